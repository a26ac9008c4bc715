// Numbers and dates.
#include "hfs/records/text_format.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <iterator>

#include "hfs/names_text.h"
#include "hfs/volume/problem.h"
#include "hfs/volume/volume_header.h"

namespace VELK {

namespace {

struct Civil {
    int year;
    unsigned month;
    unsigned day;
    unsigned hour;
    unsigned minute;
    unsigned second;
};

// Days since 1970 of a date of the proleptic Gregorian calendar, counted in eras of 400 years that
// begin on the first of March.
s64 DaysFromCivil(s64 year, unsigned month, unsigned day) {
    year -= month <= 2 ? 1 : 0;
    const s64 era = (year >= 0 ? year : year - 399) / 400;
    const s64 yearOfEra = year - era * 400;
    const s64 dayOfYear = (153 * (month > 2 ? month - 3 : month + 9) + 2) / 5 + day - 1;
    return era * 146097 + yearOfEra * 365 + yearOfEra / 4 - yearOfEra / 100 + dayOfYear - 719468;
}

Civil CivilFromDate(u32 date) {
    const s64 unixSeconds = s64{date} - s64{kUnixEpoch};
    const s64 days = (unixSeconds >= 0 ? unixSeconds : unixSeconds - 86399) / 86400;
    const unsigned rest = static_cast<unsigned>(unixSeconds - days * 86400);
    const s64 shifted = days + 719468;
    const s64 era = shifted / 146097;
    const s64 dayOfEra = shifted - era * 146097;
    const s64 yearOfEra = (dayOfEra - dayOfEra / 1460 + dayOfEra / 36524 - dayOfEra / 146096) / 365;
    const s64 dayOfYear = dayOfEra - (365 * yearOfEra + yearOfEra / 4 - yearOfEra / 100);
    const s64 monthIndex = (5 * dayOfYear + 2) / 153;
    const s64 month = monthIndex < 10 ? monthIndex + 3 : monthIndex - 9;
    return {static_cast<int>(yearOfEra + era * 400 + (month <= 2 ? 1 : 0)),
            static_cast<unsigned>(month),
            static_cast<unsigned>(dayOfYear - (153 * monthIndex + 2) / 5 + 1),
            rest / 3600,
            rest / 60 % 60,
            rest % 60};
}

char* PutTwo(char* out, unsigned value, char after) {
    out[0] = static_cast<char>('0' + value / 10);
    out[1] = static_cast<char>('0' + value % 10);
    out[2] = after;
    return out + 3;
}

std::string Scaled(u64 bytes, u64 step, const char* const* units) {
    double value = static_cast<double>(bytes);
    int unit = 0;
    while (value >= static_cast<double>(step) && unit < 5) {
        value /= static_cast<double>(step);
        unit += 1;
    }
    const bool whole = unit == 0 || value >= 100 || value == static_cast<double>(u64(value));
    return Format(whole ? "%.0f %s" : "%.1f %s", value, units[unit]);
}

struct Columns {
    char16_t first;
    char16_t last;
    std::size_t width;
};
// Units that do not take one column. A surrogate pair counts at its first half: the planes of
// pictures and of further ideographs are wide.
constexpr Columns kColumns[] = {
    {0x0300, 0x036F, 0}, {0x0483, 0x0489, 0}, {0x0591, 0x05BD, 0}, {0x064B, 0x065F, 0},
    {0x093C, 0x093C, 0}, {0x094D, 0x094D, 0}, {0x0E31, 0x0E31, 0}, {0x0E34, 0x0E3A, 0},
    {0x0E47, 0x0E4E, 0}, {0x1100, 0x115F, 2}, {0x1160, 0x11FF, 0}, {0x200B, 0x200F, 0},
    {0x20D0, 0x20FF, 0}, {0x2E80, 0x303E, 2}, {0x3041, 0x3098, 2}, {0x3099, 0x309A, 0},
    {0x309B, 0xA4CF, 2}, {0xAC00, 0xD7A3, 2}, {0xD83C, 0xD83E, 2}, {0xD840, 0xD8BF, 2},
    {0xDC00, 0xDFFF, 0}, {0xF900, 0xFAFF, 2}, {0xFE00, 0xFE0F, 0}, {0xFE20, 0xFE2F, 0},
    {0xFE30, 0xFE6F, 2}, {0xFF00, 0xFF60, 2}, {0xFFE0, 0xFFE6, 2},
};

}  // namespace

std::size_t ShownWidth(std::string_view text) {
    NameUnits units;
    if (!UnitsFromUtf8(text, &units)) {
        return text.size();
    }
    std::size_t width = units.size();
    for (const char16_t unit : units) {
        const auto* const odd = std::lower_bound(
            std::begin(kColumns), std::end(kColumns), unit,
            [](const Columns& each, char16_t sought) { return each.last < sought; });
        width += odd != std::end(kColumns) && unit >= odd->first ? odd->width - 1 : 0;
    }
    return width;
}

std::string Padded(std::string text, std::size_t width) {
    const std::size_t shown = ShownWidth(text);
    text.append(width > shown ? width - shown : 0, ' ');
    return text;
}

char* PutDate(char* out, u32 date) {
    if (date == 0) {
        std::memset(out, ' ', kDateWidth);
        out[0] = '-';
        return out + kDateWidth;
    }
    const Civil civil = CivilFromDate(date);
    const unsigned year = static_cast<unsigned>(civil.year);
    out[0] = static_cast<char>('0' + year / 1000);
    out[1] = static_cast<char>('0' + year / 100 % 10);
    out = PutTwo(out + 2, year % 100, '-');
    out = PutTwo(out, civil.month, '-');
    out = PutTwo(out, civil.day, ' ');
    out = PutTwo(out, civil.hour, ':');
    out = PutTwo(out, civil.minute, ':');
    return PutTwo(out, civil.second, 'Z');
}

std::string DateText(u32 date) {
    if (date == 0) {
        return "-";
    }
    char text[kDateWidth];
    return {text, static_cast<std::size_t>(PutDate(text, date) - text)};
}

std::string DateIso(u32 date) {
    if (date == 0) {
        return "";
    }
    std::string text = DateText(date);
    text[10] = 'T';
    return text;
}

bool ParseDate(const std::string& text, u32* date) {
    int year = 0;
    unsigned month = 0, day = 0, hour = 0, minute = 0, second = 0;
    int used = 0;
    int end = 0;
    // The widths keep every number far below what its type holds.
    // NOLINTNEXTLINE(cert-err34-c)
    if (std::sscanf(text.c_str(), "%4d-%2u-%2u%n", &year, &month, &day, &used) != 3) {
        return false;
    }
    if (static_cast<std::size_t>(used) < text.size()) {
        const char* rest = text.c_str() + used;
        if (*rest != 'T' && *rest != ' ') {
            return false;
        }
        // NOLINTNEXTLINE(cert-err34-c)
        if (std::sscanf(rest + 1, "%2u:%2u:%2u%n", &hour, &minute, &second, &end) != 3) {
            return false;
        }
        rest += 1 + end;
        if (*rest != 0 && std::strcmp(rest, "Z") != 0) {
            return false;
        }
    }
    if (month < 1 || month > 12 || day < 1 || day > 31 || hour > 23 || minute > 59 || second > 60) {
        return false;
    }
    const s64 value = DaysFromCivil(year, month, day) * 86400 + hour * 3600 + minute * 60 + second +
                      s64{kUnixEpoch};
    if (value < 1 || value > s64{0xFFFFFFFF}) {
        return false;
    }
    *date = static_cast<u32>(value);
    return true;
}

std::string ShortBytes(u64 bytes) {
    static const char* const kUnits[] = {"B", "kB", "MB", "GB", "TB", "PB"};
    return Scaled(bytes, 1000, kUnits);
}

std::string BinaryBytes(u64 bytes) {
    static const char* const kUnits[] = {"B", "KiB", "MiB", "GiB", "TiB", "PiB"};
    return Scaled(bytes, 1024, kUnits);
}

std::string Counted(u64 count, const char* singular, const char* plural) {
    return Grouped(count) + " " + (count == 1 ? singular : plural);
}

u32 DigitCount(u64 value) {
    u32 digits = 1;
    while (value >= 10) {
        value /= 10;
        digits += 1;
    }
    return digits;
}

char* PutNumber(char* out, u64 value, u32 width) {
    char digits[20];
    u32 count = 0;
    do {
        digits[count++] = static_cast<char>('0' + value % 10);
        value /= 10;
    } while (value != 0);
    for (; width > count; --width) {
        *out++ = ' ';
    }
    while (count > 0) {
        *out++ = digits[--count];
    }
    return out;
}

}  // namespace VELK
