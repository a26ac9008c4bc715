// Changes to trees that something is wrong with beside the change: what has to be refused, and what
// need not even be looked at.
#include "hfs/treehfs/bytes.h"
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
