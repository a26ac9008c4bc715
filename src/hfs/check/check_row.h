// What the walk knows of one level: the last node it saw there and that node's last key. Judges
// the links and the order of keys between neighbours.
#pragma once

#include "hfs/check/check_tree.h"

namespace VELK {

// The index record that leads to a node.
struct CheckParent {
    u32 nodeNum;
    u32 index;
    u32 offset;     // of the record in its node
    const u8* key;  // null: not sound
};

class CheckRow {
public:
    // The next node of the level, left to right. REQUIRES: called before its keys.
    void Arrive(const CheckTree& tree, u32 level, const CheckNode& node);
    // Something of this level was left out here: neighbours are no longer known.
    void Skip() { hasGap_ = true; }
    // The level is at its end.
    void Close(const CheckTree& tree, u32 level);

    // The first sound key of the node that arrived, against the row's last one (K03) and against
    // the index key above it (K04).
    void CheckFirstKey(const CheckTree& tree, const CheckNode& node, u32 index, const u8* key,
                       const CheckParent* parent) const;
    // Remembers the last sound key of the node.
    void KeepLastKey(u32 nodeNum, const u8* key);

private:
    void CheckAbove(const CheckTree& tree, const CheckNode& node, const u8* key,
                    const CheckParent& parent) const;

    bool hasNode_ = false;
    bool hasGap_ = false;
    bool hasKey_ = false;
    u32 nodeNum_ = 0;
    u32 fLink_ = 0;
    u32 keyNode_ = 0;
    u8 key_[kCheckKeyRoom] = {};
};

}  // namespace VELK
