// Slabs of equal blocks: whole, apart from each other, aligned, used again, within their space.
#include "platform/host/slabs.h"

#include <cstdint>
#include <cstring>
#include <thread>
#include <vector>

#include "gtest/gtest.h"

namespace VELK {
namespace {

constexpr std::size_t kSpace = std::size_t{1} << 26;
constexpr std::size_t kSpanSize = std::size_t{1} << 18;
constexpr std::size_t kRegionSize = std::size_t{1} << 21;

TEST(Slabs, BlocksAreAlignedAndApart) {
    Slabs slabs(kSpace);
    std::vector<u8*> blocks;
    for (std::size_t size = 0; size <= 6400; size += 37) {
        blocks.push_back(static_cast<u8*>(slabs.Alloc(size)));
        ASSERT_NE(blocks.back(), nullptr);
        EXPECT_TRUE(slabs.Owns(blocks.back()));
        EXPECT_EQ(reinterpret_cast<std::uintptr_t>(blocks.back()) % alignof(std::max_align_t), 0u);
        EXPECT_GE(slabs.SizeOf(blocks.back()), size);
        EXPECT_LT(slabs.SizeOf(blocks.back()), size + 17);
        std::memset(blocks.back(), static_cast<int>(blocks.size()), slabs.SizeOf(blocks.back()));
    }
    for (std::size_t i = 0; i < blocks.size(); ++i) {
        EXPECT_EQ(blocks[i][0], static_cast<u8>(i + 1));
        EXPECT_EQ(blocks[i][slabs.SizeOf(blocks[i]) - 1], static_cast<u8>(i + 1));
    }
}

TEST(Slabs, ManyBlocksTakeLittleMoreThanTheirBytes) {
    Slabs slabs(kSpace);
    constexpr std::size_t kCount = 100'000;
    for (std::size_t i = 0; i < kCount; ++i) {
        ASSERT_NE(slabs.Alloc(144), nullptr);
    }
    EXPECT_LE(slabs.BytesInUse(), kCount * 144 + kSpanSize);
}

TEST(Slabs, FreedBlockIsTheNextOneOfItsSize) {
    Slabs slabs(kSpace);
    void* first = slabs.Alloc(144);
    void* second = slabs.Alloc(144);
    slabs.Free(first);
    EXPECT_NE(slabs.Alloc(160), first);
    EXPECT_EQ(slabs.Alloc(144), first);
    EXPECT_NE(slabs.Alloc(144), second);
}

TEST(Slabs, MemoryOfOneSizeServesAnotherOnceAllBlocksAreFree) {
    Slabs slabs(kRegionSize);
    std::vector<void*> blocks;
    for (int round = 0; round < 3; ++round) {
        const std::size_t size = round % 2 == 0 ? 144 : 6280;
        for (void* block = slabs.Alloc(size); block != nullptr; block = slabs.Alloc(size)) {
            blocks.push_back(block);
        }
        EXPECT_EQ(slabs.BytesInUse(), kRegionSize);
        EXPECT_GE(blocks.size() * size, kRegionSize - kRegionSize / 16);
        for (std::size_t i = 0; i < blocks.size(); ++i) {
            slabs.Free(blocks[i * 7 % blocks.size()]);  // no count here is a multiple of 7
        }
        blocks.clear();
        EXPECT_EQ(slabs.BytesInUse(), 0u);
    }
}

TEST(Slabs, FullSpanIsOpenAgainAfterOneFree) {
    Slabs slabs(kRegionSize);
    std::vector<void*> blocks;
    for (void* block = slabs.Alloc(8192); block != nullptr; block = slabs.Alloc(8192)) {
        blocks.push_back(block);
    }
    EXPECT_EQ(blocks.size(), kRegionSize / 8192);
    slabs.Free(blocks[5]);
    slabs.Free(blocks[200]);
    EXPECT_EQ(slabs.Alloc(8192), blocks[200]);
    EXPECT_EQ(slabs.Alloc(8192), blocks[5]);
    EXPECT_EQ(slabs.Alloc(8192), nullptr);
}

TEST(Slabs, RefusesWhatIsTooLargeAndOwnsNothingElse) {
    Slabs slabs(kSpace);
    int local = 0;
    EXPECT_FALSE(slabs.Owns(&local));
    EXPECT_EQ(slabs.Alloc(Slabs::kLargest + 1), nullptr);
    EXPECT_NE(slabs.Alloc(Slabs::kLargest), nullptr);
    EXPECT_FALSE(slabs.Owns(&local));
    EXPECT_FALSE(slabs.Owns(nullptr));
}

TEST(Slabs, WithoutAddressesThereIsNoMemory) {
    Slabs slabs(std::size_t{1} << 60);
    EXPECT_EQ(slabs.Alloc(144), nullptr);
    EXPECT_FALSE(slabs.Owns(nullptr));
}

TEST(Slabs, ThreadsShareOne) {
    Slabs slabs(kSpace);
    const auto work = [&slabs](u8 mark) {
        std::vector<u8*> held;
        for (int i = 0; i < 20'000; ++i) {
            u8* block = static_cast<u8*>(slabs.Alloc(144));
            ASSERT_NE(block, nullptr);
            std::memset(block, mark, 144);
            held.push_back(block);
            if (i % 3 == 0) {
                u8* old = held[held.size() / 2];
                ASSERT_EQ(old[0], mark);
                ASSERT_EQ(old[143], mark);
                slabs.Free(old);
                held[held.size() / 2] = held.back();
                held.pop_back();
            }
        }
        for (u8* block : held) {
            ASSERT_EQ(block[77], mark);
            slabs.Free(block);
        }
    };
    std::thread other(work, u8{1});
    work(u8{2});
    other.join();
    EXPECT_EQ(slabs.BytesInUse(), 0u);
}

}  // namespace
}  // namespace VELK
