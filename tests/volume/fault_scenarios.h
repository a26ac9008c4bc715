// Pieces of work on small volumes, one for each thing a tree does, for tests that make every call
// below them fail in turn.
#pragma once

#include "cut_operations.h"

namespace VELK::test {

struct FaultScenario {
    const char* name;
    // Once, before the last commit of the volume that all runs start from.
    int (*prepare)(ImageVolume* volume);
    // At the start of every run, with everything working.
    int (*begin)(ImageVolume* volume);
    // What has to cope with failures. Null: mounting, which carries out what waits in the journal.
    int (*work)(ImageVolume* volume);
    u32 catalogNodes = 0;
    bool needsFreshMount = false;  // the work can be done once in a mount
};

constexpr u32 kFaultScenarios = 20;
constexpr u32 kSmallestScenarios = 5;  // the first of them
extern const FaultScenario kFaultScenario[kFaultScenarios];

// Whether a scenario's work is mounting.
inline bool Mounts(const FaultScenario& scenario) {
    return scenario.work == nullptr;
}

// The volume a scenario starts from. Where the work is mounting, what was prepared waits in the
// journal: the power was cut before any of it reached its place.
std::vector<u8> MakeFaultBase(const FaultScenario& scenario);

}  // namespace VELK::test
