// Records as lines of JSON: {"key":{...},"type":...,fields...,"raw":"..."}, the way `export` writes
// and `import` reads them.
#pragma once

#include <string>
#include <vector>

#include "hfs/records/json_reader.h"
#include "hfs/records/key_text.h"
#include "hfs/volume/problem.h"
#include "platform/types.h"

namespace VELK {

// What a line holds besides the readable members.
struct RecordJsonOptions {
    bool raw = true;       // the data as bytes besides
    bool rawKeys = false;  // the key as bytes besides
};

// One record, key and data as stored, without line feed. A key the readable members cannot hold
// brings its bytes unasked.
void AppendRecordJson(u32 fileId, const u8* key, u32 keySize, const u8* data, u32 dataSize,
                      const RecordJsonOptions& options, std::string* line);

// The way back. Bytes decide where they are present.
Problem RecordFromJson(const JsonValue& record, u32 fileId, SearchKey* key,
                       std::vector<u8>* stored);

}  // namespace VELK
