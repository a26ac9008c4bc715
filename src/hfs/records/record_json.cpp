// Records to JSON and back. The way back builds the readable notation of keys and records, which
// has all the checks.
#include "hfs/records/record_json.h"

#include "hfs/records/record_fields.h"
#include "hfs/records/record_text.h"
#include "hfs/records/record_view.h"

namespace VELK {
namespace {

std::string NumberOf(const JsonValue* value) {
    return value == nullptr ? std::string() : value->number;
}

// The readable notation of a key's members; empty when they are none.
std::string KeyTextOf(const JsonValue& key, u32 fileId) {
    if (fileId == kExtentsFileId) {
        const JsonValue* fork = key.Find("fork");
        return NumberOf(key.Find("file")) + ":" + (fork == nullptr ? "" : fork->Text()) + ":" +
               NumberOf(key.Find("block"));
    }
    const bool isCatalog = fileId == kCatalogFileId;
    const JsonValue* name = key.Find("name");
    if (name == nullptr || name->kind != JsonValue::Kind::kString) {
        return {};
    }
    const Typed typed = isCatalog ? Typed::kDecomposed : Typed::kAsIs;
    const std::string text = NumberOf(key.Find(isCatalog ? "parent" : "file")) + ":" +
                             QuotedUnits(name->units, typed, Blanks::kPlain);
    const std::string block = isCatalog ? std::string() : NumberOf(key.Find("block"));
    return block.empty() ? text : text + ":" + block;
}

std::string ExtentsTextOf(const JsonValue& value) {
    std::string text = "[";
    for (const JsonValue& extent : value.items) {
        text += text.size() == 1 ? "[" : ",[";
        for (std::size_t i = 0; i < extent.items.size(); ++i) {
            text += (i == 0 ? "" : ",") + extent.items[i].number;
        }
        text += "]";
    }
    return text + "]";
}

std::string FieldTextOf(const Field& field, const JsonValue& value) {
    if (field.kind == FieldKind::kExtents) {
        return ExtentsTextOf(value);
    }
    if (value.kind != JsonValue::Kind::kString) {
        return value.number;
    }
    return field.kind == FieldKind::kCode ? QuotedUnits(value.units, Typed::kAsIs, Blanks::kPlain)
                                          : value.Text();
}

// The readable notation of a record's members; empty for a type that has none.
std::string DataTextOf(const JsonValue& record, u32 fileId) {
    const JsonValue* type = record.Find("type");
    if (type == nullptr) {
        return {};
    }
    const RecordKind* kind = nullptr;
    for (u32 i = 0; i < kRecordKindCount && kind == nullptr; ++i) {
        const RecordKind& known = kRecordKinds[i];
        kind = known.fileId == fileId && type->Text() == known.typeName ? &known : nullptr;
    }
    if (kind == nullptr) {
        return {};
    }
    if (kind->type == kInlineAttribute) {
        const JsonValue* text = record.Find("text");
        const JsonValue* hex = record.Find("hex");
        return text != nullptr
                   ? "inline{" + QuotedUnits(text->units, Typed::kAsIs, Blanks::kPlain) + "}"
                   : "inline{hex:" + (hex == nullptr ? std::string() : hex->Text()) + "}";
    }
    const bool isBare = kind->fields[0].kind == FieldKind::kExtents;
    std::string text = std::string(kind->name) + "{";
    for (u32 i = 0; i < kind->fieldCount; ++i) {
        const Field& field = kind->fields[i];
        const JsonValue* value = record.Find(field.name);
        if (value != nullptr) {
            text += text.back() == '{' ? "" : ",";
            text += (isBare ? "" : std::string(field.name) + ":") + FieldTextOf(field, *value);
        }
    }
    const JsonValue* name = kind->size == kThreadFixed ? record.Find("name") : nullptr;
    if (name != nullptr) {
        text += text.back() == '{' ? "name:" : ",name:";
        text += QuotedUnits(name->units, Typed::kDecomposed, Blanks::kPlain);
    }
    return text + "}";
}

}  // namespace

void AppendRecordJson(u32 fileId, const u8* key, u32 keySize, const u8* data, u32 dataSize,
                      const RecordJsonOptions& options, std::string* line) {
    JsonWriter json(line);
    json.BeginObject();
    json.Key("key");
    json.BeginObject();
    KeyMembers(fileId, key, keySize, &json);
    json.EndObject();
    if (options.rawKeys || KeyText(fileId, key, keySize, Blanks::kPlain).starts_with("hex:")) {
        json.Member("key_raw", HexText(key, keySize));
    }
    RecordMembers(fileId, data, dataSize, &json);
    if (options.raw) {
        json.Member("raw", HexText(data, dataSize));
    }
    json.EndObject();
}

Problem RecordFromJson(const JsonValue& record, u32 fileId, SearchKey* key,
                       std::vector<u8>* stored) {
    const JsonValue* rawKey = record.Find("key_raw");
    const JsonValue* readableKey = record.Find("key");
    if (rawKey == nullptr && readableKey == nullptr) {
        return UsageProblem("a record without a key", "");
    }
    const std::string keyText =
        rawKey != nullptr ? "hex:" + rawKey->Text() : KeyTextOf(*readableKey, fileId);
    const Problem keyProblem = ParseKey(keyText, fileId, key);
    if (keyProblem) {
        return keyProblem;
    }
    const JsonValue* raw = record.Find("raw");
    const std::string dataText = raw != nullptr ? "hex:" + raw->Text() : DataTextOf(record, fileId);
    if (dataText.empty()) {
        return UsageProblem("a record without data: neither raw nor a type of this tree", "");
    }
    RecordData data;
    const Problem dataProblem = ParseData(dataText, fileId, &data);
    if (!dataProblem) {
        *stored = std::move(data.stored);
    }
    return dataProblem;
}

}  // namespace VELK
