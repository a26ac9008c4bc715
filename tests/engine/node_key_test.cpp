// Where a record lies in a node, and the free space behind the last one: what GetKey and
// GetFreeKey describe, what they refuse, what they say.
#include <gtest/gtest.h>

#include <cstring>

#include "capture.h"
#include "geometry.h"
#include "hfs/treehfs.h"
#include "keys.h"
#include "node_image.h"

namespace VELK::test {
namespace {

const Events kRefused = {Reported(kReasonNode, kAnySite)};

// A leaf with one record whose key fills `keyLength` bytes and whose data is `dataSize` long.
Bytes OneRecordNode(u32 nodeSize, u32 keyLength, u32 dataSize, s8 kind = kBTLeafNode) {
    Bytes key = Pattern(keyLength + 2, 5);
    Put16(&key, 0, keyLength);
    NodeImage image;
    image.kind = kind;
    image.records.push_back(Record(key, Pattern(dataSize, 8)));
    return image.Build(nodeSize);
}

// Sets slot `index` of a node.
void PutSlot(Bytes* node, u32 index, u32 value) {
    Put16(node, node->size() - 2 * (index + 1), value);
}

NodeKey GetKeyOf(const LooseNode& node, int index) {
    NodeKey key{};
    EXPECT_EQ(node->GetKey(node.Hdr(), index, &key), kOk);
    return key;
}

// ---- key lengths

TEST(KeyLength, OfALeafKeyIsItsOwnField) {
    BTHeaderMem header = GeometryHeader(512, 512);
    header.attributes = kBTBigKeysMask;
    header.maxKeyLength = 10;
    const Bytes key = {0x01, 0x04};
    const auto* be = reinterpret_cast<const BTreeKey*>(key.data());
    EXPECT_EQ(GetKeyLength(&header, be, true), 0x0104u);
}

TEST(KeyLength, OfAnIndexKeyIsItsOwnFieldWhenIndexKeysVary) {
    BTHeaderMem header = GeometryHeader(512, 512);
    header.attributes = kBTVariableIndexKeysMask;
    const Bytes key = {0x01, 0x04};
    EXPECT_EQ(GetKeyLength(&header, reinterpret_cast<const BTreeKey*>(key.data()), false), 0x104u);
}

TEST(KeyLength, OfAFixedSizeIndexKeyIsTheHeadersWhateverTheFieldSays) {
    BTHeaderMem header = GeometryHeader(512, 512);
    header.attributes = kBTBigKeysMask;
    header.maxKeyLength = 10;
    const Bytes key = {0x01, 0x04};
    const auto* raw = reinterpret_cast<const BTreeKey*>(key.data());
    EXPECT_EQ(GetKeyLength(&header, raw, false), 10u);
    EXPECT_EQ(GetKeyLengthLe(&header, raw, false), 10u);
}

TEST(KeyLength, OfAHostOrderKeyIsNotSwapped) {
    BTHeaderMem header = GeometryHeader(512, 512);
    const u16 length = 0x0104;
    Bytes key(2);
    std::memcpy(key.data(), &length, 2);
    const auto* host = reinterpret_cast<const BTreeKey*>(key.data());
    EXPECT_EQ(GetKeyLengthLe(&header, host, true), 0x0104u);
    EXPECT_EQ(GetKeyLengthLe(&header, host, false), 0x0104u);
}

// ---- GetKey in every geometry

class GetKeyTest : public GeometryTest {
protected:
    Capture capture_;
};

TEST_P(GetKeyTest, DescribesTheFirstRecordOfALeaf) {
    const LooseNode node(OneRecordNode(NodeSize(), 7, 20), MapBlock());
    const NodeKey key = GetKeyOf(node, 0);
    EXPECT_EQ(key.offset, 14u);
    EXPECT_EQ(key.size, 30u);
    EXPECT_EQ(key.ptr, node.At(14));
    EXPECT_EQ(key.firstBytes, MapBlock() - 14);
    EXPECT_EQ(key.entryPos, NodeSize() - 2);
    EXPECT_EQ(key.entry, node.At(NodeSize() - 2));
    EXPECT_EQ(key.entryBytes, 2u);
    EXPECT_EQ(key.keySize, 9u);
    EXPECT_EQ(key.dataSize, 20u);
    EXPECT_EQ(key.data, node.At(24));
    EXPECT_EQ(key.dataFirstBytes, MapBlock() - 24);
    EXPECT_EQ(key.dataNext1, nullptr);
    EXPECT_EQ(key.dataNext2, nullptr);
    EXPECT_EQ(capture_.All(), Events{});
}

TEST_P(GetKeyTest, NamesTheFollowingBlocksThatTheNodeHas) {
    const LooseNode node(OneRecordNode(NodeSize(), 6, 2), MapBlock());
    const NodeKey key = GetKeyOf(node, 0);
    const u32 blocks = GetParam().Blocks();
    EXPECT_EQ(key.next1, blocks > 1 ? node.At(MapBlock()) : nullptr);
    EXPECT_EQ(key.next2, blocks > 2 ? node.At(2 * MapBlock()) : nullptr);
}

TEST_P(GetKeyTest, FindsEveryRecordOfAFullNode) {
    NodeImage image;
    std::vector<u32> offsets;
    for (u32 n = 0, offset = 14; n < NodeSize() / 40; ++n) {
        image.records.push_back(Record(NthDiskKey(kCatalogFileId, n), Pattern(4 + 2 * (n % 5), n)));
        offsets.push_back(offset);
        offset += static_cast<u32>(image.records.back().size());
    }
    const LooseNode node(image.Build(NodeSize()), MapBlock());
    for (u32 n = 0; n < offsets.size(); ++n) {
        const NodeKey key = GetKeyOf(node, static_cast<int>(n));
        ASSERT_EQ(key.offset, offsets[n]);
        ASSERT_EQ(key.size, image.records[n].size());
        ASSERT_EQ(key.keySize, 20u);
        ASSERT_EQ(key.dataSize, 4 + 2 * (n % 5));
        ASSERT_EQ(key.data, node.At(offsets[n] + 20));
        ASSERT_EQ(key.entry, node.At(NodeSize() - 2 * (n + 1)));
        ASSERT_EQ(key.entryBytes, MapBlock() - (NodeSize() - 2 * (n + 1)) % MapBlock());
    }
    EXPECT_EQ(capture_.All(), Events{});
}

TEST_P(GetKeyTest, AssertsAnIndexPastTheRecordsAndGoesOn) {
    Bytes bytes =
        NodeImage{.records = {Record(Bytes{0, 0}, Bytes(4)), Record(Bytes{0, 0}, Bytes(6))}}.Build(
            NodeSize());
    Put16(&bytes, 10, 1);
    const LooseNode node(bytes, MapBlock());
    EXPECT_EQ(GetKeyOf(node, 1).size, 8u);
    EXPECT_EQ(capture_.All(), Events{Asserted(410)});
}

TEST_P(GetKeyTest, RefusesNegativeIndicesAfterTheAssertion) {
    const LooseNode node(OneRecordNode(NodeSize(), 6, 2), MapBlock());
    NodeKey key{};
    for (const int index : {-1, -2, -3, -256, -70000, -2147483647 - 1}) {
        EXPECT_EQ(node->GetKey(node.Hdr(), index, &key), kErrCorrupt) << index;
        EXPECT_EQ(capture_.Take(), (Events{Asserted(410), Reported(kReasonNode, kAnySite)}));
    }
}

TEST_P(GetKeyTest, RefusesIndicesWhoseSlotLiesOutsideTheNode) {
    Bytes bytes(NodeSize(), 0xFF);
    const LooseNode node(bytes, MapBlock());
    NodeKey key{};
    const int first = static_cast<int>(NodeSize() / 2 - 2);
    for (const int index : {first, first + 1, 40000, 65534}) {
        EXPECT_EQ(node->GetKey(node.Hdr(), index, &key), kErrCorrupt) << index;
        EXPECT_EQ(capture_.Take(), kRefused) << index;
    }
}

TEST_P(GetKeyTest, TheDescriptorHoldsNoSlots) {
    Bytes bytes = OneRecordNode(NodeSize(), 6, 8);
    Put16(&bytes, 0, 30);  // would be the end of a record, and the next word its start
    Put16(&bytes, 2, 14);
    const int index = static_cast<int>(NodeSize() / 2 - 2);
    NodeKey key{};
    const LooseNode node(bytes, MapBlock());
    EXPECT_EQ(node->GetKey(node.Hdr(), index, &key), kErrCorrupt);
    EXPECT_EQ(capture_.Take(), (Events{Asserted(410), Reported(kReasonNode, kAnySite)}));
    Put16(&bytes, kDescNumRecords, 0xFFFF);
    const LooseNode crowded(bytes, MapBlock());
    EXPECT_EQ(crowded->GetKey(crowded.Hdr(), index, &key), kErrCorrupt);
    EXPECT_EQ(capture_.Take(), Events{Reported(kReasonNode, kAnySite)});
}

TEST_P(GetKeyTest, RecordZeroOfANodeWithoutRecordsIsAssertedAndDescribed) {
    Bytes bytes = OneRecordNode(NodeSize(), 6, 8);
    Put16(&bytes, 10, 0);
    const LooseNode node(bytes, MapBlock());
    EXPECT_EQ(GetKeyOf(node, 0).size, 16u);
    EXPECT_EQ(capture_.Take(), Events{Asserted(410)});
}

TEST_P(GetKeyTest, RefusesARecordThatEndsAtTheNodesEnd) {
    Bytes bytes = OneRecordNode(NodeSize(), 6, 2);
    PutSlot(&bytes, 1, NodeSize());
    const LooseNode node(bytes, MapBlock());
    NodeKey key{};
    EXPECT_EQ(node->GetKey(node.Hdr(), 0, &key), kErrCorrupt);
    EXPECT_EQ(capture_.All(), kRefused);
}

TEST_P(GetKeyTest, RefusesARecordThatStartsWhereItEnds) {
    Bytes bytes = OneRecordNode(NodeSize(), 6, 2);
    PutSlot(&bytes, 0, 24);
    PutSlot(&bytes, 1, 24);
    const LooseNode node(bytes, MapBlock());
    NodeKey key{};
    EXPECT_EQ(node->GetKey(node.Hdr(), 0, &key), kErrCorrupt);
    EXPECT_EQ(capture_.All(), kRefused);
}

TEST_P(GetKeyTest, RefusesARecordThatStartsAtTheNodesEnd) {
    Bytes bytes = OneRecordNode(NodeSize(), 6, 2);
    PutSlot(&bytes, 0, NodeSize());
    const LooseNode node(bytes, MapBlock());
    NodeKey key{};
    EXPECT_EQ(node->GetKey(node.Hdr(), 0, &key), kErrCorrupt);
    EXPECT_EQ(capture_.All(), kRefused);
}

TEST_P(GetKeyTest, RefusesAKeyThatLeavesNoData) {
    for (const u32 keyLength : {22u, 21u, 23u, 65532u, 65533u, 65535u}) {
        Bytes bytes = OneRecordNode(NodeSize(), 6, 16);  // 24 bytes
        Put16(&bytes, 14, keyLength);
        const LooseNode node(bytes, MapBlock());
        NodeKey key{};
        EXPECT_EQ(node->GetKey(node.Hdr(), 0, &key), kErrCorrupt) << keyLength;
        EXPECT_EQ(capture_.Take(), kRefused) << keyLength;
    }
}

TEST_P(GetKeyTest, AcceptsTheLongestKeyThatLeavesData) {
    Bytes bytes = OneRecordNode(NodeSize(), 6, 16);
    Put16(&bytes, 14, 20);
    const LooseNode node(bytes, MapBlock());
    EXPECT_EQ(GetKeyOf(node, 0).dataSize, 2u);
}

TEST_P(GetKeyTest, RecordsOfAMapNodeHaveNoKey) {
    Bytes bytes = OneRecordNode(NodeSize(), 6, 16, kBTMapNode);
    const LooseNode node(bytes, MapBlock());
    NodeKey key;
    std::memset(&key, 0x55, sizeof key);
    EXPECT_EQ(node->GetKey(node.Hdr(), 0, &key), kOk);
    EXPECT_EQ(key.offset, 14u);
    EXPECT_EQ(key.size, 24u);
    EXPECT_EQ(key.keySize, 0u);
    EXPECT_EQ(key.dataSize, 0u);
    EXPECT_EQ(key.dataFirstBytes, 0u);
    EXPECT_EQ(key.data, nullptr);
    EXPECT_EQ(key.dataNext1, nullptr);
    EXPECT_EQ(key.dataNext2, nullptr);
}

// A header node's record 2 with a first word that no key length could be.
Bytes HeaderLikeNode(u32 nodeSize) {
    Bytes bytes(nodeSize, 0xFF);
    bytes[8] = 1;
    Put16(&bytes, 10, 3);
    PutSlot(&bytes, 0, 14);
    PutSlot(&bytes, 1, 120);
    PutSlot(&bytes, 2, 248);
    PutSlot(&bytes, 3, nodeSize - 8);
    return bytes;
}

TEST_P(GetKeyTest, TheMapRecordOfNodeZeroHasNoKey) {
    const LooseNode node(HeaderLikeNode(NodeSize()), MapBlock(), 0);
    const NodeKey key = GetKeyOf(node, 2);
    EXPECT_EQ(key.offset, 248u);
    EXPECT_EQ(key.size, NodeSize() - 256);
    EXPECT_EQ(key.firstBytes, MapBlock() - 248);
    EXPECT_EQ(key.keySize, 0u);
    EXPECT_EQ(key.data, nullptr);
    EXPECT_EQ(capture_.All(), Events{});
}

TEST_P(GetKeyTest, RecordTwoOfAnotherNodeHasAKey) {
    const LooseNode node(HeaderLikeNode(NodeSize()), MapBlock(), 7);
    NodeKey key{};
    EXPECT_EQ(node->GetKey(node.Hdr(), 2, &key), kErrCorrupt);
    EXPECT_EQ(capture_.All(), kRefused);
}

INSTANTIATE_GEOMETRIES(GetKeyTest, AllGeometries);

// ---- GetKey over block ends

TEST(GetKeyBlocks, ReadsItsSlotFromTheNextBlock) {
    NodeImage image;
    for (u32 n = 0; n < 513; ++n) {
        image.records.push_back(Record(Bytes{0, 0}, Bytes{1, 2}));
    }
    const LooseNode node(image.Build(4096), 1024);
    const NodeKey key = GetKeyOf(node, 511);  // its slot at 3072, that of record 512 at 3070
    EXPECT_EQ(key.entryPos, 3072u);
    EXPECT_EQ(key.entry, node.At(3072));
    EXPECT_EQ(key.entryBytes, 1024u);
    EXPECT_EQ(key.offset, 14u + 511 * 4);
    EXPECT_EQ(key.size, 4u);
}

// A leaf of 512-byte blocks whose only record starts at 14 with 4 key bytes and data at `data`.
Bytes NodeWithDataAt(u32 nodeSize, u32 dataOffset, u32 dataSize, s8 kind = kBTLeafNode) {
    return OneRecordNode(nodeSize, dataOffset - 16, dataSize, kind);
}

TEST(GetKeyBlocks, DataThatEndsWithItsBlockHasNoNextBlock) {
    const LooseNode node(NodeWithDataAt(1024, 500, 12), 512);
    const NodeKey key = GetKeyOf(node, 0);
    EXPECT_EQ(key.dataFirstBytes, 12u);
    EXPECT_EQ(key.dataNext1, nullptr);
}

TEST(GetKeyBlocks, DataThatReachesIntoTheNextBlockNamesIt) {
    const LooseNode node(NodeWithDataAt(1024, 500, 14), 512);
    const NodeKey key = GetKeyOf(node, 0);
    EXPECT_EQ(key.data, node.At(500));
    EXPECT_EQ(key.dataFirstBytes, 12u);
    EXPECT_EQ(key.dataNext1, node.At(512));
    EXPECT_EQ(key.dataNext2, nullptr);
}

TEST(GetKeyBlocks, DataInThreeBlocksOf512IsAssertedOnce) {
    Capture capture;
    const LooseNode node(NodeWithDataAt(2048, 500, 12 + 512 + 2), 512);
    const NodeKey key = GetKeyOf(node, 0);
    EXPECT_EQ(key.dataNext1, node.At(512));
    EXPECT_EQ(key.dataNext2, node.At(1024));
    EXPECT_EQ(capture.All(), Events{Asserted(505)});
}

TEST(GetKeyBlocks, DataInThreeLargerBlocksIsAssertedTwice) {
    Capture capture;
    const LooseNode node(NodeWithDataAt(4096, 500, 524 + 1024 + 2), 1024);
    const NodeKey key = GetKeyOf(node, 0);
    EXPECT_EQ(key.dataNext1, node.At(1024));
    EXPECT_EQ(key.dataNext2, node.At(2048));
    EXPECT_EQ(capture.All(), (Events{Asserted(505), Asserted(506)}));
}

TEST(GetKeyBlocks, DataInFourBlocksIsRefused) {
    Capture capture;
    const LooseNode node(NodeWithDataAt(4096, 500, 12 + 1024 + 2), 512);
    NodeKey key{};
    EXPECT_EQ(node->GetKey(node.Hdr(), 0, &key), kErrCorrupt);
    EXPECT_EQ(capture.All(), kRefused);
}

TEST(GetKeyBlocks, AKeylessRecordMaySpanAllBlocks) {
    Capture capture;
    Bytes bytes(4096, 0xFF);
    bytes[8] = kBTMapNode;
    Put16(&bytes, 10, 1);
    PutSlot(&bytes, 0, 14);
    PutSlot(&bytes, 1, 4090);
    const LooseNode node(bytes, 512);
    EXPECT_EQ(GetKeyOf(node, 0).size, 4076u);
    EXPECT_EQ(capture.All(), Events{});
}

// A node size that is no whole number of blocks: the last slots lie in no block.
LooseNode NodeOfHalfABlockTooMuch(Bytes bytes) {
    bytes.resize(512);
    Put16(&bytes, 10, 200);
    return LooseNode(bytes, 512);
}

// Two blocks of a node, and two that lie behind its entries in memory.
TEST(GetKeyBlocks, NamesNoBlockBehindTheNodes) {
    Bytes bytes = OneRecordNode(2048, 6, 8);
    bytes.resize(4096);
    LooseNode node(bytes, 1024);
    node.header.nodeSize = 2048;
    node.header.blocksPerNode = 2;
    for (const bool isFree : {false, true}) {
        NodeKey key{};
        EXPECT_EQ(
            isFree ? node->GetFreeKey(node.Hdr(), 1, &key) : node->GetKey(node.Hdr(), 0, &key),
            kOk);
        EXPECT_EQ(key.next1, node->bufs[1].data);
        EXPECT_EQ(key.next2, nullptr);
    }
    NodePtr place{};
    EXPECT_EQ(node->GetPtr(node.Hdr(), 1024, &place), kOk);
    EXPECT_EQ(place.next1, nullptr);
}

TEST(GetKeyBlocks, RefusesASlotInABlockTheNodeDoesNotHave) {
    Capture capture;
    LooseNode node = NodeOfHalfABlockTooMuch(Bytes(512));
    node.header.nodeSize = 768;
    NodeKey key{};
    EXPECT_EQ(node->GetKey(node.Hdr(), 0, &key), kErrCorrupt);
    EXPECT_EQ(capture.All(), (Events{Asserted(422), Reported(kReasonNode, kAnySite)}));
}

TEST(GetKeyBlocks, RefusesItsOwnSlotInABlockTheNodeDoesNotHave) {
    Capture capture;
    LooseNode node = NodeOfHalfABlockTooMuch(Bytes(512));
    node.header.nodeSize = 768;
    NodeKey key{};
    // Slot 128 is at 510, the last of the only block; slot 127 is at 512.
    EXPECT_EQ(node->GetKey(node.Hdr(), 127, &key), kErrCorrupt);
    EXPECT_EQ(capture.All(), kRefused);
}

TEST(GetKeyBlocks, RefusesARecordInABlockTheNodeDoesNotHave) {
    Capture capture;
    Bytes bytes(512);
    Put16(&bytes, 400, 600);  // slot 183
    Put16(&bytes, 402, 520);  // slot 182
    LooseNode node = NodeOfHalfABlockTooMuch(bytes);
    node.header.nodeSize = 768;
    NodeKey key{};
    EXPECT_EQ(node->GetKey(node.Hdr(), 182, &key), kErrCorrupt);
    EXPECT_EQ(capture.All(), (Events{Asserted(461), Reported(kReasonNode, kAnySite)}));
}

// ---- GetFreeKey

class GetFreeKeyTest : public GeometryTest {
protected:
    Capture capture_;
};

TEST_P(GetFreeKeyTest, DescribesTheFreeSpaceAndLeavesKeyAndDataAlone) {
    const LooseNode node(OneRecordNode(NodeSize(), 6, 16), MapBlock());
    NodeKey key;
    std::memset(&key, 0x55, sizeof key);
    EXPECT_EQ(node->GetFreeKey(node.Hdr(), 1, &key), kOk);
    EXPECT_EQ(key.offset, 38u);
    EXPECT_EQ(key.ptr, node.At(38));
    EXPECT_EQ(key.firstBytes, MapBlock() - 38);
    EXPECT_EQ(key.next1, GetParam().Blocks() > 1 ? node.At(MapBlock()) : nullptr);
    EXPECT_EQ(key.next2, GetParam().Blocks() > 2 ? node.At(2 * MapBlock()) : nullptr);
    EXPECT_EQ(key.entryPos, NodeSize() - 4);
    EXPECT_EQ(key.entry, node.At(NodeSize() - 4));
    EXPECT_EQ(key.entryBytes, 4u);
    EXPECT_EQ(key.size, NodeSize() - 4 - 38);
    EXPECT_EQ(key.keySize, 0x55555555u);
    EXPECT_EQ(key.dataSize, 0x55555555u);
    EXPECT_EQ(key.dataFirstBytes, 0x55555555u);
    EXPECT_EQ(capture_.All(), Events{});
}

TEST_P(GetFreeKeyTest, OfAnEmptyNodeStartsBehindTheDescriptor) {
    const LooseNode node(NodeImage{}.Build(NodeSize()), MapBlock());
    NodeKey key{};
    EXPECT_EQ(node->GetFreeKey(node.Hdr(), 0, &key), kOk);
    EXPECT_EQ(key.offset, 14u);
    EXPECT_EQ(key.size, NodeSize() - 16);
}

TEST_P(GetFreeKeyTest, OfAFullNodeHasSizeZero) {
    Bytes bytes = OneRecordNode(NodeSize(), 6, 16);
    PutSlot(&bytes, 1, NodeSize() - 4);
    const LooseNode node(bytes, MapBlock());
    NodeKey key{};
    EXPECT_EQ(node->GetFreeKey(node.Hdr(), 1, &key), kOk);
    EXPECT_EQ(key.size, 0u);
    EXPECT_EQ(key.offset, NodeSize() - 4);
}

TEST_P(GetFreeKeyTest, AssertsAnIndexThatIsNotTheRecordCountAndGoesOn) {
    const LooseNode node(OneRecordNode(NodeSize(), 6, 16), MapBlock());
    NodeKey key{};
    EXPECT_EQ(node->GetFreeKey(node.Hdr(), 0, &key), kOk);
    EXPECT_EQ(key.offset, 14u);
    EXPECT_EQ(capture_.All(), Events{Asserted(588)});
}

TEST_P(GetFreeKeyTest, RefusesAnIndexWhoseSlotLiesOutsideTheNode) {
    Bytes bytes = OneRecordNode(NodeSize(), 6, 16);
    Put16(&bytes, 10, NodeSize() / 2 - 1);
    const LooseNode node(bytes, MapBlock());
    NodeKey key{};
    EXPECT_EQ(node->GetFreeKey(node.Hdr(), NodeSize() / 2 - 1, &key), kErrCorrupt);
    EXPECT_EQ(capture_.Take(), kRefused);
    EXPECT_EQ(node->GetFreeKey(node.Hdr(), 0x7FFFFFFFu, &key), kErrCorrupt);
    EXPECT_EQ(capture_.Take(), (Events{Asserted(588), kRefused[0]}));
    EXPECT_EQ(node->GetFreeKey(node.Hdr(), 0xFFFFFFFFu, &key), kErrCorrupt);
    EXPECT_EQ(capture_.Take(), (Events{Asserted(588), kRefused[0]}));
}

TEST_P(GetFreeKeyTest, RefusesAFreeOffsetBehindItsSlot) {
    for (const u32 offset : {NodeSize() - 3, NodeSize() - 1, NodeSize(), 65535u}) {
        Bytes bytes = OneRecordNode(NodeSize(), 6, 16);
        PutSlot(&bytes, 1, offset);
        const LooseNode node(bytes, MapBlock());
        NodeKey key{};
        EXPECT_EQ(node->GetFreeKey(node.Hdr(), 1, &key), kErrCorrupt) << offset;
        EXPECT_EQ(capture_.Take(), kRefused) << offset;
    }
}

INSTANTIATE_GEOMETRIES(GetFreeKeyTest, AllGeometries);

TEST(GetFreeKeyBlocks, RefusesASlotInABlockTheNodeDoesNotHave) {
    Capture capture;
    LooseNode node = NodeOfHalfABlockTooMuch(Bytes(512));
    node.header.nodeSize = 768;
    NodeKey key{};
    EXPECT_EQ(node->GetFreeKey(node.Hdr(), 0, &key), kErrCorrupt);
    EXPECT_EQ(capture.All(), (Events{Asserted(588), Asserted(598), kRefused[0]}));
}

}  // namespace
}  // namespace VELK::test
