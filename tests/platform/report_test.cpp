// Hooks of the hosted platform: what reaches the sinks, and how.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "platform/error.h"
#include "platform/heap.h"
#include "platform/host/host.h"
#include "platform/trace.h"

namespace VELK {
namespace {

class Sinks : public ::testing::Test {
protected:
    void SetUp() override { before_ = SetHostSinks(&hooks_); }
    void TearDown() override { SetHostSinks(before_); }

    static Sinks* Self(void* self) { return static_cast<Sinks*>(self); }
    static void OnError(void* self, unsigned code, const char* fileName, int line) {
        Self(self)->seen.push_back(std::to_string(code) + " " + fileName + " " +
                                   std::to_string(line));
    }
    static void OnTrace(void* self, const char* text) { Self(self)->seen.push_back(text); }
    static void OnLog(void* self, void* handle, const char* text) {
        EXPECT_EQ(handle, self);
        Self(self)->seen.push_back(std::string("log ") + text);
    }
    static void OnDump(void* self, const void* bytes, unsigned size) {
        Self(self)->seen.push_back(std::string(static_cast<const char*>(bytes), size));
    }

    std::vector<std::string> seen;
    HostSinks hooks_{OnError, OnTrace, OnLog, OnDump, this};
    const HostSinks* before_ = nullptr;
};

TEST_F(Sinks, ErrorArrivesWithCodeFileAndLine) {
    VELKError(15, "src/x 1.0", 658);
    EXPECT_EQ(seen, std::vector<std::string>{"15 src/x 1.0 658"});
}

TEST_F(Sinks, TraceArrivesFormatted) {
    _VELKTrace("node %x of %u\n", 0xABu, 7u);
    EXPECT_EQ(seen, std::vector<std::string>{"node ab of 7\n"});
}

TEST_F(Sinks, LogArrivesWithItsHandle) {
    velk_printk(this, "%s %d", "n", 3);
    EXPECT_EQ(seen, std::vector<std::string>{"log n 3"});
}

TEST_F(Sinks, DumpArrivesAsBytes) {
    VELK_DumpMemory("abc", 3);
    EXPECT_EQ(seen, std::vector<std::string>{"abc"});
}

TEST_F(Sinks, LongTraceIsCutAndEnded) {
    const std::string longText(5000, 'x');
    _VELKTrace("%s", longText.c_str());
    ASSERT_EQ(seen.size(), 1u);
    EXPECT_EQ(seen[0], longText.substr(0, seen[0].size()));
    EXPECT_GE(seen[0].size(), 500u);
}

TEST_F(Sinks, InstallingReturnsTheHooksBefore) {
    HostSinks other{};
    EXPECT_EQ(SetHostSinks(&other), &hooks_);
    EXPECT_EQ(SetHostSinks(&hooks_), &other);
}

TEST(HostDefaults, TraceLogAndDumpGoToStandardErrorAndErrorsNowhere) {
    const HostSinks* before = SetHostSinks(nullptr);
    ::testing::internal::CaptureStderr();
    VELKError(1, "src/x 1.0", 1);
    _VELKTrace("a %d\n", 1);
    velk_printk(nullptr, "b %d\n", 2);
    const unsigned char bytes[17] = {0x00, 0xFF, 0x10};
    VELK_DumpMemory(bytes, sizeof bytes);
    const std::string text = ::testing::internal::GetCapturedStderr();
    SetHostSinks(before);
    EXPECT_EQ(text,
              "a 1\nb 2\n"
              "00000000: 00 ff 10 00 00 00 00 00 00 00 00 00 00 00 00 00\n"
              "00000010: 00\n");
}

// A damaged record asserts each time it is read. Other lines are never kept back.
TEST(HostDefaults, AnAssertionMetAMillionTimesIsToldAHundredTimes) {
    const HostSinks* before = SetHostSinks(nullptr);
    ::testing::internal::CaptureStderr();
    for (int i = 0; i < 1000000; ++i) {
        _VELKTrace("***** velk_assert src/x, %d\n", 505);
    }
    for (int i = 0; i < 101; ++i) {
        _VELKTrace("no assertion\n");
    }
    const std::string text = ::testing::internal::GetCapturedStderr();
    SetHostSinks(before);
    std::string expected;
    for (int i = 0; i < 100; ++i) {
        expected += "***** velk_assert src/x, 505\n";
    }
    expected += "***** told often enough, not again: src/x, 505\n";
    for (int i = 0; i < 101; ++i) {
        expected += "no assertion\n";
    }
    EXPECT_EQ(text, expected);
}

TEST(HostDefaults, HeapIsAlignedAndTakesNullBack) {
    const HostHeap* before = SetHostHeap(nullptr);
    void* memory = velk_heap_alloc(40);
    ASSERT_NE(memory, nullptr);
    EXPECT_EQ(reinterpret_cast<std::uintptr_t>(memory) % alignof(std::max_align_t), 0u);
    velk_heap_free(memory);
    velk_heap_free(nullptr);
    SetHostHeap(before);
}

}  // namespace
}  // namespace VELK
