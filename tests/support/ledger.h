// The books of a tree's cache: who holds what.
#pragma once

#include <gtest/gtest.h>

#include <vector>

#include "hfs/treehfs.h"

namespace VELK::test {

// Nodes a path holds.
u32 References(const HfsFindData& path);

// Holds when every cached node is in the red-black tree once and in order, nodeCount is right, the
// references of all cached nodes add up to `references` (all that the test knows of, those of the
// tree's own path included), a node is on the modified list exactly when one of its blocks is
// dirty, and shortcuts hold.
::testing::AssertionResult LedgerHolds(const CBTreeHfs& tree, u32 references);

// Holds when the ways to cached nodes past the red-black tree lead to nodes that are in it: the
// last link to the one with the greatest number, late nodes to any.
::testing::AssertionResult ShortcutsHold(const CBTreeHfs& tree);

// The cached nodes in ascending order.
std::vector<const HfsNode*> CachedNodes(const CBTreeHfs& tree);
// The cached node of this number, or null. Changes no count.
const HfsNode* CachedNode(const CBTreeHfs& tree, u32 nodeNum);
// Numbers of the nodes on the modified list, in its order.
std::vector<u32> ModifiedNodes(const CBTreeHfs& tree);
bool HasDirty(const CBTreeHfs& tree, const HfsNode* node);

}  // namespace VELK::test
