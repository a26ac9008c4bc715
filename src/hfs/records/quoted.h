// The smallest pieces of the notation of keys and records: strings in double quotes as JSON writes
// them, numbers, and bytes in hexadecimal. The same in arguments, scripts and output.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "hfs/names_text.h"
#include "hfs/volume/problem.h"
#include "platform/types.h"

namespace VELK {

// Whether what a person types is turned into the form volumes keep names in. Units written as
// \uXXXX are always taken as they are, so any name can be written.
enum class Typed { kDecomposed, kAsIs };
// Whether a blank in a string is printed as \u0020, for output whose fields are split at blanks.
enum class Blanks { kPlain, kEscaped };

// Reads the string whose opening quote is at `*at`; `*at` ends behind the closing one. False: no
// such string, or not UTF-8.
bool TakeQuoted(std::string_view text, std::size_t* at, Typed typed, NameUnits* units);

// The string that TakeQuoted reads back as `units`.
std::string QuotedUnits(NameView units, Typed typed, Blanks blanks);

// Decimal, or hexadecimal after 0x; false if it is neither or above `most`.
bool ParseNumber(std::string_view text, u64 most, u64* number);

// Bytes from hexadecimal digits; blanks between them are skipped. `form` begins the text of a
// problem: "hex:00zz".
Problem ParseHexBytes(std::string_view digits, std::string_view form, std::vector<u8>* bytes);
// The digits of bytes, lower case, nothing between them.
std::string HexText(const u8* bytes, std::size_t size);

}  // namespace VELK
