// Extents as runs, and back.
#include "hfs/volume/fork_map.h"

#include "platform/error.h"

namespace VELK {

int AppendExtents(HfsRuns* runs, const HfsExtent* extents, u32 totalBlocks, u32 limit, u32* next) {
    for (u32 i = 0; i < kExtentCount && extents[i].blockCount != 0; ++i) {
        const u64 end = u64{extents[i].startBlock} + extents[i].blockCount;
        const u64 newNext = u64{*next} + extents[i].blockCount;
        if (end > totalBlocks || newNext > limit) {
            return kErrInvalid;
        }
        if (!runs->AddEntry(*next, extents[i].startBlock, extents[i].blockCount)) {
            return kErrNoMemory;
        }
        *next = static_cast<u32>(newNext);
    }
    return kOk;
}

void SetInlineExtents(const HfsRuns& runs, HfsFork* fork) {
    for (u32 i = 0; i < kExtentCount; ++i) {
        fork->extents[i] = {0, 0};
        if (i < runs.Count()) {
            fork->extents[i] = {runs.At(i).lcn, runs.At(i).length};
        }
    }
}

}  // namespace VELK
