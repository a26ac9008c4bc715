// Tables, hex, raw bytes and JSON of records and nodes.
#include "tool/dump_printer.h"

#include <algorithm>

#include "hfs/records/json_writer.h"
#include "hfs/records/key_layout.h"
#include "hfs/records/key_text.h"
#include "hfs/records/name_text.h"
#include "hfs/records/record_fields.h"
#include "hfs/records/record_text.h"
#include "hfs/records/record_view.h"
#include "hfs/records/text_format.h"
#include "tool/hex_rows.h"

namespace VELK::tool {

namespace {

constexpr std::size_t kSampleRows = 100;
constexpr std::size_t kWidestKey = 40;

// Writes "n" and the ID over a name, as far as there is room.
void HideUnits(u8* units, u32 count, u32 id) {
    const std::string name = "n" + std::to_string(id);
    for (u32 i = 0; i < count; ++i) {
        units[2 * i] = 0;
        units[2 * i + 1] = static_cast<u8>(i < name.size() ? name[i] : '_');
    }
}

}  // namespace

DumpPrinter::DumpPrinter(Session* session, Output* out, u32 fileId, const DumpStyle& style)
    : session_(session), out_(out), fileId_(fileId), style_(style) {}

void DumpPrinter::Begin(bool nodes) {
    ofNodes_ = nodes;
    if (style_.json) {
        const CBTreeHfs* tree = session_->Tree(fileId_);
        out_->Print(
            "{{\"schema\":\"treehfs.dump/1\",\"tree\":\"{}\",\"of\":\"{}\",\"node_size\":{},"
            "\"records\":{}}}\n",
            ForkName(fileId_), nodes ? "nodes" : "records", tree->header.nodeSize,
            tree->header.leafRecords);
    } else if (nodes && !style_.raw && !style_.hex) {
        out_->Write("   node  kind    height  records   free B    fLink    bLink  fill\n");
    }
}

void DumpPrinter::End() {
    FlushRows();
    if (style_.json) {
        out_->Print("{{\"summary\":{{\"{}\":{}}}}}\n", ofNodes_ ? "nodes" : "records", printed_);
    }
}

// The ID of a name's owner is the record's own; a thread names the item whose ID is its key's.
NodeRecord DumpPrinter::Hidden(const NodeRecord& record, bool isLeaf) {
    NodeRecord hidden = record;
    key_.assign(record.key, record.key + record.keySize);
    data_.assign(record.data, record.data + record.dataSize);
    hidden.key = key_.data();
    hidden.data = data_.data();
    const u32 keyBytes = record.keySize;
    const u32 nameAt = kKeyLengthSize + KeyLayoutOf(fileId_).fixed;
    if (fileId_ == kExtentsFileId || keyBytes < nameAt) {
        return hidden;
    }
    const KeyView key(fileId_, record.key);
    const u32 own = isLeaf ? RecordId(fileId_, record.data, record.dataSize) : 0;
    HideUnits(key_.data() + nameAt, std::min(key.NameLength(), (keyBytes - nameAt) / 2),
              own != 0 ? own : key.Id());
    const u32 type =
        fileId_ == kCatalogFileId && record.dataSize >= kThreadFixed ? GetBe16(record.data) : 0;
    if (isLeaf && (type == kFolderThread || type == kFileThread)) {
        const u32 count = GetBe16(record.data + 8);
        HideUnits(data_.data() + kThreadFixed,
                  std::min(count, (record.dataSize - kThreadFixed) / 2), key.Id());
    }
    return hidden;
}

std::string DumpPrinter::Details(const NodeRecord& record, bool isLeaf) const {
    if (!isLeaf) {
        return record.dataSize >= kChildSize ? fmt::format("-> node {}", GetBe32(record.data)) : "";
    }
    switch (style_.values) {
        case DumpStyle::Values::kNone:
            return "";
        case DumpStyle::Values::kShort:
            return RecordDetails(fileId_, record.data, record.dataSize);
        case DumpStyle::Values::kFull:
            return DataText(fileId_, record.data, record.dataSize, Blanks::kPlain);
    }
    return "";
}

void DumpPrinter::Record(const NodeRecord& original, bool isLeaf) {
    printed_ += 1;
    const NodeRecord record = style_.hideNames ? Hidden(original, isLeaf) : original;
    if (style_.raw) {
        const std::string padding(
            record.size - std::min(record.size, record.keySize + record.dataSize), '\0');
        out_->Write({reinterpret_cast<const char*>(record.key), record.keySize});
        out_->Write(padding);
        out_->Write({reinterpret_cast<const char*>(record.data), record.dataSize});
        return;
    }
    if (style_.json) {
        PrintRecordJson(record, isLeaf);
        return;
    }
    if (style_.hex) {
        PrintRecordHex(record);
        return;
    }
    const u32 id = isLeaf ? RecordId(fileId_, record.data, record.dataSize) : 0;
    const char* type = isLeaf ? RecordTypeName(fileId_, record.data, record.dataSize) : "index";
    AddRow({std::to_string(record.node), std::to_string(record.index),
            EscapedText(KeyText(fileId_, record.key, record.keySize, Blanks::kPlain)), type,
            id != 0 ? std::to_string(id) : "", EscapedText(Details(record, isLeaf))});
}

void DumpPrinter::PrintRecordJson(const NodeRecord& record, bool isLeaf) {
    std::string text;
    JsonWriter json(&text);
    json.BeginObject();
    json.Member("node", record.node);
    json.Member("record", record.index);
    json.Key("key");
    json.BeginObject();
    KeyMembers(fileId_, record.key, record.keySize, &json);
    json.EndObject();
    if (!isLeaf) {
        json.Member("type", "index");
        json.Member("child", record.dataSize >= kChildSize ? GetBe32(record.data) : 0u);
    } else if (style_.values == DumpStyle::Values::kNone) {
        json.Member("type", RecordTypeName(fileId_, record.data, record.dataSize));
    } else {
        RecordMembers(fileId_, record.data, record.dataSize, &json);
        if (style_.values == DumpStyle::Values::kFull) {
            json.Member("raw", HexText(record.data, record.dataSize));
        }
    }
    json.EndObject();
    out_->Write(text + "\n");
}

void DumpPrinter::PrintRecordHex(const NodeRecord& record) {
    out_->Print("node {} record {} at 0x{:04x}: {}\n", record.node, record.index, record.offset,
                EscapedText(KeyText(fileId_, record.key, record.keySize, Blanks::kPlain)));
    out_->Print("  key, {} B\n", record.keySize);
    WriteHexRows(out_, record.key, record.keySize, record.offset, 2);
    out_->Print("  data, {} B\n", record.dataSize);
    WriteHexRows(out_, record.data, record.dataSize, record.offset + record.size - record.dataSize,
                 2);
}

void DumpPrinter::Node(const HeldNode& node) {
    printed_ += 1;
    const CBTreeHfs* tree = session_->Tree(fileId_);
    const u32 nodeSize = tree->header.nodeSize;
    if (style_.raw || style_.hex) {
        data_.resize(nodeSize);
        node.Bytes().CopyOut(data_.data(), 0, nodeSize);
        if (style_.raw) {
            out_->Write({reinterpret_cast<const char*>(data_.data()), nodeSize});
            return;
        }
        out_->Print("node {}\n", node.Number());
        WriteHexRows(out_, data_.data(), nodeSize, 0, 2);
        return;
    }
    const bool isBlank = node.Kind() == kBTIndexNode && node.Height() == 0;
    const char* kind = isBlank ? "blank" : NodeKindName(node.Kind());
    const u32 freeBytes = node.FreeBytes();
    if (!style_.json) {
        out_->Print("{:>7}  {:<7}{:>7}{:>9}{:>9}{:>9}{:>9}{:>6}\n", node.Number(), kind,
                    node.Height(), node.RecordCount(), isBlank ? 0 : freeBytes, node.FLink(),
                    node.BLink(),
                    isBlank ? "-" : fmt::format("{:.0f}%", FillOf(*tree, freeBytes) * 100.0));
        return;
    }
    std::string text;
    JsonWriter json(&text);
    json.BeginObject();
    json.Member("node", node.Number());
    json.Member("kind", kind);
    json.Member("height", node.Height());
    json.Member("records", node.RecordCount());
    json.Member("free", freeBytes);
    json.Member("flink", node.FLink());
    json.Member("blink", node.BLink());
    json.EndObject();
    out_->Write(text + "\n");
}

void DumpPrinter::AddRow(Row row) {
    if (widthsKnown_) {
        PrintRow(row);
        return;
    }
    rows_.push_back(std::move(row));
    if (rows_.size() == kSampleRows) {
        FlushRows();
    }
}

void DumpPrinter::FlushRows() {
    if (widthsKnown_ || rows_.empty()) {
        return;
    }
    widthsKnown_ = true;
    for (const Row& row : rows_) {
        keyWidth_ = std::max(keyWidth_, std::min(kWidestKey, ShownWidth(row.key)));
        typeWidth_ = std::max(typeWidth_, row.type.size());
        idWidth_ = std::max(idWidth_, row.id.size());
    }
    PrintRow({"node", "rec", "key", "type", "id", "..."});
    for (const Row& row : rows_) {
        PrintRow(row);
    }
    rows_.clear();
}

void DumpPrinter::PrintRow(const Row& row) {
    std::string line =
        fmt::format("{:>4}  {:>3}  {}  {:<{}}  {:<{}}", row.node, row.record,
                    Padded(row.key, keyWidth_), row.type, typeWidth_, row.id, idWidth_);
    if (style_.values != DumpStyle::Values::kNone || row.type == "index") {
        line += "  " + row.rest;
    }
    line.erase(line.find_last_not_of(' ') + 1);
    line.push_back('\n');
    out_->Write(line);
}

}  // namespace VELK::tool
