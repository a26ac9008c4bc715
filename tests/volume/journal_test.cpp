// The journal: made, written, wrapped around, carried out in both byte orders, refused when it is
// not sound.
#include <gtest/gtest.h>

#include <cstring>

#include "capture.h"
#include "hfs/volume/journal_replay.h"
#include "hfs/volume/make_journal.h"
#include "hfs/volume/wire.h"
#include "recording_device.h"
#include "small_volume.h"

namespace VELK {
namespace {

using test::BytesOf;
using test::DeviceWith;
using test::Essence;
using test::FreshDevice;
using test::InsertNumber;
using test::JournalOf;
using test::MountOn;
using test::SmallFormat;
using test::Writing;

constexpr u64 kSize = 512 << 10;
constexpr u64 kJournal = 32 << 10;

class JournalTest : public testing::Test {
protected:
    void SetUp() override { device_ = FreshDevice(kSize, SmallFormat(kJournal)); }
    std::unique_ptr<ImageVolume> Mount(const OpenOptions& options) {
        return MountOn(device_.get(), options, &problem_);
    }
    // Commits `count` records, one by one, and leaves the device as a cut behind the last one: the
    // blocks of the last commit are torn off their places again.
    void CutBehind(u32 count) {
        auto volume = Mount(Writing());
        ASSERT_NE(nullptr, volume) << problem_.Text();
        std::vector<u8> before;
        for (u32 i = 0; i < count; ++i) {
            before = BytesOf(device_.get());
            ASSERT_EQ(0, InsertNumber(volume.get(), 100 + i));
            ASSERT_EQ(0, volume->Commit(0));
        }
        std::vector<u8> cut = BytesOf(device_.get());
        place_ = JournalOf(device_.get());
        expected_ = Essence(cut, place_);
        volume.reset();
        // The first commit of a mount finds the volume header already marked as in use.
        StoreBe32(before.data() + kHeaderOffset + 8, kKeeperCode);
        const auto at = static_cast<std::ptrdiff_t>(place_.offset);
        const auto end = at + static_cast<std::ptrdiff_t>(place_.size);
        std::copy(cut.begin() + at, cut.begin() + end, before.begin() + at);
        device_ = DeviceWith(before);
        ASSERT_NE(expected_, Essence(before, place_));
    }

    test::Capture capture_;
    Problem problem_;
    std::unique_ptr<MemoryDevice> device_;
    JournalPlace place_;
    std::vector<u8> expected_;
};

TEST_F(JournalTest, HeaderBytesInBothOrders) {
    const u8 little[kJournalHeaderSize] = {
        0x78, 0x4C, 0x4E, 0x4A, 0x78, 0x56, 0x34, 0x12, 0x00, 0x0A, 0x01, 0x00, 0x00, 0x00, 0x00,
        0x00, 0x00, 0x22, 0x02, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x08, 0x00, 0x00, 0x00,
        0x00, 0x00, 0x00, 0x20, 0x00, 0x00, 0x36, 0x90, 0xCE, 0x08, 0x00, 0x02, 0x00, 0x00};
    JournalHeader header;
    ASSERT_EQ("", DecodeJournalHeader(little, 524288, &header));
    EXPECT_TRUE(header.isLittle);
    EXPECT_EQ(68096u, header.start);
    EXPECT_EQ(139776u, header.end);
    EXPECT_EQ(8192u, header.listSize);
    EXPECT_EQ(139776u - 68096, header.Used());
    u8 bytes[kJournalHeaderSize];
    EncodeJournalHeader(header, bytes);
    EXPECT_EQ(0, std::memcmp(little, bytes, sizeof bytes));
    header.isLittle = false;
    EncodeJournalHeader(header, bytes);
    EXPECT_EQ(0x87A62936u, Be32(bytes + 36));
    JournalHeader again;
    ASSERT_EQ("", DecodeJournalHeader(bytes, 524288, &again));
    EXPECT_FALSE(again.isLittle);
    EXPECT_EQ(header.end, again.end);
}

TEST_F(JournalTest, ANewVolumeWithAJournalIsSound) {
    EXPECT_EQ("", test::CheckAll(device_.get()));
    auto volume = Mount(OpenOptions{});
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_TRUE(volume->Journal().present && volume->Journal().readable);
    EXPECT_TRUE(volume->Journal().empty && volume->Journal().isConsistent);
    EXPECT_EQ(kJournal, volume->Journal().size);
    EXPECT_EQ(2u, volume->Header().fileCount);
    EXPECT_EQ(18u, volume->Header().nextCatalogId);
    EXPECT_NE(0u, volume->Header().attributes & kVolUnmounted);
}

TEST_F(JournalTest, AJournalNeedsItsSizeAndRoom) {
    for (const u64 size : {u64{1}, kSmallestNewJournal - 1, u64{2} << 30}) {
        EXPECT_EQ(nullptr, MakeMemoryVolume(kSize, SmallFormat(size), &problem_)) << size;
        EXPECT_EQ(ExitClass::kUsage, problem_.exitClass);
    }
    EXPECT_EQ(nullptr, MakeMemoryVolume(kSize, SmallFormat(kSize), &problem_));
}

TEST_F(JournalTest, ACommitCostsTwoSyncsAndAnOrderlyEndLeavesNothingBehind) {
    std::vector<test::DeviceEvent> log;
    test::RecordingDevice recorder(device_.get(), &log);
    auto volume = MountOn(&recorder, Writing(), &problem_);
    ASSERT_NE(nullptr, volume) << problem_.Text();
    for (u32 i = 0; i < 50; ++i) {
        log.clear();
        ASSERT_EQ(0, InsertNumber(volume.get(), 100 + i));
        EXPECT_TRUE(log.empty());
        ASSERT_EQ(0, volume->Commit(0));
        std::size_t syncs = 0;
        for (const test::DeviceEvent& event : log) {
            syncs += event.isSync ? 1 : 0;
        }
        // Two more when the ring has to be emptied first.
        EXPECT_TRUE(syncs == 2 || syncs == 4) << i;
        EXPECT_FALSE(log.back().isSync);
        EXPECT_NE(0u, JournalOf(device_.get()).header.Used());
    }
    EXPECT_EQ(0, volume->Close());
    EXPECT_EQ(kErrVolumeReadOnly, volume->Commit(0));
    volume.reset();
    EXPECT_EQ(0u, JournalOf(device_.get()).header.Used());
    volume = Mount(Writing());
    ASSERT_NE(nullptr, volume);
    EXPECT_EQ(0u, volume->Journal().replayed);
    EXPECT_TRUE(volume->Notes().empty());
    volume.reset();
    EXPECT_EQ("", test::CheckAll(device_.get()));
}

TEST_F(JournalTest, WhatWaitsIsCarriedOutOnTheMedium) {
    CutBehind(3);
    auto volume = Mount(Writing());
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ(1u, volume->Journal().replayed);
    EXPECT_TRUE(volume->Journal().empty);
    EXPECT_TRUE(test::HasNumber(volume.get(), 102));
    EXPECT_EQ(expected_, Essence(BytesOf(device_.get()), place_));
    ASSERT_EQ(0, InsertNumber(volume.get(), 500));
    ASSERT_EQ(0, volume->Commit(0));
    volume.reset();
    EXPECT_EQ("", test::CheckAll(device_.get()));
}

TEST_F(JournalTest, WhatWaitsIsCarriedOutInMemoryForReaders) {
    CutBehind(3);
    const std::vector<u8> cut = BytesOf(device_.get());
    for (const Access access : {Access::kReadOnly, Access::kOverlay}) {
        OpenOptions options;
        options.access = access;
        options.replay = true;
        auto volume = Mount(options);
        ASSERT_NE(nullptr, volume) << problem_.Text();
        EXPECT_EQ(1u, volume->Journal().replayed);
        EXPECT_TRUE(test::HasNumber(volume.get(), 102));
        std::vector<u8> seen(kSize);
        ASSERT_EQ(0, volume->ReadVolume(0, seen.data(), seen.size()));
        EXPECT_EQ(expected_, Essence(seen, place_));
        EXPECT_EQ(access == Access::kOverlay, volume->IsWritable());
        volume.reset();
        EXPECT_EQ(cut, BytesOf(device_.get()));
    }
    auto volume = Mount(OpenOptions{});
    ASSERT_NE(nullptr, volume);
    EXPECT_EQ(0u, volume->Journal().replayed);
    EXPECT_FALSE(volume->Journal().empty);
    EXPECT_EQ(1u, volume->Notes().size());
    EXPECT_FALSE(test::HasNumber(volume.get(), 102));
}

TEST_F(JournalTest, BothByteOrdersAndEveryPlaceInTheRing) {
    for (const bool isLittle : {false, true}) {
        for (u64 at = 512; at < kJournal; at += 1536) {
            SetUp();
            test::MoveJournal(device_.get(), at, isLittle);
            CutBehind(2);
            EXPECT_EQ(isLittle, place_.header.isLittle);
            auto volume = Mount(Writing());
            ASSERT_NE(nullptr, volume) << problem_.Text();
            ASSERT_EQ(1u, volume->Journal().replayed);
            ASSERT_EQ(expected_, Essence(BytesOf(device_.get()), place_)) << at;
        }
    }
}

// Journals as others make them: larger sectors, list headers that hold few blocks.
TEST_F(JournalTest, OtherSectorAndListSizes) {
    for (const u32 sectorSize : {512u, 2048u, 4096u}) {
        for (const u32 listSize : {512u, 1024u, 8192u}) {
            FormatOptions format = SmallFormat(2 * kJournal);
            format.blockSize = 4096;
            device_ = FreshDevice(kSize, format);
            JournalPlace place = JournalOf(device_.get());
            place.header.sectorSize = sectorSize;
            place.header.listSize = listSize;
            place.header.start = 2 * kJournal - 1024;
            place.header.end = 2 * kJournal - 1024;
            test::StoreJournalHeader(device_.get(), place);
            CutBehind(40);
            ASSERT_EQ(sectorSize, place_.header.sectorSize);
            ASSERT_EQ(listSize, place_.header.listSize);
            auto volume = Mount(Writing());
            ASSERT_NE(nullptr, volume) << problem_.Text();
            ASSERT_EQ(1u, volume->Journal().replayed);
            ASSERT_EQ(expected_, Essence(BytesOf(device_.get()), place_));
        }
    }
}

// Targets count from the volume's start, wherever in the image that lies.
TEST_F(JournalTest, AVolumeInsideAnImage) {
    const std::vector<u8> volumeBytes = BytesOf(device_.get());
    for (const std::size_t offset : {std::size_t{1536}, std::size_t{65536}}) {
        std::vector<u8> image(offset, 0x5A);
        image.insert(image.end(), volumeBytes.begin(), volumeBytes.end());
        image.resize(image.size() + 4096, 0x5A);
        auto disk = DeviceWith(image);
        SliceDevice inner(disk.get(), offset, kSize);
        JournalPlace place = JournalOf(&inner);
        place.header.start = kJournal - 2048;
        place.header.end = kJournal - 2048;
        test::StoreJournalHeader(&inner, place);
        OpenOptions options = Writing();
        options.offset = offset;
        auto volume = MountOn(disk.get(), options, &problem_);
        ASSERT_NE(nullptr, volume) << problem_.Text();
        ASSERT_EQ(0, InsertNumber(volume.get(), 100));
        ASSERT_EQ(0, volume->Commit(0));
        const std::vector<u8> before = BytesOf(disk.get());
        ASSERT_EQ(0, InsertNumber(volume.get(), 101));
        ASSERT_EQ(0, volume->Commit(0));
        const std::vector<u8> after = BytesOf(disk.get());
        volume.reset();
        std::vector<u8> cut = before;
        const auto at = static_cast<std::ptrdiff_t>(offset + place.offset);
        std::copy_n(after.begin() + at, place.size, cut.begin() + at);
        disk = DeviceWith(cut);
        volume = MountOn(disk.get(), options, &problem_);
        ASSERT_NE(nullptr, volume) << problem_.Text();
        EXPECT_EQ(1u, volume->Journal().replayed);
        EXPECT_TRUE(test::HasNumber(volume.get(), 101));
        volume.reset();
        std::vector<u8> found = BytesOf(disk.get());
        EXPECT_EQ(0x5A, found[offset - 1]);
        EXPECT_EQ(0x5A, found.back());
        EXPECT_TRUE(std::equal(found.begin(), found.begin() + static_cast<std::ptrdiff_t>(offset),
                               image.begin()));
        SliceDevice mounted(disk.get(), offset, kSize);
        const std::vector<u8> expected(after.begin() + static_cast<std::ptrdiff_t>(offset),
                                       after.end() - 4096);
        EXPECT_EQ(Essence(expected, place), Essence(BytesOf(&mounted), place));
    }
}

// More blocks than one list takes: two lists make one transaction, carried out as one.
TEST_F(JournalTest, ATransactionOfSeveralLists) {
    JournalPlace place = JournalOf(device_.get());
    place.header.listSize = 512;
    test::StoreJournalHeader(device_.get(), place);
    auto volume = Mount(Writing());
    ASSERT_NE(nullptr, volume);
    for (u32 i = 0; i < 260; ++i) {
        ASSERT_EQ(0, InsertNumber(volume.get(), 1000 + 10 * i));
        if (volume->IsCommitDue()) {
            ASSERT_EQ(0, volume->Commit(0));
        }
    }
    ASSERT_EQ(0, volume->Commit(0));
    const std::vector<u8> before = BytesOf(device_.get());
    for (u32 i = 0; i < 260; i += 8) {  // a node here, a node there
        ASSERT_EQ(0, test::UpdateNumber(volume.get(), 1000 + 10 * i, 0x77));
    }
    ASSERT_EQ(0, volume->Commit(0));
    const std::vector<u8> after = BytesOf(device_.get());
    volume.reset();
    place = JournalOf(device_.get());
    std::vector<u8> cut = before;
    const auto at = static_cast<std::ptrdiff_t>(place.offset);
    std::copy_n(after.begin() + at, place.size, cut.begin() + at);
    device_ = DeviceWith(cut);
    place = JournalOf(device_.get());
    JournalList list;
    ASSERT_EQ("", DecodeJournalList(cut.data() + place.offset + place.header.start, place.header,
                                    place.header.Used(), &list));
    ASSERT_FALSE(list.isLast);
    volume = Mount(Writing());
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ(1u, volume->Journal().replayed);
    EXPECT_EQ(Essence(after, place), Essence(BytesOf(device_.get()), place));
    // Without its second list the transaction does not count at all.
    volume.reset();
    place.header.end = place.header.Advance(place.header.start, list.bytesUsed);
    device_ = DeviceWith(cut);
    test::StoreJournalHeader(device_.get(), place);
    EXPECT_EQ(nullptr, Mount(Writing()));
    OpenOptions reading;
    reading.replay = true;
    volume = Mount(reading);
    ASSERT_NE(nullptr, volume);
    std::vector<u8> seen(kSize);
    ASSERT_EQ(0, volume->ReadVolume(0, seen.data(), seen.size()));
    EXPECT_EQ(Essence(before, place), Essence(seen, place));
}

TEST_F(JournalTest, ATransactionTooLargeIsRefusedBeforeAnythingIsWritten) {
    auto volume = Mount(Writing());
    ASSERT_NE(nullptr, volume);
    const std::vector<u8> before = BytesOf(device_.get());
    EXPECT_FALSE(volume->IsCommitDue());
    u32 due = 0;
    for (u32 i = 0; i < 600; ++i) {
        ASSERT_EQ(0, InsertNumber(volume.get(), 1000 + i));
        due = due == 0 && volume->IsCommitDue() ? i : due;
    }
    EXPECT_GT(due, 50u);
    EXPECT_LT(due, 300u);
    EXPECT_EQ(kErrVolumeJournal, volume->Commit(0));
    EXPECT_NE(std::string::npos, volume->LastIoProblem().Text().find("commit more often"));
    EXPECT_EQ(before, BytesOf(device_.get()));
    ASSERT_TRUE(volume->IsWritable());
    for (u32 i = 0; i < 600; ++i) {
        ASSERT_EQ(0, InsertNumber(volume.get(), 1000 + i));
        if (volume->IsCommitDue()) {
            ASSERT_EQ(0, volume->Commit(0)) << i;
        }
    }
    ASSERT_EQ(0, volume->Commit(0));
    volume.reset();
    EXPECT_EQ("", test::CheckAll(device_.get()));
}

TEST_F(JournalTest, AWriterWhoDoesNotKeepTheJournalMakesItVoid) {
    CutBehind(3);
    std::vector<u8> bytes = BytesOf(device_.get());
    StoreBe32(bytes.data() + kHeaderOffset + 8, 0x31302E30);
    device_ = DeviceWith(bytes);
    EXPECT_EQ(nullptr, Mount(Writing()));
    EXPECT_EQ(0u, problem_.what.find("the journal holds transactions"));
    EXPECT_EQ(bytes, BytesOf(device_.get()));
    auto volume = Mount(Writing(true));
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ(bytes, BytesOf(device_.get()));
    EXPECT_FALSE(test::HasNumber(volume.get(), 102));
    ASSERT_EQ(0, InsertNumber(volume.get(), 300));
    ASSERT_EQ(0, volume->Commit(0));
    volume.reset();
    volume = Mount(Writing());
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ(0u, volume->Journal().replayed);
    EXPECT_TRUE(test::HasNumber(volume.get(), 300));
    EXPECT_FALSE(test::HasNumber(volume.get(), 102));
}

TEST_F(JournalTest, AnAnnouncedJournalIsMadeWithTheFirstCommit) {
    const JournalPlace place = JournalOf(device_.get());
    std::vector<u8> bytes = BytesOf(device_.get());
    bytes[static_cast<std::size_t>(place.infoOffset) + 3] = kJournalInVolume | kJournalNeedsInit;
    std::memset(bytes.data() + place.offset, 0xA5, 512);
    device_ = DeviceWith(bytes);
    auto volume = Mount(Writing());
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ(bytes, BytesOf(device_.get()));
    ASSERT_EQ(0, InsertNumber(volume.get(), 300));
    ASSERT_EQ(0, volume->Commit(0));
    const std::vector<u8> cut = BytesOf(device_.get());
    EXPECT_EQ(kJournalInVolume, Be32(cut.data() + place.infoOffset));
    volume.reset();
    device_ = DeviceWith(cut);
    volume = Mount(Writing());
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ(1u, volume->Journal().replayed);
}

// --- journals that are not sound -----------------------------------------------------------------

// Every word of the header set to every unpleasant value, with a checksum that fits.
TEST_F(JournalTest, HeaderFieldsAreBounded) {
    CutBehind(2);
    const std::vector<u8> bytes = BytesOf(device_.get());
    const u64 values[] = {
        0,          1,          511,     512,      513, kJournal - 512, kJournal, kJournal + 512,
        0x7FFFFFFF, 0xFFFFFFFF, ~u64{0}, ~u64{511}};
    u32 refused = 0;
    for (const u32 field : {8u, 16u, 24u, 32u, 40u}) {
        for (const u64 value : values) {
            std::vector<u8> bad = bytes;
            u8* header = bad.data() + place_.offset;
            if (field < 32) {
                StoreBe64(header + field, value);
            } else {
                StoreBe32(header + field, static_cast<u32>(value));
            }
            StoreBe32(header + 36, JournalChecksum(header, kJournalHeaderSize, 36));
            device_ = DeviceWith(bad);
            auto volume = Mount(Writing());
            if (!volume) {
                refused += 1;
                EXPECT_EQ(bad, BytesOf(device_.get())) << field << " " << value;
                OpenOptions reading;
                reading.replay = true;
                EXPECT_NE(nullptr, Mount(reading)) << problem_.Text();
            }
        }
    }
    EXPECT_GT(refused, 45u);
}

// The same with every word of the first block list. Where it is not sound, or would make something
// else of the volume, nothing of it is carried out.
TEST_F(JournalTest, ListFieldsAreBounded) {
    CutBehind(2);
    const std::vector<u8> bytes = BytesOf(device_.get());
    const u32 values[] = {0, 1, 2, 511, 1024, 0x7FFF, 0xFFFF, 0x10000, 0x7FFFFFFF, 0xFFFFFFFF};
    u32 refused = 0;
    for (u32 field = 0; field < 64; field += 4) {
        for (const u32 value : values) {
            std::vector<u8> bad = bytes;
            u8* list = bad.data() + place_.offset + place_.header.start;
            StoreBe32(list + field, value);
            if (field != 8) {
                StoreBe32(list + 8, JournalChecksum(list, 32, 8));
            }
            device_ = DeviceWith(bad);
            auto volume = Mount(Writing());
            if (!volume) {
                refused += 1;
                EXPECT_EQ(bad, BytesOf(device_.get())) << field << " " << value;
            }
        }
    }
    EXPECT_GT(refused, 80u);
}

TEST_F(JournalTest, TargetsStayInTheVolumeAndOutOfTheJournal) {
    CutBehind(2);
    const std::vector<u8> bytes = BytesOf(device_.get());
    const u64 sectors[] = {place_.offset / 512, (place_.offset + place_.size) / 512 - 1,
                           kSize / 512,         ~u64{0} - 1,
                           ~u64{0} / 512,       u64{1} << 55};
    for (const u64 sector : sectors) {
        std::vector<u8> bad = bytes;
        StoreBe64(bad.data() + place_.offset + place_.header.start + 32, sector);
        device_ = DeviceWith(bad);
        EXPECT_EQ(nullptr, Mount(Writing())) << sector;
        EXPECT_NE(std::string::npos, problem_.what.find("outside the volume")) << problem_.Text();
        EXPECT_EQ(bad, BytesOf(device_.get()));
        auto volume = Mount(Writing(true));
        ASSERT_NE(nullptr, volume);
        EXPECT_EQ(0u, volume->Journal().replayed);
        EXPECT_FALSE(volume->Notes().empty());
    }
}

// A journal that would turn the volume into another one.
TEST_F(JournalTest, TheShapeOfTheVolumeIsNoTarget) {
    CutBehind(2);
    std::vector<u8> bad = BytesOf(device_.get());
    u8* ring = bad.data() + place_.offset;
    u8* list = ring + place_.header.start;
    u64 data = place_.header.start + place_.header.listSize;
    bool found = false;
    for (u32 i = 1; !found && i < Be16(list + 2); ++i) {
        const u64 target = Be64(list + 16 + 16 * i) * 512;
        const u32 size = Be32(list + 24 + 16 * i);
        if (target <= kHeaderOffset && kHeaderOffset < target + size) {
            StoreBe32(ring + data + (kHeaderOffset - target) + 44, 77);
            found = true;
        }
        data += size;
    }
    ASSERT_TRUE(found);
    device_ = DeviceWith(bad);
    EXPECT_EQ(nullptr, Mount(Writing()));
    EXPECT_EQ(bad, BytesOf(device_.get()));
}

TEST_F(JournalTest, AJournalOnTopOfSomethingElseIsRefused) {
    const std::vector<u8> bytes = BytesOf(device_.get());
    const JournalPlace place = JournalOf(device_.get());
    for (const u64 offset : {u64{0}, u64{1024}, place.infoOffset, kSize - kJournal, kSize - 512,
                             ~u64{0} - 511, place.offset + 4096, place.offset + 1}) {
        std::vector<u8> bad = bytes;
        StoreBe64(bad.data() + place.infoOffset + 36, offset);
        if (offset < kSize - 512) {
            std::memcpy(bad.data() + offset, bytes.data() + place.offset, kJournalHeaderSize);
        }
        device_ = DeviceWith(bad);
        EXPECT_EQ(nullptr, Mount(Writing())) << offset;
    }
}

}  // namespace
}  // namespace VELK
