// Decomposition, canonical ordering and composition of HFS+ names.
#include "hfs/names_decompose.h"

namespace VELK {
namespace {

struct Decomposition {
    u16 unit;
    u16 start;  // in kDecomposedUnits
    u8 count;
};
struct Composition {
    u16 first;
    u16 second;
    u16 unit;
};
struct CombiningClass {
    u16 unit;
    u8 value;
};

#include "hfs/names_compose.inc"
#include "hfs/names_decompose.inc"

// Hangul syllables are arithmetic: leading consonant, vowel, optional trailing consonant.
constexpr u32 kSyllableStart = 0xAC00;
constexpr u32 kSyllableCount = 11172;
constexpr u32 kLeadStart = 0x1100;
constexpr u32 kLeadCount = 19;
constexpr u32 kVowelStart = 0x1161;
constexpr u32 kVowelCount = 21;
constexpr u32 kTrailStart = 0x11A7;  // one before the first: trail 0 means none
constexpr u32 kTrailCount = 28;
static_assert(kSyllableCount == kLeadCount * kVowelCount * kTrailCount);

// The entry whose key is `wanted` in a table sorted by `Key`, or null.
template <typename Entry, unsigned Count, typename Key>
const Entry* FindSorted(const Entry (&table)[Count], u32 wanted, Key key) {
    unsigned low = 0;
    unsigned high = Count;
    while (low < high) {
        const unsigned middle = (low + high) / 2;
        if (key(table[middle]) < wanted) {
            low = middle + 1;
        } else {
            high = middle;
        }
    }
    return low < Count && key(table[low]) == wanted ? &table[low] : nullptr;
}

u8 ClassOf(u16 unit) {
    if (unit < kCombiningClasses[0].unit) {
        return 0;
    }
    const CombiningClass* entry =
        FindSorted(kCombiningClasses, unit, [](const CombiningClass& c) -> u32 { return c.unit; });
    return entry == nullptr ? u8{0} : entry->value;
}

// Puts the decomposition of one unit into `out`; returns the number of units.
unsigned DecomposeUnit(u16 unit, u16* out) {
    if (unit - kSyllableStart < kSyllableCount) {
        const u32 syllable = unit - kSyllableStart;
        const u32 trail = syllable % kTrailCount;
        out[0] = static_cast<u16>(kLeadStart + syllable / (kVowelCount * kTrailCount));
        out[1] = static_cast<u16>(kVowelStart + syllable / kTrailCount % kVowelCount);
        out[2] = static_cast<u16>(kTrailStart + trail);
        return trail == 0 ? 2 : 3;
    }
    const Decomposition* entry =
        unit < kDecompositions[0].unit
            ? nullptr
            : FindSorted(kDecompositions, unit,
                         [](const Decomposition& d) -> u32 { return d.unit; });
    if (entry == nullptr) {
        out[0] = unit;
        return 1;
    }
    for (unsigned i = 0; i < entry->count; ++i) {
        out[i] = kDecomposedUnits[entry->start + i];
    }
    return entry->count;
}

// Sorts every run of combining marks by class, stably. Runs are short, so by insertion; a name is
// at most 255 units, which bounds the work whatever it holds.
void OrderMarks(u16* units, unsigned count) {
    for (unsigned i = 1; i < count; ++i) {
        const u16 unit = units[i];
        const u8 unitClass = ClassOf(unit);
        if (unitClass == 0) {
            continue;
        }
        unsigned at = i;
        while (at > 0 && ClassOf(units[at - 1]) > unitClass) {
            units[at] = units[at - 1];
            --at;
        }
        units[at] = unit;
    }
}

// What two units compose to, or 0.
u16 ComposePair(u16 first, u16 second) {
    if (first - kLeadStart < kLeadCount && second - kVowelStart < kVowelCount) {
        const u32 lead = first - kLeadStart;
        const u32 vowel = second - kVowelStart;
        return static_cast<u16>(kSyllableStart + (lead * kVowelCount + vowel) * kTrailCount);
    }
    if (first - kSyllableStart < kSyllableCount && (first - kSyllableStart) % kTrailCount == 0 &&
        second - kTrailStart - 1 < kTrailCount - 1) {
        return static_cast<u16>(first + (second - kTrailStart));
    }
    const u32 pair = static_cast<u32>(first) << 16 | second;
    const Composition* entry = FindSorted(kCompositions, pair, [](const Composition& c) {
        return static_cast<u32>(c.first) << 16 | c.second;
    });
    return entry == nullptr ? u16{0} : entry->unit;
}

}  // namespace

bool DecomposeName(const u16* source, unsigned count, u16* target, unsigned capacity,
                   unsigned* targetCount) {
    unsigned filled = 0;
    for (unsigned i = 0; i < count; ++i) {
        u16 units[kMaxUnitDecomposition];
        const unsigned added = DecomposeUnit(source[i], units);
        if (added > capacity - filled) {
            return false;
        }
        for (unsigned k = 0; k < added; ++k) {
            target[filled++] = units[k];
        }
    }
    OrderMarks(target, filled);
    *targetCount = filled;
    return true;
}

unsigned ComposeName(u16* units, unsigned count) {
    bool hasStarter = false;
    unsigned starter = 0;  // where the last unit of class 0 stands
    u8 lastClass = 0;      // of the unit kept last, if that is not the starter
    unsigned kept = 0;
    for (unsigned i = 0; i < count; ++i) {
        const u16 unit = units[i];
        const u8 unitClass = ClassOf(unit);
        // A mark of the same or a higher class in between keeps the unit away from its starter.
        const bool isBlocked = kept != starter + 1 && lastClass >= unitClass;
        if (hasStarter && !isBlocked) {
            const u16 composed = ComposePair(units[starter], unit);
            if (composed != 0) {
                units[starter] = composed;
                continue;
            }
        }
        if (unitClass == 0) {
            hasStarter = true;
            starter = kept;
        }
        lastClass = unitClass;
        units[kept++] = unit;
    }
    return kept;
}

}  // namespace VELK
