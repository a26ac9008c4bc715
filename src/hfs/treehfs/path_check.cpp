// Checks of a stored search path. See path_check.h.
#include "hfs/treehfs/path_check.h"

#include "hfs/treehfs/node_child.h"
#include "hfs/treehfs/node_desc.h"

namespace VELK {

bool ParentsLeadHere(const CBTreeHfs* tree, const HfsFindData* path, u32 level) {
    const BTHeaderMem* hdr = &tree->header;
    const u32 depth = hdr->treeDepth;
    if (level > depth || depth > kMaxPathDepth) {
        return false;
    }
    for (; level < depth; ++level) {
        const HfsFindLevel& parent = path->path[level + 1];
        if (parent.node == nullptr || Kind(parent.node) != kBTIndexNode || parent.index < 0 ||
            static_cast<u32>(parent.index) >= NumRecords(parent.node)) {
            return false;
        }
        u32 child = 0;
        if (ChildOf(tree, parent.node, parent.index, &child) != 0 ||
            child != path->path[level].node->nodeNum) {
            return false;
        }
    }
    return path->path[depth].node->nodeNum == hdr->rootNode;
}

}  // namespace VELK
