// Space of special files: pieces of fragmented volumes, forks that shrink, overflow records that
// are damaged or cannot be written, bitmaps that are too short. No block has two owners.
#include <gtest/gtest.h>
#include <sys/resource.h>

#include "capture.h"
#include "disk_builder.h"
#include "hfs/volume/make_volume.h"
#include "hfs/volume/wire.h"
#include "small_volume.h"

namespace VELK {
namespace {

using test::Bytes;
using test::DiskVolume;

constexpr unsigned kClump = 512;

class Space : public testing::Test {
protected:
    // A fresh volume of small blocks and nodes as an image.
    static Bytes Fresh(u64 size = 1 << 18) {
        Problem problem;
        auto volume = MakeMemoryVolume(size, test::SmallTrees(), &problem);
        Bytes bytes(static_cast<std::size_t>(size));
        EXPECT_EQ(0, volume->ReadVolume(0, bytes.data(), bytes.size()));
        return bytes;
    }
    // Mounts with changes kept in memory.
    void Mount(const Bytes& disk) {
        OpenOptions options;
        options.access = Access::kOverlay;
        volume_ = ImageVolume::Open(test::DeviceOf(disk), options, nullptr, &problem_);
    }
    CBTreeHfs* Tree(u32 fileId) {
        CBTreeHfs* tree = volume_->Tree(fileId, &problem_);
        EXPECT_NE(nullptr, tree) << problem_.Text();
        return tree;
    }
    int Grow(u32 fileId, u32 nodes) {
        CBTreeHfs* tree = Tree(fileId);
        return tree->ExtendBTree(tree->header.totalNodes + nodes, nullptr, &kClump);
    }
    // Grows catalog and attributes in turn, so that each piece stands alone.
    void GrowInTurn(u32 times, u32 nodes) {
        for (u32 i = 0; i < times; ++i) {
            ASSERT_EQ(0, Grow(kCatalogFileId, nodes));
            ASSERT_EQ(0, Grow(kAttributesFileId, nodes));
        }
    }
    int Resize(u32 fileId, u64 size) {
        CFileSystemHfs* fs = volume_->Fs();
        return fs->service.ops->Resize(fs->service.self, fs, &Tree(fileId)->runs, nullptr, 0,
                                       fileId, size);
    }
    u32 Blocks(u32 fileId) {
        u32 blocks = 0;
        for (const HfsExtent& extent : volume_->ForkExtents(fileId)) {
            blocks += extent.blockCount;
        }
        return blocks;
    }
    void ExpectNoBlockTwice() {
        std::vector<bool> used(volume_->Header().totalBlocks);
        for (const u32 fileId : {3u, 4u, 6u, 8u}) {
            for (const HfsExtent& extent : volume_->ForkExtents(fileId)) {
                for (u32 i = 0; i < extent.blockCount; ++i) {
                    ASSERT_FALSE(used.at(extent.startBlock + i)) << extent.startBlock + i;
                    used[extent.startBlock + i] = true;
                }
            }
        }
    }

    test::Capture capture_;
    Problem problem_;
    std::unique_ptr<ImageVolume> volume_;
};

// --- growing and shrinking -----------------------------------------------------------------------

// With every other block in use there is no run of two.
TEST_F(Space, AFragmentedVolumeGivesSingleBlocks) {
    Bytes disk = Fresh();
    const std::size_t bitmap = std::size_t{test::Get32(disk, 1024 + 112 + 16)} * 512;
    for (std::size_t i = 0; i < 512 / 8; ++i) {
        disk[bitmap + i] |= 0xAA;
    }
    Mount(disk);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    const std::size_t before = volume_->ForkExtents(kCatalogFileId).size();
    const u32 zeros = volume_->Fs()->bitmap->GetZeros();
    ASSERT_EQ(0, Grow(kCatalogFileId, 5));
    const std::vector<HfsExtent> extents = volume_->ForkExtents(kCatalogFileId);
    ASSERT_GE(extents.size(), before + 4);
    for (std::size_t i = before + 1; i < extents.size(); ++i) {
        EXPECT_EQ(1u, extents[i].blockCount);
    }
    EXPECT_EQ(zeros - 5, volume_->Fs()->bitmap->GetZeros());
    ExpectNoBlockTwice();
    // More than there is changes nothing.
    EXPECT_EQ(kErrNoSpace, Resize(kCatalogFileId, u64{512} << 9));
    EXPECT_EQ(kErrNoSpace, Resize(kCatalogFileId, u64{1} << 40));
    EXPECT_EQ(zeros - 5, volume_->Fs()->bitmap->GetZeros());
}

TEST_F(Space, WhatAForkGivesBackIsFreeAgain) {
    Mount(Fresh(1 << 20));
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    GrowInTurn(6, 3);
    const std::vector<HfsExtent> whole = volume_->ForkExtents(kCatalogFileId);
    ASSERT_GE(whole.size(), 5u);
    const u32 blocks = Blocks(kCatalogFileId);
    const u32 zeros = volume_->Fs()->bitmap->GetZeros();
    // In the middle of the last run, at the start of one, with none left over.
    for (const u32 keep : {blocks - 1, blocks - 3, blocks - 4, 1u, 0u}) {
        ASSERT_EQ(0, Resize(kCatalogFileId, u64{keep} * 512)) << keep;
        EXPECT_EQ(keep, Blocks(kCatalogFileId));
        EXPECT_EQ(keep, volume_->Fs()->ForkOf(kCatalogFileId)->totalBlocks);
        EXPECT_EQ(zeros + (blocks - keep), volume_->Fs()->bitmap->GetZeros());
        ExpectNoBlockTwice();
    }
    volume_->Restore();
    EXPECT_EQ(1u, volume_->ForkExtents(kCatalogFileId).size());
    EXPECT_EQ(volume_->Header().freeBlocks, volume_->Fs()->bitmap->GetZeros());
}

TEST_F(Space, ASizeWithinTheLastBlockChangesNoBlock) {
    Mount(Fresh());
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    const u32 blocks = Blocks(kCatalogFileId);
    ASSERT_EQ(0, Resize(kCatalogFileId, u64{blocks} * 512 - 100));
    EXPECT_EQ(blocks, Blocks(kCatalogFileId));
    EXPECT_EQ(u64{blocks} * 512 - 100, volume_->Fs()->ForkOf(kCatalogFileId)->logicalSize);
}

// A fork whose blocks are not all known cannot change its size.
TEST_F(Space, AForkThatIsNotMappedInFullKeepsItsSize) {
    Mount(Fresh());
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    CBTreeHfs* tree = Tree(kCatalogFileId);
    CFileSystemHfs* fs = volume_->Fs();
    const auto resize = [&](u32 fileId) {
        return fs->service.ops->Resize(fs->service.self, fs, &tree->runs, nullptr, 0, fileId, 512);
    };
    for (const u32 fileId : {0u, 5u, 99u}) {
        EXPECT_EQ(kErrVolumeUnmapped, resize(fileId)) << fileId;
    }
    fs->ForkOf(kCatalogFileId)->totalBlocks += 1;
    EXPECT_EQ(kErrVolumeUnmapped, resize(kCatalogFileId));
    fs->ForkOf(kCatalogFileId)->totalBlocks -= 1;
    EXPECT_EQ(kOk, resize(kCatalogFileId));
}

// Nothing but the extents tree can tell of more than eight extents.
TEST_F(Space, WithoutAnExtentsTreeAForkHasEightExtents) {
    FormatOptions options = test::SmallTrees();
    options.emptyTrees = true;
    volume_ = MakeMemoryVolume(1 << 20, options, &problem_);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    for (const u32 fileId : {kCatalogFileId, kAttributesFileId}) {
        const u64 size = 16384;
        ASSERT_EQ(0, volume_->CreateTree(fileId, 9, &size));
        EXPECT_EQ(16384u, volume_->Fs()->ForkOf(fileId)->logicalSize);
    }
    int status = 0;
    for (u32 i = 0; i < 20 && status == 0; ++i) {
        status = Grow(kCatalogFileId, 1);
        status = status == 0 ? Grow(kAttributesFileId, 1) : status;
    }
    EXPECT_EQ(kErrNoSpace, status);
    EXPECT_EQ(8u, volume_->ForkExtents(kAttributesFileId).size());
    ExpectNoBlockTwice();
    EXPECT_EQ(0, volume_->Commit(0));
}

// --- overflow records ----------------------------------------------------------------------------

// An extents tree that does not open: records for it cannot be put anywhere.
TEST_F(Space, WithADamagedExtentsTreeACommitOfMoreExtentsIsRefused) {
    Bytes disk = Fresh();
    const std::size_t node = std::size_t{test::Get32(disk, 1024 + 192 + 16)} * 512;
    test::Put16(&disk, node + kHeadNodeSize, 64);
    Mount(disk);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    const u32 zeros = volume_->Fs()->bitmap->GetZeros();
    GrowInTurn(12, 1);
    EXPECT_EQ(kErrNoSpace, volume_->Commit(0));
    EXPECT_EQ(1u, volume_->ForkExtents(kCatalogFileId).size());
    EXPECT_EQ(zeros, volume_->Fs()->bitmap->GetZeros());
    EXPECT_EQ(nullptr, volume_->Tree(kExtentsFileId, &problem_));
    const std::string text = problem_.Text();
    EXPECT_EQ(0u, text.find("extents tree: invalid (A0000101): node size 64 is below")) << text;
    EXPECT_EQ(nullptr, volume_->Tree(kExtentsFileId, &problem_));  // and so every time
    EXPECT_EQ(text, problem_.Text());
}

// One overflow record, hurt in one place each.
TEST_F(Space, DamagedOverflowRecordsAreNoted) {
    DiskVolume shape;
    shape.blockSize = 512;
    shape.blocks = 400;
    shape.catalogNodeSize = 1024;
    shape.extentsNodeSize = 512;
    shape.catalogPiece = 3;
    shape.files = 30;
    const Bytes disk = shape.Build();
    const u32 blocks = test::Get32(disk, 1024 + 272 + 12);
    ASSERT_GT(blocks, 24u);
    const std::size_t leaf = std::size_t{test::Get32(disk, 1024 + 192 + 16) + 1} * 512;
    ASSERT_EQ(4u, test::Get32(disk, leaf + 14 + 4));   // the catalog's key
    ASSERT_EQ(24u, test::Get32(disk, leaf + 14 + 8));  // of the ninth extent
    const std::size_t extents = leaf + 14 + 12;
    struct {
        const char* what;
        std::size_t at;
        u32 value;
        u32 found;  // blocks
    } const faults[] = {
        {"another file's", leaf + 14 + 4, 5, 24},
        {"no extent", extents + 4, 0, 24},
        {"an extent outside the volume", extents, 399, 24},
        {"too many blocks", extents + 4, 100000, 24},
        {"too few blocks", extents + 12, 0, 27},
    };
    for (const auto& fault : faults) {
        Bytes bad = disk;
        test::Put32(&bad, fault.at, fault.value);
        Mount(bad);
        ASSERT_NE(nullptr, volume_) << problem_.Text();
        EXPECT_EQ(fault.found, Blocks(kCatalogFileId)) << fault.what;
        volume_->Tree(kCatalogFileId, &problem_);
        ASSERT_GE(volume_->Notes().size(), 1u) << fault.what;
        EXPECT_EQ("catalog file: extents for " + std::to_string(fault.found) + " of " +
                      std::to_string(blocks) + " blocks found: run check",
                  volume_->Notes().back().Text())
            << fault.what;
        // What cannot be mapped is left alone.
        volume_->SetModifyDate(7);
        EXPECT_EQ(0, volume_->Commit(0)) << fault.what;
    }
    // A record that ends early.
    Bytes bad = disk;
    ASSERT_EQ(14u + 12 + 64, test::Get16(bad, leaf + 512 - 4));
    test::Put16(&bad, leaf + 512 - 4, 14 + 12 + 60);
    Mount(bad);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    EXPECT_EQ(24u, Blocks(kCatalogFileId));
}

// The allocation file calls all of it free, overflow extents among them.
TEST_F(Space, BlocksOfOverflowExtentsAreNotHandedOut) {
    DiskVolume shape;
    shape.blockSize = 512;
    shape.blocks = 400;
    shape.catalogNodeSize = 1024;
    shape.extentsNodeSize = 512;
    shape.catalogPiece = 3;
    shape.files = 30;
    Bytes disk = shape.Build();
    const std::size_t bitmap = std::size_t{test::Get32(disk, 1024 + 112 + 16)} * 512;
    std::fill_n(disk.begin() + static_cast<std::ptrdiff_t>(bitmap), 400 / 8, u8{0});
    Mount(disk);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    ASSERT_GT(volume_->ForkExtents(kCatalogFileId).size(), 8u);
    for (u32 i = 0; i < 20; ++i) {
        ASSERT_EQ(0, Grow(kCatalogFileId, 4));
    }
    ExpectNoBlockTwice();
}

// --- the allocation file -------------------------------------------------------------------------

TEST_F(Space, AnAllocationFileThatIsTooShort) {
    Bytes disk = DiskVolume{}.Build();
    test::Put32(&disk, 1024 + 112 + 20, 0);
    test::Put32(&disk, 1024 + 112 + 12, 0);
    Mount(disk);
    ASSERT_EQ(nullptr, volume_);
    EXPECT_EQ("allocation file: 0 bytes for 64 blocks: the volume can only be read",
              problem_.Text());
    OpenOptions options;
    EXPECT_NE(nullptr, ImageVolume::Open(test::DeviceOf(disk), options, nullptr, &problem_))
        << problem_.Text();
}

// Marks for four billion blocks would take half a gigabyte; the file that should hold them has 512
// bytes, or claims to be as large and is not there.
TEST_F(Space, BlocksThatAreOnlyClaimedTakeNoMemory) {
    const auto most = [] {
        rusage usage = {};
        getrusage(RUSAGE_SELF, &usage);
        return usage.ru_maxrss;  // KiB
    };
    for (const u32 fileBlocks : {1u, 0xFFFFFFu}) {
        Bytes disk = DiskVolume{}.Build();
        const long before = most();
        test::Put32(&disk, 1024 + 44, 0xFFFFFFF0);
        test::Put32(&disk, 1024 + 112 + 20, fileBlocks);
        test::Put32(&disk, 1024 + 112 + 12, fileBlocks);
        Mount(disk);
        EXPECT_LT(most() - before, 64 << 10);
        EXPECT_TRUE(volume_ == nullptr || volume_->WriteObstacle()) << fileBlocks;
    }
}

TEST_F(Space, ExtentsBehindTheVolumeTakeNoBlocks) {
    Bytes disk = DiskVolume{}.Build();
    test::Put32(&disk, 1024 + 352 + 16, 1000);
    Mount(disk);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    EXPECT_EQ(0u, volume_->WriteObstacle().Text().find("attributes file: extent 0 (blocks 1,000"))
        << volume_->WriteObstacle().Text();
    EXPECT_EQ(nullptr, volume_->Tree(kAttributesFileId, &problem_));
    EXPECT_EQ(0u, Blocks(kAttributesFileId));
}

}  // namespace
}  // namespace VELK
