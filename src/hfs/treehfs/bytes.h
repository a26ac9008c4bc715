// The bytes of one cached node as one range [0, nodeSize): the only code that knows that a node
// lies in blocks (besides the accessors, which describe pieces, and the marking of blocks).
// Everything else speaks in node offsets.
//
// Offsets come from disk, so every access stays inside the node's blocks: a read that would leave
// them yields 0 (or copies nothing), a write that would leave them changes nothing. Callers check
// first; this is the net below them. 16- and 32-bit access works at odd offsets and over block
// ends.
#pragma once

#include <bit>
#include <cstring>

#include "hfs/treehfs.h"

namespace VELK {

inline u16 GetBe16(const u8* bytes) {
    return static_cast<u16>((bytes[0] << 8) | bytes[1]);
}
inline u32 GetBe32(const u8* bytes) {
    return (static_cast<u32>(bytes[0]) << 24) | (static_cast<u32>(bytes[1]) << 16) |
           (static_cast<u32>(bytes[2]) << 8) | bytes[3];
}
inline u64 GetBe64(const u8* bytes) {
    u64 value;
    std::memcpy(&value, bytes, sizeof value);
    return std::endian::native == std::endian::little ? __builtin_bswap64(value) : value;
}
// In one piece: who reads a number back soon would wait for single bytes to come together.
inline void PutBe16(u8* bytes, u32 value) {
    u16 stored = static_cast<u16>(value);
    if constexpr (std::endian::native == std::endian::little) {
        stored = __builtin_bswap16(stored);
    }
    std::memcpy(bytes, &stored, sizeof stored);
}
inline void PutBe32(u8* bytes, u32 value) {
    if constexpr (std::endian::native == std::endian::little) {
        value = __builtin_bswap32(value);
    }
    std::memcpy(bytes, &value, sizeof value);
}
// Host-order 16 bits of a search key, wherever it lies.
inline u16 GetHost16(const void* bytes) {
    u16 value;
    std::memcpy(&value, bytes, sizeof value);
    return value;
}
inline u32 GetHost32(const void* bytes) {
    u32 value;
    std::memcpy(&value, bytes, sizeof value);
    return value;
}

inline u32 RoundUpEven(u32 size) {
    return (size + 1) & ~1u;
}
// Bytes a key of this length takes in a node: length field and key, padded to even.
inline u32 PaddedKeySize(u32 keyLength) {
    return (keyLength + 3) & ~1u;
}

// Before each write: a paranoid build stops when the block was not marked modified, as a change
// nobody hands over would be lost.
inline void TrapIfClean([[maybe_unused]] const HfsBcbBuf* block) {
#ifdef TREEHFS_PARANOID
    if (!block->dirty) {
        __builtin_trap();
    }
#endif
}

// The same of all blocks that the `size` bytes from `offset` on lie in.
inline void TrapIfAnyClean([[maybe_unused]] const HfsBcbBuf* blocks,
                           [[maybe_unused]] u32 blockShift, [[maybe_unused]] u32 offset,
                           [[maybe_unused]] u32 size) {
#ifdef TREEHFS_PARANOID
    for (u32 at = offset; at < offset + size; at = ((at >> blockShift) + 1) << blockShift) {
        TrapIfClean(&blocks[at >> blockShift]);
    }
#endif
}

class NodeBytes {
public:
    NodeBytes(const BTHeaderMem* hdr, const HfsNode* node)
        : bufs_(node->bufs),
          blockMask_(hdr->blockMask),
          blockShift_(hdr->blockShift),
          blocks_(hdr->blocksPerNode) {}

    // Bytes the node's blocks hold; the node size wherever the geometry is sound.
    u64 Limit() const { return static_cast<u64>(blocks_) << blockShift_; }
    bool Contains(u32 offset, u32 size) const { return static_cast<u64>(offset) + size <= Limit(); }

    // Address of one byte, null past the node's blocks; and bytes from there to its block's end.
    u8* At(u32 offset) const {
        const u32 block = offset >> blockShift_;
        return block < blocks_ ? bufs_[block].data + (offset & blockMask_) : nullptr;
    }
    u32 Room(u32 offset) const { return blockMask_ + 1 - (offset & blockMask_); }
    // Whether the block that holds this byte was marked modified.
    bool IsDirty(u32 offset) const {
        const u32 block = offset >> blockShift_;
        return block < blocks_ && bufs_[block].dirty;
    }

    u16 U16(u32 offset) const {
        if (InOneBlock(offset, 2)) {
            return GetBe16(At(offset));
        }
        u8 bytes[2] = {};
        CopyOut(bytes, offset, 2);
        return GetBe16(bytes);
    }
    u32 U32(u32 offset) const {
        if (InOneBlock(offset, 4)) {
            return GetBe32(At(offset));
        }
        u8 bytes[4] = {};
        CopyOut(bytes, offset, 4);
        return GetBe32(bytes);
    }
    u8 U8(u32 offset) const {
        const u8* byte = At(offset);
        return byte != nullptr ? *byte : u8{0};
    }

    // REQUIRES of all writers: the blocks written were marked with SetDirty.
    void SetU8(u32 offset, u32 value) const;
    void SetU16(u32 offset, u32 value) const {
        u8 bytes[2];
        PutBe16(bytes, value);
        CopyIn(offset, bytes, 2);
    }
    void SetU32(u32 offset, u32 value) const {
        u8 bytes[4];
        PutBe32(bytes, value);
        CopyIn(offset, bytes, 4);
    }
    void CopyOut(void* target, u32 offset, u32 size) const;
    void CopyIn(u32 offset, const void* source, u32 size) const {
        if (InOneBlock(offset, size)) {
            std::memmove(WriteAt(offset), source, size);
        } else {
            CopyInPieces(offset, source, size);
        }
    }
    void Fill(u32 offset, u8 value, u32 size) const;
    void Move(u32 target, u32 source, u32 size) const {  // overlap allowed
        if (InOneBlock(source, size) && InOneBlock(target, size)) {
            std::memmove(WriteAt(target), At(source), size);
        } else {
            MovePieces(target, source, size);
        }
    }

private:
    friend void CopyBetween(NodeBytes target, u32 targetOffset, NodeBytes source, u32 sourceOffset,
                            u32 size);

    bool InOneBlock(u32 offset, u32 size) const {
        return __builtin_expect((offset >> blockShift_) < blocks_ && size <= Room(offset), true);
    }
    u8* WriteAt(u32 offset) const {
        TrapIfClean(&bufs_[offset >> blockShift_]);
        return bufs_[offset >> blockShift_].data + (offset & blockMask_);
    }
    void CopyInPieces(u32 offset, const void* source, u32 size) const;
    void MovePieces(u32 target, u32 source, u32 size) const;

    const HfsBcbBuf* bufs_;
    u32 blockMask_;
    u32 blockShift_;
    u32 blocks_;
};

// The bytes of a node that lies in one piece, without asking for each offset where that is. The net
// is the same.
class PlainBytes {
public:
    // REQUIRES: IsOnePiece.
    PlainBytes(const BTHeaderMem* hdr, const HfsNode* node)
        : bufs_(node->bufs),
          data_(node->bufs[0].data),
          size_(hdr->nodeSize),
          blockShift_(hdr->blockShift) {}

    u32 Size() const { return size_; }
    u8* At(u32 offset) const { return data_ + offset; }

    // REQUIRES of all writers: the blocks written were marked with SetDirty.
    void CopyIn(u32 offset, const void* source, u32 size) const {
        if (Contains(offset, size)) {
            std::memmove(WriteAt(offset, size), source, size);
        }
    }
    void Fill(u32 offset, u8 value, u32 size) const {
        if (Contains(offset, size)) {
            std::memset(WriteAt(offset, size), value, size);
        }
    }
    void Move(u32 target, u32 source, u32 size) const {  // overlap allowed
        if (Contains(target, size) && Contains(source, size)) {
            std::memmove(WriteAt(target, size), At(source), size);
        }
    }

private:
    bool Contains(u32 offset, u32 size) const {
        return __builtin_expect(static_cast<u64>(offset) + size <= size_, true);
    }
    u8* WriteAt(u32 offset, u32 size) const {
        TrapIfAnyClean(bufs_, blockShift_, offset, size);
        return data_ + offset;
    }

    const HfsBcbBuf* bufs_;
    u8* data_;
    u32 size_;
    u32 blockShift_;
};

// Copies between two nodes; they must not be the same one.
void CopyBetween(NodeBytes target, u32 targetOffset, NodeBytes source, u32 sourceOffset, u32 size);

}  // namespace VELK
