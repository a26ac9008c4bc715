// Names between UTF-8 and UTF-16, composed and decomposed, stored and shown.
#include "hfs/names_text.h"

#include <algorithm>
#include <vector>

#include "hfs/names_decompose.h"

namespace VELK {
namespace {

constexpr u32 kHighStart = 0xD800;
constexpr u32 kLowStart = 0xDC00;
constexpr u32 kSurrogateEnd = 0xE000;
constexpr u32 kSupplementary = 0x10000;
constexpr u32 kCodePointEnd = 0x110000;
constexpr char16_t kVisibleNul = 0x2400;

bool IsHigh(u32 unit) {
    return unit >= kHighStart && unit < kLowStart;
}
bool IsLow(u32 unit) {
    return unit >= kLowStart && unit < kSurrogateEnd;
}

void AppendUtf8(u32 point, std::string* text) {
    const auto tail = [&](unsigned shift) {
        text->push_back(static_cast<char>(0x80 | ((point >> shift) & 0x3F)));
    };
    if (point < 0x80) {
        text->push_back(static_cast<char>(point));
    } else if (point < 0x800) {
        text->push_back(static_cast<char>(0xC0 | (point >> 6)));
        tail(0);
    } else if (point < kSupplementary) {
        text->push_back(static_cast<char>(0xE0 | (point >> 12)));
        tail(6);
        tail(0);
    } else {
        text->push_back(static_cast<char>(0xF0 | (point >> 18)));
        tail(12);
        tail(6);
        tail(0);
    }
}

// Decodes the code point at `*at` and moves `*at` past it; false for bytes that are none,
// overlong forms included.
bool DecodeUtf8(std::string_view text, std::size_t* at, u32* point) {
    const u32 lead = static_cast<u8>(text[(*at)++]);
    if (lead < 0x80) {
        *point = lead;
        return true;
    }
    const unsigned more = lead >= 0xF0 ? 3 : lead >= 0xE0 ? 2 : 1;
    if (lead < 0xC2 || lead > 0xF4 || text.size() - *at < more) {
        return false;
    }
    u32 value = lead & (0x3Fu >> more);
    for (unsigned i = 0; i < more; ++i) {
        const u32 byte = static_cast<u8>(text[(*at)++]);
        if ((byte & 0xC0) != 0x80) {
            return false;
        }
        value = value << 6 | (byte & 0x3F);
    }
    constexpr u32 kLeast[] = {0x80, 0x800, kSupplementary};
    *point = value;
    return value >= kLeast[more - 1] && value < kCodePointEnd;
}

NameUnits Replaced(NameView units, char16_t (*replace)(char16_t)) {
    NameUnits result(units);
    for (char16_t& unit : result) {
        unit = replace(unit);
    }
    return result;
}

// Such names are the same in either form.
bool IsAscii(NameView units) {
    return std::all_of(units.begin(), units.end(), [](char16_t unit) { return unit < 0x80; });
}

}  // namespace

NameUnits UnitsFromStored(const void* bytes, unsigned count) {
    const u8* stored = static_cast<const u8*>(bytes);
    NameUnits units;
    units.reserve(count);
    for (unsigned i = 0; i < count; ++i, stored += 2) {
        units.push_back(static_cast<char16_t>((stored[0] << 8) | stored[1]));
    }
    return units;
}

std::string Utf8FromUnits(NameView units) {
    std::string text;
    text.reserve(units.size());
    for (std::size_t i = 0; i < units.size(); ++i) {
        u32 point = units[i];
        if (IsHigh(point) && i + 1 < units.size() && IsLow(units[i + 1])) {
            point = kSupplementary + ((point - kHighStart) << 10) + (units[++i] - kLowStart);
        }
        AppendUtf8(point, &text);
    }
    return text;
}

bool UnitsFromUtf8(std::string_view text, NameUnits* units) {
    units->clear();
    for (std::size_t at = 0; at < text.size();) {
        u32 point = 0;
        if (!DecodeUtf8(text, &at, &point)) {
            return false;
        }
        if (point < kSupplementary) {
            units->push_back(static_cast<char16_t>(point));
        } else {
            point -= kSupplementary;
            units->push_back(static_cast<char16_t>(kHighStart + (point >> 10)));
            units->push_back(static_cast<char16_t>(kLowStart + (point & 0x3FF)));
        }
    }
    return true;
}

NameUnits DecomposedUnits(NameView units) {
    if (IsAscii(units)) {
        return NameUnits(units);
    }
    const std::vector<u16> source(units.begin(), units.end());
    std::vector<u16> target(source.size() * kMaxUnitDecomposition);
    unsigned count = 0;
    DecomposeName(source.data(), static_cast<unsigned>(source.size()), target.data(),
                  static_cast<unsigned>(target.size()), &count);
    return NameUnits(target.begin(), target.begin() + count);
}

NameUnits ComposedUnits(NameView units) {
    if (IsAscii(units)) {
        return NameUnits(units);
    }
    std::vector<u16> result(units.begin(), units.end());
    const unsigned count = ComposeName(result.data(), static_cast<unsigned>(result.size()));
    return NameUnits(result.begin(), result.begin() + count);
}

NameUnits PosixUnitsFromName(NameView units) {
    return Replaced(units, [](char16_t unit) -> char16_t {
        return unit == u'/' ? u':' : unit == u':' ? u'/' : unit == 0 ? kVisibleNul : unit;
    });
}

NameUnits NameUnitsFromPosix(NameView units) {
    return Replaced(units, [](char16_t unit) -> char16_t {
        return unit == u'/' ? u':' : unit == u':' ? u'/' : unit == kVisibleNul ? u'\0' : unit;
    });
}

}  // namespace VELK
