// The journal of a new volume: its place, the two files that account for it, its first header.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "hfs/volume/block_device.h"
#include "hfs/volume/volume_header.h"

namespace VELK {

constexpr u64 kSmallestNewJournal = 1u << 15;
constexpr u64 kLargestNewJournal = u64{1} << 30;
constexpr u32 kJournalFiles = 2;  // records of type file that account for a journal

// Blocks of a new journal: the info block first, the journal behind it.
struct JournalBlocks {
    u32 first = 0;
    u32 count = 0;  // 0: no journal; includes the info block

    u32 End() const { return first + count; }
};

// Inserts the catalog records of the two files by `insert(parent, name, record)`, which returns a
// status, until one fails.
int InsertJournalFiles(
    const JournalBlocks& blocks, u32 blockSize, u32 date,
    const std::function<int(u32, const std::u16string&, const std::vector<u8>&)>& insert);

// Writes info block and journal header and syncs them; no volume header names them yet.
// REQUIRES: the volume begins with the device.
IoResult StartJournal(BlockDevice* device, const JournalBlocks& blocks, u32 blockSize);

}  // namespace VELK
