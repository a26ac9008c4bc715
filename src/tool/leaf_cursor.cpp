// The walk over leaf records.
#include "tool/leaf_cursor.h"

#include <fmt/format.h>

#include "hfs/treehfs/bytes.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

// A step out of a ring of empty leaves asks for as many nodes as there are, and every leaf may lead
// into one: so often may all nodes be asked for before the rest is given up.
constexpr u64 kMostRounds = 4;

const u8* NodeStart(const HfsNode* node) {
    return node->bufs[0].data;
}

// Adds the nodes asked for while it lives to a sum.
class RequestCount {
public:
    RequestCount(const CBTreeHfs* tree, u64* sum) : tree_(tree), before_(Now()), sum_(sum) {}
    ~RequestCount() { *sum_ += Now() - before_; }
    RequestCount(const RequestCount&) = delete;
    RequestCount& operator=(const RequestCount&) = delete;

private:
    u32 Now() const { return tree_->hitCount + tree_->readCount; }

    const CBTreeHfs* tree_;
    u32 before_;
    u64* sum_;
};

}  // namespace

LeafCursor::LeafCursor(Session* session, u32 fileId, bool keepGoing)
    : session_(session),
      tree_(session->Tree(fileId)),
      fileId_(fileId),
      keepGoing_(keepGoing),
      reader_(tree_) {
    record_.resize(std::size_t{tree_->header.nodeSize} + tree_->convert.minDataBuffer);
}

void LeafCursor::Damaged(u32 node, int status, const std::string& detail) {
    const Problem problem = session_->ProblemOf(fileId_, node, status, detail);
    if (!keepGoing_) {
        ThrowProblem(session_->Image(), problem);
    }
    session_->NotePassedOver(problem);
}

void LeafCursor::SeekFrom(const std::optional<SearchKey>& from) {
    if (from) {
        Seek(*from, nullptr);
    } else {
        SeekFirst();
    }
}

void LeafCursor::SeekFirst() {
    Seek(LowestKey(fileId_, 0), nullptr);
}

void LeafCursor::Seek(const SearchKey& key, bool* found) {
    bool present = false;
    path_.ClearPath();
    isSound_ = false;
    hasLast_ = false;
    leaves_ = 1;
    requests_ = 0;
    Last() = key;
    int status =
        tree_->FindEntry(key.Key(), key.id, &path_, &present, nullptr, nullptr, nullptr, nullptr);
    if (found != nullptr) {
        *found = present;
    }
    if (status != 0) {
        u32 node = tree_->header.rootNode;
        for (u32 level = kMaxPathDepth; level >= 1; --level) {
            if (path_.path[level].node != nullptr) {
                node = path_.path[level].node->nodeNum;
            }
        }
        const u32 child = DamagedChild();
        Damaged(child != 0 ? child : node, status, "");
        if (!PassOver(child) && !OpenLeaf(tree_->header.firstLeafNode)) {
            path_.ClearPath();
            return;
        }
    }
    if (path_.level == 1 && path_.path[1].node != nullptr) {  // else the tree is empty
        isSound_ = true;
        StandOnLeaf();
    }
}

void LeafCursor::StandOnLeaf() {
    index_ = static_cast<u32>(path_.path[1].index);
    count_ = GetBe16(NodeStart(path_.path[1].node) + kDescNumRecords);
}

// The leaf at which a lookup that got as far as level 2 failed; 0: it did not get there.
u32 LeafCursor::DamagedChild() const {
    const HfsFindLevel& parent = path_.path[2];
    unsigned child = 0;
    if (parent.node == nullptr ||
        parent.node->GetChildNodeNum(&tree_->header, parent.index, &child) != 0) {
        return 0;
    }
    return child;
}

// Places the path on a leaf by its number, past the index.
bool LeafCursor::OpenLeaf(u32 nodeNum) {
    if (nodeNum == 0 || nodeNum >= tree_->header.totalNodes) {
        return false;
    }
    path_.ClearPath();
    path_.valid = false;
    const int status = tree_->ReadLevel(1, nodeNum, &path_);
    if (status != 0) {
        path_.ClearPath();
        Damaged(nodeNum, status, "not a leaf that can be read");
        return false;
    }
    path_.level = 1;
    path_.valid = true;
    return true;
}

// The leaf that the index names after leaf `damaged`; 0: none.
u32 LeafCursor::SiblingInIndex(u32 damaged) {
    HfsFindData path;
    bool present = false;
    const SearchKey& from = Last();
    if (tree_->header.treeDepth > 1) {
        // The lookup may fail at a damaged leaf: level 2 is there all the same.
        tree_->FindEntry(from.Key(), from.id, &path, &present, nullptr, nullptr, nullptr, nullptr);
    }
    u32 next = 0;
    bool passed = false;
    int index = path.path[2].index;
    for (u32 hops = 0; path.path[2].node != nullptr && next == 0; ++hops) {
        const HfsNode* parent = path.path[2].node;
        const int records = GetBe16(NodeStart(parent) + kDescNumRecords);
        for (; index < records && next == 0; ++index) {
            unsigned child = 0;
            if (parent->GetChildNodeNum(&tree_->header, index, &child) == 0) {
                next = passed ? child : 0;
                passed = passed || child == damaged;
            }
        }
        const u32 sibling = GetBe32(NodeStart(parent));
        index = 0;
        if (next != 0 || sibling == 0 || hops > tree_->header.totalNodes ||
            tree_->ReadLevel(2, sibling, &path) != 0) {
            break;
        }
    }
    path.ClearPath();
    return next;
}

// Whether the walk has been longer than any that is sound.
bool LeafCursor::IsOverdue() const {
    const u64 nodes = tree_->header.totalNodes;
    return leaves_ > nodes || requests_ > kMostRounds * nodes;
}

// Goes on at the first leaf behind `damaged` that can be read. False: there is none.
bool LeafCursor::PassOver(u32 damaged) {
    while (damaged != 0 && !IsOverdue()) {
        const RequestCount count(tree_, &requests_);
        leaves_ += 1;
        damaged = SiblingInIndex(damaged);
        if (OpenLeaf(damaged)) {
            return true;
        }
    }
    return false;
}

bool LeafCursor::EnterNextLeaf() {
    if (IsOverdue()) {
        Damaged(path_.path[1].node->nodeNum, kErrCorrupt, "more leaves than the tree has nodes");
        return false;
    }
    unsigned size = 0;
    u32 next = GetBe32(NodeStart(path_.path[1].node));
    path_.path[1].index = static_cast<s32>(count_);
    int status = kOk;
    {
        const RequestCount count(tree_, &requests_);
        status = tree_->IncPos(0, record_.data(), static_cast<unsigned>(record_.size()), &size,
                               nullptr, 0, nullptr, &path_);
    }
    if (status == kErrNotFound) {
        return false;
    }
    leaves_ += 1;
    // A record that cannot be delivered leaves the path on its leaf; Next will name it.
    if (status != 0 && !path_.valid) {
        next = path_.path[1].node != nullptr ? path_.path[1].node->nodeNum : next;
        path_.ClearPath();
        Damaged(next, status, "the leaf before leads there");
        if (!PassOver(next)) {
            return false;
        }
    }
    StandOnLeaf();
    return true;
}

// Takes the record's key as the last one if it is sound and greater than that.
LeafCursor::KeyState LeafCursor::TakeKey(const LeafRecord& record) {
    SearchKey& key = keys_[1 - last_];
    if (!SearchKeyFromStored(fileId_, record.key, record.keySize, &key)) {
        return KeyState::kUnsound;
    }
    const BTreeKey* stored = reinterpret_cast<const BTreeKey*>(record.key);
    if (hasLast_ && tree_->compareKeys(Last().Key(), Last().id, stored) >= 0) {
        return KeyState::kNotAbove;
    }
    last_ = 1 - last_;
    hasLast_ = true;
    return KeyState::kSound;
}

bool LeafCursor::Next(LeafRecord* record) {
    while (isSound_) {
        if (index_ >= count_) {
            isSound_ = EnterNextLeaf();
            continue;
        }
        const u32 node = path_.path[1].node->nodeNum;
        const int status = reader_.Describe(path_.path[1].node, index_, record);
        const KeyState state = status == 0 ? TakeKey(*record) : KeyState::kUnsound;
        index_ += 1;
        if (status == 0 && state == KeyState::kSound) {
            return true;
        }
        if (status != 0) {
            Damaged(node, status, fmt::format("record {} cannot be located", index_ - 1));
        } else if (state == KeyState::kUnsound) {
            Damaged(node, kErrCorrupt, fmt::format("record {} has no sound key", index_ - 1));
        } else {
            Damaged(node, kErrCorrupt,
                    fmt::format("record {}: key {} is not above the one before it", index_ - 1,
                                KeyText(fileId_, record->key, record->keySize, Blanks::kPlain)));
        }
    }
    return false;
}

}  // namespace VELK::tool
