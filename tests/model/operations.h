// Random operations on a tree: what is done is decided by a list of plain numbers made from a seed
// beforehand, so that a failing run can be replayed and cut down to few operations.
#pragma once

#include <string>
#include <vector>

#include "hfs/treehfs.h"

namespace VELK::test {

enum class Verb : u8 {
    kInsert,        // a record, new or present
    kDelete,        // by key, present or absent
    kDeleteAtPath,  // the record the tree's own path stands on
    kFind,          // by key, record compared
    kUpdate,        // in place
    kStep,          // the second cursor, forward or backward
    kSeek,          // the second cursor to a key
    kPosition,      // position number taken, and returned to
    kWalk,          // a few records in order, compared
    kFlush,         // and commit
    kRestore,       // back to the last commit
    kReserve,
    kRelease,
    kExtend,
    kReopen,
    kHoldNode,   // a node taken and given back by number
    kTooLarge,   // refused insertions
    kStaleStep,  // the tree's own path moved wherever it stands
    kCount,
};

struct Operation {
    Verb verb;
    u32 key;    // number of the key
    u32 size;   // of data, or a count
    u32 fault;  // 0: none; else the nth service call or allocation from here fails
};

const char* VerbName(Verb verb);
std::string Text(const Operation& operation);

// `count` operations that grow and thin a tree in turns. The same seed gives the same list.
std::vector<Operation> MakeOperations(u64 seed, u32 count, bool withFaults);

}  // namespace VELK::test
