// The volume header: 512 bytes at volume byte 1024, with a copy 1,024 bytes before the volume's
// end. Decoded to host order, encoded back, checked field by field.
#pragma once

#include "hfs/fshfs.h"
#include "hfs/volume/problem.h"
#include "platform/types.h"

namespace VELK {

constexpr u64 kHeaderOffset = 1024;        // of the volume
constexpr u64 kAltHeaderFromEnd = 1024;    // bytes before the end
constexpr u32 kHeaderSize = 512;           // bytes
constexpr u16 kSignatureHfsPlus = 0x482B;  // "H+"
constexpr u16 kSignatureHfsx = 0x4858;     // "HX"
constexpr u16 kSignatureHfs = 0x4244;      // "BD": an old HFS volume, perhaps a wrapper

// Attribute bits of the header.
constexpr u32 kVolUnmounted = 1u << 8;          // cleanly; off while it is written
constexpr u32 kVolSparedBlocks = 1u << 9;       // the extents tree lists bad blocks
constexpr u32 kVolBootInconsistent = 1u << 11;  // the opposite of kVolUnmounted, of boot volumes
constexpr u32 kVolIdsReused = 1u << 12;         // the next ID has wrapped around
constexpr u32 kVolJournaled = 1u << 13;         // there is a journal
constexpr u32 kVolSoftwareLock = 1u << 15;      // not to be written

constexpr u32 kFirstUserId = 16;         // of the first file or folder that is not special
constexpr u32 kRootParentId = 1;         // parent of the root folder; no record has it as its ID
constexpr u32 kRootFolderId = 2;         // the root folder
constexpr u32 kUnixEpoch = 2082844800u;  // 1970 in seconds since 1904

// The volume header (HFS+ volume format) in host order. Dates are seconds since 1904, 0 = never.
struct VolumeHeader {
    u16 signature;           // kSignatureHfsPlus or kSignatureHfsx
    u16 version;             // kVersionHfsPlus or kVersionHfsx
    u32 attributes;          // kVol... bits; the others are kept as they are
    u32 lastMountedVersion;  // four characters that name the last writer
    u32 journalInfoBlock;    // allocation block; counts with kVolJournaled
    u32 createDate;          // local time; the others are UTC
    u32 modifyDate;          // last change
    u32 backupDate;          // last backup
    u32 checkedDate;         // last check
    u32 fileCount;           // file records of the catalog
    u32 folderCount;         // folder records of the catalog but the root's
    u32 blockSize;           // allocation block, bytes
    u32 totalBlocks;         // allocation blocks
    u32 freeBlocks;          // allocation blocks whose bit is clear
    u32 nextAllocation;      // allocation block: where the next search may start
    u32 rsrcClumpSize;       // default growth of resource forks, bytes
    u32 dataClumpSize;       // default growth of data forks, bytes
    u32 nextCatalogId;       // next ID to hand out
    u32 writeCount;          // raised by writers
    u64 encodingsBitmap;     // one bit for each text encoding in use
    u32 finderInfo[8];       // 6 and 7: the volume's identifier; the others are kept as they are
    // Forks of the special files; all zero where there is none.
    HfsFork allocationFile;
    HfsFork extentsFile;
    HfsFork catalogFile;
    HfsFork attributesFile;
    HfsFork startupFile;

    // The fork of a special file (3, 4, 6, 7, 8); null for any other ID.
    HfsFork* ForkOf(u32 fileId);
    const HfsFork* ForkOf(u32 fileId) const;

    // Whether it is an HFSX volume.
    bool IsHfsx() const { return signature == kSignatureHfsx; }
};

// Between the stored form, big-endian, and host order. Nothing is checked.
void DecodeHeader(const u8* bytes, VolumeHeader* header);  // kHeaderSize bytes
void EncodeHeader(const VolumeHeader& header, u8* bytes);  // writes every byte
void DecodeFork(const u8* bytes, HfsFork* fork);           // 80 bytes
void EncodeFork(const HfsFork& fork, u8* bytes);           // 80 bytes

// Whether a volume can be read by this header: signature, version, block size, block count.
// `headerOffset` is its place in the image, for the text. A volume longer than the image is no
// problem here: the image may have been cut short.
Problem CheckHeader(const VolumeHeader& header, u64 headerOffset);

// Whether the extents of one special file lie inside the volume, do not overlap each other, are
// packed from the front and add up to no more than the fork's blocks.
Problem CheckForkExtents(const HfsFork& fork, u32 volumeBlocks, u32 fileId);

// Fields in which two headers differ, by name, separated by ", "; empty: none.
std::string HeaderDifferences(const VolumeHeader& a, const VolumeHeader& b);

}  // namespace VELK
