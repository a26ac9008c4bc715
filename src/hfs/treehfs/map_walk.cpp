// Walking the allocation map: from map node to map node, and over the pieces of each record. Reads
// and writes map records only; what a bit means to the counters is the business of map_alloc.cpp
// and space_extend.cpp.
#include "hfs/treehfs/map_walk.h"

#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/header_record.h"
#include "hfs/treehfs/report.h"
#include "platform/bitmap.h"

namespace VELK {

namespace {

constexpr u64 kNodeNumbers = u64{1} << 32;

// Map records a map can have: each is a node of the file, and none is needed once every node number
// has its bit.
u64 MostMapRecords(const BTHeaderMem* hdr) {
    const u64 byNumber = 1 + kNodeNumbers / MapNodeBits(hdr);
    const u64 byNodes = hdr->totalNodes > 0 ? hdr->totalNodes : 1;
    return byNodes < byNumber ? byNodes : byNumber;
}

// Gets node `nodeNum` and keeps it only if it is of the kind that belongs there.
int GetNodeOfKind(CBTreeHfs* tree, u32 nodeNum, s8 kind, HfsNode** out) {
    NodeRef node;
    HFS_TRY(FetchNode(tree, nodeNum, NodeUse::kRead, node.Out()), 9400);
    if (Kind(node.Get()) != kind) {
        return Fail(kErrCorrupt, kReasonTree, 3651);
    }
    *out = node.Take();
    return kOk;
}

// True when the map record of `node` is exactly where the format puts it and the offset table and
// the free space lie behind it.
bool RecordIsInPlace(const BTHeaderMem* hdr, const HfsNode* node, u32 index,
                     const NodeKey& record) {
    const u32 start = index == kHeadMapIndex ? kHeadMapRecord : kDescSize;
    const u32 overhead = index == kHeadMapIndex ? kHeadMapOverhead : kMapNodeOverhead;
    const u32 count = NumRecords(node);
    if (record.offset != start || record.size != hdr->nodeSize - overhead || index >= count ||
        kSlotSize * (count + 1) >= hdr->nodeSize) {
        return false;
    }
    const u32 freeSlot = SlotOffset(hdr, count);
    const u32 freeOffset = NodeBytes(hdr, node).U16(freeSlot);
    return record.offset + record.size <= freeOffset && freeOffset <= freeSlot &&
           freeOffset % 2 == 0;
}

u8 MaskOf(u64 bitInPiece) {
    return static_cast<u8>(0x80u >> (bitInPiece % 8));
}

}  // namespace

// Worked out at once and in 64 bits: near 2^32 nodes a sum of 32 bits would pass the number of map
// nodes and never reach it.
u32 CBTreeHfs::CalcMapBits() const {
    if (header.nodeSize < (1u << kMinNodeShift)) {
        return 0;
    }
    const u64 head = HeadMapBits(&header);
    if (header.totalNodes <= head) {
        return static_cast<u32>(head);
    }
    const u64 step = MapNodeBits(&header);
    const u64 mapNodes = (header.totalNodes - head + step - 1) / step;
    return static_cast<u32>(head + mapNodes * step);
}

int CBTreeHfs::GetMapNode(HfsNode** node) {
    NodeRef before(*node);
    *node = nullptr;
    if (!before) {
        return GetNodeOfKind(this, 0, kBTHeaderNode, node);
    }
    const u32 next = FLink(before.Get());
    before.Reset();
    if (next == 0) {
        return Fail(kErrCorrupt, kReasonTree, 3626);
    }
    return GetNodeOfKind(this, next, kBTMapNode, node);
}

int MapWalk::NextNode() {
    const u64 next = RecordEnd();
    if (recordCount_ == MostMapRecords(&tree_->header)) {
        return Fail(kErrCorrupt, kReasonTree, 9401);
    }
    recordCount_ += 1;
    recordBit_ = next;
    recordBits_ = 0;
    return tree_->GetMapNode(node_.InOut());
}

int MapWalk::ReadRecord() {
    const BTHeaderMem* hdr = &tree_->header;
    const u32 index = AtHeaderNode() ? kHeadMapIndex : 0;
    NodeKey record;
    const int status = node_->GetKey(hdr, static_cast<int>(index), &record);
    if (status != kOk) {
        return status;
    }
    if (!RecordIsInPlace(hdr, node_.Get(), index, record)) {
        return Fail(kErrCorrupt, kReasonNode, 9402);
    }
    recordBits_ = u64{record.size} * 8;
    pieceBit_ = recordBit_;
    offset_ = record.offset;
    end_ = record.offset + record.size;
    bytes_ = record.firstBytes < record.size ? record.firstBytes : record.size;
    bits_ = record.ptr;
    return kOk;
}

int MapWalk::NextPiece() {
    NodePtr piece;
    const u32 offset = offset_ + bytes_;
    const int status = node_->GetPtr(&tree_->header, offset, &piece);
    if (status != kOk) {
        return status;
    }
    const u32 left = end_ - offset;
    pieceBit_ = PieceEnd();
    offset_ = offset;
    bytes_ = piece.firstBytes < left ? piece.firstBytes : left;
    bits_ = piece.ptr;
    return kOk;
}

void MapWalk::Restart() {
    node_.Reset();
    recordCount_ = 0;
    recordBit_ = 0;
    recordBits_ = 0;
}

bool MapWalk::FindClearBit(u64* bit) const {
    const unsigned long count = static_cast<unsigned long>(bytes_) * 8;
    const u64 known = tree_->isAllOwn ? tree_->noneFreeBelow : 0;
    const u64 set = known > pieceBit_ ? known - pieceBit_ : 0;
    const unsigned long found = GetFreeBitPosBe(bits_, set < count ? set : count, count);
    *bit = pieceBit_ + found;
    return found < count;
}

bool MapWalk::IsSet(u64 bit) const {
    const u64 bitInPiece = bit - pieceBit_;
    return (bits_[bitInPiece / 8] & MaskOf(bitInPiece)) != 0;
}

void MapWalk::SetBit(u64 bit) {
    const NodeBytes bytes(&tree_->header, node_.Get());
    const u64 bitInPiece = bit - pieceBit_;
    const u32 offset = offset_ + static_cast<u32>(bitInPiece / 8);
    bytes.SetU8(offset, u32{bytes.U8(offset)} | MaskOf(bitInPiece));
}

void MapWalk::ClearBit(u64 bit) {
    const NodeBytes bytes(&tree_->header, node_.Get());
    const u64 bitInPiece = bit - pieceBit_;
    const u32 offset = offset_ + static_cast<u32>(bitInPiece / 8);
    bytes.SetU8(offset, bytes.U8(offset) & ~u32{MaskOf(bitInPiece)});
    if (bit < tree_->noneFreeBelow) {
        tree_->noneFreeBelow = static_cast<u32>(bit);
    }
}

int StoreHeader(CBTreeHfs* tree, HfsNode* node0) {
    const int status = MarkDirty(tree, node0, 0);
    if (status != kOk) {
        return status;
    }
    WriteHeaderRecord(tree, node0);
    tree->isDirty = false;
    return kOk;
}

}  // namespace VELK
