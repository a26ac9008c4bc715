// Big-endian loads of the checker, and the few 64-bit helpers its bounds are computed with.
#pragma once

#include "platform/types.h"

namespace VELK {

inline u32 Load16(const u8* bytes) {
    return (static_cast<u32>(bytes[0]) << 8) | static_cast<u32>(bytes[1]);
}

inline u32 Load32(const u8* bytes) {
    return (Load16(bytes) << 16) | Load16(bytes + 2);
}

inline u64 Load64(const u8* bytes) {
    return (static_cast<u64>(Load32(bytes)) << 32) | Load32(bytes + 4);
}

inline u64 CeilDivide(u64 value, u64 unit) {
    return value / unit + (value % unit != 0 ? 1 : 0);
}

inline bool IsPowerOfTwo(u64 value) {
    return value != 0 && (value & (value - 1)) == 0;
}

}  // namespace VELK
