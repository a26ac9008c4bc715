// See capture.h.
#include "capture.h"

#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <ostream>
#include <string_view>
#include <utility>

#include "platform/trace.h"

namespace VELK::test {

namespace {

constexpr std::string_view kAssertionText = "***** velk_assert src/hfs/treehfs, ";

// Where to leave the tally of this process, one file each, when the environment names a directory.
constexpr char kTallyVariable[] = "TREEHFS_SITES_DIR";

struct Tally {
    std::set<int> sites;

    ~Tally() {
        const char* directory = std::getenv(kTallyVariable);
        if (directory != nullptr) {
            std::ofstream file(std::string(directory) + "/" + std::to_string(getpid()));
            for (const int site : sites) {
                file << site << '\n';
            }
        }
    }
};

std::set<int>& MutableSites() {
    static Tally tally;
    return tally.sites;
}

// The number in an assertion line that is exactly "<text><number>\n", or kAnySite.
int AssertionSite(std::string_view text) {
    if (text.substr(0, kAssertionText.size()) != kAssertionText || text.back() != '\n') {
        return kAnySite;
    }
    const std::string digits(
        text.substr(kAssertionText.size(), text.size() - kAssertionText.size() - 1));
    if (digits.empty() || digits.find_first_not_of("0123456789") != std::string::npos) {
        return kAnySite;
    }
    return std::atoi(digits.c_str());
}

}  // namespace

bool operator==(const Event& a, const Event& b) {
    const bool sameSite = a.site == b.site || a.site == kAnySite || b.site == kAnySite;
    return a.kind == b.kind && a.code == b.code && sameSite && a.text == b.text;
}

std::ostream& operator<<(std::ostream& out, const Event& event) {
    switch (event.kind) {
        case Event::Kind::kReport:
            return out << "report 0x" << std::hex << event.code << std::dec << " at " << event.site;
        case Event::Kind::kAssertion:
            return out << "assertion " << event.site;
        case Event::Kind::kTrace:
            return out << "trace \"" << event.text << '"';
        case Event::Kind::kLog:
            return out << "log \"" << event.text << '"';
        case Event::Kind::kDump:
            return out << "dump of " << event.code << " bytes";
    }
    return out;
}

Event Reported(u32 code, int site) {
    return {Event::Kind::kReport, code, site, {}};
}
Event Asserted(int site) {
    return {Event::Kind::kAssertion, 0, site, {}};
}
Event Traced(std::string text) {
    return {Event::Kind::kTrace, 0, 0, std::move(text)};
}
Event Logged(std::string text) {
    return {Event::Kind::kLog, 0, 0, std::move(text)};
}

Capture::Capture() : sinks_{OnError, OnTrace, OnLog, OnDump, this} {
    before_ = SetHostSinks(&sinks_);
    levelBefore_ = velk_trace_level;
}

Capture::~Capture() {
    velk_trace_level = levelBefore_;
    SetHostSinks(before_);
}

void Capture::TraceAll() {
    velk_trace_level |= VELK_TRACE_DIAGNOSTIC;
}

Events Capture::Take() {
    return std::exchange(events_, {});
}

Events Capture::Of(Event::Kind kind) const {
    Events found;
    for (const Event& event : events_) {
        if (event.kind == kind) {
            found.push_back(event);
        }
    }
    return found;
}

std::vector<int> Capture::Assertions() const {
    std::vector<int> sites;
    for (const Event& event : Of(Event::Kind::kAssertion)) {
        sites.push_back(event.site);
    }
    return sites;
}

void Capture::OnError(void* self, unsigned code, const char* /*fileName*/, int line) {
    MutableSites().insert(line);
    static_cast<Capture*>(self)->events_.push_back(Reported(code, line));
}

void Capture::OnTrace(void* self, const char* text) {
    const int site = AssertionSite(text);
    if (site != kAnySite) {
        MutableSites().insert(site);
    }
    static_cast<Capture*>(self)->events_.push_back(site != kAnySite ? Asserted(site)
                                                                    : Traced(text));
}

void Capture::OnLog(void* self, void* /*handle*/, const char* text) {
    static_cast<Capture*>(self)->events_.push_back(Logged(text));
}

void Capture::OnDump(void* self, const void* /*bytes*/, unsigned size) {
    static_cast<Capture*>(self)->events_.push_back({Event::Kind::kDump, size, 0, {}});
}

const std::set<int>& SitesSeen() {
    return MutableSites();
}

}  // namespace VELK::test
