// Names as text: UTF-8 on the outside, UTF-16 units in host order on the inside. Any sequence of
// units survives the way out and back: a lone surrogate becomes the three bytes its value would
// have, which nothing else uses.
#pragma once

#include <string>
#include <string_view>

#include "platform/types.h"

namespace VELK {

// The units of a name, owned and borrowed. Not terminated; any unit may occur, 0 included.
using NameUnits = std::u16string;
using NameView = std::u16string_view;

// Units of a name as stored: `count` big-endian units at `bytes`.
NameUnits UnitsFromStored(const void* bytes, unsigned count);

// The name as UTF-8, lone surrogates in the way described above.
std::string Utf8FromUnits(NameView units);
// False for bytes that are no UTF-8; a single surrogate in three bytes is accepted.
bool UnitsFromUtf8(std::string_view text, NameUnits* units);

// The form in which volumes keep a name, and the form most people type.
NameUnits DecomposedUnits(NameView units);
NameUnits ComposedUnits(NameView units);

// A name as a POSIX path component and back: ':' and '/' change places, since each is the other's
// separator, and NUL is shown as U+2400.
NameUnits PosixUnitsFromName(NameView units);
NameUnits NameUnitsFromPosix(NameView units);

}  // namespace VELK
