// When a lookup on the tree's own path asks the nodes above the leaf: never for a key between the
// first and the last of the leaf just visited, nor for one behind all keys of the tree, always for
// any other, and where a key to compare lies in two blocks. It shows while the root cannot be read.
#include <gtest/gtest.h>

#include <algorithm>
#include <utility>

#include "bench.h"
#include "hfs/treehfs/node_desc.h"

namespace VELK::test {
namespace {

struct ShortcutShape {
    u32 nodeSize;
    u32 fileId;
    CompareKeysFn compare;
};
std::ostream& operator<<(std::ostream& out, const ShortcutShape& shape) {
    return out << "nodes of " << shape.nodeSize << ", file " << shape.fileId
               << (shape.compare == CompareCatKeysCaseIns ? ", folded" : "");
}

class FindShortcut : public ::testing::TestWithParam<ShortcutShape> {
protected:
    FindShortcut() : bench_(Blocks(512), GetParam().fileId) {
        bench_->compareKeys = GetParam().compare;
        bench_->header.maxKeyLength = kMaxKeyLength;
        bench_->header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
        const unsigned long long size = 64 * GetParam().nodeSize;
        EXPECT_EQ(bench_->Create(GetParam().nodeSize == 512 ? 9 : 10, 0, &size), kOk);
    }
    ~FindShortcut() override {
        bench_->findData.ClearPath();
        bench_.capture.Take();
    }

    void Insert(const std::vector<HostKey>& keys) {
        const Bytes data = Pattern(20, 1);
        for (const HostKey& key : keys) {
            ASSERT_EQ(bench_->InsertRecord(key.Get(), key.id, data.data(), 20), kOk);
        }
        ASSERT_GE(bench_->header.treeDepth, 2);
        bench_.Forget();
    }
    int Find(const HostKey& key) {
        return bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr);
    }
    // The same while the root says it is something else.
    int FindWithoutRoot(const HostKey& key) {
        u8& height =
            bench_->findData.path[bench_->header.treeDepth].node->bufs[0].data[kDescHeight];
        const u8 before = std::exchange(height, u8{9});
        const int status = Find(key);
        height = before;
        return status;
    }
    bool IsKeyInOneBlock(const HfsNode* leaf, s32 index) {
        NodeKey record;
        EXPECT_EQ(leaf->GetKey(&bench_->header, index, &record), kOk);
        return record.keySize <= record.firstBytes;
    }
    // Whether the bounds of the leaf and the keys a search for this place probes lie in one block
    // each.
    bool AreKeysInOneBlock(const HfsFindLevel& place, bool found) {
        s32 low = 0;
        s32 high = static_cast<s32>(NumRecords(place.node)) - 1;
        bool isInOneBlock = IsKeyInOneBlock(place.node, high);
        if (place.index > high) {
            return isInOneBlock;
        }
        isInOneBlock = isInOneBlock && IsKeyInOneBlock(place.node, 0);
        while (low <= high && isInOneBlock) {
            const s32 middle = (low + high) / 2;
            isInOneBlock = IsKeyInOneBlock(place.node, middle);
            if (middle == place.index && found) {
                break;
            }
            (middle >= place.index ? high : low) = middle + (middle >= place.index ? -1 : 1);
        }
        return isInOneBlock;
    }
    // Looks `key` up on the leaf of `before`, then the same way without the root.
    void ExpectRootAskedIfNeeded(const HostKey& before, const HostKey& key) {
        ASSERT_EQ(Find(before), kOk);
        const HfsNode* leaf = bench_->findData.path[1].node;
        const int status = Find(key);
        const HfsFindLevel place = bench_->findData.path[1];
        const s32 count = static_cast<s32>(NumRecords(place.node));
        const bool isBetween =
            status == kOk || (place.index > 0 && (place.index < count || FLink(place.node) == 0));
        const bool isOnLeaf =
            place.node == leaf && isBetween && AreKeysInOneBlock(place, status == kOk);
        ASSERT_EQ(Find(before), kOk);
        bench_.Forget();
        ASSERT_EQ(FindWithoutRoot(key), isOnLeaf ? status : kErrCorrupt);
        if (isOnLeaf) {
            shortcuts_ += 1;
            ASSERT_EQ(bench_->findData.path[1].node, place.node);
            ASSERT_EQ(bench_->findData.path[1].index, place.index);
            ASSERT_EQ(bench_.capture.Take(), Events{});
        }
    }

    // From each of `keys`, which are in order, to each near it, and to each that is not there.
    void ExpectRootAskedIfNeeded(const std::vector<HostKey>& keys,
                                 const std::vector<HostKey>& absent) {
        Insert(keys);
        for (std::size_t i = 0; i < keys.size(); ++i) {
            for (std::size_t j = 0; j < keys.size(); ++j) {
                if (j + 8 >= i && j <= i + 8) {
                    ExpectRootAskedIfNeeded(keys[i], keys[j]);
                }
            }
            for (const HostKey& key : absent) {
                ExpectRootAskedIfNeeded(keys[i], key);
            }
            if (HasFatalFailure()) {
                FAIL() << "on the leaf of key " << i;
            }
        }
        EXPECT_GT(shortcuts_, 8 * keys.size());
    }

    Bench bench_;
    u32 shortcuts_ = 0;
};

// Names of letters and of what is no letter, of each kind at either end of a leaf; keys that are
// there and keys that are not, in three folders.
class FindNameShortcut : public FindShortcut {
protected:
    static HostKey Key(u32 id, const std::u16string& name) {
        return GetParam().fileId == kCatalogFileId ? HostCatKey(id, name)
                                                   : HostAttrKey(id, 0, name);
    }
};

TEST_P(FindNameShortcut, FromOneToTheOther) {
    const std::u16string units = u"19BDFHJLNPRTXZ\u00E9\u03B1\u4E00\u4E01\u4E03";
    std::vector<HostKey> keys;
    std::vector<HostKey> absent;
    for (const u32 id : {5u, 7u, 9u}) {
        keys.push_back(Key(id, u""));
        absent.push_back(Key(id - 1, u"k"));
        for (const char16_t unit : units) {
            keys.push_back(Key(id, unit + std::u16string(9, u'x')));
            keys.push_back(Key(id, unit + std::u16string(9, u'y')));
            absent.push_back(Key(id, unit + std::u16string(9, u'w')));
            absent.push_back(Key(id, unit + std::u16string(9, u'z')));
        }
    }
    absent.push_back(Key(10, u"k"));
    ExpectRootAskedIfNeeded(keys, absent);
}

INSTANTIATE_TEST_SUITE_P(
    Shapes, FindNameShortcut,
    ::testing::Values(ShortcutShape{512, kCatalogFileId, CompareCatKeysCaseIns},
                      ShortcutShape{1024, kCatalogFileId, CompareCatKeysCaseIns},
                      ShortcutShape{512, kCatalogFileId, CompareCatKeysCaseBin},
                      ShortcutShape{1024, kCatalogFileId, CompareCatKeysCaseBin},
                      ShortcutShape{512, kAttributesFileId, CompareAttrKeys},
                      ShortcutShape{1024, kAttributesFileId, CompareAttrKeys}));

class FindExtentShortcut : public FindShortcut {};

TEST_P(FindExtentShortcut, FromOneToTheOther) {
    std::vector<HostKey> keys;
    std::vector<HostKey> absent;
    for (const u32 id : {5u, 7u, 9u}) {
        absent.push_back(HostExtKey(kForkData, id - 1, 10));
        for (const u8 fork : {kForkData, kForkResource}) {
            for (u32 start = 10; start < 200; start += 10) {
                keys.push_back(HostExtKey(fork, id, start));
                absent.push_back(HostExtKey(fork, id, start + 5));
            }
        }
    }
    absent.push_back(HostExtKey(kForkData, 10, 10));
    ExpectRootAskedIfNeeded(keys, absent);
}

INSTANTIATE_TEST_SUITE_P(
    Shapes, FindExtentShortcut,
    ::testing::Values(ShortcutShape{512, kExtentsFileId, CompareExtentKeysPlus},
                      ShortcutShape{1024, kExtentsFileId, CompareExtentKeysPlus}));

}  // namespace
}  // namespace VELK::test
