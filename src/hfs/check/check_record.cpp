// Data of leaf records: types and sizes, by kind of tree.
#include "hfs/check/check_records.h"

#include "hfs/check/check_tree.h"

namespace VELK {
namespace {

CheckPlace DataPlace(const CheckTree& tree, const CheckNode& node, u32 index,
                     const CheckRecord& record, u32 offset) {
    return tree.Place(node.nodeNum, record.dataOffset + offset, index);
}

void CheckSize(const CheckTree& tree, const CheckNode& node, u32 index, const CheckRecord& record,
               CheckId id, const char* what, u32 expected) {
    if (record.dataSize != expected) {
        tree.run->Error(id, DataPlace(tree, node, index, record, 0),
                        CheckPrint("%s of %u bytes, expected %u", what, record.dataSize, expected),
                        expected, record.dataSize);
    }
}

void CheckThreadData(const CheckTree& tree, const CheckNode& node, u32 index,
                     const CheckRecord& record) {
    if (record.dataSize < kThreadFixed) {
        CheckSize(tree, node, index, record, CheckId::R01, "thread record", kThreadFixed);
        return;
    }
    const u32 nameLength = Load16(record.data + kThreadNameLength);
    if (nameLength == 0 || nameLength > kCatMaxName) {
        tree.run->Error(CheckId::R01, DataPlace(tree, node, index, record, kThreadNameLength),
                        CheckPrint("thread with a name of %u units, expected 1 to %u", nameLength,
                                   kCatMaxName));
        return;
    }
    CheckSize(tree, node, index, record, CheckId::R01, "thread record",
              kThreadFixed + 2 * nameLength);
}

void CheckCatalogData(const CheckTree& tree, const CheckNode& node, u32 index,
                      const CheckRecord& record) {
    if (record.dataSize < 2) {
        tree.run->Error(CheckId::R01, DataPlace(tree, node, index, record, 0),
                        "the record holds no type");
        return;
    }
    const u32 type = Load16(record.data);
    const bool isThread = type == kCatFolderThread || type == kCatFileThread;
    const bool isItem = type == kCatFolder || type == kCatFile;
    if (!isThread && !isItem) {
        tree.run->Error(CheckId::R01, DataPlace(tree, node, index, record, 0),
                        CheckPrint("record type is 0x%04x, expected 1 to 4", type));
        return;
    }
    const u32 nameLength = Load16(record.key + kCatKeyNameLength);
    if (isThread != (nameLength == 0)) {
        tree.run->Error(CheckId::R01, tree.Place(node.nodeNum, node.Start(index), index),
                        isThread ? "a thread record under a key with a name"
                                 : "a file or folder record under a key without a name");
    }
    if (isThread) {
        CheckThreadData(tree, node, index, record);
    } else if (type == kCatFolder) {
        CheckSize(tree, node, index, record, CheckId::R01, "folder record", kFolderRecordSize);
    } else {
        CheckSize(tree, node, index, record, CheckId::R01, "file record", kFileRecordSize);
    }
}

void CheckExtentsData(const CheckTree& tree, const CheckNode& node, u32 index,
                      const CheckRecord& record) {
    if (record.dataSize != kExtentRecordSize) {
        CheckSize(tree, node, index, record, CheckId::R03, "extents record", kExtentRecordSize);
        return;
    }
    CheckExtentPacking(tree, CheckId::R03, node, index, record.dataOffset);
    if (Load32(record.data + 4) == 0) {
        tree.run->Warn(CheckId::R03, DataPlace(tree, node, index, record, 0),
                       "the extents record describes no block");
    }
}

void CheckInlineAttribute(const CheckTree& tree, const CheckNode& node, u32 index,
                          const CheckRecord& record) {
    const u32 valueSize = Load32(record.data + kAttrInlineSize);
    const u64 wanted = u64{kAttrInlineData} + valueSize;
    const unsigned long long padded = wanted + wanted % 2;
    if (wanted != record.dataSize && padded != record.dataSize) {
        tree.run->Error(CheckId::R04, DataPlace(tree, node, index, record, kAttrInlineSize),
                        CheckPrint("a value of %u bytes takes a record of %llu, the record has %u",
                                   valueSize, padded, record.dataSize),
                        padded, record.dataSize);
    }
}

void CheckAttributeData(const CheckTree& tree, const CheckNode& node, u32 index,
                        const CheckRecord& record) {
    const CheckPlace place = DataPlace(tree, node, index, record, 0);
    const u32 type = record.dataSize < 4 ? 0 : Load32(record.data);
    const u32 startBlock = Load32(record.key + kAttrKeyStartBlock);
    if (type == kAttrExtents) {
        CheckSize(tree, node, index, record, CheckId::R04, "attribute extents record",
                  kAttrExtentsSize);
        if (record.dataSize == kAttrExtentsSize) {
            CheckExtentPacking(tree, CheckId::R04, node, index,
                               record.dataOffset + kAttrExtentsRuns);
        }
        if (startBlock == 0) {
            tree.run->Error(CheckId::R04, place, "attribute extents under start block 0");
        }
        return;
    }
    if (type == kAttrFork) {
        CheckSize(tree, node, index, record, CheckId::R04, "attribute fork record", kAttrForkSize);
        if (record.dataSize == kAttrForkSize) {
            CheckExtentPacking(tree, CheckId::R04, node, index,
                               record.dataOffset + kAttrForkData + kForkExtents);
        }
    } else if (type == kAttrInline && record.dataSize >= kAttrInlineData) {
        CheckInlineAttribute(tree, node, index, record);
    } else if (type == kAttrInline || record.dataSize < 4) {
        tree.run->Error(CheckId::R04, place,
                        CheckPrint("attribute record of %u bytes is too short", record.dataSize));
    } else {
        tree.run->Warn(CheckId::R04, place,
                       CheckPrint("attribute type is 0x%08x, known are 0x10, 0x20 and 0x30", type));
        return;
    }
    if (startBlock != 0) {
        tree.run->Error(CheckId::R04, tree.Place(node.nodeNum, node.Start(index), index),
                        CheckPrint("attribute that starts at block %u, expected 0", startBlock), 0,
                        startBlock);
    }
}

}  // namespace

void CheckExtentPacking(const CheckTree& tree, CheckId id, const CheckNode& node, u32 index,
                        u32 offset) {
    bool isOver = false;
    for (u32 i = 0; i < kExtentCount; ++i) {
        const u32 at = offset + i * kExtentSize;
        const u32 start = Load32(node.bytes + at);
        const u32 count = Load32(node.bytes + at + 4);
        if (isOver && count != 0) {
            tree.run->Error(id, tree.Place(node.nodeNum, at, index),
                            CheckPrint("run %u (block %u, %u blocks) stands behind an empty one", i,
                                       start, count));
            return;
        }
        isOver = isOver || count == 0;
        if (isOver && start != 0) {
            tree.run->Warn(id, tree.Place(node.nodeNum, at, index),
                           CheckPrint("run %u starts at block %u but is empty", i, start));
            return;
        }
    }
}

void CheckLeafData(const CheckTree& tree, const CheckNode& node, u32 index,
                   const CheckRecord& record) {
    switch (tree.FileId()) {
        case kCatalogFileId:
            CheckCatalogData(tree, node, index, record);
            break;
        case kExtentsFileId:
            CheckExtentsData(tree, node, index, record);
            break;
        default:
            CheckAttributeData(tree, node, index, record);
            break;
    }
}

bool IsDataUsable(const CheckTree& tree, const CheckRecord& record) {
    if (tree.FileId() == kExtentsFileId) {
        return record.dataSize == kExtentRecordSize;
    }
    if (tree.FileId() == kAttributesFileId) {
        const u32 type = record.dataSize < 4 ? 0 : Load32(record.data);
        return type == kAttrInline || (type == kAttrFork && record.dataSize == kAttrForkSize) ||
               (type == kAttrExtents && record.dataSize == kAttrExtentsSize);
    }
    const u32 type = record.dataSize < 2 ? 0 : Load16(record.data);
    switch (type) {
        case kCatFolder:
            return record.dataSize == kFolderRecordSize;
        case kCatFile:
            return record.dataSize == kFileRecordSize;
        case kCatFolderThread:
        case kCatFileThread:
            return record.dataSize >= kThreadFixed &&
                   record.dataSize >= kThreadFixed + 2 * Load16(record.data + kThreadNameLength);
        default:
            return false;
    }
}

}  // namespace VELK
