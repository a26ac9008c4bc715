// Arguments of the commands that make volumes and trees, read from text. A mistake throws.
#pragma once

#include <string>

#include "hfs/volume/make_volume.h"

namespace VELK::tool {

// "4096" for all trees, or "c=8192,e=4096,a=8192". Empty: nothing changes.
void ReadNodeSizes(const std::string& text, FormatOptions* options);
// log2 of a node size; throws when it is none.
u32 NodeShiftOf(u64 nodeSize);

// Seconds since 1904 of "2026-11-21", "2026-11-21T01:18:16Z"; and of this moment.
u32 ReadDate(const std::string& text);
u32 HfsNow();

u64 ReadUuid(const std::string& text);
u64 RandomUuid();

// A name as a user types it, in the decomposed form that volumes hold.
std::u16string StoredName(const std::string& text);

// "512 KiB", "4 MiB".
std::string BinarySize(u64 bytes);

}  // namespace VELK::tool
