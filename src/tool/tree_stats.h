// Figures of one tree: its levels, how full they are, in which order its leaves lie.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "hfs/records/json_writer.h"
#include "tool/node_reader.h"
#include "tool/progress.h"

namespace VELK::tool {

struct LevelStats {
    u32 level = 0;
    u32 nodes = 0;
    u64 records = 0;
    u64 freeBytes = 0;
    double least = 1;
    double most = 0;
};

struct TreeStats {
    static constexpr u32 kBuckets = 10;

    u32 fileId = 0;
    u32 nodeSize = 0;
    u32 totalNodes = 0;
    u32 freeNodes = 0;
    u32 mapNodes = 0;
    std::vector<LevelStats> levels;  // from the root down
    u64 fillBuckets[kBuckets] = {};  // leaves by tenths of fill
    u64 leafSteps = 0;
    u64 adjacentSteps = 0;  // to the node with the next number
    u64 forwardSteps = 0;   // to a later one that is not the next
    u64 fileBytes = 0;
    u32 extents = 0;
    u32 clump = 0;
    std::vector<std::pair<std::string, u64>> recordKinds;  // of the leaves, most frequent first
};

// Walks every level. Throws ToolError unless damage is passed over.
TreeStats CollectStats(Session* session, u32 fileId, bool keepGoing, Progress* progress);
std::string StatsText(const TreeStats& stats);
void StatsMembers(const TreeStats& stats, JsonWriter* json);

}  // namespace VELK::tool
