// Opening a tree: geometry, the checks of the header record one by one, comparator and repair.
#include <gtest/gtest.h>

#include "bench.h"

namespace VELK::test {
namespace {

class OpenGeometry : public GeometryTest {
protected:
    OpenGeometry() : bench_(Blocks(GetParam())) {}
    Bench bench_;
};

TEST_P(OpenGeometry, NodeSizeGivesShiftAndBlocks) {
    bench_.Load(SmallTree(NodeSize()));
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(1u << bench_->nodeShift, NodeSize());
    EXPECT_EQ(bench_->header.nodeSize, NodeSize());
    EXPECT_EQ(bench_->header.blockSize, MapBlock());
    EXPECT_EQ(bench_->header.blockMask, MapBlock() - 1);
    EXPECT_EQ(1u << bench_->header.blockShift, MapBlock());
    EXPECT_EQ(bench_->header.blocksPerNode, GetParam().Blocks());
    EXPECT_EQ(bench_->header.cache, &bench_.volume.fs.cache);
    EXPECT_EQ(bench_.capture.All(), Events{});
}

TEST_P(OpenGeometry, ReadsOneBlockAndKeepsNothingCached) {
    bench_.Load(SmallTree(NodeSize()));
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_.volume.TakeCalls(),
              (std::vector<CallRecord>{{Call::kMap, 0, MapBlock(), false},
                                       {Call::kRelease, 0, 0, false}}));
    EXPECT_EQ(bench_->nodeRoot, nullptr);
    EXPECT_EQ(bench_->nodeCount, 0u);
    EXPECT_EQ(bench_->readCount, 1u);
    EXPECT_EQ(bench_->maxNodeCount, 1u);
    EXPECT_EQ(bench_->hitCount, 0u);
    EXPECT_EQ(bench_.volume.Lent(), 0u);
}

TEST_P(OpenGeometry, ScratchIsOneNode) {
    bench_.Load(SmallTree(NodeSize()));
    EXPECT_EQ(bench_->Init(), kOk);
    ASSERT_NE(bench_->scratch, nullptr);
    EXPECT_EQ(bench_->scratchHalf, bench_->scratch + NodeSize() / 2);
    bench_->scratch[NodeSize() - 1] = 1;
}

INSTANTIATE_GEOMETRIES(OpenGeometry, AllGeometries);

class OpenTest : public ::testing::Test {
protected:
    void Load(u32 fileId = kCatalogFileId) {
        bench_->fileId = fileId;
        bench_->convert = ConvertFor(fileId);
        bench_.Load(SmallTree(512, 3, fileId));
    }
    void Patch32(u32 offset, u32 value) { Put32(&Disk(), offset, value); }
    void Patch16(u32 offset, u32 value) { Put16(&Disk(), offset, value); }
    void Patch8(u32 offset, u32 value) { Disk()[offset] = static_cast<u8>(value); }
    Bytes& Disk() { return bench_.volume.Disk(bench_->fileId); }

    // Init fails with reason 14, 0xA000011C and this trace, and the same without traces.
    void ExpectBadHeader(const std::string& trace) {
        EXPECT_EQ(bench_->Init(), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonHeader, kAnySite)});
        bench_.capture.TraceAll();
        EXPECT_EQ(bench_->Init(), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(),
                  (Events{Traced(trace), Reported(kReasonHeader, kAnySite)}));
    }

    Bench bench_{Blocks(512)};
};

// ---- what is read

TEST_F(OpenTest, TheHeaderRecordComesInHostOrder) {
    Load();
    Patch16(14, 0x0002);
    Patch32(20, 0x11223344);
    Patch32(46, 0xA1B2C3D4);
    Patch16(34, 0x0123);
    Patch8(50, 0x80);
    Patch8(51, 0xCF);
    EXPECT_EQ(bench_->Init(), kOk);
    const BTHeaderMem& header = bench_->header;
    EXPECT_EQ(header.treeDepth, 2);
    EXPECT_EQ(header.rootNode, bench_.image.rootNode);
    EXPECT_EQ(header.leafRecords, 0x11223344u);
    EXPECT_EQ(header.firstLeafNode, 1u);
    EXPECT_EQ(header.lastLeafNode, 3u);
    EXPECT_EQ(header.maxKeyLength, 0x0123);
    EXPECT_EQ(header.totalNodes, 13u);
    EXPECT_EQ(header.freeNodes, 8u);
    EXPECT_EQ(header.clumpSize, 0xA1B2C3D4u);
    EXPECT_EQ(header.attributes, 6u);
    EXPECT_EQ(bench_->btreeType, 0x80);
    EXPECT_EQ(bench_->keyCompareType, 0xCF);
}

TEST_F(OpenTest, AllNodesOfTheFileCountAsInitialised) {
    Load();
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_->validNodes, 13u);
    EXPECT_FALSE(bench_->IsDirty());
}

TEST_F(OpenTest, TheTraceNamesTheTree) {
    bench_.capture.TraceAll();
    Load();
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Traced("CatTree nodes: total d, free 8, size 200\n")});
    Load(kExtentsFileId);
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Traced("ExtTree nodes: total d, free 8, size 200\n")});
    Load(kAttributesFileId);
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Traced("AttTree nodes: total d, free 8, size 200\n")});
}

TEST_F(OpenTest, AnEmptyTreeOpens) {
    TreeShape shape;
    bench_.Load(BuildTree(shape, {}));
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_->header.rootNode, 0u);
    EXPECT_EQ(bench_->header.treeDepth, 0);
}

// ---- node geometry

TEST_F(OpenTest, EightBlocksOf512MakeANodeOf4096) {
    bench_.Load(SmallTree(4096));
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_->header.blocksPerNode, 8u);
    EXPECT_EQ(bench_->nodeShift, 12u);
}

TEST(OpenBlocks, ANodeSmallerThanABlockIsRefused) {
    Bench bench(Blocks(4096));
    bench.Load(SmallTree(512));
    bench.volume.Disk(4).resize(8192);
    EXPECT_EQ(bench->Init(), kErrInvalid);
    EXPECT_EQ(bench.capture.Take(), Events{Reported(kReasonInvalid, kAnySite)});
    bench.capture.TraceAll();
    EXPECT_EQ(bench->Init(), kErrInvalid);
    EXPECT_EQ(bench.capture.Take(), (Events{Traced("r=4: node size 200 < map block 1000\n"),
                                            Reported(kReasonInvalid, kAnySite)}));
}

TEST(OpenBlocks, ANodeSizeOfZeroIsRefused) {
    Bench bench(Blocks(512));
    bench.Load(SmallTree(512));
    Put16(&bench.volume.Disk(4), 32, 0);
    EXPECT_EQ(bench->Init(), kErrInvalid);
    EXPECT_EQ(bench.capture.Take(), Events{Reported(kReasonInvalid, kAnySite)});
}

TEST(OpenBlocks, ANodeSizeBelow512IsRefused) {
    Bench bench(Blocks(256));
    bench.Load(SmallTree(512));
    Put16(&bench.volume.Disk(4), 32, 256);
    EXPECT_EQ(bench->Init(), kErrCorrupt);
    EXPECT_EQ(bench.capture.Take(), Events{Reported(kReasonHeader, kAnySite)});
    bench.capture.TraceAll();
    EXPECT_EQ(bench->Init(), kErrCorrupt);
    EXPECT_EQ(bench.capture.Take(),
              (Events{Traced("Unsupported node size 256\n"), Reported(kReasonHeader, kAnySite)}));
}

TEST_F(OpenTest, ANodeSizeThatIsNoPowerOfTwoOpensAfterAnAssertion) {
    for (const u32 nodeSize : {513u, 1000u, 1536u, 3000u, 65535u}) {
        Load();
        Patch16(32, nodeSize);
        EXPECT_EQ(bench_->Init(), kOk) << nodeSize;
        EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2278)});
        EXPECT_EQ(bench_->nodeShift, 9u);
        EXPECT_EQ(bench_->header.blocksPerNode, nodeSize / 512);
    }
}

TEST_F(OpenTest, NoNodeOfATreeWithABrokenBlockIsHandedOut) {
    for (const u32 nodeSize : {513u, 1000u, 3000u, 65535u}) {
        Load();
        Patch16(32, nodeSize);
        EXPECT_EQ(bench_->Init(), kOk);
        HfsNode* node = nullptr;
        for (const u32 number : {0u, 1u, 12u}) {
            EXPECT_EQ(bench_->GetINode(number, &node, false), kErrCorrupt);
            EXPECT_EQ(bench_->GetINode(number, &node, true), kErrCorrupt);
            EXPECT_EQ(node, nullptr);
        }
        EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
    }
}

// ---- header checks, each on its own

TEST_F(OpenTest, SmallKeysAreRefused) {
    Load();
    Patch32(52, 4);
    ExpectBadHeader("HFS+ tree must use big keys\n");
}

TEST_F(OpenTest, FreeNodesMustBeBelowTotalNodes) {
    Load();
    Patch32(40, 13);
    ExpectBadHeader("HFS+ tree header: (f=d, r=4, fL=1, lL=3) >= total d\n");
}

TEST_F(OpenTest, RootNodeMustBeBelowTotalNodes) {
    Load();
    Patch32(16, 13);
    ExpectBadHeader("HFS+ tree header: (f=8, r=d, fL=1, lL=3) >= total d\n");
}

TEST_F(OpenTest, FirstLeafMustBeBelowTotalNodes) {
    Load();
    Patch32(24, 0xFFFFFFFF);
    ExpectBadHeader("HFS+ tree header: (f=8, r=4, fL=ffffffff, lL=3) >= total d\n");
}

TEST_F(OpenTest, LastLeafMustBeBelowTotalNodes) {
    Load();
    Patch32(28, 13);
    ExpectBadHeader("HFS+ tree header: (f=8, r=4, fL=1, lL=d) >= total d\n");
}

TEST_F(OpenTest, ATreeOfNoNodesIsRefused) {
    Load();
    Patch32(36, 0);
    ExpectBadHeader("HFS+ tree header: (f=8, r=4, fL=1, lL=3) >= total 0\n");
}

TEST_F(OpenTest, NumbersJustBelowTotalNodesOpen) {
    for (const u32 offset : {16u, 24u, 28u, 40u}) {
        Load();
        Patch32(offset, 12);
        EXPECT_EQ(bench_->Init(), kOk) << offset;
    }
}

TEST_F(OpenTest, Depth16Opens) {
    Load();
    Patch16(14, 16);
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_.capture.All(), Events{});
}

TEST_F(OpenTest, Depth17IsRefused) {
    Load();
    Patch16(14, 17);
    ExpectBadHeader("HFS+ tree depth 11 is too big (max=10)\n");
}

TEST_F(OpenTest, TypesOfOtherTreesOpen) {
    for (const u32 type : {0x00u, 0x80u, 0xFFu}) {
        Load();
        Patch8(50, type);
        EXPECT_EQ(bench_->Init(), kOk) << type;
    }
}

TEST_F(OpenTest, UnknownTypesAreRefused) {
    Load();
    Patch8(50, 0x01);
    ExpectBadHeader("Unknown HFS+ tree type 1\n");
}

TEST_F(OpenTest, EveryOtherTypeIsRefused) {
    for (u32 type = 1; type < 0xFF; ++type) {
        if (type != 0x80) {
            Load();
            Patch8(50, type);
            ASSERT_EQ(bench_->Init(), kErrCorrupt) << type;
        }
    }
}

TEST_F(OpenTest, OtherFilesAreNoTrees) {
    for (const u32 fileId : {6u, 7u}) {
        bench_->fileId = fileId;
        bench_.Load(SmallTree(512));
        bench_.capture.TraceAll();
        EXPECT_EQ(bench_->Init(), kErrInvalid);
        EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonUnknown, kAnySite)});
    }
}

TEST_F(OpenTest, TotalNodesMayFillTheFork) {
    Load();
    EXPECT_EQ(bench_.volume.fs.catalogFork.totalBlocks, 13u);
    EXPECT_EQ(bench_->Init(), kOk);
}

TEST_F(OpenTest, TotalNodesMustNotExceedTheFork) {
    Load();
    bench_.volume.fs.catalogFork.totalBlocks = 12;
    ExpectBadHeader("HFS+ tree total nodes d is out of logical size c nodes\n");
}

TEST_F(OpenTest, TheForksSizeIsComputedIn64Bits) {
    Load();
    bench_.volume.fs.catalogFork.totalBlocks = 0x01000000;  // x 512: 2^33 bytes
    Patch32(36, 0x01000000);
    EXPECT_EQ(bench_->Init(), kOk);
    Load();
    Patch32(36, 0x01000001);
    bench_.volume.fs.catalogFork.totalBlocks = 0x01000000;
    ExpectBadHeader("HFS+ tree total nodes 1000001 is out of logical size 1000000 nodes\n");
}

// ---- comparator and attributes

TEST_F(OpenTest, TheCatalogFoldsCase) {
    Load();
    Patch8(51, 0xBC);
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_->compareKeys, CompareCatKeysCaseIns);
}

TEST_F(OpenTest, TheCatalogOfACaseSensitiveVolumeComparesBinary) {
    bench_.volume.fs.version = kVersionHfsx;
    Load();
    Patch8(51, 0xBC);
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_->compareKeys, CompareCatKeysCaseBin);
}

TEST_F(OpenTest, ACaseSensitiveVolumeMayFoldCaseAllTheSame) {
    bench_.volume.fs.version = kVersionHfsx;
    for (const u32 type : {0x00u, 0xCFu, 0xBDu}) {
        Load();
        Patch8(51, type);
        EXPECT_EQ(bench_->Init(), kOk);
        EXPECT_EQ(bench_->compareKeys, CompareCatKeysCaseIns) << type;
    }
}

TEST_F(OpenTest, ExtentsAndAttributesHaveTheirOwnOrder) {
    Load(kExtentsFileId);
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_->compareKeys, CompareExtentKeysPlus);
    Load(kAttributesFileId);
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_->compareKeys, CompareAttrKeys);
}

TEST_F(OpenTest, AMissingVariableKeysFlagIsRepairedInMemory) {
    for (const u32 fileId : {kCatalogFileId, kAttributesFileId}) {
        Load(fileId);
        Patch32(52, 0x00000012);
        const Bytes before = Disk();
        EXPECT_EQ(bench_->Init(), kOk);
        EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2340)});
        EXPECT_EQ(bench_->header.attributes, 0x16u);
        EXPECT_FALSE(bench_->IsDirty());
        EXPECT_EQ(Disk(), before);
    }
}

TEST_F(OpenTest, ExtentsTreesHaveFixedIndexKeys) {
    Load(kExtentsFileId);
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_->header.attributes, 2u);
    EXPECT_EQ(bench_.capture.All(), Events{});
}

// ---- faults

TEST_F(OpenTest, AnUnreadableHeaderIsReportedByCacheAndInit) {
    Load();
    bench_.faults.Fail(Call::kMap, 1);
    EXPECT_EQ(bench_->Init(), kFaultStatus);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, kAnySite)}));
    EXPECT_EQ(bench_->nodeCount, 0u);
    EXPECT_EQ(bench_->readCount, 0u);
}

TEST_F(OpenTest, NoMemoryForNodeZeroIsReportedByInitOnly) {
    Load();
    bench_.heap.FailNth(1);
    EXPECT_EQ(bench_->Init(), kErrNoMemory);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kErrNoMemory, kAnySite)});
}

TEST_F(OpenTest, NoMemoryForScratchIsNotReported) {
    Load();
    bench_.heap.FailNth(2);
    EXPECT_EQ(bench_->Init(), kErrNoMemory);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(bench_->scratch, nullptr);
}

TEST_F(OpenTest, OpeningTakesTwoAllocations) {
    Load();
    EXPECT_EQ(bench_->Init(), kOk);
    EXPECT_EQ(bench_.heap.Allocations(), 2u);
    EXPECT_EQ(bench_.heap.Live(), 1u);
}

TEST_F(OpenTest, AFailedOpenLeavesNothingLentAndCanBeTornDown) {
    for (const u32 offset : {16u, 24u, 28u, 36u, 40u}) {
        Load();
        Patch32(offset, 0xFFFFFFFF);
        EXPECT_EQ(bench_->Init(), kErrCorrupt);
        EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
        bench_->Dtor();
        EXPECT_EQ(bench_.volume.Lent(), 0u);
        EXPECT_EQ(bench_.heap.Live(), 0u);
    }
}

// ---- memory size

TEST_F(OpenTest, MemorySizeCountsNodesAndObject) {
    bench_.Open(SmallTree(512));
    EXPECT_EQ(bench_->GetMemSize(false), 0u);
    EXPECT_EQ(bench_->GetMemSize(true), 520u);
    HfsNode* node = nullptr;
    bench_->GetINode(1, &node, false);
    bench_->GetINode(2, &node, false);
    EXPECT_EQ(bench_->GetMemSize(false), 2u * 592);
    EXPECT_EQ(bench_->GetMemSize(true), 2u * 592 + 520);
}

TEST_F(OpenTest, MemorySizeDoesNotWrap) {
    bench_.Open(SmallTree(512));
    bench_->nodeCount = 0x01000000;
    EXPECT_EQ(bench_->GetMemSize(true), 592ull * 0x01000000 + 520);
    bench_->nodeCount = 0;
}

TEST_F(OpenTest, IsDirtyIsTheFlag) {
    EXPECT_FALSE(bench_->IsDirty());
    bench_->isDirty = true;
    EXPECT_TRUE(bench_->IsDirty());
}

TEST(OpenAlignment, AMisalignedBlockIsAsserted) {
    MemVolumeOptions options;
    options.misalign = 4;
    Bench bench(options);
    bench.Load(SmallTree(512));
    EXPECT_EQ(bench->Init(), kOk);
    EXPECT_EQ(bench.capture.Take(), Events{Asserted(2156)});
    bench->isDirty = true;
    EXPECT_EQ(bench->Flush(0), kOk);
    EXPECT_EQ(bench.capture.Take(), Events{Asserted(2186)});
}

}  // namespace
}  // namespace VELK::test
