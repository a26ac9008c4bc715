// Strict checks of a node's record offset table. See slots.h.
#include "hfs/treehfs/slots.h"

#include "hfs/treehfs/node_desc.h"

namespace VELK {

namespace {

// Whether descriptor, records and the slots of `count` records fit the node side by side.
bool CountFits(const BTHeaderMem* hdr, u32 count) {
    return kDescSize + kSlotSize * (count + 1) <= hdr->nodeSize;
}

// Four starts in one word, without an instruction a driver could be forbidden to use.
constexpr u32 kTogether = sizeof(u64) / kSlotSize;
constexpr u64 kLowBits = 0x0001000100010001;
constexpr u64 kHighBits = kLowBits << 15;

// Not 0 where one of four starts is odd, or not below the one in the slot before it.
// REQUIRES: none of those before has its high bit set, or one that is wrong is found besides.
u64 WrongStarts(const u8* slots) {
    const u64 starts = GetBe64(slots);
    const u64 before = GetBe64(slots - kSlotSize);
    // A high bit that no difference took away: the start is below.
    const u64 below = (before | kHighBits) - starts - kLowBits;
    return (starts & (kHighBits | kLowBits)) | (~below & kHighBits);
}

// Whether the starts in `count` slots are even and fall, from that in the slot before them on.
// Four are looked at together; the last four may overlap those before.
bool StartsFall(const u8* slots, u32 count) {
    const bool isHigh = (slots[-static_cast<int>(kSlotSize)] & 0x80) != 0;
    if (count < kTogether || isHigh) {
        bool isFalling = true;
        for (const u8* slot = slots; slot < slots + kSlotSize * count; slot += kSlotSize) {
            const u32 start = GetBe16(slot);
            isFalling = isFalling && start < GetBe16(slot - kSlotSize) && (start & 1) == 0;
        }
        return isFalling;
    }
    const u32 last = count - kTogether;
    u64 wrong = WrongStarts(slots + kSlotSize * last);
    for (u32 i = 0; i < last; i += kTogether) {
        wrong |= WrongStarts(slots + kSlotSize * i);
    }
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
    const u32 limit = SlotOffset(hdr, count);
    const u32 free = bytes.U16(limit);
    // In a node whose size is no multiple of a block's, part of the table lies in none.
    if (!bytes.Contains(limit, hdr->nodeSize - limit) || free > limit || (free & 1) != 0 ||
        bytes.U16(SlotOffset(hdr, 0)) < kDescSize) {
        return false;
    }
    for (u32 position = limit;;) {
        const u32 room = bytes.Room(position);
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
