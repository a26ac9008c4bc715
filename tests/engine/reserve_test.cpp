// Reserving nodes: the worst case by depth, growth for it, the part of the volume kept back, and
// reservations that nest.
#include <algorithm>

#include "sparse_volume.h"

namespace VELK::test {
namespace {

#define EXPECT_EVENTS(...) EXPECT_EQ(capture.Take(), (Events{__VA_ARGS__}))

constexpr int Request(u32 low, u32 high) {
    return static_cast<int>(low | (high << 16));
}

class Reserve : public SparseTreeTest {
protected:
    int Ask(u32 low, u32 high) { return Tree().ReserveSpace(Request(low, high), &reserve_); }
    HfsFork* Fork() { return volume->fs.ForkOf(tree->fileId); }
    u64 Nodes(u64 count) { return count * NodeSize(); }

    // A tree of 20 nodes, all but `freeNodes` in use, on a volume of 1600 blocks, a block to a
    // node: 100 blocks are kept back. `spare` blocks are left beyond them.
    void OpenWithSpare(u32 freeNodes, u32 spare) {
        MakeVolume(1600);
        Open(20, 20 - freeNodes);
        volume->UseBlocks(1600 - 20 - 100 - spare);
        Fork()->clumpSize = NodeSize();
    }
    void ExpectRefused(u32 freeNodes) {
        EXPECT_EQ(volume->resizes, std::vector<u64>{});
        EXPECT_EQ(Tree().header.freeNodes, freeNodes);
        EXPECT_FALSE(Tree().reservationOpen);
        EXPECT_EQ(Tree().reservedNodes, 0u);
        EXPECT_TRUE(LedgerHolds(Tree(), 0));
    }

    BTReserve reserve_{77, 78, false};
};
INSTANTIATE_GEOMETRIES(Reserve, MapGeometries);

TEST_P(Reserve, WorstCaseFollowsTheDepth) {
    struct Case {
        u16 depth;
        u32 low;
        u32 high;
        u32 nodes;
    };
    const Case cases[] = {
        {0, 0, 0, 1},  {0, 1, 0, 2},   {1, 1, 0, 2}, {1, 5, 9, 6},  {2, 1, 0, 2},
        {2, 3, 7, 4},  {3, 1, 1, 4},   {3, 0, 2, 3}, {4, 2, 3, 13}, {5, 0, 2, 7},
        {5, 7, 0, 29}, {16, 1, 1, 30}, {4, 0, 0, 1},
    };
    Open(500, 3);
    for (const Case& one : cases) {
        Tree().header.treeDepth = one.depth;
        ASSERT_EQ(Ask(one.low, one.high), kOk);
        EXPECT_EQ(reserve_.nodes, one.nodes) << one.depth << ' ' << one.low << ' ' << one.high;
        Tree().ReleaseSpace(&reserve_);
    }
    EXPECT_EQ(volume->resizes, std::vector<u64>{});
    EXPECT_EVENTS();
}

TEST_P(Reserve, FirstOneOpensTheReservation) {
    Open(20, 3);
    Tree().reservationUsed = 9;
    ASSERT_EQ(Ask(4, 0), kOk);
    EXPECT_EQ(reserve_.nodes, 5u);
    EXPECT_EQ(reserve_.used, 0u);
    EXPECT_TRUE(reserve_.owner);
    EXPECT_TRUE(Tree().reservationOpen);
    EXPECT_EQ(Tree().reservedNodes, 5u);
    EXPECT_EQ(Tree().reservationUsed, 0u);
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, SecondOneJoinsIt) {
    Open(20, 3);
    ASSERT_EQ(Ask(4, 0), kOk);
    BTReserve second{77, 78, true};
    ASSERT_EQ(Tree().ReserveSpace(Request(2, 0), &second), kOk);
    EXPECT_FALSE(second.owner);
    EXPECT_EQ(second.nodes, 77u);
    EXPECT_EQ(second.used, 78u);
    EXPECT_EQ(Tree().reservedNodes, 8u);
    Tree().ReleaseSpace(&second);
    EXPECT_TRUE(Tree().reservationOpen);
    EXPECT_EQ(Tree().reservedNodes, 8u);
    Tree().ReleaseSpace(&reserve_);
    EXPECT_FALSE(Tree().reservationOpen);
    EXPECT_EQ(Tree().reservedNodes, 0u);
}

TEST_P(Reserve, ReleasingAgainDoesNotCloseTheNextOne) {
    Open(20, 3);
    ASSERT_EQ(Ask(4, 0), kOk);
    Tree().ReleaseSpace(&reserve_);
    BTReserve next{};
    ASSERT_EQ(Tree().ReserveSpace(Request(1, 0), &next), kOk);
    Tree().ReleaseSpace(&reserve_);
    Tree().ReleaseSpace(nullptr);
    EXPECT_TRUE(Tree().reservationOpen);
    EXPECT_EQ(Tree().reservedNodes, 2u);
    Tree().ReleaseSpace(&next);
}

TEST_P(Reserve, WithoutARecordOnlyTheFileGrows) {
    Open(20, 18);
    Fork()->clumpSize = NodeSize();
    ASSERT_EQ(Tree().ReserveSpace(Request(4, 0), nullptr), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(23)});
    EXPECT_FALSE(Tree().reservationOpen);
    EXPECT_EQ(Tree().reservedNodes, 0u);
    ASSERT_EQ(Ask(1, 0), kOk);
    ASSERT_EQ(Tree().ReserveSpace(Request(1, 0), nullptr), kOk);
    EXPECT_EQ(Tree().reservedNodes, 2u);
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, OpenReservationThatCountsNodesAlreadyPrints) {
    Open(20, 3);
    Tree().reservedNodes = 5;
    ASSERT_EQ(Ask(1, 0), kOk);
    EXPECT_EVENTS(Asserted(3930));
    EXPECT_EQ(Tree().reservedNodes, 2u);
    Tree().ReleaseSpace(&reserve_);
}

// What nobody has reserved is not added to.
TEST_P(Reserve, NodesCountedWithoutAReservationRefuseNothing) {
    Open(20, 3);
    Fork()->clumpSize = NodeSize();
    Tree().reservedNodes = 0xFFFFFFFF;
    ASSERT_EQ(Ask(1, 0), kOk);
    EXPECT_EVENTS(Asserted(3930));
    EXPECT_EQ(Tree().reservedNodes, 2u);
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, AllThatIsAvailableNeedsNoGrowth) {
    Open(20, 15);
    ASSERT_EQ(Ask(4, 0), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{});
    Tree().ReleaseSpace(&reserve_);
    Fork()->clumpSize = NodeSize();
    ASSERT_EQ(Ask(5, 0), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(21)});
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, NodesPromisedToOthersAreNotAvailable) {
    Open(20, 10);
    Fork()->clumpSize = NodeSize();
    ASSERT_EQ(Ask(5, 0), kOk);
    BTReserve second{};
    ASSERT_EQ(Tree().ReserveSpace(Request(5, 0), &second), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(22)});
    EXPECT_EQ(Tree().header.freeNodes, 12u);
    EXPECT_EQ(Tree().reservedNodes, 12u);
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, WhenMoreIsPromisedThanFreeNothingIsAvailable) {
    Open(20, 10);
    Fork()->clumpSize = NodeSize();
    ASSERT_EQ(Ask(5, 0), kOk);
    for (int i = 0; i < 8; ++i) {
        HfsNode* node = nullptr;
        ASSERT_EQ(Tree().AllocateNode(&node), kOk);
        node->refCount -= 1;
    }
    BTReserve second{};
    ASSERT_EQ(Tree().ReserveSpace(Request(2, 0), &second), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(23)});
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, GrowsInClumpsOfTheFork) {
    Open(20, 18);
    Fork()->clumpSize = 8 * NodeSize();
    ASSERT_EQ(Ask(4, 0), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(24)});
    EXPECT_EQ(Tree().header.freeNodes, 6u);
    EXPECT_TRUE(MapIsSound());
    EXPECT_EVENTS();
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, NewMapNodeIsCountedInTheGrowth) {
    Open(HeadBits() - 1, HeadBits() - 3);
    Fork()->clumpSize = NodeSize();
    ASSERT_EQ(Ask(4, 0), kOk);
    EXPECT_EQ(Tree().header.totalNodes, HeadBits() + 3);
    EXPECT_EQ(Tree().header.freeNodes, 5u);
    EXPECT_TRUE(MapIsSound());
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, VolumeAtItsFloorRefusesPlainRequests) {
    OpenWithSpare(2, 0);
    EXPECT_EQ(Ask(4, 0), kErrNoSpace);
    EXPECT_EVENTS(Reported(kReasonReserve, 3887));
    ExpectRefused(2);
    EXPECT_EQ(reserve_.nodes, 77u);
}

TEST_P(Reserve, OneBlockAboveTheFloorServes) {
    OpenWithSpare(4, 1);
    ASSERT_EQ(Ask(4, 0), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(21)});
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, BelowTheFloorNothingIsSpareEither) {
    OpenWithSpare(2, 0);
    volume->UseBlocks(1600 - 20 - 50);
    EXPECT_EQ(Ask(4, 0), kErrNoSpace);
    EXPECT_EVENTS(Reported(kReasonReserve, 3887));
    ExpectRefused(2);
}

TEST_P(Reserve, FloorIsNeverAbove250MiB) {
    const u32 total = 0x400000;
    MakeVolume(total);
    Open(20, 18);
    volume->UseBlocks(total - 20 - std::min(total / 16, 262144000 / NodeSize()));
    EXPECT_EQ(Ask(4, 0), kErrNoSpace);
    EXPECT_EVENTS(Reported(kReasonReserve, 3887));
    ExpectRefused(2);
}

TEST_P(Reserve, UrgentRequestsGrowIntoTheFloorByDefaultClumps) {
    OpenWithSpare(2, 0);
    volume->fs.defaultClumpSize = 7 * NodeSize();
    Tree().header.treeDepth = 3;
    ASSERT_EQ(Ask(1, 1), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(28)});
    EXPECT_EVENTS();
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, RequestForNothingGrowsIntoTheFloor) {
    OpenWithSpare(0, 0);
    volume->fs.defaultClumpSize = NodeSize();
    ASSERT_EQ(Ask(0, 0), kOk);
    EXPECT_EQ(reserve_.nodes, 1u);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(21)});
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, FewerSpareBlocksThanMissingNodesRefusePlainRequests) {
    OpenWithSpare(2, 2);
    Fork()->clumpSize = 64 * NodeSize();
    EXPECT_EQ(Ask(4, 0), kErrNoSpace);
    EXPECT_EVENTS(Reported(kReasonReserve, 3901));
    ExpectRefused(2);
}

TEST_P(Reserve, SpareBlocksSmallerThanAClumpAreTheStep) {
    OpenWithSpare(2, 5);
    Fork()->clumpSize = 64 * NodeSize();
    ASSERT_EQ(Ask(3, 0), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(25)});
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, UrgentRequestsTakeTheSpareBlocksAsStepAndGoOn) {
    OpenWithSpare(0, 2);
    Fork()->clumpSize = 64 * NodeSize();
    Tree().header.treeDepth = 3;
    ASSERT_EQ(Ask(1, 1), kOk);
    EXPECT_EQ(volume->resizes, std::vector<u64>{Nodes(24)});
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, LargestRequestDoesNotWrap) {
    MakeVolume(100000);
    Open(20, 18);
    Fork()->clumpSize = 0xFFFF8000;
    Tree().header.treeDepth = 16;
    EXPECT_EQ(Ask(65535, 0), kErrNoSpace);
    EXPECT_EVENTS(Reported(kReasonReserve, 3901));
    ExpectRefused(2);
}

TEST_P(Reserve, FailedGrowthRecordsNothing) {
    Open(20, 18);
    Fork()->clumpSize = NodeSize();
    FaultService faults(&volume->fs);
    faults.Fail(Call::kResize, 1);
    EXPECT_EQ(Ask(4, 0), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, 4047), Reported(kFaultStatus, 3916));
    ExpectRefused(2);
}

TEST_P(Reserve, FileWithoutAForkIsRefused) {
    Open(20, 18);
    for (const u32 fileId : {0u, 2u, kBadBlockFileId, 9u, 0xFFFFFFFFu}) {
        Tree().fileId = fileId;
        EXPECT_EQ(Ask(4, 0), kErrInvalid);
        EXPECT_EVENTS(Traced("***** velk_assert src/hfs/fshfs, 1090\n"),
                      Reported(kReasonInvalid, 9430));
        ExpectRefused(2);
    }
    Tree().fileId = kAttributesFileId;
}

TEST_P(Reserve, MoreNodesThanNumbersAreRefused) {
    Open(20, 18);
    Fork()->clumpSize = NodeSize();
    Tree().header.totalNodes = 0xFFFFFFFE;
    EXPECT_EQ(Ask(4, 0), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9431));
    ExpectRefused(2);
}

TEST_P(Reserve, PromisesNeverWrap) {
    Open(20, 3);
    ASSERT_EQ(Ask(1, 0), kOk);
    Tree().reservedNodes = 0xFFFFFFFE;
    BTReserve second{};
    EXPECT_EQ(Tree().ReserveSpace(Request(1, 0), &second), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9432));
    EXPECT_EQ(volume->resizes, std::vector<u64>{});
    EXPECT_EQ(Tree().reservedNodes, 0xFFFFFFFEu);
    Tree().ReleaseSpace(&reserve_);
}

TEST_P(Reserve, EveryFailingCallRecordsNothing) {
    hasJournal = true;
    bool failed = true;
    for (u32 nth = 1; failed; ++nth) {
        Open(HeadBits() - 1, HeadBits() - 3);
        Fork()->clumpSize = NodeSize();
        FaultService faults(&volume->fs);
        faults.FailAny(nth);
        const int status = Ask(4, 0);
        failed = faults.HasFailed();
        EXPECT_EQ(status, failed ? kFaultStatus : kOk) << "call " << nth;
        EXPECT_EQ(Tree().reservationOpen, !failed) << "call " << nth;
        EXPECT_TRUE(LedgerHolds(Tree(), 0)) << "call " << nth;
        EXPECT_TRUE(failed || nth > 5);
        if (failed) {
            EXPECT_EQ(capture.Take().back(), Reported(kFaultStatus, 3916));
        }
        Tree().ReleaseSpace(&reserve_);
    }
}

}  // namespace
}  // namespace VELK::test
