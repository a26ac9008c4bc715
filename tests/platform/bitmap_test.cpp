// Bit searches and the volume bitmap against a vector of bools. Every buffer is a heap block of
// exactly the bytes the bits need, so that the sanitizer sees a read past them.
#include "platform/bitmap.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <random>
#include <vector>

namespace VELK {
namespace {

struct Bits {
    explicit Bits(const std::vector<bool>& model) : bytes(new u8[(model.size() + 7) / 8]()) {
        for (std::size_t i = 0; i < model.size(); ++i) {
            if (model[i]) {
                bytes[i / 8] = static_cast<u8>(bytes[i / 8] | (0x80u >> (i % 8)));
            }
        }
    }
    std::unique_ptr<u8[]> bytes;
};

unsigned long FirstClear(const std::vector<bool>& model, unsigned long first, unsigned long count) {
    unsigned long bit = first;
    while (bit < count && model[bit]) {
        ++bit;
    }
    return bit;
}

std::vector<bool> Random(std::mt19937* random, std::size_t count, unsigned setOf100) {
    std::vector<bool> model(count);
    for (std::size_t i = 0; i < count; ++i) {
        model[i] = (*random)() % 100 < setOf100;
    }
    return model;
}

TEST(GetFreeBitPosBe, HighestBitOfTheFirstByteIsBitZero) {
    const u8 bits[] = {0x7F};
    EXPECT_EQ(GetFreeBitPosBe(bits, 0, 8), 0u);
}

TEST(GetFreeBitPosBe, LowestBitOfAByteIsItsLast) {
    const u8 bits[] = {0xFF, 0xFE};
    EXPECT_EQ(GetFreeBitPosBe(bits, 0, 16), 15u);
}

TEST(GetFreeBitPosBe, FullBitmapGivesCount) {
    const u8 bits[] = {0xFF, 0xFF};
    EXPECT_GE(GetFreeBitPosBe(bits, 0, 16), 16u);
    EXPECT_GE(GetFreeBitPosBe(bits, 16, 16), 16u);
}

TEST(GetFreeBitPosBe, ClearBitsBeforeFirstAndFromCountOnAreNotSeen) {
    const u8 bits[] = {0x3F, 0xFF, 0x80};
    EXPECT_EQ(GetFreeBitPosBe(bits, 1, 17), 1u);
    EXPECT_GE(GetFreeBitPosBe(bits, 2, 17), 17u);
}

TEST(GetFreeBitPosBe, EveryClearBitInEveryLengthIsFound) {
    for (std::size_t count = 1; count <= 200; ++count) {
        for (std::size_t clear = 0; clear < count; ++clear) {
            std::vector<bool> model(count, true);
            model[clear] = false;
            const Bits bits(model);
            ASSERT_EQ(GetFreeBitPosBe(bits.bytes.get(), 0, count), clear) << count;
        }
    }
}

TEST(GetFreeBitPosBe, RandomBitmapsAgreeWithTheModel) {
    std::mt19937 random(7);
    for (int turn = 0; turn < 3000; ++turn) {
        const std::size_t count = 1 + random() % 700;
        const std::vector<bool> model = Random(&random, count, 97);
        const Bits bits(model);
        const unsigned long first = random() % (count + 1);
        const unsigned long found = GetFreeBitPosBe(bits.bytes.get(), first, count);
        const unsigned long expected = FirstClear(model, first, count);
        ASSERT_EQ(found < count ? found : count, expected) << "turn " << turn;
    }
}

TEST(WndBitmap, AttachCountsClearBitsBelowTheSizeOnly) {
    u8 bits[] = {0xF0, 0x00, 0x0F};
    CWndBitmap bitmap;
    bitmap.Attach(bits, 20);
    EXPECT_EQ(bitmap.Size(), 20u);
    EXPECT_EQ(bitmap.GetZeros(), 16u);
}

TEST(WndBitmap, BitsAtTheSizeReadAsSet) {
    u8 bits[] = {0x00};
    CWndBitmap bitmap;
    bitmap.Attach(bits, 5);
    EXPECT_FALSE(bitmap.IsSet(4));
    EXPECT_TRUE(bitmap.IsSet(5));
}

TEST(WndBitmap, SetRunReturnsOnlyWhatChanged) {
    u8 bits[] = {0x18, 0x00};
    CWndBitmap bitmap;
    bitmap.Attach(bits, 16);
    EXPECT_EQ(bitmap.SetRun(2, 8), 6u);
    EXPECT_EQ(bits[0], 0x3F);
    EXPECT_EQ(bits[1], 0xC0);
    EXPECT_EQ(bitmap.GetZeros(), 8u);
    EXPECT_EQ(bitmap.SetRun(2, 8), 0u);
    EXPECT_EQ(bitmap.ClearRun(3, 6), 6u);
    EXPECT_EQ(bits[0], 0x20);
    EXPECT_EQ(bits[1], 0x40);
    EXPECT_EQ(bitmap.GetZeros(), 14u);
}

TEST(WndBitmap, FindZerosStopsAtTheNextSetBit) {
    u8 bits[] = {0xE1, 0x80};
    CWndBitmap bitmap;
    bitmap.Attach(bits, 16);
    u32 first = 0;
    u32 count = 0;
    ASSERT_TRUE(bitmap.FindZeros(0, 100, &first, &count));
    EXPECT_EQ(first, 3u);
    EXPECT_EQ(count, 4u);
    ASSERT_TRUE(bitmap.FindZeros(4, 2, &first, &count));
    EXPECT_EQ(first, 4u);
    EXPECT_EQ(count, 2u);
    ASSERT_TRUE(bitmap.FindZeros(7, 100, &first, &count));
    EXPECT_EQ(first, 9u);
    EXPECT_EQ(count, 7u);
}

TEST(WndBitmap, FindZerosInAFullBitmapFails) {
    u8 bits[] = {0xFF, 0xF0};
    CWndBitmap bitmap;
    bitmap.Attach(bits, 12);
    u32 first = 0;
    u32 count = 0;
    EXPECT_FALSE(bitmap.FindZeros(0, 1, &first, &count));
    EXPECT_FALSE(bitmap.FindZeros(12, 1, &first, &count));
}

TEST(WndBitmap, RandomRunsAgreeWithTheModel) {
    std::mt19937 random(99);
    std::vector<bool> model = Random(&random, 517, 50);
    const Bits bits(model);
    CWndBitmap bitmap;
    bitmap.Attach(bits.bytes.get(), 517);
    for (int turn = 0; turn < 2000; ++turn) {
        const u32 first = static_cast<u32>(random() % 517);
        const u32 count = static_cast<u32>(random() % (517 - first + 1));
        const bool value = random() % 2 == 0;
        u32 expected = 0;
        for (u32 i = first; i < first + count; ++i) {
            expected += model[i] != value ? 1u : 0u;
            model[i] = value;
        }
        ASSERT_EQ(value ? bitmap.SetRun(first, count) : bitmap.ClearRun(first, count), expected);
        ASSERT_EQ(bitmap.GetZeros(), std::count(model.begin(), model.end(), false));
    }
    const Bits expected(model);
    for (u32 i = 0; i < 517; ++i) {
        ASSERT_EQ(bitmap.IsSet(i), model[i]) << i;
    }
    EXPECT_EQ(bits.bytes[517 / 8] & 7, 0) << "bits past the size were written";
}

}  // namespace
}  // namespace VELK
