// The record offset table as changes rely on it. The accessors check just enough to read a record;
// a change moves bytes by what the table says, so it is checked more strictly first and refused
// before any byte of the node changes.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// Where one record and the free space of its node lie; all are node offsets.
struct RecordSlots {
    u32 count;  // records in the node
    u32 start;  // first byte of the record
    u32 end;    // first byte after it
    u32 free;   // start of free space
    u32 limit;  // slot of record `count`, where free space ends
};

// Reads the slots of record `index`. False: there is no such record, or not
// 14 <= start < end <= free <= limit with all of them even.
bool LoadRecordSlots(const BTHeaderMem* hdr, const HfsNode* node, u32 index, RecordSlots* slots);

// The bounds of a place where bytes may be inserted: even, behind the descriptor, not behind
// the start of free space.
inline bool IsInsertPoint(u32 offset, u32 free) {
    return offset >= kDescSize && offset <= free && ((offset | free) & 1) == 0;
}

// Whether all records of the node lie in ascending order between descriptor and offset table.
bool TableIsSound(const BTHeaderMem* hdr, const HfsNode* node);

}  // namespace VELK
