// What the host says of its mounts and loop devices, from tables written out here.
#include "hfs/volume/host_use.h"

#include <gtest/gtest.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

namespace VELK {
namespace {

class HostUse : public testing::Test {
protected:
    void SetUp() override {
        folder_ = testing::TempDir() + "treehfs_host_use_" + std::to_string(getpid());
        std::filesystem::remove_all(folder_);
        std::filesystem::create_directories(folder_ + "/blocks");
        tables_ = {folder_ + "/mounts", folder_ + "/blocks"};
        std::ofstream(tables_.mounts)
            << "22 1 0:20 / /proc rw,relatime shared:12 - proc proc rw\n"
               "69 27 7:0 / /mnt/a\\040volume\\134 rw,relatime shared:1 master:2 - hfsplus "
               "/dev/loop0 rw\n"
               "70 27 8:18 /sub /mnt/plain rw - hfsplus /dev/sdb2 rw\n";
        image_ = folder_ + "/disk.img";
        std::ofstream(image_) << "image";
    }
    void TearDown() override { std::filesystem::remove_all(folder_); }

    void Attach(const std::string& loop, const std::string& number, const std::string& file) {
        const std::string place = tables_.blocks + "/" + loop;
        std::filesystem::create_directories(place + "/loop");
        std::ofstream(place + "/dev") << number << "\n";
        std::ofstream(place + "/loop/backing_file") << file << "\n";
    }
    Problem InUse() const {
        struct stat info;
        EXPECT_EQ(0, stat(image_.c_str(), &info));
        return CheckNotInUse(info, tables_);
    }
    static struct stat DeviceState(dev_t device) {
        struct stat info = {};
        info.st_mode = S_IFBLK;
        info.st_rdev = device;
        return info;
    }

    std::string folder_;
    HostTables tables_;
    std::string image_;
};

TEST_F(HostUse, AMountIsFoundByTheNumberOfItsDevice) {
    EXPECT_EQ("/mnt/plain", MountPointOf(makedev(8, 18), tables_));
    EXPECT_EQ("", MountPointOf(makedev(8, 17), tables_));
}

TEST_F(HostUse, NamesAreShownAsTheyAre) {
    EXPECT_EQ("/mnt/a volume\\", MountPointOf(makedev(7, 0), tables_));
}

TEST_F(HostUse, AMountedDeviceIsRefused) {
    EXPECT_EQ("mounted on /mnt/plain: unmount it first",
              CheckNotInUse(DeviceState(makedev(8, 18)), tables_).Text());
    EXPECT_FALSE(CheckNotInUse(DeviceState(makedev(8, 19)), tables_));
}

TEST_F(HostUse, AFileBehindALoopDeviceIsRefused) {
    EXPECT_FALSE(InUse());
    Attach("loop3", "7:3", folder_ + "/another.img");
    EXPECT_FALSE(InUse());
    Attach("loop4", "7:4", image_);
    EXPECT_EQ("in use as /dev/loop4: losetup -d /dev/loop4 first", InUse().Text());
}

TEST_F(HostUse, AFileThatIsMountedIsRefusedByItsMount) {
    Attach("loop0", "7:0", image_);
    EXPECT_EQ("mounted on /mnt/a volume\\: unmount it first", InUse().Text());
}

// Only a backslash before three octal digits is more than itself.
TEST_F(HostUse, BackslashesThatStandForThemselves) {
    std::ofstream(tables_.mounts) << "70 27 8:1 / /mnt/a\\8bc\\07 rw - hfsplus /dev/x rw\n"
                                     "71 27 8:2 / /mnt/b\\ rw - hfsplus /dev/x rw\n";
    EXPECT_EQ("/mnt/a\\8bc\\07", MountPointOf(makedev(8, 1), tables_));
    EXPECT_EQ("/mnt/b\\", MountPointOf(makedev(8, 2), tables_));
}

// A line that ends early says what it says; sources that are no devices say nothing.
TEST_F(HostUse, LinesOutOfTheOrdinary) {
    std::ofstream(tables_.mounts) << "\n"
                                     "70 27 8:1\n"
                                     "71 27 0:40 / /mnt/file rw - fuse "
                                  << image_
                                  << " rw\n"
                                     "72 27 8:3 / /mnt/short rw relatime\n";
    EXPECT_EQ("", MountPointOf(makedev(8, 1), tables_));
    EXPECT_EQ("", MountPointOf(makedev(8, 9), tables_));
    EXPECT_EQ("/mnt/short", MountPointOf(makedev(8, 3), tables_));
}

// Some file systems show a number of their own, and the device as the source alone.
TEST_F(HostUse, AMountIsFoundByItsSource) {
    std::error_code ignored;
    for (const auto& entry : std::filesystem::directory_iterator("/dev", ignored)) {
        struct stat info;
        if (stat(entry.path().c_str(), &info) != 0 || !S_ISBLK(info.st_mode)) {
            continue;
        }
        std::ofstream(tables_.mounts)
            << "70 27 0:55 / /mnt/own rw - other " << entry.path().string() << " rw\n";
        EXPECT_EQ("/mnt/own", MountPointOf(info.st_rdev, tables_));
        EXPECT_EQ("", MountPointOf(makedev(4095, 77), tables_));
        return;
    }
    GTEST_SKIP() << "no block device to look at";
}

TEST_F(HostUse, FilesThatAreNotBehindALoopDevice) {
    struct stat info;
    ASSERT_EQ(0, stat(image_.c_str(), &info));
    std::ofstream(folder_ + "/another.img") << "other";
    Attach("loop1", "7:1", folder_ + "/gone.img (deleted)");
    Attach("loop2", "7:2", "/proc/version");
    Attach("loop3", "7:3", folder_ + "/another.img");
    EXPECT_EQ("", LoopDeviceOf(info, tables_, nullptr));
    Attach("loop4", "7:4", image_);
    EXPECT_EQ("loop4", LoopDeviceOf(info, tables_, nullptr));
    dev_t device = 0;
    EXPECT_EQ("loop4", LoopDeviceOf(info, tables_, &device));
    EXPECT_EQ(makedev(7, 4), device);
}

TEST_F(HostUse, FoldersAreInNobodysUse) {
    struct stat info;
    ASSERT_EQ(0, stat(folder_.c_str(), &info));
    EXPECT_FALSE(CheckNotInUse(info, tables_));
}

TEST_F(HostUse, AHostWithoutTablesRefusesNothing) {
    tables_ = {folder_ + "/nowhere", folder_ + "/nowhere"};
    EXPECT_FALSE(InUse());
    EXPECT_FALSE(CheckNotInUse(DeviceState(makedev(8, 18)), tables_));
}

}  // namespace
}  // namespace VELK
