// What the fuzz targets share: taking an input apart, checks that end the run, an engine that says
// nothing and whose memory is counted (quiet.h).
#pragma once

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>

#include "image_bytes.h"
#include "quiet.h"

// A target: looks at one input. Ends the process when an answer is wrong.
extern "C" int LLVMFuzzerTestOneInput(const VELK::u8* data, std::size_t size);

#define FUZZ_CHECK(condition)                                                                   \
    do {                                                                                        \
        if (!(condition)) {                                                                     \
            std::fprintf(stderr, "%s:%d: does not hold: %s\n", __FILE__, __LINE__, #condition); \
            std::abort();                                                                       \
        }                                                                                       \
    } while (false)

namespace VELK::fuzz {

// The input from front to back; past its end everything is 0.
class Input {
public:
    Input(const u8* data, std::size_t size) : data_(data), left_(size) {}

    bool IsEmpty() const { return left_ == 0; }
    u8 U8() {
        if (left_ == 0) {
            return 0;
        }
        left_ -= 1;
        return *data_++;
    }
    u16 U16() {
        const u16 high = U8();
        return static_cast<u16>(high << 8 | U8());
    }
    test::Bytes Rest(std::size_t most) {
        const std::size_t size = left_ < most ? left_ : most;
        test::Bytes rest(data_, data_ + size);
        data_ += size;
        left_ -= size;
        return rest;
    }

private:
    const u8* data_;
    std::size_t left_;
};

// One run of a target under an engine that says nothing. Once everything of the run is gone: no
// leak, no bound broken, no service of the volume used against its contract.
template <typename Run>
void RunQuietly(const u8* data, std::size_t size, Run run) {
    {
        const test::Quiet quiet;
        Input input(data, size);
        run(&input);
    }
    FUZZ_CHECK(!::testing::Test::HasFailure());
}

}  // namespace VELK::fuzz
