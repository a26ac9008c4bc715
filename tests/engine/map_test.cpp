// The allocation map: its capacity, the chain of its records, taking a node and giving it back.
#include <cstring>

#include "sparse_volume.h"

namespace VELK::test {
namespace {

u32 MapBitsFor(u32 nodeSize, u32 totalNodes) {
    CBTreeHfs tree;
    tree.header.nodeSize = nodeSize;
    tree.header.totalNodes = totalNodes;
    return tree.CalcMapBits();
}

TEST(CalcMapBits, HeaderRecordAloneServesUpToItsCapacity) {
    EXPECT_EQ(MapBitsFor(512, 0), 2048u);
    EXPECT_EQ(MapBitsFor(512, 1), 2048u);
    EXPECT_EQ(MapBitsFor(512, 2048), 2048u);
    EXPECT_EQ(MapBitsFor(1024, 6144), 6144u);
    EXPECT_EQ(MapBitsFor(2048, 14336), 14336u);
    EXPECT_EQ(MapBitsFor(4096, 30720), 30720u);
    EXPECT_EQ(MapBitsFor(8192, 63488), 63488u);
    EXPECT_EQ(MapBitsFor(16384, 129024), 129024u);
    EXPECT_EQ(MapBitsFor(32768, 260096), 260096u);
}

TEST(CalcMapBits, OneNodeMoreAddsAWholeMapNode) {
    EXPECT_EQ(MapBitsFor(512, 2049), 5984u);
    EXPECT_EQ(MapBitsFor(1024, 6145), 14176u);
    EXPECT_EQ(MapBitsFor(2048, 14337), 30560u);
    EXPECT_EQ(MapBitsFor(4096, 30721), 63328u);
    EXPECT_EQ(MapBitsFor(8192, 63489), 128864u);
    EXPECT_EQ(MapBitsFor(16384, 129025), 259936u);
    EXPECT_EQ(MapBitsFor(32768, 260097), 522080u);
}

TEST(CalcMapBits, SecondMapNodeFollowsWhenTheFirstIsFull) {
    EXPECT_EQ(MapBitsFor(512, 5984), 5984u);
    EXPECT_EQ(MapBitsFor(512, 5985), 9920u);
}

TEST(CalcMapBits, NearTheLargestNumberEndsAndKeepsTheLow32Bits) {
    EXPECT_EQ(MapBitsFor(512, 0xFFFFFFFF), 1888u);
    EXPECT_EQ(MapBitsFor(512, 0xFFFFF000), 4294965248u);
    EXPECT_EQ(MapBitsFor(4096, 0xFFFFFFFF), 26144u);
    EXPECT_EQ(MapBitsFor(32768, 0xFFFFFFFF), 258496u);
}

TEST(CalcMapBits, TreeWithoutNodeSizeHasNone) {
    EXPECT_EQ(MapBitsFor(0, 5), 0u);
    EXPECT_EQ(MapBitsFor(20, 5), 0u);
}

// What a failed walk leaves: no event but these, no reference.
#define EXPECT_EVENTS(...) EXPECT_EQ(capture.Take(), (Events{__VA_ARGS__}))

class MapChain : public SparseTreeTest {};
INSTANTIATE_GEOMETRIES(MapChain, MapGeometries);

TEST_P(MapChain, BeginsAtTheHeaderNode) {
    Open(20, 1);
    HfsNode* node = nullptr;
    ASSERT_EQ(Tree().GetMapNode(&node), kOk);
    EXPECT_EQ(node->nodeNum, 0u);
    EXPECT_TRUE(LedgerHolds(Tree(), 1));
    node->refCount -= 1;
    EXPECT_EVENTS();
}

TEST_P(MapChain, StepsOnAndGivesTheOldNodeBack) {
    Open(HeadBits() + 1, 1);
    HfsNode* node = nullptr;
    ASSERT_EQ(Tree().GetMapNode(&node), kOk);
    ASSERT_EQ(Tree().GetMapNode(&node), kOk);
    EXPECT_EQ(node->nodeNum, 1u);
    EXPECT_TRUE(LedgerHolds(Tree(), 1));
    node->refCount -= 1;
}

TEST_P(MapChain, EndsWithAStatus) {
    Open(20, 1);
    HfsNode* node = nullptr;
    ASSERT_EQ(Tree().GetMapNode(&node), kOk);
    EXPECT_EQ(Tree().GetMapNode(&node), kErrCorrupt);
    EXPECT_EQ(node, nullptr);
    EXPECT_EVENTS(Reported(kReasonTree, 3626));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(MapChain, HeaderNodeOfAnotherKindIsRefused) {
    Open(20, 1);
    Poke8(0, kDescKind, static_cast<u8>(kBTMapNode));
    HfsNode* node = nullptr;
    EXPECT_EQ(Tree().GetMapNode(&node), kErrCorrupt);
    EXPECT_EQ(node, nullptr);
    EXPECT_EVENTS(Reported(kReasonTree, 3651));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(MapChain, MapNodeOfAnotherKindIsRefused) {
    Open(HeadBits() + 1, 1);
    Poke8(1, kDescKind, 0xFF);
    HfsNode* node = nullptr;
    ASSERT_EQ(Tree().GetMapNode(&node), kOk);
    EXPECT_EQ(Tree().GetMapNode(&node), kErrCorrupt);
    EXPECT_EQ(node, nullptr);
    EXPECT_EVENTS(Reported(kReasonTree, 3651));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(MapChain, UnreadableNodePassesItsStatusOn) {
    Open(HeadBits() + 1, 1);
    FaultService faults(&volume->fs);
    HfsNode* node = nullptr;
    ASSERT_EQ(Tree().GetMapNode(&node), kOk);
    faults.Fail(Call::kMap, 1);
    EXPECT_EQ(Tree().GetMapNode(&node), kFaultStatus);
    EXPECT_EQ(node, nullptr);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 9400));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(MapChain, LinkPastTheLastNodeIsRefused) {
    Open(20, 1);
    Poke32(0, kDescFLink, 20);
    HfsNode* node = nullptr;
    ASSERT_EQ(Tree().GetMapNode(&node), kOk);
    EXPECT_EQ(Tree().GetMapNode(&node), kErrCorrupt);
    EXPECT_EVENTS(Asserted(2638), Reported(kErrCorrupt, 9400));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

class MapAllocate : public SparseTreeTest {
protected:
    int Allocate() { return Tree().AllocateNode(&node_); }
    u32 Taken() {
        const u32 number = node_->nodeNum;
        node_->refCount -= 1;
        node_ = nullptr;
        return number;
    }
    // Nothing was taken: no node out, no count changed, no reference left.
    void ExpectUntouched(u32 freeNodes) {
        EXPECT_EQ(node_, nullptr);
        EXPECT_EQ(Tree().header.freeNodes, freeNodes);
        EXPECT_EQ(ModifiedNodes(Tree()), std::vector<u32>{});
        EXPECT_TRUE(LedgerHolds(Tree(), 0));
    }

    HfsNode* node_ = nullptr;
};
INSTANTIATE_GEOMETRIES(MapAllocate, MapGeometries);

// Where the map record lies in several blocks, the header record in the first of them.
class MapAllocatePieces : public MapAllocate {};
INSTANTIATE_GEOMETRIES(MapAllocatePieces, GeometriesOfSeveralBlocks);

TEST_P(MapAllocate, TakesTheLowestFreeNodeEmpty) {
    Open(20, 3);
    ASSERT_EQ(Allocate(), kOk);
    EXPECT_EQ(node_->nodeNum, 3u);
    EXPECT_EQ(node_->refCount, 1);
    Bytes empty(NodeSize());
    empty.back() = 0x0E;
    EXPECT_EQ(Live(3), empty);
    EXPECT_EQ(Live(0)[248], 0xF0);
    EXPECT_TRUE(LedgerHolds(Tree(), 1));
    Taken();
    EXPECT_EVENTS();
}

TEST_P(MapAllocate, WritesTheHeaderRecordAtOnce) {
    Open(20, 3);
    Tree().header.leafRecords = 0x01020304;
    Tree().isDirty = true;
    ASSERT_EQ(Allocate(), kOk);
    Taken();
    EXPECT_EQ(Tree().header.freeNodes, 16u);
    EXPECT_EQ(Get32(Live(0), kHeadFreeNodes), 16u);
    EXPECT_EQ(Get32(Live(0), kHeadLeafRecords), 0x01020304u);
    EXPECT_FALSE(Tree().isDirty);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(MapAllocate, FreedNodeIsTakenAgainWhenNoLowerOneIsFree) {
    Open(20, 3);
    for (const u32 number : {3u, 4u, 5u, 6u}) {
        ASSERT_EQ(Allocate(), kOk);
        EXPECT_EQ(Taken(), number);
    }
    ASSERT_EQ(Tree().FreeNode(4), kOk);
    ASSERT_EQ(Allocate(), kOk);
    EXPECT_EQ(Taken(), 4u);
    ASSERT_EQ(Allocate(), kOk);
    EXPECT_EQ(Taken(), 7u);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(MapAllocate, LastNodeIsTakenAndThenThereIsNone) {
    Open(20, 19);
    ASSERT_EQ(Allocate(), kOk);
    EXPECT_EQ(Taken(), 19u);
    EXPECT_EQ(Allocate(), kErrNoSpace);
    EXPECT_EQ(node_, nullptr);
    EXPECT_EQ(Tree().header.freeNodes, 0u);
    EXPECT_EVENTS();
}

TEST_P(MapAllocate, ClearBitsPastTheLastNodeAreNoNodes) {
    Open(20, 20);
    EXPECT_EQ(Allocate(), kErrNoSpace);
    EXPECT_EVENTS();
    ExpectUntouched(0);
}

TEST_P(MapAllocatePieces, FirstBitOfEveryPieceIsFound) {
    for (u32 block = 1; block < GetParam().Blocks(); ++block) {
        const u32 used = (MapBlock() * block - 248) * 8;
        Open(used + 8, used);
        ASSERT_EQ(Allocate(), kOk);
        EXPECT_EQ(Taken(), used);
        EXPECT_EQ(Live(0)[MapBlock() * block], 0x80);
        const HfsNode* head = CachedNode(Tree(), 0);
        for (u32 b = 0; b < GetParam().Blocks(); ++b) {
            EXPECT_EQ(head->bufs[b].dirty, b == 0 || b == block) << "block " << b;
        }
    }
}

TEST_P(MapAllocate, LastBitOfTheHeaderRecordIsFound) {
    Open(HeadBits(), HeadBits() - 1);
    ASSERT_EQ(Allocate(), kOk);
    EXPECT_EQ(Taken(), HeadBits() - 1);
    EXPECT_EQ(Live(0)[NodeSize() - 9], 0xFF);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(MapAllocate, BitInAMapNodeLeavesTheHeaderUnsaved) {
    Open(HeadBits() + 10, HeadBits());
    ASSERT_EQ(Allocate(), kOk);
    EXPECT_EQ(Taken(), HeadBits());
    EXPECT_EQ(Live(1)[14], 0x80);
    EXPECT_TRUE(Tree().isDirty);
    EXPECT_EQ(ModifiedNodes(Tree()), (std::vector<u32>{1, HeadBits()}));
    EXPECT_EQ(Get32(Live(0), kHeadFreeNodes), 10u) << "header on disk before the flush";
    ASSERT_EQ(Tree().Flush(0), kOk);
    EXPECT_EQ(Get32(volume->DiskNode(NodeSize(), 0), kHeadFreeNodes), 9u);
}

TEST_P(MapAllocate, AMapNodeChangedOnceMoreIsTheLastToHandOver) {
    Open(HeadBits() + 10, HeadBits());
    for (u32 n = 0; n < 2; ++n) {
        ASSERT_EQ(Allocate(), kOk);
        Taken();
    }
    EXPECT_EQ(ModifiedNodes(Tree()), (std::vector<u32>{HeadBits(), 1, HeadBits() + 1}));
    EXPECT_EQ(Live(1)[14], 0xC0);
}

TEST_P(MapAllocate, SecondMapNodeIsFound) {
    Open(HeadBits() + StepBits() + 10, HeadBits() + StepBits() + 9);
    ASSERT_EQ(Allocate(), kOk);
    EXPECT_EQ(Taken(), HeadBits() + StepBits() + 9);
    EXPECT_EQ(Live(2)[15], 0xC0);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(MapAllocate, FullChainEndsWithAStatus) {
    Open(HeadBits(), HeadBits());
    EXPECT_EQ(Allocate(), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 3626), Reported(kErrCorrupt, 3691));
    ExpectUntouched(0);
}

TEST_P(MapAllocate, RingOfFullMapNodesEndsWithAStatus) {
    Open(HeadBits() + StepBits() * 2, HeadBits() + StepBits() * 2);
    Poke32(2, kDescFLink, 1);
    EXPECT_EQ(Allocate(), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9401), Reported(kErrCorrupt, 3691));
    ExpectUntouched(0);
}

TEST_P(MapAllocate, MapNodeThatNamesItselfEndsWithAStatus) {
    Open(HeadBits() + StepBits(), HeadBits() + StepBits());
    Poke32(1, kDescFLink, 1);
    EXPECT_EQ(Allocate(), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9401), Reported(kErrCorrupt, 3691));
    ExpectUntouched(0);
}

TEST_P(MapAllocate, HeaderMapRecordOutOfPlaceIsRefused) {
    struct Patch {
        u32 fromEnd;
        u32 value;
    };
    const Patch patches[] = {
        {8, NodeSize() - 10},  // one byte pair short
        {8, NodeSize() - 6},   // into the offset table
        {6, 246},              // over the user data
        {6, 250},
        {6, 14},
    };
    for (const Patch& patch : patches) {
        Open(20, 3);
        Poke16(0, NodeSize() - patch.fromEnd, patch.value);
        EXPECT_EQ(Allocate(), kErrCorrupt);
        EXPECT_EVENTS(Reported(kReasonNode, 9402), Reported(kErrCorrupt, 3698));
        ExpectUntouched(17);
    }
}

TEST_P(MapAllocate, HeaderNodeWithoutTheMapRecordIsRefused) {
    Open(20, 3);
    Poke16(0, kDescNumRecords, 2);
    EXPECT_EQ(Allocate(), kErrCorrupt);
    EXPECT_EVENTS(Asserted(410), Reported(kReasonNode, 9402), Reported(kErrCorrupt, 3698));
    ExpectUntouched(17);
}

TEST_P(MapAllocate, OffsetTableThatWouldReachTheMapIsRefused) {
    for (const u32 count : {4u, 0x7FFFu, 0xFFFFu}) {
        Open(20, 3);
        Poke16(0, kDescNumRecords, count);
        Poke16(0, NodeSize() - 10, count == 4 ? 0xFFFE : 0);  // map bits where slot 4 would be
        EXPECT_EQ(Allocate(), kErrCorrupt);
        EXPECT_EVENTS(Reported(kReasonNode, 9402), Reported(kErrCorrupt, 3698));
        ExpectUntouched(17);
    }
}

TEST_P(MapAllocate, OffsetsPastTheNodeFailTheAccessor) {
    Open(20, 3);
    Poke16(0, NodeSize() - 8, 0xFFFF);
    EXPECT_EQ(Allocate(), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 3698));
    ExpectUntouched(17);
}

TEST_P(MapAllocate, MapNodeRecordOutOfPlaceIsRefused) {
    for (const u32 value : {NodeSize() - 8, NodeSize() - 4, 16u}) {
        Open(HeadBits() + 10, HeadBits());
        Poke16(1, NodeSize() - 4, value);
        EXPECT_EQ(Allocate(), kErrCorrupt);
        EXPECT_EVENTS(Reported(kReasonNode, 9402), Reported(kErrCorrupt, 3698));
        ExpectUntouched(10);
    }
    Open(HeadBits() + 10, HeadBits());
    Poke32(1, NodeSize() - 4, (NodeSize() - 4) << 16 | 16);  // as long as it should be
    EXPECT_EQ(Allocate(), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonNode, 9402), Reported(kErrCorrupt, 3698));
}

TEST_P(MapAllocate, NodeZeroIsNeverHandedOut) {
    Open(20, 3);
    Poke8(0, 248, 0x60);
    EXPECT_EQ(Allocate(), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9403));
    EXPECT_EQ(Live(0)[248], 0x60);
    ExpectUntouched(17);
}

TEST_P(MapAllocate, RootIsNeverHandedOut) {
    Open(20, 3);
    Tree().header.rootNode = 3;
    EXPECT_EQ(Allocate(), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9403));
    EXPECT_EQ(Live(0)[248], 0xE0);
    ExpectUntouched(17);
}

TEST_P(MapAllocate, CounterOfFreeNodesNeverWraps) {
    Open(20, 3);
    Tree().header.freeNodes = 0;
    EXPECT_EQ(Allocate(), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9404));
    EXPECT_EQ(Live(0)[248], 0xE0);
    ExpectUntouched(0);
}

TEST_P(MapAllocate, RefusedWriteAccessChangesNothing) {
    hasJournal = true;
    Open(20, 3);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kWriteAccess, 1);
    EXPECT_EQ(Allocate(), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 3721));
    EXPECT_EQ(Live(0)[248], 0xE0);
    ExpectUntouched(17);
}

TEST_P(MapAllocatePieces, HeaderThatCannotBeWrittenStaysUnsaved) {
    hasJournal = true;
    const u32 used = (MapBlock() - 248) * 8;
    Open(used + 8, used);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kWriteAccess, 2);
    EXPECT_EQ(Allocate(), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 3730));
    EXPECT_EQ(node_, nullptr);
    EXPECT_EQ(Tree().header.freeNodes, 7u);
    EXPECT_TRUE(BitIsSet(used));
    EXPECT_TRUE(Tree().isDirty);
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(MapAllocate, NodeThatCannotBeReadStaysTaken) {
    Open(20, 3);
    Touch(0);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kMap, 1);
    EXPECT_EQ(Allocate(), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 3743));
    EXPECT_EQ(node_, nullptr);
    EXPECT_EQ(Tree().header.freeNodes, 16u);
    EXPECT_TRUE(BitIsSet(3));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(MapAllocate, WithoutMemoryForTheNodeItStaysTaken) {
    Open(20, 3);
    Touch(0);
    heap.FailNth(1);
    EXPECT_EQ(Allocate(), kErrNoMemory);
    EXPECT_EVENTS(Reported(kErrNoMemory, 3743));
    EXPECT_TRUE(BitIsSet(3));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

// Emptying a node goes on, with an assertion, when the journal refuses; every other refusal ends
// the call.
TEST_P(MapAllocate, EveryFailingCallPassesItsStatusOnAndLeaksNothing) {
    hasJournal = true;
    bool failed = true;
    for (u32 nth = 1; failed; ++nth) {
        Open(HeadBits() + 10, HeadBits());
        FaultService faults(&volume->fs);
        faults.FailAny(nth);
        const int status = Allocate();
        failed = faults.HasFailed();
        const bool ended = failed && capture.Assertions().empty();
        EXPECT_EQ(status, ended ? kFaultStatus : kOk) << "call " << nth;
        EXPECT_EQ(node_ == nullptr, ended) << "call " << nth;
        EXPECT_TRUE(LedgerHolds(Tree(), ended ? 0 : 1)) << "call " << nth;
        if (!ended) {
            Taken();
        }
        EXPECT_TRUE(failed || nth > 4);
        faults.FailNone();
        Tree().RestoreModifiedNodes();
        EXPECT_TRUE(MapIsSound());
    }
}

class MapFree : public SparseTreeTest {
protected:
    void ExpectUntouched(u32 freeNodes) {
        EXPECT_EQ(Tree().header.freeNodes, freeNodes);
        EXPECT_EQ(ModifiedNodes(Tree()), std::vector<u32>{});
        EXPECT_FALSE(Tree().isDirty);
        EXPECT_TRUE(LedgerHolds(Tree(), 0));
    }
};
INSTANTIATE_GEOMETRIES(MapFree, MapGeometries);

// Where the map record lies in several blocks, the header record in the first of them.
class MapFreePieces : public MapFree {};
INSTANTIATE_GEOMETRIES(MapFreePieces, GeometriesOfSeveralBlocks);

TEST_P(MapFree, ClearsTheBitAndWritesTheHeaderRecordAtOnce) {
    Open(20, 10);
    Tree().isDirty = true;
    ASSERT_EQ(Tree().FreeNode(8), kOk);
    EXPECT_EQ(Live(0)[248], 0xFF);
    EXPECT_EQ(Live(0)[249], 0x40);
    EXPECT_EQ(Tree().header.freeNodes, 11u);
    EXPECT_EQ(Get32(Live(0), kHeadFreeNodes), 11u);
    EXPECT_FALSE(Tree().isDirty);
    EXPECT_TRUE(MapIsSound());
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
    EXPECT_EVENTS();
}

TEST_P(MapFree, NeitherReadsNorChangesTheNode) {
    Open(20, 10);
    const Bytes content = Pattern(NodeSize(), 5);
    volume->PutNode(8, content);
    ASSERT_EQ(Tree().FreeNode(8), kOk);
    EXPECT_EQ(CachedNode(Tree(), 8), nullptr);
    ASSERT_EQ(Tree().Flush(0), kOk);
    EXPECT_EQ(volume->DiskNode(NodeSize(), 8), content);
}

TEST_P(MapFree, LastBitOfTheHeaderRecordAndFirstOfAMapNode) {
    Open(HeadBits() + 10, HeadBits() + 10);
    ASSERT_EQ(Tree().FreeNode(HeadBits() - 1), kOk);
    EXPECT_EQ(Live(0)[NodeSize() - 9], 0xFE);
    EXPECT_FALSE(Tree().isDirty);
    ASSERT_EQ(Tree().FreeNode(HeadBits()), kOk);
    EXPECT_EQ(Live(1)[14], 0x7F);
    EXPECT_TRUE(Tree().isDirty);
    EXPECT_EQ(Tree().header.freeNodes, 2u);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(MapFreePieces, FirstBitOfEveryPieceIsFound) {
    for (u32 block = 1; block < GetParam().Blocks(); ++block) {
        const u32 number = (MapBlock() * block - 248) * 8;
        Open(number + 8, number + 1);
        ASSERT_EQ(Tree().FreeNode(number), kOk);
        EXPECT_EQ(Live(0)[MapBlock() * block], 0x00);
        EXPECT_FALSE(BitIsSet(number));
    }
}

TEST_P(MapFree, NumberPastTheLastNodeIsRefused) {
    Open(20, 10);
    EXPECT_EQ(Tree().FreeNode(20), kErrCorrupt);
    EXPECT_EVENTS(Asserted(3778), Reported(kReasonTree, 9405));
    ExpectUntouched(10);
}

TEST_P(MapFree, HeaderNodeIsNeverFreed) {
    Open(20, 10);
    EXPECT_EQ(Tree().FreeNode(0), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9406));
    ExpectUntouched(10);
}

TEST_P(MapFree, FreeNodeIsNotFreedAgain) {
    Open(20, 10);
    EXPECT_EQ(Tree().FreeNode(10), kErrCorrupt);
    EXPECT_EVENTS(Asserted(3807), Reported(kReasonTree, 9407));
    ExpectUntouched(10);
}

TEST_P(MapFree, CounterOfFreeNodesNeverWraps) {
    Open(20, 10);
    Tree().header.freeNodes = 0xFFFFFFFF;
    EXPECT_EQ(Tree().FreeNode(9), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 9408));
    ExpectUntouched(0xFFFFFFFF);
    EXPECT_TRUE(BitIsSet(9));
}

TEST_P(MapFree, MapTooShortForTheNumberEndsWithAStatus) {
    Open(HeadBits(), 10);
    Tree().header.totalNodes = HeadBits() + 10;
    EXPECT_EQ(Tree().FreeNode(HeadBits()), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 3626), Reported(kErrCorrupt, 3788));
    ExpectUntouched(HeadBits() - 10);
}

TEST_P(MapFree, MapRecordOutOfPlaceIsRefused) {
    Open(20, 10);
    Poke16(0, NodeSize() - 8, NodeSize() - 10);
    EXPECT_EQ(Tree().FreeNode(5), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonNode, 9402), Reported(kErrCorrupt, 3795));
    ExpectUntouched(10);
}

TEST_P(MapFree, RefusedWriteAccessChangesNothing) {
    hasJournal = true;
    Open(20, 10);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kWriteAccess, 1);
    EXPECT_EQ(Tree().FreeNode(5), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 3808));
    EXPECT_TRUE(BitIsSet(5));
    ExpectUntouched(10);
}

TEST_P(MapFreePieces, HeaderThatCannotBeWrittenStaysUnsaved) {
    hasJournal = true;
    const u32 number = (MapBlock() - 248) * 8;
    Open(number + 8, number + 1);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kWriteAccess, 2);
    EXPECT_EQ(Tree().FreeNode(number), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 3816));
    EXPECT_FALSE(BitIsSet(number));
    EXPECT_EQ(Tree().header.freeNodes, 8u);
    EXPECT_TRUE(Tree().isDirty);
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(MapFree, UnreadableMapPassesItsStatusOn) {
    Open(HeadBits() + 10, HeadBits() + 10);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kMap, 2);
    EXPECT_EQ(Tree().FreeNode(HeadBits()), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 9400),
                  Reported(kFaultStatus, 3788));
    ExpectUntouched(0);
}

}  // namespace
}  // namespace VELK::test
