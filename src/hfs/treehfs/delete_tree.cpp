// DeleteRecord: takes one leaf record out of the tree and carries the removal up the search path.
// A node goes only when its last record goes, a separator is replaced only when a node's first
// record goes, and the root collapses only while it is an index node with a single child. Nodes
// are never merged.
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/node_child.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/noderef.h"
#include "hfs/treehfs/own_change.h"
#include "hfs/treehfs/path_check.h"
#include "hfs/treehfs/path_level.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/separator.h"
#include "hfs/treehfs/way.h"

namespace VELK {

namespace {

bool IsSiblingOf(const HfsNode* sibling, const HfsNode* node) {
    return sibling != node && Height(sibling) == Height(node) && Kind(sibling) == Kind(node);
}

// Takes `node` out of the chain of its level.
int Unlink(CBTreeHfs* tree, HfsNode* node) {
    BTHeaderMem* hdr = &tree->header;
    const u32 previous = BLink(node);
    const u32 next = FLink(node);
    if (previous != 0) {
        NodeRef left;
        HFS_TRY(FetchSibling(tree, node, Side::kLeft, left.Out()), 4846);
        if (FLink(left.Get()) != node->nodeNum || !IsSiblingOf(left.Get(), node)) {
            return Fail(kErrInvalid, kReasonInvalid, 9260);
        }
        HFS_TRY(MarkDirty(tree, left.Get(), 0), 4847);
        SetFLink(hdr, left.Get(), next);
    } else if (IsLeaf(node)) {
        hdr->firstLeafNode = next;
        tree->isDirty = true;
    }
    if (next != 0) {
        NodeRef right;
        HFS_TRY(FetchSibling(tree, node, Side::kRight, right.Out()), 4859);
        if (BLink(right.Get()) != node->nodeNum || !IsSiblingOf(right.Get(), node)) {
            return Fail(kErrInvalid, kReasonInvalid, 9261);
        }
        HFS_TRY(MarkDirty(tree, right.Get(), 0), 4860);
        SetBLink(hdr, right.Get(), previous);
    } else if (IsLeaf(node)) {
        hdr->lastLeafNode = previous;
        tree->isDirty = true;
    }
    return kOk;
}

// Puts the present first key of `node` into its parent in place of the one that was deleted.
// REQUIRES: the levels above lead to `node`.
int ReplaceParentKey(CBTreeHfs* tree, HfsFindData* path, HfsNode* node, int level) {
    HfsNode* parent = path->path[level + 1].node;
    const int index = path->path[level + 1].index;
    u32 child = 0;
    HFS_TRY(ChildOf(tree, parent, index, &child), 9263);
    HFS_ASSERT(child == node->nodeNum, 4960);
    if (!ReplacePlainSeparator(tree, path, level + 1, node)) {
        HFS_TRY(tree->_DeleteRecord(parent, index), 4964);
        const BTreeKey* key = nullptr;
        HFS_TRY(FirstKey(tree, node, &key), 4970);
        Separator replacement;
        replacement.Fill(&tree->header, key, node);
        replacement.entry.replacesSeparator = true;
        HFS_TRY(tree->InsertLevel(path, &replacement.entry, nullptr, parent, index, level + 1),
                4981);
    }
    const bool linked = RelinkNode(tree, node);
    HFS_ASSERT(linked, 4988);
    return kOk;
}

// Makes the only child of `root` the new root. The child is fetched before anything changes, so
// that the tree is never left without a root. The path takes the child in the old root's place.
int CollapseOnce(CBTreeHfs* tree, HfsNode* root, HfsFindLevel* entry) {
    BTHeaderMem* hdr = &tree->header;
    const bool linked = RelinkNode(tree, root);
    HFS_ASSERT(linked, 4918);
    unsigned childNum = 0;
    HFS_TRY(root->GetChildNodeNum(hdr, 0, &childNum), 4922);
    NodeRef child;
    HFS_TRY(FetchNode(tree, childNum, NodeUse::kRead, child.Out()), 4937);
    const u32 height = hdr->treeDepth - 1u;
    const s8 kind = height == 1 ? kBTLeafNode : kBTIndexNode;
    if (Height(child.Get()) != height || Kind(child.Get()) != kind) {
        return Fail(kErrCorrupt, kReasonTree, 9265);
    }
    hdr->treeDepth = static_cast<u16>(height);
    tree->isDirty = true;
    hdr->rootNode = childNum;
    HFS_TRY(tree->Zero(root), 4929);
    HFS_TRY(tree->FreeNode(root->nodeNum), 4931);
    ReleaseNode(root);
    entry->node = child.Take();
    return kOk;
}

// After the root lost a record: an empty tree has no root, and an index root of one record gives
// way to its child.
int CheckRoot(CBTreeHfs* tree, HfsFindLevel* entry) {
    BTHeaderMem* hdr = &tree->header;
    const bool empty = NumRecords(entry->node) == 0;
    const bool wasLast = hdr->leafRecords == 1;  // counted down only after the whole deletion
    if (empty != wasLast) {
        return Fail(kErrCorrupt, kReasonTree, 9266);
    }
    if (empty) {
        hdr->rootNode = 0;
        hdr->treeDepth = 0;
        tree->isDirty = true;
        HFS_TRACE("Tree %x is empty\n", tree->fileId);
        return kOk;
    }
    const u32 rootBefore = hdr->rootNode;
    // One without records is damaged: it has no child that could take its place, which is reported.
    while (NumRecords(entry->node) <= 1 && Kind(entry->node) == kBTIndexNode) {
        const int status = CollapseOnce(tree, entry->node, entry);
        if (status != 0) {
            return status;
        }
    }
    if (hdr->rootNode != rootBefore) {
        tree->isDirty = true;  // giving the old root back may have stored the header and cleared it
    }
    return kOk;
}

// Whether the path's record at `level` can be deleted: it is there, in a node of that level, and if
// the parent has to change, the levels above lead here.
bool CanDeleteAt(const CBTreeHfs* tree, const HfsFindData* path, int level) {
    if (level < 1 || static_cast<u32>(level) > kMaxPathDepth) {
        return false;
    }
    const HfsFindLevel& entry = path->path[level];
    if (entry.node == nullptr || entry.index < 0 ||
        static_cast<u32>(entry.index) >= NumRecords(entry.node) ||
        Height(entry.node) != static_cast<u32>(level) ||
        Kind(entry.node) != (level == 1 ? kBTLeafNode : kBTIndexNode)) {
        return false;
    }
    const bool reachesParent = entry.index == 0 || level == tree->header.treeDepth;
    return !reachesParent || ParentsLeadHere(tree, path, static_cast<u32>(level));
}

// Gives an emptied node back to the map.
int FreeEmptyNode(CBTreeHfs* tree, HfsNode* node) {
    const int status = Unlink(tree, node);
    if (status != 0) {
        return status;
    }
    HFS_TRY(tree->Zero(node), 4870);
    HFS_TRY(tree->FreeNode(node->nodeNum), 4872);
    return kOk;
}

// A leaf whose first record goes is linked anew in the tree of cached nodes, one whose only record
// goes leaves its siblings: what that meets is asked for before the deletion.
void PrefetchForFirst(const CBTreeHfs* tree, const HfsFindLevel& entry) {
    if (entry.node == nullptr || entry.index != 0) {
        return;
    }
    PrefetchLinks(entry.node);
    if (NumRecords(entry.node) == 1) {
        PrefetchSibling(tree, entry.node, Side::kLeft);
        PrefetchSibling(tree, entry.node, Side::kRight);
    }
}

// Makes sure there are nodes for separators that grow. Looks at the total of nodes, not at the
// free ones as insertion does, on purpose.
int ReserveForDeletion(CBTreeHfs* tree) {
    const BTHeaderMem& hdr = tree->header;
    if (hdr.totalNodes >= hdr.treeDepth + 1u) {
        return kOk;
    }
    u32 target = hdr.treeDepth + hdr.totalNodes + 1;
    if (target > tree->CalcMapBits()) {
        target += 1;
    }
    HFS_TRY(tree->ExtendBTree(target, nullptr, nullptr), 5145);
    return kOk;
}

}  // namespace

int CBTreeHfs::DeleteTree(int level, HfsFindData* path) {
    path = path != nullptr ? path : &findData;
    if (!CanDeleteAt(this, path, level)) {
        return Fail(kErrInvalid, kReasonInvalid, 9267);
    }
    HfsFindLevel* entry = &path->path[level];
    HfsNode* node = entry->node;
    if (entry->index == 0) {
        pathVersion += 1;  // a first key goes: separators or whole nodes follow
    }
    HFS_TRY(_DeleteRecord(node, entry->index), 4831);
    const bool isRoot = level == header.treeDepth;
    if (NumRecords(node) != 0) {
        if (isRoot) {
            return CheckRoot(this, entry);
        }
        return entry->index != 0 ? kOk : ReplaceParentKey(this, path, node, level);
    }
    const int status = FreeEmptyNode(this, node);
    if (status != 0) {
        return status;
    }
    if (isRoot) {
        return CheckRoot(this, entry);
    }
    HFS_TRY(DeleteTree(level + 1, path), 4993);
    return kOk;
}

int CBTreeHfs::DeleteRecord(const void* key, unsigned keyLength, bool usePath) {
    if (key != nullptr && !(usePath && findData.valid)) {
        bool found = false;
        HFS_TRY(FindEntry(static_cast<const BTreeKey*>(key), keyLength, &findData, &found, nullptr,
                          nullptr, nullptr, nullptr),
                5124);
        if (!found) {
            return kErrNotFound;
        }
    } else if (!findData.valid) {
        return Fail(kErrInvalid, kReasonInvalid, 5132);
    }
    PrefetchForFirst(this, findData.path[1]);
    if (!StandsOnLeaf(&findData, 0) || !CanDeleteAt(this, &findData, 1)) {
        return Fail(kErrInvalid, kReasonInvalid, 9268);
    }
    if (header.leafRecords == 0) {
        return Fail(kErrCorrupt, kReasonTree, 9269);
    }
    findData.searchCount += 1;
    const int status = ReserveForDeletion(this);
    if (status != 0) {
        return status;
    }
    OwnChange change(this);
    HFS_TRY(DeleteTree(1, &findData), 5148);
    change.Done();
    header.leafRecords -= 1;
    isDirty = true;
    return kOk;
}

}  // namespace VELK
