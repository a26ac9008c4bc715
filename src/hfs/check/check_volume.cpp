// Volume header and its copy, and the forks of the special files.
#include "hfs/check/check_volume.h"

#include <algorithm>
#include <cstring>

#include "hfs/check/check_records.h"

namespace VELK {
namespace {

constexpr u32 kSpecialIds[kSpecialForks] = {kAllocationFileId, kExtentsFileId, kCatalogFileId,
                                            kAttributesFileId, kStartupFileId};
constexpr u32 kLeastBlockSize = 512;

using Wide = unsigned long long;

void Decode(CheckVolumeHeader* header) {
    const u8* bytes = header->bytes;
    header->signature = Load16(bytes + kVolSignature);
    header->version = Load16(bytes + kVolVersion);
    header->attributes = Load32(bytes + kVolAttributes);
    header->journalInfoBlock = Load32(bytes + kVolJournalInfoBlock);
    header->fileCount = Load32(bytes + kVolFileCount);
    header->folderCount = Load32(bytes + kVolFolderCount);
    header->blockSize = Load32(bytes + kVolBlockSize);
    header->totalBlocks = Load32(bytes + kVolTotalBlocks);
    header->freeBlocks = Load32(bytes + kVolFreeBlocks);
    header->nextCatalogId = Load32(bytes + kVolNextCatalogId);
}

bool HasSignature(const u8* bytes) {
    const u32 signature = Load16(bytes);
    return signature == kSignatureHfsPlus || signature == kSignatureHfsx;
}

// The alternate header's place: before the end of the source, or before the end of the blocks
// where the source goes on behind the volume. kCheckNoOffset: at neither.
u64 FindAlternate(CheckRun* run, u64 blocksSize, u8* bytes) {
    const u64 size = run->Source().size;
    const u64 ends[] = {size, size / kLeastBlockSize * kLeastBlockSize, blocksSize};
    for (u64 end : ends) {
        if (end >= kVolHeaderOffset + kVolHeaderSize + kVolAlternateTail && end <= size &&
            run->Read(end - kVolAlternateTail, bytes, kVolHeaderSize) == 0 && HasSignature(bytes)) {
            return end - kVolAlternateTail;
        }
    }
    return kCheckNoOffset;
}

bool ReadHeader(CheckVolumeState* state) {
    CheckRun* run = state->run;
    CheckVolumeHeader& header = state->header;
    if (run->Options().backupHeader) {
        const u64 place = FindAlternate(run, 0, header.bytes);
        header.offset = place != kCheckNoOffset ? place
                        : run->Source().size >= kVolAlternateTail
                            ? run->Source().size - kVolAlternateTail
                            : 0;
    }
    if (int status = run->Read(header.offset, header.bytes, kVolHeaderSize); status != 0) {
        run->Unreadable(state->HeaderPlace(0), kVolHeaderSize, status);
        run->Stage()->verdict = CheckVerdict::kStopped;
        run->Stage()->why = "the volume header cannot be read";
        return false;
    }
    Decode(&header);
    return true;
}

bool CheckSignature(CheckVolumeState* state) {
    const CheckVolumeHeader& header = state->header;
    const CheckPlace place = state->HeaderPlace(kVolSignature);
    if (!HasSignature(header.bytes)) {
        state->run->Tell(CheckId::V01, CheckSeverity::kError, place,
                         CheckPrint("signature is 0x%04x, expected 0x%04x (H+) or 0x%04x (HX)",
                                    header.signature, kSignatureHfsPlus, kSignatureHfsx),
                         CheckPrint("0x%04x", kSignatureHfsPlus),
                         CheckPrint("0x%04x", header.signature));
        return false;
    }
    const u32 wanted = header.IsHfsx() ? kVersionHfsx : kVersionHfsPlus;
    if (header.version != wanted) {
        state->run->Error(CheckId::V01, state->HeaderPlace(kVolVersion),
                          CheckPrint("version is %u, expected %u with signature %s", header.version,
                                     wanted, header.IsHfsx() ? "HX" : "H+"),
                          wanted, header.version);
    }
    return true;
}

bool CheckBlocks(CheckVolumeState* state) {
    const CheckVolumeHeader& header = state->header;
    if (!IsPowerOfTwo(header.blockSize) || header.blockSize < kLeastBlockSize) {
        state->run->Error(CheckId::V02, state->HeaderPlace(kVolBlockSize),
                          CheckPrint("block size is %u, expected a power of two of at least %u",
                                     header.blockSize, kLeastBlockSize));
        return false;
    }
    const u64 size = state->run->Source().size;
    if (header.BlocksSize() > size) {
        state->run->Error(
            CheckId::V02, state->HeaderPlace(kVolTotalBlocks),
            CheckPrint("%u blocks of %u bytes make %llu bytes, the image holds %llu: %llu bytes "
                       "are missing",
                       header.totalBlocks, header.blockSize, Wide{header.BlocksSize()}, Wide{size},
                       Wide{header.BlocksSize() - size}),
            header.BlocksSize(), size);
    }
    if (header.totalBlocks == 0) {
        state->run->Error(CheckId::V02, state->HeaderPlace(kVolTotalBlocks),
                          "the volume has no blocks");
        return false;
    }
    return true;
}

// Fields a repair would need. Counters and dates may be stale.
void CheckAlternate(CheckVolumeState* state) {
    const CheckVolumeHeader& header = state->header;
    CheckRun* run = state->run;
    if (!run->Wants(CheckId::V03) || header.BlocksSize() > run->Source().size) {
        return;  // what is cut off has no end to look at
    }
    u8 other[kVolHeaderSize];
    u64 place = kVolHeaderOffset;
    if (run->Options().backupHeader) {
        if (run->Read(place, other, kVolHeaderSize) != 0 || !HasSignature(other)) {
            place = kCheckNoOffset;
        }
    } else {
        place = FindAlternate(run, header.BlocksSize(), other);
    }
    const char* name = run->Options().backupHeader ? "main header" : "alternate header";
    if (place == kCheckNoOffset) {
        const u64 missing = run->Options().backupHeader ? u64{kVolHeaderOffset}
                                                        : run->Source().size - kVolAlternateTail;
        run->Warn(CheckId::V03, {0, -1, -1, missing, name},
                  CheckPrint("no %s at volume offset %llu", name, Wide{missing}));
        return;
    }
    const struct {
        const char* text;
        u32 offset;
        u32 size;
    } fields[] = {{"signature", kVolSignature, 2},
                  {"version", kVolVersion, 2},
                  {"block size", kVolBlockSize, 4},
                  {"count of blocks", kVolTotalBlocks, 4},
                  {"allocation fork", kVolForks, kForkSize},
                  {"extents fork", kVolForks + kForkSize, kForkSize},
                  {"catalog fork", kVolForks + 2 * kForkSize, kForkSize},
                  {"attributes fork", kVolForks + 3 * kForkSize, kForkSize},
                  {"startup fork", kVolForks + 4 * kForkSize, kForkSize}};
    for (const auto& field : fields) {
        if (std::memcmp(header.bytes + field.offset, other + field.offset, field.size) != 0) {
            run->Warn(CheckId::V03, {0, -1, -1, place + field.offset, name},
                      CheckPrint("its %s differs from the one in use", field.text));
        }
    }
}

std::string RunText(const CheckExtent& run) {
    return CheckBlocksText(run.start, run.count);
}

// One special fork by itself.
void CheckSpecialFork(CheckVolumeState* state, const CheckFork& fork) {
    const u32 total = state->header.totalBlocks;
    const CheckPlace place = {fork.fileId, -1, -1, fork.place, "file"};
    for (const CheckExtent& run : fork.runs) {
        if (run.start >= total || run.count > total - run.start) {
            state->run->Error(
                CheckId::V04, place,
                CheckPrint("outside the volume of %u blocks: %s", total, RunText(run).c_str()));
        }
    }
    bool isOver = false;
    for (u32 i = 0; i < kExtentCount; ++i) {
        const u32 at =
            static_cast<u32>(fork.place - state->header.offset) + kForkExtents + i * kExtentSize;
        const u32 count = Load32(state->header.bytes + at + 4);
        if (isOver && count != 0) {
            state->run->Error(CheckId::V04, place,
                              CheckPrint("run %u of %s stands behind an empty one", i,
                                         CheckCounted(count, "block", "blocks").c_str()));
            break;
        }
        isOver = isOver || count == 0;
    }
    if (fork.logicalSize > static_cast<u64>(fork.totalBlocks) * state->header.blockSize) {
        state->run->Error(
            CheckId::V04, place,
            CheckPrint("size %llu does not fit %u blocks of %u bytes", Wide{fork.logicalSize},
                       fork.totalBlocks, state->header.blockSize));
    }
}

struct Owned {
    CheckExtent run;
    std::string owner;
    CheckPlace place;
};

}  // namespace

CheckFork TakeFork(const u8* bytes, u32 fileId, u64 place) {
    CheckFork fork;
    fork.fileId = fileId;
    fork.place = place;
    fork.logicalSize = Load64(bytes + kForkLogicalSize);
    fork.totalBlocks = Load32(bytes + kForkTotalBlocks);
    for (u32 i = 0; i < kExtentCount; ++i) {
        const u8* extent = bytes + kForkExtents + i * kExtentSize;
        const u32 count = Load32(extent + 4);
        if (count == 0) {
            break;
        }
        fork.runs.push_back({Load32(extent), count});
        fork.blocks += count;
    }
    return fork;
}

CheckFork* CheckVolumeState::ForkOf(u32 fileId) {
    for (CheckFork& fork : forks) {
        if (fork.fileId == fileId) {
            return &fork;
        }
    }
    return nullptr;
}

std::unique_ptr<CheckFile> CheckVolumeState::MakeFile(const CheckFork& fork) const {
    auto file = std::make_unique<CheckFile>(run, fork.fileId);
    for (const CheckExtent& extent : fork.runs) {
        const bool isInside =
            extent.start < header.totalBlocks && extent.count <= header.totalBlocks - extent.start;
        const u64 place = static_cast<u64>(extent.start) * header.blockSize;
        file->AddRun(isInside ? place : kCheckNowhere,
                     static_cast<u64>(extent.count) * header.blockSize);
    }
    return file;
}

u32 CheckVolumeState::ReservedAtStart() const {
    const u64 blocks = CeilDivide(kVolHeaderOffset + kVolHeaderSize, header.blockSize);
    return static_cast<u32>(std::min<u64>(blocks, header.totalBlocks));
}

u32 CheckVolumeState::ReservedAtEnd() const {
    const u64 size = std::max(run->Source().size, header.BlocksSize());
    const u64 tail = size - header.BlocksSize();
    if (tail >= header.blockSize || tail >= kVolAlternateTail) {
        return header.totalBlocks;
    }
    const u64 first = (size - kVolAlternateTail) / header.blockSize;
    return static_cast<u32>(std::min<u64>(first, header.totalBlocks));
}

bool CheckVolumeHeaders(CheckVolumeState* state) {
    if (!ReadHeader(state) || !CheckSignature(state) || !CheckBlocks(state)) {
        return false;
    }
    CheckAlternate(state);
    for (u32 i = 0; i < kSpecialForks; ++i) {
        const u32 offset = kVolForks + i * kForkSize;
        state->forks[i] =
            TakeFork(state->header.bytes + offset, kSpecialIds[i], state->header.offset + offset);
        CheckSpecialFork(state, state->forks[i]);
    }
    for (u32 fileId : {kExtentsFileId, kCatalogFileId}) {
        if (state->ForkOf(fileId)->runs.empty()) {
            state->run->Error(CheckId::V04, {fileId, -1, -1, state->ForkOf(fileId)->place, "file"},
                              "the file has no blocks");
        }
    }
    CheckJournal(state);
    return true;
}

void CheckSpecialForks(CheckVolumeState* state) {
    std::vector<Owned> owned;
    const u32 start = state->ReservedAtStart();
    const u32 end = state->ReservedAtEnd();
    owned.push_back({{0, start}, "the volume header", state->HeaderPlace(0)});
    if (end < state->header.totalBlocks) {
        owned.push_back({{end, state->header.totalBlocks - end},
                         "the alternate header",
                         state->HeaderPlace(0)});
    }
    for (const CheckFork& fork : state->forks) {
        const CheckPlace place = {fork.fileId, -1, -1, fork.place, "file"};
        if (fork.blocks != fork.totalBlocks) {
            state->run->Error(
                CheckId::V04, place,
                CheckPrint("its extents hold %s, the fork says %u",
                           CheckCounted(fork.blocks, "block", "blocks").c_str(), fork.totalBlocks),
                fork.totalBlocks, fork.blocks);
        }
        for (const CheckExtent& run : fork.runs) {
            owned.push_back({run, CheckPrint("the %s file", CheckFileName(fork.fileId)), place});
        }
    }
    std::stable_sort(owned.begin(), owned.end(), [](const Owned& left, const Owned& right) {
        return left.run.start < right.run.start;
    });
    std::size_t widest = 0;  // of those before, the one that reaches farthest
    for (std::size_t i = 1; i < owned.size(); ++i) {
        const Owned& before = owned[widest];
        const u64 reach = u64{before.run.start} + before.run.count;
        if (reach > owned[i].run.start) {
            state->run->Error(CheckId::V04, owned[i].place,
                              CheckPrint("overlap: %s with %s of %s", RunText(owned[i].run).c_str(),
                                         RunText(before.run).c_str(), before.owner.c_str()));
        }
        if (u64{owned[i].run.start} + owned[i].run.count > reach) {
            widest = i;
        }
    }
}

}  // namespace VELK
