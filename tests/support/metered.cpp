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

// What a request may leave on the heap, at most: the node with its blocks and hints, or the runs
// found in it.
u64 HeapPerRequest(const CBTreeHfs& tree) {
    const u64 nodeSize = std::max<u64>(tree.header.nodeSize, u64{1} << tree.nodeShift);
    return sizeof(HfsNode) + (u64{tree.header.blocksPerNode} + 2) * sizeof(HfsBcbBuf) +
           4 * nodeSize;
}

}  // namespace

Metered::Call::Call(CBTreeHfs* tree)
    : tree_(tree), requests_(Requests(*tree)), totalNodes_(tree->header.totalNodes) {
    if (HeapGuard* heap = HeapGuard::Current()) {
        heap->ResetPeak();
        heapBytes_ = heap->PeakBytes();
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
    if (grown > (requests + 4) * HeapPerRequest(*tree_)) {
        ADD_FAILURE() << grown << " bytes of heap taken by a call that requested " << requests
                      << " nodes";
    }
}

}  // namespace VELK::test
