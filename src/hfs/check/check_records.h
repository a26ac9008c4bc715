// Layout of leaf data and forks as far as the checker looks at them; offsets in the data.
#pragma once

#include "hfs/check/check_node.h"

namespace VELK {

// Catalog records: u16 type first.
constexpr u32 kCatFolder = 1;
constexpr u32 kCatFile = 2;
constexpr u32 kCatFolderThread = 3;
constexpr u32 kCatFileThread = 4;
constexpr u32 kCatMaxName = 255;
constexpr u32 kFolderRecordSize = 88;
constexpr u32 kFolderValence = 4;  // u32
constexpr u32 kFileRecordSize = 248;
constexpr u32 kItemId = 8;          // u32, of file and folder
constexpr u32 kFileDataFork = 88;   // fork data
constexpr u32 kFileRsrcFork = 168;  // fork data
constexpr u32 kThreadParentId = 4;  // u32
constexpr u32 kThreadNameLength = 8;
constexpr u32 kThreadName = 10;
constexpr u32 kThreadFixed = 10;  // without the name

// Attribute records: u32 type first.
constexpr u32 kAttrInline = 0x10;
constexpr u32 kAttrFork = 0x20;
constexpr u32 kAttrExtents = 0x30;
constexpr u32 kAttrInlineSize = 12;  // u32: bytes of the value
constexpr u32 kAttrInlineData = 16;
constexpr u32 kAttrForkSize = 88;
constexpr u32 kAttrForkData = 8;  // fork data
constexpr u32 kAttrExtentsSize = 72;
constexpr u32 kAttrExtentsRuns = 8;

// Fork data: 80 bytes.
constexpr u32 kForkLogicalSize = 0;   // u64
constexpr u32 kForkTotalBlocks = 12;  // u32
constexpr u32 kForkExtents = 16;
constexpr u32 kForkSize = 80;
constexpr u32 kExtentSize = 8;  // u32 start, u32 count
static_assert(kForkExtents + kExtentCount * kExtentSize == kForkSize);

// Eight runs at `offset` of the node: none behind an empty one, empty ones all 0.
void CheckExtentPacking(const CheckTree& tree, CheckId id, const CheckNode& node, u32 index,
                        u32 offset);

// Whether the data has the type and size its tree demands, so that others may read its fields.
bool IsDataUsable(const CheckTree& tree, const CheckRecord& record);

}  // namespace VELK
