// Changes: committed all together, gone after a restore, kept out of the image by an overlay.
#include <gtest/gtest.h>

#include "capture.h"
#include "disk_builder.h"
#include "hfs/volume/convert.h"
#include "hfs/volume/make_volume.h"
#include "hfs/volume/wire.h"
#include "ledger.h"
#include "small_volume.h"

namespace VELK {
namespace {

using test::NumberKey;

class CommitTest : public testing::Test {
protected:
    void Make(u64 size, const FormatOptions& options) {
        volume_ = MakeMemoryVolume(size, options, &problem_);
        ASSERT_NE(nullptr, volume_) << problem_.Text();
        size_ = size;
    }
    CBTreeHfs* Catalog() { return volume_->Tree(kCatalogFileId, &problem_); }
    int Insert(u32 number) { return test::InsertNumber(volume_.get(), number); }
    bool Has(u32 number) { return test::HasNumber(volume_.get(), number); }
    // Mounts what was committed anew; changes stay in memory.
    void ReopenWithBudget(u64 cacheBudget) {
        const std::vector<u8> image = Bytes();
        auto device = std::make_unique<MemoryDevice>(image.size());
        ASSERT_TRUE(device->Write(0, image.data(), image.size()).Ok());
        OpenOptions options;
        options.access = Access::kOverlay;
        options.cacheBudget = cacheBudget;
        volume_ = ImageVolume::Open(std::move(device), options, nullptr, &problem_);
        ASSERT_NE(nullptr, volume_) << problem_.Text();
    }
    std::vector<u8> Bytes() {
        std::vector<u8> bytes(static_cast<std::size_t>(size_));
        EXPECT_EQ(0, volume_->ReadVolume(0, bytes.data(), bytes.size()));
        return bytes;
    }

    test::Capture capture_;
    Problem problem_;
    u64 size_ = 0;
    std::unique_ptr<ImageVolume> volume_;
};

TEST_F(CommitTest, NothingReachesTheDeviceBeforeTheCommit) {
    Make(1 << 20, test::SmallTrees());
    const std::vector<u8> before = Bytes();
    ASSERT_EQ(0, Insert(100));
    EXPECT_EQ(before, Bytes());
    ASSERT_EQ(0, volume_->Commit(0));
    EXPECT_NE(before, Bytes());
    EXPECT_TRUE(Has(100));
}

TEST_F(CommitTest, ACommitWithoutChangesWritesNothing) {
    Make(1 << 20, test::SmallTrees());
    const u64 written = volume_->CommittedBytes();
    ASSERT_EQ(0, volume_->Commit(0));
    EXPECT_EQ(written, volume_->CommittedBytes());
}

TEST_F(CommitTest, RestoreLeavesTheLastCommitByteForByte) {
    Make(1 << 20, test::SmallTrees());
    for (u32 i = 100; i < 200; ++i) {
        ASSERT_EQ(0, Insert(i));
    }
    ASSERT_EQ(0, volume_->Commit(0));
    const std::vector<u8> committed = Bytes();
    const u32 freeBlocks = volume_->Header().freeBlocks;
    for (u32 i = 200; i < 3000; ++i) {
        ASSERT_EQ(0, Insert(i));
    }
    ASSERT_EQ(0, Catalog()->Flush(0));  // staged, not committed
    for (u32 i = 3000; i < 3100; ++i) {
        ASSERT_EQ(0, Insert(i));
    }
    volume_->CountCatalogRecord(1, 5000, 1);
    EXPECT_NE(freeBlocks, volume_->Header().freeBlocks);
    volume_->Restore();
    EXPECT_EQ(committed, Bytes());
    EXPECT_EQ(freeBlocks, volume_->Header().freeBlocks);
    EXPECT_EQ(0u, volume_->Header().folderCount);
    EXPECT_EQ(102u, Catalog()->header.leafRecords);
    EXPECT_TRUE(Has(199));
    EXPECT_FALSE(Has(200));
    EXPECT_TRUE(volume_->IsWritable());
    EXPECT_FALSE(Catalog()->IsDirty());
    ASSERT_EQ(0, volume_->Commit(0));
    EXPECT_EQ(committed, Bytes());
}

// The work that a restore threw away can be done again and gives the bytes it would have given.
TEST_F(CommitTest, WorkAfterARestoreEqualsUndisturbedWork) {
    Make(1 << 20, test::SmallTrees());
    for (u32 i = 100; i < 2000; ++i) {
        ASSERT_EQ(0, Insert(i));
    }
    volume_->Restore();
    for (u32 i = 100; i < 1000; ++i) {
        ASSERT_EQ(0, Insert(i));
    }
    ASSERT_EQ(0, volume_->Commit(0));
    const std::vector<u8> disturbed = Bytes();
    Make(1 << 20, test::SmallTrees());
    for (u32 i = 100; i < 1000; ++i) {
        ASSERT_EQ(0, Insert(i));
    }
    ASSERT_EQ(0, volume_->Commit(0));
    EXPECT_EQ(Bytes(), disturbed);
}

TEST_F(CommitTest, ATreeMadeAndNotCommittedIsGoneAfterARestore) {
    FormatOptions options = test::SmallTrees();
    options.withAttributes = false;
    Make(1 << 20, options);
    const std::vector<u8> before = Bytes();
    ASSERT_EQ(0, volume_->CreateTree(kAttributesFileId, 9, nullptr));
    EXPECT_TRUE(volume_->HasTree(kAttributesFileId));
    volume_->Restore();
    EXPECT_FALSE(volume_->HasTree(kAttributesFileId));
    EXPECT_EQ(before, Bytes());
    ASSERT_EQ(0, volume_->CreateTree(kAttributesFileId, 9, nullptr));
    ASSERT_EQ(0, volume_->Commit(0));
    volume_->Restore();
    EXPECT_TRUE(volume_->HasTree(kAttributesFileId));
}

TEST_F(CommitTest, OnlyFailuresThatMayHaveChangedSomethingRestore) {
    Make(1 << 20, test::SmallTrees());
    EXPECT_FALSE(volume_->RestoreAfter(kOk));
    EXPECT_FALSE(volume_->RestoreAfter(kErrNotFound));
    EXPECT_FALSE(volume_->RestoreAfter(kErrExists));
    EXPECT_FALSE(volume_->RestoreAfter(kErrTooLarge));
    EXPECT_TRUE(volume_->RestoreAfter(kErrNoSpace));
    EXPECT_TRUE(volume_->RestoreAfter(kErrCorrupt));
}

TEST_F(CommitTest, AFullVolumeRefusesGrowthAndKeepsWhatWasCommitted) {
    Make(96 << 10, test::SmallTrees());
    int status = 0;
    u32 number = 100;
    while (status == 0 && number < 100000) {
        status = Insert(number);
        number += 1;
        if (status == 0 && number % 50 == 0) {
            ASSERT_EQ(0, volume_->Commit(0));
        }
    }
    EXPECT_EQ(kErrNoSpace, status);
    EXPECT_TRUE(volume_->RestoreAfter(status));
    EXPECT_TRUE(Has(number / 50 * 50 - 1));
    EXPECT_FALSE(Has(number));
}

// Two trees growing in turn take blocks between each other's, so their forks fall apart.
class OverflowTest : public CommitTest {
protected:
    void GrowInTurn(u32 steps) {
        for (u32 i = 0; i < steps; ++i) {
            for (const u32 fileId : {kCatalogFileId, kAttributesFileId}) {
                CBTreeHfs* tree = volume_->Tree(fileId, &problem_);
                ASSERT_NE(nullptr, tree);
                ASSERT_EQ(0, tree->ExtendBTree(tree->header.totalNodes + 1, nullptr, nullptr));
            }
        }
    }
    u32 InlineBlocks(u32 fileId) {
        u32 blocks = 0;
        for (const HfsExtent& extent : volume_->Fs()->ForkOf(fileId)->extents) {
            blocks += extent.blockCount;
        }
        return blocks;
    }
};

TEST_F(OverflowTest, ForksOfMoreThanEightExtentsComeBackWhole) {
    Make(1 << 20, test::SmallTrees());
    GrowInTurn(40);
    ASSERT_EQ(0, volume_->Commit(0));
    const std::vector<HfsExtent> extents = volume_->ForkExtents(kCatalogFileId);
    ASSERT_GT(extents.size(), 24u);
    EXPECT_LT(InlineBlocks(kCatalogFileId), volume_->Fs()->catalogFork.totalBlocks);

    const std::vector<u8> bytes = Bytes();
    auto device = std::make_unique<MemoryDevice>(bytes.size());
    ASSERT_TRUE(device->Write(0, bytes.data(), bytes.size()).Ok());
    auto again = ImageVolume::Open(std::move(device), OpenOptions{}, nullptr, &problem_);
    ASSERT_NE(nullptr, again) << problem_.Text();
    ASSERT_NE(nullptr, again->Tree(kCatalogFileId, &problem_)) << problem_.Text();
    const std::vector<HfsExtent> found = again->ForkExtents(kCatalogFileId);
    ASSERT_EQ(extents.size(), found.size());
    for (std::size_t i = 0; i < found.size(); ++i) {
        EXPECT_EQ(extents[i].startBlock, found[i].startBlock) << i;
        EXPECT_EQ(extents[i].blockCount, found[i].blockCount) << i;
    }
    const u32 records = again->Tree(kExtentsFileId, &problem_)->header.leafRecords;
    EXPECT_EQ(
        (extents.size() - 8 + 7) / 8 + (again->ForkExtents(kAttributesFileId).size() - 8 + 7) / 8,
        records);
    EXPECT_TRUE(again->Notes().empty());
}

TEST_F(OverflowTest, RecordsFollowAForkThatGrowsFurther) {
    Make(1 << 20, test::SmallTrees());
    GrowInTurn(12);
    ASSERT_EQ(0, volume_->Commit(0));
    GrowInTurn(12);
    ASSERT_EQ(0, volume_->Commit(0));
    // The catalog's first growth continues its only extent, so it has one extent less.
    EXPECT_EQ(24u, volume_->ForkExtents(kCatalogFileId).size());     // 8 and two full records
    EXPECT_EQ(25u, volume_->ForkExtents(kAttributesFileId).size());  // 8 and three, the last of 1
    EXPECT_EQ(5u, volume_->Tree(kExtentsFileId, &problem_)->header.leafRecords);
}

TEST_F(OverflowTest, ARestoreDropsRecordsNotCommitted) {
    Make(1 << 20, test::SmallTrees());
    const std::vector<u8> before = Bytes();
    GrowInTurn(20);
    volume_->Restore();
    EXPECT_EQ(1u, volume_->ForkExtents(kCatalogFileId).size());
    ASSERT_EQ(0, volume_->Commit(0));
    EXPECT_EQ(before, Bytes());
}

TEST_F(OverflowTest, TheExtentsTreeItselfStopsAtEightExtents) {
    Make(1 << 20, test::SmallTrees());
    int status = 0;
    for (u32 i = 0; i < 40 && status == 0; ++i) {
        CBTreeHfs* catalog = volume_->Tree(kCatalogFileId, &problem_);
        CBTreeHfs* extents = volume_->Tree(kExtentsFileId, &problem_);
        ASSERT_EQ(0, catalog->ExtendBTree(catalog->header.totalNodes + 1, nullptr, nullptr));
        status = extents->ExtendBTree(extents->header.totalNodes + 1, nullptr, nullptr);
    }
    EXPECT_EQ(kErrNoSpace, status);
    EXPECT_EQ(8u, volume_->ForkExtents(kExtentsFileId).size());
}

TEST_F(CommitTest, AnOverlayNeverWritesTheImage) {
    Make(1 << 20, test::SmallTrees());
    const std::vector<u8> image = Bytes();
    auto device = std::make_unique<MemoryDevice>(image.size());
    MemoryDevice* home = device.get();
    ASSERT_TRUE(device->Write(0, image.data(), image.size()).Ok());
    OpenOptions options;
    options.access = Access::kOverlay;
    volume_ = ImageVolume::Open(std::move(device), options, nullptr, &problem_);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    for (u32 i = 100; i < 500; ++i) {
        ASSERT_EQ(0, Insert(i));
    }
    ASSERT_EQ(0, volume_->Commit(0));
    EXPECT_TRUE(Has(499));
    EXPECT_NE(image, Bytes());
    std::vector<u8> below(image.size());
    ASSERT_TRUE(home->Read(0, below.data(), below.size()).Ok());
    EXPECT_EQ(image, below);
}

TEST_F(CommitTest, AReadOnlyVolumeRefusesEveryChange) {
    Make(1 << 20, test::SmallTrees());
    const std::vector<u8> image = Bytes();
    auto device = std::make_unique<MemoryDevice>(image.size());
    ASSERT_TRUE(device->Write(0, image.data(), image.size()).Ok());
    volume_ = ImageVolume::Open(std::move(device), OpenOptions{}, nullptr, &problem_);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    EXPECT_FALSE(volume_->IsWritable());
    ASSERT_EQ(0, Insert(100));
    EXPECT_EQ(kErrVolumeReadOnly, Catalog()->Flush(0));
    EXPECT_EQ(kErrVolumeReadOnly, volume_->Commit(0));
    EXPECT_EQ(kErrVolumeReadOnly, volume_->CreateTree(kAttributesFileId, 12, nullptr));
    EXPECT_EQ(image, Bytes());
}

TEST_F(CommitTest, HeaderCountsFollowCatalogRecords) {
    Make(1 << 20, test::SmallTrees());
    volume_->CountCatalogRecord(1, 16, 1);
    volume_->CountCatalogRecord(2, 40, 1);
    volume_->CountCatalogRecord(2, 17, 1);
    volume_->CountCatalogRecord(3, 16, 1);
    volume_->CountCatalogRecord(2, 17, -1);
    ASSERT_EQ(0, volume_->Commit(0));
    const std::vector<u8> bytes = Bytes();
    EXPECT_EQ(1u, Be32(bytes.data() + 1024 + 32));
    EXPECT_EQ(1u, Be32(bytes.data() + 1024 + 36));
    EXPECT_EQ(41u, Be32(bytes.data() + 1024 + 64));
}

// --- writing to the medium -----------------------------------------------------------------------

class WriteTest : public testing::Test {
protected:
    std::string Refusal(const test::Bytes& disk) {
        OpenOptions options;
        options.access = Access::kWrite;
        options.force = force_;
        auto volume = ImageVolume::Open(test::DeviceOf(disk), options, nullptr, &problem_);
        return volume ? "" : problem_.Text();
    }
    bool force_ = false;
    Problem problem_;
    test::DiskVolume shape_;
};

TEST_F(WriteTest, CleanVolumeMayBeWritten) {
    EXPECT_EQ("", Refusal(shape_.Build()));
}

TEST_F(WriteTest, UncleanVolumeWantsForce) {
    test::Bytes disk = shape_.Build();
    test::Put32(&disk, 1024 + 4, 0);
    EXPECT_EQ("the volume was not unmounted cleanly: run check, then --force", Refusal(disk));
    test::Put32(&disk, 1024 + 4, 0x900);
    EXPECT_EQ("the volume was not unmounted cleanly: run check, then --force", Refusal(disk));
    force_ = true;
    EXPECT_EQ("", Refusal(disk));
}

TEST_F(WriteTest, PendingJournalWantsForce) {
    shape_.journalStart = 512;
    shape_.journalEnd = 512 + 4096;
    EXPECT_EQ(
        "the journal holds transactions (4,096 B): writing would lose them; let the native "
        "system replay it, or --force",
        Refusal(shape_.Build()));
    force_ = true;
    EXPECT_EQ("", Refusal(shape_.Build()));
}

TEST_F(WriteTest, SoftwareLockHoldsAgainstForce) {
    test::Bytes disk = shape_.Build();
    test::Put32(&disk, 1024 + 4, 0x8100);
    force_ = true;
    EXPECT_EQ("the volume is locked against writing (attribute bit 15): it can only be read",
              Refusal(disk));
}

TEST_F(WriteTest, OverlappingFilesAndTruncatedImagesCanOnlyBeRead) {
    test::Bytes disk = shape_.Build();
    test::Put32(&disk, 1024 + 192 + 16, test::Get32(disk, 1024 + 272 + 16));
    EXPECT_EQ("extents file and catalog file claim the same blocks: the volume can only be read",
              Refusal(disk));
    disk = shape_.Build();
    disk.resize(200000);
    EXPECT_EQ("image ends at 200,000, the volume at 262,144: the volume can only be read",
              Refusal(disk));
}

// Records what happens to the medium, in order.
class Recorder : public MemoryDevice {
public:
    using MemoryDevice::MemoryDevice;
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override {
        if (offset <= 1024 && offset + bytes >= 1536) {
            const u8* header = static_cast<const u8*>(source) + (1024 - offset);
            log += (header[6] & 1) != 0 ? "clean " : "unclean ";
        } else {
            log += "write ";
        }
        return MemoryDevice::Write(offset, source, bytes);
    }
    IoResult Sync() override {
        log += "sync ";
        return {};
    }
    std::string log;
};

TEST_F(WriteTest, CleanBitGoesFirstAndComesBackLast) {
    const test::Bytes disk = shape_.Build();
    auto device = std::make_unique<Recorder>(disk.size());
    Recorder* recorder = device.get();
    ASSERT_TRUE(device->Write(0, disk.data(), disk.size()).Ok());
    recorder->log.clear();
    OpenOptions options;
    options.access = Access::kWrite;
    auto volume = ImageVolume::Open(std::move(device), options, nullptr, &problem_);
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ("", recorder->log);
    CBTreeHfs* tree = volume->Tree(kCatalogFileId, &problem_);
    ASSERT_NE(nullptr, tree);
    const NumberKey key(900);
    const u8 data[10] = {9, 0};
    ASSERT_EQ(0, tree->InsertRecord(key.bytes, 900, data, sizeof data));
    ASSERT_EQ(0, volume->Commit(0));
    EXPECT_EQ("unclean sync write sync clean sync ", recorder->log);
    EXPECT_EQ(1u, volume->Header().writeCount);
}

// Blocks in use that the allocation file calls free are never handed out.
TEST_F(WriteTest, BlocksOfSpecialFilesAreNotHandedOutWhateverTheBitmapSays) {
    test::Bytes disk = shape_.Build();
    const std::size_t bitmap = std::size_t{test::Get32(disk, 1024 + 112 + 16)} * shape_.blockSize;
    std::fill_n(disk.begin() + static_cast<std::ptrdiff_t>(bitmap), 8, u8{0});
    OpenOptions options;
    options.access = Access::kOverlay;
    auto volume = ImageVolume::Open(test::DeviceOf(disk), options, nullptr, &problem_);
    ASSERT_NE(nullptr, volume) << problem_.Text();
    ASSERT_EQ(1u, volume->Notes().size());
    EXPECT_EQ("V05", volume->Notes()[0].check);
    CBTreeHfs* tree = volume->Tree(kCatalogFileId, &problem_);
    ASSERT_NE(nullptr, tree);
    const unsigned clump = 4096;
    while (tree->ExtendBTree(tree->header.totalNodes + 1, nullptr, &clump) == 0) {
    }
    std::vector<bool> used(shape_.blocks);
    used[0] = used[shape_.blocks - 1] = true;
    for (const u32 fileId : {3u, 4u, 6u, 8u}) {
        for (const HfsExtent& extent : volume->ForkExtents(fileId)) {
            for (u32 i = 0; i < extent.blockCount; ++i) {
                EXPECT_FALSE(used[extent.startBlock + i]) << extent.startBlock + i;
                used[extent.startBlock + i] = true;
            }
        }
    }
    EXPECT_EQ(0u, volume->Fs()->bitmap->GetZeros());
}

// The cache falls back under its budget, and a path held by a caller stays good.
TEST_F(CommitTest, TrimCacheKeepsHeldAndModifiedNodes) {
    FormatOptions small = test::SmallTrees();
    small.name = u"Trim";
    Make(1 << 20, small);
    for (u32 i = 100; i < 900; ++i) {
        ASSERT_EQ(0, Insert(i));
    }
    ASSERT_EQ(0, volume_->Commit(0));
    ReopenWithBudget(8192);
    const NumberKey key(500);
    HfsFindData path;
    bool found = false;
    ASSERT_EQ(
        0, Catalog()->FindEntry(key.Get(), 500, &path, &found, nullptr, nullptr, nullptr, nullptr));
    ASSERT_TRUE(found);
    ASSERT_EQ(0, Insert(1000));
    u64 most = 0;
    for (u32 i = 100; i < 900; ++i) {
        EXPECT_TRUE(Has(i));
        volume_->TrimCache();
        most = std::max(most, volume_->CachedBytes());
    }
    EXPECT_LT(most, 24000u);
    EXPECT_TRUE(Has(1000));
    u8 record[128];
    unsigned size = 0;
    EXPECT_EQ(0, Catalog()->IncPos(0, record, sizeof record, &size, nullptr, 0, nullptr, &path));
    EXPECT_EQ(100u, size);
    path.ClearPath();
}

// Lookups all over a tree, in no order, keep no more nodes than they were given room for.
TEST_F(CommitTest, RandomLookupsStayWithinTheCacheBudget) {
    constexpr u32 kRecords = 6000;
    constexpr u64 kBudget = 64 << 10;
    Make(4 << 20, test::SmallTrees());
    for (u32 i = 0; i < kRecords; ++i) {
        ASSERT_EQ(0, Insert(100 + i));
    }
    ASSERT_EQ(0, volume_->Commit(0));
    ReopenWithBudget(kBudget);
    u64 most = 0;
    u32 number = 1;
    for (u32 i = 0; i < 20000; ++i) {
        number = number * 1664525 + 1013904223;
        EXPECT_TRUE(Has(100 + (number >> 8) % kRecords));
        most = std::max(most, volume_->CachedBytes());
        volume_->TrimCache();
    }
    const u64 whole = u64{Catalog()->header.totalNodes} * 512;
    EXPECT_GT(whole, 8 * kBudget);
    EXPECT_GT(most, kBudget / 2);
    EXPECT_LT(most, kBudget + 16 * 1024);
}

// What a long run of changes kept in the cache is gone with its commit.
TEST_F(CommitTest, TheCacheBudgetHoldsAgainAfterACommit) {
    constexpr u32 kRecords = 6000;
    constexpr u64 kBudget = 64 << 10;
    Make(4 << 20, test::SmallTrees());
    ReopenWithBudget(kBudget);
    for (u32 i = 0; i < kRecords; ++i) {
        ASSERT_EQ(0, Insert(100 + i));
        volume_->TrimCache();
    }
    EXPECT_GT(volume_->CachedBytes(), 4 * kBudget);
    ASSERT_EQ(0, volume_->Commit(0));
    u64 most = 0;
    for (u32 i = 0; i < kRecords; ++i) {
        ASSERT_TRUE(Has(100 + i * 37 % kRecords));
        most = std::max(most, volume_->CachedBytes());
        volume_->TrimCache();
    }
    EXPECT_LT(most, kBudget + 4096);
}

// Whether the budget leaves room for them decides what becomes of index nodes.
TEST_F(CommitTest, TrimCacheKeepsIndexNodesThatLeaveRoomForLeaves) {
    constexpr u32 kRecords = 6000;
    Make(4 << 20, test::SmallTrees());
    for (u32 i = 0; i < kRecords; ++i) {
        ASSERT_EQ(0, Insert(100 + i));
    }
    ASSERT_EQ(0, volume_->Commit(0));
    for (const u64 budget : {u64{16} << 10, u64{256} << 10}) {
        ReopenWithBudget(budget);
        u32 trims = 0;
        std::size_t fewestIndexNodes = kRecords;
        std::size_t mostLeaves = 0;
        for (u32 i = 0; i < kRecords; ++i) {
            ASSERT_TRUE(Has(100 + i * 37 % kRecords));
            const u64 before = volume_->CachedBytes();
            volume_->TrimCache();
            if (volume_->CachedBytes() < before) {
                std::size_t leaves = 0;
                for (const HfsNode* node : test::CachedNodes(*Catalog())) {
                    leaves += node->bufs[0].data[kDescHeight] == 1 ? 1 : 0;
                }
                mostLeaves = std::max(mostLeaves, leaves);
                fewestIndexNodes = std::min(fewestIndexNodes, Catalog()->nodeCount - leaves);
                trims += 1;
            }
        }
        EXPECT_GT(trims, 5u);
        EXPECT_LT(trims, kRecords / (budget > 65536 ? 100 : 6));
        EXPECT_LE(mostLeaves, 1u);  // the one that the tree's own path holds
        if (budget > 65536) {
            EXPECT_GT(fewestIndexNodes, 40u);
        } else {
            EXPECT_LT(fewestIndexNodes, 5u);
        }
    }
}

}  // namespace
}  // namespace VELK
