// The readers of partition maps behind LocateVolume.
#pragma once

#include <vector>

#include "hfs/volume/partition.h"

namespace VELK {

// Each appends the entries of its map and returns whether the image has such a map.
bool ReadGpt(BlockDevice* image, std::vector<PartitionEntry>* entries);
bool ReadApm(BlockDevice* image, std::vector<PartitionEntry>* entries);
bool ReadMbr(BlockDevice* image, std::vector<PartitionEntry>* entries);

// Whether the map itself says that the partition holds HFS or HFS+.
bool IsHfsType(const PartitionEntry& entry);

// A compressed or foreign container; no problem when the image is none.
Problem IdentifyContainer(BlockDevice* image);

}  // namespace VELK
