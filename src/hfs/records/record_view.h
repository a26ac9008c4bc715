// Records for the eye and for programs: what listings say of them, and their JSON members.
#pragma once

#include <string>

#include "hfs/records/json_writer.h"
#include "platform/types.h"

namespace VELK {

// "folder", "thread-file", "inline", ...; "unknown" for what nobody knows.
const char* RecordTypeName(u32 fileId, const u8* stored, u32 size);

// Folder or file ID of a catalog record, 0 for any other.
u32 RecordId(u32 fileId, const u8* stored, u32 size);

// One line without line feed: "file id 20, size 2, data [59,1]".
std::string RecordSummary(u32 fileId, const u8* stored, u32 size);
// What follows type and ID in a table: "size 2 data [59,1] created 2026-11-21 01:18:16Z".
std::string RecordDetails(u32 fileId, const u8* stored, u32 size);

// Writes "type" and the record's fields, those that are 0 left out, into the open object.
void RecordMembers(u32 fileId, const u8* stored, u32 size, JsonWriter* json);
// Writes the fields of a key into the open object: parent and name, file and fork, ...; "hex" for
// bytes that are no key of this tree.
void KeyMembers(u32 fileId, const u8* stored, u32 size, JsonWriter* json);

}  // namespace VELK
