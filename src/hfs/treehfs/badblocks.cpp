// Bad-block list: the extents of file 5 in the extents overflow tree, turned into runs of a map.
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

constexpr u32 kWholeVolumeHole = 0xFFFFFFFFu;

// Adds the runs of one extent record; `run` counts those of all records.
bool AddRuns(const CFileSystemHfs* volume, HfsRuns* runs, u32 vcn, u32* run) {
    for (u32 i = 0; i < kExtentCount; ++i) {
        const u8* extent = volume->badBlockRecord + i * (kExtentRecordSize / kExtentCount);
        const u32 start = GetBe32(extent);
        const u32 count = GetBe32(extent + 4);
        if (count == 0) {
            break;
        }
        HFS_TRACE("Bad block %u: [0x%x 0x%x)\n", *run, start, start + count);
        if (*run == 0 && !runs->AddEntry(0, kWholeVolumeHole, volume->totalBlocks)) {
            return false;
        }
        if (!runs->AddEntry(vcn, start, count)) {
            return false;
        }
        vcn += count;
        *run += 1;
    }
    return true;
}

// Place of an extents key within its file: fork type, then start block.
u64 PlaceOf(const u8* key) {
    return (static_cast<u64>(key[kExtKeyForkType]) << 32) | GetBe32(key + kExtKeyStartBlock);
}

// Steps to the next record of the bad-block file. Keys that do not rise are a ring of leaves; it
// and every other failure end the list, which stands as far as it was read.
bool StepToNext(CBTreeHfs* tree, u64* place) {
    CFileSystemHfs* volume = tree->volume;
    unsigned recordSize = 0;
    unsigned keySize = 0;
    if (tree->IncPos(1, volume->badBlockRecord, kExtentRecordSize, &recordSize, volume->badBlockKey,
                     kExtKeySize, &keySize, nullptr) != kOk) {
        return false;
    }
    if (recordSize != kExtentRecordSize || keySize != kExtKeySize ||
        GetBe32(volume->badBlockKey + kExtKeyFileId) != kBadBlockFileId) {
        return false;
    }
    const u64 before = *place;
    *place = PlaceOf(volume->badBlockKey);
    return *place > before;
}

}  // namespace

int CBTreeHfs::LoadBadBlocks(HfsRuns* badRuns) {
    u8* key = volume->badBlockKey;
    key[kExtKeyForkType] = kForkData;
    PutBe32(key + kExtKeyStartBlock, 0);
    unsigned recordSize = 0;
    const int status = FindRecord(key, kBadBlockFileId, volume->badBlockRecord, kExtentRecordSize,
                                  &recordSize, nullptr);
    if (status == kErrNotFound) {
        return kOk;
    }
    HFS_TRY(status, 3385);
    if (recordSize != kExtentRecordSize) {
        AssertFailed(3389);
        return kErrBadRecord;
    }
    u32 run = 0;
    u64 place = 0;
    do {
        if (!AddRuns(volume, badRuns, static_cast<u32>(place), &run)) {
            return kErrNoMemory;
        }
    } while (StepToNext(this, &place));
    return kOk;
}

}  // namespace VELK
