// Marking blocks modified, zeroing a node, handing one node over.
#include <gtest/gtest.h>

#include "bench.h"
#include "hfs/treehfs/noderef.h"

namespace VELK::test {
namespace {

using Dirt = std::vector<bool>;

class DirtyTest : public ::testing::Test {
protected:
    // Nodes of four blocks of 1024 bytes.
    explicit DirtyTest(bool hasJournal = true) : bench_(Blocks(1024, hasJournal)) {
        bench_.Open(SmallTree(4096));
        bench_->GetINode(1, &node_, false);
        bench_.Forget();
    }
    Dirt DirtOf(const HfsNode* node) const {
        return {node->bufs[0].dirty, node->bufs[1].dirty, node->bufs[2].dirty, node->bufs[3].dirty};
    }
    std::vector<u32> Listed() { return ModifiedNodes(*bench_.tree); }

    Bench bench_;
    HfsNode* node_ = nullptr;
};

class DirtyWithoutJournal : public DirtyTest {
protected:
    DirtyWithoutJournal() : DirtyTest(false) {}
};

// ---- SetDirty

// The second change of a node in one block takes a shorter way; its range is looked at all the
// same.
TEST(DirtyNodeOfOneBlock, RangesPastItsEndAreRefusedEachTime) {
    Bench bench(Blocks(4096));
    bench.Open(SmallTree(4096));
    HfsNode* node = nullptr;
    ASSERT_EQ(bench->GetINode(1, &node, false), kOk);
    for (int time = 0; time < 2; ++time) {
        EXPECT_EQ(bench->SetDirty(node, 4000, 97), kErrCorrupt);
        EXPECT_EQ(bench.capture.Take(), (Events{Asserted(777), Reported(kReasonNode, 778)}));
        EXPECT_EQ(bench->SetDirty(node, 4097, 0), kErrCorrupt);
        EXPECT_EQ(bench.capture.Take(),
                  (Events{Asserted(776), Asserted(777), Reported(kReasonNode, 778)}));
        EXPECT_EQ(bench->SetDirty(node, 4000, 96), kOk);
        EXPECT_EQ(bench.capture.Take(), Events{});
    }
    ReleaseNode(node);
}

TEST_F(DirtyTest, MarksTheBlocksOfTheRange) {
    EXPECT_EQ(bench_->SetDirty(node_, 1020, 8), kOk);
    EXPECT_EQ(DirtOf(node_), (Dirt{true, true, false, false}));
    EXPECT_EQ(Listed(), std::vector<u32>{1});
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(DirtyTest, ARangeThatEndsWithItsBlockStaysInIt) {
    EXPECT_EQ(bench_->SetDirty(node_, 1020, 4), kOk);
    EXPECT_EQ(DirtOf(node_), (Dirt{true, false, false, false}));
}

TEST_F(DirtyTest, LengthZeroMarksTheBlockOfTheOffset) {
    EXPECT_EQ(bench_->SetDirty(node_, 1024, 0), kOk);
    EXPECT_EQ(DirtOf(node_), (Dirt{false, true, false, false}));
}

TEST_F(DirtyTest, TheShortFormMarksTheBlockOfTheOffset) {
    EXPECT_EQ(bench_->SetDirty(node_, 3071), kOk);
    EXPECT_EQ(DirtOf(node_), (Dirt{false, false, true, false}));
    EXPECT_EQ(Listed(), std::vector<u32>{1});
}

TEST_F(DirtyTest, TheWholeNodeIsARange) {
    EXPECT_EQ(bench_->SetDirty(node_, 0, 4096), kOk);
    EXPECT_EQ(DirtOf(node_), (Dirt{true, true, true, true}));
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(DirtyTest, TheJournalIsAskedOncePerBlockInOrder) {
    EXPECT_EQ(bench_->SetDirty(node_, 2000, 100), kOk);
    EXPECT_EQ(bench_->SetDirty(node_, 0, 4096), kOk);
    EXPECT_EQ(bench_.volume.TakeCalls(),
              (std::vector<CallRecord>{{Call::kWriteAccess, 4096 + 1024, 0, false},
                                       {Call::kWriteAccess, 4096 + 2048, 0, false},
                                       {Call::kWriteAccess, 4096, 0, false},
                                       {Call::kWriteAccess, 4096 + 3072, 0, false}}));
}

TEST_F(DirtyWithoutJournal, NobodyIsAsked) {
    EXPECT_EQ(bench_->SetDirty(node_, 0, 4096), kOk);
    EXPECT_EQ(DirtOf(node_), (Dirt{true, true, true, true}));
    EXPECT_EQ(bench_.volume.TakeCalls(), std::vector<CallRecord>{});
}

TEST_F(DirtyTest, MarkingAgainMovesTheNodeToTheTail) {
    HfsNode* other = nullptr;
    bench_->GetINode(2, &other, false);
    bench_->SetDirty(node_, 0);
    bench_->SetDirty(other, 0);
    EXPECT_EQ(Listed(), (std::vector<u32>{1, 2}));
    bench_->SetDirty(node_, 0);
    EXPECT_EQ(Listed(), (std::vector<u32>{2, 1}));
}

TEST_F(DirtyTest, AnOffsetPastTheNodeIsAssertedAndRefused) {
    for (const u32 offset : {4097u, 0x80000000u, 0xFFFFFFFFu}) {
        EXPECT_EQ(bench_->SetDirty(node_, offset, 0), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Assertions(), (std::vector<int>{776, 777}));
        bench_.capture.Take();
    }
    EXPECT_EQ(DirtOf(node_), Dirt(4, false));
    EXPECT_EQ(Listed(), std::vector<u32>{});
}

TEST_F(DirtyTest, ARangeThatLeavesTheNodeIsAssertedAndRefused) {
    struct {
        u32 offset, length;
    } const ranges[] = {{0, 4097}, {4095, 2}, {4096, 1}, {1, 0xFFFFFFFF}, {4096, 0xFFFFFFFF}};
    for (const auto& range : ranges) {
        EXPECT_EQ(bench_->SetDirty(node_, range.offset, range.length), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Assertions(), std::vector<int>{777});
        bench_.capture.Take();
    }
    EXPECT_EQ(DirtOf(node_), Dirt(4, false));
}

TEST_F(DirtyTest, BytesInABlockTheNodeDoesNotHaveAreRefused) {
    bench_->header.blocksPerNode = 3;
    EXPECT_EQ(bench_->SetDirty(node_, 2048, 1025), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 779)});
    bench_->header.blocksPerNode = 4;
    EXPECT_EQ(DirtOf(node_), Dirt(4, false));
}

TEST_F(DirtyTest, TheNodesEndIsInNoBlock) {
    EXPECT_EQ(bench_->SetDirty(node_, 4096, 0), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 779)});
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
}

TEST_F(DirtyTest, ARefusedFirstBlockLeavesTheNodeCleanAndUnlisted) {
    bench_.faults.Fail(Call::kWriteAccess, 1);
    EXPECT_EQ(bench_->SetDirty(node_, 0, 4096), kFaultStatus);
    EXPECT_EQ(DirtOf(node_), Dirt(4, false));
    EXPECT_EQ(Listed(), std::vector<u32>{});
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kFaultStatus, kAnySite)});
}

TEST_F(DirtyTest, ARefusedLaterBlockKeepsTheEarlierOnesAndLists) {
    bench_.faults.Fail(Call::kWriteAccess, 3);
    EXPECT_EQ(bench_->SetDirty(node_, 0, 4096), kFaultStatus);
    EXPECT_EQ(DirtOf(node_), (Dirt{true, true, false, false}));
    EXPECT_EQ(Listed(), std::vector<u32>{1});
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
}

// The order of the list is the order of writing; a change that was refused does not alter it.
TEST_F(DirtyTest, ARefusalKeepsTheOrderOfTheList) {
    HfsNode* other = nullptr;
    ASSERT_EQ(bench_->GetINode(2, &other, false), kOk);
    bench_->SetDirty(node_, 0);
    bench_->SetDirty(other, 0);
    for (const bool zero : {false, true}) {
        bench_.faults.Fail(Call::kWriteAccess, 1);
        EXPECT_EQ(zero ? bench_->Zero(node_) : bench_->SetDirty(node_, 1024), kFaultStatus);
        EXPECT_EQ(Listed(), (std::vector<u32>{1, 2}));
    }
}

TEST_F(DirtyTest, ARefusedBlockOfAListedNodeLeavesItListed) {
    bench_->SetDirty(node_, 0);
    bench_.faults.Fail(Call::kWriteAccess, 1);
    EXPECT_EQ(bench_->SetDirty(node_, 1024), kFaultStatus);
    EXPECT_EQ(Listed(), std::vector<u32>{1});
}

// ---- Zero

TEST_F(DirtyTest, ZeroClearsTheTailToo) {
    EXPECT_EQ(bench_->Zero(node_), kOk);
    EXPECT_EQ(DirtOf(node_), Dirt(4, true));
    EXPECT_EQ(Listed(), std::vector<u32>{1});
    EXPECT_EQ(bench_->FlushINode(node_), kOk);
    EXPECT_EQ(bench_.volume.DiskNode(4, 4096, 1), Bytes(4096));
}

TEST_F(DirtyTest, ZeroAsksTheJournalForCleanBlocksOnly) {
    bench_->SetDirty(node_, 1024);
    bench_.volume.TakeCalls();
    EXPECT_EQ(bench_->Zero(node_), kOk);
    EXPECT_EQ(bench_.volume.TakeCalls(),
              (std::vector<CallRecord>{{Call::kWriteAccess, 4096, 0, false},
                                       {Call::kWriteAccess, 4096 + 2048, 0, false},
                                       {Call::kWriteAccess, 4096 + 3072, 0, false}}));
}

TEST_F(DirtyTest, ZeroMovesTheNodeToTheTail) {
    HfsNode* other = nullptr;
    bench_->GetINode(2, &other, false);
    bench_->SetDirty(node_, 0);
    bench_->SetDirty(other, 0);
    EXPECT_EQ(bench_->Zero(node_), kOk);
    EXPECT_EQ(Listed(), (std::vector<u32>{2, 1}));
}

TEST_F(DirtyTest, ZeroRefusedStopsAtThatBlock) {
    bench_.faults.Fail(Call::kWriteAccess, 2);
    EXPECT_EQ(bench_->Zero(node_), kFaultStatus);
    EXPECT_EQ(DirtOf(node_), (Dirt{true, false, false, false}));
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kFaultStatus, 816)});
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
    EXPECT_NE(node_->bufs[3].data[1023], 0);
}

TEST_F(DirtyTest, ZeroRefusedAtOnceLeavesTheNodeClean) {
    bench_.faults.Fail(Call::kWriteAccess, 1);
    EXPECT_EQ(bench_->Zero(node_), kFaultStatus);
    EXPECT_EQ(Listed(), std::vector<u32>{});
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
}

// ---- FlushINode

TEST_F(DirtyTest, FlushHandsOverDirtyBlocksInOrder) {
    bench_->SetDirty(node_, 2048);
    bench_->SetDirty(node_, 0);
    node_->bufs[0].data[100] = 0x77;
    node_->bufs[2].data[5] = 0x66;
    bench_.volume.TakeCalls();
    EXPECT_EQ(bench_->FlushINode(node_), kOk);
    EXPECT_EQ(bench_.volume.TakeCalls(),
              (std::vector<CallRecord>{{Call::kDirtyMeta, 4096, 0, false},
                                       {Call::kDirtyMeta, 4096 + 2048, 0, false}}));
    EXPECT_EQ(DirtOf(node_), Dirt(4, false));
    EXPECT_EQ(Listed(), std::vector<u32>{});
    EXPECT_EQ(node_->modifiedLink.next, &node_->modifiedLink);
    EXPECT_EQ(node_->refCount, 1);
    EXPECT_EQ(bench_.volume.Disk(4)[4096 + 100], 0x77);
    EXPECT_EQ(bench_.volume.Disk(4)[4096 + 2048 + 5], 0x66);
}

TEST_F(DirtyTest, FlushOfACleanNodeDoesNothing) {
    EXPECT_EQ(bench_->FlushINode(node_), kOk);
    EXPECT_EQ(bench_.volume.TakeCalls(), std::vector<CallRecord>{});
}

TEST_F(DirtyTest, FlushOfTheFirstNewNodeRaisesValidNodes) {
    bench_->validNodes = 9;
    HfsNode* node = nullptr;
    bench_->GetINode(9, &node, true);
    EXPECT_EQ(bench_->FlushINode(node), kOk);
    EXPECT_EQ(bench_->validNodes, 10u);
}

TEST_F(DirtyTest, FlushOfALaterNewNodeRaisesValidNodesOverTheGap) {
    bench_->validNodes = 6;
    HfsNode* node = nullptr;
    bench_->GetINode(9, &node, true);
    EXPECT_EQ(bench_->FlushINode(node), kOk);
    EXPECT_EQ(bench_->validNodes, 10u);
}

TEST_F(DirtyTest, FlushOfTheLastNodeNumberDoesNotWrapValidNodes) {
    bench_->SetDirty(node_, 0);
    node_->nodeNum = 0xFFFFFFFF;
    bench_->validNodes = 0xFFFFFFFF;
    EXPECT_EQ(bench_->FlushINode(node_), kOk);
    EXPECT_EQ(bench_->validNodes, 0xFFFFFFFFu);
    node_->nodeNum = 1;
}

TEST_F(DirtyTest, FlushOfAnOldNodeLeavesValidNodes) {
    bench_->validNodes = 9;
    bench_->SetDirty(node_, 0);
    EXPECT_EQ(bench_->FlushINode(node_), kOk);
    EXPECT_EQ(bench_->validNodes, 9u);
}

TEST_F(DirtyTest, FlushOfACleanNodePastValidNodesLeavesThem) {
    bench_->validNodes = 1;
    EXPECT_EQ(bench_->FlushINode(node_), kOk);
    EXPECT_EQ(bench_->validNodes, 1u);
}

TEST_F(DirtyTest, AFailedHandOverKeepsThatBlockAndTheLaterOnesDirty) {
    bench_->validNodes = 1;
    bench_->SetDirty(node_, 0, 4096);
    bench_.faults.Fail(Call::kDirtyMeta, 2);
    EXPECT_EQ(bench_->FlushINode(node_), kFaultStatus);
    EXPECT_EQ(DirtOf(node_), (Dirt{false, true, true, true}));
    EXPECT_EQ(Listed(), std::vector<u32>{1});
    EXPECT_EQ(bench_->validNodes, 1u);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kFaultStatus, kAnySite)});
}

TEST_F(DirtyTest, AFailedHandOverIsMadeGoodByTheNext) {
    bench_->SetDirty(node_, 1024);
    node_->bufs[1].data[9] = 0x42;
    bench_.faults.Fail(Call::kDirtyMeta, 1);
    EXPECT_EQ(bench_->FlushINode(node_), kFaultStatus);
    EXPECT_EQ(bench_->FlushINode(node_), kOk);
    EXPECT_EQ(bench_.volume.Disk(4)[4096 + 1024 + 9], 0x42);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
}

TEST_F(DirtyTest, AHeaderBlockNotHandedOverKeepsTheTreeDirty) {
    HfsNode* node0 = nullptr;
    bench_->GetINode(0, &node0, false);
    bench_->SetDirty(node0, 0, 4096);
    bench_.faults.Fail(Call::kDirtyMeta, 1);
    EXPECT_EQ(bench_->FlushINode(node0), kFaultStatus);
    EXPECT_TRUE(bench_->IsDirty());
}

TEST_F(DirtyTest, AnotherBlockOfNodeZeroDoesNotMakeTheTreeDirty) {
    HfsNode* node0 = nullptr;
    bench_->GetINode(0, &node0, false);
    bench_->SetDirty(node0, 0, 4096);
    bench_.faults.Fail(Call::kDirtyMeta, 2);
    EXPECT_EQ(bench_->FlushINode(node0), kFaultStatus);
    EXPECT_FALSE(bench_->IsDirty());
}

}  // namespace
}  // namespace VELK::test
