// Key and record at a position, delivered to a caller's buffers in host form.
#pragma once

#include <cstring>

#include "hfs/treehfs.h"

namespace VELK {

// A record as far as delivery needs it.
struct RecordView {
    const BTreeKey* key;  // in one piece, fit to be compared or converted
    const u8* data;       // where its data begins
    u32 keySize;          // length field and key
    u32 dataSize;
    u32 dataOffset;      // node offset of `data`
    u32 dataFirstBytes;  // bytes of data up to the end of its block, or more
};

// Locates record `index`.
int FetchKey(CBTreeHfs* tree, const HfsNode* node, int index, RecordView* record);
// The same without its key.
int FetchData(const CBTreeHfs* tree, const HfsNode* node, int index, RecordView* record);

// The first `size` bytes of a record's data in one piece; null: no memory for that.
const u8* GatherData(CBTreeHfs* tree, const HfsNode* node, const RecordView& record, u32 size);

// Out of line: a compiler that knows how much room a caller offers copies in a way of its own,
// which takes longer to begin than most records take to copy.
void CopyData(void* target, const u8* source, u32 size);

// Converts the first `size` bytes of a record's data into `target`.
inline int DeliverData(CBTreeHfs* tree, const HfsNode* node, const RecordView& record, void* target,
                       u32 size) {
    const u8* source = record.data;
    if (size > record.dataFirstBytes) {
        source = GatherData(tree, node, record, size);
        if (source == nullptr) {
            return kErrNoMemory;
        }
    }
    if (tree->convert.DataToMemory != nullptr) {
        tree->convert.DataToMemory(target, source, size);
    } else {
        CopyData(target, source, size);
    }
    return kOk;
}

// Copies a key in steps of words, the last one over the end of the step before it. Keys are short:
// a compiler that knows so makes of memcpy an instruction that takes longer to begin than to copy.
inline void CopyKeyBytes(u8* target, const u8* source, u32 size) {
    constexpr u32 kStep = 16;
    u8 step[kStep];
    if (size < kStep) {
        std::memcpy(target, source, size);
        return;
    }
    for (u32 at = 0; at < size - kStep; at += kStep) {
        std::memcpy(step, source + at, kStep);
        std::memcpy(target + at, step, kStep);
    }
    std::memcpy(step, source + size - kStep, kStep);
    std::memcpy(target + size - kStep, step, kStep);
}

// Converts the first `size` bytes of a key into `target`.
inline void DeliverKey(const CBTreeHfs* tree, const BTreeKey* key, void* target, u32 size) {
    if (tree->convert.KeyToMemory != nullptr) {
        tree->convert.KeyToMemory(target, key, size);
    } else {
        CopyKeyBytes(static_cast<u8*>(target), reinterpret_cast<const u8*>(key), size);
    }
}

}  // namespace VELK
