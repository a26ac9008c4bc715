// Hooks of the hosted platform: where heap, error reports and traces of a hosted program go.
// Process-wide; change them only while no tree is in use.
#pragma once

#include <cstdarg>
#include <cstddef>

#include "platform/types.h"

namespace VELK {

struct HostHeap {
    void* (*Alloc)(void* self, std::size_t size);
    void (*Free)(void* self, void* memory);
    void* self;
};

struct HostSinks {
    void (*Error)(void* self, unsigned code, const char* fileName, int line);
    void (*Trace)(void* self, const char* text);  // one finished text
    void (*Log)(void* self, void* handle, const char* text);
    void (*Dump)(void* self, const void* bytes, unsigned size);
    void* self;
};

// Installs hooks; null puts the default back (malloc; standard error, errors silent). Returns the
// hooks that were installed before, or null for the default.
const HostHeap* SetHostHeap(const HostHeap* heap);
const HostSinks* SetHostSinks(const HostSinks* sinks);

}  // namespace VELK
