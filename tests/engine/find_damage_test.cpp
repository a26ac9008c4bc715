// Lookup on damaged trees and failing services: a status, its reports, no reference lost, nothing
// to write.
#include <gtest/gtest.h>

#include <cstring>

#include "bench.h"
#include "hfs/treehfs/node_child.h"

namespace VELK::test {
namespace {

// The SmallTree of nine leaves: leaves 1 .. 9 of two records, index nodes 10, 11, 12, root 13.
constexpr u32 kRoot = 13;
constexpr u32 kIndex = 10;
constexpr u32 kLeaf = 1;

class FindDamage : public GeometryTest {
protected:
    FindDamage() : bench_(Blocks(GetParam())), image_(SmallTree(NodeSize(), 9)) {}
    ~FindDamage() override { path_.ClearPath(); }

    // Opens the damaged tree and looks its first record up.
    int Find() {
        bench_.Open(image_);
        bench_.capture.TraceAll();
        const HostKey key = NthHostKey(4, 0);
        bool found = true;
        const int status =
            bench_->FindEntry(key, key.id, &path_, &found, nullptr, nullptr, nullptr, nullptr);
        EXPECT_TRUE(LedgerHolds(*bench_.tree, References(path_)));
        EXPECT_TRUE(bench_->modifiedList.IsEmpty());
        return status;
    }
    // Node offset of the child number of record `index` in an index node of this image.
    u32 ChildAt(u32 index) const { return 14 + index * 24 + 20; }

    Bench bench_;
    TreeImage image_;
    HfsFindData path_;
};

TEST_P(FindDamage, ARootOfZeroIsRefused) {
    image_.Patch32(0, 16, 0);
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonTree, 2980)});
    EXPECT_TRUE(path_.valid);
    EXPECT_EQ(path_.searchCount, 1u);
}

TEST_P(FindDamage, ARootOfTheWrongHeightIsRefused) {
    image_.Patch8(kRoot, 9, 4);
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Traced("Incorrect node height: 4 != 3\n"), Reported(kReasonTree, 2916),
                      Reported(kErrCorrupt, 2982)}));
    EXPECT_EQ(path_.path[3].node->nodeNum, kRoot);
}

TEST_P(FindDamage, ALeafOfTheWrongHeightIsRefused) {
    image_.Patch8(kLeaf, 9, 0);
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Traced("Incorrect node height: 0 != 1\n"), Reported(kReasonTree, 2916),
                      Reported(kErrCorrupt, 2982)}));
    EXPECT_EQ(References(path_), 3u);
}

TEST_P(FindDamage, ALeafOfIndexKindIsRefused) {
    image_.Patch8(kLeaf, 8, 0);
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Traced("Incorrect node type (0): expected leaf\n"),
                      Reported(kReasonTree, 2925), Reported(kErrCorrupt, 2982)}));
}

TEST_P(FindDamage, AnIndexNodeOfLeafKindIsRefused) {
    image_.Patch8(kIndex, 8, 0xFF);
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Traced("Incorrect node type (-1): expected index\n"),
                      Reported(kReasonTree, 2934), Reported(kErrCorrupt, 2982)}));
}

TEST_P(FindDamage, AChildOfZeroIsRefused) {
    image_.Patch32(kRoot, ChildAt(0), 0);
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonTree, 2980)});
    EXPECT_EQ(References(path_), 1u);
}

TEST_P(FindDamage, AChildPastTheFileIsAssertedAndRefused) {
    for (const u32 child : {22u, 23u, 0x7FFFFFFFu, 0xFFFFFFFFu}) {
        image_.Patch32(kIndex, ChildAt(0), child);
        EXPECT_EQ(Find(), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), (Events{Asserted(2638), Reported(kErrCorrupt, 2909),
                                                 Reported(kErrCorrupt, 2982)}));
        EXPECT_EQ(References(path_), 2u);
        path_.ClearPath();
        bench_->Dtor();
    }
}

TEST_P(FindDamage, AChildNeverWrittenLeavesNothingToWrite) {
    image_.Patch32(kIndex, ChildAt(0), 20);
    bench_.Open(image_);
    bench_->validNodes = 15;
    const HostKey key = NthHostKey(4, 0);
    bool found = true;
    EXPECT_EQ(bench_->FindEntry(key, key.id, &path_, &found, nullptr, nullptr, nullptr, nullptr),
              kErrCorrupt);
    EXPECT_EQ(bench_.capture.Assertions(), std::vector<int>{2638});
    EXPECT_TRUE(bench_->modifiedList.IsEmpty());
    EXPECT_EQ(bench_->validNodes, 15u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, References(path_)));
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_EQ(bench_.volume.Count(Call::kDirtyMeta), 0u);
}

TEST_P(FindDamage, ChildrenInARingEndAtTheFirstWrongHeight) {
    for (const u32 child : {kRoot, kIndex}) {
        image_ = SmallTree(NodeSize(), 9);
        image_.Patch32(kIndex, ChildAt(0), child);
        EXPECT_EQ(Find(), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Of(Event::Kind::kReport),
                  (Events{Reported(kReasonTree, 2916), Reported(kErrCorrupt, 2982)}));
        EXPECT_EQ(References(path_), 3u);
        path_.ClearPath();
        bench_->Dtor();
    }
}

TEST_P(FindDamage, ADepthThatIsTooSmallEndsAtTheRoot) {
    image_.Patch16(0, 14, 2);
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Of(Event::Kind::kReport),
              (Events{Reported(kReasonTree, 2916), Reported(kErrCorrupt, 2982)}));
}

TEST_P(FindDamage, ARecordThatCannotBeLocatedIsReported) {
    image_.Patch16(kLeaf, NodeSize() - 4, NodeSize());
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 3005)}));
    EXPECT_EQ(References(path_), 3u);
}

TEST_P(FindDamage, ARecordCountTheNodeCannotHoldIsReported) {
    image_.Patch16(kLeaf, 10, 65535);
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Of(Event::Kind::kReport).back(), Reported(kErrCorrupt, 3005));
}

TEST_P(FindDamage, AChildNumberOfTheWrongSizeIsReported) {
    // The only record of node 12 gets two bytes of data more.
    image_.Patch16(12, NodeSize() - 4, 14 + 26);
    bench_.Open(image_);
    const HostKey key = NthHostKey(4, 17);
    bool found = false;
    EXPECT_EQ(bench_->FindEntry(key, key.id, &path_, &found, nullptr, nullptr, nullptr, nullptr),
              kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 3095)}));
}

TEST_P(FindDamage, AnIndexNodeWithoutRecordsIsRefused) {
    NodeImage empty{.kind = kBTIndexNode, .height = 3};
    image_.SetNode(kRoot, empty.Build(NodeSize()));
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take().back(), Reported(kErrCorrupt, 3095));
}

TEST_P(FindDamage, ALeafWithoutRecordsHoldsNothing) {
    image_.SetNode(kLeaf, NodeImage{}.Build(NodeSize()));
    EXPECT_EQ(Find(), kOk);
    EXPECT_EQ(path_.path[1].index, 0);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Who looks for a place gets it, whatever stands there.
TEST_P(FindDamage, AFreeSpaceOffsetOutsideTheNodeIsNotFollowed) {
    image_.SetNode(kLeaf, NodeImage{}.Build(NodeSize()));
    image_.Patch16(kLeaf, NodeSize() - 2, 0xFFFF);
    EXPECT_EQ(Find(), kOk);
    EXPECT_EQ(path_.path[1].index, 0);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2671)});
}

// Each Map of a lookup fails in turn.
TEST_P(FindDamage, AnUnreadableNodeIsReportedAtEveryLevel) {
    for (u32 nth = 1; nth <= 3; ++nth) {
        Bench bench(Blocks(GetParam()));
        bench.Open(image_);
        HfsFindData path;
        const HostKey key = NthHostKey(4, 0);
        bool found = true;
        bench.faults.Fail(Call::kMap, nth);
        EXPECT_EQ(bench->FindEntry(key, key.id, &path, &found, nullptr, nullptr, nullptr, nullptr),
                  kFaultStatus);
        EXPECT_EQ(bench.capture.Take(),
                  (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 2909),
                          Reported(kFaultStatus, 2982)}));
        EXPECT_EQ(References(path), nth - 1);
        EXPECT_TRUE(LedgerHolds(*bench.tree, nth - 1));
        EXPECT_EQ(bench->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path), kOk);
        path.ClearPath();
    }
}

TEST_P(FindDamage, EveryAllocationFailsOnceAndNothingLeaks) {
    for (u32 nth = 1; nth <= 3; ++nth) {
        Bench bench(Blocks(GetParam()));
        bench.Open(image_);
        HfsFindData path;
        const HostKey key = NthHostKey(4, 0);
        bool found = true;
        bench.heap.FailNth(nth);
        EXPECT_EQ(bench->FindEntry(key, key.id, &path, &found, nullptr, nullptr, nullptr, nullptr),
                  kErrNoMemory);
        EXPECT_EQ(References(path), nth - 1);
        EXPECT_TRUE(LedgerHolds(*bench.tree, nth - 1));
        path.ClearPath();
    }
}

TEST_P(FindDamage, WithoutTracesOnlyTheReportsTell) {
    image_.Patch8(kIndex, 8, 0xFF);
    bench_.Open(image_);
    const HostKey key = NthHostKey(4, 0);
    EXPECT_EQ(bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path_), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonTree, 2934), Reported(kErrCorrupt, 2982),
                      Reported(kErrCorrupt, 3126)}));
}

// A count as large as the offset table can be at all: the probes in the upper half meet the last
// record, those below the real ones.
TEST_P(FindDamage, AnIndexNodeThatCountsTooManyRecordsIsReadWithCare) {
    const u32 count = NodeSize() / 2 - 1;
    image_.Patch16(kIndex, 10, count);
    const Bytes node = image_.Node(kIndex);
    const u32 lastSlot = NodeSize() - 2 * 4;
    const u32 start = Get16(node, lastSlot);
    const u32 end = Get16(node, lastSlot - 2);
    for (u32 probe = (count - 1) / 2; probe > 4; probe = (probe - 1) / 2) {
        image_.Patch16(kIndex, NodeSize() - 2 * (probe + 1), start);
        image_.Patch16(kIndex, NodeSize() - 2 * (probe + 2), end);
    }
    EXPECT_EQ(Find(), kOk);
    EXPECT_EQ(path_.path[2].index, 0);
    EXPECT_EQ(path_.path[1].node->nodeNum, kLeaf);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// A record that starts on the last byte of a block: its length field lies in two.
TEST_P(FindDamage, ARecordAtABlocksLastByteIsReadWithCare) {
    if (NodeSize() == MapBlock()) {
        return;
    }
    image_.Patch16(kLeaf, NodeSize() - 2, MapBlock() - 1);
    image_.Patch16(kLeaf, NodeSize() - 4, MapBlock() + 40);
    EXPECT_EQ(Find(), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Asserted(2671), Reported(kReasonNode, 9020), Reported(kErrCorrupt, 3005)}));
}

// A record that reaches to the node's last byte holds slots where its child would be.
TEST_P(FindDamage, AnIndexRecordThatEndsWithItsNodeHasNoPlainChild) {
    bench_.Open(image_);
    const CBTreeHfs* tree = &bench_.tree.tree;
    const NodeImage image{
        .kind = kBTIndexNode, .height = 2, .records = {Record(DiskCatKey(7, u"a"), 5u)}};
    Bytes bytes = image.Build(NodeSize());
    const LooseNode sound(bytes, MapBlock(), 3, false, GetParam().inOnePiece);
    EXPECT_EQ(PlainChild(tree, sound.Get(), 0), 5u);
    Put16(&bytes, NodeSize() - 4, NodeSize());
    Put16(&bytes, 14, NodeSize() - 14 - 2 - kChildSize);
    const LooseNode wide(bytes, MapBlock(), 3, false, GetParam().inOnePiece);
    EXPECT_EQ(PlainChild(tree, wide.Get(), 0), 0u);
}

// A node that counts more records than it has room for, with a record where its links are.
TEST_P(FindDamage, LinksAreNoSlots) {
    bench_.Open(image_);
    for (const s8 kind : {kBTIndexNode, kBTLeafNode}) {
        Bytes bytes =
            NodeImage{.kind = kind, .records = {Record(DiskCatKey(7, u"a"), 5u)}}.Build(NodeSize());
        Put16(&bytes, 0, 28);  // would be its end, and the next word its start
        Put16(&bytes, 2, 14);
        Put16(&bytes, kDescNumRecords, 0xFFFF);
        const LooseNode node(bytes, MapBlock(), 3, false, GetParam().inOnePiece);
        const s32 index = static_cast<s32>(NodeSize() / 2 - 2);
        EXPECT_EQ(PlainChild(&bench_.tree.tree, node.Get(), index), 0u);
        RecordView record;
        EXPECT_FALSE(ViewPlain(&bench_.tree.tree, node.Get(), static_cast<u32>(index), &record));
    }
}

// Whoever fetched an index node by its number gave it no hints.
TEST_P(FindDamage, AnIndexNodeFetchedByNumberLeadsDownAllTheSame) {
    bench_.Open(image_);
    HfsNode* index = nullptr;
    ASSERT_EQ(bench_->GetINode(kIndex, &index, false), kOk);
    const HostKey key = NthHostKey(4, 0);
    for (u32 requests = 3; requests <= 6; requests += 3) {
        EXPECT_EQ(bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path_), kOk);
        EXPECT_EQ(path_.path[2].node, index);
        EXPECT_EQ(path_.path[1].node->nodeNum, kLeaf);
    }
    bench_->PutINode(index, false);
}

INSTANTIATE_GEOMETRIES(FindDamage, FewGeometries);

// ---- data in three blocks

TEST(FindLongData, IsAssertedAtEachProbe) {
    Bench bench(Blocks(512));
    TreeShape shape;
    shape.nodeSize = 4096;
    bench.Open(BuildTree(shape, NthRecords(4, 2, 1040)));
    const HostKey key = NthHostKey(4, 0);
    EXPECT_EQ(bench->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr), kOk);
    EXPECT_EQ(bench.capture.Take(), Events{Asserted(505)});
}

// ---- keys that a comparator could not read safely

struct BadKey {
    u32 fileId;
    u32 keyLength;
    u32 nameLength;  // where the key has one
};
std::ostream& operator<<(std::ostream& out, const BadKey& key) {
    return out << "file " << key.fileId << " length " << key.keyLength << " name "
               << key.nameLength;
}

class FindBadKey : public ::testing::TestWithParam<BadKey> {
protected:
    // Looks for another key in a tree of one leaf whose only record has this key and ends right
    // behind its data.
    int Find(u32 mapBlock) {
        const BadKey& bad = GetParam();
        Bytes key(2 + bad.keyLength);
        Put16(&key, 0, bad.keyLength);
        const u32 nameAt = bad.fileId == 8 ? 12 : 6;
        if (bad.fileId != 3 && key.size() >= nameAt + 2) {
            Put16(&key, nameAt, bad.nameLength);
        }
        TreeShape shape;
        shape.fileId = bad.fileId;
        shape.nodeSize = 2048;
        Bench bench(Blocks(mapBlock), bad.fileId);
        bench.Open(BuildTree(shape, {{key, Bytes(2, 0x61)}}));
        const HostKey search = NthHostKey(bad.fileId, 0);
        const int status = bench->FindRecord(search.Get(), 7, nullptr, 0, nullptr, nullptr);
        reports_ = bench.capture.Of(Event::Kind::kReport);
        return status;
    }
    Events reports_;
};

class FindGoodKey : public FindBadKey {};

TEST_P(FindBadKey, IsRefusedLikeARecordThatCannotBeLocated) {
    for (const u32 mapBlock : {512u, 2048u}) {
        EXPECT_EQ(Find(mapBlock), kErrCorrupt);
        EXPECT_EQ(reports_, (Events{Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 3005),
                                    Reported(kErrCorrupt, 3126)}));
    }
}

INSTANTIATE_TEST_SUITE_P(Keys, FindBadKey,
                         ::testing::Values(BadKey{4, 0, 0}, BadKey{4, 5, 0}, BadKey{4, 6, 1},
                                           BadKey{4, 7, 1}, BadKey{4, 8, 2}, BadKey{4, 516, 256},
                                           BadKey{4, 516, 65535}, BadKey{4, 521, 0},
                                           BadKey{4, 1000, 255}, BadKey{3, 0, 0}, BadKey{3, 9, 0},
                                           BadKey{3, 521, 0}, BadKey{3, 1500, 0}, BadKey{8, 0, 0},
                                           BadKey{8, 11, 0}, BadKey{8, 12, 1}, BadKey{8, 14, 2},
                                           BadKey{8, 266, 128}, BadKey{8, 521, 0},
                                           BadKey{8, 266, 0x8000}));

TEST_P(FindGoodKey, IsCompared) {
    for (const u32 mapBlock : {512u, 2048u}) {
        EXPECT_EQ(Find(mapBlock), kErrNotFound);
        EXPECT_EQ(reports_, Events{});
    }
}

INSTANTIATE_TEST_SUITE_P(Keys, FindGoodKey,
                         ::testing::Values(BadKey{4, 6, 0}, BadKey{4, 8, 1}, BadKey{4, 9, 1},
                                           BadKey{4, 516, 255}, BadKey{4, 520, 255},
                                           BadKey{3, 10, 0}, BadKey{3, 520, 0}, BadKey{8, 12, 0},
                                           BadKey{8, 14, 1}, BadKey{8, 266, 127},
                                           BadKey{8, 520, 254}));

int AlwaysGreater(const BTreeKey* /*searchKey*/, unsigned /*id*/, const BTreeKey* /*nodeKey*/) {
    return 1;
}

TEST(FindForeignKeys, AForeignComparatorSeesAnyKey) {
    Bench bench(Blocks(512));
    TreeShape shape;
    bench.Open(BuildTree(shape, {{Bytes{0, 0}, Bytes(4)}}));
    bench->compareKeys = AlwaysGreater;
    const HostKey key = NthHostKey(4, 0);
    EXPECT_EQ(bench->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr), kErrNotFound);
    EXPECT_EQ(bench.capture.Take(), Events{});
}

// ---- ReadLevel

class ReadLevelTest : public ::testing::Test {
protected:
    ReadLevelTest() : bench_(Blocks(512)) { bench_.Open(SmallTree(512, 9)); }
    ~ReadLevelTest() override { path_.ClearPath(); }
    Bench bench_;
    HfsFindData path_;
};

TEST_F(ReadLevelTest, LoadsALeafAndAnIndexNode) {
    EXPECT_EQ(bench_->ReadLevel(1, 3, &path_), kOk);
    EXPECT_EQ(bench_->ReadLevel(2, 11, &path_), kOk);
    EXPECT_EQ(path_.path[1].node->nodeNum, 3u);
    EXPECT_EQ(path_.path[2].node->nodeNum, 11u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 2));
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(ReadLevelTest, ReleasesWhatTheLevelHeldAndResetsTheIndex) {
    bench_->ReadLevel(1, 3, &path_);
    path_.path[1].index = 1;
    EXPECT_EQ(bench_->ReadLevel(1, 4, &path_), kOk);
    EXPECT_EQ(path_.path[1].index, 0);
    EXPECT_EQ(CachedNode(*bench_.tree, 3)->refCount, 0);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
}

TEST_F(ReadLevelTest, LevelsAPathCannotHoldAreRefused) {
    const HfsFindData before = path_;
    for (const int level : {16, 17, 1000, 0x7FFFFFFF, 0, -1, -0x7FFFFFFF - 1}) {
        EXPECT_EQ(bench_->ReadLevel(level, 3, &path_), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonDepth, 2898)});
    }
    EXPECT_EQ(path_.valid, before.valid);
    EXPECT_EQ(References(path_), 0u);
}

TEST_F(ReadLevelTest, AnUnreadableNodeLeavesTheLevelEmpty) {
    bench_->ReadLevel(1, 3, &path_);
    bench_.faults.Fail(Call::kMap, 1);
    EXPECT_EQ(bench_->ReadLevel(1, 4, &path_), kFaultStatus);
    EXPECT_EQ(path_.path[1].node, nullptr);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 2909)}));
}

TEST_F(ReadLevelTest, ANodeOfAnotherLevelStaysReferenced) {
    EXPECT_EQ(bench_->ReadLevel(2, 3, &path_), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonTree, 2916)});
    EXPECT_EQ(path_.path[2].node->nodeNum, 3u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
}

TEST_F(ReadLevelTest, TheHeaderNodeIsNoLeaf) {
    EXPECT_EQ(bench_->ReadLevel(1, 0, &path_), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonTree, 2916)});
}

// A count so far below zero that a new reference does not lift it cannot arise: the cache revives.
TEST_F(ReadLevelTest, ANodeWithANegativeCountIsRevived) {
    bench_->ReadLevel(1, 3, &path_);
    HfsNode* node = path_.path[1].node;
    path_.path[1].node = nullptr;
    node->refCount = -5;
    EXPECT_EQ(bench_->ReadLevel(1, 3, &path_), kOk);
    EXPECT_EQ(node->refCount, 1);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Two lookups in a tree whose separators disagree with its leaves: each goes its own way down.
TEST_P(FindDamage, EachLookupFollowsTheSeparators) {
    const Bytes key = NthDiskKey(4, 1);
    for (u32 i = 0; i < key.size(); ++i) {
        image_.Patch8(kIndex, 14 + 24 + i, key[i]);  // record 1 belongs to the second leaf now
    }
    bench_.Open(image_);
    const HostKey first = NthHostKey(4, 0);
    const HostKey second = NthHostKey(4, 1);
    EXPECT_EQ(bench_->FindRecord(first.Get(), first.id, nullptr, 0, nullptr, nullptr), kOk);
    EXPECT_EQ(bench_->FindRecord(second.Get(), second.id, nullptr, 0, nullptr, nullptr),
              kErrNotFound);
    EXPECT_EQ(bench_->findData.path[1].node->nodeNum, 2u);
}

TEST_P(FindDamage, ASecondLookupMeetsTheDamageOfAnIndexNode) {
    bench_.Open(image_);
    const HostKey first = NthHostKey(4, 0);
    const HostKey second = NthHostKey(4, 1);
    bool found = false;
    EXPECT_EQ(bench_->FindEntry(first, first.id, &bench_->findData, &found, nullptr, nullptr,
                                nullptr, nullptr),
              kOk);
    HfsNode* index = bench_->findData.path[2].node;
    ASSERT_EQ(bench_->SetDirty(index, 14 + 24), kOk);
    std::memset(index->bufs[0].data + 14 + 24, 0xFF, 2);
    EXPECT_EQ(bench_->FindEntry(second, second.id, &bench_->findData, &found, nullptr, nullptr,
                                nullptr, nullptr),
              kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonNode, 9006), Reported(kErrCorrupt, 3005)}));
    bench_->findData.ClearPath();
}

}  // namespace
}  // namespace VELK::test
