// The volume as the engine sees it. An author of a volume fills in CFileSystemHfs and two or three
// small tables of functions; src/hfs/volume is one such volume, examples/ram_volume the smallest.
//
// Two units are both easily called "block": the MAP block (mapBlockSize) is the unit in which the
// volume hands tree bytes to the engine; the ALLOCATION block (allocBlockSize) is the unit of
// forks, clumps and the allocation bitmap. They need not be equal.
#pragma once

#include "hfs/format.h"
#include "platform/bitmap.h"
#include "platform/runmapper.h"
#include "platform/types.h"

namespace VELK {

class CFileSystemHfs;
struct buffer_head;  // the volume's handle of one buffered map block; opaque to the engine

using HfsRuns = CRunMapperT<unsigned int>;

// One map block of a node, as `Map` fills it. The engine borrows it until it calls Release.
struct HfsBcbBuf {
    buffer_head* bh;  // the volume's handle, given back with Release
    u8* data;         // mapBlockSize bytes, 8-byte aligned
    bool dirty;       // changed in memory and not handed over yet; kept by the engine
};

// A run of allocation blocks (HFS+ volume format, extent descriptor), in host order.
struct HfsExtent {
    u32 startBlock;  // first allocation block on the volume
    u32 blockCount;  // allocation blocks; 0: the descriptor is unused
};

// Fork record of the volume header (HFS+ volume format), in host order.
struct HfsFork {
    u64 logicalSize;  // bytes
    u32 clumpSize;    // growth step in bytes; 0 = the volume's default
    u32 totalBlocks;  // allocation blocks of all extents, those in the overflow tree included
    HfsExtent extents[kExtentCount];  // the first eight; further ones lie in the extents tree
};

// What the volume does for a tree file. `self` is the context of the table, `fs` the volume the
// call was made on: both are passed so that a shim can stand in front of any volume. Every entry
// returns a status and must not call into a tree of the same volume.
struct HfsVolumeOps {
    // Fills bufs[0 .. bytes / mapBlockSize) with `bh` and `data` for the tree file's bytes
    // [byteOffset, byteOffset + bytes); `dirty` is left alone. With `noRead` the old content is not
    // wanted: the caller overwrites all of it. All or nothing: on failure nothing is held and no
    // entry is filled. What lies at two offsets of the file is lent as two pieces of memory, also
    // when damaged extents give both the same block: a change to one node would not be announced
    // for the other. The blocks of one call may lie anywhere; one behind the other in memory, they
    // make a node that is searched and changed faster. The engine passes fork null and forkType 0:
    // the tree file itself.
    int (*Map)(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
               u32 fileId, u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs);
    // Takes over the present content of a modified block for writing. Bytes changed and never
    // handed over are gone when the block is released.
    int (*DirtyMeta)(void* self, CFileSystemHfs* fs, buffer_head* bh);
    // Zero-fills a byte range of the tree file on disk.
    int (*Zero)(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                u32 fileId, u64 byteOffset, u64 bytes);
    // Sets the size of the tree file's fork to `newSize` bytes, allocating or freeing allocation
    // blocks; updates the fork record and `runs`. On failure nothing has changed.
    int (*Resize)(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                  u32 fileId, u64 newSize);
};

// The buffer cache that lends map blocks.
struct HfsCacheOps {
    // Gives a block back; null is allowed. The engine passes flag 0.
    void (*Release)(void* self, buffer_head* bh, int flag);
    // Stand before and behind the zero-filling of a brand-new block.
    void (*BeginModify)(void* self, buffer_head* bh);
    void (*EndModify)(void* self, buffer_head* bh);
};

// The journal, where there is one. Both return a status; any but 0 stops the operation before the
// block has changed.
struct HfsJournalOps {
    int (*GetWriteAccess)(void* self, buffer_head* bh);   // before a block first changes
    int (*GetCreateAccess)(void* self, buffer_head* bh);  // before a brand-new block is zero-filled
};

// A table of functions with the context its entries get. Both stay the volume's.
template <typename Ops>
struct HfsService {
    const Ops* ops = nullptr;  // null: the service is not there
    void* self = nullptr;      // passed to each entry

    // Whether the service is there.
    explicit operator bool() const { return ops != nullptr; }
};

// The buffer cache as the engine holds it, one per volume.
struct HfsBufferCache {
    const HfsCacheOps* ops = nullptr;  // set before a tree is opened
    void* self = nullptr;              // passed to each entry

    // The calls of the table, with its context.
    void Release(buffer_head* bh, int flag) { ops->Release(self, bh, flag); }
    void BeginModify(buffer_head* bh) { ops->BeginModify(self, bh); }
    void EndModify(buffer_head* bh) { ops->EndModify(self, bh); }
};

// What the engine knows of a volume. The volume's author fills it in before the first tree is
// opened and keeps it, at one address, until the last one is gone. Numbers are in host order.
//
//     CFileSystemHfs fs;
//     fs.service = {&volumeOps, this};
//     fs.cache.ops = &cacheOps;
//     fs.mapBlockSize = 4096;
//     fs.mapBlockShift = 12;
//     fs.catalogFork = ...;
class CFileSystemHfs {
public:
    HfsService<HfsVolumeOps> service;   // must be there
    HfsBufferCache cache;               // must be there
    HfsService<HfsJournalOps> journal;  // empty: no journal

    u16 mapBlockSize = 0;           // bytes, a power of two from 512 on
    u8 mapBlockShift = 0;           // its log2
    u8 allocBlockShift = 0;         // log2 of allocBlockSize
    u32 allocBlockSize = 0;         // bytes, a power of two from 512 on
    u32 totalBlocks = 0;            // allocation blocks
    u64 volumeSize = 0;             // bytes
    u16 version = kVersionHfsPlus;  // or kVersionHfsx, as in the volume header
    u32 defaultClumpSize = 0;       // bytes, for forks whose record holds 0
    u32 nesting = 0;                // raised by one around every Resize
    CWndBitmap* bitmap = nullptr;   // allocation bitmap
    void* logHandle = nullptr;      // passed to velk_printk

    // Forks of the special files, as in the volume header. The engine reads sizes and clump sizes;
    // Resize brings them up to date.
    HfsFork extentsFork{};
    HfsFork catalogFork{};
    HfsFork allocationFork{};
    HfsFork startupFork{};
    HfsFork attributesFork{};

    // Room the bad-block loader works in: an extents key (with slack for any key the engine lets
    // through) and an extent record.
    alignas(8) u8 badBlockKey[kKeyLengthSize + kMaxKeyLength + 6] = {};
    alignas(8) u8 badBlockRecord[kExtentRecordSize] = {};

    // The fork record of a special file: 3 extents, 4 catalog, 6 allocation, 7 startup,
    // 8 attributes. Null for any other ID.
    HfsFork* ForkOf(u32 fileId);

    // The calls of HfsVolumeOps, on this volume.
    int Map(HfsRuns* runs, HfsFork* fork, u8 forkType, u32 fileId, u64 byteOffset, u32 bytes,
            bool noRead, HfsBcbBuf* bufs) {
        return service.ops->Map(service.self, this, runs, fork, forkType, fileId, byteOffset, bytes,
                                noRead, bufs);
    }
    int DirtyMeta(buffer_head* bh) { return service.ops->DirtyMeta(service.self, this, bh); }
    int Zero(HfsRuns* runs, HfsFork* fork, u8 forkType, u32 fileId, u64 byteOffset, u64 bytes) {
        return service.ops->Zero(service.self, this, runs, fork, forkType, fileId, byteOffset,
                                 bytes);
    }
    int Resize(HfsRuns* runs, HfsFork* fork, u8 forkType, u32 fileId, u64 newSize) {
        return service.ops->Resize(service.self, this, runs, fork, forkType, fileId, newSize);
    }
};

inline HfsFork* CFileSystemHfs::ForkOf(u32 fileId) {
    switch (fileId) {
        case kExtentsFileId:
            return &extentsFork;
        case kCatalogFileId:
            return &catalogFork;
        case kAllocationFileId:
            return &allocationFork;
        case kStartupFileId:
            return &startupFork;
        case kAttributesFileId:
            return &attributesFork;
        default:
            return nullptr;
    }
}

}  // namespace VELK
