// The allocation file, read once from its start to its end, against the blocks in use.
#include "hfs/check/check_bitmap.h"

#include <algorithm>
#include <bit>

namespace VELK {
namespace {

constexpr u32 kChunkSize = 64 * 1024;

using Wide = unsigned long long;

class Bitmap {
public:
    Bitmap(CheckVolumeState* state, const CheckFile* file)
        : state_(*state), file_(*file), bytes_(kChunkSize) {}

    // Blocks first..end-1, none of them asked for before: all have to be marked.
    void CheckMarked(u64 first, u64 end, const CheckClaim& claim);
    // Reads on to the end.
    void Finish();

    bool IsReadable() const { return isReadable_; }
    u64 Used() const { return used_; }
    u64 Owned() const { return owned_; }

private:
    bool Load(u64 byte);
    void TellFree(u64 first, u64 end, const CheckClaim& claim);

    CheckVolumeState& state_;
    const CheckFile& file_;
    std::vector<u8> bytes_;
    u64 first_ = 0;  // byte of the file at bytes_[0]
    u64 count_ = 0;
    u64 used_ = 0;  // marks below the total of blocks, of what was read
    u64 owned_ = 0;
    bool isReadable_ = true;
};

// Makes `byte` present, counting the marks on the way.
bool Bitmap::Load(u64 byte) {
    const u64 total = state_.header.totalBlocks;
    const u64 size = CeilDivide(total, 8);
    while (isReadable_ && byte >= first_ + count_) {
        first_ += count_;
        count_ = std::min<u64>(kChunkSize, size - first_);
        if (int status = file_.Read(first_, bytes_.data(), count_); status != 0) {
            state_.run->Unreadable({kAllocationFileId, -1, -1, file_.SourceOffset(first_), "file"},
                                   count_, status);
            isReadable_ = false;
            return false;
        }
        for (u64 i = 0; i < count_; ++i) {
            u32 marks = bytes_[i];
            if ((first_ + i) * 8 + 8 > total) {
                marks &= (0xFF00u >> (total - (first_ + i) * 8)) & 0xFFu;
            }
            used_ += static_cast<u64>(std::popcount(marks));
        }
    }
    return isReadable_;
}

void Bitmap::TellFree(u64 first, u64 end, const CheckClaim& claim) {
    const u32 count = static_cast<u32>(end - first);
    CheckPlace place = CheckBlocksPlace(state_, static_cast<u32>(first), count);
    place.offset = file_.SourceOffset(first / 8);
    state_.run->Error(
        CheckId::V05, place,
        CheckPrint("%s in use by %s, but marked free",
                   count == 1 ? "the block is" : "the blocks are", CheckClaimText(claim).c_str()));
}

void Bitmap::CheckMarked(u64 first, u64 end, const CheckClaim& claim) {
    owned_ += end - first;
    bool inFree = false;
    u64 freeStart = 0;
    for (u64 block = first; block < end; ++block) {
        if (!Load(block / 8)) {
            return;
        }
        const u32 marks = bytes_[block / 8 - first_];
        if (!inFree && marks == 0xFF && block % 8 == 0) {
            block += 7;
            continue;
        }
        const bool isFree = (marks & (0x80u >> (block % 8))) == 0;
        if (isFree && !inFree) {
            freeStart = block;
        } else if (!isFree && inFree) {
            TellFree(freeStart, block, claim);
        }
        inFree = isFree;
    }
    if (inFree) {
        TellFree(freeStart, end, claim);
    }
}

void Bitmap::Finish() {
    const u64 size = CeilDivide(state_.header.totalBlocks, 8);
    if (size > 0) {
        Load(size - 1);
    }
}

// Marks behind the last block.
void CheckTail(CheckVolumeState* state, const CheckFile& file) {
    const u64 total = state->header.totalBlocks;
    const u64 held = std::min(file.Size(), state->ForkOf(kAllocationFileId)->logicalSize);
    std::vector<u8> bytes(kChunkSize);
    for (u64 at = total / 8; at < held;) {
        const u64 count = std::min<u64>(kChunkSize, held - at);
        if (file.Read(at, bytes.data(), count) != 0) {
            return;
        }
        for (u64 i = 0; i < count; ++i) {
            const u32 inside = (at + i) * 8 < total ? static_cast<u32>(total - (at + i) * 8) : 0;
            if ((bytes[i] & (0xFFu >> inside)) != 0) {
                state->run->Warn(CheckId::V05,
                                 {kAllocationFileId, -1, -1, file.SourceOffset(at + i), "file"},
                                 CheckPrint("marks behind the last of %llu blocks", Wide{total}));
                return;
            }
        }
        at += count;
    }
}

}  // namespace

std::string CheckClaimText(const CheckClaim& claim) {
    switch (claim.kind) {
        case ClaimKind::kReserved:
            return "the volume headers";
        case ClaimKind::kSpecial:
            return CheckPrint("the %s file", CheckFileName(claim.owner));
        case ClaimKind::kBadBlocks:
            return "the bad-block list";
        case ClaimKind::kData:
            return CheckPrint("file %u", claim.owner);
        case ClaimKind::kResource:
            return CheckPrint("the resource fork of file %u", claim.owner);
        default:
            return CheckPrint("an attribute of ID %u", claim.owner);
    }
}

CheckPlace CheckBlocksPlace(const CheckVolumeState& state, u32 start, u32 count) {
    CheckPlace place;
    place.offset = static_cast<u64>(start) * state.header.blockSize;
    place.part = CheckBlocksText(start, count);
    return place;
}

void CheckBitmap(CheckVolumeState* state, const std::vector<CheckClaim>& claims) {
    const CheckVolumeHeader& header = state->header;
    const CheckFork& fork = *state->ForkOf(kAllocationFileId);
    const std::unique_ptr<CheckFile> file = state->MakeFile(fork);
    const u64 held = std::min(file->Size(), fork.logicalSize);
    if (held < CeilDivide(header.totalBlocks, 8)) {
        state->run->Error(
            CheckId::V05, {kAllocationFileId, -1, -1, fork.place, "file"},
            CheckPrint("%llu bytes hold no marks for %u blocks", Wide{held}, header.totalBlocks));
        return;
    }
    Bitmap bitmap(state, file.get());
    u64 reach = 0;
    for (const CheckClaim& claim : claims) {
        const u64 end = u64{claim.start} + claim.count;
        if (end > reach) {
            bitmap.CheckMarked(std::max<u64>(claim.start, reach), end, claim);
            reach = end;
        }
        if (state->run->IsStopped() || !bitmap.IsReadable()) {
            return;
        }
    }
    bitmap.Finish();
    if (!bitmap.IsReadable()) {
        return;
    }
    const u64 free = header.totalBlocks - bitmap.Used();
    if (free != header.freeBlocks) {
        state->run->Warn(CheckId::V06, state->HeaderPlace(kVolFreeBlocks),
                         CheckPrint("freeBlocks is %u, the allocation file has %llu clear marks",
                                    header.freeBlocks, Wide{free}),
                         free, header.freeBlocks);
    }
    if (bitmap.Used() > bitmap.Owned()) {
        state->run->Info(CheckId::V05, {kAllocationFileId, -1, -1, kCheckNoOffset, "file"},
                         CheckCounted(bitmap.Used() - bitmap.Owned(),
                                      "block is marked used but belongs to nothing",
                                      "blocks are marked used but belong to nothing"));
    }
    CheckTail(state, *file);
}

}  // namespace VELK
