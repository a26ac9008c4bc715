// Taking a node from the allocation map and giving it back: one bit, the counter of free nodes, and
// the header record when the bit lies beside it in node 0. The node itself is fetched empty when
// taken and left as it is when freed.
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/map_walk.h"
#include "hfs/treehfs/own_change.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

constexpr u32 kMostNodes = 0xFFFFFFFFu;

// Walks to the piece with the map's first clear bit.
int FindFreeNode(MapWalk* walk, u64* nodeNum) {
    for (;;) {
        HFS_TRY(walk->NextNode(), 3691);
        HFS_TRY(walk->ReadRecord(), 3698);
        for (;;) {
            if (walk->FindClearBit(nodeNum)) {
                return kOk;
            }
            if (!walk->HasMorePieces()) {
                break;
            }
            HFS_TRY(walk->NextPiece(), 3754);
        }
    }
}

// Walks to the piece that holds the bit of node `nodeNum`.
int FindNodeBit(MapWalk* walk, u32 nodeNum) {
    do {
        HFS_TRY(walk->NextNode(), 3788);
        HFS_TRY(walk->ReadRecord(), 3795);
    } while (nodeNum >= walk->RecordEnd());
    while (nodeNum >= walk->PieceEnd()) {
        HFS_TRY(walk->NextPiece(), 3830);
    }
    HFS_ASSERT(walk->PieceStart() <= nodeNum, 3804);
    return kOk;
}

}  // namespace

// Takes the lowest free node number and hands out its node, empty, in `*node` (null on failure).
// A failure after the bit was set leaves it set: the volume restores.
int TakeFreeNode(CBTreeHfs* tree, bool forIndex, HfsNode** node) {
    BTHeaderMem* header = &tree->header;
    *node = nullptr;
    MapWalk walk(tree);
    u64 nodeNum = 0;
    const int status = FindFreeNode(&walk, &nodeNum);
    if (status != kOk) {
        return status;
    }
    if (nodeNum >= header->totalNodes) {
        return kErrNoSpace;
    }
    // Node 0 and the root are in use whatever the map says; emptying them would lose the tree.
    if (nodeNum == 0 || nodeNum == header->rootNode) {
        return Fail(kErrCorrupt, kReasonTree, 9403);
    }
    if (header->freeNodes == 0) {
        return Fail(kErrCorrupt, kReasonTree, 9404);
    }
    HFS_TRY(MarkDirty(tree, walk.Node(), walk.PieceOffset()), 3721);
    walk.SetBit(nodeNum);
    tree->noneFreeBelow = static_cast<u32>(nodeNum) + 1;
    header->freeNodes -= 1;
    tree->isDirty = true;
    if (walk.AtHeaderNode()) {
        HFS_TRY(StoreHeader(tree, walk.Node()), 3730);
    }
    const NodeUse use = forIndex ? NodeUse::kEmptyIndex : NodeUse::kEmpty;
    HFS_TRY(FetchNode(tree, static_cast<u32>(nodeNum), use, node), 3743);
    return kOk;
}

int CBTreeHfs::AllocateNode(HfsNode** node) {
    return TakeFreeNode(this, false, node);
}

int CBTreeHfs::FreeNode(unsigned nodeNumber) {
    NoteChange(this);
    HFS_ASSERT(nodeNumber < header.totalNodes, 3778);
    if (nodeNumber >= header.totalNodes) {
        return Fail(kErrCorrupt, kReasonTree, 9405);
    }
    if (nodeNumber == 0) {  // the header node's bit is always set
        return Fail(kErrCorrupt, kReasonTree, 9406);
    }
    MapWalk walk(this);
    const int status = FindNodeBit(&walk, nodeNumber);
    if (status != kOk) {
        return status;
    }
    const bool isUsed = walk.IsSet(nodeNumber);
    HFS_ASSERT(isUsed, 3807);
    if (!isUsed) {
        return Fail(kErrCorrupt, kReasonTree, 9407);
    }
    if (header.freeNodes == kMostNodes) {
        return Fail(kErrCorrupt, kReasonTree, 9408);
    }
    HFS_TRY(MarkDirty(this, walk.Node(), walk.PieceOffset()), 3808);
    walk.ClearBit(nodeNumber);
    header.freeNodes += 1;
    isDirty = true;
    if (walk.AtHeaderNode()) {
        HFS_TRY(StoreHeader(this, walk.Node()), 3816);
    }
    return kOk;
}

}  // namespace VELK
