// InsertRecord on sound trees: where records go, when nodes share, split and grow a new root, what
// becomes of header, links and separators.
#include <algorithm>

#include "bench.h"
#include "geometry.h"
#include "hfs/treehfs/node_desc.h"
#include "node_bench.h"
#include "tree_test.h"

namespace VELK::test {
namespace {

constexpr u32 kData = 24;

TreeImage Image(u32 nodeSize, u32 records, u32 perLeaf = 0, u32 perIndex = 0, u32 freeNodes = 8) {
    TreeShape shape;
    shape.nodeSize = nodeSize;
    shape.recordsPerLeaf = perLeaf;
    shape.childrenPerIndex = perIndex;
    shape.freeNodes = freeNodes;
    shape.clumpSize = nodeSize;
    return BuildTree(shape, NthRecords(kCatalogFileId, records, kData));
}

// Records one leaf holds at most.
u32 PerLeaf(u32 nodeSize) {
    const u32 recordSize = static_cast<u32>(NthRecord(0, kData).size());  // all keys are as long
    return (nodeSize - 16) / (recordSize + 2);
}

// The records of Image with one more behind record `n`.
std::vector<TreeRecord> WithBetween(u32 records, u32 n, u32 dataSize = kData) {
    std::vector<TreeRecord> all = NthRecords(kCatalogFileId, records, kData);
    all.insert(all.begin() + n + 1, {NthDiskKey(kCatalogFileId, n, true), Pattern(dataSize, n)});
    return all;
}

class InsertRecord : public GeometryTest {
protected:
    u32 Fit() const { return PerLeaf(NodeSize()); }
};

TEST_P(InsertRecord, FirstRecordMakesALeafThatIsTheRoot) {
    TreeOnVolume tree(Image(NodeSize(), 0), GetParam());
    EXPECT_EQ(tree.InsertNth(5, 20), kOk);
    EXPECT_EQ(tree->header.treeDepth, 1);
    EXPECT_EQ(tree->header.leafRecords, 1u);
    EXPECT_EQ(tree->header.rootNode, 1u);
    EXPECT_EQ(tree->header.firstLeafNode, 1u);
    EXPECT_EQ(tree->header.lastLeafNode, 1u);
    EXPECT_TRUE(tree->isDirty);
    EXPECT_TRUE(LedgerHolds(*tree, 0));
    const FlatTree flat = tree.Flushed();
    EXPECT_TRUE(IsSound(flat));
    EXPECT_EQ(flat.records,
              (std::vector<TreeRecord>{{NthDiskKey(kCatalogFileId, 5), Pattern(20, 5)}}));
    EXPECT_TRUE(tree.capture.All().empty());
}

TEST_P(InsertRecord, FirstRecordGrowsAFileWithoutFreeNodes) {
    TreeOnVolume tree(Image(NodeSize(), 0, 0, 0, 0), GetParam());
    EXPECT_EQ(tree.InsertNth(5, 20), kOk);
    EXPECT_EQ(tree.Volume().Count(Call::kResize), 1u);
    EXPECT_EQ(tree->header.totalNodes, 2u);
    EXPECT_TRUE(IsSound(tree.Flushed()));
}

TEST_P(InsertRecord, ExistingKeyChangesNothing) {
    TreeOnVolume tree(Image(NodeSize(), Fit()), GetParam());
    EXPECT_EQ(tree.InsertNth(2, 20), kErrExists);
    EXPECT_TRUE(ModifiedNodes(*tree).empty());
    EXPECT_FALSE(tree->isDirty);
    EXPECT_EQ(tree->header.leafRecords, Fit());
    EXPECT_TRUE(tree.capture.All().empty());
}

TEST_P(InsertRecord, RoomBehindTheFirstRecordTouchesTheLeafOnly) {
    TreeOnVolume tree(Image(NodeSize(), 2 * Fit() - 2, Fit() - 1), GetParam());
    EXPECT_EQ(tree.InsertNth(1, kData, true), kOk);
    EXPECT_EQ(ModifiedNodes(*tree), std::vector<u32>{1});
    EXPECT_EQ(tree->header.leafRecords, 2 * Fit() - 1);
    EXPECT_TRUE(LedgerHolds(*tree, References(tree->findData)));
    const FlatTree flat = tree.Flushed();
    EXPECT_TRUE(IsSound(flat));
    EXPECT_EQ(flat.records, WithBetween(2 * Fit() - 2, 1));
}

TEST_P(InsertRecord, KeyBeforeAllReplacesTheSeparatorsOfEveryLevel) {
    TreeOnVolume tree(Image(NodeSize(), 20, 2, 3), GetParam());
    EXPECT_EQ(tree.Insert(HostCatKey(1, u"first"), Pattern(8, 1)), kOk);
    EXPECT_EQ(ModifiedNodes(*tree).size(), tree->header.treeDepth);
    const FlatTree flat = tree.Flushed();
    EXPECT_TRUE(IsSound(flat));
    EXPECT_EQ(flat.depth, 4u);
    EXPECT_EQ(flat.levels[4][0].keys[0], DiskCatKey(1, u"first"));
    EXPECT_TRUE(LedgerHolds(*tree, 0));
}

TEST_P(InsertRecord, RootLeafSplitsAtEveryIndex) {
    const TreeImage image = Image(NodeSize(), Fit());
    for (u32 n = 0; n <= Fit(); ++n) {
        TreeOnVolume tree(image, GetParam());
        const u32 dataSize = std::min(NodeSize() / 4, 480u);
        std::vector<TreeRecord> expected;
        if (n == Fit()) {
            ASSERT_EQ(tree.Insert(HostCatKey(1, u"first"), Pattern(dataSize, 1)), kOk);
            expected = NthRecords(kCatalogFileId, Fit(), kData);
            expected.insert(expected.begin(), {DiskCatKey(1, u"first"), Pattern(dataSize, 1)});
        } else {
            ASSERT_EQ(tree.InsertNth(n, dataSize, true), kOk);
            expected = WithBetween(Fit(), n, dataSize);
        }
        ASSERT_TRUE(LedgerHolds(*tree, References(tree->findData)));
        ASSERT_EQ(References(tree->findData), 2u);  // leaf and new root
        const FlatTree flat = tree.Flushed();
        ASSERT_TRUE(IsSound(flat)) << n;
        ASSERT_EQ(flat.records, expected) << n;
        ASSERT_EQ(flat.depth, 2u);
        ASSERT_EQ(flat.levels[2][0].keys.size(), 2u);
        ASSERT_EQ(flat.lastLeaf, 2u);
        ASSERT_TRUE(tree.capture.All().empty());
    }
}

TEST_P(InsertRecord, LeftSiblingWithRoomTakesRecordsBeforeASplit) {
    TreeImage image = Image(NodeSize(), Fit() + 2, 2);
    // Two leaves: two records in the first, all that fit in the second.
    TreeShape shape = image.shape;
    shape.recordsPerLeaf = 0;
    const std::vector<TreeRecord> records = NthRecords(kCatalogFileId, Fit() + 2, kData);
    std::vector<Bytes> right;
    for (u32 n = 2; n < Fit() + 2; ++n) {
        right.push_back(Record(records[n].key, records[n].data));
    }
    shape.minDepth = 2;
    image = BuildTree(shape, {records.begin(), records.begin() + Fit() + 1});
    NodeImage leaf;
    leaf.fLink = 2;
    leaf.records = SomeRecords(2, kData);
    image.SetNode(1, leaf.Build(NodeSize()));
    leaf.fLink = 0;
    leaf.bLink = 1;
    leaf.records = right;
    image.SetNode(2, leaf.Build(NodeSize()));
    NodeImage root;
    root.kind = kBTIndexNode;
    root.height = 2;
    root.records = {Record(records[0].key, 1), Record(records[2].key, 2)};
    image.SetNode(3, root.Build(NodeSize()));
    image.Patch32(0, kHeadLeafRecords, Fit() + 2);

    TreeOnVolume tree(image, GetParam());
    EXPECT_EQ(tree.InsertNth(Fit(), kData, true), kOk);
    const FlatTree flat = tree.Flushed();
    EXPECT_TRUE(IsSound(flat));
    EXPECT_EQ(flat.records, WithBetween(Fit() + 2, Fit()));
    EXPECT_EQ(NumbersOf(flat, 1), (std::vector<u32>{1, 2}));
    EXPECT_GT(flat.levels[1][0].keys.size(), 2u);
    EXPECT_TRUE(tree.capture.All().empty());
}

TEST_P(InsertRecord, FullLeavesSplitAndRelink) {
    TreeOnVolume tree(Image(NodeSize(), 3 * Fit()), GetParam());
    EXPECT_EQ(tree.InsertNth(Fit() + 1, kData, true), kOk);  // in the middle leaf
    const FlatTree flat = tree.Flushed();
    EXPECT_TRUE(IsSound(flat));
    EXPECT_EQ(NumbersOf(flat, 1), (std::vector<u32>{1, 2, 5, 3}));
    EXPECT_EQ(flat.records, WithBetween(3 * Fit(), Fit() + 1));
}

TEST_P(InsertRecord, SplitOfTheLastLeafMakesTheNewOneTheLast) {
    TreeOnVolume tree(Image(NodeSize(), 3 * Fit()), GetParam());
    EXPECT_EQ(tree.InsertNth(3 * Fit(), kData), kOk);
    EXPECT_EQ(tree->header.lastLeafNode, 5u);
    EXPECT_EQ(tree->header.firstLeafNode, 1u);
    EXPECT_TRUE(IsSound(tree.Flushed()));
}

TEST_P(InsertRecord, OddDataIsPaddedAndReadExactly) {
    TreeOnVolume tree(Image(NodeSize(), 3), GetParam());
    const HostKey key = HostCatKey(900, u"odd");
    const std::unique_ptr<u8[]> data(new u8[5]{1, 2, 3, 4, 5});
    EXPECT_EQ(tree->InsertRecord(key.Get(), key.id, data.get(), 5), kOk);
    EXPECT_EQ(tree.Flushed().records.back().data, (Bytes{1, 2, 3, 4, 5, 0}));
}

TEST_P(InsertRecord, TooFewFreeNodesGrowTheFileFirst) {
    TreeOnVolume tree(Image(NodeSize(), 3 * Fit(), 0, 0, 1), GetParam());
    const u32 total = tree->header.totalNodes;
    EXPECT_EQ(tree.InsertNth(0, kData, true), kOk);
    EXPECT_EQ(tree.Volume().Count(Call::kResize), 1u);
    // The depth, 2, less the one free node, and one more.
    EXPECT_GE(tree->header.totalNodes, total + 2);
    EXPECT_TRUE(IsSound(tree.Flushed()));
}

TEST_P(InsertRecord, EnoughFreeNodesDoNotGrowTheFile) {
    TreeOnVolume tree(Image(NodeSize(), 3 * Fit(), 0, 0, 3), GetParam());
    EXPECT_EQ(tree.InsertNth(0, kData, true), kOk);
    EXPECT_EQ(tree.Volume().Count(Call::kResize), 0u);
    EXPECT_TRUE(IsSound(tree.Flushed()));
}

TEST_P(InsertRecord, ARecordThatFitsGrowsNoFile) {
    TreeOnVolume tree(Image(NodeSize(), 9, 3, 0, 0), GetParam());
    ASSERT_EQ(tree->header.freeNodes, 0u);
    EXPECT_EQ(tree.InsertNth(4, kData, true), kOk);
    EXPECT_EQ(tree.Volume().Count(Call::kResize), 0u);
    EXPECT_EQ(tree.Flushed().records, WithBetween(9, 4));
}

INSTANTIATE_GEOMETRIES(InsertRecord, ChangeGeometries);

// Trees whose nodes are all full: one insertion splits every level.
class FullTree : public GeometryTest {};

TEST_P(FullTree, InsertionBehindEveryFewRecords) {
    const u32 records = PerLeaf(NodeSize()) * 120;
    const TreeImage image = Image(NodeSize(), records, 0, 0, 16);
    ASSERT_GE(image.depth, 3u);
    for (u32 n = 0; n < records; n += records / 23) {
        TreeOnVolume tree(image, GetParam());
        ASSERT_EQ(tree.InsertNth(n, 100, true), kOk);
        ASSERT_TRUE(LedgerHolds(*tree, References(tree->findData)));
        const FlatTree flat = tree.Flushed();
        ASSERT_TRUE(IsSound(flat)) << n;
        ASSERT_EQ(flat.records, WithBetween(records, n, 100)) << n;
        ASSERT_TRUE(tree.capture.All().empty()) << tree.capture.All()[0];
    }
}

// A key before all others splits the first leaf and replaces its separator at once, with names of
// every length so that keys of all levels straddle block ends at some time.
TEST_P(FullTree, BothSeparatorsAtOnce) {
    const u32 records = PerLeaf(NodeSize()) * 120;
    const TreeImage image = Image(NodeSize(), records, 0, 0, 16);
    const u32 longest = NodeSize() == 512 ? 50 : 110;
    u32 indexSplits = 0;
    for (u32 length = 1; length <= longest; length += 3) {
        TreeOnVolume tree(image, GetParam());
        const std::u16string name(length, u'x');
        ASSERT_EQ(tree.Insert(HostCatKey(2, name), Pattern(100, 1)), kOk);
        const FlatTree flat = tree.Flushed();
        ASSERT_TRUE(IsSound(flat)) << length;
        ASSERT_EQ(flat.records.size(), records + 1);
        ASSERT_EQ(flat.records[0].key, DiskCatKey(2, name));
        indexSplits += flat.levels[2].size() > image.levels[2].size() ? 1u : 0u;
        ASSERT_TRUE(tree.capture.All().empty()) << tree.capture.All()[0];
    }
    EXPECT_GT(indexSplits, 3u);
}

std::vector<Geometry> FullGeometries() {
    return {{512, 512}, {1024, 512}, {1024, 1024}};
}
INSTANTIATE_GEOMETRIES(FullTree, FullGeometries);

// Index keys of the extents tree all take the header's length.
TEST(ExtentsInsert, SplitsUpToSeveralLevels) {
    TreeShape shape;
    shape.fileId = kExtentsFileId;
    shape.clumpSize = 8192;
    TreeOnVolume tree(BuildTree(shape, {}), 512);
    std::vector<TreeRecord> expected;
    for (u32 n = 0; n < 700; ++n) {
        ASSERT_EQ(tree.InsertNth(699 - n, 64), kOk);
        expected.insert(expected.begin(),
                        {NthDiskKey(kExtentsFileId, 699 - n), Pattern(64, 699 - n)});
    }
    const FlatTree flat = tree.Flushed();
    EXPECT_TRUE(IsSound(flat));
    EXPECT_EQ(flat.records, expected);
    EXPECT_EQ(flat.depth, 3u);
    EXPECT_EQ(Get16(flat.levels[3][0].keys[0], 0), 10u);
    EXPECT_TRUE(tree.capture.All().empty());
}

// The map covers just the nodes there are: one more than else is asked for, for a map node.
TEST(InsertGrowth, NodesBeyondTheMapBringAMapNode) {
    TreeShape shape;
    shape.clumpSize = 512;
    const u32 fit = PerLeaf(512);
    shape.freeNodes = 2048 - 2;
    TreeImage image = BuildTree(shape, NthRecords(kCatalogFileId, fit, kData));
    ASSERT_EQ(image.totalNodes, 2048u);
    for (u32 byte = 0; byte < 256; ++byte) {
        image.Patch8(0, kHeadMapRecord + byte, 0xFF);
    }
    image.Patch32(0, kHeadFreeNodes, 0);
    TreeOnVolume tree(image, 512);
    EXPECT_EQ(tree.InsertNth(0, kData, true), kOk);
    EXPECT_EQ(tree->header.totalNodes, 2048u + 3);  // depth 1, one more, one for the map
    EXPECT_EQ(tree->header.freeNodes, 0u);          // map node, new leaf, new root
    EXPECT_EQ(tree.Node(2048)[kDescKind], kBTMapNode);
    EXPECT_EQ(tree->header.rootNode, 2050u);
}

// In a tree made here keys come into one leaf in descending order, behind its first record: each is
// looked up on the leaf of the one before. The root is split meanwhile, and that leaf gets another
// parent, where the next split of the leaf has to be entered.
TEST(InsertOnOneLeaf, ASplitOfItsParentIsFollowed) {
    Bench bench(Blocks(512));
    bench.Create(9, CompareCatKeysCaseIns);
    const Bytes data = Pattern(100, 1);
    const auto insert = [&](u32 parent, const std::u16string& name) {
        return bench->InsertRecord(HostCatKey(parent, name), parent, data.data(), 100);
    };
    const HfsFindLevel* path = bench->findData.path;
    u32 last = 0;
    while (bench->header.treeDepth < 2 || NumRecords(path[2].node) < 24) {
        ASSERT_EQ(insert(++last, u"a"), kOk);
    }
    // Full leaves, so that none takes records of its right sibling.
    for (u32 parent = 1; parent <= last; ++parent) {
        ASSERT_EQ(insert(parent, u"a"), kErrExists);
        for (u32 n = NumRecords(path[1].node); n < 4; ++n) {
            ASSERT_EQ(insert(parent, std::u16string(n, u'b')), kOk);
        }
    }
    u32 parent = last;
    do {
        ASSERT_EQ(insert(--parent, u"a"), kErrExists);
    } while (path[1].index != 0);
    const s32 index = path[2].index;
    EXPECT_GE(index, 20);
    EXPECT_EQ(NumRecords(path[2].node), 24u);
    for (char16_t unit = u'z'; unit >= u'a'; --unit) {
        ASSERT_EQ(insert(parent, {u'a', unit, u'x'}), kOk) << static_cast<u32>(unit);
    }
    EXPECT_EQ(bench->header.treeDepth, 3);
    EXPECT_LT(path[2].index, index);
    EXPECT_EQ(bench.capture.Take(), Events{});
    bench->findData.ClearPath();
}

}  // namespace
}  // namespace VELK::test
