// Growing a tree file: sizes in whole clumps, new map nodes, and what a refusal leaves behind.
#include "sparse_volume.h"

namespace VELK::test {
namespace {

#define EXPECT_EVENTS(...) EXPECT_EQ(capture.Take(), (Events{__VA_ARGS__}))

class ExtendTest : public SparseTreeTest {
protected:
    // Grows by single nodes to exactly `wanted` of them.
    int GrowTo(u32 wanted) {
        const unsigned clump = NodeSize();
        return Tree().ExtendBTree(wanted, nullptr, &clump);
    }
    int GrowIn(u32 wanted, unsigned clump) { return Tree().ExtendBTree(wanted, nullptr, &clump); }
    HfsFork* Fork() { return volume->fs.ForkOf(tree->fileId); }
    u64 Nodes(u64 count) { return count * NodeSize(); }

    void ExpectUntouched(u32 totalNodes, u32 freeNodes) {
        EXPECT_EQ(Tree().header.totalNodes, totalNodes);
        EXPECT_EQ(Tree().header.freeNodes, freeNodes);
        EXPECT_FALSE(Tree().isDirty);
        EXPECT_EQ(ModifiedNodes(Tree()), std::vector<u32>{});
        EXPECT_EQ(volume->resizes, std::vector<u64>{});
        EXPECT_TRUE(LedgerHolds(Tree(), 0));
    }
    std::vector<u32> Chain() {
        std::vector<u32> chain;
        for (u32 map = Get32(Live(0), 0); map != 0; map = Get32(Live(map), 0)) {
            chain.push_back(map);
        }
        return chain;
    }
};

class Extend : public ExtendTest {};
INSTANTIATE_GEOMETRIES(Extend, MapGeometries);

TEST_P(Extend, EnoughNodesChangeNothing) {
    Open(20, 3);
    EXPECT_EQ(GrowTo(20), kOk);
    EXPECT_EQ(GrowTo(0), kOk);
    EXPECT_EVENTS();
    EXPECT_EQ(Tree().nodeCount, 0u);
    ExpectUntouched(20, 17);
}

TEST_P(Extend, GrowsInWholeClumpsOfTheFork) {
    Open(20, 3);
    Fork()->clumpSize = 8 * NodeSize();
    ASSERT_EQ(Tree().ExtendBTree(21, nullptr, nullptr), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(24)});
    EXPECT_EQ(Tree().header.totalNodes, 24u);
    EXPECT_EQ(Tree().header.freeNodes, 21u);
    EXPECT_TRUE(Tree().isDirty);
    EXPECT_TRUE(MapIsSound());
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
    EXPECT_EVENTS();
}

TEST_P(Extend, GivenClumpGoesBeforeThatOfTheFork) {
    Open(20, 3);
    Fork()->clumpSize = 8 * NodeSize();
    ASSERT_EQ(GrowIn(21, 3 * NodeSize()), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(21)});
    ASSERT_EQ(GrowIn(22, 5 * NodeSize()), kOk);
    EXPECT_EQ(volume->resizes.back(), Nodes(25));
}

TEST_P(Extend, GivenClumpOfNothingMeansTheDefaultOfTheVolume) {
    Open(20, 3);
    Fork()->clumpSize = 8 * NodeSize();
    volume->fs.defaultClumpSize = 11 * NodeSize();
    ASSERT_EQ(GrowIn(21, 0), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(22)});
}

TEST_P(Extend, WithoutAnyClumpGrowsBy64KiB) {
    Open(20, 3);
    ASSERT_EQ(Tree().ExtendBTree(21, nullptr, nullptr), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{(Nodes(21) + 65535) / 65536 * 65536});
}

TEST_P(Extend, ClumpSmallerThanAnAllocationBlockCountsAsOne) {
    allocBlockSize = 65536;
    Open(20, 3);
    ASSERT_EQ(GrowIn(static_cast<u32>(volume->FileSize() / NodeSize()) + 1, 1), kOk);
    EXPECT_EQ(volume->resizes.back() % 65536, 0u);
    EXPECT_GE(volume->resizes.back(), Nodes(21));
}

TEST_P(Extend, GivenSizeIsRoundedUpToTheClump) {
    Open(20, 3);
    const unsigned long long size = Nodes(29) + 1;
    const unsigned clump = 4 * NodeSize();
    ASSERT_EQ(Tree().ExtendBTree(21, &size, &clump), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(32)});
    EXPECT_EQ(Tree().header.totalNodes, 32u);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(Extend, GivenSizeTooSmallForTheNodesIsRefused) {
    Open(20, 3);
    const unsigned clump = NodeSize();
    for (const unsigned long long size : {Nodes(0), Nodes(1), Nodes(20), Nodes(19) + 1}) {
        EXPECT_EQ(Tree().ExtendBTree(21, &size, &clump), kErrInvalid);
        EXPECT_EVENTS(Reported(kReasonInvalid, 9422));
        ExpectUntouched(20, 17);
    }
}

TEST_P(Extend, SizesNoNumberHoldsAreRefused) {
    Open(20, 3);
    const unsigned clump = NodeSize();
    unsigned long long size = ~0ull;
    EXPECT_EQ(Tree().ExtendBTree(21, &size, &clump), kErrInvalid);
    EXPECT_EVENTS(Reported(kReasonInvalid, 9420));
    size = Nodes(u64{1} << 32);
    EXPECT_EQ(Tree().ExtendBTree(21, &size, &clump), kErrInvalid);
    EXPECT_EVENTS(Reported(kReasonInvalid, 9421));
    ExpectUntouched(20, 17);
}

TEST_P(Extend, VolumeThatNamesNoAllocationBlockIsRefused) {
    Open(20, 3);
    volume->fs.allocBlockSize = 0;
    EXPECT_EQ(GrowTo(21), kErrInvalid);
    EXPECT_EVENTS(Reported(kReasonInvalid, 9426));
    ExpectUntouched(20, 17);
}

TEST_P(Extend, LargestClumpDoesNotWrap) {
    Open(20, 3);
    MakeVolume(1000);
    Open(20, 3);
    EXPECT_EQ(GrowIn(21, 0xFFFFFFFF), kSparseNoSpace);
    EXPECT_EQ(volume->resizes, std::vector<u64>{0x100000000});
    EXPECT_EVENTS(Reported(kSparseNoSpace, 4047));
}

TEST_P(Extend, ClumpOfNoBlocksPrintsAndCountsAsOne) {
    Open(20, 3);
    volume->fs.allocBlockShift = 50;
    EXPECT_EQ(GrowTo(21), kErrInvalid);
    EXPECT_EVENTS(Asserted(4016), Reported(kReasonInvalid, 9421));
    volume->fs.allocBlockShift = 9;
}

TEST_P(Extend, TracesTheTreeAndItsNodes) {
    Open(20, 3);
    capture.TraceAll();
    const unsigned clump = 8 * NodeSize();
    ASSERT_EQ(Tree().ExtendBTree(21, nullptr, &clump), kOk);
    EXPECT_EVENTS(Traced("Extend AttTree: 14 => 18\n"));
    Tree().fileId = kCatalogFileId;
    ASSERT_EQ(Tree().ExtendBTree(25, nullptr, &clump), kOk);
    EXPECT_EVENTS(Traced("Extend CatTree: 18 => 20\n"));
    Tree().fileId = kExtentsFileId;
    ASSERT_EQ(Tree().ExtendBTree(33, nullptr, &clump), kOk);
    EXPECT_EVENTS(Traced("Extend ExtTree: 20 => 28\n"));
    Tree().fileId = kStartupFileId;
    ASSERT_EQ(Tree().ExtendBTree(41, nullptr, &clump), kOk);
    EXPECT_EVENTS(Traced("Extend Unknown: 28 => 30\n"));
}

TEST_P(Extend, FileWithoutAForkIsRefused) {
    Open(20, 3);
    Tree().fileId = kBadBlockFileId;
    EXPECT_EQ(GrowTo(21), kErrInvalid);
    EXPECT_EVENTS(Traced("***** velk_assert src/hfs/fshfs, 1090\n"),
                  Reported(kReasonInvalid, 9427));
    ExpectUntouched(20, 17);
}

TEST_P(Extend, RefusedResizeChangesNothing) {
    Open(20, 3);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kResize, 1);
    EXPECT_EQ(GrowTo(21), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, 4047));
    EXPECT_EQ(volume->fs.nesting, 0u);
    ExpectUntouched(20, 17);
}

TEST_P(Extend, ForkOfAnotherSizePrintsAndGoesOn) {
    Open(20, 3);
    volume->liesAboutSize = true;
    EXPECT_EQ(GrowTo(21), kOk);
    EXPECT_EVENTS(Asserted(4050));
    EXPECT_EQ(Tree().header.totalNodes, 21u);
}

TEST_P(Extend, RingInTheMapChainEndsWithAStatus) {
    Open(HeadBits() + 10, 3);
    Poke32(1, kDescFLink, 1);
    EXPECT_EQ(GrowTo(HeadBits() + 11), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9401), Reported(kErrCorrupt, 3980));
    ExpectUntouched(HeadBits() + 10, HeadBits() + 7);
}

TEST_P(Extend, MapRecordOutOfPlaceIsRefused) {
    Open(20, 3);
    Poke16(0, NodeSize() - 8, NodeSize() - 10);
    EXPECT_EQ(GrowTo(21), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonNode, 9402), Reported(kErrCorrupt, 3985));
    ExpectUntouched(20, 17);
}

TEST_P(Extend, MapTooShortForTheOldNodesIsRefused) {
    Open(HeadBits(), 3);
    Tree().header.totalNodes = HeadBits() + StepBits() + 5;
    EXPECT_EQ(GrowTo(HeadBits() + StepBits() + 6), kErrCorrupt);
    EXPECT_EVENTS(Asserted(3993), Reported(kReasonTree, 9423));
    ExpectUntouched(HeadBits() + StepBits() + 5, HeadBits() - 3);
}

TEST_P(Extend, CounterOfFreeNodesNeverWraps) {
    Open(20, 3);
    Tree().header.freeNodes = 0xFFFFFFFF;
    EXPECT_EQ(GrowTo(21), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9424));
    ExpectUntouched(20, 0xFFFFFFFF);
}

TEST_P(Extend, LongerMapPrintsAndServes) {
    Open(HeadBits() + 10, 3);
    Tree().header.totalNodes = 20;
    Tree().header.freeNodes = 17;
    EXPECT_EQ(GrowTo(21), kOk);
    EXPECT_EVENTS(Asserted(3993));
    EXPECT_EQ(Tree().header.freeNodes, 18u);
    EXPECT_EQ(Chain(), std::vector<u32>{1});
}

TEST_P(Extend, OldEndBeforeTheLastRecordIsFoundFromTheStart) {
    Open(HeadBits() + 10, 3);
    Tree().header.totalNodes = 20;
    Tree().header.freeNodes = 17;
    ASSERT_EQ(GrowTo(HeadBits() + StepBits() + 1), kOk);
    EXPECT_EVENTS(Asserted(3993));
    EXPECT_EQ(Chain(), (std::vector<u32>{1, 20}));
    EXPECT_TRUE(BitIsSet(20));
    EXPECT_TRUE(MapIsSound());
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(Extend, NewMapNodeIsWrittenOut) {
    Open(HeadBits(), 3);
    const u32 number = HeadBits();
    ASSERT_EQ(GrowTo(number + 9), kOk);
    EXPECT_EVENTS();
    Bytes expected(NodeSize());
    expected[8] = 2;      // kind
    expected[11] = 1;     // records
    expected[14] = 0x80;  // its own bit
    Put16(&expected, NodeSize() - 4, NodeSize() - 6);
    expected[NodeSize() - 1] = 14;
    EXPECT_EQ(Live(number), expected);
    EXPECT_EQ(Chain(), std::vector<u32>{number});
    EXPECT_EQ(Tree().header.totalNodes, number + 9);
    EXPECT_EQ(Tree().header.freeNodes, number - 3 + 8);
    EXPECT_TRUE(MapIsSound());
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(Extend, HeaderRecordIsRewrittenBesideTheFirstLink) {
    Open(HeadBits(), 3);
    ASSERT_EQ(GrowTo(HeadBits() + 9), kOk);
    EXPECT_EQ(Get32(Live(0), kHeadTotalNodes), HeadBits() + 9);
    EXPECT_TRUE(Tree().isDirty) << "freeNodes is not on disk yet";
    ASSERT_EQ(Tree().Flush(0), kOk);
    EXPECT_EQ(Get32(volume->DiskNode(NodeSize(), 0), kHeadFreeNodes), HeadBits() + 5);
}

TEST_P(Extend, HeaderIsSavedWhenTheMapNodeTakesAllThatIsGained) {
    Open(HeadBits(), 3);
    ASSERT_EQ(GrowTo(HeadBits() + 1), kOk);
    EXPECT_EQ(Tree().header.freeNodes, HeadBits() - 3);
    EXPECT_FALSE(Tree().isDirty);
    EXPECT_EQ(Get32(Live(0), kHeadTotalNodes), HeadBits() + 1);
    EXPECT_EQ(Get32(Live(0), kHeadFreeNodes), HeadBits() - 3);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(Extend, LastMapNodeIsLinkedAndNodeZeroLeftAlone) {
    Open(HeadBits() + StepBits(), 3);
    const u32 number = HeadBits() + StepBits();
    ASSERT_EQ(GrowTo(number + 9), kOk);
    EXPECT_EQ(Chain(), (std::vector<u32>{1, number}));
    EXPECT_EQ(ModifiedNodes(Tree()), (std::vector<u32>{1, number}));
    EXPECT_TRUE(Tree().isDirty);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(Extend, NodeZeroChangedOnceMoreIsHandedOverBehindTheOthers) {
    Open(HeadBits(), 3);
    HfsNode* taken = nullptr;
    ASSERT_EQ(Tree().AllocateNode(&taken), kOk);
    taken->refCount -= 1;
    EXPECT_EQ(ModifiedNodes(Tree()), (std::vector<u32>{0, 3}));
    ASSERT_EQ(GrowTo(HeadBits() + 9), kOk);
    EXPECT_EQ(ModifiedNodes(Tree()), (std::vector<u32>{3, 0, HeadBits()}));
}

TEST_P(Extend, BitsOfNewMapNodesRunOverIntoThem) {
    Open(HeadBits() - 1, 3);
    ASSERT_EQ(GrowTo(HeadBits() + 2 * StepBits() + 5), kOk);
    EXPECT_EQ(Chain(), (std::vector<u32>{HeadBits() - 1, HeadBits(), HeadBits() + 1}));
    EXPECT_EQ(Live(0)[NodeSize() - 9], 0x01);
    EXPECT_EQ(Live(HeadBits() - 1)[14], 0xC0);
    EXPECT_EQ(ModifiedNodes(Tree()),
              (std::vector<u32>{HeadBits(), HeadBits() + 1, 0, HeadBits() - 1}));
    EXPECT_EQ(Tree().header.freeNodes, HeadBits() + 2 * StepBits() + 5 - 3 - 3);
    EXPECT_TRUE(MapIsSound());
    EXPECT_EVENTS();
}

TEST_P(Extend, UnreadableMapPassesItsStatusOn) {
    Open(20, 3);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kMap, 1);
    EXPECT_EQ(GrowTo(21), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 9400),
                  Reported(kFaultStatus, 3980));
    ExpectUntouched(20, 17);
}

// Also one that somebody has made before.
TEST_P(Extend, NewMapNodesAreHandedOverInTheirOrderBeforeTheMapTheyHangFrom) {
    Open(20, 3);
    volume->SetFileSize(tree->fileId, Nodes(30));
    HfsNode* second = nullptr;
    ASSERT_EQ(Tree().GetINode(21, &second, true), kOk);
    second->refCount -= 1;
    EXPECT_EQ(ModifiedNodes(Tree()), std::vector<u32>{21});
    ASSERT_EQ(GrowTo(HeadBits() + StepBits() + 1), kOk);
    EXPECT_EQ(ModifiedNodes(Tree()), (std::vector<u32>{20, 21, 0}));
    EXPECT_EQ(Chain(), (std::vector<u32>{20, 21}));
}

TEST_P(Extend, LastRecordThatRefusesWritingPassesItsStatusOn) {
    hasJournal = true;
    Open(HeadBits(), 3);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kWriteAccess, 1);
    EXPECT_EQ(GrowTo(HeadBits() + 9), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 4088));
    EXPECT_EQ(Get32(Live(0), kDescFLink), 0u);
}

TEST_P(Extend, NewMapNodeThatCannotBeMadePassesItsStatusOn) {
    hasJournal = true;
    for (const Call call : {Call::kMap, Call::kCreateAccess}) {
        Open(HeadBits(), 3);
        Touch(0);
        FaultService faults(&volume->fs);
        faults.Fail(call, 1);
        EXPECT_EQ(GrowTo(HeadBits() + 9), kFaultStatus);
        EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 4104));
        EXPECT_TRUE(LedgerHolds(Tree(), 0));
    }
}

TEST_P(Extend, EveryFailingCallLeavesTheTotalNewAndTheFreeOld) {
    hasJournal = true;
    bool failed = true;
    for (u32 nth = 1; failed; ++nth) {
        Open(HeadBits() - 1, 3);
        FaultService faults(&volume->fs);
        faults.FailAny(nth);
        const int status = GrowTo(HeadBits() + 9);
        failed = faults.HasFailed();
        EXPECT_EQ(status, failed ? kFaultStatus : kOk) << "call " << nth;
        EXPECT_TRUE(LedgerHolds(Tree(), 0)) << "call " << nth;
        if (failed) {
            const bool hasGrown = !volume->resizes.empty();
            EXPECT_EQ(Tree().header.totalNodes, hasGrown ? HeadBits() + 9 : HeadBits() - 1);
            EXPECT_EQ(Tree().header.freeNodes, HeadBits() - 4) << "call " << nth;
            EXPECT_EQ(Tree().isDirty, hasGrown) << "call " << nth;
        }
        EXPECT_TRUE(failed || nth > 5);
        faults.FailNone();
        Tree().RestoreModifiedNodes();
        EXPECT_EQ(Tree().header.totalNodes, HeadBits() - 1);
        EXPECT_TRUE(MapIsSound());
    }
}

TEST_P(Extend, EveryFailingAllocationPassesItsStatusOn) {
    bool failed = true;
    for (u32 nth = 1; failed; ++nth) {
        Open(HeadBits() - 1, 3);
        heap.FailNth(nth);
        const int status = GrowTo(HeadBits() + 9);
        failed = heap.HasFailed();
        heap.FailNone();
        EXPECT_EQ(status, failed ? kErrNoMemory : kOk) << "allocation " << nth;
        EXPECT_TRUE(LedgerHolds(Tree(), 0)) << "allocation " << nth;
        EXPECT_TRUE(failed || nth > 2);
    }
}

class ExtendPieces : public ExtendTest {};
INSTANTIATE_GEOMETRIES(ExtendPieces, GeometriesOfSeveralBlocks);

TEST_P(ExtendPieces, PieceThatRefusesWritingPassesItsStatusOn) {
    hasJournal = true;
    Open(HeadBits() - 1, 3);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kWriteAccess, 2);
    EXPECT_EQ(GrowTo(HeadBits() + 9), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 4188));
    EXPECT_EQ(Live(0)[NodeSize() - 9], 0x00);
    EXPECT_TRUE(Tree().isDirty);
}

// Emptying a node that was empty touches its last block only.
TEST_P(ExtendPieces, DescriptorOfANodeThatWasEmptyIsMarkedBeforeItIsWritten) {
    hasJournal = true;
    Open(HeadBits(), 3);
    Bytes empty(NodeSize());
    empty.back() = 14;
    volume->PutNode(HeadBits(), empty);
    Tree().validNodes = HeadBits() + 9;
    FaultService faults(&volume->fs);
    faults.Fail(Call::kWriteAccess, 3);
    EXPECT_EQ(GrowTo(HeadBits() + 9), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 9425));
    EXPECT_EQ(Live(HeadBits()), empty);
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

// Growth across the capacity of the map, for every node size.
class ExtendCapacity : public ExtendTest {
protected:
    void CrossOneNodeAtATime(u32 capacity) {
        Open(capacity - 2, 3);
        for (u32 wanted = capacity - 1; wanted <= capacity + 10; ++wanted) {
            ASSERT_EQ(GrowTo(wanted), kOk);
            ASSERT_EQ(Tree().header.totalNodes, wanted);
            ASSERT_TRUE(MapIsSound());
        }
        EXPECT_EVENTS();
        ASSERT_EQ(Tree().Flush(0), kOk);
        ASSERT_EQ(Tree().Init(), kOk);
        EXPECT_EQ(Tree().header.totalNodes, capacity + 10);
        EXPECT_TRUE(MapIsSound());
    }
};
INSTANTIATE_GEOMETRIES(ExtendCapacity, AllNodeSizes);

TEST_P(ExtendCapacity, FirstMapNodeComesWithTheFirstNodePastTheHeaderRecord) {
    CrossOneNodeAtATime(HeadBits());
    EXPECT_EQ(Chain(), std::vector<u32>{HeadBits()});
}

TEST_P(ExtendCapacity, SecondMapNodeComesWithTheFirstNodePastTheFirst) {
    CrossOneNodeAtATime(HeadBits() + StepBits());
    EXPECT_EQ(Chain(), (std::vector<u32>{1, HeadBits() + StepBits()}));
}

TEST_P(ExtendCapacity, AnyNumberOfMissingBitsIsCovered) {
    struct Case {
        u32 missing;
        std::size_t mapNodes;
    };
    const Case cases[] = {
        {1, 1},
        {2, 1},
        {7, 1},
        {8, 1},
        {9, 1},
        {15, 1},
        {StepBits(), 1},
        {StepBits() + 1, 2},
        {StepBits() + 7, 2},
        {StepBits() * 2, 2},
        {StepBits() * 2 + 1, 3},
    };
    for (const Case& one : cases) {
        Open(HeadBits() - 20, 3);
        ASSERT_EQ(GrowTo(HeadBits() + one.missing), kOk);
        EXPECT_EQ(Chain().size(), one.mapNodes) << one.missing;
        EXPECT_EQ(Chain().front(), HeadBits() - 20);
        EXPECT_TRUE(MapIsSound()) << one.missing;
    }
}

}  // namespace
}  // namespace VELK::test
