// What the host says of its mounts and loop devices, from tables written out here.
#include "hfs/volume/host_use.h"

#include <gtest/gtest.h>
#include <sys/sysmacros.h>

#include <filesystem>
#include <fstream>

namespace VELK {
namespace {

class HostUse : public testing::Test {
protected:
    void SetUp() override {
        folder_ = testing::TempDir() + "treehfs_host_use";
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

TEST_F(HostUse, AHostWithoutTablesRefusesNothing) {
    tables_ = {folder_ + "/nowhere", folder_ + "/nowhere"};
    EXPECT_FALSE(InUse());
    EXPECT_FALSE(CheckNotInUse(DeviceState(makedev(8, 18)), tables_));
}

}  // namespace
}  // namespace VELK
