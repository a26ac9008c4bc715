// Keys and data in one piece: the scratch buffer.
#include "hfs/treehfs/scratch.h"

#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/report.h"
#include "platform/heap.h"

namespace VELK {

int EnsureScratch(CBTreeHfs* tree) {
    if (tree->scratch == nullptr) {
        tree->scratch = static_cast<u8*>(velk_heap_alloc(tree->header.nodeSize));
        if (tree->scratch == nullptr) {
            return kErrNoMemory;
        }
        tree->scratchHalf = tree->scratch + tree->header.nodeSize / 2;
    }
    return kOk;
}

u8* DataScratch(CBTreeHfs* tree, u32 size) {
    if (size > tree->header.nodeSize || EnsureScratch(tree) != kOk) {
        return nullptr;
    }
    return size <= tree->header.nodeSize / 2 ? tree->scratchHalf : tree->scratch;
}

int CopyKey(CBTreeHfs* tree, const HfsNode* node, const NodeKey& record, const BTreeKey** key) {
    if (record.keySize > tree->header.nodeSize) {
        return kErrCorrupt;
    }
    const int status = EnsureScratch(tree);
    if (status != kOk) {
        return status;
    }
    NodeBytes(&tree->header, node).CopyOut(tree->scratch, record.offset, record.keySize);
    *key = reinterpret_cast<const BTreeKey*>(tree->scratch);
    return kOk;
}

int GatherKey(CBTreeHfs* tree, const HfsNode* node, const NodeKey& record, const BTreeKey** key) {
    if (record.keySize <= record.firstBytes) {
        *key = reinterpret_cast<const BTreeKey*>(record.ptr);
        return kOk;
    }
    const int status = CopyKey(tree, node, record, key);
    HFS_ASSERT(status != kOk || record.next1 != nullptr, 262);
    return status;
}

}  // namespace VELK
