// The fields of catalog and attribute records by name: what a readable record says and where it
// lies. One table per record serves parsing, printing and JSON.
#pragma once

#include <string_view>
#include <vector>

#include "hfs/format.h"
#include "platform/types.h"

namespace VELK {

// First 16 bits of catalog data.
constexpr u16 kFolderRecord = 1;
constexpr u16 kFileRecord = 2;
constexpr u16 kFolderThread = 3;
constexpr u16 kFileThread = 4;
constexpr u32 kFolderSize = 88;   // bytes of a folder record
constexpr u32 kFileSize = 248;    // bytes of a file record
constexpr u32 kThreadFixed = 10;  // bytes of a thread in front of its name

// First 32 bits of attribute data.
constexpr u32 kInlineAttribute = 0x10;
constexpr u32 kForkAttribute = 0x20;
constexpr u32 kExtentsAttribute = 0x30;
constexpr u32 kInlineFixed = 16;           // bytes of an inline attribute in front of its value
constexpr u32 kForkAttributeSize = 88;     // bytes of an attribute with a fork
constexpr u32 kExtentsAttributeSize = 72;  // bytes of further extents of one

// How a field is written.
enum class FieldKind {
    kNumber,   // decimal
    kHex,      // after 0x
    kOctal,    // after 0
    kDate,     // seconds since 1904, as ISO 8601
    kCode,     // four characters, in quotes when printable
    kExtents,  // eight descriptors, [[start,count],...]
    kBlocks,   // the sum of the extents that follow it unless given
};

// One field of a record.
struct Field {
    const char* name;  // as in text and JSON
    u16 offset;        // bytes from the record's start
    u8 width;          // bytes
    FieldKind kind;    // how it is written
};

// One kind of record.
struct RecordKind {
    const char* name;      // as written before the braces
    const char* typeName;  // as listings show it
    u32 fileId;            // the tree it belongs to
    u32 type;              // first 16 or 32 bits; 0 in the extents tree, which has one kind
    u32 size;              // bytes without a name or a value
    const Field* fields;   // its fields, in the order they are printed
    u32 fieldCount;        // entries of `fields`
};

// All kinds, and how many there are.
extern const RecordKind kRecordKinds[];
extern const u32 kRecordKindCount;

// The kind of a stored record; null for a type nobody knows or a record too short for its fields.
const RecordKind* KindOfRecord(u32 fileId, const u8* stored, u32 size);
// The kind named in text; `fileId` decides between kinds of the same name. Null: none; kinds of
// other trees are found too.
const RecordKind* KindByName(std::string_view name, u32 fileId);
// The field of that name; null: none.
const Field* FieldByName(const RecordKind& kind, std::string_view name);

// Big-endian number of `width` bytes (1, 2, 4 or 8).
u64 GetField(const u8* record, const Field& field);
void PutField(u8* record, const Field& field, u64 value);
// Sum of the block counts of the eight extents at `extents`.
u64 SumOfExtents(const u8* extents);
// Descriptors up to the last one that is not all zero.
u32 UsedExtents(const u8* extents);

}  // namespace VELK
