// The records of a journal: info block, journal header, block lists. Decoded into host order with
// every bound checked, encoded back in the byte order the journal was made with.
//
// A journal is a ring: the bytes from `sectorSize` to `size`, where whatever runs over the end goes
// on at the start. Positions count from the journal header.
#pragma once

#include <string>
#include <vector>

#include "platform/types.h"

namespace VELK {

constexpr u32 kJournalInfoSize = 180;
constexpr u32 kJournalHeaderSize = 44;  // alone in its sector
constexpr u32 kJournalSector = 512;     // everything in a journal is a multiple of it
constexpr u32 kSmallestList = 512;      // block list header
constexpr u32 kLargestList = 1u << 20;
constexpr u32 kUsualList = 4096;

// Flags of the info block.
constexpr u32 kJournalInVolume = 1;
constexpr u32 kJournalElsewhere = 2;
constexpr u32 kJournalNeedsInit = 4;

// Last mounted version of those who keep the journal; after any other writer what waits in it is
// out of date.
constexpr u32 kKeeperCode = 0x7472654A;  // "treJ", this layer
constexpr u32 kNativeKeeper = 0x4846534A;

inline bool KeepsJournal(u32 lastMountedVersion) {
    return lastMountedVersion == kKeeperCode || lastMountedVersion == kNativeKeeper;
}

struct JournalInfo {
    u32 flags;
    u64 offset;  // of the journal header, bytes of the volume
    u64 size;
};

JournalInfo DecodeJournalInfo(const u8* bytes);
// Writes kJournalInfoSize bytes.
void EncodeJournalInfo(const JournalInfo& info, u8* bytes);
// Changes the flags alone.
void SetJournalInfoFlags(u8* bytes, u32 flags);

struct JournalHeader {
    bool isLittle = false;
    u64 start = kJournalSector;  // oldest transaction
    u64 end = kJournalSector;    // behind the newest
    u64 size = 0;                // header sector and ring
    u32 listSize = kUsualList;
    u32 sectorSize = kJournalSector;  // unit of targets; the ring begins there

    u64 Capacity() const { return size - sectorSize; }
    u64 Used() const { return end >= start ? end - start : end - start + Capacity(); }
    // The ring never fills: equal positions mean that it is empty.
    u64 Room() const { return Capacity() - Used() - sectorSize; }
    u64 Largest() const { return Capacity() - sectorSize; }
    // REQUIRES: bytes is at most the capacity.
    u64 Advance(u64 position, u64 bytes) const {
        return position + bytes >= size ? position + bytes - Capacity() : position + bytes;
    }
};

// `size`: as the info block has it. Empty when the header is sound, else what is wrong with it.
std::string DecodeJournalHeader(const u8* bytes, u64 size, JournalHeader* header);
void EncodeJournalHeader(const JournalHeader& header, u8* bytes);

// One block of a transaction.
struct JournalBlock {
    static constexpr u64 kSkip = ~u64{0};

    u64 sector;  // target in units of the journal's sector size; kSkip: its data counts for nothing
    u32 bytes;
};

struct JournalList {
    u32 bytesUsed = 0;    // list header and data
    bool isLast = false;  // of its transaction
    std::vector<JournalBlock> blocks;
};

// Blocks one list takes at most.
inline u32 BlocksPerList(u32 listSize) {
    const u32 entries = listSize / 16 - 1;
    return (entries < 0xFFFF ? entries : 0xFFFF) - 1;
}

// `available`: bytes from the list's start to the journal's end. Empty when the list is sound in
// itself; where its blocks go is not looked at.
std::string DecodeJournalList(const u8* bytes, const JournalHeader& header, u64 available,
                              JournalList* list);
// Writes header.listSize bytes; sets list.bytesUsed.
void EncodeJournalList(const JournalHeader& header, JournalList* list, u8* bytes);

// Checksum over `size` bytes as stored; the four bytes at `checksumAt` count as 0.
u32 JournalChecksum(const u8* bytes, u32 size, u32 checksumAt);

}  // namespace VELK
