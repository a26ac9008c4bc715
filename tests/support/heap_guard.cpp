// See heap_guard.h.
#include "heap_guard.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>

namespace VELK::test {

HeapGuard::HeapGuard() : heap_{OnAlloc, OnFree, this}, before_(SetHostHeap(&heap_)) {}

HeapGuard::~HeapGuard() {
    EXPECT_EQ(live_.size(), 0u) << "blocks of the engine's heap were never given back";
    SetHostHeap(before_);
}

void HeapGuard::FailNth(u32 nth, bool forever) {
    failIn_ = nth;
    forever_ = forever;
    failed_ = false;
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
        guard->live_.insert(memory);
    }
    return memory;
}

void HeapGuard::OnFree(void* self, void* memory) {
    if (memory == nullptr) {
        return;
    }
    EXPECT_EQ(static_cast<HeapGuard*>(self)->live_.erase(memory), 1u) << "freed twice or foreign";
    std::free(memory);
}

}  // namespace VELK::test
