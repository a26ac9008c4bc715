// A small volume under which everything that can fail does so when told to: the services the engine
// calls, its heap, and the transfers of the device.
#pragma once

#include "fault_scenarios.h"
#include "fault_service.h"
#include "heap_guard.h"
#include "recording_device.h"

namespace VELK::test {

enum class Service {
    kMap,
    kDirtyMeta,
    kWriteAccess,
    kCreateAccess,
    kResize,
    kZero,
    kAllocation,
    kRead,
    kWrite,
    kSync,
};
constexpr Service kServices[] = {Service::kMap,          Service::kDirtyMeta, Service::kWriteAccess,
                                 Service::kCreateAccess, Service::kResize,    Service::kZero,
                                 Service::kAllocation,   Service::kRead,      Service::kWrite,
                                 Service::kSync};

const char* NameOf(Service service);
bool IsOfDevice(Service service);  // reads, writes and syncs of the medium
int StatusOf(Service service);     // what a failing call of it gives

// The nth call of a service fails, n counting from 1.
struct Fault {
    Service service = Service::kMap;
    u32 nth = 1;
    bool forEver = false;  // and every call after it
};

class FaultLab {
public:
    // The scenario's volume, mounted unless its work is mounting.
    FaultLab(const std::vector<u8>& base, const FaultScenario& scenario);

    // Takes the volume up anew: 0 or why it cannot be.
    int Mount();
    int Begin() { return scenario_.begin(volume_.get()); }
    int Work() { return Mounts(scenario_) ? Mount() : scenario_.work(volume_.get()); }

    // From now on the fault is waited for. One of the engine's services is counted anew in a volume
    // that is mounted meanwhile.
    void Arm(const Fault& fault);
    // Whether it was met; from here on everything works again.
    bool Disarm();

    ImageVolume* Volume() { return volume_.get(); }  // null: not mounted
    std::vector<u8> Medium() { return BytesOf(device_.get()); }

private:
    void ArmCalls();
    void Unmount();

    const FaultScenario& scenario_;
    HeapGuard heap_;
    std::unique_ptr<MemoryDevice> device_;
    DeviceFaults faults_;
    std::unique_ptr<FaultyDevice> faulty_;
    std::unique_ptr<ImageVolume> volume_;
    std::unique_ptr<FaultService> calls_;
    Fault armed_;
    bool isArmed_ = false;
    bool callsStruck_ = false;  // in a volume that was unmounted since
};

// A scenario with what its volume holds before the work and after it, compared without what may
// differ (see Essence).
class FaultCase {
public:
    explicit FaultCase(const FaultScenario& scenario);

    const FaultScenario& Scenario() const { return scenario_; }
    FaultLab NewLab() const { return FaultLab(base_, scenario_); }
    std::vector<u8> Stands(FaultLab* lab) const { return Essence(lab->Medium(), place_); }
    bool IsBefore(FaultLab* lab) const { return Stands(lab) == before_; }
    bool IsAfter(FaultLab* lab) const { return Stands(lab) == after_; }
    // Whether the work has changed the volume already, so that it cannot be done again.
    bool IsDone(FaultLab* lab) const { return before_ != after_ && IsAfter(lab); }
    // After a failure, with everything working again and the volume restored: the medium holds the
    // last commit or, where the device failed, this one; what is left to do gives the bytes of
    // undisturbed work.
    void JudgeRecovery(FaultLab* lab, bool deviceFailed) const;

private:
    const FaultScenario& scenario_;
    std::vector<u8> base_;
    JournalPlace place_;
    std::vector<u8> before_;
    std::vector<u8> after_;
};

}  // namespace VELK::test
