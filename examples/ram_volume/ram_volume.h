// The smallest volume the engine can live on: tree files in memory, no journal, no allocation
// blocks to share out. A driver does the same with its own buffers and disk.
#pragma once

#include "hfs/fshfs.h"

class RamVolume {
public:
    static constexpr unsigned kBlock = 512;         // map block and allocation block, bytes
    static constexpr unsigned kMaxFile = 1u << 20;  // a tree file grows up to here, bytes

    RamVolume();
    ~RamVolume();
    RamVolume(const RamVolume&) = delete;
    RamVolume& operator=(const RamVolume&) = delete;

    VELK::CFileSystemHfs fs;
    unsigned lentBlocks = 0;  // blocks the engine borrows now

private:
    // The service tables call these with `self`, the RamVolume.
    static int Map(void* self, VELK::CFileSystemHfs* fs, VELK::HfsRuns* runs, VELK::HfsFork* fork,
                   VELK::u8 forkType, VELK::u32 fileId, VELK::u64 byteOffset, VELK::u32 bytes,
                   bool noRead, VELK::HfsBcbBuf* bufs);
    static int DirtyMeta(void* self, VELK::CFileSystemHfs* fs, VELK::buffer_head* bh);
    static int Zero(void* self, VELK::CFileSystemHfs* fs, VELK::HfsRuns* runs, VELK::HfsFork* fork,
                    VELK::u8 forkType, VELK::u32 fileId, VELK::u64 byteOffset, VELK::u64 bytes);
    static int Resize(void* self, VELK::CFileSystemHfs* fs, VELK::HfsRuns* runs,
                      VELK::HfsFork* fork, VELK::u8 forkType, VELK::u32 fileId, VELK::u64 newSize);
    static void Release(void* self, VELK::buffer_head* bh, int flag);
    static void Modify(void* self, VELK::buffer_head* bh);

    static const VELK::HfsVolumeOps kVolumeOps;
    static const VELK::HfsCacheOps kCacheOps;

    VELK::u8* disk_;            // kMaxFile bytes for each of the three trees
    VELK::u8 bitmapBytes_[64];  // an allocation bitmap for the reserve the engine asks about
    VELK::CWndBitmap bitmap_;
};
