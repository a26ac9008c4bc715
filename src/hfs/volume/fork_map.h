// Where the bytes of a special file lie on the volume: extents as runs, and a range cut into pieces
// that lie together.
#pragma once

#include <algorithm>

#include "hfs/fshfs.h"
#include "hfs/volume/wire.h"

namespace VELK {

// Calls step(volumeOffset, done, bytes) for each piece of the fork's bytes [offset, offset + bytes)
// that lies together, `done` being the bytes before it; stops at the first status that is not 0.
// Returns `unmapped` when a part lies in no extent.
template <typename Step>
int ForEachPiece(const HfsRuns& runs, u32 blockShift, u64 offset, u64 bytes, int unmapped,
                 Step step) {
    u64 done = 0;
    while (done < bytes) {
        const u64 block = (offset + done) >> blockShift;
        u32 first = 0;
        u32 count = 0;
        if (block >= HfsRuns::kHole || !runs.Lookup(static_cast<u32>(block), &first, &count) ||
            first == HfsRuns::kHole) {
            return unmapped;
        }
        const u64 inBlock = (offset + done) & ((u64{1} << blockShift) - 1);
        const u64 piece = std::min(bytes - done, (u64{count} << blockShift) - inBlock);
        const int status = step((u64{first} << blockShift) + inBlock, done, piece);
        if (status != 0) {
            return status;
        }
        done += piece;
    }
    return 0;
}

// Blocks that `runs` maps from the fork's start on without a gap.
inline u32 MappedBlocks(const HfsRuns& runs) {
    u32 blocks = 0;
    for (u32 i = 0; i < runs.Count() && runs.At(i).vcn == blocks; ++i) {
        blocks += runs.At(i).length;
    }
    return blocks;
}

// Appends the extents of one record to `runs` at fork block `*next`, which moves on. Stops at the
// first unused extent. kErrInvalid: an extent leaves the volume, or the fork would hold more than
// `limit` blocks; `runs` then keeps what was appended. Else 0 or kErrNoMemory.
int AppendExtents(HfsRuns* runs, const HfsExtent* extents, u32 totalBlocks, u32 limit, u32* next);

// Sets the fork's eight extents from its runs; the rest belongs to overflow records.
void SetInlineExtents(const HfsRuns& runs, HfsFork* fork);

}  // namespace VELK
