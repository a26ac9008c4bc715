// Hints of index nodes. See hints.h.
#include "hfs/treehfs/hints.h"

#include <cstring>

namespace VELK {

namespace {

// A child has its places in one set and in the one beside it, which takes what the first has no
// room for.
HfsHintSet* SetOf(const CBTreeHfs* tree, const HfsNode* parent, u32 nodeNum) {
    return &parent->hints[nodeNum & (HintSetCount(tree) - 1)];
}
HfsHintSet* SetBeside(const CBTreeHfs* tree, const HfsNode* parent, u32 nodeNum) {
    return &parent->hints[(nodeNum & (HintSetCount(tree) - 1)) ^ 1];
}

bool FindInSet(HfsHintSet* set, u32 nodeNum, HintPlace* found) {
    for (u32 place = 0; place < HfsHintSet::kPlaces; ++place) {
        if (set->nodeNum[place] == nodeNum && set->node[place] != nullptr) {
            *found = {set, place};
            return true;
        }
    }
    return false;
}

bool TakeFreePlace(HfsHintSet* set, HintPlace* taken) {
    for (u32 place = 0; place < HfsHintSet::kPlaces; ++place) {
        if (set->node[place] == nullptr) {
            *taken = {set, place};
            return true;
        }
    }
    return false;
}

// Takes the hint that leads to `child` away.
void ForgetHint(CBTreeHfs* tree, HfsNode* child) {
    if (tree->rootHint == child) {
        tree->rootHint = nullptr;
    }
    const HintPlace hint = FindHint(tree, child->hintedBy, child->nodeNum);
    if (hint) {
        hint.set->node[hint.place] = nullptr;
    }
    child->hintedBy = nullptr;
}

u32 Least(u32 a, u32 b) {
    return a < b ? a : b;
}

}  // namespace

HintPlace FindHint(const CBTreeHfs* tree, const HfsNode* parent, u32 nodeNum) {
    HintPlace found = {nullptr, 0};
    if (parent != nullptr && parent->hints != nullptr &&
        !FindInSet(SetOf(tree, parent, nodeNum), nodeNum, &found)) {
        FindInSet(SetBeside(tree, parent, nodeNum), nodeNum, &found);
    }
    return found;
}

void SetHint(CBTreeHfs* tree, HfsNode* parent, HfsNode* child) {
    if (parent == child) {
        return;  // whoever leaves a node asks its parent for the way on, and the node may be gone
    }
    ForgetHint(tree, child);
    HfsHintSet* own = SetOf(tree, parent, child->nodeNum);
    HintPlace to = {own, own->next};
    if (!TakeFreePlace(own, &to) && !TakeFreePlace(SetBeside(tree, parent, child->nodeNum), &to)) {
        to.Node()->hintedBy = nullptr;
        own->next = (own->next + 1) % HfsHintSet::kPlaces;
    }
    to.set->nodeNum[to.place] = child->nodeNum;
    to.set->node[to.place] = child;
    to.set->data[to.place] = child->bufs[0].data;
    child->hintedBy = parent;
}

// No hint outlives the node it leads to or the node it belongs to.
void ForgetHints(CBTreeHfs* tree, HfsNode* node) {
    ForgetHint(tree, node);
    if (node->hints == nullptr) {
        return;
    }
    const u32 count = HintSetCount(tree);
    for (HfsHintSet* set = node->hints; set < node->hints + count; ++set) {
        for (HfsNode* child : set->node) {
            if (child != nullptr) {
                child->hintedBy = nullptr;
            }
        }
    }
}

void Separators::Prefetch(u32 count) const {
    constexpr u32 kLine = 64;
    const u32 known = Least(count, room_);
    for (u32 at = 0; at < known; at += kLine / sizeof *order_) {
        __builtin_prefetch(order_ + at);
    }
    for (u32 at = 0; at < known; at += kLine / sizeof *child_) {
        __builtin_prefetch(child_ + at);
    }
}

void Separators::Insert(u32 index, u32 count) const {
    if (index >= room_) {
        return;
    }
    const u32 moved = Least(count, room_ - 1) - index;
    std::memmove(order_ + index + 1, order_ + index, moved * sizeof *order_);
    std::memmove(child_ + index + 1, child_ + index, moved * sizeof *child_);
    child_[index] = 0;
}

void Separators::Remove(u32 index, u32 count) const {
    if (index >= room_) {
        return;
    }
    const u32 known = Least(count, room_);
    const u32 moved = known - index - 1;
    std::memmove(order_ + index, order_ + index + 1, moved * sizeof *order_);
    std::memmove(child_ + index, child_ + index + 1, moved * sizeof *child_);
    child_[known - 1] = 0;
}

void Separators::Forget() const {
    std::memset(child_, 0, room_ * sizeof *child_);
}

}  // namespace VELK
