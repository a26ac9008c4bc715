// A partition map around a new volume: the image then looks like that of a whole disk.
#pragma once

#include <memory>
#include <string>

#include "hfs/volume/block_device.h"

namespace VELK::tool {

enum class WrapScheme { kNone, kApm, kGpt };

struct WrappedVolume {
    u64 volumeBytes = 0;
    bool isHfsx = false;
    u64 uuid = 0;  // the disk's and the partition's numbers come from it
};

// Bytes of the image that holds a volume of that size.
u64 WrappedSize(WrapScheme scheme, u64 volumeBytes);
// The part of `image` in which the volume lies; the result owns the image.
std::unique_ptr<BlockDevice> VolumeWithin(WrapScheme scheme, std::unique_ptr<BlockDevice> image,
                                          u64 volumeBytes);
// Writes the map.
IoResult WriteMap(WrapScheme scheme, BlockDevice* image, const WrappedVolume& volume);

}  // namespace VELK::tool
