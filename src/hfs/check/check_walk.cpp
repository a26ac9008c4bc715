// Walk of a whole tree from its root, left to right. Every node is entered once: a set of those
// seen before stops rings and shared children, and levels, not what nodes claim, bound the depth.
#include "hfs/check/check_records.h"
#include "hfs/check/check_row.h"
#include "hfs/check/check_tree.h"

namespace VELK {
namespace {

// An index node on the way to the present one.
struct Frame {
    std::vector<u8> bytes;
    CheckNode node;
    u32 next = 0;  // record to descend by
};

class Walk {
public:
    explicit Walk(CheckTree* tree) : tree_(*tree), window_(tree->file, tree->nodeSize) {}

    void Run();

private:
    u32 RootLevel();
    const u8* Load(u32 nodeNum, u32 level, int* status);
    bool Enter(u32 nodeNum, u32 level, const CheckParent* parent);
    void CheckKeys(const CheckNode& node, u32 level, const CheckParent* parent);
    void CheckData(const CheckNode& node, u32 index, u32 level, bool isTaken,
                   const CheckRecord& record);
    void Descend(u32 level);
    bool Claim(u32 child, const CheckPlace& place);
    void Skip(u32 fromLevel);

    CheckTree& tree_;
    CheckNodeWindow window_;
    Frame frames_[kMaxOpenDepth + 1];  // by level; 0 and 1 stay empty
    CheckRow rows_[kMaxOpenDepth + 1];
};

// The level of the root, by its own height: only that leads to leaves at level 1. 0: none.
u32 Walk::RootLevel() {
    const u32 root = tree_.header.rootNode;
    u8 descriptor[kDescSize];
    const int status = tree_.file->Read(tree_.NodeOffset(root), descriptor, kDescSize);
    if (status != 0) {
        tree_.CannotRead(root, status);
        return 0;
    }
    const u32 height = descriptor[kDescHeight];
    if (height != tree_.header.treeDepth) {
        tree_.run->Error(CheckId::H12, tree_.HeaderPlace(kHeadTreeDepth),
                         CheckPrint("treeDepth is %u, the root node %u has height %u",
                                    tree_.header.treeDepth, root, height),
                         height, tree_.header.treeDepth);
    }
    if (static_cast<s8>(descriptor[kDescKind]) == kBTLeafNode) {
        return 1;
    }
    if (height >= 2 && height <= kMaxOpenDepth) {
        return height;
    }
    return tree_.header.treeDepth <= kMaxOpenDepth ? tree_.header.treeDepth : 0;
}

// Levels up to `fromLevel` miss what would have stood here.
void Walk::Skip(u32 fromLevel) {
    for (u32 level = 1; level <= fromLevel; ++level) {
        rows_[level].Skip();
    }
    tree_.isWhole = false;
}

const u8* Walk::Load(u32 nodeNum, u32 level, int* status) {
    if (level == 1) {
        return window_.Get(nodeNum, status);
    }
    std::vector<u8>& bytes = frames_[level].bytes;
    bytes.resize(tree_.nodeSize);
    *status = tree_.file->Read(tree_.NodeOffset(nodeNum), bytes.data(), tree_.nodeSize);
    return *status == 0 ? bytes.data() : nullptr;
}

// Looks at a node and its records. False: there is nothing to descend into.
bool Walk::Enter(u32 nodeNum, u32 level, const CheckParent* parent) {
    int status = 0;
    CheckNode node;
    node.bytes = Load(nodeNum, level, &status);
    node.nodeNum = nodeNum;
    node.nodeSize = tree_.nodeSize;
    if (node.bytes == nullptr) {
        if (!tree_.CannotRead(nodeNum, status)) {
            tree_.isUsable = false;
        }
        Skip(level);
        return false;
    }
    tree_.run->CountNode(tree_.Name(), tree_.header.totalNodes);
    if (!CheckNodeShape(tree_, level, &node)) {
        tree_.isWhole = false;
    }
    rows_[level].Arrive(tree_, level, node);
    CheckKeys(node, level, parent);
    if (level == 1) {
        tree_.leafRecords += node.usable;
        if (tree_.keepsLeaves) {
            tree_.leaves.push_back(nodeNum);
        }
        return false;
    }
    if (node.usable == 0) {
        Skip(level - 1);
        return false;
    }
    frames_[level].node = node;
    frames_[level].next = 0;
    return true;
}

void Walk::CheckKeys(const CheckNode& node, u32 level, const CheckParent* parent) {
    const u8* before = nullptr;
    u32 beforeIndex = 0;
    for (u32 i = 0; i < node.usable && !tree_.run->IsStopped(); ++i) {
        CheckRecord record;
        const bool isTaken = TakeRecord(tree_, node, i, level == 1, false, &record);
        CheckData(node, i, level, isTaken, record);
        if (!isTaken) {
            continue;
        }
        if (before == nullptr) {
            rows_[level].CheckFirstKey(tree_, node, i, record.key, parent);
        } else if (CompareCheckKeys(tree_.kind, record.key, before) <= 0) {
            tree_.run->Tell(CheckId::K02, CheckSeverity::kError,
                            tree_.Place(node.nodeNum, node.Start(i), i),
                            CheckPrint("key %s is not above record %u's key %s",
                                       CheckKeyText(tree_.kind, record.key).c_str(), beforeIndex,
                                       CheckKeyText(tree_.kind, before).c_str()),
                            "", CheckKeyText(tree_.kind, record.key));
        }
        before = record.key;
        beforeIndex = i;
    }
    if (before != nullptr) {
        rows_[level].KeepLastKey(node.nodeNum, before);
    }
}

void Walk::CheckData(const CheckNode& node, u32 index, u32 level, bool isTaken,
                     const CheckRecord& record) {
    if (level > 1) {
        if (isTaken && record.dataSize != kChildSize) {
            tree_.run->Error(CheckId::R02, tree_.Place(node.nodeNum, record.dataOffset, index),
                             CheckPrint("an index record with %u bytes of data, expected %u",
                                        record.dataSize, kChildSize),
                             kChildSize, record.dataSize);
        }
        return;
    }
    if (!isTaken) {
        tree_.hasLostRecords = true;
        return;
    }
    if (tree_.anyData) {
        return;
    }
    CheckLeafData(tree_, node, index, record);
    if (!IsDataUsable(tree_, record)) {
        // Attributes of unknown types are nobody's loss.
        tree_.hasLostRecords = tree_.hasLostRecords || tree_.FileId() != kAttributesFileId;
    } else if (tree_.visitor.record != nullptr) {
        tree_.visitor.record(tree_.visitor.self, tree_, node, index, record);
    }
}

// Whether the walk may enter the child now.
bool Walk::Claim(u32 child, const CheckPlace& place) {
    if (child == 0 || child >= tree_.nodes) {
        tree_.run->Error(CheckId::N05, place,
                         CheckPrint("child is node %u, expected 1..%u", child, tree_.nodes - 1));
        return false;
    }
    if (!tree_.seen.Add(child)) {
        tree_.run->Error(CheckId::N05, place,
                         CheckPrint("child is node %u, which has its place elsewhere", child));
        return false;
    }
    return true;
}

// Enters the next child of the frame at `level`.
void Walk::Descend(u32 level) {
    const CheckNode& node = frames_[level].node;
    const u32 index = frames_[level].next++;
    CheckRecord record;
    const bool isTaken = TakeRecord(tree_, node, index, false, true, &record);
    if (!isTaken || record.dataSize < kChildSize) {
        Skip(level - 1);
        return;
    }
    const u32 child = Load32(record.data);
    if (!Claim(child, tree_.Place(node.nodeNum, record.dataOffset, index))) {
        Skip(level - 1);
        return;
    }
    const CheckParent parent = {node.nodeNum, index, node.Start(index), record.key};
    Enter(child, level - 1, &parent);
}

void Walk::Run() {
    const u32 root = tree_.header.rootNode;
    const u32 rootLevel = RootLevel();
    if (rootLevel == 0 || !Claim(root, tree_.HeaderPlace(kHeadRootNode))) {
        tree_.isWhole = false;
        return;
    }
    u32 level = Enter(root, rootLevel, nullptr) ? rootLevel : 0;
    while (level <= rootLevel && level > 1 && !tree_.run->IsStopped() && tree_.isUsable) {
        Frame& frame = frames_[level];
        if (frame.next < frame.node.usable) {
            Descend(level);
            const Frame& below = frames_[level - 1];
            if (level > 2 && below.next < below.node.usable) {
                --level;
            }
            continue;
        }
        if (frame.node.usable < frame.node.NumRecords()) {
            Skip(level - 1);
        }
        ++level;
    }
    if (tree_.run->IsStopped() || !tree_.isUsable) {
        tree_.isWhole = false;
        return;
    }
    for (u32 i = 1; i <= rootLevel; ++i) {
        rows_[i].Close(tree_, i);
    }
}

}  // namespace

void WalkTree(CheckTree* tree) {
    if (tree->isUsable) {
        Walk(tree).Run();
    }
}

}  // namespace VELK
