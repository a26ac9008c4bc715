// Journal headers and the place of a journal, field by field: what is refused, and in which words.
#include <gtest/gtest.h>

#include "hfs/volume/journal_state.h"
#include "hfs/volume/wire.h"
#include "small_volume.h"

namespace VELK {
namespace {

constexpr u64 kRing = 64 << 10;

void Sign(u8* header) {
    StoreBe32(header + 36, JournalChecksum(header, kJournalHeaderSize, 36));
}

class JournalHeaders : public testing::Test {
protected:
    void SetUp() override {
        JournalHeader header;
        header.size = kRing;
        EncodeJournalHeader(header, bytes_);
    }
    std::string Decode(u64 size = kRing) {
        JournalHeader header;
        return DecodeJournalHeader(bytes_, size, &header);
    }
    // With one field changed and a checksum that fits.
    std::string With(u32 at, u64 value) {
        SetUp();
        if (at < 32) {
            StoreBe64(bytes_ + at, value);
        } else {
            StoreBe32(bytes_ + at, static_cast<u32>(value));
        }
        Sign(bytes_);
        return Decode(at == 24 ? value : kRing);
    }

    u8 bytes_[kJournalHeaderSize];
};

TEST_F(JournalHeaders, WhatMakesOne) {
    EXPECT_EQ("", Decode());
    EXPECT_EQ("is out of range", Decode(kRing + 512));
    bytes_[10] ^= 1;
    EXPECT_EQ("has a wrong checksum", Decode());
    SetUp();
    StoreBe32(bytes_ + 4, 0x78563412);
    Sign(bytes_);
    EXPECT_EQ("has no signature", Decode());
    bytes_[0] = 0;
    EXPECT_EQ("has no signature", Decode());
}

TEST_F(JournalHeaders, EachFieldHasItsBounds) {
    constexpr u32 kStart = 8;
    constexpr u32 kEnd = 16;
    constexpr u32 kSize = 24;
    constexpr u32 kListSize = 32;
    constexpr u32 kSectorSize = 40;
    struct {
        u32 field;
        u64 sound;
        std::vector<u64> bad;
    } const fields[] = {
        {kStart, kRing, {0, 511, 513, kRing + 512, ~u64{0}}},
        {kEnd, 1024, {0, 511, 1025, kRing + 512, ~u64{511}}},
        // Room for its own sector, one list and one block at the least.
        {kSize, 512 + 512 + 4096 + 512, {512 + 512 + 4096, kRing + 100, 0}},
        {kListSize, 512, {0, 256, 4100, (1u << 20) + 512, ~u32{0}}},
        {kSectorSize, 4096, {0, 256, 1000, 1u << 17, ~u32{0}}},
    };
    for (const auto& field : fields) {
        // The ring begins behind a sector of the size that is tried.
        if (field.field != kSectorSize) {
            EXPECT_EQ("", With(field.field, field.sound)) << field.field;
        }
        for (const u64 value : field.bad) {
            EXPECT_EQ("is out of range", With(field.field, value)) << field.field << " " << value;
        }
    }
    JournalHeader header;
    header.size = kRing;
    header.sectorSize = 4096;
    header.start = 4096;
    header.end = kRing;
    EncodeJournalHeader(header, bytes_);
    JournalHeader found;
    ASSERT_EQ("", DecodeJournalHeader(bytes_, kRing, &found));
    EXPECT_EQ(4096u, found.end);  // behind the last byte is the ring's start
    EXPECT_EQ(0u, found.Used());
}

// --- where a journal lies ------------------------------------------------------------------------

constexpr u64 kVolume = 512 << 10;

class JournalPlaces : public testing::Test {
protected:
    void SetUp() override {
        device_ = test::FreshDevice(kVolume, test::SmallFormat(kRing));
        u8 bytes[kHeaderSize];
        ASSERT_TRUE(device_->Read(kHeaderOffset, bytes, sizeof bytes).Ok());
        DecodeHeader(bytes, &header_);
        place_ = test::JournalOf(device_.get());
    }
    std::string State() {
        JournalPlace place;
        const JournalState state = ReadJournalState(device_.get(), header_, 65536, &place);
        EXPECT_TRUE(state.present);
        EXPECT_EQ(state.readable, state.text.empty());
        return state.text;
    }
    std::string WithInfo(u32 flags, u64 offset, u64 size) {
        u8 info[kJournalInfoSize];
        EncodeJournalInfo({flags, offset, size}, info);
        EXPECT_TRUE(device_->Write(place_.infoOffset, info, sizeof info).Ok());
        return State();
    }

    std::unique_ptr<MemoryDevice> device_;
    VolumeHeader header_{};
    JournalPlace place_;
};

TEST_F(JournalPlaces, TheInfoBlockLiesInTheVolume) {
    EXPECT_EQ("", State());
    for (const u32 block : {0u, header_.totalBlocks, ~u32{0}}) {
        header_.journalInfoBlock = block;
        EXPECT_EQ("journal info block " + Grouped(block) + " cannot be read", State());
    }
    // A volume that is longer than its image.
    header_.totalBlocks *= 2;
    header_.journalInfoBlock = header_.totalBlocks - 1;
    EXPECT_EQ("journal info block 2,047 cannot be read", State());
}

TEST_F(JournalPlaces, TheJournalIsOfThisVolume) {
    const u64 at = place_.offset;
    EXPECT_EQ("", WithInfo(kJournalInVolume, at, kRing));
    for (const u32 flags : {0u, kJournalElsewhere, kJournalElsewhere | kJournalInVolume}) {
        EXPECT_EQ("the journal lies on another device", WithInfo(flags, at, kRing)) << flags;
    }
}

TEST_F(JournalPlaces, TheStretchIsItsOwn) {
    const u64 at = place_.offset;
    const std::string where = "the journal at " + Position(65536 + at) + " ";
    EXPECT_EQ(where + "leaves the volume", WithInfo(kJournalInVolume, at, 3 * 512));
    EXPECT_EQ(where + "leaves the volume", WithInfo(kJournalInVolume, at, kVolume));
    EXPECT_EQ(where + "leaves the volume", WithInfo(kJournalInVolume, at, ~u64{0}));
    EXPECT_EQ("the journal at " + Position(65536 + at + 4) + " leaves the volume",
              WithInfo(kJournalInVolume, at + 4, kRing));
    EXPECT_EQ("journal header at " + Position(65536 + kVolume + 512) + " cannot be read",
              WithInfo(kJournalInVolume, kVolume + 512, kRing));
    EXPECT_EQ("journal header at " + Position(65536 + kVolume) + " cannot be read",
              WithInfo(kJournalInVolume, kVolume, kRing));
    EXPECT_EQ("the journal at 66,560 covers a header",
              WithInfo(kJournalInVolume, kHeaderOffset, 2048));
    EXPECT_EQ("the journal at " + Position(65536 + place_.infoOffset) + " covers a header",
              WithInfo(kJournalInVolume, place_.infoOffset, 2048));
    EXPECT_EQ("the journal at " + Position(65536 + kVolume - 2048) + " covers a header",
              WithInfo(kJournalInVolume, kVolume - 2048, 2048));
    for (const u32 fileId : {kExtentsFileId, kCatalogFileId, kAllocationFileId}) {
        const u64 start = u64{header_.ForkOf(fileId)->extents[0].startBlock} * 512;
        const std::string text = WithInfo(kJournalInVolume, start, 2048);
        EXPECT_EQ("the journal at " + Position(65536 + start) + " covers ",
                  text.substr(0, text.find(" covers ") + 8));
    }
}

TEST_F(JournalPlaces, AnnouncedAndUnreadableOnes) {
    EXPECT_EQ("", WithInfo(kJournalInVolume | kJournalNeedsInit, place_.offset, kRing));
    WithInfo(kJournalInVolume, place_.offset, kRing);
    u8 zeros[512] = {};
    ASSERT_TRUE(device_->Write(place_.offset, zeros, sizeof zeros).Ok());
    EXPECT_EQ("journal header at " + Position(65536 + place_.offset) + " has no signature",
              State());
    header_.attributes &= ~kVolJournaled;
    JournalPlace place;
    EXPECT_FALSE(ReadJournalState(device_.get(), header_, 0, &place).present);
}

}  // namespace
}  // namespace VELK
