// The comparators of the three trees: search key in host order against a key as stored.
#include <gtest/gtest.h>

#include <string>

#include "capture.h"
#include "hfs/treehfs.h"
#include "keys.h"

namespace VELK::test {
namespace {

constexpr u8 kData = 0x00;
constexpr u8 kResource = 0xFF;

int Compare(CompareKeysFn compare, const HostKey& search, u32 id, const Bytes& node) {
    return compare(search, id, reinterpret_cast<const BTreeKey*>(node.data()));
}
int Compare(CompareKeysFn compare, const HostKey& search, const Bytes& node) {
    return Compare(compare, search, search.id, node);
}

// ---- catalog

class CompareCat : public ::testing::TestWithParam<CompareKeysFn> {};

TEST_P(CompareCat, ParentIdDecidesFirst) {
    EXPECT_EQ(Compare(GetParam(), HostCatKey(6, u"a"), DiskCatKey(5, u"b")), 1);
    EXPECT_EQ(Compare(GetParam(), HostCatKey(5, u"b"), DiskCatKey(6, u"a")), -1);
}

TEST_P(CompareCat, ParentIdsAreUnsigned) {
    EXPECT_EQ(Compare(GetParam(), HostCatKey(0x80000000u, u"a"), DiskCatKey(1, u"a")), 1);
    EXPECT_EQ(Compare(GetParam(), HostCatKey(1, u"a"), DiskCatKey(0xFFFFFFFFu, u"a")), -1);
}

TEST_P(CompareCat, TheIdIsTheArgumentNotTheFieldOfTheSearchKey) {
    EXPECT_EQ(Compare(GetParam(), HostCatKey(99, u"a"), 5, DiskCatKey(5, u"a")), 0);
}

TEST_P(CompareCat, TheKeyLengthIsNotRead) {
    HostKey search = HostCatKey(5, u"a");
    search.bytes[0] = search.bytes[1] = 0;
    Bytes node = DiskCatKey(5, u"a");
    Put16(&node, 0, 0);
    EXPECT_EQ(Compare(GetParam(), search, node), 0);
}

TEST_P(CompareCat, EqualNamesAreEqual) {
    EXPECT_EQ(Compare(GetParam(), HostCatKey(5, u"\u0416x\u00FF"), DiskCatKey(5, u"\u0416x\u00FF")),
              0);
}

TEST_P(CompareCat, NamesDecideNext) {
    EXPECT_EQ(Compare(GetParam(), HostCatKey(5, u"b"), DiskCatKey(5, u"a")), 1);
    EXPECT_EQ(Compare(GetParam(), HostCatKey(5, u"a"), DiskCatKey(5, u"b")), -1);
    EXPECT_EQ(Compare(GetParam(), HostCatKey(5, u"a\u0100"), DiskCatKey(5, u"a\u00FE")), 1);
}

TEST_P(CompareCat, AProperPrefixSortsFirst) {
    EXPECT_EQ(Compare(GetParam(), HostCatKey(5, u"ab"), DiskCatKey(5, u"abc")), -1);
    EXPECT_EQ(Compare(GetParam(), HostCatKey(5, u"abc"), DiskCatKey(5, u"ab")), 1);
}

TEST_P(CompareCat, TwoEmptyNamesAreEqual) {
    EXPECT_EQ(Compare(GetParam(), HostCatKey(5, u""), DiskCatKey(5, u"")), 0);
}

TEST_P(CompareCat, AlignedKeysAssertNothing) {
    Capture capture;
    Compare(GetParam(), HostCatKey(5, u"a"), DiskCatKey(5, u"a"));
    EXPECT_EQ(capture.All(), Events{});
}

INSTANTIATE_TEST_SUITE_P(Both, CompareCat,
                         ::testing::Values(CompareCatKeysCaseIns, CompareCatKeysCaseBin));

TEST(CompareCatIns, CaseDoesNotMatter) {
    EXPECT_EQ(Compare(CompareCatKeysCaseIns, HostCatKey(5, u"ReadMe"), DiskCatKey(5, u"readme")),
              0);
    EXPECT_EQ(Compare(CompareCatKeysCaseIns, HostCatKey(5, u"\u00C6"), DiskCatKey(5, u"\u00E6")),
              0);
}

TEST(CompareCatIns, FoldedNamesDecide) {
    EXPECT_EQ(Compare(CompareCatKeysCaseIns, HostCatKey(5, u"B"), DiskCatKey(5, u"a")), 1);
    EXPECT_EQ(Compare(CompareCatKeysCaseIns, HostCatKey(5, u"a"), DiskCatKey(5, u"B")), -1);
}

TEST(CompareCatIns, AnEmptyNameYieldsTheDifferenceOfTheLengths) {
    EXPECT_EQ(Compare(CompareCatKeysCaseIns, HostCatKey(5, u""), DiskCatKey(5, u"x")), -1);
    EXPECT_EQ(Compare(CompareCatKeysCaseIns, HostCatKey(5, u"xyz"), DiskCatKey(5, u"")), 3);
    const std::u16string longest(255, u'n');
    EXPECT_EQ(Compare(CompareCatKeysCaseIns, HostCatKey(5, u""), DiskCatKey(5, longest)), -255);
    EXPECT_EQ(Compare(CompareCatKeysCaseIns, HostCatKey(5, longest), DiskCatKey(5, u"")), 255);
}

TEST(CompareCatIns, TheDifferenceOfTheLengthsIsNotNarrowed) {
    Bytes node = DiskCatKey(5, u"");
    Put16(&node, 6, 65535);  // the name itself is not read
    EXPECT_EQ(Compare(CompareCatKeysCaseIns, HostCatKey(5, u""), node), -65535);
    Put16(&node, 6, 256);
    EXPECT_EQ(Compare(CompareCatKeysCaseIns, HostCatKey(5, u""), node), -256);
}

TEST(CompareCatBin, CaseMatters) {
    EXPECT_EQ(Compare(CompareCatKeysCaseBin, HostCatKey(5, u"B"), DiskCatKey(5, u"a")), -1);
    EXPECT_EQ(Compare(CompareCatKeysCaseBin, HostCatKey(5, u"a"), DiskCatKey(5, u"A")), 1);
}

TEST(CompareCatBin, AnEmptyNameIsJustAPrefix) {
    EXPECT_EQ(Compare(CompareCatKeysCaseBin, HostCatKey(5, u""), DiskCatKey(5, u"xyz")), -1);
    EXPECT_EQ(Compare(CompareCatKeysCaseBin, HostCatKey(5, u"xyz"), DiskCatKey(5, u"")), 1);
}

// ---- extents

int CompareExt(const HostKey& search, const Bytes& node) {
    return Compare(CompareExtentKeysPlus, search, node);
}

TEST(CompareExtents, FileIdDecidesFirst) {
    EXPECT_EQ(CompareExt(HostExtKey(kData, 21, 0), DiskExtKey(kResource, 20, 9)), 1);
    EXPECT_EQ(CompareExt(HostExtKey(kResource, 20, 9), DiskExtKey(kData, 21, 0)), -1);
    EXPECT_EQ(CompareExt(HostExtKey(kData, 0x80000000u, 0), DiskExtKey(kData, 20, 0)), 1);
}

TEST(CompareExtents, TheDataForkSortsBeforeTheResourceFork) {
    EXPECT_EQ(CompareExt(HostExtKey(kData, 20, 9), DiskExtKey(kResource, 20, 0)), -1);
    EXPECT_EQ(CompareExt(HostExtKey(kResource, 20, 0), DiskExtKey(kData, 20, 9)), 1);
}

TEST(CompareExtents, StartBlocksDecideLastAndUnsigned) {
    EXPECT_EQ(CompareExt(HostExtKey(kData, 20, 8), DiskExtKey(kData, 20, 7)), 1);
    EXPECT_EQ(CompareExt(HostExtKey(kData, 20, 7), DiskExtKey(kData, 20, 8)), -1);
    EXPECT_EQ(CompareExt(HostExtKey(kData, 20, 0x80000000u), DiskExtKey(kData, 20, 1)), 1);
    EXPECT_EQ(CompareExt(HostExtKey(kData, 20, 0x01020304), DiskExtKey(kData, 20, 0x01020304)), 0);
}

TEST(CompareExtents, TheIdIsTheArgumentNotTheFieldOfTheSearchKey) {
    EXPECT_EQ(Compare(CompareExtentKeysPlus, HostExtKey(kData, 99, 7), 5, DiskExtKey(kData, 5, 7)),
              0);
}

TEST(CompareExtents, ThePadIsNotRead) {
    Bytes node = DiskExtKey(kData, 20, 7);
    node[3] = 0x99;
    EXPECT_EQ(CompareExt(HostExtKey(kData, 20, 7), node), 0);
}

// ---- attributes

int CompareAttr(const HostKey& search, const Bytes& node) {
    return Compare(CompareAttrKeys, search, node);
}

TEST(CompareAttributes, FileIdDecidesFirst) {
    EXPECT_EQ(CompareAttr(HostAttrKey(21, 0, u"a"), DiskAttrKey(20, 1, u"b")), 1);
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 1, u"b"), DiskAttrKey(21, 0, u"a")), -1);
}

TEST(CompareAttributes, NamesDecideNextUnitByUnitUnsigned) {
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 0, u"ab"), DiskAttrKey(20, 9, u"aa")), 1);
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 9, u"aa"), DiskAttrKey(20, 0, u"ab")), -1);
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 0, u"\uFFFD"), DiskAttrKey(20, 0, u"a")), 1);
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 0, u"\u0100"), DiskAttrKey(20, 0, u"\u00FF")), 1);
}

TEST(CompareAttributes, CaseMatters) {
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 0, u"A"), DiskAttrKey(20, 0, u"a")), -1);
}

TEST(CompareAttributes, AProperPrefixSortsFirstWhateverTheStartBlocks) {
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 9, u"ab"), DiskAttrKey(20, 0, u"abc")), -1);
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 0, u"abc"), DiskAttrKey(20, 9, u"ab")), 1);
}

TEST(CompareAttributes, AnEmptyNameIsAPrefixOfAll) {
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 0, u""), DiskAttrKey(20, 0, u"abc")), -1);
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 0, u"abc"), DiskAttrKey(20, 0, u"")), 1);
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 0, u""), DiskAttrKey(20, 0, u"")), 0);
}

TEST(CompareAttributes, StartBlocksDecideLastAndUnsigned) {
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 1, u"ab"), DiskAttrKey(20, 0, u"ab")), 1);
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 0, u"ab"), DiskAttrKey(20, 1, u"ab")), -1);
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 0x80000000u, u"ab"), DiskAttrKey(20, 1, u"ab")), 1);
    EXPECT_EQ(CompareAttr(HostAttrKey(20, 3, u"ab"), DiskAttrKey(20, 3, u"ab")), 0);
}

TEST(CompareAttributes, TheIdIsTheArgumentNotTheFieldOfTheSearchKey) {
    EXPECT_EQ(Compare(CompareAttrKeys, HostAttrKey(99, 0, u"a"), 5, DiskAttrKey(5, 0, u"a")), 0);
}

// ---- alignment

struct Alignment {
    CompareKeysFn compare;
    u32 fileId;
    int searchSite;
    int nodeSite;
};

class CompareAlignment : public ::testing::TestWithParam<Alignment> {
protected:
    // Compares the tree's first key with itself, the keys `searchShift` and `nodeShift` bytes off.
    int CompareShifted(u32 searchShift, u32 nodeShift) {
        const HostKey host = NthHostKey(GetParam().fileId, 0);
        const Bytes disk = NthDiskKey(GetParam().fileId, 0);
        alignas(8) u8 search[64];
        alignas(8) u8 node[64];
        std::copy(host.bytes, host.bytes + 48, search + searchShift);
        std::copy(disk.begin(), disk.end(), node + nodeShift);
        return GetParam().compare(reinterpret_cast<const BTreeKey*>(search + searchShift), host.id,
                                  reinterpret_cast<const BTreeKey*>(node + nodeShift));
    }

    Capture capture_;
};

TEST_P(CompareAlignment, ASearchKeyOffFourIsAssertedAndComparedAllTheSame) {
    EXPECT_EQ(CompareShifted(2, 0), 0);
    EXPECT_EQ(capture_.All(), Events{Asserted(GetParam().searchSite)});
}

TEST_P(CompareAlignment, ANodeKeyOffTwoIsAssertedAndComparedAllTheSame) {
    EXPECT_EQ(CompareShifted(0, 1), 0);
    EXPECT_EQ(capture_.All(), Events{Asserted(GetParam().nodeSite)});
}

TEST_P(CompareAlignment, ANodeKeyNeedsNoMoreThanTwo) {
    EXPECT_EQ(CompareShifted(0, 2), 0);
    EXPECT_EQ(CompareShifted(4, 6), 0);
    EXPECT_EQ(capture_.All(), Events{});
}

INSTANTIATE_TEST_SUITE_P(Comparators, CompareAlignment,
                         ::testing::Values(Alignment{CompareCatKeysCaseIns, 4, 70, 71},
                                           Alignment{CompareCatKeysCaseBin, 4, 123, 124},
                                           Alignment{CompareExtentKeysPlus, 3, 157, 158},
                                           Alignment{CompareAttrKeys, 8, 189, 190}));

}  // namespace
}  // namespace VELK::test
