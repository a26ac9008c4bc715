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

// Begins the log; entries follow. The checksum covers all of them, so a log that the power cut in
// the middle does not count.
struct LogHead {
    u32 magic;
    u32 count;
    u64 checksum;
};

// A block with its number in the file.
struct LogEntry {
    u32 number;
    std::array<u8, SafeVolume::kBlock> bytes;
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
        // When a write has failed, some blocks may be in their places and others not. What was
        // staged stays in front of them, so that what is read goes on agreeing with itself.
        if (!hasFailed_) {
            Abort(tree);
        }
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
        const LogEntry entry = {number, block};
        const u8* bytes = reinterpret_cast<const u8*>(&entry);
        log.insert(log.end(), bytes, bytes + sizeof entry);
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
    const u64 size = sizeof head + u64{head.count} * sizeof(LogEntry);
    if (head.magic != kMagic || size > log.size()) {
        return false;
    }
    log.resize(size);
    if (head.checksum != Checksum(log)) {
        return false;
    }
    for (u64 at = sizeof head; at < size; at += sizeof(LogEntry)) {
        LogEntry entry;
        std::memcpy(&entry, &log[at], sizeof entry);
        (*blocks)[entry.number] = entry.bytes;
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

// A block as the tree last handed it over, committed or not.
bool SafeVolume::Get(u32 block, u8* target) {
    const auto staged = staged_.find(block);
    if (staged == staged_.end()) {
        return Read(block, target, 1);
    }
    std::memcpy(target, staged->second.data(), kBlock);
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
        const u32 number = kTreeBlock + static_cast<u32>(byteOffset / kBlock) + i;
        const int status = bh == nullptr                              ? kErrNoMemory
                           : noRead || volume->Get(number, bh->bytes) ? kOk
                                                                      : kIo;
        if (status != kOk) {
            velk_heap_free(bh);
            while (i > 0) {  // all or nothing
                Release(self, bufs[--i].bh, 0);
                bufs[i] = {nullptr, nullptr, bufs[i].dirty};
            }
            return status;
        }
        bh->number = number;
        bufs[i] = {bh, bh->bytes, bufs[i].dirty};
        volume->lentBlocks += 1;
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
