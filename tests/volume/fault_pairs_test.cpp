// A second failure while the first one is being recovered from, or in the work that is done again:
// every call of every service, every allocation and every transfer of the device, in pairs, under
// the smallest scenarios, the second one once and from then on. Whatever comes together, the medium
// holds the last commit or the one under way, and what is left to do gives the bytes of undisturbed
// work.
#include <gtest/gtest.h>

#include "capture.h"
#include "fault_lab.h"

namespace VELK {
namespace {

using test::Fault;
using test::FaultLab;
using test::Service;

class FaultPairs : public testing::TestWithParam<u32> {
protected:
    FaultPairs() : case_(test::kFaultScenario[GetParam()]) {}

    // Runs the work into the first failure; its status. `*lab` is as the failure left it.
    int FailFirst(FaultLab* lab, const Fault& first, bool* hasStruck) {
        EXPECT_EQ(kOk, lab->Begin());
        lab->Arm(first);
        const int status = lab->Work();
        *hasStruck = lab->Disarm();
        return status;
    }

    // What a caller does after `status`: restores, mounts anew where the volume has ended writing,
    // and does again what is not done yet.
    int Recover(FaultLab* lab, int status, bool deviceFailed) {
        if (lab->Volume() != nullptr) {
            lab->Volume()->RestoreAfter(status);
        }
        const bool mustMount = lab->Volume() == nullptr || !lab->Volume()->IsWritable() ||
                               deviceFailed || case_.Scenario().needsFreshMount;
        status = mustMount ? lab->Mount() : kOk;
        if (status != kOk || case_.IsDone(lab)) {
            return status;
        }
        status = lab->Begin();
        return status == kOk ? lab->Work() : status;
    }

    // A tree that could not be opened stays closed until the next mount.
    static bool HasClosedTree(ImageVolume* volume) {
        bool isClosed = false;
        for (const u32 fileId : {kExtentsFileId, kCatalogFileId, kAttributesFileId}) {
            isClosed = isClosed || (volume->HasTree(fileId) && volume->OpenTree(fileId) == nullptr);
        }
        return isClosed;
    }

    // False when it never came to the second failure.
    bool FailBoth(const Fault& first, const Fault& second) {
        FaultLab lab = case_.NewLab();
        bool hasStruck = false;
        const int status = FailFirst(&lab, first, &hasStruck);
        EXPECT_TRUE(hasStruck);
        lab.Arm(second);
        const int again = Recover(&lab, status, IsOfDevice(first.service));
        hasStruck = lab.Disarm();
        if (again == kOk) {
            EXPECT_TRUE(case_.IsAfter(&lab));
            return hasStruck;
        }
        EXPECT_TRUE(hasStruck) << StatusText(again);
        if (lab.Volume() != nullptr) {
            lab.Volume()->RestoreAfter(again);
            if (second.forEver && HasClosedTree(lab.Volume())) {
                EXPECT_EQ(kOk, lab.Mount());
            }
        }
        case_.JudgeRecovery(&lab, IsOfDevice(first.service) || IsOfDevice(second.service));
        return true;
    }

    // Follows a first failure by each second one. False when it never came to the first.
    bool FollowUp(const Fault& first) {
        FaultLab lab = case_.NewLab();
        bool hasStruck = false;
        const int status = FailFirst(&lab, first, &hasStruck);
        if (!hasStruck) {
            return false;
        }
        firsts_ += 1;
        if (status == kOk) {
            return true;  // nothing depended on it, so there is nothing to recover from
        }
        for (const Service service : test::kServices) {
            for (const bool forEver : {false, true}) {
                for (u32 nth = 1; FailBoth(first, {service, nth, forEver}); ++nth) {
                    pairs_ += 1;
                    if (HasFailure()) {
                        ADD_FAILURE() << case_.Scenario().name << ": " << NameOf(first.service)
                                      << " " << first.nth << ", then " << NameOf(service) << " "
                                      << nth << (forEver ? " and from then on" : "");
                        return false;
                    }
                }
            }
        }
        return true;
    }

    test::Capture capture_;
    test::FaultCase case_;
    u32 firsts_ = 0;
    u32 pairs_ = 0;
};

TEST_P(FaultPairs, ASecondFailureInTheRecovery) {
    for (const Service service : test::kServices) {
        for (u32 nth = 1; FollowUp({service, nth}); ++nth) {
        }
        ASSERT_FALSE(HasFailure());
    }
    RecordProperty("pairs", static_cast<int>(pairs_));
    EXPECT_GT(firsts_, 15u);
    EXPECT_GT(pairs_, 500u);
}

INSTANTIATE_TEST_SUITE_P(SmallestScenarios, FaultPairs,
                         testing::Range(0u, test::kSmallestScenarios),
                         [](const testing::TestParamInfo<u32>& param) {
                             return std::string(test::kFaultScenario[param.param].name);
                         });

}  // namespace
}  // namespace VELK
