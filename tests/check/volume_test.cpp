// Whole volumes: header, copy, special forks, journal, bad blocks, and the stages of a run.
#include <gtest/gtest.h>

#include "check_support.h"
#include "hfs/format.h"
#include "keys.h"

namespace VELK::test {
namespace {

#define EXPECT_IDS(outcome, ids) EXPECT_EQ((outcome).Ids(), ids) << (outcome).Lines()

constexpr u32 kHeader = 1024;
constexpr u32 kForks = 112;
constexpr u32 kForkSize = 80;

VolumeImage Sound() {
    VolumeImage volume;
    volume.Build();
    return volume;
}

// Offset in the header of the first run of a special file (0 allocation .. 4 startup).
u32 RunOffset(u32 fork, u32 run) {
    return kForks + fork * kForkSize + 16 + 8 * run;
}

}  // namespace

TEST(CheckVolumeSound, IsCleanInEveryScope) {
    const VolumeImage volume = Sound();
    EXPECT_EQ(CheckBytes(volume.bytes, Full()).Ids(true), "");
    EXPECT_EQ(CheckBytes(volume.bytes).Ids(true), "");
    EXPECT_EQ(CheckBytes(volume.bytes, Quick()).Ids(true), "");
}

TEST(CheckVolumeSound, WithoutAttributesAndWithBinaryOrder) {
    VolumeImage volume;
    volume.isHfsx = true;
    volume.hasAttributes = false;
    volume.Build();
    const Outcome outcome = CheckBytes(volume.bytes, Full());
    EXPECT_EQ(outcome.Ids(true), "") << outcome.Lines();
    EXPECT_EQ(outcome.summary.stages[3].verdict, CheckVerdict::kNone);
}

TEST(CheckVolumeSound, CatalogInTwentyPiecesThroughTheExtentsTree) {
    VolumeImage volume;
    volume.catalogPieces = 20;
    for (u32 i = 0; i < 60; ++i) {
        const std::u16string name = u"f" + std::u16string(1, static_cast<char16_t>(0x4E00 + i));
        volume.catalog.push_back({DiskCatKey(2, name), FileData(100 + i, Bytes(80), Bytes(80))});
        volume.catalog.push_back({DiskCatKey(100 + i, u""), ThreadData(false, 2, name)});
    }
    Put32(VolumeImage::DataOf(&volume.catalog, DiskCatKey(1, u"root")), 4, 61);
    volume.Sort();
    volume.Build();
    Outcome outcome = CheckBytes(volume.bytes, Full());
    EXPECT_EQ(outcome.Ids(true), "") << outcome.Lines();
    EXPECT_EQ(outcome.summary.stages[1].records, 2u);
    CheckOptions options;
    options.trees = 1u << kCatalogFileId;
    outcome = CheckBytes(volume.bytes, options);
    EXPECT_IDS(outcome, "");
    EXPECT_EQ(outcome.summary.stages[2].records, volume.catalog.size());
}

TEST(CheckVolumeSound, StagesHaveTheirTitlesAndVerdicts) {
    const Outcome outcome = CheckBytes(Sound().bytes);
    const CheckStage* stages = outcome.summary.stages;
    ASSERT_EQ(outcome.summary.stageCount, 6u);
    EXPECT_STREQ(stages[0].title, "volume header");
    EXPECT_STREQ(stages[2].title, "catalog tree");
    EXPECT_EQ(stages[2].verdict, CheckVerdict::kSound);
    EXPECT_EQ(stages[2].records, 8u);
    EXPECT_EQ(stages[4].verdict, CheckVerdict::kSound);
    EXPECT_EQ(stages[5].verdict, CheckVerdict::kNotRun);
    EXPECT_STREQ(stages[5].why, "needs --full");
}

TEST(CheckVolumeHeader, V01SignatureAndVersion) {
    VolumeImage volume = Sound();
    volume.Patch16(kHeader, 0x4244);
    Outcome outcome = CheckBytes(volume.bytes);
    EXPECT_IDS(outcome, "V01");
    EXPECT_EQ(CheckFindingLine(outcome.findings[0]),
              "error V01 volume header (image offset 0x400): signature is 0x4244, expected 0x482b "
              "(H+) or 0x4858 (HX)");
    EXPECT_EQ(outcome.summary.stages[2].verdict, CheckVerdict::kNotRun);
    volume = Sound();
    volume.PatchHeaders32(0, 0x482B0005);
    EXPECT_IDS(CheckBytes(volume.bytes), "V01");
}

TEST(CheckVolumeHeader, V02BlockSizeAndTruncation) {
    VolumeImage volume = Sound();
    volume.PatchHeaders32(40, 3000);
    EXPECT_IDS(CheckBytes(volume.bytes), "V02");
    volume.PatchHeaders32(40, 256);
    EXPECT_IDS(CheckBytes(volume.bytes), "V02");
    volume = Sound();
    volume.PatchHeaders32(44, VolumeImage::kTotalBlocks + 10);
    const Outcome outcome = CheckBytes(volume.bytes);
    EXPECT_IDS(outcome, "V02");
    EXPECT_EQ(outcome.findings[0].text,
              "1010 blocks of 512 bytes make 517120 bytes, the image holds 512000: 5120 bytes are "
              "missing");
}

TEST(CheckVolumeHeader, V03CopyMissingOrDifferent) {
    VolumeImage volume = Sound();
    volume.Patch32(volume.bytes.size() - 1024, 0);
    EXPECT_IDS(CheckBytes(volume.bytes), "V03");
    volume = Sound();
    volume.Patch32(volume.bytes.size() - 1024 + RunOffset(2, 0), 77);
    const Outcome outcome = CheckBytes(volume.bytes);
    EXPECT_IDS(outcome, "V03");
    EXPECT_EQ(outcome.findings[0].text, "its catalog fork differs from the one in use");
    volume = Sound();
    volume.Patch32(volume.bytes.size() - 1024 + 32, 77);  // counters may be stale
    EXPECT_IDS(CheckBytes(volume.bytes), "");
}

TEST(CheckVolumeHeader, CopyServesWhenTheHeaderIsLost) {
    VolumeImage volume = Sound();
    volume.Patch32(kHeader, 0);
    CheckOptions options = Full();
    options.backupHeader = true;
    EXPECT_IDS(CheckBytes(volume.bytes, options), "V03");
}

TEST(CheckVolumeHeader, V04RunsOutsideTheVolumeOverlappingOrTooFew) {
    VolumeImage volume = Sound();
    volume.PatchHeaders32(RunOffset(4, 0), 990);  // a startup file past the end
    volume.PatchHeaders32(RunOffset(4, 0) + 4, 20);
    volume.PatchHeaders32(kForks + 4 * kForkSize + 12, 20);
    Outcome outcome = CheckBytes(volume.bytes);
    EXPECT_IDS(outcome, "V04");
    EXPECT_EQ(outcome.findings[0].text, "outside the volume of 1000 blocks: blocks 990..1009");
    EXPECT_EQ(outcome.findings[0].where, "startup file");

    volume = Sound();
    volume.PatchHeaders32(RunOffset(4, 0), 1);
    volume.PatchHeaders32(RunOffset(4, 0) + 4, 1);
    volume.PatchHeaders32(kForks + 4 * kForkSize + 12, 1);
    outcome = CheckBytes(volume.bytes);
    EXPECT_IDS(outcome, "V04");
    EXPECT_EQ(outcome.findings[0].text, "overlap: block 1 with blocks 0..2 of the volume header");

    volume = Sound();
    volume.PatchHeaders32(kForks + 12, 5);
    outcome = CheckBytes(volume.bytes);
    EXPECT_IDS(outcome, "V04");
    EXPECT_EQ(outcome.findings[0].text, "its extents hold 1 block, the fork says 5");
    EXPECT_EQ(outcome.summary.stages[0].errors, 1u);
}

TEST(CheckVolumeHeader, V04NoCatalogAtAll) {
    VolumeImage volume = Sound();
    for (u32 i = 0; i < kForkSize; i += 4) {
        volume.PatchHeaders32(kForks + 2 * kForkSize + i, 0);
    }
    EXPECT_IDS(CheckBytes(volume.bytes, Full()), "V04 H05");
}

TEST(CheckVolumeHeader, V08UncleanAndJournalNotEmpty) {
    VolumeImage volume = Sound();
    volume.PatchHeaders32(4, 0x2000);
    volume.PatchHeaders32(12, 800);
    const u64 info = 800 * 512;
    volume.Patch32(info, 1);
    volume.Patch32(info + 40, 801 * 512);
    const u64 journal = 801 * 512;
    volume.Patch32(journal, 0x4A4E4C78);
    volume.Patch32(journal + 4, 0x12345678);
    volume.Patch32(journal + 12, 512);
    volume.Patch32(journal + 20, 2048);
    volume.Patch32(journal + 28, 8192);
    volume.Patch32(journal + 40, 512);
    Outcome outcome = CheckBytes(volume.bytes);
    EXPECT_EQ(outcome.Ids(true), "V08") << outcome.Lines();
    ASSERT_EQ(outcome.findings.size(), 2u);
    EXPECT_EQ(outcome.findings[1].text,
              "the journal holds transactions (1536 bytes) that are not in their places yet");
    EXPECT_EQ(outcome.summary.errors + outcome.summary.warnings, 0u);
    EXPECT_EQ(outcome.summary.stages[0].verdict, CheckVerdict::kSound);
    volume.Patch32(journal + 20, 512);
    EXPECT_EQ(CheckBytes(volume.bytes).findings.size(), 1u);
    volume.Patch32(journal, 0);
    EXPECT_EQ(CheckBytes(volume.bytes).findings[1].text, "the journal has no valid header");
}

TEST(CheckVolumeHeader, H09CompareTypeAgainstTheVersion) {
    VolumeImage volume = Sound();
    volume.bytes[volume.catalogStart * 512 + kHeadKeyCompareType] = kKeyCompareBinary;
    EXPECT_EQ(CheckBytes(volume.bytes).Ids(true), "H09");
    volume.isHfsx = true;
    volume.Build();
    EXPECT_EQ(CheckBytes(volume.bytes).Ids(true), "");
    volume.bytes[volume.catalogStart * 512 + kHeadKeyCompareType] = 0x12;
    EXPECT_EQ(CheckBytes(volume.bytes).Ids(true), "H09");
}

TEST(CheckBadBlockList, R07RunsAndTheirOrder) {
    VolumeImage volume;
    volume.extents = {{DiskExtKey(kForkData, 5, 0), ExtentData({{900, 16}, {930, 4}})},
                      {DiskExtKey(kForkData, 5, 20), ExtentData({{950, 1}})}};
    for (u32 block = 900; block < 960; ++block) {
        if (block < 916 || (block >= 930 && block < 934) || block == 950) {
            volume.owned.push_back(block);
        }
    }
    volume.Build();
    volume.PatchHeaders32(4, 0x300);
    Outcome outcome = CheckBytes(volume.bytes, Full());
    EXPECT_EQ(outcome.Ids(true), "") << outcome.Lines();
    EXPECT_EQ(outcome.summary.stages[4].runs, 3u);
    volume.PatchHeaders32(4, 0x100);
    EXPECT_EQ(CheckBytes(volume.bytes).summary.warnings, 1u);

    volume.extents[1].key = DiskExtKey(kForkData, 5, 21);
    volume.Build();
    volume.PatchHeaders32(4, 0x300);
    outcome = CheckBytes(volume.bytes);
    EXPECT_IDS(outcome, "R07");
    EXPECT_EQ(outcome.findings[0].text, "bad blocks start at 21, expected 20");
    EXPECT_EQ(outcome.summary.stages[4].verdict, CheckVerdict::kFindings);

    volume.extents[1].key = DiskExtKey(kForkResource, 5, 20);
    volume.Build();
    EXPECT_EQ(CheckBytes(volume.bytes).First(CheckId::R07).text,
              "bad blocks under the resource fork");
}

TEST(CheckSelection, OnlySkipTreesAndLimits) {
    VolumeImage volume = Sound();
    const u64 catalog = u64{volume.catalogStart} * 512;
    volume.Patch32(catalog + kHeadLeafRecords, 99);
    volume.Patch32(catalog + kHeadFreeNodes, 1);
    EXPECT_IDS(CheckBytes(volume.bytes), "H11 H13");
    CheckOptions options;
    options.only = CheckIdBit(CheckId::H11);
    EXPECT_IDS(CheckBytes(volume.bytes, options), "H11");
    options = {};
    options.skip = CheckIdBit(CheckId::H11);
    EXPECT_IDS(CheckBytes(volume.bytes, options), "H13");
    options = {};
    options.trees = 1u << kExtentsFileId;
    EXPECT_IDS(CheckBytes(volume.bytes, options), "");
    options = {};
    options.maxErrors = 1;
    const Outcome limited = CheckBytes(volume.bytes, options);
    EXPECT_EQ(limited.findings.size(), 1u);
    EXPECT_EQ(limited.summary.warnings, 2u);
    EXPECT_EQ(limited.summary.untold, 1u);
    EXPECT_FALSE(limited.summary.isStopped);
}

TEST(CheckSelection, AskingForAnInvariantByNameBringsItsScope) {
    VolumeImage volume = Sound();
    volume.PatchHeaders32(32, 77);
    EXPECT_IDS(CheckBytes(volume.bytes), "");
    CheckOptions options;
    options.only = CheckIdBit(CheckId::V06);
    EXPECT_IDS(CheckBytes(volume.bytes, options), "V06");
}

TEST(CheckSelection, ErrorsBeyondTheLimitStopTheRun) {
    VolumeImage volume = Sound();
    volume.PatchHeaders32(0, 0x482B0005);
    CheckOptions options = Full();
    options.maxErrors = 1;
    const Outcome outcome = CheckBytes(volume.bytes, options);
    EXPECT_TRUE(outcome.summary.isStopped);
    EXPECT_EQ(outcome.findings.size(), 1u);
    EXPECT_EQ(outcome.summary.stages[0].verdict, CheckVerdict::kStopped);
    EXPECT_STREQ(outcome.summary.stages[0].why, "too many errors");
    EXPECT_EQ(outcome.summary.stages[1].verdict, CheckVerdict::kNotRun);
}

}  // namespace VELK::test
