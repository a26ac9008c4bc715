// The service tables of a volume in memory. Every block the engine borrows is a copy; what it does
// not hand over with DirtyMeta is gone when it gives the block back.
#include "ram_volume.h"

#include <cstring>

#include "platform/error.h"
#include "platform/heap.h"

using namespace VELK;

namespace {

constexpr int kNoSuchRange = 0x101;  // a status of this volume's own; the engine passes it on
constexpr int kFull = 0x102;

// Where a tree file lies: the extents, catalog and attributes files one after the other.
u8* FileStart(u8* disk, u32 fileId) {
    const u32 place = fileId == kExtentsFileId ? 0 : fileId == kCatalogFileId ? 1 : 2;
    return disk + u64{place} * RamVolume::kMaxFile;
}

}  // namespace

// A borrowed block. The engine knows the name only.
struct VELK::buffer_head {
    u8* home;  // its place on the "disk"
    alignas(8) u8 bytes[RamVolume::kBlock];
};

const HfsVolumeOps RamVolume::kVolumeOps = {Map, DirtyMeta, Zero, Resize};
const HfsCacheOps RamVolume::kCacheOps = {Release, Modify, Modify};

RamVolume::RamVolume() : disk_(static_cast<u8*>(velk_heap_alloc(3 * kMaxFile))), bitmapBytes_{} {
    fs.service = {&kVolumeOps, this};
    fs.cache = {&kCacheOps, this};
    fs.mapBlockSize = kBlock;
    fs.mapBlockShift = 9;
    fs.allocBlockSize = kBlock;
    fs.allocBlockShift = 9;
    fs.totalBlocks = sizeof bitmapBytes_ * 8;
    fs.volumeSize = u64{fs.totalBlocks} * kBlock;
    fs.defaultClumpSize = 8 * kBlock;
    bitmap_.Attach(bitmapBytes_, fs.totalBlocks);
    fs.bitmap = &bitmap_;
}

RamVolume::~RamVolume() {
    velk_heap_free(disk_);
}

int RamVolume::Map(void* self, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32 fileId,
                   u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs) {
    auto* volume = static_cast<RamVolume*>(self);
    const HfsFork* fork = fs->ForkOf(fileId);
    if (volume->disk_ == nullptr || byteOffset + bytes > fork->logicalSize) {
        return kNoSuchRange;
    }
    for (u32 i = 0; i < bytes / kBlock; ++i) {
        auto* bh = static_cast<buffer_head*>(velk_heap_alloc(sizeof(buffer_head)));
        if (bh == nullptr) {  // all or nothing
            while (i > 0) {
                Release(self, bufs[--i].bh, 0);
                bufs[i].bh = nullptr;
                bufs[i].data = nullptr;
            }
            return kErrNoMemory;
        }
        bh->home = FileStart(volume->disk_, fileId) + byteOffset + u64{i} * kBlock;
        if (!noRead) {
            std::memcpy(bh->bytes, bh->home, kBlock);
        }
        bufs[i].bh = bh;
        bufs[i].data = bh->bytes;
        volume->lentBlocks += 1;
    }
    return kOk;
}

int RamVolume::DirtyMeta(void*, CFileSystemHfs*, buffer_head* bh) {
    std::memcpy(bh->home, bh->bytes, kBlock);
    return kOk;
}

int RamVolume::Zero(void* self, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32 fileId,
                    u64 byteOffset, u64 bytes) {
    if (byteOffset + bytes > fs->ForkOf(fileId)->logicalSize) {
        return kNoSuchRange;
    }
    std::memset(FileStart(static_cast<RamVolume*>(self)->disk_, fileId) + byteOffset, 0, bytes);
    return kOk;
}

int RamVolume::Resize(void*, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32 fileId, u64 newSize) {
    if (newSize > kMaxFile) {
        return kFull;
    }
    HfsFork* fork = fs->ForkOf(fileId);
    fork->logicalSize = newSize;
    fork->totalBlocks = static_cast<u32>((newSize + kBlock - 1) / kBlock);
    return kOk;
}

void RamVolume::Release(void* self, buffer_head* bh, int) {
    if (bh != nullptr) {
        static_cast<RamVolume*>(self)->lentBlocks -= 1;
        velk_heap_free(bh);
    }
}

void RamVolume::Modify(void*, buffer_head*) {}
