// Throwing all unsaved changes away.
#include <gtest/gtest.h>

#include "bench.h"

namespace VELK::test {
namespace {

class RestoreTest : public ::testing::Test {
protected:
    RestoreTest() : bench_(Blocks(512)) { bench_.Open(SmallTree(1024)); }

    HfsNode* Get(u32 nodeNum) {
        HfsNode* node = nullptr;
        EXPECT_EQ(bench_->GetINode(nodeNum, &node, false), kOk);
        return node;
    }
    void Change(u32 nodeNum, u32 offset, u8 value) {
        HfsNode* node = Get(nodeNum);
        EXPECT_EQ(bench_->SetDirty(node, offset), kOk);
        node->bufs[offset / 512].data[offset % 512] = value;
        node->refCount = 0;
    }

    Bench bench_;
};

TEST_F(RestoreTest, ChangesOfNodesAreGone) {
    Change(1, 100, 0x99);
    bench_->RestoreModifiedNodes();
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2380)});
    EXPECT_EQ(Get(1)->bufs[0].data[100], bench_.image.Node(1)[100]);
    EXPECT_EQ(bench_.volume.Count(Call::kDirtyMeta), 0u);
    EXPECT_EQ(bench_.volume.Disk(4), bench_.image.bytes);
}

TEST_F(RestoreTest, TheHeaderIsThatOfTheDisk) {
    const BTHeaderMem before = bench_->header;
    bench_->header.rootNode = 7;
    bench_->header.leafRecords = 0;
    bench_->header.firstLeafNode = 9;
    bench_->header.lastLeafNode = 9;
    bench_->header.totalNodes = 99;
    bench_->header.freeNodes = 1;
    bench_->header.clumpSize = 1;
    bench_->header.treeDepth = 7;
    bench_->header.maxKeyLength = 3;
    bench_->btreeType = 0x80;
    bench_->keyCompareType = 0xBC;
    bench_->isDirty = true;
    bench_->RestoreModifiedNodes();
    const BTHeaderMem& after = bench_->header;
    EXPECT_EQ(after.rootNode, before.rootNode);
    EXPECT_EQ(after.leafRecords, before.leafRecords);
    EXPECT_EQ(after.firstLeafNode, before.firstLeafNode);
    EXPECT_EQ(after.lastLeafNode, before.lastLeafNode);
    EXPECT_EQ(after.totalNodes, before.totalNodes);
    EXPECT_EQ(after.freeNodes, before.freeNodes);
    EXPECT_EQ(after.clumpSize, before.clumpSize);
    EXPECT_EQ(after.treeDepth, before.treeDepth);
    EXPECT_EQ(after.maxKeyLength, before.maxKeyLength);
    EXPECT_EQ(bench_->btreeType, 0);
    EXPECT_EQ(bench_->keyCompareType, 0);
    EXPECT_FALSE(bench_->IsDirty());
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(RestoreTest, GeometryValidNodesAndComparatorAreKept) {
    bench_->validNodes = 6;
    bench_->compareKeys = CompareCatKeysCaseBin;
    bench_->RestoreModifiedNodes();
    EXPECT_EQ(bench_->validNodes, 6u);
    EXPECT_EQ(bench_->compareKeys, CompareCatKeysCaseBin);
    EXPECT_EQ(bench_->nodeShift, 10u);
    EXPECT_EQ(bench_->header.blocksPerNode, 2u);
    EXPECT_EQ(bench_->header.blockSize, 512u);
    EXPECT_EQ(bench_->header.cache, &bench_.volume.fs.cache);
}

TEST_F(RestoreTest, NodeZeroStaysCachedWithoutReferences) {
    bench_->RestoreModifiedNodes();
    ASSERT_NE(CachedNode(*bench_.tree, 0), nullptr);
    EXPECT_EQ(CachedNode(*bench_.tree, 0)->refCount, 0);
    EXPECT_EQ(bench_->nodeCount, 1u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
}

TEST_F(RestoreTest, AllOtherNodesLeaveTheCache) {
    Get(1);
    Get(2);
    bench_->findData.path[1].node = Get(3);
    bench_->RestoreModifiedNodes();
    EXPECT_EQ(bench_->nodeCount, 1u);
    EXPECT_EQ(References(bench_->findData), 0u);
    EXPECT_EQ(bench_.volume.Lent(), 2u);
}

TEST_F(RestoreTest, AnUnreadableHeaderLeavesEverythingAsItWas) {
    bench_->header.leafRecords = 0x99;
    bench_->isDirty = true;
    bench_.faults.Fail(Call::kMap, 1);
    bench_->RestoreModifiedNodes();
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kFaultStatus, kAnySite)});
    EXPECT_EQ(bench_->header.leafRecords, 0x99u);
    EXPECT_TRUE(bench_->IsDirty());
    EXPECT_EQ(bench_->nodeCount, 0u);
}

TEST_F(RestoreTest, NoMemoryForTheHeaderLeavesEverythingAsItWas) {
    bench_->isDirty = true;
    bench_.heap.FailNth(1);
    bench_->RestoreModifiedNodes();
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_TRUE(bench_->IsDirty());
    bench_->RestoreModifiedNodes();
    EXPECT_FALSE(bench_->IsDirty());
}

TEST_F(RestoreTest, TheScratchBufferIsThereAgain) {
    bench_->RestoreModifiedNodes();
    ASSERT_NE(bench_->scratch, nullptr);
    EXPECT_EQ(bench_->scratchHalf, bench_->scratch + 512);
    bench_->scratch[1023] = 1;
}

TEST_F(RestoreTest, ALookupWorksAfterARestore) {
    bench_->RestoreModifiedNodes();
    const HostKey key = NthHostKey(4, 3);
    u8 record[8];
    u32 size = 0;
    EXPECT_EQ(bench_->FindRecord(key.Get(), key.id, record, 8, &size, nullptr), kOk);
    EXPECT_EQ(size, 8u);
    EXPECT_EQ(Bytes(record, record + 8), Pattern(8, 3));
}

TEST_F(RestoreTest, TheRepairOfTheAttributesIsMadeAgain) {
    Put32(&bench_.volume.Disk(4), 52, 2);
    bench_->RestoreModifiedNodes();
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2340)});
    EXPECT_EQ(bench_->header.attributes, 6u);
}

TEST_F(RestoreTest, AHeaderOfAnotherNodeSizeIsNotTakenOver) {
    for (const u32 nodeSize : {0u, 512u, 2048u, 1025u, 65535u}) {
        Put16(&bench_.volume.Disk(4), 32, nodeSize);
        Put32(&bench_.volume.Disk(4), 20, 0x77);
        bench_.volume.Disk(4)[51] = 0xBC;
        bench_->isDirty = true;
        bench_->RestoreModifiedNodes();
        EXPECT_EQ(bench_->header.nodeSize, 1024u);
        EXPECT_EQ(bench_->header.leafRecords, 6u);
        EXPECT_EQ(bench_->keyCompareType, 0);
        EXPECT_TRUE(bench_->IsDirty());
    }
}

// Nothing was unsaved, but memory and disk disagree now: the volume has to learn of it.
TEST_F(RestoreTest, AHeaderOfAnotherNodeSizeLeavesTheTreeDirty) {
    Put16(&bench_.volume.Disk(4), 32, 2048);
    bench_->RestoreModifiedNodes();
    EXPECT_TRUE(bench_->IsDirty());
}

TEST_F(RestoreTest, AnOpenReservationIsAsserted) {
    bench_->reservationOpen = true;
    bench_->RestoreModifiedNodes();
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2377)});
    bench_->reservationOpen = false;
}

TEST_F(RestoreTest, RestoringAgainAndAgainIsHarmless) {
    for (int round = 0; round < 3; ++round) {
        Change(2, 40, 0x42);
        bench_->RestoreModifiedNodes();
        EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
        EXPECT_EQ(bench_.volume.Lent(), 2u);
        EXPECT_EQ(bench_.heap.Live(), 2u);
    }
}

}  // namespace
}  // namespace VELK::test
