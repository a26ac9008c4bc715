// What an index node remembers in its own heap block, record by record: the order of the keys that
// searches have met, and which children are cached and where they lie. All of it only saves the way
// to the red-black tree and to the node's bytes: a search that goes by it comes to what it would
// come to without. It follows the records: whoever moves some moves their hints.
#pragma once

#include <cstddef>

#include "hfs/treehfs.h"
#include "hfs/treehfs/prefetch.h"

namespace VELK {

// Records whose hints have room; those behind them are searched as they lie.
inline u32 HintRoom(const CBTreeHfs* tree) {
    constexpr u32 kNodeBytesPerHint = 32;
    return (1u << tree->nodeShift) / kNodeBytesPerHint;
}

// Bytes of all that an index node remembers.
inline std::size_t HintBytes(const CBTreeHfs* tree) {
    return offsetof(HfsHintTable, hints) + HintRoom(tree) * sizeof(HfsHint);
}

// Bytes from an index node to its hints: the next line of the processor's cache.
inline std::size_t HintsOffset(const CBTreeHfs* tree) {
    const std::size_t nodeSize =
        offsetof(HfsNode, bufs) + tree->header.blocksPerNode * sizeof(HfsBcbBuf);
    return (nodeSize + kCacheLine - 1) / kCacheLine * kCacheLine;
}

// The hints of one index node.
class Hints {
public:
    // REQUIRES: the node has room for hints.
    Hints(const CBTreeHfs* tree, const HfsNode* node)
        : node_(node), table_(node->hints), room_(HintRoom(tree)) {}

    // Order of the record's key; 0: not known.
    u64 Order(u32 index) const { return index < room_ ? table_->hints[index].order : 0; }
    void LearnOrder(u32 index, u64 order) const {
        if (Use(index)) {
            table_->hints[index].order = order;
        }
    }
    void ForgetOrder(u32 index) const {
        if (index < room_) {
            table_->hints[index].order = 0;
        }
    }

    // The cached child the record leads to, and its first block; null: none is known.
    HfsNode* Child(u32 index) const { return index < room_ ? table_->hints[index].child : nullptr; }
    // REQUIRES: there is such a child.
    const u8* Data(u32 index) const { return table_->hints[index].data; }
    // REQUIRES: the record leads to `child`. Any other hint at it is given up.
    void SetChild(u32 index, HfsNode* child) const;
    // The record whose hint is `child`; a number past the room when there is none.
    u32 IndexOf(HfsNode* child) const;
    // `child`, hinted at by this node or another, leaves its place or the cache.
    void Leave(HfsNode* child) const;

    // `count` records came in before record `index`, or left from there on.
    void Insert(u32 index, u32 count) const;
    void Remove(u32 index, u32 count) const;
    // `count` records from `index` on came from `from` on of another node.
    void Take(u32 index, const Hints& other, u32 from, u32 count) const;
    // Nothing is known any more of any record.
    void Forget() const;

private:
    Hints(const HfsNode* node, u32 room) : node_(node), table_(node->hints), room_(room) {}
    bool Use(u32 index) const {
        if (index >= room_) {
            return false;
        }
        table_->used = table_->used > index ? table_->used : index + 1;
        return true;
    }
    void DropChild(u32 index) const;
    // The first hint at `child` from `index` on, `end` when there is none before that.
    u32 FindFrom(u32 index, u32 end, const HfsNode* child) const;

    const HfsNode* node_;
    HfsHintTable* table_;
    u32 room_;
};

// Forgets the node that leaves the cache, and with it what it remembers.
void ForgetHints(CBTreeHfs* tree, HfsNode* node);

// The same for a node that may have no room for hints: what it remembered of its records is void.
inline void ForgetRecords(const CBTreeHfs* tree, const HfsNode* node) {
    if (node->hints != nullptr) {
        Hints(tree, node).Forget();
    }
}

}  // namespace VELK
