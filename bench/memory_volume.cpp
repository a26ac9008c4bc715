// One catalog file in chunks of memory. See memory_volume.h.
#include "memory_volume.h"

#include <sys/mman.h>

#include <cstring>

#include "platform/error.h"

namespace VELK::bench {

namespace {

constexpr u64 kClumpSize = (u64{1} << 30) - 4096;  // below the size that has clumps of its own
constexpr u64 kMostBytes = u64{16} << 30;
constexpr int kNoRange = 0x101;

}  // namespace

const HfsVolumeOps MemoryVolume::kVolumeOps = {Map, DirtyMeta, Zero, Resize};
const HfsCacheOps MemoryVolume::kCacheOps = {Release, Modify, Modify};

MemoryVolume::MemoryVolume(u32 mapShift) {
    fs.service = {&kVolumeOps, this};
    fs.cache = {&kCacheOps, this};
    fs.mapBlockShift = static_cast<u8>(mapShift);
    fs.mapBlockSize = static_cast<u16>(1u << mapShift);
    fs.allocBlockShift = static_cast<u8>(mapShift);
    fs.allocBlockSize = 1u << mapShift;
    fs.volumeSize = kClumpSize;
    fs.totalBlocks = static_cast<u32>(kMostBytes >> mapShift);
    fs.defaultClumpSize = 1u << kChunkShift;
    bitmapBytes_.resize((fs.totalBlocks + 7) / 8);
    bitmap_.Attach(bitmapBytes_.data(), fs.totalBlocks);
    fs.bitmap = &bitmap_;
}

MemoryVolume::~MemoryVolume() {
    for (u8* chunk : chunks_) {
        std::free(chunk);
    }
}

int MemoryVolume::Map(void* self, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32, u64 byteOffset,
                      u32 bytes, bool, HfsBcbBuf* bufs) {
    if (byteOffset + bytes > fs->catalogFork.logicalSize) {
        return kNoRange;
    }
    auto* volume = static_cast<MemoryVolume*>(self);
    for (u32 i = 0; i < bytes >> fs->mapBlockShift; ++i) {
        bufs[i].data = volume->At(byteOffset + (u64{i} << fs->mapBlockShift));
        bufs[i].bh = reinterpret_cast<buffer_head*>(bufs[i].data);
    }
    return kOk;
}

int MemoryVolume::DirtyMeta(void*, CFileSystemHfs*, buffer_head*) {
    return kOk;
}

int MemoryVolume::Zero(void* self, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32, u64 byteOffset,
                       u64 bytes) {
    if (byteOffset + bytes > fs->catalogFork.logicalSize) {
        return kNoRange;
    }
    for (u64 at = byteOffset; at < byteOffset + bytes; at += fs->mapBlockSize) {
        std::memset(static_cast<MemoryVolume*>(self)->At(at), 0, fs->mapBlockSize);
    }
    return kOk;
}

bool MemoryVolume::Supply(u64 bytes) {
    constexpr std::size_t kChunkSize = std::size_t{1} << kChunkShift;
    while (BytesHeld() < bytes) {
        void* chunk = std::aligned_alloc(kChunkSize, kChunkSize);
        if (chunk == nullptr) {
            return false;
        }
        // Huge pages, as a volume with a large cache would use: otherwise every cold node costs a
        // walk of the page tables besides, and that is measured instead of the engine.
        madvise(chunk, kChunkSize, MADV_HUGEPAGE);
        std::memset(chunk, 0, kChunkSize);
        chunks_.push_back(static_cast<u8*>(chunk));
    }
    return true;
}

int MemoryVolume::Resize(void* self, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32, u64 newSize) {
    if (!static_cast<MemoryVolume*>(self)->Supply(newSize)) {
        return kErrNoSpace;
    }
    fs->catalogFork.logicalSize = newSize;
    fs->catalogFork.totalBlocks =
        static_cast<u32>((newSize + fs->allocBlockSize - 1) >> fs->allocBlockShift);
    return kOk;
}

void MemoryVolume::Release(void*, buffer_head*, int) {}

void MemoryVolume::Modify(void*, buffer_head*) {}

}  // namespace VELK::bench
