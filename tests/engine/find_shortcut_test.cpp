// When a lookup on the tree's own path asks the nodes above the leaf: never for a key between the
// first and the last of the leaf just visited or of the last leaf beside that, nor for one behind
// all keys of the tree; always for any other, and where a record it goes by is out of the ordinary.
// It shows while the root cannot be read.
#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <utility>

#include "bench.h"
#include "hfs/treehfs/hints.h"
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
        bench_.Create(GetParam().nodeSize == 512 ? 9 : 10, GetParam().compare);
    }
    ~FindShortcut() override {
        bench_->findData.ClearPath();
        bench_.capture.Take();
    }

    void Insert(const std::vector<HostKey>& keys) {
        Bytes data = Pattern(20, 1);
        data[0] = 0;  // behind an empty name: what would be a letter
        data[1] = 'm';
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
    // Whether the last leaf is beside this one, below the same parent, which remembers it.
    bool IsLastBeside(const HfsNode* leaf, const HfsFindLevel& parent) {
        const HfsFindLevel* path = bench_->findData.path;
        return path[1].node != leaf && FLink(path[1].node) == 0 && path[2].node == parent.node &&
               path[2].index == parent.index + 1 &&
               static_cast<u32>(path[2].index) < HintRoom(&bench_.tree.tree);
    }
    // Looks `key` up on the leaf of `before`, then the same way without the root.
    void ExpectRootAskedIfNeeded(const HostKey& before, const HostKey& key) {
        ASSERT_EQ(Find(before), kOk);
        const HfsNode* leaf = bench_->findData.path[1].node;
        const HfsFindLevel parent = bench_->findData.path[2];
        const int status = Find(key);
        const HfsFindLevel place = bench_->findData.path[1];
        const bool isNear = place.node == leaf || IsLastBeside(leaf, parent);
        const s32 count = static_cast<s32>(NumRecords(place.node));
        const bool isBetween =
            status == kOk || (place.index > 0 && (place.index < count || FLink(place.node) == 0));
        const bool isOnLeaf = isNear && isBetween && AreKeysInOneBlock(place, status == kOk);
        ASSERT_EQ(Find(before), kOk);
        bench_.Forget();
        ASSERT_EQ(FindWithoutRoot(key), isOnLeaf ? status : kErrCorrupt);
        if (isOnLeaf) {
            shortcuts_ += 1;
            steps_ += place.node != leaf ? 1u : 0u;
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
        EXPECT_GT(steps_, 0u);
    }

    Bench bench_;
    u32 shortcuts_ = 0;  // on the leaf or the last one beside it
    u32 steps_ = 0;      // to the last one
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

// ---- records out of the ordinary

// Leaves of five records each, one of them changed behind the engine's back: the record in the
// middle is probed by each search, the first and the last are the bounds.
struct LeafBlocks {
    u32 mapBlock;
    u32 fileId;
    CompareKeysFn compare;
};
std::ostream& operator<<(std::ostream& out, const LeafBlocks& shape) {
    return out << "blocks of " << shape.mapBlock << ", file " << shape.fileId
               << (shape.compare == CompareCatKeysCaseIns ? ", folded" : "");
}

class FindPastOddRecord : public ::testing::TestWithParam<LeafBlocks> {
protected:
    static constexpr u32 kNodeSize = 4096;
    static constexpr u32 kFirst = 5;  // of the records of the second leaf
    static constexpr u32 kMiddle = kFirst + 2;

    struct Damage {
        const char* what;
        u32 dataSize;
        std::function<void(u32 index)> make;
    };

    FindPastOddRecord() : bench_(Blocks(GetParam().mapBlock), GetParam().fileId) {}
    ~FindPastOddRecord() override { bench_->findData.ClearPath(); }

    void Open(u32 dataSize) {
        bench_->findData.ClearPath();
        bench_->Dtor();
        TreeShape shape;
        shape.fileId = GetParam().fileId;
        shape.nodeSize = kNodeSize;
        shape.recordsPerLeaf = 5;
        bench_.Open(BuildTree(shape, NthRecords(shape.fileId, 15, dataSize)));
        bench_->compareKeys = GetParam().compare;
        ASSERT_EQ(Find(kMiddle), kOk);
        leaf_ = bench_->findData.path[1].node;
        bench_->isAllOwn = true;
    }
    int Find(u32 n) {
        const HostKey key = NthHostKey(GetParam().fileId, n);
        return bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr);
    }
    int FindWithoutRoot(u32 n) {
        u8& height = bench_->findData.path[2].node->bufs[0].data[kDescHeight];
        const u8 before = std::exchange(height, u8{9});
        const int status = Find(n);
        height = before;
        return status;
    }

    u8& At(u32 offset) {
        return leaf_->bufs[offset / GetParam().mapBlock].data[offset % GetParam().mapBlock];
    }
    u32 Word(u32 offset) { return u32{At(offset)} << 8 | At(offset + 1); }
    void SetWord(u32 offset, u32 value) {
        At(offset) = static_cast<u8>(value >> 8);
        At(offset + 1) = static_cast<u8>(value);
    }
    static u32 Slot(u32 index) { return kNodeSize - 2 * (index + 1); }
    u32 Start(u32 index) { return Word(Slot(index)); }
    Bytes Content() {
        Bytes content;
        for (u32 at = 0; at < kNodeSize; ++at) {
            content.push_back(At(at));
        }
        return content;
    }
    void Restore(const Bytes& content) {
        for (u32 at = 0; at < kNodeSize; ++at) {
            At(at) = content[at];
        }
    }

    void MakeStartOdd(u32 index) {
        const u32 start = Start(index);
        for (u32 at = start + 2 + Word(start); at > start; --at) {
            At(at) = At(at - 1);
        }
        SetWord(Slot(index), start + 1);
    }
    std::vector<Damage> Damages() {
        const auto keyLength = [this](u32 length) {
            return [this, length](u32 index) { SetWord(Start(index), length); };
        };
        std::vector<Damage> damages = {
            {"a key shorter than its fixed part", 80, keyLength(4)},
            {"a key as long as its record", 80,
             [this](u32 index) { SetWord(Start(index), Start(index + 1) - Start(index) - 2); }},
            {"a record at an odd address", 80, [this](u32 index) { MakeStartOdd(index); }},
            {"an end outside the node", 80,
             [this](u32 index) { SetWord(Slot(index + 1), 0xFFF0); }},
            {"an end before the start", 80,
             [this](u32 index) { SetWord(Slot(index + 1), Start(index) - 2); }},
        };
        if (GetParam().fileId != kExtentsFileId) {
            const u32 nameAt = GetParam().fileId == kCatalogFileId ? 6 : 12;
            damages.push_back({"a name longer than its key", 80,
                               [this, nameAt](u32 index) { SetWord(Start(index) + nameAt, 300); }});
        }
        if (GetParam().mapBlock > 512) {
            damages.push_back({"a key longer than any", 600, keyLength(521)});
        } else {
            damages.push_back({"a key in two blocks", 500, keyLength(505)});
            damages.push_back({"data in three blocks", 500, [this](u32 index) {
                                   SetWord(Slot(index + 1), Start(index) + 1200);
                               }});
        }
        return damages;
    }

    Bench bench_;
    HfsNode* leaf_ = nullptr;
};

TEST_P(FindPastOddRecord, AsksTheRoot) {
    for (const Damage& damage : Damages()) {
        Open(damage.dataSize);
        const Bytes sound = Content();
        for (const u32 index : {0u, 2u, 4u}) {
            SCOPED_TRACE(::testing::Message() << damage.what << ", record " << index);
            const u32 wanted = index == 2 ? kFirst : kMiddle;
            ASSERT_EQ(FindWithoutRoot(wanted), kOk);
            damage.make(index);
            bench_.capture.Take();
            EXPECT_EQ(FindWithoutRoot(wanted), kErrCorrupt);
            EXPECT_EQ(bench_.capture.Take(),
                      (Events{Reported(kReasonTree, 2916), Reported(kErrCorrupt, 2982),
                              Reported(kErrCorrupt, 3126)}));
            Restore(sound);
            ASSERT_EQ(Find(kMiddle), kOk);
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Blocks, FindPastOddRecord,
                         ::testing::Values(LeafBlocks{4096, kCatalogFileId, CompareCatKeysCaseIns},
                                           LeafBlocks{2048, kCatalogFileId, CompareCatKeysCaseIns},
                                           LeafBlocks{512, kCatalogFileId, CompareCatKeysCaseIns},
                                           LeafBlocks{4096, kCatalogFileId, CompareCatKeysCaseBin},
                                           LeafBlocks{2048, kCatalogFileId, CompareCatKeysCaseBin},
                                           LeafBlocks{512, kCatalogFileId, CompareCatKeysCaseBin},
                                           LeafBlocks{4096, kExtentsFileId, CompareExtentKeysPlus},
                                           LeafBlocks{2048, kExtentsFileId, CompareExtentKeysPlus},
                                           LeafBlocks{512, kExtentsFileId, CompareExtentKeysPlus},
                                           LeafBlocks{4096, kAttributesFileId, CompareAttrKeys},
                                           LeafBlocks{2048, kAttributesFileId, CompareAttrKeys},
                                           LeafBlocks{512, kAttributesFileId, CompareAttrKeys}));

}  // namespace
}  // namespace VELK::test
