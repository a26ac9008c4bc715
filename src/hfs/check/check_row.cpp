// Links and key order between neighbours of one level.
#include "hfs/check/check_row.h"

#include <cstring>

namespace VELK {

void CheckRow::Arrive(const CheckTree& tree, u32 level, const CheckNode& node) {
    const u32 bLink = node.BLink();
    if (hasNode_ && !hasGap_) {
        if (fLink_ != node.nodeNum) {
            tree.run->Error(CheckId::L01, tree.Place(nodeNum_, kDescFLink),
                            CheckPrint("fLink is %u, the next node of level %u is %u", fLink_,
                                       level, node.nodeNum),
                            node.nodeNum, fLink_);
        }
        if (bLink != nodeNum_) {
            tree.run->Error(CheckId::L01, tree.Place(node.nodeNum, kDescBLink),
                            CheckPrint("bLink is %u, the node before it on level %u is %u", bLink,
                                       level, nodeNum_),
                            nodeNum_, bLink);
        }
    } else if (!hasNode_ && !hasGap_) {
        if (bLink != 0) {
            tree.run->Error(
                CheckId::L02, tree.Place(node.nodeNum, kDescBLink),
                CheckPrint("bLink of the first node of level %u is %u, expected 0", level, bLink),
                0, bLink);
        }
        if (level == 1 && tree.header.firstLeafNode != node.nodeNum) {
            tree.run->Error(CheckId::L02, tree.HeaderPlace(kHeadFirstLeafNode),
                            CheckPrint("firstLeafNode is %u, the first leaf is %u",
                                       tree.header.firstLeafNode, node.nodeNum),
                            node.nodeNum, tree.header.firstLeafNode);
        }
    }
    hasNode_ = true;
    hasGap_ = false;
    nodeNum_ = node.nodeNum;
    fLink_ = node.FLink();
}

void CheckRow::Close(const CheckTree& tree, u32 level) {
    if (!hasNode_ || hasGap_) {
        return;
    }
    if (fLink_ != 0) {
        tree.run->Error(
            CheckId::L02, tree.Place(nodeNum_, kDescFLink),
            CheckPrint("fLink of the last node of level %u is %u, expected 0", level, fLink_), 0,
            fLink_);
    }
    if (level == 1 && tree.header.lastLeafNode != nodeNum_) {
        tree.run->Error(CheckId::L02, tree.HeaderPlace(kHeadLastLeafNode),
                        CheckPrint("lastLeafNode is %u, the last leaf is %u",
                                   tree.header.lastLeafNode, nodeNum_),
                        nodeNum_, tree.header.lastLeafNode);
    }
}

void CheckRow::CheckFirstKey(const CheckTree& tree, const CheckNode& node, u32 index, const u8* key,
                             const CheckParent* parent) const {
    if (hasKey_ && CompareCheckKeys(tree.kind, key, key_) <= 0) {
        tree.run->Tell(CheckId::K03, CheckSeverity::kError,
                       tree.Place(node.nodeNum, node.Start(index), index),
                       CheckPrint("key %s is not above node %u's last key %s",
                                  CheckKeyText(tree.kind, key).c_str(), keyNode_,
                                  CheckKeyText(tree.kind, key_).c_str()),
                       "", CheckKeyText(tree.kind, key));
    }
    if (parent != nullptr && parent->key != nullptr && index == 0 &&
        !SameCheckKeys(parent->key, key)) {
        CheckAbove(tree, node, key, *parent);
    }
}

void CheckRow::CheckAbove(const CheckTree& tree, const CheckNode& node, const u8* key,
                          const CheckParent& parent) const {
    const int order = CompareCheckKeys(tree.kind, parent.key, key);
    if (order == 0) {
        return;
    }
    const CheckPlace place = tree.Place(parent.nodeNum, parent.offset, parent.index);
    const std::string separator = CheckKeyText(tree.kind, parent.key);
    const std::string first = CheckKeyText(tree.kind, key);
    if (order > 0) {
        tree.run->Tell(CheckId::K04, CheckSeverity::kError, place,
                       CheckPrint("index key %s is above the first key %s of its child %u",
                                  separator.c_str(), first.c_str(), node.nodeNum),
                       first, separator);
    } else if (hasKey_ && CompareCheckKeys(tree.kind, parent.key, key_) <= 0) {
        tree.run->Tell(CheckId::K04, CheckSeverity::kError, place,
                       CheckPrint("index key %s of child %u is not above node %u's last key %s",
                                  separator.c_str(), node.nodeNum, keyNode_,
                                  CheckKeyText(tree.kind, key_).c_str()),
                       first, separator);
    } else {
        tree.run->Tell(CheckId::K04, CheckSeverity::kWarning, place,
                       CheckPrint("index key %s is below the first key %s of its child %u",
                                  separator.c_str(), first.c_str(), node.nodeNum),
                       first, separator);
    }
}

void CheckRow::KeepLastKey(u32 nodeNum, const u8* key) {
    hasKey_ = true;
    keyNode_ = nodeNum;
    std::memcpy(key_, key, kKeyLengthSize + Load16(key));
}

}  // namespace VELK
