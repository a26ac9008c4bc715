// Stepping along damaged leaf chains, with failing services, and from paths that lead nowhere.
#include <gtest/gtest.h>

#include "bench.h"
#include "hfs/treehfs/bytes.h"

namespace VELK::test {
namespace {

// The SmallTree of nine leaves: leaf n (1 .. 9) holds records 2n - 2 and 2n - 1. 22 nodes.
class IterateDamage : public GeometryTest {
protected:
    IterateDamage() : bench_(Blocks(GetParam())), image_(SmallTree(NodeSize(), 9)) {}
    ~IterateDamage() override { path_.ClearPath(); }

    void StandOn(u32 n) {
        bench_.Open(image_);
        const HostKey key = NthHostKey(4, n);
        EXPECT_EQ(bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path_), kOk);
        bench_.Forget();
    }
    int Step(int count) {
        u32 size = 0;
        u32 keySize = 0;
        const int status = bench_->IncPos(count, record_, 8, &size, keyOut_, 20, &keySize, &path_);
        EXPECT_TRUE(LedgerHolds(*bench_.tree, References(path_)));
        EXPECT_TRUE(bench_->modifiedList.IsEmpty());
        return status;
    }
    Events Reports() {
        const Events reports = bench_.capture.Of(Event::Kind::kReport);
        bench_.capture.Take();
        return reports;
    }

    Bench bench_;
    TreeImage image_;
    HfsFindData path_;
    u8 record_[8] = {};
    alignas(8) u8 keyOut_[kKeyLengthSize + kMaxKeyLength] = {};
};

// ---- siblings

TEST_P(IterateDamage, ASiblingThatIsNoLeafIsReported) {
    image_.Patch8(2, 8, 0);
    StandOn(1);
    EXPECT_EQ(Step(1), kErrCorrupt);
    EXPECT_EQ(Reports(), (Events{Reported(kReasonTree, 2925), Reported(kErrCorrupt, 3286)}));
    EXPECT_FALSE(path_.valid);
    EXPECT_EQ(path_.path[1].node->nodeNum, 2u);
}

TEST_P(IterateDamage, ASiblingOfAnotherHeightIsReported) {
    image_.Patch32(1, 0, 10);
    StandOn(1);
    EXPECT_EQ(Step(1), kErrCorrupt);
    EXPECT_EQ(Reports(), (Events{Reported(kReasonTree, 2916), Reported(kErrCorrupt, 3286)}));
}

TEST_P(IterateDamage, AFormerSiblingOfAnotherHeightIsReported) {
    image_.Patch32(2, 4, 10);
    StandOn(2);
    EXPECT_EQ(Step(-1), kErrCorrupt);
    EXPECT_EQ(Reports(), (Events{Reported(kReasonTree, 2916), Reported(kErrCorrupt, 3257)}));
}

TEST_P(IterateDamage, SteppingOnFromARejectedNodeIsRefused) {
    image_.Patch32(1, 0, 10);
    StandOn(1);
    EXPECT_EQ(Step(1), kErrCorrupt);
    bench_.capture.Take();
    EXPECT_EQ(Step(1), kErrInvalid);
    EXPECT_EQ(Reports(), Events{Reported(kReasonInvalid, kAnySite)});
}

TEST_P(IterateDamage, ASiblingPastTheFileIsAssertedAndReported) {
    for (const u32 sibling : {22u, 0xFFFFFFFFu}) {
        image_.Patch32(1, 0, sibling);
        StandOn(1);
        EXPECT_EQ(Step(1), kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), (Events{Asserted(2638), Reported(kErrCorrupt, 2909),
                                                 Reported(kErrCorrupt, 3286)}));
        EXPECT_EQ(path_.path[1].node, nullptr);
        path_.ClearPath();
        bench_->Dtor();
    }
}

TEST_P(IterateDamage, ASiblingNeverWrittenLeavesNothingToWrite) {
    image_.Patch32(1, 0, 20);
    StandOn(1);
    bench_->validNodes = 15;
    EXPECT_EQ(Step(1), kErrCorrupt);
    EXPECT_EQ(bench_->validNodes, 15u);
    EXPECT_EQ(bench_->Flush(0), kOk);
    EXPECT_EQ(bench_.volume.Count(Call::kDirtyMeta), 0u);
}

TEST_P(IterateDamage, AnUnreadableSiblingIsReported) {
    StandOn(1);
    bench_.faults.Fail(Call::kMap, 1);
    EXPECT_EQ(Step(1), kFaultStatus);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 2909),
                      Reported(kFaultStatus, 3286)}));
    EXPECT_FALSE(path_.valid);
    EXPECT_EQ(path_.path[1].node, nullptr);
}

TEST_P(IterateDamage, AnUnreadableFormerSiblingIsReported) {
    StandOn(2);
    bench_.faults.Fail(Call::kMap, 1);
    EXPECT_EQ(Step(-1), kFaultStatus);
    EXPECT_EQ(bench_.capture.Take().back(), Reported(kFaultStatus, 3257));
}

TEST_P(IterateDamage, SteppingOnAfterAFailureIsRefused) {
    StandOn(1);
    bench_.faults.Fail(Call::kMap, 1);
    EXPECT_EQ(Step(1), kFaultStatus);
    bench_.capture.Take();
    for (const int count : {-1, 0, 1}) {
        EXPECT_EQ(Step(count), kErrInvalid);
        EXPECT_EQ(bench_.capture.Take(),
                  (Events{Asserted(3229), Reported(kReasonInvalid, kAnySite)}));
    }
}

TEST_P(IterateDamage, NoMemoryForASiblingIsPassedOn) {
    StandOn(1);
    bench_.heap.FailNth(1);
    EXPECT_EQ(Step(1), kErrNoMemory);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kErrNoMemory, 2909), Reported(kErrNoMemory, 3286)}));
}

// ---- rings

TEST_P(IterateDamage, ARingOfEmptyLeavesEnds) {
    for (const u32 length : {1u, 2u, 5u}) {
        image_ = SmallTree(NodeSize(), 9);
        for (u32 leaf = 2; leaf < 2 + length; ++leaf) {
            NodeImage empty{.fLink = leaf + 1 == 2 + length ? 2 : leaf + 1};
            image_.SetNode(leaf, empty.Build(NodeSize()));
        }
        StandOn(1);
        const u32 requests = bench_->hitCount + bench_->readCount;
        EXPECT_EQ(Step(1), kErrCorrupt);
        EXPECT_EQ(Reports(),
                  (Events{Reported(kReasonTree, kAnySite), Reported(kErrCorrupt, 3286)}));
        EXPECT_LE(bench_->hitCount + bench_->readCount - requests, 22u);
        path_.ClearPath();
        bench_->Dtor();
    }
}

TEST_P(IterateDamage, ALongStepInARingOfLeavesEnds) {
    image_.Patch32(3, 0, 2);
    StandOn(1);
    EXPECT_EQ(Step(0x7FFFFFFF), kErrCorrupt);
    EXPECT_EQ(Reports(), (Events{Reported(kReasonTree, kAnySite), Reported(kErrCorrupt, 3286)}));
}

TEST_P(IterateDamage, ALongStepBackInARingOfLeavesEnds) {
    image_.Patch32(2, 4, 3);
    StandOn(5);
    const u32 requests = bench_->hitCount + bench_->readCount;
    EXPECT_EQ(Step(-0x7FFFFFFF - 1), kErrCorrupt);
    EXPECT_EQ(Reports(), (Events{Reported(kReasonTree, kAnySite), Reported(kErrCorrupt, 3257)}));
    EXPECT_LE(bench_->hitCount + bench_->readCount - requests, 22u);
}

TEST_P(IterateDamage, TheLongestSoundChainIsNoRing) {
    StandOn(0);
    EXPECT_EQ(Step(17), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// ---- records

TEST_P(IterateDamage, ARecordThatCannotBeLocatedIsReported) {
    image_.Patch16(2, NodeSize() - 4, NodeSize());
    StandOn(1);
    EXPECT_EQ(Step(1), kErrCorrupt);
    EXPECT_EQ(Reports(), (Events{Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 3305)}));
    EXPECT_TRUE(path_.valid);
}

TEST_P(IterateDamage, ARecordThatCannotBeLocatedIsReportedWithoutAKeyBuffer) {
    image_.Patch16(2, NodeSize() - 4, NodeSize());
    StandOn(1);
    u32 size = 77;
    EXPECT_EQ(bench_->IncPos(1, record_, 8, &size, nullptr, 0, nullptr, &path_), kErrCorrupt);
    EXPECT_EQ(Reports(), (Events{Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 3305)}));
    EXPECT_EQ(size, 77u);
}

// The map record of the header node has no key, whatever its bytes look like.
TEST_P(IterateDamage, TheMapRecordOfAHeaderNodeThatCallsItselfALeafHasNoKey) {
    image_.Patch8(0, kDescKind, 0xFF);
    image_.Patch8(0, 9, 1);
    image_.Patch16(0, 248, 6);
    image_.Patch32(0, 250, 2);
    image_.Patch16(0, 254, 0);
    bench_.Open(image_);
    ASSERT_EQ(bench_->ReadLevel(1, 0, &path_), kOk);
    path_.level = 1;
    path_.valid = true;
    path_.path[1].index = 2;
    EXPECT_EQ(Step(0), kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonNode, 9020), Reported(kErrCorrupt, 3305)}));
}

// An index node that led to itself, made a leaf: it is gone when the way on is asked for.
TEST_P(IterateDamage, AFormerParentOfItselfIsLeftLikeAnyLeaf) {
    image_.Patch32(10, 14 + 20, 10);
    bench_.Open(image_);
    const HostKey key = NthHostKey(4, 0);
    EXPECT_EQ(bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path_), kErrCorrupt);
    path_.ClearPath();
    HfsNode* node = nullptr;
    ASSERT_EQ(bench_->GetINode(10, &node, false), kOk);
    ASSERT_EQ(bench_->SetDirty(node, 0, kDescSize), kOk);
    PutBe32(node->bufs[0].data + kDescFLink, 2);
    node->bufs[0].data[kDescKind] = static_cast<u8>(kBTLeafNode);
    node->bufs[0].data[kDescHeight] = 1;
    ASSERT_EQ(bench_->FlushINode(node), kOk);
    ASSERT_EQ(bench_->ReadLevel(1, 10, &path_), kOk);
    node->refCount -= 1;
    path_.level = 1;
    path_.valid = true;
    bench_.Forget();
    EXPECT_EQ(Step(4), kOk);
    EXPECT_EQ(path_.path[1].node->nodeNum, 2u);
    EXPECT_EQ(CachedNode(*bench_.tree, 10), nullptr);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(IterateDamage, AKeyTooShortForItsKindIsReported) {
    image_.Patch16(2, 14, 5);
    StandOn(1);
    EXPECT_EQ(Step(1), kErrCorrupt);
    EXPECT_EQ(Reports(), (Events{Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 3305)}));
}

TEST_P(IterateDamage, ANameThatRunsPastItsKeyIsReported) {
    image_.Patch16(2, 14 + 6, 0x7FFF);
    StandOn(1);
    EXPECT_EQ(Step(1), kErrCorrupt);
    EXPECT_EQ(Reports(), (Events{Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 3305)}));
}

INSTANTIATE_GEOMETRIES(IterateDamage, FewGeometries);

// ---- paths that lead nowhere

class IterateBadPath : public ::testing::Test {
protected:
    IterateBadPath() : bench_(Blocks(512)) {
        bench_.Open(SmallTree(512, 9));
        const HostKey key = NthHostKey(4, 3);
        bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, &path_);
        bench_.Forget();
    }
    ~IterateBadPath() override { path_.ClearPath(); }
    int Step(int count) {
        u32 size = 0;
        return bench_->IncPos(count, record_, 8, &size, nullptr, 0, nullptr, &path_);
    }
    Bench bench_;
    HfsFindData path_;
    u8 record_[8] = {};
};

TEST_F(IterateBadPath, AFreshPathIsAssertedAndRefused) {
    path_.ClearPath();
    path_ = HfsFindData();
    EXPECT_EQ(Step(1), kErrInvalid);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Asserted(3229), Asserted(3234), Reported(kReasonInvalid, kAnySite)}));
}

TEST_F(IterateBadPath, AnInvalidPathThatStandsOnALeafIsAssertedOnly) {
    path_.valid = false;
    EXPECT_EQ(Step(0), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3229)});
}

TEST_F(IterateBadPath, LevelsOtherThanOneAreAssertedAndRefused) {
    for (const u32 level : {0u, 2u, 15u, 16u, 0xFFFFFFFFu}) {
        path_.level = level;
        EXPECT_EQ(Step(1), kErrInvalid);
        EXPECT_EQ(bench_.capture.Take(),
                  (Events{Asserted(3234), Reported(kReasonInvalid, kAnySite)}));
    }
}

TEST_F(IterateBadPath, APathClearedByAFlushIsRefused) {
    const HostKey key = NthHostKey(4, 3);
    bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr);
    EXPECT_EQ(bench_->Flush(0), kOk);
    u32 size = 0;
    EXPECT_EQ(bench_->IncPos(1, record_, 8, &size, nullptr, 0, nullptr, nullptr), kErrInvalid);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonInvalid, kAnySite)});
}

TEST_F(IterateBadPath, AnIndexPastTheLeafIsRefused) {
    for (const s32 index : {3, 4, 70000, 0x7FFFFFFF, -1, -0x7FFFFFFF - 1}) {
        path_.path[1].index = index;
        for (const int count : {-1, 0, 1, 0x7FFFFFFF}) {
            EXPECT_EQ(Step(count), kErrInvalid);
            EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonInvalid, kAnySite)});
        }
    }
}

TEST_F(IterateBadPath, AnEmptyLeafAtTheFrontLeavesNoUsablePosition) {
    path_.ClearPath();
    TreeImage image = SmallTree(512, 9);
    image.SetNode(1, NodeImage{.fLink = 2}.Build(512));
    bench_.volume.Disk(4) = image.bytes;
    bench_->Dtor();
    ASSERT_EQ(bench_->Init(), kOk);
    const HostKey key = NthHostKey(4, 0);
    bool found = true;
    bench_->FindEntry(key, key.id, &path_, &found, nullptr, nullptr, nullptr, nullptr);
    bench_.Forget();
    EXPECT_EQ(Step(-1), kErrNotFound);
    EXPECT_EQ(path_.path[1].index, -1);
    EXPECT_EQ(Step(1), kErrInvalid);
}

// ---- delivery

// Keys in folded order are delivered by a short way where nothing is out of the ordinary, keys in
// other orders never are: whatever the bytes, both come to the same.
struct DeliveryShape {
    u32 nodeSize;
    u32 dataSize;  // of 10 bytes: all in the first block; of more: the third key or data in two
};

struct Delivered {
    int status;
    Events events;
    Bytes key;
    Bytes record;

    bool operator==(const Delivered&) const = default;
};

class DeliverDamaged : public ::testing::TestWithParam<DeliveryShape> {
protected:
    static constexpr u32 kRecords = 4;

    static Delivered Deliver(const TreeImage& image, CompareKeysFn compare, s32 index) {
        Bench bench(Blocks(512));
        bench.Open(image);
        bench->compareKeys = compare;
        HfsFindData path;
        EXPECT_EQ(bench->ReadLevel(1, 1, &path), kOk);
        path.level = 1;
        path.valid = true;
        path.path[1].index = index;
        alignas(8) u8 key[kKeyLengthSize + kMaxKeyLength] = {};
        Bytes record(image.shape.nodeSize);
        u32 size = 0;
        u32 keySize = 0;
        const int status =
            bench->IncPos(0, record.data(), image.shape.nodeSize, &size, key, 40, &keySize, &path);
        path.ClearPath();
        record.resize(size);
        return {status, bench.capture.Take(), Bytes(key, key + keySize), record};
    }
};

TEST_P(DeliverDamaged, AnyWordReplaced) {
    const u32 nodeSize = GetParam().nodeSize;
    TreeShape shape;
    shape.nodeSize = nodeSize;
    shape.freeNodes = 1;
    const TreeImage sound = BuildTree(shape, NthRecords(4, kRecords, GetParam().dataSize));
    const u32 recordSize = 20 + GetParam().dataSize;
    u32 delivered = 0;
    for (u32 at = 10; at < nodeSize; at += 2) {
        const bool isData = at >= 14 && (at - 14) % recordSize >= 10;
        if (at < nodeSize - 2 * (kRecords + 1) && (isData || at >= 14 + kRecords * recordSize)) {
            continue;
        }
        for (const u32 value : {0u, 3u, 14u, 0xFFu, 0xFFFFu, 510u, 511u, 512u, 513u, 1024u}) {
            TreeImage image = sound;
            image.Patch16(1, at, value);
            for (s32 index = 0; index < static_cast<s32>(kRecords); ++index) {
                const Delivered folded = Deliver(image, CompareCatKeysCaseIns, index);
                ASSERT_TRUE(folded == Deliver(image, CompareCatKeysCaseBin, index))
                    << "byte " << at << " value " << value << " record " << index;
                delivered += folded.status == kOk ? 1 : 0;
            }
        }
    }
    EXPECT_GT(delivered, 500u);
}

INSTANTIATE_TEST_SUITE_P(Leaves, DeliverDamaged,
                         ::testing::Values(DeliveryShape{512, 10}, DeliveryShape{1024, 10},
                                           DeliveryShape{1024, 150}, DeliveryShape{1024, 220}));

}  // namespace
}  // namespace VELK::test
