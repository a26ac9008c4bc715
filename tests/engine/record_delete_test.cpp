// _DeleteRecord and the moves of one record between two loose nodes.
#include "hfs/treehfs/bytes.h"
#include "node_bench.h"

namespace VELK::test {
namespace {

constexpr u32 kData = 16;

class RecordDelete : public NodeTest {
protected:
    u32 Count() const { return NodeSize() / 2 / 40; }
    std::vector<Bytes> Records() const { return SomeRecords(Count(), kData); }
    Bytes Leaf() const { return LeafOf(NodeSize(), Records()); }
    u32 SlotAt(u32 index) const { return NodeSize() - 2 * (index + 1); }

    // A node built of `records` whose free space still holds what `before` had there.
    Bytes WithStale(const std::vector<Bytes>& records, const Bytes& before, u32 freeBefore) const {
        Bytes node = LeafOf(NodeSize(), records);
        const u32 freeNow = Get16(node, SlotAt(static_cast<u32>(records.size())));
        for (u32 i = freeNow; i < freeBefore; ++i) {
            node[i] = before[i];
        }
        return node;
    }
};

TEST_P(RecordDelete, TheOnlyRecordLeavesAnEmptyNode) {
    const auto node = bench_.Node(LeafOf(NodeSize(), SomeRecords(1, kData)));
    EXPECT_EQ(tree_._DeleteRecord(node->Get(), 0), kOk);
    const Bytes content = node->Content();
    EXPECT_EQ(Get16(content, 10), 0u);
    EXPECT_EQ(Get16(content, NodeSize() - 2), 14u);
    EXPECT_EQ(Get16(content, NodeSize() - 4), 0u);
}

TEST_P(RecordDelete, TheLastRecordGoesWithoutMovingBytes) {
    const auto node = bench_.Node(Leaf());
    EXPECT_EQ(tree_._DeleteRecord(node->Get(), -1), kOk);
    Bytes expected = Leaf();
    Put16(&expected, 10, Count() - 1);
    Put16(&expected, SlotAt(Count()), 0);
    EXPECT_EQ(node->Content(), expected);
}

TEST_P(RecordDelete, EveryIndexClosesItsGap) {
    const u32 freeBefore = Get16(Leaf(), SlotAt(Count()));
    for (u32 index = 0; index < Count(); ++index) {
        const auto node = bench_.Node(Leaf());
        ASSERT_EQ(tree_._DeleteRecord(node->Get(), static_cast<int>(index)), kOk);
        std::vector<Bytes> records = Records();
        records.erase(records.begin() + index);
        ASSERT_EQ(node->Content(), WithStale(records, Leaf(), freeBefore)) << index;
    }
    EXPECT_TRUE(bench_.capture.All().empty());
}

TEST_P(RecordDelete, IndexOutOfRangeIsAssertedAndRefused) {
    for (const int index : {static_cast<int>(Count()), 0x7FFFFFFF, -2}) {
        const auto node = bench_.Node(Leaf());
        EXPECT_EQ(tree_._DeleteRecord(node->Get(), index), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), (Events{Asserted(943), Reported(kReasonNode, 9210)}));
        EXPECT_EQ(node->Content(), Leaf());
    }
}

TEST_P(RecordDelete, EmptyNodeHasNothingToDelete) {
    for (const int index : {-1, 0}) {
        const auto node = bench_.Node(LeafOf(NodeSize(), {}));
        EXPECT_EQ(tree_._DeleteRecord(node->Get(), index), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), (Events{Asserted(943), Reported(kReasonNode, 9210)}));
        EXPECT_EQ(node->Content(), LeafOf(NodeSize(), {}));
    }
}

TEST_P(RecordDelete, SlotsThatLieAreRefusedBeforeAnyChange) {
    const u32 start = Get16(Leaf(), SlotAt(1));
    const u32 end = Get16(Leaf(), SlotAt(2));
    const u32 freeStart = Get16(Leaf(), SlotAt(Count()));
    struct Lie {
        u32 slot;
        u32 value;
    };
    for (const Lie& lie : {Lie{1, 0}, Lie{1, 12}, Lie{1, start + 1}, Lie{1, end}, Lie{1, end + 2},
                           Lie{1, 0xFFFF}, Lie{2, start}, Lie{2, end + 1}, Lie{2, freeStart + 2},
                           Lie{2, 0xFFFE}, Lie{Count(), end - 2}, Lie{Count(), freeStart + 1},
                           Lie{Count(), SlotAt(Count()) + 2}, Lie{Count(), 0}}) {
        Bytes content = Leaf();
        Put16(&content, SlotAt(lie.slot), lie.value);
        const auto node = bench_.Node(content);
        EXPECT_EQ(tree_._DeleteRecord(node->Get(), 1), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 9210)})
            << lie.slot << ' ' << lie.value;
        EXPECT_EQ(node->Content(), content);
        EXPECT_TRUE(DirtyBlocks(*node).empty());
    }
}

TEST_P(RecordDelete, CountsThatLeaveNoRoomForRecordsAreRefused) {
    for (const u32 count : {(NodeSize() - 16) / 2 + 1, NodeSize() / 2, 0xFFFFu}) {
        Bytes content = Leaf();
        Put16(&content, 10, count);
        const auto node = bench_.Node(content);
        EXPECT_EQ(tree_._DeleteRecord(node->Get(), -1), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 9210)});
        EXPECT_EQ(node->Content(), content);
    }
}

TEST_P(RecordDelete, SlotBelowTheDeletedBytesIsAsserted) {
    Bytes content = Leaf();
    Put16(&content, SlotAt(3), 2);
    const auto node = bench_.Node(content);
    EXPECT_EQ(tree_._DeleteRecord(node->Get(), 0), kOk);
    EXPECT_EQ(bench_.capture.All(), Events{Asserted(1082)});
}

TEST_P(RecordDelete, FirstRefusedAccessIsReported) {
    const auto node = bench_.Node(Leaf());
    bench_.RefuseAccess(1);
    EXPECT_EQ(tree_._DeleteRecord(node->Get(), 0), kRefused);
    EXPECT_EQ(bench_.capture.All(),
              (Events{Reported(kRefused, kAnySite), Reported(kRefused, 962)}));
    EXPECT_EQ(node->Content(), Leaf());
}

INSTANTIATE_GEOMETRIES(RecordDelete, ChangeGeometries);

class ManyBlocksDelete : public ManyBlocksTest {};

TEST_F(ManyBlocksDelete, SlotsShiftInBothBlocks) {
    for (const u32 index : {0u, 1u, 253u, 254u, 255u, 256u, 298u, 299u}) {
        const auto node = bench_.Node(LeafOf(4096, Tiny(300)));
        ASSERT_EQ(bench_.tree._DeleteRecord(node->Get(), static_cast<int>(index)), kOk);
        std::vector<Bytes> records = Tiny(300);
        records.erase(records.begin() + index);
        Bytes expected = LeafOf(4096, records);
        const Bytes before = LeafOf(4096, Tiny(300));
        for (u32 i = 14 + 299 * 6; i < 14 + 300 * 6; ++i) {
            expected[i] = before[i];
        }
        ASSERT_EQ(node->Content(), expected) << index;
        EXPECT_EQ((*node)->bufs[7].dirty, index < 255) << index;
    }
}

// With 256 records the free-space slot is the last one of its block.
TEST_F(ManyBlocksDelete, FreeSpaceSlotAtTheEndOfItsBlock) {
    for (const u32 index : {0u, 254u, 255u}) {
        const auto node = bench_.Node(LeafOf(4096, Tiny(256)));
        ASSERT_EQ(bench_.tree._DeleteRecord(node->Get(), static_cast<int>(index)), kOk);
        EXPECT_EQ(Get16(node->Content(), 4096 - 2 * 257), 0u);
        EXPECT_EQ(Get16(node->Content(), 4096 - 2 * 256), 14u + 255 * 6);
        EXPECT_EQ((*node)->bufs[7].dirty, index < 255) << index;
    }
}

TEST_F(ManyBlocksDelete, RefusedAccessesAreReportedByTheirLines) {
    struct Case {
        u32 nth;
        int site;
    };
    // Slots, five blocks of records of which the first holds the descriptor, second slot block.
    for (const Case& refused : {Case{1, 962}, Case{2, 1011}, Case{6, 1074}}) {
        const auto node = bench_.Node(LeafOf(4096, Tiny(300)));
        bench_.RefuseAccess(refused.nth);
        EXPECT_EQ(bench_.tree._DeleteRecord(node->Get(), 0), kRefused);
        EXPECT_EQ(bench_.capture.Take(),
                  (Events{Reported(kRefused, kAnySite), Reported(kRefused, refused.site)}))
            << refused.nth;
    }
    const auto node = bench_.Node(LeafOf(4096, Tiny(300)));
    bench_.RefuseAccess(3);  // the record lies outside the descriptor's block
    EXPECT_EQ(bench_.tree._DeleteRecord(node->Get(), 299), kRefused);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kRefused, kAnySite), Reported(kRefused, 1054)}));
}

class RecordMove : public NodeTest {
protected:
    u32 Count() const { return NodeSize() / 3 / 40; }
    Bytes LeafFrom(u32 first, u32 count) const {
        return LeafOf(NodeSize(), SomeRecords(count, kData, first));
    }
};

TEST_P(RecordMove, LeftTakesTheFirstRecordOfRight) {
    const auto left = bench_.Node(LeafFrom(0, Count()), 1);
    const auto right = bench_.Node(LeafFrom(Count(), Count()), 2);
    EXPECT_EQ(tree_._RotateRecordLeft(left->Get(), right->Get()), kOk);
    EXPECT_EQ(left->Content(), LeafFrom(0, Count() + 1));
    const Bytes shorter = LeafFrom(Count() + 1, Count() - 1);
    const Bytes content = right->Content();
    const u32 used = Get16(shorter, NodeSize() - 2 * Count());
    EXPECT_EQ(Bytes(content.begin(), content.begin() + used),
              Bytes(shorter.begin(), shorter.begin() + used));
    EXPECT_EQ(Bytes(content.end() - 2 * (Count() + 1), content.end()),
              Bytes(shorter.end() - 2 * (Count() + 1), shorter.end()));
}

TEST_P(RecordMove, RightTakesTheLastRecordOfLeft) {
    const auto left = bench_.Node(LeafFrom(0, Count()), 1);
    const auto right = bench_.Node(LeafFrom(Count(), Count()), 2);
    EXPECT_EQ(tree_._RotateRecordRight(right->Get(), left->Get()), kOk);
    EXPECT_EQ(right->Content(), LeafFrom(Count() - 1, Count() + 1));
    EXPECT_EQ(Get16(left->Content(), 10), Count() - 1);
}

TEST_P(RecordMove, NoRoomLeavesBothUnchanged) {
    const u32 filler = NodeSize() - 14 - 2 - 2 - 16 - 10;
    const Bytes full = LeafOf(NodeSize(), {Record(DiskCatKey(1, u"full"), Pattern(filler, 1))});
    const Bytes other = LeafFrom(5, 3);
    const auto left = bench_.Node(full, 1);
    const auto right = bench_.Node(other, 2);
    EXPECT_EQ(tree_._RotateRecordLeft(left->Get(), right->Get()), kErrInvalid);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonInvalid, 1183), Reported(kErrInvalid, 1623)}));
    EXPECT_EQ(tree_._RotateRecordRight(left->Get(), right->Get()), kErrInvalid);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonInvalid, 1183), Reported(kErrInvalid, 1705)}));
    EXPECT_EQ(left->Content(), full);
    EXPECT_EQ(right->Content(), other);
}

TEST_P(RecordMove, EmptyGiverIsReported) {
    const auto empty = bench_.Node(LeafOf(NodeSize(), {}), 1);
    const auto other = bench_.Node(LeafFrom(5, 3), 2);
    EXPECT_EQ(tree_._RotateRecordLeft(other->Get(), empty->Get()), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), (Events{Asserted(410), Reported(kReasonNode, kAnySite),
                                             Reported(kErrCorrupt, 1616)}));
    EXPECT_EQ(tree_._RotateRecordRight(other->Get(), empty->Get()), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), (Events{Asserted(410), Reported(kReasonNode, kAnySite),
                                             Reported(kErrCorrupt, 1698)}));
    EXPECT_EQ(other->Content(), LeafFrom(5, 3));
}

TEST_P(RecordMove, SlotsThatLieAreRefusedBeforeAnyChange) {
    Bytes content = LeafFrom(5, 3);
    Put16(&content, NodeSize() - 2, 12);  // record 0 starts in the descriptor
    Put16(&content, 12, 6);
    const auto giver = bench_.Node(content, 1);
    const auto taker = bench_.Node(LeafFrom(0, 3), 2);
    EXPECT_EQ(tree_._RotateRecordLeft(taker->Get(), giver->Get()), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 9211)});
    Put16(&content, NodeSize() - 2, 14);
    Put16(&content, NodeSize() - 8, Get16(content, NodeSize() - 8) + 1);
    const auto odd = bench_.Node(content, 3);
    EXPECT_EQ(tree_._RotateRecordRight(taker->Get(), odd->Get()), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 9212)});
    EXPECT_EQ(taker->Content(), LeafFrom(0, 3));
}

TEST_P(RecordMove, NodeIsNotItsOwnSibling) {
    const auto node = bench_.Node(LeafFrom(0, 3), 1);
    EXPECT_EQ(tree_._RotateRecordLeft(node->Get(), node->Get()), kErrCorrupt);
    EXPECT_EQ(tree_._RotateRecordRight(node->Get(), node->Get()), kErrCorrupt);
    EXPECT_EQ(bench_.capture.All(),
              (Events{Reported(kReasonNode, 9211), Reported(kReasonNode, 9212)}));
    EXPECT_EQ(node->Content(), LeafFrom(0, 3));
}

TEST_P(RecordMove, RefusedDeletionLeavesTheRecordInBoth) {
    const auto left = bench_.Node(LeafFrom(0, 3), 1);
    const auto right = bench_.Node(LeafFrom(3, 3), 2);
    for (u32 b = 0; b < GetParam().Blocks(); ++b) {
        (*left)->bufs[b].dirty = true;
    }
    bench_.RefuseAccess(1);
    EXPECT_EQ(tree_._RotateRecordLeft(left->Get(), right->Get()), kRefused);
    EXPECT_EQ(bench_.capture.Take(), (Events{Reported(kRefused, kAnySite), Reported(kRefused, 962),
                                             Reported(kRefused, 1675)}));
    EXPECT_EQ(left->Content(), LeafFrom(0, 4));
    EXPECT_EQ(right->Content(), LeafFrom(3, 3));
    bench_.RefuseAccess(1);
    EXPECT_EQ(tree_._RotateRecordRight(left->Get(), right->Get()), kRefused);
    EXPECT_EQ(bench_.capture.Take(), (Events{Reported(kRefused, kAnySite), Reported(kRefused, 962),
                                             Reported(kRefused, 1761)}));
}

INSTANTIATE_GEOMETRIES(RecordMove, ChangeGeometries);

}  // namespace
}  // namespace VELK::test
