// Heap of a hosted program: slabs for what a cache of nodes takes and malloc for the rest, unless
// hooks stand in for both.
#include <malloc.h>

#include <cstdlib>

#include "platform/heap.h"
#include "platform/host/host.h"
#include "platform/host/slabs.h"

namespace VELK {

namespace {

const HostHeap* hooks = nullptr;

// Builds that look for mistakes give each allocation a heap block of its own: an access past its
// end, or after it was given back, would meet the next block of a slab and go unnoticed.
#if defined(__has_feature)
#define HAS_FEATURE(name) __has_feature(name)
#else
#define HAS_FEATURE(name) 0
#endif
#if defined(__SANITIZE_ADDRESS__) || HAS_FEATURE(address_sanitizer) || defined(TREEHFS_PARANOID)
constexpr bool kUseSlabs = false;
#else
constexpr bool kUseSlabs = true;
#endif

constexpr std::size_t kSlabSpace = std::size_t{1} << 38;  // addresses, not memory

// Never torn down: a tree that is a static object gives its nodes back after every destructor here.
union SlabsForEver {
    constexpr SlabsForEver() : slabs(kSlabSpace) {}
    ~SlabsForEver() {}
    Slabs slabs;
};
constinit SlabsForEver forEver;

}  // namespace

const HostHeap* SetHostHeap(const HostHeap* heap) {
    const HostHeap* before = hooks;
    hooks = heap;
    return before;
}

void* HostAlloc(std::size_t size) {
    void* memory = kUseSlabs ? forEver.slabs.Alloc(size) : nullptr;
    return memory != nullptr ? memory : std::malloc(size);
}

void HostFree(void* memory) {
    if (forEver.slabs.Owns(memory)) {
        forEver.slabs.Free(memory);
    } else {
        std::free(memory);
    }
}

std::size_t HostSizeOf(void* memory) {
    return forEver.slabs.Owns(memory) ? forEver.slabs.SizeOf(memory) : malloc_usable_size(memory);
}

}  // namespace VELK

void* velk_heap_alloc(std::size_t size) {
    const VELK::HostHeap* heap = VELK::hooks;
    return heap != nullptr ? heap->Alloc(heap->self, size) : VELK::HostAlloc(size);
}

void velk_heap_free(void* memory) {
    const VELK::HostHeap* heap = VELK::hooks;
    if (heap != nullptr) {
        heap->Free(heap->self, memory);
    } else {
        VELK::HostFree(memory);
    }
}
