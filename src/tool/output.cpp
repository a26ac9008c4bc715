// Buffered output to standard output or to a file.
#include "tool/output.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <utility>

#include "tool/errors.h"
#include "tool/progress.h"

namespace VELK::tool {

namespace {

std::string ErrnoText(int error) {
    switch (error) {
        case ENOENT:
            return "no such folder";
        case EACCES:
        case EPERM:
            return "permission denied";
        case ENOSPC:
            return "no space left on the disk";
        default:
            return std::strerror(error);
    }
}

bool IsSameFile(const std::string& a, const std::string& b) {
    struct stat first {};
    struct stat second {};
    return stat(a.c_str(), &first) == 0 && stat(b.c_str(), &second) == 0 &&
           first.st_dev == second.st_dev && first.st_ino == second.st_ino;
}

}  // namespace

Output::Output() : buffer_(new char[kBufferSize]) {}

Output::~Output() {
    if (!path_.empty()) {
        close(fd_);
        unlink(partPath_.c_str());
    }
}

void Output::OpenFile(const std::string& path, const std::string& image, bool replace) {
    struct stat present {};
    const bool exists = lstat(path.c_str(), &present) == 0;
    if (exists && IsSameFile(path, image)) {
        ThrowFailed(path, "is the image itself", "choose another name");
    }
    if (exists && !replace) {
        ToolError error;
        error.problem = Failure(path + " exists", "--force replaces it");
        throw ToolError(std::move(error));
    }
    if (exists && !S_ISREG(present.st_mode)) {
        ThrowFailed(path, "is not a regular file", "choose another name");
    }
    const std::string part = path + ".part";
    const int fd = open(part.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666);
    if (fd < 0) {
        ThrowFailed(part, "cannot create: " + (errno == EEXIST ? "it exists" : ErrnoText(errno)),
                    errno == EEXIST ? "remove what an earlier run left" : "");
    }
    fd_ = fd;
    path_ = path;
    partPath_ = part;
    replace_ = replace;
}

void Output::Write(std::string_view text) {
    if (text.size() > kBufferSize - used_) {
        Flush();
        if (text.size() > kBufferSize) {
            WriteAll(text.data(), text.size());
            return;
        }
    }
    std::memcpy(buffer_.get() + used_, text.data(), text.size());
    used_ += text.size();
}

void Output::Flush() {
    const std::size_t size = used_;
    used_ = 0;
    WriteAll(buffer_.get(), size);
}

void Output::WriteAll(const char* bytes, std::size_t size) {
    while (size > 0) {
        // A signal ends a write early, with an error or with part of the bytes written.
        ThrowIfInterrupted();
        const ssize_t written = write(fd_, bytes, size);
        if (written < 0) {
            if (errno == EINTR) {
                continue;
            }
            if (errno == EPIPE) {
                throw OutputClosed{};
            }
            ThrowFailed(path_.empty() ? "standard output" : path_,
                        "cannot write: " + ErrnoText(errno), "");
        }
        bytes += written;
        size -= static_cast<std::size_t>(written);
    }
}

void Output::Commit() {
    Flush();
    if (path_.empty()) {
        return;
    }
    const std::string path = path_;
    path_.clear();
    if (close(fd_) != 0) {
        const int error = errno;
        unlink(partPath_.c_str());
        ThrowFailed(path, "cannot write: " + ErrnoText(error), "");
    }
    // link refuses a name that has appeared meanwhile; rename would replace it.
    const int status =
        replace_ ? rename(partPath_.c_str(), path.c_str()) : link(partPath_.c_str(), path.c_str());
    const int error = errno;
    if (status != 0 || !replace_) {
        unlink(partPath_.c_str());
    }
    if (status != 0) {
        ThrowFailed(path, "cannot create: " + ErrnoText(error), "");
    }
}

bool Output::IsTerminal() const {
    return path_.empty() && isatty(fd_) != 0;
}

}  // namespace VELK::tool
