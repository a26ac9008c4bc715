// Quoted strings, numbers and hexadecimal bytes.
#include "hfs/records/quoted.h"

#include <charconv>

namespace VELK {
namespace {

constexpr char kHexDigits[] = "0123456789abcdef";

int HexValue(char digit) {
    if (digit >= '0' && digit <= '9') {
        return digit - '0';
    }
    const char lower = static_cast<char>(digit | 0x20);
    return lower >= 'a' && lower <= 'f' ? lower - 'a' + 10 : -1;
}

// Units that show nothing, move the cursor or turn the direction of a line; and halves of pairs.
bool IsUnfit(u32 unit) {
    return unit < 0x20 || (unit >= 0x7F && unit < 0xA0) || unit == 0xAD || unit == 0x61C ||
           unit == 0x180E || (unit >= 0x200B && unit <= 0x200F) ||
           (unit >= 0x2028 && unit <= 0x202E) || (unit >= 0x2060 && unit <= 0x206F) ||
           (unit >= 0xD800 && unit <= 0xDFFF) || unit == 0xFEFF || unit >= 0xFFF9;
}

void AppendEscape(u32 unit, std::string* text) {
    *text += "\\u";
    for (int shift = 12; shift >= 0; shift -= 4) {
        text->push_back(kHexDigits[(unit >> shift) & 15]);
    }
}

bool AppendRun(std::string_view run, Typed typed, NameUnits* units) {
    if (run.empty()) {
        return true;
    }
    NameUnits part;
    if (!VELK::UnitsFromUtf8(run, &part)) {
        return false;
    }
    *units += typed == Typed::kDecomposed ? DecomposedUnits(part) : part;
    return true;
}

// Reads the escape behind the backslash at `at`; returns the characters it takes, 0 for none.
std::size_t TakeEscape(std::string_view text, std::size_t at, char16_t* unit) {
    if (at + 1 >= text.size()) {
        return 0;
    }
    constexpr std::string_view kNames = "\"\\/bfnrt";
    constexpr char16_t kUnits[] = {u'"', u'\\', u'/', u'\b', u'\f', u'\n', u'\r', u'\t'};
    const std::size_t known = kNames.find(text[at + 1]);
    if (known != std::string_view::npos) {
        *unit = kUnits[known];
        return 2;
    }
    if (text[at + 1] != 'u' || text.size() - at < 6) {
        return 0;
    }
    int value = 0;
    for (std::size_t i = 2; i < 6; ++i) {
        const int digit = HexValue(text[at + i]);
        if (digit < 0) {
            return 0;
        }
        value = value << 4 | digit;
    }
    *unit = static_cast<char16_t>(value);
    return 6;
}

}  // namespace

bool TakeQuoted(std::string_view text, std::size_t* at, Typed typed, NameUnits* units) {
    if (*at >= text.size() || text[*at] != '"') {
        return false;
    }
    units->clear();
    std::size_t run = *at + 1;
    for (std::size_t i = run; i < text.size();) {
        if (text[i] == '"') {
            *at = i + 1;
            return AppendRun(text.substr(run, i - run), typed, units);
        }
        if (text[i] != '\\') {
            ++i;
            continue;
        }
        char16_t unit = 0;
        const std::size_t length = TakeEscape(text, i, &unit);
        if (length == 0 || !AppendRun(text.substr(run, i - run), typed, units)) {
            return false;
        }
        units->push_back(unit);
        i += length;
        run = i;
    }
    return false;
}

std::string QuotedUnits(NameView units, Typed typed, Blanks blanks) {
    bool isAscii = true;
    for (const char16_t unit : units) {
        isAscii = isAscii && unit < 0x80;
    }
    // A script would take $i, $j and $k for the number of a repetition.
    const auto isCounter = [&](std::size_t at) {
        return units[at] == '$' && at + 1 < units.size() && units[at + 1] >= 'i' &&
               units[at + 1] <= 'k';
    };
    // Read back, text is decomposed once more; where that would change it, escapes say it all.
    const bool isPlain = isAscii || typed == Typed::kAsIs || DecomposedUnits(units) == units;
    std::string text = "\"";
    for (std::size_t i = 0; i < units.size(); ++i) {
        const u32 unit = units[i];
        const bool isPair = unit >= 0xD800 && unit < 0xDC00 && i + 1 < units.size() &&
                            units[i + 1] >= 0xDC00 && units[i + 1] < 0xE000;
        if (isPair && isPlain) {
            text += Utf8FromUnits(units.substr(i++, 2));
        } else if (unit == '"' || unit == '\\') {
            text.push_back('\\');
            text.push_back(static_cast<char>(unit));
        } else if (IsUnfit(unit) || (unit >= 0x80 && !isPlain) ||
                   (unit == ' ' && blanks == Blanks::kEscaped) || isCounter(i)) {
            AppendEscape(unit, &text);
        } else if (unit < 0x80) {
            text.push_back(static_cast<char>(unit));
        } else {
            text += Utf8FromUnits(units.substr(i, 1));
        }
    }
    text.push_back('"');
    return text;
}

bool ParseNumber(std::string_view text, u64 most, u64* number) {
    const bool isHex = text.starts_with("0x") || text.starts_with("0X");
    const std::string_view digits = isHex ? text.substr(2) : text;
    const char* end = digits.data() + digits.size();
    u64 value = 0;
    const auto result = std::from_chars(digits.data(), end, value, isHex ? 16 : 10);
    if (digits.empty() || result.ec != std::errc() || result.ptr != end || value > most) {
        return false;
    }
    *number = value;
    return true;
}

Problem ParseHexBytes(std::string_view digits, std::string_view form, std::vector<u8>* bytes) {
    bytes->clear();
    bytes->reserve(digits.size() / 2);
    std::size_t count = 0;
    int high = 0;
    for (const char digit : digits) {
        if (digit == ' ' || digit == '\t') {
            continue;
        }
        const int value = HexValue(digit);
        ++count;
        if (value < 0) {
            return UsageProblem(std::string(form) + ": '" + digit + "' at digit " +
                                    std::to_string(count) + " is not hexadecimal",
                                "");
        }
        if (count % 2 == 0) {
            bytes->push_back(static_cast<u8>(high << 4 | value));
        }
        high = value;
    }
    if (count % 2 != 0) {
        return UsageProblem(std::string(form) + ": " + std::to_string(count) +
                                " digits are no whole number of bytes",
                            "");
    }
    return {};
}

std::string HexText(const u8* bytes, std::size_t size) {
    std::string text(2 * size, '0');
    for (std::size_t i = 0; i < size; ++i) {
        text[2 * i] = kHexDigits[bytes[i] >> 4];
        text[2 * i + 1] = kHexDigits[bytes[i] & 15];
    }
    return text;
}

}  // namespace VELK
