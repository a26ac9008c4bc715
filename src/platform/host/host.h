// Hooks of the hosted platform: where heap, error reports and traces of a hosted program go.
// Process-wide; change them only while no tree is in use.
#pragma once

#include <cstdarg>
#include <cstddef>

#include "platform/types.h"

namespace VELK {

// Stands in for malloc under heap.h. Both entries have to be there.
struct HostHeap {
    void* (*Alloc)(void* self, std::size_t size);  // null: no memory
    void (*Free)(void* self, void* memory);        // null is allowed
    void* self;                                    // context, passed to both
};

// Takes what the engine reports. Texts are finished, at most 1,023 bytes, and valid during the call
// only. An entry that is null leaves its part to the default.
struct HostSinks {
    // One step of a failure, as VELKError got it.
    void (*Error)(void* self, unsigned code, const char* fileName, int line);
    void (*Trace)(void* self, const char* text);                 // _VELKTrace
    void (*Log)(void* self, void* handle, const char* text);     // velk_printk; the volume's handle
    void (*Dump)(void* self, const void* bytes, unsigned size);  // VELK_DumpMemory
    void* self;                                                  // context, passed to all
};

// Installs hooks, which stay the caller's and must outlive their use; null puts the default back
// (malloc; standard error, errors silent). Returns the hooks that were installed before, or null
// for the default.
const HostHeap* SetHostHeap(const HostHeap* heap);
const HostSinks* SetHostSinks(const HostSinks* sinks);

}  // namespace VELK
