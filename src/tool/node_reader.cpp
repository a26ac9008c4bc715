// Nodes and records through the engine's node operations and accessors.
#include "tool/node_reader.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstring>

#include "tool/errors.h"

namespace VELK::tool {

namespace {

struct Pieces {
    const u8* first;
    u32 firstBytes;
    const u8* second;  // a block
    const u8* third;   // a block
};

// Puts `size` bytes together. False: they need more pieces than there are.
bool Gather(const Pieces& pieces, u32 size, u32 blockSize, std::vector<u8>* target) {
    target->resize(size);
    const u32 head = std::min(size, pieces.firstBytes);
    const u32 middle = std::min(size - head, blockSize);
    const u32 tail = size - head - middle;
    if (tail > blockSize || (middle != 0 && pieces.second == nullptr) ||
        (tail != 0 && pieces.third == nullptr)) {
        return false;
    }
    std::memcpy(target->data(), pieces.first, head);
    if (middle != 0) {
        std::memcpy(target->data() + head, pieces.second, middle);
    }
    if (tail != 0) {
        std::memcpy(target->data() + head + middle, pieces.third, tail);
    }
    return true;
}

}  // namespace

int RecordReader::Describe(const HfsNode* node, u32 index, NodeRecord* record) {
    NodeKey at;
    const int status = node->GetKey(&tree_->header, static_cast<int>(index), &at);
    if (status != 0) {
        return status;
    }
    record->node = node->nodeNum;
    record->index = index;
    record->offset = at.offset;
    record->size = at.size;
    const u32 blockSize = tree_->header.blockSize;
    const u32 nodeSize = tree_->header.nodeSize;
    if (at.data == nullptr) {  // a record without a key is all data
        record->key = nullptr;
        record->keySize = 0;
        data_.resize(at.size);
        NodeBytes(&tree_->header, node).CopyOut(data_.data(), at.offset, at.size);
        record->data = data_.data();
        record->dataSize = at.size;
        return 0;
    }
    record->key = at.ptr;
    record->keySize = at.keySize;
    if (at.keySize > at.firstBytes) {
        if (at.keySize > nodeSize ||
            !Gather({at.ptr, at.firstBytes, at.next1, at.next2}, at.keySize, blockSize, &key_)) {
            return kErrCorrupt;
        }
        record->key = key_.data();
    }
    record->data = at.data;
    record->dataSize = at.dataSize;
    if (at.dataSize > at.dataFirstBytes) {
        if (at.dataSize > nodeSize ||
            !Gather({at.data, at.dataFirstBytes, at.dataNext1, at.dataNext2}, at.dataSize,
                    blockSize, &data_)) {
            return kErrCorrupt;
        }
        record->data = data_.data();
    }
    return 0;
}

int HeldNode::Open(u32 number) {
    Release();
    return tree_->GetINode(number, &node_, false);
}

void HeldNode::Release() {
    if (node_ == nullptr) {
        return;
    }
    if (afterUse_ == AfterUse::kKeepCached || !node_->modifiedLink.IsEmpty()) {
        node_->refCount -= 1;  // the plain release: the node stays cached
    } else {
        tree_->PutINode(node_, false);
    }
    node_ = nullptr;
}

u32 HeldNode::FreeBytes() const {
    unsigned bytes = 0;
    const bool sound = node_->GetNodeFreeSize(&tree_->header, &bytes) == 0;
    return sound && bytes <= tree_->header.nodeSize ? bytes : tree_->header.nodeSize;
}

const char* NodeKindName(s8 kind) {
    switch (kind) {
        case kBTLeafNode:
            return "leaf";
        case kBTIndexNode:
            return "index";
        case kBTHeaderNode:
            return "header";
        case kBTMapNode:
            return "map";
        default:
            return "unknown";
    }
}

double FillOf(const CBTreeHfs& tree, u32 freeBytes) {
    return 1.0 - static_cast<double>(freeBytes) / tree.header.nodeSize;
}

std::vector<u32> MapNodes(CBTreeHfs* tree) {
    std::vector<u32> numbers;
    HeldNode node(tree);
    // Map nodes cover so many bits that a chain of more than this describes no tree.
    const u32 most = tree->header.totalNodes / 8 + 1;
    if (node.Open(0) != 0) {
        return numbers;
    }
    for (u32 next = node.FLink(); next != 0 && numbers.size() < most; next = node.FLink()) {
        if (next >= tree->header.totalNodes || node.Open(next) != 0 || node.Kind() != kBTMapNode) {
            break;
        }
        numbers.push_back(next);
    }
    return numbers;
}

MapBit FindMapBit(CBTreeHfs* tree, u32 nodeNum) {
    MapBit bit;
    const u32 nodeSize = tree->header.nodeSize;
    u32 rest = nodeNum;
    u32 start = kHeadMapRecord;
    const u32 headerBits = (nodeSize - kHeadMapOverhead) * 8;
    if (rest >= headerBits) {
        const u32 bitsPerNode = (nodeSize - kMapNodeOverhead) * 8;
        rest -= headerBits;
        const std::vector<u32> nodes = MapNodes(tree);
        if (rest / bitsPerNode >= nodes.size()) {
            return bit;
        }
        bit.node = nodes[rest / bitsPerNode];
        rest %= bitsPerNode;
        start = kDescSize;
    }
    bit.offset = start + rest / 8;
    HeldNode node(tree);
    if (node.Open(bit.node) == 0) {
        bit.known = true;
        bit.isSet = (node.Bytes().U8(bit.offset) & (0x80u >> (rest % 8))) != 0;
    }
    return bit;
}

void WalkChain(Session* session, u32 fileId, u32 first, bool keepGoing,
               const std::function<bool(const HeldNode&)>& visit) {
    CBTreeHfs* tree = session->Tree(fileId);
    HeldNode node(tree);
    u64 hops = 0;
    for (u32 next = first; next != 0; next = node.FLink()) {
        int status = next < tree->header.totalNodes ? node.Open(next) : kErrCorrupt;
        std::string detail = status == 0 ? "" : "cannot be read";
        if (next >= tree->header.totalNodes) {
            detail = "there is no such node, though a link leads there";
        } else if (++hops > tree->header.totalNodes) {
            status = kErrCorrupt;
            detail = "the links of its level form a ring";
        }
        if (status != 0) {
            const Problem problem = session->ProblemOf(fileId, next, status, detail);
            if (!keepGoing) {
                ThrowProblem(session->Image(), problem);
            }
            session->NotePassedOver(problem);
            return;
        }
        if (!visit(node)) {
            return;
        }
    }
}

std::vector<u32> LevelStarts(Session* session, u32 fileId) {
    CBTreeHfs* tree = session->Tree(fileId);
    std::vector<u32> first;
    HeldNode node(tree);
    u32 number = tree->header.rootNode;
    for (u32 level = tree->header.treeDepth; level >= 1; --level) {
        int status = number < tree->header.totalNodes ? node.Open(number) : kErrCorrupt;
        const s8 kind = level == 1 ? kBTLeafNode : kBTIndexNode;
        std::string detail;
        if (status == 0 && (node.Kind() != kind || node.Height() != level)) {
            status = kErrCorrupt;
            detail = fmt::format("no {} node of level {}", NodeKindName(kind), level);
        }
        unsigned child = 0;
        if (status == 0 && level > 1) {
            status = node.Get()->GetChildNodeNum(&tree->header, 0, &child);
        }
        if (status != 0) {
            ThrowProblem(session->Image(), session->ProblemOf(fileId, number, status, detail));
        }
        first.push_back(number);
        number = child;
    }
    return first;
}

namespace {

// A node that cannot be read ends a walk, or is named and passed over.
void Unreadable(Session* session, u32 fileId, u32 node, int status, bool keepGoing) {
    const Problem problem = session->ProblemOf(fileId, node, status, "cannot be read");
    if (!keepGoing) {
        ThrowProblem(session->Image(), problem);
    }
    session->NotePassedOver(problem);
}

void VisitByDepth(Session* session, u32 fileId, bool keepGoing,
                  const std::function<bool(const HeldNode&)>& visit) {
    CBTreeHfs* tree = session->Tree(fileId);
    std::vector<bool> seen(tree->header.totalNodes);
    std::vector<u32> waiting;
    if (tree->header.rootNode != 0) {
        waiting.push_back(tree->header.rootNode);
    }
    HeldNode node(tree);
    while (!waiting.empty()) {
        const u32 number = waiting.back();
        waiting.pop_back();
        const bool exists = number < tree->header.totalNodes;
        const int status = exists && !seen[number] ? node.Open(number) : kErrCorrupt;
        if (status != 0) {
            Unreadable(session, fileId, number, status, keepGoing);
            continue;
        }
        seen[number] = true;
        if (!visit(node)) {
            return;
        }
        if (node.Kind() != kBTIndexNode) {
            continue;
        }
        for (u32 i = node.RecordCount(); i > 0; --i) {
            unsigned child = 0;
            const int bad =
                node.Get()->GetChildNodeNum(&tree->header, static_cast<int>(i - 1), &child);
            if (bad != 0) {
                Unreadable(session, fileId, number, bad, keepGoing);
            } else {
                waiting.push_back(child);
            }
        }
    }
}

}  // namespace

void VisitNodes(Session* session, u32 fileId, NodeOrder order, bool keepGoing,
                const std::function<bool(const HeldNode&)>& visit) {
    CBTreeHfs* tree = session->Tree(fileId);
    bool goesOn = true;
    const auto visitAndTell = [&](const HeldNode& node) {
        goesOn = visit(node);
        return goesOn;
    };
    switch (order) {
        case NodeOrder::kLeaf:
            WalkChain(session, fileId, tree->header.firstLeafNode, keepGoing, visitAndTell);
            break;
        case NodeOrder::kBreadth:
            for (const u32 first : LevelStarts(session, fileId)) {
                if (goesOn) {
                    WalkChain(session, fileId, first, keepGoing, visitAndTell);
                }
            }
            break;
        case NodeOrder::kDepth:
            VisitByDepth(session, fileId, keepGoing, visit);
            break;
        case NodeOrder::kDisk: {
            HeldNode node(tree);
            for (u32 number = 0; number < tree->header.totalNodes && goesOn; ++number) {
                const int status = node.Open(number);
                if (status != 0) {
                    Unreadable(session, fileId, number, status, keepGoing);
                } else {
                    goesOn = visit(node);
                }
            }
            break;
        }
    }
}

}  // namespace VELK::tool
