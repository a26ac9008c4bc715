// The search for a free node takes the first of the map. In a tree that nobody else touched it
// looks at no bits before those it took last, unless one of them was cleared meanwhile.
#include "bench.h"

namespace VELK::test {
namespace {

class FreeNodeSearch : public ::testing::TestWithParam<u32> {
protected:
    FreeNodeSearch() : bench_(Blocks(GetParam())) { bench_.Create(10, CompareCatKeysCaseIns); }
    ~FreeNodeSearch() override {
        bench_->findData.ClearPath();
        bench_->Clear();
        bench_->Dtor();
    }

    static HostKey Key(u32 n) {
        return HostCatKey(5, std::u16string(3, static_cast<char16_t>(0x4E00 + n)));
    }
    u8& MapByte(u32 index) {
        const u32 at = kHeadMapRecord + index;
        const u32 block = bench_->header.blockSize;
        return CachedNode(*bench_.tree, 0)->bufs[at / block].data[at % block];
    }
    u32 FirstClearBit() {
        u32 bit = 0;
        while ((MapByte(bit / 8) & 0x80 >> bit % 8) != 0) {
            bit += 1;
        }
        return bit;
    }
    // Number of the next node that is taken.
    u32 Taken() {
        HfsNode* node = nullptr;
        EXPECT_EQ(bench_->AllocateNode(&node), kOk);
        node->refCount -= 1;
        return node->nodeNum;
    }

    Bench bench_;
};

TEST_P(FreeNodeSearch, NodeThatEmptiedIsFirstAgain) {
    for (u32 n = 0; n < 60; ++n) {
        const HostKey key = Key(n);
        ASSERT_EQ(bench_->InsertRecord(key, key.id, Pattern(100, n).data(), 100), kOk);
    }
    const u32 last = FirstClearBit();
    for (u32 n = 10; n < 30; ++n) {
        const HostKey key = Key(n);
        ASSERT_EQ(bench_->DeleteRecord(key, key.id, false), kOk);
    }
    const u32 freed = FirstClearBit();
    ASSERT_LT(freed, last);
    ASSERT_TRUE(bench_->isAllOwn);
    EXPECT_EQ(Taken(), freed);
    const u32 next = FirstClearBit();
    EXPECT_EQ(Taken(), next);
    EXPECT_TRUE(bench_->isAllOwn);
}

TEST_P(FreeNodeSearch, NodeThatIsGivenBackIsFirstAgain) {
    for (const u32 number : {1u, 2u, 3u}) {
        ASSERT_EQ(Taken(), number);
    }
    ASSERT_EQ(bench_->FreeNode(2), kOk);
    EXPECT_EQ(Taken(), 2u);
    EXPECT_EQ(Taken(), 4u);
}

// Who holds a node may write into it long after that was announced.
TEST_P(FreeNodeSearch, BitThatSomebodyElseClearsIsSeen) {
    HfsNode* map = nullptr;
    ASSERT_EQ(bench_->GetINode(0, &map, false), kOk);
    ASSERT_EQ(bench_->SetDirty(map, kHeadMapRecord, 1), kOk);
    for (const u32 number : {1u, 2u, 3u}) {
        ASSERT_EQ(Taken(), number);
    }
    MapByte(0) = 0xD0;  // node 2 is free again
    bench_->header.freeNodes += 1;
    EXPECT_EQ(Taken(), 2u);
    EXPECT_EQ(Taken(), 4u);
    map->refCount -= 1;
}

TEST_P(FreeNodeSearch, MapThatIsReadAgainIsSearchedFromItsStart) {
    for (const u32 number : {1u, 2u, 3u}) {
        ASSERT_EQ(Taken(), number);
    }
    ASSERT_EQ(bench_->Flush(0), kOk);
    HfsNode* map = nullptr;
    ASSERT_EQ(bench_->GetMapNode(&map), kOk);
    MapByte(0) = 0xD0;
    map->refCount -= 1;
    EXPECT_EQ(Taken(), 2u);
    EXPECT_EQ(Taken(), 4u);
}

TEST(FreeNodeSearchInChains, RecordsThatAreFullAreLeftBehind) {
    Bench bench(Blocks(512));
    bench.Create(9, CompareCatKeysCaseIns);
    ASSERT_EQ(bench->ExtendBTree(2600, nullptr, nullptr), kOk);
    u32 before = 0;
    for (u32 n = 0; n < 2500; ++n) {
        HfsNode* node = nullptr;
        ASSERT_EQ(bench->AllocateNode(&node), kOk);
        node->refCount -= 1;
        ASSERT_GT(node->nodeNum, before);
        ASSERT_LE(node->nodeNum, before + 2) << "one map node at most lies between";
        before = node->nodeNum;
    }
    EXPECT_TRUE(bench->isAllOwn);
    bench->Clear();
    bench->Dtor();
    bench.capture.Take();
}

INSTANTIATE_TEST_SUITE_P(Blocks, FreeNodeSearch, ::testing::Values(512u, 1024u));

}  // namespace
}  // namespace VELK::test
