// The twelve operations whose commits are cut, and the volumes they are done on.
#pragma once

#include <functional>
#include <set>

#include "small_volume.h"

namespace VELK::test {

constexpr u32 kCutOperations = 12;
constexpr u32 kUpdateAll = 12;  // one more, of large transactions
const char* CutOperationName(u32 operation);

// A volume and the numbers in its catalog.
struct CutVolume {
    ImageVolume* volume;
    std::set<u32> numbers;
    std::function<int()> commit;  // called by operations that do not fit into one transaction
    u8 fill = 0x80;               // of updated records; another one each time
};

// Does one operation without the last commit: 0 or a status.
int DoCutOperation(u32 operation, CutVolume* on);

// A volume of `records` records on a fresh device. Nearly full: a few blocks are free.
struct CutBase {
    std::vector<u8> bytes;
    std::set<u32> numbers;
};
struct CutBaseShape {
    u64 journalSize = 32 << 10;
    u64 journalAt = 512;  // where in the ring the journal begins
    u32 records = 3;
    u32 catalogNodes = 0;  // at least so many
    bool nearlyFull = false;
    u64 size = 192 << 10;
};
CutBase MakeCutBase(const CutBaseShape& shape);

}  // namespace VELK::test
