// The search for a free node takes the first of the map, and goes on where the last one ended only
// as long as nothing before that can have become free.
#include "sparse_volume.h"

namespace VELK::test {
namespace {

class FreeNodeSearch : public SparseTreeTest {
protected:
    void SetUp() override {
        SparseTreeTest::SetUp();
        Open(20, 3);
    }
    // Takes so many nodes and expects these.
    ::testing::AssertionResult TakesNodes(const std::vector<u32>& numbers) {
        for (const u32 number : numbers) {
            HfsNode* node = nullptr;
            if (const int status = Tree().AllocateNode(&node)) {
                return ::testing::AssertionFailure() << "status " << status;
            }
            node->refCount -= 1;
            if (node->nodeNum != number) {
                return ::testing::AssertionFailure() << node->nodeNum << ", not " << number;
            }
        }
        return ::testing::AssertionSuccess();
    }
};
INSTANTIATE_GEOMETRIES(FreeNodeSearch, MapGeometries);

TEST_P(FreeNodeSearch, NodeThatIsGivenBackIsFirstAgain) {
    ASSERT_TRUE(TakesNodes({3, 4, 5}));
    ASSERT_EQ(Tree().FreeNode(4), kOk);
    EXPECT_TRUE(TakesNodes({4, 6}));
}

TEST_P(FreeNodeSearch, BitThatSomebodyElseClearsIsSeen) {
    ASSERT_TRUE(TakesNodes({3, 4, 5}));
    HfsNode* map = nullptr;
    ASSERT_EQ(Tree().GetMapNode(&map), kOk);
    ASSERT_EQ(Tree().SetDirty(map, kHeadMapRecord, 1), kOk);
    map->bufs[0].data[kHeadMapRecord] = 0xEC;  // node 3 is free again
    Tree().header.freeNodes += 1;
    map->refCount -= 1;
    EXPECT_TRUE(TakesNodes({3, 6}));
}

TEST_P(FreeNodeSearch, MapThatIsReadAgainIsSearchedFromItsStart) {
    ASSERT_TRUE(TakesNodes({3, 4, 5}));
    ASSERT_EQ(Tree().Flush(0), kOk);
    ASSERT_EQ(Tree().nodeCount, 0u);
    Poke8(0, kHeadMapRecord, 0xF4);  // node 4 is free again
    EXPECT_TRUE(TakesNodes({4, 6}));
}

}  // namespace
}  // namespace VELK::test
