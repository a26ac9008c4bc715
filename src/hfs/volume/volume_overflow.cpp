// Keeps the overflow records of the extents tree in step with forks of more than eight extents.
//
// A fork changes its size inside an operation of its own tree, when no other tree may be entered.
// So the records are brought up to date at commit, and the extents tree is flushed after that.
#include <cstring>

#include "hfs/volume/extents_key.h"
#include "hfs/volume/volume_state.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

std::vector<OverflowRecord> WantedRecords(const HfsRuns& runs) {
    std::vector<OverflowRecord> records;
    for (u32 i = kExtentCount; i < runs.Count(); i += kExtentCount) {
        OverflowRecord record{};
        record.startBlock = runs.At(i).vcn;
        for (u32 j = 0; j < kExtentCount && i + j < runs.Count(); ++j) {
            record.extents[j] = {runs.At(i + j).lcn, runs.At(i + j).length};
        }
        records.push_back(record);
    }
    return records;
}

bool Contains(const std::vector<OverflowRecord>& records, const OverflowRecord& record) {
    for (const OverflowRecord& other : records) {
        if (other == record) {
            return true;
        }
    }
    return false;
}

// Records go into the extents tree as they are on disk.
int InsertOverflow(CBTreeHfs* tree, u32 fileId, const OverflowRecord& record) {
    alignas(8) u8 bytes[kExtentRecordSize];
    for (u32 i = 0; i < kExtentCount; ++i) {
        StoreBe32(bytes + 8 * i, record.extents[i].startBlock);
        StoreBe32(bytes + 8 * i + 4, record.extents[i].blockCount);
    }
    const ExtentsKey key(fileId, record.startBlock);
    return tree->InsertRecord(key.bytes, fileId, bytes, sizeof bytes);
}

}  // namespace

int ImageVolume::State::SettleOverflow(u32 fileId) {
    SpecialFile* file = File(fileId);
    const std::vector<OverflowRecord> wanted = WantedRecords(*file->runs);
    if (wanted == file->overflow || file->problem) {
        return kOk;
    }
    CBTreeHfs* tree = Open(kExtentsFileId);
    if (tree == nullptr) {
        return kErrNoSpace;
    }
    for (const OverflowRecord& record : file->overflow) {
        if (!Contains(wanted, record)) {
            const ExtentsKey key(fileId, record.startBlock);
            const int status = tree->DeleteRecord(key.bytes, fileId, false);
            if (status != kOk) {
                return status;
            }
        }
    }
    for (const OverflowRecord& record : wanted) {
        if (!Contains(file->overflow, record)) {
            const int status = InsertOverflow(tree, fileId, record);
            if (status != kOk) {
                return status;
            }
        }
    }
    file->overflow = wanted;
    return kOk;
}

}  // namespace VELK
