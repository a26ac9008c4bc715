// Record data as text. Readable: folder{id:16,valence:3} file{id:20,size:1107,data:[[17,1]]}
// thread{parent:2,name:"dir"} thread-file{...} extents{[[100,8]]} inline{"text"} inline{hex:...}
// fork{size:...,data:[...]}; fields left out are 0, and the block count of a fork is the sum of its
// extents unless `blocks` says otherwise. Bytes: hex:..., @FILE, @- (standard input), zero:N,
// fill:XX*N, seq:N. And `same`, the data the record has already. Records are in the form they have
// on disk.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "hfs/records/quoted.h"
#include "hfs/volume/problem.h"

namespace VELK {

// What a text of data stands for.
struct RecordData {
    bool isSame = false;     // `same`: the bytes are the record's own
    std::vector<u8> stored;  // otherwise
};

// Most bytes one record's text may stand for; no node holds more than a fraction of it.
constexpr u32 kMostRecordBytes = 1u << 20;

// Reads the data of a record of tree `fileId`. Files are read at once.
Problem ParseData(std::string_view text, u32 fileId, RecordData* data);

// The readable form of a stored record, or hex:... when that would not say it all.
std::string DataText(u32 fileId, const u8* stored, u32 size, Blanks blanks);

}  // namespace VELK
