// Nodes are handed over in the order in which they were changed last, also those that were modified
// before.
#include "tree_test.h"

namespace VELK::test {
namespace {

// Four leaves 1 .. 4 as full as they can be, root 5.
TreeImage FullLeaves(u32 recordsPerLeaf) {
    TreeShape shape;
    shape.recordsPerLeaf = recordsPerLeaf;
    return BuildTree(shape, NthRecords(kCatalogFileId, 4 * recordsPerLeaf, 24));
}

class HandOver : public ::testing::Test {
protected:
    void Open(u32 recordsPerLeaf) {
        tree_ = std::make_unique<TreeOnVolume>(FullLeaves(recordsPerLeaf), 512);
        ASSERT_EQ((*tree_)->header.rootNode, 5u);
    }
    // Marks these nodes modified, in this order.
    void Modify(const std::vector<u32>& numbers) {
        for (const u32 number : numbers) {
            HfsNode* node = nullptr;
            ASSERT_EQ((*tree_)->GetINode(number, &node, false), kOk);
            ASSERT_EQ((*tree_)->SetDirty(node, 0), kOk);
            node->refCount -= 1;
        }
        EXPECT_EQ(Order(), numbers);
    }
    std::vector<u32> Order() { return ModifiedNodes(**tree_); }

    std::unique_ptr<TreeOnVolume> tree_;
};

// The map, the right sibling, the new half, the old one, the parent.
TEST_F(HandOver, OfASplit) {
    Open(10);
    Modify({3, 2, 5, 4, 1});
    EXPECT_EQ(tree_->InsertNth(11, 24, true), kOk);
    EXPECT_EQ(Order(), (std::vector<u32>{4, 1, 0, 3, 6, 2, 5}));
}

// Both siblings, the leaf itself, the map, the parent.
TEST_F(HandOver, OfTheLastRecordOfALeaf) {
    Open(1);
    Modify({3, 1, 5, 4, 2});
    EXPECT_EQ(tree_->DeleteNth(1), kOk);
    EXPECT_EQ(Order(), (std::vector<u32>{4, 1, 3, 2, 0, 5}));
}

}  // namespace
}  // namespace VELK::test
