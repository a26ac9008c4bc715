// Prints the records and nodes that dump visits.
#pragma once

#include <string>
#include <vector>

#include "tool/node_reader.h"
#include "tool/output.h"

namespace VELK::tool {

struct DumpStyle {
    enum class Values { kNone, kShort, kFull };

    Values values = Values::kShort;
    bool hideNames = false;
    bool hex = false;
    bool raw = false;
    bool json = false;
};

class DumpPrinter {
public:
    DumpPrinter(Session* session, Output* out, u32 fileId, const DumpStyle& style);

    // Header of the table or of the stream; what follows are nodes or records.
    void Begin(bool nodes);
    void Record(const NodeRecord& record, bool isLeaf);
    void Node(const HeldNode& node);
    void End();

private:
    // One line of the table before its columns are aligned.
    struct Row {
        std::string node, record, key, type, id, rest;
    };

    void AddRow(Row row);
    void FlushRows();
    void PrintRow(const Row& row);
    void PrintRecordJson(const NodeRecord& record, bool isLeaf);
    void PrintRecordHex(const NodeRecord& record);
    NodeRecord Hidden(const NodeRecord& record, bool isLeaf);
    std::string Details(const NodeRecord& record, bool isLeaf) const;

    Session* session_;
    Output* out_;
    u32 fileId_;
    DumpStyle style_;
    bool ofNodes_ = false;
    u64 printed_ = 0;
    std::vector<Row> rows_;  // the first ones decide how wide the columns are
    bool widthsKnown_ = false;
    std::size_t keyWidth_ = 3;
    std::size_t typeWidth_ = 4;
    std::size_t idWidth_ = 2;
    std::vector<u8> key_;
    std::vector<u8> data_;
};

}  // namespace VELK::tool
