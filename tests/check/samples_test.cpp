// Real volumes: all come out clean in a full run, but for what is written out here.
#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <map>

#include "check_support.h"
#include "samples.h"

namespace VELK::test {
namespace {

struct Sample {
    const char* name;
    u64 offset;
    u64 size;        // 0: to the end of the file
    u64 records[3];  // leaf records of extents, catalog, attributes
    const char* ids;
    const char* infos;
};

class CheckSamples : public testing::TestWithParam<Sample> {};

int ReadFile(void* self, u64 offset, void* target, std::size_t size) {
    std::ifstream& file = *static_cast<std::ifstream*>(self);
    file.clear();
    file.seekg(static_cast<std::streamoff>(offset));
    file.read(static_cast<char*>(target), static_cast<std::streamsize>(size));
    return file.gcount() == static_cast<std::streamsize>(size) ? 0 : 5;
}

// The bytes [offset, offset + size) of a sample; size 0: to its end.
Outcome CheckSample(const std::string& name, u64 offset, u64 size, const CheckOptions& options) {
    struct Part {
        std::ifstream file;
        u64 offset;
    } part = {std::ifstream(SamplePath(name), std::ios::binary | std::ios::ate), offset};
    EXPECT_TRUE(part.file.is_open()) << name;
    const u64 fileSize = static_cast<u64>(part.file.tellg());
    EXPECT_GT(fileSize, offset);
    CheckSource source = {};
    source.self = &part;
    source.read = [](void* self, u64 at, void* target, std::size_t bytes) {
        auto* from = static_cast<Part*>(self);
        return ReadFile(&from->file, from->offset + at, target, bytes);
    };
    source.size = size != 0 ? size : fileSize - offset;
    source.imageOffset = offset;
    return CheckSourceBytes(source, options);
}

}  // namespace

TEST_P(CheckSamples, ComesOutAsKnown) {
    std::string why;
    if (!HaveSamples(&why)) {
        GTEST_SKIP() << why;
    }
    const Sample& sample = GetParam();
    const Outcome outcome = CheckSample(sample.name, sample.offset, sample.size, Full());
    EXPECT_EQ(outcome.Ids(), sample.ids) << outcome.Lines();
    EXPECT_EQ(outcome.Ids(true), sample.infos) << outcome.Lines();
    EXPECT_TRUE(outcome.unreadable.empty());
    for (u32 i = 0; i < 3; ++i) {
        EXPECT_EQ(outcome.summary.stages[1 + i].records, sample.records[i]) << i;
    }
    EXPECT_EQ(CheckSample(sample.name, sample.offset, sample.size, Quick()).Ids(), "");
}

// Cut short, a header node without offsets, a leaf whose keys are gone, a map without marks.
TEST(CheckDamagedSample, IsToldWhatIsKnownOfIt) {
    std::string why;
    if (!HaveSamples(&why)) {
        GTEST_SKIP() << why;
    }
    const Outcome outcome = CheckSample("damaged-wrapped.img", 45056, 0, Full());
    EXPECT_EQ(outcome.Ids(), "V02 H01 H13 M04 K01") << outcome.Lines();
    EXPECT_EQ(outcome.First(CheckId::V02).text,
              "180 blocks of 4096 bytes make 737280 bytes, the image holds 736576: 704 bytes are "
              "missing");
    EXPECT_EQ(CheckFindingLine(outcome.First(CheckId::H01)),
              "error H01 extents header (image offset 0xdffe): the header record starts at 0, "
              "expected 14");
    EXPECT_EQ(CheckFindingLine(outcome.First(CheckId::H13)),
              "warn  H13 catalog header (image offset 0x15028): freeNodes is 6, the map has 8 "
              "clear bits");
    EXPECT_EQ(CheckFindingLine(outcome.First(CheckId::M04)),
              "error M04 catalog map bit 0 (image offset 0x150f8): node 0 is in use but its bit is "
              "clear");
    EXPECT_EQ(CheckFindingLine(outcome.First(CheckId::K01)),
              "error K01 catalog node 1 record 2 (image offset 0x160a0): key length is 0, expected "
              "6 to 516");
    const CheckStage* stages = outcome.summary.stages;
    EXPECT_EQ(stages[1].errors, 4u);   // four offsets of the header node
    EXPECT_EQ(stages[2].errors, 22u);  // 20 keys, two marks
    EXPECT_EQ(stages[2].records, 22u);
    EXPECT_STREQ(stages[5].why, "a tree is damaged");
}

// iso-2000-b512: its writer leaves the marks of the last eight blocks clear, though three of them
// are in use and none is counted as free.
INSTANTIATE_TEST_SUITE_P(
    All, CheckSamples,
    testing::Values(Sample{"plain.img", 0, 0, {0, 26, 1}, "", ""},
                    Sample{"blank.img", 0, 0, {0, 2, 0}, "", ""},
                    Sample{"hardlinks-small.img", 0, 0, {0, 56, 0}, "", ""},
                    Sample{"many-names.img", 0, 0, {0, 31178, 0}, "", ""},
                    Sample{"noattr.img", 0, 0, {0, 8, 0}, "", ""},
                    Sample{"linux-512.img", 0, 0, {0, 20, 2}, "", ""},
                    Sample{"linux-hfsx-1024.img", 0, 0, {0, 20, 2}, "", ""},
                    Sample{"linux-2048-cp.img", 0, 0, {0, 20, 2}, "", ""},
                    Sample{"hfsx.img", 0, 0, {0, 12, 0}, "", ""},
                    Sample{"hfsx-app.img", 0, 0, {0, 40, 0}, "", ""},
                    Sample{"wrapped.img", 45056, 2036 * 4096, {0, 2, 0}, "", ""},
                    Sample{"hardlinks-journaled.img", 0, 0, {0, 28, 0}, "", ""},
                    Sample{"attributes-journaled.img", 0, 0, {0, 30, 2}, "", ""},
                    Sample{"attributes-nine.img", 0, 0, {0, 24, 9}, "", ""},
                    Sample{"attribute-fork.img", 0, 0, {0, 42, 3}, "", ""},
                    Sample{"names-spotlight.img", 0, 0, {0, 206, 0}, "", ""},
                    Sample{"mbr-journaled.img", 32256, 0, {0, 26, 0}, "", "V05"},
                    Sample{"gpt-open-journal.img", 20480, 0, {0, 16, 0}, "", "V05 V08"},
                    Sample{"iso-2000-b512.hfs", 0, 0, {0, 4002, 0}, "V05 V06", "V05 V06"},
                    Sample{"iso-20000.hfs", 0, 0, {0, 40002, 0}, "", "V05"}),
    [](const testing::TestParamInfo<Sample>& sample) {
        std::string name = sample.param.name;
        for (char& letter : name) {
            letter = std::isalnum(static_cast<unsigned char>(letter)) != 0 ? letter : '_';
        }
        return name;
    });

}  // namespace VELK::test
