// Hooks of the hosted platform: where heap, error reports and traces of a hosted program go.
// Process-wide; change them only while no tree is in use.
#pragma once

#include <cstdarg>
#include <cstddef>

#include "platform/types.h"

namespace VELK {

// Stands in for the default heap under heap.h. Both entries have to be there.
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
// (HostAlloc; standard error, errors silent). Returns the hooks that were installed before, or null
// for the default.
const HostHeap* SetHostHeap(const HostHeap* heap);
const HostSinks* SetHostSinks(const HostSinks* sinks);

// The default heap, for hooks that pass on what they are asked: node-sized blocks lie together in
// huge pages (slabs.h), others come from malloc. Null: no memory; null is allowed. Any thread.
void* HostAlloc(std::size_t size);
void HostFree(void* memory);
// Bytes that an allocation really takes. REQUIRES: `memory` came from HostAlloc.
std::size_t HostSizeOf(void* memory);

}  // namespace VELK
