// Names as text: UTF-8 in and out, decomposed for storage, composed for people.
#include "hfs/names_text.h"

#include <gtest/gtest.h>

#include <random>

using namespace std::string_literals;

namespace VELK {
namespace {

NameUnits Parsed(const std::string& text) {
    NameUnits units;
    EXPECT_TRUE(UnitsFromUtf8(text, &units)) << text;
    return units;
}

TEST(NameDecomposition, KnownUnits) {
    EXPECT_EQ(DecomposedUnits(u"\u00E9"), u"e\u0301");
    EXPECT_EQ(DecomposedUnits(u"\u1EA5"), u"a\u0302\u0301");
    EXPECT_EQ(DecomposedUnits(u"\u0344"), u"\u0308\u0301");
    EXPECT_EQ(DecomposedUnits(u"\uAC01"), u"\u1100\u1161\u11A8");
    EXPECT_EQ(DecomposedUnits(u"\uAC00"), u"\u1100\u1161");
    EXPECT_EQ(DecomposedUnits(u"\uD7A3"), u"\u1112\u1175\u11C2");
    EXPECT_EQ(DecomposedUnits(u"\u212B\uF900"), u"\u212B\uF900");
    EXPECT_EQ(DecomposedUnits(u"\u0130"), u"I\u0307");
    EXPECT_EQ(DecomposedUnits(u"plain"), u"plain");
}

TEST(NameDecomposition, MarksAreOrderedByClassWithinARun) {
    EXPECT_EQ(DecomposedUnits(u"a\u0301\u0323b\u0301\u0323"), u"a\u0323\u0301b\u0323\u0301");
    EXPECT_EQ(DecomposedUnits(u"a\u0301\u0300"), u"a\u0301\u0300");
    EXPECT_EQ(DecomposedUnits(u"\u1E69"), u"s\u0323\u0307");
    EXPECT_EQ(DecomposedUnits(u"\u1E61\u0323"), u"s\u0323\u0307");
}

TEST(NameDecomposition, SurrogatesPassThrough) {
    EXPECT_EQ(DecomposedUnits(u"\U0001D15E"), u"\U0001D15E");
    const NameUnits lone = {0xDC00, u'x', 0xD800};
    EXPECT_EQ(DecomposedUnits(lone), lone);
}

TEST(NameComposition, UndoesTheDecompositionOfWhatPeopleType) {
    for (const char16_t unit : u"\u00E9\u1EA5\uAC00\uAC01\uD7A3\u0130\u1E69\u0439"s) {
        EXPECT_EQ(ComposedUnits(DecomposedUnits(NameUnits(1, unit))), NameUnits(1, unit));
    }
    EXPECT_EQ(ComposedUnits(u"e\u0301e"), u"\u00E9e");
}

TEST(NameComposition, LeavesExclusionsApart) {
    EXPECT_EQ(ComposedUnits(DecomposedUnits(u"\u0958")), u"\u0915\u093C");
    EXPECT_EQ(ComposedUnits(DecomposedUnits(u"\u0340")), u"\u0300");
}

TEST(NameComposition, MarkOfTheSameClassBlocks) {
    EXPECT_EQ(ComposedUnits(u"a\u0305\u0301"), u"a\u0305\u0301");
    EXPECT_EQ(ComposedUnits(u"a\u0323\u0301"), u"\u1EA1\u0301");
    EXPECT_EQ(ComposedUnits(u"e\u0345b\u0301"), u"e\u0345b\u0301");
}

TEST(NameComposition, EveryUnitComesBackDecomposedAlike) {
    for (u32 unit = 0; unit <= 0xFFFF; ++unit) {
        const NameUnits stored = DecomposedUnits(NameUnits(1, static_cast<char16_t>(unit)));
        ASSERT_EQ(DecomposedUnits(stored), stored) << std::hex << unit;
        ASSERT_EQ(DecomposedUnits(ComposedUnits(stored)), stored) << std::hex << unit;
    }
}

TEST(NameText, Utf8OfEveryLength) {
    EXPECT_EQ(Utf8FromUnits(u"a\u00FC\u20AC\U0001F600"), "a\xC3\xBC\xE2\x82\xAC\xF0\x9F\x98\x80");
    EXPECT_EQ(Parsed("a\xC3\xBC\xE2\x82\xAC\xF0\x9F\x98\x80"), u"a\u00FC\u20AC\U0001F600");
}

TEST(NameText, LoneSurrogateComesBack) {
    const NameUnits units = {u'a', 0xDC00, u'b', 0xD83D, 0xD83D, 0xDE00, 0xD800};
    EXPECT_EQ(Parsed(Utf8FromUnits(units)), units);
    EXPECT_EQ(Utf8FromUnits(NameUnits(1, 0xD800)), "\xED\xA0\x80");
}

TEST(NameText, RefusesWhatIsNoUtf8) {
    NameUnits units;
    for (const char* bad : {"\x80", "\xC3", "\xC0\x80", "\xE0\x80\x80", "\xF0\x80\x80\x80",
                            "\xF4\x90\x80\x80", "\xFF", "\xE2\x82", "\xC3("}) {
        EXPECT_FALSE(UnitsFromUtf8(bad, &units));
    }
}

TEST(NameText, RandomUnitsComeBack) {
    std::mt19937 random(7);
    for (int i = 0; i < 20000; ++i) {
        NameUnits units(random() % 8, u'\0');
        for (char16_t& unit : units) {
            unit = static_cast<char16_t>(random() % 3 == 0 ? 0xD700 + random() % 0xA00 : random());
        }
        ASSERT_EQ(Parsed(Utf8FromUnits(units)), units) << i;
    }
}

TEST(NameText, PosixSwapsTheSeparators) {
    EXPECT_EQ(PosixUnitsFromName(u"a/b:c\0"s), u"a:b/c\u2400");
    EXPECT_EQ(NameUnitsFromPosix(u"a:b\u2400"), u"a/b\0"s);
}

TEST(NameText, StoredUnitsAreBigEndian) {
    const u8 stored[] = {0x00, 0x61, 0x20, 0xAC};
    EXPECT_EQ(UnitsFromStored(stored, 2), u"a\u20AC");
}

}  // namespace
}  // namespace VELK
