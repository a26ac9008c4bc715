// Says in words why a tree did not open.
#pragma once

#include "hfs/treehfs.h"
#include "hfs/volume/problem.h"

namespace VELK {

// What is known about a tree whose opening failed.
struct TreeDiagnosis {
    u32 fileId;
    int status;        // what Init returned
    const u8* header;  // the first kHeadEnd bytes of its fork, or null
    u32 mapBlockSize;
    u64 forkBlockBytes;  // bytes of the fork's allocation blocks
    u64 imageOffset;     // of the fork's first byte
};

Problem DiagnoseTree(const TreeDiagnosis& tree);

}  // namespace VELK
