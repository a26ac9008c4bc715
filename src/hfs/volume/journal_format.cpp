// Info block, journal header and block lists as bytes. The info block is big-endian; the others are
// in the order of the machine that made the journal, which the signature tells.
#include "hfs/volume/journal_format.h"

#include <cstring>

#include "hfs/volume/problem.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

// Info block.
constexpr u32 kInfoFlags = 0;
constexpr u32 kInfoOffset = 36;
constexpr u32 kInfoJournalSize = 44;

// Journal header.
constexpr u32 kMagicValue = 0x4A4E4C78;
constexpr u32 kEndianValue = 0x12345678;
constexpr u32 kMagic = 0;
constexpr u32 kEndian = 4;
constexpr u32 kStart = 8;
constexpr u32 kEnd = 16;
constexpr u32 kSize = 24;
constexpr u32 kListSize = 32;
constexpr u32 kHeaderChecksum = 36;
constexpr u32 kSectorBytes = 40;
constexpr u32 kLargestSector = 1u << 16;

// Block list header; entry 0 is part of it.
constexpr u32 kMaxBlocks = 0;
constexpr u32 kNumBlocks = 2;
constexpr u32 kBytesUsed = 4;
constexpr u32 kListChecksum = 8;
constexpr u32 kFirstEntry = 16;
constexpr u32 kFirstNext = 28;
constexpr u32 kEntrySize = 16;
constexpr u32 kEntryBytes = 8;
constexpr u32 kChecksummed = 32;

struct Reader {
    const u8* bytes;
    bool isLittle;

    u32 U16(u32 at) const {
        return isLittle ? bytes[at] | (u32{bytes[at + 1]} << 8) : Be16(bytes + at);
    }
    u32 U32(u32 at) const { return isLittle ? Le32(bytes + at) : Be32(bytes + at); }
    u64 U64(u32 at) const { return isLittle ? Le64(bytes + at) : Be64(bytes + at); }
};

struct Writer {
    u8* bytes;
    bool isLittle;

    void Store(u32 at, u32 size, u64 value) const {
        for (u32 i = 0; i < size; ++i) {
            bytes[at + (isLittle ? i : size - 1 - i)] = static_cast<u8>(value >> (8 * i));
        }
    }
};

bool IsSectors(u64 number) {
    return number % kJournalSector == 0;
}

}  // namespace

u32 JournalChecksum(const u8* bytes, u32 size, u32 checksumAt) {
    u32 sum = 0;
    for (u32 i = 0; i < size; ++i) {
        const u32 byte = i >= checksumAt && i < checksumAt + 4 ? 0 : bytes[i];
        sum = (sum << 8) ^ (sum + byte);
    }
    return ~sum;
}

JournalInfo DecodeJournalInfo(const u8* bytes) {
    return {Be32(bytes + kInfoFlags), Be64(bytes + kInfoOffset), Be64(bytes + kInfoJournalSize)};
}

void EncodeJournalInfo(const JournalInfo& info, u8* bytes) {
    std::memset(bytes, 0, kJournalInfoSize);
    SetJournalInfoFlags(bytes, info.flags);
    StoreBe64(bytes + kInfoOffset, info.offset);
    StoreBe64(bytes + kInfoJournalSize, info.size);
}

void SetJournalInfoFlags(u8* bytes, u32 flags) {
    StoreBe32(bytes + kInfoFlags, flags);
}

std::string DecodeJournalHeader(const u8* bytes, u64 size, JournalHeader* header) {
    const Reader reader{bytes, Be32(bytes) != kMagicValue};
    if (reader.U32(kMagic) != kMagicValue || reader.U32(kEndian) != kEndianValue) {
        return "has no signature";
    }
    if (reader.U32(kHeaderChecksum) !=
        JournalChecksum(bytes, kJournalHeaderSize, kHeaderChecksum)) {
        return "has a wrong checksum";
    }
    JournalHeader found;
    found.isLittle = reader.isLittle;
    found.start = reader.U64(kStart);
    found.end = reader.U64(kEnd);
    found.size = reader.U64(kSize);
    found.listSize = reader.U32(kListSize);
    found.sectorSize = reader.U32(kSectorBytes);
    const u64 least = found.sectorSize;
    if (found.size != size || !IsSectors(size) || !IsPowerOfTwo(least) || least < kJournalSector ||
        least > kLargestSector || found.listSize < kSmallestList || found.listSize > kLargestList ||
        !IsSectors(found.listSize) || size < 2 * least + found.listSize + kJournalSector) {
        return "is out of range";
    }
    for (u64* position : {&found.start, &found.end}) {
        if (*position < least || *position > size || !IsSectors(*position)) {
            return "is out of range";
        }
        *position = *position == size ? least : *position;
    }
    *header = found;
    return {};
}

void EncodeJournalHeader(const JournalHeader& header, u8* bytes) {
    const Writer writer{bytes, header.isLittle};
    writer.Store(kMagic, 4, kMagicValue);
    writer.Store(kEndian, 4, kEndianValue);
    writer.Store(kStart, 8, header.start);
    writer.Store(kEnd, 8, header.end);
    writer.Store(kSize, 8, header.size);
    writer.Store(kListSize, 4, header.listSize);
    writer.Store(kSectorBytes, 4, header.sectorSize);
    writer.Store(kHeaderChecksum, 4, JournalChecksum(bytes, kJournalHeaderSize, kHeaderChecksum));
}

// Every list takes at least its own header, so a walk over lists ends. Entries from 1 on are not
// covered by the checksum: that their sizes add up to bytes_used is what vouches for them.
std::string DecodeJournalList(const u8* bytes, const JournalHeader& header, u64 available,
                              JournalList* list) {
    const Reader reader{bytes, header.isLittle};
    if (reader.U32(kListChecksum) != JournalChecksum(bytes, kChecksummed, kListChecksum)) {
        return "has a wrong checksum";
    }
    const u32 entries = reader.U16(kNumBlocks);
    list->bytesUsed = reader.U32(kBytesUsed);
    if (entries < 1 || entries - 1 > BlocksPerList(header.listSize)) {
        return Format("counts %u blocks", entries);
    }
    if (list->bytesUsed > available) {
        return "reaches past the end of the journal";
    }
    list->isLast = reader.U32(kFirstNext) == 0;
    list->blocks.clear();
    u64 sum = header.listSize;
    for (u32 i = 1; i < entries; ++i) {
        const u32 at = kFirstEntry + i * kEntrySize;
        const JournalBlock block{reader.U64(at), reader.U32(at + kEntryBytes)};
        if (!IsSectors(block.bytes)) {
            return Format("has a block of %u bytes", block.bytes);
        }
        sum += block.bytes;
        list->blocks.push_back(block);
    }
    return sum == list->bytesUsed ? std::string() : "does not add up";
}

void EncodeJournalList(const JournalHeader& header, JournalList* list, u8* bytes) {
    std::memset(bytes, 0, header.listSize);
    const Writer writer{bytes, header.isLittle};
    list->bytesUsed = header.listSize;
    u32 at = kFirstEntry;
    for (const JournalBlock& block : list->blocks) {
        at += kEntrySize;
        writer.Store(at, 8, block.sector);
        writer.Store(at + kEntryBytes, 4, block.bytes);
        list->bytesUsed += block.bytes;
    }
    writer.Store(kMaxBlocks, 2, BlocksPerList(header.listSize) + 1);
    writer.Store(kNumBlocks, 2, list->blocks.size() + 1);
    writer.Store(kBytesUsed, 4, list->bytesUsed);
    writer.Store(kFirstNext, 4, list->isLast ? 0 : 1);
    writer.Store(kListChecksum, 4, JournalChecksum(bytes, kChecksummed, kListChecksum));
}

}  // namespace VELK
