// What a tree should hold: a plain ordered map with an order of its own, independent of the
// engine's comparators, and the host and disk forms of its keys.
#pragma once

#include <map>
#include <string>

#include "keys.h"

namespace VELK::test {

// One key of any tree kind.
struct ModelKey {
    u32 fileId = 0;
    u32 id = 0;     // parent or file
    u32 fork = 0;   // extents
    u32 block = 0;  // extents, attributes
    std::u16string name;

    HostKey Host() const;
    Bytes Delivered() const;  // as iteration delivers it to a caller
};

struct ModelOrder {
    bool operator()(const ModelKey& a, const ModelKey& b) const;
};

struct ModelRecord {
    ModelKey key;  // as it was inserted: letters may differ in case from a later search
    Bytes data;    // padded to even
};

using TreeModel = std::map<ModelKey, ModelRecord, ModelOrder>;

// The key with this number; several numbers may name equal catalog keys in other letters.
// `longest` bounds the key in bytes.
ModelKey KeyOf(u32 fileId, u32 number, u32 longest);

// `size` bytes that depend on key and salt, padded with a zero to even.
Bytes DataOf(u32 number, u32 salt, u32 size);

}  // namespace VELK::test
