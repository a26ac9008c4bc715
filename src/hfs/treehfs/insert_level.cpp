// Carries an insertion up the search path: one or two records go into the node at one level; what
// its parent has to learn goes up as separators, by a call for the level above. The parent is
// changed only after the whole level below is done.
#include "hfs/treehfs/node_child.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/noderef.h"
#include "hfs/treehfs/path_check.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/separator.h"
#include "platform/heap.h"

namespace VELK {

namespace {

// What became of the records of one level.
struct LevelChange {
    NodeRef newNode;  // new right sibling, or the left one that took records
    NodeRef newRoot;
    unsigned nodeNum = 0;  // where the last record ended
    int index = 0;
    bool firstKeyChanged = false;
    bool enterNewNode = false;
};

// Gives the path its own reference on a root that grew above `level`.
void EnterRoot(HfsFindData* path, int level, const LevelChange& change) {
    HfsFindLevel& entry = path->path[level + 1];
    ReleaseNode(entry.node);
    entry.node = change.newRoot.Get();
    entry.node->refCount += 1;
    entry.index = change.nodeNum == change.newNode->nodeNum ? 1 : 0;
}

int PutRecord(CBTreeHfs* tree, HfsFindData* path, const InsertKey* key, HfsNode* node,
              unsigned nodeNum, int index, int level, LevelChange* change) {
    HfsNode* newRoot = nullptr;
    const int status = tree->InsertNode(key, node, nodeNum, index, &change->nodeNum, &change->index,
                                        change->newNode.InOut(), &change->firstKeyChanged,
                                        &change->enterNewNode, &newRoot);
    if (status == 0 && newRoot != nullptr) {
        *change->newRoot.Out() = newRoot;
        EnterRoot(path, level, *change);
    }
    return status;
}

// Puts `first` and then `second`, if there is one, into the level's node.
int PutRecords(CBTreeHfs* tree, HfsFindData* path, const InsertKey* first, const InsertKey* second,
               HfsNode* node, int index, int level, LevelChange* change) {
    HFS_TRY(PutRecord(tree, path, first, node, node->nodeNum, index, level, change), 4639);
    if (second == nullptr) {
        return kOk;
    }
    HFS_TRY(PutRecord(tree, path, second, node, change->nodeNum, change->index + 1, level, change),
            4665);
    HFS_ASSERT(!(change->firstKeyChanged && change->newRoot), 4666);
    return kOk;
}

bool KeysAreEqual(const BTHeaderMem* hdr, const HfsFindLevel& one, const HfsFindLevel& other) {
    const NodeBytes bytes(hdr, one.node);
    const NodeBytes otherBytes(hdr, other.node);
    const u32 at = bytes.U16(SlotOffset(hdr, static_cast<u32>(one.index)));
    const u32 otherAt = otherBytes.U16(SlotOffset(hdr, static_cast<u32>(other.index)));
    const u32 size = u32{bytes.U16(at)} + kKeyLengthSize;
    for (u32 i = 0; i < size; ++i) {
        if (bytes.U8(at + i) != otherBytes.U8(otherAt + i)) {
            return false;
        }
    }
    return true;
}

// A record alone that goes into the left sibling leaves the node's first key as it was, and with it
// the separator: here that is always the first key. Other writers leave a separator behind when the
// record it was taken from goes. It is then below the first key, and lookups of the record that
// went left would still be led into this node: such a separator has to follow.
bool SeparatorStayedBehind(const CBTreeHfs* tree, const HfsFindData* path, HfsNode* node,
                           const LevelChange& change, int level) {
    return change.nodeNum != node->nodeNum && !change.newRoot && level != tree->header.treeDepth &&
           ParentsLeadHere(tree, path, static_cast<u32>(level)) &&
           !KeysAreEqual(&tree->header, path->path[level + 1], {node, 0});
}

// The parent's record for `node` must be there before it is replaced or followed by another.
int CheckParent(const CBTreeHfs* tree, const HfsFindLevel& parent, const HfsNode* node,
                bool replace) {
    HFS_ASSERT(parent.node != nullptr && Kind(parent.node) == kBTIndexNode, 4696);
    if (parent.node == nullptr || Kind(parent.node) != kBTIndexNode) {
        return Fail(kErrCorrupt, kReasonTree, 9241);
    }
    if (!replace) {
        return kOk;
    }
    u32 child = 0;
    HFS_TRY(ChildOf(tree, parent.node, parent.index, &child), 9242);
    HFS_ASSERT(child == node->nodeNum, 4705);
    if (child != node->nodeNum || parent.index < 0) {
        return Fail(kErrCorrupt, kReasonTree, 9243);
    }
    return kOk;
}

// Enters the new right node of a level in the parent, together with the replacement of the level's
// own separator if there is one. That one may occupy the scratch buffer, so the new separator does
// not use it then.
int EnterNewNode(CBTreeHfs* tree, HfsFindData* path, Separator* replacement, HfsNode* newNode,
                 int level) {
    const HfsFindLevel parent = path->path[level + 1];
    const BTreeKey* key = nullptr;
    void* heap = nullptr;
    int status = replacement != nullptr ? FirstKeyAside(tree, newNode, &key, &heap)
                                        : FirstKey(tree, newNode, &key);
    if (status == kErrNoMemory) {
        return status;
    }
    HFS_TRY(status, 4757);
    Separator entry;
    entry.Fill(&tree->header, key, newNode);
    if (replacement != nullptr) {
        status = tree->InsertLevel(path, &replacement->entry, &entry.entry, parent.node,
                                   parent.index, level + 1);
    } else {
        status = tree->InsertLevel(path, &entry.entry, nullptr, parent.node, parent.index + 1,
                                   level + 1);
    }
    velk_heap_free(heap);
    return status;
}

// Tells the parent what changed below it.
int TellParent(CBTreeHfs* tree, HfsFindData* path, HfsNode* node, const LevelChange& change,
               int level) {
    const BTHeaderMem* hdr = &tree->header;
    HFS_ASSERT(level != hdr->treeDepth, 4685);
    if (level == hdr->treeDepth || static_cast<u32>(level) >= kMaxPathDepth) {
        return Fail(kErrCorrupt, kReasonTree, 9244);
    }
    const HfsFindLevel parent = path->path[level + 1];
    int status = CheckParent(tree, parent, node, change.firstKeyChanged);
    if (status != 0) {
        return status;
    }
    if (!change.firstKeyChanged) {
        return EnterNewNode(tree, path, nullptr, change.newNode.Get(), level);
    }

    if (!change.enterNewNode && ReplacePlainSeparator(tree, path, level + 1, node)) {
        return kOk;
    }
    HFS_TRY(tree->_DeleteRecord(parent.node, parent.index), 4714);
    const BTreeKey* key = nullptr;
    HFS_TRY(FirstKey(tree, node, &key), 4716);
    Separator replacement;
    replacement.Fill(hdr, key, node);
    replacement.entry.replacesSeparator = true;
    replacement.entry.secondKeyFollows = change.enterNewNode;
    if (change.enterNewNode) {
        return EnterNewNode(tree, path, &replacement, change.newNode.Get(), level);
    }
    return tree->InsertLevel(path, &replacement.entry, nullptr, parent.node, parent.index,
                             level + 1);
}

}  // namespace

int CBTreeHfs::InsertLevel(HfsFindData* path, InsertKey* first, const InsertKey* second,
                           HfsNode* node, int index, int level) {
    path = path != nullptr ? path : &findData;
    if (level < 1 || static_cast<u32>(level) > kMaxPathDepth) {
        return Fail(kErrCorrupt, kReasonDepth, 9245);
    }
    HFS_ASSERT(node == path->path[level].node, 4632);
    if (node == nullptr || node != path->path[level].node ||
        Height(node) != static_cast<u32>(level)) {
        return Fail(kErrInvalid, kReasonInvalid, 9246);
    }
    HFS_ASSERT(level != 1 || IsLeaf(node), 4631);

    pathVersion += 1;
    LevelChange change;
    const int status = PutRecords(this, path, first, second, node, index, level, &change);
    if (status != 0) {
        return status;
    }
    if (!change.firstKeyChanged && !change.enterNewNode) {
        if (!SeparatorStayedBehind(this, path, node, change, level)) {
            return kOk;
        }
        change.firstKeyChanged = true;
    }
    return TellParent(this, path, node, change, level);
}

}  // namespace VELK
