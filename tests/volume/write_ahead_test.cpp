// A monitor between the volume and its medium, and one between the engine and the volume: no block
// reaches its place before its copy in the journal counts and is on the medium, and no byte of a
// block changes before access was granted.
#include <gtest/gtest.h>

#include <cstring>
#include <map>

#include "capture.h"
#include "cut_operations.h"
#include "hfs/volume/journal_replay.h"
#include "hfs/volume/wire.h"

namespace VELK {
namespace {

constexpr u32 kVersionEnd = 12;  // attributes and last mounted version: bytes 4 to 11

// Knows what a power cut could not take away: the bytes as of the last sync.
class WriteAheadMonitor : public BlockDevice {
public:
    WriteAheadMonitor(BlockDevice* base, const JournalPlace& place)
        : place_(place), base_(base), synced_(test::DeviceWith(test::BytesOf(base))) {}

    u64 Size() const override { return base_->Size(); }
    bool IsWritable() const override { return true; }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override {
        return base_->Read(offset, target, bytes);
    }
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override {
        const u8* in = static_cast<const u8*>(source);
        if (place_.Touches(offset, bytes)) {
            JudgeRing(offset, bytes);
        } else {
            JudgeHome(offset, in, bytes);
        }
        return base_->Write(offset, source, bytes);
    }
    IoResult Sync() override {
        const std::vector<u8> bytes = test::BytesOf(base_);
        return synced_->Write(0, bytes.data(), bytes.size());
    }

    u32 homeWrites = 0;
    u32 ringWrites = 0;
    u32 headerWrites = 0;
    u32 violations = 0;

private:
    // What would be there after a cut now and a mount.
    void JudgeHome(u64 offset, const u8* bytes, std::size_t size) {
        const JournalPlace now = test::JournalOf(synced_.get());
        OverlayDevice recovered(synced_.get());
        const ReplayResult replay = ReplayJournal(synced_.get(), now, &recovered);
        violations += replay.isComplete && replay.io.Ok() ? 0u : 1u;
        std::vector<u8> expected(size);
        violations += recovered.Peek(offset, expected.data(), size).Ok() ? 0u : 1u;
        if (offset == kHeaderOffset && size == kHeaderSize &&
            std::memcmp(expected.data(), bytes, size) != 0) {
            // Taking the volume into use and out of it: one sector, these two fields.
            std::memcpy(expected.data() + 4, bytes + 4, kVersionEnd - 4);
            headerWrites += 1;
        }
        violations += std::memcmp(expected.data(), bytes, size) == 0 ? 0u : 1u;
        homeWrites += 1;
    }

    // Nothing of a transaction that counts is written over, and the header goes alone.
    void JudgeRing(u64 offset, std::size_t size) {
        const JournalHeader header = test::JournalOf(synced_.get()).header;
        ringWrites += 1;
        if (offset == place_.offset) {
            violations += size == kJournalSector ? 0u : 1u;
            return;
        }
        for (u64 at = offset - place_.offset; at < offset - place_.offset + size; at += 512) {
            const u64 behindStart =
                at >= header.start ? at - header.start : at - header.start + header.Capacity();
            violations += behindStart < header.Used() ? 1u : 0u;
        }
    }

    JournalPlace place_;
    BlockDevice* base_;
    std::unique_ptr<MemoryDevice> synced_;
};

// Stands in front of a volume's service tables and keeps a copy of every lent block.
class AccessMonitor {
public:
    explicit AccessMonitor(CFileSystemHfs* fs)
        : fs_(fs), service_(fs->service), cache_(fs->cache), journal_(fs->journal) {
        fs->service = {&kVolume, this};
        fs->cache = {&kCache, this};
        fs->journal = {&kJournal, this};
    }
    ~AccessMonitor() {
        fs_->service = service_;
        fs_->cache = cache_;
        fs_->journal = journal_;
    }

    u32 grants = 0;
    u32 handovers = 0;
    u32 violations = 0;

private:
    struct Block {
        const u8* data;
        std::vector<u8> copy;
        bool isGranted;

        bool IsUnchanged() const { return std::memcmp(data, copy.data(), copy.size()) == 0; }
    };

    static AccessMonitor* Of(void* self) { return static_cast<AccessMonitor*>(self); }

    static int Map(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                   u32 fileId, u64 offset, u32 bytes, bool noRead, HfsBcbBuf* bufs) {
        AccessMonitor* monitor = Of(self);
        const int status = monitor->service_.ops->Map(
            monitor->service_.self, fs, runs, fork, forkType, fileId, offset, bytes, noRead, bufs);
        for (u32 i = 0; status == 0 && i < bytes / fs->mapBlockSize; ++i) {
            monitor->blocks_[bufs[i].bh] = {
                bufs[i].data, {bufs[i].data, bufs[i].data + fs->mapBlockSize}, false};
        }
        return status;
    }
    static int DirtyMeta(void* self, CFileSystemHfs* fs, buffer_head* bh) {
        AccessMonitor* monitor = Of(self);
        Block& block = monitor->blocks_[bh];
        monitor->violations += block.isGranted ? 0u : 1u;
        monitor->handovers += 1;
        const int status = monitor->service_.ops->DirtyMeta(monitor->service_.self, fs, bh);
        block.copy.assign(block.data, block.data + block.copy.size());
        block.isGranted = false;
        return status;
    }
    static int Zero(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                    u32 fileId, u64 offset, u64 bytes) {
        const auto& next = Of(self)->service_;
        return next.ops->Zero(next.self, fs, runs, fork, forkType, fileId, offset, bytes);
    }
    static int Resize(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                      u32 fileId, u64 size) {
        const auto& next = Of(self)->service_;
        return next.ops->Resize(next.self, fs, runs, fork, forkType, fileId, size);
    }
    static void Release(void* self, buffer_head* bh, int flag) {
        AccessMonitor* monitor = Of(self);
        const auto found = monitor->blocks_.find(bh);
        if (found != monitor->blocks_.end()) {
            const Block& block = found->second;
            monitor->violations += block.isGranted || block.IsUnchanged() ? 0u : 1u;
            monitor->blocks_.erase(found);
        }
        monitor->cache_.Release(bh, flag);
    }
    static void BeginModify(void* self, buffer_head* bh) { Of(self)->cache_.BeginModify(bh); }
    static void EndModify(void* self, buffer_head* bh) { Of(self)->cache_.EndModify(bh); }
    static int Grant(void* self, buffer_head* bh) {
        AccessMonitor* monitor = Of(self);
        Block& block = monitor->blocks_[bh];
        monitor->violations += block.isGranted || block.IsUnchanged() ? 0u : 1u;
        const int status = monitor->journal_.ops->GetWriteAccess(monitor->journal_.self, bh);
        block.isGranted = block.isGranted || status == 0;
        monitor->grants += 1;
        return status;
    }

    static constexpr HfsVolumeOps kVolume = {Map, DirtyMeta, Zero, Resize};
    static constexpr HfsCacheOps kCache = {Release, BeginModify, EndModify};
    static constexpr HfsJournalOps kJournal = {Grant, Grant};

    CFileSystemHfs* fs_;
    HfsService<HfsVolumeOps> service_;
    HfsBufferCache cache_;
    HfsService<HfsJournalOps> journal_;
    std::map<buffer_head*, Block> blocks_;
};

TEST(WriteAhead, NoBlockReachesItsPlaceBeforeItsCopyCounts) {
    test::Capture capture;
    test::CutBaseShape shape;
    shape.records = 20;
    const test::CutBase base = test::MakeCutBase(shape);
    auto device = test::DeviceWith(base.bytes);
    WriteAheadMonitor monitor(device.get(), test::JournalOf(device.get()));
    Problem problem;
    auto volume = test::MountOn(&monitor, test::Writing(), &problem);
    ASSERT_NE(nullptr, volume) << problem.Text();
    test::CutVolume on{volume.get(), base.numbers, [&] { return volume->Commit(0); }};
    for (u32 i = 0; i < 5 * test::kCutOperations; ++i) {
        const int status = test::DoCutOperation(i % test::kCutOperations, &on);
        ASSERT_TRUE(status == 0 || status == kErrNoSpace) << i;
        ASSERT_EQ(0, status == 0 ? volume->Commit(0) : (volume->Restore(), 0));
        ASSERT_EQ(0u, monitor.violations) << test::CutOperationName(i % test::kCutOperations);
    }
    ASSERT_EQ(0, volume->Close());
    EXPECT_EQ(0u, monitor.violations);
    EXPECT_EQ(2u, monitor.headerWrites);
    EXPECT_GT(monitor.homeWrites, 100u);
    EXPECT_GT(monitor.ringWrites, 100u);
}

TEST(WriteAhead, NoByteChangesBeforeAccessWasGranted) {
    test::Capture capture;
    test::CutBaseShape shape;
    shape.records = 20;
    const test::CutBase base = test::MakeCutBase(shape);
    auto device = test::DeviceWith(base.bytes);
    Problem problem;
    auto volume = test::MountOn(device.get(), test::Writing(), &problem);
    ASSERT_NE(nullptr, volume) << problem.Text();
    {
        AccessMonitor monitor(volume->Fs());
        test::CutVolume on{volume.get(), base.numbers, [&] { return volume->Commit(0); }};
        for (u32 i = 0; i < 5 * test::kCutOperations; ++i) {
            const int status = test::DoCutOperation(i % test::kCutOperations, &on);
            ASSERT_TRUE(status == 0 || status == kErrNoSpace) << i;
            ASSERT_EQ(0, status == 0 ? volume->Commit(0) : (volume->Restore(), 0));
            ASSERT_EQ(0u, monitor.violations) << test::CutOperationName(i % test::kCutOperations);
        }
        EXPECT_GT(monitor.grants, 100u);
        EXPECT_GT(monitor.handovers, 100u);
    }
    volume.reset();
    EXPECT_EQ("", test::CheckAll(device.get()));
}

}  // namespace
}  // namespace VELK
