// The sink that writes a journal, alone over a device: transactions of many pieces, each transfer
// failing in turn, journals it has to make first, bytes it must not touch.
#include "hfs/volume/journal_sink.h"

#include <gtest/gtest.h>

#include "hfs/volume/journal_replay.h"
#include "hfs/volume/wire.h"
#include "image_bytes.h"
#include "recording_device.h"
#include "small_volume.h"

namespace VELK {
namespace {

using test::Bytes;
using test::BytesOf;
using test::DeviceFaults;

// A stretch of the volume that changes.
struct Change {
    u64 offset;
    u64 bytes;
};

struct SinkCase {
    const char* name;
    u64 size;         // of the volume
    u64 journalSize;  // and of its journal
    std::vector<Change> changes;
    u32 sectorSize = kJournalSector;
    bool mustInit = false;
    bool needsInit = false;
};

// Prints the name alone where a test says its parameter.
void PrintTo(const SinkCase& sinkCase, std::ostream* out) {
    *out << sinkCase.name;
}

class Sink : public testing::TestWithParam<SinkCase> {
protected:
    void SetUp() override {
        const SinkCase& param = GetParam();
        FormatOptions format = test::SmallFormat(param.journalSize);
        format.blockSize = 4096;
        format.catalogNodeSize = 4096;
        device_ = test::FreshDevice(param.size, format);
        place_ = test::JournalOf(device_.get());
        place_.header.sectorSize = param.sectorSize;
        place_.header.start = param.sectorSize;
        place_.header.end = param.sectorSize;
        place_.needsInit = param.needsInit;
        if (param.mustInit || param.needsInit) {
            const Bytes noise(512, 0xA5);
            ASSERT_TRUE(device_->Write(place_.offset, noise.data(), noise.size()).Ok());
            u8 info[kJournalInfoSize];
            EncodeJournalInfo({kJournalInVolume | (param.needsInit ? kJournalNeedsInit : 0),
                               place_.offset, place_.size},
                              info);
            ASSERT_TRUE(device_->Write(place_.infoOffset, info, sizeof info).Ok());
        } else {
            test::StoreJournalHeader(device_.get(), place_);
        }
        start_ = BytesOf(device_.get());
        options_.volumeBytes = param.size;
        options_.mustInit = param.mustInit;
    }
    void Stage(OverlayDevice* staged) {
        u32 seed = 1;
        for (const Change& change : GetParam().changes) {
            const Bytes bytes = test::Pattern(static_cast<std::size_t>(change.bytes), seed++);
            ASSERT_TRUE(staged->Write(change.offset, bytes.data(), bytes.size()).Ok());
        }
    }
    // The volume with the changes in their places.
    Bytes Changed() {
        Bytes bytes = start_;
        u32 seed = 1;
        for (const Change& change : GetParam().changes) {
            const Bytes pattern = test::Pattern(static_cast<std::size_t>(change.bytes), seed++);
            std::copy(pattern.begin(), pattern.end(),
                      bytes.begin() + static_cast<std::ptrdiff_t>(change.offset));
        }
        return Rest(bytes);
    }
    // Without journal, info block and volume header, which are the sink's own.
    Bytes Rest(Bytes bytes) const {
        const auto at = [&](u64 offset) {
            return bytes.begin() + static_cast<std::ptrdiff_t>(offset);
        };
        std::fill(at(place_.offset), at(place_.offset + place_.size), u8{0});
        std::fill(at(place_.infoOffset), at(place_.infoOffset + kJournalInfoSize), u8{0});
        std::fill(at(kHeaderOffset), at(kHeaderOffset + kHeaderSize), u8{0});
        return bytes;
    }
    // What a mount would find: the volume after what waits in the journal was carried out.
    Bytes Found() {
        u8 bytes[kHeaderSize];
        EXPECT_TRUE(device_->Read(kHeaderOffset, bytes, sizeof bytes).Ok());
        VolumeHeader header;
        DecodeHeader(bytes, &header);
        JournalPlace place;
        const JournalState state = ReadJournalState(device_.get(), header, 0, &place);
        if (state.readable && !state.empty) {
            const ReplayResult result = ReplayJournal(device_.get(), place, device_.get());
            EXPECT_TRUE(result.isComplete) << result.text;
            EXPECT_EQ(1u, result.transactions);
        }
        return Rest(BytesOf(device_.get()));
    }
    void FailInTurn(u32 DeviceFaults::*which) {
        const Bytes after = Changed();
        const Bytes before = Rest(start_);
        for (u32 nth = 1;; ++nth) {
            ASSERT_TRUE(device_->Write(0, start_.data(), start_.size()).Ok());
            DeviceFaults faults;
            faults.*which = nth;
            test::FaultyDevice faulty(device_.get(), &faults);
            OverlayDevice staged(&faulty);
            Stage(&staged);
            JournalSink sink(place_, options_);
            u64 written = 0;
            IoResult result = sink.Carry(staged, &faulty, &written);
            if (faults.hasFailed) {
                ASSERT_EQ(5, result.error) << nth;
                const Bytes found = BytesOf(device_.get());
                EXPECT_EQ(kIoReadOnly, sink.Carry(staged, &faulty, &written).error) << nth;
                EXPECT_TRUE(sink.Finish(&faulty).Ok()) << nth;
                ASSERT_EQ(found, BytesOf(device_.get())) << nth;
                const Bytes stands = Found();
                ASSERT_TRUE(stands == before || stands == after) << nth;
                continue;
            }
            ASSERT_TRUE(result.Ok()) << nth;
            // No further transfer fails: the end does.
            result = sink.Finish(&faulty);
            ASSERT_EQ(after, Found()) << nth;
            if (result.Ok()) {
                ASSERT_FALSE(faults.hasFailed);
                EXPECT_GT(nth, 1u);
                return;
            }
            EXPECT_EQ(5, result.error);
            EXPECT_EQ(kIoReadOnly, sink.Carry(staged, &faulty, &written).error);
        }
    }

    std::unique_ptr<MemoryDevice> device_;
    JournalPlace place_;
    JournalSink::Options options_;
    Bytes start_;
};

TEST_P(Sink, CarriesItAll) {
    OverlayDevice staged(device_.get());
    Stage(&staged);
    JournalSink sink(place_, options_);
    u64 written = 0;
    ASSERT_TRUE(sink.Carry(staged, device_.get(), &written).Ok());
    EXPECT_GE(sink.Largest(), sink.Needed());
    const Bytes cut = BytesOf(device_.get());
    EXPECT_EQ(Changed(), Rest(cut));
    // The ring holds all of it: what is torn off its place comes back.
    Bytes torn = cut;
    for (const Change& change : GetParam().changes) {
        if (change.offset > kHeaderOffset) {
            std::fill_n(torn.begin() + static_cast<std::ptrdiff_t>(change.offset), change.bytes,
                        u8{0xEE});
        }
    }
    ASSERT_TRUE(device_->Write(0, torn.data(), torn.size()).Ok());
    EXPECT_EQ(Changed(), Found());
    ASSERT_TRUE(device_->Write(0, cut.data(), cut.size()).Ok());
    ASSERT_TRUE(sink.Finish(device_.get()).Ok());
    EXPECT_EQ(0u, test::JournalOf(device_.get()).header.Used());
}

TEST_P(Sink, EachWriteFailsInTurn) {
    FailInTurn(&DeviceFaults::failWrite);
}

TEST_P(Sink, EachSyncFailsInTurn) {
    FailInTurn(&DeviceFaults::failSync);
}

// Reads of the device below: of the journal header, the volume header, and of what lies around a
// change in a sector of the journal's size.
TEST_P(Sink, EachReadFailsInTurn) {
    FailInTurn(&DeviceFaults::failRead);
}

const SinkCase kSinkCases[] = {
    {"a few sectors", 1 << 20, 64 << 10, {{300 * 1024, 512}, {302 * 1024, 4096}}},
    {"a part of the boot blocks", 1 << 20, 64 << 10, {{0, 512}, {300 * 1024, 512}}},
    {"large sectors", 1 << 20, 64 << 10, {{300 * 1024, 512}, {320 * 1024, 1024}}, 4096},
    {"a journal of noise", 1 << 20, 64 << 10, {{300 * 1024, 512}}, 512, true},
    {"a journal that was announced", 1 << 20, 64 << 10, {{300 * 1024, 512}}, 512, false, true},
    // Beyond what is gathered for one write.
    {"megabytes", 8 << 20, 4 << 20, {{5 << 20, 2600000 / 512 * 512}}},
};

INSTANTIATE_TEST_SUITE_P(Cases, Sink, testing::ValuesIn(kSinkCases));

TEST(SinkBounds, TheJournalIsNoTargetAndHoldsNoMoreThanItCan) {
    auto device = test::FreshDevice(1 << 20, test::SmallFormat(64 << 10));
    const JournalPlace place = test::JournalOf(device.get());
    const Bytes before = BytesOf(device.get());
    JournalSink::Options options;
    options.volumeBytes = 1 << 20;
    JournalSink sink(place, options);
    u64 written = 0;
    OverlayDevice large(device.get());
    const Bytes bytes = test::Pattern(64 << 10, 2);
    ASSERT_TRUE(large.Write(512 << 10, bytes.data(), bytes.size()).Ok());
    EXPECT_EQ(kIoTooLarge, sink.Carry(large, device.get(), &written).error);
    EXPECT_EQ(before, BytesOf(device.get()));
    EXPECT_GT(sink.Needed(), sink.Largest());
    // Too much is no failure of the medium: less of it goes.
    OverlayDevice small(device.get());
    ASSERT_TRUE(small.Write(512 << 10, bytes.data(), 512).Ok());
    EXPECT_TRUE(sink.Carry(small, device.get(), &written).Ok());
    const Bytes after = BytesOf(device.get());
    OverlayDevice wild(device.get());
    ASSERT_TRUE(wild.Write(place.offset + 1024, bytes.data(), 512).Ok());
    const IoResult result = sink.Carry(wild, device.get(), &written);
    EXPECT_EQ(kIoReadOnly, result.error);
    EXPECT_EQ(place.offset + 1024, result.offset);
    EXPECT_EQ(after, BytesOf(device.get()));
    EXPECT_EQ(kIoReadOnly, sink.Carry(small, device.get(), &written).error);
}

}  // namespace
}  // namespace VELK
