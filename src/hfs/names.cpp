// The two orders of HFS+ names and the folding table behind one of them. Works on the names where
// they lie: nothing is copied, nothing allocated.
#include "hfs/names.h"

#include <bit>
#include <cstring>

namespace VELK {
namespace {

#include "hfs/names_fold.inc"

u16 HostUnit(const u8* name, unsigned index) {
    u16 unit;
    std::memcpy(&unit, name + 2 * static_cast<std::size_t>(index), sizeof unit);
    return unit;
}

u16 StoredUnit(const u8* name, unsigned index) {
    const u8* unit = name + 2 * static_cast<std::size_t>(index);
    return static_cast<u16>((unit[0] << 8) | unit[1]);
}

// True for the units that fold without the table: ASCII save NUL, which sorts last.
bool IsPlainAscii(u16 unit) {
    return unit - 1u < 0x7Fu;
}

u16 FoldAscii(u16 unit) {
    return unit >= u'A' && unit <= u'Z' ? static_cast<u16>(unit + 0x20) : unit;
}

int Sign(u16 first, u16 second) {
    return first < second ? -1 : 1;
}

unsigned Least(unsigned a, unsigned b) {
    return a < b ? a : b;
}

constexpr unsigned kUnitsInWord = 4;

// How far the units in a word of a name and in one of a stored name are equal, on a host whose
// words begin with the lowest byte.
unsigned EqualInWords(const u8* name, const u8* stored) {
    constexpr u64 kLowBytes = 0x00FF00FF00FF00FFu;
    u64 a;
    u64 b;
    std::memcpy(&a, name, sizeof a);
    std::memcpy(&b, stored, sizeof b);
    const u64 different = a ^ ((b & kLowBytes) << 8 | (b >> 8 & kLowBytes));
    return static_cast<unsigned>(std::countr_zero(different)) / 16;
}

// How many of the first `count` units of a name and a stored name are equal before the first that
// are not.
unsigned EqualUnits(const u8* name, const u8* stored, unsigned count) {
    unsigned i = 0;
    if constexpr (std::endian::native == std::endian::little) {
        for (; i + kUnitsInWord <= count; i += kUnitsInWord) {
            const unsigned equal =
                EqualInWords(name + 2 * std::size_t{i}, stored + 2 * std::size_t{i});
            if (equal < kUnitsInWord) {
                return i + equal;
            }
        }
    }
    while (i < count && HostUnit(name, i) == StoredUnit(stored, i)) {
        ++i;
    }
    return i;
}

}  // namespace

u16 FoldHfsUnit(u16 unit) {
    const u8 page = kFoldPage[unit >> 8];
    return page == 0 ? unit : kFoldUnits[page - 1][unit & 0xFF];
}

int CompareHfsNamesIns(const void* first, unsigned firstLength, const void* second,
                       unsigned secondLength) {
    const u8* firstName = static_cast<const u8*>(first);
    const u8* secondName = static_cast<const u8*>(second);
    unsigned i = 0;
    unsigned j = 0;
    for (;;) {
        // Equal units fold alike, so both names go on together; most of a comparison ends here.
        while (i < firstLength && j < secondLength) {
            const unsigned equal =
                EqualUnits(firstName + 2 * std::size_t{i}, secondName + 2 * std::size_t{j},
                           Least(firstLength - i, secondLength - j));
            i += equal;
            j += equal;
            if (i == firstLength || j == secondLength) {
                break;
            }
            const u16 a = HostUnit(firstName, i);
            const u16 b = StoredUnit(secondName, j);
            if (!IsPlainAscii(a) || !IsPlainAscii(b)) {
                break;
            }
            const u16 x = FoldAscii(a);
            const u16 y = FoldAscii(b);
            if (x != y) {
                return Sign(x, y);
            }
            ++i;
            ++j;
        }
        // The next unit of each that counts; 0 at the end of a name.
        u16 x = 0;
        u16 y = 0;
        while (x == 0 && i < firstLength) {
            x = FoldHfsUnit(HostUnit(firstName, i++));
        }
        while (y == 0 && j < secondLength) {
            y = FoldHfsUnit(StoredUnit(secondName, j++));
        }
        if (x != y) {
            return Sign(x, y);
        }
        if (x == 0) {
            return 0;
        }
    }
}

int CompareHfsNamesBin(const void* first, unsigned firstLength, const void* second,
                       unsigned secondLength) {
    const u8* firstName = static_cast<const u8*>(first);
    const u8* secondName = static_cast<const u8*>(second);
    const unsigned common = Least(firstLength, secondLength);
    const unsigned i = EqualUnits(firstName, secondName, common);
    if (i < common) {
        return Sign(HostUnit(firstName, i), StoredUnit(secondName, i));
    }
    return firstLength == secondLength ? 0 : firstLength < secondLength ? -1 : 1;
}

}  // namespace VELK
