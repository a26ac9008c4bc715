// See metered.h.
#include "metered.h"

#include <gtest/gtest.h>

#include <algorithm>

namespace VELK::test {

namespace {

constexpr u64 kSpareNodes = 64;  // that a growing tree may take before its header counts them

// Node requests so far; a tree set up anew counts from 0.
u32 Requests(const CBTreeHfs& tree) {
    return tree.hitCount + tree.readCount;
}

// What a request may leave on the heap, at most: the node with its blocks and hints, or the bad
// runs found in it.
u64 HeapPerRequest(const CBTreeHfs& tree) {
    const u64 nodeSize = std::max<u64>(tree.header.nodeSize, u64{1} << tree.nodeShift);
    return sizeof(HfsNode) + (u64{tree.header.blocksPerNode} + 2) * sizeof(HfsBcbBuf) +
           4 * nodeSize;
}

// Heap that the map of the tree's file takes. No request stands behind it: a volume in pieces may
// give a growing file a run for each block.
std::size_t MapBytes(const HeapGuard& heap, const CBTreeHfs& tree) {
    return tree.runs.Count() > 0 ? heap.BytesOf(&tree.runs.At(0)) : 0;
}

}  // namespace

Metered::Call::Call(CBTreeHfs* tree)
    : tree_(tree), requests_(Requests(*tree)), totalNodes_(tree->header.totalNodes) {
    if (HeapGuard* heap = HeapGuard::Current()) {
        heap->ResetPeak();
        heapBytes_ = heap->PeakBytes();
        mapBytes_ = MapBytes(*heap, *tree);
    }
}

Metered::Call::~Call() {
    const u32 now = Requests(*tree_);
    const u64 requests = now >= requests_ ? now - requests_ : now;
    const u64 totalNodes = std::max(totalNodes_, tree_->header.totalNodes);
    if (requests > MostRequests(totalNodes)) {
        ADD_FAILURE() << requests << " node requests by one call in a tree of " << totalNodes;
    }
    if (tree_->nodeCount > totalNodes + kSpareNodes) {
        ADD_FAILURE() << tree_->nodeCount << " nodes cached of a tree of " << totalNodes;
    }
    const HeapGuard* heap = HeapGuard::Current();
    if (heap == nullptr || heap->PeakBytes() <= heapBytes_) {
        return;
    }
    const u64 grown = heap->PeakBytes() - heapBytes_;
    const u64 mapBytes = MapBytes(*heap, *tree_);
    // A map that grows doubles, and both copies are out for a while.
    const u64 mapGrown = mapBytes > mapBytes_ ? mapBytes + mapBytes / 2 : 0;
    if (grown > (requests + 4) * HeapPerRequest(*tree_) + mapGrown) {
        ADD_FAILURE() << grown << " bytes of heap taken by a call that requested " << requests
                      << " nodes";
    }
}

}  // namespace VELK::test
