// Which partition of a map is taken, and the sentence where none is: maps with several volumes,
// with other file systems, with volumes whose header is gone.
#include "hfs/volume/partition.h"

#include <gtest/gtest.h>

#include <cstring>

#include "disk_builder.h"
#include "hfs/volume/partition_maps.h"
#include "hfs/volume/volume_header.h"

namespace VELK {
namespace {

using test::Bytes;
using test::DiskVolume;

constexpr std::size_t kPart = test::kPartitionStart;  // of the only volume of a disk built here

// One entry more for the Apple partition map of InApm, with what lies there behind the disk.
void AddPartition(Bytes* disk, u32 number, const char* type, const Bytes& content) {
    const std::size_t at = std::size_t{number} * 512;
    std::memcpy(disk->data() + at, "PM", 2);
    for (u32 entry = 1; entry <= number; ++entry) {
        test::Put32(disk, std::size_t{entry} * 512 + 4, number);
    }
    test::Put32(disk, at + 8, static_cast<u32>(disk->size() / 512));
    test::Put32(disk, at + 12, static_cast<u32>(content.size() / 512));
    std::memset(disk->data() + at + 48, 0, 32);
    std::memcpy(disk->data() + at + 48, type, std::strlen(type));
    test::AppendBytes(disk, content);
}

Bytes OtherSystem(std::size_t offset, const char* signature, std::size_t size) {
    Bytes bytes(size);
    std::memcpy(bytes.data() + offset, signature, std::strlen(signature));
    return bytes;
}

Bytes PlainHfs() {
    Bytes bytes(8192);
    test::Put16(&bytes, 1024, 0x4244);
    return bytes;
}

void DestroyHeader(Bytes* disk, std::size_t volume) {
    test::Put32(disk, volume + 1024, 0x58585858);
}

class Partitions : public testing::Test {
protected:
    // Empty when a volume was found.
    std::string Locate(const Bytes& disk) {
        return LocateVolume(test::DeviceOf(disk).get(), options_, &scan_).Text();
    }
    const VolumePlace& Place() const { return scan_.place; }

    PlaceOptions options_;
    VolumeScan scan_;
};

TEST_F(Partitions, ThreeVolumesAreAllNamed) {
    Bytes disk = test::InApm(DiskVolume{}.Build(), 512);
    AddPartition(&disk, 4, "Apple_HFS", DiskVolume{}.Build());
    AddPartition(&disk, 5, "Apple_HFSX", DiskVolume{}.Build());
    EXPECT_EQ("3 HFS+ volumes (partitions 2 and 4, 5): choose with --partition", Locate(disk));
    options_.partition = 5;
    EXPECT_EQ("", Locate(disk));
    EXPECT_EQ(5u, Place().partition);
    EXPECT_EQ("chosen", scan_.partitions[4].reason);
    EXPECT_TRUE(scan_.partitions[4].taken);
    EXPECT_FALSE(scan_.partitions[1].taken);
}

TEST_F(Partitions, ANumberWithoutAMapIsAnswered) {
    options_.partition = 3;
    EXPECT_EQ("partition 3: the image has no partition map: see info --partitions",
              Locate(DiskVolume{}.Build()));
}

TEST_F(Partitions, WhatANamedPartitionHoldsInstead) {
    Bytes disk = test::InApm(DiskVolume{}.Build(), 512);
    AddPartition(&disk, 4, "Apple_HFS", PlainHfs());
    AddPartition(&disk, 5, "Windows_NTFS", OtherSystem(3, "NTFS    ", 8192));
    AddPartition(&disk, 6, "Apple_HFS", Bytes(8192));
    options_.partition = 4;
    EXPECT_EQ(
        "HFS volume without an HFS+ volume inside (signature 4244 at 332,800): only HFS+ and HFSX "
        "are supported",
        Locate(disk));
    options_.partition = 5;
    EXPECT_EQ("partition 5 holds NTFS (NTFS at 339,971), not HFS+", Locate(disk));
    options_.partition = 6;
    EXPECT_EQ(
        "volume header at 349,184: signature 0000 is neither 482B nor 4858: try --backup-header",
        Locate(disk));
    EXPECT_FALSE(scan_.partitions[5].taken);
    EXPECT_EQ("type says HFS, but there is no volume header", scan_.partitions[5].reason);
}

TEST_F(Partitions, WithoutAVolumeThePlainOneIsNamedBeforeTheOthers) {
    Bytes disk = test::InApm(Bytes(8192), 512);
    std::memcpy(disk.data() + 2 * 512 + 48, "Apple_Free", 10);
    AddPartition(&disk, 4, "Linux", OtherSystem(1080, "\x53\xEF", 8192));
    AddPartition(&disk, 5, "Other", PlainHfs());
    EXPECT_EQ(0u, Locate(disk).find("HFS volume without an HFS+ volume inside"));
}

TEST_F(Partitions, WithoutAVolumeTheLargestOtherSystemIsNamed) {
    Bytes disk = test::InApm(Bytes(8192), 512);
    std::memcpy(disk.data() + 2 * 512 + 48, "Apple_Free", 10);
    AddPartition(&disk, 4, "boot", OtherSystem(0, "XFSB", 4096));
    AddPartition(&disk, 5, "Linux", OtherSystem(1080, "\x53\xEF", 16384));
    AddPartition(&disk, 6, "swap", OtherSystem(0, "hsqs", 8192));
    EXPECT_EQ("partition 5 holds ext2/3/4 (EF53 at 83,000), not HFS+", Locate(disk));
}

// The type alone says HFS; what lies there says otherwise.
TEST_F(Partitions, ATypeIsNotBelievedAgainstASignature) {
    Bytes disk = test::InApm(OtherSystem(3, "EXFAT   ", 8192), 512);
    EXPECT_EQ("partition 2 holds exFAT (EXFAT at 65,539), not HFS+", Locate(disk));
    disk = test::InApm(Bytes(8192), 512);
    EXPECT_EQ(
        "volume header at 66,560: signature 0000 is neither 482B nor 4858: try --backup-header",
        Locate(disk));
}

TEST_F(Partitions, TheCopyOfAHeaderLeadsToAVolumeWhenAskedFor) {
    for (const bool hfsx : {false, true}) {
        DiskVolume shape;
        shape.hfsx = hfsx;
        const Bytes volume = shape.Build();
        Bytes disk = test::InApm(volume, 512);
        DestroyHeader(&disk, kPart);
        options_.lenient = false;
        EXPECT_EQ(
            "volume header at 66,560: signature 5858 is neither 482B nor 4858: try "
            "--backup-header",
            Locate(disk));
        options_.lenient = true;
        EXPECT_EQ("", Locate(disk));
        EXPECT_EQ(kPart, Place().offset);
        EXPECT_EQ(2u, Place().partition);
        // Nor without a map.
        Bytes bare = volume;
        DestroyHeader(&bare, 0);
        EXPECT_EQ("", Locate(bare));
        EXPECT_EQ(0u, Place().partition);
        options_.lenient = false;
        EXPECT_EQ(
            "volume header at 1024: signature 5858 is neither 482B nor 4858: try --backup-header",
            Locate(bare));
        options_.lenient = true;
        // A copy of another version is none.
        test::Put16(&disk, kPart + volume.size() - 1022, 9);
        EXPECT_EQ(0u, Locate(disk).find("volume header at 66,560: signature 5858"));
        test::Put16(&bare, bare.size() - 1022, 9);
        EXPECT_EQ(0u, Locate(bare).find("no HFS+ volume found"));
        options_.offset = 0;
        EXPECT_EQ(0u, Locate(bare).find("volume header at 1024: signature 5858"));
        options_.offset.reset();
    }
}

TEST_F(Partitions, NamesAndTypesOfFullLengthAreShownAsFarAsTheyCanBe) {
    Bytes disk = test::InApm(DiskVolume{}.Build(), 512);
    std::memset(disk.data() + 2 * 512 + 16, 'n', 32);
    std::memset(disk.data() + 2 * 512 + 48, 't', 32);
    disk[2 * 512 + 17] = 7;
    disk[2 * 512 + 18] = 0x80;
    ASSERT_EQ("", Locate(disk));
    EXPECT_EQ("n??" + std::string(29, 'n'), scan_.partitions[1].name);
    EXPECT_EQ(std::string(32, 't'), scan_.partitions[1].type);

    disk = test::InGpt(DiskVolume{}.Build(), 512);
    const std::size_t name = 2 * 512 + 128 + 56;
    for (std::size_t i = 0; i < 36; ++i) {
        disk[name + 2 * i] = 'g';
        disk[name + 2 * i + 1] = 0;
    }
    disk[name] = 0x0A;
    disk[name + 3] = 0x30;
    ASSERT_EQ("", Locate(disk));
    EXPECT_EQ("??" + std::string(34, 'g'), scan_.partitions[0].name);
}

// A block size below a sector finds no entries, so the map is read by sectors.
TEST_F(Partitions, AnApplePartitionMapOfTinyBlocks) {
    Bytes disk = test::InApm(DiskVolume{}.Build(), 512);
    test::Put16(&disk, 2, 256);
    EXPECT_EQ("", Locate(disk));
    EXPECT_EQ(kPart, Place().offset);
    std::memset(disk.data() + 512, 0, 512);
    EXPECT_EQ(0u, Locate(disk).find("no HFS+ volume found"));
}

TEST_F(Partitions, WrapperWithoutRoomForTheVolumeInside) {
    Bytes disk = test::InWrapper(DiskVolume{}.Build());
    Bytes bad = disk;
    test::Put16(&bad, 1024 + 128, 0);
    EXPECT_EQ(
        "HFS wrapper at 0: block size 1,024, 0 blocks for the volume inside: if you know where the "
        "volume starts, give --offset",
        Locate(bad));
    bad = disk;
    test::Put32(&bad, 1024 + 20, 1000);
    EXPECT_EQ(0u, Locate(bad).find("HFS wrapper at 0: block size 1,000, 256 blocks"));
    bad = disk;
    test::Put32(&bad, 1024 + 20, 0);
    EXPECT_EQ(0u, Locate(bad).find("HFS wrapper at 0: block size 0, 256 blocks"));
}

TEST(PartitionSchemes, HaveNamesAndTypesOfTheirOwn) {
    EXPECT_STREQ("APM", SchemeName(PartitionScheme::kApm));
    EXPECT_STREQ("GPT", SchemeName(PartitionScheme::kGpt));
    EXPECT_STREQ("MBR", SchemeName(PartitionScheme::kMbr));
    EXPECT_STREQ("none", SchemeName(PartitionScheme::kNone));
    EXPECT_STREQ("none", SchemeName(static_cast<PartitionScheme>(9)));
    PartitionEntry entry;
    entry.type = "Apple_HFS";
    const auto isHfs = [&](PartitionScheme scheme) {
        entry.scheme = scheme;
        return IsHfsType(entry);
    };
    EXPECT_TRUE(isHfs(PartitionScheme::kApm));
    EXPECT_FALSE(isHfs(PartitionScheme::kGpt));
    EXPECT_FALSE(isHfs(PartitionScheme::kMbr));
    EXPECT_FALSE(isHfs(PartitionScheme::kNone));
    EXPECT_FALSE(isHfs(static_cast<PartitionScheme>(9)));
    entry.type = "Apple_HFSX";
    EXPECT_TRUE(isHfs(PartitionScheme::kApm));
    entry.type = "0xAF";
    EXPECT_TRUE(isHfs(PartitionScheme::kMbr));
    EXPECT_FALSE(isHfs(PartitionScheme::kApm));
}

}  // namespace
}  // namespace VELK
