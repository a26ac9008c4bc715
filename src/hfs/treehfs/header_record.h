// Header record of node 0 <-> the tree's in-memory header.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// Fills the tree's header, btreeType and keyCompareType from node 0; leaves the geometry alone.
void ReadHeaderRecord(CBTreeHfs* tree, const HfsNode* node0);

// Writes the in-memory header into node 0's header record. btreeType, keyCompareType and the
// reserved fields are not written, only asserted to be what the tree believes. REQUIRES: node 0's
// first block was marked with SetDirty.
void WriteHeaderRecord(const CBTreeHfs* tree, HfsNode* node0);

}  // namespace VELK
