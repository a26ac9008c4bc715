// Asking the processor for memory before it is needed. It changes nothing but the time.
#pragma once

#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/one_piece.h"

namespace VELK {

constexpr u32 kCacheLine = 64;  // bytes

// To be put into their callers early, like all that does nothing else: left alone, a compiler finds
// that they do nothing and drops the calls.
[[gnu::always_inline]] inline void Prefetch(const u8* bytes, u32 size) {
    for (u32 at = 0; at < size; at += kCacheLine) {
        __builtin_prefetch(bytes + at);
    }
}

// Bytes of a node of which only the first block is known. The blocks of a node mostly lie one
// behind the other; where they do not, the request is in vain.
[[gnu::always_inline]] inline void PrefetchNode(const u8* firstBlock, u32 offset, u32 size) {
    const std::uintptr_t from = reinterpret_cast<std::uintptr_t>(firstBlock) + offset;
#pragma GCC unroll 8
    for (u32 at = 0; at < size; at += kCacheLine) {
        __builtin_prefetch(reinterpret_cast<const void*>(from + at));
    }
}

// The offset table: one line of it in a leaf, where that is 32 records, two in an index node.
[[gnu::always_inline]] inline void PrefetchTail(const BTHeaderMem& header, const u8* firstBlock,
                                                u32 lines) {
    PrefetchNode(firstBlock, header.nodeSize - lines * kCacheLine, lines * kCacheLine);
}

// The lines of a leaf, on the way to it. A search meets keys at any place, each in a line that was
// met long ago, and only then knows the next one; a walk or a change from there on meets what lies
// behind. Asked for together, lines come in the time of two. In a larger leaf most would be in
// vain.
enum class LeafUse { kRecord, kPlace };
[[gnu::always_inline]] inline void PrefetchLeaf(const BTHeaderMem& header, const u8* firstBlock,
                                                LeafUse use) {
    constexpr u32 kLargestLeaf = 8192;
    if (firstBlock != nullptr && header.nodeSize <= kLargestLeaf) {
        const u32 quarters = use == LeafUse::kPlace ? 3 : 2;
        PrefetchNode(firstBlock, 0, header.nodeSize / 4 * quarters);
    }
}

// The records of a node from node offset `offset` on, which a walk from there reads and a change
// there moves: as many as are met before the processor sees where this goes.
[[gnu::always_inline]] inline void PrefetchRecords(const BTHeaderMem* hdr, const HfsNode* node,
                                                   u32 offset) {
    constexpr u32 kMost = 1024;
    const NodeBytes bytes(hdr, node);
    const u8* from = bytes.At(offset);
    if (from != nullptr) {
        const u32 room = IsOnePiece(hdr, node) ? hdr->nodeSize - offset : bytes.Room(offset);
        Prefetch(from, room < kMost ? room : kMost);
    }
}

}  // namespace VELK
