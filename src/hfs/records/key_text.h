// Keys as text: 2:"My File.txt" in the catalog, 5:data:0 in the extents tree, 37:"tag":8 in the
// attributes tree, and hex:... anywhere, the whole key as it lies in a leaf. Whatever is printed
// here is accepted here.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "hfs/format.h"
#include "hfs/records/quoted.h"
#include "hfs/volume/problem.h"

namespace VELK {

// A key as the engine's operations take it: host order, length field first.
struct SearchKey {
    alignas(8) u8 bytes[kKeyLengthSize + kMaxKeyLength + 6] = {};  // the key, and slack behind it
    u32 id = 0;    // parent or file ID, which the operations want besides
    u32 size = 0;  // bytes, length field included

    // The key as the engine takes it.
    const BTreeKey* Key() const { return reinterpret_cast<const BTreeKey*>(bytes); }
};

// Reads a key of tree `fileId`. The problem says what is wrong with `text`; its advice for a key of
// another tree is "add -t TREE". `id:N` is not known here.
Problem ParseKey(std::string_view text, u32 fileId, SearchKey* key);

// N of `id:N`; false for any other text.
bool ParseIdKey(std::string_view text, u32* id);

// The readable form of a key as stored in a node, or its hex: form when the readable one would not
// say it all. Reads no byte beyond `size`.
std::string KeyText(u32 fileId, const u8* stored, u32 size, Blanks blanks);

// Between the two forms. The first fails for bytes that are no key the tree could hold: they are
// too short for the fields of its kind, too long for any, or disagree with their length field.
bool SearchKeyFromStored(u32 fileId, const u8* stored, u32 size, SearchKey* key);
// The stored form, length field included.
std::vector<u8> StoredKey(u32 fileId, const SearchKey& key);
// A key as iteration delivers it: in host order, save in the extents tree.
std::vector<u8> StoredFromDelivered(u32 fileId, const u8* delivered, u32 size);

}  // namespace VELK
