// Every call of every service, and every allocation, fails in turn under each scenario, once and
// from then on. The status is the injected one, the report lines are those of the table beside this
// file, nothing leaks, no reference stays; after the recovery the medium holds the last committed
// state, and the same work done again gives the bytes of undisturbed work.
//
// TREEHFS_WRITE_REPORTS=FILE writes the table of report lines that were seen.
#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <set>

#include "capture.h"
#include "fault_scenarios.h"
#include "fault_service.h"
#include "heap_guard.h"
#include "ledger.h"
#include "recording_device.h"

namespace VELK {
namespace {

using test::Call;
using test::DeviceFaults;
using test::FaultScenario;

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
constexpr const char* kServiceNames[] = {"Map",    "DirtyMeta", "WriteAccess", "CreateAccess",
                                         "Resize", "Zero",      "Allocation",  "Read",
                                         "Write",  "Sync"};
constexpr Service kServices[] = {Service::kMap,          Service::kDirtyMeta, Service::kWriteAccess,
                                 Service::kCreateAccess, Service::kResize,    Service::kZero,
                                 Service::kAllocation,   Service::kRead,      Service::kWrite,
                                 Service::kSync};

bool IsOfDevice(Service service) {
    return service >= Service::kRead;
}

int StatusOf(Service service) {
    return service == Service::kAllocation ? kErrNoMemory
           : IsOfDevice(service)           ? kErrVolumeIo
                                           : test::kFaultStatus;
}

Call CallOf(Service service) {
    constexpr Call kCalls[] = {Call::kMap,          Call::kDirtyMeta, Call::kWriteAccess,
                               Call::kCreateAccess, Call::kResize,    Call::kZero};
    return kCalls[static_cast<int>(service)];
}

// A volume with everything under it that can fail.
class Lab {
public:
    Lab(const std::vector<u8>& base, const FaultScenario& scenario)
        : scenario_(scenario), device_(test::DeviceWith(base)) {
        Mount();
    }

    // Takes the volume up anew, on a medium that works.
    void Mount() {
        calls_.reset();
        volume_.reset();
        faults_ = DeviceFaults{};
        faulty_ = std::make_unique<test::FaultyDevice>(device_.get(), &faults_);
        Problem problem;
        volume_ = test::MountOn(faulty_.get(), test::Writing(), &problem);
        ASSERT_NE(nullptr, volume_) << problem.Text();
        calls_ = std::make_unique<test::FaultService>(volume_->Fs());
    }
    int Begin() { return scenario_.begin(volume_.get()); }
    int Work() { return scenario_.work(volume_.get()); }

    void Arm(Service service, u32 nth, bool forEver) {
        faults_.forEver = forEver;
        switch (service) {
            case Service::kAllocation:
                heap_.FailNth(nth, forEver);
                break;
            case Service::kRead:
                faults_.failRead = faults_.reads + nth;
                break;
            case Service::kWrite:
                faults_.failWrite = faults_.writes + nth;
                break;
            case Service::kSync:
                faults_.failSync = faults_.syncs + nth;
                break;
            default:
                calls_->Fail(CallOf(service), nth, test::kFaultStatus, forEver);
        }
    }
    // Whether a failure was met; from here on everything works again.
    bool Disarm() {
        const bool hasStruck = heap_.HasFailed() || faults_.hasFailed || calls_->HasFailed();
        heap_.FailNone();
        calls_->FailNone();
        faults_.failRead = 0;
        faults_.failWrite = 0;
        faults_.failSync = 0;
        return hasStruck;
    }

    ImageVolume* Volume() { return volume_.get(); }
    std::vector<u8> Medium() { return test::BytesOf(device_.get()); }

private:
    const FaultScenario& scenario_;
    test::HeapGuard heap_;
    std::unique_ptr<MemoryDevice> device_;
    DeviceFaults faults_;
    std::unique_ptr<test::FaultyDevice> faulty_;
    std::unique_ptr<ImageVolume> volume_;
    std::unique_ptr<test::FaultService> calls_;
};

// Report lines by what failed: "Split Map: 2916 2982 3012".
class ReportTable {
public:
    static std::set<std::string> Read() {
        std::ifstream file(TREEHFS_FAULT_REPORTS);
        std::set<std::string> lines;
        for (std::string line; std::getline(file, line);) {
            if (!line.empty() && line[0] != '#') {
                lines.insert(line);
            }
        }
        return lines;
    }
    static void Write(const std::set<std::string>& lines) {
        if (const char* path = std::getenv("TREEHFS_WRITE_REPORTS")) {
            std::ofstream file(path, std::ios::app);
            for (const std::string& line : lines) {
                file << line << "\n";
            }
        }
    }
};

class FaultTable : public testing::TestWithParam<u32> {
protected:
    void SetUp() override {
        base_ = test::MakeFaultBase(Scenario());
        place_ = test::JournalOf(test::DeviceWith(base_).get());
        before_ = test::Essence(base_, place_);
        Lab lab(base_, Scenario());
        ASSERT_EQ(kOk, lab.Begin());
        ASSERT_EQ(kOk, lab.Work());
        after_ = test::Essence(lab.Medium(), place_);
        capture_.Take();
    }
    const FaultScenario& Scenario() const { return test::kFaultScenario[GetParam()]; }

    // Fails the nth call; false when it never came to that.
    bool FailNth(Service service, u32 nth, bool forEver) {
        Lab lab(base_, Scenario());
        EXPECT_EQ(kOk, lab.Begin());
        capture_.Take();
        lab.Arm(service, nth, forEver);
        const int status = lab.Work();
        const bool hasStruck = lab.Disarm();
        if (!hasStruck) {
            EXPECT_EQ(kOk, status);
            EXPECT_EQ(after_, test::Essence(lab.Medium(), place_));
            return false;
        }
        JudgeReports(service, status, forEver);
        if (status == kOk) {
            // Nothing depended on it: a hint, memory that can be done without.
            EXPECT_EQ(after_, test::Essence(lab.Medium(), place_));
            return true;
        }
        EXPECT_TRUE(status == StatusOf(service) || IsRestore()) << StatusText(status);
        lab.Volume()->RestoreAfter(status);
        JudgeReferences(lab.Volume());
        JudgeRecovery(&lab, service);
        return true;
    }

    bool IsRestore() const { return std::string(Scenario().name) == "Restore"; }
    bool IsOpen() const { return std::string(Scenario().name) == "Open"; }

    void JudgeReports(Service service, int status, bool forEver) {
        std::string line = std::string(Scenario().name) + " " +
                           kServiceNames[static_cast<int>(service)] + ":" +
                           (status == kOk ? " passed" : "");
        for (const test::Event& event : capture_.Take()) {
            if (event.kind == test::Event::Kind::kReport) {
                EXPECT_EQ(static_cast<u32>(StatusOf(service)), event.code) << event.site;
                line += " " + std::to_string(event.site);
            } else if (event.kind == test::Event::Kind::kAssertion) {
                line += " assert " + std::to_string(event.site);
            }
        }
        // What goes on failing fails in the recovery too: other lines follow.
        if (!forEver) {
            seen_.insert(line);
        }
    }

    static void JudgeReferences(ImageVolume* volume) {
        for (const u32 fileId : {kExtentsFileId, kCatalogFileId, kAttributesFileId}) {
            if (const CBTreeHfs* tree = volume->OpenTree(fileId)) {
                EXPECT_TRUE(test::LedgerHolds(*tree, 0)) << fileId;
            }
        }
    }

    void JudgeRecovery(Lab* lab, Service service) {
        std::vector<u8> stands = test::Essence(lab->Medium(), place_);
        if (IsOfDevice(service)) {
            // The commit under way stands or not: the next mount shows which.
            lab->Mount();
            stands = test::Essence(lab->Medium(), place_);
            if (stands == after_) {
                return;
            }
        }
        ASSERT_EQ(before_, stands);
        if (!lab->Volume()->IsWritable() || IsOpen()) {
            lab->Mount();
        }
        ASSERT_EQ(kOk, lab->Begin());
        ASSERT_EQ(kOk, lab->Work());
        ASSERT_EQ(after_, test::Essence(lab->Medium(), place_));
    }

    test::Capture capture_;
    std::vector<u8> base_;
    JournalPlace place_;
    std::vector<u8> before_;
    std::vector<u8> after_;
    std::set<std::string> seen_;
};

TEST_P(FaultTable, EachCallOfEachServiceInTurn) {
    u32 failures = 0;
    for (const Service service : kServices) {
        for (const bool forEver : {false, true}) {
            u32 nth = 1;
            for (; FailNth(service, nth, forEver); ++nth) {
                ASSERT_FALSE(HasFailure())
                    << Scenario().name << " " << kServiceNames[static_cast<int>(service)] << " "
                    << nth << (forEver ? " and from then on" : "");
            }
            failures += nth - 1;
        }
    }
    EXPECT_GT(failures, 5u);
    ReportTable::Write(seen_);
    std::set<std::string> expected;
    for (const std::string& line : ReportTable::Read()) {
        if (line.starts_with(std::string(Scenario().name) + " ")) {
            expected.insert(line);
        }
    }
    EXPECT_EQ(expected, seen_);
}

INSTANTIATE_TEST_SUITE_P(Scenarios, FaultTable, testing::Range(0u, test::kFaultScenarios),
                         [](const testing::TestParamInfo<u32>& param) {
                             return std::string(test::kFaultScenario[param.param].name);
                         });

}  // namespace
}  // namespace VELK
