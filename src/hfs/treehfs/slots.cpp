// Strict checks of a node's record offset table. See slots.h.
#include "hfs/treehfs/slots.h"

#include "hfs/treehfs/node_desc.h"

namespace VELK {

namespace {

// Whether descriptor, records and the slots of `count` records fit the node side by side.
bool CountFits(const BTHeaderMem* hdr, u32 count) {
    return kDescSize + kSlotSize * (count + 1) <= hdr->nodeSize;
}

}  // namespace

bool LoadRecordSlots(const BTHeaderMem* hdr, const HfsNode* node, u32 index, RecordSlots* slots) {
    slots->count = NumRecords(node);
    if (index >= slots->count || !CountFits(hdr, slots->count)) {
        return false;
    }
    const NodeBytes bytes(hdr, node);
    slots->limit = SlotOffset(hdr, slots->count);
    slots->start = bytes.U16(SlotOffset(hdr, index));
    slots->end = bytes.U16(SlotOffset(hdr, index + 1));
    slots->free = bytes.U16(slots->limit);
    return kDescSize <= slots->start && slots->start < slots->end && slots->end <= slots->free &&
           slots->free <= slots->limit && ((slots->start | slots->end | slots->free) & 1) == 0;
}

bool TableIsSound(const BTHeaderMem* hdr, const HfsNode* node) {
    const u32 count = NumRecords(node);
    if (!CountFits(hdr, count)) {
        return false;
    }
    const NodeBytes bytes(hdr, node);
    u32 end = bytes.U16(SlotOffset(hdr, count));
    if (end > SlotOffset(hdr, count) || (end & 1) != 0) {
        return false;
    }
    for (u32 index = count; index > 0; --index) {
        const u32 start = bytes.U16(SlotOffset(hdr, index - 1));
        if (start >= end || (start & 1) != 0) {
            return false;
        }
        end = start;
    }
    return end >= kDescSize;
}

}  // namespace VELK
