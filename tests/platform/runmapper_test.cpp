// The run mapper against a plain map of single blocks, with memory failing at every allocation.
#include "platform/runmapper.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <map>
#include <random>

#include "platform/host/host.h"

namespace VELK {
namespace {

using Mapper = CRunMapperT<unsigned int>;
constexpr unsigned kHole = Mapper::kHole;

// Counts what is allocated and lets allocations fail while `fails` is set.
class CountedHeap {
public:
    CountedHeap() : before_(SetHostHeap(&hooks_)) {}
    ~CountedHeap() { SetHostHeap(before_); }
    CountedHeap(const CountedHeap&) = delete;
    CountedHeap& operator=(const CountedHeap&) = delete;

    bool fails = false;
    int live = 0;

private:
    static void* Alloc(void* self, std::size_t size) {
        CountedHeap* heap = static_cast<CountedHeap*>(self);
        if (heap->fails) {
            return nullptr;
        }
        heap->live += 1;
        return std::malloc(size);
    }
    static void Free(void* self, void* memory) {
        static_cast<CountedHeap*>(self)->live -= memory != nullptr ? 1 : 0;
        std::free(memory);
    }

    HostHeap hooks_{Alloc, Free, this};
    const HostHeap* before_;
};

void ExpectRun(const Mapper& map, u32 index, unsigned vcn, unsigned lcn, unsigned length) {
    ASSERT_LT(index, map.Count());
    EXPECT_EQ(map.At(index).vcn, vcn);
    EXPECT_EQ(map.At(index).lcn, lcn);
    EXPECT_EQ(map.At(index).length, length);
}

TEST(RunMapper, EmptyMapKnowsNoBlock) {
    const Mapper map;
    unsigned lcn = 0;
    unsigned length = 0;
    EXPECT_FALSE(map.Lookup(0, &lcn, &length));
}

TEST(RunMapper, LookupCountsFromTheBlockAsked) {
    Mapper map;
    ASSERT_TRUE(map.AddEntry(10, 100, 5));
    unsigned lcn = 0;
    unsigned length = 0;
    ASSERT_TRUE(map.Lookup(12, &lcn, &length));
    EXPECT_EQ(lcn, 102u);
    EXPECT_EQ(length, 3u);
    EXPECT_FALSE(map.Lookup(9, &lcn, &length));
    EXPECT_FALSE(map.Lookup(15, &lcn, &length));
}

TEST(RunMapper, RunsThatContinueEachOtherBecomeOne) {
    Mapper map;
    ASSERT_TRUE(map.AddEntry(0, 50, 4));
    ASSERT_TRUE(map.AddEntry(8, 58, 4));
    ASSERT_TRUE(map.AddEntry(4, 54, 4));
    ASSERT_EQ(map.Count(), 1u);
    ExpectRun(map, 0, 0, 50, 12);
}

TEST(RunMapper, NeighboursElsewhereOnTheVolumeStayApart) {
    Mapper map;
    ASSERT_TRUE(map.AddEntry(0, 50, 4));
    ASSERT_TRUE(map.AddEntry(4, 60, 4));
    EXPECT_EQ(map.Count(), 2u);
}

TEST(RunMapper, EntryInsideARunSplitsIt) {
    Mapper map;
    ASSERT_TRUE(map.AddEntry(0, 100, 10));
    ASSERT_TRUE(map.AddEntry(4, 500, 2));
    ASSERT_EQ(map.Count(), 3u);
    ExpectRun(map, 0, 0, 100, 4);
    ExpectRun(map, 1, 4, 500, 2);
    ExpectRun(map, 2, 6, 106, 4);
}

TEST(RunMapper, HolesMergeAndKeepTheirLcn) {
    Mapper map;
    ASSERT_TRUE(map.AddEntry(0, kHole, 10));
    ASSERT_TRUE(map.AddEntry(3, 7, 2));
    ASSERT_EQ(map.Count(), 3u);
    ExpectRun(map, 2, 5, kHole, 5);
    ASSERT_TRUE(map.AddEntry(3, kHole, 2));
    ASSERT_EQ(map.Count(), 1u);
    ExpectRun(map, 0, 0, kHole, 10);
    unsigned lcn = 0;
    unsigned length = 0;
    ASSERT_TRUE(map.Lookup(4, &lcn, &length));
    EXPECT_EQ(lcn, kHole);
    EXPECT_EQ(length, 6u);
}

TEST(RunMapper, LengthZeroAndRangesPastTheLastBlockAreRefused) {
    Mapper map;
    EXPECT_FALSE(map.AddEntry(1, 1, 0));
    EXPECT_FALSE(map.AddEntry(0xFFFFFFFF, 1, 2));
    EXPECT_FALSE(map.AddEntry(0, 0xFFFFFFFE, 2));
    EXPECT_EQ(map.Count(), 0u);
    EXPECT_TRUE(map.AddEntry(0xFFFFFFFF, 1, 1));
    EXPECT_TRUE(map.AddEntry(0, 0xFFFFFFFE, 1));
}

TEST(RunMapper, RunsWhoseSumWouldOverflowStayApart) {
    Mapper map;
    ASSERT_TRUE(map.AddEntry(0, kHole, 0xFFFFFFFF));
    ASSERT_TRUE(map.AddEntry(0xFFFFFFFF, kHole, 1));
    EXPECT_EQ(map.Count(), 2u);
}

TEST(RunMapper, TruncateCutsInsideARun) {
    Mapper map;
    ASSERT_TRUE(map.AddEntry(0, 100, 10));
    ASSERT_TRUE(map.AddEntry(20, 200, 10));
    map.Truncate(25);
    ASSERT_EQ(map.Count(), 2u);
    ExpectRun(map, 1, 20, 200, 5);
    map.Truncate(20);
    EXPECT_EQ(map.Count(), 1u);
    map.Truncate(4);
    ExpectRun(map, 0, 0, 100, 4);
    map.Truncate(0);
    EXPECT_EQ(map.Count(), 0u);
}

TEST(RunMapper, MovingHandsTheRunsOver) {
    CountedHeap heap;
    {
        Mapper source;
        ASSERT_TRUE(source.AddEntry(0, 9, 1));
        Mapper target(static_cast<Mapper&&>(source));
        EXPECT_EQ(target.Count(), 1u);
        EXPECT_EQ(source.Count(), 0u);
        Mapper other;
        other = static_cast<Mapper&&>(target);
        EXPECT_EQ(other.Count(), 1u);
    }
    EXPECT_EQ(heap.live, 0);
}

class RunMapperModel : public ::testing::Test {
protected:
    void Add(unsigned vcn, unsigned lcn, unsigned length) {
        for (unsigned i = 0; i < length; ++i) {
            blocks_[vcn + i] = lcn == kHole ? kHole : lcn + i;
        }
    }
    void Truncate(unsigned vcn) { blocks_.erase(blocks_.lower_bound(vcn), blocks_.end()); }

    // Every run as long as it can be, and block by block what the model says.
    void Compare(const Mapper& map) {
        u64 mapped = 0;
        for (u32 i = 0; i < map.Count(); ++i) {
            const Mapper::Run& run = map.At(i);
            mapped += run.length;
            for (unsigned k = 0; k < run.length; ++k) {
                const auto found = blocks_.find(run.vcn + k);
                ASSERT_NE(found, blocks_.end());
                ASSERT_EQ(found->second, run.lcn == kHole ? kHole : run.lcn + k);
            }
            if (i == 0) {
                continue;
            }
            const Mapper::Run& last = map.At(i - 1);
            ASSERT_LE(last.vcn + last.length, run.vcn);
            ASSERT_FALSE(last.vcn + last.length == run.vcn &&
                         (last.lcn == kHole
                              ? run.lcn == kHole
                              : run.lcn != kHole && last.lcn + last.length == run.lcn))
                << "runs that continue each other";
        }
        ASSERT_EQ(mapped, blocks_.size());
    }

    std::map<unsigned, unsigned> blocks_;
};

TEST_F(RunMapperModel, RandomEntriesAgreeAlsoWhenMemoryFails) {
    std::mt19937 random(4711);
    CountedHeap heap;
    {
        Mapper map;
        int refused = 0;
        for (int turn = 0; turn < 4000; ++turn) {
            const unsigned vcn = static_cast<unsigned>(random() % 400);
            const unsigned length = 1 + static_cast<unsigned>(random() % 12);
            const unsigned lcn =
                random() % 4 == 0 ? kHole : vcn + 1000 * (1 + static_cast<unsigned>(random() % 3));
            heap.fails = random() % 8 != 0;
            if (random() % 200 == 0) {
                map.Truncate(vcn);
                Truncate(vcn);
            } else if (map.AddEntry(vcn, lcn, length)) {
                Add(vcn, lcn, length);
            } else {
                ASSERT_TRUE(heap.fails);
                refused += 1;
            }
            Compare(map);
            ASSERT_FALSE(HasFatalFailure()) << "turn " << turn;
        }
        EXPECT_GT(refused, 10) << "no allocation failed";
    }
    EXPECT_EQ(heap.live, 0);
}

TEST_F(RunMapperModel, WithoutMemoryTheMapIsUnchanged) {
    CountedHeap heap;
    Mapper map;
    for (unsigned i = 0; i < 8; ++i) {
        ASSERT_TRUE(map.AddEntry(i * 2, i * 10, 1));
        Add(i * 2, i * 10, 1);
    }
    heap.fails = true;
    EXPECT_FALSE(map.AddEntry(100, 5, 1));
    Compare(map);
    EXPECT_TRUE(map.AddEntry(14, 75, 1)) << "replacing a run needs no memory";
}

}  // namespace
}  // namespace VELK
