// Reports and traces of a hosted program. Texts are formatted in a buffer on the stack, cut when
// they are longer, and handed on whole. A sink without an entry for something leaves that to the
// default: traces, logs and dumps go to standard error, error reports nowhere.
#include <cstdarg>
#include <cstdio>

#include "platform/error.h"
#include "platform/host/host.h"
#include "platform/trace.h"

unsigned velk_trace_level = 0;

namespace VELK {

namespace {

constexpr std::size_t kTextSize = 1024;
constexpr unsigned kDumpRow = 16;

const HostSinks* sinks = nullptr;

void DumpRow(const u8* bytes, unsigned offset, unsigned count) {
    char text[kDumpRow * 3 + 1];
    for (unsigned i = 0; i < count; ++i) {
        std::snprintf(text + std::size_t{i} * 3, 4, " %02x", bytes[offset + i]);
    }
    std::fprintf(stderr, "%08x:%s\n", offset, text);
}

}  // namespace

const HostSinks* SetHostSinks(const HostSinks* newSinks) {
    const HostSinks* before = sinks;
    sinks = newSinks;
    return before;
}

}  // namespace VELK

void VELKError(unsigned code, const char* fileName, int line) {
    const VELK::HostSinks* sinks = VELK::sinks;
    if (sinks != nullptr && sinks->Error != nullptr) {
        sinks->Error(sinks->self, code, fileName, line);
    }
}

void _VELKTrace(const char* format, ...) {
    char text[VELK::kTextSize];
    std::va_list arguments;
    va_start(arguments, format);
    std::vsnprintf(text, sizeof text, format, arguments);
    va_end(arguments);
    const VELK::HostSinks* sinks = VELK::sinks;
    if (sinks != nullptr && sinks->Trace != nullptr) {
        sinks->Trace(sinks->self, text);
    } else {
        std::fputs(text, stderr);
    }
}

void velk_printk(void* handle, const char* format, ...) {
    char text[VELK::kTextSize];
    std::va_list arguments;
    va_start(arguments, format);
    std::vsnprintf(text, sizeof text, format, arguments);
    va_end(arguments);
    const VELK::HostSinks* sinks = VELK::sinks;
    if (sinks != nullptr && sinks->Log != nullptr) {
        sinks->Log(sinks->self, handle, text);
    } else {
        std::fputs(text, stderr);
    }
}

void VELK_DumpMemory(const void* bytes, unsigned size) {
    const VELK::HostSinks* sinks = VELK::sinks;
    if (sinks != nullptr && sinks->Dump != nullptr) {
        sinks->Dump(sinks->self, bytes, size);
        return;
    }
    for (unsigned offset = 0; offset < size;) {
        const unsigned left = size - offset;
        const unsigned count = left < VELK::kDumpRow ? left : VELK::kDumpRow;
        VELK::DumpRow(static_cast<const VELK::u8*>(bytes), offset, count);
        offset += count;
    }
}
