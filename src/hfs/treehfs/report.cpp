// Reports, assertions and tree names: cold paths of every engine file.
#include "hfs/treehfs/report.h"

#include "hfs/format.h"

namespace VELK {

namespace {

constexpr char kSourceId[] = "src/hfs/treehfs 1.0";

}  // namespace

[[gnu::cold, gnu::noinline]] void Report(int code, int site) {
    VELKError(static_cast<unsigned>(code), kSourceId, site);
}

[[gnu::cold, gnu::noinline]] void AssertFailed(int site) {
    _VELKTrace("***** velk_assert src/hfs/treehfs, %d\n", site);
}

const char* TreeName(u32 fileId) {
    switch (fileId) {
        case kExtentsFileId:
            return "ExtTree";
        case kCatalogFileId:
            return "CatTree";
        case kAttributesFileId:
            return "AttTree";
        default:
            return "Unknown";
    }
}

}  // namespace VELK
