// Small volumes with records of no meaning. Where a test asks what reaches the medium, the device
// belongs to the test, and a cut is a copy of its bytes taken while the volume is mounted.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "hfs/volume/image_volume.h"
#include "hfs/volume/journal_state.h"
#include "hfs/volume/make_volume.h"

namespace VELK::test {

// Blocks of 512 bytes and trees of 512-byte nodes: all three; or no attributes tree, and a journal.
FormatOptions SmallTrees();
FormatOptions SmallFormat(u64 journalSize);

std::vector<u8> BytesOf(BlockDevice* device);
std::unique_ptr<MemoryDevice> DeviceWith(const std::vector<u8>& bytes);
// A fresh volume, unmounted.
std::unique_ptr<MemoryDevice> FreshDevice(u64 size, const FormatOptions& options);

OpenOptions Writing(bool force = false);  // with replay
// Mounts without owning the device.
std::unique_ptr<ImageVolume> MountOn(BlockDevice* device, const OpenOptions& options,
                                     Problem* problem);

// Catalog key with an empty name under the parent `number`, in host order.
struct alignas(4) NumberKey {
    u8 bytes[kCatKeyName] = {};

    explicit NumberKey(u32 number);
    const BTreeKey* Get() const { return reinterpret_cast<const BTreeKey*>(bytes); }
};

// Catalog records with such keys, 100 bytes each.
int InsertNumber(ImageVolume* volume, u32 number);
int UpdateNumber(ImageVolume* volume, u32 number, u8 fill);
int DeleteNumber(ImageVolume* volume, u32 number);
bool HasNumber(ImageVolume* volume, u32 number);

// Where the journal of the volume on `device` lies.
JournalPlace JournalOf(BlockDevice* device);
// Puts `place`'s header onto the device.
void StoreJournalHeader(BlockDevice* device, const JournalPlace& place);
// Makes the journal begin at `position`, empty.
void MoveJournal(BlockDevice* device, u64 position, bool isLittle);

// What the checker says about the volume with all its invariants: errors and warnings, a line each;
// empty: none.
std::string CheckAll(BlockDevice* device);

// The volume without what may differ between two media that hold the same: the journal, and from
// the volume header the clean bit and the last writer's code.
std::vector<u8> Essence(std::vector<u8> bytes, const JournalPlace& place);

}  // namespace VELK::test
