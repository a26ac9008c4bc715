// The memory of the next new node is asked for once the distance between new nodes was the same
// twice, from its end to its start, some lines with each insertion. Nothing but the time tells
// whether it was: what is looked at here is what is left to ask for.
#include "hfs/treehfs/next_node.h"

#include <sys/mman.h>
#include <unistd.h>

#include "bench.h"
#include "hfs/treehfs/cache.h"

namespace VELK::test {
namespace {

constexpr u32 kShare = 512;  // bytes of one insertion

class NextNode : public ::testing::TestWithParam<u32> {
protected:
    NextNode() : bench_(Blocks(GetParam())) { bench_.Create(12, CompareCatKeysCaseIns); }
    ~NextNode() override { bench_->Dtor(); }

    void Note(const u8* data) { NoteNewNode(&*bench_.tree, data); }
    u32 Left() { return bench_->nextNodeLeft; }
    void Prefetch() { PrefetchNextNode(&*bench_.tree); }

    Bench bench_;
};

TEST_P(NextNode, IsAskedForAtADistanceSeenTwice) {
    const Bytes space(1 << 15);
    const u8* const at = space.data();
    Note(at);
    EXPECT_EQ(Left(), 0u);
    Note(at + 5000);
    EXPECT_EQ(Left(), 0u);
    Note(at + 10000);
    EXPECT_EQ(Left(), 4096u);
    for (u32 left = 4096; left > 0; left -= kShare) {
        EXPECT_EQ(Left(), left);
        Prefetch();
    }
    EXPECT_EQ(Left(), 0u);
    Prefetch();
    EXPECT_EQ(Left(), 0u);
    Note(at + 15000);
    EXPECT_EQ(Left(), 4096u);
    Prefetch();
    Note(at + 21000);
    EXPECT_EQ(Left(), 0u);
    Note(at + 27000);
    EXPECT_EQ(Left(), 4096u);
    Note(at + 21000);  // downwards is another distance
    EXPECT_EQ(Left(), 0u);
    Note(at + 15000);
    EXPECT_EQ(Left(), 4096u);
}

// Where the nodes so far lead there may be nothing, or what nobody may touch.
TEST_P(NextNode, MayLieWhereNothingIs) {
    const std::size_t page = static_cast<std::size_t>(sysconf(_SC_PAGESIZE));
    void* const space =
        mmap(nullptr, 4 * page, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
    ASSERT_NE(space, MAP_FAILED);
    const u8* const at = static_cast<const u8*>(space);
    for (const u8* data : {at, at + page, at + 2 * page}) {
        Note(data);
    }
    ASSERT_EQ(Left(), 4096u);
    while (Left() > 0) {
        Prefetch();
    }
    munmap(space, 4 * page);
    Note(nullptr);
    Note(nullptr);
    Note(nullptr);
    ASSERT_EQ(Left(), 4096u);
    while (Left() > 0) {
        Prefetch();
    }
}

TEST_P(NextNode, IsAskedForByEachInsertion) {
    const auto insert = [this](char16_t unit) {
        const HostKey key = HostCatKey(5, std::u16string(1, unit));
        return bench_->InsertRecord(key, key.id, Pattern(200, unit).data(), 200);
    };
    ASSERT_EQ(insert(u'a'), kOk);  // makes its leaf
    bench_->nextNodeLeft = 4096;
    ASSERT_EQ(insert(u'b'), kOk);
    EXPECT_EQ(Left(), 4096 - kShare);
    ASSERT_EQ(insert(u'c'), kOk);
    EXPECT_EQ(Left(), 4096 - 2 * kShare);
    EXPECT_EQ(insert(u'A'), kErrExists);
    EXPECT_EQ(Left(), 4096 - 2 * kShare);
    bench_->findData.ClearPath();
    EXPECT_EQ(bench_->Clear(), kOk);
}

INSTANTIATE_TEST_SUITE_P(Blocks, NextNode, ::testing::Values(512u, 4096u));

// Each node that is taken behind the initialised part of the file is noted where the cache maps it.
TEST(NewNode, IsNotedWhereTheCacheMapsIt) {
    Bench bench(Blocks(512));
    bench.Create(9, CompareCatKeysCaseIns);
    for (u32 n = 0; n < 30; ++n) {
        const HostKey key = NthHostKey(kCatalogFileId, n);
        ASSERT_EQ(bench->InsertRecord(key.Get(), key.id, Pattern(60, n).data(), 60), kOk);
        const HfsNode* last = NodeOf(bench->lastLink);
        EXPECT_EQ(bench->newestNode, reinterpret_cast<std::uintptr_t>(last->bufs[0].data)) << n;
    }
    EXPECT_GT(bench->nodeCount, 4u);
    bench->findData.ClearPath();
    bench.capture.Take();
}

}  // namespace
}  // namespace VELK::test
