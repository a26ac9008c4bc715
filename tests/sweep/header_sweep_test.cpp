// Every field of the volume header gets the values it should not have, in the first copy alone and
// in both; then the volume is mounted from memory, read with everything there is, and checked.
// TREEHFS_SWEEP=all goes through all values of 16-bit fields and all boundary values of the others;
// without it a sample of both is tried.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "check_support.h"
#include "fields.h"
#include "reading.h"

namespace VELK::test {

namespace {

constexpr u32 kHeaderAt = 1024;
constexpr u32 kSampleStep = 29;  // of the boundary values

bool SweepsAll() {
    const char* text = std::getenv("TREEHFS_SWEEP");
    return text != nullptr && std::string(text) == "all";
}

// The volume that is hurt, and how it fared so far.
class HeaderSweep {
public:
    HeaderSweep() : alternateAt_(static_cast<u32>(sound_.bytes.size()) - kHeaderAt) {}

    const Bytes& SoundImage() const { return sound_.bytes; }

    // Sets the field in the first header, or in both, and reads. The words of what went wrong.
    std::string Try(const Field& field, u64 value, bool inBoth) {
        Bytes image = sound_.bytes;
        SetField(image.data() + kHeaderAt, field, value);
        if (inBoth) {
            SetField(image.data() + alternateAt_, field, value);
        }
        const Reading reading = ReadEverything(image, sound_.volume);
        const Outcome outcome = CheckBytes(image);
        trials += 1;
        told += reading.text.empty() && outcome.findings.empty() ? 0u : 1u;
        return reading.fault;
    }

    u64 trials = 0;
    u64 told = 0;  // trials that were heard of

private:
    Specimen sound_;
    u32 alternateAt_;
};

std::vector<u64> ValuesOf(const Field& field, const Bytes& image) {
    const u64 old = GetField(image.data() + kHeaderAt, field);
    std::vector<u64> values = BoundaryValues(field, old, 512, image.size() / 512);
    if (SweepsAll() && field.width == 2) {
        values.clear();
        for (u32 value = 0; value <= 0xFFFF; ++value) {
            values.push_back(value);
        }
    }
    return values;
}

}  // namespace

// One field: a part of the sweep that can be run by itself.
class VolumeHeader : public ::testing::TestWithParam<std::size_t> {
protected:
    static void TearDownTestSuite() {
        std::printf("%llu trials of the volume header, %llu of them heard of\n",
                    static_cast<unsigned long long>(trials), static_cast<unsigned long long>(told));
        // Parts may be fields that nothing depends on; together they are not.
        const auto* suite = ::testing::UnitTest::GetInstance()->current_test_suite();
        if (suite->test_to_run_count() == suite->total_test_count()) {
            EXPECT_GT(told, trials / 4);
        }
    }

    inline static u64 trials = 0;
    inline static u64 told = 0;  // trials that were heard of
};

TEST_P(VolumeHeader, FieldMayHoldAnyValue) {
    HeaderSweep sweep;
    const Field& field = FieldsOfVolumeHeader()[GetParam()];
    const std::vector<u64> values = ValuesOf(field, sweep.SoundImage());
    const u32 step = SweepsAll() ? 1 : kSampleStep;
    for (std::size_t i = field.offset / 2 % step; i < values.size(); i += step) {
        for (const bool inBoth : {false, true}) {
            ASSERT_EQ("", sweep.Try(field, values[i], inBoth))
                << field.name << " at " << field.offset << " = " << values[i]
                << (inBoth ? " in both" : "");
        }
    }
    trials += sweep.trials;
    told += sweep.told;
}

INSTANTIATE_TEST_SUITE_P(Fields, VolumeHeader,
                         ::testing::Range(std::size_t{0}, FieldsOfVolumeHeader().size()));

}  // namespace VELK::test
