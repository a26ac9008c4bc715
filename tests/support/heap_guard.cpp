// See heap_guard.h.
#include "heap_guard.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>

namespace VELK::test {

namespace {

HeapGuard* currentGuard = nullptr;

}  // namespace

HeapGuard* HeapGuard::Current() {
    return currentGuard;
}

HeapGuard::HeapGuard()
    : heap_{OnAlloc, OnFree, this}, before_(SetHostHeap(&heap_)), outer_(currentGuard) {
    currentGuard = this;
}

HeapGuard::~HeapGuard() {
    EXPECT_EQ(live_.size(), 0u) << "blocks of the engine's heap were never given back";
    SetHostHeap(before_);
    currentGuard = outer_;
}

void HeapGuard::FailNth(u32 nth, bool forever) {
    failIn_ = nth;
    forever_ = forever;
    failed_ = false;
}

std::size_t HeapGuard::BytesOf(const void* block) const {
    const auto found = live_.find(block);
    return found != live_.end() ? found->second : 0;
}

void* HeapGuard::OnAlloc(void* self, std::size_t size) {
    HeapGuard* guard = static_cast<HeapGuard*>(self);
    guard->allocations_ += 1;
    if (guard->failIn_ == 1) {
        guard->failIn_ = guard->forever_ ? 1 : 0;
        guard->failed_ = true;
        return nullptr;
    }
    if (guard->failIn_ > 1) {
        guard->failIn_ -= 1;
    }
    void* memory = std::malloc(size);
    if (memory != nullptr) {
        std::memset(memory, 0xA7, size);  // nobody may rely on zeroed memory
        guard->live_.emplace(memory, size);
        guard->liveBytes_ += size;
        guard->peakBytes_ = std::max(guard->peakBytes_, guard->liveBytes_);
    }
    return memory;
}

void HeapGuard::OnFree(void* self, void* memory) {
    if (memory == nullptr) {
        return;
    }
    HeapGuard* guard = static_cast<HeapGuard*>(self);
    const auto block = guard->live_.find(memory);
    if (block == guard->live_.end()) {
        ADD_FAILURE() << "freed twice or foreign";
    } else {
        guard->liveBytes_ -= block->second;
        guard->live_.erase(block);
    }
    std::free(memory);
}

}  // namespace VELK::test
