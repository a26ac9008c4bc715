// What an operation on a stored path makes sure of before its first change. A path outlives the
// call that filled it: nodes may have been released, records may have moved, the leaf may have been
// left behind by a step to the next one.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// Whether every level above `level`, up to the root, holds an index node whose record at the
// path's index points at the node held one level below. REQUIRES: 1 <= level, node held there.
// A record that cannot be read is reported by its accessor.
bool ParentsLeadHere(const CBTreeHfs* tree, const HfsFindData* path, u32 level);

}  // namespace VELK
