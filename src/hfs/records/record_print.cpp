// Records as text that can be given back.
#include "hfs/records/record_fields.h"
#include "hfs/records/record_text.h"
#include "hfs/records/text_format.h"
#include "hfs/records/thread_view.h"
#include "hfs/treehfs/bytes.h"

namespace VELK {
namespace {

std::string ExtentsText(const u8* extents) {
    std::string text = "[";
    const u32 used = UsedExtents(extents);
    for (u32 i = 0; i < used; ++i) {
        text += (i == 0 ? "[" : ",[") + std::to_string(GetBe32(extents + 8 * i)) + "," +
                std::to_string(GetBe32(extents + 8 * i + 4)) + "]";
    }
    return text + "]";
}

std::string NumberText(const char* format, u64 value) {
    return Format(format, static_cast<unsigned long long>(value));
}

std::string CodeText(const u8* code) {
    for (u32 i = 0; i < 4; ++i) {
        if (code[i] < 0x20 || code[i] > 0x7E || code[i] == '"' || code[i] == '\\') {
            return NumberText("0x%08llx", GetBe32(code));
        }
    }
    return "\"" + std::string(reinterpret_cast<const char*>(code), 4) + "\"";
}

// The value of a field; empty when it may be left out.
std::string FieldText(const u8* record, const Field& field, Blanks blanks) {
    if (field.kind == FieldKind::kExtents) {
        return UsedExtents(record + field.offset) == 0 ? "" : ExtentsText(record + field.offset);
    }
    const u64 value = GetField(record, field);
    if (field.kind == FieldKind::kBlocks) {
        // The extents lie right behind the count.
        const u64 sum = SumOfExtents(record + field.offset + field.width);
        return value == sum ? "" : std::to_string(value);
    }
    if (value == 0) {
        return "";
    }
    switch (field.kind) {
        case FieldKind::kHex:
            return NumberText("0x%llx", value);
        case FieldKind::kOctal:
            return NumberText("0%llo", value);
        case FieldKind::kDate:
            return DateIso(static_cast<u32>(value));
        case FieldKind::kCode: {
            const std::string text = CodeText(record + field.offset);
            const bool hasBlank = text.find(' ') != std::string::npos;
            return hasBlank && blanks == Blanks::kEscaped ? NumberText("0x%08llx", value) : text;
        }
        default:
            return std::to_string(value);
    }
}

std::string InlineText(const u8* stored, u32 size, Blanks blanks) {
    const u8* value = stored + kInlineFixed;
    const std::string_view text(reinterpret_cast<const char*>(value), size);
    NameUnits units;
    if (VELK::UnitsFromUtf8(text, &units) && Utf8FromUnits(units) == text) {
        return "inline{" + QuotedUnits(units, Typed::kAsIs, blanks) + "}";
    }
    return "inline{hex:" + HexText(value, size) + "}";
}

// The readable form, which may say less than the record holds.
std::string Readable(const RecordKind& kind, const u8* stored, u32 size, Blanks blanks) {
    if (kind.type == kInlineAttribute) {
        const u32 valueSize = GetBe32(stored + 12);
        return valueSize <= size - kInlineFixed ? InlineText(stored, valueSize, blanks) : "";
    }
    if (kind.fields[0].kind == FieldKind::kExtents) {
        return std::string(kind.name) + "{" + ExtentsText(stored + kind.fields[0].offset) + "}";
    }
    std::string text = std::string(kind.name) + "{";
    for (u32 i = 0; i < kind.fieldCount; ++i) {
        const std::string value = FieldText(stored, kind.fields[i], blanks);
        if (!value.empty()) {
            text +=
                (text.back() == '{' ? "" : ",") + std::string(kind.fields[i].name) + ":" + value;
        }
    }
    if (kind.size == kThreadFixed) {
        const ThreadView thread(stored, size);
        if (!thread.IsValid()) {
            return "";
        }
        text += std::string(text.back() == '{' ? "" : ",") + "name:" +
                QuotedUnits(UnitsFromStored(thread.Name(), thread.NameLength()), Typed::kDecomposed,
                            blanks);
    }
    return text + "}";
}

}  // namespace

std::string DataText(u32 fileId, const u8* stored, u32 size, Blanks blanks) {
    const RecordKind* kind = KindOfRecord(fileId, stored, size);
    if (kind != nullptr) {
        std::string text = Readable(*kind, stored, size, blanks);
        // Bytes outside the known fields would be lost: read it back and see.
        RecordData back;
        if (!text.empty() && !ParseData(text, fileId, &back) &&
            back.stored == std::vector<u8>(stored, stored + size)) {
            return text;
        }
    }
    return "hex:" + HexText(stored, size);
}

}  // namespace VELK
