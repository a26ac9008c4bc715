// Carries out what waits in a journal.
#pragma once

#include "hfs/volume/journal_state.h"

namespace VELK {

struct ReplayResult {
    u32 transactions = 0;  // carried out
    u64 blocks = 0;
    bool isComplete = true;  // up to the journal's end
    u64 stoppedAt = 0;       // volume byte of the list that ended the walk
    std::string text;        // what was wrong with it
    IoResult io;             // a failed transfer; nothing else then counts
};

// Reads the transactions of the journal on `volume` and writes their blocks to `target`, the same
// volume with changes kept elsewhere. A transaction is checked whole before its first block is
// written; the first that is not sound ends the walk.
ReplayResult ReplayJournal(BlockDevice* volume, const JournalPlace& place, BlockDevice* target);

}  // namespace VELK
