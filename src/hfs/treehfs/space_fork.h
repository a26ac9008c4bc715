// The tree file's fork: its record in the volume header, and its size.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// The fork record of the tree's file; null, with the volume's assertion printed, for a file ID that
// has none.
HfsFork* FindFork(CBTreeHfs* tree);

// Sets the tree file to `size` bytes. The volume's nesting counter tells it that the call comes
// from inside a tree operation. The status is unreported.
int ResizeFork(CBTreeHfs* tree, u64 size);

}  // namespace VELK
