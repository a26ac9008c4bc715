// Volumes built from bytes: found wherever they lie, opened whatever their geometry, and what is
// wrong with them said in one line.
#include <gtest/gtest.h>

#include <random>

#include "capture.h"
#include "disk_builder.h"
#include "hfs/volume/image_volume.h"

namespace VELK {
namespace {

using test::Bytes;
using test::DiskVolume;

class Mount : public testing::Test {
protected:
    bool Open(const Bytes& disk) {
        volume_ = ImageVolume::Open(test::DeviceOf(disk), options_, &scan_, &problem_);
        return volume_ != nullptr;
    }
    // Why the disk does not open.
    std::string Refusal(const Bytes& disk) {
        EXPECT_FALSE(Open(disk));
        return problem_.Text();
    }
    std::string TreeRefusal(u32 fileId) {
        EXPECT_EQ(nullptr, volume_->Tree(fileId, &problem_));
        return problem_.Text();
    }
    u32 CountRecords() {
        CBTreeHfs* tree = volume_->Tree(kCatalogFileId, &problem_);
        if (tree == nullptr) {
            ADD_FAILURE() << problem_.Text();
            return 0;
        }
        HfsFindData path;
        alignas(8) u8 record[520];
        alignas(8) u8 key[600];
        unsigned recordSize = 0;
        unsigned keySize = 0;
        const unsigned long long first = u64{tree->header.firstLeafNode} << tree->nodeShift;
        u32 count = 0;
        int status = tree->SetPos(first, record, sizeof record, &recordSize, key, sizeof key,
                                  &keySize, &path);
        while (status == 0) {
            count += 1;
            status = tree->IncPos(1, record, sizeof record, &recordSize, key, sizeof key, &keySize,
                                  &path);
        }
        path.ClearPath();
        EXPECT_EQ(kErrNotFound, status);
        return count;
    }

    test::Capture capture_;
    OpenOptions options_;
    VolumeScan scan_;
    Problem problem_;
    std::unique_ptr<ImageVolume> volume_;
};

// --- places --------------------------------------------------------------------------------------

TEST_F(Mount, BareVolume) {
    ASSERT_TRUE(Open(DiskVolume{}.Build())) << problem_.Text();
    EXPECT_EQ(0u, volume_->Place().offset);
    EXPECT_EQ(8u, CountRecords());
    EXPECT_TRUE(volume_->Notes().empty());
}

TEST_F(Mount, ApplePartitionMapWithBothBlockSizes) {
    for (const u32 blockSize : {512u, 2048u}) {
        ASSERT_TRUE(Open(test::InApm(DiskVolume{}.Build(), blockSize))) << problem_.Text();
        EXPECT_EQ(test::kPartitionStart, volume_->Place().offset);
        EXPECT_EQ(2u, volume_->Place().partition);
        EXPECT_EQ(3u, volume_->Place().partitions);
        EXPECT_EQ(PartitionScheme::kApm, scan_.scheme);
        EXPECT_EQ("taken: holds HFS+", scan_.partitions[1].reason);
        EXPECT_EQ("type Apple_Free, holds nothing known", scan_.partitions[2].reason);
        EXPECT_EQ(8u, CountRecords());
    }
}

TEST_F(Mount, GuidPartitionTableWithEverySectorSize) {
    for (const u32 sectorSize : {512u, 2048u, 4096u}) {
        ASSERT_TRUE(Open(test::InGpt(DiskVolume{}.Build(), sectorSize))) << problem_.Text();
        EXPECT_EQ(test::kPartitionStart, volume_->Place().offset);
        EXPECT_EQ(2u, volume_->Place().partition);
        EXPECT_EQ(PartitionScheme::kGpt, scan_.scheme);
        EXPECT_EQ("Bu", scan_.partitions[0].name);
        EXPECT_EQ(8u, CountRecords());
    }
}

TEST_F(Mount, MasterBootRecord) {
    ASSERT_TRUE(Open(test::InMbr(DiskVolume{}.Build()))) << problem_.Text();
    EXPECT_EQ(test::kPartitionStart, volume_->Place().offset);
    EXPECT_EQ(PartitionScheme::kMbr, scan_.scheme);
    EXPECT_EQ(8u, CountRecords());
}

TEST_F(Mount, WrapperBareAndInAPartition) {
    const Bytes wrapped = test::InWrapper(DiskVolume{}.Build());
    ASSERT_TRUE(Open(wrapped)) << problem_.Text();
    EXPECT_EQ(test::kWrappedStart, volume_->Place().offset);
    EXPECT_TRUE(volume_->Place().wrapped);
    EXPECT_EQ(8u, CountRecords());
    ASSERT_TRUE(Open(test::InApm(wrapped, 512))) << problem_.Text();
    EXPECT_EQ(test::kPartitionStart + test::kWrappedStart, volume_->Place().offset);
    EXPECT_EQ(test::kPartitionStart, volume_->Place().wrapperOffset);
}

TEST_F(Mount, OffsetAndPartitionAreTakenAtTheirWord) {
    const Bytes disk = test::InGpt(DiskVolume{}.Build(), 512);
    options_.offset = test::kPartitionStart;
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    EXPECT_EQ(0u, volume_->Place().partition);
    EXPECT_EQ(8u, CountRecords());
    EXPECT_NE(nullptr, volume_->AlternateHeader(nullptr));
    options_.offset = disk.size();
    EXPECT_EQ("offset 331,776: the image ends at 331,776", Refusal(disk).substr(0, 41));
    options_.offset.reset();
    options_.partition = 2;
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    options_.partition = 9;
    EXPECT_EQ("partition 9: the GPT lists 1 partitions: see info --partitions", Refusal(disk));
    EXPECT_EQ(ExitClass::kUsage, problem_.exitClass);
}

TEST_F(Mount, TwoVolumesWantAChoice) {
    Bytes disk = test::InApm(DiskVolume{}.Build(), 512);
    const u64 second = disk.size();
    test::AppendBytes(&disk, DiskVolume{}.Build());
    std::copy_n("Apple_HFS\0", 11, disk.begin() + 3 * 512 + 48);
    test::Put32(&disk, 3 * 512 + 8, static_cast<u32>(second / 512));
    test::Put32(&disk, 3 * 512 + 12, 64 * 4096 / 512);
    EXPECT_EQ("2 HFS+ volumes (partitions 2 and 3): choose with --partition", Refusal(disk));
    EXPECT_EQ(ExitClass::kUsage, problem_.exitClass);
    options_.partition = 3;
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    EXPECT_EQ(second, volume_->Place().offset);
}

// --- geometries ----------------------------------------------------------------------------------

TEST_F(Mount, SmallBlocksUnderLargeNodes) {
    DiskVolume shape;
    shape.blockSize = 512;
    shape.blocks = 400;
    shape.catalogNodeSize = 8192;
    ASSERT_TRUE(Open(shape.Build())) << problem_.Text();
    EXPECT_EQ(4096u, volume_->Fs()->mapBlockSize);
    EXPECT_EQ(8u, CountRecords());
    options_.mapBlockSize = 512;
    ASSERT_TRUE(Open(shape.Build())) << problem_.Text();
    EXPECT_EQ(8u, CountRecords());
    EXPECT_EQ(16u, volume_->Tree(kCatalogFileId, nullptr)->header.blocksPerNode);
}

TEST_F(Mount, LargeBlocksOverSmallNodes) {
    DiskVolume shape;
    shape.blockSize = 65536;
    shape.blocks = 8;
    shape.catalogNodeSize = 1024;
    shape.extentsNodeSize = 512;
    shape.files = 30;
    ASSERT_TRUE(Open(shape.Build())) << problem_.Text();
    EXPECT_EQ(512u, volume_->Fs()->mapBlockSize);
    EXPECT_EQ(62u, CountRecords());
}

TEST_F(Mount, MapBlockMustFitTheSmallestNode) {
    options_.mapBlockSize = 8192;
    EXPECT_EQ("map block 8,192: the smallest node of the volume has 4,096 bytes: give at most that",
              Refusal(DiskVolume{}.Build()));
    options_.mapBlockSize = 3000;
    EXPECT_EQ("map block 3000 is not a power of two from 512 to 32,768",
              Refusal(DiskVolume{}.Build()));
}

TEST_F(Mount, HfsxComparesBinary) {
    DiskVolume shape;
    shape.hfsx = true;
    ASSERT_TRUE(Open(shape.Build())) << problem_.Text();
    EXPECT_EQ(5u, volume_->Fs()->version);
    EXPECT_EQ(&CompareCatKeysCaseBin, volume_->Tree(kCatalogFileId, nullptr)->compareKeys);
}

TEST_F(Mount, AbsentAttributesTree) {
    DiskVolume shape;
    shape.attributesNodeSize = 0;
    ASSERT_TRUE(Open(shape.Build())) << problem_.Text();
    EXPECT_EQ("the volume has no attributes tree: create-tree would add one",
              TreeRefusal(kAttributesFileId));
    EXPECT_EQ(ExitClass::kNo, problem_.exitClass);
}

TEST_F(Mount, ForkWithOverflowRecordsIsReadThroughThem) {
    DiskVolume shape;
    shape.blockSize = 512;
    shape.blocks = 900;
    shape.catalogNodeSize = 1024;
    shape.catalogPiece = 3;  // nodes lie across pieces
    shape.files = 300;
    ASSERT_TRUE(Open(shape.Build())) << problem_.Text();
    EXPECT_EQ(602u, CountRecords());
    EXPECT_GT(volume_->ForkExtents(kCatalogFileId).size(), 40u);
    EXPECT_TRUE(volume_->Notes().empty());
    // Fork block 24 is the first that an overflow record maps; pieces of 3 with gaps of 1.
    const u64 first = *volume_->ImageOffset(kCatalogFileId, 0);
    EXPECT_EQ(first + 32 * 512, *volume_->ImageOffset(kCatalogFileId, 24 * 512));
    EXPECT_EQ(first + 33 * 512 + 7, *volume_->ImageOffset(kCatalogFileId, 25 * 512 + 7));
}

TEST_F(Mount, MissingOverflowRecordIsNoted) {
    DiskVolume shape;
    shape.blockSize = 512;
    shape.blocks = 900;
    shape.catalogNodeSize = 1024;
    shape.catalogPiece = 30;
    shape.files = 300;
    Bytes disk = shape.Build();
    test::Put32(&disk, 1024 + 272 + 12, 500);  // more blocks than any record maps
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    EXPECT_EQ(602u, CountRecords());
    ASSERT_EQ(1u, volume_->Notes().size());
    EXPECT_EQ("V04", volume_->Notes()[0].check);
    EXPECT_NE(std::string::npos, volume_->Notes()[0].Text().find("of 500 blocks found"));
}

TEST_F(Mount, TailBehindTheLastBlockHoldsTheAlternateHeader) {
    DiskVolume shape;
    shape.tailBytes = 2560;
    const Bytes disk = shape.Build();
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    u64 offset = 0;
    ASSERT_NE(nullptr, volume_->AlternateHeader(&offset));
    EXPECT_EQ(disk.size() - 1024, offset);
}

// --- damage --------------------------------------------------------------------------------------

TEST_F(Mount, DamagedHeaderIsNamedAndTheAlternateHelps) {
    Bytes disk = DiskVolume{}.Build();
    test::Put32(&disk, 1024 + 40, 3000);
    EXPECT_EQ("volume header at 1024: block size 3000 is not a power of two: try --backup-header",
              Refusal(disk));
    EXPECT_EQ("V02", problem_.check);
    test::Put32(&disk, 1024, 0);
    EXPECT_EQ("volume header at 1024: signature 0000 is neither 482B nor 4858: try --backup-header",
              Refusal(disk));
    options_.backupHeader = true;
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    EXPECT_TRUE(volume_->UsedBackupHeader());
    EXPECT_EQ(8u, CountRecords());
}

TEST_F(Mount, VersionMustBelongToTheSignature) {
    Bytes disk = DiskVolume{}.Build();
    test::Put16(&disk, 1026, 5);
    EXPECT_EQ(
        "volume header at 1024: version 5 does not belong to signature 482B (HFS+ is 4): "
        "try --backup-header",
        Refusal(disk));
    test::Put32(&disk, 1024, 0x48580006);
    EXPECT_EQ("volume header at 1024: version 6 of HFSX is not known (5 is): try --backup-header",
              Refusal(disk));
}

TEST_F(Mount, TreeHeaderFaultIsNamedWithItsPlaceAndCheck) {
    const DiskVolume shape;
    Bytes disk = shape.Build();
    const u64 catalog = test::CatalogOffset(shape);
    test::Put32(&disk, catalog + 16, 900);
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    EXPECT_EQ(
        "catalog tree: corrupt (A000011C): rootNode 900 is not below totalNodes 4 "
        "(image offset 0x2010, check H04)",
        TreeRefusal(kCatalogFileId));
    EXPECT_EQ(kErrCorrupt, problem_.status);
    EXPECT_EQ(catalog + 16, *problem_.offset);
    EXPECT_NE(nullptr, volume_->Tree(kExtentsFileId, &problem_));
}

TEST_F(Mount, EveryOpeningCheckOfATreeHasItsWords) {
    struct Fault {
        u32 at;
        u32 size;
        u32 value;
        const char* text;
    };
    const Fault faults[] = {
        {kHeadFreeNodes, 4, 50, "freeNodes 50 is not below totalNodes 4"},
        {kHeadFirstLeafNode, 4, 4, "firstLeafNode 4 is not below totalNodes 4"},
        {kHeadLastLeafNode, 4, 4, "lastLeafNode 4 is not below totalNodes 4"},
        {kHeadTreeDepth, 2, 17, "treeDepth 17 is above 16"},
        {kHeadBtreeType, 1, 1, "btreeType 0x01 is not known"},
        {kHeadAttributes, 4, 4, "attributes lack the bit for 16-bit key lengths"},
        {kHeadTotalNodes, 4, 5000, "totalNodes 5,000 does not fit the file of 16,384 bytes"},
        {kHeadNodeSize, 2, 256, "node size 256 is below the map block of 4096"},
    };
    for (const Fault& fault : faults) {
        const DiskVolume shape;
        Bytes disk = shape.Build();
        const std::size_t at = test::CatalogOffset(shape) + fault.at;
        if (fault.size == 1) {
            disk[at] = static_cast<u8>(fault.value);
        } else if (fault.size == 2) {
            test::Put16(&disk, at, fault.value);
        } else {
            test::Put32(&disk, at, fault.value);
        }
        ASSERT_TRUE(Open(disk)) << problem_.Text();
        EXPECT_NE(std::string::npos, TreeRefusal(kCatalogFileId).find(fault.text))
            << problem_.Text();
    }
}

TEST_F(Mount, ExtentsOutsideTheVolumeAreRefusedAndOverlapsNoted) {
    Bytes disk = DiskVolume{}.Build();
    test::Put32(&disk, 1024 + 272 + 16, 1000);
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    EXPECT_EQ(
        "catalog file: extent 0 (blocks 1,000 to 1,003) leaves the volume of 64 blocks: try "
        "--backup-header",
        TreeRefusal(kCatalogFileId));
    disk = DiskVolume{}.Build();
    test::Put32(&disk, 1024 + 192 + 16, test::Get32(disk, 1024 + 272 + 16));
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    ASSERT_EQ(1u, volume_->Notes().size());
    EXPECT_EQ("extents file and catalog file claim the same blocks: run check",
              volume_->Notes()[0].Text());
}

TEST_F(Mount, TruncatedImageIsReadAsFarAsItGoes) {
    DiskVolume shape;
    Bytes disk = shape.Build();
    disk.resize(100000);
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    EXPECT_TRUE(volume_->IsTruncated());
    ASSERT_EQ(1u, volume_->Notes().size());
    EXPECT_EQ(
        "image ends at 100,000, the volume at 262,144: reading what is there; check and dump "
        "need --keep-going",
        volume_->Notes()[0].Text());
    EXPECT_EQ(8u, CountRecords());

    disk.resize(test::CatalogOffset(shape) + 4096 + 100);
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    CBTreeHfs* tree = volume_->Tree(kCatalogFileId, &problem_);
    ASSERT_NE(nullptr, tree) << problem_.Text();
    HfsNode* node = nullptr;
    EXPECT_EQ(kErrVolumeTruncated, tree->GetINode(1, &node, false));
    EXPECT_EQ("image ends at 12,388, catalog node 1 (0x3000) lies behind that",
              volume_->LastIoProblem().Text());
    // A node of eight blocks, read at once: what is told is where it stops being there.
    options_.mapBlockSize = 512;
    disk.resize(test::CatalogOffset(shape) + 4096 + 2 * 512 + 100);
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    tree = volume_->Tree(kCatalogFileId, &problem_);
    ASSERT_NE(nullptr, tree) << problem_.Text();
    EXPECT_EQ(kErrVolumeTruncated, tree->GetINode(1, &node, false));
    EXPECT_EQ("image ends at 13,412, catalog node 1 (0x3400) lies behind that",
              volume_->LastIoProblem().Text());
    options_.mapBlockSize = 0;
    disk.resize(test::CatalogOffset(shape) + 10);
    ASSERT_TRUE(Open(disk)) << problem_.Text();
    EXPECT_EQ("catalog tree: image ends at 8202, catalog file (0x2000) lies behind that",
              TreeRefusal(kCatalogFileId));
}

TEST_F(Mount, PendingJournalIsNotedAndAnEmptyOneIsNot) {
    DiskVolume shape;
    shape.journalStart = 512;
    shape.journalEnd = 512 + 4608;
    ASSERT_TRUE(Open(shape.Build())) << problem_.Text();
    EXPECT_EQ(4608u, volume_->Journal().pendingBytes);
    ASSERT_EQ(1u, volume_->Notes().size());
    EXPECT_EQ(8u, CountRecords());
    // Around the end of the ring: from 30,000 to the end (32,768) and from 512 to 1,024.
    shape.journalStart = 30208;
    shape.journalEnd = 1024;
    ASSERT_TRUE(Open(shape.Build())) << problem_.Text();
    EXPECT_EQ(32768u - 30208 + 512, volume_->Journal().pendingBytes);
    shape.journalEnd = shape.journalStart;
    ASSERT_TRUE(Open(shape.Build())) << problem_.Text();
    EXPECT_TRUE(volume_->Journal().empty);
    EXPECT_TRUE(volume_->Notes().empty());
}

// --- other things --------------------------------------------------------------------------------

TEST_F(Mount, OtherFileSystemsAreNamed) {
    Bytes disk(1 << 17);
    EXPECT_EQ(
        "no HFS+ volume found (looked at offset 1024, GPT, APM, MBR); first bytes 0000 0000: "
        "if you know where it starts, give --offset",
        Refusal(disk));
    test::Put32(&disk, 1024, 0x42440000);
    EXPECT_EQ(
        "HFS volume without an HFS+ volume inside (signature 4244 at 1024): only HFS+ and "
        "HFSX are supported",
        Refusal(disk));
    disk = Bytes(1 << 17);
    std::copy_n("NXSB", 4, disk.begin() + 32);
    EXPECT_EQ("holds APFS (NXSB at 32), not HFS+", Refusal(disk));
    disk = test::InApm(Bytes(1 << 17), 512);
    std::copy_n("NXSB", 4, disk.begin() + 65536 + 32);
    std::copy_n("Apple_APFS", 11, disk.begin() + 2 * 512 + 48);
    EXPECT_EQ("partition 2 holds APFS (NXSB at 65,568), not HFS+", Refusal(disk));
}

TEST_F(Mount, CompressedAndForeignImagesAreNamed) {
    Bytes disk(1 << 12);
    std::copy_n("koly", 4, disk.end() - 512);
    EXPECT_EQ("compressed disk image (koly trailer): convert it to a raw image first",
              Refusal(disk));
    disk = Bytes(1 << 12);
    std::copy_n("QFI\xFB", 4, disk.begin());
    EXPECT_EQ("qcow2 disk image: convert it to a raw image first", Refusal(disk));
    disk[0] = 0x1F;
    disk[1] = 0x8B;
    EXPECT_EQ("compressed file (gzip): unpack it first", Refusal(disk));
}

TEST_F(Mount, NothingAtAll) {
    EXPECT_EQ("no HFS+ volume found (the image is empty)", Refusal(Bytes()));
    EXPECT_EQ(
        "no HFS+ volume found (looked at offset 1024, GPT, APM, MBR); first bytes 07: if you "
        "know where it starts, give --offset",
        Refusal(Bytes{7}));
}

TEST_F(Mount, HostFilesThatAreNoImages) {
    EXPECT_EQ(nullptr, ImageVolume::OpenFile("/nonexistent/x.img", options_, &scan_, &problem_));
    EXPECT_EQ("cannot open: no such file", problem_.Text());
    EXPECT_EQ(nullptr, ImageVolume::OpenFile("/", options_, &scan_, &problem_));
    EXPECT_EQ("is a folder: name an image file or a block device", problem_.Text());
    EXPECT_EQ(nullptr, ImageVolume::OpenFile("/dev/null", options_, &scan_, &problem_));
    EXPECT_EQ("is neither a file nor a block device: name an image file", problem_.Text());
}

// Random bytes anywhere in the parts that say where things are: any answer, but an answer.
TEST_F(Mount, RandomBytesNeverBringItDown) {
    std::mt19937 random(20);
    DiskVolume shape;
    shape.blockSize = 512;
    shape.blocks = 700;
    shape.catalogNodeSize = 1024;
    shape.catalogPiece = 9;
    shape.files = 60;
    const Bytes volume = shape.Build();
    const Bytes disks[] = {volume, test::InApm(volume, 512), test::InGpt(volume, 512),
                           test::InMbr(volume), test::InWrapper(volume)};
    u32 opened = 0;
    for (u32 round = 0; round < 500; ++round) {
        Bytes disk = disks[round % 5];
        const u64 start = round % 5 == 0   ? 0
                          : round % 5 == 4 ? test::kWrappedStart
                                           : test::kPartitionStart;
        for (u32 i = 0; i < 4; ++i) {
            const bool inHeader = random() % 2 == 0;
            const u64 at = inHeader ? start + 1024 + random() % 512 : random() % 8192;
            disk[static_cast<std::size_t>(at)] = static_cast<u8>(random());
        }
        if (!Open(disk)) {
            EXPECT_FALSE(problem_.Text().empty());
            continue;
        }
        opened += 1;
        for (const u32 fileId : {3u, 4u, 8u}) {
            volume_->Tree(fileId, &problem_);
            volume_->ForkBytes(fileId);
            volume_->ImageOffset(fileId, 5000);
        }
        capture_.Take();
    }
    EXPECT_GT(opened, 100u);
}

}  // namespace
}  // namespace VELK
