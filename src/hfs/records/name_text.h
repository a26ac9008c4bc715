// Names on their way to a person or a program. On disk a name is UTF-16; `/` is an ordinary
// character there and `:` is hardly used, so the two change places in a path, and NUL is shown as
// U+2400. What is `:` or U+2400 on disk, and whatever could move a terminal's cursor or reorder a
// line, is written as \xNN or \uNNNN, and a backslash as two, so every printed path can be given
// back as an argument.
#pragma once

#include <string>
#include <string_view>

#include "platform/types.h"

namespace VELK {

// What a name is written for.
enum class NameForm {
    kText,  // escaped, one line for a person
    kRaw,   // the bytes of a path, for lists that end in NUL
    kJson,  // the inside of a JSON string
};

// Most bytes one code unit can take in any form.
constexpr u32 kNameBytesPerUnit = 6;

// Writes `count` big-endian code units to `out`, which has room for kNameBytesPerUnit each, and
// returns the end.
char* PutName(char* out, const u8* unitsBe, u32 count, NameForm form);
// The same at the end of a string, and as a string of its own in the form for a person.
void AppendName(std::string* out, const u8* unitsBe, u32 count, NameForm form);
std::string NameText(const u8* unitsBe, u32 count);

// The inside of a JSON string for the units as they lie on disk: nothing changes places.
void AppendJsonUnits(std::string* out, const u8* unitsBe, u32 count);
// The same for UTF-8; bytes that are no UTF-8 become U+FFFD.
void AppendJsonText(std::string* out, std::string_view text);

// UTF-8 of any origin with everything unfit for a terminal escaped.
std::string EscapedText(std::string_view text);

// One component of a path as a user types it -> code units in host order, undoing the exchange and
// the escapes. Bytes that are no UTF-8 become U+FFFD.
std::u16string UnitsFromPath(std::string_view component);
}  // namespace VELK
