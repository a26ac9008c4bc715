// What a mounted volume answers: copies of it, services asked out of turn, media that refuse,
// commits where the copy of the header is missing or sectors are shared with what lies beside the
// volume.
#include <gtest/gtest.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>

#include "capture.h"
#include "disk_builder.h"
#include "hfs/volume/make_volume.h"
#include "hfs/volume/transaction.h"
#include "hfs/volume/wire.h"
#include "hfs/volume/write_checks.h"
#include "recording_device.h"

namespace VELK {
namespace {

using test::Bytes;
using test::DeviceFaults;
using test::DiskVolume;

class Volume : public testing::Test {
protected:
    // On a device that outlives the volume and fails as `faults_` says.
    void Mount(const Bytes& disk, Access access) {
        options_.access = access;
        volume_.reset();
        device_ = test::DeviceOf(disk);
        volume_ = ImageVolume::Open(std::make_unique<test::FaultyDevice>(device_.get(), &faults_),
                                    options_, nullptr, &problem_);
    }
    Bytes Medium() {
        Bytes bytes(static_cast<std::size_t>(device_->Size()));
        EXPECT_TRUE(device_->Read(0, bytes.data(), bytes.size()).Ok());
        return bytes;
    }
    void FailNext(u32 DeviceFaults::*which, u32 DeviceFaults::*calls, int error) {
        faults_.error = error;
        faults_.*which = faults_.*calls + 1;
    }

    test::Capture capture_;
    OpenOptions options_;
    Problem problem_;
    DeviceFaults faults_;
    std::unique_ptr<BlockDevice> device_;
    std::unique_ptr<ImageVolume> volume_;
};

// --- copies --------------------------------------------------------------------------------------

TEST_F(Volume, ACopyHoldsWhatWasCommitted) {
    const Bytes disk = DiskVolume{}.Build();
    const std::string path = testing::TempDir() + "volume_copy.img";
    for (const Access access : {Access::kReadOnly, Access::kOverlay}) {
        Mount(disk, access);
        ASSERT_NE(nullptr, volume_) << problem_.Text();
        std::FILE* file = std::fopen(path.c_str(), "w");
        ASSERT_NE(nullptr, file);
        EXPECT_FALSE(volume_->SaveTo(file));
        std::fclose(file);
        Problem problem;
        auto copy = FileDevice::Open(path, FileDevice::Mode::kRead, 0, &problem);
        ASSERT_NE(nullptr, copy) << problem.Text();
        Bytes bytes(disk.size());
        ASSERT_EQ(disk.size(), copy->Size());
        ASSERT_TRUE(copy->Read(0, bytes.data(), bytes.size()).Ok());
        EXPECT_EQ(disk, bytes);
    }
    std::remove(path.c_str());
}

TEST_F(Volume, ACopyThatCannotBeReadOrWrittenSaysSo) {
    Mount(DiskVolume{}.Build(), Access::kReadOnly);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    if (std::filesystem::exists("/dev/full")) {
        std::FILE* full = std::fopen("/dev/full", "w");
        ASSERT_NE(nullptr, full);
        EXPECT_EQ("cannot write the copy: disk full or not writable", volume_->SaveTo(full).Text());
        std::fclose(full);
        // What the host's buffer takes is missed when that is written.
        std::vector<char> buffer(1 << 20);
        full = std::fopen("/dev/full", "w");
        std::setvbuf(full, buffer.data(), _IOFBF, buffer.size());
        EXPECT_EQ("cannot write the copy", volume_->SaveTo(full).Text());
        std::fclose(full);
    }
    std::FILE* nowhere = std::fopen("/dev/null", "w");
    FailNext(&DeviceFaults::failRead, &DeviceFaults::reads, EIO);
    EXPECT_EQ("read error at 0x0: Input/output error", volume_->SaveTo(nowhere).Text());
    EXPECT_FALSE(volume_->SaveTo(nowhere));
    std::fclose(nowhere);
}

// --- reading -------------------------------------------------------------------------------------

TEST_F(Volume, BytesBehindTheEnd) {
    const Bytes disk = DiskVolume{}.Build();
    Mount(disk, Access::kReadOnly);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    u8 bytes[512];
    EXPECT_EQ(0, volume_->ReadVolume(disk.size() - 512, bytes, 512));
    EXPECT_EQ(kErrVolumeTruncated, volume_->ReadVolume(disk.size() - 511, bytes, 512));
    EXPECT_EQ("image ends at 262,144, volume (0x3fe01) lies behind that",
              volume_->LastIoProblem().Text());
    EXPECT_EQ(kErrVolumeUnmapped, volume_->ReadFork(kCatalogFileId, u64{1} << 45, bytes, 512));
    EXPECT_EQ(kErrVolumeUnmapped, volume_->ReadFork(kCatalogFileId, 1 << 20, bytes, 512));
}

TEST_F(Volume, AMediumWithoutMemoryAndOneThatIsReadOnly) {
    FailNext(&DeviceFaults::failRead, &DeviceFaults::reads, kIoNoMemory);
    Mount(DiskVolume{}.Build(), Access::kReadOnly);
    ASSERT_EQ(nullptr, volume_);
    EXPECT_EQ(kErrNoMemory, problem_.status);
    EXPECT_EQ("read error at 0x400: out of memory", problem_.what);
    Mount(DiskVolume{}.Build(), Access::kWrite);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    u8 bytes[512];
    FailNext(&DeviceFaults::failRead, &DeviceFaults::reads, kIoNoMemory);
    EXPECT_EQ(kErrNoMemory, volume_->ReadVolume(0, bytes, 512));
    volume_->SetModifyDate(7);
    FailNext(&DeviceFaults::failWrite, &DeviceFaults::writes, kIoReadOnly);
    EXPECT_EQ(kErrVolumeReadOnly, volume_->Commit(0));
    EXPECT_EQ("write error at 0x400 (volume): device is read-only",
              volume_->LastIoProblem().Text());
    EXPECT_FALSE(volume_->IsWritable());
}

// --- changes -------------------------------------------------------------------------------------

TEST_F(Volume, OneThatIsOnlyReadChangesNothing) {
    const Bytes disk = DiskVolume{}.Build();
    Mount(disk, Access::kReadOnly);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    CBTreeHfs* tree = volume_->Tree(kCatalogFileId, &problem_);
    ASSERT_NE(nullptr, tree) << problem_.Text();
    CFileSystemHfs* fs = volume_->Fs();
    HfsBcbBuf buf{};
    ASSERT_EQ(0, fs->service.ops->Map(fs->service.self, fs, &tree->runs, nullptr, 0, kCatalogFileId,
                                      4096, 4096, false, &buf));
    buf.data[100] ^= 0xFF;
    EXPECT_EQ(kErrVolumeReadOnly, fs->service.ops->DirtyMeta(fs->service.self, fs, buf.bh));
    EXPECT_EQ(kErrVolumeReadOnly, fs->service.ops->Zero(fs->service.self, fs, &tree->runs, nullptr,
                                                        0, kCatalogFileId, 0, 4096));
    EXPECT_EQ(kErrVolumeReadOnly, fs->service.ops->Resize(fs->service.self, fs, &tree->runs,
                                                          nullptr, 0, kCatalogFileId, 65536));
    fs->cache.Release(buf.bh, 0);
    volume_->Restore();
    EXPECT_EQ(0u, volume_->CommittedBytes());
    EXPECT_EQ(0, volume_->Close());
    EXPECT_EQ(disk, Medium());
}

TEST_F(Volume, TheHeadersCountsLeaveTheRootOut) {
    Mount(DiskVolume{}.Build(), Access::kOverlay);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    const VolumeHeader before = volume_->Header();
    volume_->CountCatalogRecord(1, kRootFolderId, 1);
    EXPECT_EQ("", HeaderDifferences(before, volume_->Header()));
    volume_->CountCatalogRecord(2, ~u32{0}, 1);
    EXPECT_EQ(before.fileCount + 1, volume_->Header().fileCount);
    EXPECT_EQ(before.nextCatalogId, volume_->Header().nextCatalogId);
    EXPECT_EQ(kErrInvalid, volume_->CreateTree(99, 12, nullptr));
    EXPECT_EQ(kErrInvalid, volume_->CreateTree(kStartupFileId, 12, nullptr));
}

// A fork that grows changes both headers; where one is missing none is made.
TEST_F(Volume, ACommitWritesNoCopyWhereThereWasNone) {
    DiskVolume shape;
    Bytes disk = shape.Build();
    for (const bool hasCopy : {true, false}) {
        const std::size_t copy = disk.size() - 1024;
        if (!hasCopy) {
            test::Put32(&disk, copy, 0);
        }
        Mount(disk, Access::kWrite);
        ASSERT_NE(nullptr, volume_) << problem_.Text();
        CBTreeHfs* tree = volume_->Tree(kCatalogFileId, &problem_);
        ASSERT_EQ(0, tree->ExtendBTree(tree->header.totalNodes + 1, nullptr, nullptr));
        ASSERT_EQ(0, volume_->Commit(0));
        ASSERT_EQ(0, volume_->Close());
        const Bytes after = Medium();
        EXPECT_NE(disk, after);
        const bool isSame = std::equal(disk.begin() + static_cast<std::ptrdiff_t>(copy), disk.end(),
                                       after.end() - 1024);
        EXPECT_EQ(!hasCopy, isSame);
    }
}

// The volume shares its first sector with what lies before it: a change there has to be read first.
TEST_F(Volume, AVolumeBetweenTheSectorsOfItsImage) {
    const Bytes inner = DiskVolume{}.Build();
    Bytes disk(100, 0x5A);
    test::AppendBytes(&disk, inner);
    disk.resize(disk.size() + 1000, 0x5A);
    options_.offset = 100;
    Mount(disk, Access::kWrite);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    volume_->SetModifyDate(7);
    FailNext(&DeviceFaults::failRead, &DeviceFaults::reads, EIO);
    EXPECT_EQ(kErrVolumeIo, volume_->Commit(0));
    EXPECT_EQ("write error at 0x400 (volume): Input/output error", volume_->LastIoProblem().Text());
    EXPECT_EQ(disk, Medium());
    EXPECT_TRUE(volume_->IsWritable());
    volume_->SetModifyDate(7);
    ASSERT_EQ(0, volume_->Commit(0));
    ASSERT_EQ(0, volume_->Close());
    const Bytes after = Medium();
    EXPECT_EQ(7u, test::Get32(after, 100 + 1024 + 20));
    EXPECT_EQ(Bytes(100, 0x5A), Bytes(after.begin(), after.begin() + 100));
    EXPECT_EQ(Bytes(1000, 0x5A), Bytes(after.end() - 1000, after.end()));
}

// A block asked for twice before it is handed over counts once.
TEST_F(Volume, ThePermissionToChangeABlockIsCountedOnce) {
    FormatOptions format;
    format.blockSize = 512;
    format.catalogNodeSize = 512;
    format.extentsNodeSize = 512;
    format.journalSize = 32 << 10;
    format.withAttributes = false;
    volume_ = MakeMemoryVolume(1 << 20, format, &problem_);
    ASSERT_NE(nullptr, volume_) << problem_.Text();
    CBTreeHfs* tree = volume_->Tree(kCatalogFileId, &problem_);
    CFileSystemHfs* fs = volume_->Fs();
    HfsBcbBuf buf{};
    ASSERT_EQ(0, fs->service.ops->Map(fs->service.self, fs, &tree->runs, nullptr, 0, kCatalogFileId,
                                      512, 512, false, &buf));
    const auto ask = [&] { return fs->journal.ops->GetWriteAccess(fs->journal.self, buf.bh); };
    for (u32 i = 0; i < 100; ++i) {
        ASSERT_EQ(0, ask());
    }
    EXPECT_FALSE(volume_->IsCommitDue());
    u32 grants = 0;
    while (!volume_->IsCommitDue()) {
        ASSERT_EQ(0, fs->service.ops->DirtyMeta(fs->service.self, fs, buf.bh));
        ASSERT_EQ(0, ask());
        ASSERT_LT(++grants, 64u);
    }
    EXPECT_GT(grants, 10u);
    fs->cache.Release(buf.bh, 0);
    volume_->Restore();
    EXPECT_FALSE(volume_->IsCommitDue());
}

// --- ways to the medium --------------------------------------------------------------------------

TEST(Transactions, NeighboursGoInPiecesOfAMegabyte) {
    MemoryDevice home(8 << 20);
    std::vector<test::DeviceEvent> log;
    test::RecordingDevice recorder(&home, &log);
    Transaction transaction(&recorder);
    const Bytes bytes = test::Pattern((5 << 20) / 2, 1);
    ASSERT_TRUE(transaction.Staged()->Write(4096, bytes.data(), bytes.size()).Ok());
    EXPECT_EQ(nullptr, transaction.Staged()->PageAt(0));
    ASSERT_NE(nullptr, transaction.Staged()->PageAt(1));
    ASSERT_TRUE(transaction.Commit().Ok());
    ASSERT_EQ(4u, log.size());
    u64 next = 4096;
    for (u32 i = 0; i < 3; ++i) {
        EXPECT_EQ(next, log[i].offset);
        EXPECT_EQ(i < 2 ? u64{1} << 20 : u64{1} << 19, log[i].bytes.size());
        next += log[i].bytes.size();
    }
    EXPECT_TRUE(log[3].isSync);
    Bytes found(bytes.size());
    ASSERT_TRUE(home.Read(4096, found.data(), found.size()).Ok());
    EXPECT_EQ(bytes, found);
}

TEST(Transactions, EachWriteOfALargeOneFailsInTurn) {
    for (u32 nth = 1; nth <= 3; ++nth) {
        MemoryDevice home(8 << 20);
        DeviceFaults faults;
        faults.failWrite = nth;
        test::FaultyDevice faulty(&home, &faults);
        Transaction transaction(&faulty);
        const Bytes bytes = test::Pattern((5 << 20) / 2, 1);
        ASSERT_TRUE(transaction.Staged()->Write(0, bytes.data(), bytes.size()).Ok());
        const IoResult result = transaction.Commit();
        EXPECT_EQ(EIO, result.error);
        EXPECT_EQ(u64{nth - 1} << 20, result.offset);
        EXPECT_EQ(nth, faults.writes);
        EXPECT_FALSE(transaction.IsEmpty());  // what was staged is still there
    }
}

// A header that does not begin with a sector of the image: what stands beside it in the same
// sectors is carried too, and of the header itself only the clean bit changes.
TEST(Transactions, TheHeaderGoesLastWhereverItLies) {
    for (const u64 at : {u64{1024}, u64{1124}, u64{4096 - 300}}) {
        for (u32 nth = 1;; ++nth) {
            MemoryDevice home(16384);
            Bytes before = test::Pattern(16384, 3);
            before[static_cast<std::size_t>(at) + 6] |= 1;  // unmounted cleanly
            ASSERT_TRUE(home.Write(0, before.data(), before.size()).Ok());
            DeviceFaults faults;
            faults.failWrite = nth;
            test::FaultyDevice faulty(&home, &faults);
            OverlayDevice staged(&faulty);
            Bytes expected = before;
            const Bytes change = test::Pattern(8192, 9);
            std::copy(change.begin(), change.end(), expected.begin() + 512);
            ASSERT_TRUE(staged.Write(512, change.data(), change.size()).Ok());
            expected[static_cast<std::size_t>(at) + 6] |= 1;
            HeaderLastSink sink(at);
            u64 written = 0;
            const IoResult result = sink.Carry(staged, &faulty, &written);
            Bytes after(16384);
            ASSERT_TRUE(home.Read(0, after.data(), after.size()).Ok());
            if (!faults.hasFailed) {
                EXPECT_TRUE(result.Ok());
                EXPECT_EQ(expected, after) << at;
                EXPECT_GT(nth, 3u);
                break;
            }
            EXPECT_EQ(EIO, result.error);
            // Nothing was written, or the volume says that it is in use.
            const bool isClean = (after[static_cast<std::size_t>(at) + 6] & 1) != 0;
            EXPECT_EQ(nth == 1, isClean) << at << " " << nth;
            EXPECT_TRUE(nth > 1 || before == after);
        }
    }
}

}  // namespace
}  // namespace VELK
