// Writes a new, empty HFS+ or HFSX volume onto a device. The trees are made by the engine's Create
// and the first catalog records by its InsertRecord.
//
//     FormatOptions options;
//     options.name = u"Scratch";
//     auto volume = MakeMemoryVolume(64 << 20, options, &problem);  // mounted, and writable
#pragma once

#include <memory>
#include <string>

#include "hfs/volume/block_device.h"
#include "hfs/volume/image_volume.h"
#include "hfs/volume/problem.h"

namespace VELK {

// What the new volume is like. Sizes are bytes; node sizes and block size powers of two. Values a
// volume cannot have are refused with ExitClass::kUsage.
struct FormatOptions {
    bool caseSensitive = false;  // HFSX with binary name order
    u32 blockSize = 4096;        // allocation block, 512 to 65,536
    // Nodes, 512 to 32,768.
    u32 catalogNodeSize = 4096;
    u32 extentsNodeSize = 4096;
    u32 attributesNodeSize = 8192;
    // First size of the tree files; 0: by the clump size.
    u64 catalogSize = 0;
    u64 extentsSize = 0;
    u64 attributesSize = 0;
    u64 journalSize = 0;         // bytes, rounded up to blocks; 0: no journal
    u32 clumpSize = 0;           // of the tree forks, bytes; 0: by the volume's size
    bool withAttributes = true;  // an attributes tree, empty
    bool withRoot = true;     // the records of the root folder; without them the catalog is empty
    bool emptyTrees = false;  // forks of size 0 and no records: trees are left to the caller
    std::u16string name = u"Untitled";  // decomposed
    u32 date = 0;                       // seconds since 1904, written to every date
    u64 uuid = 0;                       // volume identifier
    bool deviceIsZero = false;          // just made: nothing has to be zeroed
    u32 mapBlockSize = 0;               // of the mounted volume; 0: the smallest node size
};

// Whether a volume of `size` bytes can be made so: what MakeVolume would refuse before it writes.
Problem CheckFormat(u64 size, const FormatOptions& options);

// Formats `device` and mounts it with Access::kWrite. Null with `*problem` set.
std::unique_ptr<ImageVolume> MakeVolume(std::unique_ptr<BlockDevice> device,
                                        const FormatOptions& options, Problem* problem);

// A fresh volume of `size` bytes in memory.
std::unique_ptr<ImageVolume> MakeMemoryVolume(u64 size, const FormatOptions& options,
                                              Problem* problem);

}  // namespace VELK
