// The node cache: nodes by number in a red-black tree, counted references, and the two ways a node
// leaves (the full release here, hand-over in cache_dirty.cpp). It has no size limit of its own.
#include "hfs/treehfs/cache.h"

#include <cstring>

#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/next_node.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/noderef.h"
#include "hfs/treehfs/one_piece.h"
#include "hfs/treehfs/prefetch.h"
#include "hfs/treehfs/report.h"
#include "platform/heap.h"

namespace VELK {

namespace {

constexpr u16 kEmptyTail = kDescSize;  // last two bytes of a node: record 0, or free space, at 14

// Where a number belongs in the tree of cached nodes: the link that leads to it, null when it is
// not there, and the node that link is part of. Void once a node came in or left.
struct Place {
    rb_node* parent;
    rb_node** link;
    u32 nodeCount;  // of the tree when the place was found
    u32 readCount;
};

// Where a node with this number would be remembered. Map nodes stand at multiples of what one maps:
// the low bits alone would put them all in one place.
HfsNode** LateNode(CBTreeHfs* tree, u32 nodeNum) {
    constexpr u32 kSpread = 0x85EBCA6B;
    return &tree->lateNodes[nodeNum * kSpread >> (32 - CBTreeHfs::kLateShift)];
}

// New nodes mostly have the greatest number there is.
Place FindPlace(CBTreeHfs* tree, u32 nodeNum) {
    Place place = {nullptr, &tree->nodeRoot, tree->nodeCount, tree->readCount};
    if (tree->lastLink != nullptr && NodeOf(tree->lastLink)->nodeNum < nodeNum) {
        place.parent = tree->lastLink;
        place.link = &tree->lastLink->right;
    }
    while (*place.link != nullptr) {
        const u32 number = NodeOf(*place.link)->nodeNum;
        if (number == nodeNum) {
            break;
        }
        place.parent = *place.link;
        place.link = nodeNum < number ? &place.parent->left : &place.parent->right;
    }
    return place;
}

// The node before a linked one, by number; null: there is none.
rb_node* NodeBefore(rb_node* node) {
    if (node->left != nullptr) {
        node = node->left;
        while (node->right != nullptr) {
            node = node->right;
        }
        return node;
    }
    rb_node* parent = node->Parent();
    while (parent != nullptr && node == parent->left) {
        node = parent;
        parent = node->Parent();
    }
    return parent;
}

// What FindPlace would find for a number right behind `before` (null: in front of all).
Place PlaceBehind(CBTreeHfs* tree, rb_node* before) {
    Place place = {before, before != nullptr ? &before->right : &tree->nodeRoot, tree->nodeCount,
                   tree->readCount};
    while (*place.link != nullptr) {
        place.parent = *place.link;
        place.link = &place.parent->left;
    }
    return place;
}

void LinkAt(CBTreeHfs* tree, const Place& place, HfsNode* node) {
    node->link.Link(place.parent, place.link);
    node->link.insert_color(&tree->nodeRoot);
    if (tree->lastLink == nullptr || place.link == &tree->lastLink->right) {
        tree->lastLink = &node->link;
    }
    tree->nodeCount += 1;
    if (tree->nodeCount > tree->maxNodeCount) {
        tree->maxNodeCount = tree->nodeCount;
    }
}

// A node whose blocks do not make up nodeSize bytes could be read past its end: no node of such a
// tree is ever handed out, although it opens.
bool HasWholeBlocks(const BTHeaderMem& header) {
    return static_cast<u64>(header.blocksPerNode) << header.blockShift == header.nodeSize;
}

HfsNode* NewNode(const CBTreeHfs* tree, u32 nodeNum, bool withHints) {
    std::size_t ownSize = offsetof(HfsNode, bufs) + tree->header.blocksPerNode * sizeof(HfsBcbBuf);
    std::size_t hintSize = 0;
    if (withHints) {
        ownSize = HintsOffset(tree);
        hintSize = HintBytes(tree);
    }
    HfsNode* node = static_cast<HfsNode*>(velk_heap_alloc(ownSize + hintSize));
    if (node == nullptr) {
        return nullptr;
    }
    std::memset(static_cast<void*>(node), 0, ownSize + hintSize);
    node->nodeNum = nodeNum;
    node->modifiedLink.Init();
    node->link.MarkUnlinked();
    if (withHints) {
        node->hints = reinterpret_cast<HfsHintTable*>(reinterpret_cast<u8*>(node) + ownSize);
    }
    return node;
}

void FreeNodeMemory(CBTreeHfs* tree, HfsNode* node) {
    for (u32 i = 0; i < tree->header.blocksPerNode; ++i) {
        HFS_ASSERT(node->bufs[i].bh != nullptr, 2835);
        tree->header.cache->Release(node->bufs[i].bh, 0);
    }
    velk_heap_free(node);
}

u8* TailOf(const BTHeaderMem& header, HfsNode* node) {
    return node->bufs[header.blocksPerNode - 1].data + header.blockSize - kSlotSize;
}

// Fills a node that lies past the initialised part of the file: all zero but for its free-space
// offset. On failure nothing stays open.
int InitialiseNew(CBTreeHfs* tree, HfsNode* node) {
    const BTHeaderMem& header = tree->header;
    for (u32 i = 0; i < header.blocksPerNode; ++i) {
        HfsBcbBuf* block = &node->bufs[i];
        header.cache->BeginModify(block->bh);
        if (tree->volume->journal) {
            const HfsService<HfsJournalOps>& journal = tree->volume->journal;
            const int status = journal.ops->GetCreateAccess(journal.self, block->bh);
            if (status != kOk) {
                header.cache->EndModify(block->bh);
                return status;
            }
        }
        std::memset(block->data, 0, header.blockSize);
        block->dirty = true;
        if (i + 1 == header.blocksPerNode) {
            PutBe16(TailOf(header, node), kEmptyTail);
        }
        header.cache->EndModify(block->bh);
    }
    return kOk;
}

// Marks one block dirty on the way to emptying a node. A journal that refuses is only asserted: the
// node must be empty for its new owner. True: the block was clean before.
bool MarkForEmptying(CBTreeHfs* tree, HfsBcbBuf* block, bool* granted) {
    *granted = true;
    if (block->dirty) {
        return false;
    }
    if (tree->volume->journal) {
        const HfsService<HfsJournalOps>& journal = tree->volume->journal;
        *granted = journal.ops->GetWriteAccess(journal.self, block->bh) == kOk;
    }
    block->dirty = true;
    return true;
}

// Offset of the first 8-byte word of the block that is not zero, blockSize when all are.
u32 FirstNonZeroWord(const u8* data, u32 blockSize) {
    for (u32 at = 0; at < blockSize; at += 8) {
        u64 word;
        std::memcpy(&word, data + at, sizeof word);
        if (word != 0) {
            return at;
        }
    }
    return blockSize;
}

// Empties a node that held something: zeroes each block from its first non-zero word on, so that
// blocks already zero are neither journalled nor written, and sets the free-space offset.
void EmptyExisting(CBTreeHfs* tree, HfsNode* node) {
    const BTHeaderMem& header = tree->header;
    tree->pathVersion += 1;
    ForgetRecords(tree, node);
    bool madeDirty = false;
    bool granted = true;
    for (u32 i = 0; i < header.blocksPerNode; ++i) {
        HfsBcbBuf* block = &node->bufs[i];
        const u32 from = FirstNonZeroWord(block->data, header.blockSize);
        if (from == header.blockSize) {
            continue;
        }
        if (node->nodeNum >= tree->validNodes) {
            HFS_TRACE("node %x must be zeroed. Valid=%x\n", node->nodeNum, tree->validNodes);
        }
        madeDirty |= MarkForEmptying(tree, block, &granted);
        HFS_ASSERT(granted, 2745);
        std::memset(block->data + from, 0, header.blockSize - from);
    }
    if (GetBe16(TailOf(header, node)) != kEmptyTail) {
        madeDirty |= MarkForEmptying(tree, &node->bufs[header.blocksPerNode - 1], &granted);
        HFS_ASSERT(granted, 2769);
        PutBe16(TailOf(header, node), kEmptyTail);
    }
    if (madeDirty) {
        node->modifiedLink.MoveTail(&tree->modifiedList);
    }
}

bool WantsEmpty(NodeUse use) {
    return use == NodeUse::kEmpty || use == NodeUse::kEmptyIndex;
}

// A node past the initialised part of the file is to be requested empty only.
void AssertRequest(bool expected) {
    HFS_ASSERT(expected, 2638);
}

// Links the node just read, which was not cached when its place was found. A number is cached once:
// should a service of the volume have brought the node meanwhile, this one stays outside.
void LinkOnce(CBTreeHfs* tree, const Place& place, HfsNode* node) {
    if (tree->nodeCount == place.nodeCount && tree->readCount == place.readCount + 1) {
        LinkAt(tree, place, node);
    } else {
        HFS_ASSERT(LinkNode(tree, node), 2706);
    }
}

// Maps a node that is not cached and links it at its place, with its first reference.
int LoadNode(CBTreeHfs* tree, const Place& place, u32 nodeNum, NodeUse use, HfsNode** out) {
    const bool makeEmpty = WantsEmpty(use);
    if (!HasWholeBlocks(tree->header)) {
        return Fail(kErrCorrupt, kReasonNode, 2615);
    }
    if (nodeNum != 0 && nodeNum >= tree->header.totalNodes && !makeEmpty) {
        AssertRequest(false);
        return kErrCorrupt;
    }
    HfsNode* node =
        NewNode(tree, nodeNum, use == NodeUse::kReadIndex || use == NodeUse::kEmptyIndex);
    if (node == nullptr) {
        return kErrNoMemory;
    }
    const bool isNew = nodeNum >= tree->validNodes;
    int status = tree->volume->Map(&tree->runs, nullptr, 0, tree->fileId,
                                   static_cast<u64>(nodeNum) << tree->nodeShift,
                                   tree->header.nodeSize, isNew, node->bufs);
    if (status != kOk) {
        velk_heap_free(node);
        Report(status, 2620);
        return status;
    }
    tree->readCount += 1;
    node->isOnePiece = LieTogether(&tree->header, node->bufs);
    // The descriptor and the offset table: needed once the node is linked.
    Prefetch(node->bufs[0].data, 1);
    Prefetch(TailOf(tree->header, node), 1);
    if (isNew) {
        NoteNewNode(tree, node->bufs[0].data);
        AssertRequest(makeEmpty);
        status = InitialiseNew(tree, node);
        if (status != kOk) {
            FreeNodeMemory(tree, node);
            Report(status, 2645);
            return status;
        }
        LinkOnce(tree, place, node);
        node->modifiedLink.LinkTail(&tree->modifiedList);
        TakeReference(node);
        *out = node;
        return kOk;
    }
    const bool wasEmpty = tree->nodeRoot == nullptr;
    LinkOnce(tree, place, node);
    if (makeEmpty) {
        EmptyExisting(tree, node);
    } else {
        tree->isAllOwn = false;
        HFS_ASSERT(wasEmpty || GetBe16(TailOf(tree->header, node)) == kEmptyTail, 2671);
    }
    TakeReference(node);
    *out = node;
    return kOk;
}

}  // namespace

bool LinkNode(CBTreeHfs* tree, HfsNode* node) {
    const Place place = FindPlace(tree, node->nodeNum);
    if (*place.link != nullptr) {
        return false;
    }
    LinkAt(tree, place, node);
    return true;
}

void UnlinkNode(CBTreeHfs* tree, HfsNode* node) {
    if (tree->lastLink == &node->link) {
        tree->lastLink = NodeBefore(&node->link);
    }
    if (*LateNode(tree, node->nodeNum) == node) {
        *LateNode(tree, node->nodeNum) = nullptr;
    }
    node->link.remove(&tree->nodeRoot);
    tree->nodeCount -= 1;
}

bool RelinkNode(CBTreeHfs* tree, HfsNode* node) {
    if (!node->link.IsLinked()) {
        return LinkNode(tree, node);
    }
    rb_node* before = NodeBefore(&node->link);
    UnlinkNode(tree, node);
    LinkAt(tree, PlaceBehind(tree, before), node);
    return true;
}

void DiscardNode(CBTreeHfs* tree, HfsNode* node) {
    if (node->link.IsLinked()) {
        UnlinkNode(tree, node);
    }
    node->modifiedLink.Unlink();
    ForgetHints(tree, node);
    FreeNodeMemory(tree, node);
}

void DropNode(CBTreeHfs* tree, HfsNode* node) {
    node->refCount -= 1;
    HFS_ASSERT(node->refCount <= 2, 2818);
    if (node->refCount <= 0) {
        DiscardNode(tree, node);
    }
}

bool HasDirtyBlock(const BTHeaderMem* hdr, const HfsNode* node) {
    for (u32 i = 0; i < hdr->blocksPerNode; ++i) {
        if (node->bufs[i].dirty) {
            return true;
        }
    }
    return false;
}

int FetchNode(CBTreeHfs* tree, u32 nodeNum, NodeUse use, HfsNode** out) {
    *out = nullptr;
    HfsNode** late = LateNode(tree, nodeNum);
    HfsNode* node = *late;
    if (node == nullptr || node->nodeNum != nodeNum) {
        const Place place = FindPlace(tree, nodeNum);
        if (*place.link == nullptr) {
            return LoadNode(tree, place, nodeNum, use, out);
        }
        node = NodeOf(*place.link);
        *late = node;
    }
    CountHit(tree, node);
    if (WantsEmpty(use)) {
        EmptyExisting(tree, node);
    }
    TakeReference(node);
    *out = node;
    return kOk;
}

int CBTreeHfs::GetINode(unsigned nodeNum, HfsNode** out, bool makeEmpty) {
    const int status = FetchNode(this, nodeNum, makeEmpty ? NodeUse::kEmpty : NodeUse::kRead, out);
    if (status == kOk) {
        isAllOwn = false;  // who asks for a node by its number may write into it
        ForgetRecords(this, *out);
    }
    return status;
}

void CBTreeHfs::PutINode(HfsNode* node, bool) {
    DropNode(this, node);
}

}  // namespace VELK
