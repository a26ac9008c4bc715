// Turning an empty fork into an empty tree: node 0 is written from nothing, then the file grows to
// its first clump. When it cannot be finished the fork is empty again; the nodes cached meanwhile
// are the volume's to drop, by tearing the tree down.
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/header_record.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/noderef.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/scratch.h"
#include "hfs/treehfs/space_fork.h"
#include "platform/heap.h"

namespace VELK {

namespace {

constexpr u8 kHeaderNodeBit = 0x80;  // node 0's bit in the first byte of the map

void SetTreeConstants(CBTreeHfs* tree) {
    if (tree->fileId == kAttributesFileId) {
        tree->compareKeys = CompareAttrKeys;
        tree->header.maxKeyLength = kAttrMaxKeyLength;
        tree->keyCompareType = 0;
        tree->header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
    }
}

void SetGeometry(CBTreeHfs* tree) {
    const CFileSystemHfs* volume = tree->volume;
    BTHeaderMem* header = &tree->header;
    header->cache = &tree->volume->cache;
    header->blockSize = volume->mapBlockSize;
    header->blockMask = header->blockSize - 1;
    header->blockShift = volume->mapBlockShift;
    header->blocksPerNode = header->nodeSize >> header->blockShift;
    tree->validNodes = 1;
}

// Lays out node 0: descriptor, header record, user data left zero, and a map record with only its
// own bit set.
int WriteHeaderNode(CBTreeHfs* tree, HfsNode* node) {
    const BTHeaderMem* hdr = &tree->header;
    const NodeBytes bytes(hdr, node);
    HFS_ASSERT(bytes.U16(SlotOffset(hdr, 0)) == kDescSize, 5349);
    bytes.SetU16(SlotOffset(hdr, 1), kHeadEnd);
    bytes.SetU16(SlotOffset(hdr, kHeadMapIndex), kHeadMapRecord);
    bytes.SetU16(SlotOffset(hdr, kHeadNumRecords), hdr->nodeSize - kHeadSlotsSize);
    SetKind(hdr, node, kBTHeaderNode);
    SetNumRecords(hdr, node, kHeadNumRecords);
    bytes.SetU8(kHeadBtreeType, tree->btreeType);
    bytes.SetU8(kHeadKeyCompareType, tree->keyCompareType);
    WriteHeaderRecord(tree, node);
    NodePtr map;
    HFS_TRY(node->GetPtr(hdr, kHeadMapRecord, &map), 5370);
    bytes.SetU8(map.offset, u32{bytes.U8(map.offset)} | kHeaderNodeBit);
    return kOk;
}

// Writes node 0 and grows the file. Holds node 0 no longer than that, whatever the outcome.
int BuildTree(CBTreeHfs* tree, const unsigned long long* initialSize) {
    NodeRef node;
    HFS_TRY(FetchNode(tree, 0, NodeUse::kEmpty, node.Out()), 5338);
    HFS_TRY(MarkDirty(tree, node.Get(), 0, tree->header.nodeSize), 5340);
    const int status = WriteHeaderNode(tree, node.Get());
    if (status != kOk) {
        return status;
    }
    HFS_TRY(tree->ExtendBTree(tree->header.totalNodes + 1, initialSize, &tree->header.clumpSize),
            5378);
    return kOk;
}

}  // namespace

int CBTreeHfs::Create(unsigned newNodeShift, unsigned char, const unsigned long long* initialSize) {
    SetTreeConstants(this);
    if (newNodeShift < kMinNodeShift || newNodeShift > kMaxNodeShift || compareKeys == nullptr) {
        return Fail(kErrInvalid, kReasonUnknown, 5302);
    }
    nodeShift = newNodeShift;
    header.nodeSize = 1u << newNodeShift;
    header.clumpSize =
        GetHfsClumpSize(volume->allocBlockSize, header.nodeSize, volume->volumeSize, fileId);
    if (newNodeShift < volume->mapBlockShift) {
        HFS_TRACE("r=%x: node size %x < map block %x\n", fileId, header.nodeSize,
                  u32{volume->mapBlockSize});
        return Fail(kErrInvalid, kReasonInvalid, 5317);
    }
    HFS_TRY(ResizeFork(this, initialSize != nullptr ? *initialSize : header.clumpSize), 5326);
    SetGeometry(this);
    noneFreeBelow = 0;
    const int status = BuildTree(this, initialSize);
    if (status != kOk) {
        const bool isUndone = ResizeFork(this, 0) == kOk;
        HFS_ASSERT(isUndone, 5393);
        return status;
    }
    isAllOwn = true;
    hasLongData = false;
    velk_heap_free(scratch);
    scratch = nullptr;
    return EnsureScratch(this);
}

}  // namespace VELK
