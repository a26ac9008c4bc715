// The allocation map as a chain of records, and each record as the pieces it lies in. Bit n of the
// whole chain stands for node n.
//
//   node 0, record 2          map node, record 0        map node, record 0
//   [piece][piece]...   ->    [piece][piece]...   ->    [piece]...
//   bits 0 ..                 bits 8 x (nodeSize - 256) ..
//
// A walk holds one counted node at a time and gives it back when it steps on or ends. It reports
// nothing about its callees: the operation that walks reports each step at a site of its own.
#pragma once

#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/noderef.h"

namespace VELK {

// Bits of node 0's map record and of a map node's. REQUIRES: nodeSize 512 or more.
inline u64 HeadMapBits(const BTHeaderMem* hdr) {
    return 8 * (u64{hdr->nodeSize} - kHeadMapOverhead);
}
inline u64 MapNodeBits(const BTHeaderMem* hdr) {
    return 8 * (u64{hdr->nodeSize} - kMapNodeOverhead);
}

class MapWalk {
public:
    explicit MapWalk(CBTreeHfs* tree) : tree_(tree) {}
    MapWalk(const MapWalk&) = delete;
    MapWalk& operator=(const MapWalk&) = delete;

    // Steps to the first node of the chain, or to the next one. Fails when there is none, and past
    // the number of records a map can have: links that form a ring would never end.
    int NextNode();
    // Finds the map record of the present node and stands at its first piece. The record must lie
    // where the format puts it, because its bits are counted and written on that ground.
    int ReadRecord();
    // Stands at the next piece of the record. REQUIRES: HasMorePieces.
    int NextPiece();
    bool HasMorePieces() const { return offset_ + bytes_ < end_; }
    // Back to where a new walk starts.
    void Restart();

    HfsNode* Node() const { return node_.Get(); }
    bool AtHeaderNode() const { return node_->nodeNum == 0; }
    u64 RecordStart() const { return recordBit_; }  // number of the record's first bit
    u64 RecordBits() const { return recordBits_; }
    u64 RecordEnd() const { return recordBit_ + recordBits_; }

    // The piece: node offset of its first byte, number of its first bit, one past its last bit.
    u32 PieceOffset() const { return offset_; }
    u64 PieceStart() const { return pieceBit_; }
    u64 PieceEnd() const { return pieceBit_ + u64{bytes_} * 8; }

    // Number of the piece's first clear bit, sought behind those that are known to be set. False:
    // all are set.
    bool FindClearBit(u64* bit) const;

    // REQUIRES of these: the bit lies in the piece; of the writers: the piece's block was marked.
    bool IsSet(u64 bit) const;
    void SetBit(u64 bit);
    void ClearBit(u64 bit);

private:
    CBTreeHfs* tree_;
    NodeRef node_;
    u64 recordCount_ = 0;
    u64 recordBit_ = 0;
    u64 recordBits_ = 0;
    u64 pieceBit_ = 0;
    u32 offset_ = 0;
    u32 bytes_ = 0;
    u32 end_ = 0;  // node offset one past the record
    const u8* bits_ = nullptr;
};

// AllocateNode, told whether the node is to be an index node.
int TakeFreeNode(CBTreeHfs* tree, bool forIndex, HfsNode** node);

// Writes the in-memory header into node 0 at once, so that the counters on disk never stay behind
// a map that lies in the same node. REQUIRES: `node0` is node 0.
int StoreHeader(CBTreeHfs* tree, HfsNode* node0);

}  // namespace VELK
