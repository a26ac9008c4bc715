// Reports and traces of a hosted program. Texts are formatted in a buffer on the stack, cut when
// they are longer, and handed on whole. A sink without an entry for something leaves that to the
// default: traces, logs and dumps go to standard error, error reports nowhere.
#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "platform/error.h"
#include "platform/host/host.h"
#include "platform/trace.h"

unsigned velk_trace_level = 0;

namespace VELK {

namespace {

constexpr std::size_t kTextSize = 1024;
constexpr unsigned kDumpRow = 16;

const HostSinks* sinks = nullptr;

constexpr char kAssertionStart[] = "***** velk_assert ";
constexpr u32 kMostAlike = 100;
constexpr u32 kCounters = 256;

// Assertions told, by a hash of their text; two that share a counter share its limit.
std::atomic<u32> told[kCounters];

u32 HashOf(const char* text) {
    u32 hash = 0;
    for (; *text != 0; ++text) {
        hash = hash * 31 + static_cast<u8>(*text);
    }
    return hash;
}

// Assertions go on, so a damaged record brings its line as often as it is read: standard error gets
// each line so often and no more.
void PrintTrace(const char* text) {
    constexpr std::size_t kStart = sizeof kAssertionStart - 1;
    if (std::strncmp(text, kAssertionStart, kStart) != 0) {
        std::fputs(text, stderr);
        return;
    }
    std::atomic<u32>& count = told[HashOf(text) % kCounters];
    if (count.load(std::memory_order_relaxed) > kMostAlike) {
        return;
    }
    if (count.fetch_add(1, std::memory_order_relaxed) < kMostAlike) {
        std::fputs(text, stderr);
    } else {
        std::fprintf(stderr, "***** told often enough, not again: %s", text + kStart);
    }
}

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
        VELK::PrintTrace(text);
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
