// One node by itself: its descriptor, its offset table, its records.
#pragma once

#include "hfs/check/check_bytes.h"
#include "hfs/check/check_run.h"
#include "hfs/format.h"

namespace VELK {

struct CheckTree;

// A node's bytes. Records below `usable` lie inside the node, between the descriptor and the
// offset table, in rising order.
struct CheckNode {
    const u8* bytes = nullptr;
    u32 nodeNum = 0;
    u32 nodeSize = 0;
    u32 usable = 0;

    u32 FLink() const { return Load32(bytes + kDescFLink); }
    u32 BLink() const { return Load32(bytes + kDescBLink); }
    s8 Kind() const { return static_cast<s8>(bytes[kDescKind]); }
    u32 Height() const { return bytes[kDescHeight]; }
    u32 NumRecords() const { return Load16(bytes + kDescNumRecords); }
    // Entry of the offset table. REQUIRES: index at most `usable`.
    u32 Slot(u32 index) const { return Load16(bytes + nodeSize - kSlotSize * (index + 1)); }
    u32 Start(u32 index) const { return Slot(index); }
    u32 Size(u32 index) const { return Slot(index + 1) - Slot(index); }
    const u8* Record(u32 index) const { return bytes + Start(index); }
};

// Counts the records that can be trusted, without a word about the others.
u32 CountUsableRecords(const u8* bytes, u32 nodeSize);

// Kind, height, record count, offset table and reserved field of a node of `level` (N01 to N04,
// N06). Sets `usable`; 0 if the node's kind does not fit the level. True: nothing was at fault that
// hides records.
bool CheckNodeShape(const CheckTree& tree, u32 level, CheckNode* node);

// A record taken apart.
struct CheckRecord {
    const u8* key = nullptr;  // null: not sound
    const u8* data = nullptr;
    u32 dataOffset = 0;  // in the node
    u32 dataSize = 0;
};

// Key of record `index` (K01, K05) and place of its data. Reports unless `isSilent`. False: the
// key is not sound, or there is no data.
bool TakeRecord(const CheckTree& tree, const CheckNode& node, u32 index, bool isLeaf, bool isSilent,
                CheckRecord* record);

// Data of a leaf record, by kind of tree (R01, R03, R04).
void CheckLeafData(const CheckTree& tree, const CheckNode& node, u32 index,
                   const CheckRecord& record);

}  // namespace VELK
