// The volume header between its bytes and host order, and the checks that decide whether a volume
// can be read by it.
#include "hfs/volume/volume_header.h"

#include <cstring>
#include <string>

#include "hfs/volume/wire.h"

namespace VELK {

namespace {

constexpr u32 kForkSize = 80;

// Byte offsets of the fields in the header.
constexpr u32 kVhSignature = 0;
constexpr u32 kVhVersion = 2;
constexpr u32 kVhAttributes = 4;
constexpr u32 kVhLastMounted = 8;
constexpr u32 kVhJournalInfo = 12;
constexpr u32 kVhCreateDate = 16;
constexpr u32 kVhModifyDate = 20;
constexpr u32 kVhBackupDate = 24;
constexpr u32 kVhCheckedDate = 28;
constexpr u32 kVhFileCount = 32;
constexpr u32 kVhFolderCount = 36;
constexpr u32 kVhBlockSize = 40;
constexpr u32 kVhTotalBlocks = 44;
constexpr u32 kVhFreeBlocks = 48;
constexpr u32 kVhNextAllocation = 52;
constexpr u32 kVhRsrcClump = 56;
constexpr u32 kVhDataClump = 60;
constexpr u32 kVhNextCatalogId = 64;
constexpr u32 kVhWriteCount = 68;
constexpr u32 kVhEncodings = 72;
constexpr u32 kVhFinderInfo = 80;
constexpr u32 kVhAllocationFile = 112;
constexpr u32 kVhExtentsFile = kVhAllocationFile + kForkSize;
constexpr u32 kVhCatalogFile = kVhExtentsFile + kForkSize;
constexpr u32 kVhAttributesFile = kVhCatalogFile + kForkSize;
constexpr u32 kVhStartupFile = kVhAttributesFile + kForkSize;
static_assert(kVhStartupFile + kForkSize == kHeaderSize);

// Byte offsets of the fields of a fork record.
constexpr u32 kForkLogicalSize = 0;
constexpr u32 kForkClumpSize = 8;
constexpr u32 kForkTotalBlocks = 12;
constexpr u32 kForkExtents = 16;

std::string ReadableSignature(u32 signature) {
    return Format("%04X", signature);
}

struct NamedField {
    const char* name;
    u32 offset;
    u32 size;
};

constexpr NamedField kFields[] = {
    {"signature", kVhSignature, 2},
    {"version", kVhVersion, 2},
    {"attributes", kVhAttributes, 4},
    {"lastMountedVersion", kVhLastMounted, 4},
    {"journalInfoBlock", kVhJournalInfo, 4},
    {"createDate", kVhCreateDate, 4},
    {"modifyDate", kVhModifyDate, 4},
    {"backupDate", kVhBackupDate, 4},
    {"checkedDate", kVhCheckedDate, 4},
    {"fileCount", kVhFileCount, 4},
    {"folderCount", kVhFolderCount, 4},
    {"blockSize", kVhBlockSize, 4},
    {"totalBlocks", kVhTotalBlocks, 4},
    {"freeBlocks", kVhFreeBlocks, 4},
    {"nextAllocation", kVhNextAllocation, 4},
    {"rsrcClumpSize", kVhRsrcClump, 4},
    {"dataClumpSize", kVhDataClump, 4},
    {"nextCatalogID", kVhNextCatalogId, 4},
    {"writeCount", kVhWriteCount, 4},
    {"encodingsBitmap", kVhEncodings, 8},
    {"finderInfo", kVhFinderInfo, 32},
    {"allocationFile", kVhAllocationFile, kForkSize},
    {"extentsFile", kVhExtentsFile, kForkSize},
    {"catalogFile", kVhCatalogFile, kForkSize},
    {"attributesFile", kVhAttributesFile, kForkSize},
    {"startupFile", kVhStartupFile, kForkSize},
};

}  // namespace

void DecodeFork(const u8* bytes, HfsFork* fork) {
    fork->logicalSize = Be64(bytes + kForkLogicalSize);
    fork->clumpSize = Be32(bytes + kForkClumpSize);
    fork->totalBlocks = Be32(bytes + kForkTotalBlocks);
    for (u32 i = 0; i < kExtentCount; ++i) {
        fork->extents[i].startBlock = Be32(bytes + kForkExtents + 8 * i);
        fork->extents[i].blockCount = Be32(bytes + kForkExtents + 8 * i + 4);
    }
}

void EncodeFork(const HfsFork& fork, u8* bytes) {
    StoreBe64(bytes + kForkLogicalSize, fork.logicalSize);
    StoreBe32(bytes + kForkClumpSize, fork.clumpSize);
    StoreBe32(bytes + kForkTotalBlocks, fork.totalBlocks);
    for (u32 i = 0; i < kExtentCount; ++i) {
        StoreBe32(bytes + kForkExtents + 8 * i, fork.extents[i].startBlock);
        StoreBe32(bytes + kForkExtents + 8 * i + 4, fork.extents[i].blockCount);
    }
}

void DecodeHeader(const u8* bytes, VolumeHeader* header) {
    header->signature = Be16(bytes + kVhSignature);
    header->version = Be16(bytes + kVhVersion);
    header->attributes = Be32(bytes + kVhAttributes);
    header->lastMountedVersion = Be32(bytes + kVhLastMounted);
    header->journalInfoBlock = Be32(bytes + kVhJournalInfo);
    header->createDate = Be32(bytes + kVhCreateDate);
    header->modifyDate = Be32(bytes + kVhModifyDate);
    header->backupDate = Be32(bytes + kVhBackupDate);
    header->checkedDate = Be32(bytes + kVhCheckedDate);
    header->fileCount = Be32(bytes + kVhFileCount);
    header->folderCount = Be32(bytes + kVhFolderCount);
    header->blockSize = Be32(bytes + kVhBlockSize);
    header->totalBlocks = Be32(bytes + kVhTotalBlocks);
    header->freeBlocks = Be32(bytes + kVhFreeBlocks);
    header->nextAllocation = Be32(bytes + kVhNextAllocation);
    header->rsrcClumpSize = Be32(bytes + kVhRsrcClump);
    header->dataClumpSize = Be32(bytes + kVhDataClump);
    header->nextCatalogId = Be32(bytes + kVhNextCatalogId);
    header->writeCount = Be32(bytes + kVhWriteCount);
    header->encodingsBitmap = Be64(bytes + kVhEncodings);
    for (u32 i = 0; i < 8; ++i) {
        header->finderInfo[i] = Be32(bytes + kVhFinderInfo + 4 * i);
    }
    DecodeFork(bytes + kVhAllocationFile, &header->allocationFile);
    DecodeFork(bytes + kVhExtentsFile, &header->extentsFile);
    DecodeFork(bytes + kVhCatalogFile, &header->catalogFile);
    DecodeFork(bytes + kVhAttributesFile, &header->attributesFile);
    DecodeFork(bytes + kVhStartupFile, &header->startupFile);
}

void EncodeHeader(const VolumeHeader& header, u8* bytes) {
    StoreBe16(bytes + kVhSignature, header.signature);
    StoreBe16(bytes + kVhVersion, header.version);
    StoreBe32(bytes + kVhAttributes, header.attributes);
    StoreBe32(bytes + kVhLastMounted, header.lastMountedVersion);
    StoreBe32(bytes + kVhJournalInfo, header.journalInfoBlock);
    StoreBe32(bytes + kVhCreateDate, header.createDate);
    StoreBe32(bytes + kVhModifyDate, header.modifyDate);
    StoreBe32(bytes + kVhBackupDate, header.backupDate);
    StoreBe32(bytes + kVhCheckedDate, header.checkedDate);
    StoreBe32(bytes + kVhFileCount, header.fileCount);
    StoreBe32(bytes + kVhFolderCount, header.folderCount);
    StoreBe32(bytes + kVhBlockSize, header.blockSize);
    StoreBe32(bytes + kVhTotalBlocks, header.totalBlocks);
    StoreBe32(bytes + kVhFreeBlocks, header.freeBlocks);
    StoreBe32(bytes + kVhNextAllocation, header.nextAllocation);
    StoreBe32(bytes + kVhRsrcClump, header.rsrcClumpSize);
    StoreBe32(bytes + kVhDataClump, header.dataClumpSize);
    StoreBe32(bytes + kVhNextCatalogId, header.nextCatalogId);
    StoreBe32(bytes + kVhWriteCount, header.writeCount);
    StoreBe64(bytes + kVhEncodings, header.encodingsBitmap);
    for (u32 i = 0; i < 8; ++i) {
        StoreBe32(bytes + kVhFinderInfo + 4 * i, header.finderInfo[i]);
    }
    EncodeFork(header.allocationFile, bytes + kVhAllocationFile);
    EncodeFork(header.extentsFile, bytes + kVhExtentsFile);
    EncodeFork(header.catalogFile, bytes + kVhCatalogFile);
    EncodeFork(header.attributesFile, bytes + kVhAttributesFile);
    EncodeFork(header.startupFile, bytes + kVhStartupFile);
}

const HfsFork* VolumeHeader::ForkOf(u32 fileId) const {
    switch (fileId) {
        case kExtentsFileId:
            return &extentsFile;
        case kCatalogFileId:
            return &catalogFile;
        case kAllocationFileId:
            return &allocationFile;
        case kStartupFileId:
            return &startupFile;
        case kAttributesFileId:
            return &attributesFile;
        default:
            return nullptr;
    }
}

HfsFork* VolumeHeader::ForkOf(u32 fileId) {
    return const_cast<HfsFork*>(static_cast<const VolumeHeader*>(this)->ForkOf(fileId));
}

Problem CheckHeader(const VolumeHeader& header, u64 headerOffset) {
    const std::string place = "volume header at " + Position(headerOffset) + ": ";
    std::string fault;
    std::string check = "V02";
    if (header.signature != kSignatureHfsPlus && header.signature != kSignatureHfsx) {
        fault = "signature " + ReadableSignature(header.signature) + " is neither 482B nor 4858";
        check = "V01";
    } else if (header.signature == kSignatureHfsPlus && header.version != kVersionHfsPlus) {
        fault = Format("version %u does not belong to signature 482B (HFS+ is 4)", header.version);
        check = "V01";
    } else if (header.signature == kSignatureHfsx && header.version != kVersionHfsx) {
        fault = Format("version %u of HFSX is not known (5 is)", header.version);
        check = "V01";
    } else if (!IsPowerOfTwo(header.blockSize)) {
        fault = "block size " + std::to_string(header.blockSize) + " is not a power of two";
    } else if (header.blockSize < kHeaderSize) {
        fault = "block size " + std::to_string(header.blockSize) + " is below 512";
    } else if (header.totalBlocks == 0) {
        fault = "the volume has 0 blocks";
    }
    if (fault.empty()) {
        return {};
    }
    Problem problem = FailureAt(headerOffset, place + fault, "try --backup-header");
    problem.check = check;
    return problem;
}

Problem CheckForkExtents(const HfsFork& fork, u32 volumeBlocks, u32 fileId) {
    std::string fault;
    u64 blocks = 0;
    bool ended = false;
    for (u32 i = 0; i < kExtentCount && fault.empty(); ++i) {
        const HfsExtent& extent = fork.extents[i];
        if (extent.blockCount == 0) {
            ended = true;
            continue;
        }
        const u64 end = static_cast<u64>(extent.startBlock) + extent.blockCount;
        if (ended) {
            fault = Format("extent %u follows an unused one", i);
        } else if (end > volumeBlocks) {
            fault = Format("extent %u (blocks ", i) + Grouped(extent.startBlock) + " to " +
                    Grouped(end - 1) + ") leaves the volume of " + Grouped(volumeBlocks) +
                    " blocks";
        }
        for (u32 other = 0; other < i && fault.empty(); ++other) {
            const HfsExtent& before = fork.extents[other];
            const u64 beforeEnd = static_cast<u64>(before.startBlock) + before.blockCount;
            if (extent.startBlock < beforeEnd && before.startBlock < end) {
                fault = Format("extents %u and %u overlap", other, i);
            }
        }
        blocks += extent.blockCount;
    }
    if (fault.empty() && blocks > fork.totalBlocks) {
        fault = "extents hold " + Grouped(blocks) + " blocks, the fork says " +
                Grouped(fork.totalBlocks);
    }
    if (fault.empty()) {
        return {};
    }
    Problem problem =
        Failure(std::string(ForkName(fileId)) + " file: " + fault, "try --backup-header");
    problem.fileId = fileId;
    problem.check = "V04";
    return problem;
}

std::string HeaderDifferences(const VolumeHeader& a, const VolumeHeader& b) {
    u8 bytesA[kHeaderSize];
    u8 bytesB[kHeaderSize];
    EncodeHeader(a, bytesA);
    EncodeHeader(b, bytesB);
    std::string names;
    for (const NamedField& field : kFields) {
        if (std::memcmp(bytesA + field.offset, bytesB + field.offset, field.size) != 0) {
            names += names.empty() ? "" : ", ";
            names += field.name;
        }
    }
    return names;
}

}  // namespace VELK
