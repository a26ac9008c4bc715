// One counted reference on a cached node, given back by the plain release: the count falls, the
// node stays cached. The full release, which drops unsaved changes, is always an explicit call.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

inline void ReleaseNode(HfsNode* node) {
    if (node != nullptr) {
        node->refCount -= 1;
    }
}

class NodeRef {
public:
    NodeRef() = default;
    explicit NodeRef(HfsNode* owned) : node_(owned) {}
    NodeRef(const NodeRef&) = delete;
    NodeRef& operator=(const NodeRef&) = delete;
    ~NodeRef() { ReleaseNode(node_); }

    // Where an operation that hands out a referenced node stores it.
    HfsNode** Out() {
        Reset();
        return &node_;
    }
    // For operations that step from one node to the next and release the old one themselves.
    HfsNode** InOut() { return &node_; }
    HfsNode* Get() const { return node_; }
    HfsNode* operator->() const { return node_; }
    explicit operator bool() const { return node_ != nullptr; }

    // Hands the reference over to the caller.
    HfsNode* Take() {
        HfsNode* node = node_;
        node_ = nullptr;
        return node;
    }
    void Reset() { ReleaseNode(Take()); }

private:
    HfsNode* node_ = nullptr;
};

}  // namespace VELK
