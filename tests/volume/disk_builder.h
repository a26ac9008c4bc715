// Builds whole small volumes and disks from bytes, without the engine and the volume layer.
#pragma once

#include <memory>
#include <string>

#include "hfs/volume/block_device.h"
#include "tree_image.h"

namespace VELK::test {

struct DiskVolume {
    u32 blockSize = 4096;
    u32 blocks = 64;
    u32 tailBytes = 0;  // behind the last block
    bool hfsx = false;
    u32 catalogNodeSize = 4096;
    u32 extentsNodeSize = 4096;
    u32 attributesNodeSize = 8192;  // 0: no attributes tree
    u32 files = 3;
    u32 catalogPiece = 0;  // blocks of one extent of the catalog, a gap after each; 0: one extent
    u64 journalStart = 0;  // 0: no journal
    u64 journalEnd = 0;

    Bytes Build() const;
};

// Image offset of the catalog's first block in a volume built without pieces.
u64 CatalogOffset(const DiskVolume& volume);

// The volume as partition `index` + 1 of a map of three, the others being something else. The map
// takes the first 64 KiB.
Bytes InApm(const Bytes& volume, u32 mapBlockSize);
Bytes InGpt(const Bytes& volume, u32 sectorSize);
Bytes InMbr(const Bytes& volume);
// The volume inside an old HFS volume, whose blocks have 1,024 bytes.
Bytes InWrapper(const Bytes& volume);
constexpr u64 kPartitionStart = 65536;
constexpr u64 kWrappedStart = 11 * 512 + 36 * 1024;

std::unique_ptr<BlockDevice> DeviceOf(const Bytes& bytes);

}  // namespace VELK::test
