// See mutate_journal.h.
#include "mutate_journal.h"

#include <algorithm>

#include "hfs/volume/journal_format.h"
#include "hfs/volume/volume_header.h"

namespace VELK::fuzz {

namespace {

constexpr u32 kMostLists = 64;
constexpr u32 kMostBlocks = 8;
constexpr u32 kListHeader = 32;
constexpr u32 kBlockEntry = 16;

u64 Number(const u8* at, u32 width, bool isLittle) {
    u64 value = 0;
    for (u32 i = 0; i < width; ++i) {
        value = value << 8 | at[isLittle ? width - 1 - i : i];
    }
    return value;
}

void StoreChecksum(u8* at, u32 value, bool isLittle) {
    for (u32 i = 0; i < 4; ++i) {
        at[isLittle ? i : 3 - i] = static_cast<u8>(value >> (8 * i));
    }
}

// Where the block lists begin that a reader of this journal would meet, one after the other.
std::vector<u64> ListsOf(const u8* journal, u64 size, bool isLittle) {
    std::vector<u64> lists;
    u64 at = Number(journal + 8, 8, isLittle);
    while (lists.size() < kMostLists && at < size && size - at >= kListHeader) {
        lists.push_back(at);
        const u64 used = Number(journal + at + 4, 4, isLittle);
        if (used == 0) {
            break;
        }
        at += used;
    }
    return lists;
}

u32 BlocksWithRoom(u64 size, u64 list) {
    const u64 room = (size - list) / kBlockEntry;
    return room > 2 ? static_cast<u32>(std::min<u64>(room - 2, kMostBlocks)) : 0;
}

// The sectors that the first blocks of a list are made of, as they lie in the journal.
std::vector<u64> SectorsOf(const u8* journal, u64 size, u64 list, bool isLittle) {
    std::vector<u64> sectors;
    u64 at = list + Number(journal + 32, 4, isLittle);
    for (u32 i = 0; i < BlocksWithRoom(size, list); ++i) {
        const u8* entry = journal + list + kListHeader + u64{i} * kBlockEntry;
        const u64 end = std::min(at + Number(entry + 8, 4, isLittle), size);
        for (; at + kJournalSector <= end; at += kJournalSector) {
            sectors.push_back(at);
        }
        at = end;
    }
    return sectors;
}

bool IsVolumeHeader(const u8* sector) {
    const u32 signature = static_cast<u32>(Number(sector, 2, false));
    return signature == kSignatureHfsPlus || signature == kSignatureHfsx;
}

// A field of a volume header, or of what may be a node.
void MutateSector(Mutator* mutator, u8* sector) {
    constexpr u32 kVolumeBlocks = 256;
    if (IsVolumeHeader(sector)) {
        mutator->Field(sector, test::FieldsOfVolumeHeader(), kJournalSector, kVolumeBlocks);
    } else {
        mutator->Node(sector, kJournalSector, kCatalogFileId, kVolumeBlocks);
    }
}

}  // namespace

void FitChecksums(u8* journal, u64 size, u8 how) {
    const bool isLittle = (how & kLittleEndian) != 0;
    if ((how & kFitLists) != 0) {
        for (const u64 list : ListsOf(journal, size, isLittle)) {
            StoreChecksum(journal + list + 8, JournalChecksum(journal + list, kListHeader, 8),
                          isLittle);
        }
    }
    if ((how & kFitHeader) != 0) {
        StoreChecksum(journal + 36, JournalChecksum(journal, kJournalHeaderSize, 36), isLittle);
    }
}

void MutateJournal(Mutator* mutator, u8* journal, u64 size, bool isLittle) {
    const std::vector<u64> lists = ListsOf(journal, size, isLittle);
    if (lists.empty() || mutator->OneIn(4)) {
        mutator->Field(journal, test::FieldsOfJournalHeader(), kJournalSector, size);
        return;
    }
    const u64 list = lists[mutator->Below(static_cast<u32>(lists.size()))];
    const std::vector<u64> sectors = SectorsOf(journal, size, list, isLittle);
    if (!sectors.empty() && mutator->OneIn(2)) {
        MutateSector(mutator, journal + sectors[mutator->Below(static_cast<u32>(sectors.size()))]);
        return;
    }
    mutator->Field(journal + list, test::FieldsOfJournalList(BlocksWithRoom(size, list)),
                   kJournalSector, size);
}

}  // namespace VELK::fuzz
