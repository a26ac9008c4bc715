// Moves one record between two neighbouring nodes: a copy goes into one, then the record leaves
// the other. Neither looks at parents or sibling links.
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/slots.h"

namespace VELK {

int CBTreeHfs::_RotateRecordLeft(HfsNode* left, HfsNode* right) {
    NodeKey source{};
    HFS_TRY(right->GetKey(&header, 0, &source), 1616);
    RecordSlots slots;
    if (left == right || !LoadRecordSlots(&header, right, 0, &slots)) {
        return Fail(kErrCorrupt, kReasonNode, 9211);
    }
    NodeKey target{};
    HFS_TRY(_InsertRecord(left, -1, source.size, &target, nullptr), 1623);
    CopyBetween(NodeBytes(&header, left), target.offset, NodeBytes(&header, right), source.offset,
                source.size);
    HFS_TRY(_DeleteRecord(right, 0), 1675);
    return kOk;
}

int CBTreeHfs::_RotateRecordRight(HfsNode* right, HfsNode* left) {
    const int last = static_cast<int>(NumRecords(left)) - 1;
    NodeKey source{};
    HFS_TRY(left->GetKey(&header, last, &source), 1698);
    RecordSlots slots;
    if (left == right || !LoadRecordSlots(&header, left, static_cast<u32>(last), &slots)) {
        return Fail(kErrCorrupt, kReasonNode, 9212);
    }
    NodeKey target{};
    HFS_TRY(_InsertRecord(right, 0, source.size, &target, nullptr), 1705);
    CopyBetween(NodeBytes(&header, right), target.offset, NodeBytes(&header, left), source.offset,
                source.size);
    HFS_TRY(_DeleteRecord(left, last), 1761);
    return kOk;
}

}  // namespace VELK
