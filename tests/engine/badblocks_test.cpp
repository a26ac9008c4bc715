// Loading the bad-block list from the extents tree.
#include <gtest/gtest.h>

#include "bench.h"

namespace VELK::test {
namespace {

constexpr u32 kHole = 0xFFFFFFFF;
constexpr u32 kTotalBlocks = 65536;

using Runs = std::vector<std::vector<u32>>;  // {vcn, lcn, length}
using Extents = std::vector<HfsExtent>;

// An extents record of file `fileId` from its fork block `startBlock` on.
TreeRecord ExtentRecord(u32 fileId, u32 startBlock, const Extents& extents,
                        u8 forkType = kForkData) {
    Bytes data;
    for (const HfsExtent& extent : extents) {
        Append32(&data, extent.startBlock);
        Append32(&data, extent.blockCount);
    }
    data.resize(kExtentRecordSize);
    return {DiskExtKey(forkType, fileId, startBlock), data};
}

class BadBlocks : public GeometryTest {
protected:
    BadBlocks() : bench_(Blocks(GetParam()), kExtentsFileId) {}

    void Open(const std::vector<TreeRecord>& records, u32 recordsPerLeaf = 2) {
        TreeShape shape;
        shape.fileId = kExtentsFileId;
        shape.nodeSize = NodeSize();
        shape.recordsPerLeaf = recordsPerLeaf;
        shape.childrenPerIndex = 4;
        bench_.Open(BuildTree(shape, records));
    }
    Runs Loaded() const {
        Runs list;
        for (u32 i = 0; i < runs_.Count(); ++i) {
            const HfsRuns::Run& run = runs_.At(i);
            list.push_back({run.vcn, run.lcn, run.length});
        }
        return list;
    }
    // What lies at [0, ...): the runs given, then the hole up to the size of the volume.
    Runs WithHole(Runs runs) const {
        const u32 end = runs.back()[0] + runs.back()[2];
        runs.push_back({end, kHole, kTotalBlocks - end});
        return runs;
    }

    Bench bench_;
    HfsRuns runs_;
};

TEST_P(BadBlocks, AVolumeWithoutBadBlocksAddsNoRun) {
    Open({ExtentRecord(4, 0, {{10, 2}}), ExtentRecord(6, 0, {{20, 2}})});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), Runs{});
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(BadBlocks, AnEmptyTreeAddsNoRun) {
    Open({});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), Runs{});
}

TEST_P(BadBlocks, ExtentsBecomeRunsOneAfterTheOther) {
    Open({ExtentRecord(5, 0, {{100, 3}, {7, 1}, {5000, 20}})});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), WithHole({{0, 100, 3}, {3, 7, 1}, {4, 5000, 20}}));
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(BadBlocks, AllEightExtentsAreTaken) {
    Extents extents;
    Runs expected;
    for (u32 i = 0; i < 8; ++i) {
        extents.push_back({1000 - 10 * i, 1});
        expected.push_back({i, 1000 - 10 * i, 1});
    }
    Open({ExtentRecord(5, 0, extents)});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), WithHole(expected));
}

TEST_P(BadBlocks, AnExtentOfNoBlocksEndsItsRecord) {
    Open({ExtentRecord(5, 0, {{100, 3}, {0, 0}, {5000, 20}})});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), WithHole({{0, 100, 3}}));
}

TEST_P(BadBlocks, ARecordOfNoBlocksAddsNothingAndTheWalkGoesOn) {
    Open({ExtentRecord(5, 0, {}), ExtentRecord(5, 8, {{300, 2}})});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), (Runs{{0, kHole, 8}, {8, 300, 2}, {10, kHole, kTotalBlocks - 10}}));
}

TEST_P(BadBlocks, TheWalkCrossesLeavesAndTakesPlacesFromTheKeys) {
    Open({ExtentRecord(4, 0, {{1, 1}}), ExtentRecord(5, 0, {{100, 3}}),
          ExtentRecord(5, 3, {{200, 4}, {300, 1}}), ExtentRecord(5, 50, {{400, 2}}),
          ExtentRecord(5, 60, {{500, 1}}), ExtentRecord(6, 0, {{600, 9}})});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), (Runs{{0, 100, 3},
                              {3, 200, 4},
                              {7, 300, 1},
                              {8, kHole, 42},
                              {50, 400, 2},
                              {52, kHole, 8},
                              {60, 500, 1},
                              {61, kHole, kTotalBlocks - 61}}));
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(BadBlocks, TheForkOfLaterRecordsDoesNotMatter) {
    Open({ExtentRecord(5, 0, {{100, 3}}), ExtentRecord(5, 3, {{200, 1}}, kForkResource)});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), WithHole({{0, 100, 3}, {3, 200, 1}}));
}

TEST_P(BadBlocks, AListThatDoesNotBeginAtBlockZeroIsNone) {
    Open({ExtentRecord(5, 8, {{100, 3}})});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), Runs{});
}

TEST_P(BadBlocks, EachRunIsTraced) {
    Open({ExtentRecord(5, 0, {{100, 3}, {0xFFFFFFFF, 2}}), ExtentRecord(5, 5, {{0x1F, 1}})});
    bench_.capture.TraceAll();
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(bench_.capture.Take(), (Events{Traced("Bad block 0: [0x64 0x67)\n"),
                                             Traced("Bad block 1: [0xffffffff 0x1)\n"),
                                             Traced("Bad block 2: [0x1f 0x20)\n")}));
}

TEST_P(BadBlocks, StaleFieldsOfTheVolumesKeyAreOverwritten) {
    Open({ExtentRecord(5, 0, {{100, 3}})});
    std::fill(bench_.volume.fs.badBlockKey, bench_.volume.fs.badBlockKey + 12, u8{0xEE});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), WithHole({{0, 100, 3}}));
}

TEST_P(BadBlocks, TheTreesOwnPathKeepsItsNodes) {
    Open({ExtentRecord(5, 0, {{100, 3}})});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(References(bench_->findData), 1u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
}

// ---- records of the wrong size

TEST_P(BadBlocks, AShortFirstRecordIsAssertedAndRefused) {
    TreeRecord record = ExtentRecord(5, 0, {{100, 3}});
    record.data.resize(62);
    Open({record});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kErrBadRecord);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3389)});
    EXPECT_EQ(Loaded(), Runs{});
}

TEST_P(BadBlocks, ALongFirstRecordIsCutAndTaken) {
    TreeRecord record = ExtentRecord(5, 0, {{100, 3}});
    record.data.resize(70);
    Open({record});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3051)});
    EXPECT_EQ(Loaded(), WithHole({{0, 100, 3}}));
}

TEST_P(BadBlocks, AShortLaterRecordEndsTheList) {
    TreeRecord record = ExtentRecord(5, 3, {{200, 3}});
    record.data.resize(62);
    Open({ExtentRecord(5, 0, {{100, 3}}), record, ExtentRecord(5, 6, {{300, 3}})});
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), WithHole({{0, 100, 3}}));
}

TEST_P(BadBlocks, ALongLaterKeyStaysInsideTheVolumesArea) {
    TreeRecord record = ExtentRecord(5, 3, {{200, 3}});
    record.key.resize(202, 0x77);
    Put16(&record.key, 0, 200);
    Open({ExtentRecord(5, 0, {{100, 3}}), record}, 1);
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(bench_.volume.fs.badBlockKey[12], 0);
}

// ---- damage and faults

TEST_P(BadBlocks, ARingOfLeavesEndsTheList) {
    Open({ExtentRecord(5, 0, {{100, 3}}), ExtentRecord(5, 3, {{200, 3}}),
          ExtentRecord(5, 6, {{300, 3}}), ExtentRecord(5, 9, {{400, 3}})});
    Put32(&bench_.volume.Disk(3), 2 * NodeSize(), 1);  // leaf 2 leads back to leaf 1
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), WithHole({{0, 100, 3}, {3, 200, 3}, {6, 300, 3}, {9, 400, 3}}));
}

TEST_P(BadBlocks, AnUnreadableLaterLeafEndsTheList) {
    Open({ExtentRecord(5, 0, {{100, 3}}), ExtentRecord(5, 3, {{200, 3}}),
          ExtentRecord(5, 6, {{300, 3}})});
    bench_.faults.Fail(Call::kMap, 3);
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), WithHole({{0, 100, 3}, {3, 200, 3}}));
}

TEST_P(BadBlocks, AFailedLookupIsReportedTwiceAndReturned) {
    Open({ExtentRecord(5, 0, {{100, 3}})});
    bench_.faults.Fail(Call::kMap, 1);
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kFaultStatus);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 2909),
                      Reported(kFaultStatus, 2982), Reported(kFaultStatus, 3126),
                      Reported(kFaultStatus, 3385)}));
}

TEST_P(BadBlocks, ALookupThatFailsWithNotFoundIsReportedOnceAndNoFailure) {
    Open({ExtentRecord(5, 0, {{100, 3}})});
    bench_.faults.Fail(Call::kMap, 1, kErrNotFound);
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(bench_.capture.Take().back(), Reported(kErrNotFound, 3126));
}

TEST_P(BadBlocks, NoMemoryForARunIsReturnedUnreported) {
    Open({ExtentRecord(5, 0, {{100, 3}})});
    HfsFindData path;
    const HostKey key = HostExtKey(0, 5, 0);
    bench_->FindRecord(key.Get(), 5, nullptr, 0, nullptr, &path);  // the leaf is cached now
    bench_.heap.FailNth(1, true);
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kErrNoMemory);
    EXPECT_EQ(bench_.capture.Take(), Events{});
    bench_.heap.FailNone();
    path.ClearPath();
}

TEST_P(BadBlocks, NoMemoryForALaterRunIsReturnedAndTheEarlierStand) {
    Extents first;
    Extents second;
    for (u32 i = 0; i < 8; ++i) {
        first.push_back({1000 - 10 * i, 1});
        second.push_back({2000 - 10 * i, 1});
    }
    Open({ExtentRecord(5, 0, first), ExtentRecord(5, 8, second)});
    HfsFindData path;
    bench_->FindRecord(HostExtKey(0, 5, 0).Get(), 5, nullptr, 0, nullptr, &path);
    bench_.heap.FailNth(2, true);  // the map's first block of runs is got, a larger one is not
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kErrNoMemory);
    EXPECT_EQ(Loaded()[0], (std::vector<u32>{0, 1000, 1}));
    bench_.heap.FailNone();
    path.ClearPath();
}

TEST_P(BadBlocks, ALeafThatLeadsToItselfEndsTheList) {
    Open({ExtentRecord(5, 0, {{100, 3}}), ExtentRecord(5, 3, {{200, 3}})}, 1);
    Put32(&bench_.volume.Disk(3), 2 * NodeSize(), 2);
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), WithHole({{0, 100, 3}, {3, 200, 3}}));
    EXPECT_LE(bench_->readCount + bench_->hitCount, 6u);
}

TEST_P(BadBlocks, LeafRecordsOfZeroEndAfterTheFirstRecord) {
    Open({ExtentRecord(5, 0, {{100, 3}}), ExtentRecord(5, 3, {{200, 3}})});
    bench_->header.leafRecords = 0;
    EXPECT_EQ(bench_->LoadBadBlocks(&runs_), kOk);
    EXPECT_EQ(Loaded(), WithHole({{0, 100, 3}}));
}

INSTANTIATE_GEOMETRIES(BadBlocks, FewGeometries);

}  // namespace
}  // namespace VELK::test
