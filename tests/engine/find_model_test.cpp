// The engine's lookup against plain ones: random keys against a count of the smaller ones, and any
// damage of a tree against the lookup of literal_find.h.
#include <gtest/gtest.h>

#include <algorithm>
#include <random>

#include "bench.h"
#include "literal_find.h"

namespace VELK::test {
namespace {

// ---- random keys

struct RandomTree {
    Geometry geometry;
    u32 fileId;
    u16 version;
};
std::ostream& operator<<(std::ostream& out, const RandomTree& tree) {
    return out << tree.geometry << ", file " << tree.fileId << ", version " << tree.version;
}

class FindRandom : public ::testing::TestWithParam<RandomTree> {
protected:
    FindRandom() : bench_(OptionsOf(GetParam()), GetParam().fileId), random_(20240229) {}

    static MemVolumeOptions OptionsOf(const RandomTree& tree) {
        MemVolumeOptions options = Blocks(tree.geometry.mapBlock);
        options.version = tree.version;
        return options;
    }
    u32 Below(u32 limit) { return static_cast<u32>(random_() % limit); }

    // Names that are hard on an order: cases, accents, ignorable units, prefixes, nothing at all.
    std::u16string RandomName() {
        static const std::u16string kUnits =
            u"aAbBzZ_.~\u0001\u00E9\u00C9\u0130\u03A3\u03C3"
            u"\u200C\u200D\uFEFF\u4E00\uFFFF";
        std::u16string name;
        const u32 length = Below(8) == 0 ? Below(60) : Below(4);
        for (u32 i = 0; i < length; ++i) {
            name += kUnits[Below(static_cast<u32>(kUnits.size()))];
        }
        return name;
    }
    HostKey RandomKey() {
        static const u32 kIds[] = {1, 2, 3, 0x7FFFFFFF, 0x80000000, 0xFFFFFFFF};
        const u32 id = kIds[Below(6)];
        switch (GetParam().fileId) {
            case 3:
                return HostExtKey(Below(2) == 0 ? kForkData : kForkResource, id, kIds[Below(6)]);
            case 8:
                return HostAttrKey(id, Below(3), RandomName());
            default:
                return HostCatKey(id, RandomName());
        }
    }
    int Compare(const HostKey& a, const HostKey& b) const {
        const Bytes disk = DiskFormOf(GetParam().fileId, b);
        return compare_(a, a.id, reinterpret_cast<const BTreeKey*>(disk.data()));
    }
    // Opens a tree of up to `count` different random keys, in `keys_` in order.
    void OpenRandom(u32 count) {
        const bool binary = GetParam().version == kVersionHfsx;
        compare_ = GetParam().fileId == 3   ? CompareExtentKeysPlus
                   : GetParam().fileId == 8 ? CompareAttrKeys
                   : binary                 ? CompareCatKeysCaseBin
                                            : CompareCatKeysCaseIns;
        for (u32 i = 0; i < count; ++i) {
            keys_.push_back(RandomKey());
        }
        std::sort(keys_.begin(), keys_.end(),
                  [&](const HostKey& a, const HostKey& b) { return Compare(a, b) < 0; });
        const auto same = [&](const HostKey& a, const HostKey& b) { return Compare(a, b) == 0; };
        keys_.erase(std::unique(keys_.begin(), keys_.end(), same), keys_.end());
        std::vector<TreeRecord> records;
        for (const HostKey& key : keys_) {
            records.push_back({DiskFormOf(GetParam().fileId, key), Bytes(6, 1)});
        }
        TreeShape shape;
        shape.fileId = GetParam().fileId;
        shape.nodeSize = GetParam().geometry.nodeSize;
        shape.keyCompareType = binary ? kKeyCompareBinary : 0;
        bench_.Open(BuildTree(shape, records));
    }
    u32 Smaller(const HostKey& key) const {
        return static_cast<u32>(
            std::count_if(keys_.begin(), keys_.end(),
                          [&](const HostKey& other) { return Compare(key, other) > 0; }));
    }
    // Number of the leaf record the path stands on, counted over all leaves.
    u32 PlaceOf(const HfsFindData& path) const {
        u32 place = static_cast<u32>(path.path[1].index);
        for (const u32 leaf : bench_.image.levels[1]) {
            if (leaf == path.path[1].node->nodeNum) {
                break;
            }
            place += Get16(bench_.image.Node(leaf), 10);
        }
        return place;
    }
    bool IsThere(const HostKey& key) const {
        const u32 place = Smaller(key);
        return place < keys_.size() && Compare(key, keys_[place]) == 0;
    }
    void ExpectPlace(const HostKey& key, HfsFindData* path) {
        bool found = false;
        ASSERT_EQ(bench_->FindEntry(key, key.id, path, &found, nullptr, nullptr, nullptr, nullptr),
                  kOk);
        EXPECT_EQ(found, IsThere(key));
        EXPECT_EQ(PlaceOf(path != nullptr ? *path : bench_->findData), Smaller(key));
    }

    Bench bench_;
    std::mt19937 random_;
    CompareKeysFn compare_ = nullptr;
    std::vector<HostKey> keys_;
};

TEST_P(FindRandom, EveryKeyStandsBehindTheSmallerOnes) {
    OpenRandom(400);
    HfsFindData path;
    for (int round = 0; round < 400; ++round) {
        const HostKey key =
            Below(2) == 0 ? keys_[Below(static_cast<u32>(keys_.size()))] : RandomKey();
        ExpectPlace(key, &path);
        ExpectPlace(key, nullptr);
    }
    path.ClearPath();
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(FindRandom, KeysInOrderOnTheTreesOwnPath) {
    OpenRandom(300);
    for (const HostKey& key : keys_) {
        ExpectPlace(key, nullptr);
    }
    EXPECT_TRUE(LedgerHolds(*bench_.tree, References(bench_->findData)));
}

INSTANTIATE_TEST_SUITE_P(
    Trees, FindRandom,
    ::testing::Values(RandomTree{{512, 512}, 4, 4}, RandomTree{{1024, 512}, 4, 4},
                      RandomTree{{4096, 512}, 4, 4}, RandomTree{{4096, 4096}, 4, 5},
                      RandomTree{{512, 512}, 3, 4}, RandomTree{{1024, 512}, 8, 4}));

// ---- any damage

// Trees whose records lie far from the blocks' ends, and such as lie across them.
enum class Layout {
    kSmall,      // all in the first blocks of their nodes
    kWideLeaf,   // the key of the third record of each leaf in two blocks
    kWideIndex,  // as many records in the root as it has room for
};

struct Damaged {
    Geometry geometry;
    u32 fileId;
    Layout layout = Layout::kSmall;
    u16 version = kVersionHfsPlus;
};
std::ostream& operator<<(std::ostream& out, const Damaged& damaged) {
    return out << damaged.geometry << ", file " << damaged.fileId << ", layout "
               << static_cast<int>(damaged.layout) << ", version " << damaged.version;
}

class FindLiteral : public ::testing::TestWithParam<Damaged> {
protected:
    FindLiteral() : bench_(OptionsOf(GetParam()), GetParam().fileId) {
        const Layout layout = GetParam().layout;
        const bool isWideIndex = layout == Layout::kWideIndex;
        TreeShape shape;
        shape.fileId = GetParam().fileId;
        shape.nodeSize = GetParam().geometry.nodeSize;
        shape.recordsPerLeaf = isWideIndex ? 1 : 4;
        shape.childrenPerIndex = isWideIndex ? 0 : 3;
        shape.keyCompareType = GetParam().version == kVersionHfsx ? kKeyCompareBinary : 0;
        const u32 dataSize = layout == Layout::kWideLeaf ? 220 : 10;
        sound_ = BuildTree(shape, NthRecords(shape.fileId, isWideIndex ? 30 : 16, dataSize));
    }
    static MemVolumeOptions OptionsOf(const Damaged& damaged) {
        MemVolumeOptions options = Blocks(damaged.geometry.mapBlock);
        options.version = damaged.version;
        return options;
    }

    // Looks several keys up on a fresh tree, each compared with the plain lookup.
    void ExpectSame(const TreeImage& image, bool ownPath) {
        bench_.Load(image);
        ASSERT_EQ(bench_->Init(), kOk);
        LiteralFind plain(image, GetParam().geometry.mapBlock, bench_->compareKeys);
        HfsFindData path;
        HfsFindData* used = ownPath ? &bench_->findData : &path;
        const u32 last = sound_.leafRecords - 1;
        for (const u32 n : {6u, 4u, 5u, 7u, 0u, last, last * 2 / 3}) {
            const HostKey key = NthHostKey(GetParam().fileId, n, n == 5);
            bench_.capture.Take();
            bool found = false;
            const int status =
                bench_->FindEntry(key, key.id, used, &found, nullptr, nullptr, nullptr, nullptr);
            const Events events = bench_.capture.Take();
            const LiteralResult expected = plain.Find(key);
            ASSERT_EQ(status, expected.status) << n;
            ASSERT_EQ(events, expected.events) << n;
            if (status == kOk) {
                ASSERT_EQ(found, expected.found) << n;
                ASSERT_EQ(PathOf(*used), expected.path) << n;
            }
        }
        path.ClearPath();
        bench_->Dtor();
        bench_->findData = HfsFindData();
    }
    static std::map<u32, std::pair<u32, s32>> PathOf(const HfsFindData& path) {
        std::map<u32, std::pair<u32, s32>> held;
        for (u32 level = 0; level <= kMaxPathDepth; ++level) {
            if (path.path[level].node != nullptr) {
                held[level] = {path.path[level].node->nodeNum, path.path[level].index};
            }
        }
        return held;
    }
    // Whether the search reads the word at this place of a node: anything but the data of a leaf,
    // the space behind the records, and most of a name.
    bool IsSearched(u32 nodeNum, u32 at) const {
        const Bytes node = sound_.Node(nodeNum);
        const u32 count = Get16(node, 10);
        if (at < 14 || at >= node.size() - 2 * (count + 1)) {
            return true;
        }
        for (u32 n = 0; n < count; ++n) {
            const u32 start = Get16(node, node.size() - 2 * (n + 1));
            const u32 end = Get16(node, node.size() - 2 * (n + 2));
            if ((at >= start && at < start + 14) || (at + 4 >= end && at < end)) {
                return true;
            }
        }
        return false;
    }
    // One word of a node in use replaced, at each place that a search reads in turn.
    void ExpectSameForEveryWord(bool ownPath) {
        const u32 nodeSize = sound_.shape.nodeSize;
        const u32 mapBlock = GetParam().geometry.mapBlock;
        const u32 used = sound_.totalNodes - sound_.freeNodes;
        const u32 first = GetParam().layout == Layout::kWideIndex ? sound_.rootNode : 1;
        for (u32 at = first * nodeSize; at < used * nodeSize; at += 2) {
            if (!IsSearched(at / nodeSize, at % nodeSize)) {
                continue;
            }
            for (const u32 value :
                 {0u, 3u, 14u, 0x00FFu, 0xFFFFu, nodeSize - 8, nodeSize, mapBlock - 1, mapBlock}) {
                TreeImage image = sound_;
                Put16(&image.bytes, at, value);
                SCOPED_TRACE(::testing::Message() << "byte " << at << " value " << value);
                ExpectSame(image, ownPath);
                if (HasFatalFailure()) {
                    return;
                }
            }
        }
    }

    Bench bench_;
    TreeImage sound_;
};

TEST_P(FindLiteral, ASoundTree) {
    ExpectSame(sound_, false);
    ExpectSame(sound_, true);
}

TEST_P(FindLiteral, AnyWordReplaced) {
    ExpectSameForEveryWord(false);
}

// On the tree's own path a lookup must not depend on the one before it.
TEST_P(FindLiteral, AnyWordReplacedOnTheTreesOwnPath) {
    ExpectSameForEveryWord(true);
}

INSTANTIATE_TEST_SUITE_P(Trees, FindLiteral,
                         ::testing::Values(Damaged{{512, 512}, 4}, Damaged{{1024, 512}, 4},
                                           Damaged{{512, 512}, 3}, Damaged{{512, 512}, 8},
                                           Damaged{{1024, 512}, 3}, Damaged{{1024, 512}, 8},
                                           Damaged{{512, 512}, 4, Layout::kSmall, kVersionHfsx},
                                           Damaged{{1024, 512}, 4, Layout::kWideLeaf},
                                           Damaged{{1024, 512}, 4, Layout::kWideLeaf, kVersionHfsx},
                                           Damaged{{1024, 512}, 4, Layout::kWideIndex},
                                           Damaged{{1024, 512}, 8, Layout::kWideIndex}));

}  // namespace
}  // namespace VELK::test
