// The order of writes with a journal. A block reaches its place only after the journal header that
// covers its copy was synced, and the ring's bytes were synced before that header was written.
#include "hfs/volume/journal_sink.h"

#include <algorithm>

#include "hfs/volume/wire.h"

namespace VELK {

namespace {

constexpr u32 kAttributesInHeader = 4;
constexpr u32 kVersionInHeader = 8;
constexpr u32 kLargestBlock = 32768;  // bytes of one block of a list
constexpr std::size_t kLargestWrite = std::size_t{1} << 20;

// Room for gathering `bytes` bytes that are written in large pieces.
std::size_t PieceSize(u64 bytes) {
    return static_cast<std::size_t>(std::min<u64>(bytes, kLargestWrite));
}

// Collects the bytes of a transaction and writes them into the ring in large pieces.
class RingWriter {
public:
    // `expected`: bytes of the transaction, which the ring can hold.
    RingWriter(BlockDevice* volume, JournalPlace* place, u64 expected)
        : volume_(volume),
          place_(place),
          position_(place->header.end),
          room_(PieceSize(expected)) {}
    u64 Position() const { return position_; }
    // Room for `bytes` more bytes, to be filled in before the next call; null: a write failed.
    u8* Take(u32 bytes) {
        if (used_ + bytes > room_.size()) {
            Flush();
            room_.resize(std::max<std::size_t>(room_.size(), bytes));
        }
        used_ += bytes;
        return result_.Ok() ? room_.data() + used_ - bytes : nullptr;
    }
    IoResult Flush() {
        if (result_.Ok() && used_ != 0) {
            result_ = WriteRing(volume_, *place_, position_, room_.data(), used_);
            position_ = place_->header.Advance(position_, used_);
        }
        used_ = 0;
        return result_;
    }

private:
    BlockDevice* volume_;
    JournalPlace* place_;
    u64 position_;
    std::vector<u8> room_;
    std::size_t used_ = 0;
    IoResult result_;
};

}  // namespace

// Changed sectors as stretches of the volume that begin with a sector of the journal's size.
std::vector<JournalSink::Stretch> JournalSink::Collect(const OverlayDevice& staged) const {
    const u64 unit = place_.header.sectorSize;
    std::vector<Stretch> stretches;
    for (const u64 number : staged.ChangedPages()) {
        const OverlayDevice::Page* page = staged.PageAt(number);
        for (u32 sector = 0; sector < OverlayDevice::kSectorsPerPage; ++sector) {
            if ((page->changed >> sector & 1) == 0) {
                continue;
            }
            const u64 at = number * OverlayDevice::kPageSize + u64{sector} * kSectorSize;
            const u64 from = (at - options_.volumeOffset) / unit * unit;
            const u64 to = std::min(from + unit, options_.volumeBytes);
            Stretch* last = stretches.empty() ? nullptr : &stretches.back();
            const u64 end = last == nullptr ? 0 : last->offset + last->bytes;
            if (last != nullptr && to <= end) {
                continue;
            }
            if (last != nullptr && end == from && last->bytes + (to - from) <= kLargestBlock) {
                last->bytes += static_cast<u32>(to - from);
            } else {
                stretches.push_back({from, static_cast<u32>(to - from)});
            }
        }
    }
    return stretches;
}

// The volume header that travels says that the volume is in use: only Finish says otherwise.
IoResult JournalSink::ReadStaged(const OverlayDevice& staged, Stretch stretch, u8* target) const {
    const IoResult result =
        staged.Peek(options_.volumeOffset + stretch.offset, target, stretch.bytes);
    if (result.Ok() && stretch.offset <= kHeaderOffset &&
        stretch.offset + stretch.bytes >= kHeaderOffset + kHeaderSize) {
        u8* attributes = target + (kHeaderOffset - stretch.offset) + kAttributesInHeader;
        StoreBe32(attributes, Be32(attributes) & ~kVolUnmounted);
    }
    return result;
}

IoResult JournalSink::Initialise(BlockDevice* home) {
    SliceDevice volume(home, options_.volumeOffset, options_.volumeBytes);
    place_.header.start = place_.header.sectorSize;
    place_.header.end = place_.header.sectorSize;
    IoResult result = WriteJournalHeader(&volume, place_);
    if (result.Ok()) {
        result = home->Sync();
    }
    u8 info[kJournalInfoSize];
    if (result.Ok() && place_.needsInit) {
        result = volume.Read(place_.infoOffset, info, sizeof info);
        if (result.Ok()) {
            SetJournalInfoFlags(info, kJournalInVolume);
            result = volume.Write(place_.infoOffset, info, sizeof info);
        }
        if (result.Ok()) {
            result = home->Sync();
        }
    }
    return result;
}

// Before the first transaction of a mount: the volume header on the medium must name somebody who
// keeps the journal, or the transaction would be passed over, and say that the volume is in use.
// One sector, made durable by the sync of the ring.
IoResult JournalSink::Begin(BlockDevice* home, u64* bytesWritten) {
    IoResult result;
    if (options_.mustInit || place_.needsInit) {
        result = Initialise(home);
    }
    u8 header[kHeaderSize];
    if (result.Ok()) {
        result = home->Read(HeaderOffset(), header, sizeof header);
    }
    if (!result.Ok()) {
        return result;
    }
    const u32 attributes = Be32(header + kAttributesInHeader);
    if ((attributes & kVolUnmounted) == 0 && KeepsJournal(Be32(header + kVersionInHeader))) {
        return result;
    }
    StoreBe32(header + kAttributesInHeader, attributes & ~kVolUnmounted);
    StoreBe32(header + kVersionInHeader, kKeeperCode);
    *bytesWritten += sizeof header;
    return home->Write(HeaderOffset(), header, sizeof header);
}

// Every transaction so far has reached its places: says so.
IoResult JournalSink::Empty(BlockDevice* home) {
    IoResult result = home->Sync();
    if (result.Ok() && place_.header.Used() != 0) {
        SliceDevice volume(home, options_.volumeOffset, options_.volumeBytes);
        place_.header.start = place_.header.end;
        result = WriteJournalHeader(&volume, place_);
        if (result.Ok()) {
            result = home->Sync();
        }
    }
    return result;
}

IoResult JournalSink::Log(const OverlayDevice& staged, const std::vector<Stretch>& stretches,
                          BlockDevice* home, u64* bytesWritten) {
    SliceDevice volume(home, options_.volumeOffset, options_.volumeBytes);
    RingWriter ring(&volume, &place_, needed_);
    const u32 perList = BlocksPerList(place_.header.listSize);
    for (std::size_t first = 0; first < stretches.size(); first += perList) {
        const std::size_t last = std::min(stretches.size(), first + perList);
        JournalList list;
        list.isLast = last == stretches.size();
        for (std::size_t i = first; i < last; ++i) {
            list.blocks.push_back(
                {stretches[i].offset / place_.header.sectorSize, stretches[i].bytes});
        }
        u8* bytes = ring.Take(place_.header.listSize);
        if (bytes == nullptr) {
            return ring.Flush();
        }
        EncodeJournalList(place_.header, &list, bytes);
        for (std::size_t i = first; i < last; ++i) {
            bytes = ring.Take(stretches[i].bytes);
            if (bytes == nullptr) {
                return ring.Flush();
            }
            const IoResult result = ReadStaged(staged, stretches[i], bytes);
            if (!result.Ok()) {
                return result;
            }
        }
    }
    IoResult result = ring.Flush();
    if (result.Ok()) {
        result = home->Sync();
    }
    if (result.Ok()) {
        // What was in the ring before has been written to its places before this sync.
        place_.header.start = place_.header.end;
        place_.header.end = ring.Position();
        result = WriteJournalHeader(&volume, place_);
    }
    *bytesWritten += needed_ + kJournalSector;
    return result.Ok() ? home->Sync() : result;
}

// In rising order, neighbours in one write. Not synced: the next commit or Finish does that.
IoResult JournalSink::WriteHome(const OverlayDevice& staged, const std::vector<Stretch>& stretches,
                                BlockDevice* home, u64* bytesWritten) {
    std::vector<u8> room(PieceSize(needed_));  // of which any stretch is a part
    for (std::size_t first = 0; first < stretches.size();) {
        const u64 start = stretches[first].offset;
        std::size_t used = 0;
        std::size_t next = first;
        for (; next < stretches.size() && stretches[next].offset == start + used &&
               used + stretches[next].bytes <= room.size();
             ++next) {
            const IoResult result = ReadStaged(staged, stretches[next], room.data() + used);
            if (!result.Ok()) {
                return result;
            }
            used += stretches[next].bytes;
        }
        *bytesWritten += used;
        const IoResult result = home->Write(options_.volumeOffset + start, room.data(), used);
        if (!result.Ok()) {
            return result;
        }
        first = next;
    }
    return {};
}

IoResult JournalSink::CarryAll(const OverlayDevice& staged, BlockDevice* home, u64* bytesWritten) {
    const std::vector<Stretch> stretches = Collect(staged);
    const u64 lists = CeilDiv(stretches.size(), BlocksPerList(place_.header.listSize));
    needed_ = lists * place_.header.listSize;
    for (const Stretch& stretch : stretches) {
        needed_ += stretch.bytes;
        if (place_.Touches(stretch.offset, stretch.bytes)) {
            return {kIoReadOnly, options_.volumeOffset + stretch.offset};
        }
    }
    if (needed_ > Largest()) {
        return {kIoTooLarge, options_.volumeOffset + place_.offset};
    }
    IoResult result;
    if (!hasBegun_) {
        result = Begin(home, bytesWritten);
        hasBegun_ = result.Ok();
    }
    if (result.Ok() && needed_ > place_.header.Room()) {
        result = Empty(home);
    }
    if (result.Ok()) {
        result = Log(staged, stretches, home, bytesWritten);
    }
    return result.Ok() ? WriteHome(staged, stretches, home, bytesWritten) : result;
}

IoResult JournalSink::Carry(const OverlayDevice& staged, BlockDevice* home, u64* bytesWritten) {
    const IoResult result =
        hasFailed_ ? IoResult{kIoReadOnly, 0} : CarryAll(staged, home, bytesWritten);
    hasFailed_ = hasFailed_ || (!result.Ok() && result.error != kIoTooLarge);
    return result;
}

// A volume whose journal was carried out may say that it is in use although nothing was committed.
IoResult JournalSink::Finish(BlockDevice* home) {
    if (hasFailed_ || (!hasBegun_ && !options_.endsClean)) {
        return {};
    }
    IoResult result;
    if (hasBegun_) {
        result = Empty(home);
        hasBegun_ = false;
    }
    if (result.Ok() && options_.endsClean) {
        result = MarkClean(home);
    }
    hasFailed_ = !result.Ok();
    return result;
}

IoResult JournalSink::MarkClean(BlockDevice* home) {
    u8 header[kHeaderSize];
    IoResult result = home->Read(HeaderOffset(), header, sizeof header);
    if (!result.Ok()) {
        return result;
    }
    const u32 attributes = Be32(header + kAttributesInHeader);
    if ((attributes & kVolUnmounted) != 0) {
        return result;
    }
    StoreBe32(header + kAttributesInHeader, attributes | kVolUnmounted);
    result = home->Write(HeaderOffset(), header, sizeof header);
    return result.Ok() ? home->Sync() : result;
}

}  // namespace VELK
