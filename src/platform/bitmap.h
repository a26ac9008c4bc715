// Bitmaps in big-endian bit order: bit n is 0x80 >> (n mod 8) of byte n / 8.
#pragma once

#include "platform/types.h"

namespace VELK {

// Number of the first clear bit in bits first .. count - 1 of `bits`; `count` or more when all are
// set. Reads no byte past the one that holds bit count - 1.
unsigned long GetFreeBitPosBe(const unsigned char* bits, unsigned long first, unsigned long count);

// The allocation bitmap of a volume over bytes that the volume owns. Counts its clear bits as they
// change. Set = used.
class CWndBitmap {
public:
    // Works on `bits` (big-endian bit order, at least ceil(count / 8) bytes) until the next Attach.
    void Attach(u8* bits, u32 count);

    u32 Size() const { return count_; }      // bits
    u32 GetZeros() const { return zeros_; }  // clear bits; counted, not searched
    bool IsSet(u32 bit) const;               // bits at or past Size() read as set

    // Sets or clears [first, first + count) and returns how many bits really changed.
    // REQUIRES: first + count <= Size().
    u32 SetRun(u32 first, u32 count);
    u32 ClearRun(u32 first, u32 count);

    // Finds the first run of clear bits at or after `from`, at most `wanted` long. False: none.
    bool FindZeros(u32 from, u32 wanted, u32* first, u32* count) const;

private:
    u8* bits_ = nullptr;
    u32 count_ = 0;
    u32 zeros_ = 0;
};

}  // namespace VELK
