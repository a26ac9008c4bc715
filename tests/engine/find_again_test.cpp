// Lookups one after the other in a tree this object created: the shortcut for keys of the leaf just
// visited says and counts what the whole way down would.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <utility>

#include "bench.h"
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/node_desc.h"
#include "platform/heap.h"

namespace VELK::test {
namespace {

class FindAgain : public ::testing::Test {
protected:
    FindAgain() : bench_(Blocks(512)) {
        bench_->compareKeys = CompareCatKeysCaseIns;
        bench_->header.maxKeyLength = kCatMaxKeyLength;
        bench_->header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
        const unsigned long long size = 64 * 512;
        EXPECT_EQ(bench_->Create(9, 0, &size), kOk);
        for (u32 n = 0; n < 40; ++n) {
            const HostKey key = NthHostKey(4, n);
            const Bytes data = Pattern(24, n);
            EXPECT_EQ(bench_->InsertRecord(key.Get(), key.id, data.data(), 24), kOk);
        }
        EXPECT_EQ(bench_->header.treeDepth, 2);
        bench_.Forget();
    }
    ~FindAgain() override { bench_.capture.Take(); }

    int Find(u32 n) { return FindAt(NthHostKey(4, n).Get(), NthHostKey(4, n).id); }
    int FindAt(const BTreeKey* key, u32 id) {
        return bench_->FindRecord(key, id, nullptr, 0, nullptr, nullptr);
    }

    Bench bench_;
};

TEST_F(FindAgain, CountersMoveAsOnTheWayDown) {
    const u32 hits = bench_->hitCount;
    const u32 reads = bench_->readCount;
    const u32 searches = bench_->findData.searchCount;
    for (const u32 n : {0u, 0u, 1u, 39u, 39u, 0u}) {
        EXPECT_EQ(Find(n), kOk);
        EXPECT_EQ(bench_->findData.path[1].node->refCount, 1);
    }
    EXPECT_EQ(bench_->hitCount, hits + 12);
    EXPECT_EQ(bench_->readCount, reads);
    EXPECT_EQ(bench_->findData.searchCount, searches + 6);
}

// The comparator asserts at each probe, so the number of probes shows.
TEST_F(FindAgain, AKeyOutOfLineIsAssertedAsOften) {
    const HostKey key = NthHostKey(4, 1);
    alignas(8) u8 room[sizeof key.bytes + 2];
    std::memcpy(room + 2, key.bytes, sizeof key.bytes);
    const BTreeKey* shifted = reinterpret_cast<const BTreeKey*>(room + 2);
    EXPECT_EQ(FindAt(shifted, key.id), kOk);
    const Events first = bench_.capture.Take();
    EXPECT_EQ(FindAt(shifted, key.id), kOk);
    EXPECT_EQ(bench_.capture.Take(), first);
    EXPECT_EQ(first, Events(4, Asserted(70)));  // two in a root of four records, two in the leaf
    ASSERT_EQ(NumRecords(bench_->findData.path[2].node), 4u);
    ASSERT_EQ(NumRecords(bench_->findData.path[1].node), 10u);
}

TEST_F(FindAgain, ANodeHeldByTooManyIsAssertedEachTime) {
    EXPECT_EQ(Find(1), kOk);
    HfsNode* leaf = bench_->findData.path[1].node;
    leaf->refCount += 3;
    for (int round = 0; round < 2; ++round) {
        EXPECT_EQ(Find(1), kOk);
        EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2610)});
    }
    leaf->refCount -= 3;
}

TEST_F(FindAgain, AnIndexNodeEmptiedMeanwhileIsMet) {
    EXPECT_EQ(Find(1), kOk);
    ASSERT_EQ(bench_->Zero(bench_->findData.path[2].node), kOk);
    EXPECT_EQ(Find(1), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonTree, 2916), Reported(kErrCorrupt, 2982),
                      Reported(kErrCorrupt, 3126)}));
}

// What the root remembers of its records is void once its bytes say otherwise.
TEST_F(FindAgain, ChildrenExchangedInTheRootAreFollowed) {
    EXPECT_EQ(Find(0), kOk);
    EXPECT_EQ(Find(39), kOk);
    const HfsNode* root = bench_->findData.path[2].node;
    const int last = static_cast<int>(GetBe16(root->bufs[0].data + kDescNumRecords)) - 1;
    NodeKey first;
    NodeKey second;
    ASSERT_EQ(root->GetKey(&bench_->header, 0, &first), kOk);
    ASSERT_EQ(root->GetKey(&bench_->header, last, &second), kOk);
    std::swap_ranges(first.data, first.data + kChildSize, second.data);
    EXPECT_EQ(Find(0), kErrNotFound);
    EXPECT_EQ(Find(0), kErrNotFound);
    std::swap_ranges(first.data, first.data + kChildSize, second.data);
    bench_->findData.ClearPath();
    EXPECT_EQ(Find(0), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// A first key out of the ordinary is no bound: the way down is walked, and meets it only where the
// search probes it.
TEST_F(FindAgain, AFirstKeyThatCannotBeReadIsNoShortcut) {
    EXPECT_EQ(Find(1), kOk);
    HfsNode* leaf = bench_->findData.path[1].node;
    const int count = static_cast<int>(NumRecords(leaf));
    ASSERT_GE(count, 4);
    NodeKey first;
    ASSERT_EQ(leaf->GetKey(&bench_->header, 0, &first), kOk);
    const u8 before = std::exchange(first.ptr[0], u8{0xFF});
    const u32 middle = static_cast<u32>(count - 1) / 2;
    EXPECT_EQ(Find(middle), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(Find(0), kErrCorrupt);
    EXPECT_FALSE(bench_.capture.Take().empty());
    first.ptr[0] = before;
    EXPECT_EQ(Find(0), kOk);
}

// The same names as separators: of roots in one block and in two.
TEST(FindRemembered, SeparatorsThatDifferInTheirFirstUnits) {
    const std::vector<std::u16string> names = {u"",  u"1",      u"B",      u"Bx",    u"D",
                                               u"Z", u"\u00E9", u"\u03B1", u"\u4E00"};
    for (const u32 nodeSize : {512u, 1024u}) {
        Bench bench(Blocks(512));
        TreeShape shape;
        shape.nodeSize = nodeSize;
        shape.recordsPerLeaf = 1;
        std::vector<TreeRecord> records;
        for (const std::u16string& name : names) {
            records.push_back({DiskCatKey(7, name), Pattern(8, 1)});
        }
        bench.Open(BuildTree(shape, records));
        const auto find = [&](const std::u16string& name) {
            return bench->FindRecord(HostCatKey(7, name), 7, nullptr, 0, nullptr, nullptr);
        };
        for (u32 round = 0; round < 2; ++round) {
            for (std::size_t i = 0; i < names.size(); ++i) {
                EXPECT_EQ(find(names[i]), kOk) << i;
                EXPECT_EQ(bench->findData.path[2].index, static_cast<s32>(i));
            }
            for (const char16_t* name : {u"0", u"C", u"b0", u"\u00E8", u"\u5E00"}) {
                EXPECT_EQ(find(name), kErrNotFound);
            }
        }
        EXPECT_EQ(bench.capture.Take(), Events{});
        bench->findData.ClearPath();
    }
}

// A folder's own record has no name: the number of the child behind it is none either.
TEST(FindRemembered, AnEmptyNameHasNoFirstUnit) {
    for (const u32 nodeSize : {512u, 1024u}) {
        Bench bench(Blocks(512));
        TreeShape shape;
        shape.nodeSize = nodeSize;
        shape.recordsPerLeaf = 1;
        const Bytes data = Pattern(8, 1);
        TreeImage image = BuildTree(shape, {{DiskCatKey(5, u"x"), data},
                                            {DiskCatKey(6, u"y"), data},
                                            {DiskCatKey(7, u""), data},
                                            {DiskCatKey(7, u"b"), data},
                                            {DiskCatKey(7, u"d"), data}});
        const Bytes root = image.Node(image.rootNode);
        image.Patch32(image.rootNode, Get16(root, nodeSize - 2 * 4) - 4, 0x007A0001);
        bench.Open(image);
        EXPECT_EQ(bench->FindRecord(HostCatKey(7, u"b"), 7, nullptr, 0, nullptr, nullptr), kOk);
        EXPECT_EQ(bench.capture.Take(), Events{});
        bench->findData.ClearPath();
    }
}

// Between good bounds: the key the search meets is told of once.
TEST_F(FindAgain, AKeyBetweenThatCannotBeReadIsToldOnce) {
    EXPECT_EQ(Find(1), kOk);
    HfsNode* leaf = bench_->findData.path[1].node;
    const int count = static_cast<int>(NumRecords(leaf));
    ASSERT_GE(count, 4);
    NodeKey middle;
    ASSERT_EQ(leaf->GetKey(&bench_->header, (count - 1) / 2, &middle), kOk);
    const u8 before = std::exchange(middle.ptr[0], u8{0xFF});
    EXPECT_EQ(Find(0), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonNode, 9006), Reported(kErrCorrupt, 3005),
                      Reported(kErrCorrupt, 3126)}));
    middle.ptr[0] = before;
    EXPECT_EQ(Find(0), kOk);
}

TEST_F(FindAgain, AReferenceTooFewIsAsserted) {
    EXPECT_EQ(Find(1), kOk);
    bench_->findData.path[1].node->refCount = 0;
    EXPECT_EQ(Find(1), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(755)});
    EXPECT_EQ(bench_->findData.path[1].node->refCount, 1);
}

TEST_F(FindAgain, AGapInThePathIsAsserted) {
    EXPECT_EQ(Find(1), kOk);
    HfsNode* leaf = bench_->findData.path[1].node;
    leaf->refCount += 1;
    bench_->findData.path[4].node = leaf;
    EXPECT_EQ(Find(1), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(752)});
    EXPECT_EQ(bench_->findData.path[4].node, nullptr);
    EXPECT_EQ(leaf->refCount, 1);
}

TEST_F(FindAgain, ANodeHandedOutMayHaveBeenWrittenTo) {
    EXPECT_EQ(Find(1), kOk);
    HfsNode* leaf = nullptr;
    ASSERT_EQ(bench_->GetINode(bench_->findData.path[1].node->nodeNum, &leaf, false), kOk);
    leaf->bufs[0].data[kDescKind] = kBTIndexNode;
    EXPECT_EQ(Find(1), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonTree, 2925), Reported(kErrCorrupt, 2982),
                      Reported(kErrCorrupt, 3126)}));
    leaf->bufs[0].data[kDescKind] = static_cast<u8>(kBTLeafNode);
    leaf->refCount -= 1;
    EXPECT_EQ(Find(1), kOk);
}

// A step of a deletion by hand: the last leaf loses the separator that leads to it.
TEST_F(FindAgain, ALeafThatNothingLeadsToAnyMoreIsNotFound) {
    EXPECT_EQ(Find(39), kOk);
    ASSERT_GE(bench_->findData.path[2].index, 2);
    EXPECT_EQ(bench_->DeleteTree(2, &bench_->findData), kOk);
    EXPECT_EQ(Find(39), kErrNotFound);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Moved by hand, a record lies behind the separator of the leaf it came from.
TEST_F(FindAgain, ARecordMovedByHandIsWhereItsSeparatorSaysOrNowhere) {
    EXPECT_EQ(Find(0), kOk);
    HfsNode* left = bench_->findData.path[1].node;
    const u32 count = NumRecords(left);
    EXPECT_EQ(Find(count), kOk);
    HfsNode* right = bench_->findData.path[1].node;
    ASSERT_NE(left, right);
    EXPECT_EQ(bench_->DeleteRecord(NthHostKey(4, 1).Get(), NthHostKey(4, 1).id, false), kOk);
    ASSERT_EQ(bench_->_RotateRecordLeft(left, right), kOk);
    EXPECT_EQ(Find(0), kOk);
    EXPECT_EQ(Find(count), kErrNotFound);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// The same exchange in a root that was read, and has room to remember its records. Keys that differ
// from all separators in what is remembered are led down without a look at the root's keys.
TEST(FindRemembered, ChildrenExchangedInTheRootAreFollowed) {
    Bench bench(Blocks(512));
    TreeShape shape;
    shape.recordsPerLeaf = 2;
    std::vector<TreeRecord> records;
    for (u32 n = 0; n < 8; ++n) {
        records.push_back({DiskCatKey(10 + n, u"a"), Pattern(8, n)});
    }
    bench.Open(BuildTree(shape, records));
    const auto find = [&](u32 n) {
        return bench->FindRecord(HostCatKey(10 + n, u"a"), 10 + n, nullptr, 0, nullptr, nullptr);
    };
    const auto exchangeEnds = [&] {
        const HfsNode* root = bench->findData.path[2].node;
        NodeKey first;
        NodeKey last;
        ASSERT_EQ(root->GetKey(&bench->header, 0, &first), kOk);
        ASSERT_EQ(root->GetKey(&bench->header, 3, &last), kOk);
        std::swap_ranges(first.data, first.data + kChildSize, last.data);
    };
    for (const int expected : {kOk, kErrNotFound, kOk}) {
        for (u32 round = 0; round < 2; ++round) {
            EXPECT_EQ(find(1), expected);
            EXPECT_EQ(find(7), expected);
            EXPECT_EQ(find(3), kOk);
        }
        exchangeEnds();
    }
    EXPECT_EQ(bench.capture.Take(), Events{});
}

// Trees of one leaf, made here or read; in one block and in two; in both orders of names.
struct LeafShape {
    u32 nodeSize;
    bool isOwn;
    bool isFolded;
};

class FindInLeaf : public ::testing::TestWithParam<LeafShape> {
protected:
    FindInLeaf() : bench_(Blocks(512)) {}
    ~FindInLeaf() override {
        bench_->findData.ClearPath();
        bench_.capture.Take();
    }
    void Make(const std::vector<std::u16string>& names) {
        const LeafShape& shape = GetParam();
        bench_->compareKeys = shape.isFolded ? CompareCatKeysCaseIns : CompareCatKeysCaseBin;
        bench_->header.maxKeyLength = kCatMaxKeyLength;
        bench_->header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
        const unsigned long long size = 64 * shape.nodeSize;
        ASSERT_EQ(bench_->Create(shape.nodeSize == 512 ? 9 : 10, 0, &size), kOk);
        for (const std::u16string& name : names) {
            ASSERT_EQ(bench_->InsertRecord(HostCatKey(7, name), 7, kLetters, 4), kOk);
        }
        bench_->isAllOwn = shape.isOwn;
        bench_.Forget();
    }
    int Find(const std::u16string& name) {
        return bench_->FindRecord(HostCatKey(7, name), 7, nullptr, 0, nullptr, nullptr);
    }

    // Data that behind an empty name would be one.
    static constexpr u8 kLetters[4] = {0, 'm', 0, 'm'};
    Bench bench_;
};

// One name after each other one: by first units that are letters, or need more than that, or none;
// each of these as the bounds of the leaf.
TEST_P(FindInLeaf, NamesThatDifferInTheirFirstUnits) {
    const bool isFolded = GetParam().isFolded;
    const std::vector<std::u16string> names = {u"",  u"1",      u"B",      u"Bx",    u"D",
                                               u"Z", u"\u00E9", u"\u03B1", u"\u4E00"};
    const struct {
        std::u16string name;
        std::size_t smaller;  // of the names
    } absent[] = {
        {u"0", 1},      {u"A", 2},      {u"C", 4},     {u"E", 5}, {u"b0", isFolded ? 3u : 6u},
        {u"\u00E8", 6}, {u"\u03B2", 8}, {u"\u5E00", 9}};
    Make(names);
    for (std::size_t first = 0; first < 4; ++first) {
        for (const std::u16string& before : {names[first], names[5], names.back()}) {
            for (std::size_t i = first; i < names.size(); ++i) {
                ASSERT_EQ(Find(before), kOk);
                ASSERT_EQ(Find(names[i]), kOk);
                ASSERT_EQ(bench_->findData.path[1].index, static_cast<s32>(i - first));
            }
            for (const auto& other : absent) {
                ASSERT_EQ(Find(before), kOk);
                ASSERT_EQ(Find(other.name), kErrNotFound);
                ASSERT_EQ(bench_->findData.path[1].index,
                          static_cast<s32>(std::max(other.smaller, first) - first));
            }
        }
        ASSERT_EQ(bench_->DeleteRecord(HostCatKey(7, names[first]), 7, false), kOk);
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Letters alone at both ends.
TEST_P(FindInLeaf, BoundsThatAreLetters) {
    const std::vector<std::u16string> names = {u"B", u"C", u"Cx", u"F", u"X"};
    Make(names);
    for (const std::u16string& before : names) {
        for (std::size_t i = 0; i < names.size(); ++i) {
            ASSERT_EQ(Find(before), kOk);
            ASSERT_EQ(Find(names[i]), kOk);
            ASSERT_EQ(bench_->findData.path[1].index, static_cast<s32>(i));
        }
        for (const char16_t* name : {u"", u"A", u"D", u"Z", u"\u00E9"}) {
            ASSERT_EQ(Find(before), kOk);
            ASSERT_EQ(Find(name), kErrNotFound);
        }
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// A last record that says it belongs in front of all, and is out of the ordinary in one way: it is
// no bound of its leaf. The record in the middle is found without a look at it.
TEST_P(FindInLeaf, ALastKeyThatCannotBeReadIsNoBound) {
    Make({u"a", u"b", u"c", u"d", u"e"});
    ASSERT_EQ(Find(u"c"), kOk);
    HfsNode* leaf = bench_->findData.path[1].node;
    NodeKey last;
    ASSERT_EQ(leaf->GetKey(&bench_->header, 4, &last), kOk);
    u8* key = last.ptr;
    u8* slots = leaf->bufs[bench_->header.blocksPerNode - 1].data + 512 - 2 * 6;
    const u32 start = GetBe16(slots + 2);
    struct {
        const char* what;
        u8* at;
        u32 value;
    } const damages[] = {
        {"a key shorter than its fixed part", key, 4},
        {"a key longer than any", key, 600},
        {"a key as long as the record", key, last.size - 2},
        {"a name longer than its key", key + kCatKeyNameLength, 2},
        {"an odd start", slots + 2, start + 1},
        {"an end outside the node", slots, 0xFFF0},
        {"an end before the start", slots, start},
    };
    for (const auto& damage : damages) {
        const u16 value = GetBe16(damage.at);
        PutBe32(key + kCatKeyParentId, 1);
        PutBe16(damage.at, damage.value);
        for (u32 time = 0; time < 2; ++time) {
            EXPECT_EQ(Find(u"c"), kOk) << damage.what;
            EXPECT_EQ(bench_.capture.Take(), Events{}) << damage.what;
        }
        PutBe16(damage.at, value);
        PutBe32(key + kCatKeyParentId, 7);
        EXPECT_EQ(Find(u"e"), kOk) << damage.what;
    }
}

// Several leaves, of which each begins with a letter or with something else: from each name to
// each.
TEST_P(FindInLeaf, NamesOfOtherLeaves) {
    std::vector<std::u16string> names;
    for (const char16_t unit : std::u16string(u"1BDFHJLNPRTXZ\u00E9\u03B1\u4E00\u4E01\u4E03")) {
        names.push_back(unit + std::u16string(60, u'x'));
    }
    Make(names);
    ASSERT_GE(bench_->header.treeDepth, 2);
    for (const std::u16string& before : names) {
        for (const std::u16string& name : names) {
            ASSERT_EQ(Find(before), kOk);
            ASSERT_EQ(Find(name), kOk);
        }
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// A first record that says it belongs in front of all, and cannot be read, is no bound either.
TEST_P(FindInLeaf, AFirstKeyThatCannotBeReadIsNoBound) {
    std::vector<std::u16string> names;
    for (const char16_t unit : std::u16string(u"BDFHJLNPRTXZ")) {
        names.push_back(unit + std::u16string(60, u'x'));
    }
    Make(names);
    ASSERT_EQ(Find(names.back()), kOk);
    NodeKey first;
    ASSERT_EQ(bench_->findData.path[1].node->GetKey(&bench_->header, 0, &first), kOk);
    struct {
        u32 at;
        u32 value;
    } const damages[] = {{0, 4}, {0, 600}, {0, first.size - 2}, {kCatKeyNameLength, 300}};
    for (const auto& damage : damages) {
        const u16 value = GetBe16(first.ptr + damage.at);
        PutBe32(first.ptr + kCatKeyParentId, 1);
        PutBe16(first.ptr + damage.at, damage.value);
        EXPECT_EQ(Find(names[0]), kOk) << damage.at << " " << damage.value;
        EXPECT_EQ(bench_.capture.Take(), Events{});
        PutBe16(first.ptr + damage.at, value);
        PutBe32(first.ptr + kCatKeyParentId, 7);
        EXPECT_EQ(Find(names.back()), kOk);
    }
}

INSTANTIATE_TEST_SUITE_P(Shapes, FindInLeaf,
                         ::testing::Values(LeafShape{512, true, true}, LeafShape{1024, true, true},
                                           LeafShape{512, true, false},
                                           LeafShape{1024, true, false},
                                           LeafShape{512, false, true},
                                           LeafShape{1024, false, true}));

// Who announces a change to a node may change its keys: what the root remembers of them is void,
// also when its children stay.
TEST(FindRemembered, AnAnnouncedChangeOfASeparatorIsMet) {
    Bench bench(Blocks(512));
    TreeShape shape;
    shape.recordsPerLeaf = 2;
    std::vector<TreeRecord> records;
    for (u32 n = 0; n < 8; ++n) {
        records.push_back({DiskCatKey(10 + n, u"a"), Pattern(8, n)});
    }
    bench.Open(BuildTree(shape, records));
    const auto find = [&](u32 id) {
        return bench->FindRecord(HostCatKey(id, u"a"), id, nullptr, 0, nullptr, nullptr);
    };
    EXPECT_EQ(find(10), kOk);  // the root comes in on the way down, with room to remember
    HfsNode* root = nullptr;
    ASSERT_EQ(bench->GetINode(bench->header.rootNode, &root, false), kOk);
    NodeKey second;
    ASSERT_EQ(root->GetKey(&bench->header, 1, &second), kOk);
    for (const u32 separator : {12u, 11u, 12u}) {
        ASSERT_EQ(bench->SetDirty(root, second.offset, second.size), kOk);
        PutBe32(second.ptr + kCatKeyParentId, separator);
        for (u32 round = 0; round < 2; ++round) {
            EXPECT_EQ(find(11), separator == 12 ? kOk : kErrNotFound);
            EXPECT_EQ(find(12), kOk);
            EXPECT_EQ(find(15), kOk);
        }
    }
    root->refCount -= 1;
    EXPECT_EQ(bench.capture.Take(), Events{});
}

// The comparator asserts at each probe of a key at an odd address: three in the root, two in the
// leaf.
TEST(FindRemembered, KeysAtOddAddressesAreAssertedAtEachProbe) {
    MemVolumeOptions options = Blocks(512);
    options.misalign = 1;
    Bench bench(options);
    TreeShape shape;
    shape.recordsPerLeaf = 2;
    std::vector<TreeRecord> records;
    for (u32 n = 0; n < 8; ++n) {
        records.push_back({DiskCatKey(10 + n, u"a"), Pattern(8, n)});
    }
    bench.Open(BuildTree(shape, records));
    for (u32 round = 0; round < 2; ++round) {
        EXPECT_EQ(bench->FindRecord(HostCatKey(17, u"a"), 17, nullptr, 0, nullptr, nullptr), kOk);
        EXPECT_EQ(bench.capture.Take(), Events(5, Asserted(71)));
    }
}

TEST_F(FindAgain, APathClearedMeanwhileIsWalkedAgain) {
    EXPECT_EQ(Find(1), kOk);
    bench_->findData.ClearPath();
    EXPECT_EQ(Find(1), kOk);
    EXPECT_NE(bench_->findData.path[1].node, nullptr);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// One leaf of two blocks in which the key of record 11 lies in both.
class FindAgainOverBlocks : public FindAgain {
protected:
    FindAgainOverBlocks() : wide_(Blocks(512)) {
        wide_->compareKeys = CompareCatKeysCaseIns;
        wide_->header.maxKeyLength = kCatMaxKeyLength;
        wide_->header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
        const unsigned long long size = 64 * 1024;
        EXPECT_EQ(wide_->Create(10, 0, &size), kOk);
    }
    ~FindAgainOverBlocks() override { wide_.capture.Take(); }
    void Insert(u32 from, u32 to) {
        for (u32 n = from; n < to; ++n) {
            const HostKey key = NthHostKey(4, n);
            const Bytes data = Pattern(24, n);
            EXPECT_EQ(wide_->InsertRecord(key.Get(), key.id, data.data(), 24), kOk);
        }
    }
    int FindWide(u32 n) {
        const HostKey key = NthHostKey(4, n);
        return wide_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr);
    }

    Bench wide_;
};

TEST_F(FindAgainOverBlocks, ALastKeyInTwoBlocksIsNoShortcut) {
    Insert(0, 12);
    wide_.Forget();
    for (const u32 n : {11u, 3u, 11u}) {
        EXPECT_EQ(FindWide(n), kOk);
        EXPECT_EQ(wide_->findData.path[1].index, static_cast<s32>(n));
    }
    EXPECT_EQ(wide_.capture.Take(), Events{});
}

// The shortcut asks for no memory, and so no failure of it passes unseen.
TEST_F(FindAgainOverBlocks, NoMemoryIsToldAsOnTheWayDown) {
    Insert(0, 16);
    EXPECT_EQ(FindWide(3), kOk);
    velk_heap_free(wide_->scratch);
    wide_->scratch = wide_->scratchHalf = nullptr;
    wide_.Forget();
    wide_.heap.FailNth(1);
    EXPECT_EQ(FindWide(11), kErrNoMemory);
    EXPECT_TRUE(wide_.heap.HasFailed());
    EXPECT_EQ(wide_.capture.Take(), Events{Reported(kErrNoMemory, 3126)});
    EXPECT_EQ(FindWide(11), kOk);
}

}  // namespace
}  // namespace VELK::test
