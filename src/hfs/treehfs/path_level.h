// Loading of one level of a search path.
#pragma once

#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/way.h"

namespace VELK {

// A path describes levels 1 to 15; anything else is a tree too deep to search.
int CheckLevel(int level);

// Puts node `nodeNum` into path[level], index 0, and checks that it belongs there: its height and
// its kind. After a failed check the node stays in the path for ClearPath to release.
// REQUIRES: CheckLevel(level) succeeded.
int LoadLevel(CBTreeHfs* tree, int level, u32 nodeNum, const HintedWay& way, HfsFindData* path);

// Whether `path` stands on a record of a leaf: level 1, a leaf held there, its index at most
// `slack` past the last record. False for a path that was cleared, failed half-way or was outlived
// by its records.
inline bool StandsOnLeaf(const HfsFindData* path, u32 slack) {
    const HfsFindLevel& leaf = path->path[1];
    return path->level == 1 && leaf.node != nullptr && IsLeaf(leaf.node) &&
           Height(leaf.node) == 1 && leaf.index >= 0 &&
           static_cast<u32>(leaf.index) < NumRecords(leaf.node) + slack;
}

}  // namespace VELK
