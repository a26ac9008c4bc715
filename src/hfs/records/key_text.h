// Keys as text: 2:"My File.txt" in the catalog, 5:data:0 in the extents tree, 37:"tag":8 in the
// attributes tree, and hex:... anywhere, the whole key as it lies in a leaf. Whatever is printed
// here is accepted here.
#pragma once

#include <string>
#include <string_view>

#include "hfs/records/quoted.h"
#include "hfs/records/search_key.h"
#include "hfs/volume/problem.h"

namespace VELK {

// Reads a key of tree `fileId`. The problem says what is wrong with `text`; its advice for a key of
// another tree is "add -t TREE". `id:N` is not known here.
Problem ParseKey(std::string_view text, u32 fileId, SearchKey* key);

// N of `id:N`; false for any other text.
bool ParseIdKey(std::string_view text, u32* id);

// The readable form of a key as stored in a node, or its hex: form when the readable one would not
// say it all. Reads no byte beyond `size`.
std::string KeyText(u32 fileId, const u8* stored, u32 size, Blanks blanks);

}  // namespace VELK
