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
    // What has to cope with failures.
    int (*work)(ImageVolume* volume);
    u32 catalogNodes = 0;
};

constexpr u32 kFaultScenarios = 19;
extern const FaultScenario kFaultScenario[kFaultScenarios];

// The volume a scenario starts from.
std::vector<u8> MakeFaultBase(const FaultScenario& scenario);

}  // namespace VELK::test
