// Default clump sizes, with every result written out.
#include <gtest/gtest.h>

#include "capture.h"
#include "hfs/treehfs.h"

namespace VELK::test {
namespace {

constexpr u64 kMiB = u64{1} << 20;
constexpr u64 kGiB = u64{1} << 30;

struct Step {
    u64 volumeSize;
    u32 mebibytes;
};

TEST(ClumpSize, FollowsTheTableFromOneGibibyteOn) {
    const Step steps[] = {
        {kGiB, 4},
        {2 * kGiB - 1, 4},
        {2 * kGiB, 6},
        {4 * kGiB - 1, 6},
        {4 * kGiB, 8},
        {8 * kGiB, 11},
        {16 * kGiB, 64},
        {32 * kGiB, 84},
        {64 * kGiB, 111},
        {128 * kGiB, 147},
        {256 * kGiB, 194},
        {512 * kGiB, 256},
        {1024 * kGiB, 294},
        {2048 * kGiB, 338},
        {4096 * kGiB, 388},
        {8192 * kGiB, 446},
        {16384 * kGiB, 512},
        {32768 * kGiB, 512},
        {0xFFFFFFFFFFFFFFFFull, 512},
    };
    const Capture capture;
    for (const Step& step : steps) {
        EXPECT_EQ(GetHfsClumpSize(4096, 4096, step.volumeSize, kAttributesFileId),
                  step.mebibytes * kMiB)
            << step.volumeSize;
    }
    EXPECT_EQ(capture.All(), Events{});
}

TEST(ClumpSize, OtherFilesShareTheTableUnderAnAssertion) {
    const Capture capture;
    EXPECT_EQ(GetHfsClumpSize(4096, 4096, kGiB, kCatalogFileId), 4 * kMiB);
    EXPECT_EQ(capture.All(), Events{Asserted(5220)});
}

TEST(ClumpSize, SmallVolumesGiveOneOf128Parts) {
    const Capture capture;
    EXPECT_EQ(GetHfsClumpSize(4096, 4096, 0x3FFFFFFF, kAttributesFileId), 8384512u);
    EXPECT_EQ(GetHfsClumpSize(4096, 4096, 0x3FFFFFFF, kCatalogFileId), 8384512u);
    EXPECT_EQ(GetHfsClumpSize(512, 512, 10 * kMiB, kExtentsFileId), 81920u);
    EXPECT_EQ(capture.All(), Events{});
}

TEST(ClumpSize, IsAtLeastEightNodes) {
    EXPECT_EQ(GetHfsClumpSize(512, 4096, kMiB, kCatalogFileId), 32768u);
    EXPECT_EQ(GetHfsClumpSize(512, 4096, 0, kCatalogFileId), 32768u);
    EXPECT_EQ(GetHfsClumpSize(512, 32768, 0, kCatalogFileId), 262144u);
}

TEST(ClumpSize, IsRoundedDownToTheLargerOfNodeAndBlock) {
    EXPECT_EQ(GetHfsClumpSize(65536, 512, 100 * kMiB, kCatalogFileId), 786432u);
    EXPECT_EQ(GetHfsClumpSize(512, 8192, 10 * kMiB + 5000 * 128, kCatalogFileId), 81920u);
}

TEST(ClumpSize, IsNeverLessThanOneUnit) {
    EXPECT_EQ(GetHfsClumpSize(1048576, 512, 64 * kMiB, kCatalogFileId), 1048576u);
    const Capture capture;
    EXPECT_EQ(GetHfsClumpSize(8388608, 512, kGiB, kAttributesFileId), 8388608u);
}

TEST(ClumpSize, WithoutBlocksAndNodesIsNothing) {
    EXPECT_EQ(GetHfsClumpSize(0, 0, 10 * kMiB, kCatalogFileId), 0u);
}

}  // namespace
}  // namespace VELK::test
