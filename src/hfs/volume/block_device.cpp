// Devices that need no host: memory, a slice of another device, changes kept over another device.
#include "hfs/volume/block_device.h"

#include <algorithm>
#include <cstring>
#include <new>

namespace VELK {

namespace {

// Whether [offset, offset + bytes) lies in a device of `size` bytes.
bool Fits(u64 offset, u64 bytes, u64 size) {
    return offset <= size && bytes <= size - offset;
}

}  // namespace

IoResult BlockDevice::Zero(u64 offset, u64 bytes) {
    static const u8 zeros[1u << 16] = {};
    while (bytes > 0) {
        const std::size_t piece = static_cast<std::size_t>(std::min<u64>(bytes, sizeof zeros));
        const IoResult result = Write(offset, zeros, piece);
        if (!result.Ok()) {
            return result;
        }
        offset += piece;
        bytes -= piece;
    }
    return {};
}

MemoryDevice::MemoryDevice(u64 size) : size_(size) {
    chunks_.resize(static_cast<std::size_t>((size + kChunkSize - 1) / kChunkSize));
}

IoResult MemoryDevice::Read(u64 offset, void* target, std::size_t bytes) {
    if (!Fits(offset, bytes, size_)) {
        return {kIoPastEnd, offset};
    }
    u8* out = static_cast<u8*>(target);
    while (bytes > 0) {
        const std::size_t at = static_cast<std::size_t>(offset % kChunkSize);
        const std::size_t piece = std::min<std::size_t>(bytes, kChunkSize - at);
        const u8* chunk = chunks_[static_cast<std::size_t>(offset / kChunkSize)].get();
        if (chunk != nullptr) {
            std::memcpy(out, chunk + at, piece);
        } else {
            std::memset(out, 0, piece);
        }
        out += piece;
        offset += piece;
        bytes -= piece;
    }
    return {};
}

IoResult MemoryDevice::Write(u64 offset, const void* source, std::size_t bytes) {
    if (!Fits(offset, bytes, size_)) {
        return {kIoPastEnd, offset};
    }
    const u8* in = static_cast<const u8*>(source);
    while (bytes > 0) {
        const std::size_t at = static_cast<std::size_t>(offset % kChunkSize);
        const std::size_t piece = std::min<std::size_t>(bytes, kChunkSize - at);
        std::unique_ptr<u8[]>& chunk = chunks_[static_cast<std::size_t>(offset / kChunkSize)];
        if (!chunk) {
            chunk.reset(new (std::nothrow) u8[kChunkSize]);
            if (!chunk) {
                return {kIoNoMemory, offset};
            }
            std::memset(chunk.get(), 0, kChunkSize);
        }
        std::memcpy(chunk.get() + at, in, piece);
        in += piece;
        offset += piece;
        bytes -= piece;
    }
    return {};
}

IoResult MemoryDevice::Zero(u64 offset, u64 bytes) {
    if (!Fits(offset, bytes, size_)) {
        return {kIoPastEnd, offset};
    }
    while (bytes > 0) {
        const std::size_t at = static_cast<std::size_t>(offset % kChunkSize);
        const u64 piece = std::min<u64>(bytes, kChunkSize - at);
        std::unique_ptr<u8[]>& chunk = chunks_[static_cast<std::size_t>(offset / kChunkSize)];
        if (piece == kChunkSize) {
            chunk.reset();
        } else if (chunk) {
            std::memset(chunk.get() + at, 0, static_cast<std::size_t>(piece));
        }
        offset += piece;
        bytes -= piece;
    }
    return {};
}

IoResult SliceDevice::Read(u64 offset, void* target, std::size_t bytes) {
    if (!Fits(offset, bytes, size_)) {
        return {kIoPastEnd, offset};
    }
    IoResult result = base_->Read(offset_ + offset, target, bytes);
    result.offset -= std::min(result.offset, offset_);
    return result;
}

IoResult SliceDevice::Write(u64 offset, const void* source, std::size_t bytes) {
    if (!Fits(offset, bytes, size_)) {
        return {kIoPastEnd, offset};
    }
    IoResult result = base_->Write(offset_ + offset, source, bytes);
    result.offset -= std::min(result.offset, offset_);
    return result;
}

IoResult SliceDevice::Zero(u64 offset, u64 bytes) {
    if (!Fits(offset, bytes, size_)) {
        return {kIoPastEnd, offset};
    }
    IoResult result = base_->Zero(offset_ + offset, bytes);
    result.offset -= std::min(result.offset, offset_);
    return result;
}

IoResult OverlayDevice::Peek(u64 offset, void* target, std::size_t bytes) const {
    if (!Fits(offset, bytes, Size())) {
        return {kIoPastEnd, offset};
    }
    if (pages_.empty()) {
        return base_->Read(offset, target, bytes);
    }
    u8* out = static_cast<u8*>(target);
    while (bytes > 0) {
        const u32 room = kPageSize - static_cast<u32>(offset % kPageSize);
        const u32 piece = static_cast<u32>(std::min<std::size_t>(bytes, room));
        const IoResult result = ReadPage(offset, out, piece);
        if (!result.Ok()) {
            return result;
        }
        out += piece;
        offset += piece;
        bytes -= piece;
    }
    return {};
}

// A range inside one page: from the changes where a sector was changed, else from the base, as few
// reads as there are stretches.
IoResult OverlayDevice::ReadPage(u64 offset, u8* target, u32 bytes) const {
    const auto found = pages_.find(offset / kPageSize);
    if (found == pages_.end()) {
        return base_->Read(offset, target, bytes);
    }
    const Page& page = *found->second;
    u32 at = static_cast<u32>(offset % kPageSize);
    while (bytes > 0) {
        const bool changed = (page.changed >> (at / kSectorSize) & 1) != 0;
        u32 end = (at / kSectorSize + 1) * kSectorSize;
        while (end < kPageSize && end < at + bytes &&
               ((page.changed >> (end / kSectorSize) & 1) != 0) == changed) {
            end += kSectorSize;
        }
        const u32 piece = std::min(bytes, end - at);
        if (changed) {
            std::memcpy(target, page.bytes + at, piece);
        } else {
            const IoResult result = base_->Read(offset, target, piece);
            if (!result.Ok()) {
                return result;
            }
        }
        target += piece;
        offset += piece;
        at += piece;
        bytes -= piece;
    }
    return {};
}

IoResult OverlayDevice::Write(u64 offset, const void* source, std::size_t bytes) {
    if (!Fits(offset, bytes, Size())) {
        return {kIoPastEnd, offset};
    }
    const u8* in = static_cast<const u8*>(source);
    while (bytes > 0) {
        const u32 room = kPageSize - static_cast<u32>(offset % kPageSize);
        const u32 piece = static_cast<u32>(std::min<std::size_t>(bytes, room));
        const IoResult result = WritePage(offset, in, piece);
        if (!result.Ok()) {
            return result;
        }
        in += piece;
        offset += piece;
        bytes -= piece;
    }
    return {};
}

// One after the other: a page that took its successors along would do so at any depth.
OverlayDevice::~OverlayDevice() {
    while (spare_) {
        spare_ = std::move(spare_->next);
    }
}

// Changes that come in batches find the memory of the batch before: given back, the host would take
// it away and clear it again for each batch.
void OverlayDevice::Drop() {
    for (auto& entry : pages_) {
        entry.second->next = std::move(spare_);
        spare_ = std::move(entry.second);
    }
    pages_.clear();
}

// A page without changes; null: out of memory.
std::unique_ptr<OverlayDevice::Page> OverlayDevice::NewPage() {
    if (!spare_) {
        return std::unique_ptr<Page>(new (std::nothrow) Page);
    }
    std::unique_ptr<Page> page = std::move(spare_);
    spare_ = std::move(page->next);
    page->changed = 0;
    return page;
}

// A range inside one page. A sector that is changed in part is completed from the base first.
IoResult OverlayDevice::WritePage(u64 offset, const u8* source, u32 bytes) {
    std::unique_ptr<Page>& page = pages_[offset / kPageSize];
    if (!page) {
        page = NewPage();
        if (!page) {
            pages_.erase(offset / kPageSize);
            return {kIoNoMemory, offset};
        }
    }
    const u32 at = static_cast<u32>(offset % kPageSize);
    const u64 pageStart = offset - at;
    const u32 firstSector = at / kSectorSize;
    const u32 lastSector = (at + bytes - 1) / kSectorSize;
    u32 changed = 0;
    for (u32 sector = firstSector; sector <= lastSector; ++sector) {
        const u32 start = sector * kSectorSize;
        const bool whole = start >= at && start + kSectorSize <= at + bytes;
        if (!whole && (page->changed >> sector & 1) == 0) {
            const u64 left = Size() - (pageStart + start);
            const u32 size = static_cast<u32>(std::min<u64>(kSectorSize, left));
            const IoResult result = base_->Read(pageStart + start, page->bytes + start, size);
            if (!result.Ok()) {
                return result;
            }
        }
        changed |= 1u << sector;
    }
    page->changed = static_cast<u8>(page->changed | changed);
    std::memcpy(page->bytes + at, source, bytes);
    return {};
}

std::vector<u64> OverlayDevice::ChangedPages() const {
    std::vector<u64> numbers;
    numbers.reserve(pages_.size());
    for (const auto& entry : pages_) {
        numbers.push_back(entry.first);
    }
    std::sort(numbers.begin(), numbers.end());
    return numbers;
}

const OverlayDevice::Page* OverlayDevice::PageAt(u64 number) const {
    const auto found = pages_.find(number);
    return found == pages_.end() ? nullptr : found->second.get();
}

}  // namespace VELK
