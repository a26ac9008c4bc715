// Strict checks of a node's record offset table. See slots.h.
#include "hfs/treehfs/slots.h"

#include <bit>

#include "hfs/treehfs/node_desc.h"

namespace VELK {

namespace {

// Whether descriptor, records and the slots of `count` records fit the node side by side.
bool CountFits(const BTHeaderMem* hdr, u32 count) {
    return kDescSize + kSlotSize * (count + 1) <= hdr->nodeSize;
}

constexpr u32 kTogether = sizeof(U16x8) / kSlotSize;

// Not 0 where a start is odd, or not below the one in the slot before it.
U16x8 WrongStarts(const u8* slots) {
    const U16x8 starts = GetBe16x8(slots);
    return (starts & 1) | reinterpret_cast<U16x8>(starts >= GetBe16x8(slots - kSlotSize));
}

// Whether the starts in `count` slots are even and fall, from that in the slot before them on.
// Eight are looked at together; the last eight may overlap those before.
bool StartsFall(const u8* slots, u32 count) {
    if (count < kTogether) {
        bool isFalling = true;
        for (const u8* slot = slots; slot < slots + kSlotSize * count; slot += kSlotSize) {
            const u32 start = GetBe16(slot);
            isFalling = isFalling && start < GetBe16(slot - kSlotSize) && (start & 1) == 0;
        }
        return isFalling;
    }
    const u32 last = count - kTogether;
    U16x8 wrong = WrongStarts(slots + kSlotSize * last);
    for (u32 i = 0; i < last; i += kTogether) {
        wrong |= WrongStarts(slots + kSlotSize * i);
    }
    struct Halves {
        u64 low, high;
    };
    const Halves halves = std::bit_cast<Halves>(wrong);
    return (halves.low | halves.high) == 0;
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
    const u32 limit = SlotOffset(hdr, count);
    const u32 free = bytes.U16(limit);
    if (free > limit || (free & 1) != 0 || bytes.U16(SlotOffset(hdr, 0)) < kDescSize) {
        return false;
    }
    for (u32 position = limit;;) {
        const u32 left = hdr->nodeSize - position;
        const u32 room = bytes.Room(position) < left ? bytes.Room(position) : left;
        if (!StartsFall(bytes.At(position) + kSlotSize, room / kSlotSize - 1)) {
            return false;
        }
        position += room;
        if (position == hdr->nodeSize) {
            return true;
        }
        const u32 start = bytes.U16(position);  // the slot before it lies in another block
        if (start >= bytes.U16(position - kSlotSize) || (start & 1) != 0) {
            return false;
        }
    }
}

}  // namespace VELK
