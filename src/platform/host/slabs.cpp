// Spans of equal blocks. See slabs.h.
#include "platform/host/slabs.h"

#include <sys/mman.h>

#include <algorithm>
#include <cstring>

namespace VELK {

namespace {

constexpr std::size_t kRegionSize = std::size_t{1} << 21;  // a huge page
constexpr unsigned kSpanShift = 18;
constexpr std::size_t kSpanSize = std::size_t{1} << kSpanShift;
// The first spans lie in small pages: a program with few nodes is not to pay for a huge one, which
// costs as much as three or four of them.
constexpr std::size_t kSmallSpace = 2 * kSpanSize;

void* MapSpace(std::size_t bytes, int access) {
    void* space = mmap(nullptr, bytes, access, MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
    return space == MAP_FAILED ? nullptr : space;
}

// Small pages that come in together cost less than one after the other; those that nobody comes to
// need cost nothing.
constexpr u32 kSupply = u32{32} << 10;  // bytes

void Supply([[maybe_unused]] void* space, [[maybe_unused]] std::size_t bytes) {
#if defined(MADV_POPULATE_WRITE)
    madvise(space, bytes, MADV_POPULATE_WRITE);
#endif
}

}  // namespace

// What is known of a span lies apart from its blocks: at the start of each it would meet that of
// every other span in the same place of the processor's caches.
struct Slabs::Span {
    Span* next;             // in the list of open or of empty spans; both null: in none, or alone
    Span* previous;         // null: first of its list
    void* freed;            // blocks given back, each holding the address of the next one
    std::size_t blockSize;  // bytes
    u32 untouched;          // offset of the first block that was never used
    u32 supplied;           // offset of the first byte whose page may still have to come in
    u32 count;              // blocks in use
};

Slabs::~Slabs() {
    if (base_ != nullptr) {
        munmap(base_, space_);
        munmap(spans_, (space_ >> kSpanShift) * sizeof(Span));
    }
}

// Takes the addresses, a region more than needed so that those behind the first spans can begin at
// a multiple of their size.
bool Slabs::Reserve() {
    if (base_ != nullptr || isRefused_) {
        return base_ != nullptr;
    }
    isRefused_ = true;
    void* space = MapSpace(space_ + kRegionSize, PROT_NONE);
    if (space == nullptr) {
        return false;
    }
    void* spans = MapSpace((space_ >> kSpanShift) * sizeof(Span), PROT_READ | PROT_WRITE);
    if (spans == nullptr) {
        munmap(space, space_ + kRegionSize);
        return false;
    }
    u8* const start = static_cast<u8*>(space);
    const std::size_t before =
        -(reinterpret_cast<std::uintptr_t>(start) + kSmallSpace) & (kRegionSize - 1);
    if (before != 0) {
        munmap(start, before);
    }
    munmap(start + before + space_, kRegionSize - before);
    base_ = start + before;
    spans_ = static_cast<Span*>(spans);
    return true;
}

bool Slabs::OpenRegion() {
    u8* const region = base_ + opened_;
    const bool isFirst = opened_ == 0;
    const std::size_t size = std::min(isFirst ? kSmallSpace : kRegionSize, space_ - opened_);
    if (size == 0 || mprotect(region, size, PROT_READ | PROT_WRITE) != 0) {
        return false;
    }
    if (!isFirst) {
        madvise(region, size, MADV_HUGEPAGE);
    }
    opened_ += size;
    return true;
}

Slabs::Span* Slabs::NewSpan(std::size_t blockSize) {
    Span* span = empty_;
    u32 supplied = kSpanSize;
    if (span != nullptr) {
        Unlink(&empty_, span);
        emptyCount_ -= 1;
    } else {
        if (taken_ == opened_ && !OpenRegion()) {
            return nullptr;
        }
        span = &spans_[taken_ >> kSpanShift];
        supplied = taken_ < kSmallSpace ? 0 : kSpanSize;
        taken_ += kSpanSize;
    }
    *span = {nullptr, nullptr, nullptr, blockSize, 0, supplied, 0};
    return span;
}

Slabs::Span* Slabs::SpanOf(const void* block) const {
    return &spans_[static_cast<std::size_t>(static_cast<const u8*>(block) - base_) >> kSpanShift];
}

void* Slabs::BlocksOf(const Span* span) const {
    return base_ + (static_cast<std::size_t>(span - spans_) << kSpanShift);
}

void Slabs::Link(Span** list, Span* span) {
    span->next = *list;
    span->previous = nullptr;
    if (*list != nullptr) {
        (*list)->previous = span;
    }
    *list = span;
}

void Slabs::Unlink(Span** list, Span* span) {
    (span->previous != nullptr ? span->previous->next : *list) = span->next;
    if (span->next != nullptr) {
        span->next->previous = span->previous;
    }
}

void* Slabs::Alloc(std::size_t size) {
    if (size > kLargest) {
        return nullptr;
    }
    const std::size_t steps = size <= kStep ? 1 : (size + kStep - 1) / kStep;
    const std::lock_guard<std::mutex> guard(lock_);
    Span** const list = &open_[steps];
    if (*list == nullptr) {
        Span* span = Reserve() ? NewSpan(steps * kStep) : nullptr;
        if (span == nullptr) {
            return nullptr;
        }
        Link(list, span);
    }
    Span* const span = *list;
    void* block = span->freed;
    if (block != nullptr) {
        std::memcpy(&span->freed, block, sizeof span->freed);
    } else {
        u8* const blocks = static_cast<u8*>(BlocksOf(span));
        block = blocks + span->untouched;
        span->untouched += static_cast<u32>(span->blockSize);
        for (; span->supplied < span->untouched; span->supplied += kSupply) {
            Supply(blocks + span->supplied, kSupply);
        }
    }
    span->count += 1;
    if (span->freed == nullptr && span->untouched + span->blockSize > kSpanSize) {
        Unlink(list, span);
    }
    return block;
}

bool Slabs::Owns(const void* block) const {
    // Asked without the lock: whoever has a block of these saw `base_` set when it was allocated.
    const u8* const base = base_.load(std::memory_order_relaxed);
    return base != nullptr &&
           reinterpret_cast<std::uintptr_t>(block) - reinterpret_cast<std::uintptr_t>(base) <
               space_;
}

void Slabs::Free(void* block) {
    const std::lock_guard<std::mutex> guard(lock_);
    Span* const span = SpanOf(block);
    Span** const list = &open_[span->blockSize / kStep];
    if (span->freed == nullptr && span->untouched + span->blockSize > kSpanSize) {
        Link(list, span);
    }
    std::memcpy(block, &span->freed, sizeof span->freed);
    span->freed = block;
    span->count -= 1;
    if (span->count == 0) {
        Unlink(list, span);
        Link(&empty_, span);
        emptyCount_ += 1;
    }
}

std::size_t Slabs::SizeOf(const void* block) const {
    return SpanOf(block)->blockSize;
}

std::size_t Slabs::BytesInUse() {
    const std::lock_guard<std::mutex> guard(lock_);
    return taken_ - (emptyCount_ << kSpanShift);
}

}  // namespace VELK
