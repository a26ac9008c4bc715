// Every service call under a volume with a journal fails in turn, the journal's permissions among
// them: after a restore the volume is as the last commit left it, and the same work done again
// gives the bytes of undisturbed work.
#include <gtest/gtest.h>

#include <functional>

#include "capture.h"
#include "cut_operations.h"
#include "fault_service.h"
#include "heap_guard.h"

namespace VELK {
namespace {

using test::CutVolume;
using test::Essence;

class JournalFaults : public testing::TestWithParam<u32> {
protected:
    void SetUp() override {
        test::CutBaseShape shape;
        shape.records = 24;
        base_ = test::MakeCutBase(shape);
        place_ = test::JournalOf(test::DeviceWith(base_.bytes).get());
        Mount();
        ASSERT_EQ(0, Work());
        after_ = Stands();
        Mount();
        before_ = Stands();
    }
    void Mount() {
        volume_.reset();
        device_ = test::DeviceWith(base_.bytes);
        Problem problem;
        volume_ = test::MountOn(device_.get(), test::Writing(), &problem);
        ASSERT_NE(nullptr, volume_) << problem.Text();
        ASSERT_NE(nullptr, volume_->Tree(kCatalogFileId, nullptr));
        ASSERT_NE(nullptr, volume_->Tree(kExtentsFileId, nullptr));
    }
    // The operation and its commit, in one transaction.
    int Work() {
        CutVolume on{volume_.get(), base_.numbers, [] { return 0; }};
        const int status = test::DoCutOperation(GetParam(), &on);
        return status == 0 ? volume_->Commit(0) : status;
    }
    std::vector<u8> Stands() { return Essence(test::BytesOf(device_.get()), place_); }

    // `arm` makes the nth call fail, `struck` says whether it came to that.
    void FailInTurn(const std::function<void(u32)>& arm, const std::function<bool()>& struck,
                    const std::function<void()>& disarm, bool forEver) {
        u32 failures = 0;
        for (u32 nth = 1;; ++nth) {
            arm(nth);
            const int status = Work();
            const bool hasStruck = struck();
            disarm();
            if (!hasStruck) {
                ASSERT_EQ(0, status);
                ASSERT_EQ(after_, Stands());
                break;
            }
            failures += 1;
            if (status != 0) {
                volume_->RestoreAfter(status);
                ASSERT_EQ(before_, Stands()) << nth;
                if (!volume_->IsWritable()) {
                    // A commit restores by itself, and that met the fault too.
                    ASSERT_TRUE(forEver) << nth;
                    Mount();
                }
                ASSERT_EQ(0, volume_->Commit(0)) << nth;
                ASSERT_EQ(before_, Stands()) << nth;
            } else {
                // Nothing depended on it: a hint, an allocation with another way out.
                ASSERT_EQ(after_, Stands()) << nth;
                Mount();
            }
        }
        EXPECT_GE(failures, 1u);
    }

    test::Capture capture_;
    test::HeapGuard heap_;
    test::CutBase base_;
    JournalPlace place_;
    std::unique_ptr<MemoryDevice> device_;
    std::unique_ptr<ImageVolume> volume_;
    std::vector<u8> before_;
    std::vector<u8> after_;
};

TEST_P(JournalFaults, EachServiceCallInTurn) {
    std::unique_ptr<test::FaultService> faults;
    for (const bool forEver : {false, true}) {
        FailInTurn(
            [&](u32 nth) {
                faults = std::make_unique<test::FaultService>(volume_->Fs());
                faults->FailAny(nth, test::kFaultStatus, forEver);
            },
            [&] { return faults->HasFailed(); }, [&] { faults.reset(); }, forEver);
        Mount();
    }
}

TEST_P(JournalFaults, EachPermissionInTurn) {
    for (const test::Call kind : {test::Call::kWriteAccess, test::Call::kCreateAccess}) {
        u32 nth = 1;
        for (bool hasStruck = true; hasStruck; ++nth) {
            int status = 0;
            {
                test::FaultService faults(volume_->Fs());
                faults.Fail(kind, nth, test::kFaultStatus);
                status = Work();
                hasStruck = faults.HasFailed();
            }
            if (hasStruck && status != 0) {
                ASSERT_EQ(test::kFaultStatus, status) << nth;
                volume_->RestoreAfter(status);
                ASSERT_EQ(before_, Stands()) << nth;
            } else {
                ASSERT_EQ(0, status);
                Mount();
            }
        }
    }
}

TEST_P(JournalFaults, EachAllocationInTurn) {
    FailInTurn([&](u32 nth) { heap_.FailNth(nth); }, [&] { return heap_.HasFailed(); },
               [&] { heap_.FailNone(); }, false);
}

// A second fault while the first is being recovered from, or in the work that is done again.
class PairsOfFaults : public JournalFaults {
protected:
    // Whether the second fault was met.
    bool SecondFault(u32 first, u32 second) {
        int status = 0;
        {
            test::FaultService faults(volume_->Fs());
            faults.FailAny(first);
            status = Work();
            EXPECT_TRUE(faults.HasFailed());
        }
        if (status == 0) {
            // Nothing depended on it.
            EXPECT_EQ(after_, Stands()) << first;
            Mount();
            return false;
        }
        bool hasStruck = false;
        {
            test::FaultService faults(volume_->Fs());
            faults.FailAny(second);
            volume_->RestoreAfter(status);
            EXPECT_EQ(before_, Stands()) << first << " " << second;
            status = Work();
            hasStruck = faults.HasFailed();
        }
        // A recovery may do without what it could not read.
        EXPECT_TRUE(hasStruck || status == 0) << first << " " << second;
        if (status != 0) {
            volume_->RestoreAfter(status);
            EXPECT_EQ(before_, Stands()) << first << " " << second;
            if (!volume_->IsWritable()) {
                Mount();
            }
            EXPECT_EQ(0, Work()) << first << " " << second;
        }
        EXPECT_EQ(after_, Stands()) << first << " " << second;
        Mount();
        return hasStruck;
    }
};

TEST_P(PairsOfFaults, AllOfThem) {
    u32 firsts = 0;
    {
        test::FaultService faults(volume_->Fs());
        ASSERT_EQ(0, Work());
        firsts = faults.Count();
    }
    Mount();
    u32 pairs = 0;
    for (u32 first = 1; first <= firsts; ++first) {
        for (u32 second = 1; SecondFault(first, second); ++second) {
            pairs += 1;
            ASSERT_FALSE(HasFailure());
        }
    }
    EXPECT_GT(pairs, 15u);
}

INSTANTIATE_TEST_SUITE_P(SmallestOperations, PairsOfFaults, testing::Values(0u, 3u, 6u, 7u, 9u));
INSTANTIATE_TEST_SUITE_P(Operations, JournalFaults, testing::Range(0u, test::kCutOperations));

}  // namespace
}  // namespace VELK
