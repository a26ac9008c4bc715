// Piecewise access to node bytes. See bytes.h.
#include "hfs/treehfs/bytes.h"

namespace VELK {

namespace {

inline u32 Least(u32 a, u32 b) {
    return a < b ? a : b;
}

}  // namespace

void NodeBytes::SetU8(u32 offset, u32 value) const {
    const u8 byte = static_cast<u8>(value);
    CopyIn(offset, &byte, 1);
}

void NodeBytes::CopyOut(void* target, u32 offset, u32 size) const {
    if (!Contains(offset, size)) {
        return;
    }
    u8* out = static_cast<u8*>(target);
    while (size > 0) {
        const u32 piece = Least(size, Room(offset));
        std::memmove(out, At(offset), piece);
        out += piece;
        offset += piece;
        size -= piece;
    }
}

void NodeBytes::CopyInPieces(u32 offset, const void* source, u32 size) const {
    if (!Contains(offset, size)) {
        return;
    }
    const u8* in = static_cast<const u8*>(source);
    while (size > 0) {
        const u32 piece = Least(size, Room(offset));
        std::memmove(WriteAt(offset), in, piece);
        in += piece;
        offset += piece;
        size -= piece;
    }
}

void NodeBytes::Fill(u32 offset, u8 value, u32 size) const {
    if (!Contains(offset, size)) {
        return;
    }
    while (size > 0) {
        const u32 piece = Least(size, Room(offset));
        std::memset(WriteAt(offset), value, piece);
        offset += piece;
        size -= piece;
    }
}

// Upward moves step backward from the end and downward moves forward, so that no byte is
// overwritten before it was read.
void NodeBytes::MovePieces(u32 target, u32 source, u32 size) const {
    if (!Contains(target, size) || !Contains(source, size)) {
        return;
    }
    if (target < source) {
        while (size > 0) {
            const u32 piece = Least(size, Least(Room(source), Room(target)));
            std::memmove(WriteAt(target), At(source), piece);
            target += piece;
            source += piece;
            size -= piece;
        }
        return;
    }
    u32 targetEnd = target + size;
    u32 sourceEnd = source + size;
    while (size > 0) {
        const u32 sourcePart = ((sourceEnd - 1) & blockMask_) + 1;
        const u32 targetPart = ((targetEnd - 1) & blockMask_) + 1;
        const u32 piece = Least(size, Least(sourcePart, targetPart));
        targetEnd -= piece;
        sourceEnd -= piece;
        size -= piece;
        std::memmove(WriteAt(targetEnd), At(sourceEnd), piece);
    }
}

void CopyBetween(NodeBytes target, u32 targetOffset, NodeBytes source, u32 sourceOffset, u32 size) {
    if (!target.Contains(targetOffset, size) || !source.Contains(sourceOffset, size)) {
        return;
    }
    while (size > 0) {
        const u32 piece = Least(size, source.Room(sourceOffset));
        target.CopyIn(targetOffset, source.At(sourceOffset), piece);
        targetOffset += piece;
        sourceOffset += piece;
        size -= piece;
    }
}

}  // namespace VELK
