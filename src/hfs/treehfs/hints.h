// What an index node remembers in its own heap block: which of its children are cached and where
// they lie, and for records that searches have met the order of their keys and their children. All
// of it only saves the way to the red-black tree and to the node's bytes: a search that goes by it
// comes to what it would come to without.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// Sets of children: about twice as many places as a node is likely to have children, so that few
// of them find none.
inline u32 HintSetCount(const CBTreeHfs* tree) {
    constexpr u32 kNodeBytesPerSet = 64;
    constexpr u32 kSmallNodeBytesPerSet = 128;  // small nodes have little room for anything
    constexpr u32 kSmallNodeShift = 10;
    const u32 perSet = tree->nodeShift > kSmallNodeShift ? kNodeBytesPerSet : kSmallNodeBytesPerSet;
    return (1u << tree->nodeShift) / perSet;
}

// Records whose separators have room; those behind them are searched as they lie.
inline u32 SeparatorRoom(const CBTreeHfs* tree) {
    constexpr u32 kNodeBytesPerSeparator = 32;
    return (1u << tree->nodeShift) / kNodeBytesPerSeparator;
}

// Bytes of all that an index node remembers.
inline std::size_t HintBytes(const CBTreeHfs* tree) {
    return HintSetCount(tree) * sizeof(HfsHintSet) +
           SeparatorRoom(tree) * (sizeof(u64) + sizeof(u32));
}

// One hint.
struct HintPlace {
    HfsHintSet* set;  // null: there is none
    u32 place;

    explicit operator bool() const { return set != nullptr; }
    HfsNode* Node() const { return set->node[place]; }
    const u8* Data() const { return set->data[place]; }
};

// The hint by which `parent` (null: nobody) leads to a child.
HintPlace FindHint(const CBTreeHfs* tree, const HfsNode* parent, u32 nodeNum);
// Lets `parent`, an index node with room for hints, lead to `child`, perhaps in place of another.
void SetHint(CBTreeHfs* tree, HfsNode* parent, HfsNode* child);
// Forgets the node that leaves the cache, and with it what it remembers.
void ForgetHints(CBTreeHfs* tree, HfsNode* node);

// The separators that an index node remembers, by record.
class Separators {
public:
    // REQUIRES: the node has room for hints.
    Separators(const CBTreeHfs* tree, const HfsNode* node)
        : order_(reinterpret_cast<u64*>(node->hints + HintSetCount(tree))),
          child_(reinterpret_cast<u32*>(order_ + SeparatorRoom(tree))),
          room_(SeparatorRoom(tree)) {}

    // The child of record `index`; 0: nothing is known of the record.
    u32 Child(u32 index) const { return index < room_ ? child_[index] : 0; }
    // Order of the record's key. REQUIRES: Child(index) is not 0.
    u64 Order(u32 index) const { return order_[index]; }
    // REQUIRES: `child` is not 0.
    void Learn(u32 index, u64 order, u32 child) const {
        if (index < room_) {
            order_[index] = order;
            child_[index] = child;
        }
    }
    // Asks for the memory of the first `count`.
    void Prefetch(u32 count) const;

    // Record `index` came in, or left; the node had `count` records before.
    void Insert(u32 index, u32 count) const;
    void Remove(u32 index, u32 count) const;
    void Forget() const;

private:
    u64* order_;
    u32* child_;
    u32 room_;
};

// The same for a node that may have no room for hints: what it remembered of its records is void.
inline void ForgetSeparators(const CBTreeHfs* tree, const HfsNode* node) {
    if (node->hints != nullptr) {
        Separators(tree, node).Forget();
    }
}

}  // namespace VELK
