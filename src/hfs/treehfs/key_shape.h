// What the keys of the comparators this engine knows look like, and the gate a key from a node
// passes before it is compared or converted.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// Fixed part of the keys a comparator reads, and where their ID and their name length stand (0: no
// name).
struct KeyShape {
    u32 fixed;
    u32 id;
    u32 nameLength;
};

// False: a comparator this engine does not know.
inline bool ShapeOf(CompareKeysFn compare, KeyShape* shape) {
    if (compare == CompareCatKeysCaseIns || compare == CompareCatKeysCaseBin) {
        *shape = {kCatKeyFixed, kCatKeyParentId, kCatKeyNameLength};
    } else if (compare == CompareExtentKeysPlus) {
        *shape = {kExtKeyFixed, kExtKeyFileId, 0};
    } else if (compare == CompareAttrKeys) {
        *shape = {kAttrKeyFixed, kAttrKeyFileId, kAttrKeyNameLength};
    } else {
        return false;
    }
    return true;
}

// Refuses a node key that a comparator or converter could not read safely: longer than any key,
// shorter than its kind's fixed part, or a name that runs past the key. Chosen by the tree's own
// comparator; keys of a foreign comparator pass. True: the key may be used.
bool NodeKeyIsSound(const CBTreeHfs* tree, const BTreeKey* key, u32 keySize);

}  // namespace VELK
