// Accessors of one cached node: where its records, keys, child pointers and free space lie. They
// check exactly what they read and change nothing; a position that lies in no block of the node is
// refused after its assertion has printed.
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

int BadNode(int site) {
    return Fail(kErrCorrupt, kReasonNode, site);
}

bool IsKeyless(const HfsNode* node, int index) {
    return Kind(node) == kBTMapNode ||
           (node->nodeNum == 0 && index == static_cast<int>(kHeadMapIndex));
}

// Describes where node byte `offset` lies. REQUIRES: its block is one of the node's.
void Locate(const BTHeaderMem* hdr, const HfsNode* node, u32 offset, NodeKey* out) {
    const u32 block = offset >> hdr->blockShift;
    const u32 inBlock = offset & hdr->blockMask;
    out->ptr = node->bufs[block].data + inBlock;
    out->firstBytes = hdr->blockSize - inBlock;
    out->next1 = block + 1 < hdr->blocksPerNode ? node->bufs[block + 1].data : nullptr;
    out->next2 = block + 2 < hdr->blocksPerNode ? node->bufs[block + 2].data : nullptr;
}

void ClearKeyAndData(NodeKey* out) {
    out->keySize = 0;
    out->dataSize = 0;
    out->dataFirstBytes = 0;
    out->data = nullptr;
    out->dataNext1 = nullptr;
    out->dataNext2 = nullptr;
}

// Splits a located record into key and data and names the blocks its data reaches into.
int SplitRecord(const BTHeaderMem* hdr, const HfsNode* node, NodeKey* out) {
    const u32 keyLength = NodeBytes(hdr, node).U16(out->offset);
    const u32 padded = PaddedKeySize(keyLength);
    if (out->size <= padded) {
        return BadNode(9006);
    }
    out->keySize = keyLength + kKeyLengthSize;
    out->dataSize = out->size - padded;

    const u32 dataOffset = out->offset + padded;
    const u32 block = dataOffset >> hdr->blockShift;
    const u32 inBlock = dataOffset & hdr->blockMask;
    const u32 extra = ((out->offset + out->size - 1) >> hdr->blockShift) - block;
    if (block + extra >= hdr->blocksPerNode || extra > 2) {
        return BadNode(9007);
    }
    out->data = node->bufs[block].data + inBlock;
    out->dataFirstBytes = hdr->blockSize - inBlock;
    out->dataNext1 = extra >= 1 ? node->bufs[block + 1].data : nullptr;
    out->dataNext2 = extra == 2 ? node->bufs[block + 2].data : nullptr;
    if (extra == 2) {
        // Three pieces are the most a reader can follow, and are expected of 512-byte blocks only.
        AssertFailed(505);
        HFS_ASSERT(hdr->blockShift == kMinNodeShift, 506);
    }
    return kOk;
}

// GetRecordSize of a node in one block that holds such a record.
bool GetPlainRecordSize(const BTHeaderMem* hdr, const HfsNode* node, u32 index, unsigned* size) {
    const u64 fromEnd = static_cast<u64>(index) * kSlotSize + 2 * kSlotSize;
    if (fromEnd >= hdr->nodeSize) {
        return false;
    }
    const u8* slots = node->bufs[0].data + hdr->nodeSize - fromEnd;
    const u32 end = GetBe16(slots);
    const u32 start = GetBe16(slots + kSlotSize);
    *size = end - start;
    return end < hdr->nodeSize && start < end;
}

// Describes where a record and its slot lie in a node of one block, the slot `fromEnd` bytes before
// the node's end.
void LocateInOneBlock(u8* data, u32 nodeSize, u32 start, u32 fromEnd, NodeKey* out) {
    out->offset = start;
    out->firstBytes = nodeSize - start;
    out->ptr = data + start;
    out->next1 = nullptr;
    out->next2 = nullptr;
    out->entryPos = nodeSize - fromEnd;
    out->entry = data + (nodeSize - fromEnd);
    out->entryBytes = fromEnd;
}

// GetKey of a node in one block, as far as nothing about the record is out of the ordinary. False:
// the long way round has to tell what it is.
bool GetPlainKey(const BTHeaderMem* hdr, const HfsNode* node, u32 index, NodeKey* out) {
    const u32 nodeSize = hdr->nodeSize;
    const u64 fromEnd = static_cast<u64>(index) * kSlotSize + 2 * kSlotSize;
    if (hdr->blockSize != nodeSize || index >= NumRecords(node) || fromEnd >= nodeSize ||
        IsKeyless(node, static_cast<int>(index))) {
        return false;
    }
    u8* data = node->bufs[0].data;
    u8* slots = data + nodeSize - fromEnd;
    const u32 end = GetBe16(slots);
    const u32 start = GetBe16(slots + kSlotSize);
    if (end >= nodeSize || start >= end) {
        return false;
    }
    const u32 keyLength = GetBe16(data + start);
    const u32 padded = PaddedKeySize(keyLength);
    if (end - start <= padded) {
        return false;
    }
    LocateInOneBlock(data, nodeSize, start, static_cast<u32>(fromEnd) - kSlotSize, out);
    out->size = end - start;
    out->keySize = keyLength + kKeyLengthSize;
    out->dataSize = end - start - padded;
    out->dataFirstBytes = nodeSize - start - padded;
    out->data = data + start + padded;
    out->dataNext1 = nullptr;
    out->dataNext2 = nullptr;
    return true;
}

// GetFreeKey of a node in one block, as far as nothing about it is out of the ordinary.
bool GetPlainFree(const BTHeaderMem* hdr, const HfsNode* node, u32 index, NodeKey* out) {
    const u32 nodeSize = hdr->nodeSize;
    const u64 fromEnd = static_cast<u64>(index) * kSlotSize + kSlotSize;
    if (hdr->blockSize != nodeSize || index != NumRecords(node) || fromEnd >= nodeSize) {
        return false;
    }
    u8* data = node->bufs[0].data;
    const u32 position = nodeSize - static_cast<u32>(fromEnd);
    const u32 start = GetBe16(data + position);
    if (start > position) {
        return false;
    }
    LocateInOneBlock(data, nodeSize, start, static_cast<u32>(fromEnd), out);
    out->size = position - start;
    return true;
}

}  // namespace

unsigned GetKeyLength(const BTHeaderMem* hdr, const BTreeKey* key, bool leaf) {
    const bool own = leaf || (hdr->attributes & kBTVariableIndexKeysMask) != 0;
    return own ? GetBe16(key->length) : hdr->maxKeyLength;
}

unsigned GetKeyLengthLe(const BTHeaderMem* hdr, const BTreeKey* key, bool leaf) {
    const bool own = leaf || (hdr->attributes & kBTVariableIndexKeysMask) != 0;
    return own ? GetHost16(key->length) : hdr->maxKeyLength;
}

int HfsNode::GetKey(const BTHeaderMem* hdr, int index, NodeKey* out) const {
    if (hdr->blocksPerNode == 1 && GetPlainKey(hdr, this, static_cast<u32>(index), out)) {
        return kOk;
    }
    if (HFS_UNLIKELY(index < 0 || static_cast<u32>(index) >= NumRecords(this))) {
        AssertFailed(410);
        if (index < 0) {
            return BadNode(9001);
        }
    }
    const u64 fromEnd = static_cast<u64>(static_cast<u32>(index)) * kSlotSize + 2 * kSlotSize;
    if (fromEnd >= hdr->nodeSize) {
        return BadNode(9002);
    }
    const NodeBytes bytes(hdr, this);
    const u32 nextPos = hdr->nodeSize - static_cast<u32>(fromEnd);
    const u32 entryPosition = nextPos + kSlotSize;
    if (HFS_UNLIKELY(nextPos >> hdr->blockShift >= hdr->blocksPerNode)) {
        AssertFailed(422);
        return BadNode(9003);
    }
    const u32 end = bytes.U16(nextPos);
    if (end >= hdr->nodeSize || entryPosition >> hdr->blockShift >= hdr->blocksPerNode) {
        return BadNode(9004);
    }
    out->entryPos = entryPosition;
    out->entry = bytes.At(entryPosition);
    out->entryBytes = bytes.Room(entryPosition);

    const u32 start = bytes.U16(entryPosition);
    if (start >= hdr->nodeSize || start >= end) {
        return BadNode(9005);
    }
    out->offset = start;
    out->size = end - start;
    if (HFS_UNLIKELY(start >> hdr->blockShift >= hdr->blocksPerNode)) {
        AssertFailed(461);
        return BadNode(9008);
    }
    Locate(hdr, this, start, out);
    if (HFS_UNLIKELY(IsKeyless(this, index))) {
        ClearKeyAndData(out);
        return kOk;
    }
    return SplitRecord(hdr, this, out);
}

int HfsNode::GetFreeKey(const BTHeaderMem* hdr, unsigned index, NodeKey* out) const {
    if (hdr->blocksPerNode == 1 && GetPlainFree(hdr, this, index, out)) {
        return kOk;
    }
    HFS_ASSERT(index == NumRecords(this), 588);
    const u64 fromEnd = static_cast<u64>(index) * kSlotSize + kSlotSize;
    if (fromEnd >= hdr->nodeSize) {
        return BadNode(9009);
    }
    const NodeBytes bytes(hdr, this);
    const u32 position = hdr->nodeSize - static_cast<u32>(fromEnd);
    if (HFS_UNLIKELY(position >> hdr->blockShift >= hdr->blocksPerNode)) {
        AssertFailed(598);
        return BadNode(9010);
    }
    const u32 freeStart = bytes.U16(position);
    if (freeStart >= hdr->nodeSize || position < freeStart) {
        return BadNode(9011);
    }
    out->entryPos = position;
    out->entry = bytes.At(position);
    out->entryBytes = bytes.Room(position);
    out->offset = freeStart;
    out->size = position - freeStart;
    Locate(hdr, this, freeStart, out);
    return kOk;
}

int HfsNode::GetPtr(const BTHeaderMem* hdr, unsigned offset, NodePtr* out) const {
    out->ptr = nullptr;
    if (offset > hdr->nodeSize) {
        return BadNode(658);
    }
    const u32 block = offset >> hdr->blockShift;
    if (HFS_UNLIKELY(block >= hdr->blocksPerNode)) {
        AssertFailed(663);
        return BadNode(9012);
    }
    out->offset = offset;
    out->ptr = bufs[block].data + (offset & hdr->blockMask);
    out->firstBytes = hdr->blockSize - (offset & hdr->blockMask);
    out->next1 = block + 1 < hdr->blocksPerNode ? bufs[block + 1].data : nullptr;
    out->next2 = nullptr;
    return kOk;
}

int HfsNode::GetChildNodeNum(const BTHeaderMem* hdr, int index, unsigned* child) const {
    if (Kind(this) != kBTIndexNode) {
        return BadNode(9013);
    }
    NodeKey record;
    HFS_TRY(GetKey(hdr, index, &record), 9014);
    if (record.dataSize != kChildSize) {
        return BadNode(9015);
    }
    *child = NodeBytes(hdr, this).U32(record.offset + record.size - kChildSize);
    return kOk;
}

int HfsNode::GetNodeFreeSize(const BTHeaderMem* hdr, unsigned* freeBytes) const {
    const s64 position =
        static_cast<s64>(hdr->nodeSize) - kSlotSize * (static_cast<s64>(NumRecords(this)) + 1);
    if (position < 1) {
        return BadNode(1781);
    }
    const s64 bytesFree = position - NodeBytes(hdr, this).U16(static_cast<u32>(position));
    if (bytesFree < 0) {
        return BadNode(1789);
    }
    *freeBytes = static_cast<u32>(bytesFree);
    return kOk;
}

int HfsNode::GetRecordSize(const BTHeaderMem* hdr, int index, unsigned* size) const {
    if (hdr->blockSize == hdr->nodeSize &&
        GetPlainRecordSize(hdr, this, static_cast<u32>(index), size)) {
        return kOk;
    }
    *size = 0;
    const s64 position =
        static_cast<s64>(hdr->nodeSize) - kSlotSize * (static_cast<s64>(index) + 2);
    u32 start = 0;
    u32 end = 0;
    if (index >= 0 && position > 0) {
        const NodeBytes bytes(hdr, this);
        end = bytes.U16(static_cast<u32>(position));
        start = bytes.U16(static_cast<u32>(position) + kSlotSize);
    }
    if (end >= hdr->nodeSize || start >= end) {
        return BadNode(1856);
    }
    *size = end - start;
    return kOk;
}

}  // namespace VELK
