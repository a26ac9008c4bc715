// The power goes away while a volume is made on a device that held another one: what mounts for
// writing afterwards is the old volume or the new one, each whole, or nothing.
#include <gtest/gtest.h>

#include "capture.h"
#include "power_cut.h"
#include "small_volume.h"

namespace VELK {
namespace {

using test::Cut;
using test::DeviceEvent;
using test::Epoch;

constexpr u64 kSize = 128 << 10;

class FormatCut : public testing::TestWithParam<u64> {
protected:
    void SetUp() override {
        old_ = test::FreshDevice(kSize, test::SmallFormat(0));
        Problem problem;
        auto volume = test::MountOn(old_.get(), test::Writing(), &problem);
        for (u32 i = 0; i < 30; ++i) {
            ASSERT_EQ(0, test::InsertNumber(volume.get(), 100 + i));
        }
        ASSERT_EQ(0, volume->Commit(0));
        ASSERT_EQ(0, volume->Close());
    }

    test::Capture capture_;
    std::unique_ptr<MemoryDevice> old_;
};

TEST_P(FormatCut, LeavesTheOldVolumeOrTheNewOneOrNone) {
    const std::vector<u8> before = test::BytesOf(old_.get());
    auto device = test::DeviceWith(before);
    std::vector<DeviceEvent> log;
    FormatOptions options = test::SmallFormat(GetParam());
    Problem problem;
    ASSERT_NE(nullptr, MakeVolume(std::make_unique<test::RecordingDevice>(device.get(), &log),
                                  options, &problem))
        << problem.Text();
    const std::vector<u8> after = test::BytesOf(device.get());
    u32 states = 0;
    u32 refused = 0;
    std::mt19937_64 random(11);
    for (const Epoch& epoch : test::EpochsOf(log)) {
        test::ForEachCut(log, epoch, {8, 100, 4}, &random, [&](const Cut& cut) {
            OverlayDevice state(old_.get());
            test::ApplyCut(cut, &state);
            OpenOptions writing = test::Writing();
            writing.offset.reset();
            const std::vector<u8> bytes = test::BytesOf(&state);
            states += 1;
            if (test::MountOn(&state, writing, &problem) == nullptr) {
                refused += 1;
                return;
            }
            ASSERT_TRUE(bytes == before || bytes == after)
                << "events " << epoch.first << " to " << epoch.end;
        });
        ASSERT_FALSE(HasFailure());
        test::ApplyEpoch(log, epoch, old_.get());
    }
    EXPECT_EQ(after, test::BytesOf(old_.get()));
    EXPECT_GT(states, 100u);
    EXPECT_GT(refused, 50u);
}

INSTANTIATE_TEST_SUITE_P(Journals, FormatCut, testing::Values(u64{0}, u64{32} << 10));

}  // namespace
}  // namespace VELK
