// Counts what the whole program asks of the medium: syncs, writes that return only when they are on
// it, and bytes written with positioned writes.
#pragma once

#include <cstdint>

namespace bench {

struct HostTally {
    std::uint64_t syncs = 0;         // fsync, fdatasync, msync
    std::uint64_t syncedWrites = 0;  // to files opened with O_DSYNC
    std::uint64_t bytes = 0;
};

HostTally Tally();

}  // namespace bench
