// Default clump size of a tree file: the step in which it grows.
#include <bit>

#include "hfs/treehfs.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

// MiB, by volume size: below 2 GiB, from 2 GiB, from 4 GiB, ... from 16 TiB on.
constexpr u16 s_ClumpAttrTable[] = {4,   6,   8,   11,  64,  84,  111, 147,
                                    194, 256, 294, 338, 388, 446, 512};
constexpr u32 kLastIndex = sizeof s_ClumpAttrTable / sizeof s_ClumpAttrTable[0] - 1;
constexpr u32 kMiBShift = 20;
constexpr u32 kTableShift = 31;  // one step of the table per doubling from 2 GiB on

constexpr u64 kLargestSmallVolume = 0x3FFFFFFF;
constexpr u32 kSmallVolumeShare = 128;
constexpr u32 kLeastClumpNodes = 8;

}  // namespace

unsigned GetHfsClumpSize(unsigned blockSize, unsigned nodeSize,
                         const unsigned long long& volumeSize, unsigned fileId) {
    const u64 size = volumeSize;
    u64 clump;
    if (size > kLargestSmallVolume) {
        // The table was made for the attributes file; other files that come here share it.
        HFS_ASSERT(fileId == kAttributesFileId, 5220);
        const u32 index = static_cast<u32>(std::bit_width(size >> kTableShift));
        clump = u64{s_ClumpAttrTable[index < kLastIndex ? index : kLastIndex]} << kMiBShift;
    } else {
        const u64 least = u64{kLeastClumpNodes} * nodeSize;
        clump = size / kSmallVolumeShare;
        clump = clump < least ? least : clump;
    }
    const u64 unit = nodeSize < blockSize ? blockSize : nodeSize;
    if (unit == 0) {
        return 0;
    }
    const u64 rounded = clump - clump % unit;
    return static_cast<unsigned>(rounded == 0 ? unit : rounded);
}

}  // namespace VELK
