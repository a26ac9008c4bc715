// Summaries and JSON of records, from the field tables.
#include "hfs/records/record_view.h"

#include "hfs/records/key_layout.h"
#include "hfs/records/key_text.h"
#include "hfs/records/record_fields.h"
#include "hfs/records/record_text.h"
#include "hfs/records/text_format.h"
#include "hfs/records/thread_view.h"
#include "hfs/treehfs/bytes.h"

namespace VELK {
namespace {

constexpr u32 kShownValue = 40;  // bytes of an attribute that a listing shows

u64 Named(const RecordKind& kind, const u8* stored, const char* name) {
    const Field* field = FieldByName(kind, name);
    return field == nullptr ? 0 : GetField(stored, *field);
}

std::string Runs(const u8* extents) {
    std::string text;
    const u32 used = UsedExtents(extents);
    for (u32 i = 0; i < used; ++i) {
        text += (i == 0 ? "[" : " [") + std::to_string(GetBe32(extents + 8 * i)) + "," +
                std::to_string(GetBe32(extents + 8 * i + 4)) + "]";
    }
    return text;
}

// "size 2, data [59,1]" of a file or of an attribute with a fork, with `separator` between.
std::string ForkDetails(const RecordKind& kind, const u8* stored, const char* separator) {
    std::string text = "size " + std::to_string(Named(kind, stored, "size"));
    const std::string data = Runs(stored + FieldByName(kind, "data")->offset);
    if (!data.empty()) {
        text += std::string(separator) + "data " + data;
    }
    const Field* rsrc = FieldByName(kind, "rsrc");
    if (rsrc == nullptr) {
        return text;
    }
    const u64 size = Named(kind, stored, "rsize");
    const std::string runs = Runs(stored + rsrc->offset);
    if (size != 0 || !runs.empty()) {
        text += std::string(separator) + "resource " + std::to_string(size);
        text += runs.empty() ? "" : std::string(separator) + "rsrc " + runs;
    }
    return text;
}

// The item a thread names, as a key.
std::string ThreadTarget(const u8* stored, u32 size) {
    const ThreadView thread(stored, size);
    const std::string parent = std::to_string(thread.Parent());
    if (!thread.IsValid()) {
        return parent + ": name of " + std::to_string(thread.NameLength()) + " units in " +
               std::to_string(size) + " bytes";
    }
    return parent + ":" +
           QuotedUnits(UnitsFromStored(thread.Name(), thread.NameLength()), Typed::kDecomposed,
                       Blanks::kPlain);
}

std::string InlineDetails(const u8* stored, u32 size) {
    const u32 valueSize = GetBe32(stored + 12);
    std::string text = std::to_string(valueSize) + (valueSize == 1 ? " byte" : " bytes");
    if (valueSize > size - kInlineFixed) {
        return text + " in a record of " + std::to_string(size);
    }
    const u32 shown = valueSize < kShownValue ? valueSize : kShownValue;
    const std::string_view value(reinterpret_cast<const char*>(stored + kInlineFixed), shown);
    NameUnits units;
    bool isText = shown != 0 && VELK::UnitsFromUtf8(value, &units);
    for (const char16_t unit : units) {
        isText = isText && unit >= 0x20 && unit != 0x7F;
    }
    if (shown == 0) {
        return text;
    }
    text += " " + (isText ? QuotedUnits(units, Typed::kAsIs, Blanks::kPlain)
                          : HexText(stored + kInlineFixed, shown));
    return shown == valueSize ? text : text + "...";
}

std::string Items(u64 count) {
    return std::to_string(count) + (count == 1 ? " item" : " items");
}

void ExtentsMember(const char* name, const u8* extents, JsonWriter* json) {
    json->Key(name);
    json->BeginArray();
    const u32 used = UsedExtents(extents);
    for (u32 i = 0; i < used; ++i) {
        json->BeginArray();
        json->Value(GetBe32(extents + 8 * i));
        json->Value(GetBe32(extents + 8 * i + 4));
        json->EndArray();
    }
    json->EndArray();
}

void UnitsMember(const char* name, const u8* stored, u32 units, JsonWriter* json) {
    json->Key(name);
    json->Raw(QuotedUnits(UnitsFromStored(stored, units), Typed::kAsIs, Blanks::kPlain));
}

void FieldMember(const u8* stored, const Field& field, bool isFirst, JsonWriter* json) {
    if (field.kind == FieldKind::kExtents) {
        if (isFirst || UsedExtents(stored + field.offset) != 0) {
            ExtentsMember(field.name, stored + field.offset, json);
        }
        return;
    }
    const u64 value = GetField(stored, field);
    // A block count is left out only when its reader would fill in the same.
    const bool isImplied = value == 0 && (field.kind != FieldKind::kBlocks ||
                                          SumOfExtents(stored + field.offset + field.width) == 0);
    if (isImplied && !isFirst) {
        return;
    }
    json->Key(field.name);
    switch (field.kind) {
        case FieldKind::kDate:
            json->Value(DateIso(static_cast<u32>(value)));
            break;
        case FieldKind::kOctal:
            json->Value(Format("0%llo", static_cast<unsigned long long>(value)));
            break;
        case FieldKind::kCode: {
            NameUnits code;
            for (u32 i = 0; i < field.width; ++i) {
                code.push_back(stored[field.offset + i]);
            }
            json->Raw(QuotedUnits(code, Typed::kAsIs, Blanks::kPlain));
            break;
        }
        default:
            json->Value(value);
    }
}

}  // namespace

const char* RecordTypeName(u32 fileId, const u8* stored, u32 size) {
    const RecordKind* kind = KindOfRecord(fileId, stored, size);
    return kind == nullptr ? "unknown" : kind->typeName;
}

u32 RecordId(u32 fileId, const u8* stored, u32 size) {
    const RecordKind* kind = KindOfRecord(fileId, stored, size);
    return kind == nullptr ? 0 : static_cast<u32>(Named(*kind, stored, "id"));
}

std::string RecordSummary(u32 fileId, const u8* stored, u32 size) {
    const RecordKind* kind = KindOfRecord(fileId, stored, size);
    if (kind == nullptr) {
        return "unknown, " + std::to_string(size) + " bytes";
    }
    const std::string id = "id " + std::to_string(Named(*kind, stored, "id")) + ", ";
    if (kind->size == kThreadFixed) {
        return std::string(kind->typeName) + " " + ThreadTarget(stored, size);
    }
    if (kind->type == kInlineAttribute) {
        return "inline " + InlineDetails(stored, size);
    }
    if (kind->fields[0].kind == FieldKind::kExtents) {
        const std::string runs = Runs(stored + kind->fields[0].offset);
        return runs.empty() ? "extents none" : "extents " + runs;
    }
    if (FieldByName(*kind, "valence") != nullptr) {
        return "folder " + id + Items(Named(*kind, stored, "valence"));
    }
    return std::string(kind->typeName) + " " + (FieldByName(*kind, "id") == nullptr ? "" : id) +
           ForkDetails(*kind, stored, ", ");
}

std::string RecordDetails(u32 fileId, const u8* stored, u32 size) {
    const RecordKind* kind = KindOfRecord(fileId, stored, size);
    if (kind == nullptr) {
        return std::to_string(size) + " bytes";
    }
    if (kind->size == kThreadFixed) {
        return ThreadTarget(stored, size);
    }
    if (kind->type == kInlineAttribute) {
        return InlineDetails(stored, size);
    }
    if (kind->fields[0].kind == FieldKind::kExtents) {
        return Runs(stored + kind->fields[0].offset);
    }
    std::string text = FieldByName(*kind, "valence") != nullptr
                           ? Items(Named(*kind, stored, "valence"))
                           : ForkDetails(*kind, stored, " ");
    const u32 created = static_cast<u32>(Named(*kind, stored, "created"));
    return created == 0 ? text : text + " created " + DateText(created);
}

void RecordMembers(u32 fileId, const u8* stored, u32 size, JsonWriter* json) {
    const RecordKind* kind = KindOfRecord(fileId, stored, size);
    json->Member("type", kind == nullptr ? "unknown" : kind->typeName);
    if (kind == nullptr) {
        return;
    }
    if (kind->type == kInlineAttribute) {
        const u32 valueSize = GetBe32(stored + 12);
        json->Member("size", valueSize);
        if (valueSize <= size - kInlineFixed) {
            const u8* value = stored + kInlineFixed;
            NameUnits units;
            const std::string_view text(reinterpret_cast<const char*>(value), valueSize);
            if (VELK::UnitsFromUtf8(text, &units) && Utf8FromUnits(units) == text) {
                json->Key("text");
                json->Raw(QuotedUnits(units, Typed::kAsIs, Blanks::kPlain));
            } else {
                json->Member("hex", HexText(value, valueSize));
            }
        }
        return;
    }
    const Field* const sizeField = FieldByName(*kind, "size");
    const Field* const valenceField = FieldByName(*kind, "valence");
    for (u32 i = 0; i < kind->fieldCount; ++i) {
        const Field* field = kind->fields + i;
        FieldMember(stored, *field, i == 0 || field == sizeField || field == valenceField, json);
    }
    const ThreadView thread(stored, size);
    if (fileId == kCatalogFileId && thread.IsValid()) {
        UnitsMember("name", thread.Name(), thread.NameLength(), json);
    }
}

void KeyMembers(u32 fileId, const u8* stored, u32 size, JsonWriter* json) {
    SearchKey key;
    if (!SearchKeyFromStored(fileId, stored, size, &key)) {
        json->Member("hex", HexText(stored, size));
        return;
    }
    if (fileId == kExtentsFileId) {
        const u8 fork = stored[kExtKeyForkType];
        json->Member("file", key.id);
        if (fork == kForkData || fork == kForkResource) {
            json->Member("fork", fork == kForkData ? "data" : "rsrc");
        } else {
            json->Member("fork", fork);
        }
        json->Member("block", GetBe32(stored + kExtKeyStartBlock));
        return;
    }
    json->Member(fileId == kCatalogFileId ? "parent" : "file", key.id);
    const KeyView view(fileId, stored);
    UnitsMember("name", view.Name(), view.NameLength(), json);
    if (view.StartBlock() != 0) {
        json->Member("block", view.StartBlock());
    }
}

}  // namespace VELK
