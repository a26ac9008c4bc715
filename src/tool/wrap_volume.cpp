// Apple partition maps and GUID partition tables with one partition.
#include "tool/wrap_volume.h"

#include <cstring>
#include <string_view>
#include <vector>

#include "hfs/treehfs/bytes.h"

namespace VELK::tool {

namespace {

constexpr u32 kSector = kSectorSize;
constexpr u32 kFirstSector = 64;   // of the volume, in either scheme
constexpr u32 kTableSectors = 32;  // 128 entries of 128 bytes
constexpr u32 kTableEntries = 128;
constexpr u32 kEntrySize = 128;
constexpr u32 kGptHeaderSize = 92;
constexpr u32 kGptRevision = 0x00010000;
constexpr u32 kEndSectors = kTableSectors + 1;  // the second table and its header
constexpr u32 kApmStatus = 0x40000033;          // valid, in use, readable, writable

// HFS+ in the byte order that GUIDs have on disk.
constexpr u8 kHfsGuid[16] = {0x00, 0x53, 0x46, 0x48, 0x00, 0x00, 0xAA, 0x11,
                             0xAA, 0x11, 0x00, 0x30, 0x65, 0x43, 0xEC, 0xAC};

class OwnedSlice : public SliceDevice {
public:
    OwnedSlice(std::unique_ptr<BlockDevice> base, u64 offset, u64 size)
        : SliceDevice(base.get(), offset, size), owned_(std::move(base)) {}

private:
    std::unique_ptr<BlockDevice> owned_;
};

void PutLe32(u8* bytes, u32 value) {
    for (int i = 0; i < 4; ++i) {
        bytes[i] = static_cast<u8>(value >> (8 * i));
    }
}

// The characters alone, without a zero behind them.
void PutText(u8* bytes, std::string_view text) {
    text.copy(reinterpret_cast<char*>(bytes), text.size());
}

void PutLe64(u8* bytes, u64 value) {
    PutLe32(bytes, static_cast<u32>(value));
    PutLe32(bytes + 4, static_cast<u32>(value >> 32));
}

u32 Crc32(const u8* bytes, std::size_t size) {
    u32 crc = ~0u;
    for (std::size_t i = 0; i < size; ++i) {
        crc ^= bytes[i];
        for (int bit = 0; bit < 8; ++bit) {
            crc = (crc >> 1) ^ ((crc & 1) != 0 ? 0xEDB88320u : 0);
        }
    }
    return ~crc;
}

// A random-looking GUID (version 4) of a number.
void PutGuid(u8* bytes, u64 seed) {
    PutLe64(bytes, seed * 0x9E3779B97F4A7C15u);
    PutLe64(bytes + 8, (seed ^ 0x5DEECE66Du) * 0xC2B2AE3D27D4EB4Fu);
    bytes[7] = static_cast<u8>((bytes[7] & 0x0F) | 0x40);
    bytes[8] = static_cast<u8>((bytes[8] & 0x3F) | 0x80);
}

u64 SectorsOf(u64 volumeBytes) {
    return (volumeBytes + kSector - 1) / kSector;
}

void ApmEntry(u8* entry, u32 start, u32 count, const char* name, const char* type) {
    PutText(entry, "PM");
    PutBe32(entry + 4, 2);  // entries in the map
    PutBe32(entry + 8, start);
    PutBe32(entry + 12, count);
    std::strncpy(reinterpret_cast<char*>(entry + 16), name, 31);
    std::strncpy(reinterpret_cast<char*>(entry + 48), type, 31);
    PutBe32(entry + 84, count);
    PutBe32(entry + 88, kApmStatus);
}

IoResult WriteApm(BlockDevice* image, const WrappedVolume& volume) {
    u8 map[3 * kSector] = {};
    PutText(map, "ER");
    PutBe16(map + 2, kSector);
    PutBe32(map + 4, static_cast<u32>(image->Size() / kSector));
    ApmEntry(map + kSector, 1, kFirstSector - 1, "Apple", "Apple_partition_map");
    ApmEntry(map + 2 * kSector, kFirstSector, static_cast<u32>(SectorsOf(volume.volumeBytes)),
             "disk image", volume.isHfsx ? "Apple_HFSX" : "Apple_HFS");
    return image->Write(0, map, sizeof map);
}

// Tools that know only the older kind of map see one partition over the whole disk.
void ProtectiveMbr(u8* sector, u64 sectors) {
    u8* entry = sector + 446;
    entry[2] = 2;
    entry[4] = 0xEE;
    std::memset(entry + 5, 0xFF, 3);
    PutLe32(entry + 8, 1);
    PutLe32(entry + 12, sectors - 1 > 0xFFFFFFFF ? 0xFFFFFFFF : static_cast<u32>(sectors - 1));
    sector[510] = 0x55;
    sector[511] = 0xAA;
}

void GptHeader(u8* header, u64 own, u64 other, u64 table, u64 sectors, u64 uuid, u32 tableCrc) {
    PutText(header, "EFI PART");
    PutLe32(header + 8, kGptRevision);
    PutLe32(header + 12, kGptHeaderSize);
    PutLe64(header + 24, own);
    PutLe64(header + 32, other);
    PutLe64(header + 40, 2 + kTableSectors);  // first and last sector for partitions
    PutLe64(header + 48, sectors - 1 - kEndSectors);
    PutGuid(header + 56, uuid + 1);
    PutLe64(header + 72, table);
    PutLe32(header + 80, kTableEntries);
    PutLe32(header + 84, kEntrySize);
    PutLe32(header + 88, tableCrc);
    PutLe32(header + 16, Crc32(header, kGptHeaderSize));
}

IoResult WriteGpt(BlockDevice* image, const WrappedVolume& volume) {
    const u64 sectors = image->Size() / kSector;
    std::vector<u8> start((2 + kTableSectors) * kSector);
    u8* entry = start.data() + 2 * kSector;
    std::memcpy(entry, kHfsGuid, sizeof kHfsGuid);
    PutGuid(entry + 16, volume.uuid + 2);
    PutLe64(entry + 32, kFirstSector);
    PutLe64(entry + 40, kFirstSector + SectorsOf(volume.volumeBytes) - 1);
    const u32 crc = Crc32(entry, kTableEntries * kEntrySize);
    ProtectiveMbr(start.data(), sectors);
    GptHeader(start.data() + kSector, 1, sectors - 1, 2, sectors, volume.uuid, crc);
    IoResult result = image->Write(0, start.data(), start.size());
    std::vector<u8> end(kEndSectors * kSector);
    std::memcpy(end.data(), entry, kTableEntries * kEntrySize);
    GptHeader(end.data() + kTableSectors * kSector, sectors - 1, 1, sectors - kEndSectors, sectors,
              volume.uuid, crc);
    if (result.Ok()) {
        result = image->Write((sectors - kEndSectors) * kSector, end.data(), end.size());
    }
    return result;
}

}  // namespace

u64 WrappedSize(WrapScheme scheme, u64 volumeBytes) {
    switch (scheme) {
        case WrapScheme::kApm:
            return (kFirstSector + SectorsOf(volumeBytes)) * kSector;
        case WrapScheme::kGpt:
            return (kFirstSector + SectorsOf(volumeBytes) + kEndSectors) * kSector;
        case WrapScheme::kNone:
            break;
    }
    return volumeBytes;
}

std::unique_ptr<BlockDevice> VolumeWithin(WrapScheme scheme, std::unique_ptr<BlockDevice> image,
                                          u64 volumeBytes) {
    if (scheme == WrapScheme::kNone) {
        return image;
    }
    return std::make_unique<OwnedSlice>(std::move(image), u64{kFirstSector} * kSector, volumeBytes);
}

IoResult WriteMap(WrapScheme scheme, BlockDevice* image, const WrappedVolume& volume) {
    switch (scheme) {
        case WrapScheme::kApm:
            return WriteApm(image, volume);
        case WrapScheme::kGpt:
            return WriteGpt(image, volume);
        case WrapScheme::kNone:
            break;
    }
    return {};
}

}  // namespace VELK::tool
