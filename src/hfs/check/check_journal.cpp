// What a person should know before trusting a volume's content: an unclean end, a journal that
// holds transactions, or one that cannot be understood (V08). Never more than a remark.
#include <cstring>

#include "hfs/check/check_volume.h"

namespace VELK {
namespace {

constexpr u32 kInfoSize = 52;  // bytes of the info block that are read
constexpr u32 kInfoInVolume = 1;
constexpr u32 kInfoOnOther = 2;
constexpr u32 kInfoNeedsInit = 4;
constexpr u32 kInfoOffset = 36;  // u64

constexpr u32 kJournalSize = 44;
constexpr u8 kMagicBig[8] = {0x4A, 0x4E, 0x4C, 0x78, 0x12, 0x34, 0x56, 0x78};
constexpr u8 kMagicLittle[8] = {0x78, 0x4C, 0x4E, 0x4A, 0x78, 0x56, 0x34, 0x12};
constexpr u32 kJournalStart = 8;    // u64
constexpr u32 kJournalEnd = 16;     // u64
constexpr u32 kJournalLength = 24;  // u64
constexpr u32 kJournalHeaderSize = 40;

u64 Number(const u8* bytes, u32 size, bool isLittle) {
    u64 value = 0;
    for (u32 i = 0; i < size; ++i) {
        value = (value << 8) | bytes[isLittle ? size - 1 - i : i];
    }
    return value;
}

void CheckTransactions(CheckVolumeState* state, const CheckPlace& place, u64 offset) {
    u8 bytes[kJournalSize];
    CheckPlace header = place;
    header.offset = offset;
    header.part = "journal";
    if (state->run->Read(offset, bytes, kJournalSize) != 0) {
        state->run->Info(CheckId::V08, place,
                         CheckPrint("the journal at volume offset %llu cannot be read",
                                    static_cast<unsigned long long>(offset)));
        return;
    }
    const bool isLittle = std::memcmp(bytes, kMagicLittle, sizeof(kMagicLittle)) == 0;
    if (!isLittle && std::memcmp(bytes, kMagicBig, sizeof(kMagicBig)) != 0) {
        state->run->Info(CheckId::V08, header, "the journal has no valid header");
        return;
    }
    const u64 start = Number(bytes + kJournalStart, 8, isLittle);
    const u64 end = Number(bytes + kJournalEnd, 8, isLittle);
    const u64 size = Number(bytes + kJournalLength, 8, isLittle);
    const u64 sector = Number(bytes + kJournalHeaderSize, 4, isLittle);
    if (start == end) {
        return;
    }
    if (start > size || end > size || sector > size) {
        state->run->Info(CheckId::V08, header, "the journal's offsets lie outside the journal");
        return;
    }
    const u64 held = end > start ? end - start : size - sector - (start - end);
    state->run->Info(CheckId::V08, header,
                     CheckPrint("the journal holds transactions (%llu bytes) that are not in their "
                                "places yet",
                                static_cast<unsigned long long>(held)));
}

}  // namespace

void CheckJournal(CheckVolumeState* state) {
    const CheckVolumeHeader& header = state->header;
    CheckRun* run = state->run;
    const CheckPlace attributes = state->HeaderPlace(kVolAttributes);
    if ((header.attributes & kVolAttrUnmounted) == 0 ||
        (header.attributes & kVolAttrInconsistent) != 0) {
        run->Info(CheckId::V08, attributes, "the volume was not unmounted cleanly");
    }
    if ((header.attributes & kVolAttrJournaled) == 0) {
        return;
    }
    const CheckPlace place = state->HeaderPlace(kVolJournalInfoBlock);
    u8 info[kInfoSize];
    const u64 offset = static_cast<u64>(header.journalInfoBlock) * header.blockSize;
    if (header.journalInfoBlock == 0 || header.journalInfoBlock >= header.totalBlocks ||
        run->Read(offset, info, kInfoSize) != 0) {
        run->Info(CheckId::V08, place,
                  CheckPrint("the journal info block %u cannot be read", header.journalInfoBlock));
        return;
    }
    const u32 flags = Load32(info);
    if ((flags & kInfoNeedsInit) != 0) {
        return;
    }
    if ((flags & kInfoOnOther) != 0 || (flags & kInfoInVolume) == 0) {
        run->Info(CheckId::V08, place, "the journal lies on another device");
        return;
    }
    CheckTransactions(state, place, Load64(info + kInfoOffset));
}

}  // namespace VELK
