// Extents key of a data fork, in host order as callers of the tree pass it.
#pragma once

#include <cstring>

#include "hfs/format.h"

namespace VELK {

struct alignas(4) ExtentsKey {
    u8 bytes[kExtKeySize] = {};

    ExtentsKey(u32 fileId, u32 startBlock) {
        const u16 length = kExtKeyFixed;
        std::memcpy(bytes, &length, sizeof length);
        std::memcpy(bytes + kExtKeyFileId, &fileId, sizeof fileId);
        std::memcpy(bytes + kExtKeyStartBlock, &startBlock, sizeof startBlock);
    }
};

}  // namespace VELK
