// Service tables over staged blocks, and the log. The file: log, a block with the size of the tree
// file, the tree file.
#include "safe_volume.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstring>

#include "platform/heap.h"

using namespace VELK;

namespace {

constexpr int kIo = 0x101;  // statuses of this volume's own; the engine passes them on
constexpr int kFull = 0x102;
constexpr u32 kMagic = 0x53564C31;
constexpr u32 kSizeBlock = SafeVolume::kLogBlocks;
constexpr u32 kTreeBlock = kSizeBlock + 1;

// Begins the log; the numbers of the blocks follow, then the blocks. The checksum covers all of it,
// so a log that the power cut in the middle does not count.
struct LogHead {
    u32 magic;
    u32 count;
    u64 checksum;
};

u64 Checksum(const std::vector<u8>& bytes) {
    u64 sum = 0xCBF29CE484222325;
    for (std::size_t i = sizeof(LogHead); i < bytes.size(); ++i) {
        sum = (sum ^ bytes[i]) * 0x100000001B3;
    }
    return sum;
}

u32 BlocksFor(u64 bytes) {
    return static_cast<u32>((bytes + SafeVolume::kBlock - 1) / SafeVolume::kBlock);
}

}  // namespace

// A borrowed block.
struct VELK::buffer_head {
    u32 number;
    alignas(8) u8 bytes[SafeVolume::kBlock];
};

const HfsVolumeOps SafeVolume::kVolumeOps = {Map, DirtyMeta, Zero, Resize};
const HfsCacheOps SafeVolume::kCacheOps = {Release, Modify, Modify};

SafeVolume::SafeVolume(const std::string& path, long writes) : writes_(writes) {
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

    file_ = open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0666);
    const off_t size = off_t{kBlock} * kTreeBlock + kMaxFile;
    Blocks logged;
    Block first{};
    if (file_ < 0 || ftruncate(file_, size) != 0 ||
        (ReadLog(&logged) && !(WriteHome(logged) && Sync())) ||
        !Read(kSizeBlock, first.data(), 1)) {
        file_ = -1;
        return;
    }
    std::memcpy(&committedSize_, first.data(), sizeof committedSize_);
    SetSize(committedSize_);
}

SafeVolume::~SafeVolume() {
    close(file_);
}

int SafeVolume::Commit(CBTreeHfs* tree) {
    int status = tree->Flush(0);
    if (status == kOk) {
        std::memcpy(staged_[kSizeBlock].data(), &fs.attributesFork.logicalSize, sizeof(u64));
        // The first sync makes the commit stand. The second must come before the log is used
        // again: a block that has not reached its place is nowhere else.
        const bool done = WriteLog(staged_) && Sync() && WriteHome(staged_) && Sync();
        status = done ? kOk : kIo;
    }
    if (status != kOk) {
        Abort(tree);
        return status;
    }
    staged_.clear();
    committedSize_ = fs.attributesFork.logicalSize;
    return kOk;
}

void SafeVolume::Abort(CBTreeHfs* tree) {
    staged_.clear();
    SetSize(committedSize_);
    tree->RestoreModifiedNodes();
}

void SafeVolume::SetSize(u64 bytes) {
    fs.attributesFork.logicalSize = bytes;
    fs.attributesFork.totalBlocks = BlocksFor(bytes);
}

bool SafeVolume::Read(u32 block, void* target, unsigned blocks) {
    const off_t at = off_t{kBlock} * block;
    return pread(file_, target, blocks * kBlock, at) == ssize_t{kBlock} * blocks;
}

bool SafeVolume::Write(u32 block, const void* source, unsigned blocks) {
    if (writes_-- == 0) {
        _exit(99);  // the power goes off
    }
    const off_t at = off_t{kBlock} * block;
    hasFailed_ =
        hasFailed_ || pwrite(file_, source, blocks * kBlock, at) != ssize_t{kBlock} * blocks;
    return !hasFailed_;
}

bool SafeVolume::Sync() {
    hasFailed_ = hasFailed_ || fdatasync(file_) != 0;
    return !hasFailed_;
}

bool SafeVolume::WriteLog(const Blocks& blocks) {
    std::vector<u8> log(sizeof(LogHead));
    for (const auto& [number, block] : blocks) {
        const u8* bytes = reinterpret_cast<const u8*>(&number);
        log.insert(log.end(), bytes, bytes + sizeof number);
    }
    for (const auto& [number, block] : blocks) {
        log.insert(log.end(), block.begin(), block.end());
    }
    const LogHead head = {kMagic, static_cast<u32>(blocks.size()), Checksum(log)};
    std::memcpy(log.data(), &head, sizeof head);
    log.resize(u64{BlocksFor(log.size())} * kBlock);
    // Too much for the log is refused before anything is written.
    return log.size() <= kLogBlocks * kBlock && Write(0, log.data(), BlocksFor(log.size()));
}

// False: the log holds nothing that counts.
bool SafeVolume::ReadLog(Blocks* blocks) {
    std::vector<u8> log(kLogBlocks * kBlock);
    LogHead head;
    if (!Read(0, log.data(), kLogBlocks)) {
        return false;
    }
    std::memcpy(&head, log.data(), sizeof head);
    const u64 size = sizeof head + u64{head.count} * (sizeof(u32) + kBlock);
    if (head.magic != kMagic || size > log.size()) {
        return false;
    }
    log.resize(size);
    if (head.checksum != Checksum(log)) {
        return false;
    }
    for (u32 i = 0; i < head.count; ++i) {
        u32 number;
        std::memcpy(&number, &log[sizeof head + i * sizeof number], sizeof number);
        std::memcpy((*blocks)[number].data(),
                    &log[sizeof head + head.count * sizeof number + u64{i} * kBlock], kBlock);
    }
    return true;
}

bool SafeVolume::WriteHome(const Blocks& blocks) {
    for (const auto& [number, block] : blocks) {
        if (!Write(number, block.data(), 1)) {
            return false;
        }
    }
    return true;
}

int SafeVolume::Map(void* self, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32 fileId,
                    u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs) {
    auto* volume = static_cast<SafeVolume*>(self);
    if (byteOffset + bytes > fs->ForkOf(fileId)->logicalSize) {
        return kFull;
    }
    for (u32 i = 0; i < bytes / kBlock; ++i) {
        auto* bh = static_cast<buffer_head*>(velk_heap_alloc(sizeof(buffer_head)));
        if (bh != nullptr) {
            bh->number = kTreeBlock + static_cast<u32>(byteOffset / kBlock) + i;
            const auto staged = volume->staged_.find(bh->number);
            volume->lentBlocks += 1;
            bufs[i] = {bh, bh->bytes, bufs[i].dirty};
            if (staged != volume->staged_.end()) {
                std::memcpy(bh->bytes, staged->second.data(), kBlock);
                continue;
            }
            if (noRead || volume->Read(bh->number, bh->bytes, 1)) {
                continue;
            }
        }
        for (u32 k = bh != nullptr ? i + 1 : i; k > 0; --k) {  // all or nothing
            Release(self, bufs[k - 1].bh, 0);
            bufs[k - 1] = {nullptr, nullptr, bufs[k - 1].dirty};
        }
        return bh != nullptr ? kIo : kErrNoMemory;
    }
    return kOk;
}

int SafeVolume::DirtyMeta(void* self, CFileSystemHfs*, buffer_head* bh) {
    std::memcpy(static_cast<SafeVolume*>(self)->staged_[bh->number].data(), bh->bytes, kBlock);
    return kOk;
}

int SafeVolume::Zero(void* self, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32 fileId,
                     u64 byteOffset, u64 bytes) {
    if (byteOffset + bytes > fs->ForkOf(fileId)->logicalSize) {
        return kFull;
    }
    for (u64 at = byteOffset; at < byteOffset + bytes; at += kBlock) {
        static_cast<SafeVolume*>(self)->staged_[kTreeBlock + static_cast<u32>(at / kBlock)] =
            Block{};
    }
    return kOk;
}

int SafeVolume::Resize(void* self, CFileSystemHfs*, HfsRuns*, HfsFork*, u8, u32, u64 newSize) {
    if (newSize > kMaxFile) {
        return kFull;
    }
    static_cast<SafeVolume*>(self)->SetSize(newSize);
    return kOk;
}

void SafeVolume::Release(void* self, buffer_head* bh, int) {
    if (bh != nullptr) {
        static_cast<SafeVolume*>(self)->lentBlocks -= 1;
        velk_heap_free(bh);
    }
}
