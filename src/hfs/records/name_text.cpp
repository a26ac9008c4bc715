// UTF-16 names to text and back.
#include "hfs/records/name_text.h"

#include <cstring>

namespace VELK {

namespace {

constexpr char kHexDigits[] = "0123456789abcdef";
constexpr u32 kVisibleNul = 0x2400;

bool IsHigh(u32 unit) {
    return unit >= 0xD800 && unit < 0xDC00;
}
bool IsLow(u32 unit) {
    return unit >= 0xDC00 && unit < 0xE000;
}

// Code points that show nothing, move the cursor, or turn the direction of a line.
bool IsUnfitForTerminal(u32 point) {
    return point < 0x20 || (point >= 0x7F && point < 0xA0) || point == 0xAD || point == 0x61C ||
           point == 0x180E || (point >= 0x200B && point <= 0x200F) ||
           (point >= 0x2028 && point <= 0x202E) || (point >= 0x2060 && point <= 0x206F) ||
           (point >= 0xD800 && point <= 0xDFFF) || point == 0xFEFF ||
           (point >= 0xFFF9 && point <= 0xFFFB) || (point & 0xFFFE) == 0xFFFE ||
           (point >= 0xE0000 && point <= 0xE007F);
}

char* PutUtf8(char* out, u32 point) {
    if (point < 0x80) {
        *out++ = static_cast<char>(point);
    } else if (point < 0x800) {
        *out++ = static_cast<char>(0xC0 | (point >> 6));
        *out++ = static_cast<char>(0x80 | (point & 0x3F));
    } else if (point < 0x10000) {
        *out++ = static_cast<char>(0xE0 | (point >> 12));
        *out++ = static_cast<char>(0x80 | ((point >> 6) & 0x3F));
        *out++ = static_cast<char>(0x80 | (point & 0x3F));
    } else {
        *out++ = static_cast<char>(0xF0 | (point >> 18));
        *out++ = static_cast<char>(0x80 | ((point >> 12) & 0x3F));
        *out++ = static_cast<char>(0x80 | ((point >> 6) & 0x3F));
        *out++ = static_cast<char>(0x80 | (point & 0x3F));
    }
    return out;
}

char* PutHex(char* out, u32 value, int digits) {
    for (int shift = 4 * (digits - 1); shift >= 0; shift -= 4) {
        *out++ = kHexDigits[(value >> shift) & 15];
    }
    return out;
}

char* PutUnitEscape(char* out, u32 unit) {
    *out++ = '\\';
    *out++ = 'u';
    return PutHex(out, unit, 4);
}

char* PutEscaped(char* out, u32 point) {
    if (point < 0x100) {
        *out++ = '\\';
        *out++ = 'x';
        return PutHex(out, point, 2);
    }
    if (point >= 0x10000) {
        out = PutUnitEscape(out, 0xD800 + ((point - 0x10000) >> 10));
        return PutUnitEscape(out, 0xDC00 + (point & 0x3FF));
    }
    return PutUnitEscape(out, point);
}

char* PutJsonPoint(char* out, u32 point) {
    if (point == '"' || point == '\\') {
        *out++ = '\\';
        *out++ = static_cast<char>(point);
        return out;
    }
    const bool escape = point < 0x20 || point == 0x7F || (point >= 0xD800 && point <= 0xDFFF);
    return escape ? PutUnitEscape(out, point) : PutUtf8(out, point);
}

// What PutJsonPoint writes as it is, one byte for one.
bool IsPlainJson(char byte) {
    return byte >= 0x20 && byte < 0x7F && byte != '"' && byte != '\\';
}

u32 Exchange(u32 unit) {
    switch (unit) {
        case '/':
            return ':';
        case ':':
            return '/';
        case 0:
            return kVisibleNul;
        default:
            return unit;
    }
}

// A stored colon would read as the separator, and U+2400 as NUL: these are escaped.
char* PutTextPoint(char* out, u32 stored) {
    if (stored == '\\') {
        *out++ = '\\';
        *out++ = '\\';
        return out;
    }
    const u32 shown = Exchange(stored);
    const bool misleads = stored == ':' || stored == kVisibleNul;
    return misleads || IsUnfitForTerminal(shown) ? PutEscaped(out, stored) : PutUtf8(out, shown);
}

// The code point at `*index` of the big-endian units; a lone surrogate stands for itself.
u32 TakePoint(const u8* unitsBe, u32 count, u32* index) {
    const u8* at = unitsBe + 2 * std::size_t{*index};
    const u32 unit = static_cast<u32>(at[0] << 8 | at[1]);
    *index += 1;
    if (IsHigh(unit) && *index < count) {
        const u32 next = static_cast<u32>(at[2] << 8 | at[3]);
        if (IsLow(next)) {
            *index += 1;
            return 0x10000 + ((unit - 0xD800) << 10) + (next - 0xDC00);
        }
    }
    return unit;
}

// The code point at `*index` of UTF-8 text; U+FFFD for a byte that starts none.
u32 TakeUtf8(std::string_view text, std::size_t* index) {
    const auto byte = [&](std::size_t at) { return static_cast<u32>(static_cast<u8>(text[at])); };
    const u32 first = byte(*index);
    *index += 1;
    if (first < 0x80) {
        return first;
    }
    const u32 extra = first >= 0xF0 && first < 0xF8 ? 3 : first >= 0xE0 ? 2 : 1;
    if (first < 0xC2 || first >= 0xF8 || *index + extra > text.size()) {
        return 0xFFFD;
    }
    u32 point = first & (0x3Fu >> extra);
    for (u32 i = 0; i < extra; ++i) {
        const u32 next = byte(*index + i);
        if ((next & 0xC0) != 0x80) {
            return 0xFFFD;
        }
        point = point << 6 | (next & 0x3F);
    }
    constexpr u32 kLeast[] = {0, 0x80, 0x800, 0x10000};
    if (point < kLeast[extra] || point > 0x10FFFF || (point >= 0xD800 && point <= 0xDFFF)) {
        return 0xFFFD;
    }
    *index += extra;
    return point;
}

void AppendUnits(std::u16string* out, u32 point) {
    if (point >= 0x10000) {
        out->push_back(static_cast<char16_t>(0xD800 + ((point - 0x10000) >> 10)));
        out->push_back(static_cast<char16_t>(0xDC00 + (point & 0x3FF)));
    } else {
        out->push_back(static_cast<char16_t>(point));
    }
}

int HexValue(char digit) {
    const char* found = digit != 0 ? std::strchr(kHexDigits, digit | 0x20) : nullptr;
    return found != nullptr ? static_cast<int>(found - kHexDigits) : -1;
}

// Reads an escape that begins at `at`: the unit in `*unit` and its length, or 0 for none.
std::size_t ReadEscape(std::string_view text, std::size_t at, u32* unit) {
    if (at + 1 >= text.size() || text[at] != '\\') {
        return 0;
    }
    if (text[at + 1] == '\\') {
        *unit = '\\';
        return 2;
    }
    const std::size_t digits = text[at + 1] == 'x' ? 2 : text[at + 1] == 'u' ? 4 : 0;
    if (digits == 0 || at + 2 + digits > text.size()) {
        return 0;
    }
    *unit = 0;
    for (std::size_t i = 0; i < digits; ++i) {
        const int value = HexValue(text[at + 2 + i]);
        if (value < 0) {
            return 0;
        }
        *unit = *unit << 4 | static_cast<u32>(value);
    }
    return 2 + digits;
}

}  // namespace

char* PutName(char* out, const u8* unitsBe, u32 count, NameForm form) {
    for (u32 index = 0; index < count;) {
        const u32 ascii = unitsBe[2 * std::size_t{index} + 1];
        if (unitsBe[2 * std::size_t{index}] == 0 && ascii >= 0x20 && ascii < 0x7F && ascii != '/' &&
            ascii != ':' && ascii != '\\' && ascii != '"') {
            *out++ = static_cast<char>(ascii);
            index += 1;
            continue;
        }
        const u32 stored = TakePoint(unitsBe, count, &index);
        switch (form) {
            case NameForm::kText:
                out = PutTextPoint(out, stored);
                break;
            case NameForm::kRaw:
                out = PutUtf8(out, Exchange(stored));
                break;
            case NameForm::kJson:
                out = PutJsonPoint(out, Exchange(stored));
                break;
        }
    }
    return out;
}

void AppendName(std::string* out, const u8* unitsBe, u32 count, NameForm form) {
    const std::size_t start = out->size();
    out->resize(start + std::size_t{count} * kNameBytesPerUnit);
    const char* end = PutName(out->data() + start, unitsBe, count, form);
    out->resize(static_cast<std::size_t>(end - out->data()));
}

std::string NameText(const u8* unitsBe, u32 count) {
    std::string text;
    AppendName(&text, unitsBe, count, NameForm::kText);
    return text;
}

void AppendJsonUnits(std::string* out, const u8* unitsBe, u32 count) {
    char piece[2 * kNameBytesPerUnit];
    for (u32 index = 0; index < count;) {
        const u32 point = TakePoint(unitsBe, count, &index);
        out->append(piece, static_cast<std::size_t>(PutJsonPoint(piece, point) - piece));
    }
}

void AppendJsonText(std::string* out, std::string_view text) {
    char piece[2 * kNameBytesPerUnit];
    for (std::size_t index = 0; index < text.size();) {
        const std::size_t start = index;
        while (index < text.size() && IsPlainJson(text[index])) {
            index += 1;
        }
        out->append(text, start, index - start);
        if (index < text.size()) {
            const u32 point = TakeUtf8(text, &index);
            out->append(piece, static_cast<std::size_t>(PutJsonPoint(piece, point) - piece));
        }
    }
}

std::string EscapedText(std::string_view text) {
    std::string result;
    char piece[2 * kNameBytesPerUnit];
    for (std::size_t index = 0; index < text.size();) {
        const u32 point = TakeUtf8(text, &index);
        // A backslash stays single here: the text may hold names that are escaped already.
        const char* end =
            IsUnfitForTerminal(point) ? PutEscaped(piece, point) : PutUtf8(piece, point);
        result.append(piece, static_cast<std::size_t>(end - piece));
    }
    return result;
}

std::u16string UnitsFromPath(std::string_view component) {
    std::u16string units;
    for (std::size_t index = 0; index < component.size();) {
        u32 unit = 0;
        const std::size_t length = ReadEscape(component, index, &unit);
        if (length != 0) {
            index += length;
            units.push_back(static_cast<char16_t>(unit));
            continue;
        }
        const u32 point = TakeUtf8(component, &index);
        AppendUnits(&units, point == kVisibleNul ? 0 : point == ':' ? '/' : point);
    }
    return units;
}

}  // namespace VELK
