// Building of separators. See separator.h.
#include "hfs/treehfs/separator.h"

#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/one_piece.h"
#include "hfs/treehfs/own_change.h"
#include "hfs/treehfs/plain_record.h"
#include "hfs/treehfs/scratch.h"
#include "hfs/treehfs/slots.h"
#include "platform/heap.h"

namespace VELK {

namespace {

// Nodes of a size that is no power of two follow one another by less than they are long. A volume
// that lends what two of them share as one piece of memory would have a key that is left in place
// change, its length with it, while records move in the nodes above.
bool NodesOverlap(const CBTreeHfs* tree) {
    return tree->header.nodeSize != 1u << tree->nodeShift;
}

// The first record of a node, if its key lies in one piece and can become that of a separator as it
// is. REQUIRES: the node lies in one piece.
bool FindFirst(const CBTreeHfs* tree, const HfsNode* node, PlainRecord* first) {
    const BTHeaderMem* hdr = &tree->header;
    return NumRecords(node) != 0 &&
           PlainRecords(hdr, OnePiece(tree, node), AnyShape(0, 0)).Find(0, first) &&
           PaddedKeySize(first->keySize - kKeyLengthSize) == first->keySize &&
           GetKeyLength(hdr, KeyOf(*first), false) + kKeyLengthSize == first->keySize;
}

// Whether the records behind record `index` can follow its end without a word: as a deletion and an
// insertion there would look at them. `data` are the bytes of the node.
bool CanMoveBehind(const BTHeaderMem* hdr, const u8* data, const RecordSlots& slots, u32 index,
                   u32 removed) {
    for (u32 at = slots.limit; at < SlotOffset(hdr, index); at += kSlotSize) {
        if (GetBe16(data + at) <= removed) {
            return false;
        }
    }
    if (index + 1 == slots.count) {
        return true;
    }
    const u32 nextEnd = GetBe16(data + SlotOffset(hdr, index + 2));
    const u32 nextData = slots.end + PaddedKeySize(GetBe16(data + slots.end));
    return IsInsertPoint(nextEnd, slots.free) && CanMoveData(hdr, nextData, nextEnd);
}

}  // namespace

int FirstKey(CBTreeHfs* tree, HfsNode* node, const BTreeKey** key) {
    NodeKey record;
    const int status = node->GetKey(&tree->header, 0, &record);
    if (status != 0) {
        return status;
    }
    return NodesOverlap(tree) ? CopyKey(tree, node, record, key)
                              : GatherKey(tree, node, record, key);
}

int FirstKeyAside(CBTreeHfs* tree, HfsNode* node, const BTreeKey** key, void** heap) {
    *heap = nullptr;
    NodeKey record;
    const int status = node->GetKey(&tree->header, 0, &record);
    if (status != 0) {
        return status;
    }
    if (record.keySize <= record.firstBytes && !NodesOverlap(tree)) {
        *key = reinterpret_cast<const BTreeKey*>(record.ptr);
        return kOk;
    }
    *heap = velk_heap_alloc(record.keySize);
    if (*heap == nullptr) {
        return kErrNoMemory;
    }
    NodeBytes(&tree->header, node).CopyOut(*heap, record.offset, record.keySize);
    *key = static_cast<const BTreeKey*>(*heap);
    return kOk;
}

void Separator::Fill(const BTHeaderMem* hdr, const BTreeKey* key, HfsNode* leadsTo) {
    PutBe32(child, leadsTo->nodeNum);
    entry.convert = nullptr;
    entry.key = key;
    entry.keyLength = GetKeyLength(hdr, key, false);
    entry.data = child;
    entry.dataSize = kChildSize;
    entry.replacesSeparator = false;
    entry.secondKeyFollows = false;
    entry.child = leadsTo;
}

bool ReplacePlainSeparator(CBTreeHfs* tree, const HfsFindData* path, int level, HfsNode* child) {
    const BTHeaderMem* hdr = &tree->header;
    HfsNode* parent = path->path[level].node;
    const u32 index = static_cast<u32>(path->path[level].index);
    const bool endsHere = index != 0 || level == hdr->treeDepth;
    PlainRecord first;
    RecordSlots slots;
    if (!endsHere || Height(parent) != static_cast<u32>(level) || !IsMarkedPiece(hdr, parent) ||
        !IsOnePiece(hdr, child) || !LieApart(hdr, parent, child) ||
        !FindFirst(tree, child, &first) || !LoadRecordSlots(hdr, parent, index, &slots)) {
        return false;
    }
    const PlainBytes bytes(hdr, parent);
    u8* const data = bytes.At(0);
    const u32 removed = slots.end - slots.start;
    const u32 size = first.keySize + kChildSize;
    if (slots.free - removed + size > slots.limit ||
        !CanMoveBehind(hdr, data, slots, index, removed)) {
        return false;
    }
    NoteChange(tree);
    tree->pathVersion += 1;
    bytes.Move(slots.start + size, slots.end, slots.free - slots.end);
    bytes.CopyIn(slots.start, first.key, first.keySize);
    PutBe32(data + slots.start + first.keySize, child->nodeNum);
    for (u32 at = slots.limit; at < SlotOffset(hdr, index); at += kSlotSize) {
        PutBe16(data + at, GetBe16(data + at) + size - removed);
    }
    parent->modifiedLink.MoveTail(&tree->modifiedList);
    if (parent->hints != nullptr) {
        Hints(tree, parent).ForgetOrder(index);
        Hints(tree, parent).SetChild(index, child);
    }
    return true;
}

bool WasEmptied(const BTHeaderMem* hdr, const HfsNode* node, const BTreeKey* key) {
    if (node->refCount <= 1) {
        return false;  // nobody else holds it, so no key of it is on its way
    }
    const u8* bytes = key->length;
    for (u32 block = 0; block < hdr->blocksPerNode; ++block) {
        const u8* data = node->bufs[block].data;
        if (bytes >= data && bytes < data + hdr->blockSize) {
            return true;
        }
    }
    return false;
}

}  // namespace VELK
