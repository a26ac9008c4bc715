// The node descriptor: links, kind, height and record count of a node, read and written in place.
#pragma once

#include "hfs/treehfs/bytes.h"

namespace VELK {

// Every node has at least one block and blocks hold at least 512 bytes, so the descriptor lies in
// the first block whatever the geometry.
inline u32 FLink(const HfsNode* node) {
    return GetBe32(node->bufs[0].data + kDescFLink);
}
inline u32 BLink(const HfsNode* node) {
    return GetBe32(node->bufs[0].data + kDescBLink);
}
inline s8 Kind(const HfsNode* node) {
    return static_cast<s8>(node->bufs[0].data[kDescKind]);
}
inline u32 Height(const HfsNode* node) {
    return node->bufs[0].data[kDescHeight];
}
inline u32 NumRecords(const HfsNode* node) {
    return GetBe16(node->bufs[0].data + kDescNumRecords);
}
inline bool IsLeaf(const HfsNode* node) {
    return Kind(node) == kBTLeafNode;
}

// REQUIRES of the writers: the descriptor's block was marked with SetDirty(node, 0).
inline void SetFLink(const BTHeaderMem* hdr, HfsNode* node, u32 value) {
    NodeBytes(hdr, node).SetU32(kDescFLink, value);
}
inline void SetBLink(const BTHeaderMem* hdr, HfsNode* node, u32 value) {
    NodeBytes(hdr, node).SetU32(kDescBLink, value);
}
inline void SetKind(const BTHeaderMem* hdr, HfsNode* node, s8 value) {
    NodeBytes(hdr, node).SetU8(kDescKind, static_cast<u8>(value));
}
inline void SetHeight(const BTHeaderMem* hdr, HfsNode* node, u32 value) {
    NodeBytes(hdr, node).SetU8(kDescHeight, value);
}
inline void SetNumRecords(const BTHeaderMem* hdr, HfsNode* node, u32 value) {
    NodeBytes(hdr, node).SetU16(kDescNumRecords, value);
}

// Node offset of the slot of record `index`. REQUIRES: 2 x (index + 1) <= nodeSize.
inline u32 SlotOffset(const BTHeaderMem* hdr, u32 index) {
    return hdr->nodeSize - kSlotSize * (index + 1);
}

}  // namespace VELK
