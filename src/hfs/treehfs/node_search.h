// Binary search for a key inside one node.
#pragma once

#include "hfs/treehfs/path_deliver.h"

namespace VELK {

// A search key with what the search needs to know of its tree, worked out once per lookup.
class SoughtKey {
public:
    SoughtKey(const CBTreeHfs* tree, const BTreeKey* key, unsigned id);

    // Order of the search key against a key of a node, as the tree's comparator has it.
    // REQUIRES: the node key is sound (see key_shape.h).
    int Compare(const BTreeKey* nodeKey) const;
    // The same by the comparator itself, which may have something to assert.
    int CompareAsAsked(const BTreeKey* nodeKey) const { return compare_(key_, id_, nodeKey); }
    // The same of a key in folded order, as IsFolded tells.
    int CompareFolded(const BTreeKey* nodeKey) const;
    bool IsFolded() const { return isFolded_; }
    // Parent and first two units of a key in folded order as one number: of two keys that have one,
    // the key with the greater number sorts behind the other. False: the key has none.
    bool HasOrder() const { return hasOrder_; }
    // Works the order out, before a way down through index nodes. Until then there is none.
    void LearnOrder();
    u64 Order() const { return order_; }

    // Fewest bytes of a sound node key, and where its name length stands (0: it has no name).
    u32 Fixed() const { return fixed_; }
    u32 NameLengthAt() const { return nameLengthAt_; }

private:
    int CompareFirstUnits(const u8* nodeKey) const;

    const BTreeKey* key_;
    CompareKeysFn compare_;
    unsigned id_;
    u32 fixed_ = 0;
    u32 nameLengthAt_ = 0;
    u64 order_ = 0;
    u16 firstUnit_ = 0;  // folded; 0: the comparator has to decide
    bool isFolded_ = false;
    bool hasOrder_ = false;
};

// What a search in one node came to.
struct SearchResult {
    bool found;
    s32 index;          // the equal record, or the first greater one
    RecordView record;  // the equal record
};

// Reports a key that cannot be read at 3005, kErrNoMemory nowhere.
int SearchNode(CBTreeHfs* tree, const HfsNode* node, const SoughtKey& key, SearchResult* result);

// The same for a key known to lie between the first and the last key of `leaf`, or behind the last
// key of the tree's last leaf. False, nothing reported: it does not, or the node is not so plain
// that this can be told at once.
bool SearchInside(CBTreeHfs* tree, const HfsNode* leaf, const SoughtKey& key, SearchResult* result);

}  // namespace VELK
