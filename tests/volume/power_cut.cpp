// Enumerates cuts.
#include "power_cut.h"

#include <gtest/gtest.h>

#include <algorithm>

namespace VELK::test {

namespace {

Cut Chosen(const Cut& all, const std::function<bool(std::size_t)>& isThere) {
    Cut cut;
    for (std::size_t i = 0; i < all.size(); ++i) {
        if (isThere(i)) {
            cut.push_back(all[i]);
        }
    }
    return cut;
}

void VisitTears(const Cut& all, const CutLimits& limits,
                const std::function<void(const Cut&)>& visit) {
    Cut cut;
    for (const CutPiece& piece : all) {
        const std::size_t sectors = piece.size / kSectorSize;
        const std::size_t step = std::max<std::size_t>(1, sectors / std::max(1u, limits.tears));
        for (std::size_t kept = step; kept < sectors; kept += step) {
            cut.push_back({piece.offset, piece.bytes, kept * kSectorSize});
            visit(cut);
            cut.pop_back();
        }
        cut.push_back(piece);
    }
}

}  // namespace

std::vector<Epoch> EpochsOf(const std::vector<DeviceEvent>& log) {
    std::vector<Epoch> epochs;
    std::size_t first = 0;
    for (std::size_t i = 0; i <= log.size(); ++i) {
        if (i == log.size() || log[i].isSync) {
            if (i > first) {
                epochs.push_back({first, i});
            }
            first = i + 1;
        }
    }
    return epochs;
}

void ForEachCut(const std::vector<DeviceEvent>& log, Epoch epoch, const CutLimits& limits,
                std::mt19937_64* random, const std::function<void(const Cut&)>& visit) {
    Cut all;
    for (std::size_t i = epoch.first; i < epoch.end; ++i) {
        all.push_back({log[i].offset, log[i].bytes.data(), log[i].bytes.size()});
    }
    if (all.size() <= limits.allSubsets) {
        for (u32 mask = 0; mask < 1u << all.size(); ++mask) {
            visit(Chosen(all, [&](std::size_t i) { return (mask >> i & 1) != 0; }));
        }
    } else {
        for (std::size_t length = 0; length <= all.size(); ++length) {
            visit(Chosen(all, [&](std::size_t i) { return i < length; }));
        }
        for (std::size_t missing = 0; missing + 1 < all.size(); ++missing) {
            visit(Chosen(all, [&](std::size_t i) { return i != missing; }));
        }
        for (u32 n = 0; n < limits.randomSubsets; ++n) {
            visit(Chosen(all, [&](std::size_t) { return ((*random)() >> 40 & 1) != 0; }));
        }
    }
    VisitTears(all, limits, visit);
}

void ApplyCut(const Cut& cut, BlockDevice* device) {
    for (const CutPiece& piece : cut) {
        ASSERT_TRUE(device->Write(piece.offset, piece.bytes, piece.size).Ok());
    }
}

void ApplyEpoch(const std::vector<DeviceEvent>& log, Epoch epoch, BlockDevice* device) {
    for (std::size_t i = epoch.first; i < epoch.end; ++i) {
        ASSERT_TRUE(device->Write(log[i].offset, log[i].bytes.data(), log[i].bytes.size()).Ok());
    }
}

}  // namespace VELK::test
