// Prints one node: descriptor, records, free space, offset table, and what the tree says of it.
#pragma once

#include <vector>

#include "tool/node_reader.h"
#include "tool/output.h"

namespace VELK::tool {

struct NodeStyle {
    bool hex = false;
    bool raw = false;
    bool json = false;
};

class NodePrinter {
public:
    NodePrinter(Session* session, Output* out, u32 fileId, const NodeStyle& style);

    // Throws ToolError when the node cannot be read.
    void Print(u32 number);
    // Adds the children of the index nodes among `numbers` behind them.
    void AppendChildren(std::vector<u32>* numbers);

private:
    struct Line {
        u32 offset = 0;
        u32 keySize = 0;
        u32 dataSize = 0;
        std::string key;
        std::string what;
        std::vector<u8> bytes;  // for --hex
    };

    void PrintText(const HeldNode& node);
    void PrintJson(const HeldNode& node);
    void PrintRaw(const HeldNode& node);
    void PrintHeaderFields();
    void PrintMapFields(const HeldNode& node);
    void PrintRecords(const std::vector<Line>& lines);
    void PrintTail(const HeldNode& node);
    std::vector<Line> RecordLines(const HeldNode& node, std::string* fault);
    std::string Reference(const HeldNode& node);
    u32 SlotsShown(const HeldNode& node) const;

    Session* session_;
    Output* out_;
    u32 fileId_;
    NodeStyle style_;
    CBTreeHfs* tree_;
};

}  // namespace VELK::tool
