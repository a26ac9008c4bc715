// Keys as text: every form, every complaint, and the way back.
#include "hfs/records/key_text.h"

#include <gtest/gtest.h>

#include <cstring>
#include <random>

namespace VELK::tool {
namespace {

using Bytes = std::vector<u8>;

Bytes Stored(const std::string& text, u32 fileId) {
    SearchKey key;
    const Problem problem = ParseKey(text, fileId, &key);
    EXPECT_FALSE(problem) << problem.Text();
    return StoredKey(fileId, key);
}

std::string Complaint(const std::string& text, u32 fileId) {
    SearchKey key;
    const Problem problem = ParseKey(text, fileId, &key);
    EXPECT_TRUE(problem) << text;
    EXPECT_EQ(static_cast<int>(problem.exitClass), 16);
    return problem.Text();
}

std::string Text(u32 fileId, const Bytes& stored) {
    return KeyText(fileId, stored.data(), static_cast<u32>(stored.size()), Blanks::kPlain);
}

TEST(KeyText, CatalogKeyIsParentAndName) {
    const Bytes expected = {0, 8, 0, 0, 0, 2, 0, 1, 0, 'a'};
    EXPECT_EQ(Stored("2:a", kCatalogFileId), expected);
    EXPECT_EQ(Stored("2:\"a\"", kCatalogFileId), expected);
    EXPECT_EQ(Stored("2:\"\\u0061\"", kCatalogFileId), expected);
    EXPECT_EQ(Stored("0x2:a", kCatalogFileId), expected);
    EXPECT_EQ(Stored("hex:0008 00000002 0001 0061", kCatalogFileId), expected);
    EXPECT_EQ(Text(kCatalogFileId, expected), "2:\"a\"");
}

TEST(KeyText, ThreadKeyHasAnEmptyName) {
    const Bytes expected = {0, 6, 0, 0, 0, 16, 0, 0};
    EXPECT_EQ(Stored("16:\"\"", kCatalogFileId), expected);
    EXPECT_EQ(Text(kCatalogFileId, expected), "16:\"\"");
}

TEST(KeyText, TypedNamesAreStoredDecomposed) {
    const Bytes expected = {0, 10, 0, 0, 0, 2, 0, 2, 0, 'e', 3, 1};
    EXPECT_EQ(Stored("2:\u00E9", kCatalogFileId), expected);
    EXPECT_EQ(Stored("2:\"\u00E9\"", kCatalogFileId), expected);
    EXPECT_EQ(Text(kCatalogFileId, expected), "2:\"e\u0301\"");
}

TEST(KeyText, EscapedUnitsAreTakenAsTheyAre) {
    const Bytes composed = {0, 8, 0, 0, 0, 2, 0, 1, 0, 0xE9};
    EXPECT_EQ(Stored("2:\"\\u00e9\"", kCatalogFileId), composed);
    EXPECT_EQ(Text(kCatalogFileId, composed), "2:\"\\u00e9\"");
    const Bytes lone = {0, 8, 0, 0, 0, 2, 0, 1, 0xD8, 0};
    EXPECT_EQ(Stored("2:\"\\ud800\"", kCatalogFileId), lone);
    EXPECT_EQ(Text(kCatalogFileId, lone), "2:\"\\ud800\"");
}

TEST(KeyText, ExtentsKeyIsFileForkAndBlock) {
    const Bytes expected = {0, 10, 0xFF, 0, 0, 0, 4, 18, 0, 0, 0, 96};
    EXPECT_EQ(Stored("1042:rsrc:96", kExtentsFileId), expected);
    EXPECT_EQ(Stored("hex:000aff000000041200000060", kExtentsFileId), expected);
    EXPECT_EQ(Text(kExtentsFileId, expected), "1042:rsrc:96");
    EXPECT_EQ(Text(kExtentsFileId, Stored("5:data:0", kExtentsFileId)), "5:data:0");
}

TEST(KeyText, ExtentsSearchKeyIsInHostOrder) {
    SearchKey key;
    ASSERT_FALSE(ParseKey("1042:rsrc:96", kExtentsFileId, &key));
    u32 block = 0;
    std::memcpy(&block, key.bytes + kExtKeyStartBlock, sizeof block);
    EXPECT_EQ(block, 96u);
    EXPECT_EQ(key.id, 1042u);
    EXPECT_EQ(key.size, 12u);
}

TEST(KeyText, AttributesKeyMayHaveABlock) {
    const Bytes expected = {0, 14, 0, 0, 0, 0, 0, 37, 0, 0, 0, 8, 0, 1, 0, 'b'};
    EXPECT_EQ(Stored("37:b:8", kAttributesFileId), expected);
    EXPECT_EQ(Stored("37:\"b\":8", kAttributesFileId), expected);
    EXPECT_EQ(Text(kAttributesFileId, expected), "37:\"b\":8");
    EXPECT_EQ(Text(kAttributesFileId, Stored("37:com.x", kAttributesFileId)), "37:\"com.x\"");
    EXPECT_EQ(Text(kAttributesFileId, Stored("5:data:0", kAttributesFileId)), "5:\"data\"");
}

TEST(KeyText, BlanksCanBeEscaped) {
    const Bytes stored = Stored("2:\"a b\"", kCatalogFileId);
    EXPECT_EQ(
        KeyText(kCatalogFileId, stored.data(), static_cast<u32>(stored.size()), Blanks::kEscaped),
        "2:\"a\\u0020b\"");
}

TEST(KeyText, WhatReadableTextCannotSayIsHex) {
    EXPECT_EQ(Text(kCatalogFileId, {0, 9, 0, 0, 0, 2, 0, 1, 0, 'a', 0}),
              "hex:00090000000200010061"
              "00");
    EXPECT_EQ(Text(kExtentsFileId, {0, 10, 1, 0, 0, 0, 0, 5, 0, 0, 0, 0}),
              "hex:000a01000000000500000000");
    EXPECT_EQ(Text(kExtentsFileId, {0, 10, 0, 7, 0, 0, 0, 5, 0, 0, 0, 0}),
              "hex:000a00070000000500000000");
    EXPECT_EQ(Text(kCatalogFileId, {0, 6, 0, 0}), "hex:00060000");
    EXPECT_EQ(Text(kCatalogFileId, {}), "hex:");
}

TEST(KeyText, IdKeyNamesAThread) {
    u32 id = 0;
    EXPECT_TRUE(ParseIdKey("id:1042", &id));
    EXPECT_EQ(id, 1042u);
    EXPECT_FALSE(ParseIdKey("2:alpha", &id));
    EXPECT_FALSE(ParseIdKey("id:4294967296", &id));
}

TEST(KeyComplaint, BadKey) {
    EXPECT_EQ(Complaint("2-alpha", kCatalogFileId),
              "key '2-alpha': expected PARENT:NAME, for example 2:alpha");
    EXPECT_EQ(Complaint("5-data", kExtentsFileId),
              "key '5-data': expected FILE:data|rsrc:BLOCK, for example 5:data:0");
    EXPECT_EQ(Complaint("x:y", kAttributesFileId),
              "key 'x:y': expected FILE:NAME[:BLOCK], for example 37:com.example.tag");
    EXPECT_EQ(Complaint("2:\"open", kCatalogFileId),
              "key '2:\"open': expected PARENT:NAME, for example 2:alpha");
    Complaint("2:", kCatalogFileId);
    Complaint("4294967296:a", kCatalogFileId);
    Complaint("", kCatalogFileId);
}

TEST(KeyComplaint, KeyOfAnotherTree) {
    EXPECT_EQ(Complaint("5:data:0", kCatalogFileId),
              "key '5:data:0' is an extents key, the tree is catalog: add -t extents");
    EXPECT_EQ(Complaint("37:\"com.example.tag\":8", kCatalogFileId),
              "key '37:\"com.example.tag\":8' is an attributes key, the tree is catalog: add -t "
              "attributes");
    EXPECT_EQ(Complaint("2:alpha", kExtentsFileId),
              "key '2:alpha' is a catalog key, the tree is extents: add -t catalog");
}

TEST(KeyComplaint, BadHex) {
    EXPECT_EQ(Complaint("hex:00zz", kCatalogFileId), "hex:00zz: 'z' at digit 3 is not hexadecimal");
    EXPECT_EQ(Complaint("hex:0010 00000002 0002 00610062", kCatalogFileId),
              "hex:0010 ... : length field says 16 bytes, 10 follow");
    EXPECT_EQ(Complaint("hex:001", kCatalogFileId),
              "hex:001: 3 digits are no whole number of bytes");
    EXPECT_EQ(Complaint("hex:", kCatalogFileId), "hex:: no length field");
    EXPECT_EQ(Complaint("hex:0004 00000002", kCatalogFileId),
              "hex:0004 ... : 4 bytes are too few for a catalog key (6)");
    EXPECT_EQ(Complaint("hex:0008 00000002 0002 0061", kCatalogFileId),
              "hex:0008 ... : name of 2 units does not fit into 8 bytes");
}

TEST(KeyComplaint, NameTooLong) {
    EXPECT_EQ(Complaint("2:" + std::string(300, 'x'), kCatalogFileId),
              "key '2:" + std::string(300, 'x') + "': the name has 300 units, the longest has 255");
    Complaint("37:" + std::string(128, 'x'), kAttributesFileId);
    Stored("2:" + std::string(255, 'x'), kCatalogFileId);
    Stored("37:" + std::string(127, 'x'), kAttributesFileId);
}

// Whatever the bytes are, what is printed reads back as the very same bytes.
TEST(KeyText, EveryPrintedKeyIsAccepted) {
    std::mt19937 random(5);
    for (int round = 0; round < 30000; ++round) {
        const u32 fileId = round % 3 == 0   ? kCatalogFileId
                           : round % 3 == 1 ? kExtentsFileId
                                            : kAttributesFileId;
        const u32 fixed = fileId == kCatalogFileId ? 6 : fileId == kExtentsFileId ? 10 : 12;
        const u32 units = fileId == kExtentsFileId ? 0 : static_cast<u32>(random() % 6);
        const u32 slack = random() % 8 == 0 ? 2 : 0;
        Bytes stored(2 + fixed + 2 * units + slack);
        for (u8& byte : stored) {
            byte = static_cast<u8>(random() % 3 == 0 ? random() : random() % 128);
        }
        stored[0] = 0;
        stored[1] = static_cast<u8>(stored.size() - 2);
        if (fileId == kExtentsFileId) {
            stored[2] = random() % 2 == 0 ? 0 : 0xFF;
            stored[3] = 0;
        } else {
            const std::size_t at = fileId == kCatalogFileId ? 6 : 12;
            stored[at] = 0;
            stored[at + 1] = static_cast<u8>(units);
            for (std::size_t i = at + 2; i + 1 < stored.size(); i += 2) {
                constexpr u8 kHigh[] = {0, 0, 0, 3, 0x1E, 0x20, 0xAC, 0xD8, 0xDC, 0xFE};
                stored[i] = kHigh[random() % std::size(kHigh)];
            }
            if (fileId == kAttributesFileId && random() % 4 != 0) {
                stored[2] = stored[3] = 0;
            }
        }
        for (const Blanks blanks : {Blanks::kPlain, Blanks::kEscaped}) {
            const std::string text =
                KeyText(fileId, stored.data(), static_cast<u32>(stored.size()), blanks);
            ASSERT_EQ(Stored(text, fileId), stored) << text;
        }
    }
}

TEST(KeyText, DeliveredKeysBecomeStoredOnes) {
    SearchKey key;
    ASSERT_FALSE(ParseKey("2:alpha", kCatalogFileId, &key));
    EXPECT_EQ(StoredFromDelivered(kCatalogFileId, key.bytes, key.size),
              StoredKey(kCatalogFileId, key));
    const Bytes extents = Stored("5:data:0", kExtentsFileId);
    EXPECT_EQ(StoredFromDelivered(kExtentsFileId, extents.data(), 12), extents);
}

}  // namespace
}  // namespace VELK::tool
