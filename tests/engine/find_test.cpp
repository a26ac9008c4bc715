// Lookup on sound trees: the path it leaves, what it delivers, what it costs.
#include <gtest/gtest.h>

#include "bench.h"
#include "platform/heap.h"

namespace VELK::test {
namespace {

// The SmallTree of nine leaves: leaves 1 .. 9 of records 2n - 2 and 2n - 1, index nodes 10 (leaves
// 1 .. 4), 11 (5 .. 8) and 12 (9), root 13.
constexpr u32 kLeaves = 9;
constexpr u32 kRecords = 18;

u32 LeafOf(u32 record) {
    return record / 2 + 1;
}

class FindTest : public GeometryTest {
protected:
    FindTest() : bench_(Blocks(GetParam())) { bench_.Open(SmallTree(NodeSize(), kLeaves)); }
    ~FindTest() override { path_.ClearPath(); }

    bool Find(const HostKey& key) {
        bool found = !expectFound_;
        EXPECT_EQ(
            bench_->FindEntry(key, key.id, &path_, &found, nullptr, nullptr, nullptr, nullptr),
            kOk);
        return found;
    }
    void ExpectLevel(u32 level, u32 nodeNum, s32 index) {
        ASSERT_NE(path_.path[level].node, nullptr) << level;
        EXPECT_EQ(path_.path[level].node->nodeNum, nodeNum) << level;
        EXPECT_EQ(path_.path[level].index, index) << level;
    }

    Bench bench_;
    HfsFindData path_;
    bool expectFound_ = true;
};

TEST_P(FindTest, EveryKeyIsFoundInItsLeaf) {
    for (u32 n = 0; n < kRecords; ++n) {
        EXPECT_TRUE(Find(NthHostKey(4, n))) << n;
        ExpectLevel(1, LeafOf(n), static_cast<s32>(n % 2));
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(FindTest, AnAbsentKeyLeavesTheInsertionPoint) {
    for (u32 n = 0; n < kRecords; ++n) {
        EXPECT_FALSE(Find(NthHostKey(4, n, true))) << n;
        ExpectLevel(1, LeafOf(n), static_cast<s32>(n % 2 + 1));
    }
}

TEST_P(FindTest, ThePathHoldsOneReferenceAtEveryLevel) {
    Find(NthHostKey(4, 11));
    ExpectLevel(3, 13, 1);
    ExpectLevel(2, 11, 1);
    ExpectLevel(1, 6, 1);
    EXPECT_EQ(path_.path[0].node, nullptr);
    EXPECT_EQ(path_.path[4].node, nullptr);
    EXPECT_EQ(path_.level, 1u);
    EXPECT_TRUE(path_.valid);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 3));
}

TEST_P(FindTest, AKeyBelowAllFollowsTheFirstRecords) {
    EXPECT_FALSE(Find(HostCatKey(1, u"a")));
    ExpectLevel(3, 13, 0);
    ExpectLevel(2, 10, 0);
    ExpectLevel(1, 1, 0);
}

TEST_P(FindTest, AKeyAboveAllFollowsTheLastRecords) {
    EXPECT_FALSE(Find(HostCatKey(0xFFFFFFFF, u"a")));
    ExpectLevel(3, 13, 2);
    ExpectLevel(2, 12, 0);
    ExpectLevel(1, 9, 2);
}

TEST_P(FindTest, AKeyEqualToAnIndexKeyFollowsThatRecord) {
    EXPECT_TRUE(Find(NthHostKey(4, 8)));  // first of leaf 5, hence of index node 11
    ExpectLevel(3, 13, 1);
    ExpectLevel(2, 11, 0);
    ExpectLevel(1, 5, 0);
}

TEST_P(FindTest, AKeyJustBelowAnIndexKeyFollowsTheRecordBefore) {
    EXPECT_FALSE(Find(NthHostKey(4, 7, true)));
    ExpectLevel(3, 13, 0);
    ExpectLevel(2, 10, 3);
    ExpectLevel(1, 4, 2);
}

TEST_P(FindTest, ASecondSearchReleasesTheFirst) {
    Find(NthHostKey(4, 0));
    Find(NthHostKey(4, 17));
    EXPECT_EQ(path_.searchCount, 2u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 3));
    EXPECT_EQ(bench_->nodeCount, 5u);
    path_.ClearPath();
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
    EXPECT_EQ(bench_->nodeCount, 5u);
}

TEST_P(FindTest, ANullPathIsTheTreesOwn) {
    const HostKey key = NthHostKey(4, 3);
    u8 record[8];
    u32 size = 0;
    EXPECT_EQ(bench_->FindRecord(key.Get(), key.id, record, 8, &size, nullptr), kOk);
    EXPECT_EQ(bench_->findData.path[1].node->nodeNum, 2u);
    EXPECT_EQ(bench_->findData.searchCount, 1u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 3));
}

// ---- cost

TEST_P(FindTest, ALookupReadsOneNodePerLevel) {
    Find(NthHostKey(4, 11));
    EXPECT_EQ(bench_->readCount, 4u);
    EXPECT_EQ(bench_->hitCount, 0u);
    EXPECT_EQ(bench_.volume.Count(Call::kMap), 4u);
}

TEST_P(FindTest, ALookupOfCachedNodesCostsOneRequestPerLevelAndNoMemory) {
    for (u32 n = 0; n < kRecords; ++n) {
        Find(NthHostKey(4, n));
    }
    const u32 allocations = bench_.heap.Allocations();
    const u32 hits = bench_->hitCount;
    const u32 reads = bench_->readCount;
    bench_.volume.TakeCalls();
    u8 record[8];
    u32 size = 0;
    for (u32 n = 0; n < kRecords; ++n) {
        const HostKey key = NthHostKey(4, n);
        EXPECT_EQ(bench_->FindRecord(key.Get(), key.id, record, 8, &size, &path_), kOk);
    }
    EXPECT_EQ(bench_->hitCount - hits, 3 * kRecords);
    EXPECT_EQ(bench_->readCount, reads);
    EXPECT_EQ(bench_.heap.Allocations(), allocations);
    EXPECT_EQ(bench_.volume.TakeCalls(), std::vector<CallRecord>{});
}

TEST_P(FindTest, LookingWritesNothing) {
    for (u32 n = 0; n < kRecords; ++n) {
        Find(NthHostKey(4, n, n % 3 == 0));
    }
    EXPECT_TRUE(bench_->modifiedList.IsEmpty());
    EXPECT_FALSE(bench_->IsDirty());
}

INSTANTIATE_GEOMETRIES(FindTest, FewGeometries);

// ---- full nodes of all three trees, keys and data over block ends

struct FullTree {
    Geometry geometry;
    u32 fileId;
};
std::ostream& operator<<(std::ostream& out, const FullTree& tree) {
    return out << tree.geometry << ", file " << tree.fileId;
}
std::vector<FullTree> FullTrees() {
    std::vector<FullTree> trees;
    for (const Geometry& geometry : AllGeometries()) {
        for (const u32 fileId : {3u, 4u, 8u}) {
            trees.push_back({geometry, fileId});
        }
    }
    return trees;
}

class FindInFullNodes : public ::testing::TestWithParam<FullTree> {
protected:
    FindInFullNodes() : bench_(Blocks(GetParam().geometry.mapBlock), GetParam().fileId) {
        TreeShape shape;
        shape.fileId = GetParam().fileId;
        shape.nodeSize = GetParam().geometry.nodeSize;
        count_ = shape.nodeSize / 16;
        bench_.Open(BuildTree(shape, NthRecords(shape.fileId, count_, 10)));
    }
    Bench bench_;
    u32 count_;
};

TEST_P(FindInFullNodes, EveryRecordIsDeliveredWithItsKey) {
    HfsFindData path;
    for (u32 n = 0; n < count_; n += 1 + n / 64) {
        const HostKey key = NthHostKey(GetParam().fileId, n);
        alignas(8) u8 keyOut[kKeyLengthSize + kMaxKeyLength] = {};
        u8 record[10] = {};
        u32 recordSize = 10;
        u32 keySize = 12;
        bool found = false;
        ASSERT_EQ(
            bench_->FindEntry(key, key.id, &path, &found, record, &recordSize, keyOut, &keySize),
            kOk);
        ASSERT_TRUE(found) << n;
        ASSERT_EQ(recordSize, 10u);
        ASSERT_EQ(Bytes(record, record + 10), Pattern(10, n));
        const Bytes disk = NthDiskKey(GetParam().fileId, n);
        const Bytes host(key.bytes, key.bytes + disk.size());
        ASSERT_EQ(Bytes(keyOut, keyOut + disk.size()), GetParam().fileId == 3 ? disk : host);
    }
    path.ClearPath();
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
}

TEST_P(FindInFullNodes, NoAbsentKeyIsFound) {
    HfsFindData path;
    for (u32 n = 0; n < count_; n += 1 + n / 64) {
        const HostKey key = NthHostKey(GetParam().fileId, n, true);
        ASSERT_EQ(bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path), kErrNotFound);
    }
    path.ClearPath();
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

INSTANTIATE_TEST_SUITE_P(AllTrees, FindInFullNodes, ::testing::ValuesIn(FullTrees()));

// Keys of 518 bytes start at every even place of a 512-byte block and reach over one or two ends.
TEST(FindLongKeys, KeysOverTwoBlockEndsAreGathered) {
    Bench bench(Blocks(512));
    std::vector<TreeRecord> records;
    for (u32 n = 0; n < 300; ++n) {
        const std::u16string name = std::u16string(200 + n % 56, u'x');
        records.push_back({DiskCatKey(100 + n, name), Pattern(2 + n % 7 * 2, n)});
    }
    TreeShape shape;
    shape.nodeSize = 8192;
    bench.Open(BuildTree(shape, records));
    HfsFindData path;
    for (u32 n = 0; n < 300; ++n) {
        const HostKey key = HostCatKey(100 + n, std::u16string(200 + n % 56, u'x'));
        u8 data[14] = {};
        u32 size = 0;
        ASSERT_EQ(bench->FindRecord(key.Get(), key.id, data, 2 + n % 7 * 2, &size, &path), kOk);
        ASSERT_EQ(Bytes(data, data + size), Pattern(2 + n % 7 * 2, n));
    }
    path.ClearPath();
    EXPECT_EQ(bench.capture.Take(), Events{});
}

TEST(FindLongData, DataLongerThanHalfANodeIsGathered) {
    Bench bench(Blocks(1024));
    TreeShape shape;
    shape.nodeSize = 2048;
    bench.Open(BuildTree(shape, {{NthDiskKey(4, 0), Pattern(1900, 3)}}));
    const HostKey key = NthHostKey(4, 0);
    Bytes data(1900);
    u32 size = 0;
    EXPECT_EQ(bench->FindRecord(key.Get(), key.id, data.data(), 1900, &size, nullptr), kOk);
    EXPECT_EQ(data, Pattern(1900, 3));
}

// ---- the scratch buffer

// One leaf of two blocks, read, and no scratch buffer.
class LeafOfTwoBlocks : public ::testing::Test {
protected:
    LeafOfTwoBlocks(u32 records, u32 dataSize) : bench_(Blocks(512)) {
        TreeShape shape;
        shape.nodeSize = 1024;
        bench_.Open(BuildTree(shape, NthRecords(4, records, dataSize)));
        bench_->findData = HfsFindData();
        HfsNode* leaf = nullptr;
        bench_->GetINode(1, &leaf, false);
        leaf->refCount = 0;
        velk_heap_free(bench_->scratch);
        bench_->scratch = bench_->scratchHalf = nullptr;
        bench_.Forget();
    }
    int Find(u32 n) {
        const HostKey key = NthHostKey(4, n);
        return bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr);
    }
    Bench bench_;
};

// The key of record 16 lies in both blocks.
class FindScratch : public LeafOfTwoBlocks {
protected:
    FindScratch() : LeafOfTwoBlocks(31, 10) {}
};

// The data of record 14 lies in both blocks.
class FindDataScratch : public LeafOfTwoBlocks {
protected:
    FindDataScratch() : LeafOfTwoBlocks(28, 14) {}

    u8 record_[20] = {};
    u32 size_ = 0;
};

TEST_F(FindScratch, IsMadeWhenAKeyNeedsIt) {
    EXPECT_EQ(Find(15), kOk);
    EXPECT_EQ(bench_->scratch, nullptr);
    EXPECT_EQ(Find(16), kOk);
    EXPECT_NE(bench_->scratch, nullptr);
}

TEST_F(FindScratch, NoMemoryForItIsReportedByFindRecordOnly) {
    bench_.heap.FailNth(1);
    EXPECT_EQ(Find(16), kErrNoMemory);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kErrNoMemory, 3126)});
    EXPECT_EQ(Find(16), kOk);
}

TEST_F(FindScratch, NoMemoryForTheKeyOfAStepIsNotReported) {
    u8 record[10];
    alignas(8) u8 keyOut[64];
    u32 size = 0;
    u32 keySize = 0;
    ASSERT_EQ(Find(15), kOk);
    bench_.heap.FailNth(1);
    EXPECT_EQ(bench_->IncPos(1, record, 10, &size, keyOut, 64, &keySize, nullptr), kErrNoMemory);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(FindDataScratch, NoMemoryForItIsReportedByFindRecordOnly) {
    const HostKey key = NthHostKey(4, 14);
    bench_.heap.FailNth(1);
    EXPECT_EQ(bench_->FindRecord(key.Get(), key.id, record_, 20, &size_, nullptr), kErrNoMemory);
    EXPECT_EQ(size_, 20u);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kErrNoMemory, 3126)});
}

TEST_F(FindDataScratch, NoMemoryForAStepIsNotReported) {
    ASSERT_EQ(Find(14), kOk);
    bench_.heap.FailNth(1);
    EXPECT_EQ(bench_->IncPos(0, record_, 14, &size_, nullptr, 0, nullptr, nullptr), kErrNoMemory);
    EXPECT_EQ(size_, 0u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// ---- depth

TEST(FindDepth, ATreeOfFifteenLevelsIsSearched) {
    Bench bench(Blocks(512));
    TreeShape shape;
    shape.minDepth = 15;
    shape.recordsPerLeaf = 2;
    bench.Open(BuildTree(shape, NthRecords(4, 6, 8)));
    HfsFindData path;
    const HostKey key = NthHostKey(4, 5);
    EXPECT_EQ(bench->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path), kOk);
    EXPECT_EQ(References(path), 15u);
    EXPECT_TRUE(LedgerHolds(*bench.tree, 15));
    path.ClearPath();
}

TEST(FindDepth, ATreeOfSixteenLevelsOpensAndIsNotSearched) {
    Bench bench(Blocks(512));
    TreeShape shape;
    shape.minDepth = 16;
    bench.Open(BuildTree(shape, NthRecords(4, 6, 8)));
    HfsFindData path;
    bool found = true;
    const HostKey key = NthHostKey(4, 5);
    EXPECT_EQ(bench->FindEntry(key, key.id, &path, &found, nullptr, nullptr, nullptr, nullptr),
              kErrCorrupt);
    EXPECT_EQ(bench.capture.Take(),
              (Events{Reported(kReasonDepth, 2898), Reported(kErrCorrupt, 2982)}));
    EXPECT_FALSE(found);
    EXPECT_EQ(References(path), 0u);
}

// ---- the empty tree

TEST(FindEmpty, NothingIsFoundAndThePathIsNotTouched) {
    Bench bench(Blocks(512));
    bench.Open(SmallTree(512));
    HfsFindData path;
    const HostKey key = NthHostKey(4, 0);
    bool found = false;
    bench->FindEntry(key, key.id, &path, &found, nullptr, nullptr, nullptr, nullptr);
    bench->header.treeDepth = 0;
    found = true;
    EXPECT_EQ(bench->FindEntry(key, key.id, &path, &found, nullptr, nullptr, nullptr, nullptr),
              kOk);
    EXPECT_FALSE(found);
    EXPECT_EQ(References(path), 2u);
    EXPECT_EQ(path.searchCount, 1u);
    path.ClearPath();
}

TEST(FindEmpty, AFreshPathStaysEmpty) {
    Bench bench(Blocks(512));
    bench.Open(BuildTree({}, {}));
    HfsFindData path;
    EXPECT_EQ(path.level, 0u);
    EXPECT_FALSE(path.valid);
    const HostKey key = NthHostKey(4, 0);
    EXPECT_EQ(bench->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path), kErrNotFound);
    EXPECT_FALSE(path.valid);
    EXPECT_EQ(path.searchCount, 0u);
    EXPECT_EQ(bench.capture.Take(), Events{});
}

// ---- ClearPath

TEST(ClearPath, ForgetsNodesAndKeepsTheRest) {
    Bench bench(Blocks(512));
    bench.Open(SmallTree(512));
    HfsFindData path;
    const HostKey key = NthHostKey(4, 3);
    bool found = false;
    bench->FindEntry(key, key.id, &path, &found, nullptr, nullptr, nullptr, nullptr);
    path.ClearPath();
    EXPECT_EQ(References(path), 0u);
    EXPECT_EQ(path.level, 1u);
    EXPECT_EQ(path.searchCount, 1u);
    EXPECT_TRUE(path.valid);
    EXPECT_EQ(path.path[1].index, 1);
    EXPECT_EQ(path.path[2].index, 1);
    path.ClearPath();
    EXPECT_EQ(bench.capture.Take(), Events{});
}

TEST(ClearPath, AssertsGapsAndCountsBelowZero) {
    Bench bench(Blocks(512));
    bench.Open(SmallTree(512));
    HfsNode* nodes[3] = {};
    for (u32 i = 0; i < 3; ++i) {
        bench->GetINode(i + 1, &nodes[i], false);
    }
    HfsFindData path;
    path.path[0].node = nodes[0];
    path.path[2].node = nodes[1];
    path.path[15].node = nodes[2];
    nodes[1]->refCount = 0;
    path.ClearPath();
    EXPECT_EQ(bench.capture.Take(), (Events{Asserted(752), Asserted(755), Asserted(752)}));
    EXPECT_EQ(References(path), 0u);
    nodes[1]->refCount = 0;
}

// What lies behind a key without a name is no unit of it, though it may look like one.
TEST(FindNameless, DataBehindTheKeyIsNoName) {
    for (const u32 nodeSize : {512u, 1024u}) {
        Bench bench(Blocks(512));
        TreeShape shape;
        shape.nodeSize = nodeSize;
        bench.Open(BuildTree(shape, {{DiskCatKey(7, u""), {0, 'z', 0, 'z'}},
                                     {DiskCatKey(7, u"B"), {1, 2}},
                                     {DiskCatKey(7, u"C"), {3, 4}}}));
        EXPECT_EQ(bench->FindRecord(HostCatKey(7, u"A"), 7, nullptr, 0, nullptr, nullptr),
                  kErrNotFound);
        EXPECT_EQ(bench->findData.path[1].index, 1);
        bench->findData.ClearPath();
    }
}

// Nodes on two levels, wherever these are: a gap between them is asserted, and a reference too few.
TEST(ClearPath, AssertsGapsAndReferencesOnEachLevel) {
    Capture capture;
    const Bytes content = NodeImage{}.Build(512);
    const LooseNode lower(content, 512, 1);
    const LooseNode upper(content, 512, 2);
    for (u32 low = 0; low <= kMaxPathDepth; ++low) {
        for (u32 high = low; high <= kMaxPathDepth; ++high) {
            for (const s32 references : {1, 0}) {
                HfsFindData path;
                lower->refCount = 1;
                upper->refCount = references;
                path.path[low].node = lower.Get();
                path.path[high].node = upper.Get();  // alone when they are one level
                path.ClearPath();
                Events expected;
                if (high > low + 1) {
                    expected.push_back(Asserted(752));
                }
                if (references == 0) {
                    expected.push_back(Asserted(755));
                }
                EXPECT_EQ(capture.Take(), expected) << low << " " << high << " " << references;
                EXPECT_EQ(upper->refCount, references - 1);
                EXPECT_EQ(lower->refCount, high > low ? 0 : 1);
                EXPECT_EQ(path.path[low].node, nullptr);
                EXPECT_EQ(path.path[high].node, nullptr);
            }
        }
    }
}

}  // namespace
}  // namespace VELK::test
