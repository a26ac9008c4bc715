// Every service call and every allocation of a piece of work fails in turn: the volume is then as
// it was at the last commit, byte for byte, and the same work done again gives the bytes of
// undisturbed work.
#include <gtest/gtest.h>

#include <functional>

#include "capture.h"
#include "fault_service.h"
#include "heap_guard.h"
#include "hfs/volume/make_volume.h"
#include "hfs/volume/volume_header.h"
#include "small_volume.h"

namespace VELK {
namespace {

constexpr u64 kSize = 512 << 10;

using test::NumberKey;

std::unique_ptr<ImageVolume> Start() {
    FormatOptions options;
    options.blockSize = 512;
    options.catalogNodeSize = 1024;
    options.extentsNodeSize = 512;
    options.attributesNodeSize = 1024;
    options.clumpSize = 1024;
    Problem problem;
    auto volume = MakeMemoryVolume(kSize, options, &problem);
    EXPECT_NE(nullptr, volume) << problem.Text();
    return volume;
}

std::vector<u8> Bytes(ImageVolume* volume) {
    std::vector<u8> bytes(kSize);
    EXPECT_EQ(0, volume->ReadVolume(0, bytes.data(), bytes.size()));
    return bytes;
}

int Insert(CBTreeHfs* tree, u32 number) {
    const NumberKey key(number);
    const u8 data[200] = {0xFF, 0xFF};
    return tree->InsertRecord(key.bytes, number, data, sizeof data);
}

constexpr u32 kInserted = 180;  // no multiple of 7

// Splits, growth of two forks in turn until they need overflow records, deletion, a commit.
int Work(ImageVolume* volume) {
    CBTreeHfs* catalog = volume->Tree(kCatalogFileId, nullptr);
    CBTreeHfs* attributes = volume->Tree(kAttributesFileId, nullptr);
    if (catalog == nullptr || attributes == nullptr) {
        return kErrVolumeIo;
    }
    int status = 0;
    for (u32 i = 0; i < kInserted && status == 0; ++i) {
        status = Insert(catalog, 100 + i * 7 % kInserted);
        if (status == 0 && i % 5 == 0) {
            status = attributes->ExtendBTree(attributes->header.totalNodes + 1, nullptr, nullptr);
        }
        if (status == 0 && i % 5 == 0) {
            status = catalog->ExtendBTree(catalog->header.totalNodes + 1, nullptr, nullptr);
        }
    }
    for (u32 i = 0; i < 20 && status == 0; ++i) {
        const NumberKey key(100 + i);
        status = catalog->DeleteRecord(key.bytes, 100 + i, false);
    }
    return status == 0 ? volume->Commit(0) : status;
}

// Work on a fresh volume with one fault, for each fault in turn. `arm` makes the nth call fail,
// `struck` says whether it came to that.
void FailInTurn(const std::function<void(u32)>& arm, const std::function<bool()>& struck,
                const std::function<void()>& disarm, ImageVolume* volume,
                const std::vector<u8>& before, const std::vector<u8>& after) {
    u32 faults = 0;
    for (u32 nth = 1;; ++nth) {
        arm(nth);
        const int status = Work(volume);
        const bool failed = struck();
        disarm();
        if (!failed) {
            ASSERT_EQ(0, status);
            ASSERT_EQ(after, Bytes(volume));
            break;
        }
        faults += 1;
        ASSERT_NE(0, status) << nth;
        volume->RestoreAfter(status);
        ASSERT_EQ(before, Bytes(volume)) << nth;
        ASSERT_TRUE(volume->IsWritable()) << nth;
        ASSERT_EQ(0, volume->Commit(0)) << nth;
        ASSERT_EQ(before, Bytes(volume)) << nth;
    }
    EXPECT_GT(faults, 100u);
}

class Faults : public testing::Test {
protected:
    void SetUp() override {
        auto undisturbed = Start();
        ASSERT_EQ(0, Work(undisturbed.get()));
        after_ = Bytes(undisturbed.get());
        ASSERT_GT(undisturbed->ForkExtents(kCatalogFileId).size(), 8u);
        undisturbed.reset();
        volume_ = Start();
        before_ = Bytes(volume_.get());
    }
    test::Capture capture_;
    test::HeapGuard heap_;
    std::vector<u8> before_;
    std::vector<u8> after_;
    std::unique_ptr<ImageVolume> volume_;
};

TEST_F(Faults, EachServiceCallInTurn) {
    test::FaultService faults(volume_->Fs());
    FailInTurn([&](u32 nth) { faults.FailAny(nth); }, [&] { return faults.HasFailed(); },
               [&] { faults.FailNone(); }, volume_.get(), before_, after_);
}

TEST_F(Faults, EachAllocationInTurn) {
    FailInTurn([&](u32 nth) { heap_.FailNth(nth); }, [&] { return heap_.HasFailed(); },
               [&] { heap_.FailNone(); }, volume_.get(), before_, after_);
}

// The restore itself meets the fault: the volume then takes no more changes.
TEST_F(Faults, RestoreWithoutMemoryEndsWriting) {
    ASSERT_EQ(0, Insert(volume_->Tree(kCatalogFileId, nullptr), 500));
    heap_.FailNth(1, true);
    volume_->Restore();
    heap_.FailNone();
    EXPECT_FALSE(volume_->IsWritable());
    EXPECT_EQ(kErrVolumeReadOnly, volume_->Commit(0));
    EXPECT_EQ(before_, Bytes(volume_.get()));
}

}  // namespace
}  // namespace VELK
