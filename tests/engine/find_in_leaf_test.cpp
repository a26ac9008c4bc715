// Lookups one after the other in one leaf: names and bounds of every kind.
#include <gtest/gtest.h>

#include <algorithm>
#include <string>

#include "bench.h"
#include "hfs/treehfs/bytes.h"

namespace VELK::test {
namespace {

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
        bench_.Create(shape.nodeSize == 512 ? 9 : 10,
                      shape.isFolded ? CompareCatKeysCaseIns : CompareCatKeysCaseBin);
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

}  // namespace
}  // namespace VELK::test
