// Millions of random calls of all public operations against the model, in every geometry and tree
// kind. TREEHFS_SEED repeats a run, TREEHFS_MODEL_CALLS sets how many calls there are in all.
#include <gtest/gtest.h>

#include <cstdlib>

#include "runner.h"

namespace VELK::test {

namespace {

constexpr u32 kDefaultCalls = 300000;

u64 NumberFromEnvironment(const char* name, u64 otherwise) {
    const char* text = std::getenv(name);
    return text != nullptr ? std::strtoull(text, nullptr, 0) : otherwise;
}

Geometry InOnePiece(Geometry geometry) {
    geometry.inOnePiece = true;
    return geometry;
}

std::vector<RunSetup> Setups() {
    std::vector<RunSetup> setups;
    for (const Geometry& geometry : AllGeometries()) {
        if (geometry.nodeSize <= 8192 || geometry.mapBlock >= 4096) {
            for (const u32 fileId : {kExtentsFileId, kCatalogFileId, kAttributesFileId}) {
                setups.push_back({fileId, geometry});
                if (geometry.Blocks() > 1) {
                    setups.push_back({fileId, InOnePiece(geometry)});
                }
            }
        }
    }
    return setups;
}

std::optional<std::string> RunOnce(const RunSetup& setup,
                                   const std::vector<Operation>& operations) {
    return Runner(setup).Run(operations);
}

// Takes stretches of operations out as long as the run still fails.
std::vector<Operation> Shrink(const RunSetup& setup, std::vector<Operation> operations) {
    for (std::size_t stretch = operations.size() / 2; stretch > 0; stretch /= 2) {
        for (std::size_t from = 0; from + stretch <= operations.size();) {
            std::vector<Operation> fewer = operations;
            fewer.erase(fewer.begin() + static_cast<std::ptrdiff_t>(from),
                        fewer.begin() + static_cast<std::ptrdiff_t>(from + stretch));
            if (RunOnce(setup, fewer)) {
                operations = std::move(fewer);
            } else {
                from += stretch;
            }
        }
    }
    return operations;
}

class ModelTest : public ::testing::TestWithParam<RunSetup> {};

void RunAndShrink(const RunSetup& setup, u64 seed, bool withFaults) {
    const u64 calls = NumberFromEnvironment("TREEHFS_MODEL_CALLS", kDefaultCalls);
    const u32 share = static_cast<u32>(calls / (2 * Setups().size()) + 1);
    const std::vector<Operation> operations = MakeOperations(seed, share, withFaults);
    const auto failure = RunOnce(setup, operations);
    if (!failure) {
        return;
    }
    std::string few;
    for (const Operation& operation : Shrink(setup, operations)) {
        few += "  " + Text(operation) + "\n";
    }
    ADD_FAILURE() << "TREEHFS_SEED=" << seed << ": " << *failure << "\nfewest operations:\n" << few;
}

}  // namespace

TEST_P(ModelTest, TreeAndModelAgree) {
    RunAndShrink(GetParam(), NumberFromEnvironment("TREEHFS_SEED", 20261121), false);
}

TEST_P(ModelTest, TreeAndModelAgreeWhenServicesFail) {
    RunAndShrink(GetParam(), NumberFromEnvironment("TREEHFS_SEED", 20261122), true);
}

u64 DigestOf(u32 fileId, const Geometry& geometry, const std::vector<Operation>& operations) {
    Runner runner({fileId, geometry, true});
    const auto failure = runner.Run(operations);
    EXPECT_FALSE(failure) << *failure;
    return runner.Digest();
}

// Accelerators must not change what can be observed: the order of changes, the residue in the gaps
// of nodes, the counts of requests. One number stands for all of it, over every geometry and tree
// kind, with and without faults. A change that is meant to be seen brings a new number.
// Nodes in several blocks that lie in one piece give the number that they give when these lie
// apart. TREEHFS_DIGEST_CALLS takes longer runs and only tells their number, to compare two builds
// by.
TEST(ModelDigest, RunsAreWhatTheyWereObservedToBe) {
    constexpr u64 kDefault = 40;
    constexpr u64 kSmallNodesMore = 12;  // times the calls, where a tree gets deep soon
    const u64 calls = NumberFromEnvironment("TREEHFS_DIGEST_CALLS", kDefault);
    u64 all = 0;
    u64 seed = 4711;
    for (const RunSetup& setup : Setups()) {
        if (setup.geometry.inOnePiece) {
            continue;
        }
        const bool isSmall = setup.geometry.nodeSize <= 512;
        for (const bool withFaults : {false, true}) {
            const u64 share = isSmall ? calls * kSmallNodesMore : calls;
            const std::vector<Operation> operations =
                MakeOperations(++seed, static_cast<u32>(share), withFaults);
            const u64 digest = DigestOf(setup.fileId, setup.geometry, operations);
            EXPECT_EQ(DigestOf(setup.fileId, InOnePiece(setup.geometry), operations), digest);
            all = all * 31 + digest;
        }
    }
    if (calls != kDefault) {
        GTEST_SKIP() << "number of these runs: " << all;
    }
    EXPECT_EQ(all, 3368167796521018749u);
}

INSTANTIATE_TEST_SUITE_P(Setups, ModelTest, ::testing::ValuesIn(Setups()), [](const auto& param) {
    return std::string(param.param.fileId == kExtentsFileId   ? "Extents"
                       : param.param.fileId == kCatalogFileId ? "Catalog"
                                                              : "Attributes") +
           std::to_string(param.param.geometry.nodeSize) + "by" +
           std::to_string(param.param.geometry.mapBlock) +
           (param.param.geometry.inOnePiece ? "inOnePiece" : "");
});

}  // namespace VELK::test
