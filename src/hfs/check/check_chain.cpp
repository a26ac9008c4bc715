// The leaf chain alone, from the first leaf to the last: the quick look at a tree.
#include "hfs/check/check_records.h"
#include "hfs/check/check_tree.h"

namespace VELK {
namespace {

class Chain {
public:
    explicit Chain(CheckTree* tree) : tree_(*tree), window_(tree->file, tree->nodeSize) {}

    void Run();

private:
    bool Visit(u32 nodeNum);
    void ShowRecords(const CheckNode& node) const;
    void Close() const;

    CheckTree& tree_;
    CheckNodeWindow window_;
    u32 before_ = 0;
    u32 next_ = 0;
};

void Chain::ShowRecords(const CheckNode& node) const {
    for (u32 i = 0; i < node.usable; ++i) {
        CheckRecord record;
        if (TakeRecord(tree_, node, i, true, true, &record) && IsDataUsable(tree_, record)) {
            tree_.visitor.record(tree_.visitor.self, tree_, node, i, record);
        }
    }
}

// False: the chain cannot be followed from here.
bool Chain::Visit(u32 nodeNum) {
    int status = 0;
    CheckNode node;
    node.bytes = window_.Get(nodeNum, &status);
    if (node.bytes == nullptr) {
        tree_.CannotRead(nodeNum, status);
        return false;
    }
    node.nodeNum = nodeNum;
    node.nodeSize = tree_.nodeSize;
    tree_.run->CountNode(tree_.Name(), tree_.header.totalNodes);
    const bool isSound = CheckNodeShape(tree_, 1, &node);
    if (!isSound) {
        tree_.isWhole = false;
    }
    if (const u32 bLink = node.BLink(); bLink != before_) {
        const CheckId id = before_ == 0 ? CheckId::L02 : CheckId::L01;
        tree_.run->Error(id, tree_.Place(nodeNum, kDescBLink),
                         before_ == 0
                             ? CheckPrint("bLink of the first leaf is %u, expected 0", bLink)
                             : CheckPrint("bLink is %u, node %u leads here", bLink, before_),
                         before_, bLink);
    }
    tree_.leafRecords += node.usable;
    if (tree_.visitor.record != nullptr) {
        ShowRecords(node);
    }
    before_ = nodeNum;
    next_ = node.FLink();
    return isSound || node.Kind() == kBTLeafNode;
}

void Chain::Close() const {
    if (before_ != tree_.header.lastLeafNode) {
        tree_.run->Error(CheckId::L02, tree_.HeaderPlace(kHeadLastLeafNode),
                         CheckPrint("lastLeafNode is %u, the chain of leaves ends at %u",
                                    tree_.header.lastLeafNode, before_),
                         before_, tree_.header.lastLeafNode);
    }
}

void Chain::Run() {
    next_ = tree_.header.firstLeafNode;
    while (next_ != 0 && !tree_.run->IsStopped()) {
        const u32 nodeNum = next_;
        const CheckPlace link =
            before_ == 0 ? tree_.HeaderPlace(kHeadFirstLeafNode) : tree_.Place(before_, kDescFLink);
        if (nodeNum >= tree_.nodes || !tree_.seen.Add(nodeNum)) {
            tree_.run->Error(CheckId::L01, link,
                             nodeNum >= tree_.nodes
                                 ? CheckPrint("the chain of leaves leads to node %u, the tree has "
                                              "nodes 0..%u",
                                              nodeNum, tree_.nodes - 1)
                                 : CheckPrint("the chain of leaves leads to node %u, which has its "
                                              "place elsewhere",
                                              nodeNum));
            tree_.isWhole = false;
            return;
        }
        if (!Visit(nodeNum)) {
            tree_.isWhole = false;
            return;
        }
    }
    if (!tree_.run->IsStopped()) {
        Close();
    }
}

}  // namespace

void WalkLeafChain(CheckTree* tree) {
    if (tree->header.firstLeafNode < tree->nodes) {
        Chain(tree).Run();
    } else {
        tree->isWhole = false;
    }
}

}  // namespace VELK
