// Puts one record into one node or, when it is full, shares with its left sibling, else splits it
// into a new right sibling. A full root is split the same way and gets a new root above. What the
// parent has to learn of it is told, not done: see insert_level.cpp.
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/map_walk.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/noderef.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/separator.h"
#include "hfs/treehfs/way.h"

namespace VELK {

namespace {

constexpr unsigned kDumpSize = 128;  // bytes of a descriptor and what follows, for a person

// Where InsertNode tells what became of its record.
struct Placement {
    unsigned* nodeNum;
    int* index;
    HfsNode** newNode;
    bool* firstKeyChanged;
    bool* enterNewNode;
    HfsNode** newRoot;
};

bool IsRoot(const CBTreeHfs* tree, const HfsNode* node) {
    return Height(node) == tree->header.treeDepth;
}

bool IsSiblingOf(const HfsNode* sibling, const HfsNode* node) {
    return sibling != node && Height(sibling) == Height(node) && Kind(sibling) == Kind(node);
}

int CheckLeftSibling(const HfsNode* left, const HfsNode* node) {
    HFS_ASSERT(FLink(left) == node->nodeNum, 4353);
    if (FLink(left) == node->nodeNum && IsSiblingOf(left, node)) {
        return kOk;
    }
    HFS_TRACE("bLink=%x, NodeNum=%x\n", BLink(node), node->nodeNum);
    VELK_DumpMemory(left->bufs[0].data, kDumpSize);
    return Fail(kErrInvalid, kReasonInvalid, 4361);
}

int CheckRightSibling(const HfsNode* right, const HfsNode* node) {
    if (BLink(right) == node->nodeNum && IsSiblingOf(right, node)) {
        return kOk;
    }
    const int status = Fail(kErrInvalid, kReasonInvalid, 4418);
    HFS_TRACE("fLink=%x, NodeNum=%x\n", FLink(node), node->nodeNum);
    VELK_DumpMemory(right->bufs[0].data, kDumpSize);
    VELK_DumpMemory(node->bufs[0].data, kDumpSize);
    return status;
}

// Shares the records of `node` and the new one with the left sibling, if there is one and it has
// room. `*placed` false: nothing changed.
int LendLeft(CBTreeHfs* tree, const InsertKey& key, HfsNode* node, int index, const Placement& out,
             bool* placed) {
    *placed = false;
    if (BLink(node) == 0) {
        return kOk;
    }
    NodeRef left;
    HFS_TRY(FetchSibling(tree, node, Side::kLeft, left.Out()), 4351);
    HFS_TRY(CheckLeftSibling(left.Get(), node), 4362);
    if (key.secondKeyFollows) {
        return kOk;
    }
    unsigned moved = 0;
    HFS_TRY(tree->_RotateLeft(left.Get(), node, index, key.key, key.data, key.dataSize, out.index,
                              out.nodeNum, placed, &moved, key.convert),
            4371);
    if (*placed) {
        // With the new record alone in front of the others, the node's first key stays.
        if (key.replacesSeparator || moved >= 2 || index >= 1) {
            *out.firstKeyChanged = true;
        }
        *out.newNode = left.Take();
    }
    return kOk;
}

// Links the empty `fresh` in between `node` and its right sibling. Order: sibling, new node, node.
int LinkRight(CBTreeHfs* tree, HfsNode* node, HfsNode* fresh) {
    const BTHeaderMem* hdr = &tree->header;
    const u32 next = FLink(node);
    if (next != 0) {
        NodeRef right;
        HFS_TRY(FetchSibling(tree, node, Side::kRight, right.Out()), 4413);
        HFS_TRY(CheckRightSibling(right.Get(), node), 4424);
        HFS_TRY(MarkDirty(tree, right.Get(), 0), 4428);
        SetBLink(hdr, right.Get(), fresh->nodeNum);
    }
    HFS_TRY(MarkDirty(tree, fresh, 0), 9230);
    SetFLink(hdr, fresh, next);
    SetBLink(hdr, fresh, node->nodeNum);
    SetKind(hdr, fresh, Kind(node));
    SetHeight(hdr, fresh, Height(node));
    HFS_TRY(MarkDirty(tree, node, 0), 4449);
    SetFLink(hdr, node, fresh->nodeNum);
    if (IsLeaf(fresh) && next == 0) {
        tree->header.lastLeafNode = fresh->nodeNum;
        tree->isDirty = true;
    }
    return kOk;
}

// Moves the tail of `node` into a new right sibling and places the record in one of the two.
int SplitRight(CBTreeHfs* tree, const InsertKey& key, HfsNode* node, int index,
               const Placement& out) {
    if (Height(node) == 1 && !IsLeaf(node)) {
        return Fail(kErrInvalid, kReasonInvalid, 4394);
    }
    if (IsRoot(tree, node) && Height(node) >= kMaxPathDepth) {
        return Fail(kErrCorrupt, kReasonDepth, 9231);  // no path could hold the new root
    }
    NodeRef fresh;
    HFS_TRY(TakeFreeNode(tree, !IsLeaf(node), fresh.Out()), 4402);
    HFS_ASSERT(fresh->refCount == 1, 4404);
    if (fresh.Get() == node || WasEmptied(&tree->header, fresh.Get(), key.key)) {
        return Fail(kErrCorrupt, kReasonTree, 9232);  // the map calls a node free that is in use
    }
    const int status = LinkRight(tree, node, fresh.Get());
    if (status != 0) {
        return status;
    }
    unsigned moved = 0;
    HFS_TRY(tree->_RotateRight(node, fresh.Get(), index, key.key, key.data, key.dataSize, out.index,
                               out.nodeNum, &moved, key.convert),
            4467);
    *out.newNode = fresh.Take();
    return kOk;
}

// Makes a new root over the split old one and its new right sibling. The first record of the new
// root is in before the key of the second is gathered: both may need the scratch buffer.
int GrowRoot(CBTreeHfs* tree, HfsNode* node, HfsNode* right, HfsNode** newRoot) {
    BTHeaderMem* hdr = &tree->header;
    NodeRef root;
    HFS_TRY(TakeFreeNode(tree, true, root.Out()), 4474);
    HFS_TRY(MarkDirty(tree, root.Get(), 0), 9233);
    SetKind(hdr, root.Get(), kBTIndexNode);
    hdr->treeDepth = static_cast<u16>(hdr->treeDepth + 1);
    SetHeight(hdr, root.Get(), hdr->treeDepth);
    tree->isDirty = true;

    const BTreeKey* key = nullptr;
    Separator separator;
    HFS_TRY(FirstKey(tree, node, &key), 4488);
    separator.Fill(hdr, key, node);
    HFS_TRY(tree->_InsertKeyRecord(root.Get(), 0, key, separator.entry.keyLength, separator.child,
                                   kChildSize, nullptr),
            4501);
    HFS_TRY(FirstKey(tree, right, &key), 4503);
    separator.Fill(hdr, key, right);
    HFS_TRY(tree->_InsertKeyRecord(root.Get(), 1, key, separator.entry.keyLength, separator.child,
                                   kChildSize, nullptr),
            4516);
    hdr->rootNode = root->nodeNum;
    HFS_ASSERT(tree->isDirty, 4522);
    HFS_ASSERT(root->refCount == 1, 4526);
    *newRoot = root.Take();
    return kOk;
}

// The node did not have room: left sibling, else split, else a new level.
int MakeRoom(CBTreeHfs* tree, const InsertKey& key, HfsNode* node, int index,
             const Placement& out) {
    HFS_ASSERT(*out.newNode == nullptr, 4342);
    if (*out.newNode != nullptr) {
        return Fail(kErrInvalid, kReasonInvalid, 9234);  // one call can hand out one new node
    }
    bool placed = false;
    int status = LendLeft(tree, key, node, index, out, &placed);
    if (status != 0 || placed) {
        return status;
    }
    const bool root = IsRoot(tree, node);
    status = SplitRight(tree, key, node, index, out);
    if (status != 0) {
        return status;
    }
    if (root) {
        return GrowRoot(tree, node, *out.newNode, out.newRoot);
    }
    *out.enterNewNode = true;
    if (key.replacesSeparator || (index == 0 && *out.index == 0)) {
        *out.firstKeyChanged = true;
    }
    return kOk;
}

int Place(CBTreeHfs* tree, const InsertKey& key, HfsNode* node, unsigned nodeNum, int index,
          const Placement& out) {
    HfsNode* target = nodeNum == node->nodeNum ? node : *out.newNode;
    if (target == nullptr || target->nodeNum != nodeNum) {
        return Fail(kErrInvalid, kReasonInvalid, 9235);
    }
    bool inserted = false;
    if (!key.wasRefused) {
        HFS_TRY(tree->_InsertKeyRecord(target, index, key.key, key.keyLength, key.data,
                                       key.dataSize, key.convert, &inserted),
                4327);
    }
    if (!inserted) {
        return MakeRoom(tree, key, target, index, out);
    }
    if (key.child != nullptr && target->hints != nullptr) {
        Hints(tree, target).SetChild(static_cast<u32>(index), key.child);
    }
    *out.nodeNum = nodeNum;
    *out.index = index;
    if (index == 0 && !IsRoot(tree, target)) {
        *out.firstKeyChanged = true;
    }
    return kOk;
}

}  // namespace

int CBTreeHfs::InsertNode(const InsertKey* insertKey, HfsNode* node, unsigned nodeNum, int index,
                          unsigned* outNodeNum, int* outIndex, HfsNode** newNode,
                          bool* firstKeyChanged, bool* enterNewNode, HfsNode** newRoot) {
    *newRoot = nullptr;
    const Placement out = {outNodeNum, outIndex, newNode, firstKeyChanged, enterNewNode, newRoot};
    const int status = Place(this, *insertKey, node, nodeNum, index, out);
    if (status != 0) {
        ReleaseNode(*newNode);
        *newNode = nullptr;
    }
    return status;
}

}  // namespace VELK
