// Strict checks of a node's record offset table. See slots.h.
#include "hfs/treehfs/slots.h"

#include "hfs/treehfs/node_desc.h"

namespace VELK {

namespace {

// Whether descriptor, records and the slots of `count` records fit the node side by side.
bool CountFits(const BTHeaderMem* hdr, u32 count) {
    return kDescSize + kSlotSize * (count + 1) <= hdr->nodeSize;
}

// Whether the starts in `size` bytes of slots are even and fall from `*end` on. The last one comes
// back in its place.
bool StartsFall(const u8* slots, u32 size, u32* end) {
    u32 above = *end;
    u32 wrong = 0;
    for (const u8* slot = slots; slot < slots + size; slot += kSlotSize) {
        const u32 start = GetBe16(slot);
        wrong |= (start >= above ? 1u : 0u) | (start & 1);
        above = start;
    }
    *end = above;
    return wrong == 0;
}

}  // namespace

bool LoadRecordSlots(const BTHeaderMem* hdr, const HfsNode* node, u32 index, RecordSlots* slots) {
    slots->count = NumRecords(node);
    if (index >= slots->count || !CountFits(hdr, slots->count)) {
        return false;
    }
    slots->limit = SlotOffset(hdr, slots->count);
    if (hdr->blockSize == hdr->nodeSize) {
        const u8* table = node->bufs[0].data + SlotOffset(hdr, index);
        slots->start = GetBe16(table);
        slots->end = GetBe16(table - kSlotSize);
        slots->free = GetBe16(node->bufs[0].data + slots->limit);
    } else {
        const NodeBytes bytes(hdr, node);
        slots->start = bytes.U16(SlotOffset(hdr, index));
        slots->end = bytes.U16(SlotOffset(hdr, index + 1));
        slots->free = bytes.U16(slots->limit);
    }
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
    u32 position = SlotOffset(hdr, count) + kSlotSize;
    bool isFalling = true;
    while (position < hdr->nodeSize) {  // a slot lies in one block
        isFalling = StartsFall(bytes.At(position), bytes.Room(position), &end) && isFalling;
        position += bytes.Room(position);
    }
    return isFalling && end >= kDescSize;
}

}  // namespace VELK
