// Nodes that lie in one piece: in one block, or in several that the volume lent one behind the
// other in memory. A change of such a node need not ask for each offset which block holds it, and
// one whose blocks were all marked before cannot be refused half-way.
#pragma once

#include <cstdint>

#include "hfs/treehfs.h"

namespace VELK {

inline bool IsOnePiece(const BTHeaderMem* hdr, const HfsNode* node) {
    return hdr->blocksPerNode == 1 || node->isOnePiece;
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

// Whether a reader can follow data of that size wherever it lies: in three blocks it is asserted
// each time its record is looked at.
inline bool StaysInTwoBlocks(const BTHeaderMem* hdr, u32 dataSize) {
    return dataSize <= hdr->blockSize;
}

}  // namespace VELK
