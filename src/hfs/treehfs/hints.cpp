// Hints of index nodes. See hints.h.
#include "hfs/treehfs/hints.h"

#include <cstring>

namespace VELK {

namespace {

u32 Least(u32 a, u32 b) {
    return a < b ? a : b;
}

}  // namespace

void Hints::DropChild(u32 index) const {
    HfsHint* hint = &table_->hints[index];
    if (index < table_->used && hint->child != nullptr) {
        hint->child->hintedBy = nullptr;
        hint->child = nullptr;
    }
}

void Hints::SetChild(u32 index, HfsNode* child) const {
    if (child == node_ || !Use(index)) {
        return;  // whoever leaves a node asks its parent for the way on, and the node may be gone
    }
    Leave(child);
    DropChild(index);
    table_->hints[index].child = child;
    table_->hints[index].data = child->bufs[0].data;
    child->hintedBy = const_cast<HfsNode*>(node_);
    child->hintedAt = index;
}

void Hints::Leave(HfsNode* child) const {
    if (child->hintedBy != nullptr) {
        const Hints hints(child->hintedBy, room_);
        hints.DropChild(hints.IndexOf(child));
    }
}

u32 Hints::FindFrom(u32 index, u32 end, const HfsNode* child) const {
    while (index < end && table_->hints[index].child != child) {
        index += 1;
    }
    return index;
}

// Mostly the record is where it was, or some came in before it.
u32 Hints::IndexOf(HfsNode* child) const {
    const u32 before = Least(child->hintedAt, table_->used);
    u32 index = FindFrom(before, table_->used, child);
    if (index == table_->used) {
        index = FindFrom(0, before, child);
        if (index == before) {
            return room_;
        }
    }
    child->hintedAt = index;
    return index;
}

void Hints::Insert(u32 index, u32 count) const {
    HfsHint* hints = table_->hints;
    if (index >= table_->used) {
        return;
    }
    const u32 gapEnd = Least(index + count, room_);
    const u32 kept = Least(table_->used - index, room_ - gapEnd);
    for (u32 i = index + kept; i < table_->used; ++i) {
        DropChild(i);
    }
    std::memmove(hints + gapEnd, hints + index, kept * sizeof *hints);
    std::memset(hints + index, 0, (gapEnd - index) * sizeof *hints);
    table_->used = gapEnd + kept;
}

void Hints::Remove(u32 index, u32 count) const {
    HfsHint* hints = table_->hints;
    if (index >= table_->used) {
        return;
    }
    const u32 end = Least(index + count, table_->used);
    for (u32 i = index; i < end; ++i) {
        DropChild(i);
    }
    const u32 behind = table_->used - end;
    std::memmove(hints + index, hints + end, behind * sizeof *hints);
    std::memset(hints + index + behind, 0, (end - index) * sizeof *hints);
    table_->used = index + behind;
}

void Hints::Take(u32 index, const Hints& other, u32 from, u32 count) const {
    const u32 end = Least(from + count, other.table_->used);
    for (; from < end; ++from, ++index) {
        HfsNode* child = other.Child(from);
        other.DropChild(from);
        LearnOrder(index, other.Order(from));
        if (child != nullptr) {
            SetChild(index, child);
        }
    }
}

void Hints::Forget() const {
    for (u32 i = 0; i < table_->used; ++i) {
        DropChild(i);
    }
    std::memset(table_->hints, 0, table_->used * sizeof *table_->hints);
    table_->used = 0;
}

// No hint outlives the node it leads to or the node it belongs to.
void ForgetHints(CBTreeHfs* tree, HfsNode* node) {
    if (tree->rootHint == node) {
        tree->rootHint = nullptr;
    }
    if (node->hintedBy != nullptr) {
        Hints(tree, node->hintedBy).Leave(node);
    }
    ForgetRecords(tree, node);
}

}  // namespace VELK
