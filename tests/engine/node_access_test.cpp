// Byte positions, child numbers, free space and record sizes of a node; and every accessor on
// nodes whose offsets are anything at all.
#include <gtest/gtest.h>

#include "capture.h"
#include "geometry.h"
#include "hfs/treehfs.h"
#include "keys.h"
#include "node_image.h"

namespace VELK::test {
namespace {

const Events kRefused = {Reported(kReasonNode, kAnySite)};

void PutSlot(Bytes* node, u32 index, u32 value) {
    Put16(node, node->size() - 2 * (index + 1), value);
}

NodeImage TwoRecords() {
    return {.records = {Record(Bytes{0, 0}, Bytes(4)), Record(Bytes{0, 0}, Bytes(6))}};
}

class NodeAccess : public GeometryTest {
protected:
    Capture capture_;
};

// ---- GetKey

TEST_P(NodeAccess, OnlyTheMapRecordOfTheHeaderNodeHasNoKey) {
    const NodeImage image{.kind = kBTHeaderNode,
                          .height = 0,
                          .records = {Record(Bytes{0, 2, 1, 1}, Bytes(6)),
                                      Record(Bytes{0, 2, 1, 1}, Bytes(6)), Bytes(8, 0xFF)}};
    const LooseNode node(image.Build(NodeSize()), MapBlock(), 0);
    NodeKey record{};
    EXPECT_EQ(node->GetKey(node.Hdr(), 0, &record), kOk);
    EXPECT_EQ(record.keySize, 4u);
    EXPECT_EQ(node->GetKey(node.Hdr(), 2, &record), kOk);
    EXPECT_EQ(record.keySize, 0u);
    EXPECT_EQ(record.size, 8u);
}

// A node of a block and two bytes has blocks for one: data in the two bytes lies nowhere.
TEST_P(NodeAccess, DataPastTheNodesBlocksIsRefused) {
    Bytes content(MapBlock());
    Put16(&content, 10, 2);
    Put16(&content, MapBlock() - 2, 14);
    Put16(&content, MapBlock() - 4, MapBlock() + 1);
    LooseNode node(content, MapBlock());
    node.header.nodeSize = MapBlock() + 2;
    NodeKey record{};
    EXPECT_EQ(node->GetKey(node.Hdr(), 1, &record), kErrCorrupt);
    EXPECT_EQ(capture_.Take(), (Events{Reported(kReasonNode, 9007)}));
}

// ---- GetPtr

TEST_P(NodeAccess, PtrDescribesAByteAndTheBlockAfterIt) {
    const LooseNode node(Bytes(NodeSize()), MapBlock());
    NodePtr ptr{1, 1, nullptr, nullptr, node.At(0)};
    EXPECT_EQ(node->GetPtr(node.Hdr(), 100, &ptr), kOk);
    EXPECT_EQ(ptr.offset, 100u);
    EXPECT_EQ(ptr.ptr, node.At(100));
    EXPECT_EQ(ptr.firstBytes, MapBlock() - 100);
    EXPECT_EQ(ptr.next1, GetParam().Blocks() > 1 ? node.At(MapBlock()) : nullptr);
    EXPECT_EQ(ptr.next2, nullptr);
}

TEST_P(NodeAccess, PtrOfTheLastByteHasNoNextBlock) {
    const LooseNode node(Bytes(NodeSize()), MapBlock());
    NodePtr ptr{};
    EXPECT_EQ(node->GetPtr(node.Hdr(), NodeSize() - 1, &ptr), kOk);
    EXPECT_EQ(ptr.ptr, node.At(NodeSize() - 1));
    EXPECT_EQ(ptr.firstBytes, 1u);
    EXPECT_EQ(ptr.next1, nullptr);
    EXPECT_EQ(capture_.All(), Events{});
}

TEST_P(NodeAccess, PtrOfTheNodesEndIsAssertedAndNull) {
    const LooseNode node(Bytes(NodeSize()), MapBlock());
    NodePtr ptr{0, 0, node.At(0), nullptr, nullptr};
    EXPECT_EQ(node->GetPtr(node.Hdr(), NodeSize(), &ptr), kErrCorrupt);
    EXPECT_EQ(ptr.ptr, nullptr);
    EXPECT_EQ(capture_.All(), (Events{Asserted(663), kRefused[0]}));
}

TEST_P(NodeAccess, PtrPastTheNodesEndIsRefused) {
    const LooseNode node(Bytes(NodeSize()), MapBlock());
    for (const u32 offset : {NodeSize() + 1, 0x80000000u, 0xFFFFFFFFu}) {
        NodePtr ptr{0, 0, node.At(0), nullptr, nullptr};
        EXPECT_EQ(node->GetPtr(node.Hdr(), offset, &ptr), kErrCorrupt);
        EXPECT_EQ(ptr.ptr, nullptr);
        EXPECT_EQ(capture_.Take(), Events{Reported(kReasonNode, 658)});
    }
}

// ---- GetChildNodeNum

TEST_P(NodeAccess, ChildNumberIsTheDataOfAnIndexRecord) {
    NodeImage image{.kind = kBTIndexNode, .height = 2};
    image.records = {Record(NthDiskKey(4, 0), 0x01020304u), Record(NthDiskKey(4, 1), 0xFFEEDDCCu)};
    const LooseNode node(image.Build(NodeSize()), MapBlock());
    u32 child = 0;
    EXPECT_EQ(node->GetChildNodeNum(node.Hdr(), 0, &child), kOk);
    EXPECT_EQ(child, 0x01020304u);
    EXPECT_EQ(node->GetChildNodeNum(node.Hdr(), 1, &child), kOk);
    EXPECT_EQ(child, 0xFFEEDDCCu);
    EXPECT_EQ(capture_.All(), Events{});
}

TEST_P(NodeAccess, OnlyIndexNodesHaveChildren) {
    for (const s8 kind : {kBTLeafNode, kBTHeaderNode, kBTMapNode}) {
        NodeImage image{.kind = kind};
        image.records = {Record(NthDiskKey(4, 0), 77)};
        const LooseNode node(image.Build(NodeSize()), MapBlock());
        u32 child = 0;
        EXPECT_EQ(node->GetChildNodeNum(node.Hdr(), 0, &child), kErrCorrupt);
        EXPECT_EQ(capture_.Take(), kRefused);
    }
}

TEST_P(NodeAccess, ChildDataOfAnyOtherSizeIsRefused) {
    for (const u32 size : {2u, 6u, 8u}) {
        NodeImage image{.kind = kBTIndexNode, .height = 2};
        image.records = {Record(NthDiskKey(4, 0), Bytes(size))};
        const LooseNode node(image.Build(NodeSize()), MapBlock());
        u32 child = 0;
        EXPECT_EQ(node->GetChildNodeNum(node.Hdr(), 0, &child), kErrCorrupt);
        EXPECT_EQ(capture_.Take(), kRefused);
    }
}

TEST_P(NodeAccess, AChildWhoseRecordIsBrokenIsReportedTwice) {
    NodeImage image{.kind = kBTIndexNode, .height = 2};
    image.records = {Record(NthDiskKey(4, 0), 77)};
    Bytes bytes = image.Build(NodeSize());
    PutSlot(&bytes, 1, 14);
    const LooseNode node(bytes, MapBlock());
    u32 child = 0;
    EXPECT_EQ(node->GetChildNodeNum(node.Hdr(), 0, &child), kErrCorrupt);
    EXPECT_EQ(capture_.All(), (Events{kRefused[0], Reported(kErrCorrupt, kAnySite)}));
}

// ---- GetNodeFreeSize

TEST_P(NodeAccess, FreeSizeOfAnEmptyNode) {
    const LooseNode node(NodeImage{}.Build(NodeSize()), MapBlock());
    u32 size = 0;
    EXPECT_EQ(node->GetNodeFreeSize(node.Hdr(), &size), kOk);
    EXPECT_EQ(size, NodeSize() - 2 - 14);
}

TEST_P(NodeAccess, FreeSizeEndsAtTheSlotOfTheFreeSpace) {
    const LooseNode node(TwoRecords().Build(NodeSize()), MapBlock());
    u32 size = 0;
    EXPECT_EQ(node->GetNodeFreeSize(node.Hdr(), &size), kOk);
    EXPECT_EQ(size, NodeSize() - 6 - 28);
}

TEST_P(NodeAccess, FreeSizeOfAFullNodeIsZero) {
    Bytes bytes = TwoRecords().Build(NodeSize());
    PutSlot(&bytes, 2, NodeSize() - 6);
    const LooseNode node(bytes, MapBlock());
    u32 size = 1;
    EXPECT_EQ(node->GetNodeFreeSize(node.Hdr(), &size), kOk);
    EXPECT_EQ(size, 0u);
}

TEST_P(NodeAccess, FreeSpaceBehindItsSlotIsRefused) {
    Bytes bytes = TwoRecords().Build(NodeSize());
    PutSlot(&bytes, 2, NodeSize() - 5);
    const LooseNode node(bytes, MapBlock());
    u32 size = 0;
    EXPECT_EQ(node->GetNodeFreeSize(node.Hdr(), &size), kErrCorrupt);
    EXPECT_EQ(capture_.All(), Events{Reported(kReasonNode, 1789)});
}

TEST_P(NodeAccess, FreeSpaceWithoutRoomForItsSlotIsRefused) {
    for (const u32 count : {NodeSize() / 2 - 1, NodeSize() / 2, 65535u}) {
        Bytes bytes(NodeSize());
        Put16(&bytes, 10, count);
        const LooseNode node(bytes, MapBlock());
        u32 size = 0;
        EXPECT_EQ(node->GetNodeFreeSize(node.Hdr(), &size), kErrCorrupt) << count;
        EXPECT_EQ(capture_.Take(), Events{Reported(kReasonNode, 1781)}) << count;
    }
}

// ---- GetRecordSize

TEST_P(NodeAccess, RecordSizeIsTheDistanceOfTwoSlots) {
    const LooseNode node(TwoRecords().Build(NodeSize()), MapBlock());
    u32 size = 0;
    EXPECT_EQ(node->GetRecordSize(node.Hdr(), 0, &size), kOk);
    EXPECT_EQ(size, 6u);
    EXPECT_EQ(node->GetRecordSize(node.Hdr(), 1, &size), kOk);
    EXPECT_EQ(size, 8u);
}

TEST_P(NodeAccess, RecordSizeDoesNotLookAtTheRecordCount) {
    Bytes bytes = TwoRecords().Build(NodeSize());
    Put16(&bytes, 10, 0);
    const LooseNode node(bytes, MapBlock());
    u32 size = 0;
    EXPECT_EQ(node->GetRecordSize(node.Hdr(), 1, &size), kOk);
    EXPECT_EQ(size, 8u);
    EXPECT_EQ(capture_.All(), Events{});
}

TEST_P(NodeAccess, RecordSizeOfAnyUnsoundSlotIsZeroAndRefused) {
    struct {
        u32 start, end;
    } const pairs[] = {{20, 20}, {21, 20}, {20, NodeSize()}, {NodeSize(), 65535}, {65535, 20}};
    for (const auto& pair : pairs) {
        Bytes bytes = TwoRecords().Build(NodeSize());
        PutSlot(&bytes, 0, pair.start);
        PutSlot(&bytes, 1, pair.end);
        const LooseNode node(bytes, MapBlock());
        u32 size = 9;
        EXPECT_EQ(node->GetRecordSize(node.Hdr(), 0, &size), kErrCorrupt);
        EXPECT_EQ(size, 0u);
        EXPECT_EQ(capture_.Take(), Events{Reported(kReasonNode, 1856)});
    }
}

TEST_P(NodeAccess, RecordSizeOfAnIndexWithoutSlotsIsRefused) {
    const LooseNode node(Bytes(NodeSize(), 0x11), MapBlock());
    const int first = static_cast<int>(NodeSize() / 2 - 2);
    for (const int index : {-1, -2, -70000, first, first + 1, 65535, 0x7FFFFFFF, -0x7FFFFFFF - 1}) {
        u32 size = 9;
        EXPECT_EQ(node->GetRecordSize(node.Hdr(), index, &size), kErrCorrupt) << index;
        EXPECT_EQ(size, 0u);
        EXPECT_EQ(capture_.Take(), Events{Reported(kReasonNode, 1856)}) << index;
    }
}

INSTANTIATE_GEOMETRIES(NodeAccess, AllGeometries);

// ---- over block ends

// An index node whose only record's child number lies at node offset `childAt`.
Bytes IndexNodeWithChildAt(u32 childAt, u32 recordStart) {
    Bytes bytes(1024);
    bytes[8] = 0;
    bytes[9] = 2;
    Put16(&bytes, 10, 1);
    Put16(&bytes, recordStart, childAt - recordStart - 2);
    Put32(&bytes, childAt, 0xA1B2C3D4u);
    PutSlot(&bytes, 0, recordStart);
    PutSlot(&bytes, 1, childAt + 4);
    return bytes;
}

TEST(NodeAccessBlocks, AChildNumberSplitTwoAndTwo) {
    const LooseNode node(IndexNodeWithChildAt(510, 14), 512);
    u32 child = 0;
    EXPECT_EQ(node->GetChildNodeNum(node.Hdr(), 0, &child), kOk);
    EXPECT_EQ(child, 0xA1B2C3D4u);
}

TEST(NodeAccessBlocks, AChildNumberSplitAtOddOffsets) {
    for (const u32 childAt : {509u, 511u}) {
        const LooseNode node(IndexNodeWithChildAt(childAt, 15), 512);
        u32 child = 0;
        EXPECT_EQ(node->GetChildNodeNum(node.Hdr(), 0, &child), kOk) << childAt;
        EXPECT_EQ(child, 0xA1B2C3D4u) << childAt;
    }
}

TEST(NodeAccessBlocks, ARecordSizeWhoseSlotsLieInTwoBlocks) {
    Bytes bytes(4096);
    Put16(&bytes, 3070, 400);
    Put16(&bytes, 3072, 380);
    const LooseNode node(bytes, 1024);
    u32 size = 0;
    EXPECT_EQ(node->GetRecordSize(node.Hdr(), 511, &size), kOk);
    EXPECT_EQ(size, 20u);
}

// ---- hostile offsets: each block is its own heap block, so a byte outside the node is seen

// Calls all accessors; what one accepts must lie inside the node.
void CallAll(const LooseNode& node, int index) {
    const BTHeaderMem* hdr = node.Hdr();
    NodeKey key{};
    if (node->GetKey(hdr, index, &key) == kOk) {
        ASSERT_LT(key.offset, key.offset + key.size);
        ASSERT_LE(key.offset + key.size, hdr->nodeSize);
        ASSERT_EQ(key.ptr, node.At(key.offset));
    }
    if (node->GetFreeKey(hdr, static_cast<unsigned>(index), &key) == kOk) {
        ASSERT_LE(key.offset + key.size, hdr->nodeSize);
    }
    u32 value = 0;
    node->GetChildNodeNum(hdr, index, &value);
    node->GetNodeFreeSize(hdr, &value);
    node->GetRecordSize(hdr, index, &value);
    NodePtr ptr{};
    node->GetPtr(hdr, static_cast<unsigned>(index), &ptr);
}

TEST(NodeAccessHostile, EveryOffsetInEitherSlotOfARecord) {
    for (const u32 slot : {0u, 1u}) {
        for (u32 value = 0; value < 65536; value += value < 1100 ? 1 : 251) {
            Capture capture;
            Bytes bytes = IndexNodeWithChildAt(510, 14);
            PutSlot(&bytes, slot, value);
            CallAll(LooseNode(bytes, 512), 0);
            CallAll(LooseNode(bytes, 1024), 0);
        }
    }
}

TEST(NodeAccessHostile, EveryRecordCountAndManyIndices) {
    for (u32 count = 0; count < 65536; count += count < 600 ? 1 : 509) {
        Capture capture;
        Bytes bytes = IndexNodeWithChildAt(510, 14);
        Put16(&bytes, 10, count);
        const LooseNode node(bytes, 512);
        for (const int index : {-70000, -2, -1, 0, 1, 2, 255, 256, 509, 510, 511, 512, 70000}) {
            CallAll(node, index);
        }
    }
}

TEST(NodeAccessHostile, EveryKeyLength) {
    for (u32 length = 0; length < 65536; length += length < 1100 ? 1 : 127) {
        Capture capture;
        Bytes bytes = IndexNodeWithChildAt(510, 14);
        Put16(&bytes, 14, length);
        CallAll(LooseNode(bytes, 512), 0);
    }
}

TEST(NodeAccessHostile, ANodeSizeThatIsNoWholeNumberOfBlocks) {
    for (u32 nodeSize = 513; nodeSize < 2048; nodeSize += 5) {
        Capture capture;
        LooseNode node(Bytes(nodeSize / 512 * 512, 0x02), 512);
        node.header.nodeSize = nodeSize;
        for (const int index : {-1, 0, 1, 100, 126, 127, 128, 200, 254, 255, 256, 500, 1022}) {
            CallAll(node, index);
        }
        for (u32 offset = nodeSize - 4; offset < nodeSize + 2; ++offset) {
            NodePtr ptr{};
            node->GetPtr(node.Hdr(), offset, &ptr);
        }
    }
}

}  // namespace
}  // namespace VELK::test
