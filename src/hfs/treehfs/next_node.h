// Asks for the memory of the node that will be taken next while records still go into others. A
// node behind the initialised part of the file is zeroed in one go when it is taken, and all of its
// lines are far away then. Volumes mostly lend the blocks of such nodes at equal distances: once
// it is the same twice in a row, the next node is asked for there, a few lines with each insertion.
// Where that leads elsewhere the requests are in vain.
#pragma once

#include "hfs/treehfs.h"
#include "hfs/treehfs/prefetch.h"

namespace VELK {

// A node behind the initialised part of the file came to lie at `data`, its first block.
inline void NoteNewNode(CBTreeHfs* tree, const u8* data) {
    const std::uintptr_t at = reinterpret_cast<std::uintptr_t>(data);
    const std::uintptr_t distance = at - tree->newestNode;
    tree->nextNodeLeft = distance == tree->newDistance ? tree->header.nodeSize : 0;
    tree->newestNode = at;
    tree->newDistance = distance;
}

// Asks for some more of the node to come.
inline void PrefetchNextNode(CBTreeHfs* tree) {
    constexpr u32 kAtOnce = 8 * kCacheLine;
    if (tree->nextNodeLeft >= kAtOnce) {
        tree->nextNodeLeft -= kAtOnce;
        const std::uintptr_t next = tree->newestNode + tree->newDistance + tree->nextNodeLeft;
        for (u32 at = 0; at < kAtOnce; at += kCacheLine) {
            __builtin_prefetch(reinterpret_cast<const void*>(next + at), 1);
        }
    }
}

}  // namespace VELK
