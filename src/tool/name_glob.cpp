// Patterns for names.
#include "tool/name_glob.h"

#include "hfs/names.h"

namespace VELK::tool {

namespace {

// Whether `point` is in the set that begins behind the bracket at `*at`; `*at` ends behind it. A
// bracket that is never closed stands for itself.
bool TakeSet(std::u32string_view pattern, std::size_t* at, char32_t point) {
    std::size_t i = *at + 1;
    const bool negated = i < pattern.size() && (pattern[i] == '!' || pattern[i] == '^');
    i += negated ? 1u : 0u;
    bool inside = false;
    const std::size_t first = i;
    for (; i < pattern.size() && (pattern[i] != ']' || i == first); ++i) {
        if (i + 2 < pattern.size() && pattern[i + 1] == '-' && pattern[i + 2] != ']') {
            inside = inside || (point >= pattern[i] && point <= pattern[i + 2]);
            i += 2;
        } else {
            inside = inside || point == pattern[i];
        }
    }
    if (i >= pattern.size()) {
        *at += 1;
        return point == '[';
    }
    *at = i + 1;
    return inside != negated;
}

// Whether the pattern's element at `*at` takes `point`; `*at` ends behind the element.
bool TakeOne(std::u32string_view pattern, std::size_t* at, char32_t point) {
    switch (pattern[*at]) {
        case '?':
            *at += 1;
            return true;
        case '[':
            return TakeSet(pattern, at, point);
        case '\\':
            *at += *at + 1 < pattern.size() ? 1u : 0u;
            break;
        default:
            break;
    }
    *at += 1;
    return pattern[*at - 1] == point;
}

// One star is remembered at a time: a later one makes the earlier one's choice final.
bool Match(std::u32string_view pattern, std::u32string_view name) {
    std::size_t at = 0;
    std::size_t from = 0;
    std::size_t star = std::u32string_view::npos;
    std::size_t starFrom = 0;
    while (from < name.size()) {
        if (at < pattern.size() && pattern[at] == '*') {
            star = ++at;
            starFrom = from;
            continue;
        }
        if (at < pattern.size() && TakeOne(pattern, &at, name[from])) {
            from += 1;
            continue;
        }
        if (star == std::u32string_view::npos) {
            return false;
        }
        at = star;
        from = ++starFrom;
    }
    while (at < pattern.size() && pattern[at] == '*') {
        at += 1;
    }
    return at == pattern.size();
}

void Fold(NameUnits* units) {
    for (char16_t& unit : *units) {
        const u16 folded = FoldHfsUnit(static_cast<u16>(unit));
        unit = folded != 0 ? static_cast<char16_t>(folded) : unit;
    }
}

bool IsPair(char16_t high, char16_t low) {
    return high >= 0xD800 && high < 0xDC00 && low >= 0xDC00 && low < 0xE000;
}

// Two units that stand for one character count once; half of them stands for itself.
std::u32string PointsOf(const NameUnits& units) {
    std::u32string points;
    points.reserve(units.size());
    for (std::size_t i = 0; i < units.size(); ++i) {
        if (i + 1 < units.size() && IsPair(units[i], units[i + 1])) {
            points += static_cast<char32_t>(0x10000 + ((units[i] - 0xD800) << 10) +
                                            (units[i + 1] - 0xDC00));
            i += 1;
        } else {
            points += units[i];
        }
    }
    return points;
}

// Case is folded before composing: the folding table knows no composed letters.
std::u32string Prepared(const NameUnits& units, bool ignoreCase) {
    NameUnits decomposed = DecomposedUnits(units);
    if (ignoreCase) {
        Fold(&decomposed);
    }
    return PointsOf(ComposedUnits(decomposed));
}

}  // namespace

NameGlob::NameGlob(const std::string& pattern, bool ignoreCase) : ignoreCase_(ignoreCase) {
    NameUnits units;
    VELK::UnitsFromUtf8(pattern, &units);
    pattern_ = Prepared(units, ignoreCase);
}

bool NameGlob::Matches(const u8* unitsBe, u32 count) const {
    const NameUnits name = PosixUnitsFromName(UnitsFromStored(unitsBe, count));
    return Match(pattern_, Prepared(name, ignoreCase_));
}

}  // namespace VELK::tool
