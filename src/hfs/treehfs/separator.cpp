// Building of separators. See separator.h.
#include "hfs/treehfs/separator.h"

#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/scratch.h"
#include "platform/heap.h"

namespace VELK {

namespace {

// Nodes of a size that is no power of two follow one another by less than they are long. A volume
// that lends what two of them share as one piece of memory would have a key that is left in place
// change, its length with it, while records move in the nodes above.
bool NodesOverlap(const CBTreeHfs* tree) {
    return tree->header.nodeSize != 1u << tree->nodeShift;
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
