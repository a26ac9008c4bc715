// Stands in front of the C library's calls, for the libraries of the other stores too.
#include "host_syncs.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <unistd.h>

namespace {

bench::HostTally g_tally;

void NoteWrite(int handle, ssize_t bytes) {
    g_tally.bytes += bytes > 0 ? static_cast<std::uint64_t>(bytes) : 0;
    g_tally.syncedWrites += (fcntl(handle, F_GETFL) & O_DSYNC) != 0 ? 1 : 0;
}

}  // namespace

namespace bench {

HostTally Tally() {
    return g_tally;
}

}  // namespace bench

extern "C" {

int fsync(int handle) {
    g_tally.syncs += 1;
    return static_cast<int>(syscall(SYS_fsync, handle));
}

int fdatasync(int handle) {
    g_tally.syncs += 1;
    return static_cast<int>(syscall(SYS_fdatasync, handle));
}

int msync(void* start, size_t bytes, int flags) {
    g_tally.syncs += 1;
    return static_cast<int>(syscall(SYS_msync, start, bytes, flags));
}

ssize_t pwrite(int handle, const void* source, size_t bytes, off_t offset) {
    const ssize_t done = syscall(SYS_pwrite64, handle, source, bytes, offset);
    NoteWrite(handle, done);
    return done;
}

ssize_t pwrite64(int handle, const void* source, size_t bytes, off64_t offset) {
    const ssize_t done = syscall(SYS_pwrite64, handle, source, bytes, offset);
    NoteWrite(handle, done);
    return done;
}

ssize_t pwritev(int handle, const struct iovec* pieces, int count, off_t offset) {
    const ssize_t done = syscall(SYS_pwritev, handle, pieces, count, offset, 0);
    NoteWrite(handle, done);
    return done;
}

ssize_t write(int handle, const void* source, size_t bytes) {
    const ssize_t done = syscall(SYS_write, handle, source, bytes);
    NoteWrite(handle, done);
    return done;
}

}  // extern "C"
