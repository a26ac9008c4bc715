// Sources that lie, end early or fail: the checker ends quickly, with words, and within its bounds.
#include <gtest/gtest.h>

#include <chrono>
#include <cstring>
#include <random>

#include "check_support.h"
#include "hfs/format.h"

namespace VELK::test {
namespace {

// A source of zeros with a volume at its start: as large as it likes to claim.
struct Sparse {
    const Bytes* bytes;
    u64 reads = 0;
    u64 failFrom = ~u64{0};
    u64 failTo = ~u64{0};

    static int Read(void* self, u64 offset, void* target, std::size_t size) {
        auto* sparse = static_cast<Sparse*>(self);
        ++sparse->reads;
        if (offset < sparse->failTo && offset + size > sparse->failFrom) {
            return 5;
        }
        std::memset(target, 0, size);
        if (offset < sparse->bytes->size()) {
            std::memcpy(target, sparse->bytes->data() + offset,
                        std::min<u64>(size, sparse->bytes->size() - offset));
        }
        return 0;
    }
};

struct Collected {
    CheckSummary summary;
    std::vector<CheckUnreadable> unreadable;
};

Collected RunOn(Sparse* sparse, u64 size, const CheckOptions& options) {
    Collected collected;
    CheckSink sink;
    sink.self = &collected;
    sink.unreadable = [](void* self, const CheckUnreadable& unreadable) {
        static_cast<Collected*>(self)->unreadable.push_back(unreadable);
    };
    collected.summary = CheckVolume({sparse, Sparse::Read, size, 86016}, options, sink);
    return collected;
}

}  // namespace

TEST(CheckHostile, EmptyAndTinySources) {
    for (std::size_t size : {0u, 1u, 1023u, 1024u, 1535u, 1536u, 2048u}) {
        const Outcome outcome = CheckBytes(Bytes(size), Full());
        EXPECT_EQ(outcome.unreadable.size() + outcome.summary.errors, 1u) << size;
    }
    for (std::size_t size : {0u, 1u, 511u, 512u, 4096u}) {
        TreeImage tree;
        tree.shape.fileId = kCatalogFileId;
        tree.bytes.assign(size, 0);
        EXPECT_NE(CheckImage(tree, Full()).summary.errors, 0u) << size;
    }
}

TEST(CheckHostile, TruncatedVolumesAreToldAndReadAsFarAsTheyGo) {
    VolumeImage volume;
    volume.Build();
    for (u64 size = 1536; size < volume.bytes.size(); size += 5000) {
        Bytes cut(volume.bytes.begin(), volume.bytes.begin() + static_cast<long>(size));
        CheckOptions options = Full();
        options.keepGoing = true;
        const Outcome outcome = CheckBytes(cut, options);
        EXPECT_EQ(outcome.First(CheckId::V02).id, CheckId::V02) << size;
    }
}

TEST(CheckHostile, AnUnreadableNodeIsNamedAndEndsItsTree) {
    VolumeImage volume;
    volume.Build();
    ASSERT_GT(volume.catalogTree.levels[1].size(), 2u);
    const u32 leaf = volume.catalogTree.levels[1][1];
    Sparse sparse = {&volume.bytes, 0, (u64{volume.catalogStart} + leaf) * 512, 0};
    sparse.failTo = sparse.failFrom + 512;
    Collected collected = RunOn(&sparse, volume.bytes.size(), {});
    ASSERT_EQ(collected.unreadable.size(), 1u);
    EXPECT_EQ(collected.unreadable[0].where, "catalog node " + std::to_string(leaf));
    EXPECT_EQ(collected.unreadable[0].offset, sparse.failFrom + 86016);
    EXPECT_EQ(collected.unreadable[0].status, 5);
    EXPECT_EQ(collected.summary.stages[2].verdict, CheckVerdict::kStopped);
    EXPECT_EQ(collected.summary.errors, 0u);
    const u64 before = collected.summary.nodes;
    CheckOptions options;
    options.keepGoing = true;
    collected = RunOn(&sparse, volume.bytes.size(), options);
    EXPECT_EQ(collected.unreadable.size(), 1u);
    EXPECT_GT(collected.summary.nodes, before);
    EXPECT_EQ(collected.summary.errors + collected.summary.warnings, 0u);
}

// 2^32 - 1 nodes and blocks that an all but empty source of 8 TiB seems to have.
TEST(CheckHostile, ForgedCountsCostNeitherTimeNorMemory) {
    VolumeImage volume;
    volume.Build();
    const u64 size = u64{1} << 43;
    volume.Patch32(1024 + 44, 0xFFFFFFFF);
    const u32 catalogFork = 1024 + 112 + 2 * 80;
    volume.Patch32(catalogFork + 12, 0xFFFFFFF0);
    volume.Patch32(catalogFork + 16 + 4, 0xFFFFFFF0);
    volume.Patch32(catalogFork, 0x1000);
    const u64 header = u64{volume.catalogStart} * 512;
    volume.Patch32(header + kHeadTotalNodes, 0xFFFFFFF0);
    volume.Patch32(header + kHeadFreeNodes, 0xFFFFFF00);
    Sparse sparse = {&volume.bytes};
    const auto start = std::chrono::steady_clock::now();
    CheckOptions options = Full();
    options.keepGoing = true;
    const Collected collected = RunOn(&sparse, size, options);
    const auto taken = std::chrono::steady_clock::now() - start;
    EXPECT_NE(collected.summary.errors, 0u);
    EXPECT_LT(sparse.reads, 2000u);
    EXPECT_LT(taken, std::chrono::seconds(2));
}

TEST(CheckHostile, RingsOfEveryKindEnd) {
    const TreeImage sound = CatalogTree(300);
    for (u32 level = 1; level < sound.levels.size(); ++level) {
        for (u32 target : {0u, sound.rootNode, sound.levels[1][0], sound.levels[level][0]}) {
            TreeImage tree = sound;
            for (u32 nodeNum : sound.levels[level]) {
                tree.Patch32(nodeNum, kDescFLink, target);
            }
            EXPECT_LE(CheckImage(tree, Full()).summary.nodes, tree.totalNodes);
            EXPECT_LE(CheckImage(tree, Quick()).summary.nodes, tree.totalNodes);
        }
    }
}

TEST(CheckHostile, AProgressThatSaysNoStops) {
    TreeImage tree = CatalogTree(2000);
    CheckSink sink;
    sink.progress = [](void*, const CheckProgress& progress) {
        EXPECT_STREQ(progress.stage, "catalog");
        return progress.done < 500;
    };
    const CheckSummary summary =
        CheckTreeBytes(tree.bytes.data(), tree.bytes.size(),
                       {kCatalogFileId, CheckNameOrder::kFolding, false}, {}, sink);
    EXPECT_TRUE(summary.isStopped);
    EXPECT_EQ(summary.nodes, 512u);
    EXPECT_STREQ(summary.stages[0].why, "interrupted");
}

// Random bytes over random places: whatever is said, it ends, and stays inside its buffers.
TEST(CheckHostile, RandomDamageIsSurvived) {
    VolumeImage sound;
    sound.Build();
    std::mt19937 random(20260721);
    std::vector<std::size_t> places;
    for (std::size_t i = 0; i < sound.bytes.size(); ++i) {
        if (sound.bytes[i] != 0) {
            places.push_back(i);
        }
    }
    u32 told = 0;
    for (u32 round = 0; round < 400; ++round) {
        Bytes bytes = sound.bytes;
        for (u32 i = 0; i < 1 + round % 5; ++i) {
            bytes[places[random() % places.size()]] = static_cast<u8>(random());
        }
        CheckOptions options = round % 3 == 0 ? Quick() : Full();
        options.keepGoing = round % 2 == 0;
        told += CheckBytes(bytes, options).findings.empty() ? 0u : 1u;
    }
    EXPECT_GT(told, 300u);
}

}  // namespace VELK::test
