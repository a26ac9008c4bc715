// Reads the host's tables: mounted block devices, files behind loop devices.
#include "hfs/volume/host_use.h"

#include <sys/sysmacros.h>

#include <filesystem>
#include <fstream>
#include <sstream>

namespace VELK {

namespace {

// Names in the table write blanks, tabs, newlines and backslashes as three octal digits.
std::string Unescaped(const std::string& text) {
    std::string plain;
    for (std::size_t i = 0; i < text.size(); ++i) {
        const bool isEscape = text[i] == '\\' && i + 3 < text.size() &&
                              text.find_first_not_of("01234567", i + 1) >= i + 4;
        if (isEscape) {
            plain += static_cast<char>(std::stoi(text.substr(i + 1, 3), nullptr, 8));
            i += 3;
        } else {
            plain += text[i];
        }
    }
    return plain;
}

bool IsDevice(const std::string& path, dev_t device) {
    struct stat info;
    return stat(path.c_str(), &info) == 0 && S_ISBLK(info.st_mode) && info.st_rdev == device;
}

std::string FirstLine(const std::filesystem::path& path) {
    std::ifstream file(path);
    std::string line;
    std::getline(file, line);
    return line;
}

}  // namespace

// A line: ID, parent, major:minor, root, mount point, options, any number of fields, "-", type,
// source. Some file systems show a number of their own there and the device as the source only.
std::string MountPointOf(dev_t device, const HostTables& tables) {
    const std::string number = std::to_string(major(device)) + ":" + std::to_string(minor(device));
    std::ifstream table(tables.mounts);
    for (std::string line; std::getline(table, line);) {
        std::istringstream words(line);
        std::string id;
        std::string parent;
        std::string found;
        std::string root;
        std::string target;
        words >> id >> parent >> found >> root >> target;
        std::string word;
        while (words >> word && word != "-") {
        }
        std::string type;
        std::string source;
        words >> type >> source;
        if (found == number || IsDevice(Unescaped(source), device)) {
            return Unescaped(target);
        }
    }
    return {};
}

std::string LoopDeviceOf(const struct stat& info, const HostTables& tables, dev_t* device) {
    std::error_code ignored;
    for (const auto& entry : std::filesystem::directory_iterator(tables.blocks, ignored)) {
        const std::string file = FirstLine(entry.path() / "loop" / "backing_file");
        struct stat backing;
        if (file.empty() || stat(file.c_str(), &backing) != 0 || backing.st_dev != info.st_dev ||
            backing.st_ino != info.st_ino) {
            continue;
        }
        unsigned majorNumber = 0;
        unsigned minorNumber = 0;
        char colon = 0;
        std::istringstream(FirstLine(entry.path() / "dev")) >> majorNumber >> colon >> minorNumber;
        if (device != nullptr) {
            *device = makedev(majorNumber, minorNumber);
        }
        return entry.path().filename();
    }
    return {};
}

Problem CheckNotInUse(const struct stat& info, const HostTables& tables) {
    dev_t device = info.st_rdev;
    std::string loop;
    if (S_ISREG(info.st_mode)) {
        loop = LoopDeviceOf(info, tables, &device);
        if (loop.empty()) {
            return {};
        }
    } else if (!S_ISBLK(info.st_mode)) {
        return {};
    }
    const std::string mounted = MountPointOf(device, tables);
    if (!mounted.empty()) {
        return Failure("mounted on " + mounted, "unmount it first");
    }
    return loop.empty() ? Problem{}
                        : Failure("in use as /dev/" + loop, "losetup -d /dev/" + loop + " first");
}

}  // namespace VELK
