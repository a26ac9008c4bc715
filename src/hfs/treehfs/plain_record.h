// Records where they lie in their nodes. Nearly every record is sound and has its key in one piece;
// that case is decided here, without a call. In any doubt a caller goes the careful way of
// FetchKey, which also reports what is wrong.
#pragma once

#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/one_piece.h"
#include "hfs/treehfs/path_deliver.h"
#include "hfs/treehfs/report.h"

namespace VELK {

// Where the bytes of a node are. Nearly every node lies in one block, and is then searched without
// asking for each offset which block holds it.
class OneBlock {
public:
    OneBlock(const CBTreeHfs* tree, const HfsNode* node)
        : data_(node->bufs[0].data), slots_(data_ + tree->header.nodeSize) {}

    const u8* At(u32 offset) const { return data_ + offset; }
    // Slot of record `index` in the lower half, that of the next record in the upper one.
    u32 SlotPair(u32 index) const { return GetBe32(slots_ - kSlotSize * std::size_t{index + 2}); }
    // Whether the `size` bytes from `offset` on can be read in one piece, and whether those from
    // `start` to `end` lie in two blocks at most. REQUIRES of both: they lie inside the node.
    static bool IsWhole(u32, u32) { return true; }
    static bool IsShort(u32, u32) { return true; }
    // Bytes from `offset` on that can be read in one piece, or more when the whole node can.
    static u32 Room(u32) { return ~0u; }

private:
    const u8* data_;
    const u8* slots_;  // end of the table
};

// Where the blocks of a node end, if it has several.
class BlockEnds {
public:
    explicit BlockEnds(const BTHeaderMem* hdr) : mask_(hdr->blockMask), shift_(hdr->blockShift) {}

    bool IsWhole(u32 offset, u32 size) const { return (offset & mask_) + size <= mask_ + 1; }
    bool IsShort(u32 start, u32 end) const {
        return ((end - 1) >> shift_) - (start >> shift_) <= 1;
    }
    u32 Room(u32 offset) const { return mask_ + 1 - (offset & mask_); }

protected:
    u32 mask_;
    u32 shift_;
};

// Several blocks in one piece. What lies over the end of a block can be read where it is, instead
// of being gathered in the scratch buffer; but only where there is one, as who has no memory for it
// is to be told.
class OnePiece : public BlockEnds {
public:
    OnePiece(const CBTreeHfs* tree, const HfsNode* node)
        : BlockEnds(&tree->header), bytes_(tree, node), canGather_(tree->scratch != nullptr) {}

    const u8* At(u32 offset) const { return bytes_.At(offset); }
    u32 SlotPair(u32 index) const { return bytes_.SlotPair(index); }
    bool IsWhole(u32 offset, u32 size) const {
        return canGather_ || BlockEnds::IsWhole(offset, size);
    }
    u32 Room(u32 offset) const { return canGather_ ? ~0u : BlockEnds::Room(offset); }

private:
    OneBlock bytes_;
    bool canGather_;
};

class ManyPieces : public BlockEnds {
public:
    ManyPieces(const CBTreeHfs* tree, const HfsNode* node)
        : BlockEnds(&tree->header), bufs_(node->bufs), nodeSize_(tree->header.nodeSize) {}

    const u8* At(u32 offset) const { return bufs_[offset >> shift_].data + (offset & mask_); }
    u32 SlotPair(u32 index) const {
        const u32 slot = nodeSize_ - kSlotSize * (index + 1);
        return GetBe16(At(slot)) | u32{GetBe16(At(slot - kSlotSize))} << 16;
    }

private:
    const HfsBcbBuf* bufs_;
    u32 nodeSize_;
};

// Calls `body` with the class that knows best where the bytes of the node are.
template <typename Body>
[[gnu::always_inline]] inline auto WithBlocks(const CBTreeHfs* tree, const HfsNode* node,
                                              Body body) {
    if (HFS_LIKELY(tree->header.blocksPerNode == 1)) {
        return body(OneBlock(tree, node));
    }
    return node->isOnePiece ? body(OnePiece(tree, node)) : body(ManyPieces(tree, node));
}

// What fixed part the keys of a comparator have, and where their name length stands (0: no name).
// That of catalog keys, by far the most frequent, is known to the compiler.
struct CatalogShape {
    static constexpr u32 Fixed() { return kCatKeyFixed; }
    static constexpr u32 NameLengthAt() { return kCatKeyNameLength; }
};
class AnyShape {
public:
    AnyShape(u32 fixed, u32 nameLengthAt) : fixed_(fixed), nameLengthAt_(nameLengthAt) {}
    u32 Fixed() const { return fixed_; }
    u32 NameLengthAt() const { return nameLengthAt_; }

private:
    u32 fixed_;
    u32 nameLengthAt_;
};

// A record of which nothing is out of the ordinary. Its data is given by node offsets.
struct PlainRecord {
    const u8* key;
    u32 keySize;  // length field and key
    u32 data;     // where its data begins
    u32 end;      // and ends

    u32 DataSize() const { return end - data; }
};

inline const BTreeKey* KeyOf(const PlainRecord& record) {
    return reinterpret_cast<const BTreeKey*>(record.key);
}

// Finds such records: exactly the checks of GetKey, of contiguity and of soundness.
template <typename Blocks, typename Shape>
class PlainRecords {
public:
    PlainRecords(const BTHeaderMem* hdr, Blocks blocks, Shape shape)
        : blocks_(blocks), shape_(shape), nodeSize_(hdr->nodeSize) {}

    // Record `index`. False: something about it is out of the ordinary.
    // REQUIRES of all: the slots of record `index` and the next lie inside the node.
    [[gnu::always_inline]] bool Find(u32 index, PlainRecord* out) const {
        const u32 slots = blocks_.SlotPair(index);
        const u32 start = slots & 0xFFFF;
        const u32 end = slots >> 16;
        if (HFS_UNLIKELY(end >= nodeSize_ || start >= end) ||
            HFS_UNLIKELY(!blocks_.IsWhole(start, kKeyLengthSize))) {
            return false;
        }
        const u8* key = blocks_.At(start);
        const u32 keyLength = GetBe16(key);
        const u32 padded = PaddedKeySize(keyLength);
        // A key at an odd address is asserted by the comparator each time it is asked.
        if (HFS_UNLIKELY((reinterpret_cast<std::uintptr_t>(key) & 1) != 0) ||
            HFS_UNLIKELY(keyLength - shape_.Fixed() > kMaxKeyLength - shape_.Fixed() ||
                         padded >= end - start) ||
            HFS_UNLIKELY(!blocks_.IsWhole(start, padded))) {
            return false;
        }
        // Data in three blocks is asserted each time it is described.
        if (HFS_UNLIKELY(!blocks_.IsShort(start + padded, end))) {
            return false;
        }
        *out = {key, keyLength + kKeyLengthSize, start + padded, end};
        return shape_.NameLengthAt() == 0 ||
               HFS_LIKELY(shape_.Fixed() + 2u * GetBe16(key + shape_.NameLengthAt()) <= keyLength);
    }

    // The record as it is delivered.
    RecordView View(const PlainRecord& record) const {
        return {KeyOf(record), blocks_.At(record.data),  record.keySize, record.DataSize(),
                record.data,   blocks_.Room(record.data)};
    }

    [[gnu::always_inline]] void Prefetch(u32 index) const {
        const u32 start = blocks_.SlotPair(index) & 0xFFFF;
        if (start < nodeSize_) {
            __builtin_prefetch(blocks_.At(start));
        }
    }

private:
    Blocks blocks_;
    [[no_unique_address]] Shape shape_;
    u32 nodeSize_;
};

// Whether the slots of `count` records fit the node.
inline bool TableFits(const BTHeaderMem& header, u32 count) {
    return kSlotSize * (count + 1) < header.nodeSize;
}

// FetchKey of a leaf whose keys are in folded order. False, nothing reported: something about the
// record is out of the ordinary, or its key in more than one piece.
[[gnu::always_inline]] inline bool ViewPlain(const CBTreeHfs* tree, const HfsNode* leaf, u32 index,
                                             RecordView* record) {
    const BTHeaderMem* hdr = &tree->header;
    const u32 count = NumRecords(leaf);
    if (HFS_UNLIKELY(tree->compareKeys != CompareCatKeysCaseIns) || HFS_UNLIKELY(index >= count) ||
        HFS_UNLIKELY(!TableFits(*hdr, count)) || HFS_UNLIKELY(leaf->nodeNum == 0)) {
        return false;
    }
    return WithBlocks(tree, leaf, [hdr, index, record](auto blocks) {
        const PlainRecords records(hdr, blocks, CatalogShape());
        PlainRecord plain;
        if (!records.Find(index, &plain)) {
            return false;
        }
        *record = records.View(plain);
        return true;
    });
}

}  // namespace VELK
