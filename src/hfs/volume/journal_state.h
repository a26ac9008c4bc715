// What the journal of a volume holds, looked at without carrying anything out.
#pragma once

#include "hfs/volume/block_device.h"
#include "hfs/volume/image_volume.h"

namespace VELK {

// `volume` starts at volume byte 0, which is byte `imageOffset` of the image.
JournalState ReadJournalState(BlockDevice* volume, const VolumeHeader& header, u64 imageOffset);

// Checksum of journal headers and block list headers over `size` bytes as stored; the four bytes at
// `checksumAt` count as 0.
u32 JournalChecksum(const u8* bytes, u32 size, u32 checksumAt);

}  // namespace VELK
