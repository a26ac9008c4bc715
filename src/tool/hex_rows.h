// Bytes for a person: sixteen to a row, with their offset and what is printable of them.
#pragma once

#include "tool/output.h"

namespace VELK::tool {

// Rows that repeat the one before are shown as a single "*", save the last.
// The offset of the first byte is printed as `base`; every row begins with `indent` blanks.
void WriteHexRows(Output* out, const u8* bytes, std::size_t size, u64 base, u32 indent = 0);

}  // namespace VELK::tool
