// Reading ahead.
#include "tool/read_ahead.h"

#include <algorithm>
#include <cstring>

namespace VELK::tool {

namespace {

// Lookups jump; only a walk makes so many reads in a row.
constexpr u32 kReadsBeforeAhead = 3;

}  // namespace

ReadAheadDevice::ReadAheadDevice(std::unique_ptr<BlockDevice> base)
    : base_(std::move(base)), window_(new u8[kWindowSize]) {}

// False when there is nothing to read ahead, or it fails: the plain read then tells why.
bool ReadAheadDevice::FillWindow(u64 offset) {
    const u64 size = base_->Size();
    if (offset >= size) {
        return false;
    }
    const u64 bytes = std::min<u64>(kWindowSize, size - offset);
    windowBytes_ = 0;
    if (!base_->Read(offset, window_.get(), static_cast<std::size_t>(bytes)).Ok()) {
        return false;
    }
    windowStart_ = offset;
    windowBytes_ = bytes;
    return true;
}

IoResult ReadAheadDevice::Read(u64 offset, void* target, std::size_t bytes) {
    inRow_ = offset == expected_ ? inRow_ + 1 : 0;
    expected_ = offset + bytes;
    const bool held =
        Holds(offset, bytes) || (inRow_ >= kReadsBeforeAhead && bytes <= kWindowSize / 4 &&
                                 FillWindow(offset) && Holds(offset, bytes));
    if (!held) {
        return base_->Read(offset, target, bytes);
    }
    std::memcpy(target, window_.get() + (offset - windowStart_), bytes);
    return {};
}

IoResult ReadAheadDevice::Write(u64 offset, const void*, std::size_t) {
    return {kIoReadOnly, offset};
}

}  // namespace VELK::tool
