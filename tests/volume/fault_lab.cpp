// Arming, mounting, and what has to stand after a failure.
#include "fault_lab.h"

#include <gtest/gtest.h>

namespace VELK::test {

namespace {

constexpr const char* kServiceNames[] = {"Map",    "DirtyMeta", "WriteAccess", "CreateAccess",
                                         "Resize", "Zero",      "Allocation",  "Read",
                                         "Write",  "Sync"};

bool IsOfEngine(Service service) {
    return service < Service::kAllocation;
}

Call CallOf(Service service) {
    constexpr Call kCalls[] = {Call::kMap,          Call::kDirtyMeta, Call::kWriteAccess,
                               Call::kCreateAccess, Call::kResize,    Call::kZero};
    return kCalls[static_cast<int>(service)];
}

}  // namespace

const char* NameOf(Service service) {
    return kServiceNames[static_cast<int>(service)];
}

bool IsOfDevice(Service service) {
    return service >= Service::kRead;
}

int StatusOf(Service service) {
    return service == Service::kAllocation ? kErrNoMemory
           : IsOfDevice(service)           ? kErrVolumeIo
                                           : kFaultStatus;
}

FaultLab::FaultLab(const std::vector<u8>& base, const FaultScenario& scenario)
    : scenario_(scenario), device_(DeviceWith(base)) {
    if (!Mounts(scenario_)) {
        EXPECT_EQ(kOk, Mount());
    }
}

void FaultLab::Unmount() {
    callsStruck_ = callsStruck_ || (calls_ != nullptr && calls_->HasFailed());
    calls_.reset();
    volume_.reset();
}

int FaultLab::Mount() {
    Unmount();
    faulty_ = std::make_unique<FaultyDevice>(device_.get(), &faults_);
    Problem problem;
    volume_ = MountOn(faulty_.get(), Writing(), &problem);
    if (volume_ == nullptr) {
        EXPECT_NE(0, problem.status) << problem.Text();
        return problem.status;
    }
    calls_ = std::make_unique<FaultService>(volume_->Fs());
    ArmCalls();
    return kOk;
}

void FaultLab::ArmCalls() {
    if (isArmed_ && IsOfEngine(armed_.service) && calls_ != nullptr &&
        (!callsStruck_ || armed_.forEver)) {
        calls_->Fail(CallOf(armed_.service), armed_.nth, kFaultStatus, armed_.forEver);
    }
}

void FaultLab::Arm(const Fault& fault) {
    armed_ = fault;
    isArmed_ = true;
    callsStruck_ = false;
    faults_.hasFailed = false;
    faults_.forEver = fault.forEver;
    switch (fault.service) {
        case Service::kAllocation:
            heap_.FailNth(fault.nth, fault.forEver);
            break;
        case Service::kRead:
            faults_.failRead = faults_.reads + fault.nth;
            break;
        case Service::kWrite:
            faults_.failWrite = faults_.writes + fault.nth;
            break;
        case Service::kSync:
            faults_.failSync = faults_.syncs + fault.nth;
            break;
        default:
            ArmCalls();
    }
}

bool FaultLab::Disarm() {
    bool hasStruck = faults_.hasFailed;
    if (armed_.service == Service::kAllocation) {
        hasStruck = heap_.HasFailed();
    } else if (IsOfEngine(armed_.service)) {
        hasStruck = callsStruck_ || (calls_ != nullptr && calls_->HasFailed());
    }
    isArmed_ = false;
    heap_.FailNone();
    if (calls_ != nullptr) {
        calls_->FailNone();
    }
    faults_.failRead = 0;
    faults_.failWrite = 0;
    faults_.failSync = 0;
    return hasStruck;
}

FaultCase::FaultCase(const FaultScenario& scenario)
    : scenario_(scenario),
      base_(MakeFaultBase(scenario)),
      place_(JournalOf(DeviceWith(base_).get())),
      before_(Essence(base_, place_)) {
    FaultLab lab = NewLab();
    EXPECT_EQ(kOk, lab.Begin());
    EXPECT_EQ(kOk, lab.Work());
    after_ = Stands(&lab);
}

void FaultCase::JudgeRecovery(FaultLab* lab, bool deviceFailed) const {
    if (deviceFailed || lab->Volume() == nullptr) {
        // The next mount shows which it is.
        ASSERT_EQ(kOk, lab->Mount());
        if (IsDone(lab)) {
            return;
        }
    }
    ASSERT_TRUE(IsBefore(lab));
    ASSERT_FALSE(Mounts(scenario_));
    if (!lab->Volume()->IsWritable() || scenario_.needsFreshMount) {
        ASSERT_EQ(kOk, lab->Mount());
    }
    ASSERT_EQ(kOk, lab->Begin());
    ASSERT_EQ(kOk, lab->Work());
    ASSERT_TRUE(IsAfter(lab));
}

}  // namespace VELK::test
