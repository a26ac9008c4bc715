// Every leaf key looked up from the root, as a reader would (D01): at each level the last record
// that is not above the key. What the walk has proved of neighbours must add up to this.
#include <algorithm>

#include "hfs/check/check_tree.h"

namespace VELK {
namespace {

// Where a lookup ends.
struct Arrival {
    bool isFound = false;
    u32 nodeNum = 0;
    u32 index = 0;
    std::string why;  // of a lookup that ends early
};

class Descent {
public:
    explicit Descent(CheckTree* tree) : tree_(*tree) {}

    Arrival Find(const u8* key);

private:
    // The last node loaded of a level; neighbours in key order share most of their path.
    struct Kept {
        std::vector<u8> bytes;
        CheckNode node;
        std::vector<u16> keys;  // starts of the records, 0: the key is not sound
    };

    Kept* Load(u32 nodeNum, u32 level);
    s64 LastNotAbove(const Kept& kept, const u8* key) const;

    CheckTree& tree_;
    Kept kept_[kMaxOpenDepth + 1];
};

Descent::Kept* Descent::Load(u32 nodeNum, u32 level) {
    Kept& kept = kept_[level];
    if (kept.node.bytes != nullptr && kept.node.nodeNum == nodeNum) {
        return &kept;
    }
    kept.node.bytes = nullptr;
    kept.bytes.resize(tree_.nodeSize);
    if (nodeNum == 0 || nodeNum >= tree_.nodes ||
        tree_.file->Read(tree_.NodeOffset(nodeNum), kept.bytes.data(), tree_.nodeSize) != 0) {
        return nullptr;
    }
    kept.node.bytes = kept.bytes.data();
    kept.node.nodeNum = nodeNum;
    kept.node.nodeSize = tree_.nodeSize;
    kept.node.usable = CountUsableRecords(kept.bytes.data(), tree_.nodeSize);
    kept.keys.clear();
    for (u32 i = 0; i < kept.node.usable; ++i) {
        CheckRecord record;
        const bool isTaken = TakeRecord(tree_, kept.node, i, level == 1, true, &record);
        kept.keys.push_back(isTaken ? static_cast<u16>(kept.node.Start(i)) : u16{0});
    }
    return &kept;
}

// By halving, over the records as they stand. -1: all are above, -2: a key on the way is unusable.
s64 Descent::LastNotAbove(const Kept& kept, const u8* key) const {
    u32 low = 0;
    u32 high = static_cast<u32>(kept.keys.size());
    while (low < high) {
        const u32 middle = low + (high - low) / 2;
        if (kept.keys[middle] == 0) {
            return -2;
        }
        if (CompareCheckKeys(tree_.kind, kept.node.bytes + kept.keys[middle], key) <= 0) {
            low = middle + 1;
        } else {
            high = middle;
        }
    }
    return static_cast<s64>(low) - 1;
}

Arrival Descent::Find(const u8* key) {
    Arrival arrival;
    u32 nodeNum = tree_.header.rootNode;
    for (u32 level = std::min(tree_.header.treeDepth, kMaxOpenDepth); level >= 1; --level) {
        const Kept* kept = Load(nodeNum, level);
        if (kept == nullptr) {
            arrival.why = CheckPrint("leads to node %u, which cannot be read", nodeNum);
            return arrival;
        }
        const bool isLeaf = kept->node.Kind() == kBTLeafNode;
        if (isLeaf != (level == 1) || kept->node.Height() != level) {
            arrival.why = CheckPrint("leads to node %u, which is not of level %u", nodeNum, level);
            return arrival;
        }
        const s64 index = LastNotAbove(*kept, key);
        if (index < 0) {
            arrival.why = index == -1
                              ? CheckPrint("ends at node %u, whose keys are all above", nodeNum)
                              : CheckPrint("meets a damaged key in node %u", nodeNum);
            return arrival;
        }
        const u32 at = static_cast<u32>(index);
        if (isLeaf) {
            arrival.isFound =
                CompareCheckKeys(tree_.kind, kept->node.bytes + kept->keys[at], key) == 0;
            arrival.nodeNum = nodeNum;
            arrival.index = at;
            return arrival;
        }
        CheckRecord record;
        TakeRecord(tree_, kept->node, at, false, true, &record);
        if (record.dataSize < kChildSize) {
            arrival.why = CheckPrint("meets a record without a child in node %u", nodeNum);
            return arrival;
        }
        nodeNum = Load32(record.data);
    }
    return arrival;
}

// Lookups of one leaf after the other; the first failure of a leaf is told with their number.
class Lookups {
public:
    explicit Lookups(CheckTree* tree) : tree_(*tree), descent_(tree) {}

    void Take(const CheckNode& node, u32 index, const u8* key);
    void Finish();

private:
    CheckTree& tree_;
    Descent descent_;
    u32 nodeNum_ = 0;
    u32 failures_ = 0;
    CheckPlace place_;
    std::string text_;
};

void Lookups::Take(const CheckNode& node, u32 index, const u8* key) {
    if (node.nodeNum != nodeNum_) {
        Finish();
        nodeNum_ = node.nodeNum;
    }
    const Arrival arrival = descent_.Find(key);
    if (arrival.isFound && arrival.nodeNum == node.nodeNum && arrival.index == index) {
        return;
    }
    if (++failures_ > 1) {
        return;
    }
    place_ = tree_.Place(node.nodeNum, node.Start(index), index);
    const std::string text = CheckKeyText(tree_.kind, key);
    if (!arrival.why.empty()) {
        text_ = CheckPrint("looking up %s from the root %s", text.c_str(), arrival.why.c_str());
    } else if (arrival.isFound) {
        text_ = CheckPrint("looking up %s from the root arrives at node %u record %u", text.c_str(),
                           arrival.nodeNum, arrival.index);
    } else {
        text_ = CheckPrint("looking up %s from the root ends at node %u and does not find it",
                           text.c_str(), arrival.nodeNum);
    }
}

void Lookups::Finish() {
    if (failures_ > 1) {
        text_ += "; so for " + CheckCounted(failures_ - 1, "more record", "more records") +
                 " of this node";
    }
    if (failures_ > 0) {
        tree_.run->Error(CheckId::D01, place_, text_);
    }
    failures_ = 0;
}

}  // namespace

void CheckDescents(CheckTree* tree) {
    if (!tree->run->Wants(CheckId::D01) || !tree->isUsable) {
        return;
    }
    CheckNodeWindow window(tree->file, tree->nodeSize);
    Lookups lookups(tree);
    u64 done = 0;
    for (u32 nodeNum : tree->leaves) {
        tree->run->Step("lookups", ++done, tree->leaves.size());
        int status = 0;
        CheckNode node;
        node.bytes = window.Get(nodeNum, &status);
        if (node.bytes == nullptr || tree->run->IsStopped()) {
            break;
        }
        node.nodeNum = nodeNum;
        node.nodeSize = tree->nodeSize;
        node.usable = CountUsableRecords(node.bytes, tree->nodeSize);
        for (u32 i = 0; i < node.usable; ++i) {
            CheckRecord record;
            if (TakeRecord(*tree, node, i, true, true, &record)) {
                lookups.Take(node, i, record.key);
            }
        }
    }
    lookups.Finish();
}

}  // namespace VELK
