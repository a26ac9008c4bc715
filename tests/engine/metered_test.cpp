// The meter under the tests: does it notice a call that takes more than it may?
#include "metered.h"

#include <gtest/gtest-spi.h>
#include <gtest/gtest.h>

namespace {

using namespace VELK;
using namespace VELK::test;

constexpr u32 kPieces = 1000;

void TakeHeapWithoutRequests() {
    CBTreeHfs tree;
    tree.header.nodeSize = 512;
    void* memory = nullptr;
    {
        const Metered::Call call(&tree);
        memory = velk_heap_alloc(kPieces * sizeof(HfsRuns::Run));
    }
    velk_heap_free(memory);
}

TEST(Metered, HeapThatNoRequestStandsBehindIsNoticed) {
    const HeapGuard heap;
    EXPECT_NONFATAL_FAILURE(TakeHeapWithoutRequests(), "12000 bytes of heap taken by a call");
}

TEST(Metered, AFileThatGrowsInPiecesMayTakeARunForEach) {
    const HeapGuard heap;
    CBTreeHfs tree;
    tree.header.nodeSize = 512;
    const Metered::Call call(&tree);
    for (u32 piece = 0; piece < kPieces; ++piece) {
        ASSERT_TRUE(tree.runs.AddEntry(piece, 2 * piece, 1));
    }
}

}  // namespace
