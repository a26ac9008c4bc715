// Heap of a hosted program: malloc, unless hooks stand in for it.
#include <cstdlib>

#include "platform/heap.h"
#include "platform/host/host.h"

namespace VELK {

namespace {

const HostHeap* hooks = nullptr;

}  // namespace

const HostHeap* SetHostHeap(const HostHeap* heap) {
    const HostHeap* before = hooks;
    hooks = heap;
    return before;
}

}  // namespace VELK

void* velk_heap_alloc(std::size_t size) {
    const VELK::HostHeap* heap = VELK::hooks;
    return heap != nullptr ? heap->Alloc(heap->self, size) : std::malloc(size);
}

void velk_heap_free(void* memory) {
    const VELK::HostHeap* heap = VELK::hooks;
    if (heap != nullptr) {
        heap->Free(heap->self, memory);
    } else {
        std::free(memory);
    }
}
