// See ledger.h.
#include "ledger.h"

#include <algorithm>
#include <cstddef>

namespace VELK::test {

namespace {

const HfsNode* FromLink(const rb_node* link) {
    return reinterpret_cast<const HfsNode*>(link);  // first member
}

const HfsNode* FromModifiedLink(const list_head* link) {
    return reinterpret_cast<const HfsNode*>(reinterpret_cast<const u8*>(link) -
                                            offsetof(HfsNode, modifiedLink));
}

void Collect(const rb_node* link, std::vector<const HfsNode*>* nodes) {
    if (link != nullptr) {
        Collect(link->left, nodes);
        nodes->push_back(FromLink(link));
        Collect(link->right, nodes);
    }
}

std::vector<const HfsNode*> ListedNodes(const CBTreeHfs& tree) {
    std::vector<const HfsNode*> nodes;
    for (const list_head* link = tree.modifiedList.next; link != &tree.modifiedList;
         link = link->next) {
        nodes.push_back(FromModifiedLink(link));
    }
    return nodes;
}

}  // namespace

u32 References(const HfsFindData& path) {
    u32 count = 0;
    for (const HfsFindLevel& level : path.path) {
        count += level.node != nullptr ? 1 : 0;
    }
    return count;
}

std::vector<const HfsNode*> CachedNodes(const CBTreeHfs& tree) {
    std::vector<const HfsNode*> nodes;
    Collect(tree.nodeRoot, &nodes);
    return nodes;
}

const HfsNode* CachedNode(const CBTreeHfs& tree, u32 nodeNum) {
    for (const HfsNode* node : CachedNodes(tree)) {
        if (node->nodeNum == nodeNum) {
            return node;
        }
    }
    return nullptr;
}

std::vector<u32> ModifiedNodes(const CBTreeHfs& tree) {
    std::vector<u32> numbers;
    for (const HfsNode* node : ListedNodes(tree)) {
        numbers.push_back(node->nodeNum);
    }
    return numbers;
}

bool HasDirty(const CBTreeHfs& tree, const HfsNode* node) {
    for (u32 b = 0; b < tree.header.blocksPerNode; ++b) {
        if (node->bufs[b].dirty) {
            return true;
        }
    }
    return false;
}

::testing::AssertionResult ShortcutsHold(const CBTreeHfs& tree) {
    const std::vector<const HfsNode*> nodes = CachedNodes(tree);
    ::testing::AssertionResult failure = ::testing::AssertionFailure();
    const rb_node* last = nodes.empty() ? nullptr : &nodes.back()->link;
    if (tree.lastLink != last) {
        return failure << "the link of the last node is not that";
    }
    for (const HfsNode* late : tree.lateNodes) {
        if (late != nullptr &&
            (std::count(nodes.begin(), nodes.end(), late) != 1 ||
             std::count(std::begin(tree.lateNodes), std::end(tree.lateNodes), late) != 1)) {
            return failure << "a node that is remembered is not cached, or is so twice";
        }
    }
    return ::testing::AssertionSuccess();
}

::testing::AssertionResult LedgerHolds(const CBTreeHfs& tree, u32 references) {
    const std::vector<const HfsNode*> nodes = CachedNodes(tree);
    const std::vector<const HfsNode*> listed = ListedNodes(tree);
    ::testing::AssertionResult failure = ::testing::AssertionFailure();
    if (nodes.size() != tree.nodeCount) {
        return failure << nodes.size() << " nodes cached, nodeCount " << tree.nodeCount;
    }
    long sum = 0;
    for (std::size_t i = 0; i < nodes.size(); ++i) {
        const HfsNode* node = nodes[i];
        if (i > 0 && nodes[i - 1]->nodeNum >= node->nodeNum) {
            return failure << "node " << node->nodeNum << " is out of order";
        }
        if (node->refCount < 0) {
            return failure << "node " << node->nodeNum << " has " << node->refCount;
        }
        sum += node->refCount;
        const bool isListed = std::count(listed.begin(), listed.end(), node) == 1;
        if (isListed != HasDirty(tree, node)) {
            return failure << "node " << node->nodeNum
                           << (isListed ? " is listed and clean" : " is dirty and not listed");
        }
    }
    for (const HfsNode* node : listed) {
        if (std::count(nodes.begin(), nodes.end(), node) != 1) {
            return failure << "a listed node is not cached";
        }
    }
    if (sum != static_cast<long>(references)) {
        return failure << sum << " references counted, " << references << " known";
    }
    return ShortcutsHold(tree);
}

}  // namespace VELK::test
