// The child an index record leads to.
#pragma once

#include "hfs/treehfs/plain_record.h"

namespace VELK {

// The child of a record of which length field and child lie in one piece each; 0: the record is not
// so plain.
template <typename Blocks>
[[gnu::always_inline]] inline u32 PlainChildIn(const CBTreeHfs* tree, const HfsNode* node,
                                               u32 index) {
    const Blocks blocks(tree, node);
    const u32 slots = blocks.SlotPair(index);
    const u32 start = slots & 0xFFFF;
    const u32 end = slots >> 16;
    if (HFS_UNLIKELY(end >= tree->header.nodeSize || start + kKeyLengthSize > end) ||
        HFS_UNLIKELY(Kind(node) != kBTIndexNode) ||
        HFS_UNLIKELY(!blocks.IsWhole(start, kKeyLengthSize)) ||
        HFS_UNLIKELY(PaddedKeySize(GetBe16(blocks.At(start))) + kChildSize != end - start) ||
        HFS_UNLIKELY(!blocks.IsWhole(end - kChildSize, kChildSize))) {
        return 0;
    }
    return GetBe32(blocks.At(end - kChildSize));
}

// The child of a record of which nothing is out of the ordinary; 0: something is.
inline u32 PlainChild(const CBTreeHfs* tree, const HfsNode* node, s32 index) {
    const u32 count = NumRecords(node);
    if (HFS_UNLIKELY(static_cast<u32>(index) >= count) ||
        HFS_UNLIKELY(!TableFits(tree->header, count)) || HFS_UNLIKELY(node->nodeNum == 0)) {
        return 0;
    }
    return WithBlocks(tree, node, [=](auto blocks) {
        return PlainChildIn<decltype(blocks)>(tree, node, static_cast<u32>(index));
    });
}

// GetChildNodeNum without the way round for plain records.
inline int ChildOf(const CBTreeHfs* tree, const HfsNode* node, s32 index, u32* child) {
    *child = PlainChild(tree, node, index);
    return *child != 0 ? kOk : node->GetChildNodeNum(&tree->header, index, child);
}

}  // namespace VELK
