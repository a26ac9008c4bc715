// Stands in for the heap of the engine: counts, fails the nth allocation, and proves at its end
// that everything was given back. Declare it before the objects that allocate.
#pragma once

#include <cstddef>
#include <unordered_map>

#include "platform/host/host.h"
#include "platform/types.h"

namespace VELK::test {

class HeapGuard {
public:
    HeapGuard();
    ~HeapGuard();  // a test failure when blocks are left
    HeapGuard(const HeapGuard&) = delete;
    HeapGuard& operator=(const HeapGuard&) = delete;

    // The nth allocation from now on (1: the next) yields null, once or from then on.
    void FailNth(u32 nth, bool forever = false);
    void FailNone() { failIn_ = 0; }
    bool HasFailed() const { return failed_; }

    u32 Allocations() const { return allocations_; }  // all so far, refused ones included
    std::size_t Live() const { return live_.size(); }
    // Most bytes that were out at once since the last ResetPeak.
    std::size_t PeakBytes() const { return peakBytes_; }
    void ResetPeak() { peakBytes_ = liveBytes_; }

    // Size of a block that is out; 0: there is no such block.
    std::size_t BytesOf(const void* block) const;

    // The one that stands in now; null: none.
    static HeapGuard* Current();

private:
    static void* OnAlloc(void* self, std::size_t size);
    static void OnFree(void* self, void* memory);

    std::unordered_map<const void*, std::size_t> live_;  // bytes by block
    std::size_t liveBytes_ = 0;
    std::size_t peakBytes_ = 0;
    HostHeap heap_;
    const HostHeap* before_;
    HeapGuard* outer_;
    u32 allocations_ = 0;
    u32 failIn_ = 0;
    bool forever_ = false;
    bool failed_ = false;
};

}  // namespace VELK::test
