// Every block somebody owns: forks of files, overflow extents, attributes, special files. Whether
// they lie inside the volume, belong to one owner, and add up to what their forks say.
#include <algorithm>

#include "hfs/check/check_bitmap.h"
#include "hfs/check/check_records.h"

namespace VELK {
namespace {

using Wide = unsigned long long;

class Space {
public:
    explicit Space(CheckVolumeState* state) : state_(*state), run_(*state->run) {}

    void GatherSpecial();
    void GatherExtents();
    void GatherFiles();
    void GatherAttributes();
    void CheckOverlaps();
    void CheckUnclaimed();
    const std::vector<CheckClaim>& Claims() const { return claims_; }

private:
    static void TakeExtents(void* self, const CheckTree&, const CheckNode&, u32,
                            const CheckRecord&);
    static void TakeFile(void* self, const CheckTree&, const CheckNode&, u32, const CheckRecord&);
    static void TakeAttribute(void* self, const CheckTree&, const CheckNode&, u32,
                              const CheckRecord&);

    // Where a record's bytes are, for findings.
    struct Source {
        const CheckTree& tree;
        const CheckNode& node;
        u32 index;
        CheckPlace At(const u8* bytes) const {
            return tree.Place(node.nodeNum, static_cast<u32>(bytes - node.bytes), index);
        }
    };

    u64 TakeRuns(const Source& source, const u8* runs, u32 owner, ClaimKind kind);
    void TakeFileFork(const Source& source, const u8* fork, u32 owner, u8 forkType);
    u64 ClaimOverflow(u32 owner, u8 forkType, u64 blocks);
    void CloseAttribute();

    CheckVolumeState& state_;
    CheckRun& run_;
    std::vector<CheckClaim> claims_;

    // The attribute fork whose extents records are awaited.
    u32 attributeId_ = 0;
    u64 attributeBlocks_ = 0;
    u64 attributeTotal_ = 0;
    CheckPlace attributePlace_;
};

void Space::GatherSpecial() {
    const u32 total = state_.header.totalBlocks;
    const u32 start = state_.ReservedAtStart();
    const u32 end = state_.ReservedAtEnd();
    claims_.push_back({0, start, 0, ClaimKind::kReserved});
    if (end < total) {
        claims_.push_back({end, total - end, 0, ClaimKind::kReserved});
    }
    for (const CheckFork& fork : state_.forks) {
        for (const CheckExtent& run : fork.runs) {
            if (run.start < total && run.count <= total - run.start) {
                claims_.push_back({run.start, run.count, fork.fileId, ClaimKind::kSpecial});
            }
        }
    }
}

// Claims the eight runs at `runs`; returns their blocks.
u64 Space::TakeRuns(const Source& source, const u8* runs, u32 owner, ClaimKind kind) {
    const u32 total = state_.header.totalBlocks;
    u64 blocks = 0;
    bool isOver = false;
    for (u32 i = 0; i < kExtentCount; ++i) {
        const u8* bytes = runs + i * kExtentSize;
        const u32 start = Load32(bytes);
        const u32 count = Load32(bytes + 4);
        if (count == 0) {
            isOver = true;
            continue;
        }
        if (isOver) {
            run_.Error(CheckId::R06, source.At(bytes),
                       CheckPrint("run %u of ID %u stands behind an empty one", i, owner));
            break;
        }
        blocks += count;
        if (start < total && count <= total - start) {
            claims_.push_back({start, count, owner, kind});
        } else {
            run_.Error(CheckId::R06, source.At(bytes),
                       CheckPrint("outside the volume of %u blocks: %s of %s", total,
                                  CheckBlocksText(start, count).c_str(),
                                  CheckClaimText({start, count, owner, kind}).c_str()));
        }
    }
    return blocks;
}

void Space::TakeExtents(void* self, const CheckTree& tree, const CheckNode& node, u32 index,
                        const CheckRecord& record) {
    auto* space = static_cast<Space*>(self);
    const u32 fileId = Load32(record.key + kExtKeyFileId);
    const u8 forkType = record.key[kExtKeyForkType];
    if (forkType == kForkData && space->state_.ForkOf(fileId) != nullptr) {
        return;  // with the special file's own runs
    }
    const ClaimKind kind = fileId == kBadBlockFileId ? ClaimKind::kBadBlocks
                           : forkType == kForkData   ? ClaimKind::kData
                                                     : ClaimKind::kResource;
    space->TakeRuns({tree, node, index}, record.data, fileId, kind);
}

void Space::GatherExtents() {
    if (state_.extents != nullptr) {
        ForEachLeafRecord(state_.extents.get(), {this, TakeExtents});
    }
}

// Follows the overflow records of a fork whose first extents hold `blocks`; returns the new sum.
u64 Space::ClaimOverflow(u32 owner, u8 forkType, u64 blocks) {
    auto before = [](const CheckOverflow& record, const CheckOverflow& wanted) {
        return record.fileId != wanted.fileId ? record.fileId < wanted.fileId
                                              : record.forkType < wanted.forkType;
    };
    const CheckOverflow wanted = {owner, 0, 0, 0, 0, forkType, 0, false};
    auto record = std::lower_bound(state_.overflow.begin(), state_.overflow.end(), wanted, before);
    const auto isOwners = [&] {
        return record != state_.overflow.end() && record->fileId == owner &&
               record->forkType == forkType;
    };
    if (isOwners() && record->isClaimed) {
        return blocks;  // by another file of the same ID: each record is passed once
    }
    for (; isOwners(); ++record) {
        if (record->startBlock != blocks) {
            run_.Error(CheckId::R08,
                       state_.extents->Place(record->nodeNum, kDescSize, record->record),
                       CheckPrint("extents of file %u start at block %u, expected %llu", owner,
                                  record->startBlock, Wide{blocks}),
                       blocks, record->startBlock);
        }
        record->isClaimed = true;
        blocks += record->blocks;
    }
    return blocks;
}

void Space::TakeFileFork(const Source& source, const u8* fork, u32 owner, u8 forkType) {
    const bool isData = forkType == kForkData;
    const u64 inlineBlocks = TakeRuns(source, fork + kForkExtents, owner,
                                      isData ? ClaimKind::kData : ClaimKind::kResource);
    const u64 blocks =
        state_.overflow.empty() ? inlineBlocks : ClaimOverflow(owner, forkType, inlineBlocks);
    const u32 total = Load32(fork + kForkTotalBlocks);
    const char* name = isData ? "data" : "resource";
    if (blocks != inlineBlocks && Load32(fork + kForkSize - 4) == 0) {
        run_.Error(CheckId::R08, source.At(fork + kForkExtents),
                   CheckPrint("the %s fork of file %u has overflow extents, but not eight of its "
                              "own",
                              name, owner));
    }
    if (blocks != total) {
        run_.Error(CheckId::R08, source.At(fork + kForkTotalBlocks),
                   CheckPrint("the %s fork of file %u has %s, its extents hold %llu", name, owner,
                              CheckCounted(total, "block", "blocks").c_str(), Wide{blocks}),
                   total, blocks);
    }
    const u64 size = Load64(fork + kForkLogicalSize);
    if (size > static_cast<u64>(total) * state_.header.blockSize) {
        run_.Error(CheckId::R06, source.At(fork),
                   CheckPrint("the %s fork of file %u: size %llu does not fit %s", name, owner,
                              Wide{size}, CheckCounted(total, "block", "blocks").c_str()));
    }
}

void Space::TakeFile(void* self, const CheckTree& tree, const CheckNode& node, u32 index,
                     const CheckRecord& record) {
    auto* space = static_cast<Space*>(self);
    if (Load16(record.data) != kCatFile) {
        return;
    }
    const Source source = {tree, node, index};
    const u32 id = Load32(record.data + kItemId);
    space->TakeFileFork(source, record.data + kFileDataFork, id, kForkData);
    space->TakeFileFork(source, record.data + kFileRsrcFork, id, kForkResource);
}

void Space::GatherFiles() {
    ForEachLeafRecord(state_.catalog.get(), {this, TakeFile});
}

// The attribute fork gathered so far has to be complete.
void Space::CloseAttribute() {
    if (attributeBlocks_ != attributeTotal_) {
        run_.Error(
            CheckId::R08, attributePlace_,
            CheckPrint("an attribute fork of ID %u has %s, its extents hold %llu", attributeId_,
                       CheckCounted(attributeTotal_, "block", "blocks").c_str(),
                       Wide{attributeBlocks_}),
            attributeTotal_, attributeBlocks_);
    }
    attributeBlocks_ = attributeTotal_ = 0;
}

void Space::TakeAttribute(void* self, const CheckTree& tree, const CheckNode& node, u32 index,
                          const CheckRecord& record) {
    auto* space = static_cast<Space*>(self);
    const Source source = {tree, node, index};
    const u32 type = Load32(record.data);
    const u32 id = Load32(record.key + kAttrKeyFileId);
    if (type != kAttrExtents) {
        space->CloseAttribute();
    }
    if (type == kAttrFork) {
        const u8* fork = record.data + kAttrForkData;
        space->attributeId_ = id;
        space->attributeTotal_ = Load32(fork + kForkTotalBlocks);
        space->attributePlace_ = source.At(fork + kForkTotalBlocks);
        space->attributeBlocks_ =
            space->TakeRuns(source, fork + kForkExtents, id, ClaimKind::kAttribute);
    } else if (type == kAttrExtents) {
        const u32 start = Load32(record.key + kAttrKeyStartBlock);
        if (id != space->attributeId_ || start != space->attributeBlocks_) {
            space->run_.Error(CheckId::R08, source.At(record.key),
                              CheckPrint("attribute extents %s do not continue the record before",
                                         CheckKeyText(tree.kind, record.key).c_str()),
                              space->attributeBlocks_, start);
        }
        space->attributeBlocks_ +=
            space->TakeRuns(source, record.data + kAttrExtentsRuns, id, ClaimKind::kAttribute);
    }
}

void Space::GatherAttributes() {
    if (state_.attributes != nullptr) {
        ForEachLeafRecord(state_.attributes.get(), {this, TakeAttribute});
        CloseAttribute();
    }
}

void Space::CheckOverlaps() {
    std::sort(claims_.begin(), claims_.end(), [](const CheckClaim& left, const CheckClaim& right) {
        return left.start != right.start ? left.start < right.start : left.owner < right.owner;
    });
    std::size_t widest = 0;  // of those before, the one that reaches farthest
    for (std::size_t i = 1; i < claims_.size() && !run_.IsStopped(); ++i) {
        const CheckClaim& claim = claims_[i];
        const CheckClaim& before = claims_[widest];
        const u64 reach = u64{before.start} + before.count;
        const u64 end = u64{claim.start} + claim.count;
        // Special files among themselves are told with their forks.
        if (reach > claim.start && std::max(claim.kind, before.kind) > ClaimKind::kSpecial) {
            const u32 shared = static_cast<u32>(std::min(reach, end) - claim.start);
            run_.Error(CheckId::R06, CheckBlocksPlace(state_, claim.start, shared),
                       CheckPrint("in use by %s and by %s", CheckClaimText(before).c_str(),
                                  CheckClaimText(claim).c_str()));
        }
        if (end > reach) {
            widest = i;
        }
    }
}

void Space::CheckUnclaimed() {
    for (const CheckOverflow& record : state_.overflow) {
        if (!record.isClaimed) {
            run_.Error(CheckId::R08,
                       state_.extents->Place(record.nodeNum, kDescSize, record.record),
                       CheckPrint("extents of file %u that none of its forks continues with",
                                  record.fileId));
        }
    }
}

}  // namespace

void CheckSpace(CheckVolumeState* state) {
    if (!state->run->WantsAny({CheckId::R06, CheckId::R08, CheckId::V05, CheckId::V06})) {
        return;
    }
    Space space(state);
    space.GatherSpecial();
    space.GatherExtents();
    space.GatherFiles();
    space.GatherAttributes();
    space.CheckOverlaps();
    space.CheckUnclaimed();
    if (!state->run->IsStopped() && state->run->WantsAny({CheckId::V05, CheckId::V06})) {
        CheckBitmap(state, space.Claims());
    }
}

}  // namespace VELK
