// What the engine says while it works, kept in order, for programs that print it beside the
// operation it belongs to.
#pragma once

#include <string>
#include <vector>

#include "platform/host/host.h"
#include "platform/types.h"

namespace VELK::tool {

// Takes the place of the host's sinks while it lives.
class EngineLog {
public:
    EngineLog();
    EngineLog(const EngineLog&) = delete;
    EngineLog& operator=(const EngineLog&) = delete;
    ~EngineLog();

    // Off (at first), nothing is kept.
    void Keep(bool keep) { keep_ = keep; }
    bool IsKeeping() const { return keep_; }

    // The lines since the last call: "! report 10 line 2916 status A000011C", "! assert 410". A
    // report that names a reason gets the status that was returned for it; `status` is the one the
    // whole operation returned.
    std::vector<std::string> Take(int status);

private:
    struct Entry {
        bool isAssertion;
        u32 code;  // reason or status of a report
        int line;
    };
    static void OnError(void* self, unsigned code, const char* fileName, int line);
    static void OnTrace(void* self, const char* text);
    static void OnLog(void* self, void* handle, const char* text);
    static void OnDump(void* self, const void* bytes, unsigned size);

    HostSinks sinks_;
    const HostSinks* before_;
    bool keep_ = false;
    std::vector<Entry> entries_;
};

}  // namespace VELK::tool
