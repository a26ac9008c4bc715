// Holds every call of a tree to the bounds that no input may break: node requests at most four
// times the tree's nodes and a few, cached nodes no more than there are, heap in proportion to what
// was requested and to the runs of the file. Stands for a pointer to the tree; what is called
// through it is measured until the call's statement ends, so a statement that hands a field to a
// function of many calls says (*tree).field.
#pragma once

#include "heap_guard.h"
#include "hfs/treehfs.h"

namespace VELK::test {

class Metered {
public:
    // One statement's use of the tree; a test failure at its end when a bound was broken.
    class Call {
    public:
        explicit Call(CBTreeHfs* tree);
        ~Call();
        Call(const Call&) = delete;
        Call& operator=(const Call&) = delete;

        CBTreeHfs* operator->() const { return tree_; }

    private:
        CBTreeHfs* tree_;
        u32 requests_;
        u32 totalNodes_;
        std::size_t heapBytes_ = 0;
        std::size_t mapBytes_ = 0;
    };

    explicit Metered(CBTreeHfs* tree) : tree_(tree) {}

    Call operator->() const { return Call(tree_); }
    CBTreeHfs& operator*() const { return *tree_; }
    CBTreeHfs* Get() const { return tree_; }

private:
    CBTreeHfs* tree_;
};

// Most node requests one call may make in a tree of so many nodes.
constexpr u64 MostRequests(u64 totalNodes) {
    return 4 * (totalNodes + 64);
}

}  // namespace VELK::test
