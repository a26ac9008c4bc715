// Small volumes on devices that the test keeps.
#include "small_volume.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>

#include "hfs/volume/wire.h"

namespace VELK::test {

namespace {

constexpr u32 kRecordSize = 100;

}  // namespace

FormatOptions SmallTrees() {
    FormatOptions options;
    options.blockSize = 512;
    options.catalogNodeSize = 512;
    options.extentsNodeSize = 512;
    options.attributesNodeSize = 512;
    options.clumpSize = 512;
    return options;
}

FormatOptions SmallFormat(u64 journalSize) {
    FormatOptions options = SmallTrees();
    options.withAttributes = false;
    options.journalSize = journalSize;
    return options;
}

std::vector<u8> BytesOf(BlockDevice* device) {
    std::vector<u8> bytes(static_cast<std::size_t>(device->Size()));
    EXPECT_TRUE(device->Read(0, bytes.data(), bytes.size()).Ok());
    return bytes;
}

std::unique_ptr<MemoryDevice> DeviceWith(const std::vector<u8>& bytes) {
    auto device = std::make_unique<MemoryDevice>(bytes.size());
    EXPECT_TRUE(device->Write(0, bytes.data(), bytes.size()).Ok());
    return device;
}

std::unique_ptr<MemoryDevice> FreshDevice(u64 size, const FormatOptions& options) {
    auto device = std::make_unique<MemoryDevice>(size);
    FormatOptions zeroed = options;
    zeroed.deviceIsZero = true;
    Problem problem;
    auto volume =
        MakeVolume(std::make_unique<SliceDevice>(device.get(), 0, size), zeroed, &problem);
    EXPECT_NE(nullptr, volume) << problem.Text();
    return device;
}

OpenOptions Writing(bool force) {
    OpenOptions options;
    options.access = Access::kWrite;
    options.offset = 0;
    options.replay = true;
    options.force = force;
    return options;
}

std::unique_ptr<ImageVolume> MountOn(BlockDevice* device, const OpenOptions& options,
                                     Problem* problem) {
    return ImageVolume::Open(std::make_unique<SliceDevice>(device, 0, device->Size()), options,
                             nullptr, problem);
}

NumberKey::NumberKey(u32 number) {
    const u16 length = kCatKeyFixed;
    std::memcpy(bytes, &length, sizeof length);
    std::memcpy(bytes + kCatKeyParentId, &number, sizeof number);
}

int InsertNumber(ImageVolume* volume, u32 number) {
    const NumberKey key(number);
    u8 data[kRecordSize] = {0xFF, 0xFF};
    StoreBe32(data + 4, number);
    return volume->Tree(kCatalogFileId, nullptr)
        ->InsertRecord(key.bytes, number, data, sizeof data);
}

int UpdateNumber(ImageVolume* volume, u32 number, u8 fill) {
    const NumberKey key(number);
    u8 data[kRecordSize];
    std::memset(data, fill, sizeof data);
    data[0] = 0xFF;
    data[1] = 0xFF;
    CBTreeHfs* tree = volume->Tree(kCatalogFileId, nullptr);
    bool found = false;
    int status = tree->FindEntry(key.Get(), number, &tree->findData, &found, nullptr, nullptr,
                                 nullptr, nullptr);
    if (status == kOk) {
        status = found ? tree->UpdateKeyAndRecord(nullptr, data) : kErrNotFound;
    }
    tree->findData.ClearPath();
    return status;
}

int DeleteNumber(ImageVolume* volume, u32 number) {
    const NumberKey key(number);
    return volume->Tree(kCatalogFileId, nullptr)->DeleteRecord(key.bytes, number, false);
}

bool HasNumber(ImageVolume* volume, u32 number) {
    const NumberKey key(number);
    HfsFindData path;
    bool found = false;
    EXPECT_EQ(
        0, volume->Tree(kCatalogFileId, nullptr)
               ->FindEntry(key.Get(), number, &path, &found, nullptr, nullptr, nullptr, nullptr));
    path.ClearPath();
    return found;
}

JournalPlace JournalOf(BlockDevice* device) {
    u8 bytes[kHeaderSize];
    EXPECT_TRUE(device->Read(kHeaderOffset, bytes, sizeof bytes).Ok());
    VolumeHeader header;
    DecodeHeader(bytes, &header);
    JournalPlace place;
    const JournalState state = ReadJournalState(device, header, 0, &place);
    EXPECT_TRUE(state.readable) << state.text;
    return place;
}

void StoreJournalHeader(BlockDevice* device, const JournalPlace& place) {
    EXPECT_TRUE(WriteJournalHeader(device, place).Ok());
}

void MoveJournal(BlockDevice* device, u64 position, bool isLittle) {
    JournalPlace place = JournalOf(device);
    ASSERT_EQ(0u, place.header.Used());
    place.header.start = position;
    place.header.end = position;
    place.header.isLittle = isLittle;
    StoreJournalHeader(device, place);
}

std::vector<u8> Essence(std::vector<u8> bytes, const JournalPlace& place) {
    const auto journal = bytes.begin() + static_cast<std::ptrdiff_t>(place.offset);
    std::fill(journal, journal + static_cast<std::ptrdiff_t>(place.size), u8{0});
    u8* header = bytes.data() + kHeaderOffset;
    StoreBe32(header + 4, Be32(header + 4) & ~kVolUnmounted);
    StoreBe32(header + 8, 0);
    return bytes;
}

}  // namespace VELK::test
