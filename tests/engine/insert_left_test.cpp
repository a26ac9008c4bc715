// A record alone that goes into the left sibling of its leaf, and what the leaf's separator has to
// do with it.
#include "tree_test.h"

namespace VELK::test {
namespace {

// A full leaf whose left sibling has room for one long record, and no more to share.
class InsertAloneIntoTheLeft : public ::testing::Test {
protected:
    static constexpr u32 kData = 24;
    static constexpr u32 kFit = 10;  // records of a full leaf of 512 bytes
    static constexpr u32 kLeft = 7;
    static constexpr u32 kLong = 138;  // bytes of data

    static TreeImage UnevenImage(const Bytes& separator) {
        TreeShape shape;
        shape.recordsPerLeaf = kFit;
        const std::vector<TreeRecord> records = NthRecords(kCatalogFileId, kLeft + kFit, kData);
        TreeImage image = BuildTree(shape, records);
        NodeImage leaf;
        leaf.fLink = 2;
        for (u32 n = 0; n < kLeft + kFit; ++n) {
            if (n == kLeft) {
                image.SetNode(1, leaf.Build(512));
                leaf = NodeImage{};
                leaf.bLink = 1;
            }
            leaf.records.push_back(Record(records[n].key, records[n].data));
        }
        image.SetNode(2, leaf.Build(512));
        NodeImage root;
        root.kind = kBTIndexNode;
        root.height = 2;
        root.records = {Record(records[0].key, 1), Record(separator, 2)};
        image.SetNode(3, root.Build(512));
        return image;
    }
    void TearDown() override { path_.ClearPath(); }
    void Open(const TreeImage& image) { tree_ = std::make_unique<TreeOnVolume>(image, 512); }
    CBTreeHfs& Tree() { return **tree_; }
    void StandAt(u32 n) {
        const HostKey key = NthHostKey(kCatalogFileId, n);
        bool found = false;
        ASSERT_EQ(
            kOk, Tree().FindEntry(key, key.id, &path_, &found, nullptr, nullptr, nullptr, nullptr));
        ASSERT_TRUE(found);
    }
    int InsertLong() {
        const Bytes key = NthDiskKey(kCatalogFileId, kLeft - 1, true);
        const Bytes data = Pattern(kLong, 1);
        return Tree().InsertTree(reinterpret_cast<const BTreeKey*>(key.data()), data.data(), kLong,
                                 path_.path[1].node, 0, 1, false, &path_, nullptr);
    }
    u32 RecordsOf(u32 node) { return Get16(tree_->Node(node), kDescNumRecords); }
    // The key of the root's record for the full leaf.
    Bytes SeparatorKey() {
        const Bytes root = tree_->Node(3);
        const u32 at = Get16(root, 512 - 2 * 2);
        return Bytes(root.begin() + at, root.begin() + at + Get16(root, at) + 2);
    }

    std::unique_ptr<TreeOnVolume> tree_;
    HfsFindData path_;
};

TEST_F(InsertAloneIntoTheLeft, SeparatorThatIsTheFirstKeyStays) {
    const Bytes first = NthDiskKey(kCatalogFileId, kLeft);
    Open(UnevenImage(first));
    StandAt(kLeft);
    const Bytes root = tree_->Node(3);
    EXPECT_EQ(InsertLong(), kOk);
    EXPECT_TRUE(tree_->capture.Take().empty());
    EXPECT_EQ(RecordsOf(1), kLeft + 1);
    EXPECT_EQ(RecordsOf(2), kFit);
    EXPECT_EQ(root, tree_->Node(3));
}

TEST_F(InsertAloneIntoTheLeft, SeparatorBelowTheRecordRisesToTheFirstKey) {
    Open(UnevenImage(NthDiskKey(kCatalogFileId, kLeft - 1, true)));
    StandAt(kLeft);
    EXPECT_EQ(InsertLong(), kOk);
    EXPECT_TRUE(tree_->capture.Take().empty());
    EXPECT_EQ(RecordsOf(1), kLeft + 1);
    EXPECT_EQ(RecordsOf(2), kFit);
    EXPECT_EQ(SeparatorKey(), NthDiskKey(kCatalogFileId, kLeft));
    const HostKey key = NthHostKey(kCatalogFileId, kLeft - 1, true);
    bool found = false;
    path_.ClearPath();
    EXPECT_EQ(kOk,
              Tree().FindEntry(key, key.id, &path_, &found, nullptr, nullptr, nullptr, nullptr));
    EXPECT_TRUE(found);
}

// A root has no separator, whatever its links say.
TEST_F(InsertAloneIntoTheLeft, RootWithASiblingTellsNobody) {
    TreeImage image = UnevenImage(NthDiskKey(kCatalogFileId, kLeft));
    image.Patch32(0, kHeadRootNode, 2);
    image.Patch16(0, kHeadTreeDepth, 1);
    Open(image);
    StandAt(kLeft);
    EXPECT_EQ(InsertLong(), kOk);
    EXPECT_TRUE(tree_->capture.Take().empty());
    EXPECT_EQ(RecordsOf(1), kLeft + 1);
    EXPECT_EQ(RecordsOf(2), kFit);
}

// An index node of another writer is full of separators with more data than a child's number, but
// for the first. One more, of the first leaf, which is split, sends some of them to the left
// sibling: nobody is led by the odd ones, and nothing is said of them.
TEST(InsertBesideDamage, SeparatorsOutOfTheOrdinaryThatMoveAreNotReported) {
    TreeShape shape;
    shape.childrenPerIndex = 4;
    const std::vector<TreeRecord> records = NthRecords(kCatalogFileId, 32, 100);
    TreeImage image = BuildTree(shape, records);
    ASSERT_EQ(image.levels[1].size(), 8u);
    NodeImage index;
    index.kind = kBTIndexNode;
    index.height = 2;
    index.bLink = 9;
    index.records = {Record(records[16].key, 5)};
    for (u32 n = 1; n < 4; ++n) {
        Bytes data(134);
        Put32(&data, 0, 5 + n);
        index.records.push_back(Record(records[16 + 4 * n].key, data));
    }
    image.SetNode(10, index.Build(512));
    TreeOnVolume tree(image, 512);
    EXPECT_EQ(tree.InsertNth(17, 100, true), kOk);
    EXPECT_TRUE(tree.capture.Take().empty());
    EXPECT_EQ(Get16(tree.Node(9), kDescNumRecords), 7u);
    EXPECT_EQ(Get16(tree.Node(10), kDescNumRecords), 2u);
}

}  // namespace
}  // namespace VELK::test
