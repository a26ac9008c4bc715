// Byte strings in the order of the disk, for images that tests build without the engine.
#pragma once

#include <vector>

#include "platform/types.h"

namespace VELK::test {

using Bytes = std::vector<u8>;

inline void Put16(Bytes* bytes, std::size_t offset, u32 value) {
    bytes->at(offset) = static_cast<u8>(value >> 8);
    bytes->at(offset + 1) = static_cast<u8>(value);
}
inline void Put32(Bytes* bytes, std::size_t offset, u32 value) {
    Put16(bytes, offset, value >> 16);
    Put16(bytes, offset + 2, value);
}
inline u32 Get16(const Bytes& bytes, std::size_t offset) {
    return static_cast<u32>(bytes.at(offset) << 8) | bytes.at(offset + 1);
}
inline u32 Get32(const Bytes& bytes, std::size_t offset) {
    return (Get16(bytes, offset) << 16) | Get16(bytes, offset + 2);
}
inline void Append16(Bytes* bytes, u32 value) {
    bytes->push_back(static_cast<u8>(value >> 8));
    bytes->push_back(static_cast<u8>(value));
}
inline void Append32(Bytes* bytes, u32 value) {
    Append16(bytes, value >> 16);
    Append16(bytes, value);
}
inline void AppendBytes(Bytes* bytes, const Bytes& more) {
    bytes->insert(bytes->end(), more.begin(), more.end());
}

// `size` bytes that differ from their neighbours, so that a shifted copy shows.
inline Bytes Pattern(std::size_t size, u32 seed) {
    Bytes bytes(size);
    for (std::size_t i = 0; i < size; ++i) {
        bytes[i] = static_cast<u8>(seed * 31 + i * 7 + (i >> 8) + 1);
    }
    return bytes;
}

}  // namespace VELK::test
