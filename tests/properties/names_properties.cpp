// Names: their order, their forms, the ways they are written.
#include <gtest/gtest.h>

#include "draws.h"
#include "hfs/names.h"
#include "hfs/records/json_reader.h"
#include "hfs/records/name_text.h"

namespace VELK {
namespace {

using Comparator = int (*)(const void*, unsigned, const void*, unsigned);

int Sign(int value) {
    return (value > 0) - (value < 0);
}

int Compare(Comparator comparator, const Units& a, const Units& b) {
    return Sign(comparator(a.data(), static_cast<unsigned>(a.size()), Stored(b).data(),
                           static_cast<unsigned>(b.size())));
}

// A tree is searched and changed correctly only while this holds.
void IsAStrictWeakOrder(Comparator comparator, const Units& a, const Units& b, const Units& c) {
    const int ab = Compare(comparator, a, b);
    const int bc = Compare(comparator, b, c);
    const int ac = Compare(comparator, a, c);
    RC_TAG(ab == 0 || bc == 0 || ac == 0 ? "some are equal" : "none are equal");
    RC_ASSERT(Compare(comparator, a, a) == 0);
    RC_ASSERT(Compare(comparator, b, a) == -ab);
    if (ab <= 0 && bc <= 0) {
        RC_ASSERT(ac == (ab == 0 && bc == 0 ? 0 : -1));
    }
    if (ab == 0) {
        RC_ASSERT(ac == bc);
    }
}

RC_GTEST_PROP(NamesInOrder, FoldedNamesAreStrictlyWeaklyOrdered, ()) {
    IsAStrictWeakOrder(CompareHfsNamesIns, *AlikeName(), *AlikeName(), *AlikeName());
    IsAStrictWeakOrder(CompareHfsNamesIns, *AnyName(255), *AnyName(255), *AnyName(255));
}

RC_GTEST_PROP(NamesInOrder, BinaryNamesAreStrictlyWeaklyOrdered, ()) {
    IsAStrictWeakOrder(CompareHfsNamesBin, *AlikeName(), *AlikeName(), *AlikeName());
    IsAStrictWeakOrder(CompareHfsNamesBin, *AnyName(255), *AnyName(255), *AnyName(255));
}

RC_GTEST_PROP(NamesInOrder, IgnorableUnitChangesNoComparison, ()) {
    const Units name = *AnyName(255);
    Units longer = name;
    const auto at = *rc::gen::inRange<std::size_t>(0, name.size() + 1);
    longer.insert(longer.begin() + static_cast<std::ptrdiff_t>(at),
                  *rc::gen::element<u16>(0x200C, 0x200D, 0x202A, 0xFEFF));
    const Units other = *AlikeName();
    RC_ASSERT(Compare(CompareHfsNamesIns, name, longer) == 0);
    RC_ASSERT(Compare(CompareHfsNamesIns, name, other) ==
              Compare(CompareHfsNamesIns, longer, other));
    RC_ASSERT(Compare(CompareHfsNamesIns, other, name) ==
              Compare(CompareHfsNamesIns, other, longer));
}

RC_GTEST_PROP(NameForms, DecomposedNameStaysAsItIs, ()) {
    const NameUnits decomposed = DecomposedUnits(InHostOrder(*AnyName(255)));
    RC_ASSERT(DecomposedUnits(decomposed) == decomposed);
}

RC_GTEST_PROP(NameForms, ComposingLosesNothing, ()) {
    const NameUnits decomposed = DecomposedUnits(InHostOrder(*AnyName(255)));
    RC_ASSERT(DecomposedUnits(ComposedUnits(decomposed)) == decomposed);
}

RC_GTEST_PROP(NameForms, Utf8ComesBack, ()) {
    const NameUnits units = InHostOrder(*AnyName(255));
    NameUnits back;
    RC_ASSERT(UnitsFromUtf8(Utf8FromUnits(units), &back));
    RC_ASSERT(back == units);
}

// Whatever a listing prints can be typed.
RC_GTEST_PROP(NameForms, PrintedComponentNamesTheSameItem, ()) {
    const Units units = *AnyName(255);
    const std::string text = NameText(Stored(units).data(), static_cast<u32>(units.size()));
    RC_ASSERT(UnitsFromPath(text) == InHostOrder(units));
    RC_ASSERT(text.find('/') == std::string::npos);
}

RC_GTEST_PROP(NameForms, JsonStringComesBack, ()) {
    const Units units = *AnyName(255);
    std::string text = "\"";
    AppendJsonUnits(&text, Stored(units).data(), static_cast<u32>(units.size()));
    JsonValue value;
    std::string fault;
    RC_ASSERT(ReadJson(text + "\"", &value, &fault));
    RC_ASSERT(value.units == InHostOrder(units));
}

}  // namespace
}  // namespace VELK
