// Creating trees: the header node byte by byte, the first sizes, and what a failure undoes.
#include "sparse_volume.h"

namespace VELK::test {
namespace {

#define EXPECT_EVENTS(...) EXPECT_EQ(capture.Take(), (Events{__VA_ARGS__}))

class CreateTest : public SparseTreeTest {
protected:
    u32 Shift() const { return static_cast<u32>(__builtin_ctz(NodeSize())); }
    u64 Nodes(u64 count) { return count * NodeSize(); }
    HfsFork* Fork() { return volume->fs.ForkOf(tree->fileId); }

    int Create() { return Tree().Create(Shift(), 0, nullptr); }
    int CreateOf(unsigned long long size) { return Tree().Create(Shift(), 0, &size); }

    // A volume of 1024 blocks, a block to a node: clumps of 8 nodes.
    void MakeSmallVolume(u32 fileId) { MakeVolume(1024, fileId); }
    void SetCatalogConstants() {
        Tree().compareKeys = CompareCatKeysCaseIns;
        Tree().header.maxKeyLength = kCatMaxKeyLength;
        Tree().header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
        Tree().keyCompareType = kKeyCompareFolding;
    }
    // Nothing asked of the volume, nothing cached.
    void ExpectNothingDone() {
        EXPECT_EQ(volume->resizes, std::vector<u64>{});
        EXPECT_EQ(Tree().nodeCount, 0u);
        EXPECT_EQ(Tree().scratch, nullptr);
    }
    // The fork is empty again and no node is held.
    void ExpectUndone() {
        EXPECT_EQ(Fork()->logicalSize, 0u);
        EXPECT_EQ(Fork()->totalBlocks, 0u);
        EXPECT_EQ(volume->fs.nesting, 0u);
        EXPECT_TRUE(LedgerHolds(Tree(), 0));
    }
};

class CreateTree : public CreateTest {};
INSTANTIATE_GEOMETRIES(CreateTree, MapGeometries);

TEST_P(CreateTree, HeaderNodeIsWrittenOut) {
    MakeSmallVolume(kCatalogFileId);
    SetCatalogConstants();
    Tree().btreeType = 0x80;
    ASSERT_EQ(CreateOf(Nodes(16)), kOk);
    EXPECT_EVENTS();
    ASSERT_EQ(Tree().Flush(0), kOk);
    Bytes expected(NodeSize());
    expected[8] = 1;   // kind
    expected[11] = 3;  // records
    Put16(&expected, 32, NodeSize());
    Put16(&expected, 34, 516);
    Put32(&expected, 36, 16);
    Put32(&expected, 40, 15);
    Put32(&expected, 46, 8 * NodeSize());
    expected[50] = 0x80;
    expected[51] = 0xCF;
    Put32(&expected, 52, 6);
    expected[248] = 0x80;
    Put16(&expected, NodeSize() - 8, NodeSize() - 8);
    Put16(&expected, NodeSize() - 6, 248);
    Put16(&expected, NodeSize() - 4, 120);
    Put16(&expected, NodeSize() - 2, 14);
    EXPECT_EQ(volume->DiskNode(NodeSize(), 0), expected);
}

TEST_P(CreateTree, AttributesTreeBringsItsOwnConstants) {
    MakeSmallVolume(kAttributesFileId);
    Tree().keyCompareType = 9;
    ASSERT_EQ(Create(), kOk);
    EXPECT_EQ(Tree().compareKeys, &CompareAttrKeys);
    EXPECT_EQ(Tree().header.maxKeyLength, 266u);
    EXPECT_EQ(Tree().header.attributes, 6u);
    EXPECT_EQ(Tree().keyCompareType, 0);
    EXPECT_EQ(Live(0)[51], 0);
}

TEST_P(CreateTree, WithoutASizeOneClumpIsMade) {
    MakeSmallVolume(kAttributesFileId);
    ASSERT_EQ(Create(), kOk);
    EXPECT_EQ(volume->resizes, (std::vector<u64>{Nodes(8), Nodes(8)}));
    EXPECT_EQ(Tree().header.clumpSize, 8 * NodeSize());
    EXPECT_EQ(Tree().header.totalNodes, 8u);
    EXPECT_EQ(Tree().header.freeNodes, 7u);
    EXPECT_TRUE(Tree().isDirty);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(CreateTree, SizeBelowAClumpGrowsToAWholeOne) {
    MakeSmallVolume(kAttributesFileId);
    ASSERT_EQ(CreateOf(Nodes(3)), kOk);
    EXPECT_EQ(volume->resizes, (std::vector<u64>{Nodes(3), Nodes(8)}));
    EXPECT_EQ(Tree().header.totalNodes, 8u);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(CreateTree, SizeAboveAClumpGrowsToWholeOnes) {
    MakeSmallVolume(kAttributesFileId);
    ASSERT_EQ(CreateOf(Nodes(17)), kOk);
    EXPECT_EQ(volume->resizes, (std::vector<u64>{Nodes(17), Nodes(24)}));
    EXPECT_EQ(Tree().header.freeNodes, 23u);
}

TEST_P(CreateTree, NodeZeroIsReleasedAndTheScratchBufferThere) {
    MakeSmallVolume(kAttributesFileId);
    ASSERT_EQ(Create(), kOk);
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
    ASSERT_NE(Tree().scratch, nullptr);
    EXPECT_EQ(Tree().scratchHalf, Tree().scratch + NodeSize() / 2);
    Tree().scratch[NodeSize() - 1] = 1;
}

TEST_P(CreateTree, CreatedTreeOpens) {
    for (const u32 fileId : {kExtentsFileId, kCatalogFileId, kAttributesFileId}) {
        MakeSmallVolume(fileId);
        SetCatalogConstants();
        ASSERT_EQ(Create(), kOk);
        ASSERT_EQ(Tree().Flush(4), kOk);
        CBTreeHfs opened;
        opened.volume = &volume->fs;
        opened.fileId = fileId;
        ASSERT_EQ(opened.Init(), kOk);
        EXPECT_EQ(opened.header.totalNodes, 8u);
        EXPECT_EQ(opened.header.freeNodes, 7u);
        EXPECT_EQ(opened.header.treeDepth, 0u);
        EXPECT_EQ(opened.header.rootNode, 0u);
        opened.Dtor();
    }
}

TEST_P(CreateTree, CreatedTreeHandsOutItsNodes) {
    MakeSmallVolume(kCatalogFileId);
    SetCatalogConstants();
    ASSERT_EQ(Create(), kOk);
    HfsNode* node = nullptr;
    for (u32 number = 1; number < 8; ++number) {
        ASSERT_EQ(Tree().AllocateNode(&node), kOk);
        EXPECT_EQ(node->nodeNum, number);
        node->refCount -= 1;
    }
    EXPECT_EQ(Tree().AllocateNode(&node), kErrNoSpace);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(CreateTree, TreeThatIsCreatedAgainHandsOutItsFirstNodeFirst) {
    MakeSmallVolume(kCatalogFileId);
    SetCatalogConstants();
    for (int time = 0; time < 2; ++time) {
        ASSERT_EQ(Create(), kOk);
        for (u32 number = 1; number < 4; ++number) {
            HfsNode* node = nullptr;
            ASSERT_EQ(Tree().AllocateNode(&node), kOk);
            EXPECT_EQ(node->nodeNum, number);
            node->refCount -= 1;
        }
        ASSERT_EQ(Tree().Flush(0), kOk);
        Tree().Dtor();
    }
}

TEST_P(CreateTree, NodeSizesOutOfRangeAreRefused) {
    for (const unsigned shift : {0u, 8u, 16u, 0xFFFFFFFFu}) {
        for (const u32 fileId : {kAttributesFileId, kCatalogFileId}) {
            MakeSmallVolume(fileId);
            Tree().compareKeys = CompareCatKeysCaseIns;
            EXPECT_EQ(Tree().Create(shift, 0, nullptr), kErrInvalid);
            EXPECT_EVENTS(Reported(kReasonUnknown, 5302));
            ExpectNothingDone();
        }
    }
}

TEST_P(CreateTree, OtherTreesNeedAComparator) {
    MakeSmallVolume(kCatalogFileId);
    EXPECT_EQ(Create(), kErrInvalid);
    EXPECT_EVENTS(Reported(kReasonUnknown, 5302));
    ExpectNothingDone();
}

TEST_P(CreateTree, RefusedFirstSizePassesItsStatusOn) {
    MakeSmallVolume(kAttributesFileId);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kResize, 1);
    EXPECT_EQ(Create(), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, 5326));
    ExpectNothingDone();
}

TEST_P(CreateTree, UnreadableNodeZeroEmptiesTheFork) {
    MakeSmallVolume(kAttributesFileId);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kMap, 1);
    EXPECT_EQ(Create(), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 5338));
    EXPECT_EQ(volume->resizes, (std::vector<u64>{Nodes(8), 0}));
    ExpectUndone();
}

TEST_P(CreateTree, SizeOfNothingFailsCleanly) {
    MakeSmallVolume(kAttributesFileId);
    EXPECT_EQ(CreateOf(0), kSparseNoRange);
    EXPECT_EVENTS(Reported(kSparseNoRange, kAnySite), Reported(kSparseNoRange, 5338));
    EXPECT_EQ(volume->resizes, (std::vector<u64>{0, 0}));
    ExpectUndone();
}

TEST_P(CreateTree, FailedGrowthEmptiesTheFork) {
    MakeSmallVolume(kAttributesFileId);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kResize, 2);
    EXPECT_EQ(Create(), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, 4047), Reported(kFaultStatus, 5378));
    EXPECT_EQ(volume->resizes, (std::vector<u64>{Nodes(8), 0}));
    ExpectUndone();
    EXPECT_EQ(Tree().scratch, nullptr);
}

TEST_P(CreateTree, ForkThatCannotBeEmptiedOnlyPrints) {
    MakeSmallVolume(kAttributesFileId);
    FaultService faults(&volume->fs);
    faults.Fail(Call::kResize, 2, kFaultStatus, true);
    EXPECT_EQ(Create(), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, 4047), Reported(kFaultStatus, 5378), Asserted(5393));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(CreateTree, WithoutMemoryForNodeZeroTheForkIsEmptied) {
    MakeSmallVolume(kAttributesFileId);
    heap.FailNth(1);
    EXPECT_EQ(Create(), kErrNoMemory);
    EXPECT_EVENTS(Reported(kErrNoMemory, 5338));
    ExpectUndone();
}

TEST_P(CreateTree, WithoutMemoryForTheScratchBufferTheTreeStands) {
    MakeSmallVolume(kAttributesFileId);
    heap.FailNth(2);
    EXPECT_EQ(Create(), kErrNoMemory);
    EXPECT_EVENTS();
    EXPECT_EQ(Fork()->logicalSize, Nodes(8));
    EXPECT_EQ(Tree().header.totalNodes, 8u);
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

// Emptying node 0 goes on, with an assertion, when the journal refuses; every other refusal undoes
// the creation.
TEST_P(CreateTree, EveryFailingCallIsUndone) {
    hasJournal = true;
    bool failed = true;
    for (u32 nth = 1; failed; ++nth) {
        MakeVolume(0x10000 + HeadBits(), kAttributesFileId);
        FaultService faults(&volume->fs);
        faults.FailAny(nth);
        const int status = CreateOf(Nodes(HeadBits() + 5));
        failed = faults.HasFailed();
        const bool ended = failed && capture.Assertions().empty();
        EXPECT_EQ(status, ended ? kFaultStatus : kOk) << "call " << nth;
        if (ended) {
            ExpectUndone();
        } else {
            EXPECT_TRUE(MapIsSound());
        }
        EXPECT_TRUE(failed || nth > 5);
    }
}

class CreateTreePieces : public CreateTest {};
INSTANTIATE_GEOMETRIES(CreateTreePieces, GeometriesOfSeveralBlocks);

TEST_P(CreateTreePieces, NodeSmallerThanAMapBlockIsRefused) {
    MakeSmallVolume(kAttributesFileId);
    volume->fs.mapBlockShift = 10;
    volume->fs.mapBlockSize = 1024;
    EXPECT_EQ(Tree().Create(9, 0, nullptr), kErrInvalid);
    EXPECT_EVENTS(Reported(kReasonInvalid, 5317));
    capture.TraceAll();
    EXPECT_EQ(Tree().Create(9, 0, nullptr), kErrInvalid);
    EXPECT_EVENTS(Traced("r=8: node size 200 < map block 400\n"), Reported(kReasonInvalid, 5317));
    ExpectNothingDone();
}

// Node 0 comes empty from the disk: only its last block is marked by emptying it.
TEST_P(CreateTreePieces, HeaderNodeThatRefusesWritingEmptiesTheFork) {
    hasJournal = true;
    MakeSmallVolume(kAttributesFileId);
    volume->stale = 0;
    FaultService faults(&volume->fs);
    faults.Fail(Call::kWriteAccess, 2);
    EXPECT_EQ(Create(), kFaultStatus);
    EXPECT_EVENTS(Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 5340));
    EXPECT_EQ(volume->resizes, (std::vector<u64>{Nodes(8), 0}));
    ExpectUndone();
}

class CreateLarge : public CreateTest {};
INSTANTIATE_GEOMETRIES(CreateLarge, AllNodeSizes);

TEST_P(CreateLarge, MapNodesComeWithALargeSize) {
    MakeVolume(0x200000, kAttributesFileId);
    const u32 wanted = HeadBits() + StepBits() + 1;
    ASSERT_EQ(CreateOf(Nodes(wanted)), kOk);
    EXPECT_GE(Tree().header.totalNodes, wanted);
    EXPECT_EQ(Get32(Live(0), kDescFLink), 1u);
    EXPECT_EQ(Get32(Live(1), kDescFLink), 2u);
    EXPECT_EQ(Live(0)[248], 0xE0);
    EXPECT_TRUE(MapIsSound());
    ASSERT_EQ(Tree().Flush(0), kOk);
    ASSERT_EQ(Tree().Init(), kOk);
    EXPECT_TRUE(MapIsSound());
}

TEST_P(CreateLarge, CapacityAloneNeedsNoMapNode) {
    allocBlockSize = NodeSize();
    MakeVolume(HeadBits() * 2, kAttributesFileId);
    const unsigned long long size = Nodes(HeadBits());
    Tree().volume->volumeSize = 0;  // clumps of 8 nodes
    ASSERT_EQ(Tree().Create(Shift(), 0, &size), kOk);
    EXPECT_EQ(Tree().header.totalNodes, HeadBits());
    EXPECT_EQ(Tree().header.freeNodes, HeadBits() - 1);
    EXPECT_EQ(Get32(Live(0), kDescFLink), 0u);
    EXPECT_TRUE(MapIsSound());
}

class CreateOfOneGibibyte : public CreateTest {};
INSTANTIATE_TEST_SUITE_P(Geometry, CreateOfOneGibibyte,
                         ::testing::Values(Geometry{4096, 4096}, Geometry{4096, 512}),
                         GeometryName);

TEST_P(CreateOfOneGibibyte, AttributesTreeGetsAClumpOfFourMebibytes) {
    MakeVolume(262144, kAttributesFileId);
    ASSERT_EQ(Create(), kOk);
    EXPECT_EVENTS();
    EXPECT_EQ(Tree().header.clumpSize, 4194304u);
    EXPECT_EQ(volume->FileSize(), 4194304u);
    EXPECT_EQ(Tree().header.totalNodes, 1024u);
    EXPECT_EQ(Tree().header.freeNodes, 1023u);
    Bytes map(3840);
    map[0] = 0x80;
    const Bytes head = Live(0);
    EXPECT_EQ(Bytes(head.begin() + 248, head.begin() + 4088), map);
}

TEST_P(CreateOfOneGibibyte, OtherTreesPrintThatTheTableIsNotTheirs) {
    MakeVolume(262144, kCatalogFileId);
    SetCatalogConstants();
    ASSERT_EQ(Create(), kOk);
    EXPECT_EVENTS(Asserted(5220));
    EXPECT_EQ(Tree().header.totalNodes, 1024u);
}

}  // namespace
}  // namespace VELK::test
