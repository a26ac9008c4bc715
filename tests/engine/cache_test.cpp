// The node cache: requests by number, counted references, new and emptied nodes, the full release.
#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <random>

#include "bench.h"

namespace VELK::test {
namespace {

class CacheTest : public GeometryTest {
protected:
    CacheTest() : bench_(Blocks(GetParam(), true)) { bench_.Open(SmallTree(NodeSize())); }

    HfsNode* Get(u32 nodeNum, bool makeEmpty = false) {
        HfsNode* node = nullptr;
        EXPECT_EQ(bench_->GetINode(nodeNum, &node, makeEmpty), kOk) << nodeNum;
        return node;
    }
    // Lets nodes from `first` on count as never initialised, with rubbish on disk.
    void MakeNew(u32 first) {
        bench_->validNodes = first;
        Bytes& disk = bench_.volume.Disk(4);
        std::fill(disk.begin() + static_cast<std::ptrdiff_t>(first) * NodeSize(), disk.end(), 0xEE);
    }
    Bytes Content(const HfsNode* node) const {
        Bytes bytes;
        for (u32 b = 0; b < GetParam().Blocks(); ++b) {
            bytes.insert(bytes.end(), node->bufs[b].data, node->bufs[b].data + MapBlock());
        }
        return bytes;
    }
    Bytes EmptyNode() const {
        Bytes bytes(NodeSize());
        bytes.back() = 0x0E;
        return bytes;
    }
    u32 DirtyBlocks(const HfsNode* node) const {
        u32 count = 0;
        for (u32 b = 0; b < GetParam().Blocks(); ++b) {
            count += node->bufs[b].dirty ? 1 : 0;
        }
        return count;
    }

    Bench bench_;
};

// ---- a node that is there

TEST_P(CacheTest, AMissMapsTheNodeAndCountsIt) {
    const HfsNode* node = Get(2);
    EXPECT_EQ(node->nodeNum, 2u);
    EXPECT_EQ(node->refCount, 1);
    EXPECT_EQ(Content(node), bench_.image.Node(2));
    EXPECT_EQ(DirtyBlocks(node), 0u);
    EXPECT_EQ(bench_->nodeCount, 1u);
    EXPECT_EQ(bench_->readCount, 2u);
    EXPECT_EQ(bench_->hitCount, 0u);
    EXPECT_EQ(bench_.volume.TakeCalls(),
              (std::vector<CallRecord>{{Call::kMap, 2 * NodeSize(), NodeSize(), false}}));
    EXPECT_EQ(bench_.heap.Allocations(), 3u);
}

TEST_P(CacheTest, AHitIsTheSameNodeWithOneMoreReference) {
    const HfsNode* node = Get(2);
    EXPECT_EQ(Get(2), node);
    EXPECT_EQ(node->refCount, 2);
    EXPECT_EQ(bench_->hitCount, 1u);
    EXPECT_EQ(bench_->readCount, 2u);
    EXPECT_EQ(bench_->nodeCount, 1u);
    EXPECT_EQ(bench_.volume.Count(Call::kMap), 2u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 2));
}

TEST_P(CacheTest, TheFourthReferenceIsAssertedAndGiven) {
    HfsNode* node = Get(2);
    Get(2);
    Get(2);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    Get(2);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2610)});
    EXPECT_EQ(node->refCount, 4);
}

TEST_P(CacheTest, AHitRevivesANodeWithoutReferences) {
    HfsNode* node = Get(2);
    for (const s32 count : {0, -1}) {
        node->refCount = count;
        EXPECT_EQ(Get(2), node);
        EXPECT_EQ(node->refCount, 1);
    }
}

TEST_P(CacheTest, ANodeWithoutTheEmptyTailIsAssertedUnlessItIsTheFirst) {
    bench_.volume.Disk(4)[2 * NodeSize() - 1] = 0x0F;
    HfsNode* node = Get(1);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    bench_->PutINode(node, false);
    Get(2);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(Content(Get(1)).back(), 0x0F);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2671)});
}

TEST_P(CacheTest, MapFailureIsReportedAndLeavesNothing) {
    bench_.faults.Fail(Call::kMap, 1);
    HfsNode* node = reinterpret_cast<HfsNode*>(&bench_);
    EXPECT_EQ(bench_->GetINode(2, &node, false), kFaultStatus);
    EXPECT_EQ(node, nullptr);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kFaultStatus, kAnySite)});
    EXPECT_EQ(bench_->readCount, 1u);
    EXPECT_EQ(bench_.heap.Live(), 1u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
    EXPECT_NE(Get(2), nullptr);
}

TEST_P(CacheTest, NoMemoryIsNotReported) {
    bench_.heap.FailNth(1);
    HfsNode* node = nullptr;
    EXPECT_EQ(bench_->GetINode(2, &node, false), kErrNoMemory);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(bench_.volume.Count(Call::kMap), 1u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
}

TEST_P(CacheTest, HundredsOfRequestsInAnyOrderKeepTheBooks) {
    std::mt19937 random(NodeSize());
    std::vector<HfsNode*> held;
    for (int step = 0; step < 400; ++step) {
        const bool take = held.size() < 8 && (held.empty() || random() % 3 != 0);
        if (take) {
            held.push_back(Get(static_cast<u32>(random() % 13)));
        } else {
            const std::size_t which = random() % held.size();
            bench_->PutINode(held[which], random() % 2 == 0);
            held.erase(held.begin() + static_cast<std::ptrdiff_t>(which));
        }
        ASSERT_TRUE(LedgerHolds(*bench_.tree, static_cast<u32>(held.size()))) << step;
        bench_.capture.Take();
    }
    EXPECT_GE(bench_->maxNodeCount, bench_->nodeCount);
}

// ---- nodes that are found without the red-black tree

TEST_P(CacheTest, TheLastNodeIsKnownAsNodesComeAndGo) {
    const auto last = [this] {
        const rb_node* link = bench_->lastLink;
        return link != nullptr ? reinterpret_cast<const HfsNode*>(link)->nodeNum : 0;
    };
    EXPECT_EQ(bench_->lastLink, nullptr);
    HfsNode* fifth = Get(5);
    EXPECT_EQ(last(), 5u);
    HfsNode* second = Get(2);
    EXPECT_EQ(last(), 5u);
    HfsNode* ninth = Get(9);
    EXPECT_EQ(last(), 9u);
    bench_->PutINode(second, false);
    EXPECT_EQ(last(), 9u);
    bench_->PutINode(ninth, false);
    EXPECT_EQ(last(), 5u);
    bench_->PutINode(fifth, false);
    EXPECT_EQ(bench_->lastLink, nullptr);
    Get(3);
    EXPECT_EQ(last(), 3u);
}

TEST_P(CacheTest, ANodeMetAgainIsRememberedUntilItLeaves) {
    const auto isRemembered = [this](const HfsNode* node) {
        return std::count(std::begin(bench_->lateNodes), std::end(bench_->lateNodes), node) == 1;
    };
    HfsNode* node = Get(2);
    EXPECT_FALSE(isRemembered(node));  // most nodes are requested by number once
    EXPECT_EQ(Get(2), node);
    EXPECT_TRUE(isRemembered(node));
    const u32 hits = bench_->hitCount;
    EXPECT_EQ(Get(2), node);
    EXPECT_EQ(bench_->hitCount, hits + 1);
    EXPECT_EQ(node->refCount, 3);
    for (int reference = 0; reference < 3; ++reference) {
        EXPECT_TRUE(isRemembered(node));
        bench_->PutINode(node, false);
    }
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
    const u32 reads = bench_->readCount;
    Get(2);
    EXPECT_EQ(bench_->readCount, reads + 1);
}

// ---- numbers the file does not have

TEST_P(CacheTest, ANumberPastTheFileIsAssertedAndRefused) {
    for (const u32 number : {13u, 14u, 1u << 20, 0x7FFFFFFFu, 0xFFFFFFFFu}) {
        HfsNode* node = nullptr;
        EXPECT_EQ(bench_->GetINode(number, &node, false), kErrCorrupt);
        EXPECT_EQ(node, nullptr);
        EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2638)});
    }
    EXPECT_EQ(bench_.volume.TakeCalls(), std::vector<CallRecord>{});
    EXPECT_EQ(bench_->validNodes, 13u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
}

TEST_P(CacheTest, NodeZeroIsAlwaysThere) {
    bench_->header.totalNodes = 0;
    EXPECT_EQ(Get(0)->nodeNum, 0u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(CacheTest, FileOffsetsAreComputedIn64Bits) {
    bench_->header.totalNodes = bench_->validNodes = 0xFFFFFFFF;
    HfsNode* node = nullptr;
    EXPECT_EQ(bench_->GetINode(0xFFFFFFF0u, &node, false), kMemNoRange);
    EXPECT_EQ(
        bench_.volume.TakeCalls(),
        (std::vector<CallRecord>{{Call::kMap, 0xFFFFFFF0ull * NodeSize(), NodeSize(), false}}));
}

// ---- a new node

TEST_P(CacheTest, ANewNodeIsEmptyDirtyAndListed) {
    MakeNew(5);
    const HfsNode* node = Get(5, true);
    EXPECT_EQ(Content(node), EmptyNode());
    EXPECT_EQ(DirtyBlocks(node), GetParam().Blocks());
    EXPECT_EQ(node->refCount, 1);
    EXPECT_EQ(ModifiedNodes(*bench_.tree), std::vector<u32>{5});
    EXPECT_EQ(bench_->readCount, 2u);
    EXPECT_EQ(bench_->nodeCount, 1u);
    EXPECT_EQ(bench_->hitCount, 0u);
    EXPECT_EQ(bench_->validNodes, 5u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(CacheTest, EachBlockOfANewNodeIsOpenedJournalledAndClosedInTurn) {
    MakeNew(5);
    Get(5, true);
    std::vector<CallRecord> expected = {{Call::kMap, 5 * NodeSize(), NodeSize(), true}};
    for (u32 b = 0; b < GetParam().Blocks(); ++b) {
        const u64 offset = 5 * NodeSize() + b * MapBlock();
        expected.push_back({Call::kBeginModify, offset, 0, false});
        expected.push_back({Call::kCreateAccess, offset, 0, false});
        expected.push_back({Call::kEndModify, offset, 0, false});
    }
    EXPECT_EQ(bench_.volume.TakeCalls(), expected);
}

TEST_P(CacheTest, ANewNodeWithoutAJournalNeedsNoAccess) {
    Bench bench(Blocks(GetParam()));
    bench.Open(SmallTree(NodeSize()));
    bench->validNodes = 5;
    HfsNode* node = nullptr;
    EXPECT_EQ(bench->GetINode(5, &node, true), kOk);
    EXPECT_EQ(bench.volume.Count(Call::kBeginModify), GetParam().Blocks());
    EXPECT_EQ(bench.volume.Count(Call::kEndModify), GetParam().Blocks());
    EXPECT_EQ(Content(node), EmptyNode());
}

TEST_P(CacheTest, ANewNodeNotAskedForEmptyIsAssertedAndEmptyAllTheSame) {
    MakeNew(5);
    const HfsNode* node = Get(7);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2638)});
    EXPECT_EQ(Content(node), EmptyNode());
    EXPECT_EQ(DirtyBlocks(node), GetParam().Blocks());
    EXPECT_EQ(ModifiedNodes(*bench_.tree), std::vector<u32>{7});
}

TEST_P(CacheTest, NewNodesGoToTheEndOfTheModifiedList) {
    MakeNew(5);
    Get(9, true);
    Get(6, true);
    Get(7, true);
    EXPECT_EQ(ModifiedNodes(*bench_.tree), (std::vector<u32>{9, 6, 7}));
}

TEST_P(CacheTest, ANewNodeAskedForAgainKeepsItsDirt) {
    MakeNew(5);
    HfsNode* node = Get(5, true);
    bench_.Forget();
    EXPECT_EQ(Get(5, false), node);
    EXPECT_EQ(node->refCount, 2);
    EXPECT_EQ(DirtyBlocks(node), GetParam().Blocks());
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(CacheTest, CreateAccessRefusedAtAnyBlockLeavesNothing) {
    MakeNew(5);
    for (u32 block = 1; block <= GetParam().Blocks(); ++block) {
        bench_.faults.Fail(Call::kCreateAccess, block);
        HfsNode* node = reinterpret_cast<HfsNode*>(&bench_);
        ASSERT_EQ(bench_->GetINode(5, &node, true), kFaultStatus);
        ASSERT_EQ(node, nullptr);
        ASSERT_EQ(bench_.capture.Take(), Events{Reported(kFaultStatus, kAnySite)});
        ASSERT_TRUE(LedgerHolds(*bench_.tree, 0));
        ASSERT_EQ(bench_.volume.Lent(), 0u);
        ASSERT_EQ(bench_.heap.Live(), 1u);
    }
    EXPECT_EQ(Content(Get(5, true)), EmptyNode());
}

// ---- emptying a node that is there

TEST_P(CacheTest, EmptyingZeroesAllButTheTail) {
    const HfsNode* node = Get(1, true);
    EXPECT_EQ(Content(node), EmptyNode());
    EXPECT_EQ(ModifiedNodes(*bench_.tree), std::vector<u32>{1});
    EXPECT_EQ(bench_->hitCount, 0u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(CacheTest, EmptyingDirtiesOnlyBlocksThatHeldSomething) {
    const HfsNode* node = Get(1, true);
    // Two records at the start and their slots at the end.
    EXPECT_EQ(DirtyBlocks(node), std::min(GetParam().Blocks(), 2u));
    EXPECT_TRUE(node->bufs[0].dirty);
    EXPECT_TRUE(node->bufs[GetParam().Blocks() - 1].dirty);
    EXPECT_EQ(bench_.volume.Count(Call::kWriteAccess), std::min(GetParam().Blocks(), 2u));
}

TEST_P(CacheTest, EmptyingACachedNodeCountsAHit) {
    const HfsNode* node = Get(1);
    EXPECT_EQ(Get(1, true), node);
    EXPECT_EQ(node->refCount, 2);
    EXPECT_EQ(bench_->hitCount, 1u);
    EXPECT_EQ(Content(node), EmptyNode());
    EXPECT_EQ(ModifiedNodes(*bench_.tree), std::vector<u32>{1});
}

TEST_P(CacheTest, EmptyingAZeroNodeWritesTheTailOnly) {
    const HfsNode* node = Get(7, true);  // a free node: all zero on disk
    EXPECT_EQ(Content(node), EmptyNode());
    EXPECT_EQ(DirtyBlocks(node), 1u);
    EXPECT_TRUE(node->bufs[GetParam().Blocks() - 1].dirty);
    EXPECT_EQ(bench_.volume.Count(Call::kWriteAccess), 1u);
}

TEST_P(CacheTest, EmptyingANodeAlreadyEmptyZeroesAndRewritesItsTail) {
    bench_.volume.Disk(4)[8 * NodeSize() - 1] = 0x0E;
    const HfsNode* node = Get(7, true);
    EXPECT_EQ(Content(node), EmptyNode());
    EXPECT_EQ(DirtyBlocks(node), 1u);
}

TEST_P(CacheTest, EmptyingFindsTheLastByteOfABlock) {
    bench_.volume.Disk(4)[7 * NodeSize() + MapBlock() - 1] = 0x80;
    const HfsNode* node = Get(7, true);
    EXPECT_EQ(Content(node), EmptyNode());
    EXPECT_TRUE(node->bufs[0].dirty);
}

TEST_P(CacheTest, EmptyingADirtyNodeAsksTheJournalNoMore) {
    HfsNode* node = Get(1, true);
    node->bufs[0].data[20] = 9;
    const u32 asked = bench_.volume.Count(Call::kWriteAccess);
    Get(1, true);
    EXPECT_EQ(Content(node), EmptyNode());
    EXPECT_EQ(bench_.volume.Count(Call::kWriteAccess), asked);
}

TEST_P(CacheTest, EmptyingANodeAllDirtyLeavesItsPlaceInTheList) {
    HfsNode* node = Get(1, true);
    bench_->SetDirty(node, 0, NodeSize());
    Get(2, true);
    node->bufs[0].data[20] = 9;
    Get(1, true);
    EXPECT_EQ(ModifiedNodes(*bench_.tree), (std::vector<u32>{1, 2}));
}

TEST_P(CacheTest, EmptyingANodeThatWasNeverWrittenIsTraced) {
    MakeNew(5);
    HfsNode* node = Get(5, true);
    node->bufs[0].data[20] = 9;
    bench_.capture.Take();
    bench_.capture.TraceAll();
    Get(5, true);
    Events expected = {Traced("node 5 must be zeroed. Valid=5\n")};
    if (GetParam().Blocks() > 1) {  // the last block holds the tail
        expected.push_back(expected[0]);
    }
    EXPECT_EQ(bench_.capture.Take(), expected);
}

TEST_P(CacheTest, EmptyingANodeThatWasWrittenIsNotTraced) {
    bench_.capture.TraceAll();
    Get(1, true);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(CacheTest, EmptyingANodeThatWasNeverWrittenSaysNothingWithoutTraces) {
    MakeNew(5);
    HfsNode* node = Get(5, true);
    node->bufs[0].data[20] = 9;
    bench_.capture.Take();
    Get(5, true);
    EXPECT_EQ(node->bufs[0].data[20], 0);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Only a request to read such a node is asserted; whether it can be had is the volume's business.
TEST_P(CacheTest, AnEmptyNodePastTheTreeIsAskedOfTheVolume) {
    HfsNode* node = nullptr;
    EXPECT_EQ(bench_->GetINode(bench_->header.totalNodes, &node, true), kMemNoRange);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kMemNoRange, 2620)});
}

TEST_P(CacheTest, AJournalThatRefusesEmptyingIsAssertedAndIgnored) {
    bench_.faults.Fail(Call::kWriteAccess, 1, kFaultStatus, true);
    const HfsNode* node = Get(1, true);
    EXPECT_EQ(Content(node), EmptyNode());
    EXPECT_EQ(bench_.capture.Take(), Events(std::min(GetParam().Blocks(), 2u), Asserted(2745)));
    EXPECT_EQ(ModifiedNodes(*bench_.tree), std::vector<u32>{1});
}

TEST_P(CacheTest, AJournalThatRefusesTheTailIsAssertedAndIgnored) {
    bench_.faults.Fail(Call::kWriteAccess, 1);
    const HfsNode* node = Get(7, true);
    EXPECT_EQ(Content(node), EmptyNode());
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2769)});
}

// ---- the full release

TEST_P(CacheTest, TheLastReleaseFreesTheNode) {
    HfsNode* node = Get(1);
    Get(1);
    bench_->PutINode(node, true);
    EXPECT_EQ(node->refCount, 1);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
    bench_.volume.TakeCalls();
    bench_->PutINode(node, false);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 0));
    EXPECT_EQ(bench_->nodeCount, 0u);
    EXPECT_EQ(bench_->maxNodeCount, 1u);
    EXPECT_EQ(bench_.volume.Count(Call::kRelease), 1u + GetParam().Blocks());
    EXPECT_EQ(bench_.heap.Live(), 1u);
}

TEST_P(CacheTest, AReleaseThatLeavesMoreThanTwoIsAsserted) {
    HfsNode* node = Get(1);
    node->refCount = 4;
    bench_->PutINode(node, false);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2818)});
    EXPECT_EQ(node->refCount, 3);
    bench_->PutINode(node, false);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(CacheTest, TheFullReleaseDropsUnsavedChanges) {
    HfsNode* node = Get(1, true);
    bench_->PutINode(node, false);
    EXPECT_EQ(ModifiedNodes(*bench_.tree), std::vector<u32>{});
    EXPECT_EQ(bench_.volume.Count(Call::kDirtyMeta), 0u);
    EXPECT_EQ(Content(Get(1)), bench_.image.Node(1));
}

TEST_P(CacheTest, AMissingHandleIsAssertedAndReleasedAllTheSame) {
    HfsNode* node = Get(1);
    buffer_head* const handle = node->bufs[0].bh;
    node->bufs[0].bh = nullptr;
    const u32 released = bench_.volume.Count(Call::kRelease);
    bench_->PutINode(node, false);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2835)});
    EXPECT_EQ(bench_.volume.Count(Call::kRelease), released + GetParam().Blocks());
    bench_.volume.fs.cache.Release(handle, 0);
}

// A volume that breaks its contract: its Map calls the tree once.
class ReentrantVolume {
public:
    using Inside = std::function<void(CBTreeHfs* tree)>;
    ReentrantVolume(Bench* bench, Inside inside)
        : bench_(bench), next_(bench->volume.fs.service), inside_(std::move(inside)) {
        bench->volume.fs.service = {};
        bench->volume.fs.service.ops = &kOps;
        bench->volume.fs.service.self = this;
    }
    ~ReentrantVolume() { bench_->volume.fs.service = next_; }

private:
    static int Map(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                   u32 fileId, u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs) {
        auto* volume = static_cast<ReentrantVolume*>(self);
        fs->service = volume->next_;
        volume->inside_(&*volume->bench_->tree);
        return fs->Map(runs, fork, forkType, fileId, byteOffset, bytes, noRead, bufs);
    }
    static constexpr HfsVolumeOps kOps = {Map, nullptr, nullptr, nullptr};

    Bench* bench_;
    HfsService<HfsVolumeOps> next_;
    Inside inside_;
};

TEST_P(CacheTest, ANumberThatIsThereAlreadyIsAssertedAndNotLinked) {
    HfsNode* inner = nullptr;
    ReentrantVolume volume(&bench_, [&](CBTreeHfs* tree) { tree->GetINode(2, &inner, false); });
    HfsNode* outer = Get(2);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2706)});
    EXPECT_NE(outer, inner);
    EXPECT_EQ(CachedNode(*bench_.tree, 2), inner);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
    bench_->PutINode(outer, false);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
    EXPECT_EQ(bench_.volume.Lent(), GetParam().Blocks());
}

// The place that was found for node 2 is the one that node 1 takes: behind node 3, in front of it.
TEST_P(CacheTest, NodesThatCameInMeanwhileAreLinkedBesideTheNewOne) {
    HfsNode* third = Get(3);
    HfsNode* inner = nullptr;
    ReentrantVolume volume(&bench_, [&](CBTreeHfs* tree) { tree->GetINode(1, &inner, false); });
    HfsNode* outer = Get(2);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(CachedNode(*bench_.tree, 1), inner);
    EXPECT_EQ(CachedNode(*bench_.tree, 2), outer);
    EXPECT_EQ(CachedNode(*bench_.tree, 3), third);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 3));
}

// As many nodes are cached as before, and the one that the place hangs from is gone.
TEST_P(CacheTest, ANodeThatLeftMeanwhileIsNotLinkedTo) {
    HfsNode* third = Get(3);
    HfsNode* inner = nullptr;
    ReentrantVolume volume(&bench_, [&](CBTreeHfs* tree) {
        tree->PutINode(third, false);
        tree->GetINode(1, &inner, false);
    });
    HfsNode* outer = Get(2);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(CachedNode(*bench_.tree, 1), inner);
    EXPECT_EQ(CachedNode(*bench_.tree, 2), outer);
    EXPECT_EQ(CachedNode(*bench_.tree, 3), nullptr);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 2));
}

// The place behind the last node is no longer that, or no longer behind the last one.
TEST_P(CacheTest, TheLastNodeMayChangeMeanwhile) {
    using Numbers = std::vector<u32>;
    struct Change {
        bool drops;
        u32 gets;  // 0: none
        Numbers left;
    };
    for (const Change& change : {Change{true, 0, {5}}, Change{true, 1, {1, 5}},
                                 Change{false, 7, {3, 5, 7}}, Change{false, 4, {3, 4, 5}}}) {
        HfsNode* third = Get(3);
        HfsNode* inner = nullptr;
        HfsNode* outer = nullptr;
        {
            ReentrantVolume volume(&bench_, [&](CBTreeHfs* tree) {
                if (change.drops) {
                    tree->PutINode(third, false);
                }
                if (change.gets != 0) {
                    tree->GetINode(change.gets, &inner, false);
                }
            });
            outer = Get(5);
        }
        Numbers numbers;
        for (const HfsNode* node : CachedNodes(*bench_.tree)) {
            numbers.push_back(node->nodeNum);
        }
        EXPECT_EQ(numbers, change.left);
        EXPECT_TRUE(LedgerHolds(*bench_.tree, static_cast<u32>(numbers.size())));
        for (HfsNode* node : {inner, outer, change.drops ? nullptr : third}) {
            if (node != nullptr) {
                bench_->PutINode(node, false);
            }
        }
        bench_.capture.Take();
    }
}

INSTANTIATE_GEOMETRIES(CacheTest, FewGeometries);

}  // namespace
}  // namespace VELK::test
