// Rebalancing of the intrusive red-black tree. Both operations keep the four facts the tree rests
// on: the root is black, a red node has no red child, every way down from a node to a missing child
// passes equally many black nodes, and the order of the nodes stays what the owner linked.
//
// Left and right are mirror images; the code names a side and its opposite instead of stating
// everything twice.
#include "platform/rbtree.h"

namespace VELK {

namespace {

constexpr std::uintptr_t kBlack = 1;

enum class Side { kLeft, kRight };

Side Opposite(Side side) {
    return side == Side::kLeft ? Side::kRight : Side::kLeft;
}

rb_node*& Child(rb_node* node, Side side) {
    return side == Side::kLeft ? node->left : node->right;
}

Side SideOf(const rb_node* parent, const rb_node* node) {
    return parent->left == node ? Side::kLeft : Side::kRight;
}

// A missing child counts as black.
bool IsRed(const rb_node* node) {
    return node != nullptr && (node->parentColor & kBlack) == 0;
}

void SetRed(rb_node* node) {
    node->parentColor &= ~kBlack;
}

void SetBlack(rb_node* node) {
    node->parentColor |= kBlack;
}

void SetParent(rb_node* node, rb_node* parent) {
    node->parentColor = reinterpret_cast<std::uintptr_t>(parent) | (node->parentColor & kBlack);
}

// Makes `replacement`, which may be null, what `parent` (null: the root pointer) has in place of
// `node`. Leaves the parent of `replacement` to the caller.
void ReplaceChild(rb_node** root, rb_node* parent, const rb_node* node, rb_node* replacement) {
    if (parent == nullptr) {
        *root = replacement;
    } else {
        Child(parent, SideOf(parent, node)) = replacement;
    }
}

// Turns `node` down to `side`; its child on the other side takes its place. Colours stay.
void Rotate(rb_node** root, rb_node* node, Side side) {
    const Side other = Opposite(side);
    rb_node* raised = Child(node, other);
    rb_node* parent = node->Parent();
    rb_node* moved = Child(raised, side);

    Child(node, other) = moved;
    if (moved != nullptr) {
        SetParent(moved, node);
    }
    ReplaceChild(root, parent, node, raised);
    SetParent(raised, parent);
    Child(raised, side) = node;
    SetParent(node, raised);
}

// Settles the one step in which a red pair can be resolved by turning: `node` and its parent are
// red, the parent's sibling is black.
void TurnRedPair(rb_node** root, rb_node* node, rb_node* parent, rb_node* grandparent) {
    const Side side = SideOf(grandparent, parent);
    if (SideOf(parent, node) != side) {
        Rotate(root, parent, side);
        parent = node;
    }
    SetBlack(parent);
    SetRed(grandparent);
    Rotate(root, grandparent, Opposite(side));
}

// One way down through `node` (null, or black) lacks a black node against the other ways through
// `parent`. Moves the lack up until it can be made good.
void RestoreBlackHeight(rb_node** root, rb_node* node, rb_node* parent) {
    while (parent != nullptr && !IsRed(node)) {
        const Side side = SideOf(parent, node);
        const Side other = Opposite(side);
        rb_node* sibling = Child(parent, other);
        if (IsRed(sibling)) {
            SetBlack(sibling);
            SetRed(parent);
            Rotate(root, parent, side);
            sibling = Child(parent, other);
        }
        if (!IsRed(sibling->left) && !IsRed(sibling->right)) {
            SetRed(sibling);
            node = parent;
            parent = node->Parent();
            continue;
        }
        if (!IsRed(Child(sibling, other))) {
            SetBlack(Child(sibling, side));
            SetRed(sibling);
            Rotate(root, sibling, other);
            sibling = Child(parent, other);
        }
        if (IsRed(parent)) {
            SetRed(sibling);
        } else {
            SetBlack(sibling);
        }
        SetBlack(parent);
        SetBlack(Child(sibling, other));
        Rotate(root, parent, side);
        return;
    }
    if (node != nullptr) {
        SetBlack(node);
    }
}

}  // namespace

void rb_node::insert_color(rb_node** root) {
    rb_node* node = this;
    rb_node* parent = node->Parent();
    while (IsRed(parent)) {
        // A red parent is not the root, so there is a grandparent.
        rb_node* grandparent = parent->Parent();
        rb_node* uncle = Child(grandparent, Opposite(SideOf(grandparent, parent)));
        if (!IsRed(uncle)) {
            TurnRedPair(root, node, parent, grandparent);
            break;
        }
        SetBlack(parent);
        SetBlack(uncle);
        SetRed(grandparent);
        node = grandparent;
        parent = node->Parent();
    }
    SetBlack(*root);
}

void rb_node::remove(rb_node** root) {
    rb_node* parent = Parent();
    rb_node* child = left != nullptr ? left : right;
    bool removedBlack = !IsRed(this);
    if (left == nullptr || right == nullptr) {
        ReplaceChild(root, parent, this, child);
        if (child != nullptr) {
            SetParent(child, parent);
        }
    } else {
        // The next node in order has no left child; it takes over this node's place and colour,
        // and the tree loses a node of *its* colour where it was.
        rb_node* next = right;
        while (next->left != nullptr) {
            next = next->left;
        }
        removedBlack = !IsRed(next);
        child = next->right;
        rb_node* gap = next->Parent();
        if (gap == this) {
            gap = next;
        } else {
            gap->left = child;
            if (child != nullptr) {
                SetParent(child, gap);
            }
            next->right = right;
            SetParent(right, next);
        }
        ReplaceChild(root, parent, this, next);
        next->parentColor = parentColor;
        next->left = left;
        SetParent(left, next);
        parent = gap;
    }
    if (removedBlack) {
        RestoreBlackHeight(root, child, parent);
    }
    left = nullptr;
    right = nullptr;
    MarkUnlinked();
}

}  // namespace VELK
