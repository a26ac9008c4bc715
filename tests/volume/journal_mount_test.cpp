// Mounting volumes whose journal cannot be written, is too much to carry out, or would make another
// volume of this one: refused or noted in words, and not a byte changes.
#include <gtest/gtest.h>

#include <cstring>
#include <functional>

#include "capture.h"
#include "hfs/volume/make_journal.h"
#include "hfs/volume/wire.h"
#include "image_bytes.h"
#include "small_volume.h"

namespace VELK {
namespace {

using test::Bytes;
using test::BytesOf;
using test::DeviceWith;
using test::InsertNumber;
using test::JournalOf;
using test::MountOn;
using test::SmallFormat;
using test::Writing;

constexpr u64 kSize = 512 << 10;

class JournalMount : public testing::Test {
protected:
    void SetUp() override { device_ = test::FreshDevice(kSize, SmallFormat(32 << 10)); }
    std::unique_ptr<ImageVolume> Mount(const OpenOptions& options) {
        return MountOn(device_.get(), options, &problem_);
    }
    std::string Refusal(const OpenOptions& options) {
        const Bytes before = BytesOf(device_.get());
        EXPECT_EQ(nullptr, Mount(options));
        EXPECT_EQ(before, BytesOf(device_.get()));
        return problem_.Text();
    }
    // One commit that waits in the journal, none of it in its place; the volume header neither.
    Bytes Waiting() {
        const Bytes before = BytesOf(device_.get());
        auto volume = Mount(Writing());
        EXPECT_EQ(0, InsertNumber(volume.get(), 100));
        EXPECT_EQ(0, volume->Commit(0));
        Bytes cut = BytesOf(device_.get());
        volume.reset();
        place_ = JournalOf(DeviceWith(cut).get());
        Bytes bytes = before;
        StoreBe32(bytes.data() + kHeaderOffset + 8, kKeeperCode);
        StoreBe32(bytes.data() + kHeaderOffset + 4, kVolJournaled);
        std::copy_n(cut.begin() + static_cast<std::ptrdiff_t>(place_.offset), place_.size,
                    bytes.begin() + static_cast<std::ptrdiff_t>(place_.offset));
        return bytes;
    }
    // The copy of the volume header in the transaction that waits.
    u8* WaitingHeader(Bytes* bytes) const {
        u8* ring = bytes->data() + place_.offset;
        const u8* list = ring + place_.header.start;
        u64 data = place_.header.start + place_.header.listSize;
        for (u32 i = 1; i < Be16(list + 2); ++i) {
            const u64 target = Be64(list + 16 + 16 * i) * 512;
            const u32 size = Be32(list + 24 + 16 * i);
            if (target <= kHeaderOffset && kHeaderOffset < target + size) {
                return ring + data + (kHeaderOffset - target);
            }
            data += size;
        }
        return nullptr;
    }

    test::Capture capture_;
    Problem problem_;
    std::unique_ptr<MemoryDevice> device_;
    JournalPlace place_;
};

constexpr char kOtherShape[] = "the journal would change the shape of the volume: run check";

// Everything a replay cut off half-way needs to be begun again.
TEST_F(JournalMount, NoTransactionMakesAnotherVolume) {
    const Bytes waiting = Waiting();
    struct {
        const char* what;
        std::function<void(u8*)> change;
        std::string text;
    } const changes[] = {
        {"signature", [](u8* header) { StoreBe32(header, 0x48580005); }, kOtherShape},
        {"another one", [](u8* header) { StoreBe32(header, 0); },
         "volume header at 1024: signature 0000 is neither 482B nor 4858: try --backup-header"},
        {"blocks", [](u8* header) { StoreBe32(header + 44, 1000); }, kOtherShape},
        {"block size", [](u8* header) { StoreBe32(header + 40, 1024); }, kOtherShape},
        {"info block", [](u8* header) { StoreBe32(header + 12, 900); }, kOtherShape},
        {"no journal", [](u8* header) { StoreBe32(header + 4, 0x100); }, kOtherShape},
        {"last writer", [](u8* header) { StoreBe32(header + 8, 0x31302E30); }, kOtherShape},
    };
    for (const auto& change : changes) {
        Bytes bad = waiting;
        // A second info block for the volume header to name.
        std::copy_n(bad.begin() + static_cast<std::ptrdiff_t>(place_.infoOffset), 512,
                    bad.begin() + 900 * 512);
        u8* header = WaitingHeader(&bad);
        ASSERT_NE(nullptr, header);
        change.change(header);
        device_ = DeviceWith(bad);
        EXPECT_EQ(change.text, Refusal(Writing())) << change.what;
        OpenOptions reading;
        reading.replay = true;
        EXPECT_EQ(change.text, Refusal(reading)) << change.what;
    }
    device_ = DeviceWith(waiting);
    auto volume = Mount(Writing());
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ(1u, volume->Journal().replayed);
}

// A transaction that moves or hides the journal it comes from.
TEST_F(JournalMount, TheInfoBlockIsNoTargetForOtherNumbers) {
    const Bytes waiting = Waiting();
    struct {
        u32 at;
        u64 value;
    } const fields[] = {{36, 128 << 10}, {44, 16 << 10}, {0, u64{kJournalElsewhere} << 32}};
    for (const auto& field : fields) {
        Bytes bad = waiting;
        u8* ring = bad.data() + place_.offset;
        u8* list = ring + place_.header.start;
        ASSERT_GE(Be16(list + 2), 2u);
        u8* data = ring + place_.header.start + place_.header.listSize;
        StoreBe64(list + 32, place_.infoOffset / 512);
        std::copy_n(waiting.begin() + static_cast<std::ptrdiff_t>(place_.infoOffset), 512, data);
        StoreBe64(data + field.at, field.value);
        // A journal header stands wherever the info block says.
        std::copy_n(waiting.begin() + static_cast<std::ptrdiff_t>(place_.offset), 512,
                    bad.begin() + (128 << 10));
        device_ = DeviceWith(bad);
        EXPECT_EQ(kOtherShape, Refusal(Writing())) << field.at;
    }
}

// Lists that others may write: blocks whose data counts for nothing, blocks without data.
TEST_F(JournalMount, BlocksThatCountForNothing) {
    Bytes waiting = Waiting();
    u8* list = waiting.data() + place_.offset + place_.header.start;
    ASSERT_GE(Be16(list + 2), 3u);
    StoreBe64(list + 32, JournalBlock::kSkip);
    const u32 count = Be16(list + 2);
    StoreBe16(list + 2, count + 1);
    StoreBe64(list + 16 + 16 * count, 900);
    StoreBe32(list + 24 + 16 * count, 0);
    StoreBe32(list + 8, JournalChecksum(list, 32, 8));
    device_ = DeviceWith(waiting);
    OpenOptions reading;
    reading.replay = true;
    auto volume = Mount(reading);
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ(1u, volume->Journal().replayed);
    u8 sector[512];
    ASSERT_EQ(0, volume->ReadVolume(900 * 512, sector, sizeof sector));
    EXPECT_EQ(0, std::memcmp(sector, waiting.data() + 900 * 512, 512));
}

TEST_F(JournalMount, LessThanAListIsNoTransaction) {
    const Bytes waiting = Waiting();
    device_ = DeviceWith(waiting);
    JournalPlace place = place_;
    place.header.end = place.header.Advance(place.header.start, 512);
    test::StoreJournalHeader(device_.get(), place);
    const std::string at = Position(place.offset + place.header.start);
    EXPECT_EQ("the journal is damaged at " + at +
                  ": block list reaches past the end of the journal: run check, then --force",
              Refusal(Writing()));
}

TEST_F(JournalMount, TooMuchToHoldInMemoryIsNotCarriedOut) {
    FormatOptions format = SmallFormat(kSmallestNewJournal);
    format.blockSize = 65536;
    device_ = test::FreshDevice(u64{1200} << 20, format);
    // Moved to where a large one has room.
    JournalPlace place = JournalOf(device_.get());
    place.offset = u64{100} << 20;
    place.size = u64{1050} << 20;
    place.header.size = place.size;
    place.header.end = (u64{1} << 30) + 1024;
    u8 info[kJournalInfoSize];
    EncodeJournalInfo({kJournalInVolume, place.offset, place.size}, info);
    ASSERT_TRUE(device_->Write(place.infoOffset, info, sizeof info).Ok());
    test::StoreJournalHeader(device_.get(), place);
    OpenOptions reading;
    reading.replay = true;
    auto volume = Mount(reading);
    ASSERT_NE(nullptr, volume) << problem_.Text();
    ASSERT_EQ(1u, volume->Notes().size());
    EXPECT_EQ(
        "the journal holds transactions (1,073,742,336 B): not carried out: too much to hold in "
        "memory",
        volume->Notes()[0].Text());
}

TEST_F(JournalMount, LockedAndCutShortVolumesAreNotReplayedInto) {
    Bytes waiting = Waiting();
    Bytes locked = waiting;
    StoreBe32(locked.data() + kHeaderOffset + 4, kVolJournaled | kVolSoftwareLock);
    device_ = DeviceWith(locked);
    EXPECT_EQ("the volume is locked against writing (attribute bit 15): it can only be read",
              Refusal(Writing(true)));
    StoreBe32(waiting.data() + kHeaderOffset + 44, 2048);
    device_ = DeviceWith(waiting);
    EXPECT_NE("", Refusal(Writing()));
}

// --- journals that cannot be written -------------------------------------------------------------

TEST_F(JournalMount, AVolumeBesideTheSectorsOfItsImage) {
    const Bytes volumeBytes = BytesOf(device_.get());
    Bytes image(100);
    test::AppendBytes(&image, volumeBytes);
    device_ = DeviceWith(image);
    OpenOptions options = Writing();
    options.offset = 100;
    EXPECT_EQ("the volume does not begin and end with a sector: its journal cannot be written",
              Refusal(options));
    // One that ends between sectors, with its last block.
    image = volumeBytes;
    image.resize(image.size() + 100);
    device_ = DeviceWith(image);
    EXPECT_EQ("the volume does not begin and end with a sector: its journal cannot be written",
              Refusal(Writing()));
    EXPECT_NE(nullptr, Mount(OpenOptions{})) << problem_.Text();
}

TEST_F(JournalMount, AJournalBesideItsOwnSectors) {
    JournalPlace place = JournalOf(device_.get());
    ASSERT_NE(0u, place.offset % 4096);
    place.header.sectorSize = 4096;
    place.header.start = 4096;
    place.header.end = 4096;
    test::StoreJournalHeader(device_.get(), place);
    EXPECT_EQ("the journal does not begin and end with one of its sectors: it cannot be written",
              Refusal(Writing()));
}

// What is no journal any more is made anew when the user insists, with lists that fit a small one.
TEST_F(JournalMount, AJournalOfNoiseIsMadeAnewWithForce) {
    for (const u64 size : {u64{32} << 10, u64{128} << 10}) {
        device_ = test::FreshDevice(kSize, SmallFormat(size));
        const JournalPlace place = JournalOf(device_.get());
        const Bytes noise(512, 0xA5);
        ASSERT_TRUE(device_->Write(place.offset, noise.data(), noise.size()).Ok());
        EXPECT_EQ("journal header at " + Position(place.offset) +
                      " has no signature: let the native system repair it, or --force",
                  Refusal(Writing()));
        auto volume = Mount(Writing(true));
        ASSERT_NE(nullptr, volume) << problem_.Text();
        ASSERT_EQ(0, InsertNumber(volume.get(), 100));
        ASSERT_EQ(0, volume->Commit(0));
        volume.reset();
        const JournalPlace made = JournalOf(device_.get());
        EXPECT_EQ(size < (64 << 10) ? 512u : 4096u, made.header.listSize);
        volume = Mount(Writing());
        ASSERT_NE(nullptr, volume) << problem_.Text();
        EXPECT_TRUE(test::HasNumber(volume.get(), 100));
    }
}

}  // namespace
}  // namespace VELK
