// One node for a person.
#include "tool/node_printer.h"

#include <algorithm>

#include "hfs/records/json_writer.h"
#include "hfs/records/key_text.h"
#include "hfs/records/name_text.h"
#include "hfs/records/record_view.h"
#include "hfs/records/text_format.h"
#include "tool/errors.h"
#include "tool/hex_rows.h"

namespace VELK::tool {

namespace {

constexpr std::size_t kWidestKey = 48;

bool IsKeyed(const HeldNode& node) {
    return node.Kind() == kBTLeafNode || node.Kind() == kBTIndexNode;
}

std::string OffsetName(u32 offset) {
    return fmt::format("0x{:04x}", offset);
}

}  // namespace

NodePrinter::NodePrinter(Session* session, Output* out, u32 fileId, const NodeStyle& style)
    : session_(session), out_(out), fileId_(fileId), style_(style), tree_(session->Tree(fileId)) {}

void NodePrinter::Print(u32 number) {
    HeldNode node(tree_);
    const int status = node.Open(number);
    if (status != 0) {
        ThrowProblem(session_->Image(), session_->ProblemOf(fileId_, number, status, ""));
    }
    if (style_.raw) {
        PrintRaw(node);
    } else if (style_.json) {
        PrintJson(node);
    } else {
        PrintText(node);
    }
}

void NodePrinter::AppendChildren(std::vector<u32>* numbers) {
    HeldNode node(tree_);
    const std::vector<u32> parents = *numbers;
    for (const u32 number : parents) {
        if (node.Open(number) != 0 || node.Kind() != kBTIndexNode) {
            continue;
        }
        for (u32 i = 0; i < node.RecordCount(); ++i) {
            unsigned child = 0;
            if (node.Get()->GetChildNodeNum(&tree_->header, static_cast<int>(i), &child) == 0 &&
                child < tree_->header.totalNodes) {
                numbers->push_back(child);
            }
        }
    }
}

void NodePrinter::PrintRaw(const HeldNode& node) {
    std::vector<char> bytes(tree_->header.nodeSize);
    node.Bytes().CopyOut(bytes.data(), 0, tree_->header.nodeSize);
    out_->Write({bytes.data(), bytes.size()});
}

// Slots the table can hold at most, whatever the node claims.
u32 NodePrinter::SlotsShown(const HeldNode& node) const {
    return std::min(node.RecordCount() + 1, (tree_->header.nodeSize - kDescSize) / kSlotSize);
}

std::vector<NodePrinter::Line> NodePrinter::RecordLines(const HeldNode& node, std::string* fault) {
    std::vector<Line> lines;
    RecordReader reader(tree_);
    NodeRecord record;
    for (u32 i = 0; i + 1 < SlotsShown(node); ++i) {
        const int status = reader.Describe(node.Get(), i, &record);
        if (status != 0) {
            *fault = fmt::format("record {} cannot be located: {}", i, StatusWithCode(status));
            break;
        }
        Line line;
        line.offset = record.offset;
        line.keySize = record.keySize;
        line.dataSize = record.dataSize;
        line.key = EscapedText(KeyText(fileId_, record.key, record.keySize, Blanks::kPlain));
        if (node.Kind() == kBTLeafNode) {
            line.what = EscapedText(RecordSummary(fileId_, record.data, record.dataSize));
        } else if (record.dataSize >= kChildSize) {
            line.what = fmt::format("-> node {}", GetBe32(record.data));
        }
        if (style_.hex) {
            line.bytes.resize(record.size);
            node.Bytes().CopyOut(line.bytes.data(), record.offset, record.size);
        }
        lines.push_back(std::move(line));
    }
    return lines;
}

void NodePrinter::PrintRecords(const std::vector<Line>& lines) {
    std::size_t keyWidth = 0;
    for (const Line& line : lines) {
        keyWidth = std::max(keyWidth, std::min(ShownWidth(line.key), kWidestKey));
    }
    const u32 indexWidth = DigitCount(lines.empty() ? 0 : lines.size() - 1);
    for (std::size_t i = 0; i < lines.size(); ++i) {
        const Line& line = lines[i];
        out_->Print("{}  [{:>{}}]  key {:>2} B  {}  data {:>3} B   {}\n", OffsetName(line.offset),
                    i, indexWidth, line.keySize, Padded(line.key, keyWidth), line.dataSize,
                    line.what);
        WriteHexRows(out_, line.bytes.data(), line.bytes.size(), line.offset, 2);
    }
}

void NodePrinter::PrintHeaderFields() {
    const BTHeaderMem& header = tree_->header;
    out_->Print("0x000e  [0]  header record, 106 B\n");
    out_->Print("        treeDepth {}  rootNode {}  leafRecords {}\n", header.treeDepth,
                header.rootNode, header.leafRecords);
    out_->Print("        firstLeafNode {}  lastLeafNode {}\n", header.firstLeafNode,
                header.lastLeafNode);
    out_->Print("        nodeSize {}  maxKeyLength {}\n", header.nodeSize, header.maxKeyLength);
    out_->Print("        totalNodes {}  freeNodes {}  clumpSize {}\n", header.totalNodes,
                header.freeNodes, header.clumpSize);
    out_->Print("        btreeType 0x{:02x}  keyCompareType 0x{:02x}  attributes 0x{:08x}\n",
                tree_->btreeType, tree_->keyCompareType, header.attributes);
    out_->Print("0x0078  [1]  user data, 128 B\n");
    out_->Print("0x00f8  [2]  map record, {} B: bits of nodes 0..{}\n",
                header.nodeSize - kHeadMapOverhead, (header.nodeSize - kHeadMapOverhead) * 8 - 1);
}

void NodePrinter::PrintMapFields(const HeldNode& node) {
    const u32 bytes = tree_->header.nodeSize - kMapNodeOverhead;
    u32 used = 0;
    for (u32 i = 0; i < bytes; ++i) {
        used += static_cast<u32>(__builtin_popcount(node.Bytes().U8(kDescSize + i)));
    }
    out_->Print("0x000e  [0]  map record, {} B: {} of {} bits set\n", bytes, Grouped(used),
                Grouped(u64{bytes} * 8));
}

void NodePrinter::PrintTail(const HeldNode& node) {
    const u32 nodeSize = tree_->header.nodeSize;
    const u32 slots = SlotsShown(node);
    const u32 tableStart = nodeSize - kSlotSize * slots;
    const u32 freeStart = node.Bytes().U16(tableStart);
    if (freeStart <= tableStart) {
        out_->Print("{}  free {} B\n", OffsetName(freeStart), Grouped(tableStart - freeStart));
        if (style_.hex) {
            std::vector<u8> bytes(tableStart - freeStart);
            node.Bytes().CopyOut(bytes.data(), freeStart, tableStart - freeStart);
            WriteHexRows(out_, bytes.data(), bytes.size(), freeStart, 2);
        }
    }
    std::string table;
    constexpr u32 kShown = 5;
    for (u32 i = slots; i > 0; --i) {
        if (slots > kShown && i < slots && i >= kShown) {
            table += i == kShown ? " ..." : "";
            continue;
        }
        table += " " + OffsetName(node.Bytes().U16(nodeSize - kSlotSize * i));
    }
    out_->Print("{}  offset table, {}:{}\n", OffsetName(tableStart),
                Counted(slots, "entry", "entries"), table);
}

// The index record that leads to the node, found by looking up its first key.
std::string NodePrinter::Reference(const HeldNode& node) {
    if (node.Number() == tree_->header.rootNode) {
        return "root of the tree";
    }
    RecordReader reader(tree_);
    NodeRecord record;
    SearchKey key;
    if (!IsKeyed(node) || node.RecordCount() == 0 || node.Height() >= kMaxPathDepth ||
        reader.Describe(node.Get(), 0, &record) != 0 ||
        !SearchKeyFromStored(fileId_, record.key, record.keySize, &key)) {
        return IsKeyed(node) ? "not reached from the root" : "";
    }
    HfsFindData path;
    bool found = false;
    tree_->FindEntry(key.Key(), key.id, &path, &found, nullptr, nullptr, nullptr, nullptr);
    std::string text = "not reached from the root";
    const u32 height = node.Height();
    const HfsFindLevel& self = path.path[height];
    const HfsFindLevel& parent = path.path[height + 1];
    if (self.node != nullptr && self.node->nodeNum == node.Number() && parent.node != nullptr) {
        text = fmt::format("referenced by node {} record {}", parent.node->nodeNum, parent.index);
    }
    path.ClearPath();
    return text;
}

void NodePrinter::PrintText(const HeldNode& node) {
    const u64 treeOffset = u64{node.Number()} << tree_->nodeShift;
    const std::string place = session_->OffsetText(fileId_, treeOffset);
    out_->Print("{} node {}{} (tree offset 0x{:x}), {} B\n", ForkName(fileId_), node.Number(),
                place.empty() ? "" : " at " + place, treeOffset, Grouped(tree_->header.nodeSize));
    out_->Print("0x0000  fLink {}  bLink {}  kind {} ({})  height {}  records {}  reserved {}\n",
                node.FLink(), node.BLink(), NodeKindName(node.Kind()), node.Kind(), node.Height(),
                node.RecordCount(), node.Reserved());
    std::string fault;
    if (node.Number() == 0) {
        PrintHeaderFields();
    } else if (node.Kind() == kBTMapNode) {
        PrintMapFields(node);
    } else {
        PrintRecords(RecordLines(node, &fault));
    }
    if (!fault.empty()) {
        out_->Print("        damaged: {}\n", fault);
    }
    PrintTail(node);
    const MapBit bit = FindMapBit(tree_, node.Number());
    std::string last = fmt::format("fill {:.1f}%", FillOf(*tree_, node.FreeBytes()) * 100.0);
    last += !bit.known ? ", no map bit" : bit.isSet ? ", map bit set" : ", map bit clear";
    const std::string reference = Reference(node);
    out_->Print("{}{}{}\n", last, reference.empty() ? "" : ", ", reference);
}

void NodePrinter::PrintJson(const HeldNode& node) {
    std::string text;
    std::string fault;
    JsonWriter json(&text);
    const u64 treeOffset = u64{node.Number()} << tree_->nodeShift;
    json.BeginObject();
    json.Member("schema", "treehfs.node/1");
    json.Member("tree", ForkName(fileId_));
    json.Member("node", node.Number());
    json.Member("tree_offset", treeOffset);
    if (const auto offset = session_->Volume().ImageOffset(fileId_, treeOffset)) {
        json.Member("image_offset", *offset);
    }
    json.Member("size", tree_->header.nodeSize);
    json.Member("flink", node.FLink());
    json.Member("blink", node.BLink());
    json.Member("kind", NodeKindName(node.Kind()));
    json.Member("height", node.Height());
    json.Member("free", node.FreeBytes());
    const MapBit bit = FindMapBit(tree_, node.Number());
    json.Key("map_bit");
    if (bit.known) {
        json.Value(bit.isSet);
    } else {
        json.Null();
    }
    json.Member("record_count", node.RecordCount());
    json.Key("records");
    json.BeginArray();
    RecordReader reader(tree_);
    NodeRecord record;
    for (u32 i = 0; IsKeyed(node) && i + 1 < SlotsShown(node); ++i) {
        const int status = reader.Describe(node.Get(), i, &record);
        if (status != 0) {
            fault = fmt::format("record {} cannot be located", i);
            break;
        }
        json.BeginObject();
        json.Member("offset", record.offset);
        json.Key("key");
        json.BeginObject();
        KeyMembers(fileId_, record.key, record.keySize, &json);
        json.EndObject();
        if (node.Kind() == kBTLeafNode) {
            RecordMembers(fileId_, record.data, record.dataSize, &json);
        } else {
            json.Member("child", record.dataSize >= kChildSize ? GetBe32(record.data) : 0u);
        }
        json.EndObject();
    }
    json.EndArray();
    if (!fault.empty()) {
        json.Member("damage", fault);
    }
    json.EndObject();
    out_->Write(text + "\n");
}

}  // namespace VELK::tool
