// DeleteRecord: what becomes of leaves, separators, chains and the root, and what is refused.
#include <algorithm>
#include <memory>
#include <utility>

#include "hfs/treehfs/cache.h"
#include "node_bench.h"
#include "tree_test.h"

namespace VELK::test {
namespace {

constexpr u32 kData = 24;

TreeImage Image(u32 nodeSize, u32 records, u32 perLeaf, u32 perIndex = 0, u32 minDepth = 0) {
    TreeShape shape;
    shape.nodeSize = nodeSize;
    shape.recordsPerLeaf = perLeaf;
    shape.childrenPerIndex = perIndex;
    shape.minDepth = minDepth;
    shape.clumpSize = nodeSize;
    return BuildTree(shape, NthRecords(kCatalogFileId, records, kData));
}

std::vector<TreeRecord> Without(u32 records, u32 from, u32 count = 1) {
    std::vector<TreeRecord> all = NthRecords(kCatalogFileId, records, kData);
    all.erase(all.begin() + from, all.begin() + from + count);
    return all;
}

class DeleteRecord : public GeometryTest {
protected:
    void Open(const TreeImage& image) {
        tree_.reset();
        tree_ = std::make_unique<TreeOnVolume>(image, GetParam());
    }
    void ExpectTree(const std::vector<TreeRecord>& records) {
        EXPECT_TRUE(LedgerHolds(**tree_, References((*tree_)->findData)));
        flat_ = tree_->Flushed();
        EXPECT_TRUE(IsSound(flat_));
        EXPECT_EQ(flat_.records, records);
        EXPECT_TRUE(tree_->capture.All().empty());
    }

    std::unique_ptr<TreeOnVolume> tree_;
    FlatTree flat_;
};

TEST_P(DeleteRecord, TheOnlyRecordLeavesAnEmptyTree) {
    Open(Image(NodeSize(), 1, 0));
    tree_->capture.TraceAll();
    EXPECT_EQ(tree_->DeleteNth(0), kOk);
    const BTHeaderMem& header = (*tree_)->header;
    EXPECT_EQ(header.rootNode, 0u);
    EXPECT_EQ(header.treeDepth, 0);
    EXPECT_EQ(header.firstLeafNode, 0u);
    EXPECT_EQ(header.lastLeafNode, 0u);
    EXPECT_EQ(header.leafRecords, 0u);
    EXPECT_EQ(header.freeNodes, 9u);
    EXPECT_EQ(tree_->capture.Take(), Events{Traced("Tree 4 is empty\n")});
    EXPECT_EQ(tree_->Node(1), Bytes(NodeSize()));
    ExpectTree({});
}

TEST_P(DeleteRecord, FirstRecordOfALeafReplacesTheSeparator) {
    Open(Image(NodeSize(), 9, 3));
    EXPECT_EQ(tree_->DeleteNth(3), kOk);
    EXPECT_EQ(ModifiedNodes(**tree_), (std::vector<u32>{2, 4}));
    ExpectTree(Without(9, 3));
    EXPECT_EQ(flat_.levels[2][0].keys[1], NthDiskKey(kCatalogFileId, 4));
}

TEST_P(DeleteRecord, FirstRecordOfTheTreeReplacesTheSeparatorsOfEveryLevel) {
    Open(Image(NodeSize(), 24, 2, 3));
    EXPECT_EQ(tree_->DeleteNth(0), kOk);
    ExpectTree(Without(24, 0));
    EXPECT_EQ(flat_.levels[4][0].keys[0], NthDiskKey(kCatalogFileId, 1));
}

TEST_P(DeleteRecord, OtherRecordsTouchNoParent) {
    for (const u32 n : {4u, 5u}) {
        Open(Image(NodeSize(), 9, 3));
        EXPECT_EQ(tree_->DeleteNth(n), kOk);
        EXPECT_EQ(ModifiedNodes(**tree_), std::vector<u32>{2});
        ExpectTree(Without(9, n));
    }
}

TEST_P(DeleteRecord, EmptiedLeafLeavesTheChainAndTheParent) {
    struct Case {
        u32 leaf;
        std::vector<u32> left;
    };
    for (const Case& emptied : {Case{0, {2, 3}}, Case{1, {1, 3}}, Case{2, {1, 2}}}) {
        Open(Image(NodeSize(), 9, 3));
        for (u32 i = 0; i < 3; ++i) {
            EXPECT_EQ(tree_->DeleteNth(3 * emptied.leaf + i), kOk);
        }
        EXPECT_EQ(tree_->Node(emptied.leaf + 1), Bytes(NodeSize()));
        ExpectTree(Without(9, 3 * emptied.leaf, 3));
        EXPECT_EQ(NumbersOf(flat_, 1), emptied.left);
        EXPECT_EQ(flat_.depth, 2u);
    }
}

TEST_P(DeleteRecord, RootOfOneChildCollapses) {
    for (const u32 emptied : {0u, 3u}) {
        Open(Image(NodeSize(), 6, 3));
        for (u32 i = 0; i < 3; ++i) {
            EXPECT_EQ(tree_->DeleteNth(emptied + i), kOk);
        }
        EXPECT_EQ((*tree_)->header.treeDepth, 1);
        EXPECT_EQ((*tree_)->header.rootNode, emptied == 0 ? 2u : 1u);
        EXPECT_EQ(tree_->Node(3), Bytes(NodeSize()));
        ExpectTree(Without(6, emptied, 3));
    }
}

// Two leaves (1, 2), each under two index nodes of one record (3, 4 and 5, 6), under one root (7).
TreeImage TwoChains(u32 nodeSize) {
    TreeImage image = Image(nodeSize, 6, 3);
    const Bytes keys[2] = {NthDiskKey(kCatalogFileId, 0), NthDiskKey(kCatalogFileId, 3)};
    NodeImage index;
    index.kind = kBTIndexNode;
    for (u32 level = 2; level <= 3; ++level) {
        index.height = static_cast<u8>(level);
        for (u32 side = 0; side < 2; ++side) {
            const u32 number = 2 * level - 1 + side;
            index.bLink = side == 0 ? 0 : number - 1;
            index.fLink = side == 0 ? number + 1 : 0;
            index.records = {Record(keys[side], number - 2)};
            image.SetNode(number, index.Build(nodeSize));
        }
    }
    index.height = 4;
    index.bLink = 0;
    index.fLink = 0;
    index.records = {Record(keys[0], 5), Record(keys[1], 6)};
    image.SetNode(7, index.Build(nodeSize));
    image.Patch16(0, kHeadTreeDepth, 4);
    image.Patch32(0, kHeadRootNode, 7);
    image.Patch8(0, kHeadMapRecord, 0xFF);
    image.Patch32(0, kHeadFreeNodes, image.totalNodes - 8);
    return image;
}

TEST_P(DeleteRecord, CollapseGoesDownSeveralLevels) {
    for (const u32 emptied : {0u, 3u}) {
        Open(TwoChains(NodeSize()));
        for (u32 i = 0; i < 3; ++i) {
            EXPECT_EQ(tree_->DeleteNth(emptied + i), kOk);
        }
        EXPECT_EQ((*tree_)->header.treeDepth, 1);
        EXPECT_EQ((*tree_)->header.rootNode, emptied == 0 ? 2u : 1u);
        EXPECT_EQ((*tree_)->header.freeNodes, (*tree_)->header.totalNodes - 2);
        ExpectTree(Without(6, emptied, 3));
    }
}

// A root of one record stays while nothing is taken from it.
TEST_P(DeleteRecord, RootOfOneRecordStaysWhenTheLevelBelowKeepsRecords) {
    Open(Image(NodeSize(), 6, 3, 0, 4));
    for (u32 n = 0; n < 3; ++n) {
        EXPECT_EQ(tree_->DeleteNth(n), kOk);
    }
    EXPECT_EQ((*tree_)->header.treeDepth, 4);
    ExpectTree(Without(6, 0, 3));
}

TEST_P(DeleteRecord, SubtreesGoLeafByLeaf) {
    Open(Image(NodeSize(), 32, 2, 2));
    std::vector<TreeRecord> left = NthRecords(kCatalogFileId, 32, kData);
    for (u32 step = 0; step < 32; ++step) {
        const u32 n = (step * 5 + 8) % 32;
        ASSERT_EQ(tree_->DeleteNth(n), kOk);
        for (std::size_t i = 0; i < left.size(); ++i) {
            if (left[i].key == NthDiskKey(kCatalogFileId, n)) {
                left.erase(left.begin() + static_cast<std::ptrdiff_t>(i));
                break;
            }
        }
        ExpectTree(left);
    }
    EXPECT_EQ(flat_.depth, 0u);
}

TEST_P(DeleteRecord, UnderfullNodesAreNeitherMergedNorRefilled) {
    Open(Image(NodeSize(), 18, 6));
    for (const u32 n : {7u, 8u, 9u, 10u, 11u, 1u, 2u, 3u, 4u, 5u}) {
        EXPECT_EQ(tree_->DeleteNth(n), kOk);
    }
    EXPECT_EQ(tree_->capture.Take(), Events{});
    flat_ = tree_->Flushed();
    EXPECT_TRUE(IsSound(flat_));
    EXPECT_EQ(flat_.levels[1].size(), 3u);
    EXPECT_EQ(flat_.levels[1][0].keys.size(), 1u);
    EXPECT_EQ(flat_.levels[1][1].keys.size(), 1u);
}

TEST_P(DeleteRecord, AbsentKeyIsNoFailure) {
    Open(Image(NodeSize(), 9, 3));
    EXPECT_EQ(tree_->Delete(NthHostKey(kCatalogFileId, 4, true)), kErrNotFound);
    EXPECT_EQ((*tree_)->header.leafRecords, 9u);
    EXPECT_TRUE(ModifiedNodes(**tree_).empty());
    EXPECT_TRUE(tree_->capture.All().empty());
    Open(Image(NodeSize(), 0, 0));
    EXPECT_EQ(tree_->DeleteNth(4), kErrNotFound);
}

INSTANTIATE_GEOMETRIES(DeleteRecord, ChangeGeometries);

class DeleteAtPath : public ::testing::Test {
protected:
    void Open(const TreeImage& image) {
        tree_.reset();
        tree_ = std::make_unique<TreeOnVolume>(image, 512);
    }
    CBTreeHfs& Tree() { return **tree_; }
    void Find(u32 n) {
        const HostKey key = NthHostKey(kCatalogFileId, n);
        ASSERT_EQ(Tree().FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr), kOk);
    }
    void Step(int count) {
        u8 record[64];
        unsigned size = 0;
        ASSERT_EQ(Tree().IncPos(count, record, sizeof record, &size, nullptr, 0, nullptr,
                                &Tree().findData),
                  kOk);
    }
    void ExpectRefused(int status, int expected, const Events& events) {
        EXPECT_EQ(status, expected);
        EXPECT_EQ(tree_->capture.Take(), events);
        EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
    }
    int DeleteHere() { return Tree().DeleteRecord(nullptr, 0, false); }

    const Events refused_ = {Reported(kReasonInvalid, 9267)};
    std::unique_ptr<TreeOnVolume> tree_;
};

TEST_F(DeleteAtPath, NullKeyDeletesWhereThePathStands) {
    Open(Image(512, 9, 3));
    Find(4);
    const u32 count = Tree().findData.searchCount;
    EXPECT_EQ(DeleteHere(), kOk);
    EXPECT_EQ(Tree().findData.searchCount, count + 1);
    EXPECT_EQ(tree_->Flushed().records, Without(9, 4));
}

TEST_F(DeleteAtPath, ValidPathTakesPrecedenceWhenAskedTo) {
    Open(Image(512, 9, 3));
    Find(4);
    const HostKey other = NthHostKey(kCatalogFileId, 7);
    EXPECT_EQ(Tree().DeleteRecord(other.Get(), other.id, true), kOk);
    EXPECT_EQ(tree_->Flushed().records, Without(9, 4));
}

TEST_F(DeleteAtPath, KeyIsLookedUpWhenThePathIsNotValid) {
    Open(Image(512, 9, 3));
    const HostKey key = NthHostKey(kCatalogFileId, 7);
    EXPECT_EQ(Tree().DeleteRecord(key.Get(), key.id, true), kOk);
    EXPECT_EQ(tree_->Flushed().records, Without(9, 7));
}

TEST_F(DeleteAtPath, NoKeyAndNoPathIsRefused) {
    Open(Image(512, 9, 3));
    ExpectRefused(DeleteHere(), kErrInvalid, {Reported(kReasonInvalid, 5132)});
}

TEST_F(DeleteAtPath, PathThatAFlushClearedIsRefused) {
    Open(Image(512, 9, 3));
    Find(4);
    ASSERT_EQ(Tree().Flush(0), kOk);
    ExpectRefused(DeleteHere(), kErrInvalid, {Reported(kReasonInvalid, 9268)});
}

TEST_F(DeleteAtPath, InsertionPointBehindTheLastRecordIsRefused) {
    Open(Image(512, 9, 3));
    EXPECT_EQ(tree_->Delete(NthHostKey(kCatalogFileId, 5, true)), kErrNotFound);
    ExpectRefused(DeleteHere(), kErrInvalid, {Reported(kReasonInvalid, 9268)});
}

TEST_F(DeleteAtPath, StepIntoTheNextLeafLeavesTheParentBehind) {
    Open(Image(512, 9, 3));
    Find(5);
    Step(1);  // record 6 is the first of the next leaf, but the parent still leads to this one
    ExpectRefused(DeleteHere(), kErrInvalid, {Reported(kReasonInvalid, 9268)});
    EXPECT_TRUE(ModifiedNodes(Tree()).empty());
    Step(1);  // record 7 needs no parent
    EXPECT_EQ(DeleteHere(), kOk);
    EXPECT_EQ(tree_->Flushed().records, Without(9, 7));
}

TEST_F(DeleteAtPath, LevelsOutsideThePathAreRefused) {
    Open(Image(512, 9, 3));
    Find(4);
    for (const int level : {-1, 0, 3, 15, 16}) {
        ExpectRefused(Tree().DeleteTree(level, &Tree().findData), kErrInvalid, refused_);
    }
    for (const s32 index : {-1, 3, 100}) {  // of a leaf of three
        Tree().findData.path[1].index = index;
        ExpectRefused(Tree().DeleteTree(1, &Tree().findData), kErrInvalid, refused_);
    }
}

TEST_F(DeleteAtPath, ParentsThatDoNotLeadThereAreRefused) {
    Open(Image(512, 9, 3));
    Find(3);  // the first record of its leaf, so the parent would have to change
    HfsFindData& path = Tree().findData;
    u8* parent = path.path[2].node->bufs[0].data;
    const Bytes before(parent, parent + 512);
    parent[kDescKind] = static_cast<u8>(kBTMapNode);
    ExpectRefused(Tree().DeleteTree(1, &path), kErrInvalid, refused_);
    parent[kDescKind] = before[kDescKind];
    const u32 slot = 512 - 2 * (static_cast<u32>(path.path[2].index) + 1);
    parent[slot] = 0xFF;
    EXPECT_EQ(Tree().DeleteTree(1, &path), kErrInvalid);
    EXPECT_EQ(tree_->capture.Take().back(), refused_[0]);
    std::copy(before.begin(), before.end(), parent);
    const u16 depth = std::exchange(Tree().header.treeDepth, u16{0});
    ExpectRefused(Tree().DeleteTree(1, &path), kErrInvalid, refused_);
    Tree().header.treeDepth = depth;
    EXPECT_EQ(Tree().DeleteTree(1, &path), kOk);
}

// A lookup leaves a node it rejected in the path.
TEST_F(DeleteAtPath, NodeOfAnotherLevelIsRefused) {
    for (const bool asIndex : {false, true}) {
        TreeImage image = Image(512, 3, 0);
        image.Patch8(1, asIndex ? 8 : 9, asIndex ? 0 : 2);
        Open(image);
        EXPECT_EQ(Tree().ReadLevel(1, 1, nullptr), kErrCorrupt);
        tree_->capture.Take();
        Tree().findData.level = 1;
        ExpectRefused(Tree().DeleteTree(1, &Tree().findData), kErrInvalid,
                      {Reported(kReasonInvalid, 9267)});
        EXPECT_TRUE(ModifiedNodes(Tree()).empty());
    }
}

// Giving the old root back stores the header, and clears the mark; the collapse sets it again.
TEST_F(DeleteAtPath, CollapseOfTheRootLeavesTheHeaderDirty) {
    Open(Image(512, 4, 3));
    Find(3);
    EXPECT_EQ(Tree().DeleteTree(1, &Tree().findData), kOk);
    EXPECT_EQ(Tree().header.treeDepth, 1);
    EXPECT_EQ(Tree().header.rootNode, 1u);
    EXPECT_TRUE(Tree().IsDirty());
}

TEST_F(DeleteAtPath, LookupThatFailsIsReported) {
    TreeImage image = Image(512, 9, 3);
    image.Patch32(0, kHeadRootNode, 0);
    Open(image);
    ExpectRefused(tree_->DeleteNth(4), kErrCorrupt,
                  {Reported(kReasonTree, 2980), Reported(kErrCorrupt, 5124)});
}

TEST_F(DeleteAtPath, LeafRecordsOfZeroDoNotWrap) {
    TreeImage image = Image(512, 9, 3);
    image.Patch32(0, kHeadLeafRecords, 0);
    Open(image);
    ExpectRefused(tree_->DeleteNth(4), kErrCorrupt, {Reported(kReasonTree, 9269)});
    EXPECT_TRUE(ModifiedNodes(Tree()).empty());
}

// The root and the count of leaf records must agree on whether this was the last record.
TEST_F(DeleteAtPath, CountOfOneWithRecordsLeft) {
    TreeImage image = Image(512, 5, 5);
    image.Patch32(0, kHeadLeafRecords, 1);
    Open(image);
    ExpectRefused(tree_->DeleteNth(4), kErrCorrupt,
                  {Reported(kReasonTree, 9266), Reported(kErrCorrupt, 5148)});
    EXPECT_NE(Tree().header.rootNode, 0u);
}

TEST_F(DeleteAtPath, CountAboveOneWithNoRecordLeft) {
    TreeImage image = Image(512, 1, 1);
    image.Patch32(0, kHeadLeafRecords, 2);
    Open(image);
    ExpectRefused(tree_->DeleteNth(0), kErrCorrupt,
                  {Reported(kReasonTree, 9266), Reported(kErrCorrupt, 5148)});
}

TEST_F(DeleteAtPath, SlotsThatLieAreReported) {
    TreeImage image = Image(512, 9, 3);
    Open(image);
    Find(4);
    Tree().findData.path[1].node->bufs[0].data[512 - 7] += 1;  // free space starts odd
    ExpectRefused(
        DeleteHere(), kErrCorrupt,
        {Reported(kReasonNode, 9210), Reported(kErrCorrupt, 4831), Reported(kErrCorrupt, 5148)});
}

TEST_F(DeleteAtPath, NextRecordThatCannotBecomeASeparatorIsReported) {
    Open(Image(512, 9, 3));
    Find(3);
    HfsNode* leaf = Tree().findData.path[1].node;
    tree_->Volume().Damage(leaf, 14 + 44, 0x70);  // key length of the second record
    ExpectRefused(DeleteHere(), kErrCorrupt,
                  {Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 4970),
                   Reported(kErrCorrupt, 5148)});
}

// Siblings of an emptied leaf are checked before they are changed.
class DeleteUnlink : public DeleteAtPath {
protected:
    // Deletes the one record of the middle leaf after a patch of one node.
    void ExpectUnlink(const TreeImage& image, const Events& events, int status) {
        Open(image);
        Events expected = events;
        expected.push_back(Reported(status, 5148));
        ExpectRefused(tree_->DeleteNth(1), status, expected);
    }
    static TreeImage Three() { return Image(512, 3, 1); }
};

TEST_F(DeleteUnlink, LeftSiblingThatDisagrees) {
    TreeImage image = Three();
    image.Patch32(1, kDescFLink, 3);
    ExpectUnlink(image, {Reported(kReasonInvalid, 9260)}, kErrInvalid);
    image = Three();
    image.Patch8(1, kDescHeight, 2);
    ExpectUnlink(image, {Reported(kReasonInvalid, 9260)}, kErrInvalid);
    image = Three();
    image.Patch8(1, kDescKind, kBTMapNode);
    ExpectUnlink(image, {Reported(kReasonInvalid, 9260)}, kErrInvalid);
    image = Three();
    image.Patch32(2, kDescBLink, 2);
    image.Patch32(2, kDescFLink, 2);
    ExpectUnlink(image, {Reported(kReasonInvalid, 9260)}, kErrInvalid);
}

TEST_F(DeleteUnlink, RightSiblingThatDisagrees) {
    TreeImage image = Three();
    image.Patch32(3, kDescBLink, 1);
    ExpectUnlink(image, {Reported(kReasonInvalid, 9261)}, kErrInvalid);
    image = Three();
    image.Patch8(3, kDescHeight, 2);
    ExpectUnlink(image, {Reported(kReasonInvalid, 9261)}, kErrInvalid);
    image = Three();
    image.Patch8(3, kDescKind, kBTMapNode);
    ExpectUnlink(image, {Reported(kReasonInvalid, 9261)}, kErrInvalid);
}

TEST_F(DeleteUnlink, SiblingsThatAreNotThere) {
    TreeImage image = Three();
    image.Patch32(2, kDescBLink, 0x10000);
    ExpectUnlink(image, {Asserted(2638), Reported(kErrCorrupt, 4846)}, kErrCorrupt);
    image = Three();
    image.Patch32(2, kDescFLink, 0x10000);
    ExpectUnlink(image, {Asserted(2638), Reported(kErrCorrupt, 4859)}, kErrCorrupt);
}

TEST_F(DeleteUnlink, NodeThatTheMapCallsFree) {
    TreeImage image = Three();
    image.Patch8(0, kHeadMapRecord, 0xDF);  // node 2
    ExpectUnlink(image,
                 {Asserted(3807), Reported(kReasonTree, kAnySite), Reported(kErrCorrupt, 4872)},
                 kErrCorrupt);
}

// A child that cannot be the new root is found out before the old one is touched.
class DeleteCollapse : public DeleteAtPath {
protected:
    void ExpectCollapse(const TreeImage& image, const Events& events) {
        Open(image);
        const u32 root = Tree().header.rootNode;
        const Bytes before = tree_->Node(root);
        Events expected = events;
        expected.push_back(Reported(kErrCorrupt, 4993));
        expected.push_back(Reported(kErrCorrupt, 5148));
        ExpectRefused(tree_->DeleteNth(0), kErrCorrupt, expected);
        EXPECT_EQ(Tree().header.rootNode, root);
        EXPECT_EQ(Tree().header.treeDepth, 2);
        EXPECT_EQ(Get16(tree_->Node(root), kDescNumRecords), 1u);
    }
    static TreeImage Two() { return Image(512, 2, 1); }
    // Node offset of the child number in the second record of the root.
    static u32 SecondChild(const TreeImage& image) {
        return Get16(image.Node(3), 512 - 6) - kChildSize;
    }
};

TEST_F(DeleteCollapse, ChildOfAnotherHeight) {
    for (const u32 field : {kDescHeight, kDescKind}) {
        TreeImage image = Two();
        image.Patch32(1, kDescFLink, 0);  // else the emptied leaf would notice first
        image.Patch8(2, field, 2);
        ExpectCollapse(image, {Reported(kReasonTree, 9265)});
    }
}

TEST_F(DeleteCollapse, ChildThatIsTheHeaderOrTheRootItself) {
    for (const u32 child : {0u, 3u}) {
        TreeImage image = Two();
        image.Patch32(3, SecondChild(image), child);
        ExpectCollapse(image, {Reported(kReasonTree, 9265)});
    }
}

TEST_F(DeleteCollapse, ChildThatIsNotThere) {
    TreeImage image = Two();
    image.Patch32(3, SecondChild(image), 0x10000);
    ExpectCollapse(image, {Asserted(2638), Reported(kErrCorrupt, 4937)});
}

TEST_F(DeleteCollapse, ChildThatCannotBeRead) {
    TreeImage image = Two();
    const u32 second = Get16(image.Node(3), 512 - 4);
    image.Patch16(3, second, 4);  // a short key leaves more than a child number as data
    ExpectCollapse(image, {Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 4922)});
}

TEST_F(DeleteCollapse, RootThatTheMapCallsFree) {
    TreeImage image = Two();
    image.Patch8(0, kHeadMapRecord, 0xE0);  // node 3
    Open(image);
    ExpectRefused(tree_->DeleteNth(0), kErrCorrupt,
                  {Asserted(3807), Reported(kReasonTree, kAnySite), Reported(kErrCorrupt, 4931),
                   Reported(kErrCorrupt, 4993), Reported(kErrCorrupt, 5148)});
}

// A separator that grows may split its parent, up to a new root, also on a deletion.
TEST(DeleteGrowth, LongerSeparatorsSplitEveryLevel) {
    TreeShape shape;
    shape.recordsPerLeaf = 2;
    shape.freeNodes = 200;
    std::vector<TreeRecord> records;
    for (u32 n = 0; n < 200; ++n) {
        const std::u16string name(n % 2 == 0 ? 2u : 40u, u'a');
        records.push_back({DiskCatKey(16 + n, name), Pattern(kData, n)});
    }
    const TreeImage image = BuildTree(shape, records);
    for (u32 n = 0; n < 200; n += 2) {
        TreeOnVolume tree(image, 512);
        ASSERT_EQ(tree.Delete(HostCatKey(16 + n, u"aa")), kOk);
        ASSERT_TRUE(LedgerHolds(*tree, References(tree->findData)));
        const FlatTree flat = tree.Flushed();
        ASSERT_TRUE(IsSound(flat)) << n;
        ASSERT_EQ(flat.records.size(), 199u);
        ASSERT_TRUE(tree.capture.All().empty());
    }
    // All of them in one tree: the levels above grow.
    TreeOnVolume tree(image, 512);
    for (u32 n = 0; n < 200; n += 2) {
        ASSERT_EQ(tree.Delete(HostCatKey(16 + n, u"aa")), kOk);
    }
    const FlatTree flat = tree.Flushed();
    EXPECT_TRUE(IsSound(flat));
    EXPECT_EQ(flat.records.size(), 100u);
    EXPECT_GT(flat.depth, image.depth);
}

// The test before a deletion looks at the total of nodes; it is small only in a forged header.
TEST(DeleteGrowth, FileWithFewerNodesThanLevelsGrowsFirst) {
    TreeOnVolume tree(Image(512, 6, 3), 512);
    const HostKey key = NthHostKey(kCatalogFileId, 1);
    ASSERT_EQ(tree->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr), kOk);
    tree->header.totalNodes = 2;
    tree.Volume().fs.ForkOf(kCatalogFileId)->clumpSize = 512;
    EXPECT_EQ(tree.DeleteNth(1), kOk);
    EXPECT_EQ(tree->header.totalNodes, 5u);  // depth 2, 2 nodes, and one
    tree->header.totalNodes = 2;
    tree.Volume().options.maxFileSize = 512;
    EXPECT_EQ(tree.DeleteNth(2), kMemNoSpace);
    EXPECT_EQ(tree.capture.Take().back(), Reported(kMemNoSpace, 5145));
}

// Nodes that lost their place in the cache to another of the same number stay out.
class DeleteRekey : public DeleteAtPath {
protected:
    ~DeleteRekey() override { EXPECT_TRUE(ShortcutsHold(Tree())); }
    void Displace(HfsNode* node) {
        UnlinkNode(&Tree(), node);
        HfsNode* other = nullptr;
        ASSERT_EQ(Tree().GetINode(node->nodeNum, &other, false), kOk);
        other->refCount -= 1;
    }
};

TEST_F(DeleteRekey, LeafAfterItsSeparatorWasReplaced) {
    Open(Image(512, 9, 3));
    Find(3);
    Displace(Tree().findData.path[1].node);
    EXPECT_EQ(DeleteHere(), kOk);
    EXPECT_EQ(tree_->capture.Take(), Events{Asserted(4988)});
}

TEST_F(DeleteRekey, RootBeforeItCollapses) {
    Open(Image(512, 2, 1));
    Find(0);
    Displace(Tree().findData.path[2].node);
    EXPECT_EQ(DeleteHere(), kOk);
    EXPECT_EQ(tree_->capture.Take(), Events{Asserted(4918)});
}

}  // namespace
}  // namespace VELK::test
