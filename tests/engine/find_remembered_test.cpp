// Lookups in trees that were read, whose roots have room to remember their records.
#include <gtest/gtest.h>

#include <algorithm>
#include <string>

#include "bench.h"
#include "hfs/treehfs/bytes.h"

namespace VELK::test {
namespace {

class FindRemembered : public ::testing::Test {
protected:
    explicit FindRemembered(const MemVolumeOptions& options = Blocks(512)) : bench_(options) {}
    ~FindRemembered() override { bench_->findData.ClearPath(); }

    static TreeImage Tree(u32 nodeSize, u32 recordsPerLeaf, const std::vector<Bytes>& keys) {
        TreeShape shape;
        shape.nodeSize = nodeSize;
        shape.recordsPerLeaf = recordsPerLeaf;
        std::vector<TreeRecord> records;
        for (const Bytes& key : keys) {
            records.push_back({key, Pattern(8, 1)});
        }
        return BuildTree(shape, records);
    }
    int Find(u32 parent, const std::u16string& name) {
        return bench_->FindRecord(HostCatKey(parent, name), parent, nullptr, 0, nullptr, nullptr);
    }

    Bench bench_;
};

// ---- leaves of one record, of nodes in one block and in two

class FindRememberedNames : public FindRemembered, public ::testing::WithParamInterface<u32> {};

TEST_P(FindRememberedNames, SeparatorsThatDifferInTheirFirstUnits) {
    const std::vector<std::u16string> names = {u"",  u"1",      u"B",      u"Bx",    u"D",
                                               u"Z", u"\u00E9", u"\u03B1", u"\u4E00"};
    std::vector<Bytes> keys;
    for (const std::u16string& name : names) {
        keys.push_back(DiskCatKey(7, name));
    }
    bench_.Open(Tree(GetParam(), 1, keys));
    for (u32 round = 0; round < 2; ++round) {
        for (std::size_t i = 0; i < names.size(); ++i) {
            EXPECT_EQ(Find(7, names[i]), kOk) << i;
            EXPECT_EQ(bench_->findData.path[2].index, static_cast<s32>(i));
        }
        for (const char16_t* name : {u"0", u"C", u"b0", u"\u00E8", u"\u5E00"}) {
            EXPECT_EQ(Find(7, name), kErrNotFound);
        }
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// A folder's own record has no name: the number of the child behind it is none either.
TEST_P(FindRememberedNames, AnEmptyNameHasNoFirstUnit) {
    TreeImage image = Tree(GetParam(), 1,
                           {DiskCatKey(5, u"x"), DiskCatKey(6, u"y"), DiskCatKey(7, u""),
                            DiskCatKey(7, u"b"), DiskCatKey(7, u"d")});
    const Bytes root = image.Node(image.rootNode);
    image.Patch32(image.rootNode, Get16(root, GetParam() - 2 * 4) - 4, 0x007A0001);
    bench_.Open(image);
    EXPECT_EQ(Find(7, u"b"), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

INSTANTIATE_TEST_SUITE_P(NodeSizes, FindRememberedNames, ::testing::Values(512u, 1024u));

// ---- four leaves of two records each, of folders 10 to 17

class FindRememberedFolders : public FindRemembered {
protected:
    using FindRemembered::FindRemembered;

    void Open() {
        std::vector<Bytes> keys;
        for (u32 folder = 10; folder < 18; ++folder) {
            keys.push_back(DiskCatKey(folder, u"a"));
        }
        bench_.Open(Tree(512, 2, keys));
    }
    int FindIn(u32 folder) { return Find(folder, u"a"); }
};

// Keys that differ from all separators in what is remembered are led down without a look at the
// root's keys.
TEST_F(FindRememberedFolders, ChildrenExchangedInTheRootAreFollowed) {
    Open();
    const auto exchangeEnds = [&] {
        const HfsNode* root = bench_->findData.path[2].node;
        NodeKey first;
        NodeKey last;
        ASSERT_EQ(root->GetKey(&bench_->header, 0, &first), kOk);
        ASSERT_EQ(root->GetKey(&bench_->header, 3, &last), kOk);
        std::swap_ranges(first.data, first.data + kChildSize, last.data);
    };
    for (const int expected : {kOk, kErrNotFound, kOk}) {
        for (u32 round = 0; round < 2; ++round) {
            EXPECT_EQ(FindIn(11), expected);
            EXPECT_EQ(FindIn(17), expected);
            EXPECT_EQ(FindIn(13), kOk);
        }
        exchangeEnds();
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Who announces a change to a node may change its keys: what the root remembers of them is void,
// also when its children stay.
TEST_F(FindRememberedFolders, AnAnnouncedChangeOfASeparatorIsMet) {
    Open();
    EXPECT_EQ(FindIn(10), kOk);  // the root comes in on the way down, with room to remember
    HfsNode* root = nullptr;
    ASSERT_EQ(bench_->GetINode(bench_->header.rootNode, &root, false), kOk);
    NodeKey second;
    ASSERT_EQ(root->GetKey(&bench_->header, 1, &second), kOk);
    for (const u32 separator : {12u, 11u, 12u}) {
        ASSERT_EQ(bench_->SetDirty(root, second.offset, second.size), kOk);
        PutBe32(second.ptr + kCatKeyParentId, separator);
        for (u32 round = 0; round < 2; ++round) {
            EXPECT_EQ(FindIn(11), separator == 12 ? kOk : kErrNotFound);
            EXPECT_EQ(FindIn(12), kOk);
            EXPECT_EQ(FindIn(15), kOk);
        }
    }
    root->refCount -= 1;
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

MemVolumeOptions OddAddresses() {
    MemVolumeOptions options = Blocks(512);
    options.misalign = 1;
    return options;
}

class FindRememberedAtOddAddresses : public FindRememberedFolders {
protected:
    FindRememberedAtOddAddresses() : FindRememberedFolders(OddAddresses()) {}
};

// The comparator asserts at each probe: three in the root, two in the leaf.
TEST_F(FindRememberedAtOddAddresses, EachProbeIsAsserted) {
    Open();
    for (u32 round = 0; round < 2; ++round) {
        EXPECT_EQ(FindIn(17), kOk);
        EXPECT_EQ(bench_.capture.Take(), Events(5, Asserted(71)));
    }
}

}  // namespace
}  // namespace VELK::test
