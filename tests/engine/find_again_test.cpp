// Lookups one after the other in a tree this object created: the shortcut for keys of the leaf just
// visited says and counts what the whole way down would.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <utility>

#include "bench.h"
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/node_desc.h"
#include "platform/heap.h"

namespace VELK::test {
namespace {

class FindAgain : public ::testing::Test {
protected:
    explicit FindAgain(u32 nodeShift) : bench_(Blocks(512)) {
        bench_.Create(nodeShift, CompareCatKeysCaseIns);
    }
    ~FindAgain() override { bench_.capture.Take(); }

    void Insert(u32 count) {
        for (u32 n = 0; n < count; ++n) {
            const HostKey key = NthHostKey(4, n);
            const Bytes data = Pattern(24, n);
            EXPECT_EQ(bench_->InsertRecord(key.Get(), key.id, data.data(), 24), kOk);
        }
        bench_.Forget();
    }

    int Find(u32 n) { return FindAt(NthHostKey(4, n).Get(), NthHostKey(4, n).id); }
    int FindAt(const BTreeKey* key, u32 id) {
        return bench_->FindRecord(key, id, nullptr, 0, nullptr, nullptr);
    }

    Bench bench_;
};

// Four leaves of ten records each.
class FindAgainOnLeaves : public FindAgain {
protected:
    FindAgainOnLeaves() : FindAgain(9) {
        Insert(40);
        EXPECT_EQ(bench_->header.treeDepth, 2);
    }
};

TEST_F(FindAgainOnLeaves, CountersMoveAsOnTheWayDown) {
    const u32 hits = bench_->hitCount;
    const u32 reads = bench_->readCount;
    const u32 searches = bench_->findData.searchCount;
    for (const u32 n : {0u, 0u, 1u, 39u, 39u, 0u}) {
        EXPECT_EQ(Find(n), kOk);
        EXPECT_EQ(bench_->findData.path[1].node->refCount, 1);
    }
    EXPECT_EQ(bench_->hitCount, hits + 12);
    EXPECT_EQ(bench_->readCount, reads);
    EXPECT_EQ(bench_->findData.searchCount, searches + 6);
}

// The comparator asserts at each probe, so the number of probes shows.
TEST_F(FindAgainOnLeaves, AKeyOutOfLineIsAssertedAsOften) {
    const HostKey key = NthHostKey(4, 1);
    alignas(8) u8 room[sizeof key.bytes + 2];
    std::memcpy(room + 2, key.bytes, sizeof key.bytes);
    const BTreeKey* shifted = reinterpret_cast<const BTreeKey*>(room + 2);
    EXPECT_EQ(FindAt(shifted, key.id), kOk);
    const Events first = bench_.capture.Take();
    EXPECT_EQ(FindAt(shifted, key.id), kOk);
    EXPECT_EQ(bench_.capture.Take(), first);
    EXPECT_EQ(first, Events(4, Asserted(70)));  // two in a root of four records, two in the leaf
    ASSERT_EQ(NumRecords(bench_->findData.path[2].node), 4u);
    ASSERT_EQ(NumRecords(bench_->findData.path[1].node), 10u);
}

TEST_F(FindAgainOnLeaves, ANodeHeldByTooManyIsAssertedEachTime) {
    EXPECT_EQ(Find(1), kOk);
    HfsNode* leaf = bench_->findData.path[1].node;
    leaf->refCount += 3;
    for (int round = 0; round < 2; ++round) {
        EXPECT_EQ(Find(1), kOk);
        EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2610)});
    }
    leaf->refCount -= 3;
}

TEST_F(FindAgainOnLeaves, AnIndexNodeEmptiedMeanwhileIsMet) {
    EXPECT_EQ(Find(1), kOk);
    ASSERT_EQ(bench_->Zero(bench_->findData.path[2].node), kOk);
    EXPECT_EQ(Find(1), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonTree, 2916), Reported(kErrCorrupt, 2982),
                      Reported(kErrCorrupt, 3126)}));
}

// What the root remembers of its records is void once its bytes say otherwise.
TEST_F(FindAgainOnLeaves, ChildrenExchangedInTheRootAreFollowed) {
    EXPECT_EQ(Find(0), kOk);
    EXPECT_EQ(Find(39), kOk);
    const HfsNode* root = bench_->findData.path[2].node;
    const int last = static_cast<int>(GetBe16(root->bufs[0].data + kDescNumRecords)) - 1;
    NodeKey first;
    NodeKey second;
    ASSERT_EQ(root->GetKey(&bench_->header, 0, &first), kOk);
    ASSERT_EQ(root->GetKey(&bench_->header, last, &second), kOk);
    std::swap_ranges(first.data, first.data + kChildSize, second.data);
    EXPECT_EQ(Find(0), kErrNotFound);
    EXPECT_EQ(Find(0), kErrNotFound);
    std::swap_ranges(first.data, first.data + kChildSize, second.data);
    bench_->findData.ClearPath();
    EXPECT_EQ(Find(0), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// A first key out of the ordinary is no bound: the way down is walked, and meets it only where the
// search probes it.
TEST_F(FindAgainOnLeaves, AFirstKeyThatCannotBeReadIsNoShortcut) {
    EXPECT_EQ(Find(1), kOk);
    HfsNode* leaf = bench_->findData.path[1].node;
    const int count = static_cast<int>(NumRecords(leaf));
    ASSERT_GE(count, 4);
    NodeKey first;
    ASSERT_EQ(leaf->GetKey(&bench_->header, 0, &first), kOk);
    const u8 before = std::exchange(first.ptr[0], u8{0xFF});
    const u32 middle = static_cast<u32>(count - 1) / 2;
    EXPECT_EQ(Find(middle), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(Find(0), kErrCorrupt);
    EXPECT_FALSE(bench_.capture.Take().empty());
    first.ptr[0] = before;
    EXPECT_EQ(Find(0), kOk);
}

// Between good bounds: the key the search meets is told of once.
TEST_F(FindAgainOnLeaves, AKeyBetweenThatCannotBeReadIsToldOnce) {
    EXPECT_EQ(Find(1), kOk);
    HfsNode* leaf = bench_->findData.path[1].node;
    const int count = static_cast<int>(NumRecords(leaf));
    ASSERT_GE(count, 4);
    NodeKey middle;
    ASSERT_EQ(leaf->GetKey(&bench_->header, (count - 1) / 2, &middle), kOk);
    const u8 before = std::exchange(middle.ptr[0], u8{0xFF});
    EXPECT_EQ(Find(0), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonNode, 9006), Reported(kErrCorrupt, 3005),
                      Reported(kErrCorrupt, 3126)}));
    middle.ptr[0] = before;
    EXPECT_EQ(Find(0), kOk);
}

TEST_F(FindAgainOnLeaves, AReferenceTooFewIsAsserted) {
    EXPECT_EQ(Find(1), kOk);
    bench_->findData.path[1].node->refCount = 0;
    EXPECT_EQ(Find(1), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(755)});
    EXPECT_EQ(bench_->findData.path[1].node->refCount, 1);
}

TEST_F(FindAgainOnLeaves, AGapInThePathIsAsserted) {
    EXPECT_EQ(Find(1), kOk);
    HfsNode* leaf = bench_->findData.path[1].node;
    leaf->refCount += 1;
    bench_->findData.path[4].node = leaf;
    EXPECT_EQ(Find(1), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(752)});
    EXPECT_EQ(bench_->findData.path[4].node, nullptr);
    EXPECT_EQ(leaf->refCount, 1);
}

TEST_F(FindAgainOnLeaves, ANodeHandedOutMayHaveBeenWrittenTo) {
    EXPECT_EQ(Find(1), kOk);
    HfsNode* leaf = nullptr;
    ASSERT_EQ(bench_->GetINode(bench_->findData.path[1].node->nodeNum, &leaf, false), kOk);
    leaf->bufs[0].data[kDescKind] = kBTIndexNode;
    EXPECT_EQ(Find(1), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonTree, 2925), Reported(kErrCorrupt, 2982),
                      Reported(kErrCorrupt, 3126)}));
    leaf->bufs[0].data[kDescKind] = static_cast<u8>(kBTLeafNode);
    leaf->refCount -= 1;
    EXPECT_EQ(Find(1), kOk);
}

// A step of a deletion by hand: the last leaf loses the separator that leads to it.
TEST_F(FindAgainOnLeaves, ALeafThatNothingLeadsToAnyMoreIsNotFound) {
    EXPECT_EQ(Find(39), kOk);
    ASSERT_GE(bench_->findData.path[2].index, 2);
    EXPECT_EQ(bench_->DeleteTree(2, &bench_->findData), kOk);
    EXPECT_EQ(Find(39), kErrNotFound);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Moved by hand, a record lies behind the separator of the leaf it came from.
TEST_F(FindAgainOnLeaves, ARecordMovedByHandIsWhereItsSeparatorSaysOrNowhere) {
    EXPECT_EQ(Find(0), kOk);
    HfsNode* left = bench_->findData.path[1].node;
    const u32 count = NumRecords(left);
    EXPECT_EQ(Find(count), kOk);
    HfsNode* right = bench_->findData.path[1].node;
    ASSERT_NE(left, right);
    EXPECT_EQ(bench_->DeleteRecord(NthHostKey(4, 1).Get(), NthHostKey(4, 1).id, false), kOk);
    ASSERT_EQ(bench_->_RotateRecordLeft(left, right), kOk);
    EXPECT_EQ(Find(0), kOk);
    EXPECT_EQ(Find(count), kErrNotFound);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(FindAgainOnLeaves, APathClearedMeanwhileIsWalkedAgain) {
    EXPECT_EQ(Find(1), kOk);
    bench_->findData.ClearPath();
    EXPECT_EQ(Find(1), kOk);
    EXPECT_NE(bench_->findData.path[1].node, nullptr);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// One leaf of two blocks in which the key of record 11 lies in both.
class FindAgainOverBlocks : public FindAgain {
protected:
    FindAgainOverBlocks() : FindAgain(10) {}
};

TEST_F(FindAgainOverBlocks, ALastKeyInTwoBlocksIsNoShortcut) {
    Insert(12);
    for (const u32 n : {11u, 3u, 11u}) {
        EXPECT_EQ(Find(n), kOk);
        EXPECT_EQ(bench_->findData.path[1].index, static_cast<s32>(n));
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// The shortcut asks for no memory, and so no failure of it passes unseen.
TEST_F(FindAgainOverBlocks, NoMemoryIsToldAsOnTheWayDown) {
    Insert(16);
    EXPECT_EQ(Find(3), kOk);
    velk_heap_free(bench_->scratch);
    bench_->scratch = bench_->scratchHalf = nullptr;
    bench_.Forget();
    bench_.heap.FailNth(1);
    EXPECT_EQ(Find(11), kErrNoMemory);
    EXPECT_TRUE(bench_.heap.HasFailed());
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kErrNoMemory, 3126)});
    EXPECT_EQ(Find(11), kOk);
}

}  // namespace
}  // namespace VELK::test
