// Record data as text: every form, every complaint, and the way back.
#include "hfs/records/record_text.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <random>

#include "hfs/format.h"
#include "hfs/records/record_fields.h"
#include "hfs/records/record_view.h"

namespace VELK::tool {
namespace {

using Bytes = std::vector<u8>;

Bytes Stored(const std::string& text, u32 fileId) {
    RecordData data;
    const Problem problem = ParseData(text, fileId, &data);
    EXPECT_FALSE(problem) << problem.Text();
    EXPECT_FALSE(data.isSame);
    return data.stored;
}

std::string Complaint(const std::string& text, u32 fileId) {
    RecordData data;
    const Problem problem = ParseData(text, fileId, &data);
    EXPECT_TRUE(problem) << text;
    EXPECT_EQ(static_cast<int>(problem.exitClass), 16);
    return problem.Text();
}

std::string Text(u32 fileId, const Bytes& stored) {
    return DataText(fileId, stored.data(), static_cast<u32>(stored.size()), Blanks::kPlain);
}

std::string Summary(u32 fileId, const std::string& text) {
    const Bytes stored = Stored(text, fileId);
    return RecordSummary(fileId, stored.data(), static_cast<u32>(stored.size()));
}

std::string Members(u32 fileId, const std::string& text) {
    const Bytes stored = Stored(text, fileId);
    std::string out;
    JsonWriter json(&out);
    json.BeginObject();
    RecordMembers(fileId, stored.data(), static_cast<u32>(stored.size()), &json);
    json.EndObject();
    return out;
}

TEST(DataText, BytesByRecipe) {
    EXPECT_EQ(Stored("hex:0002 aaFF", kCatalogFileId), (Bytes{0, 2, 0xAA, 0xFF}));
    EXPECT_EQ(Stored("zero:3", kCatalogFileId), (Bytes{0, 0, 0}));
    EXPECT_EQ(Stored("fill:AA*2", kCatalogFileId), (Bytes{0xAA, 0xAA}));
    EXPECT_EQ(Stored("fill:0102*2", kCatalogFileId), (Bytes{1, 2, 1, 2}));
    EXPECT_EQ(Stored("seq:4", kCatalogFileId), (Bytes{0, 1, 2, 3}));
    EXPECT_EQ(Stored("seq:300", kCatalogFileId)[257], 1);
    EXPECT_TRUE(Stored("zero:0", kCatalogFileId).empty());
}

TEST(DataText, BytesOfAFile) {
    const std::string path = ::testing::TempDir() + "data_of_a_record";
    std::FILE* file = std::fopen(path.c_str(), "wb");
    ASSERT_NE(file, nullptr);
    std::fputs("abc", file);
    std::fclose(file);
    EXPECT_EQ(Stored("@" + path, kCatalogFileId), (Bytes{'a', 'b', 'c'}));
    std::remove(path.c_str());
    EXPECT_EQ(Complaint("@nowhere", kCatalogFileId), "data '@nowhere': cannot open the file");
}

TEST(DataText, SameIsTheRecordsOwn) {
    RecordData data;
    EXPECT_FALSE(ParseData("same", kCatalogFileId, &data));
    EXPECT_TRUE(data.isSame);
}

TEST(DataText, FolderRecord) {
    const Bytes stored = Stored("folder{id:16,valence:3}", kCatalogFileId);
    Bytes expected(88);
    expected[1] = 1;
    expected[7] = 3;
    expected[11] = 16;
    EXPECT_EQ(stored, expected);
    EXPECT_EQ(Text(kCatalogFileId, stored), "folder{id:16,valence:3}");
}

TEST(DataText, FileRecordCountsItsBlocks) {
    const Bytes stored = Stored("file{id:20,size:1107,data:[[17,1],[30,2]]}", kCatalogFileId);
    ASSERT_EQ(stored.size(), 248u);
    EXPECT_EQ(stored[1], 2);
    EXPECT_EQ(stored[11], 20);
    EXPECT_EQ(stored[94], 1107 >> 8);
    EXPECT_EQ(stored[95], 1107 & 255);
    EXPECT_EQ(stored[103], 3);
    EXPECT_EQ(stored[107], 17);
    EXPECT_EQ(stored[111], 1);
    EXPECT_EQ(stored[115], 30);
    EXPECT_EQ(Text(kCatalogFileId, stored), "file{id:20,size:1107,data:[[17,1],[30,2]]}");
    const std::string odd = "file{id:20,data:[[17,1]],blocks:0}";
    EXPECT_EQ(Stored(odd, kCatalogFileId)[103], 0);
    EXPECT_EQ(Text(kCatalogFileId, Stored(odd, kCatalogFileId)), odd);
}

TEST(DataText, FileRecordWithEverything) {
    const std::string text =
        "file{id:18,rsize:5,rsrc:[[9,1]],rclump:4096,flags:0x82,link:3,"
        "created:2026-11-21T01:18:16Z,owner:501,group:20,adminflags:0x1,ownerflags:0x2,"
        "mode:0120755,special:1,filetype:\"slnk\",creator:0x00000001,finderflags:0x4000,"
        "location:0x40004000,putaway:7,encoding:126,reserved:0x9}";
    EXPECT_EQ(Text(kCatalogFileId, Stored(text, kCatalogFileId)), text);
}

TEST(DataText, ThreadRecords) {
    const Bytes folder = {0, 3, 0, 0, 0, 0, 0, 2, 0, 3, 0, 'd', 0, 'i', 0, 'r'};
    EXPECT_EQ(Stored("thread{parent:2,name:\"dir\"}", kCatalogFileId), folder);
    EXPECT_EQ(Stored("thread-folder{ parent:2 , name:dir }", kCatalogFileId), folder);
    EXPECT_EQ(Text(kCatalogFileId, folder), "thread{parent:2,name:\"dir\"}");
    Bytes file = folder;
    file[1] = 4;
    EXPECT_EQ(Text(kCatalogFileId, file), "thread-file{parent:2,name:\"dir\"}");
    EXPECT_EQ(Stored("thread-file{parent:2,name:\"dir\"}", kCatalogFileId), file);
}

TEST(DataText, ExtentsRecords) {
    Bytes expected(64);
    expected[3] = 100;
    expected[7] = 8;
    expected[10] = 1;
    expected[11] = 44;
    expected[15] = 4;
    EXPECT_EQ(Stored("extents{[[100,8],[300,4]]}", kExtentsFileId), expected);
    EXPECT_EQ(Text(kExtentsFileId, expected), "extents{[[100,8],[300,4]]}");
    EXPECT_EQ(Stored("extents{[]}", kExtentsFileId), Bytes(64));
    const Bytes attribute = Stored("extents{[[100,8]]}", kAttributesFileId);
    ASSERT_EQ(attribute.size(), 72u);
    EXPECT_EQ(attribute[3], 0x30);
    EXPECT_EQ(attribute[11], 100);
}

TEST(DataText, InlineAttributes) {
    const Bytes odd = {0, 0, 0, 16, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 3, 'a', 'b', 'c', 0};
    EXPECT_EQ(Stored("inline{\"abc\"}", kAttributesFileId), odd);
    EXPECT_EQ(Text(kAttributesFileId, odd), "inline{\"abc\"}");
    Bytes binary = odd;
    binary[16] = 0xFF;
    EXPECT_EQ(Text(kAttributesFileId, binary), "inline{hex:ff6263}");
    EXPECT_EQ(Stored("inline{hex:ff6263}", kAttributesFileId), binary);
    Bytes padded = odd;
    padded[19] = 1;
    EXPECT_EQ(Text(kAttributesFileId, padded),
              "hex:000000100000000000000000000000036162"
              "6301");
}

TEST(DataText, ForkAttribute) {
    const std::string text = "fork{size:9000,data:[[40,3]]}";
    const Bytes stored = Stored(text, kAttributesFileId);
    ASSERT_EQ(stored.size(), 88u);
    EXPECT_EQ(stored[3], 0x20);
    EXPECT_EQ(stored[23], 3);
    EXPECT_EQ(Text(kAttributesFileId, stored), text);
}

TEST(DataText, WhatReadableTextCannotSayIsHex) {
    Bytes longer = Stored("folder{id:16}", kCatalogFileId);
    longer.push_back(0);
    EXPECT_EQ(Text(kCatalogFileId, longer).substr(0, 8), "hex:0001");
    EXPECT_EQ(Text(kCatalogFileId, {0, 1, 0}), "hex:000100");
    EXPECT_EQ(Text(kCatalogFileId, {0, 9, 1, 2}), "hex:00090102");
    EXPECT_EQ(Text(kCatalogFileId, {0, 3, 0, 0, 0, 0, 0, 2, 0, 9, 0, 'd'}).substr(0, 4), "hex:");
}

TEST(DataText, BlanksCanBeEscaped) {
    const Bytes stored = Stored("thread{parent:2,name:\"a b\"}", kCatalogFileId);
    const std::string text =
        DataText(kCatalogFileId, stored.data(), static_cast<u32>(stored.size()), Blanks::kEscaped);
    EXPECT_EQ(text, "thread{parent:2,name:\"a\\u0020b\"}");
    EXPECT_EQ(Stored(text, kCatalogFileId), stored);
}

TEST(DataComplaint, EachKindOfMistake) {
    EXPECT_EQ(Complaint("nonsense", kCatalogFileId),
              "data 'nonsense': expected hex:, @FILE, zero:N, fill:XX*N, seq:N, same or a record, "
              "for example file{id:16}");
    EXPECT_EQ(Complaint("fiel{id:16}", kCatalogFileId),
              "data 'fiel{id:16}': unknown record 'fiel' (did you mean file?)");
    EXPECT_EQ(Complaint("file{siz:16}", kCatalogFileId),
              "data 'file{siz:16}': unknown field 'siz' (did you mean size?)");
    EXPECT_EQ(Complaint("file{id:x}", kCatalogFileId),
              "data 'file{id:x}': 'x' is no value for 'id'");
    EXPECT_EQ(Complaint("file{id:16}", kAttributesFileId),
              "data 'file{id:16}': a record of the catalog tree, the tree is attributes");
    EXPECT_EQ(Complaint("file{id:16", kCatalogFileId),
              "data 'file{id:16': expected ',' or '}' at character 11");
    EXPECT_EQ(Complaint("file{id:16}x", kCatalogFileId),
              "data 'file{id:16}x': expected nothing more at character 12");
    EXPECT_EQ(Complaint("hex:0g", kCatalogFileId), "hex:0g: 'g' at digit 2 is not hexadecimal");
    EXPECT_EQ(Complaint("hex:000", kCatalogFileId),
              "hex:000: 3 digits are no whole number of bytes");
    EXPECT_EQ(Complaint("zero:x", kCatalogFileId),
              "data 'zero:x': 'x' is no number of bytes from 0 to 1048576");
    EXPECT_EQ(Complaint("zero:99999999999", kCatalogFileId),
              "data 'zero:99999999999': '99999999999' is no number of bytes from 0 to 1048576");
    Complaint("fill:aa", kCatalogFileId);
    Complaint("fill:*3", kCatalogFileId);
    Complaint("fill:aabb*1048576", kCatalogFileId);
    Complaint("extents{[[1,2],[1,2],[1,2],[1,2],[1,2],[1,2],[1,2],[1,2],[1,2]]}", kExtentsFileId);
    Complaint("extents{[[1]]}", kExtentsFileId);
    Complaint("inline{abc}", kAttributesFileId);
    Complaint("file{filetype:\"toolong\"}", kCatalogFileId);
    Complaint("file{mode:0999}", kCatalogFileId);
    Complaint("file{created:2026-13-01}", kCatalogFileId);
    Complaint("", kCatalogFileId);
    Complaint("{}", kCatalogFileId);
}

// Whatever the bytes are, what is printed reads back as the very same bytes.
TEST(DataText, EveryPrintedRecordIsAccepted) {
    std::mt19937 random(11);
    u32 readable = 0;
    for (int round = 0; round < 6000; ++round) {
        const RecordKind& kind = kRecordKinds[random() % kRecordKindCount];
        const u32 extra = kind.size == kThreadFixed || kind.type == kInlineAttribute
                              ? static_cast<u32>(random() % 5) * 2
                              : 0;
        Bytes stored(kind.size + extra);
        for (u8& byte : stored) {
            byte = random() % 4 == 0 ? static_cast<u8>(random()) : u8{0};
        }
        if (kind.fileId == kCatalogFileId) {
            stored[0] = 0;
            stored[1] = static_cast<u8>(kind.type);
        } else if (kind.fileId == kAttributesFileId) {
            stored[0] = stored[1] = stored[2] = 0;
            stored[3] = static_cast<u8>(kind.type);
        }
        if (kind.size == kThreadFixed) {
            stored[8] = 0;
            stored[9] = static_cast<u8>(extra / 2);
        }
        if (kind.type == kInlineAttribute && random() % 4 != 0) {
            std::fill(stored.begin() + 4, stored.begin() + 15, u8{0});
            stored[15] = static_cast<u8>(extra);
        }
        for (const Blanks blanks : {Blanks::kPlain, Blanks::kEscaped}) {
            const std::string text =
                DataText(kind.fileId, stored.data(), static_cast<u32>(stored.size()), blanks);
            readable += text.starts_with("hex:") ? 0u : 1u;
            ASSERT_EQ(Stored(text, kind.fileId), stored) << text;
            ASSERT_TRUE(blanks == Blanks::kPlain || text.find(' ') == std::string::npos) << text;
        }
    }
    EXPECT_GT(readable, 6000u);
}

TEST(RecordView, Summaries) {
    EXPECT_EQ(Summary(kCatalogFileId, "folder{id:2,valence:301}"), "folder id 2, 301 items");
    EXPECT_EQ(Summary(kCatalogFileId, "file{id:20,size:2,data:[[59,1]]}"),
              "file id 20, size 2, data [59,1]");
    EXPECT_EQ(Summary(kCatalogFileId, "thread{parent:1,name:\"ISOIMAGE\"}"),
              "thread-folder 1:\"ISOIMAGE\"");
    EXPECT_EQ(Summary(kExtentsFileId, "extents{[[100,8],[300,4]]}"), "extents [100,8] [300,4]");
    EXPECT_EQ(Summary(kAttributesFileId, "inline{\"abc\"}"), "inline 3 bytes \"abc\"");
    EXPECT_EQ(Summary(kAttributesFileId, "fork{size:9,data:[[40,3]]}"), "fork size 9, data [40,3]");
    EXPECT_EQ(Summary(kCatalogFileId, "hex:0009"), "unknown, 2 bytes");
}

TEST(RecordView, Details) {
    const Bytes file =
        Stored("file{id:20,size:2,data:[[59,1]],created:2026-11-21T01:18:16Z}", kCatalogFileId);
    EXPECT_EQ(RecordDetails(kCatalogFileId, file.data(), static_cast<u32>(file.size())),
              "size 2 data [59,1] created 2026-11-21 01:18:16Z");
    EXPECT_STREQ(RecordTypeName(kCatalogFileId, file.data(), static_cast<u32>(file.size())),
                 "file");
    EXPECT_EQ(RecordId(kCatalogFileId, file.data(), static_cast<u32>(file.size())), 20u);
}

TEST(RecordView, JsonMembers) {
    EXPECT_EQ(Members(kCatalogFileId, "folder{id:2,valence:301,created:2026-11-21T01:18:16Z}"),
              "{\"type\":\"folder\",\"id\":2,\"valence\":301,"
              "\"created\":\"2026-11-21T01:18:16Z\"}");
    EXPECT_EQ(Members(kCatalogFileId, "thread{parent:1,name:\"a b\"}"),
              "{\"type\":\"thread-folder\",\"parent\":1,\"name\":\"a b\"}");
    EXPECT_EQ(Members(kExtentsFileId, "extents{[[100,8]]}"),
              "{\"type\":\"extents\",\"extents\":[[100,8]]}");
    EXPECT_EQ(Members(kAttributesFileId, "inline{\"abc\"}"),
              "{\"type\":\"inline\",\"size\":3,\"text\":\"abc\"}");
}

// Summaries must hold on any bytes at all.
TEST(RecordView, RandomBytesAreHarmless) {
    std::mt19937 random(17);
    for (int round = 0; round < 6000; ++round) {
        const u32 fileId = round % 3 == 0   ? kCatalogFileId
                           : round % 3 == 1 ? kExtentsFileId
                                            : kAttributesFileId;
        Bytes stored(random() % 100);
        for (u8& byte : stored) {
            byte = static_cast<u8>(random());
        }
        if (fileId == kCatalogFileId && stored.size() > 1) {
            stored[0] = 0;
            stored[1] = static_cast<u8>(random() % 6);
        }
        if (fileId == kAttributesFileId && stored.size() > 3) {
            stored[0] = stored[1] = stored[2] = 0;
            stored[3] = static_cast<u8>(random() % 4 * 16);
        }
        const u32 size = static_cast<u32>(stored.size());
        std::string out;
        JsonWriter json(&out);
        json.BeginObject();
        RecordMembers(fileId, stored.data(), size, &json);
        KeyMembers(fileId, stored.data(), size, &json);
        json.EndObject();
        EXPECT_FALSE(RecordSummary(fileId, stored.data(), size).empty());
        RecordDetails(fileId, stored.data(), size);
        ASSERT_EQ(Stored(Text(fileId, stored), fileId), stored);
    }
}

}  // namespace
}  // namespace VELK::tool
