// Changes done in one go, in a node of one block or of two in one piece, against the long way that
// nodes of two blocks go: with whatever damage to the bytes they go by, all give the same answer,
// say the same and leave the same bytes.
#include <algorithm>
#include <bit>
#include <memory>

#include "bench.h"
#include "damages.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/record_move.h"
#include "hfs/treehfs/separator.h"
#include "node_bench.h"

namespace VELK::test {
namespace {

constexpr u32 kNodeSize = 1024;
constexpr Geometry kOneBlock = {kNodeSize, kNodeSize};
constexpr Geometry kTwoBlocks = {kNodeSize, kNodeSize / 2};
constexpr Geometry kOnePiece = {kNodeSize, kNodeSize / 2, true};

struct Outcome {
    int status = kOk;
    bool inserted = false;
    Events events;
    Bytes bytes;

    bool operator==(const Outcome&) const = default;
};
std::ostream& operator<<(std::ostream& out, const Outcome& outcome) {
    out << std::hex << outcome.status << std::dec << (outcome.inserted ? " inserted" : "");
    for (const Event& event : outcome.events) {
        out << " " << event;
    }
    return out << " " << ::testing::PrintToString(outcome.bytes);
}

enum class Form { kDisk, kHost, kHookOfKeys, kNoHooks };

Outcome Insert(const Geometry& geometry, const Bytes& content, int index, Form form) {
    NodeBench bench(geometry);
    const auto node = bench.Node(content);
    EXPECT_EQ(bench.tree.SetDirty(node->Get(), 0, kNodeSize), kOk);
    const HostKey host = HostCatKey(7, u"middle");
    const Bytes disk = DiskCatKey(7, u"middle");
    HfsConvert hooks = form == Form::kNoHooks ? HfsConvert{} : bench.tree.convert;
    if (form == Form::kHookOfKeys) {
        hooks.DataToDisk = nullptr;
    }
    const Bytes data = Pattern(21, 3);
    Outcome outcome;
    outcome.status = bench.tree._InsertKeyRecord(
        node->Get(), index,
        form == Form::kDisk ? reinterpret_cast<const BTreeKey*>(disk.data()) : host.Get(), 0,
        data.data(), 21, form == Form::kDisk ? nullptr : &hooks, &outcome.inserted);
    outcome.events = bench.capture.Take();
    outcome.bytes = node->Content();
    return outcome;
}

TEST(PlainInsertion, ComesToWhatTheLongWayDoes) {
    const Bytes content = LeafOf(kNodeSize, SomeRecords(3, 30));
    std::vector<Damage> damages = DamagesOf(content);
    damages.push_back({0, 0, 1});  // none
    for (const Damage& damage : damages) {
        Bytes damaged = content;
        Apply(damage, &damaged);
        for (const int index : {-1, 0, 1, 2, 3, 4}) {
            for (const Form form : {Form::kDisk, Form::kHost, Form::kHookOfKeys, Form::kNoHooks}) {
                const Outcome expected = Insert(kTwoBlocks, damaged, index, form);
                for (const Geometry& geometry : {kOneBlock, kOnePiece}) {
                    ASSERT_EQ(Insert(geometry, damaged, index, form), expected)
                        << damage << ", record " << index << ", form " << static_cast<int>(form)
                        << ", " << geometry;
                }
            }
        }
    }
}

// Takes the first record of a leaf out after somebody damaged that, or the root, behind the lookup.
constexpr u32 kKeys = 90;  // to a KiB of a node: several leaves below a root

class FirstRecordGoes {
public:
    explicit FirstRecordGoes(const Geometry& geometry)
        : nodeSize_(geometry.nodeSize), keys_(kKeys * nodeSize_ / 1024), bench_(Blocks(geometry)) {
        bench_.Create(static_cast<u32>(std::countr_zero(nodeSize_)), CompareCatKeysCaseIns);
        for (u32 n = 0; n < keys_; ++n) {
            const HostKey key = Key(n);
            EXPECT_EQ(bench_->InsertRecord(key, key.id, Pattern(30, n).data(), 30), kOk);
        }
        EXPECT_EQ(bench_->header.treeDepth, 2);
        bench_.Forget();
    }
    ~FirstRecordGoes() {
        bench_->findData.ClearPath();
        bench_->Dtor();
        bench_.capture.Take();
    }

    Bytes Root() { return Content(bench_->header.rootNode); }
    Bytes Leaf(u32 leaf) {
        StandOn(leaf);
        return Content(bench_->findData.path[1].node->nodeNum);
    }
    u32 Leaves() { return Get16(Root(), kDescNumRecords); }

    Outcome Play(u32 leaf, int level, const Damage& damage) {
        StandOn(leaf);
        HfsNode* root = bench_->findData.path[2].node;
        HfsNode* damaged = bench_->findData.path[level].node;
        EXPECT_EQ(bench_->SetDirty(root, 0, nodeSize_), kOk);
        EXPECT_EQ(bench_->SetDirty(damaged, 0, nodeSize_), kOk);
        for (u32 i = 0; i < damage.width; ++i) {
            const u32 at = damage.at + i;
            const u32 block = bench_->header.blockSize;
            damaged->bufs[at / block].data[at % block] =
                static_cast<u8>(damage.value >> 8 * (damage.width - 1 - i));
        }
        bench_.Forget();
        Outcome outcome;
        outcome.status = bench_->DeleteTree(1, nullptr);
        outcome.events = bench_.capture.Take();
        outcome.bytes = Content(root->nodeNum);
        return outcome;
    }

    // Whether the root takes the first key of a leaf at once, when they lie in one piece or do not.
    bool ReplacesFromLeaf(bool isRootOnePiece, bool isLeafOnePiece) {
        StandOn(1);
        HfsNode* leaf = bench_->findData.path[1].node;
        EXPECT_EQ(bench_->SetDirty(bench_->findData.path[2].node, 0, nodeSize_), kOk);
        bench_->findData.path[2].node->isOnePiece = isRootOnePiece;
        leaf->isOnePiece = isLeafOnePiece;
        return ReplacePlainSeparator(&*bench_.tree, &bench_->findData, 2, leaf);
    }

    // The same while one of the root's blocks is not marked.
    bool ReplacesWithout(u32 block) {
        StandOn(1);
        HfsNode* root = bench_->findData.path[2].node;
        EXPECT_EQ(bench_->SetDirty(root, 0, nodeSize_), kOk);
        root->bufs[block].dirty = false;
        return ReplacePlainSeparator(&*bench_.tree, &bench_->findData, 2,
                                     bench_->findData.path[1].node);
    }

    // Whether the root takes the first key of a leaf at once that a damaged volume lent in the same
    // memory.
    bool ReplacesInOneMemory() {
        StandOn(1);
        HfsNode* leaf = bench_->findData.path[1].node;
        HfsNode* root = bench_->findData.path[2].node;
        EXPECT_EQ(bench_->SetDirty(root, 0, nodeSize_), kOk);
        u8* const own = leaf->bufs[0].data;
        leaf->bufs[0].data = root->bufs[0].data;
        const bool replaces = ReplacePlainSeparator(&*bench_.tree, &bench_->findData, 2, leaf);
        leaf->bufs[0].data = own;
        return replaces;
    }

private:
    static HostKey Key(u32 n) {
        return HostCatKey(5, std::u16string(1 + n % 7, static_cast<char16_t>(0x4E00 + n)));
    }
    // Puts the tree's own path on the first record of the nth leaf.
    void StandOn(u32 leaf) {
        for (u32 n = 0; n < keys_; ++n) {
            const HostKey key = Key(n);
            bool found = false;
            EXPECT_EQ(
                bench_->FindEntry(key, key.id, nullptr, &found, nullptr, nullptr, nullptr, nullptr),
                kOk);
            const HfsFindLevel* path = bench_->findData.path;
            if (static_cast<u32>(path[2].index) == leaf && path[1].index == 0) {
                return;
            }
        }
        ADD_FAILURE() << "no leaf " << leaf;
    }
    Bytes Content(u32 number) {
        const HfsNode* node = CachedNode(*bench_.tree, number);
        Bytes bytes;
        for (u32 at = 0; at < nodeSize_; ++at) {
            const u32 block = bench_->header.blockSize;
            bytes.push_back(node->bufs[at / block].data[at % block]);
        }
        return bytes;
    }

    u32 nodeSize_;
    u32 keys_;
    Bench bench_;
};

void ExpectAlike(u32 leaf, int level, const Damage& damage) {
    const Outcome expected = FirstRecordGoes(kTwoBlocks).Play(leaf, level, damage);
    for (const Geometry& geometry : {kOneBlock, kOnePiece}) {
        ASSERT_EQ(FirstRecordGoes(geometry).Play(leaf, level, damage), expected)
            << damage << ", leaf " << leaf << ", level " << level << ", " << geometry;
    }
}

TEST(PlainSeparator, ComesToWhatTheLongWayDoes) {
    const u32 leaves = FirstRecordGoes(kOneBlock).Leaves();
    ASSERT_GE(leaves, 4u);
    for (u32 leaf = 0; leaf < leaves; ++leaf) {
        ExpectAlike(leaf, 2, {0, 0, 1});  // none
        for (const Damage& damage : DamagesOf(FirstRecordGoes(kOneBlock).Root())) {
            ExpectAlike(leaf, 2, damage);
        }
        for (const Damage& damage : DamagesOf(FirstRecordGoes(kOneBlock).Leaf(leaf))) {
            ExpectAlike(leaf, 1, damage);
        }
        ASSERT_FALSE(HasFatalFailure());
    }
}

// Blocks that were not marked are asked for, whatever was marked of the others.
TEST(PlainChange, IsNotForNodesOfWhichPartIsMarked) {
    constexpr Geometry kFourBlocks = {2048, 512, true};
    const Bytes content = LeafOf(2048, SomeRecords(3, 30));
    const Bytes key = DiskCatKey(7, u"middle");
    const auto play = [&](u32 unmarked, int what) {
        NodeBench bench(kFourBlocks);
        const auto node = bench.Node(content, 11);
        const auto other = bench.Node(content, 12);
        for (HfsNode* each : {node->Get(), other->Get()}) {
            EXPECT_EQ(bench.tree.SetDirty(each, 0, 2048), kOk);
        }
        node->Get()->bufs[unmarked].dirty = false;
        bench.RefuseAccess(1);
        int status = kOk;
        if (what == 0) {
            status = bench.tree._InsertKeyRecord(node->Get(), 0,
                                                 reinterpret_cast<const BTreeKey*>(key.data()), 0,
                                                 "data", 4, nullptr);
        } else if (what == 1) {
            status = bench.tree._DeleteRecord(node->Get(), 0);
        } else if (what == 2) {
            status = MoveRecordsLeft(&bench.tree, node->Get(), other->Get(), 2);
        } else {
            status = MoveRecordsRight(&bench.tree, other->Get(), node->Get(), 2);
        }
        bench.capture.Take();
        return status;
    };
    for (int what = 0; what < 4; ++what) {
        EXPECT_EQ(play(0, what), kRefused) << what;  // records and their count
        EXPECT_EQ(play(3, what), kRefused) << what;  // the table
    }
}

TEST(PlainSeparator, IsNotExchangedInANodeOfWhichPartIsMarked) {
    for (u32 unmarked = 0; unmarked < 4; ++unmarked) {
        FirstRecordGoes tree({2048, 512, true});
        EXPECT_FALSE(tree.ReplacesWithout(unmarked)) << unmarked;
    }
}

// The record behind the separator reaches into a third block, of which each look at it tells.
TEST(PlainSeparator, IsNotExchangedInFrontOfDataInThreeBlocks) {
    constexpr Geometry kApart = {2048, 512};
    constexpr Geometry kTogether = {2048, 512, true};
    const Bytes root = FirstRecordGoes(kApart).Root();
    const u32 count = Get16(root, kDescNumRecords);
    const u32 freeSlot = 2048 - 2 * (count + 1);
    const Damage damage = {freeSlot, Get16(root, freeSlot) + 1024u, 2};
    const Outcome expected = FirstRecordGoes(kApart).Play(count - 2, 2, damage);
    EXPECT_NE(std::find(expected.events.begin(), expected.events.end(), Asserted(505)),
              expected.events.end());
    EXPECT_EQ(FirstRecordGoes(kTogether).Play(count - 2, 2, damage), expected);
}

// A volume may lend one node in one piece and the next one not.
TEST(PlainSeparator, IsExchangedBetweenNodesInOnePieceOnly) {
    FirstRecordGoes tree(kOnePiece);
    const Bytes before = tree.Root();
    EXPECT_FALSE(tree.ReplacesFromLeaf(true, false));
    EXPECT_FALSE(tree.ReplacesFromLeaf(false, true));
    EXPECT_EQ(tree.Root(), before);
    EXPECT_TRUE(tree.ReplacesFromLeaf(true, true));
}

TEST(PlainSeparator, IsNotExchangedInTheMemoryItComesFrom) {
    FirstRecordGoes tree(kOneBlock);
    const Bytes before = tree.Root();
    EXPECT_FALSE(tree.ReplacesInOneMemory());
    EXPECT_EQ(tree.Root(), before);
}

}  // namespace
}  // namespace VELK::test
