// Growing a tree file by whole clumps. The plan is made first and refused whole when its numbers do
// not fit; then the fork is resized; then the map is lengthened, by new map nodes at the first of
// the nodes gained, when it has too few bits for all of them.
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/header_record.h"
#include "hfs/treehfs/map_walk.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/space_fork.h"

namespace VELK {

namespace {

constexpr u32 kLastClumpSize = 0x10000;  // bytes, when neither fork nor volume name a clump
constexpr u64 kMostNodes = 0xFFFFFFFF;

struct Growth {
    u64 newSize;   // bytes
    u32 oldTotal;  // nodes; the header node counts even before there is a tree
    u32 newTotal;
    u32 mapNodes;  // new ones
    u32 newFree;   // free nodes afterwards
};

u64 CeilDiv(u64 value, u64 divisor) {
    return value / divisor + (value % divisor != 0 ? 1 : 0);
}

// Walks to the last record of the map, which may be node 0's.
int WalkToLastRecord(MapWalk* walk) {
    do {
        HFS_TRY(walk->NextNode(), 3980);
        HFS_TRY(walk->ReadRecord(), 3985);
    } while (FLink(walk->Node()) != 0);
    return kOk;
}

// New size of the file: `requested` bytes in whole clumps. Works in 64 bits throughout; a size that
// 64 bits or 32-bit node numbers cannot hold is refused.
int PlanSize(const CBTreeHfs* tree, u64 requested, u32 clumpSize, u32 wantedNodes, Growth* growth) {
    const CFileSystemHfs* volume = tree->volume;
    if (volume->allocBlockSize == 0) {
        return Fail(kErrInvalid, kReasonInvalid, 9426);
    }
    const u32 shift = volume->allocBlockShift;
    u64 clumpBlocks = (u64{clumpSize} + volume->allocBlockSize - 1) >> shift;
    HFS_ASSERT(clumpBlocks >= 1, 4016);
    clumpBlocks = clumpBlocks == 0 ? 1 : clumpBlocks;
    const u64 clumps = CeilDiv(CeilDiv(requested, volume->allocBlockSize), clumpBlocks);
    if (clumps > (~u64{0} >> shift) / clumpBlocks) {
        return Fail(kErrInvalid, kReasonInvalid, 9420);
    }
    growth->newSize = (clumps * clumpBlocks) << shift;
    const u64 newTotal = growth->newSize >> tree->nodeShift;
    if (newTotal > kMostNodes) {
        return Fail(kErrInvalid, kReasonInvalid, 9421);
    }
    // A size given by the caller may be too small for the nodes it wants: the fork would shrink.
    if (newTotal < wantedNodes) {
        return Fail(kErrInvalid, kReasonInvalid, 9422);
    }
    growth->newTotal = static_cast<u32>(newTotal);
    return kOk;
}

// New map nodes and the counters afterwards. Bits still missing are rounded up to bytes before they
// are spread over map nodes, so that even one missing bit makes a map node: the map always covers
// `totalNodes`.
int PlanMap(const BTHeaderMem& header, u64 mapBits, Growth* growth) {
    const u64 gained = growth->newTotal - growth->oldTotal;
    u64 mapNodes = 0;
    if (growth->newTotal > mapBits) {
        const u64 missingBytes = CeilDiv(growth->newTotal - mapBits, 8);
        mapNodes = CeilDiv(missingBytes, u64{header.nodeSize} - kMapNodeOverhead);
    }
    // Only a map that was too short before can want more nodes than are gained.
    if (mapNodes > gained) {
        return Fail(kErrCorrupt, kReasonTree, 9423);
    }
    const u64 newFree = header.freeNodes + (gained - mapNodes);
    if (newFree > kMostNodes) {
        return Fail(kErrCorrupt, kReasonTree, 9424);
    }
    growth->mapNodes = static_cast<u32>(mapNodes);
    growth->newFree = static_cast<u32>(newFree);
    return kOk;
}

// Makes node `nodeNum` an empty map node whose link is `next`.
int BuildMapNode(CBTreeHfs* tree, u32 nodeNum, u32 next) {
    const BTHeaderMem* hdr = &tree->header;
    NodeRef node;
    HFS_TRY(FetchNode(tree, nodeNum, NodeUse::kEmpty, node.Out()), 4104);
    // An emptied node has its last block marked, but its first may have been zero and stay clean.
    HFS_TRY(MarkDirty(tree, node.Get(), 0), 9425);
    SetKind(hdr, node.Get(), kBTMapNode);
    SetNumRecords(hdr, node.Get(), 1);
    NodePtr slot;
    HFS_TRY(node->GetPtr(hdr, SlotOffset(hdr, 1), &slot), 4117);
    const NodeBytes bytes(hdr, node.Get());
    HFS_ASSERT(bytes.U16(SlotOffset(hdr, 0)) == kDescSize, 4120);
    bytes.SetU16(slot.offset, hdr->nodeSize - kMapNodeTail);
    if (next != 0) {
        SetFLink(hdr, node.Get(), next);
    }
    return kOk;
}

// Steps on to the record that holds the bit of node `nodeNum`, and in it to the piece that does.
int StepToBit(MapWalk* walk, u32 nodeNum, u32 firstNewNode) {
    while (nodeNum >= walk->RecordEnd()) {
        const bool isLast = walk->Node() != nullptr && FLink(walk->Node()) == 0;
        HFS_ASSERT(!isLast, 4147);
        if (isLast) {
            return Fail(kErrCorrupt, kReasonTree, 4150);
        }
        HFS_TRY(walk->NextNode(), 4157);
        const HfsNode* node = walk->Node();
        HFS_ASSERT(node->nodeNum < firstNewNode || NumRecords(node) == 1, 4159);
        HFS_ASSERT(node->nodeNum < firstNewNode || Kind(node) == kBTMapNode, 4160);
        HFS_TRY(walk->ReadRecord(), 4173);
    }
    while (nodeNum >= walk->PieceEnd()) {
        HFS_TRY(walk->NextPiece(), 4181);
    }
    return kOk;
}

// Marks the new map nodes used, from the record with the old end of the file onwards. `walk` stands
// at what was the last record; in a map longer than the file the old end lies before it.
int MarkMapNodes(CBTreeHfs* tree, const Growth& growth, MapWalk* walk) {
    if (growth.oldTotal < walk->RecordStart()) {
        walk->Restart();
    }
    for (u32 i = 0; i < growth.mapNodes; ++i) {
        const u32 nodeNum = growth.oldTotal + i;
        const int status = StepToBit(walk, nodeNum, growth.oldTotal);
        if (status != kOk) {
            return status;
        }
        HFS_TRY(MarkDirty(tree, walk->Node(), walk->PieceOffset()), 4188);
        walk->SetBit(nodeNum);
    }
    return kOk;
}

// Hangs the new map nodes behind the last record of the map, at which `walk` stands.
int AddMapNodes(CBTreeHfs* tree, const Growth& growth, MapWalk* walk) {
    HFS_ASSERT(growth.mapNodes >= 1, 4076);
    HFS_TRY(MarkDirty(tree, walk->Node(), 0), 4088);
    SetFLink(&tree->header, walk->Node(), growth.oldTotal);
    if (walk->AtHeaderNode()) {
        WriteHeaderRecord(tree, walk->Node());
        tree->isDirty = false;
    }
    const u32 last = growth.oldTotal + growth.mapNodes - 1;
    for (u32 nodeNum = growth.oldTotal; nodeNum <= last; ++nodeNum) {
        const int status = BuildMapNode(tree, nodeNum, nodeNum == last ? 0 : nodeNum + 1);
        if (status != kOk) {
            return status;
        }
    }
    return MarkMapNodes(tree, growth, walk);
}

}  // namespace

int CBTreeHfs::ExtendBTree(unsigned wantedNodes, const unsigned long long* newFileSize,
                           const unsigned* growBytes) {
    if (header.totalNodes >= wantedNodes) {
        return kOk;
    }
    MapWalk walk(this);
    int status = WalkToLastRecord(&walk);
    if (status != kOk) {
        return status;
    }
    const u64 mapBits = walk.RecordEnd();
    HFS_ASSERT(mapBits == CalcMapBits(), 3993);
    const HfsFork* fork = FindFork(this);
    if (fork == nullptr) {
        return Fail(kErrInvalid, kReasonInvalid, 9427);
    }

    Growth growth{};
    growth.oldTotal = header.totalNodes == 0 ? 1 : header.totalNodes;
    const u64 requested =
        newFileSize != nullptr ? *newFileSize : static_cast<u64>(wantedNodes) << nodeShift;
    u32 clumpSize = growBytes != nullptr ? *growBytes : fork->clumpSize;
    if (clumpSize == 0) {
        clumpSize = volume->defaultClumpSize != 0 ? volume->defaultClumpSize : kLastClumpSize;
    }
    status = PlanSize(this, requested, clumpSize, wantedNodes, &growth);
    if (status == kOk) {
        status = PlanMap(header, mapBits, &growth);
    }
    if (status != kOk) {
        return status;
    }

    HFS_TRACE("Extend %s: %x => %x\n", TreeName(fileId), growth.oldTotal, growth.newTotal);
    HFS_TRY(ResizeFork(this, growth.newSize), 4047);
    HFS_ASSERT(fork->logicalSize == growth.newSize, 4050);
    isDirty = true;
    header.totalNodes = growth.newTotal;
    if (growth.mapNodes != 0) {
        status = AddMapNodes(this, growth, &walk);
        if (status != kOk) {
            isDirty = true;
            return status;
        }
    }
    if (header.freeNodes != growth.newFree) {
        header.freeNodes = growth.newFree;
        isDirty = true;
    }
    return kOk;
}

}  // namespace VELK
