// Catches what the engine says: error reports, assertions, traces and log texts, in order.
// An assertion is recognised by its text and keeps only its number. While a Capture lives nothing
// reaches standard error. All sites seen in the process are tallied.
#pragma once

#include <iosfwd>
#include <set>
#include <string>
#include <vector>

#include "platform/host/host.h"
#include "platform/types.h"

namespace VELK::test {

constexpr int kAnySite = -1;  // in an expected event: whatever the site

struct Event {
    enum class Kind { kReport, kAssertion, kTrace, kLog, kDump };

    Kind kind;
    u32 code;  // of a report; bytes of a dump
    int site;  // of a report or assertion
    std::string text;

    friend bool operator==(const Event& a, const Event& b);
};
std::ostream& operator<<(std::ostream& out, const Event& event);
using Events = std::vector<Event>;

// What a test expects.
Event Reported(u32 code, int site);
inline Event Reported(int status, int site) {
    return Reported(static_cast<u32>(status), site);
}
Event Asserted(int site);
Event Traced(std::string text);
Event Logged(std::string text);

class Capture {
public:
    Capture();
    ~Capture();
    Capture(const Capture&) = delete;
    Capture& operator=(const Capture&) = delete;

    // Lets diagnostic traces through until this object ends.
    void TraceAll();

    const Events& All() const { return events_; }
    Events Take();                   // all events so far, and forgets them
    Events Of(Event::Kind k) const;  // those of one kind
    std::vector<int> Assertions() const;

private:
    static void OnError(void* self, unsigned code, const char* fileName, int line);
    static void OnTrace(void* self, const char* text);
    static void OnLog(void* self, void* handle, const char* text);
    static void OnDump(void* self, const void* bytes, unsigned size);

    Events events_;
    HostSinks sinks_;
    const HostSinks* before_;
    unsigned levelBefore_;
};

// Sites of reports and assertions any Capture of this process has seen.
const std::set<int>& SitesSeen();

}  // namespace VELK::test
