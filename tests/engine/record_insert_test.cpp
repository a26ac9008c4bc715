// _InsertRecord and _InsertKeyRecord on loose nodes: bytes, marks, answers and refusals.
#include <memory>

#include "hfs/treehfs/bytes.h"
#include "node_bench.h"

namespace VELK::test {
namespace {

constexpr u32 kData = 16;

class RecordInsert : public NodeTest {
protected:
    // As many records as leave about a quarter of the node free.
    u32 Count() const { return NodeSize() / 4 * 3 / 40; }
    std::vector<Bytes> Records() const { return SomeRecords(Count(), kData); }
    Bytes Leaf() const { return LeafOf(NodeSize(), Records()); }
    u32 FreeBytes() const { return NodeSize() - 14 - UsedBytes(Records()); }

    int Insert(LooseNode* node, int index, const HostKey& key, const Bytes& data,
               bool* inserted = nullptr) {
        return tree_._InsertKeyRecord(node->Get(), index, key.Get(), 0, data.data(),
                                      static_cast<unsigned>(data.size()), &tree_.convert, inserted);
    }
    // The same from disk form.
    int InsertRaw(LooseNode* node, int index, const Bytes& key, const Bytes& data, u32 keyLen = 0) {
        return tree_._InsertKeyRecord(node->Get(), index,
                                      reinterpret_cast<const BTreeKey*>(key.data()), keyLen,
                                      data.data(), static_cast<unsigned>(data.size()), nullptr);
    }
};

TEST_P(RecordInsert, MinusOneAppendsToAnEmptyNode) {
    const auto node = bench_.Node(LeafOf(NodeSize(), {}));
    NodeKey key{};
    bool inserted = false;
    EXPECT_EQ(tree_._InsertRecord(node->Get(), -1, 20, &key, &inserted), kOk);
    EXPECT_TRUE(inserted);
    EXPECT_EQ(key.offset, 14u);
    EXPECT_EQ(key.ptr, node->At(14));
    EXPECT_EQ(key.firstBytes, MapBlock() - 14);
    const Bytes content = node->Content();
    EXPECT_EQ(Get16(content, 10), 1u);
    EXPECT_EQ(Get16(content, NodeSize() - 2), 14u);
    EXPECT_EQ(Get16(content, NodeSize() - 4), 34u);
}

// Nodes of records without keys are changed by the long way.
TEST_P(RecordInsert, ANodeChangedOnceMoreIsTheLastToHandOver) {
    for (const s8 kind : {kBTLeafNode, kBTIndexNode, kBTMapNode}) {
        NodeImage image;
        image.kind = kind;
        image.records = SomeRecords(2, kChildSize);
        const auto node = bench_.Node(image.Build(NodeSize()), 1);
        const auto other = bench_.Node(Leaf(), 2);
        ASSERT_EQ(tree_.SetDirty(node->Get(), 0, NodeSize()), kOk);
        ASSERT_EQ(tree_.SetDirty(other->Get(), 0), kOk);
        NodeKey key{};
        EXPECT_EQ(tree_._InsertRecord(node->Get(), 1, 8, &key, nullptr), kOk);
        EXPECT_EQ(key.offset, 14u + image.records[0].size());
        EXPECT_EQ(tree_.modifiedList.next, &other->Get()->modifiedLink);
        EXPECT_EQ(tree_.modifiedList.prev, &node->Get()->modifiedLink);
        node->Get()->modifiedLink.Unlink();
        other->Get()->modifiedLink.Unlink();
    }
}

TEST_P(RecordInsert, RecordOfExactlyTheFreeSpaceFits) {
    const auto node = bench_.Node(Leaf());
    NodeKey key{};
    bool inserted = false;
    EXPECT_EQ(tree_._InsertRecord(node->Get(), -1, FreeBytes() - 2, &key, &inserted), kOk);
    EXPECT_TRUE(inserted);
    unsigned freeBytes = 1;
    EXPECT_EQ((*node)->GetNodeFreeSize(node->Hdr(), &freeBytes), kOk);
    EXPECT_EQ(freeBytes, 0u);
}

TEST_P(RecordInsert, RecordOneSlotTooLongChangesNothing) {
    for (const u32 size : {FreeBytes(), NodeSize(), 0xFFFFFFF0u, 0xFFFFFFFEu}) {
        const auto node = bench_.Node(Leaf());
        NodeKey key{};
        bool inserted = true;
        EXPECT_EQ(tree_._InsertRecord(node->Get(), 0, size, &key, &inserted), kOk);
        EXPECT_FALSE(inserted) << size;
        EXPECT_EQ(node->Content(), Leaf());
        EXPECT_TRUE(DirtyBlocks(*node).empty());
    }
    EXPECT_TRUE(bench_.capture.All().empty());
}

TEST_P(RecordInsert, NoRoomIsAnErrorForCallersThatDoNotAsk) {
    const auto node = bench_.Node(Leaf());
    NodeKey key{};
    EXPECT_EQ(tree_._InsertRecord(node->Get(), 0, FreeBytes(), &key, nullptr), kErrInvalid);
    EXPECT_EQ(bench_.capture.All(), Events{Reported(kReasonInvalid, 1183)});
    EXPECT_EQ(node->Content(), Leaf());
}

TEST_P(RecordInsert, EveryIndexGivesTheNodeBuiltWithTheRecord) {
    for (u32 index = 0; index <= Count(); ++index) {
        const auto node = bench_.Node(Leaf());
        const u32 before = index == 0 ? 0 : index - 1;
        ASSERT_EQ(Insert(node.get(), static_cast<int>(index),
                         NthHostKey(kCatalogFileId, before, true), Pattern(kData, 77)),
                  kOk);
        std::vector<Bytes> records = Records();
        records.insert(records.begin() + index,
                       Record(NthDiskKey(kCatalogFileId, before, true), Pattern(kData, 77)));
        ASSERT_EQ(node->Content(), LeafOf(NodeSize(), records)) << index;
    }
    EXPECT_TRUE(bench_.capture.All().empty());
}

TEST_P(RecordInsert, SlotsAboveTheIndexGrowAndItsOwnStays) {
    const auto node = bench_.Node(Leaf());
    NodeKey key{};
    ASSERT_EQ(tree_._InsertRecord(node->Get(), 2, 12, &key, nullptr), kOk);
    const Bytes before = Leaf();
    const Bytes after = node->Content();
    for (u32 slot = 0; slot <= Count(); ++slot) {
        const u32 old = Get16(before, NodeSize() - 2 * (slot + 1));
        const u32 now = slot > 2 ? slot + 1 : slot;
        EXPECT_EQ(Get16(after, NodeSize() - 2 * (now + 1)), old + (slot > 2 ? 12 : 0)) << slot;
    }
    const u32 start = Get16(before, NodeSize() - 6);
    EXPECT_EQ(key.offset, start);
    EXPECT_EQ(Get16(after, NodeSize() - 8), start + 12);
}

TEST_P(RecordInsert, OnlyTouchedBlocksAreMarked) {
    const auto node = bench_.Node(Leaf());
    ASSERT_EQ(Insert(node.get(), static_cast<int>(Count()), NthHostKey(kCatalogFileId, Count()),
                     Pattern(kData, 1)),
              kOk);
    const u32 start = NodeSize() - 2 * (Count() + 1) - FreeBytes();
    std::vector<u32> expected;
    for (u32 block = 0; block < GetParam().Blocks(); ++block) {
        const bool hasRecord = block >= start / MapBlock() &&
                               block <= (start + NthRecord(Count(), kData).size() - 1) / MapBlock();
        const bool hasSlot = block == (NodeSize() - 2 * (Count() + 2)) / MapBlock();
        if (block == 0 || hasRecord || hasSlot) {
            expected.push_back(block);
        }
    }
    EXPECT_EQ(DirtyBlocks(*node), expected);
}

TEST_P(RecordInsert, IndexBehindTheCountIsRefused) {
    for (const int index : {static_cast<int>(Count()) + 1, 0x7FFFFFFF, -2, -70000}) {
        const auto node = bench_.Node(Leaf());
        NodeKey key{};
        bool inserted = false;
        EXPECT_EQ(tree_._InsertRecord(node->Get(), index, 8, &key, &inserted), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), (Events{Asserted(1170), Reported(kReasonNode, 9202)}));
        EXPECT_EQ(node->Content(), Leaf());
    }
}

TEST_P(RecordInsert, FreeSpaceThatStartsInTheDescriptorIsRefused) {
    for (const u32 start : {0u, 12u, 13u, 15u}) {
        Bytes content = LeafOf(NodeSize(), {});
        Put16(&content, NodeSize() - 2, start);
        const auto node = bench_.Node(content);
        NodeKey key{};
        EXPECT_EQ(tree_._InsertRecord(node->Get(), -1, 8, &key, nullptr), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 9202)});
        EXPECT_EQ(node->Content(), content);
        EXPECT_TRUE(DirtyBlocks(*node).empty());
    }
}

TEST_P(RecordInsert, SizesThatWouldBreakTheSlotsAreRefused) {
    for (const u32 size : {0u, 1u, 7u}) {
        const auto node = bench_.Node(Leaf());
        NodeKey key{};
        EXPECT_EQ(tree_._InsertRecord(node->Get(), -1, size, &key, nullptr), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 9202)});
        EXPECT_EQ(node->Content(), Leaf());
    }
}

TEST_P(RecordInsert, FreeSpaceBehindItsSlotIsReportedByItsAccessor) {
    Bytes content = Leaf();
    Put16(&content, NodeSize() - 2 * (Count() + 1), NodeSize() - 2);
    const auto node = bench_.Node(content);
    NodeKey key{};
    EXPECT_EQ(tree_._InsertRecord(node->Get(), 0, 8, &key, nullptr), kErrCorrupt);
    EXPECT_EQ(bench_.capture.All(),
              (Events{Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 1174)}));
}

TEST_P(RecordInsert, RecordWithoutDataIsReportedByItsAccessor) {
    Bytes content = Leaf();
    Put16(&content, 14, 0x7000);                  // key length of record 0
    for (const bool wasMarked : {false, true}) {  // takes a shorter way where it was
        const auto node = bench_.Node(content);
        ASSERT_EQ(wasMarked ? tree_.SetDirty(node->Get(), 0, NodeSize()) : kOk, kOk);
        NodeKey key{};
        EXPECT_EQ(tree_._InsertRecord(node->Get(), 0, 8, &key, nullptr), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(),
                  (Events{Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 1203)}));
        EXPECT_EQ(node->Content(), content);
    }
}

// A map node's records have no key: what looks like its length is part of the map.
TEST_P(RecordInsert, RecordsWithoutKeyMoveWhateverTheyBeginWith) {
    Bytes content = Leaf();
    content[8] = 2;
    Put16(&content, 14, 0x7000);
    for (const bool wasMarked : {false, true}) {
        const auto node = bench_.Node(content);
        ASSERT_EQ(wasMarked ? tree_.SetDirty(node->Get(), 0, NodeSize()) : kOk, kOk);
        NodeKey key{};
        ASSERT_EQ(tree_._InsertRecord(node->Get(), 0, 8, &key, nullptr), kOk);
        EXPECT_EQ(bench_.capture.Take(), Events{});
        EXPECT_EQ(key.offset, 14u);
        const Bytes result = node->Content();
        EXPECT_EQ(Get16(result, 10), Count() + 1);
        EXPECT_EQ(Get16(result, NodeSize() - 4), 22u);
        EXPECT_EQ(Get16(result, 22), 0x7000u);
    }
}

TEST_P(RecordInsert, RecordOutsideTheRecordAreaIsRefused) {
    const u32 freeStart = Get16(Leaf(), NodeSize() - 2 * (Count() + 1));
    struct Slots {
        u32 start;
        u32 end;
    };
    for (const Slots& bad :
         {Slots{0, 60}, Slots{12, 60}, Slots{15, 60}, Slots{14, 61},
          Slots{freeStart - 20, freeStart + 2}, Slots{freeStart, freeStart + 60}}) {
        Bytes content = Leaf();
        Put16(&content, NodeSize() - 2, bad.start);
        Put16(&content, NodeSize() - 4, bad.end);
        Put16(&content, bad.start, 6);  // a short key, so that its accessor is content
        for (const bool wasMarked : {false, true}) {  // takes a shorter way where it was
            const auto node = bench_.Node(content);
            ASSERT_EQ(wasMarked ? tree_.SetDirty(node->Get(), 0, NodeSize()) : kOk, kOk);
            NodeKey key{};
            EXPECT_EQ(tree_._InsertRecord(node->Get(), 0, 8, &key, nullptr), kErrCorrupt);
            EXPECT_EQ(bench_.capture.Of(Event::Kind::kReport).back(), Reported(kReasonNode, 9200))
                << bad.start << ' ' << bad.end;
            EXPECT_EQ(node->Content(), content);
            EXPECT_EQ(DirtyBlocks(*node).empty(), !wasMarked);
            bench_.capture.Take();
        }
    }
}

TEST_P(RecordInsert, RefusedAccessToTheRecordIsReported) {
    struct Case {
        int index;
        int site;
    };
    for (const Case& place : {Case{-1, 1257}, Case{0, 1214}}) {
        const auto node = bench_.Node(Leaf());
        bench_.RefuseAccess(1);
        NodeKey key{};
        EXPECT_EQ(tree_._InsertRecord(node->Get(), place.index, 8, &key, nullptr), kRefused);
        EXPECT_EQ(bench_.capture.Take(),
                  (Events{Reported(kRefused, kAnySite), Reported(kRefused, place.site)}));
        EXPECT_EQ(node->Content(), Leaf());
    }
}

TEST_P(RecordInsert, OddKeyGetsAZeroPadByte) {
    Bytes content = LeafOf(NodeSize(), {});
    for (u32 i = 14; i < 64; ++i) {
        content[i] = 0xEE;
    }
    const auto node = bench_.Node(content);
    ASSERT_EQ(InsertRaw(node.get(), 0, {0, 3, 0x11, 0x22, 0x33}, {0x44, 0x55}), kOk);
    const Bytes stored = node->Content();
    EXPECT_EQ(Bytes(stored.begin() + 14, stored.begin() + 24),
              (Bytes{0, 3, 0x11, 0x22, 0x33, 0, 0x44, 0x55, 0xEE, 0xEE}));
    EXPECT_EQ(Get16(stored, NodeSize() - 4), 22u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(RecordInsert, EvenKeyGetsNoPadByte) {
    const auto node = bench_.Node(LeafOf(NodeSize(), {}));
    ASSERT_EQ(InsertRaw(node.get(), 0, {0, 2, 0x11, 0x22}, {0x44, 0x55}), kOk);
    const Bytes stored = node->Content();
    EXPECT_EQ(Bytes(stored.begin() + 14, stored.begin() + 22),
              (Bytes{0, 2, 0x11, 0x22, 0x44, 0x55, 0, 0}));
    EXPECT_EQ(Get16(stored, NodeSize() - 4), 20u);
}

TEST_P(RecordInsert, RecordedLengthReplacesTheKeysOwn) {
    const auto node = bench_.Node(LeafOf(NodeSize(), {}));
    ASSERT_EQ(InsertRaw(node.get(), 0, {0, 3, 0x11, 0x22, 0x33}, {0x44, 0x55}, 10), kOk);
    const Bytes stored = node->Content();
    EXPECT_EQ(Bytes(stored.begin() + 14, stored.begin() + 22),
              (Bytes{0, 10, 0x11, 0x22, 0x33, 0, 0x44, 0x55}));
    EXPECT_EQ(Get16(stored, NodeSize() - 4), 22u);  // the space follows the key's own length
    EXPECT_TRUE(bench_.capture.All().empty());
}

TEST_P(RecordInsert, RecordedLengthBelowTheKeysOwnIsAsserted) {
    const auto node = bench_.Node(LeafOf(NodeSize(), {}));
    ASSERT_EQ(InsertRaw(node.get(), 0, {0, 4, 1, 2, 3, 4}, {5, 6}, 2), kOk);
    EXPECT_EQ(bench_.capture.All(), Events{Asserted(1359)});
    EXPECT_EQ(Get16(node->Content(), 14), 2u);
}

TEST_P(RecordInsert, KeyLongerThanAnyIsAsserted) {
    const auto node = bench_.Node(LeafOf(NodeSize(), {}));
    ASSERT_EQ(InsertRaw(node.get(), 0, {0, 2, 1, 2}, {5, 6}, 521), kOk);
    EXPECT_EQ(bench_.capture.All(), Events{Asserted(1362)});
}

TEST_P(RecordInsert, OddDataIsPaddedAndReadExactly) {
    const auto node = bench_.Node(LeafOf(NodeSize(), {}));
    const HostKey key = NthHostKey(kCatalogFileId, 1);
    const std::unique_ptr<u8[]> data(new u8[3]{7, 8, 9});  // one byte more would be seen
    ASSERT_EQ(tree_._InsertKeyRecord(node->Get(), 0, key.Get(), 0, data.get(), 3, &tree_.convert),
              kOk);
    EXPECT_EQ(node->Content(),
              LeafOf(NodeSize(), {Record(NthDiskKey(kCatalogFileId, 1), Bytes{7, 8, 9, 0})}));
}

TEST_P(RecordInsert, RecordWithoutDataIsRefused) {
    const auto node = bench_.Node(Leaf());
    bool inserted = false;
    EXPECT_EQ(Insert(node.get(), 0, NthHostKey(kCatalogFileId, 1), {}, &inserted), kErrInvalid);
    EXPECT_EQ(bench_.capture.All(), Events{Reported(kReasonInvalid, 9203)});
    EXPECT_EQ(node->Content(), Leaf());
}

TEST_P(RecordInsert, KeyRecordThatDoesNotFitSaysSo) {
    const auto node = bench_.Node(Leaf());
    bool inserted = true;
    EXPECT_EQ(Insert(node.get(), 0, NthHostKey(kCatalogFileId, 1), Bytes(FreeBytes()), &inserted),
              kOk);
    EXPECT_FALSE(inserted);
    EXPECT_EQ(node->Content(), Leaf());
    EXPECT_EQ(Insert(node.get(), 0, NthHostKey(kCatalogFileId, 1), Bytes(FreeBytes())),
              kErrInvalid);
    EXPECT_EQ(bench_.capture.All(),
              (Events{Reported(kReasonInvalid, 1183), Reported(kErrInvalid, 1370)}));
}

TEST_P(RecordInsert, DataOfFourGibibytesDoesNotFit) {
    const auto node = bench_.Node(Leaf());
    const HostKey key = NthHostKey(kCatalogFileId, 1);
    bool inserted = true;
    EXPECT_EQ(tree_._InsertKeyRecord(node->Get(), 0, key.Get(), 0, key.bytes, 0xFFFFFFFFu,
                                     &tree_.convert, &inserted),
              kOk);
    EXPECT_FALSE(inserted);
    EXPECT_EQ(node->Content(), Leaf());
}

TEST_P(RecordInsert, HookWithoutFunctionsCopies) {
    const auto node = bench_.Node(LeafOf(NodeSize(), {}));
    tree_.convert = {};
    const HostKey key = NthHostKey(kCatalogFileId, 3);
    const u32 size = GetHost16(key.bytes) + 2;
    ASSERT_EQ(Insert(node.get(), 0, key, Pattern(8, 1)), kOk);
    const Bytes stored = node->Content();
    EXPECT_EQ(Bytes(stored.begin() + 14, stored.begin() + 14 + size),
              Bytes(key.bytes, key.bytes + size));
}

INSTANTIATE_GEOMETRIES(RecordInsert, ChangeGeometries);

// The longest catalog key with data longer than half a node, at every place around the block ends:
// stored as in a node of one block, converted or not.
class StraddlingInsert : public NodeTest {
protected:
    void InsertBehind(u32 fillerSize, u32 dataSize, HfsConvert* hook) {
        const std::u16string name(255, u'n');
        const Bytes diskKey = DiskCatKey(77, name);
        const HostKey hostKey = HostCatKey(77, name);
        const Bytes data = Pattern(dataSize, 5);
        const Bytes filler = Record(DiskCatKey(1, u"f"), Pattern(fillerSize, 9));
        const auto node = bench_.Node(LeafOf(NodeSize(), {filler}));
        const BTreeKey* key =
            hook != nullptr ? hostKey.Get() : reinterpret_cast<const BTreeKey*>(diskKey.data());
        ASSERT_EQ(tree_._InsertKeyRecord(node->Get(), -1, key, 0, data.data(), dataSize, hook),
                  kOk);
        ASSERT_EQ(node->Content(), LeafOf(NodeSize(), {filler, Record(diskKey, data)}))
            << fillerSize;
    }
};

TEST_P(StraddlingInsert, EveryStartAroundTheBlockEnds) {
    const u32 room = NodeSize() - 14 - 6 - 518 - 10;
    for (u32 filler = 2; filler < room - 100; filler += filler % 512 < 40 ? 2u : 62u) {
        InsertBehind(filler, 90, &tree_.convert);
        InsertBehind(filler, 90, nullptr);
        if (HasFatalFailure()) {
            return;
        }
    }
}

TEST_P(StraddlingInsert, DataLongerThanHalfANode) {
    InsertBehind(2, NodeSize() / 2 + 62, &tree_.convert);
    InsertBehind(100, NodeSize() - 14 - 6 - 518 - 10 - 100, &tree_.convert);
}

std::vector<Geometry> LargeGeometries() {
    return {{4096, 4096}, {4096, 1024}, {4096, 512}, {8192, 4096}, {8192, 512}};
}
INSTANTIATE_GEOMETRIES(StraddlingInsert, LargeGeometries);

class ManyBlocksInsert : public ManyBlocksTest {};

TEST_F(ManyBlocksInsert, InsertionShiftsSlotsInBothBlocks) {
    for (const u32 index : {0u, 1u, 253u, 254u, 255u, 256u, 299u, 300u}) {
        const auto node = bench_.Node(LeafOf(4096, Tiny(300)));
        const Bytes key = {0, 4, 9, 9, 9, 9};
        const Bytes data = {1, 2};
        ASSERT_EQ(bench_.tree._InsertKeyRecord(node->Get(), static_cast<int>(index),
                                               reinterpret_cast<const BTreeKey*>(key.data()), 0,
                                               data.data(), 2, nullptr),
                  kOk);
        std::vector<Bytes> records = Tiny(300);
        records.insert(records.begin() + index, Bytes{0, 4, 9, 9, 9, 9, 1, 2});
        ASSERT_EQ(node->Content(), LeafOf(4096, records)) << index;
    }
    EXPECT_TRUE(bench_.capture.All().empty());
}

TEST_F(ManyBlocksInsert, BlocksWithoutAChangedSlotStayClean) {
    const auto node = bench_.Node(LeafOf(4096, Tiny(300)));
    NodeKey key{};
    ASSERT_EQ(bench_.tree._InsertRecord(node->Get(), 256, 8, &key, nullptr), kOk);
    EXPECT_FALSE((*node)->bufs[7].dirty);
    EXPECT_TRUE((*node)->bufs[6].dirty);
}

TEST_F(ManyBlocksInsert, RefusedAccessToTheNextBlockOfSlotsIsReported) {
    const auto node = bench_.Node(LeafOf(4096, Tiny(300)));
    bench_.RefuseAccess(6);  // four blocks of records, one of slots, then this one
    NodeKey key{};
    EXPECT_EQ(bench_.tree._InsertRecord(node->Get(), 0, 8, &key, nullptr), kRefused);
    EXPECT_EQ(bench_.capture.All(),
              (Events{Reported(kRefused, kAnySite), Reported(kRefused, 1284)}));
}

TEST_F(ManyBlocksInsert, RefusedAccessToTheSlotsOrTheDescriptorIsReported) {
    for (const auto& [nth, site] : {std::pair{2u, 1268}, std::pair{3u, 1295}}) {
        const auto node = bench_.Node(LeafOf(4096, SomeRecords(2, 512)));
        bench_.RefuseAccess(nth);
        NodeKey key{};
        EXPECT_EQ(bench_.tree._InsertRecord(node->Get(), -1, 8, &key, nullptr), kRefused);
        EXPECT_EQ(bench_.capture.Take(),
                  (Events{Reported(kRefused, kAnySite), Reported(kRefused, site)}));
    }
}

TEST_F(ManyBlocksInsert, NoScratchBufferNoConversion) {
    const Bytes leaf = LeafOf(4096, SomeRecords(3, 16));
    const auto node = bench_.Node(leaf);
    bench_.heap.FailNth(1);
    const HostKey key = NthHostKey(kCatalogFileId, 1);
    const Bytes data = Pattern(8, 1);
    EXPECT_EQ(bench_.tree._InsertKeyRecord(node->Get(), 0, key.Get(), 0, data.data(), 8,
                                           &bench_.tree.convert),
              kErrNoMemory);
    EXPECT_EQ(bench_.capture.All(), Events{Reported(kErrNoMemory, 9204)});
    EXPECT_EQ(node->Content(), leaf);
}

}  // namespace
}  // namespace VELK::test
