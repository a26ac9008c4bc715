// Records in bytes that no offset table speaks for: gaps of nodes, freed nodes, the journal. A
// record is believed only when its key and its data fit each other and the tree to the byte.
#pragma once

#include <functional>

#include "platform/types.h"

namespace VELK::tool {

struct CarvedRecord {
    const u8* key = nullptr;
    u32 keySize = 0;  // length field included
    const u8* data = nullptr;
    u32 dataSize = 0;

    // Bytes from the key's first to the data's last, padding included.
    u32 Size() const { return static_cast<u32>(data - key) + dataSize; }
};

// Whether a record of tree `fileId` begins at `bytes`, of which `room` may be read.
bool CarveRecord(u32 fileId, const u8* bytes, u32 room, CarvedRecord* record);

// Calls `visit` for each record in [from, to) of `bytes`, at even positions, with its position.
void CarveAll(u32 fileId, const u8* bytes, u32 from, u32 to,
              const std::function<void(u32 at, const CarvedRecord&)>& visit);

// Whether `bytes` are a leaf of `nodeSize` bytes: its descriptor and its offset table hold.
bool IsLeafImage(const u8* bytes, u32 nodeSize);
// Where a node's gap begins; REQUIRES IsLeafImage or a node that the engine has accepted.
u32 GapStart(const u8* bytes, u32 nodeSize);
u32 TableStart(const u8* bytes, u32 nodeSize);

}  // namespace VELK::tool
