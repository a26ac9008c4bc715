// Reads the three kinds of partition maps into one list. Every count and position comes from the
// image and is bounded here; an entry that cannot be is dropped.
#include "hfs/volume/partition_maps.h"

#include <algorithm>
#include <cstring>

#include "hfs/volume/wire.h"

namespace VELK {

namespace {

constexpr u32 kMostEntries = 4096;  // more than any map that was made by a program

std::string FixedText(const u8* bytes, std::size_t size) {
    std::string text;
    for (std::size_t i = 0; i < size && bytes[i] != 0; ++i) {
        text += bytes[i] >= 0x20 && bytes[i] < 0x7F ? static_cast<char>(bytes[i]) : '?';
    }
    return text;
}

// Name of a GPT entry: 36 little-endian UTF-16 units, shown as far as they are ASCII.
std::string GptName(const u8* bytes) {
    std::string text;
    for (u32 i = 0; i < 36; ++i) {
        const u32 unit = bytes[2 * i] | (static_cast<u32>(bytes[2 * i + 1]) << 8);
        if (unit == 0) {
            break;
        }
        text += unit >= 0x20 && unit < 0x7F ? static_cast<char>(unit) : '?';
    }
    return text;
}

std::string GuidText(const u8* bytes) {
    return Format("%08X-%02X%02X-%02X%02X-%02X%02X-%02X%02X%02X%02X%02X%02X", Le32(bytes), bytes[5],
                  bytes[4], bytes[7], bytes[6], bytes[8], bytes[9], bytes[10], bytes[11], bytes[12],
                  bytes[13], bytes[14], bytes[15]);
}

bool ReadGptAt(BlockDevice* image, u64 sectorSize, std::vector<PartitionEntry>* entries) {
    u8 header[128];
    if (!image->Read(sectorSize, header, sizeof header).Ok() ||
        std::memcmp(header, "EFI PART", 8) != 0) {
        return false;
    }
    const u64 firstSector = Le64(header + 72);
    const u32 count = std::min(Le32(header + 80), kMostEntries);
    const u32 entrySize = Le32(header + 84);
    if (entrySize < 128 || entrySize > 4096 || firstSector > image->Size() / sectorSize) {
        return false;
    }
    const u64 most = ~u64{0} / sectorSize - 1;
    for (u32 i = 0; i < count; ++i) {
        u8 entry[128];
        static const u8 unused[16] = {};
        if (!image->Read(firstSector * sectorSize + u64{i} * entrySize, entry, sizeof entry).Ok()) {
            break;
        }
        const u64 first = Le64(entry + 32);
        const u64 last = Le64(entry + 40);
        if (std::memcmp(entry, unused, 16) == 0 || last < first || last > most) {
            continue;
        }
        PartitionEntry found;
        found.number = i + 1;
        found.scheme = PartitionScheme::kGpt;
        found.offset = first * sectorSize;
        found.size = (last - first + 1) * sectorSize;
        found.type = GuidText(entry);
        found.name = GptName(entry + 56);
        entries->push_back(found);
    }
    return true;
}

}  // namespace

bool ReadGpt(BlockDevice* image, std::vector<PartitionEntry>* entries) {
    for (const u64 sectorSize : {u64{512}, u64{2048}, u64{4096}}) {
        if (ReadGptAt(image, sectorSize, entries)) {
            return true;
        }
    }
    return false;
}

bool ReadApm(BlockDevice* image, std::vector<PartitionEntry>* entries) {
    u8 driver[4];
    if (!image->Read(0, driver, sizeof driver).Ok() || std::memcmp(driver, "ER", 2) != 0) {
        return false;
    }
    // The block size decides where entries stand; a size that finds no entry is not believed.
    u64 blockSize = Be16(driver + 2);
    u8 entry[512];
    const auto readEntry = [&](u64 number) {
        return image->Read(number * blockSize, entry, sizeof entry).Ok() &&
               std::memcmp(entry, "PM", 2) == 0;
    };
    if (!IsPowerOfTwo(blockSize) || blockSize < 512 || !readEntry(1)) {
        blockSize = 512;
        if (!readEntry(1)) {
            return false;
        }
    }
    const u32 count = std::min(Be32(entry + 4), kMostEntries);
    for (u32 i = 1; i <= count; ++i) {
        if (!readEntry(i)) {
            break;
        }
        PartitionEntry found;
        found.number = i;
        found.scheme = PartitionScheme::kApm;
        found.offset = Be32(entry + 8) * blockSize;
        found.size = Be32(entry + 12) * blockSize;
        found.name = FixedText(entry + 16, 32);
        found.type = FixedText(entry + 48, 32);
        entries->push_back(found);
    }
    return true;
}

bool ReadMbr(BlockDevice* image, std::vector<PartitionEntry>* entries) {
    u8 sector[512];
    if (!image->Read(0, sector, sizeof sector).Ok() || sector[510] != 0x55 || sector[511] != 0xAA) {
        return false;
    }
    // The same two bytes end the boot sector of other file systems, whose code then stands where
    // entries would: a status other than 0 or 0x80 gives it away.
    for (u32 i = 0; i < 4; ++i) {
        if ((sector[446 + 16 * i] & 0x7F) != 0) {
            return false;
        }
    }
    for (u32 i = 0; i < 4; ++i) {
        const u8* entry = sector + 446 + 16 * i;
        if (entry[4] == 0 || Le32(entry + 12) == 0) {
            continue;
        }
        PartitionEntry found;
        found.number = i + 1;
        found.scheme = PartitionScheme::kMbr;
        found.offset = u64{Le32(entry + 8)} * 512;
        found.size = u64{Le32(entry + 12)} * 512;
        found.type = Format("0x%02X", entry[4]);
        entries->push_back(found);
    }
    return !entries->empty();
}

bool IsHfsType(const PartitionEntry& entry) {
    switch (entry.scheme) {
        case PartitionScheme::kApm:
            return entry.type == "Apple_HFS" || entry.type == "Apple_HFSX";
        case PartitionScheme::kGpt:
            return entry.type == "48465300-0000-11AA-AA11-00306543ECAC";
        case PartitionScheme::kMbr:
            return entry.type == "0xAF";
        case PartitionScheme::kNone:
            break;
    }
    return false;
}

}  // namespace VELK
