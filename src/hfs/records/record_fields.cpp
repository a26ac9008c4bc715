// Field tables of the records, in the order in which they are printed.
#include "hfs/records/record_fields.h"

#include <iterator>

#include "hfs/treehfs/bytes.h"

namespace VELK {
namespace {

using enum FieldKind;

constexpr Field kFolderFields[] = {
    {"id", 8, 4, kNumber},          {"valence", 4, 4, kNumber},  {"flags", 2, 2, kHex},
    {"created", 12, 4, kDate},      {"modified", 16, 4, kDate},  {"changed", 20, 4, kDate},
    {"accessed", 24, 4, kDate},     {"backup", 28, 4, kDate},    {"owner", 32, 4, kNumber},
    {"group", 36, 4, kNumber},      {"adminflags", 40, 1, kHex}, {"ownerflags", 41, 1, kHex},
    {"mode", 42, 2, kOctal},        {"special", 44, 4, kNumber}, {"window", 48, 8, kHex},
    {"finderflags", 56, 2, kHex},   {"location", 58, 4, kHex},   {"finderreserved", 62, 2, kHex},
    {"scroll", 64, 4, kHex},        {"added", 68, 4, kNumber},   {"xflags", 72, 2, kHex},
    {"xreserved", 74, 2, kHex},     {"putaway", 76, 4, kNumber}, {"encoding", 80, 4, kNumber},
    {"subfolders", 84, 4, kNumber},
};

constexpr Field kFileFields[] = {
    {"id", 8, 4, kNumber},           {"size", 88, 8, kNumber},
    {"data", 104, 64, kExtents},     {"blocks", 100, 4, kBlocks},
    {"clump", 96, 4, kNumber},       {"rsize", 168, 8, kNumber},
    {"rsrc", 184, 64, kExtents},     {"rblocks", 180, 4, kBlocks},
    {"rclump", 176, 4, kNumber},     {"flags", 2, 2, kHex},
    {"link", 4, 4, kNumber},         {"created", 12, 4, kDate},
    {"modified", 16, 4, kDate},      {"changed", 20, 4, kDate},
    {"accessed", 24, 4, kDate},      {"backup", 28, 4, kDate},
    {"owner", 32, 4, kNumber},       {"group", 36, 4, kNumber},
    {"adminflags", 40, 1, kHex},     {"ownerflags", 41, 1, kHex},
    {"mode", 42, 2, kOctal},         {"special", 44, 4, kNumber},
    {"filetype", 48, 4, kCode},      {"creator", 52, 4, kCode},
    {"finderflags", 56, 2, kHex},    {"location", 58, 4, kHex},
    {"finderreserved", 62, 2, kHex}, {"finderxreserved", 64, 4, kHex},
    {"added", 68, 4, kNumber},       {"xflags", 72, 2, kHex},
    {"xreserved", 74, 2, kHex},      {"putaway", 76, 4, kNumber},
    {"encoding", 80, 4, kNumber},    {"reserved", 84, 4, kHex},
};

// The name of a thread is no field: it is what is left of the record.
constexpr Field kThreadFields[] = {{"parent", 4, 4, kNumber}, {"reserved", 2, 2, kHex}};
constexpr Field kForkAttributeFields[] = {
    {"size", 8, 8, kNumber},   {"data", 24, 64, kExtents}, {"blocks", 20, 4, kBlocks},
    {"clump", 16, 4, kNumber}, {"reserved", 4, 4, kHex},
};
constexpr Field kOverflowFields[] = {{"extents", 0, 64, kExtents}};
constexpr Field kExtentsAttributeFields[] = {{"extents", 8, 64, kExtents}};

template <u32 Count>
constexpr RecordKind Kind(const char* name, const char* typeName, u32 fileId, u32 type, u32 size,
                          const Field (&fields)[Count]) {
    return {name, typeName, fileId, type, size, fields, Count};
}

u32 TypeOf(u32 fileId, const u8* stored, u32 size) {
    if (fileId == kExtentsFileId) {
        return 0;
    }
    if (fileId == kCatalogFileId) {
        return size < 2 ? 0 : GetBe16(stored);
    }
    return size < 4 ? 0 : GetBe32(stored);
}

}  // namespace

const RecordKind kRecordKinds[] = {
    Kind("folder", "folder", kCatalogFileId, kFolderRecord, kFolderSize, kFolderFields),
    Kind("file", "file", kCatalogFileId, kFileRecord, kFileSize, kFileFields),
    Kind("thread", "thread-folder", kCatalogFileId, kFolderThread, kThreadFixed, kThreadFields),
    Kind("thread-folder", "thread-folder", kCatalogFileId, kFolderThread, kThreadFixed,
         kThreadFields),
    Kind("thread-file", "thread-file", kCatalogFileId, kFileThread, kThreadFixed, kThreadFields),
    Kind("extents", "extents", kExtentsFileId, 0, kExtentRecordSize, kOverflowFields),
    {"inline", "inline", kAttributesFileId, kInlineAttribute, kInlineFixed, nullptr, 0},
    Kind("fork", "fork", kAttributesFileId, kForkAttribute, kForkAttributeSize,
         kForkAttributeFields),
    Kind("extents", "extents", kAttributesFileId, kExtentsAttribute, kExtentsAttributeSize,
         kExtentsAttributeFields),
};
const u32 kRecordKindCount = static_cast<u32>(std::size(kRecordKinds));

const RecordKind* KindOfRecord(u32 fileId, const u8* stored, u32 size) {
    const u32 type = TypeOf(fileId, stored, size);
    for (const RecordKind& kind : kRecordKinds) {
        if (kind.fileId == fileId && kind.type == type && size >= kind.size) {
            return &kind;
        }
    }
    return nullptr;
}

const RecordKind* KindByName(std::string_view name, u32 fileId) {
    const RecordKind* other = nullptr;
    for (const RecordKind& kind : kRecordKinds) {
        if (name == kind.name) {
            if (kind.fileId == fileId) {
                return &kind;
            }
            other = &kind;
        }
    }
    return other;
}

const Field* FieldByName(const RecordKind& kind, std::string_view name) {
    for (u32 i = 0; i < kind.fieldCount; ++i) {
        if (name == kind.fields[i].name) {
            return &kind.fields[i];
        }
    }
    return nullptr;
}

u64 GetField(const u8* record, const Field& field) {
    u64 value = 0;
    for (u32 i = 0; i < field.width; ++i) {
        value = value << 8 | record[field.offset + i];
    }
    return value;
}

void PutField(u8* record, const Field& field, u64 value) {
    for (u32 i = field.width; i-- > 0; value >>= 8) {
        record[field.offset + i] = static_cast<u8>(value);
    }
}

u64 SumOfExtents(const u8* extents) {
    u64 sum = 0;
    for (u32 i = 0; i < kExtentCount; ++i) {
        sum += GetBe32(extents + 8 * i + 4);
    }
    return sum;
}

u32 UsedExtents(const u8* extents) {
    u32 used = 0;
    for (u32 i = 0; i < kExtentCount; ++i) {
        if (GetBe32(extents + 8 * i) != 0 || GetBe32(extents + 8 * i + 4) != 0) {
            used = i + 1;
        }
    }
    return used;
}

}  // namespace VELK
