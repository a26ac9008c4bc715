// Checkpoint, restore and end of a tree's in-memory state.
#include <utility>

#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/header_record.h"
#include "hfs/treehfs/noderef.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/tree_open.h"
#include "platform/heap.h"

namespace VELK {

namespace {

constexpr unsigned long kFlushZeroTail = 4;  // mode bit of Flush

int SaveHeader(CBTreeHfs* tree) {
    NodeRef node0;
    HFS_TRY(FetchNode(tree, 0, NodeUse::kRead, node0.Out()), 3442);
    HFS_TRY(MarkDirty(tree, node0.Get(), 0), 3444);
    WriteHeaderRecord(tree, node0.Get());
    tree->isDirty = false;
    return kOk;
}

// Zero-fills the part of the file that no node was ever written to.
void ZeroTail(CBTreeHfs* tree) {
    CFileSystemHfs* volume = tree->volume;
    const u32 from = tree->validNodes;
    const u32 to = tree->header.totalNodes;
    HFS_TRACE("Zero nodes r=%x, [%x %x)\n", tree->fileId, from, to);
    velk_printk(volume->logHandle, "Zero nodes r=%x, [%x %x)\n", tree->fileId, from, to);
    const int status = volume->Zero(&tree->runs, nullptr, 0, tree->fileId,
                                    static_cast<u64>(from) << tree->nodeShift,
                                    static_cast<u64>(to - from) << tree->nodeShift);
    HFS_ASSERT(status == kOk, 3481);
    tree->validNodes = to;
}

// Frees every cached node whatever references remain, then those that lost their place in the tree.
void DiscardAll(CBTreeHfs* tree) {
    while (tree->nodeRoot != nullptr) {
        DropNode(tree, NodeOf(tree->nodeRoot));
    }
    while (!tree->modifiedList.IsEmpty()) {
        DiscardNode(tree, NodeOfModified(tree->modifiedList.next));
    }
}

}  // namespace

int CBTreeHfs::Flush(unsigned long mode) {
    findData.ClearPath();
    if (isDirty) {
        const int status = SaveHeader(this);
        if (status != kOk) {
            return status;
        }
    }
    HFS_TRY(Clear(), 3461);
    if ((mode & kFlushZeroTail) != 0 && validNodes < header.totalNodes) {
        ZeroTail(this);
    }
    return kOk;
}

void CBTreeHfs::Dtor() {
    velk_heap_free(scratch);
    scratch = nullptr;
    scratchHalf = nullptr;
    HFS_ASSERT(!reservationOpen, 2377);
    HFS_ASSERT(modifiedList.IsEmpty(), 2380);
    findData.ClearPath();
    DiscardAll(this);
    HFS_ASSERT(nodeCount == 0, 2388);
    HFS_TRACE("~%s: Max %u, Hit %u, Read %u, Write %u\n", TreeName(fileId), maxNodeCount, hitCount,
              readCount, writeCount);
}

void CBTreeHfs::RestoreModifiedNodes() {
    // The buffer is kept aside: a restored tree is used again.
    u8* const buffer = std::exchange(scratch, nullptr);
    u8* const half = std::exchange(scratchHalf, nullptr);
    Dtor();
    scratch = buffer;
    scratchHalf = half;

    NodeRef node0;
    if (FetchNode(this, 0, NodeUse::kRead, node0.Out()) != kOk) {
        return;
    }
    const BTHeaderMem before = header;
    const u8 typeBefore = btreeType;
    const u8 compareBefore = keyCompareType;
    ReadHeaderRecord(this, node0.Get());
    if (header.nodeSize != 1u << nodeShift) {
        // Every cached length follows the geometry the tree was opened with: a header that names
        // another one is not taken over, and isDirty tells the volume that the restore failed.
        header = before;
        btreeType = typeBefore;
        keyCompareType = compareBefore;
        isDirty = true;
        return;
    }
    RepairAttributes(this);
    isDirty = false;
}

}  // namespace VELK
