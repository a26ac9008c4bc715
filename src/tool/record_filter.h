// Conditions on single records, as in --where size>=64K: a field of the key or of the data, a
// comparison, and a value. All conditions must hold.
#pragma once

#include <string>
#include <vector>

#include "hfs/records/record_fields.h"
#include "tool/name_glob.h"
#include "tool/node_reader.h"

namespace VELK::tool {

class RecordFilter {
public:
    // Takes `tree=NAME` out of `conditions`; 0: there is none. Throws ToolError for a second one.
    static u32 TakeTree(std::vector<std::string>* conditions);

    // Throws ToolError for a condition that names no field of the tree's records.
    RecordFilter(u32 fileId, const std::vector<std::string>& conditions);

    // A record without the field fails, whatever the comparison. `isLeaf` false: an index record,
    // which has the fields of its key alone.
    bool Holds(const NodeRecord& record, bool isLeaf) const;
    bool IsEmpty() const { return conditions_.empty(); }

private:
    enum class Comparison { kEqual, kUnequal, kBelow, kAtMost, kAbove, kAtLeast };

    struct Condition {
        std::string field;
        Comparison comparison;
        u64 number = 0;
        std::string text;             // of fields that are words
        std::vector<NameGlob> globs;  // of names: one pattern
    };

    Condition Read(const std::string& text) const;
    bool Holds(const Condition& condition, const NodeRecord& record, bool isLeaf) const;
    bool NumberOf(const Condition& condition, const NodeRecord& record, bool isLeaf,
                  u64* value) const;

    u32 fileId_;
    std::vector<Condition> conditions_;
};

}  // namespace VELK::tool
