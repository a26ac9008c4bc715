// An engine that says nothing, for runs that are repeated so often that nobody would read what they
// say.
#pragma once

#include "heap_guard.h"
#include "platform/host/host.h"

namespace VELK::test {

class Silence {
public:
    Silence() : before_(SetHostSinks(&kSilent)) {}
    ~Silence() { SetHostSinks(before_); }
    Silence(const Silence&) = delete;
    Silence& operator=(const Silence&) = delete;

private:
    static void NoText(void*, const char*) {}
    static void NoLog(void*, void*, const char*) {}
    static void NoDump(void*, const void*, unsigned) {}
    static void NoError(void*, unsigned, const char*, int) {}

    static constexpr HostSinks kSilent = {NoError, NoText, NoLog, NoDump, nullptr};
    const HostSinks* before_;
};

// With its heap counted: at the end nothing may be left on it.
class Quiet {
private:
    Silence silence_;
    HeapGuard heap_;
};

}  // namespace VELK::test
