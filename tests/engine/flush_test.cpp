// Checkpoint and end of a tree's state: Clear, Flush, Dtor.
#include <gtest/gtest.h>

#include "bench.h"
#include "hfs/treehfs/cache.h"

namespace VELK::test {
namespace {

class FlushTest : public ::testing::Test {
protected:
    FlushTest() : bench_(Blocks(512)) { bench_.Open(SmallTree(1024)); }

    HfsNode* Get(u32 nodeNum, bool makeEmpty = false) {
        HfsNode* node = nullptr;
        EXPECT_EQ(bench_->GetINode(nodeNum, &node, makeEmpty), kOk);
        return node;
    }
    // Changes one byte of a node and keeps `references` on it.
    HfsNode* Change(u32 nodeNum, u32 offset, u8 value, s32 references = 0) {
        HfsNode* node = Get(nodeNum);
        EXPECT_EQ(bench_->SetDirty(node, offset), kOk);
        node->bufs[offset / 512].data[offset % 512] = value;
        node->refCount = references;
        return node;
    }
    u8 OnDisk(u32 nodeNum, u32 offset) { return bench_.volume.Disk(4)[nodeNum * 1024 + offset]; }
    void FillPath(u32 level, u32 nodeNum) { bench_->findData.path[level] = {Get(nodeNum), 0}; }

    Bench bench_;
};

// ---- FlushINode

// The number after the highest one would be 0 again.
TEST_F(FlushTest, TheHighestNumberDoesNotMoveTheInitialisedPart) {
    const u32 valid = bench_->validNodes;
    HfsNode* node = Change(3, 20, 0x33, 1);
    node->nodeNum = 0xFFFFFFFF;
    EXPECT_EQ(bench_->FlushINode(node), kOk);
    EXPECT_EQ(bench_->validNodes, valid);
    node->nodeNum = 3;
    EXPECT_EQ(OnDisk(3, 20), 0x33);
}

// ---- Clear

TEST_F(FlushTest, ClearHandsOverInListOrderAndFreesTheUnreferenced) {
    Change(3, 20, 0x33);
    Change(1, 600, 0x11);
    bench_.volume.TakeCalls();
    EXPECT_EQ(bench_->Clear(), kOk);
    EXPECT_EQ(bench_.volume.TakeCalls(),
              (std::vector<CallRecord>{{Call::kDirtyMeta, 3072, 0, false},
                                       {Call::kRelease, 3072, 0, false},
                                       {Call::kRelease, 3584, 0, false},
                                       {Call::kDirtyMeta, 1536, 0, false},
                                       {Call::kRelease, 1024, 0, false},
                                       {Call::kRelease, 1536, 0, false}}));
    EXPECT_EQ(OnDisk(3, 20), 0x33);
    EXPECT_EQ(OnDisk(1, 600), 0x11);
    EXPECT_EQ(bench_->nodeCount, 0u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
}

TEST_F(FlushTest, ClearKeepsReferencedNodesWithCleanBlocks) {
    const HfsNode* node = Change(1, 600, 0x11, 1);
    EXPECT_EQ(bench_->Clear(), kOk);
    EXPECT_EQ(CachedNode(*bench_.tree, 1), node);
    EXPECT_FALSE(node->bufs[1].dirty);
    EXPECT_EQ(node->modifiedLink.next, &node->modifiedLink);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
}

TEST_F(FlushTest, ClearLeavesCleanNodesCached) {
    Get(2)->refCount = 0;
    EXPECT_EQ(bench_->Clear(), kOk);
    EXPECT_NE(CachedNode(*bench_.tree, 2), nullptr);
}

TEST_F(FlushTest, ClearOfNothingDoesNothing) {
    EXPECT_EQ(bench_->Clear(), kOk);
    EXPECT_EQ(bench_.volume.TakeCalls(), std::vector<CallRecord>{});
}

TEST_F(FlushTest, ClearRaisesValidNodes) {
    bench_->validNodes = 6;
    Get(8, true)->refCount = 0;
    Get(7, true)->refCount = 0;
    EXPECT_EQ(bench_->Clear(), kOk);
    EXPECT_EQ(bench_->validNodes, 9u);
}

TEST_F(FlushTest, ClearGoesOnAfterAFailureAndReturnsTheFirst) {
    Change(3, 20, 0x33);
    Change(1, 600, 0x11);
    Change(2, 20, 0x22);
    bench_.faults.Fail(Call::kDirtyMeta, 1);
    EXPECT_EQ(bench_->Clear(), kFaultStatus);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kFaultStatus, kAnySite)});
    EXPECT_EQ(ModifiedNodes(*bench_.tree), std::vector<u32>{3});
    EXPECT_EQ(OnDisk(1, 600), 0x11);
    EXPECT_EQ(OnDisk(2, 20), 0x22);
    EXPECT_NE(OnDisk(3, 20), 0x33);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
    EXPECT_EQ(bench_->Clear(), kOk);
    EXPECT_EQ(OnDisk(3, 20), 0x33);
}

TEST_F(FlushTest, ClearReportsEveryFailure) {
    Change(3, 20, 0x33);
    Change(1, 600, 0x11);
    bench_.faults.Fail(Call::kDirtyMeta, 1, kFaultStatus, true);
    EXPECT_EQ(bench_->Clear(), kFaultStatus);
    EXPECT_EQ(bench_.capture.Take().size(), 2u);
    EXPECT_EQ(ModifiedNodes(*bench_.tree), (std::vector<u32>{3, 1}));
}

TEST_F(FlushTest, ClearAssertsAMissingHandle) {
    HfsNode* node = Change(3, 20, 0x33);
    buffer_head* const handle = std::exchange(node->bufs[1].bh, nullptr);
    EXPECT_EQ(bench_->Clear(), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2835)});
    bench_.volume.fs.cache.Release(handle, 0);
}

// ---- Flush

TEST_F(FlushTest, FlushOfACleanTreeDoesNothing) {
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_EQ(bench_->Flush(4), kOk);
    EXPECT_EQ(bench_.volume.TakeCalls(), std::vector<CallRecord>{});
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(FlushTest, FlushReleasesTheTreesOwnPath) {
    FillPath(1, 1);
    FillPath(2, 4);
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_EQ(References(bench_->findData), 0u);
    EXPECT_EQ(bench_->nodeCount, 2u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(FlushTest, FlushAssertsAGapInThePath) {
    FillPath(1, 1);
    FillPath(3, 4);
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(752)});
}

TEST_F(FlushTest, FlushAssertsACountBelowZero) {
    FillPath(1, 1);
    bench_->findData.path[1].node->refCount = 0;
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(755)});
}

TEST_F(FlushTest, FlushWritesTheHeaderRecordWhenItChanged) {
    BTHeaderMem& header = bench_->header;
    header.treeDepth = 0x0102;
    header.rootNode = 0x03040506;
    header.leafRecords = 0x0708090A;
    header.firstLeafNode = 0x0B0C0D0E;
    header.lastLeafNode = 0x0F101112;
    header.maxKeyLength = 0x1314;
    header.totalNodes = 0x15161718;
    header.freeNodes = 0x191A1B1C;
    header.clumpSize = 0x1D1E1F20;
    header.attributes = 0x21222324;
    bench_->isDirty = true;
    EXPECT_EQ(bench_->Flush(0), kOk);
    Bytes expected = bench_.image.Node(0);
    const u8 record[] = {0x01, 0x02, 0x03, 0x04, 0x05, 0x06, 0x07, 0x08, 0x09, 0x0A, 0x0B,
                         0x0C, 0x0D, 0x0E, 0x0F, 0x10, 0x11, 0x12, 0x04, 0x00, 0x13, 0x14,
                         0x15, 0x16, 0x17, 0x18, 0x19, 0x1A, 0x1B, 0x1C, 0x00, 0x00, 0x1D,
                         0x1E, 0x1F, 0x20, 0x00, 0x00, 0x21, 0x22, 0x23, 0x24};
    std::copy(std::begin(record), std::end(record), expected.begin() + 14);
    EXPECT_EQ(bench_.volume.DiskNode(4, 1024, 0), expected);
    EXPECT_FALSE(bench_->IsDirty());
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(FlushTest, FlushMarksOnlyTheHeadersBlock) {
    bench_->isDirty = true;
    bench_.volume.TakeCalls();
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_EQ(bench_.volume.TakeCalls(),
              (std::vector<CallRecord>{{Call::kMap, 0, 1024, false},
                                       {Call::kDirtyMeta, 0, 0, false},
                                       {Call::kRelease, 0, 0, false},
                                       {Call::kRelease, 512, 0, false}}));
}

TEST_F(FlushTest, AnUnchangedHeaderIsNotWritten) {
    bench_->header.leafRecords = 999;
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_EQ(bench_.volume.DiskNode(4, 1024, 0), bench_.image.Node(0));
}

TEST_F(FlushTest, FieldsThatFlushDoesNotWriteAreChecked) {
    Bytes& disk = bench_.volume.Disk(4);
    Put16(&disk, 44, 0x0101);
    disk[50] = 0x80;
    disk[51] = 0xCF;
    bench_->isDirty = true;
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_EQ(bench_.capture.Take(), (Events{Asserted(2201), Asserted(2202), Asserted(2203)}));
    EXPECT_EQ(OnDisk(0, 44), 0x01);
    EXPECT_EQ(OnDisk(0, 50), 0x80);
    EXPECT_EQ(OnDisk(0, 51), 0xCF);
}

TEST_F(FlushTest, FlushHandsOverChangedNodes) {
    Change(3, 20, 0x33);
    bench_->isDirty = true;
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_EQ(OnDisk(3, 20), 0x33);
    EXPECT_EQ(bench_->nodeCount, 0u);
    EXPECT_TRUE(bench_->modifiedList.IsEmpty());
}

TEST_F(FlushTest, Mode4ZeroesTheTailOfTheFile) {
    bench_.capture.TraceAll();
    Bytes& disk = bench_.volume.Disk(4);
    std::fill(disk.begin() + 6 * 1024, disk.end(), u8{0xEE});
    bench_->validNodes = 7;
    EXPECT_EQ(bench_->Flush(4), kOk);
    EXPECT_EQ(bench_.volume.TakeCalls(),
              (std::vector<CallRecord>{{Call::kZero, 7168, 6 * 1024, false}}));
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Traced("Zero nodes r=4, [7 d)\n"), Logged("Zero nodes r=4, [7 d)\n")}));
    EXPECT_EQ(bench_->validNodes, 13u);
    EXPECT_EQ(OnDisk(6, 0), 0xEE);
    EXPECT_EQ(bench_.volume.DiskNode(4, 1024, 7), Bytes(1024));
}

TEST_F(FlushTest, TheLogIsWrittenWithoutDiagnosticTraces) {
    bench_->validNodes = 7;
    EXPECT_EQ(bench_->Flush(4), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Logged("Zero nodes r=4, [7 d)\n")});
}

TEST_F(FlushTest, OtherModesZeroNothing) {
    for (const unsigned long mode : {0ul, 1ul, 2ul, 3ul, 8ul, ~4ul}) {
        bench_->validNodes = 7;
        EXPECT_EQ(bench_->Flush(mode), kOk);
        EXPECT_EQ(bench_.volume.Count(Call::kZero), 0u) << mode;
        EXPECT_EQ(bench_->validNodes, 7u);
    }
}

TEST_F(FlushTest, TheTailIsComputedIn64Bits) {
    bench_->header.totalNodes = 0xFFFFFFFF;
    bench_->validNodes = 0x00800000;
    EXPECT_EQ(bench_->Flush(4), kOk);
    EXPECT_EQ(
        bench_.volume.TakeCalls(),
        (std::vector<CallRecord>{{Call::kZero, 0x00800000ull << 10, 0xFF7FFFFFull << 10, false}}));
    EXPECT_EQ(bench_.capture.Assertions(), std::vector<int>{3481});
}

TEST_F(FlushTest, AFailedZeroIsAssertedOnly) {
    bench_->validNodes = 7;
    bench_.faults.Fail(Call::kZero, 1);
    EXPECT_EQ(bench_->Flush(4), kOk);
    EXPECT_EQ(bench_.capture.Assertions(), std::vector<int>{3481});
    EXPECT_EQ(bench_.capture.Of(Event::Kind::kReport), Events{});
    EXPECT_EQ(bench_->validNodes, 13u);
}

// ---- faults in Flush

TEST_F(FlushTest, AnUnreadableHeaderStaysToBeWritten) {
    bench_->isDirty = true;
    bench_.faults.Fail(Call::kMap, 1);
    EXPECT_EQ(bench_->Flush(0), kFaultStatus);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, kAnySite)}));
    EXPECT_TRUE(bench_->IsDirty());
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
}

TEST_F(FlushTest, NoMemoryForTheHeaderIsReportedOnce) {
    bench_->isDirty = true;
    bench_.heap.FailNth(1);
    EXPECT_EQ(bench_->Flush(0), kErrNoMemory);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kErrNoMemory, kAnySite)});
    EXPECT_TRUE(bench_->IsDirty());
}

TEST_F(FlushTest, AFailedHandOverIsReportedByClearAndFlush) {
    Change(3, 20, 0x33);
    bench_.faults.Fail(Call::kDirtyMeta, 1);
    EXPECT_EQ(bench_->Flush(4), kFaultStatus);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, kAnySite)}));
}

TEST_F(FlushTest, AFailedHandOverZeroesNothing) {
    Change(3, 20, 0x33);
    bench_->validNodes = 7;
    bench_.faults.Fail(Call::kDirtyMeta, 1);
    EXPECT_EQ(bench_->Flush(4), kFaultStatus);
    EXPECT_EQ(bench_.volume.Count(Call::kZero), 0u);
    EXPECT_EQ(bench_->validNodes, 7u);
}

TEST_F(FlushTest, AHeaderNotHandedOverIsHandedOverByTheNextFlush) {
    bench_->header.leafRecords = 0x55;
    bench_->isDirty = true;
    bench_.faults.Fail(Call::kDirtyMeta, 1);
    EXPECT_EQ(bench_->Flush(0), kFaultStatus);
    EXPECT_TRUE(bench_->IsDirty());
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_FALSE(bench_->IsDirty());
    EXPECT_EQ(OnDisk(0, 23), 0x55);
}

class FlushJournal : public ::testing::Test {
protected:
    FlushJournal() : bench_(Blocks(512, true)) { bench_.Open(SmallTree(1024)); }
    Bench bench_;
};

TEST_F(FlushJournal, AHeaderThatMustNotBeMarkedStaysToBeWritten) {
    bench_->isDirty = true;
    for (int retry = 0; retry < 5; ++retry) {
        bench_.faults.Fail(Call::kWriteAccess, 1);
        EXPECT_EQ(bench_->Flush(0), kFaultStatus);
        EXPECT_EQ(bench_.capture.Take(),
                  (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, kAnySite)}));
        EXPECT_TRUE(bench_->IsDirty());
        EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
    }
    EXPECT_EQ(bench_->Flush(0), kOk);
}

// Every service call of one checkpoint fails in turn; a second one makes it good.
TEST_F(FlushJournal, AnySingleFaultIsMadeGoodByTheNextFlush) {
    bool struck = true;
    for (u32 nth = 1; struck; ++nth) {
        SCOPED_TRACE(nth);
        Bench bench(Blocks(512, true));
        bench.Open(SmallTree(1024));
        HfsNode* node = nullptr;
        for (const u32 number : {1u, 2u}) {
            ASSERT_EQ(bench->GetINode(number, &node, false), kOk);
            ASSERT_EQ(bench->SetDirty(node, 0, 1024), kOk);
            node->bufs[1].data[7] = 0x5C;
            node->refCount = 0;
        }
        bench->header.leafRecords = 0x77;
        bench->isDirty = true;
        bench.faults.FailAny(nth);
        const int status = bench->Flush(0);
        struck = bench.faults.HasFailed();
        EXPECT_EQ(status, struck ? kFaultStatus : kOk);
        EXPECT_TRUE(LedgerHolds(*bench.tree, 0));
        bench.faults.FailNone();
        EXPECT_EQ(bench->Flush(0), kOk);
        EXPECT_EQ(bench.volume.Disk(4)[23], 0x77);
        EXPECT_EQ(bench.volume.Disk(4)[1024 + 519], 0x5C);
        EXPECT_EQ(bench.volume.Disk(4)[2048 + 519], 0x5C);
        EXPECT_EQ(bench->nodeCount, 0u);
    }
}

// ---- Dtor

TEST_F(FlushTest, TeardownPrintsTheStatistics) {
    bench_->PutINode(Get(1), false);
    Get(2);
    Get(3);
    Get(2);
    bench_->writeCount = 21;
    bench_.capture.Take();
    bench_.capture.TraceAll();
    bench_->Dtor();
    EXPECT_EQ(bench_.capture.Take(), Events{Traced("~CatTree: Max 2, Hit 1, Read 4, Write 21\n")});
}

TEST_F(FlushTest, TeardownIsSilentWithoutDiagnosticTraces) {
    bench_->Dtor();
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(FlushTest, TeardownNamesTheTree) {
    bench_.capture.TraceAll();
    const std::pair<u32, const char*> names[] = {{3, "ExtTree"}, {4, "CatTree"}, {5, "Unknown"},
                                                 {8, "AttTree"}, {0, "Unknown"}, {99, "Unknown"}};
    for (const auto& [fileId, name] : names) {
        bench_->fileId = fileId;
        bench_->Dtor();
        EXPECT_EQ(bench_.capture.Take(),
                  Events{Traced("~" + std::string(name) + ": Max 1, Hit 0, Read 1, Write 0\n")});
    }
}

TEST_F(FlushTest, TeardownFreesNodesWhateverTheirCounts) {
    Get(1)->refCount = 0;
    Get(2);
    Get(3)->refCount = 2;
    bench_->Dtor();
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(bench_->nodeRoot, nullptr);
    EXPECT_EQ(bench_->nodeCount, 0u);
    EXPECT_EQ(bench_.volume.Lent(), 0u);
    EXPECT_EQ(bench_.heap.Live(), 0u);
}

// Such a node is found by the modified list alone; were it left there, a later flush would meet it.
TEST_F(FlushTest, TeardownFreesAModifiedNodeThatIsNoLongerFound) {
    HfsNode* node = Get(1);
    ASSERT_EQ(kOk, bench_->SetDirty(node, 0));
    UnlinkNode(&*bench_.tree, node);
    bench_->Dtor();
    EXPECT_TRUE(ShortcutsHold(*bench_.tree));
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2380)});
    EXPECT_TRUE(bench_->modifiedList.IsEmpty());
    EXPECT_EQ(bench_.volume.Lent(), 0u);
    EXPECT_EQ(bench_.heap.Live(), 0u);
}

TEST_F(FlushTest, TeardownAssertsMoreThanThreeReferences) {
    Get(1)->refCount = 3;
    bench_->Dtor();
    EXPECT_EQ(bench_.capture.Take(), Events{});
    bench_.Load(bench_.image);
    EXPECT_EQ(bench_->Init(), kOk);
    Get(1)->refCount = 4;
    bench_->Dtor();
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2818)});
    EXPECT_EQ(bench_.heap.Live(), 0u);
}

TEST_F(FlushTest, TeardownDropsUnsavedChangesAfterAnAssertion) {
    Change(3, 20, 0x33);
    bench_->Dtor();
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2380)});
    EXPECT_EQ(bench_.volume.Count(Call::kDirtyMeta), 0u);
    EXPECT_NE(OnDisk(3, 20), 0x33);
    EXPECT_TRUE(bench_->modifiedList.IsEmpty());
}

TEST_F(FlushTest, TeardownAssertsAnOpenReservation) {
    bench_->reservationOpen = true;
    bench_->Dtor();
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2377)});
    bench_->reservationOpen = false;
}

TEST_F(FlushTest, TeardownReleasesTheTreesOwnPathFirst) {
    FillPath(1, 1);
    bench_->findData.path[1].node->refCount = 4;
    bench_->Dtor();
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(References(bench_->findData), 0u);
}

TEST_F(FlushTest, TeardownAssertsAWrongNodeCount) {
    bench_->nodeCount = 1;
    bench_->Dtor();
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2388)});
    bench_->nodeCount = 0;
}

TEST_F(FlushTest, ASecondTeardownIsHarmless) {
    Get(1);
    bench_->Dtor();
    bench_->Dtor();
    EXPECT_EQ(bench_->scratch, nullptr);
    EXPECT_EQ(bench_.heap.Live(), 0u);
}

TEST_F(FlushTest, ATreeTornDownOpensAgain) {
    bench_->Dtor();
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(Get(1)->nodeNum, 1u);
}

TEST(Teardown, OfATreeThatWasNeverOpened) {
    Bench bench(Blocks(512));
    bench->Dtor();
    EXPECT_EQ(bench.capture.Take(), Events{});
}

}  // namespace
}  // namespace VELK::test
