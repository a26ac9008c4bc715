// A walk through the museum: each exhibit is met as its label says.
#include <gtest/gtest.h>

#include <cctype>
#include <cstdlib>
#include <random>
#include <set>

#include "document.h"
#include "reading.h"

namespace VELK::test {

namespace {

std::vector<Exhibit> AllExhibits() {
    std::vector<Exhibit> all;
    for (const Hall& hall : Museum()) {
        all.insert(all.end(), hall.exhibits.begin(), hall.exhibits.end());
    }
    return all;
}

const std::map<std::string, std::string>& Labels() {
    static const std::map<std::string, std::string> labels = ReadLabels(TREEHFS_DAMAGE_DOCUMENT);
    return labels;
}

std::string NameOf(const ::testing::TestParamInfo<Exhibit>& info) {
    std::string name;
    bool isStart = true;
    for (const char* c = info.param.name; *c != 0; ++c) {
        if (*c == '-') {
            isStart = true;
            continue;
        }
        name += isStart ? static_cast<char>(std::toupper(static_cast<u8>(*c))) : *c;
        isStart = false;
    }
    return name;
}

u32 SeedOf(u32 otherwise) {
    const char* given = std::getenv("TREEHFS_SEED");
    return given != nullptr ? static_cast<u32>(std::strtoul(given, nullptr, 10)) : otherwise;
}

}  // namespace

void PrintTo(const Exhibit& exhibit, std::ostream* out) {
    *out << exhibit.name;
}

class MuseumExhibit : public ::testing::TestWithParam<Exhibit> {};

TEST_P(MuseumExhibit, IsMetAsItsLabelSays) {
    const Shown shown = Show(GetParam());
    EXPECT_EQ(Labels().at(GetParam().name), LabelOf(GetParam(), shown));
    EXPECT_EQ("", shown.fault);
}
INSTANTIATE_TEST_SUITE_P(Museum, MuseumExhibit, ::testing::ValuesIn(AllExhibits()), NameOf);

TEST(Museum, TheVolumeNobodyHurtIsSound) {
    const Shown shown = Show({"sound", "", [](Specimen&) {}});
    EXPECT_EQ("", shown.engine);
    EXPECT_EQ("", shown.check);
    EXPECT_EQ("0 0 0 0 0 0 0", shown.exits);
    EXPECT_EQ("", shown.refusal);
    EXPECT_EQ("", shown.fault);
}

TEST(Museum, TheWidenedAndTheJournaledVolumeAreSoundToo) {
    const Shown wide = Show({"wide", "", [](Specimen& s) { s.Widen(); }});
    EXPECT_EQ("", wide.engine + wide.check + wide.refusal + wide.fault);
    const Shown journaled = Show({"journaled", "", [](Specimen& s) { s.Journaled(512, 512); }});
    EXPECT_EQ("0 0 0 0 0 0 0", journaled.exits);
    EXPECT_EQ("", journaled.refusal + journaled.fault);
}

TEST(Museum, EveryExhibitHasANameOfItsOwnAndDiffersFromTheSoundVolume) {
    const Specimen sound;
    std::set<std::string> names;
    std::set<Bytes> images;
    for (const Exhibit& exhibit : AllExhibits()) {
        EXPECT_TRUE(names.insert(exhibit.name).second) << exhibit.name;
        EXPECT_TRUE(images.insert(MakeImage(exhibit)).second) << exhibit.name;
        EXPECT_NE(sound.bytes, MakeImage(exhibit)) << exhibit.name;
    }
    EXPECT_GE(names.size(), 150u);
}

// Bytes changed at random where there are any: whatever is found, reading leaves nothing to write.
TEST(Museum, ReadingNeverWritesWhateverTheDamage) {
    const u32 seed = SeedOf(20261122);
    SCOPED_TRACE("TREEHFS_SEED=" + std::to_string(seed));
    std::mt19937 random(seed);
    const Specimen sound;
    std::vector<std::size_t> places;
    for (std::size_t i = 0; i < sound.bytes.size() - 1024; ++i) {
        if (sound.bytes[i] != 0) {
            places.push_back(i);
        }
    }
    u32 heard = 0;
    for (u32 round = 0; round < 300; ++round) {
        Bytes image = sound.bytes;
        for (u32 i = 0; i < 1 + round % 4; ++i) {
            image[places[random() % places.size()]] = static_cast<u8>(random());
        }
        const Reading reading = ReadEverything(image, sound.volume);
        ASSERT_EQ("", reading.fault) << "round " << round;
        heard += reading.text.empty() ? 0u : 1u;
    }
    EXPECT_GT(heard, 30u);
}

TEST(Museum, EveryLabelHasItsExhibit) {
    std::set<std::string> names;
    for (const Exhibit& exhibit : AllExhibits()) {
        names.insert(exhibit.name);
    }
    for (const auto& label : Labels()) {
        EXPECT_EQ(1u, names.count(label.first)) << label.first;
    }
    EXPECT_EQ(names.size(), Labels().size());
}

}  // namespace VELK::test
