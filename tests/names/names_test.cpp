// The two name orders, against the table and against the definition walked unit by unit.
#include "hfs/names.h"

#include <gtest/gtest.h>

#include <cstring>
#include <fstream>
#include <map>
#include <random>
#include <string>
#include <vector>

using namespace std::string_literals;

namespace VELK {
namespace {

std::vector<u8> Stored(const std::u16string& name) {
    std::vector<u8> bytes;
    for (const char16_t unit : name) {
        bytes.push_back(static_cast<u8>(unit >> 8));
        bytes.push_back(static_cast<u8>(unit));
    }
    return bytes;
}

using Order = int (*)(const void*, unsigned, const void*, unsigned);

int Compare(Order order, const std::u16string& a, const std::u16string& b) {
    return order(a.data(), static_cast<unsigned>(a.size()), Stored(b).data(),
                 static_cast<unsigned>(b.size()));
}
int Ins(const std::u16string& a, const std::u16string& b) {
    return Compare(CompareHfsNamesIns, a, b);
}
int Bin(const std::u16string& a, const std::u16string& b) {
    return Compare(CompareHfsNamesBin, a, b);
}

std::map<u32, u32> FoldTable() {
    std::map<u32, u32> table;
    std::ifstream file(TREEHFS_NAME_DATA "/hfs_case_fold.tsv");
    std::string line;
    while (std::getline(file, line)) {
        if (!line.empty() && line[0] != '#') {
            table[static_cast<u32>(std::stoul(line, nullptr, 16))] =
                static_cast<u32>(std::stoul(line.substr(5), nullptr, 16));
        }
    }
    return table;
}

// The order as it is defined, unit by unit, without any shortcut.
int DefinedOrder(const std::u16string& a, const std::u16string& b) {
    std::size_t i = 0;
    std::size_t j = 0;
    for (;;) {
        u16 x = 0;
        u16 y = 0;
        while (i < a.size() && x == 0) {
            x = FoldHfsUnit(a[i++]);
        }
        while (j < b.size() && y == 0) {
            y = FoldHfsUnit(b[j++]);
        }
        if (x != y) {
            return x < y ? -1 : 1;
        }
        if (x == 0) {
            return 0;
        }
    }
}

TEST(NameFolding, EveryUnitFoldsAsTheTableSays) {
    const std::map<u32, u32> table = FoldTable();
    ASSERT_EQ(table.size(), 329u);
    for (u32 unit = 0; unit <= 0xFFFF; ++unit) {
        const auto entry = table.find(unit);
        const u32 expected = entry == table.end() ? unit : entry->second;
        ASSERT_EQ(FoldHfsUnit(static_cast<u16>(unit)), expected) << std::hex << unit;
    }
}

TEST(NamesFolded, CaseIsNoDifference) {
    EXPECT_EQ(Ins(u"ABC", u"abc"), 0);
    EXPECT_EQ(Ins(u"\u0410", u"\u0430"), 0);
    EXPECT_EQ(Ins(u"\u01C4", u"\u01C5"), 0);
}

TEST(NamesFolded, IgnorableUnitsVanishAnywhere) {
    EXPECT_EQ(Ins(u"ABC", u"a\u200CbC\uFEFF"), 0);
    EXPECT_EQ(Ins(u"\u200C", u""), 0);
    EXPECT_EQ(Ins(u"a\u200Cb", u"a\u200Dc"), -1);
}

// Units that count for nothing are passed one by one, also when there is nothing else to compare.
TEST(NamesFolded, NamesOfIgnorableUnitsAloneEnd) {
    const std::u16string many(65535, u'\u200C');
    EXPECT_EQ(Ins(many, many), 0);
    EXPECT_EQ(Ins(many, u"\uFEFF"), 0);
    EXPECT_EQ(Ins(many + u"a", u"b"), -1);
    EXPECT_EQ(Ins(u"b", many + u"a"), 1);
}

TEST(NamesFolded, SoftHyphenAndFinalSigmaCount) {
    EXPECT_NE(Ins(u"a\u00ADb", u"ab"), 0);
    EXPECT_EQ(Ins(u"\u03C2", u"\u03C3"), -1);
}

TEST(NamesFolded, NulSortsAfterEverything) {
    EXPECT_EQ(Ins(std::u16string(4, u'\0'), u"zzz"), 1);
    EXPECT_EQ(Ins(std::u16string(1, u'\0'), u"\uFFFE"), 1);
    EXPECT_EQ(Ins(std::u16string(1, u'\0'), u"\uFFFF"), 0);
}

TEST(NamesFolded, FolderOfARealVolumeIsInOrder) {
    const std::u16string order[] = {
        u".fseventsd",    u".HFS+ Private Directory Data\r",
        u"a_directory",   u"a_link",
        u"passwords.txt", std::u16string(4, u'\0') + u"HFS+ Private Data"};
    for (std::size_t i = 1; i < std::size(order); ++i) {
        EXPECT_EQ(Ins(order[i - 1], order[i]), -1) << i;
        EXPECT_EQ(Ins(order[i], order[i - 1]), 1) << i;
    }
}

TEST(NamesFolded, PrefixIsSmaller) {
    EXPECT_EQ(Ins(u"ab", u"abc"), -1);
    EXPECT_EQ(Ins(u"abc", u"ab"), 1);
    EXPECT_EQ(Ins(u"", u"a"), -1);
}

TEST(NamesFolded, PlainAsciiSortsByLowerCase) {
    EXPECT_EQ(Ins(u"Z", u"a"), 1);
    EXPECT_EQ(Ins(u"_", u"A"), -1);
    EXPECT_EQ(Ins(u"[", u"a"), -1);
    EXPECT_EQ(Ins(u"@", u"A"), -1);
}

TEST(NamesFolded, RandomNamesCompareAsDefined) {
    std::mt19937 random(1);
    const std::u16string units = u"aAbBzZ@[_\0\u200C\uFEFF\u00C6\u00E6\u0391\u03B1\uFFFF\u00AD"s +
                                 char16_t{0xD800} + char16_t{0xDC00};
    const auto name = [&] {
        std::u16string result(random() % 6, u'\0');
        for (char16_t& unit : result) {
            unit = units[random() % units.size()];
        }
        return result;
    };
    for (int i = 0; i < 200000; ++i) {
        const std::u16string a = name();
        const std::u16string b = name();
        ASSERT_EQ(Ins(a, b), DefinedOrder(a, b)) << i;
        ASSERT_EQ(Ins(a, b), -Ins(b, a)) << i;
    }
}

TEST(NamesBinary, UnitsDecideUnsigned) {
    EXPECT_EQ(Bin(u"Bob", u"apple"), -1);
    EXPECT_EQ(Bin(u"\uFF21", u"A"), 1);
    EXPECT_EQ(Bin(u"\U00010000", u"\uE000"), -1);
    EXPECT_EQ(Bin(std::u16string(1, u'\0'), u"a"), -1);
    EXPECT_EQ(Bin(u"abc", u"abc"), 0);
}

TEST(NamesBinary, PrefixIsSmallerAndNothingIsIgnored) {
    EXPECT_EQ(Bin(u"ab", u"abc"), -1);
    EXPECT_EQ(Bin(u"abc", u"ab"), 1);
    EXPECT_EQ(Bin(u"", u""), 0);
    EXPECT_EQ(Bin(u"ab\u200C", u"ab"), 1);
}

TEST(NamesBinary, NamesNeedNoAlignment) {
    const std::u16string name = u"Name";
    std::vector<u8> shifted(1 + 2 * name.size());
    std::memcpy(shifted.data() + 1, name.data(), 2 * name.size());
    std::vector<u8> stored = Stored(u"name");
    stored.insert(stored.begin(), 0);
    EXPECT_EQ(CompareHfsNamesIns(shifted.data() + 1, 4, stored.data() + 1, 4), 0);
    EXPECT_EQ(CompareHfsNamesBin(shifted.data() + 1, 4, stored.data() + 1, 4), -1);
}

}  // namespace
}  // namespace VELK
