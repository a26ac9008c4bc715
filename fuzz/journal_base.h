// A small volume as a cut left it: its first transaction waits in the journal.
#pragma once

#include "image_bytes.h"
#include "platform/types.h"

namespace VELK::fuzz {

struct JournalBase {
    test::Bytes image;
    u64 journalOffset;
    u64 journalSize;
};

JournalBase MakeJournalBase();

}  // namespace VELK::fuzz
