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
#include "fault_lab.h"
#include "ledger.h"

namespace VELK {
namespace {

using test::Fault;
using test::FaultLab;
using test::Service;

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
    FaultTable() : case_(test::kFaultScenario[GetParam()]) { capture_.Take(); }

    const char* Name() const { return case_.Scenario().name; }

    // False when it never came to the failure.
    bool Fail(const Fault& fault) {
        FaultLab lab = case_.NewLab();
        EXPECT_EQ(kOk, lab.Begin());
        capture_.Take();
        lab.Arm(fault);
        const int status = lab.Work();
        const bool hasStruck = lab.Disarm();
        if (!hasStruck) {
            EXPECT_EQ(kOk, status);
            EXPECT_TRUE(case_.IsAfter(&lab));
            return false;
        }
        JudgeReports(fault, status);
        if (status == kOk) {
            // Nothing depended on it: a hint, memory that can be done without.
            EXPECT_TRUE(case_.IsAfter(&lab));
            return true;
        }
        EXPECT_TRUE(status == StatusOf(fault.service) || IsRestore()) << StatusText(status);
        if (lab.Volume() != nullptr) {
            lab.Volume()->RestoreAfter(status);
            JudgeReferences(lab.Volume());
        }
        case_.JudgeRecovery(&lab, IsOfDevice(fault.service));
        return true;
    }

    bool IsRestore() const { return std::string(Name()) == "Restore"; }

    void JudgeReports(const Fault& fault, int status) {
        std::string line = std::string(Name()) + " " + NameOf(fault.service) + ":" +
                           (status == kOk ? " passed" : "");
        for (const test::Event& event : capture_.Take()) {
            if (event.kind == test::Event::Kind::kReport) {
                EXPECT_EQ(static_cast<u32>(StatusOf(fault.service)), event.code) << event.site;
                line += " " + std::to_string(event.site);
            } else if (event.kind == test::Event::Kind::kAssertion) {
                line += " assert " + std::to_string(event.site);
            }
        }
        // What goes on failing fails in the recovery too: other lines follow.
        if (!fault.forEver) {
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

    test::Capture capture_;
    test::FaultCase case_;
    std::set<std::string> seen_;
};

TEST_P(FaultTable, EachCallOfEachServiceInTurn) {
    u32 failures = 0;
    for (const Service service : test::kServices) {
        for (const bool forEver : {false, true}) {
            u32 nth = 1;
            for (; Fail({service, nth, forEver}); ++nth) {
                ASSERT_FALSE(HasFailure()) << Name() << " " << NameOf(service) << " " << nth
                                           << (forEver ? " and from then on" : "");
            }
            failures += nth - 1;
        }
    }
    EXPECT_GT(failures, 5u);
    ReportTable::Write(seen_);
    std::set<std::string> expected;
    for (const std::string& line : ReportTable::Read()) {
        if (line.starts_with(std::string(Name()) + " ")) {
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
