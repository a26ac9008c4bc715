// Overwrites the data of the record at the tree's own position. The record keeps its size, its
// place and its key; no header field changes.
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/path_level.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/scratch.h"
#include "hfs/treehfs/slots.h"

namespace VELK {

namespace {

// Writes `size` bytes of host-form data at `offset`, which the caller marked modified.
int WriteData(CBTreeHfs* tree, HfsNode* node, const NodeKey& record, u32 offset, const void* data) {
    const NodeBytes bytes(&tree->header, node);
    const auto toDisk = tree->convert.DataToDisk;
    if (toDisk == nullptr) {
        bytes.CopyIn(offset, data, record.dataSize);
        return kOk;
    }
    if (record.dataSize <= record.dataFirstBytes) {
        toDisk(record.data, data, record.dataSize);
        return kOk;
    }
    u8* piece = DataScratch(tree, record.dataSize);
    if (piece == nullptr) {
        return Fail(kErrCorrupt, kReasonNode, 9213);
    }
    toDisk(piece, data, record.dataSize);
    HFS_ASSERT(record.dataSize > record.dataFirstBytes, 294);
    bytes.CopyIn(offset, piece, record.dataSize);
    return kOk;
}

}  // namespace

int CBTreeHfs::UpdateKeyAndRecord(const void* key, const void* data) {
    HFS_ASSERT(key != nullptr || data != nullptr, 3548);
    if (!StandsOnLeaf(&findData, 0)) {
        return Fail(kErrInvalid, kReasonInvalid, 9214);
    }
    HfsNode* node = findData.path[findData.level].node;
    const int index = findData.path[findData.level].index;
    NodeKey record;
    HFS_TRY(node->GetKey(&header, index, &record), 3556);
    HFS_ASSERT(key == nullptr, 3559);
    if (data == nullptr) {
        return kOk;
    }

    RecordSlots slots;
    if (!LoadRecordSlots(&header, node, static_cast<u32>(index), &slots)) {
        return Fail(kErrCorrupt, kReasonNode, 9215);
    }
    if (header.blocksPerNode > 1) {
        HFS_TRY(EnsureScratch(this), 9216);
    }
    const u32 offset = record.offset + record.size - record.dataSize;
    HFS_TRY(MarkDirty(this, node, offset, record.dataSize), 3586);
    return WriteData(this, node, record, offset, data);
}

}  // namespace VELK
