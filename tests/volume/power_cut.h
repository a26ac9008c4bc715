// What a cut of the power can leave of a recorded row of writes and syncs. Everything synced is
// there; of the writes behind the last sync any may be missing, and the last one may be torn.
#pragma once

#include <functional>
#include <random>
#include <vector>

#include "recording_device.h"

namespace VELK::test {

struct CutPiece {
    u64 offset;
    const u8* bytes;
    std::size_t size;
};
// Pieces that reached the medium since the last sync, in the order in which they were written.
using Cut = std::vector<CutPiece>;

struct CutLimits {
    u32 allSubsets = 12;       // every subset of at most so many writes
    u32 randomSubsets = 2000;  // of more
    u32 tears = 8;             // places a write is torn at
};

// The writes between two syncs.
struct Epoch {
    std::size_t first;  // events of the log
    std::size_t end;    // the sync, or the end of the log
};
std::vector<Epoch> EpochsOf(const std::vector<DeviceEvent>& log);

// Calls `visit` with every cut in the epoch: each subset of few writes, else each prefix, each with
// one missing and random ones; and each prefix whose last write is torn at a sector.
void ForEachCut(const std::vector<DeviceEvent>& log, Epoch epoch, const CutLimits& limits,
                std::mt19937_64* random, const std::function<void(const Cut&)>& visit);

void ApplyCut(const Cut& cut, BlockDevice* device);
void ApplyEpoch(const std::vector<DeviceEvent>& log, Epoch epoch, BlockDevice* device);

}  // namespace VELK::test
