// What a lookup delivers into the caller's buffers, and FindRecord.
#include <gtest/gtest.h>

#include <algorithm>

#include "bench.h"

namespace VELK::test {
namespace {

// Records of the catalog: keys of 20 bytes, data of 8.
class FindOutput : public ::testing::Test {
protected:
    FindOutput() : bench_(Blocks(512)) { bench_.Open(SmallTree(512)); }
    ~FindOutput() override { path_.ClearPath(); }

    // Looks record 3 up with these capacities; 0 with a null buffer.
    int Find(u32 recordCapacity, u32 keyCapacity, u32 n = 3) {
        const HostKey key = NthHostKey(4, n);
        recordSize_ = recordCapacity;
        keySize_ = keyCapacity;
        return bench_->FindEntry(key, key.id, &path_, &found_, wantRecord_ ? record_ : nullptr,
                                 &recordSize_, wantKey_ ? keyOut_ : nullptr, &keySize_);
    }
    Bytes Record(u32 size) const { return Bytes(record_, record_ + size); }
    Bytes Key(u32 size) const { return Bytes(keyOut_, keyOut_ + size); }

    Bench bench_;
    HfsFindData path_;
    bool found_ = false;
    bool wantRecord_ = true;
    bool wantKey_ = true;
    u32 recordSize_ = 0;
    u32 keySize_ = 0;
    u8 record_[64] = {};
    alignas(8) u8 keyOut_[kKeyLengthSize + kMaxKeyLength] = {};
};

const HostKey kKey3 = NthHostKey(4, 3);
const Bytes kHostKey3(kKey3.bytes, kKey3.bytes + 20);

TEST_F(FindOutput, BuffersOfTheRightSizeAssertNothing) {
    EXPECT_EQ(Find(8, 20), kOk);
    EXPECT_EQ(recordSize_, 8u);
    EXPECT_EQ(keySize_, 20u);
    EXPECT_EQ(Record(8), Pattern(8, 3));
    EXPECT_EQ(Key(20), kHostKey3);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Without a hook the caller gets the key as it lies in the node, however short it is. No two bytes
// of the name are alike, so that none can stand for another.
TEST(FindOutputAsStored, KeysOfEveryLength) {
    Bench bench(Blocks(512));
    TreeShape shape;
    std::vector<TreeRecord> records;
    std::u16string name;
    for (u32 units = 0; units < 40; ++units) {
        records.push_back({DiskCatKey(16, name), Pattern(4, units)});
        name.push_back(static_cast<char16_t>(0x2181 + 0x0101 * units));
    }
    bench.Open(BuildTree(shape, records));
    bench->convert.KeyToMemory = nullptr;
    HfsFindData path;
    for (u32 units = 0; units < 40; ++units) {
        const HostKey key = HostCatKey(16, name.substr(0, units));
        const Bytes stored = records[units].key;
        alignas(8) u8 room[128] = {};
        u32 size = static_cast<u32>(stored.size());
        bool found = false;
        ASSERT_EQ(bench->FindEntry(key, key.id, &path, &found, nullptr, nullptr, room, &size), kOk);
        ASSERT_TRUE(found);
        EXPECT_EQ(size, stored.size());
        EXPECT_EQ(Bytes(room, room + stored.size()), stored);
        EXPECT_EQ(room[stored.size()], 0);

        u8 data[4];
        u32 dataSize = 0;
        alignas(8) u8 walked[128] = {};
        ASSERT_EQ(bench->IncPos(0, data, sizeof data, &dataSize, walked,
                                static_cast<u32>(stored.size()), &size, &path),
                  kOk);
        EXPECT_EQ(Bytes(walked, walked + sizeof walked), Bytes(room, room + sizeof room));
    }
    path.ClearPath();
    EXPECT_EQ(bench.capture.Take(), Events{});
}

TEST(FindOutputAsStored, AWalkCutsKeysAtEveryByte) {
    Bench bench(Blocks(512));
    const Bytes stored = DiskCatKey(16, u"\u2181\u2282\u2383\u2484\u2585\u2686");
    bench.Open(BuildTree(TreeShape{}, {{stored, Pattern(4, 1)}}));
    bench->convert.KeyToMemory = nullptr;
    HfsFindData path;
    bool found = false;
    const HostKey key = HostCatKey(16, u"");
    ASSERT_EQ(bench->FindEntry(key, key.id, &path, &found, nullptr, nullptr, nullptr, nullptr),
              kOk);
    for (u32 capacity = 0; capacity < stored.size(); ++capacity) {
        u8 data[4];
        u32 dataSize = 0;
        u32 size = 0;
        alignas(8) u8 walked[32] = {};
        ASSERT_EQ(bench->IncPos(0, data, sizeof data, &dataSize, walked, capacity, &size, &path),
                  kOk);
        Bytes wanted(stored.begin(), stored.begin() + capacity);
        wanted.resize(sizeof walked);
        EXPECT_EQ(size, capacity);
        EXPECT_EQ(Bytes(walked, walked + sizeof walked), wanted);
        EXPECT_EQ(bench.capture.Take().front(), Asserted(3316));
    }
    path.ClearPath();
}

TEST_F(FindOutput, ASmallKeyBufferGetsTheWholeKeyAllTheSame) {
    EXPECT_EQ(Find(8, 5), kOk);
    EXPECT_EQ(keySize_, 5u);
    EXPECT_EQ(Key(20), kHostKey3);
    EXPECT_EQ(keyOut_[20], 0);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(FindOutput, ALargeKeyBufferIsAsserted) {
    EXPECT_EQ(Find(8, 21), kOk);
    EXPECT_EQ(keySize_, 20u);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3039)});
}

TEST_F(FindOutput, AKeyBufferBelowTheHooksMinimumIsAsserted) {
    bench_->convert.minKeyBuffer = 21;
    EXPECT_EQ(Find(8, 20), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3040)});
}

TEST_F(FindOutput, ASmallRecordBufferIsAssertedAndFilled) {
    EXPECT_EQ(Find(6, 20), kOk);
    EXPECT_EQ(recordSize_, 6u);
    Bytes expected = Pattern(8, 3);
    std::fill(expected.begin() + 6, expected.end(), u8{0});
    EXPECT_EQ(Record(8), expected);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3051)});
}

TEST_F(FindOutput, ALargeRecordBufferGetsTheRecordsSize) {
    EXPECT_EQ(Find(64, 20), kOk);
    EXPECT_EQ(recordSize_, 8u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(FindOutput, ARecordBufferBelowTheHooksMinimumIsAsserted) {
    bench_->convert.minDataBuffer = 9;
    EXPECT_EQ(Find(8, 20), kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(3052)});
}

TEST_F(FindOutput, TheKeyIsDeliveredBeforeTheRecord) {
    bench_->convert.minKeyBuffer = 64;
    bench_->convert.minDataBuffer = 64;
    EXPECT_EQ(Find(7, 21), kOk);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Asserted(3039), Asserted(3040), Asserted(3051), Asserted(3052)}));
}

TEST_F(FindOutput, NullBuffersAreNotWanted) {
    wantRecord_ = wantKey_ = false;
    EXPECT_EQ(Find(3, 4), kOk);
    EXPECT_TRUE(found_);
    EXPECT_EQ(recordSize_, 3u);
    EXPECT_EQ(keySize_, 4u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(FindOutput, AnAbsentKeyDeliversNothing) {
    const HostKey key = NthHostKey(4, 3, true);
    u32 size = 8;
    u32 keySize = 20;
    EXPECT_EQ(bench_->FindEntry(key, key.id, &path_, &found_, record_, &size, keyOut_, &keySize),
              kOk);
    EXPECT_FALSE(found_);
    EXPECT_EQ(size, 8u);
    EXPECT_EQ(keySize, 20u);
    EXPECT_EQ(Record(8), Bytes(8));
    EXPECT_EQ(Key(20), Bytes(20));
}

TEST_F(FindOutput, AnEqualIndexKeyDeliversOnlyTheLeafRecord) {
    EXPECT_EQ(Find(8, 20, 2), kOk);  // first of leaf 2: its key stands in the root too
    EXPECT_EQ(recordSize_, 8u);
    EXPECT_EQ(Record(8), Pattern(8, 2));
}

TEST_F(FindOutput, AMisalignedKeyBufferIsAssertedAndFilled) {
    const HostKey key = NthHostKey(4, 3);
    u32 size = 20;
    EXPECT_EQ(bench_->FindEntry(key, key.id, &path_, &found_, nullptr, nullptr, keyOut_ + 4, &size),
              kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2963)});
    EXPECT_EQ(Bytes(keyOut_ + 4, keyOut_ + 24), kHostKey3);
}

TEST_F(FindOutput, AMisalignedKeyBufferIsAssertedOnAnEmptyTreeToo) {
    bench_->header.treeDepth = 0;
    const HostKey key = NthHostKey(4, 3);
    u32 size = 20;
    EXPECT_EQ(bench_->FindEntry(key, key.id, &path_, &found_, nullptr, nullptr, keyOut_ + 1, &size),
              kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2963)});
}

TEST_F(FindOutput, MissingHooksCopyTheBytes) {
    bench_->convert = {};
    EXPECT_EQ(Find(8, 20), kOk);
    EXPECT_EQ(Record(8), Pattern(8, 3));
    EXPECT_EQ(Key(20), NthDiskKey(4, 3));
}

// Sizes the hooks were called with.
u32 hookKeySize;
u32 hookDataSize;
void NoteKey(void* /*target*/, const void* /*source*/, unsigned size) {
    hookKeySize = size;
}
void NoteData(void* /*target*/, const void* /*source*/, unsigned size) {
    hookDataSize = size;
}

TEST_F(FindOutput, HooksGetTheWholeKeyAndTheCutRecord) {
    bench_->convert.KeyToMemory = NoteKey;
    bench_->convert.DataToMemory = NoteData;
    EXPECT_EQ(Find(6, 5), kOk);
    EXPECT_EQ(hookKeySize, 20u);
    EXPECT_EQ(hookDataSize, 6u);
}

TEST_F(FindOutput, TheSearchArgumentReachesTheComparator) {
    HostKey key = NthHostKey(4, 3);
    EXPECT_EQ(
        bench_->FindEntry(key, key.id + 1, &path_, &found_, nullptr, nullptr, nullptr, nullptr),
        kOk);
    EXPECT_FALSE(found_);
}

// ---- FindRecord

TEST_F(FindOutput, FindRecordDeliversTheRecord) {
    u32 size = 0;
    EXPECT_EQ(bench_->FindRecord(kKey3.Get(), kKey3.id, record_, 8, &size, &path_), kOk);
    EXPECT_EQ(size, 8u);
    EXPECT_EQ(Record(8), Pattern(8, 3));
    EXPECT_EQ(References(path_), 2u);
}

TEST_F(FindOutput, FindRecordOfAnAbsentKeyIsNotReported) {
    const HostKey key = NthHostKey(4, 3, true);
    u32 size = 0;
    EXPECT_EQ(bench_->FindRecord(key.Get(), key.id, record_, 8, &size, &path_), kErrNotFound);
    EXPECT_EQ(size, 8u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_F(FindOutput, FindRecordWithoutABufferLeavesTheSize) {
    u32 size = 77;
    EXPECT_EQ(bench_->FindRecord(kKey3.Get(), kKey3.id, nullptr, 8, &size, &path_), kOk);
    EXPECT_EQ(size, 77u);
}

TEST_F(FindOutput, FindRecordReportsAFailure) {
    bench_.faults.Fail(Call::kMap, 1);
    u32 size = 0;
    EXPECT_EQ(bench_->FindRecord(kKey3.Get(), kKey3.id, record_, 8, &size, &path_), kFaultStatus);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 2909),
                      Reported(kFaultStatus, 2982), Reported(kFaultStatus, 3126)}));
}

TEST_F(FindOutput, NoRoomForTheRecordGetsNothingOfIt) {
    bench_->convert.DataToMemory = nullptr;
    record_[0] = 0x77;
    EXPECT_EQ(Find(0, 20), kOk);
    EXPECT_EQ(recordSize_, 0u);
    EXPECT_EQ(record_[0], 0x77);
}

}  // namespace
}  // namespace VELK::test
