// Moving of several records between neighbouring nodes.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// `count` times _RotateRecordLeft, or _RotateRecordRight; every byte of the two nodes comes out as
// if it were done one by one, but each is moved once where nothing on the way can be refused.
// A failure, not reported, leaves the records moved so far.
// REQUIRES: the offset tables of both are sound, and the giver holds `count` records.
int MoveRecordsLeft(CBTreeHfs* tree, HfsNode* left, HfsNode* right, u32 count);
int MoveRecordsRight(CBTreeHfs* tree, HfsNode* right, HfsNode* left, u32 count);

}  // namespace VELK
