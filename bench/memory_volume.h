// A volume in memory made to cost next to nothing: blocks are lent in place, taking over a changed
// block is free, the file grows by chunks that never move. So a measurement shows the engine.
#pragma once

#include <cstdlib>
#include <vector>

#include "hfs/fshfs.h"

namespace VELK::bench {

class MemoryVolume {
public:
    // Blocks of 2^mapShift bytes; at most 2^15.
    explicit MemoryVolume(u32 mapShift);
    ~MemoryVolume();
    MemoryVolume(const MemoryVolume&) = delete;
    MemoryVolume& operator=(const MemoryVolume&) = delete;

    // Takes and touches memory for a file of `bytes` now, so that what the system needs to supply
    // it is not measured later. False: there is none.
    bool Supply(u64 bytes);
    u64 BytesHeld() const { return u64{chunks_.size()} << kChunkShift; }

    CFileSystemHfs fs;

private:
    static constexpr u32 kChunkShift = 21;  // a huge page

    static int Map(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                   u32 fileId, u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs);
    static int DirtyMeta(void* self, CFileSystemHfs* fs, buffer_head* bh);
    static int Zero(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                    u32 fileId, u64 byteOffset, u64 bytes);
    static int Resize(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                      u32 fileId, u64 newSize);
    static void Release(void* self, buffer_head* bh, int flag);
    static void Modify(void* self, buffer_head* bh);

    u8* At(u64 offset) {
        return chunks_[offset >> kChunkShift] + (offset & ((1u << kChunkShift) - 1));
    }

    static const HfsVolumeOps kVolumeOps;
    static const HfsCacheOps kCacheOps;

    std::vector<u8*> chunks_;
    std::vector<u8> bitmapBytes_;
    CWndBitmap bitmap_;
};

}  // namespace VELK::bench
