// Progress lines and interruption.
#include "tool/progress.h"

#include <fmt/format.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <csignal>
#include <cstdio>

#include "hfs/records/text_format.h"
#include "hfs/volume/problem.h"
#include "tool/command.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

std::atomic<int> g_signal{0};  // the one that came last, or 0

// A line for a program. False: the reader went away.
bool Report(int fd, const std::string& what, u64 done, u64 total) {
    std::string name = what;
    std::replace(name.begin(), name.end(), ' ', '.');
    const std::string line = fmt::format("{} {} {}\n", name, done, total);
    return write(fd, line.data(), line.size()) >= 0;
}

// The last line says how far the work came, however short it was.
void ReportEnd(int fd, const std::string& what, u64 done, u64 total) {
    if (fd >= 0 && done != 0) {
        Report(fd, what, done, total);
    }
}

std::string Bar(double part) {
    constexpr std::size_t kBarWidth = 24;
    std::string bar(static_cast<std::size_t>(part * static_cast<double>(kBarWidth)), '#');
    bar.resize(kBarWidth, ' ');
    return bar;
}

// Bytes a line may have: one that runs on in the next row could not be erased.
std::size_t LineWidth() {
    constexpr std::size_t kUsual = 80;
    winsize size{};
    const bool isKnown = ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col != 0;
    return (isKnown ? size.ws_col : kUsual) - 1;
}

void OnInterrupt(int signal) {
    g_signal.store(signal, std::memory_order_relaxed);
}

}  // namespace

void InstallInterruptHandler() {
    struct sigaction action {};
    action.sa_handler = OnInterrupt;
    sigemptyset(&action.sa_mask);
    action.sa_flags = static_cast<int>(SA_RESETHAND);  // a second Ctrl-C ends at once
    sigaction(SIGINT, &action, nullptr);
    sigaction(SIGTERM, &action, nullptr);
}

void ThrowIfInterrupted() {
    if (g_signal.load(std::memory_order_relaxed) != 0) {
        throw Interrupted{};
    }
}

bool TakeInterrupt() {
    int expected = SIGINT;
    if (!g_signal.compare_exchange_strong(expected, 0)) {
        return false;
    }
    InstallInterruptHandler();
    return true;
}

Progress::Progress(const Invocation& call, std::string what, std::string unit, u64 total,
                   u32 unitBytes)
    : what_(std::move(what)),
      unit_(std::move(unit)),
      total_(total),
      unitBytes_(unitBytes),
      onTerminal_(call.showProgress),
      fd_(call.progressFd),
      start_(Clock::now()),
      last_(start_) {}

Progress::~Progress() {
    Erase();
    ReportEnd(fd_, what_, done_, total_);
}

void Progress::Restart(std::string what, u64 total) {
    Erase();
    ReportEnd(fd_, what_, done_, total_);
    what_ = std::move(what);
    total_ = total;
    done_ = 0;
    start_ = Clock::now();
    last_ = start_;
}

void Progress::Look() {
    ThrowIfInterrupted();
    if (!onTerminal_ && fd_ < 0) {
        return;
    }
    const Clock::time_point now = Clock::now();
    if (now - last_ < std::chrono::milliseconds(250)) {
        return;
    }
    last_ = now;
    if (fd_ >= 0) {
        // A reader that went away is no reason to stop the work.
        fd_ = Report(fd_, what_, done_, total_) ? fd_ : -1;
    }
    const double seconds = std::chrono::duration<double>(now - start_).count();
    if (onTerminal_ && seconds >= 1.0) {
        Draw(seconds);
    }
}

// Without a total (it is not known before the walk) only what was done is said.
void Progress::Draw(double seconds) {
    std::string line = what_;
    const double part =
        total_ == 0 ? 0.0 : std::min(1.0, static_cast<double>(done_) / static_cast<double>(total_));
    if (total_ == 0) {
        line += fmt::format("  {} {}", Grouped(done_), unit_);
    } else {
        line += fmt::format(" {:3.0f}% [{}]  {}/{} {}", part * 100.0, Bar(part), Grouped(done_),
                            Grouped(total_), unit_);
    }
    if (unitBytes_ != 0) {
        const double rate = static_cast<double>(done_) * unitBytes_ / seconds;
        line += fmt::format("  {}/s", ShortBytes(static_cast<u64>(rate)));
    }
    if (part > 0) {
        const u64 left = static_cast<u64>(std::lround(seconds / part - seconds));
        line += fmt::format("  {}:{:02} left", left / 60, left % 60);
    }
    line.resize(std::min(line.size(), LineWidth()));
    line = "\r" + line + "\x1b[K";
    std::fwrite(line.data(), 1, line.size(), stderr);
    drawn_ = true;
}

void Progress::Erase() {
    if (drawn_) {
        std::fputs("\r\x1b[K", stderr);
        drawn_ = false;
    }
}

}  // namespace VELK::tool
