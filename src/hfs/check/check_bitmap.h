// The blocks that something owns, and the allocation file they are compared with.
#pragma once

#include "hfs/check/check_volume.h"

namespace VELK {

enum class ClaimKind : u8 { kReserved, kSpecial, kBadBlocks, kData, kResource, kAttribute };

struct CheckClaim {
    u32 start;
    u32 count;
    u32 owner;  // file ID
    ClaimKind kind;
};

// "blocks 10..12 of file 20", for findings.
std::string CheckClaimText(const CheckClaim& claim);
CheckPlace CheckBlocksPlace(const CheckVolumeState& state, u32 start, u32 count);

// Owned blocks must be marked, marks and the count of free blocks must agree (V05, V06).
// REQUIRES: claims sorted by start, all inside the volume.
void CheckBitmap(CheckVolumeState* state, const std::vector<CheckClaim>& claims);

}  // namespace VELK
