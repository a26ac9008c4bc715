// The red-black tree against std::set, with its colour rules checked after every change.
#include "platform/rbtree.h"

#include <gtest/gtest.h>

#include <random>
#include <set>
#include <vector>

namespace VELK {
namespace {

struct Item {
    rb_node link;
    int key;
};

Item* ItemOf(rb_node* node) {
    return reinterpret_cast<Item*>(node);
}

class RbTree : public ::testing::Test {
protected:
    void Insert(Item* item) {
        rb_node* parent = nullptr;
        rb_node** slot = &root_;
        while (*slot != nullptr) {
            parent = *slot;
            slot = item->key < ItemOf(parent)->key ? &parent->left : &parent->right;
        }
        item->link.Link(parent, slot);
        item->link.insert_color(&root_);
    }

    // Keys in order; fails the test when a rule of the tree does not hold.
    std::vector<int> Check() {
        std::vector<int> keys;
        if (root_ != nullptr) {
            EXPECT_EQ(root_->Parent(), nullptr);
            EXPECT_EQ(root_->parentColor & 1, 1u) << "red root";
        }
        BlackHeight(root_, &keys);
        return keys;
    }

    int BlackHeight(rb_node* node, std::vector<int>* keys) {
        if (node == nullptr) {
            return 0;
        }
        const bool isBlack = (node->parentColor & 1) != 0;
        for (rb_node* child : {node->left, node->right}) {
            if (child != nullptr) {
                EXPECT_EQ(child->Parent(), node);
                EXPECT_TRUE(isBlack || (child->parentColor & 1) != 0) << "two red in a row";
            }
        }
        const int left = BlackHeight(node->left, keys);
        keys->push_back(ItemOf(node)->key);
        EXPECT_EQ(left, BlackHeight(node->right, keys));
        return left + (isBlack ? 1 : 0);
    }

    rb_node* root_ = nullptr;
};

TEST_F(RbTree, OneNodeIsTheBlackRoot) {
    Item item{{}, 1};
    Insert(&item);
    EXPECT_EQ(root_, &item.link);
    EXPECT_EQ(Check(), std::vector<int>{1});
}

TEST_F(RbTree, RemovedNodeIsUnlinked) {
    Item item{{}, 1};
    Insert(&item);
    EXPECT_TRUE(item.link.IsLinked());
    item.link.remove(&root_);
    EXPECT_FALSE(item.link.IsLinked());
    EXPECT_EQ(root_, nullptr);
}

TEST_F(RbTree, AscendingInsertionStaysBalanced) {
    std::vector<Item> items(64);
    std::vector<int> expected;
    for (int key = 0; key < 64; ++key) {
        items[static_cast<std::size_t>(key)].key = key;
        Insert(&items[static_cast<std::size_t>(key)]);
        expected.push_back(key);
        ASSERT_EQ(Check(), expected);
    }
}

TEST_F(RbTree, RemovingTheRootTimeAndAgainEmptiesTheTree) {
    std::vector<Item> items(100);
    for (std::size_t i = 0; i < items.size(); ++i) {
        items[i].key = static_cast<int>(i * 37 % 100);
        Insert(&items[i]);
    }
    for (std::size_t left = items.size(); left > 0; --left) {
        ASSERT_EQ(Check().size(), left);
        root_->remove(&root_);
    }
    EXPECT_EQ(root_, nullptr);
}

TEST_F(RbTree, RandomInsertionsAndRemovalsAgreeWithASet) {
    std::mt19937 random(20240607);
    std::vector<Item> items(200);
    for (std::size_t i = 0; i < items.size(); ++i) {
        items[i].key = static_cast<int>(i);
        items[i].link.MarkUnlinked();
    }
    std::set<int> model;
    for (int step = 0; step < 6000; ++step) {
        Item* item = &items[random() % items.size()];
        if (item->link.IsLinked()) {
            item->link.remove(&root_);
            model.erase(item->key);
        } else {
            Insert(item);
            model.insert(item->key);
        }
        ASSERT_EQ(Check(), std::vector<int>(model.begin(), model.end())) << "step " << step;
    }
}

}  // namespace
}  // namespace VELK
