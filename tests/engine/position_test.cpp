// Positions as 64-bit numbers: GetPos and SetPos.
#include <gtest/gtest.h>

#include <utility>

#include "bench.h"

namespace VELK::test {
namespace {

class PositionTest : public GeometryTest {
protected:
    PositionTest() : bench_(Blocks(GetParam())) { bench_.Open(SmallTree(NodeSize(), 9)); }
    ~PositionTest() override { path_.ClearPath(); }

    void StandOn(u32 n) {
        const HostKey key = NthHostKey(4, n);
        bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path_);
        bench_.Forget();
    }
    int SetPos(u64 position) {
        path_.ClearPath();
        path_.level = 0;
        const unsigned long long pos = position;
        recordSize_ = 0;
        return bench_->SetPos(pos, record_, 8, &recordSize_, nullptr, 0, nullptr, &path_);
    }
    u64 Position(u64 leaf, u64 index) const { return leaf * NodeSize() + index; }

    Bench bench_;
    HfsFindData path_;
    u8 record_[8] = {};
    u32 recordSize_ = 0;
};

// ---- GetPos

TEST_P(PositionTest, IsTheLeafTimesTheNodeSizePlusTheIndex) {
    StandOn(7);
    EXPECT_EQ(bench_->GetPos(&path_, nullptr, nullptr), Position(4, 1));
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(PositionTest, OfAHighNodeNumberHas64Bits) {
    StandOn(7);
    path_.path[1].node->nodeNum = 0xFFFFFFF0;
    EXPECT_EQ(bench_->GetPos(&path_, nullptr, nullptr), Position(0xFFFFFFF0, 1));
    path_.path[1].node->nodeNum = 4;
}

TEST_P(PositionTest, ConvertsTheCallersKey) {
    StandOn(7);
    CatalogKey key;
    CatalogKey copy{};
    const HostKey host = NthHostKey(4, 7);
    std::copy(host.bytes, host.bytes + sizeof key.bytes, key.bytes);
    EXPECT_EQ(bench_->GetPos(&path_, &key, &copy), Position(4, 1));
    EXPECT_EQ(Bytes(copy.bytes, copy.bytes + 20), NthDiskKey(4, 7));
    copy = {};
    path_.level = 2;
    EXPECT_EQ(bench_->GetPos(&path_, &key, &copy), Position(10, 3));
    EXPECT_EQ(Bytes(copy.bytes, copy.bytes + 20), NthDiskKey(4, 7));
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3151)});
}

TEST_P(PositionTest, WithoutACopyOrAHookNoKeyIsConverted) {
    StandOn(7);
    CatalogKey key{};
    CatalogKey copy{};
    EXPECT_EQ(bench_->GetPos(&path_, &key, nullptr), Position(4, 1));
    copy.bytes[1] = 7;
    EXPECT_EQ(bench_->GetPos(&path_, nullptr, &copy), Position(4, 1));
    EXPECT_EQ(copy.bytes[1], 7);
    copy.bytes[1] = 0;
    path_.level = 2;
    EXPECT_EQ(bench_->GetPos(&path_, &key, nullptr) / NodeSize(), path_.path[2].node->nodeNum);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3151)});
    path_.level = 1;
    const auto hook = std::exchange(bench_->convert.KeyToDisk, nullptr);
    key.bytes[1] = 20;
    EXPECT_EQ(bench_->GetPos(&path_, &key, &copy), Position(4, 1));
    EXPECT_EQ(copy.bytes[1], 0);
    bench_->convert.KeyToDisk = hook;
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(PositionTest, OfAnEmptyPathIsAllOnes) {
    path_.valid = true;
    path_.level = 1;
    EXPECT_EQ(bench_->GetPos(&path_, nullptr, nullptr), ~u64{0});
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(PositionTest, OfAnInvalidPathIsAsserted) {
    EXPECT_EQ(bench_->GetPos(&path_, nullptr, nullptr), ~u64{0});
    EXPECT_EQ(bench_.capture.Take(), (Events{Asserted(3150), Asserted(3151)}));
}

TEST_P(PositionTest, OfANullPathIsAssertedAndThatOfTheTree) {
    const HostKey key = NthHostKey(4, 7);
    bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr);
    EXPECT_EQ(bench_->GetPos(nullptr, nullptr, nullptr), Position(4, 1));
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3146)});
}

TEST_P(PositionTest, OfAnotherLevelIsAsserted) {
    StandOn(7);
    path_.level = 2;
    EXPECT_EQ(bench_->GetPos(&path_, nullptr, nullptr), Position(10, 3));
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3151)});
}

TEST_P(PositionTest, OfALevelNoPathHasIsAllOnes) {
    StandOn(7);
    for (const u32 level : {16u, 0xFFFFFFFFu}) {
        path_.level = level;
        EXPECT_EQ(bench_->GetPos(&path_, nullptr, nullptr), ~u64{0});
        EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3151)});
    }
    path_.level = 1;
}

// ---- SetPos

TEST_P(PositionTest, EveryPositionLeadsBackToItsRecord) {
    for (u32 n = 0; n < 18; ++n) {
        StandOn(n);
        const u64 position = bench_->GetPos(&path_, nullptr, nullptr);
        EXPECT_EQ(SetPos(position), kOk);
        EXPECT_EQ(Bytes(record_, record_ + 8), Pattern(8, n));
        EXPECT_EQ(recordSize_, 8u);
        EXPECT_EQ(bench_->GetPos(&path_, nullptr, nullptr), position);
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(PositionTest, SettingHoldsTheLeafOnly) {
    EXPECT_EQ(SetPos(Position(4, 1)), kOk);
    EXPECT_EQ(References(path_), 1u);
    EXPECT_EQ(path_.level, 1u);
    EXPECT_TRUE(path_.valid);
    EXPECT_EQ(path_.searchCount, 2u);  // its own and that of the step it makes
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 1));
}

TEST_P(PositionTest, SettingDeliversTheKey) {
    alignas(8) u8 key[20] = {};
    u32 keySize = 0;
    const unsigned long long position = Position(4, 1);
    EXPECT_EQ(bench_->SetPos(position, record_, 8, &recordSize_, key, 20, &keySize, &path_), kOk);
    const HostKey host = NthHostKey(4, 7);
    EXPECT_EQ(Bytes(key, key + 20), Bytes(host.bytes, host.bytes + 20));
    EXPECT_EQ(keySize, 20u);
}

TEST_P(PositionTest, AnIndexPastTheLeafContinuesInTheNext) {
    EXPECT_EQ(SetPos(Position(4, 2)), kOk);
    EXPECT_EQ(Bytes(record_, record_ + 8), Pattern(8, 8));
    EXPECT_EQ(SetPos(Position(4, 5)), kOk);
    EXPECT_EQ(Bytes(record_, record_ + 8), Pattern(8, 11));
}

TEST_P(PositionTest, AnIndexPastTheLastLeafIsReported) {
    EXPECT_EQ(SetPos(Position(9, 2)), kErrNotFound);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kErrNotFound, 3201)});
}

TEST_P(PositionTest, NodeZeroAndNodesPastTheFileAreNotFound) {
    for (const u64 position : {Position(0, 0), Position(0, 3), Position(22, 0), Position(23, 1),
                               Position(0x100000000, 0), ~u64{0}}) {
        path_.level = 0;
        const unsigned long long pos = position;
        EXPECT_EQ(bench_->SetPos(pos, record_, 8, &recordSize_, nullptr, 0, nullptr, &path_),
                  kErrNotFound);
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
    EXPECT_EQ(path_.searchCount, 0u);
    EXPECT_EQ(path_.level, 0u);
    EXPECT_EQ(References(path_), 0u);
}

TEST_P(PositionTest, NodeNumbersCountIn32Bits) {
    EXPECT_EQ(SetPos(Position(0x100000004, 1)), kOk);
    EXPECT_EQ(Bytes(record_, record_ + 8), Pattern(8, 7));
}

TEST_P(PositionTest, ATreeWithoutLeafRecordsHasNoPositions) {
    bench_->header.leafRecords = 0;
    EXPECT_EQ(SetPos(Position(4, 1)), kErrNotFound);
    EXPECT_EQ(References(path_), 0u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(PositionTest, SettingAPathInUseIsAsserted) {
    StandOn(1);
    const unsigned long long position = Position(4, 1);
    EXPECT_EQ(bench_->SetPos(position, record_, 8, &recordSize_, nullptr, 0, nullptr, &path_), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3185)});
    EXPECT_EQ(References(path_), 3u);
    EXPECT_TRUE(LedgerHolds(*bench_.tree, 3));
}

TEST_P(PositionTest, SettingANullPathIsAssertedAndSetsTheTrees) {
    const unsigned long long position = Position(4, 1);
    EXPECT_EQ(bench_->SetPos(position, record_, 8, &recordSize_, nullptr, 0, nullptr, nullptr),
              kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3180)});
    EXPECT_EQ(bench_->findData.path[1].node->nodeNum, 4u);
}

TEST_P(PositionTest, APositionInAnIndexNodeIsRefused) {
    EXPECT_EQ(SetPos(Position(10, 0)), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonTree, 2916), Reported(kErrCorrupt, 3197)}));
    EXPECT_FALSE(path_.valid);
    EXPECT_EQ(path_.level, 1u);
}

TEST_P(PositionTest, APositionInAFreeNodeIsRefused) {
    EXPECT_EQ(SetPos(Position(20, 0)), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Of(Event::Kind::kReport),
              (Events{Reported(kReasonTree, 2916), Reported(kErrCorrupt, 3197)}));
    EXPECT_TRUE(bench_->modifiedList.IsEmpty());
}

TEST_P(PositionTest, AnUnreadableLeafIsReported) {
    bench_.faults.Fail(Call::kMap, 1);
    EXPECT_EQ(SetPos(Position(4, 1)), kFaultStatus);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 2909),
                      Reported(kFaultStatus, 3197)}));
    EXPECT_FALSE(path_.valid);
}

INSTANTIATE_GEOMETRIES(PositionTest, FewGeometries);

}  // namespace
}  // namespace VELK::test
