// Modified nodes: marking blocks before their bytes change, and handing them to the volume. A node
// is on the modified list exactly when one of its blocks is dirty.
#include <cstring>

#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/own_change.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

// Gets journal access for a clean block and marks it dirty.
int MarkBlock(CBTreeHfs* tree, HfsBcbBuf* block) {
    if (block->dirty) {
        return kOk;
    }
    const HfsService<HfsJournalOps>& journal = tree->volume->journal;
    if (journal) {
        const int status = journal.ops->GetWriteAccess(journal.self, block->bh);
        if (status != kOk) {
            return status;
        }
    }
    block->dirty = true;
    return kOk;
}

// After a refusal part way: a node with a dirty block is listed, one that was listed keeps its
// place.
void ListIfDirty(CBTreeHfs* tree, HfsNode* node) {
    if (node->modifiedLink.IsEmpty() && HasDirtyBlock(&tree->header, node)) {
        node->modifiedLink.LinkTail(&tree->modifiedList);
    }
}

// Marks blocks first .. last.
int MarkBlocks(CBTreeHfs* tree, HfsNode* node, u32 first, u32 last) {
    if (last >= tree->header.blocksPerNode) {
        return Fail(kErrCorrupt, kReasonNode, 779);
    }
    for (u32 i = first; i <= last; ++i) {
        const int status = MarkBlock(tree, &node->bufs[i]);
        if (status != kOk) {
            ListIfDirty(tree, node);
            Report(status, 790);
            return status;
        }
    }
    node->modifiedLink.MoveTail(&tree->modifiedList);
    return kOk;
}

// Hands the node's dirty blocks over in order. On failure the block that was refused stays dirty,
// so that a later flush hands it over, and the header stays unsaved if it was node 0's first block.
int HandOver(CBTreeHfs* tree, HfsNode* node) {
    bool any = false;
    for (u32 i = 0; i < tree->header.blocksPerNode; ++i) {
        HfsBcbBuf* block = &node->bufs[i];
        if (!block->dirty) {
            continue;
        }
        block->dirty = false;
        const int status = tree->volume->DirtyMeta(block->bh);
        if (status != kOk) {
            block->dirty = true;
            if (node->nodeNum == 0 && i == 0) {
                tree->isDirty = true;
            }
            Report(status, 2655);
            return status;
        }
        any = true;
    }
    if (any && node->nodeNum >= tree->validNodes && node->nodeNum != 0xFFFFFFFFu) {
        tree->validNodes = node->nodeNum + 1;
    }
    node->modifiedLink.Unlink();
    return kOk;
}

}  // namespace

int MarkBytes(CBTreeHfs* tree, HfsNode* node, u32 offset, u32 length) {
    const BTHeaderMem& header = tree->header;
    const u64 end = static_cast<u64>(offset) + length;
    HFS_ASSERT(offset <= header.nodeSize, 776);
    HFS_ASSERT(end <= header.nodeSize, 777);
    if (offset > header.nodeSize || end > header.nodeSize) {
        return Fail(kErrCorrupt, kReasonNode, 778);
    }
    const u32 first = offset >> header.blockShift;
    const u32 last = length == 0 ? first : static_cast<u32>((end - 1) >> header.blockShift);
    return MarkBlocks(tree, node, first, last);
}

// Somebody else is about to write into the node.
int CBTreeHfs::SetDirty(HfsNode* node, unsigned offset, unsigned length) {
    isAllOwn = false;
    ForgetRecords(this, node);
    return MarkDirty(this, node, offset, length);
}

int CBTreeHfs::SetDirty(HfsNode* node, unsigned offset) {
    return SetDirty(node, offset, 0);
}

int CBTreeHfs::Zero(HfsNode* node) {
    pathVersion += 1;
    NoteChange(this);
    ForgetRecords(this, node);
    for (u32 i = 0; i < header.blocksPerNode; ++i) {
        const int status = MarkBlock(this, &node->bufs[i]);
        if (status != kOk) {
            ListIfDirty(this, node);
            Report(status, 816);
            return status;
        }
        std::memset(node->bufs[i].data, 0, header.blockSize);
    }
    node->modifiedLink.MoveTail(&modifiedList);
    return kOk;
}

int CBTreeHfs::FlushINode(HfsNode* node) {
    return HandOver(this, node);
}

int CBTreeHfs::Clear() {
    int first = kOk;
    list_head* link = modifiedList.next;
    while (link != &modifiedList) {
        HfsNode* node = NodeOfModified(link);
        link = link->next;
        const int status = HandOver(this, node);
        if (status != kOk) {
            first = first == kOk ? status : first;
        } else if (node->refCount == 0) {
            node->refCount = -1;
            DiscardNode(this, node);
        }
    }
    return first;
}

}  // namespace VELK
