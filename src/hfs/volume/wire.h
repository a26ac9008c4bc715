// Big- and little-endian numbers in byte arrays of the volume layer.
#pragma once

#include "platform/types.h"

namespace VELK {

inline u16 Be16(const u8* bytes) {
    return static_cast<u16>((bytes[0] << 8) | bytes[1]);
}
inline u32 Be32(const u8* bytes) {
    return (static_cast<u32>(Be16(bytes)) << 16) | Be16(bytes + 2);
}
inline u64 Be64(const u8* bytes) {
    return (static_cast<u64>(Be32(bytes)) << 32) | Be32(bytes + 4);
}
inline void StoreBe16(u8* bytes, u32 value) {
    bytes[0] = static_cast<u8>(value >> 8);
    bytes[1] = static_cast<u8>(value);
}
inline void StoreBe32(u8* bytes, u32 value) {
    StoreBe16(bytes, value >> 16);
    StoreBe16(bytes + 2, value);
}
inline void StoreBe64(u8* bytes, u64 value) {
    StoreBe32(bytes, static_cast<u32>(value >> 32));
    StoreBe32(bytes + 4, static_cast<u32>(value));
}
inline u32 Le32(const u8* bytes) {
    return bytes[0] | (static_cast<u32>(bytes[1]) << 8) | (static_cast<u32>(bytes[2]) << 16) |
           (static_cast<u32>(bytes[3]) << 24);
}
inline u64 Le64(const u8* bytes) {
    return Le32(bytes) | (static_cast<u64>(Le32(bytes + 4)) << 32);
}

inline bool IsPowerOfTwo(u64 value) {
    return value != 0 && (value & (value - 1)) == 0;
}
// REQUIRES: value is not 0. Number of the highest set bit.
inline u8 Log2(u64 value) {
    return static_cast<u8>(63 - __builtin_clzll(value));
}
inline u64 CeilDiv(u64 value, u64 unit) {
    return value / unit + (value % unit != 0 ? 1 : 0);
}
inline u64 RoundUp(u64 value, u64 unit) {
    return CeilDiv(value, unit) * unit;
}

}  // namespace VELK
