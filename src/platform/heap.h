// The only source of memory for the engine.
#pragma once

#include <cstddef>

extern "C" {

// Returns `size` bytes aligned for any type, not zeroed, or null when there are none.
void* velk_heap_alloc(std::size_t size);

// Gives back what velk_heap_alloc returned; null is allowed.
void velk_heap_free(void* memory);
}
