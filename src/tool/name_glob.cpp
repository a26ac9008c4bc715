// Patterns for names.
#include "tool/name_glob.h"

#include "hfs/names.h"

namespace VELK::tool {

namespace {

// Whether `unit` is in the set that begins behind the bracket at `*at`; `*at` ends behind it. A
// bracket that is never closed stands for itself.
bool TakeSet(NameView pattern, std::size_t* at, char16_t unit) {
    std::size_t i = *at + 1;
    const bool negated = i < pattern.size() && (pattern[i] == '!' || pattern[i] == '^');
    i += negated ? 1u : 0u;
    bool inside = false;
    const std::size_t first = i;
    for (; i < pattern.size() && (pattern[i] != ']' || i == first); ++i) {
        if (i + 2 < pattern.size() && pattern[i + 1] == '-' && pattern[i + 2] != ']') {
            inside = inside || (unit >= pattern[i] && unit <= pattern[i + 2]);
            i += 2;
        } else {
            inside = inside || unit == pattern[i];
        }
    }
    if (i >= pattern.size()) {
        *at += 1;
        return unit == '[';
    }
    *at = i + 1;
    return inside != negated;
}

// Whether the pattern's element at `*at` takes `unit`; `*at` ends behind the element.
bool TakeOne(NameView pattern, std::size_t* at, char16_t unit) {
    switch (pattern[*at]) {
        case '?':
            *at += 1;
            return true;
        case '[':
            return TakeSet(pattern, at, unit);
        case '\\':
            *at += *at + 1 < pattern.size() ? 1u : 0u;
            break;
        default:
            break;
    }
    *at += 1;
    return pattern[*at - 1] == unit;
}

// One star is remembered at a time: a later one makes the earlier one's choice final.
bool Match(NameView pattern, NameView name) {
    std::size_t at = 0;
    std::size_t from = 0;
    std::size_t star = NameView::npos;
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
        if (star == NameView::npos) {
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

// Case is folded before composing: the folding table knows no composed letters.
NameUnits Prepared(const NameUnits& units, bool ignoreCase) {
    NameUnits decomposed = DecomposedUnits(units);
    if (ignoreCase) {
        Fold(&decomposed);
    }
    return ComposedUnits(decomposed);
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
