// Operation lists from a seed. See operations.h.
#include "operations.h"

#include <random>

namespace VELK::test {

namespace {

struct Weight {
    Verb verb;
    u32 share;
};

// Shares of 1000; insertions and deletions get what is left.
constexpr Weight kShares[] = {
    {Verb::kDeleteAtPath, 40}, {Verb::kFind, 90},     {Verb::kUpdate, 50},   {Verb::kStep, 50},
    {Verb::kSeek, 30},         {Verb::kPosition, 20}, {Verb::kWalk, 30},     {Verb::kFlush, 25},
    {Verb::kRestore, 4},       {Verb::kReserve, 8},   {Verb::kRelease, 12},  {Verb::kExtend, 3},
    {Verb::kReopen, 3},        {Verb::kHoldNode, 15}, {Verb::kTooLarge, 10}, {Verb::kStaleStep, 20},
};

Verb PickVerb(u32 ticket, bool growing, u32 coin) {
    for (const Weight& weight : kShares) {
        if (ticket < weight.share) {
            return weight.verb;
        }
        ticket -= weight.share;
    }
    return (coin < 70) == growing ? Verb::kInsert : Verb::kDelete;
}

}  // namespace

const char* VerbName(Verb verb) {
    constexpr const char* kNames[] = {
        "insert",  "delete",   "delete-at-path", "find",      "update",    "step",
        "seek",    "position", "walk",           "flush",     "restore",   "reserve",
        "release", "extend",   "reopen",         "hold-node", "too-large", "stale-step"};
    static_assert(std::size(kNames) == static_cast<std::size_t>(Verb::kCount));
    return kNames[static_cast<int>(verb)];
}

std::string Text(const Operation& operation) {
    std::string text = VerbName(operation.verb);
    text += " key=" + std::to_string(operation.key) + " size=" + std::to_string(operation.size);
    return operation.fault == 0 ? text : text + " fault=" + std::to_string(operation.fault);
}

std::vector<Operation> MakeOperations(u64 seed, u32 count, bool withFaults) {
    std::mt19937_64 random(seed);
    const auto below = [&](u32 limit) { return static_cast<u32>(random() % limit); };
    std::vector<Operation> operations;
    operations.reserve(count);
    // Three turns of growing to each of thinning, so that trees get deep and empty again.
    constexpr u32 kTurn = 700;
    for (u32 i = 0; i < count; ++i) {
        const bool growing = (i / kTurn) % 4 != 3;
        const u32 ticket = below(1000);
        Operation operation{PickVerb(ticket, growing, below(100)), below(4000), below(1u << 16), 0};
        if (withFaults && below(25) == 0) {
            operation.fault = 1 + below(24);
        }
        operations.push_back(operation);
    }
    return operations;
}

}  // namespace VELK::test
