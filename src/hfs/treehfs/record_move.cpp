// Moves records between two neighbouring nodes: a copy goes into one, then the record leaves the
// other. Neither looks at parents or sibling links.
#include "hfs/treehfs/record_move.h"

#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/one_piece.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/slots.h"

namespace VELK {

namespace {

// A node that lies in one piece, as a run of records with the table of where they start.
class Table {
public:
    Table(const BTHeaderMem* hdr, const HfsNode* node)
        : bytes_(hdr, node), count_(NumRecords(node)) {}

    // REQUIRES of all: the table is sound, and has room for the slots named.
    u32 Count() const { return count_; }
    u32 Start(u32 index) const { return GetBe16(Slot(index)); }
    u32 Free() const { return Start(count_); }
    u32 Room() const { return SlotAt(count_) - Free(); }
    u32 KeyLength(u32 index) const { return GetBe16(bytes_.At(Start(index))); }
    const PlainBytes& Bytes() const { return bytes_; }

    // Copies `count` slots of `other`, which may be this table, and moves what they say by `by`.
    void TakeStarts(u32 at, const Table& other, u32 from, u32 count, u32 by) const {
        u8* const slots = Slot(at + count - 1);
        bytes_.CopyIn(SlotAt(at + count - 1), other.Slot(from + count - 1), kSlotSize * count);
        for (u8* slot = slots; slot < slots + kSlotSize * count; slot += kSlotSize) {
            PutBe16(slot, GetBe16(slot) + by);
        }
    }
    void ClearStarts(u32 first, u32 count) const {
        bytes_.Fill(SlotAt(first + count - 1), 0, kSlotSize * count);
    }
    void SetCount(u32 count) const { PutBe16(bytes_.At(kDescNumRecords), count); }

private:
    u32 SlotAt(u32 index) const { return bytes_.Size() - kSlotSize * (index + 1); }
    u8* Slot(u32 index) const { return bytes_.At(SlotAt(index)); }

    PlainBytes bytes_;
    u32 count_;
};

// A node that was marked before becomes the last that was.
void MarkAgain(CBTreeHfs* tree, HfsNode* node) {
    node->modifiedLink.MoveTail(&tree->modifiedList);
}

// Whether GetKey has nothing to say of the record, wherever it lies.
[[gnu::always_inline]] inline bool IsPlain(const BTHeaderMem* hdr, const Table& table, u32 index) {
    const u32 data = table.Start(index) + PaddedKeySize(table.KeyLength(index));
    return CanMoveData(hdr, data, table.Start(index + 1));
}

// Whether records first .. first + count - 1 of `giver` can go to `receiver` in one go: nothing on
// the way can be refused. REQUIRES: both tables are sound.
bool CanMoveAtOnce(const CBTreeHfs* tree, const HfsNode* giver, const HfsNode* receiver, u32 first,
                   u32 count) {
    const BTHeaderMem* hdr = &tree->header;
    if (!IsMarkedPiece(hdr, giver) || !IsMarkedPiece(hdr, receiver) ||
        !LieApart(hdr, giver, receiver)) {
        return false;
    }
    const Table table(hdr, giver);
    const u32 size = table.Start(first + count) - table.Start(first);
    if (size + count * kSlotSize > Table(hdr, receiver).Room()) {
        return false;
    }
    for (u32 i = first; i < first + count; ++i) {
        if (!IsPlain(hdr, table, i)) {
            return false;
        }
    }
    return true;
}

// Whether records can go in front of those of `receiver`: the first of these is looked at then.
// REQUIRES: CanMoveAtOnce.
bool CanMoveInFront(const CBTreeHfs* tree, const HfsNode* receiver) {
    const Table table(&tree->header, receiver);
    return table.Count() == 0 || IsPlain(&tree->header, table, 0);
}

// What the nodes remember of `count` records that went from place `first` of one to place `at` of
// the other. Neighbours are of one kind, but one may have come without room for hints.
void MoveHints(const CBTreeHfs* tree, const HfsNode* giver, u32 first, const HfsNode* receiver,
               u32 at, u32 count) {
    if (receiver->hints != nullptr) {
        Hints(tree, receiver).Insert(at, count);
    }
    if (giver->hints != nullptr && receiver->hints != nullptr) {
        Hints(tree, receiver).Take(at, Hints(tree, giver), first, count);
    }
    if (giver->hints != nullptr) {
        Hints(tree, giver).Remove(first, count);
    }
}

// Closes the gap that the first `count` records of `table` leave, as if they had left one by one:
// each leaves the last bytes there were, as many as it had, once more in front of those that the
// ones before it left.
void CloseFront(const Table& table, u32 count) {
    const u32 base = table.Start(0);
    const u32 free = table.Free();
    const u32 gap = table.Start(count) - base;
    table.Bytes().Move(base, base + gap, free - base - gap);
    for (u32 i = count - 1; i > 0; --i) {
        const u32 before = table.Start(i) - base;
        const u32 size = table.Start(i + 1) - table.Start(i);
        table.Bytes().Move(free - before - size, free - size, size);
    }
    table.TakeStarts(0, table, count, table.Count() - count + 1, 0 - gap);
    table.ClearStarts(table.Count() - count + 1, count);
    table.SetCount(table.Count() - count);
}

// The first `count` records of `right` behind those of `left`.
void MoveFront(const CBTreeHfs* tree, HfsNode* left, HfsNode* right, u32 count) {
    const BTHeaderMem* hdr = &tree->header;
    const Table from(hdr, right);
    const Table to(hdr, left);
    const u32 base = from.Start(0);
    const u32 free = to.Free();
    to.Bytes().CopyIn(free, from.Bytes().At(base), from.Start(count) - base);
    to.TakeStarts(to.Count() + 1, from, 1, count, free - base);
    to.SetCount(to.Count() + count);
    CloseFront(from, count);
    MoveHints(tree, right, 0, left, to.Count(), count);
}

// The last `count` records of `left` in front of those of `right`.
void MoveBack(const CBTreeHfs* tree, HfsNode* right, HfsNode* left, u32 count) {
    const BTHeaderMem* hdr = &tree->header;
    const Table from(hdr, left);
    const Table to(hdr, right);
    const u32 first = from.Count() - count;
    const u32 start = from.Start(first);
    const u32 size = from.Free() - start;
    const u32 base = to.Start(0);
    to.Bytes().Move(base + size, base, to.Free() - base);
    to.Bytes().CopyIn(base, from.Bytes().At(start), size);
    to.TakeStarts(count, to, 0, to.Count() + 1, size);
    to.TakeStarts(0, from, first, count, base - start);
    to.SetCount(to.Count() + count);
    from.ClearStarts(first + 1, count);
    from.SetCount(first);
    MoveHints(tree, left, first, right, 0, count);
}

}  // namespace

// Records go one by one only as long as that may be refused: until all blocks of both nodes are
// announced as changed.
int MoveRecordsLeft(CBTreeHfs* tree, HfsNode* left, HfsNode* right, u32 count) {
    for (; count > 0; --count) {
        if (CanMoveAtOnce(tree, right, left, 0, count)) {
            MoveFront(tree, left, right, count);
            MarkAgain(tree, left);
            MarkAgain(tree, right);
            return kOk;
        }
        const int status = tree->_RotateRecordLeft(left, right);
        if (status != kOk) {
            return status;
        }
    }
    return kOk;
}

int MoveRecordsRight(CBTreeHfs* tree, HfsNode* right, HfsNode* left, u32 count) {
    for (; count > 0; --count) {
        if (CanMoveAtOnce(tree, left, right, NumRecords(left) - count, count) &&
            CanMoveInFront(tree, right)) {
            MoveBack(tree, right, left, count);
            MarkAgain(tree, right);
            MarkAgain(tree, left);
            return kOk;
        }
        const int status = tree->_RotateRecordRight(right, left);
        if (status != kOk) {
            return status;
        }
    }
    return kOk;
}

int CBTreeHfs::_RotateRecordLeft(HfsNode* left, HfsNode* right) {
    NodeKey source;
    HFS_TRY(right->GetKey(&header, 0, &source), 1616);
    RecordSlots slots;
    if (left == right || !LoadRecordSlots(&header, right, 0, &slots)) {
        return Fail(kErrCorrupt, kReasonNode, 9211);
    }
    NodeKey target;
    HFS_TRY(_InsertRecord(left, -1, source.size, &target, nullptr), 1623);
    CopyBetween(NodeBytes(&header, left), target.offset, NodeBytes(&header, right), source.offset,
                source.size);
    HFS_TRY(_DeleteRecord(right, 0), 1675);
    return kOk;
}

int CBTreeHfs::_RotateRecordRight(HfsNode* right, HfsNode* left) {
    const int last = static_cast<int>(NumRecords(left)) - 1;
    NodeKey source;
    HFS_TRY(left->GetKey(&header, last, &source), 1698);
    RecordSlots slots;
    if (left == right || !LoadRecordSlots(&header, left, static_cast<u32>(last), &slots)) {
        return Fail(kErrCorrupt, kReasonNode, 9212);
    }
    NodeKey target;
    HFS_TRY(_InsertRecord(right, 0, source.size, &target, nullptr), 1705);
    CopyBetween(NodeBytes(&header, right), target.offset, NodeBytes(&header, left), source.offset,
                source.size);
    HFS_TRY(_DeleteRecord(left, last), 1761);
    return kOk;
}

}  // namespace VELK
