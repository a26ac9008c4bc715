// Stepping from record to record along the leaves.
#include <gtest/gtest.h>

#include "bench.h"

namespace VELK::test {
namespace {

// The SmallTree of nine leaves: leaf n (1 .. 9) holds records 2n - 2 and 2n - 1.
constexpr u32 kRecords = 18;

class IterateTest : public GeometryTest {
protected:
    IterateTest() : bench_(Blocks(GetParam())) { bench_.Open(SmallTree(NodeSize(), 9)); }
    ~IterateTest() override { path_.ClearPath(); }

    void StandOn(u32 n, bool between = false) {
        const HostKey key = NthHostKey(4, n, between);
        bool found = false;
        EXPECT_EQ(
            bench_->FindEntry(key, key.id, &path_, &found, nullptr, nullptr, nullptr, nullptr),
            kOk);
        EXPECT_EQ(found, !between);
        bench_.Forget();
    }
    int Step(int count) {
        recordSize_ = keySize_ = 0;
        return bench_->IncPos(count, record_, 8, &recordSize_, keyOut_, 20, &keySize_, &path_);
    }
    // Number of the record last delivered; checks its key and data.
    u32 Delivered() {
        for (u32 n = 0; n < kRecords; ++n) {
            if (Bytes(record_, record_ + 8) == Pattern(8, n)) {
                const HostKey key = NthHostKey(4, n);
                EXPECT_EQ(Bytes(keyOut_, keyOut_ + 20), Bytes(key.bytes, key.bytes + 20));
                EXPECT_EQ(recordSize_, 8u);
                EXPECT_EQ(keySize_, 20u);
                return n;
            }
        }
        return kRecords;
    }
    u32 LeafNum() const { return path_.path[1].node->nodeNum; }
    s32 Index() const { return path_.path[1].index; }

    Bench bench_;
    HfsFindData path_;
    u8 record_[64] = {};
    alignas(8) u8 keyOut_[kKeyLengthSize + kMaxKeyLength] = {};
    u32 recordSize_ = 0;
    u32 keySize_ = 0;
};

// ---- forward

TEST_P(IterateTest, StayingDeliversTheRecordFound) {
    StandOn(7);
    EXPECT_EQ(Step(0), kOk);
    EXPECT_EQ(Delivered(), 7u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(IterateTest, ARecordCannotBeDeliveredNowhere) {
    StandOn(7);
    const u32 searches = path_.searchCount;
    EXPECT_EQ(bench_->IncPos(1, nullptr, 8, &recordSize_, nullptr, 0, nullptr, &path_),
              kErrInvalid);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonInvalid, 9032)});
    EXPECT_EQ(path_.searchCount, searches);
    EXPECT_EQ(Step(0), kOk);
    EXPECT_EQ(Delivered(), 7u);
}

TEST_P(IterateTest, OneStepAfterTheOtherVisitsAllRecordsInOrder) {
    StandOn(0);
    EXPECT_EQ(Step(0), kOk);
    for (u32 n = 1; n < kRecords; ++n) {
        EXPECT_EQ(Step(1), kOk);
        EXPECT_EQ(Delivered(), n);
    }
    EXPECT_EQ(Step(1), kErrNotFound);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(IterateTest, EveryDistanceForwardLandsOnItsRecord) {
    for (int count = 0; count < static_cast<int>(kRecords); ++count) {
        StandOn(0);
        EXPECT_EQ(Step(count), kOk);
        EXPECT_EQ(Delivered(), static_cast<u32>(count));
    }
}

TEST_P(IterateTest, StayingPastTheEndOfALeafMovesToTheNext) {
    StandOn(3, true);
    EXPECT_EQ(Index(), 2);
    EXPECT_EQ(Step(0), kOk);
    EXPECT_EQ(Delivered(), 4u);
    EXPECT_EQ(LeafNum(), 3u);
    EXPECT_EQ(Index(), 0);
}

TEST_P(IterateTest, StayingPastTheEndOfTheLastLeafIsTheEnd) {
    StandOn(17, true);
    EXPECT_EQ(Step(0), kErrNotFound);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(LeafNum(), 9u);
    EXPECT_EQ(Index(), 2);
}

TEST_P(IterateTest, SteppingOffTheEndKeepsThePosition) {
    StandOn(17);
    EXPECT_EQ(Step(1), kErrNotFound);
    EXPECT_EQ(LeafNum(), 9u);
    EXPECT_EQ(Index(), 1);
    EXPECT_TRUE(path_.valid);
    EXPECT_EQ(Step(0), kOk);
    EXPECT_EQ(Delivered(), 17u);
}

TEST_P(IterateTest, SteppingFarOffTheEndStandsOnTheLastLeaf) {
    for (const int count : {18, 19, 1000, 0x7FFFFFFF}) {
        StandOn(0);
        EXPECT_EQ(Step(count), kErrNotFound);
        EXPECT_EQ(LeafNum(), 9u);
        EXPECT_EQ(Index(), 0);
    }
}

TEST_P(IterateTest, EmptyLeavesArePassed) {
    TreeImage image = SmallTree(NodeSize(), 9);
    for (const u32 leaf : {2u, 3u}) {
        NodeImage empty{.fLink = leaf + 1, .bLink = leaf - 1};
        image.SetNode(leaf, empty.Build(NodeSize()));
    }
    bench_.volume.Disk(4) = image.bytes;
    StandOn(1);
    EXPECT_EQ(Step(1), kOk);
    EXPECT_EQ(Delivered(), 6u);
}

TEST_P(IterateTest, ATreeWithoutLeafRecordsEndsAtOnce) {
    bench_->header.leafRecords = 0;
    EXPECT_EQ(Step(0), kErrNotFound);
    EXPECT_EQ(Step(-1), kErrNotFound);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(path_.searchCount, 0u);
}

TEST_P(IterateTest, EachCallCountsAsASearch) {
    StandOn(0);
    Step(0);
    Step(1);
    EXPECT_EQ(path_.searchCount, 3u);
}

TEST_P(IterateTest, UpperLevelsStayAsTheyWere) {
    StandOn(0);
    const HfsFindLevel upper = path_.path[2];
    EXPECT_EQ(Step(17), kOk);
    EXPECT_EQ(path_.path[2].node, upper.node);
    EXPECT_EQ(path_.path[2].index, upper.index);
    EXPECT_EQ(References(path_), 3u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 3));
}

// ---- backward

TEST_P(IterateTest, BackwardInsideALeaf) {
    StandOn(5);
    EXPECT_EQ(Step(-1), kOk);
    EXPECT_EQ(Delivered(), 4u);
    EXPECT_EQ(LeafNum(), 3u);
}

TEST_P(IterateTest, BackwardFromRecordZeroLandsOnRecordZeroOfTheLeafBefore) {
    StandOn(4);
    EXPECT_EQ(Step(-1), kOk);
    EXPECT_EQ(Delivered(), 2u);
    EXPECT_EQ(LeafNum(), 2u);
    EXPECT_EQ(Index(), 0);
}

TEST_P(IterateTest, EachFurtherStepBackwardPassesALeaf) {
    StandOn(9);  // record 1 of leaf 5: -2 leaves it, then one leaf per step
    EXPECT_EQ(Step(-2), kOk);
    EXPECT_EQ(LeafNum(), 4u);
    StandOn(9);
    EXPECT_EQ(Step(-3), kOk);
    EXPECT_EQ(LeafNum(), 3u);
    EXPECT_EQ(Delivered(), 4u);
    StandOn(9);
    EXPECT_EQ(Step(-5), kOk);
    EXPECT_EQ(LeafNum(), 1u);
    EXPECT_EQ(Delivered(), 0u);
}

TEST_P(IterateTest, BackwardOffTheFirstLeafStandsOnItsLastRecord) {
    StandOn(0);
    EXPECT_EQ(Step(-1), kErrNotFound);
    EXPECT_EQ(LeafNum(), 1u);
    EXPECT_EQ(Index(), 1);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(IterateTest, BackwardFarOffTheFirstLeafStandsOnItsLastRecord) {
    for (const int count : {-7, -1000, -0x7FFFFFFF, -0x7FFFFFFF - 1}) {
        StandOn(9);
        EXPECT_EQ(Step(count), kErrNotFound);
        EXPECT_EQ(LeafNum(), 1u);
        EXPECT_EQ(Index(), 1);
    }
}

TEST_P(IterateTest, BackwardFromAnInsertionPoint) {
    StandOn(3, true);
    EXPECT_EQ(Step(-1), kOk);
    EXPECT_EQ(Delivered(), 3u);
}

// ---- the cache while stepping

TEST_P(IterateTest, CleanLeavesLeaveTheCacheBehindTheScan) {
    StandOn(0);
    for (u32 n = 1; n < kRecords; ++n) {
        EXPECT_EQ(Step(1), kOk);
        EXPECT_EQ(bench_->nodeCount, 3u);
        EXPECT_TRUE(LedgerHolds(*bench_.tree, 3));
    }
    EXPECT_EQ(bench_.volume.Count(Call::kMap), 1u + 3 + 8);
}

TEST_P(IterateTest, AStepInsideALeafTouchesNoNode) {
    StandOn(0);
    const u32 hits = bench_->hitCount;
    EXPECT_EQ(Step(1), kOk);
    EXPECT_EQ(bench_->hitCount, hits);
    EXPECT_EQ(bench_.volume.TakeCalls(), std::vector<CallRecord>{});
}

TEST_P(IterateTest, ADirtyLeafStaysCached) {
    StandOn(1);
    EXPECT_EQ(bench_->SetDirty(path_.path[1].node, 0), kOk);
    EXPECT_EQ(Step(1), kOk);
    ASSERT_NE(CachedNode(*bench_.tree, 1), nullptr);
    EXPECT_EQ(CachedNode(*bench_.tree, 1)->refCount, 0);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 3));
    EXPECT_EQ(Delivered(), 2u);
}

TEST_P(IterateTest, ALeafSomebodyElseHoldsStaysCached) {
    StandOn(1);
    HfsNode* node = nullptr;
    bench_->GetINode(1, &node, false);
    EXPECT_EQ(Step(1), kOk);
    EXPECT_EQ(CachedNode(*bench_.tree, 1), node);
    EXPECT_EQ(node->refCount, 1);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 4));
    bench_->PutINode(node, false);
}

TEST_P(IterateTest, LeavingALeafWithMoreThanThreeReferencesIsAsserted) {
    StandOn(1);
    HfsNode* node = path_.path[1].node;
    node->refCount = 4;
    EXPECT_EQ(Step(1), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2818)});
    EXPECT_EQ(node->refCount, 3);
    node->refCount = 0;
}

TEST_P(IterateTest, AMissingHandleIsAssertedWhenTheLeafIsLeft) {
    StandOn(1);
    buffer_head* const handle = std::exchange(path_.path[1].node->bufs[0].bh, nullptr);
    EXPECT_EQ(Step(1), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2835)});
    bench_.volume.fs.cache.Release(handle, 0);
}

// ---- what is delivered

class IterateOutput : public IterateTest {};

TEST_P(IterateOutput, WithoutAKeyBuffer) {
    StandOn(3);
    u32 size = 0;
    u32 keySize = 77;
    EXPECT_EQ(bench_->IncPos(0, record_, 8, &size, nullptr, 0, &keySize, &path_), kOk);
    EXPECT_EQ(size, 8u);
    EXPECT_EQ(keySize, 77u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(IterateOutput, ACapacityWithoutAKeyBufferIsAsserted) {
    StandOn(3);
    u32 size = 0;
    EXPECT_EQ(bench_->IncPos(0, record_, 8, &size, nullptr, 1, nullptr, &path_), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3312)});
}

TEST_P(IterateOutput, ASmallKeyBufferIsAsserted) {
    StandOn(3);
    u32 size = 0;
    u32 keySize = 0;
    EXPECT_EQ(bench_->IncPos(0, record_, 8, &size, keyOut_, 12, &keySize, &path_), kOk);
    EXPECT_EQ(keySize, 12u);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3316)});
    const HostKey key = NthHostKey(4, 3);
    EXPECT_EQ(Bytes(keyOut_ + 2, keyOut_ + 12), Bytes(key.bytes + 2, key.bytes + 12));
    EXPECT_EQ(Bytes(keyOut_ + 12, keyOut_ + 40), Bytes(28));
}

TEST_P(IterateOutput, BuffersBelowTheHooksMinimaAreAsserted) {
    StandOn(3);
    bench_->convert.minKeyBuffer = 21;
    bench_->convert.minDataBuffer = 9;
    EXPECT_EQ(Step(0), kOk);
    EXPECT_EQ(bench_.capture.Take(), (Events{Asserted(3317), Asserted(3340)}));
}

TEST_P(IterateOutput, ASmallRecordBufferIsAssertedAndFilled) {
    StandOn(3);
    u32 size = 0;
    EXPECT_EQ(bench_->IncPos(0, record_, 6, &size, nullptr, 0, nullptr, &path_), kOk);
    EXPECT_EQ(size, 6u);
    const Bytes whole = Pattern(8, 3);
    EXPECT_EQ(Bytes(record_, record_ + 6), Bytes(whole.begin(), whole.begin() + 6));
    EXPECT_EQ(record_[6], 0);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3339)});
}

TEST_P(IterateOutput, AttributesAreCutWithoutAnAssertion) {
    Bench bench(Blocks(GetParam()), kAttributesFileId);
    bench.Open(SmallTree(NodeSize(), 3, kAttributesFileId));
    HfsFindData path;
    const HostKey key = NthHostKey(8, 3);
    bench->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path);
    u32 size = 0;
    EXPECT_EQ(bench->IncPos(0, record_, 6, &size, nullptr, 0, nullptr, &path), kOk);
    EXPECT_EQ(size, 6u);
    EXPECT_EQ(bench.capture.Take(), Events{});
    path.ClearPath();
}

TEST_P(IterateOutput, MissingHooksCopyTheBytes) {
    bench_->convert = {};
    StandOn(3);
    EXPECT_EQ(Step(0), kOk);
    EXPECT_EQ(Bytes(keyOut_, keyOut_ + 20), NthDiskKey(4, 3));
    EXPECT_EQ(Bytes(record_, record_ + 8), Pattern(8, 3));
}

TEST_P(IterateTest, NoRecordIsWantedAndNoneIsDelivered) {
    StandOn(3);
    bench_->convert.DataToMemory = nullptr;
    EXPECT_EQ(bench_->IncPos(1, nullptr, 0, &recordSize_, keyOut_, 20, &keySize_, &path_), kOk);
    EXPECT_EQ(recordSize_, 0u);
    EXPECT_EQ(keySize_, 20u);
}

TEST_P(IterateTest, ALevelReadWithoutAPathIsThatOfTheTree) {
    EXPECT_EQ(bench_->ReadLevel(1, 3, nullptr), kOk);
    EXPECT_EQ(bench_->findData.path[1].node->nodeNum, 3u);
    EXPECT_EQ(bench_->findData.path[1].index, 0);
}

INSTANTIATE_GEOMETRIES(IterateTest, FewGeometries);
INSTANTIATE_GEOMETRIES(IterateOutput, FewGeometries);

// ---- full nodes, keys and data over block ends

TEST(IterateFullNodes, AllRecordsOfAllTreesInOrder) {
    for (const Geometry& geometry : AllGeometries()) {
        for (const u32 fileId : {3u, 4u, 8u}) {
            SCOPED_TRACE(::testing::Message() << geometry << " file " << fileId);
            Bench bench(Blocks(geometry), fileId);
            TreeShape shape;
            shape.fileId = fileId;
            shape.nodeSize = geometry.nodeSize;
            const u32 count = geometry.nodeSize / 16;
            bench.Open(BuildTree(shape, NthRecords(fileId, count, 10)));
            HfsFindData path;
            const HostKey first = NthHostKey(fileId, 0);
            ASSERT_EQ(bench->FindRecord(first.Get(), first.id, nullptr, 0, nullptr, &path), kOk);
            for (u32 n = 0; n < count; ++n) {
                alignas(8) u8 key[40];
                u8 record[10];
                u32 size = 0;
                u32 keySize = 0;
                ASSERT_EQ(
                    bench->IncPos(n == 0 ? 0 : 1, record, 10, &size, key, 40, &keySize, &path),
                    kOk);
                ASSERT_EQ(Bytes(record, record + size), Pattern(10, n));
                ASSERT_EQ(keySize, NthDiskKey(fileId, n).size());
            }
            path.ClearPath();
            EXPECT_EQ(bench.capture.Take(), Events{});
        }
    }
}

// ---- the tree's own path

TEST(IterateOwnPath, ANullPathIsTheTreesOwn) {
    Bench bench(Blocks(512));
    bench.Open(SmallTree(512));
    const HostKey key = NthHostKey(4, 1);
    bench->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr);
    u8 record[8];
    u32 size = 0;
    EXPECT_EQ(bench->IncPos(1, record, 8, &size, nullptr, 0, nullptr, nullptr), kOk);
    EXPECT_EQ(Bytes(record, record + 8), Pattern(8, 2));
}

TEST(IterateMemory, AScanAllocatesOnlyTheNodesItReads) {
    Bench bench(Blocks(512));
    bench.Open(SmallTree(512, 9));
    HfsFindData path;
    const HostKey key = NthHostKey(4, 0);
    bench->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path);
    const u32 before = bench.heap.Allocations();
    u8 record[8];
    u32 size = 0;
    while (bench->IncPos(1, record, 8, &size, nullptr, 0, nullptr, &path) == kOk) {
    }
    EXPECT_EQ(bench.heap.Allocations() - before, 8u);
    EXPECT_EQ(bench.heap.Live(), 1u + 3);
    path.ClearPath();
}

}  // namespace
}  // namespace VELK::test
