// Intrusive red-black tree node. The owner of a tree walks and links by its own key and leaves the
// rebalancing to insert_color; nothing here allocates or compares.
#pragma once

#include <cstdint>

namespace VELK {

// The links of an element that hangs in a tree, as a member of the element. Owns nothing.
struct rb_node {
    std::uintptr_t parentColor;  // parent's address; lowest bit: 1 = black, 0 = red
    rb_node* right;              // child behind this node in the owner's order, or null
    rb_node* left;               // child before it, or null

    // Null at the root; the node itself when it is in no tree.
    rb_node* Parent() const {
        return reinterpret_cast<rb_node*>(parentColor & ~static_cast<std::uintptr_t>(1));
    }

    // Hangs this node, red and without children, at `*slot`, a null child pointer of `parent`
    // (or the root pointer, with `parent` null). insert_color must follow.
    void Link(rb_node* parent, rb_node** slot) {
        parentColor = reinterpret_cast<std::uintptr_t>(parent);
        left = nullptr;
        right = nullptr;
        *slot = this;
    }

    // A node in no tree is its own parent. A new one has to be marked so.
    void MarkUnlinked() { parentColor = reinterpret_cast<std::uintptr_t>(this); }
    // Whether it hangs in a tree.
    bool IsLinked() const { return Parent() != this; }

    // Rebalances after Link.
    void insert_color(rb_node** root);

    // Takes this node out of the tree at `*root`, rebalances and marks it unlinked.
    // REQUIRES: this node is in that tree.
    void remove(rb_node** root);
};

}  // namespace VELK
