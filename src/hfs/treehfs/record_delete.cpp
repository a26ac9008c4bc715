// Takes one record out of one node and closes the gap. Looks at no other node.
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/one_piece.h"
#include "hfs/treehfs/own_change.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/slots.h"

namespace VELK {

namespace {

// Gives every slot from `slot` up to `end` the value of its lower neighbour, `lower` for the first
// of them, less the deleted bytes. Returns what the last one held.
u32 CloseRun(u8* slot, u8* const end, u32 lower, u32 removed) {
    for (; slot < end; slot += kSlotSize) {
        HFS_ASSERT(lower > removed, 1082);
        const u32 value = GetBe16(slot);
        PutBe16(slot, lower - removed);
        lower = value;
    }
    return lower;
}

// Gives every slot from that of the record before the last up to that of the record behind the
// deleted one the value of its lower neighbour, less the deleted bytes. Blocks are marked as the
// walk enters them; a failure leaves the slots before in place.
int CloseSlots(CBTreeHfs* tree, HfsNode* node, const RecordSlots& slots, u32 index) {
    const NodeBytes bytes(&tree->header, node);
    const u32 removed = slots.end - slots.start;
    const u32 end = SlotOffset(&tree->header, index);
    u32 position = slots.limit + kSlotSize;
    u32 lower = slots.free;  // value of the slot below `position` before the change
    while (position < end) {
        if (bytes.Room(position - kSlotSize) == kSlotSize) {
            HFS_TRY(MarkDirty(tree, node, position), 1074);
        }
        u32 piece = bytes.Room(position);
        if (piece > end - position) {
            piece = end - position;
        }
        u8* slot = bytes.At(position);
        lower = CloseRun(slot, slot + piece, lower, removed);
        position += piece;
    }
    return kOk;
}

// CloseGap in a node that lies in one piece and was marked before: no step can be refused. False:
// nothing has changed.
bool ClosePlainGap(CBTreeHfs* tree, HfsNode* node, const RecordSlots& slots, u32 index) {
    if (!IsMarkedPiece(&tree->header, node)) {
        return false;
    }
    const PlainBytes bytes(&tree->header, node);
    u8* const data = bytes.At(0);
    bytes.Move(slots.start, slots.end, slots.free - slots.end);
    const u32 removed = slots.end - slots.start;
    PutBe16(data + slots.limit, 0);
    CloseRun(data + slots.limit + kSlotSize, data + SlotOffset(&tree->header, index), slots.free,
             removed);
    SetNumRecords(&tree->header, node, slots.count - 1);
    node->modifiedLink.MoveTail(&tree->modifiedList);
    return true;
}

// Closes the gap that record `index` leaves.
int CloseGap(CBTreeHfs* tree, HfsNode* node, const RecordSlots& slots, u32 index) {
    if (HFS_LIKELY(ClosePlainGap(tree, node, slots, index))) {
        return kOk;
    }
    HFS_TRY(MarkDirty(tree, node, slots.limit), 962);
    HFS_TRY(MarkDirty(tree, node, slots.start, slots.free - slots.start), 1011);
    const NodeBytes bytes(&tree->header, node);
    bytes.Move(slots.start, slots.end, slots.free - slots.end);

    HFS_TRY(MarkDirty(tree, node, 0), 1054);
    SetNumRecords(&tree->header, node, slots.count - 1);
    bytes.SetU16(slots.limit, 0);
    return CloseSlots(tree, node, slots, index);
}

}  // namespace

int CBTreeHfs::_DeleteRecord(HfsNode* node, int index) {
    NoteChange(this);
    const u32 count = NumRecords(node);
    const u32 record = index == -1 ? count - 1 : static_cast<u32>(index);
    HFS_ASSERT(record < count, 943);
    RecordSlots slots;
    if (!LoadRecordSlots(&header, node, record, &slots)) {
        return Fail(kErrCorrupt, kReasonNode, 9210);
    }
    const int status = CloseGap(this, node, slots, record);
    if (status != kOk) {
        ForgetRecords(this, node);
    } else if (node->hints != nullptr) {
        Hints(this, node).Remove(record, 1);
    }
    return status;
}

}  // namespace VELK
