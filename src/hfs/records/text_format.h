// Numbers, dates and columns as they are printed, and arithmetic on nothing else.
#pragma once

#include <string>
#include <string_view>

#include "platform/types.h"

namespace VELK {

// Seconds since 1904 -> "2026-11-21 01:18:16Z"; "-" for 0, which means not set.
std::string DateText(u32 date);
// "2026-11-21T01:18:16Z"; empty for 0.
std::string DateIso(u32 date);
// Writes the first form, kDateWidth bytes, and returns the end; 0 is padded with blanks.
constexpr u32 kDateWidth = 20;  // bytes of that form
char* PutDate(char* out, u32 date);
// "2026-11-21" or "2026-11-21T01:18:16Z" or "2026-11-21 01:18:16" -> seconds since 1904.
bool ParseDate(const std::string& text, u32* date);

// "1.2 GB", "108 KiB" are for reading at a glance: three digits and a binary or decimal unit.
std::string ShortBytes(u64 bytes);   // decimal: 1.2 GB
std::string BinaryBytes(u64 bytes);  // binary: 512 KiB

// Plural form: "1 file", "2 files", with grouped digits.
std::string Counted(u64 count, const char* singular, const char* plural);

// Columns that a terminal gives to UTF-8: one a character, none to marks, two to ideographs.
std::size_t ShownWidth(std::string_view text);
// With blanks behind it, so that it takes `width` columns or more.
std::string Padded(std::string text, std::size_t width);

char* PutNumber(char* out, u64 value, u32 width);  // right-aligned
u32 DigitCount(u64 value);                         // decimal digits

}  // namespace VELK
