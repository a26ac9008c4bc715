// Parts of opening that restoring a tree repeats.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// Catalog and attributes trees have big keys and variable index keys; a header that lacks either
// mask is repaired in memory, so that index keys are measured rightly. Extents trees stay as they
// are.
void RepairAttributes(CBTreeHfs* tree);

}  // namespace VELK
