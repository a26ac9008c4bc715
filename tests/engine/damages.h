// Single damages of a node of catalog records: bytes that searches and changes go by.
#pragma once

#include <ostream>
#include <vector>

#include "node_image.h"

namespace VELK::test {

struct Damage {
    u32 at;  // node offset
    u32 value;
    u32 width;  // bytes
};
inline std::ostream& operator<<(std::ostream& out, const Damage& damage) {
    return out << damage.value << " in " << damage.width << " bytes at " << damage.at;
}

// Kinds, counts, starts and key lengths that lead out of the ordinary, and some that do not.
inline std::vector<Damage> DamagesOf(const Bytes& content) {
    const u32 size = static_cast<u32>(content.size());
    const u32 count = Get16(content, kDescNumRecords);
    std::vector<Damage> damages;
    for (const u32 kind : {0xFFu, 0x00u, 0x01u, 0x02u, 0x03u}) {
        damages.push_back({kDescKind, kind, 1});
    }
    damages.push_back({kDescHeight, 5, 1});
    for (const u32 other : {0u, 1u, count - 1, count + 1, 504u, 505u, 510u, 511u, 512u, 0xFFFFu}) {
        damages.push_back({kDescNumRecords, other, 2});
    }
    const u32 free = Get16(content, size - 2 * (count + 1));
    for (u32 record = 0; record <= count; ++record) {
        const u32 slot = size - 2 * (record + 1);
        const u32 start = Get16(content, slot);
        for (const u32 other :
             {0u, 2u, 12u, 13u, 14u, start - 2, start - 1, start + 1, start + 2, start + 30, free,
              free + 2, slot, size - 100, size - 2, size, 0x8000u, 0xFFFEu}) {
            damages.push_back({slot, other & 0xFFFF, 2});
        }
        if (record < count) {
            const u32 length = Get16(content, start);
            for (const u32 other : {0u, 1u, 5u, 6u, length - 2, length - 1, length + 1, length + 2,
                                    length + 20, 516u, 520u, 521u, 0xFFFFu}) {
                damages.push_back({start, other & 0xFFFF, 2});
            }
            const u32 name = start + kCatKeyNameLength;
            for (const u32 other : {0u, 1u, Get16(content, name) + 1u, 256u, 0x8000u, 0xFFFFu}) {
                damages.push_back({name, other, 2});
            }
        }
    }
    return damages;
}

inline void Apply(const Damage& damage, Bytes* content) {
    if (damage.width == 1) {
        (*content)[damage.at] = static_cast<u8>(damage.value);
    } else {
        Put16(content, damage.at, damage.value);
    }
}

}  // namespace VELK::test
