// Collecting reports and assertions.
#include "tool/engine_log.h"

#include <cstdlib>
#include <cstring>

#include "hfs/volume/problem.h"

namespace VELK::tool {
namespace {

constexpr char kAssertionStart[] = "***** velk_assert ";
constexpr u32 kFirstStatus = 0x100;  // reasons are smaller

}  // namespace

EngineLog::EngineLog() : sinks_{OnError, OnTrace, OnLog, OnDump, this} {
    before_ = SetHostSinks(&sinks_);
}

EngineLog::~EngineLog() {
    SetHostSinks(before_);
}

void EngineLog::OnError(void* self, unsigned code, const char*, int line) {
    EngineLog* log = static_cast<EngineLog*>(self);
    if (log->keep_) {
        log->entries_.push_back({false, code, line});
    }
}

void EngineLog::OnTrace(void* self, const char* text) {
    EngineLog* log = static_cast<EngineLog*>(self);
    const char* comma = std::strrchr(text, ',');
    if (log->keep_ && comma != nullptr &&
        std::strncmp(text, kAssertionStart, sizeof kAssertionStart - 1) == 0) {
        log->entries_.push_back({true, 0, static_cast<int>(std::strtol(comma + 1, nullptr, 10))});
    }
}

void EngineLog::OnLog(void*, void*, const char*) {}
void EngineLog::OnDump(void*, const void*, unsigned) {}

std::vector<std::string> EngineLog::Take(int status) {
    std::vector<std::string> lines;
    for (std::size_t i = 0; i < entries_.size(); ++i) {
        const Entry& entry = entries_[i];
        if (entry.isAssertion) {
            lines.push_back(Format("! assert %d", entry.line));
        } else if (entry.code >= kFirstStatus) {
            lines.push_back(Format("! report line %d status %08X", entry.line, entry.code));
        } else {
            // The first to pass the failure on names the status.
            u32 passed = static_cast<u32>(status);
            for (std::size_t k = i + 1; k < entries_.size(); ++k) {
                if (!entries_[k].isAssertion && entries_[k].code >= kFirstStatus) {
                    passed = entries_[k].code;
                    break;
                }
            }
            lines.push_back(
                Format("! report %u line %d status %08X", entry.code, entry.line, passed));
        }
    }
    entries_.clear();
    return lines;
}

}  // namespace VELK::tool
