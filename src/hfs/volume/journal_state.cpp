// Journal info block and journal header: found through the volume header, checked, and read just
// far enough to tell whether transactions wait.
#include "hfs/volume/journal_state.h"

#include <algorithm>

#include "hfs/volume/wire.h"

namespace VELK {

namespace {

constexpr u32 kSpecialForks[] = {kExtentsFileId, kCatalogFileId, kAttributesFileId,
                                 kAllocationFileId, kStartupFileId};

// Why the stretch cannot be a journal's own; empty when it can.
std::string StretchProblem(const JournalPlace& place, const VolumeHeader& header, u64 volumeBytes) {
    if (place.offset % kJournalSector != 0 || place.size < 4 * kJournalSector ||
        place.offset > volumeBytes || place.size > volumeBytes - place.offset) {
        return "leaves the volume";
    }
    if (place.Touches(kHeaderOffset, kHeaderSize) ||
        place.Touches(volumeBytes - kAltHeaderFromEnd, kHeaderSize) ||
        place.Touches(place.infoOffset, kJournalInfoSize)) {
        return "covers a header";
    }
    for (const u32 fileId : kSpecialForks) {
        for (const HfsExtent& extent : header.ForkOf(fileId)->extents) {
            if (extent.blockCount != 0 &&
                place.Touches(u64{extent.startBlock} * header.blockSize,
                              u64{extent.blockCount} * header.blockSize)) {
                return std::string("covers the ") + ForkName(fileId) + " file";
            }
        }
    }
    return {};
}

}  // namespace

JournalState ReadJournalState(BlockDevice* volume, const VolumeHeader& header, u64 imageOffset,
                              JournalPlace* place) {
    JournalState state;
    *place = JournalPlace{};
    if ((header.attributes & kVolJournaled) == 0) {
        return state;
    }
    state.present = true;
    u8 infoBytes[kJournalInfoSize];
    place->infoOffset = u64{header.journalInfoBlock} * header.blockSize;
    if (header.journalInfoBlock == 0 || header.journalInfoBlock >= header.totalBlocks ||
        !volume->Read(place->infoOffset, infoBytes, sizeof infoBytes).Ok()) {
        state.text = "journal info block " + Grouped(header.journalInfoBlock) + " cannot be read";
        return state;
    }
    const JournalInfo info = DecodeJournalInfo(infoBytes);
    place->offset = info.offset;
    place->size = info.size;
    state.offset = imageOffset + info.offset;
    state.size = info.size;
    if ((info.flags & kJournalElsewhere) != 0 || (info.flags & kJournalInVolume) == 0) {
        state.text = "the journal lies on another device";
        return state;
    }
    const std::string name = "journal header at " + Position(state.offset);
    u8 bytes[kJournalHeaderSize];
    if (info.offset > volume->Size() || !volume->Read(info.offset, bytes, sizeof bytes).Ok()) {
        state.text = name + " cannot be read";
        return state;
    }
    const std::string stretch = StretchProblem(*place, header, volume->Size());
    if (!stretch.empty()) {
        state.text = "the journal at " + Position(state.offset) + " " + stretch;
        return state;
    }
    place->isSound = true;
    place->header.size = place->size;
    if ((info.flags & kJournalNeedsInit) != 0) {
        place->needsInit = true;
        state.readable = true;  // nothing waits in it
        return state;
    }
    const std::string wrong = DecodeJournalHeader(bytes, info.size, &place->header);
    if (!wrong.empty()) {
        state.text = name + " " + wrong;
        return state;
    }
    state.readable = true;
    state.pendingBytes = place->header.Used();
    state.empty = state.pendingBytes == 0;
    return state;
}

IoResult ReadRing(BlockDevice* volume, const JournalPlace& place, u64 position, void* target,
                  u64 bytes) {
    const u64 front = std::min(bytes, place.size - position);
    u8* out = static_cast<u8*>(target);
    IoResult result = volume->Read(place.offset + position, out, static_cast<std::size_t>(front));
    if (result.Ok() && front < bytes) {
        result = volume->Read(place.offset + place.header.sectorSize, out + front,
                              static_cast<std::size_t>(bytes - front));
    }
    return result;
}

IoResult WriteRing(BlockDevice* volume, const JournalPlace& place, u64 position, const void* source,
                   u64 bytes) {
    const u64 front = std::min(bytes, place.size - position);
    const u8* in = static_cast<const u8*>(source);
    IoResult result = volume->Write(place.offset + position, in, static_cast<std::size_t>(front));
    if (result.Ok() && front < bytes) {
        result = volume->Write(place.offset + place.header.sectorSize, in + front,
                               static_cast<std::size_t>(bytes - front));
    }
    return result;
}

IoResult WriteJournalHeader(BlockDevice* volume, const JournalPlace& place) {
    u8 sector[kJournalSector];
    const IoResult result = volume->Read(place.offset, sector, sizeof sector);
    if (!result.Ok()) {
        return result;
    }
    EncodeJournalHeader(place.header, sector);
    return volume->Write(place.offset, sector, sizeof sector);
}

}  // namespace VELK
