// Keys as callers of a tree pass them, in host order; made of what they name, and of the bytes that
// a leaf holds.
#pragma once

#include <string>
#include <vector>

#include "hfs/format.h"
#include "hfs/names_text.h"

namespace VELK {

// A key as the engine's operations take it: host order, length field first.
struct SearchKey {
    alignas(8) u8 bytes[kKeyLengthSize + kMaxKeyLength + 6] = {};  // the key, and slack behind it
    u32 id = 0;    // parent or file ID, which the operations want besides
    u32 size = 0;  // bytes, length field included

    // The key as the engine takes it.
    const BTreeKey* Key() const { return reinterpret_cast<const BTreeKey*>(bytes); }
};

// Sorts before every other key of the tree that has this ID: all further fields are 0. In the
// catalog it is the key of a thread; with ID 0 it sorts before every key there is.
SearchKey LowestKey(u32 fileId, u32 id);
// Keys of what they name. A name is cut to as many units as the tree's keys can have.
SearchKey CatalogSearchKey(u32 parent, NameView name);
SearchKey ExtentsSearchKey(u32 file, u8 forkType, u32 startBlock);
SearchKey AttributesSearchKey(u32 file, NameView name, u32 startBlock);

// What keeps stored bytes from being a key the tree could hold: too short for the fields of its
// kind, too long for any, at odds with its length field. Empty: nothing.
std::string FaultOfStored(u32 fileId, const u8* stored, u32 size);
// The tree's keys in a sentence: "a catalog key".
std::string KeyKindText(u32 fileId);

// Between the two forms. The first fails for bytes that have a fault.
bool SearchKeyFromStored(u32 fileId, const u8* stored, u32 size, SearchKey* key);
// The stored form, length field included.
std::vector<u8> StoredKey(u32 fileId, const SearchKey& key);
// A key as iteration delivers it: in host order, save in the extents tree.
std::vector<u8> StoredFromDelivered(u32 fileId, const u8* delivered, u32 size);

}  // namespace VELK
