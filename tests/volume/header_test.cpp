// Volume headers and tree headers field by field: what is wrong with one in words, where two
// differ, which of the places a copy may stand at is believed.
#include "hfs/volume/volume_header.h"

#include <gtest/gtest.h>

#include "capture.h"
#include "disk_builder.h"
#include "hfs/format.h"
#include "hfs/volume/image_volume.h"
#include "hfs/volume/tree_diagnosis.h"

namespace VELK {
namespace {

using test::Bytes;
using test::DiskVolume;

TEST(VolumeHeaders, EachFieldThatKeepsAVolumeFromBeingRead) {
    struct {
        u16 signature;
        u16 version;
        u32 blockSize;
        u32 totalBlocks;
        const char* text;
    } const headers[] = {
        {0x482B, 4, 4096, 64, ""},
        {0x4858, 5, 512, 1, ""},
        {0x4244, 4, 4096, 64, "signature 4244 is neither 482B nor 4858"},
        {0x482B, 5, 4096, 64, "version 5 does not belong to signature 482B (HFS+ is 4)"},
        {0x4858, 4, 4096, 64, "version 4 of HFSX is not known (5 is)"},
        {0x482B, 4, 3000, 64, "block size 3000 is not a power of two"},
        {0x482B, 4, 0, 64, "block size 0 is not a power of two"},
        {0x482B, 4, 256, 64, "block size 256 is below 512"},
        {0x482B, 4, 4096, 0, "the volume has 0 blocks"},
    };
    for (const auto& fields : headers) {
        VolumeHeader header{};
        header.signature = fields.signature;
        header.version = fields.version;
        header.blockSize = fields.blockSize;
        header.totalBlocks = fields.totalBlocks;
        const std::string text = fields.text;
        EXPECT_EQ(text.empty() ? text : "volume header at 1024: " + text + ": try --backup-header",
                  CheckHeader(header, 1024).Text());
    }
}

TEST(VolumeHeaders, DifferencesAreNamed) {
    VolumeHeader a{};
    VolumeHeader b{};
    EXPECT_EQ("", HeaderDifferences(a, b));
    b.totalBlocks = 7;
    const std::string one = HeaderDifferences(a, b);
    EXPECT_FALSE(one.empty());
    EXPECT_EQ(std::string::npos, one.find(", "));
    b.catalogFile.extents[3].startBlock = 1;
    const std::string two = HeaderDifferences(a, b);
    EXPECT_EQ(0u, two.find(one + ", ")) << two;
}

TEST(VolumeHeaders, FilesHaveForksAndNames) {
    VolumeHeader header{};
    EXPECT_EQ(&header.extentsFile, header.ForkOf(3));
    EXPECT_EQ(&header.catalogFile, header.ForkOf(4));
    EXPECT_EQ(&header.allocationFile, header.ForkOf(6));
    EXPECT_EQ(&header.startupFile, header.ForkOf(7));
    EXPECT_EQ(&header.attributesFile, header.ForkOf(8));
    for (const u32 fileId : {0u, 2u, 5u, 9u, ~0u}) {
        EXPECT_EQ(nullptr, header.ForkOf(fileId));
        EXPECT_STREQ("file", ForkName(fileId));
    }
    EXPECT_STREQ("startup", ForkName(7));
}

// --- tree headers --------------------------------------------------------------------------------

std::string Diagnosis(const Bytes& header, u64 forkBytes = 65536) {
    return DiagnoseTree({kCatalogFileId, kErrCorrupt, header.empty() ? nullptr : header.data(), 512,
                         forkBytes, 40960})
        .Text();
}

Bytes SoundTreeHeader() {
    Bytes header(kHeadEnd);
    test::Put16(&header, kHeadNodeSize, 4096);
    test::Put32(&header, kHeadTotalNodes, 16);
    test::Put32(&header, kHeadAttributes, kBTBigKeysMask);
    return header;
}

TEST(TreeHeaders, WhereNothingIsWrongTheStatusIsAllThereIs) {
    constexpr char kNothing[] = "catalog tree: corrupt (A000011C): run check";
    Bytes header = SoundTreeHeader();
    EXPECT_EQ(kNothing, Diagnosis(header));
    EXPECT_EQ(kNothing, Diagnosis(Bytes()));  // it could not be read
    for (const u8 type : {u8{0x80}, u8{0xFF}}) {
        header[kHeadBtreeType] = type;
        EXPECT_EQ(kNothing, Diagnosis(header));
    }
    // Of 3,000 bytes no node is: they are counted as if they had 512.
    test::Put16(&header, kHeadNodeSize, 3000);
    test::Put32(&header, kHeadTotalNodes, 128);
    EXPECT_EQ(kNothing, Diagnosis(header));
    test::Put32(&header, kHeadTotalNodes, 129);
    EXPECT_EQ(
        "catalog tree: corrupt (A000011C): totalNodes 129 does not fit the file of 65,536 bytes "
        "(image offset 0xa024, check H05)",
        Diagnosis(header));
}

TEST(TreeHeaders, KindsNobodyKnows) {
    for (const u8 type : {u8{1}, u8{0x7F}, u8{0x81}, u8{0xFE}}) {
        Bytes header = SoundTreeHeader();
        header[kHeadBtreeType] = type;
        EXPECT_EQ(Format("catalog tree: corrupt (A000011C): btreeType 0x%02X is not known (image "
                         "offset 0x%x, check H06)",
                         type, 40960 + kHeadBtreeType),
                  Diagnosis(header));
    }
}

// --- the copy of the volume header ---------------------------------------------------------------

class Headers : public testing::Test {
protected:
    bool Open(const Bytes& disk, Access access = Access::kReadOnly) {
        options_.access = access;
        volume_ = ImageVolume::Open(test::DeviceOf(disk), options_, nullptr, &problem_);
        return volume_ != nullptr;
    }

    test::Capture capture_;
    OpenOptions options_;
    Problem problem_;
    std::unique_ptr<ImageVolume> volume_;
};

TEST_F(Headers, ACopyOfAnotherVolumeIsNone) {
    const Bytes disk = DiskVolume{}.Build();
    const std::size_t copy = disk.size() - 1024;
    struct {
        const char* what;
        std::size_t at;
        u32 value;
    } const changes[] = {{"signature", 0, 0x42440004},
                         {"block size", 40, 3000},
                         {"small blocks", 40, 256},
                         {"other blocks", 40, 8192}};
    for (const auto& change : changes) {
        Bytes bad = disk;
        test::Put32(&bad, copy + change.at, change.value);
        options_.backupHeader = false;
        ASSERT_TRUE(Open(bad)) << problem_.Text();
        EXPECT_EQ(nullptr, volume_->AlternateHeader(nullptr)) << change.what;
        options_.backupHeader = true;
        ASSERT_FALSE(Open(bad)) << change.what;
        EXPECT_EQ("alternate volume header at 261,120: there is none", problem_.Text());
    }
    u64 offset = 0;
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    ASSERT_NE(nullptr, volume_->AlternateHeader(&offset));
    EXPECT_EQ(copy, offset);
    EXPECT_TRUE(volume_->UsedBackupHeader());
}

// The map gives the volume less room, or more, than it takes.
TEST_F(Headers, TheCopyIsFoundWhateverTheMapSays) {
    const Bytes volume = DiskVolume{}.Build();
    for (const u32 sectors : {0u, 2u, 4u, 5u, 511u, 513u, 5000u}) {
        Bytes disk = test::InApm(volume, 512);
        test::Put32(&disk, 2 * 512 + 12, sectors);
        disk.resize(disk.size() + 100000);
        ASSERT_TRUE(Open(disk)) << problem_.Text();
        u64 offset = 0;
        ASSERT_NE(nullptr, volume_->AlternateHeader(&offset)) << sectors;
        EXPECT_EQ(test::kPartitionStart + volume.size() - 1024, offset) << sectors;
        EXPECT_NE(nullptr, volume_->Tree(kCatalogFileId, &problem_)) << problem_.Text();
    }
}

// Blocks so large that the copy can stand at more places than are looked at.
TEST_F(Headers, BlocksBeyondTheUsualSizes) {
    DiskVolume shape;
    shape.blockSize = 131072;
    shape.blocks = 16;
    Bytes disk = shape.Build();
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    EXPECT_NE(nullptr, volume_->AlternateHeader(nullptr));
    EXPECT_NE(nullptr, volume_->Tree(kCatalogFileId, &problem_)) << problem_.Text();
    disk.resize(disk.size() + 700);
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    u64 offset = 0;
    ASSERT_NE(nullptr, volume_->AlternateHeader(&offset));
    EXPECT_EQ(16u * 131072 - 1024, offset);
}

// --- node sizes and map blocks -------------------------------------------------------------------

TEST_F(Headers, NodesOfSizesThatNoneHasKeepFromWriting) {
    const DiskVolume shape;
    for (const u32 size : {256u, 3000u, 65535u}) {
        Bytes disk = shape.Build();
        test::Put16(&disk, test::CatalogOffset(shape) + kHeadNodeSize, size);
        ASSERT_FALSE(Open(disk, Access::kWrite)) << size;
        EXPECT_EQ(Format("catalog tree: node size %u is not a power of two from 512 to 32,768: the "
                         "volume can only be read",
                         size),
                  problem_.Text());
        EXPECT_EQ("H02", problem_.check);
        ASSERT_TRUE(Open(disk)) << problem_.Text();
        EXPECT_EQ(4096u, volume_->Fs()->mapBlockSize);
    }
}

TEST_F(Headers, MapBlocksOfSizesThatNoneHas) {
    const Bytes disk = DiskVolume{}.Build();
    for (const u32 size : {1u, 256u, 1000u, 65536u}) {
        options_.mapBlockSize = size;
        ASSERT_FALSE(Open(disk)) << size;
        EXPECT_EQ("map block " + std::to_string(size) + " is not a power of two from 512 to 32,768",
                  problem_.Text());
        EXPECT_EQ(ExitClass::kUsage, problem_.exitClass);
    }
    options_.mapBlockSize = 512;
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    EXPECT_EQ(512u, volume_->Fs()->mapBlockSize);
}

}  // namespace
}  // namespace VELK
