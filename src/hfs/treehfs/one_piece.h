// Nodes that lie in one piece: in one block, or in several that the volume lent one behind the
// other in memory. A change of such a node need not ask for each offset which block holds it, and
// one whose blocks were all marked before cannot be refused half-way.
#pragma once

#include <cstdint>

#include "hfs/treehfs.h"

namespace VELK {

// What HfsNode::isOnePiece says of the blocks of a node.
inline bool LieTogether(const BTHeaderMem* hdr, const HfsBcbBuf* blocks) {
    for (u32 i = 1; i < hdr->blocksPerNode; ++i) {
        if (blocks[i].data != blocks[i - 1].data + hdr->blockSize) {
            return false;
        }
    }
    return true;
}

inline bool IsOnePiece(const BTHeaderMem* hdr, const HfsNode* node) {
    return hdr->blockSize == hdr->nodeSize || node->isOnePiece;
}

inline bool IsMarked(const BTHeaderMem* hdr, const HfsNode* node) {
    bool isMarked = true;
    for (u32 i = 0; i < hdr->blocksPerNode; ++i) {
        isMarked = isMarked && node->bufs[i].dirty;
    }
    return isMarked;
}

inline bool IsMarkedPiece(const BTHeaderMem* hdr, const HfsNode* node) {
    return IsOnePiece(hdr, node) && IsMarked(hdr, node);
}

// Whether changes in one node leave the other alone: a damaged volume can give two nodes the same
// bytes. REQUIRES: each lies in one piece.
inline bool LieApart(const BTHeaderMem* hdr, const HfsNode* one, const HfsNode* other) {
    const std::uintptr_t a = reinterpret_cast<std::uintptr_t>(one->bufs[0].data);
    const std::uintptr_t b = reinterpret_cast<std::uintptr_t>(other->bufs[0].data);
    return (a > b ? a - b : b - a) >= hdr->nodeSize;
}

// Whether data of that size lies in no more than two blocks wherever it is moved: in three it is
// asserted each time its record is looked at.
inline bool StaysInTwoBlocks(const BTHeaderMem* hdr, u32 dataSize) {
    return dataSize <= hdr->blockSize;
}

// Whether there is nothing to say of a record whose data lies from `data` to `end`, wherever it is
// moved.
inline bool CanMoveData(const BTHeaderMem* hdr, u32 data, u32 end) {
    return data < end && StaysInTwoBlocks(hdr, end - data);
}

}  // namespace VELK
