// Splits at the edges of what a node can hold or a path can know: separators as long as a node,
// records that can be read in one place and not in another, nodes freed and taken again.
#include <memory>

#include "tree_test.h"

namespace VELK::test {
namespace {

constexpr u32 kData = 24;
constexpr u32 kFit = 10;         // records of the small trees that fill a leaf of 512 bytes
constexpr u32 kLongData = 1510;  // bytes that lie in four blocks of 512 where a node begins

class SplitLimits : public ::testing::Test {
protected:
    void Open(const TreeImage& image) {
        tree_.reset();
        tree_ = std::make_unique<TreeOnVolume>(image, 512);
    }
    CBTreeHfs& Tree() { return **tree_; }

    std::unique_ptr<TreeOnVolume> tree_;
};

// Two full leaves of which the first one says that it holds two records.
TreeImage LeafWithRoomBefore() {
    TreeImage image = BuildTree({}, NthRecords(kCatalogFileId, 2 * kFit, kData));
    image.Patch16(1, kDescNumRecords, 2);
    return image;
}

// Full leaves of three records of 1,000 bytes.
TreeImage LeavesOfThree(u32 leaves) {
    TreeShape shape;
    shape.nodeSize = 4096;
    return BuildTree(shape, NthRecords(kCatalogFileId, 3 * leaves, 1000));
}

// A leaf that one record fills to the last byte; with a node number its key is longer than a node.
TEST_F(SplitLimits, SeparatorAndNodeNumberLongerThanANode) {
    Open(BuildTree({}, {}));
    ASSERT_EQ(tree_->Insert(HostCatKey(2, std::u16string(242, u'a')), Pattern(2, 1)), kOk);
    EXPECT_EQ(tree_->Insert(HostCatKey(3, u"b"), Pattern(2, 2)), kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(),
              (Events{Reported(kReasonInvalid, 1183), Reported(kErrInvalid, 1370),
                      Reported(kErrInvalid, 4501), Reported(kErrInvalid, 4639),
                      Reported(kErrInvalid, 4593), Reported(kErrInvalid, 5092)}));
    EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
}

TEST_F(SplitLimits, FirstRecordOfTheNewLeafCannotBeReadForARoot) {
    Open(LeavesOfThree(1));
    EXPECT_EQ(tree_->InsertNth(1, kLongData, true), kErrCorrupt);
    EXPECT_EQ(tree_->capture.Of(Event::Kind::kReport),
              (Events{Reported(kReasonNode, 9007), Reported(kErrCorrupt, 4503),
                      Reported(kErrCorrupt, 4639), Reported(kErrCorrupt, 4593),
                      Reported(kErrCorrupt, 5092)}));
    EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
}

TEST_F(SplitLimits, FirstRecordOfTheNewLeafCannotBeReadForAParent) {
    Open(LeavesOfThree(2));
    EXPECT_EQ(tree_->InsertNth(4, kLongData, true), kErrCorrupt);
    EXPECT_EQ(tree_->capture.Of(Event::Kind::kReport),
              (Events{Reported(kReasonNode, 9007), Reported(kErrCorrupt, 4757),
                      Reported(kErrCorrupt, 4593), Reported(kErrCorrupt, 5092)}));
    EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
}

// Five records go to the left sibling; the sixth, which no search has looked at, comes first.
TEST_F(SplitLimits, FirstRecordAfterLendingCannotBeRead) {
    TreeImage image = LeafWithRoomBefore();
    image.Patch16(2, 14 + 5 * 44, 0x7000);  // its key length
    Open(image);
    EXPECT_EQ(tree_->InsertNth(2 * kFit - 1, kData, true), kErrCorrupt);
    EXPECT_EQ(tree_->capture.Take(),
              (Events{Reported(kReasonNode, 9006), Reported(kErrCorrupt, 4716),
                      Reported(kErrCorrupt, 4593), Reported(kErrCorrupt, 5092)}));
    EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
}

TEST_F(SplitLimits, RootThatLendsToASiblingHasNoParentToTell) {
    TreeImage image = LeafWithRoomBefore();
    image.Patch16(0, kHeadTreeDepth, 1);
    image.Patch32(0, kHeadRootNode, 2);
    Open(image);
    EXPECT_EQ(tree_->InsertNth(2 * kFit - 1, kData, true), kErrCorrupt);
    EXPECT_EQ(tree_->capture.Take(),
              (Events{Asserted(4685), Reported(kReasonTree, 9244), Reported(kErrCorrupt, 4593),
                      Reported(kErrCorrupt, 5092)}));
    EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
}

// Deleting the first record frees its leaf and the index node above; the separator that takes
// their place is longer, splits the root, and both nodes are taken again while the path holds them.
TEST_F(SplitLimits, DeletionThatSplitsTheRootTakesBothFreedNodes) {
    std::vector<TreeRecord> records;
    for (u32 i = 0; i < 27; ++i) {
        const u32 length = i == 0 ? 46 : i == 3 ? 96 : i == 9 || i == 18 ? 86 : 6;
        records.push_back({DiskCatKey(16 + i, std::u16string(length, u'n')), Pattern(2, i)});
    }
    TreeShape shape;
    shape.recordsPerLeaf = 1;
    shape.childrenPerIndex = 3;
    Open(BuildTree(shape, records));
    ASSERT_EQ(Tree().header.treeDepth, 4);
    for (const u32 i : {1u, 2u}) {
        ASSERT_EQ(tree_->Delete(HostCatKey(16 + i, std::u16string(6, u'n'))), kOk);
    }
    HfsNode* taken[2];  // the numbers that would be taken first
    for (HfsNode*& node : taken) {
        ASSERT_EQ(Tree().AllocateNode(&node), kOk);
        node->refCount -= 1;
    }
    ASSERT_EQ(tree_->capture.Take(), Events{});
    EXPECT_EQ(tree_->Delete(HostCatKey(16, std::u16string(46, u'n'))), kOk);
    EXPECT_EQ(tree_->capture.Take(), (Events{Asserted(4404), Asserted(4526)}));
    EXPECT_EQ(Tree().header.treeDepth, 5);
    EXPECT_EQ(Tree().header.rootNode, 28u);
    EXPECT_EQ(Tree().FreeNode(taken[0]->nodeNum), kOk);
    EXPECT_EQ(Tree().FreeNode(taken[1]->nodeNum), kOk);
    EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
    const FlatTree flat = tree_->Flushed();
    EXPECT_TRUE(IsSound(flat));
    records.erase(records.begin(), records.begin() + 3);
    EXPECT_EQ(flat.records, records);
}

}  // namespace
}  // namespace VELK::test
