// Whose change it is. In a tree that Create made, every record lies where a lookup of its key ends,
// as long as records come and go by InsertRecord and DeleteRecord alone and to their end. The
// operations these are made of are public as well: called by somebody else, they may put a record
// anywhere, and `isAllOwn` ends with them.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// What the tree's own path says while InsertRecord or DeleteRecord is at work: it leads nowhere,
// and changes are the engine's own.
constexpr u64 kOwnChange = ~u64{0};

// In each operation that changes records or gives nodes back.
inline void NoteChange(CBTreeHfs* tree) {
    tree->isAllOwn = tree->isAllOwn && tree->findData.leadsAsOf == kOwnChange;
}

// One whole change by the engine. Unless it is said to be done it was left half-way.
class OwnChange {
public:
    explicit OwnChange(CBTreeHfs* tree) : tree_(tree), before_(tree->findData.leadsAsOf) {
        tree_->findData.leadsAsOf = kOwnChange;
    }
    ~OwnChange() {
        if (tree_ != nullptr) {
            tree_->findData.leadsAsOf = 0;
            tree_->isAllOwn = false;
        }
    }
    OwnChange(const OwnChange&) = delete;
    OwnChange& operator=(const OwnChange&) = delete;

    void Done() {
        tree_->findData.leadsAsOf = before_;
        tree_ = nullptr;
    }

private:
    CBTreeHfs* tree_;
    u64 before_;
};

}  // namespace VELK
