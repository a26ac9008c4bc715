// Shares the records of a full node and one new record with a sibling: _RotateLeft lends from its
// front to the left sibling, _RotateRight from its back to the right one. How many entries go is
// planned by bytes before the first record moves. Parents and sibling links are left alone.
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/own_change.h"
#include "hfs/treehfs/record_move.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/slots.h"

namespace VELK {

namespace {

// The new record among those of the full node: they form one sequence of entries in key order.
struct NewEntry {
    u32 position;  // of the new record in the sequence
    u32 count;     // records of the full node, so the sequence's last position
    u32 keyLength;
    u64 size;  // bytes it takes, slot included
};

struct Plan {
    u32 moved;  // entries that go to the sibling
    bool fits;
};

NewEntry MeasureEntry(const BTHeaderMem* hdr, const HfsNode* node, int index, const BTreeKey* key,
                      u32 dataSize, const HfsConvert* convert) {
    const bool leaf = IsLeaf(node);
    const u32 keyLength =
        convert != nullptr ? GetKeyLengthLe(hdr, key, leaf) : GetKeyLength(hdr, key, leaf);
    const u64 dataBytes = (static_cast<u64>(dataSize) + 3) / 2 * 2;  // even, and the slot
    return {static_cast<u32>(index), NumRecords(node), keyLength,
            dataBytes + PaddedKeySize(keyLength)};
}

// Bytes entry `position` takes in a node, slot included. An accessor's status on failure.
int EntrySize(const BTHeaderMem* hdr, const HfsNode* node, const NewEntry& entry, u32 position,
              u64* size) {
    if (position == entry.position) {
        *size = entry.size;
        return kOk;
    }
    const u32 record = position < entry.position ? position : position - 1;
    unsigned recordSize = 0;
    const int status = node->GetRecordSize(hdr, static_cast<int>(record), &recordSize);
    *size = static_cast<u64>(recordSize) + kSlotSize;
    return status;
}

// The accessor's answer, and report, for a record that no node has room for.
int PastLastRecord(const BTHeaderMem* hdr, const HfsNode* node) {
    unsigned size = 0;
    return node->GetRecordSize(hdr, static_cast<int>(hdr->nodeSize / kSlotSize), &size);
}

// Settles a plan whose last entry may be one too many for the receiver.
Plan Settle(const BTHeaderMem* hdr, u32 taken, u64 giverUsed, u64 receiverUsed, u64 lastSize) {
    if (receiverUsed > hdr->nodeSize) {
        return {taken - 1, giverUsed + lastSize <= hdr->nodeSize};
    }
    return {taken, giverUsed <= hdr->nodeSize};
}

int PlanLeft(const BTHeaderMem* hdr, const HfsNode* left, const HfsNode* node,
             const NewEntry& entry, Plan* plan) {
    unsigned freeBytes = 0;
    HFS_TRY(node->GetNodeFreeSize(hdr, &freeBytes), 1932);
    u64 nodeUsed = hdr->nodeSize - freeBytes + entry.size;
    HFS_TRY(left->GetNodeFreeSize(hdr, &freeBytes), 1935);
    u64 leftUsed = hdr->nodeSize - freeBytes;
    u32 taken = 0;
    u64 size = 0;
    while (leftUsed < nodeUsed) {
        if (taken > entry.count) {
            HFS_TRY(PastLastRecord(hdr, node), 1951);
        }
        HFS_TRY(EntrySize(hdr, node, entry, taken, &size), 1944);
        leftUsed += size;
        nodeUsed = nodeUsed > size ? nodeUsed - size : 0;
        taken += 1;
    }
    *plan = Settle(hdr, taken, nodeUsed, leftUsed, size);
    return kOk;
}

int PlanRight(const BTHeaderMem* hdr, const HfsNode* node, const HfsNode* right,
              const NewEntry& entry, Plan* plan) {
    unsigned freeBytes = 0;
    HFS_TRY(node->GetNodeFreeSize(hdr, &freeBytes), 2049);
    u64 nodeUsed = hdr->nodeSize - freeBytes + entry.size;
    HFS_TRY(right->GetNodeFreeSize(hdr, &freeBytes), 2052);
    u64 rightUsed = hdr->nodeSize - freeBytes;
    u32 taken = 0;
    u64 size = 0;
    while (rightUsed < nodeUsed) {
        if (taken > entry.count) {
            HFS_TRY(PastLastRecord(hdr, node), 2069);
        }
        HFS_TRY(EntrySize(hdr, node, entry, entry.count - taken, &size), 2062);
        rightUsed += size;
        nodeUsed = nodeUsed > size ? nodeUsed - size : 0;
        taken += 1;
    }
    *plan = Settle(hdr, taken, nodeUsed, rightUsed, size);
    return kOk;
}

// Whether records can move between the two without a step that would be refused half-way.
bool CanShare(const BTHeaderMem* hdr, const HfsNode* giver, const HfsNode* receiver,
              const NewEntry& entry) {
    return giver != receiver && entry.position <= entry.count && TableIsSound(hdr, giver) &&
           TableIsSound(hdr, receiver);
}

int LendFront(CBTreeHfs* tree, HfsNode* left, HfsNode* node, u32 count) {
    HFS_TRY(MoveRecordsLeft(tree, left, node, count), 1996);
    return kOk;
}

int LendBack(CBTreeHfs* tree, HfsNode* right, HfsNode* node, u32 count) {
    HFS_TRY(MoveRecordsRight(tree, right, node, count), 2122);
    return kOk;
}

}  // namespace

int CBTreeHfs::_RotateLeft(HfsNode* left, HfsNode* node, int index, const BTreeKey* key,
                           const void* data, unsigned dataSize, int* outIndex, unsigned* outNodeNum,
                           bool* rotated, unsigned* moved, HfsConvert* hook) {
    NoteChange(this);
    *outIndex = 0;
    *outNodeNum = 0;
    *rotated = false;
    *moved = 0;
    HFS_ASSERT((header.attributes & kBTBigKeysMask) != 0, 1925);
    const NewEntry entry = MeasureEntry(&header, node, index, key, dataSize, hook);
    Plan plan{};
    const int status = PlanLeft(&header, left, node, entry, &plan);
    if (status != 0 || !plan.fits) {
        return status;
    }
    if (!CanShare(&header, node, left, entry)) {
        return Fail(kErrCorrupt, kReasonNode, 9220);
    }

    *moved = plan.moved;
    const bool goesLeft = entry.position < plan.moved;
    int lent = LendFront(this, left, node, goesLeft ? entry.position : plan.moved);
    if (lent == kOk && goesLeft) {
        const int last = static_cast<int>(NumRecords(left));
        HFS_TRY(_InsertKeyRecord(left, last, key, entry.keyLength, data, dataSize, hook), 1989);
        *outIndex = last;
        *outNodeNum = left->nodeNum;
        lent = LendFront(this, left, node, plan.moved - entry.position - 1);
    }
    if (lent != kOk) {
        return lent;
    }
    if (entry.position >= plan.moved) {
        const int kept = static_cast<int>(entry.position - plan.moved);
        HFS_TRY(_InsertKeyRecord(node, kept, key, entry.keyLength, data, dataSize, hook), 2007);
        *outIndex = kept;
        *outNodeNum = node->nodeNum;
    }
    *rotated = true;
    return kOk;
}

int CBTreeHfs::_RotateRight(HfsNode* node, HfsNode* right, int index, const BTreeKey* key,
                            const void* data, unsigned dataSize, int* outIndex,
                            unsigned* outNodeNum, unsigned* moved, HfsConvert* hook) {
    NoteChange(this);
    *outIndex = 0;
    *outNodeNum = 0;
    *moved = 0;
    HFS_ASSERT((header.attributes & kBTBigKeysMask) != 0, 2043);
    const NewEntry entry = MeasureEntry(&header, node, index, key, dataSize, hook);
    Plan plan{};
    const int status = PlanRight(&header, node, right, entry, &plan);
    if (status != 0) {
        return status;
    }
    if (!plan.fits) {
        return Fail(kErrInvalid, kReasonInvalid, 2086);
    }
    if (!CanShare(&header, node, right, entry)) {
        return Fail(kErrCorrupt, kReasonNode, 9221);
    }

    *moved = plan.moved;
    const u32 firstMoved = entry.count + 1 - plan.moved;
    const bool goesRight = entry.position >= firstMoved;
    int lent = LendBack(this, right, node, goesRight ? entry.count - entry.position : plan.moved);
    if (lent == kOk && goesRight) {
        if (entry.position == entry.count) {
            HFS_TRY(_InsertKeyRecord(right, 0, key, entry.keyLength, data, dataSize, hook), 2100);
        } else {
            HFS_TRY(_InsertKeyRecord(right, 0, key, entry.keyLength, data, dataSize, hook), 2113);
        }
        *outNodeNum = right->nodeNum;
        *outIndex = static_cast<int>(entry.position - firstMoved);
        lent = LendBack(this, right, node, entry.position - firstMoved);
    }
    if (lent != kOk) {
        return lent;
    }
    if (entry.position < firstMoved) {
        HFS_TRY(_InsertKeyRecord(node, index, key, entry.keyLength, data, dataSize, hook), 2135);
        *outIndex = index;
        *outNodeNum = node->nodeNum;
    }
    return kOk;
}

}  // namespace VELK
