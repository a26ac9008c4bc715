// Asking the processor for memory before it is needed. It changes nothing but the time.
#pragma once

#include "hfs/treehfs/bytes.h"

namespace VELK {

constexpr u32 kCacheLine = 64;  // bytes

// To be put into their callers early, like all that does nothing else: left alone, a compiler finds
// that they do nothing and drops the calls.
[[gnu::always_inline]] inline void Prefetch(const u8* bytes, u32 size) {
    for (u32 at = 0; at < size; at += kCacheLine) {
        __builtin_prefetch(bytes + at);
    }
}

// The offset table of a node of which only the first block is known. The blocks of a node mostly
// lie one behind the other; where they do not, the request is in vain.
[[gnu::always_inline]] inline void PrefetchTail(const BTHeaderMem& header, const u8* firstBlock) {
    const std::uintptr_t end = reinterpret_cast<std::uintptr_t>(firstBlock) + header.nodeSize;
    __builtin_prefetch(reinterpret_cast<const void*>(end - kCacheLine));
}

// The records of a node from node offset `offset` on, which a walk from there reads and a change
// there moves: as many as are met before the processor sees where this goes.
[[gnu::always_inline]] inline void PrefetchRecords(const BTHeaderMem* hdr, const HfsNode* node,
                                                   u32 offset) {
    constexpr u32 kMost = 1024;
    const NodeBytes bytes(hdr, node);
    const u8* from = bytes.At(offset);
    if (from != nullptr) {
        const u32 room = bytes.Room(offset);
        Prefetch(from, room < kMost ? room : kMost);
    }
}

}  // namespace VELK
