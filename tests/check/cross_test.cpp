// What only a full run sees: the trees against each other, the allocation file, the counts.
#include <gtest/gtest.h>

#include "check_support.h"
#include "hfs/format.h"
#include "keys.h"

namespace VELK::test {
namespace {

#define EXPECT_IDS(outcome, ids) EXPECT_EQ((outcome).Ids(), ids) << (outcome).Lines()

constexpr u32 kData = VolumeImage::kDataStart;
constexpr u32 kBlock = VolumeImage::kBlockSize;

// A full run over the volume as the test left its parts.
Outcome CheckParts(VolumeImage* volume) {
    volume->Sort();
    volume->Build();
    return CheckBytes(volume->bytes, Full());
}

void AddFile(VolumeImage* volume, u32 id, std::u16string_view name, const Runs& data) {
    volume->catalog.push_back(
        {DiskCatKey(16, name), FileData(id, ForkData(data, kBlock), Bytes(80))});
    volume->catalog.push_back({DiskCatKey(id, u""), ThreadData(false, 16, name)});
    Bytes* folder = VolumeImage::DataOf(&volume->catalog, DiskCatKey(2, u"dir"));
    Put32(folder, 4, Get32(*folder, 4) + 1);
    for (const auto& run : data) {
        for (u32 i = 0; i < run.second; ++i) {
            volume->owned.push_back(run.first + i);
        }
    }
}

// A file of ten runs: eight in its record, two in the extents tree.
VolumeImage WithLongFile() {
    VolumeImage volume;
    Runs runs;
    for (u32 i = 0; i < 10; ++i) {
        runs.push_back({kData + 10 + 3 * i, 2});
    }
    AddFile(&volume, 30, u"long", runs);
    volume.extents = {{DiskExtKey(kForkData, 30, 16), ExtentData({runs[8], runs[9]})}};
    return volume;
}

}  // namespace

TEST(CheckCross, V05BlocksInUseMarkedFree) {
    VolumeImage volume;
    volume.owned.clear();
    Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "V05");
    EXPECT_EQ(outcome.findings[0].where, "volume blocks 700..701");
    EXPECT_EQ(outcome.findings[0].text, "the blocks are in use by file 17, but marked free");
    EXPECT_EQ(outcome.findings[0].offset, 3u * kBlock + 700 / 8);

    VolumeImage other;
    other.Build();
    other.bytes[3 * kBlock] = 0xEF;  // block 3: the allocation file itself
    outcome = CheckBytes(other.bytes, Full());
    EXPECT_IDS(outcome, "V05 V06");
    EXPECT_EQ(outcome.First(CheckId::V05).text,
              "the block is in use by the allocation file, but marked free");
}

TEST(CheckCross, V05MarksWithoutOwnerAndBehindTheEnd) {
    VolumeImage volume;
    volume.owned.push_back(kData + 50);
    Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "");
    EXPECT_EQ(outcome.First(CheckId::V05).text, "1 block is marked used but belongs to nothing");
    EXPECT_EQ(outcome.First(CheckId::V05).severity, CheckSeverity::kInfo);
    volume.bytes[3 * kBlock + VolumeImage::kTotalBlocks / 8] = 0x40;
    EXPECT_IDS(CheckBytes(volume.bytes, Full()), "V05");
}

TEST(CheckCross, V06CountsOfFilesFoldersAndFreeBlocks) {
    VolumeImage volume;
    volume.Build();
    volume.PatchHeaders32(32, 5);
    volume.PatchHeaders32(36, 6);
    volume.PatchHeaders32(48, 7);
    const Outcome outcome = CheckBytes(volume.bytes, Full());
    EXPECT_IDS(outcome, "V06");
    ASSERT_EQ(outcome.findings.size(), 3u);
    EXPECT_EQ(outcome.findings[0].text, "fileCount is 5, the catalog has 2 files");
    EXPECT_EQ(outcome.findings[1].text,
              "folderCount is 6, the catalog has 1 folder below the root");
    EXPECT_EQ(outcome.summary.errors, 0u);
}

TEST(CheckCross, V07NextIdNotAboveAll) {
    VolumeImage volume;
    volume.Build();
    volume.PatchHeaders32(64, 18);
    EXPECT_IDS(CheckBytes(volume.bytes, Full()), "V07");
    volume.PatchHeaders32(4, 0x1100);  // IDs are reused
    EXPECT_IDS(CheckBytes(volume.bytes, Full()), "");
}

TEST(CheckCross, R05ThreadMissingOrWrong) {
    VolumeImage volume;
    volume.catalog.pop_back();  // thread of "beta"
    Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R05");
    EXPECT_EQ(outcome.findings[0].text, "file 16:\"beta\" (ID 18) has no thread");

    volume = {};
    volume.catalog.back().data = ThreadData(false, 16, u"gamma");
    outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R05");
    EXPECT_EQ(outcome.findings[0].text,
              "the thread of ID 18 points to 16:\"gamma\", its record is 16:\"beta\"");

    volume = {};
    volume.catalog.back().data = ThreadData(true, 16, u"beta");
    EXPECT_IDS(CheckParts(&volume), "R05");

    volume = {};
    volume.catalog.push_back({DiskCatKey(40, u""), ThreadData(false, 16, u"none")});
    outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R05");
    EXPECT_EQ(outcome.findings[0].text, "a thread of ID 40, which no file or folder has");
}

TEST(CheckCross, R05ParentMissingOrAFile) {
    VolumeImage volume;
    volume.catalog[5].key = DiskCatKey(99, u"beta");
    volume.catalog.back().data = ThreadData(false, 99, u"beta");
    Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R05");
    EXPECT_EQ(outcome.findings[0].text, "file 99:\"beta\" (ID 18): there is no folder 99");
    EXPECT_EQ(outcome.summary.warnings, 1u);  // the valence of the folder it left

    volume = {};
    volume.catalog[5].key = DiskCatKey(17, u"beta");
    volume.catalog.back().data = ThreadData(false, 17, u"beta");
    EXPECT_NE(CheckParts(&volume).Lines().find("ID 17 is a file"), std::string::npos);
}

TEST(CheckCross, R05RootMissing) {
    VolumeImage volume;
    *VolumeImage::DataOf(&volume.catalog, DiskCatKey(1, u"root")) = FolderData(50, 1);
    const Outcome outcome = CheckParts(&volume);
    EXPECT_NE(outcome.Lines().find("there is no root folder"), std::string::npos)
        << outcome.Lines();
}

TEST(CheckCross, R05ValenceMiscounted) {
    VolumeImage volume;
    *VolumeImage::DataOf(&volume.catalog, DiskCatKey(2, u"dir")) = FolderData(16, 9);
    const Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R05");
    EXPECT_EQ(outcome.findings[0].text, "valence of folder 2:\"dir\" (ID 16) is 9, it has 2 items");
    EXPECT_EQ(outcome.summary.errors, 0u);
}

TEST(CheckCross, R05FolderInsideItself) {
    VolumeImage volume;
    // 20 lies in 21, 21 in 20.
    volume.catalog.push_back({DiskCatKey(20, u""), ThreadData(true, 21, u"a")});
    volume.catalog.push_back({DiskCatKey(20, u"b"), FolderData(21, 1)});
    volume.catalog.push_back({DiskCatKey(21, u""), ThreadData(true, 20, u"b")});
    volume.catalog.push_back({DiskCatKey(21, u"a"), FolderData(20, 1)});
    const Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R05");
    ASSERT_EQ(outcome.findings.size(), 1u);
    EXPECT_EQ(outcome.findings[0].text, "folder 21:\"a\" (ID 20) lies in itself");
}

TEST(CheckCross, R06BlocksOutsideTheVolumeOrOwnedTwice) {
    VolumeImage volume;
    AddFile(&volume, 30, u"twin", {{kData + 1, 4}});
    Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R06");
    EXPECT_EQ(outcome.findings[0].where, "volume block 701");
    EXPECT_EQ(outcome.findings[0].text, "in use by file 17 and by file 30");

    volume = {};
    AddFile(&volume, 30, u"thief", {{4, 2}});
    outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R06");
    EXPECT_EQ(outcome.findings[0].text, "in use by the catalog file and by file 30");

    volume = {};
    AddFile(&volume, 30, u"far", {});
    *VolumeImage::DataOf(&volume.catalog, DiskCatKey(16, u"far")) =
        FileData(30, ForkData({{999, 0xFFFFFFFF}}, 1), Bytes(80));
    outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R06");
    EXPECT_EQ(outcome.findings[0].text,
              "outside the volume of 1000 blocks: blocks 999..4294968293 of file 30");
}

TEST(CheckCross, R06SizeThatDoesNotFitItsBlocks) {
    VolumeImage volume;
    Put32(VolumeImage::DataOf(&volume.catalog, DiskCatKey(16, u"alpha")), 88 + 4, 1025);
    const Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R06");
    EXPECT_EQ(outcome.findings[0].text,
              "the data fork of file 17: size 1025 does not fit 2 blocks");
}

TEST(CheckCross, R08OverflowExtents) {
    VolumeImage volume = WithLongFile();
    EXPECT_IDS(CheckParts(&volume), "");

    volume.extents[0].key = DiskExtKey(kForkData, 30, 15);
    Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R08");
    EXPECT_EQ(outcome.findings[0].text, "extents of file 30 start at block 15, expected 16");

    volume.extents.clear();
    outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R08");
    EXPECT_EQ(outcome.findings[0].text,
              "the data fork of file 30 has 20 blocks, its extents hold 16");

    volume = WithLongFile();
    volume.extents[0].key = DiskExtKey(kForkData, 31, 16);
    outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R08");
    EXPECT_NE(outcome.Lines().find("extents of ID 31, which is no file"), std::string::npos);

    volume = WithLongFile();
    volume.extents.push_back({DiskExtKey(kForkResource, 30, 16), ExtentData({{kData + 80, 1}})});
    EXPECT_IDS(CheckParts(&volume), "V05 R08");
}

TEST(CheckCross, R08AttributeForks) {
    Bytes fork(8);
    Put32(&fork, 0, 0x20);
    AppendBytes(&fork, ForkData({{kData + 10, 1}, {kData + 12, 2}}, kBlock));
    Bytes more(8);
    Put32(&more, 0, 0x30);
    AppendBytes(&more, ExtentData({{kData + 20, 4}}));
    VolumeImage volume;
    volume.attributes.push_back({DiskAttrKey(18, 0, u"big"), fork});
    for (u32 block : {10u, 12u, 13u, 20u, 21u, 22u, 23u}) {
        volume.owned.push_back(kData + block);
    }
    Put32(&volume.attributes.back().data, 8 + 12, 7);
    volume.attributes.push_back({DiskAttrKey(18, 3, u"big"), more});
    EXPECT_IDS(CheckParts(&volume), "");
    volume.attributes.back().key = DiskAttrKey(18, 4, u"big");
    EXPECT_IDS(CheckParts(&volume), "R08");
    volume.attributes.pop_back();
    const Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R08");
    EXPECT_EQ(outcome.findings[0].text,
              "an attribute fork of ID 18 has 7 blocks, its extents hold 3");
}

TEST(CheckCross, R09AttributeOfNobody) {
    VolumeImage volume;
    volume.attributes.push_back({DiskAttrKey(77, 0, u"tag"), InlineAttribute(4)});
    const Outcome outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R09");
    EXPECT_EQ(outcome.findings[0].text, "attribute 77:\"tag\": no file or folder has ID 77");
}

TEST(CheckCross, R10IdUsedTwiceOrReserved) {
    VolumeImage volume;
    AddFile(&volume, 30, u"one", {});
    AddFile(&volume, 31, u"two", {});
    Put32(VolumeImage::DataOf(&volume.catalog, DiskCatKey(16, u"two")), 8, 30);
    Outcome outcome = CheckParts(&volume);
    EXPECT_NE(outcome.Ids().find("R10"), std::string::npos);
    EXPECT_EQ(outcome.First(CheckId::R10).text,
              "ID 30 of file 16:\"two\" is used by another record too");

    volume = {};
    AddFile(&volume, 9, u"low", {});
    outcome = CheckParts(&volume);
    EXPECT_IDS(outcome, "R10");
    EXPECT_EQ(outcome.findings[0].text, "ID 9 of file 16:\"low\" is reserved");
}

TEST(CheckCross, D01KeysThatALookupMisses) {
    // The separators of the second and the third leaf change places with keys between.
    std::vector<TreeRecord> records;
    for (u32 i = 0; i < 8; ++i) {
        records.push_back({DiskExtKey(kForkData, 100 + 10 * i, 8), ExtentData({{1, 1}})});
    }
    TreeShape shape;
    shape.fileId = kExtentsFileId;
    shape.recordsPerLeaf = 2;
    TreeImage tree = BuildTree(shape, records);
    const u32 record = Get16(tree.Node(tree.rootNode), 512 - 4);
    tree.Patch32(tree.rootNode, record + kExtKeyFileId, 125);
    CheckOptions options = Full();
    options.only = CheckIdBit(CheckId::D01);
    Outcome outcome = CheckImage(tree, options);
    EXPECT_IDS(outcome, "D01");
    EXPECT_EQ(outcome.findings[0].text,
              "looking up 120:data:8 from the root ends at node 1 and does not find it");
    tree.Patch32(tree.rootNode, record + kExtKeyFileId, 135);
    outcome = CheckImage(tree, options);
    EXPECT_EQ(outcome.findings[0].text,
              "looking up 120:data:8 from the root ends at node 1 and does not find it; so for 1 "
              "more record of this node");
}

TEST(CheckCross, NothingIsReadForRulesThatNobodyWants) {
    VolumeImage volume;
    volume.Build();
    const auto bytesRead = [&](u64 only) {
        CheckOptions options = Full();
        options.only = only;
        return CheckBytes(volume.bytes, options).summary.bytes;
    };
    const u64 treesAlone = bytesRead(CheckIdBit(CheckId::N01));
    const u64 blocks = bytesRead(CheckIdBit(CheckId::V05));
    EXPECT_LE(treesAlone, CheckBytes(volume.bytes).summary.bytes);
    EXPECT_GT(blocks, treesAlone);
    EXPECT_GT(bytesRead(CheckIdBit(CheckId::V05) | CheckIdBit(CheckId::R10)), blocks);
}

TEST(CheckCross, NothingIsComparedWithADamagedTree) {
    VolumeImage volume;
    volume.Build();
    const u64 leaf = (u64{volume.catalogStart} + volume.catalogTree.levels[1][0]) * 512;
    volume.Patch16(leaf + kDescNumRecords, 0xFFFF);
    const Outcome outcome = CheckBytes(volume.bytes, Full());
    EXPECT_IDS(outcome, "N03");
    EXPECT_EQ(outcome.summary.stages[5].verdict, CheckVerdict::kNotRun);
    EXPECT_STREQ(outcome.summary.stages[5].why, "a tree is damaged");
}

}  // namespace VELK::test
