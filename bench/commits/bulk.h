// How fast the medium takes bytes in a row: the measure for changes in bulk.
#pragma once

#include <cstdint>
#include <string>

namespace bench {

// Seconds for writing a fresh file of `bytes` in pieces of 1 MiB, and a sync at its end.
double SecondsToWrite(const std::string& path, std::uint64_t bytes);
// Seconds for `count` times overwriting one block of 4 KiB and syncing it.
double SecondsToSync(const std::string& path, std::uint32_t count);

}  // namespace bench
