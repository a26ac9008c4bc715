// The volume header: 512 bytes at volume byte 1024, with a copy 1,024 bytes before the volume's
// end. Decoded to host order, encoded back, checked field by field.
#pragma once

#include "hfs/fshfs.h"
#include "hfs/volume/problem.h"
#include "platform/types.h"

namespace VELK {

constexpr u64 kHeaderOffset = 1024;      // of the volume
constexpr u64 kAltHeaderFromEnd = 1024;  // bytes before the end
constexpr u32 kHeaderSize = 512;
constexpr u16 kSignatureHfsPlus = 0x482B;
constexpr u16 kSignatureHfsx = 0x4858;
constexpr u16 kSignatureHfs = 0x4244;

// Attribute bits of the header.
constexpr u32 kVolUnmounted = 1u << 8;
constexpr u32 kVolSparedBlocks = 1u << 9;
constexpr u32 kVolBootInconsistent = 1u << 11;
constexpr u32 kVolIdsReused = 1u << 12;
constexpr u32 kVolJournaled = 1u << 13;
constexpr u32 kVolSoftwareLock = 1u << 15;

constexpr u32 kFirstUserId = 16;
constexpr u32 kRootParentId = 1;
constexpr u32 kRootFolderId = 2;
constexpr u32 kUnixEpoch = 2082844800u;  // 1970 in seconds since 1904

struct VolumeHeader {
    u16 signature;
    u16 version;
    u32 attributes;
    u32 lastMountedVersion;
    u32 journalInfoBlock;
    u32 createDate;  // local time; the others are UTC
    u32 modifyDate;
    u32 backupDate;
    u32 checkedDate;
    u32 fileCount;
    u32 folderCount;
    u32 blockSize;
    u32 totalBlocks;
    u32 freeBlocks;
    u32 nextAllocation;
    u32 rsrcClumpSize;
    u32 dataClumpSize;
    u32 nextCatalogId;
    u32 writeCount;
    u64 encodingsBitmap;
    u32 finderInfo[8];
    HfsFork allocationFile;
    HfsFork extentsFile;
    HfsFork catalogFile;
    HfsFork attributesFile;
    HfsFork startupFile;

    HfsFork* ForkOf(u32 fileId);
    const HfsFork* ForkOf(u32 fileId) const;
    bool IsHfsx() const { return signature == kSignatureHfsx; }
};

void DecodeHeader(const u8* bytes, VolumeHeader* header);  // kHeaderSize bytes
void EncodeHeader(const VolumeHeader& header, u8* bytes);  // writes every byte
void DecodeFork(const u8* bytes, HfsFork* fork);           // 80 bytes
void EncodeFork(const HfsFork& fork, u8* bytes);

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
