// A file or block device of the host: positioned reads and writes of any length, repeated until
// they are complete, interrupted calls taken up again.
#include <fcntl.h>
#include <sys/file.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "hfs/volume/block_device.h"
#include "hfs/volume/host_use.h"

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
        case kIoTooLarge:
            return "more changes than the journal holds";
        default:
            return std::strerror(error);
    }
}

namespace {

// Of a file's own attributes only the size matters to whoever reads it later, and that is kept by
// fdatasync; times are not worth a write of their own for every commit.
constexpr HostCalls kHostCalls = {pread, pwrite, fdatasync};
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

// Empties a file and gives it `size` bytes of zeros, which are there after a cut, and so is its
// name: what is written into it later could not be found otherwise.
Problem SetFreshSize(int handle, const std::string& path, u64 size) {
    if (ftruncate(handle, 0) != 0 || ftruncate(handle, static_cast<off_t>(size)) != 0) {
        return Failure(std::string("cannot set the size: ") + std::strerror(errno), "");
    }
    if (fsync(handle) != 0) {
        return Failure(std::string("cannot sync: ") + std::strerror(errno), "");
    }
    const std::size_t slash = path.find_last_of('/');
    const std::string folder = slash == std::string::npos ? "." : path.substr(0, slash + 1);
    const int folderHandle = open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (folderHandle >= 0) {
        fsync(folderHandle);  // not every file system can: then there is nothing to do
        close(folderHandle);
    }
    return {};
}

Problem OpenProblem(int error, bool isBlockDevice) {
    if (error == EISDIR) {
        return Failure("is a folder", "name an image file or a block device");
    }
    // A device, or a part of it, that is mounted, swapped to or part of something larger.
    return error == EBUSY && isBlockDevice ? Failure("in use by the system", "release it first")
                                           : CannotOpen(error);
}

// Opens a file to be read without leaving a trace of that, its time of access, where the system
// lets us: it is for who owns the file.
int OpenUntouched([[maybe_unused]] const std::string& path, [[maybe_unused]] int flags) {
#if defined(O_NOATIME)
    return open(path.c_str(), flags | O_NOATIME);
#else
    return -1;
#endif
}

constexpr u64 kWorthStarting = u64{256} << 10;

// Lets the medium begin with what it will be asked for at the next sync. Nothing depends on it.
void StartWriting(int handle, u64 offset, u64 bytes) {
#if defined(SYNC_FILE_RANGE_WRITE)
    sync_file_range(handle, static_cast<off64_t>(offset), static_cast<off64_t>(bytes),
                    SYNC_FILE_RANGE_WRITE);
#else
    (void)handle, (void)offset, (void)bytes;
#endif
}

}  // namespace

std::unique_ptr<FileDevice> FileDevice::Open(const std::string& path, Mode mode, u64 size,
                                             Problem* problem) {
    struct stat before;
    const bool exists = stat(path.c_str(), &before) == 0;
    const bool isBlockDevice = exists && S_ISBLK(before.st_mode);
    // Non-blocking: a FIFO must not hold us up before it is refused.
    int flags = O_CLOEXEC | O_NONBLOCK | (mode == Mode::kRead ? O_RDONLY : O_RDWR);
    if (mode == Mode::kCreate && !isBlockDevice) {
        flags |= O_CREAT;
    }
    if (mode != Mode::kRead) {
        flags |= isBlockDevice ? O_EXCL : 0;
        *problem = exists ? CheckNotInUse(before, HostTables{}) : Problem{};
        if (*problem) {
            return nullptr;
        }
    }
    int handle = mode == Mode::kRead ? OpenUntouched(path, flags) : -1;
    if (handle < 0) {
        handle = open(path.c_str(), flags, 0666);
    }
    if (handle < 0) {
        *problem = OpenProblem(errno, isBlockDevice);
        return nullptr;
    }
    std::unique_ptr<FileDevice> device(new FileDevice(handle, 0, mode != Mode::kRead));
    if (!SizeOf(handle, &device->size_, &device->isFile_, problem)) {
        return nullptr;
    }
    *problem = mode != Mode::kRead ? Claim(handle) : Problem{};
    if (!*problem && mode == Mode::kCreate && device->isFile_) {
        *problem = SetFreshSize(handle, path, size);
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
    const u64 start = offset;
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
    if (offset - start >= kWorthStarting) {
        StartWriting(handle_, start, offset - start);
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
