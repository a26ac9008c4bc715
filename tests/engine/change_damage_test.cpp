// Changes to trees that something is wrong with beside the change: what has to be refused, and what
// need not even be looked at.
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/node_desc.h"
#include "tree_test.h"

namespace VELK::test {
namespace {

// A root leaf of the extents tree splits, the record ends in the new right node, and the
// header's maxKeyLength makes both separators unreadable. Nobody is asked to read them.
TEST(ChangeOfDamaged, SplitOfARootSaysNothingOfSeparatorsItNeedNotRead) {
    TreeShape shape;
    shape.fileId = kExtentsFileId;
    TreeImage image = BuildTree(shape, NthRecords(kExtentsFileId, 6, kExtentRecordSize));
    ASSERT_EQ(image.depth, 1u);
    image.Patch16(0, kHeadMaxKeyLength, 12);
    TreeOnVolume tree(image, 512);
    ASSERT_EQ(tree.OpenStatus(), kOk);
    tree.capture.Take();
    EXPECT_EQ(tree.InsertNth(6, kExtentRecordSize), kOk);
    EXPECT_EQ(tree->header.treeDepth, 2);
    EXPECT_EQ(tree.capture.Take(), Events{});
}

// The same in a tree that Create made, when the tree's own path is renewed.
TEST(ChangeOfDamaged, SplitOfARootThatCreateMadeSaysNothing) {
    HeapGuard heap;
    MemVolume volume;
    Capture capture;
    TestTree tree(&volume, kExtentsFileId);
    PrepareCreate(&*tree);
    (*tree).header.attributes = kBTBigKeysMask;
    (*tree).header.maxKeyLength = 12;
    const unsigned long long size = 64 * 512;
    ASSERT_EQ((*tree).Create(9, 0, &size), kOk);
    capture.Take();
    const Bytes data = Pattern(kExtentRecordSize, 1);
    for (u32 n = 20; n > 13; --n) {
        const HostKey key = NthHostKey(kExtentsFileId, n);
        EXPECT_EQ((*tree).InsertRecord(key, key.id, data.data(), kExtentRecordSize), kOk) << n;
    }
    EXPECT_EQ((*tree).header.treeDepth, 2);
    EXPECT_EQ(capture.Take(), Events{});
}

// The root collapses to an index node without records: that is no tree that could be gone on with.
TEST(ChangeOfDamaged, CollapseToAnEmptyIndexNodeIsNoSuccess) {
    TreeShape shape;
    shape.recordsPerLeaf = 1;
    shape.childrenPerIndex = 2;
    TreeImage image = BuildTree(shape, NthRecords(kCatalogFileId, 3, 24));
    ASSERT_EQ(image.depth, 3u);
    const u32 left = image.levels[2][0];
    NodeImage empty;
    empty.kind = kBTIndexNode;
    empty.height = 2;
    empty.fLink = image.levels[2][1];
    image.SetNode(left, empty.Build(512));
    TreeOnVolume tree(image, 512);
    ASSERT_EQ(tree.OpenStatus(), kOk);
    EXPECT_EQ(tree.DeleteNth(2), kErrCorrupt);
    EXPECT_EQ(tree.capture.Take(),
              (Events{Asserted(410), Reported(kReasonNode, 9005), Reported(kErrCorrupt, 9014),
                      Reported(kErrCorrupt, 4922), Reported(kErrCorrupt, 4993),
                      Reported(kErrCorrupt, 4993), Reported(kErrCorrupt, 5148)}));
}

// Leaf 2 is full, and leaf 1 has room for one record: that of number 9, which is not there.
TreeImage RoomForOneOnTheLeft() {
    TreeShape shape;
    shape.recordsPerLeaf = 10;
    const std::vector<TreeRecord> records = NthRecords(kCatalogFileId, 20, 24);
    TreeImage image = BuildTree(shape, records);
    NodeImage left;
    left.fLink = 2;
    for (u32 n = 0; n < 9; ++n) {
        left.records.push_back(Record(records[n].key, records[n].data));
    }
    image.SetNode(1, left.Build(512));
    return image;
}

// A root with a left sibling: the record alone goes there, and no separator above a root is asked
// for.
TEST(ChangeOfDamaged, ARootLendsToALeftSiblingThatItShouldNotHave) {
    TreeImage image = RoomForOneOnTheLeft();
    image.Patch32(0, kHeadRootNode, 2);
    image.Patch16(0, kHeadTreeDepth, 1);
    TreeOnVolume tree(image, 512);
    ASSERT_EQ(tree.OpenStatus(), kOk);
    tree.capture.Take();
    EXPECT_EQ(tree.InsertNth(9, 24), kOk);
    EXPECT_EQ(tree.capture.Take(), Events{});
    EXPECT_EQ(tree->findData.path[1].node->nodeNum, 2u);
    EXPECT_EQ(NumRecords(tree->findData.path[1].node), 10);
    EXPECT_EQ(tree->header.treeDepth, 1);
    EXPECT_EQ(tree->header.rootNode, 2u);
}

// One level by itself, on a path whose parent leads elsewhere: nothing above has to change.
TEST(ChangeAtPath, ALevelThatKeepsItsFirstKeyNeedsNoParent) {
    TreeOnVolume tree(RoomForOneOnTheLeft(), 512);
    ASSERT_EQ(tree.OpenStatus(), kOk);
    const HostKey first = NthHostKey(kCatalogFileId, 10);
    bool found = false;
    ASSERT_EQ(tree->FindEntry(first, first.id, nullptr, &found, nullptr, nullptr, nullptr, nullptr),
              kOk);
    tree->findData.path[2].index = 0;
    tree.capture.Take();
    const HostKey key = NthHostKey(kCatalogFileId, 9);
    const Bytes data = Pattern(24, 9);
    InsertKey entry = {};
    entry.convert = &tree->convert;
    entry.key = key;
    entry.keyLength = GetHost16(key.bytes);
    entry.data = data.data();
    entry.dataSize = 24;
    HfsNode* leaf = tree->findData.path[1].node;
    EXPECT_EQ(tree->InsertLevel(&tree->findData, &entry, nullptr, leaf, 0, 1), kOk);
    EXPECT_EQ(tree.capture.Take(), Events{});
    EXPECT_EQ(leaf->nodeNum, 2u);
    EXPECT_EQ(NumRecords(leaf), 10);
}

// A null path is the tree's own, for the steps of an operation too.
TEST(ChangeAtPath, ANullPathIsTheTreesOwn) {
    TreeOnVolume tree(BuildTree({}, NthRecords(kCatalogFileId, 4, 24)), 512);
    ASSERT_EQ(tree.OpenStatus(), kOk);
    const auto stand = [&](u32 n) {
        const HostKey key = NthHostKey(kCatalogFileId, n);
        bool found = false;
        EXPECT_EQ(tree->FindEntry(key, key.id, nullptr, &found, nullptr, nullptr, nullptr, nullptr),
                  kOk);
        return found;
    };
    ASSERT_TRUE(stand(2));
    EXPECT_EQ(tree->DeleteTree(1, nullptr), kOk);
    EXPECT_FALSE(stand(2));
    const HostKey key = NthHostKey(kCatalogFileId, 2);
    HfsFindLevel at = tree->findData.path[1];
    EXPECT_EQ(
        tree->InsertTree(key, "back", 4, at.node, at.index, 1, false, nullptr, &tree->convert),
        kOk);
    EXPECT_TRUE(stand(2));
    EXPECT_EQ(tree->DeleteTree(1, nullptr), kOk);
    EXPECT_FALSE(stand(2));
    at = tree->findData.path[1];
    InsertKey entry = {};
    entry.convert = &tree->convert;
    entry.key = key;
    entry.keyLength = GetHost16(key.bytes);
    entry.data = "more";
    entry.dataSize = 4;
    EXPECT_EQ(tree->InsertLevel(nullptr, &entry, nullptr, at.node, at.index, 1), kOk);
    EXPECT_TRUE(stand(2));
}

}  // namespace
}  // namespace VELK::test
