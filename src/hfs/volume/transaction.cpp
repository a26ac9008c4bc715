// The direct way from staged changes to the image: in rising order, neighbours in one write, then a
// sync.
#include "hfs/volume/transaction.h"

#include <algorithm>
#include <cstring>

namespace VELK {

namespace {

constexpr std::size_t kLargestWrite = std::size_t{1} << 20;

// Collects neighbouring bytes and writes them at once.
class Gatherer {
public:
    Gatherer(BlockDevice* device, u64* written) : device_(device), written_(written) {}

    IoResult Add(u64 offset, const u8* bytes, u32 size) {
        if (offset != start_ + bytes_.size() || bytes_.size() + size > kLargestWrite) {
            const IoResult result = Finish();
            if (!result.Ok()) {
                return result;
            }
            start_ = offset;
        }
        bytes_.insert(bytes_.end(), bytes, bytes + size);
        return {};
    }
    IoResult Finish() {
        if (bytes_.empty()) {
            return {};
        }
        const IoResult result = device_->Write(start_, bytes_.data(), bytes_.size());
        *written_ += bytes_.size();
        start_ += bytes_.size();
        bytes_.clear();
        return result;
    }

private:
    BlockDevice* device_;
    u64* written_;
    u64 start_ = 0;
    std::vector<u8> bytes_;
};

}  // namespace

IoResult CommitSink::CarryExcept(const OverlayDevice& staged, BlockDevice* home, u64 skip,
                                 u64 skipBytes, u64* bytesWritten) {
    Gatherer gatherer(home, bytesWritten);
    for (const u64 number : staged.ChangedPages()) {
        const OverlayDevice::Page* page = staged.PageAt(number);
        for (u32 sector = 0; sector < OverlayDevice::kSectorsPerPage; ++sector) {
            if ((page->changed >> sector & 1) == 0) {
                continue;
            }
            const u32 at = sector * kSectorSize;
            const u64 offset = number * OverlayDevice::kPageSize + at;
            const u32 size = static_cast<u32>(std::min<u64>(kSectorSize, home->Size() - offset));
            // The range to skip need not begin with a sector: what lies beside it is written.
            const u64 skipFrom = std::clamp(skip, offset, offset + size);
            const u64 skipTo = std::clamp(skip + skipBytes, offset, offset + size);
            const u32 before =
                static_cast<u32>((skipTo == skipFrom ? offset + size : skipFrom) - offset);
            IoResult result;
            if (before != 0) {
                result = gatherer.Add(offset, page->bytes + at, before);
            }
            if (result.Ok() && skipTo != skipFrom && skipTo < offset + size) {
                const u32 rest = static_cast<u32>(skipTo - offset);
                result = gatherer.Add(skipTo, page->bytes + at + rest, size - rest);
            }
            if (!result.Ok()) {
                return result;
            }
        }
    }
    return gatherer.Finish();
}

IoResult CommitSink::Carry(const OverlayDevice& staged, BlockDevice* home, u64* bytesWritten) {
    const IoResult result = CarryExcept(staged, home, 0, 0, bytesWritten);
    return result.Ok() ? home->Sync() : result;
}

}  // namespace VELK
