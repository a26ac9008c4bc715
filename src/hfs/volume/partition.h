// Finds the HFS+ volume in an image: bare, in an Apple partition map, a GUID partition table or an
// MBR, or inside an old HFS volume (wrapper). Keeps a list of everything it looked at, with the
// reason why it was taken or left.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "hfs/volume/block_device.h"
#include "hfs/volume/problem.h"

namespace VELK {

// Kind of partition map: none, Apple partition map, GUID partition table, MBR.
enum class PartitionScheme { kNone, kApm, kGpt, kMbr };

const char* SchemeName(PartitionScheme scheme);  // "none", "APM", "GPT", "MBR"

// What lies at a place of the image.
enum class Content {
    kUnknown,
    kHfsPlus,
    kHfsx,
    kWrapper,   // HFS volume with an HFS+ volume inside
    kPlainHfs,  // HFS volume without one
    kOther,     // another file system that was recognised
};

// One partition of a map, and what was found in it.
struct PartitionEntry {
    u32 number = 0;                                   // as the map numbers it, from 1
    PartitionScheme scheme = PartitionScheme::kNone;  // of the map that lists it
    u64 offset = 0;                                   // bytes from the image's start
    u64 size = 0;                                     // bytes, as the map says
    std::string type;                                 // "Apple_HFS", a GUID, "0xAF"
    std::string name;                                 // as the map says; an MBR has no names
    Content content = Content::kUnknown;              // what lies at its start
    std::string contentName;                          // "HFS+", "APFS (NXSB at 209,735,712)", ...
    bool holdsVolume = false;                         // an HFS+ or HFSX volume, bare or wrapped
    bool taken = false;                               // this is where the volume was found
    std::string reason;                               // why it was taken or left
};

// Where the volume was found.
struct VolumePlace {
    u64 offset = 0;  // of volume byte 0 in the image
    u64 size = 0;    // bytes the volume may take, as the map or wrapper says
    PartitionScheme scheme = PartitionScheme::kNone;  // of the map that led there
    u32 partition = 0;                                // 0: no partition
    u32 partitions = 0;                               // how many the map lists
    bool wrapped = false;                             // it lies inside an old HFS volume
    u64 wrapperOffset = 0;                            // where that one starts in the image
};

// Everything the search looked at.
struct VolumeScan {
    PartitionScheme scheme = PartitionScheme::kNone;  // of the map that was used
    std::vector<PartitionEntry> partitions;           // all of them, in the map's order
    VolumePlace place;                                // where the volume was found
};

// Where to look.
struct PlaceOptions {
    std::optional<u64> offset;  // bytes; the volume (or its wrapper) starts here
    u32 partition = 0;          // 0: whichever holds a volume
    bool lenient = false;       // accept a place whose header signature is gone
};

// Fills `*scan`; `scan->place` is set when no problem is returned.
Problem LocateVolume(BlockDevice* image, const PlaceOptions& options, VolumeScan* scan);

// Lists the partitions only (none: empty list, scheme kNone).
Problem ListPartitions(BlockDevice* image, VolumeScan* scan);

// Names what lies at byte `offset`.
Content Identify(BlockDevice* image, u64 offset, std::string* name);

}  // namespace VELK
