// Sinks for the engine's reports and traces.
#include "tool/engine_trace.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "platform/host/host.h"
#include "platform/trace.h"

namespace VELK::tool {

namespace {

constexpr char kAssertionStart[] = "***** velk_assert ";

// Reasons are small numbers, statuses have their top bit set.
void PrintReport(void*, unsigned code, const char*, int line) {
    if (code < 0x100) {
        std::fprintf(stderr, "  ! report %u line %d\n", code, line);
    } else {
        std::fprintf(stderr, "  ! report line %d status %08X\n", line, code);
    }
}

void PrintTrace(void*, const char* text) {
    const char* comma = std::strrchr(text, ',');
    if (std::strncmp(text, kAssertionStart, sizeof kAssertionStart - 1) == 0 && comma != nullptr) {
        std::fprintf(stderr, "  ! assert %d\n",
                     static_cast<int>(std::strtol(comma + 1, nullptr, 10)));
        return;
    }
    const std::size_t length = std::strlen(text);
    const bool hasLineFeed = length > 0 && text[length - 1] == '\n';
    std::fprintf(stderr, "  ! %s%s", text, hasLineFeed ? "" : "\n");
}

void PrintLog(void* self, void*, const char* text) {
    PrintTrace(self, text);
}

void PrintDump(void*, const void* bytes, unsigned size) {
    for (unsigned i = 0; i < size; ++i) {
        std::fprintf(stderr, "%s%02x%s", i % 16 == 0 ? "  ! " : " ",
                     static_cast<const unsigned char*>(bytes)[i],
                     i % 16 == 15 || i + 1 == size ? "\n" : "");
    }
}

void IgnoreReport(void*, unsigned, const char*, int) {}
void IgnoreTrace(void*, const char*) {}
void IgnoreLog(void*, void*, const char*) {}
void IgnoreDump(void*, const void*, unsigned) {}

const HostSinks kSilent = {IgnoreReport, IgnoreTrace, IgnoreLog, IgnoreDump, nullptr};
const HostSinks kPrinting = {PrintReport, PrintTrace, PrintLog, PrintDump, nullptr};

}  // namespace

void SilenceEngine() {
    velk_trace_level = 0;
    SetHostSinks(&kSilent);
}

void TraceEngine() {
    velk_trace_level |= VELK_TRACE_DIAGNOSTIC;
    SetHostSinks(&kPrinting);
}

}  // namespace VELK::tool
