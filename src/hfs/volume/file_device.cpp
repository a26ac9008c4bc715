// A file or block device of the host: positioned reads and writes of any length, repeated until
// they are complete, interrupted calls taken up again.
#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
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

Problem CannotOpen(int error) {
    if (error == ENOENT) {
        return Failure("cannot open: no such file", "");
    }
    std::string text = std::strerror(error);
    text[0] = static_cast<char>(text[0] | 0x20);
    return Failure("cannot open: " + text, "");
}

// Size of an open file or device; false with `*problem` set when it is neither.
bool SizeOf(int handle, u64* size, Problem* problem) {
    struct stat info;
    if (fstat(handle, &info) != 0) {
        *problem = CannotOpen(errno);
        return false;
    }
    if (S_ISREG(info.st_mode)) {
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

std::unique_ptr<FileDevice> FileDevice::Open(const std::string& path, Mode mode, u64 size,
                                             Problem* problem) {
    int flags = O_CLOEXEC;
    switch (mode) {
        case Mode::kRead:
            flags |= O_RDONLY | O_NONBLOCK;  // a FIFO must not hold us up before it is refused
            break;
        case Mode::kReadWrite:
            flags |= O_RDWR | O_NONBLOCK;
            break;
        case Mode::kCreate:
            flags |= O_RDWR | O_CREAT | O_TRUNC | O_NONBLOCK;
            break;
    }
    const int handle = open(path.c_str(), flags, 0666);
    if (handle < 0) {
        *problem = errno == EISDIR ? Failure("is a folder", "name an image file or a block device")
                                   : CannotOpen(errno);
        return nullptr;
    }
    u64 bytes = 0;
    bool usable = SizeOf(handle, &bytes, problem);
    if (usable && mode == Mode::kCreate && bytes < size) {
        usable = ftruncate(handle, static_cast<off_t>(size)) == 0;
        if (!usable) {
            *problem = Failure(std::string("cannot set the size: ") + std::strerror(errno), "");
        }
        bytes = size;
    }
    if (!usable) {
        close(handle);
        return nullptr;
    }
    return std::unique_ptr<FileDevice>(new FileDevice(handle, bytes, mode != Mode::kRead));
}

FileDevice::~FileDevice() {
    close(handle_);
}

IoResult FileDevice::Read(u64 offset, void* target, std::size_t bytes) {
    u8* out = static_cast<u8*>(target);
    const u64 start = offset;
    while (bytes > 0) {
        const ssize_t count = pread(handle_, out, bytes, static_cast<off_t>(offset));
        if (count < 0) {
            if (errno == EINTR) {
                continue;
            }
            return {errno, offset};
        }
        if (count == 0) {
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
    if (offset > size_ || bytes > size_ - offset) {
        return {kIoPastEnd, offset};
    }
    const u8* in = static_cast<const u8*>(source);
    while (bytes > 0) {
        const ssize_t count = pwrite(handle_, in, bytes, static_cast<off_t>(offset));
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
    if (writable_ && fsync(handle_) != 0) {
        return {errno, 0};
    }
    return {};
}

}  // namespace VELK
