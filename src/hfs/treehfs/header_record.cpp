// Header record of node 0 <-> in-memory header. See header_record.h; layout in format.h.
#include "hfs/treehfs/header_record.h"

#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

bool IsAligned(const void* bytes, std::uintptr_t alignment) {
    return reinterpret_cast<std::uintptr_t>(bytes) % alignment == 0;
}

}  // namespace

void ReadHeaderRecord(CBTreeHfs* tree, const HfsNode* node0) {
    HFS_ASSERT(IsAligned(node0->bufs[0].data, 8), 2156);
    HFS_ASSERT(IsAligned(&tree->header, 4), 2157);
    BTHeaderMem* header = &tree->header;
    const NodeBytes bytes(header, node0);
    header->rootNode = bytes.U32(kHeadRootNode);
    header->leafRecords = bytes.U32(kHeadLeafRecords);
    header->firstLeafNode = bytes.U32(kHeadFirstLeafNode);
    header->lastLeafNode = bytes.U32(kHeadLastLeafNode);
    header->totalNodes = bytes.U32(kHeadTotalNodes);
    header->freeNodes = bytes.U32(kHeadFreeNodes);
    header->clumpSize = bytes.U32(kHeadClumpSize);
    header->attributes = bytes.U32(kHeadAttributes);
    header->treeDepth = bytes.U16(kHeadTreeDepth);
    header->nodeSize = bytes.U16(kHeadNodeSize);
    header->maxKeyLength = bytes.U16(kHeadMaxKeyLength);
    tree->btreeType = bytes.U8(kHeadBtreeType);
    tree->keyCompareType = bytes.U8(kHeadKeyCompareType);
}

void WriteHeaderRecord(const CBTreeHfs* tree, HfsNode* node0) {
    HFS_ASSERT(IsAligned(node0->bufs[0].data, 8), 2186);
    HFS_ASSERT(IsAligned(&tree->header, 4), 2187);
    const BTHeaderMem* header = &tree->header;
    const NodeBytes bytes(header, node0);
    u8* const record = bytes.At(0);  // a block holds all of it
    TrapIfClean(&node0->bufs[0]);
    PutBe32(record + kHeadRootNode, header->rootNode);
    PutBe32(record + kHeadLeafRecords, header->leafRecords);
    PutBe32(record + kHeadFirstLeafNode, header->firstLeafNode);
    PutBe32(record + kHeadLastLeafNode, header->lastLeafNode);
    PutBe32(record + kHeadTotalNodes, header->totalNodes);
    PutBe32(record + kHeadFreeNodes, header->freeNodes);
    PutBe32(record + kHeadClumpSize, header->clumpSize);
    PutBe32(record + kHeadAttributes, header->attributes);
    PutBe16(record + kHeadTreeDepth, header->treeDepth);
    PutBe16(record + kHeadNodeSize, header->nodeSize);
    PutBe16(record + kHeadMaxKeyLength, header->maxKeyLength);
    HFS_ASSERT(bytes.U16(kHeadReserved) == 0, 2201);
    HFS_ASSERT(bytes.U8(kHeadBtreeType) == tree->btreeType, 2202);
    HFS_ASSERT(bytes.U8(kHeadKeyCompareType) == tree->keyCompareType, 2203);
}

}  // namespace VELK
