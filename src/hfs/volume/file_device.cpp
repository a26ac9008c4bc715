// A file or block device of the host: positioned reads and writes of any length, repeated until
// they are complete, interrupted calls taken up again.
#include <fcntl.h>
#include <sys/file.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "hfs/volume/block_device.h"

#if defined(__linux__)
#include <linux/fs.h>
#endif

namespace VELK {

std::string IoErrorText(int error) {
    switch (error) {
        case kIoPastEnd:
            return "past the end";
        case kIoReadOnly:
            return "device is read-only";
        case kIoNoMemory:
            return "out of memory";
        default:
            return std::strerror(error);
    }
}

namespace {

constexpr HostCalls kHostCalls = {pread, pwrite, fsync};
const HostCalls* g_calls = &kHostCalls;

Problem CannotOpen(int error) {
    if (error == ENOENT) {
        return Failure("cannot open: no such file", "");
    }
    std::string text = std::strerror(error);
    text[0] = static_cast<char>(text[0] | 0x20);
    return Failure("cannot open: " + text, "");
}

// Size of an open file or device; false with `*problem` set when it is neither.
bool SizeOf(int handle, u64* size, bool* isFile, Problem* problem) {
    struct stat info;
    if (fstat(handle, &info) != 0) {
        *problem = CannotOpen(errno);
        return false;
    }
    *isFile = S_ISREG(info.st_mode);
    if (*isFile) {
        *size = static_cast<u64>(info.st_size);
        return true;
    }
    if (S_ISBLK(info.st_mode)) {
#if defined(BLKGETSIZE64)
        u64 bytes = 0;
        if (ioctl(handle, BLKGETSIZE64, &bytes) == 0) {
            *size = bytes;
            return true;
        }
#endif
        const off_t end = lseek(handle, 0, SEEK_END);
        if (end >= 0) {
            *size = static_cast<u64>(end);
            return true;
        }
        *problem = CannotOpen(errno);
        return false;
    }
    if (S_ISDIR(info.st_mode)) {
        *problem = Failure("is a folder", "name an image file or a block device");
    } else {
        *problem = Failure("is neither a file nor a block device", "name an image file");
    }
    return false;
}

}  // namespace

namespace {

// Where a block device is mounted, empty when nowhere (or when the host does not tell).
std::string MountPoint(const std::string& path) {
    struct stat device;
    std::string found;
    std::FILE* table = stat(path.c_str(), &device) == 0 && S_ISBLK(device.st_mode)
                           ? std::fopen("/proc/self/mounts", "re")
                           : nullptr;
    if (table == nullptr) {
        return found;
    }
    char source[512];
    char target[512];
    struct stat mounted;
    while (found.empty() && std::fscanf(table, "%511s %511s%*[^\n]", source, target) == 2) {
        if (stat(source, &mounted) == 0 && S_ISBLK(mounted.st_mode) &&
            mounted.st_rdev == device.st_rdev) {
            found = target;
        }
    }
    std::fclose(table);
    return found;
}

// A device that will be written must be ours alone.
Problem Claim(int handle) {
    if (flock(handle, LOCK_EX | LOCK_NB) == 0) {
        return {};
    }
    if (errno == EWOULDBLOCK) {
        return Failure("another process has it open for writing", "");
    }
    return errno == ENOLCK || errno == EOPNOTSUPP ? Problem{} : CannotOpen(errno);
}

// Empties a file and gives it `size` bytes of zeros.
Problem SetFreshSize(int handle, u64 size) {
    if (ftruncate(handle, 0) == 0 && ftruncate(handle, static_cast<off_t>(size)) == 0) {
        return {};
    }
    return Failure(std::string("cannot set the size: ") + std::strerror(errno), "");
}

}  // namespace

std::unique_ptr<FileDevice> FileDevice::Open(const std::string& path, Mode mode, u64 size,
                                             Problem* problem) {
    // Non-blocking: a FIFO must not hold us up before it is refused.
    int flags = O_CLOEXEC | O_NONBLOCK | (mode == Mode::kRead ? O_RDONLY : O_RDWR);
    if (mode == Mode::kCreate) {
        flags |= O_CREAT;
    }
    if (mode != Mode::kRead) {
        const std::string mounted = MountPoint(path);
        if (!mounted.empty()) {
            *problem = Failure("mounted on " + mounted, "unmount it first");
            return nullptr;
        }
    }
    const int handle = open(path.c_str(), flags, 0666);
    if (handle < 0) {
        *problem = errno == EISDIR ? Failure("is a folder", "name an image file or a block device")
                                   : CannotOpen(errno);
        return nullptr;
    }
    std::unique_ptr<FileDevice> device(new FileDevice(handle, 0, mode != Mode::kRead));
    if (!SizeOf(handle, &device->size_, &device->isFile_, problem)) {
        return nullptr;
    }
    *problem = mode != Mode::kRead ? Claim(handle) : Problem{};
    if (!*problem && mode == Mode::kCreate && device->isFile_) {
        *problem = SetFreshSize(handle, size);
        device->size_ = size;
    }
    return *problem ? nullptr : std::move(device);
}

FileDevice::~FileDevice() {
    close(handle_);
}

IoResult FileDevice::Read(u64 offset, void* target, std::size_t bytes) {
    u8* out = static_cast<u8*>(target);
    const u64 start = offset;
    while (bytes > 0) {
        const ssize_t count = g_calls->read(handle_, out, bytes, static_cast<off_t>(offset));
        if (count < 0) {
            if (errno == EINTR) {
                continue;
            }
            return {errno, offset};
        }
        if (count == 0) {
            HasShrunk();
            return {kIoPastEnd, start};
        }
        out += count;
        offset += static_cast<u64>(count);
        bytes -= static_cast<std::size_t>(count);
    }
    return {};
}

IoResult FileDevice::Write(u64 offset, const void* source, std::size_t bytes) {
    if (!writable_) {
        return {kIoReadOnly, offset};
    }
    if (syncError_ != 0) {
        return {syncError_, offset};
    }
    // A write behind the end of a file would make it longer again, with a hole of zeros.
    if (offset > size_ || bytes > size_ - offset || HasShrunk()) {
        return {kIoPastEnd, offset};
    }
    const u8* in = static_cast<const u8*>(source);
    while (bytes > 0) {
        const ssize_t count = g_calls->write(handle_, in, bytes, static_cast<off_t>(offset));
        if (count < 0) {
            if (errno == EINTR) {
                continue;
            }
            return {errno, offset};
        }
        if (count == 0) {
            return {EIO, offset};
        }
        in += count;
        offset += static_cast<u64>(count);
        bytes -= static_cast<std::size_t>(count);
    }
    return {};
}

IoResult FileDevice::Sync() {
    if (!writable_) {
        return {};
    }
    if (syncError_ != 0) {
        return {syncError_, 0};
    }
    int status = 0;
    do {
        status = g_calls->sync(handle_);
    } while (status != 0 && errno == EINTR);
    if (status != 0) {
        syncError_ = errno;
        return {syncError_, 0};
    }
    return HasShrunk() ? IoResult{kIoPastEnd, size_} : IoResult{};
}

// What is left of a file is the size from now on, for those who tell where it ends.
bool FileDevice::HasShrunk() {
    struct stat info;
    if (isFile_ && fstat(handle_, &info) == 0 && static_cast<u64>(info.st_size) < size_) {
        size_ = static_cast<u64>(info.st_size);
        hasShrunk_ = true;
    }
    return hasShrunk_;
}

void FileDevice::SetHostCalls(const HostCalls* calls) {
    g_calls = calls != nullptr ? calls : &kHostCalls;
}

}  // namespace VELK
