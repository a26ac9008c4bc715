// Devices against a plain array of bytes; what a failing device does to a volume above it.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <fstream>
#include <random>

#include "capture.h"
#include "disk_builder.h"
#include "hfs/volume/make_volume.h"
#include "hfs/volume/transaction.h"

namespace VELK {
namespace {

using test::Bytes;

// Runs random reads, writes and zero-fills over `device` and an array that starts as `model`.
void CompareWithModel(BlockDevice* device, Bytes model) {
    std::mt19937 random(7);
    for (u32 i = 0; i < 3000; ++i) {
        const u64 offset = random() % model.size();
        const u64 size =
            std::min<u64>(random() % (i % 7 == 0 ? 150000 : 3000), model.size() - offset);
        const auto at = model.begin() + static_cast<std::ptrdiff_t>(offset);
        switch (random() % 4) {
            case 0: {
                const Bytes bytes = test::Pattern(static_cast<std::size_t>(size), i);
                ASSERT_TRUE(device->Write(offset, bytes.data(), bytes.size()).Ok());
                std::copy(bytes.begin(), bytes.end(), at);
                break;
            }
            case 1:
                ASSERT_TRUE(device->Zero(offset, size).Ok());
                std::fill_n(at, size, u8{0});
                break;
            default: {
                Bytes bytes(static_cast<std::size_t>(size));
                ASSERT_TRUE(device->Read(offset, bytes.data(), bytes.size()).Ok());
                ASSERT_TRUE(std::equal(bytes.begin(), bytes.end(), at)) << i;
            }
        }
    }
    u8 byte = 0;
    EXPECT_EQ(kIoPastEnd, device->Read(model.size(), &byte, 1).error);
    EXPECT_EQ(kIoPastEnd, device->Write(model.size() - 1, "ab", 2).error);
    EXPECT_EQ(kIoPastEnd, device->Zero(~u64{0}, 2).error);
}

TEST(Devices, MemoryEqualsTheModel) {
    MemoryDevice device(300001);
    CompareWithModel(&device, Bytes(300001));
}

TEST(Devices, SliceEqualsTheModelAndStaysInside) {
    MemoryDevice device(400000);
    SliceDevice slice(&device, 4321, 300001);
    CompareWithModel(&slice, Bytes(300001));
    u8 bytes[2] = {1, 1};
    ASSERT_TRUE(device.Read(4320, bytes, 1).Ok());
    ASSERT_TRUE(device.Read(4321 + 300001, bytes + 1, 1).Ok());
    EXPECT_EQ(0, bytes[0] + bytes[1]);
}

TEST(Devices, OverlayEqualsTheModelAndSparesItsBase) {
    MemoryDevice base(300001);
    const Bytes content = test::Pattern(300001, 3);
    ASSERT_TRUE(base.Write(0, content.data(), content.size()).Ok());
    OverlayDevice overlay(&base);
    CompareWithModel(&overlay, content);
    Bytes after(300001);
    ASSERT_TRUE(base.Read(0, after.data(), after.size()).Ok());
    EXPECT_EQ(content, after);
    overlay.Drop();
    ASSERT_TRUE(overlay.Read(0, after.data(), after.size()).Ok());
    EXPECT_EQ(content, after);
}

TEST(Devices, FileEqualsTheModel) {
    const std::string path = testing::TempDir() + "device_test.img";
    Problem problem;
    auto device = FileDevice::Open(path, FileDevice::Mode::kCreate, 300001, &problem);
    ASSERT_NE(nullptr, device) << problem.Text();
    CompareWithModel(device.get(), Bytes(300001));
    EXPECT_TRUE(device->Sync().Ok());
    device = FileDevice::Open(path, FileDevice::Mode::kRead, 0, &problem);
    ASSERT_NE(nullptr, device) << problem.Text();
    EXPECT_EQ(300001u, device->Size());
    EXPECT_EQ(kIoReadOnly, device->Write(0, "a", 1).error);
    std::remove(path.c_str());
}

TEST(Devices, AFileOpenForWritingIsOursAlone) {
    const std::string path = testing::TempDir() + "claimed_test.img";
    Problem problem;
    auto first = FileDevice::Open(path, FileDevice::Mode::kCreate, 4096, &problem);
    ASSERT_NE(nullptr, first) << problem.Text();
    ASSERT_TRUE(first->Write(0, "kept", 4).Ok());
    EXPECT_EQ(nullptr, FileDevice::Open(path, FileDevice::Mode::kReadWrite, 0, &problem));
    EXPECT_EQ("another process has it open for writing", problem.Text());
    EXPECT_EQ(nullptr, FileDevice::Open(path, FileDevice::Mode::kCreate, 8192, &problem));
    auto reader = FileDevice::Open(path, FileDevice::Mode::kRead, 0, &problem);
    ASSERT_NE(nullptr, reader) << problem.Text();
    u8 bytes[4];
    ASSERT_TRUE(reader->Read(0, bytes, 4).Ok());
    EXPECT_EQ('k', bytes[0]);
    EXPECT_EQ(4096u, reader->Size());
    std::remove(path.c_str());
}

timespec TimeOfAccess(const std::string& path) {
    struct stat info {};
    EXPECT_EQ(0, stat(path.c_str(), &info));
    return info.st_atim;
}

// Who images a disk for evidence wants the file to be as it was, its time of access included.
TEST(Devices, ReadingLeavesTheTimeOfAccess) {
    const std::string path = testing::TempDir() + "access_test.img";
    Problem problem;
    ASSERT_NE(nullptr, FileDevice::Open(path, FileDevice::Mode::kCreate, 4096, &problem));
    constexpr timespec kOld[2] = {{1'000'000'000, 5}, {1'000'000'000, 7}};  // of access, of change
    ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), kOld, 0));
    auto device = FileDevice::Open(path, FileDevice::Mode::kRead, 0, &problem);
    ASSERT_NE(nullptr, device) << problem.Text();
    u8 bytes[512];
    ASSERT_TRUE(device->Read(0, bytes, sizeof bytes).Ok());
    EXPECT_EQ(kOld[0].tv_sec, TimeOfAccess(path).tv_sec);
    EXPECT_EQ(kOld[0].tv_nsec, TimeOfAccess(path).tv_nsec);

    std::ifstream(path, std::ios::binary).read(reinterpret_cast<char*>(bytes), sizeof bytes);
    const bool isKept = TimeOfAccess(path).tv_sec == kOld[0].tv_sec;
    std::remove(path.c_str());
    if (isKept) {
        GTEST_SKIP() << "this file system keeps no times of access";
    }
}

// That is for a file's owner only; everybody else reads it all the same.
TEST(Devices, AFileOfSomebodyElseIsRead) {
    constexpr uid_t kNobody = 65534;
    const uid_t own = geteuid();
    if (own == 0) {
        ASSERT_EQ(0, seteuid(kNobody));
    }
    Problem problem;
    const auto device = FileDevice::Open("/etc/passwd", FileDevice::Mode::kRead, 0, &problem);
    ASSERT_EQ(0, seteuid(own));
    ASSERT_NE(nullptr, device) << problem.Text();
    u8 byte = 0;
    EXPECT_TRUE(device->Read(0, &byte, 1).Ok());
}

// A file that is cut short while it is open gives an error, not a fault.
TEST(Devices, ShrinkingFileIsAnError) {
    const std::string path = testing::TempDir() + "shrinking_test.img";
    Problem problem;
    auto device = FileDevice::Open(path, FileDevice::Mode::kCreate, 100000, &problem);
    ASSERT_NE(nullptr, device) << problem.Text();
    ASSERT_EQ(0, truncate(path.c_str(), 5000));
    u8 bytes[100];
    EXPECT_EQ(kIoPastEnd, device->Read(4950, bytes, 100).error);
    EXPECT_TRUE(device->Read(4900, bytes, 100).Ok());
    std::remove(path.c_str());
}

// Fails transfers that touch a chosen byte.
class FaultyDevice : public BlockDevice {
public:
    explicit FaultyDevice(const Bytes& bytes) : inner_(test::DeviceOf(bytes)) {}
    u64 Size() const override { return inner_->Size(); }
    bool IsWritable() const override { return true; }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override {
        return Hits(readFault, offset, bytes) ? IoResult{EIO, *readFault}
                                              : inner_->Read(offset, target, bytes);
    }
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override {
        return Hits(writeFault, offset, bytes) ? IoResult{ENOSPC, *writeFault}
                                               : inner_->Write(offset, source, bytes);
    }
    IoResult Sync() override { return {syncFault, 0}; }

    std::optional<u64> readFault;
    std::optional<u64> writeFault;
    int syncFault = 0;

private:
    static bool Hits(const std::optional<u64>& at, u64 offset, std::size_t bytes) {
        return at && *at >= offset && *at < offset + bytes;
    }
    std::unique_ptr<BlockDevice> inner_;
};

class FaultyVolume : public testing::Test {
protected:
    void Open(Access access) {
        const test::DiskVolume shape;
        auto device = std::make_unique<FaultyDevice>(shape.Build());
        device_ = device.get();
        catalog_ = test::CatalogOffset(shape);
        OpenOptions options;
        options.access = access;
        volume_ = ImageVolume::Open(std::move(device), options, nullptr, &problem_);
        ASSERT_NE(nullptr, volume_) << problem_.Text();
    }
    test::Capture capture_;
    Problem problem_;
    FaultyDevice* device_ = nullptr;
    u64 catalog_ = 0;
    std::unique_ptr<ImageVolume> volume_;
};

TEST_F(FaultyVolume, ReadErrorNamesOffsetNodeAndCause) {
    Open(Access::kReadOnly);
    CBTreeHfs* tree = volume_->Tree(kCatalogFileId, &problem_);
    ASSERT_NE(nullptr, tree);
    device_->readFault = catalog_ + 4096;
    HfsNode* node = nullptr;
    EXPECT_EQ(kErrVolumeIo, tree->GetINode(1, &node, false));
    EXPECT_EQ("read error at 0x3000 (catalog node 1): Input/output error",
              volume_->LastIoProblem().Text());
    EXPECT_EQ(1u, *volume_->LastIoProblem().node);
    device_->readFault.reset();
    EXPECT_EQ(0, tree->GetINode(1, &node, false));
    tree->PutINode(node, false);
}

TEST_F(FaultyVolume, TreeWhoseHeaderCannotBeReadSaysSo) {
    Open(Access::kReadOnly);
    device_->readFault = catalog_ + 100;
    EXPECT_EQ(nullptr, volume_->Tree(kCatalogFileId, &problem_));
    EXPECT_EQ("catalog tree: read error at 0x2064 (catalog file): Input/output error",
              problem_.Text());
}

TEST_F(FaultyVolume, CommitThatCannotBeWrittenMakesTheVolumeReadOnly) {
    Open(Access::kWrite);
    device_->writeFault = 1024;
    volume_->CountCatalogRecord(2, 100, 1);
    EXPECT_EQ(kErrVolumeIo, volume_->Commit(0));
    EXPECT_FALSE(volume_->IsWritable());
    EXPECT_EQ(kErrVolumeReadOnly, volume_->Commit(0));
}

TEST_F(FaultyVolume, FailedSyncMakesTheVolumeReadOnly) {
    Open(Access::kWrite);
    device_->syncFault = EIO;
    volume_->CountCatalogRecord(2, 100, 1);
    EXPECT_EQ(kErrVolumeIo, volume_->Commit(0));
    EXPECT_FALSE(volume_->IsWritable());
}

// Only the sectors that changed are written, neighbours in one write.
TEST(TransactionTest, CarriesExactlyTheChangedSectors) {
    class Counter : public MemoryDevice {
    public:
        using MemoryDevice::MemoryDevice;
        IoResult Write(u64 offset, const void* source, std::size_t bytes) override {
            writes.push_back({offset, bytes});
            return MemoryDevice::Write(offset, source, bytes);
        }
        std::vector<std::pair<u64, std::size_t>> writes;
    };
    Counter home(1 << 20);
    Transaction transaction(&home);
    const Bytes bytes = test::Pattern(5000, 1);
    ASSERT_TRUE(transaction.Staged()->Write(700, bytes.data(), 100).Ok());
    ASSERT_TRUE(transaction.Staged()->Write(9000, bytes.data(), 5000).Ok());
    EXPECT_TRUE(home.writes.empty());
    ASSERT_TRUE(transaction.Commit().Ok());
    ASSERT_EQ(2u, home.writes.size());
    EXPECT_EQ(std::make_pair(u64{512}, std::size_t{512}), home.writes[0]);
    EXPECT_EQ(std::make_pair(u64{8704}, std::size_t{5632}), home.writes[1]);
    EXPECT_TRUE(transaction.IsEmpty());
    EXPECT_EQ(512u + 5632u, transaction.BytesWritten());
}

TEST(Texts, HaveAnyLength) {
    const std::string longText(5000, 'x');
    EXPECT_EQ(longText + " 7", Format("%s %d", longText.c_str(), 7));
    EXPECT_EQ("", Format("%s", ""));
}

TEST(Texts, EachErrorOfADeviceHasOne) {
    EXPECT_EQ("past the end", IoErrorText(kIoPastEnd));
    EXPECT_EQ("device is read-only", IoErrorText(kIoReadOnly));
    EXPECT_EQ("out of memory", IoErrorText(kIoNoMemory));
    EXPECT_EQ("more changes than the journal holds", IoErrorText(kIoTooLarge));
    EXPECT_EQ("Input/output error", IoErrorText(EIO));
}

}  // namespace
}  // namespace VELK
