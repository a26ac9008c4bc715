// Progress of long walks on standard error: shown after one second when that is a terminal, erased
// at the end. With --progress-fd, lines for a program, four a second. Also the place where a walk
// notices that the user wants to stop.
#pragma once

#include <chrono>
#include <string>

#include "platform/types.h"

namespace VELK::tool {

class Invocation;

class Progress {
public:
    // `what` as in "check catalog"; `unit` as in "nodes"; `unitBytes` 0: no data rate is shown.
    Progress(const Invocation& call, std::string what, std::string unit, u64 total, u32 unitBytes);
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;
    ~Progress();

    // Cheap: looks at the clock only now and then. Throws Interrupted.
    void Update(u64 done) {
        done_ = done;
        if (++calls_ % kStride == 0) {
            Look();
        }
    }
    // The same for callers that call seldom.
    void Show(u64 done) {
        done_ = done;
        Look();
    }
    void Restart(std::string what, u64 total);
    void Erase();
    // Looks at the clock at once.
    void Look();

private:
    static constexpr u32 kStride = 64;
    using Clock = std::chrono::steady_clock;

    void Draw(double seconds);

    std::string what_;
    std::string unit_;
    u64 total_;
    u32 unitBytes_;
    bool onTerminal_;
    int fd_;
    u64 done_ = 0;
    u32 calls_ = 0;
    bool drawn_ = false;
    Clock::time_point start_;
    Clock::time_point last_;
};

// Set by the handler of SIGINT and SIGTERM.
void InstallInterruptHandler();
void ThrowIfInterrupted();
// True after Ctrl-C, which is forgotten with it: what goes on can be interrupted again. A signal
// that asks the program to end is not forgotten.
bool TakeInterrupt();

}  // namespace VELK::tool
