// Plain writes to plain files.
#include "bulk.h"

#include <fcntl.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <vector>

namespace bench {

namespace {

int OpenFresh(const std::string& path) {
    const int handle = open(path.c_str(), O_RDWR | O_CREAT | O_TRUNC, 0644);
    if (handle < 0) {
        std::perror(path.c_str());
        std::exit(1);
    }
    return handle;
}

void Must(bool done, const char* what) {
    if (!done) {
        std::perror(what);
        std::exit(1);
    }
}

double SecondsSince(std::chrono::steady_clock::time_point start) {
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

}  // namespace

double SecondsToWrite(const std::string& path, std::uint64_t bytes) {
    const int handle = OpenFresh(path);
    const std::vector<char> piece(1 << 20, 'x');
    const auto start = std::chrono::steady_clock::now();
    for (std::uint64_t done = 0; done < bytes; done += piece.size()) {
        Must(pwrite(handle, piece.data(), piece.size(), static_cast<off_t>(done)) ==
                 static_cast<ssize_t>(piece.size()),
             "write");
    }
    Must(fdatasync(handle) == 0, "sync");
    const double seconds = SecondsSince(start);
    close(handle);
    unlink(path.c_str());
    return seconds;
}

double SecondsToSync(const std::string& path, std::uint32_t count) {
    const int handle = OpenFresh(path);
    const std::vector<char> block(4096, 'x');
    Must(pwrite(handle, block.data(), block.size(), 0) > 0 && fsync(handle) == 0, "write");
    const auto start = std::chrono::steady_clock::now();
    for (std::uint32_t i = 0; i < count; ++i) {
        Must(pwrite(handle, block.data(), block.size(), 0) > 0 && fdatasync(handle) == 0, "sync");
    }
    const double seconds = SecondsSince(start);
    close(handle);
    unlink(path.c_str());
    return seconds;
}

}  // namespace bench
