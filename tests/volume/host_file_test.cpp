// Files of the host: opened, made and refused by name, and what failing calls of the host come to.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>

#include "hfs/volume/block_device.h"
#include "image_bytes.h"

namespace VELK {
namespace {

using Mode = FileDevice::Mode;

// What the host's calls do next: move nothing, fail with this error, or what they always do.
int g_error = 0;
bool g_movesNothing = false;

ssize_t FailingRead(int handle, void* target, std::size_t bytes, off_t offset) {
    errno = g_error;
    return g_error != 0 ? -1 : pread(handle, target, bytes, offset);
}
ssize_t FailingWrite(int handle, const void* source, std::size_t bytes, off_t offset) {
    errno = g_error;
    if (g_movesNothing) {
        return 0;
    }
    return g_error != 0 ? -1 : pwrite(handle, source, bytes, offset);
}

class HostFiles : public testing::Test {
protected:
    void SetUp() override {
        folder_ = testing::TempDir() + "treehfs_host_files_" + std::to_string(getpid());
        std::filesystem::remove_all(folder_);
        std::filesystem::create_directories(folder_);
        path_ = folder_ + "/disk.img";
        g_error = 0;
        g_movesNothing = false;
    }
    void TearDown() override {
        FileDevice::SetHostCalls(nullptr);
        std::filesystem::remove_all(folder_);
    }
    std::unique_ptr<FileDevice> Open(const std::string& path, Mode mode, u64 size = 0) {
        return FileDevice::Open(path, mode, size, &problem_);
    }
    std::string Refusal(const std::string& path, Mode mode, u64 size = 0) {
        EXPECT_EQ(nullptr, Open(path, mode, size));
        return problem_.Text();
    }

    std::string folder_;
    std::string path_;
    Problem problem_;
};

TEST_F(HostFiles, WhatCannotBeOpenedIsToldApart) {
    std::ofstream(path_) << "file";
    EXPECT_EQ("cannot open: no such file", Refusal(folder_ + "/none", Mode::kRead));
    EXPECT_EQ("cannot open: no such file", Refusal(folder_ + "/none", Mode::kReadWrite));
    EXPECT_EQ("cannot open: no such file", Refusal(folder_ + "/none/x", Mode::kCreate, 512));
    EXPECT_EQ("cannot open: not a directory", Refusal(path_ + "/x", Mode::kRead));
    for (const Mode mode : {Mode::kRead, Mode::kReadWrite, Mode::kCreate}) {
        EXPECT_EQ("is a folder: name an image file or a block device", Refusal(folder_, mode));
    }
    EXPECT_EQ("is neither a file nor a block device: name an image file",
              Refusal("/dev/null", Mode::kReadWrite));
}

TEST_F(HostFiles, ASizeNoFileCanHave) {
    EXPECT_EQ("cannot set the size: Invalid argument", Refusal(path_, Mode::kCreate, u64{1} << 63));
}

TEST_F(HostFiles, AFileIsMadeWhereTheProcessStands) {
    const std::filesystem::path before = std::filesystem::current_path();
    std::filesystem::current_path(folder_);
    EXPECT_NE(nullptr, Open("plain.img", Mode::kCreate, 1000)) << problem_.Text();
    std::filesystem::current_path(before);
    EXPECT_EQ(1000u, std::filesystem::file_size(folder_ + "/plain.img"));
}

// A folder that lets files be made but not be listed: its own entry cannot be synced.
TEST_F(HostFiles, AFileIsMadeInAFolderThatCannotBeRead) {
    constexpr uid_t kNobody = 65534;
    ASSERT_EQ(0, chmod(folder_.c_str(), 0333));
    const bool wasRoot = geteuid() == 0;
    if (wasRoot) {
        ASSERT_EQ(0, seteuid(kNobody));
    }
    const auto device = Open(path_, Mode::kCreate, 1000);
    if (wasRoot) {
        ASSERT_EQ(0, seteuid(0));
    }
    ASSERT_EQ(0, chmod(folder_.c_str(), 0755));
    EXPECT_NE(nullptr, device) << problem_.Text();
    EXPECT_EQ(1000u, std::filesystem::file_size(path_));
}

TEST_F(HostFiles, ALargeWriteArrivesWhole) {
    auto device = Open(path_, Mode::kCreate, 1 << 20);
    ASSERT_NE(nullptr, device) << problem_.Text();
    const test::Bytes bytes = test::Pattern(600000, 9);
    ASSERT_TRUE(device->Write(1000, bytes.data(), bytes.size()).Ok());
    ASSERT_TRUE(device->Sync().Ok());
    test::Bytes found(bytes.size());
    ASSERT_TRUE(device->Read(1000, found.data(), found.size()).Ok());
    EXPECT_EQ(bytes, found);
}

TEST_F(HostFiles, AReaderHasNothingToSync) {
    ASSERT_NE(nullptr, Open(path_, Mode::kCreate, 4096)) << problem_.Text();
    auto reader = Open(path_, Mode::kRead);
    ASSERT_NE(nullptr, reader) << problem_.Text();
    EXPECT_TRUE(reader->Sync().Ok());
    EXPECT_FALSE(reader->IsWritable());
}

TEST_F(HostFiles, FailingCallsGiveTheHostsErrorAndThePlace) {
    auto device = Open(path_, Mode::kCreate, 4096);
    ASSERT_NE(nullptr, device) << problem_.Text();
    const HostCalls calls = {FailingRead, FailingWrite, fdatasync};
    FileDevice::SetHostCalls(&calls);
    u8 bytes[512] = {};
    for (const int error : {EIO, ENOSPC, ENXIO}) {
        g_error = error;
        IoResult result = device->Read(1024, bytes, sizeof bytes);
        EXPECT_EQ(error, result.error);
        EXPECT_EQ(1024u, result.offset);
        result = device->Write(2048, bytes, sizeof bytes);
        EXPECT_EQ(error, result.error);
        EXPECT_EQ(2048u, result.offset);
    }
    g_error = 0;
    g_movesNothing = true;
    EXPECT_EQ(EIO, device->Write(2048, bytes, sizeof bytes).error);
    g_movesNothing = false;
    EXPECT_TRUE(device->Write(2048, bytes, sizeof bytes).Ok());
}

TEST_F(HostFiles, ASyncFindsOutThatTheFileHasShrunk) {
    auto device = Open(path_, Mode::kCreate, 8192);
    ASSERT_NE(nullptr, device) << problem_.Text();
    ASSERT_TRUE(device->Write(0, "kept", 4).Ok());
    ASSERT_EQ(0, truncate(path_.c_str(), 5000));
    const IoResult result = device->Sync();
    EXPECT_EQ(kIoPastEnd, result.error);
    EXPECT_EQ(5000u, result.offset);
    EXPECT_EQ(5000u, device->Size());
    EXPECT_EQ(kIoPastEnd, device->Write(0, "lost", 4).error);
}

// The descriptor was closed under the device.
TEST_F(HostFiles, ADescriptorThatIsGoneGivesTheHostsError) {
    auto device = Open(path_, Mode::kCreate, 8192);
    ASSERT_NE(nullptr, device) << problem_.Text();
    ASSERT_EQ(0, close(device->Handle()));
    EXPECT_EQ(EBADF, device->Write(0, "lost", 4).error);
    u8 bytes[4];
    EXPECT_EQ(EBADF, device->Read(0, bytes, 4).error);
    EXPECT_EQ(EBADF, device->Sync().error);
    EXPECT_EQ(8192u, device->Size());
}

// A device of blocks that is not in use; there may be none, or none that we may open.
std::string FreeBlockDevice() {
    std::error_code ignored;
    for (const auto& entry : std::filesystem::directory_iterator("/dev", ignored)) {
        if (entry.is_block_file(ignored) && access(entry.path().c_str(), R_OK | W_OK) == 0 &&
            entry.path().filename().string().rfind("loop", 0) == 0) {
            const int handle = open(entry.path().c_str(), O_RDWR | O_EXCL | O_CLOEXEC);
            const off_t size = handle >= 0 ? lseek(handle, 0, SEEK_END) : 1;
            if (handle >= 0) {
                close(handle);
            }
            if (size == 0) {
                return entry.path();
            }
        }
    }
    return {};
}

// A loop device with no file behind it has no bytes: it can be opened in every way, and not
// written.
TEST_F(HostFiles, ABlockDeviceKeepsItsSize) {
    const std::string path = FreeBlockDevice();
    if (path.empty()) {
        GTEST_SKIP() << "no loop device that is free";
    }
    for (const Mode mode : {Mode::kRead, Mode::kReadWrite, Mode::kCreate}) {
        auto device = Open(path, mode, 4096);
        ASSERT_NE(nullptr, device) << problem_.Text();
        EXPECT_EQ(0u, device->Size());
        EXPECT_EQ(mode != Mode::kRead, device->IsWritable());
        EXPECT_FALSE(device->Write(0, "x", 1).Ok());
    }
}

}  // namespace
}  // namespace VELK
