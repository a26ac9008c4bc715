// See tree_name.h.
#include "tool/tree_name.h"

#include "hfs/format.h"

namespace VELK::tool {

u32 TreeIdFromText(const std::string& text) {
    if (text == "catalog" || text == "c") {
        return kCatalogFileId;
    }
    if (text == "extents" || text == "e") {
        return kExtentsFileId;
    }
    if (text == "attributes" || text == "a") {
        return kAttributesFileId;
    }
    return 0;
}

}  // namespace VELK::tool
