// What the journal of a volume holds, looked at without carrying anything out.
#pragma once

#include "hfs/volume/block_device.h"
#include "hfs/volume/image_volume.h"
#include "hfs/volume/journal_format.h"

namespace VELK {

// Where a journal lies, in bytes of its volume, and what its header says.
struct JournalPlace {
    u64 infoOffset = 0;
    u64 offset = 0;
    u64 size = 0;
    bool isSound = false;    // the stretch is the journal's own, whatever its header holds
    bool needsInit = false;  // announced, never written
    JournalHeader header;    // when the state is readable

    // Whether [at, at + bytes) of the volume touches the journal. REQUIRES: no overflow.
    bool Touches(u64 at, u64 bytes) const { return at < offset + size && offset < at + bytes; }
};

// `volume` starts at volume byte 0, which is byte `imageOffset` of the image.
JournalState ReadJournalState(BlockDevice* volume, const VolumeHeader& header, u64 imageOffset,
                              JournalPlace* place);

// Reads and writes bytes of the ring of a journal; what runs over its end goes on at its start.
// REQUIRES: bytes is at most the capacity.
IoResult ReadRing(BlockDevice* volume, const JournalPlace& place, u64 position, void* target,
                  u64 bytes);
IoResult WriteRing(BlockDevice* volume, const JournalPlace& place, u64 position, const void* source,
                   u64 bytes);
// Puts place.header into the first sector of the journal; one sector, so it happens or not.
IoResult WriteJournalHeader(BlockDevice* volume, const JournalPlace& place);

}  // namespace VELK
