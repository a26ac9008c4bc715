// A volume under check: its header, its forks, its trees, and what the stages hand on.
#pragma once

#include <memory>
#include <vector>

#include "hfs/check/check_tree.h"

namespace VELK {

constexpr u32 kVolHeaderOffset = 1024;
constexpr u32 kVolHeaderSize = 512;
constexpr u32 kVolAlternateTail = 1024;  // the alternate header starts so far before the end
constexpr u16 kSignatureHfsPlus = 0x482B;
constexpr u16 kSignatureHfsx = 0x4858;

constexpr u32 kVolAttrUnmounted = 0x100;
constexpr u32 kVolAttrSparedBlocks = 0x200;
constexpr u32 kVolAttrInconsistent = 0x800;
constexpr u32 kVolAttrReusedIds = 0x1000;
constexpr u32 kVolAttrJournaled = 0x2000;

// Offsets in the volume header.
constexpr u32 kVolSignature = 0;          // u16
constexpr u32 kVolVersion = 2;            // u16
constexpr u32 kVolAttributes = 4;         // u32
constexpr u32 kVolJournalInfoBlock = 12;  // u32
constexpr u32 kVolFileCount = 32;         // u32
constexpr u32 kVolFolderCount = 36;       // u32
constexpr u32 kVolBlockSize = 40;         // u32
constexpr u32 kVolTotalBlocks = 44;       // u32
constexpr u32 kVolFreeBlocks = 48;        // u32
constexpr u32 kVolNextCatalogId = 64;     // u32
constexpr u32 kVolForks = 112;            // five times fork data

struct CheckVolumeHeader {
    u64 offset = kVolHeaderOffset;  // in the source
    u32 signature = 0;
    u32 version = 0;
    u32 attributes = 0;
    u32 journalInfoBlock = 0;
    u32 fileCount = 0;
    u32 folderCount = 0;
    u32 blockSize = 0;
    u32 totalBlocks = 0;
    u32 freeBlocks = 0;
    u32 nextCatalogId = 0;
    u8 bytes[kVolHeaderSize] = {};

    bool IsHfsx() const { return signature == kSignatureHfsx; }
    u64 BlocksSize() const { return static_cast<u64>(totalBlocks) * blockSize; }
};

// A fork as its 80 bytes and the extents tree describe it.
struct CheckFork {
    u32 fileId = 0;
    u64 place = kCheckNoOffset;  // of the fork data in the source
    u64 logicalSize = 0;
    u32 totalBlocks = 0;
    u64 blocks = 0;  // sum of `runs`
    std::vector<CheckExtent> runs;
};

// Reads the fork data at `bytes`; runs up to the first empty one.
CheckFork TakeFork(const u8* bytes, u32 fileId, u64 place);

// A leaf record of the extents tree.
struct CheckOverflow {
    u32 fileId;
    u32 startBlock;
    u32 nodeNum;
    u32 blocks;  // sum of its runs, cut at 32 bits
    u16 record;
    u8 forkType;
    u8 runs;
    bool isClaimed;
};

constexpr u32 kSpecialForks = 5;

struct CheckVolumeState {
    explicit CheckVolumeState(CheckRun* owner) : run(owner) {}

    CheckRun* run;
    CheckVolumeHeader header;
    CheckFork forks[kSpecialForks];  // allocation, extents, catalog, attributes, startup
    std::unique_ptr<CheckFile> extentsFile;
    std::unique_ptr<CheckFile> catalogFile;
    std::unique_ptr<CheckFile> attributesFile;
    std::unique_ptr<CheckTree> extents;
    std::unique_ptr<CheckTree> catalog;
    std::unique_ptr<CheckTree> attributes;  // null: the volume has none
    std::vector<CheckOverflow> badBlocks;
    std::vector<CheckOverflow> overflow;  // of files from 16 on; full runs only

    CheckFork* ForkOf(u32 fileId);
    CheckPlace HeaderPlace(u32 offset) const {
        return {0, -1, -1, header.offset + offset, "header"};
    }
    // The fork's runs as a file. Blocks outside the volume cannot be read from it.
    std::unique_ptr<CheckFile> MakeFile(const CheckFork& fork) const;
    // Blocks [0, first) hold the volume header, [last, totalBlocks) the alternate one.
    u32 ReservedAtStart() const;
    u32 ReservedAtEnd() const;
};

// Volume header, alternate, special forks, journal (V01 to V04, V08). False: the rest is in vain.
bool CheckVolumeHeaders(CheckVolumeState* state);
// The special forks once their overflow extents are known: totals and overlaps (V04).
void CheckSpecialForks(CheckVolumeState* state);
// Journal and clean unmounting (V08).
void CheckJournal(CheckVolumeState* state);
// Bad-block records (R07).
void CheckBadBlocks(CheckVolumeState* state);

// Full runs: the catalog's items against threads, parents, counts and attributes, overflow extents
// against files (R05, R08, R09, R10, V06, V07); forks against each other and the allocation file
// (R06, R08, V05, V06). Nothing is read when none of these is wanted.
void CheckItems(CheckVolumeState* state);
void CheckSpace(CheckVolumeState* state);

}  // namespace VELK
