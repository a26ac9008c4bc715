// Failures of the host under a mounted volume: every read, write and sync fails in turn, files
// become shorter, calls are interrupted. What a commit promised stands, the volume says what went
// wrong and takes no more changes.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

#include "capture.h"
#include "hfs/volume/wire.h"
#include "recording_device.h"
#include "small_volume.h"

namespace VELK {
namespace {

using test::BytesOf;
using test::DeviceFaults;
using test::DeviceWith;
using test::Essence;
using test::InsertNumber;
using test::MountOn;
using test::SmallFormat;
using test::Writing;

constexpr u64 kSize = 192 << 10;
constexpr u32 kCommits = 4;

// A volume that takes one record with each commit, until something fails.
struct Outcome {
    bool mounted = false;
    u32 committed = 0;  // commits that returned 0
    int status = 0;     // the first that was not
    std::string text;
    bool isWritable = false;
    int close = 0;
};

Outcome Work(BlockDevice* device, DeviceFaults* faults) {
    test::FaultyDevice faulty(device, faults);
    Outcome outcome;
    Problem problem;
    auto volume = MountOn(&faulty, Writing(), &problem);
    outcome.mounted = volume != nullptr;
    outcome.text = problem.Text();
    for (u32 i = 0; i < kCommits && volume && outcome.status == 0; ++i) {
        outcome.status = volume->Tree(kCatalogFileId, nullptr) == nullptr
                             ? kErrVolumeIo
                             : InsertNumber(volume.get(), 100 + i);
        if (outcome.status != 0) {
            outcome.text = volume->LastIoProblem().Text();
            volume->Restore();
            break;
        }
        outcome.status = volume->Commit(0);
        outcome.text = volume->LastIoProblem().Text();
        outcome.committed += outcome.status == 0 ? 1u : 0u;
    }
    if (volume) {
        outcome.isWritable = volume->IsWritable();
        if (outcome.status != 0 && !outcome.isWritable) {
            EXPECT_EQ(kErrVolumeReadOnly, volume->Commit(0));
        }
        outcome.close = volume->Close();
    }
    return outcome;
}

class HostFailures : public testing::TestWithParam<u64> {
protected:
    void SetUp() override {
        auto fresh = test::FreshDevice(kSize, SmallFormat(GetParam()));
        start_ = BytesOf(fresh.get());
        if (GetParam() != 0) {
            place_ = test::JournalOf(fresh.get());
        }
        // What stands after each commit.
        for (u32 commits = 0; commits <= kCommits; ++commits) {
            auto device = DeviceWith(start_);
            Problem problem;
            auto volume = MountOn(device.get(), Writing(), &problem);
            for (u32 i = 0; i < commits; ++i) {
                ASSERT_EQ(0, InsertNumber(volume.get(), 100 + i));
                ASSERT_EQ(0, volume->Commit(0));
            }
            volume.reset();
            stands_.push_back(Essence(BytesOf(device.get()), place_));
        }
    }

    // Mounts what a failed run left: with a journal it is what the last commit that returned left,
    // or the one that was under way.
    void JudgeMedium(BlockDevice* device, const Outcome& outcome, u32 nth) {
        Problem problem;
        const bool isClean =
            (Be32(BytesOf(device).data() + kHeaderOffset + 4) & kVolUnmounted) != 0;
        auto volume = MountOn(device, Writing(), &problem);
        if (GetParam() == 0 && !isClean) {
            ASSERT_EQ(nullptr, volume);
            return;
        }
        ASSERT_NE(nullptr, volume) << problem.Text() << " " << nth;
        volume.reset();
        const std::vector<u8> found = Essence(BytesOf(device), place_);
        const u32 next = std::min(outcome.committed + 1, kCommits);
        ASSERT_TRUE(found == stands_[outcome.committed] || found == stands_[next]) << nth;
        ASSERT_EQ("", test::CheckAll(device));
    }

    void FailInTurn(u32 DeviceFaults::*which, const DeviceFaults& kind, bool endsWriting) {
        u32 failures = 0;
        for (u32 nth = 1;; ++nth) {
            DeviceFaults faults = kind;
            faults.*which = nth;
            auto device = DeviceWith(start_);
            const Outcome outcome = Work(device.get(), &faults);
            if (!faults.hasFailed) {
                ASSERT_EQ(kCommits, outcome.committed);
                ASSERT_EQ(stands_[kCommits], Essence(BytesOf(device.get()), place_));
                break;
            }
            failures += 1;
            if (endsWriting && outcome.status != 0) {
                ASSERT_FALSE(outcome.isWritable) << nth;
            }
            ASSERT_EQ(0u, faults.changesAfterFailure) << nth;
            ASSERT_TRUE(!outcome.mounted || outcome.status != 0 || outcome.close != 0 ||
                        outcome.committed == kCommits)
                << nth;
            if (outcome.status != 0 || outcome.close != 0 || !outcome.mounted) {
                JudgeMedium(device.get(), outcome, nth);
            }
            ASSERT_FALSE(HasFailure()) << nth;
        }
        EXPECT_GT(failures, 8u);
    }

    test::Capture capture_;
    std::vector<u8> start_;
    JournalPlace place_;
    std::vector<std::vector<u8>> stands_;
};

TEST_P(HostFailures, EachWriteInTurn) {
    for (const bool forEver : {false, true}) {
        for (const bool part : {false, true}) {
            DeviceFaults kind;
            kind.error = ENOSPC;
            kind.forEver = forEver;
            kind.writesPart = part;
            FailInTurn(&DeviceFaults::failWrite, kind, true);
        }
    }
}

TEST_P(HostFailures, EachSyncInTurn) {
    for (const bool forEver : {false, true}) {
        DeviceFaults kind;
        kind.forEver = forEver;
        FailInTurn(&DeviceFaults::failSync, kind, true);
    }
}

TEST_P(HostFailures, EachReadInTurn) {
    for (const bool forEver : {false, true}) {
        DeviceFaults kind;
        kind.forEver = forEver;
        FailInTurn(&DeviceFaults::failRead, kind, false);
    }
}

TEST_P(HostFailures, TheVolumeSaysWhatFailed) {
    DeviceFaults faults;
    faults.error = ENOSPC;
    faults.failWrite = 1;
    auto device = DeviceWith(start_);
    const Outcome outcome = Work(device.get(), &faults);
    EXPECT_EQ(kErrVolumeIo, outcome.status);
    EXPECT_EQ(0u, outcome.text.find("write error at 0x")) << outcome.text;
    EXPECT_NE(std::string::npos, outcome.text.find("No space left on device")) << outcome.text;
    EXPECT_FALSE(outcome.isWritable);
}

INSTANTIATE_TEST_SUITE_P(Journals, HostFailures, testing::Values(u64{0}, u64{32} << 10));

// Failures while the journal is carried out: the mount fails, the next one gives what it would
// have.
TEST(ReplayFailures, EachTransferInTurn) {
    test::Capture capture;
    auto device = test::FreshDevice(kSize, SmallFormat(32 << 10));
    const JournalPlace place = test::JournalOf(device.get());
    Problem problem;
    auto volume = MountOn(device.get(), Writing(), &problem);
    const std::vector<u8> before = BytesOf(device.get());
    ASSERT_EQ(0, InsertNumber(volume.get(), 100));
    ASSERT_EQ(0, volume->Commit(0));
    const std::vector<u8> after = BytesOf(device.get());
    volume.reset();
    // The ring and the volume header as after the commit, everything else as before it.
    std::vector<u8> cut = before;
    const auto at = static_cast<std::ptrdiff_t>(place.offset);
    std::copy_n(after.begin() + at, place.size, cut.begin() + at);
    std::copy_n(after.begin() + kHeaderOffset, kHeaderSize, cut.begin() + kHeaderOffset);
    for (u32 DeviceFaults::*which :
         {&DeviceFaults::failRead, &DeviceFaults::failWrite, &DeviceFaults::failSync}) {
        u32 failures = 0;
        for (u32 nth = 1;; ++nth) {
            DeviceFaults faults;
            faults.*which = nth;
            faults.writesPart = true;
            device = DeviceWith(cut);
            test::FaultyDevice faulty(device.get(), &faults);
            volume = MountOn(&faulty, Writing(), &problem);
            if (!faults.hasFailed) {
                ASSERT_NE(nullptr, volume);
                volume.reset();  // before the device goes
                break;
            }
            failures += volume == nullptr ? 1u : 0u;
            ASSERT_TRUE(volume == nullptr || which == &DeviceFaults::failRead);
            volume.reset();
            volume = MountOn(device.get(), Writing(), &problem);
            ASSERT_NE(nullptr, volume) << problem.Text();
            volume.reset();
            ASSERT_EQ(Essence(after, place), Essence(BytesOf(device.get()), place)) << nth;
        }
        EXPECT_GE(failures, 2u);
    }
}

// A place that cannot be read is not one where nothing is: who writes then would leave an alternate
// header as it was, or take a journal for broken.
TEST(MountingFailures, AReadErrorAnywhereKeepsFromWriting) {
    test::Capture capture;
    auto device = test::FreshDevice(kSize, SmallFormat(32 << 10));
    const std::vector<u8> before = BytesOf(device.get());
    const std::string ofAlternate =
        "read error at 0x2fc00: Input/output error: the volume can only be read";
    u32 failures = 0;
    u32 alternates = 0;
    for (u32 nth = 1;; ++nth) {
        const auto mount = [&](const OpenOptions& options, Problem* problem) {
            DeviceFaults faults;
            faults.failRead = nth;
            test::FaultyDevice faulty(device.get(), &faults);
            const auto volume = MountOn(&faulty, options, problem);
            failures += faults.hasFailed ? 1u : 0u;
            return volume != nullptr;
        };
        Problem problem;
        const u32 failuresBefore = failures;
        const bool isMounted = mount(Writing(), &problem);
        if (failures == failuresBefore) {
            EXPECT_TRUE(isMounted) << problem.Text();
            break;
        }
        ASSERT_FALSE(isMounted) << nth;
        ASSERT_EQ(kErrVolumeIo, problem.status) << problem.Text();
        ASSERT_EQ("read error at 0x", problem.what.substr(0, 16)) << nth;
        ASSERT_EQ(before, BytesOf(device.get())) << nth;
        if (problem.Text() == ofAlternate) {
            alternates += 1;
            EXPECT_TRUE(mount(OpenOptions{}, &problem)) << problem.Text();
            EXPECT_TRUE(mount(Writing(true), &problem)) << problem.Text();
            ASSERT_TRUE(device->Write(0, before.data(), before.size()).Ok());
        }
    }
    EXPECT_GE(failures, 8u);
    EXPECT_EQ(1u, alternates);
}

// --- files of the host ---------------------------------------------------------------------------

class HostFile : public testing::Test {
protected:
    void SetUp() override {
        const char* folder = std::getenv("TMPDIR");
        path_ = std::string(folder != nullptr ? folder : "/tmp") + "/treehfs_host_XXXXXX";
        const int handle = mkstemp(path_.data());
        ASSERT_GE(handle, 0);
        close(handle);
        Problem problem;
        auto device = FileDevice::Open(path_, FileDevice::Mode::kCreate, kSize, &problem);
        ASSERT_NE(nullptr, device) << problem.Text();
        ASSERT_NE(nullptr, MakeVolume(std::move(device), SmallFormat(32 << 10), &problem))
            << problem.Text();
    }
    void TearDown() override {
        FileDevice::SetHostCalls(nullptr);
        unlink(path_.c_str());
    }
    u64 FileSize() const {
        const int handle = open(path_.c_str(), O_RDONLY);
        const off_t size = lseek(handle, 0, SEEK_END);
        close(handle);
        return static_cast<u64>(size);
    }
    std::unique_ptr<ImageVolume> Mount() {
        return ImageVolume::OpenFile(path_, Writing(), nullptr, &problem_);
    }

    test::Capture capture_;
    std::string path_;
    Problem problem_;
};

u32 g_calls = 0;
u32 g_syncs = 0;
int g_syncError = 0;

// Every other call is interrupted, the others move at most 100 bytes.
ssize_t ShortRead(int handle, void* target, std::size_t bytes, off_t offset) {
    errno = EINTR;
    return ++g_calls % 2 == 0 ? -1
                              : pread(handle, target, std::min<std::size_t>(bytes, 100), offset);
}
ssize_t ShortWrite(int handle, const void* source, std::size_t bytes, off_t offset) {
    errno = EINTR;
    return ++g_calls % 2 == 0 ? -1
                              : pwrite(handle, source, std::min<std::size_t>(bytes, 100), offset);
}
int InterruptedSync(int) {
    errno = EINTR;
    return ++g_syncs % 2 != 0 ? -1 : 0;
}
int FailingSync(int) {
    errno = g_syncError;
    return ++g_syncs == 1 ? -1 : 0;
}

TEST_F(HostFile, ShortAndInterruptedCallsAreTakenUpAgain) {
    auto volume = Mount();
    ASSERT_NE(nullptr, volume) << problem_.Text();
    const HostCalls calls = {ShortRead, ShortWrite, InterruptedSync};
    FileDevice::SetHostCalls(&calls);
    g_calls = 0;
    for (u32 i = 0; i < 5; ++i) {
        ASSERT_EQ(0, InsertNumber(volume.get(), 100 + i));
        ASSERT_EQ(0, volume->Commit(0));
    }
    EXPECT_GT(g_calls, 100u);
    EXPECT_GE(g_syncs, 20u);
    ASSERT_EQ(0, volume->Close());
    volume.reset();
    volume = Mount();
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_TRUE(test::HasNumber(volume.get(), 104));
}

TEST_F(HostFile, TheFirstFailingSyncIsFinal) {
    Problem problem;
    auto device = FileDevice::Open(path_, FileDevice::Mode::kReadWrite, 0, &problem);
    ASSERT_NE(nullptr, device);
    const HostCalls calls = {pread, pwrite, FailingSync};
    FileDevice::SetHostCalls(&calls);
    g_syncs = 0;
    g_syncError = EIO;
    const u8 bytes[512] = {1};
    ASSERT_TRUE(device->Write(0, bytes, sizeof bytes).Ok());
    EXPECT_EQ(EIO, device->Sync().error);
    EXPECT_EQ(EIO, device->Sync().error);
    EXPECT_EQ(EIO, device->Write(0, bytes, sizeof bytes).error);
    EXPECT_EQ(1u, g_syncs);
    u8 again[512];
    EXPECT_TRUE(device->Read(0, again, sizeof again).Ok());
}

TEST_F(HostFile, AFileThatBecomesShorterTakesNoMoreChanges) {
    auto volume = Mount();
    ASSERT_NE(nullptr, volume) << problem_.Text();
    ASSERT_EQ(0, InsertNumber(volume.get(), 100));
    ASSERT_EQ(0, volume->Commit(0));
    ASSERT_EQ(0, truncate(path_.c_str(), 100 << 10));
    ASSERT_EQ(0, InsertNumber(volume.get(), 101));
    EXPECT_EQ(kErrVolumeTruncated, volume->Commit(0));
    EXPECT_EQ(0u, volume->LastIoProblem().what.find("image ends at 102,400"))
        << volume->LastIoProblem().what;
    EXPECT_FALSE(volume->IsWritable());
    volume.reset();
    EXPECT_EQ(u64{100} << 10, FileSize());
}

}  // namespace
}  // namespace VELK
