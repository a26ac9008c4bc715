// The tree's own path, and what nodes remember of their records, lead past what the way down from
// the root would look at. Nothing may show of that: status, reports, calls of the comparator.
#include <gtest/gtest.h>

#include <cstring>

#include "bench.h"
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/node_desc.h"

namespace VELK::test {
namespace {

class ShortWay : public ::testing::Test {
protected:
    static int Insert(Bench* bench, const std::u16string& name, u32 dataSize) {
        const HostKey key = HostCatKey(7, name);
        return (*bench)->InsertRecord(key.Get(), 7, Pattern(dataSize, 1).data(), dataSize);
    }
    // Status and what was said of a lookup, on the tree's own path or on another one.
    static std::pair<int, Events> Find(Bench* bench, const std::u16string& name,
                                       HfsFindData* path) {
        bench->capture.Take();
        bool found = false;
        const HostKey key = HostCatKey(7, name);
        const int status =
            (*bench)->FindEntry(key, 7, path, &found, nullptr, nullptr, nullptr, nullptr);
        return {status, bench->capture.Take()};
    }
    // A lookup on the tree's own path ends as the one on a new path does, with `status`; what both
    // say.
    static Events ExpectAsPlainly(Bench* bench, const std::u16string& name, int status) {
        HfsFindData path;
        const auto own = Find(bench, name, nullptr);
        const auto plain = Find(bench, name, &path);
        path.ClearPath();
        (*bench)->findData.ClearPath();
        bench->capture.Take();
        EXPECT_EQ(plain.first, status);
        EXPECT_EQ(own.first, plain.first);
        EXPECT_EQ(own.second, plain.second);
        return plain.second;
    }
};

// Sound tree, legal calls: data of three blocks is asserted (505) at each probe.
TEST_F(ShortWay, BehindAllKeysARecordOfThreeBlocksIsAsserted) {
    Bench bench(Blocks(512));
    bench.Create(12, CompareCatKeysCaseIns);
    for (const char16_t* name : {u"a", u"b", u"c", u"d", u"e"}) {
        ASSERT_EQ(Insert(&bench, name, 700), kOk);
    }
    EXPECT_EQ(ExpectAsPlainly(&bench, u"z", kOk), Events{Asserted(505)});
}

// A stored key longer than 520 is refused wherever it is probed.
TEST_F(ShortWay, BehindAllKeysAKeyThatIsTooLongIsRefused) {
    Bench bench(Blocks(4096));
    bench.Create(12, CompareCatKeysCaseIns);
    ASSERT_EQ(Insert(&bench, u"a", 20), kOk);
    ASSERT_EQ(Insert(&bench, u"y", 20), kOk);
    ASSERT_EQ(Insert(&bench, u"b" + std::u16string(257, u'x'), 20), kOk);
    EXPECT_EQ(bench.capture.Take(), Events{Asserted(1362)});
    ExpectAsPlainly(&bench, u"z", kErrCorrupt);
}

// The same as a separator.
TEST_F(ShortWay, ASeparatorThatIsTooLongIsRefused) {
    Bench bench(Blocks(2048));
    bench.Create(11, CompareCatKeysCaseIns);
    for (const char16_t* name : {u"a", u"b", u"q"}) {
        ASSERT_EQ(Insert(&bench, name, 400), kOk);
    }
    ASSERT_EQ(Insert(&bench, u"c" + std::u16string(257, u'x'), 400), kOk);
    ASSERT_EQ(bench->header.treeDepth, 2);
    bench.capture.Take();
    EXPECT_EQ(Find(&bench, u"a", nullptr).first, kOk);
    ExpectAsPlainly(&bench, u"b", kErrCorrupt);
}

// What InsertTree is asked for by somebody else is looked at, also in a tree nobody else touched.
TEST_F(ShortWay, APathByHandIsLookedAt) {
    Bench bench(Blocks(512));
    bench.Create(9, CompareCatKeysCaseIns);
    for (const char16_t* name : {u"a", u"b", u"d"}) {
        ASSERT_EQ(Insert(&bench, name, 20), kOk);
    }
    const HostKey key = HostCatKey(5, u"c");
    bool found = true;
    ASSERT_EQ(bench->FindEntry(key, key.id, nullptr, &found, nullptr, nullptr, nullptr, nullptr),
              kOk);
    ASSERT_FALSE(found);
    const HfsFindLevel place = bench->findData.path[1];
    ASSERT_TRUE(bench->isAllOwn);
    EXPECT_EQ(bench->InsertTree(key, Pattern(20, 1).data(), 20, place.node, place.index, 1, false,
                                nullptr, &bench->convert),
              kOk);
    EXPECT_FALSE(bench->isAllOwn);
    bench->findData.ClearPath();
}

// A leaf that has no room is not asked a second time when that could say nothing new.
TEST_F(ShortWay, AKeyThatIsTooLongIsSaidToBeSoAsOften) {
    Events said[2];
    for (const bool isAllOwn : {false, true}) {
        Bench bench(Blocks(2048));
        bench.Create(11, CompareCatKeysCaseIns);
        for (const char16_t* name : {u"a", u"b", u"q"}) {
            ASSERT_EQ(Insert(&bench, name, 400), kOk);
        }
        bench.capture.Take();
        bench->isAllOwn = isAllOwn;
        ASSERT_EQ(Insert(&bench, u"c" + std::u16string(257, u'x'), 400), kOk);
        said[isAllOwn ? 1 : 0] = bench.capture.Take();
        bench->findData.ClearPath();
    }
    EXPECT_EQ(said[0], said[1]);
    EXPECT_GE(said[0].size(), 3u);
}

// An extents key of 12 bytes in a tree of separators of 10: asserted (1359), inserted, and nothing
// else is said of an insertion that succeeded.
TEST_F(ShortWay, AnInsertionThatSucceedsReportsNothing) {
    Bench bench(Blocks(512), kExtentsFileId);
    bench->compareKeys = CompareExtentKeysPlus;
    bench->header.maxKeyLength = kExtMaxKeyLength;
    bench->header.attributes = kBTBigKeysMask;
    const unsigned long long size = 64 * 512;
    ASSERT_EQ(bench->Create(9, 0, &size), kOk);
    for (u32 n = 10; n < 30; ++n) {
        ASSERT_EQ(bench->InsertRecord(HostExtKey(0, n, 0).Get(), n, Pattern(64, n).data(), 64),
                  kOk);
    }
    ASSERT_EQ(bench->header.treeDepth, 2);
    bench.capture.Take();
    HostKey key = HostExtKey(0, 5, 0);
    key.bytes[0] = 12;
    EXPECT_EQ(bench->InsertRecord(key.Get(), 5, Pattern(64, 1).data(), 64), kOk);
    const Events events = bench.capture.Take();
    bench->findData.ClearPath();
    for (const Event& event : events) {
        EXPECT_NE(event.kind, Event::Kind::kReport) << event;
    }
}

// Records moved by hand by a rotation that is refused at its own record.
TEST_F(ShortWay, RecordsMovedByARotationThatFailed) {
    Bench bench(Blocks(512));
    bench.Create(9, CompareCatKeysCaseIns);
    for (u32 n = 0; n < 40; ++n) {
        const HostKey key = NthHostKey(4, n);
        ASSERT_EQ(bench->InsertRecord(key.Get(), key.id, Pattern(24, n).data(), 24), kOk);
    }
    const auto find = [&](u32 n, HfsFindData* path) {
        const HostKey key = NthHostKey(4, n);
        return bench->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, path);
    };
    ASSERT_EQ(find(0, nullptr), kOk);
    HfsNode* left = bench->findData.path[1].node;
    const u32 count = NumRecords(left);
    HfsFindData second;
    ASSERT_EQ(find(count, &second), kOk);
    HfsNode* right = second.path[1].node;
    ASSERT_NE(left, right);
    for (const u32 n : {1u, 2u, 3u}) {
        ASSERT_EQ(bench->DeleteRecord(NthHostKey(4, n).Get(), NthHostKey(4, n).id, false), kOk);
    }
    ASSERT_EQ(find(0, nullptr), kOk);
    const u32 before = NumRecords(left);
    int index = 0;
    unsigned nodeNum = 0;
    unsigned moved = 0;
    bool rotated = false;
    const HostKey key = NthHostKey(4, count + NumRecords(right) - 1, true);
    ASSERT_EQ(bench->_RotateLeft(left, right, static_cast<int>(NumRecords(right)), key, "x", 0,
                                 &index, &nodeNum, &rotated, &moved, &bench->convert),
              kErrInvalid);
    ASSERT_GT(NumRecords(left), before);
    const int own = find(count, nullptr);
    const int plain = find(count, &second);
    second.ClearPath();
    bench->findData.ClearPath();
    bench.capture.Take();
    EXPECT_EQ(own, plain);
}

// The comparator asserts at each probe (70) when the search key is out of line: a lookup asks as
// often as the one after it, which finds the same tree.
TEST_F(ShortWay, ANodeIsSearchedOnce) {
    Bench bench(Blocks(512));
    bench.Create(11, CompareCatKeysCaseIns);
    for (u32 n = 0; n < 60; ++n) {
        const std::u16string name = std::u16string(1, static_cast<char16_t>(u'A' + n / 10)) +
                                    std::u16string(1, static_cast<char16_t>(u'0' + n % 10)) +
                                    std::u16string(20 + n % 7, u'x');
        ASSERT_EQ(Insert(&bench, name, 300), kOk);
        const HostKey key = HostCatKey(7, name);
        alignas(8) u8 room[sizeof key.bytes + 2];
        std::memcpy(room + 2, key.bytes, sizeof key.bytes);
        std::size_t asked[2];
        for (std::size_t& times : asked) {
            bench.capture.Take();
            HfsFindData path;
            bool found = false;
            ASSERT_EQ(bench->FindEntry(reinterpret_cast<const BTreeKey*>(room + 2), 7, &path,
                                       &found, nullptr, nullptr, nullptr, nullptr),
                      kOk);
            ASSERT_TRUE(found);
            times = bench.capture.Take().size();
            path.ClearPath();
        }
        EXPECT_EQ(asked[0], asked[1]) << n;
    }
    bench->findData.ClearPath();
    bench.capture.Take();
}

// An index record of much data, probed and remembered in two blocks, then moved into three.
TEST_F(ShortWay, ARecordThatMovedIntoThreeBlocksIsAsserted) {
    Bench bench(Blocks(512));
    TreeShape shape;
    shape.nodeSize = 4096;
    shape.recordsPerLeaf = 2;
    std::vector<TreeRecord> records;
    for (const char16_t* name : {u"b", u"c", u"h", u"i", u"n", u"o"}) {
        records.push_back({DiskCatKey(7, name), Pattern(8, 1)});
    }
    bench.Open(BuildTree(shape, records));
    HfsFindData path;
    ASSERT_EQ(Find(&bench, u"o", &path).first, kOk);
    HfsNode* root = path.path[2].node;
    const Bytes wide = DiskCatKey(7, u"d");
    const Bytes first = DiskCatKey(7, u"a" + std::u16string(205, u'x'));
    const Bytes data = Pattern(600, 1);
    const auto asKey = [](const Bytes& key) {
        return reinterpret_cast<const BTreeKey*>(key.data());
    };
    ASSERT_EQ(bench->_InsertKeyRecord(root, 1, asKey(wide), 0, data.data(), 600, nullptr), kOk);
    EXPECT_EQ(Find(&bench, u"o", &path).second, Events{});
    const u8 child[] = {0, 0, 0, 1};
    ASSERT_EQ(bench->_InsertKeyRecord(root, 0, asKey(first), 0, child, 4, nullptr), kOk);
    const auto remembered = Find(&bench, u"o", &path);
    HfsNode* node = nullptr;
    ASSERT_EQ(bench->GetINode(bench->header.rootNode, &node, false), kOk);
    node->refCount -= 1;
    const auto plain = Find(&bench, u"o", &path);
    path.ClearPath();
    bench.capture.Take();
    EXPECT_EQ(plain.second, Events{Asserted(505)});
    EXPECT_EQ(remembered.second, plain.second);
}

// Sound tree: node 3 was the root and is a leaf now, its object has room to remember.
TEST_F(ShortWay, ALeafRecordThatMovedIntoThreeBlocksIsAsserted) {
    Bench bench(Blocks(512));
    bench.Create(12, CompareCatKeysCaseIns);
    const std::u16string letters = u"bdfhjlnp";
    for (const char16_t letter : letters) {
        ASSERT_EQ(Insert(&bench, {letter}, 600), kOk);
    }
    ASSERT_EQ(bench->header.treeDepth, 2);
    ASSERT_EQ(bench->header.rootNode, 3u);
    for (const char16_t letter : letters) {
        ASSERT_EQ(bench->DeleteRecord(HostCatKey(7, {&letter, 1}).Get(), 7, false), kOk);
    }
    ASSERT_EQ(bench->header.treeDepth, 0);
    ASSERT_EQ(Insert(&bench, u"b", 600), kOk);
    HfsNode* held = nullptr;
    ASSERT_EQ(bench->AllocateNode(&held), kOk);
    ASSERT_EQ(held->nodeNum, 2u);
    for (const char16_t letter : letters.substr(1)) {
        ASSERT_EQ(Insert(&bench, {letter}, 600), kOk);
    }
    ASSERT_EQ(bench->header.lastLeafNode, 3u);
    HfsFindData path;
    const std::u16string inLast = u"lnp";
    for (const char16_t letter : inLast) {
        ASSERT_EQ(Find(&bench, {letter}, &path).first, kOk);
        ASSERT_EQ(path.path[1].node->nodeNum, 3u);
    }
    ASSERT_NE(path.path[1].node->hints, nullptr);
    const s32 last = path.path[1].index;
    for (u32 grow = 0; grow < 4; ++grow) {
        const char16_t next[] = {u'j', static_cast<char16_t>(u'a' + grow), 0};
        ASSERT_EQ(Insert(&bench, next, 100), kOk);
        for (const char16_t letter : inLast) {
            const auto remembered = Find(&bench, {letter}, &path);
            HfsNode* node = nullptr;
            ASSERT_EQ(bench->GetINode(3, &node, false), kOk);
            node->refCount -= 1;
            const auto plain = Find(&bench, {letter}, &path);
            EXPECT_EQ(remembered.second, plain.second) << grow << " " << u32{letter} << " " << last;
        }
        for (const char16_t letter : inLast) {
            Find(&bench, {letter}, &path);
        }
    }
    path.ClearPath();
    held->refCount -= 1;
    bench->findData.ClearPath();
    bench.capture.Take();
}

// The leaf beside that of the tree's own path, the last one, is held more often than is expected.
TEST_F(ShortWay, ALastLeafThatManyHoldIsAsserted) {
    Bench bench(Blocks(1024));
    bench.Create(10, CompareCatKeysCaseIns);
    const std::u16string names = u"abcdefghijklmnopqrst";
    for (const char16_t name : names) {
        ASSERT_EQ(Insert(&bench, {name}, 100), kOk);
    }
    const u32 last = bench->header.lastLeafNode;
    HfsFindData holders[3];
    for (HfsFindData& holder : holders) {
        alignas(8) u8 record[100];
        unsigned size = 0;
        ASSERT_EQ(bench->SetPos(u64{last} << 10, record, sizeof record, &size, nullptr, 0, nullptr,
                                &holder),
                  kOk);
    }
    for (const char16_t name : names) {
        ASSERT_EQ(Find(&bench, {name}, nullptr).first, kOk);
        if (FLink(bench->findData.path[1].node) == last) {
            break;
        }
    }
    ASSERT_TRUE(bench->isAllOwn);
    ASSERT_EQ(FLink(bench->findData.path[1].node), last);
    EXPECT_EQ(ExpectAsPlainly(&bench, u"t", kOk), Events{Asserted(2610)});
    for (HfsFindData& holder : holders) {
        holder.ClearPath();
    }
}

}  // namespace
}  // namespace VELK::test
