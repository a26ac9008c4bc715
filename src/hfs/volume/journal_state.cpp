// Journal info block and journal header: found through the volume header, checked, and read just
// far enough to tell whether transactions wait.
#include "hfs/volume/journal_state.h"

#include "hfs/volume/wire.h"

namespace VELK {

namespace {

// Journal info block, big-endian.
constexpr u32 kInfoSize = 52;
constexpr u32 kInfoFlags = 0;
constexpr u32 kInfoOffset = 36;
constexpr u32 kInfoJournalSize = 44;
constexpr u32 kInfoInVolume = 1;
constexpr u32 kInfoElsewhere = 2;
constexpr u32 kInfoNeedsInit = 4;

// Journal header, in the byte order of the machine that wrote it.
constexpr u32 kJournalHeaderSize = 44;
constexpr u32 kJournalMagic = 0x4A4E4C78;
constexpr u32 kJournalEndian = 0x12345678;
constexpr u32 kJournalStart = 8;
constexpr u32 kJournalEnd = 16;
constexpr u32 kJournalSize = 24;
constexpr u32 kJournalChecksum = 36;
constexpr u32 kJournalHeaderBytes = 40;

struct Reader {
    const u8* bytes;
    bool little;

    u32 U32(u32 at) const { return little ? Le32(bytes + at) : Be32(bytes + at); }
    u64 U64(u32 at) const { return little ? Le64(bytes + at) : Be64(bytes + at); }
};

}  // namespace

u32 JournalChecksum(const u8* bytes, u32 size, u32 checksumAt) {
    u32 sum = 0;
    for (u32 i = 0; i < size; ++i) {
        const u32 byte = i >= checksumAt && i < checksumAt + 4 ? 0 : bytes[i];
        sum = (sum << 8) ^ (sum + byte);
    }
    return ~sum;
}

JournalState ReadJournalState(BlockDevice* volume, const VolumeHeader& header, u64 imageOffset) {
    JournalState state;
    if ((header.attributes & kVolJournaled) == 0) {
        return state;
    }
    state.present = true;
    u8 info[kInfoSize];
    const u64 infoAt = u64{header.journalInfoBlock} * header.blockSize;
    if (header.journalInfoBlock >= header.totalBlocks ||
        !volume->Read(infoAt, info, sizeof info).Ok()) {
        state.text = "journal info block " + Grouped(header.journalInfoBlock) + " cannot be read";
        return state;
    }
    const u32 flags = Be32(info + kInfoFlags);
    const u64 offset = Be64(info + kInfoOffset);
    state.offset = imageOffset + offset;
    state.size = Be64(info + kInfoJournalSize);
    if ((flags & kInfoElsewhere) != 0 || (flags & kInfoInVolume) == 0) {
        state.text = "the journal lies on another device";
        return state;
    }
    if ((flags & kInfoNeedsInit) != 0) {
        state.readable = true;  // announced, never written: nothing waits in it
        return state;
    }
    u8 bytes[kJournalHeaderSize];
    if (offset > volume->Size() || !volume->Read(offset, bytes, sizeof bytes).Ok()) {
        state.text = "journal header at " + Position(state.offset) + " cannot be read";
        return state;
    }
    const Reader reader{bytes, Be32(bytes) != kJournalMagic};
    const u64 start = reader.U64(kJournalStart);
    const u64 end = reader.U64(kJournalEnd);
    const u64 size = reader.U64(kJournalSize);
    const u64 headerBytes = reader.U32(kJournalHeaderBytes);
    if (reader.U32(0) != kJournalMagic || reader.U32(4) != kJournalEndian) {
        state.text = "journal header at " + Position(state.offset) + " has no signature";
    } else if (reader.U32(kJournalChecksum) !=
               JournalChecksum(bytes, kJournalHeaderSize, kJournalChecksum)) {
        state.text = "journal header at " + Position(state.offset) + " has a wrong checksum";
    } else if (size != state.size || !IsPowerOfTwo(headerBytes) || headerBytes < kSectorSize ||
               headerBytes >= size || start < headerBytes || start > size || end < headerBytes ||
               end > size) {
        state.text = "journal header at " + Position(state.offset) + " is out of range";
    } else {
        state.readable = true;
        state.pendingBytes = end >= start ? end - start : end - start + (size - headerBytes);
        state.empty = state.pendingBytes == 0;
    }
    return state;
}

}  // namespace VELK
