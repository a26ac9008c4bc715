// Reserving nodes ahead of an operation that may split several: the file grows now, so that no
// split runs out of nodes half-way. A part of the volume is kept back from requests that could also
// be refused.
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/space_fork.h"

namespace VELK {

namespace {

constexpr u32 kReserveShare = 16;              // one sixteenth of the volume is kept back,
constexpr u32 kMostReserveBytes = 262144000u;  // at most 250 MiB
constexpr u64 kMostNodes = 0xFFFFFFFF;

// A request: how many splits reach each level below the root, in two classes.
struct Request {
    u32 low;
    u32 high;

    // Only a plain request can be refused in favour of the volume's reserve.
    bool YieldsToReserve() const { return low != 0 && high == 0; }
};

u32 WorstCase(u32 depth, const Request& request) {
    if (depth < 2) {
        return request.low + 1;
    }
    return (depth - 1) * request.low + (depth - 2) * request.high + 1;
}

// Free allocation blocks beyond the part kept back.
u32 SpareBlocks(const CFileSystemHfs* volume) {
    const u32 share = volume->totalBlocks / kReserveShare;
    const u32 most = kMostReserveBytes >> volume->allocBlockShift;
    const u32 floor = share < most ? share : most;
    const u32 free = volume->bitmap->GetZeros();
    return free > floor ? free - floor : 0;
}

// Grows the file by the `missing` nodes.
int GrowBy(CBTreeHfs* tree, u32 missing, const Request& request) {
    const CFileSystemHfs* volume = tree->volume;
    const u32 shift = volume->allocBlockShift;
    const u32 spareBlocks = SpareBlocks(volume);
    if (spareBlocks == 0 && request.YieldsToReserve()) {
        return Fail(kErrNoSpace, kReasonReserve, 3887);
    }
    const HfsFork* fork = FindFork(tree);
    if (fork == nullptr) {
        return Fail(kErrInvalid, kReasonInvalid, 9430);
    }
    u32 growBytes = fork->clumpSize;
    if (spareBlocks < growBytes >> shift) {
        const u64 missingBlocks = (static_cast<u64>(missing) << tree->nodeShift) >> shift;
        if (missingBlocks > spareBlocks && request.YieldsToReserve()) {
            return Fail(kErrNoSpace, kReasonReserve, 3901);
        }
        growBytes = spareBlocks << shift;  // less than the clump, so 32 bits hold it
    }
    u64 target = static_cast<u64>(tree->header.totalNodes) + missing;
    if (tree->CalcMapBits() < target) {
        target += 1;  // a map node
    }
    if (target > kMostNodes) {
        return Fail(kErrCorrupt, kReasonTree, 9431);
    }
    HFS_TRY(tree->ExtendBTree(static_cast<u32>(target), nullptr, &growBytes), 3916);
    return kOk;
}

}  // namespace

int CBTreeHfs::ReserveSpace(int request, BTReserve* reserve) {
    const u32 packed = static_cast<u32>(request);
    const Request counts{packed & 0xFFFF, packed >> 16};
    const u32 need = WorstCase(header.treeDepth, counts);
    const bool joins = reserve != nullptr && reservationOpen;
    if (joins && need > kMostNodes - reservedNodes) {
        return Fail(kErrCorrupt, kReasonTree, 9432);
    }
    // Nodes taken under a reservation leave less free than promised; nothing is available then.
    const u32 available = header.freeNodes > reservedNodes ? header.freeNodes - reservedNodes : 0;
    if (need > available) {
        const int status = GrowBy(this, need - available, counts);
        if (status != kOk) {
            return status;
        }
    }
    if (reserve == nullptr) {
        return kOk;
    }
    if (joins) {
        reserve->owner = false;
        reservedNodes += need;
        return kOk;
    }
    HFS_ASSERT(reservedNodes == 0, 3930);
    *reserve = {need, 0, true};
    reservedNodes = need;
    reservationUsed = 0;
    reservationOpen = true;
    return kOk;
}

void CBTreeHfs::ReleaseSpace(BTReserve* reserve) {
    if (reserve == nullptr || !reserve->owner) {
        return;
    }
    reserve->owner = false;
    reservedNodes = 0;
    reservationOpen = false;
}

}  // namespace VELK
