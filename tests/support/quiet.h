// An engine that says nothing, its heap counted: for runs that are repeated so often that nobody
// would read what they say. At the end nothing may be left on the heap.
#pragma once

#include "heap_guard.h"
#include "platform/host/host.h"

namespace VELK::test {

class Quiet {
public:
    Quiet() : before_(SetHostSinks(&kSilent)) {}
    ~Quiet() { SetHostSinks(before_); }
    Quiet(const Quiet&) = delete;
    Quiet& operator=(const Quiet&) = delete;

private:
    static void NoText(void*, const char*) {}
    static void NoLog(void*, void*, const char*) {}
    static void NoDump(void*, const void*, unsigned) {}
    static void NoError(void*, unsigned, const char*, int) {}

    static constexpr HostSinks kSilent = {NoError, NoText, NoLog, NoDump, nullptr};
    const HostSinks* before_;
    HeapGuard heap_;
};

}  // namespace VELK::test
