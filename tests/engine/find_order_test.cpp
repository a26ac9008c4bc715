// Lookups one after the other in trees of every order, made here: the shortcut for keys of the leaf
// just visited needs to know where a key carries its ID.
#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "bench.h"
#include "hfs/treehfs/node_desc.h"

namespace VELK::test {
namespace {

struct Order {
    const char* name;
    u32 fileId;
    CompareKeysFn compare;
    u32 idAt;  // in the key
};

// An order that the engine does not know.
int CompareForeign(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey) {
    return CompareCatKeysCaseBin(searchKey, id, nodeKey);
}

class FindInOrder : public ::testing::TestWithParam<Order> {
protected:
    FindInOrder() : bench_(Blocks(512), GetParam().fileId) {
        bench_.Create(9, GetParam().compare);
        for (u32 n = 0; n < 40; ++n) {
            const HostKey key = Key(n);
            const Bytes data = Pattern(24, n);
            EXPECT_EQ(bench_->InsertRecord(key.Get(), key.id, data.data(), 24), kOk);
        }
        EXPECT_GE(bench_->header.treeDepth, 2);
    }

    static HostKey Key(u32 n, bool between = false) {
        return NthHostKey(GetParam().fileId, n, between);
    }
    int Find(const HostKey& key, u32 id) {
        return bench_->FindRecord(key.Get(), id, nullptr, 0, nullptr, nullptr);
    }

    Bench bench_;
};

TEST_P(FindInOrder, RecordsAreWhereTheyWerePut) {
    for (u32 n = 0; n < 40; ++n) {
        EXPECT_EQ(Find(Key(n), Key(n).id), kOk);
        EXPECT_EQ(Find(Key(n, true), Key(n, true).id), kErrNotFound);
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// A record goes where the ID given with its key leads, here behind the last one of the first leaf.
// A lookup by the ID it carries ends in the last leaf.
TEST_P(FindInOrder, AKeyGivenWithAnotherIdIsNotFoundByItsOwn) {
    EXPECT_EQ(Find(Key(0), Key(0).id), kOk);
    const u32 count = NumRecords(bench_->findData.path[1].node);
    for (const u32 n : {1u, 2u}) {
        EXPECT_EQ(bench_->DeleteRecord(Key(n).Get(), Key(n).id, false), kOk);
    }
    HostKey key = Key(count - 1, true);
    const u32 ownId = 0x7FFFFFFF;
    std::memcpy(key.bytes + GetParam().idAt, &ownId, sizeof ownId);
    const Bytes data = Pattern(24, 1);
    EXPECT_EQ(bench_->InsertRecord(key.Get(), key.id, data.data(), 24), kOk);
    EXPECT_EQ(bench_->findData.path[1].index, static_cast<s32>(count - 2));
    EXPECT_EQ(Find(key, ownId), kErrNotFound);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

INSTANTIATE_TEST_SUITE_P(
    Orders, FindInOrder,
    ::testing::Values(Order{"Folded", kCatalogFileId, CompareCatKeysCaseIns, kCatKeyParentId},
                      Order{"Binary", kCatalogFileId, CompareCatKeysCaseBin, kCatKeyParentId},
                      Order{"Extents", kExtentsFileId, CompareExtentKeysPlus, kExtKeyFileId},
                      Order{"Attributes", kAttributesFileId, CompareAttrKeys, kAttrKeyFileId},
                      Order{"Foreign", kCatalogFileId, CompareForeign, kCatKeyParentId}),
    [](const auto& test) { return std::string(test.param.name); });

}  // namespace
}  // namespace VELK::test
