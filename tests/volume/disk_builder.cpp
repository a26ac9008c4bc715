// Volumes and partition maps, field by field.
#include "disk_builder.h"

#include <algorithm>
#include <cstring>

#include "hfs/volume/wire.h"

namespace VELK::test {

namespace {

struct Extent {
    u32 start;
    u32 count;
};

// A disk under construction: blocks are handed out from the start.
struct Disk {
    const DiskVolume& shape;
    Bytes bytes;
    u32 next = 0;
    std::vector<bool> used;

    explicit Disk(const DiskVolume& volume) : shape(volume) {
        bytes.resize(std::size_t{volume.blockSize} * volume.blocks + volume.tailBytes);
        used.resize(volume.blocks);
        for (std::size_t at = 0; at < 1536; at += 512) {
            Use(static_cast<u32>(at / volume.blockSize));
        }
        Use(static_cast<u32>((bytes.size() - 1024) / volume.blockSize));
        Use(volume.blocks - 1);
        next = static_cast<u32>(CeilDiv(1536, volume.blockSize));
    }
    void Use(u32 block) {
        if (block < used.size()) {
            used[block] = true;
        }
    }
    u32 BlocksFor(std::size_t size) const {
        return static_cast<u32>(CeilDiv(size, shape.blockSize));
    }
    void Put(u32 block, const Bytes& content) {
        std::copy(
            content.begin(), content.end(),
            bytes.begin() + static_cast<std::ptrdiff_t>(std::size_t{block} * shape.blockSize));
    }
    // Places a file in pieces of `piece` blocks with a free block after each.
    std::vector<Extent> Place(const Bytes& content, u32 piece) {
        std::vector<Extent> extents;
        const u32 blocks = BlocksFor(content.size());
        for (u32 done = 0; done < blocks;) {
            const u32 count = piece == 0 ? blocks : std::min(piece, blocks - done);
            const std::size_t from = std::size_t{done} * shape.blockSize;
            const std::size_t to =
                std::min(content.size(), from + std::size_t{count} * shape.blockSize);
            Put(next, Bytes(content.begin() + static_cast<std::ptrdiff_t>(from),
                            content.begin() + static_cast<std::ptrdiff_t>(to)));
            for (u32 i = 0; i < count; ++i) {
                Use(next + i);
            }
            extents.push_back({next, count});
            next += count + (piece == 0 ? 0 : 1);
            done += count;
        }
        return extents;
    }
    void PutFork(std::size_t at, u64 size, const std::vector<Extent>& extents) {
        Put32(&bytes, at, static_cast<u32>(size >> 32));
        Put32(&bytes, at + 4, static_cast<u32>(size));
        u32 blocks = 0;
        for (std::size_t i = 0; i < extents.size(); ++i) {
            blocks += extents[i].count;
            if (i < 8) {
                Put32(&bytes, at + 16 + 8 * i, extents[i].start);
                Put32(&bytes, at + 20 + 8 * i, extents[i].count);
            }
        }
        Put32(&bytes, at + 12, blocks);
    }
};

Bytes CatalogKey(u32 parent, const std::string& name) {
    Bytes key;
    Append16(&key, static_cast<u32>(6 + 2 * name.size()));
    Append32(&key, parent);
    Append16(&key, static_cast<u32>(name.size()));
    for (const char c : name) {
        Append16(&key, static_cast<u8>(c));
    }
    return key;
}

Bytes Thread(u32 type, u32 parent, const std::string& name) {
    Bytes data;
    Append16(&data, type);
    Append16(&data, 0);
    Append32(&data, parent);
    Append16(&data, static_cast<u32>(name.size()));
    for (const char c : name) {
        Append16(&data, static_cast<u8>(c));
    }
    return data;
}

std::string FileName(u32 index) {
    char name[16];
    std::snprintf(name, sizeof name, "file%05u", index);
    return name;
}

// Root folder and thread, the files of the root, their threads: in key order.
std::vector<TreeRecord> CatalogRecords(u32 files) {
    Bytes folder(88);
    Put16(&folder, 0, 1);
    Put32(&folder, 4, files);
    Put32(&folder, 8, 2);
    std::vector<TreeRecord> records;
    records.push_back({CatalogKey(1, "Built"), folder});
    records.push_back({CatalogKey(2, ""), Thread(3, 1, "Built")});
    for (u32 i = 0; i < files; ++i) {
        Bytes file(248);
        Put16(&file, 0, 2);
        Put16(&file, 2, 2);
        Put32(&file, 8, 16 + i);
        records.push_back({CatalogKey(2, FileName(i)), file});
    }
    for (u32 i = 0; i < files; ++i) {
        records.push_back({CatalogKey(16 + i, ""), Thread(4, 2, FileName(i))});
    }
    return records;
}

// Extents records for what the catalog has beyond eight extents.
std::vector<TreeRecord> OverflowRecords(const std::vector<Extent>& extents) {
    std::vector<TreeRecord> records;
    u32 block = 0;
    for (std::size_t i = 0; i < extents.size(); ++i) {
        if (i >= 8 && i % 8 == 0) {
            Bytes key = {0, 10, 0, 0};
            Append32(&key, 4);
            Append32(&key, block);
            records.push_back({key, Bytes(64)});
        }
        if (i >= 8) {
            Put32(&records.back().data, 8 * (i % 8), extents[i].start);
            Put32(&records.back().data, 8 * (i % 8) + 4, extents[i].count);
        }
        block += extents[i].count;
    }
    return records;
}

TreeShape ShapeOf(u32 fileId, u32 nodeSize, u8 compare) {
    TreeShape shape;
    shape.fileId = fileId;
    shape.nodeSize = nodeSize;
    shape.keyCompareType = compare;
    shape.freeNodes = 2;
    return shape;
}

// Journal info block and journal header; a journal of 8 blocks.
void PutJournal(Disk* disk, const DiskVolume& shape) {
    const u32 info = disk->next;
    const u32 journal = info + 1;
    for (u32 i = 0; i < 9; ++i) {
        disk->Use(disk->next++);
    }
    Put32(&disk->bytes, 1024 + 4, 0x2100);
    Put32(&disk->bytes, 1024 + 12, info);
    const std::size_t at = std::size_t{info} * shape.blockSize;
    Put32(&disk->bytes, at, 1);
    Put32(&disk->bytes, at + 40, journal * shape.blockSize);
    Put32(&disk->bytes, at + 48, 8 * shape.blockSize);
    Bytes header;
    Append32(&header, 0x4A4E4C78);
    Append32(&header, 0x12345678);
    Append32(&header, 0);
    Append32(&header, static_cast<u32>(shape.journalStart));
    Append32(&header, 0);
    Append32(&header, static_cast<u32>(shape.journalEnd));
    Append32(&header, 0);
    Append32(&header, 8 * shape.blockSize);
    Append32(&header, 4096);
    Append32(&header, 0);
    Append32(&header, 512);
    u32 sum = 0;
    for (const u8 byte : header) {
        sum = (sum << 8) ^ (sum + byte);
    }
    Put32(&header, 36, ~sum);
    disk->Put(journal, header);
}

}  // namespace

Bytes DiskVolume::Build() const {
    Disk disk(*this);
    Bytes& bytes = disk.bytes;
    Put32(&bytes, 1024, hfsx ? 0x48580005 : 0x482B0004);
    Put32(&bytes, 1024 + 4, 0x100);
    Put32(&bytes, 1024 + 32, files);
    Put32(&bytes, 1024 + 40, blockSize);
    Put32(&bytes, 1024 + 44, blocks);
    Put32(&bytes, 1024 + 64, 16 + files);
    if (journalStart != 0) {
        PutJournal(&disk, *this);
    }
    const u32 bitmapBlock = disk.next;
    disk.PutFork(1024 + 112, CeilDiv(blocks, 8),
                 disk.Place(Bytes(static_cast<std::size_t>(CeilDiv(blocks, 8))), 0));
    const TreeImage catalog =
        BuildTree(ShapeOf(4, catalogNodeSize, hfsx ? 0xBC : 0xCF), CatalogRecords(files));
    const std::vector<Extent> extents = disk.Place(catalog.bytes, catalogPiece);
    disk.PutFork(1024 + 272, catalog.bytes.size(), extents);
    const TreeImage overflow = BuildTree(ShapeOf(3, extentsNodeSize, 0), OverflowRecords(extents));
    disk.PutFork(1024 + 192, overflow.bytes.size(), disk.Place(overflow.bytes, 0));
    if (attributesNodeSize != 0) {
        const TreeImage attributes = BuildTree(ShapeOf(8, attributesNodeSize, 0), {});
        disk.PutFork(1024 + 352, attributes.bytes.size(), disk.Place(attributes.bytes, 0));
    }
    u32 freeBlocks = 0;
    for (u32 block = 0; block < blocks; ++block) {
        if (disk.used[block]) {
            bytes[std::size_t{bitmapBlock} * blockSize + block / 8] |=
                static_cast<u8>(0x80 >> (block % 8));
        } else {
            freeBlocks += 1;
        }
    }
    Put32(&bytes, 1024 + 48, freeBlocks);
    std::copy_n(bytes.begin() + 1024, 512, bytes.end() - 1024);
    return bytes;
}

u64 CatalogOffset(const DiskVolume& volume) {
    const u64 reserved = CeilDiv(1536, volume.blockSize);
    return (reserved + CeilDiv(CeilDiv(volume.blocks, 8), volume.blockSize)) * volume.blockSize;
}

namespace {

Bytes WithMapSpace(const Bytes& volume) {
    Bytes disk(kPartitionStart);
    AppendBytes(&disk, volume);
    disk.resize(disk.size() + 4096);
    return disk;
}

void PutText(Bytes* bytes, std::size_t at, const char* text) {
    std::memcpy(bytes->data() + at, text, std::strlen(text));
}

void PutLe(Bytes* bytes, std::size_t at, u64 value, u32 size) {
    for (u32 i = 0; i < size; ++i) {
        bytes->at(at + i) = static_cast<u8>(value >> (8 * i));
    }
}

}  // namespace

Bytes InApm(const Bytes& volume, u32 mapBlockSize) {
    Bytes disk = WithMapSpace(volume);
    PutText(&disk, 0, "ER");
    Put16(&disk, 2, mapBlockSize);
    Put32(&disk, 4, 0xEB02FFFF);
    const char* types[] = {"Apple_partition_map", "Apple_HFS", "Apple_Free"};
    const u64 starts[] = {mapBlockSize, kPartitionStart, disk.size() - 4096};
    const u64 sizes[] = {kPartitionStart - mapBlockSize, volume.size(), 4096};
    for (u32 i = 0; i < 3; ++i) {
        const std::size_t at = std::size_t{i + 1} * mapBlockSize;
        PutText(&disk, at, "PM");
        Put32(&disk, at + 4, 3);
        Put32(&disk, at + 8, static_cast<u32>(starts[i] / mapBlockSize));
        Put32(&disk, at + 12, static_cast<u32>(sizes[i] / mapBlockSize));
        PutText(&disk, at + 16, i == 1 ? "Built" : "other");
        PutText(&disk, at + 48, types[i]);
    }
    return disk;
}

Bytes InGpt(const Bytes& volume, u32 sectorSize) {
    Bytes disk = WithMapSpace(volume);
    disk[510] = 0x55;
    disk[511] = 0xAA;
    disk[450] = 0xEE;
    PutLe(&disk, 454, 1, 4);
    PutLe(&disk, 458, disk.size() / 512 - 1, 4);
    PutText(&disk, sectorSize, "EFI PART");
    PutLe(&disk, sectorSize + 72, 2, 8);
    PutLe(&disk, sectorSize + 80, 4, 4);
    PutLe(&disk, sectorSize + 84, 128, 4);
    const u8 guid[16] = {0x00, 0x53, 0x46, 0x48, 0x00, 0x00, 0xAA, 0x11,
                         0xAA, 0x11, 0x00, 0x30, 0x65, 0x43, 0xEC, 0xAC};
    const std::size_t entry = std::size_t{2} * sectorSize + 128;
    std::copy_n(guid, 16, disk.begin() + static_cast<std::ptrdiff_t>(entry));
    PutLe(&disk, entry + 32, kPartitionStart / sectorSize, 8);
    PutLe(&disk, entry + 40, (kPartitionStart + volume.size()) / sectorSize - 1, 8);
    disk[entry + 56] = 'B';
    disk[entry + 58] = 'u';
    return disk;
}

Bytes InMbr(const Bytes& volume) {
    Bytes disk = WithMapSpace(volume);
    disk[510] = 0x55;
    disk[511] = 0xAA;
    disk[446 + 4] = 0x0C;
    PutLe(&disk, 446 + 8, 1, 4);
    PutLe(&disk, 446 + 12, 2, 4);
    disk[462] = 0x80;
    disk[462 + 4] = 0xAF;
    PutLe(&disk, 462 + 8, kPartitionStart / 512, 4);
    PutLe(&disk, 462 + 12, volume.size() / 512, 4);
    return disk;
}

Bytes InWrapper(const Bytes& volume) {
    Bytes disk(kWrappedStart);
    AppendBytes(&disk, volume);
    disk.resize(RoundUp(disk.size(), 1024) + 2048);
    PutText(&disk, 1024, "BD");
    Put32(&disk, 1024 + 20, 1024);
    Put16(&disk, 1024 + 28, 11);
    PutText(&disk, 1024 + 0x7C, "H+");
    Put16(&disk, 1024 + 0x7E, 36);
    Put16(&disk, 1024 + 0x80, static_cast<u32>(CeilDiv(volume.size(), 1024)));
    return disk;
}

std::unique_ptr<BlockDevice> DeviceOf(const Bytes& bytes) {
    auto device = std::make_unique<MemoryDevice>(bytes.size());
    device->Write(0, bytes.data(), bytes.size());
    return device;
}

}  // namespace VELK::test
