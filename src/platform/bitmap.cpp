// Bit searches and counts over big-endian bitmaps. Whole words are read where eight whole bytes are
// left, single bytes otherwise: a bitmap may end at any byte of somebody's buffer.
#include "platform/bitmap.h"

#include <bit>
#include <cstring>

namespace VELK {

namespace {

constexpr unsigned kWordBits = 64;

// 64 bits with the lowest-numbered one on top.
u64 LoadWord(const unsigned char* bytes) {
    u64 word;
    std::memcpy(&word, bytes, sizeof word);
    if constexpr (std::endian::native == std::endian::little) {
        word = __builtin_bswap64(word);
    }
    return word;
}

// Skips whole groups of four words in which every bit is as `skip` says: in a long map that is in
// use nearly everything is skipped. `bit` and what comes back stand at the start of a byte.
unsigned long SkipEqual(const unsigned char* bits, unsigned long bit, unsigned long count,
                        bool skip) {
    constexpr unsigned kWords = 4;
    const u64 equal = skip ? ~u64{0} : 0;
    for (; count - bit >= kWords * kWordBits; bit += kWords * kWordBits) {
        u64 words[kWords];
        std::memcpy(words, bits + bit / 8, sizeof words);
        if (((words[0] ^ equal) | (words[1] ^ equal) | (words[2] ^ equal) | (words[3] ^ equal)) !=
            0) {
            break;
        }
    }
    return bit;
}

// First bit in first .. count - 1 that differs from `skip`, `count` when there is none.
unsigned long FindOther(const unsigned char* bits, unsigned long first, unsigned long count,
                        bool skip) {
    const u64 invert = skip ? ~u64{0} : 0;
    unsigned long bit = first;
    if (bit % 8 == 0 && bit < count) {
        bit = SkipEqual(bits, bit, count, skip);
    }
    while (bit < count) {
        unsigned long found;
        if (bit % 8 == 0 && count - bit >= kWordBits) {
            const u64 word = LoadWord(bits + bit / 8) ^ invert;
            found = bit + static_cast<unsigned long>(std::countl_zero(word));
            bit += kWordBits;
        } else {
            const unsigned inByte = bit % 8;
            const u8 byte = static_cast<u8>((bits[bit / 8] ^ invert) & (0xFFu >> inByte));
            bit -= inByte;
            found = bit + static_cast<unsigned long>(std::countl_zero(byte));
            bit += 8;
        }
        if (found < bit) {
            return found < count ? found : count;
        }
    }
    return count;
}

// The bits of one byte that lie in [first, end), as a mask; `base` is the byte's first bit.
u8 MaskOf(u64 base, u64 first, u64 end) {
    unsigned mask = 0xFF;
    if (first > base) {
        mask &= 0xFFu >> (first - base);
    }
    if (end < base + 8) {
        mask &= 0xFFu << (base + 8 - end);
    }
    return static_cast<u8>(mask);
}

// Ones of a word, counted in pairs, fours and bytes. std::popcount would call into the compiler's
// run-time library on processors without an instruction for it, and a driver may have none.
u32 OnesOf(u64 word) {
    word -= word >> 1 & 0x5555555555555555u;
    word = (word & 0x3333333333333333u) + (word >> 2 & 0x3333333333333333u);
    word = (word + (word >> 4)) & 0x0F0F0F0F0F0F0F0Fu;
    return static_cast<u32>(word * 0x0101010101010101u >> 56);
}

}  // namespace

unsigned long GetFreeBitPosBe(const unsigned char* bits, unsigned long first, unsigned long count) {
    return FindOther(bits, first, count, true);
}

void CWndBitmap::Attach(u8* bits, u32 count) {
    bits_ = bits;
    count_ = count;
    zeros_ = count;
    u64 bit = 0;
    for (; count - bit >= kWordBits; bit += kWordBits) {
        zeros_ -= OnesOf(LoadWord(bits + bit / 8));
    }
    for (; bit < count; bit += 8) {
        zeros_ -= OnesOf(static_cast<u8>(bits[bit / 8] & MaskOf(bit, bit, count)));
    }
}

bool CWndBitmap::IsSet(u32 bit) const {
    return bit >= count_ || (bits_[bit / 8] & (0x80u >> (bit % 8))) != 0;
}

u32 CWndBitmap::SetRun(u32 first, u32 count) {
    const u64 end = static_cast<u64>(first) + count;
    u32 changed = 0;
    for (u64 base = first & ~7u; base < end; base += 8) {
        const u8 mask = MaskOf(base, first, end);
        u8* byte = bits_ + base / 8;
        changed += OnesOf(static_cast<u8>(~*byte & mask));
        *byte = static_cast<u8>(*byte | mask);
    }
    zeros_ -= changed;
    return changed;
}

u32 CWndBitmap::ClearRun(u32 first, u32 count) {
    const u64 end = static_cast<u64>(first) + count;
    u32 changed = 0;
    for (u64 base = first & ~7u; base < end; base += 8) {
        const u8 mask = MaskOf(base, first, end);
        u8* byte = bits_ + base / 8;
        changed += OnesOf(static_cast<u8>(*byte & mask));
        *byte = static_cast<u8>(*byte & ~mask);
    }
    zeros_ += changed;
    return changed;
}

bool CWndBitmap::FindZeros(u32 from, u32 wanted, u32* first, u32* count) const {
    const unsigned long start = FindOther(bits_, from, count_, true);
    if (start >= count_ || wanted == 0) {
        return false;
    }
    const unsigned long room = count_ - start;
    const unsigned long limit = start + (wanted < room ? wanted : room);
    *first = static_cast<u32>(start);
    *count = static_cast<u32>(FindOther(bits_, start, limit, false) - start);
    return true;
}

}  // namespace VELK
