// Differences of two trees, record by record: both are walked in key order side by side.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "tool/leaf_cursor.h"
#include "tool/progress.h"

namespace VELK::tool {

struct DiffCounts {
    u64 removed = 0;
    u64 added = 0;
    u64 changed = 0;
    u64 equal = 0;

    u64 Differences() const { return removed + added + changed; }
};

// A record of the first tree, of the second, or the two that share a key. Null: there is none.
using DiffVisit = std::function<void(const LeafRecord* before, const LeafRecord* after)>;

// Compares tree `fileId` of both sessions; an absent tree is an empty one. Fields named in
// `ignored` count as equal. Throws ToolError, also when the trees order their names differently.
DiffCounts DiffTrees(Session* before, Session* after, u32 fileId, bool keepGoing,
                     const std::vector<std::string>& ignored, Progress* progress,
                     const DiffVisit& visit);

// Fields in which two records of one key differ: "size 2 -> 3, modified ...". "type" for records of
// different kinds, "data" for bytes that no field names.
struct FieldChange {
    std::string field;
    std::string before;
    std::string after;
};
std::vector<FieldChange> FieldChanges(u32 fileId, const LeafRecord& before, const LeafRecord& after,
                                      const std::vector<std::string>& ignored);
// Whether any record of the tree has a field of that name.
bool IsFieldOfTree(u32 fileId, const std::string& name);

}  // namespace VELK::tool
