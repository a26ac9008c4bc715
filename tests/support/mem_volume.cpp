// See mem_volume.h.
#include "mem_volume.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <ostream>
#include <stdexcept>
#include <utility>

#include "keys.h"

namespace VELK::test {

namespace {

u8 Log2(u32 value) {
    u8 shift = 0;
    while ((1u << shift) < value) {
        ++shift;
    }
    return shift;
}

MemVolume* Self(void* self) {
    return static_cast<MemVolume*>(self);
}

}  // namespace

const HfsVolumeOps MemVolume::kVolumeOps = {OnMap, OnDirtyMeta, OnZero, OnResize};
const HfsCacheOps MemVolume::kCacheOps = {OnRelease, OnBeginModify, OnEndModify};
const HfsJournalOps MemVolume::kJournalOps = {OnWriteAccess, OnCreateAccess};

std::ostream& operator<<(std::ostream& out, const CallRecord& record) {
    static const char* const kNames[kCallKinds] = {"Map",       "DirtyMeta",   "Zero",
                                                   "Resize",    "Release",     "BeginModify",
                                                   "EndModify", "WriteAccess", "CreateAccess"};
    return out << kNames[static_cast<int>(record.call)] << '(' << record.offset << ", "
               << record.bytes << (record.noRead ? ", noRead)" : ")");
}

MemVolume::MemVolume(const MemVolumeOptions& wanted)
    : options(wanted), bitmapBytes_((wanted.totalBlocks + 7) / 8) {
    bitmap_.Attach(bitmapBytes_.data(), options.totalBlocks);
    fs.service.ops = &kVolumeOps;
    fs.service.self = this;
    fs.cache.ops = &kCacheOps;
    fs.cache.self = this;
    if (options.hasJournal) {
        fs.journal.ops = &kJournalOps;
        fs.journal.self = this;
    }
    fs.mapBlockSize = static_cast<u16>(options.mapBlockSize);
    fs.mapBlockShift = Log2(options.mapBlockSize);
    fs.allocBlockSize = options.allocBlockSize;
    fs.allocBlockShift = Log2(options.allocBlockSize);
    fs.totalBlocks = options.totalBlocks;
    fs.volumeSize = static_cast<u64>(options.totalBlocks) * options.allocBlockSize;
    fs.version = options.version;
    fs.defaultClumpSize = options.defaultClumpSize;
    fs.bitmap = &bitmap_;
    fs.logHandle = this;
}

MemVolume::~MemVolume() {
    EXPECT_EQ(lent_.size(), 0u) << "blocks were never released";
    for (const std::string& breach : breaches) {
        ADD_FAILURE() << breach;
    }
}

void MemVolume::LoadFile(u32 fileId, const Bytes& content) {
    HfsFork* fork = fs.ForkOf(fileId);
    Shrink(fork, 0);
    files_[fileId].clear();
    const u32 blocks =
        static_cast<u32>((content.size() + options.allocBlockSize - 1) / options.allocBlockSize);
    if (Grow(fork, blocks) != kOk) {
        throw std::length_error("the volume is too small for the file");
    }
    fork->logicalSize = static_cast<u64>(blocks) * options.allocBlockSize;
    Bytes& file = files_[fileId];
    file = content;
    file.resize(fork->logicalSize, options.stale);
}

void MemVolume::Damage(const HfsNode* node, u32 offset, u8 value) {
    const u32 at = offset % options.mapBlockSize;
    Block* block = lent_.at(node->bufs[offset / options.mapBlockSize].bh).get();
    block->data[at] = value;
    if (fs.journal) {
        block->clean[at] = value;
    }
}

Bytes MemVolume::DiskNode(u32 fileId, u32 nodeSize, u32 nodeNum) {
    const Bytes& file = files_[fileId];
    const u64 start = static_cast<u64>(nodeNum) * nodeSize;
    return Bytes(file.begin() + static_cast<std::ptrdiff_t>(start),
                 file.begin() + static_cast<std::ptrdiff_t>(start + nodeSize));
}

std::vector<CallRecord> MemVolume::TakeCalls() {
    return std::exchange(calls_, {});
}

MemVolume::Snapshot MemVolume::Save() {
    Snapshot snapshot;
    snapshot.files = files_;
    for (const u32 fileId : {kExtentsFileId, kCatalogFileId, kAttributesFileId}) {
        snapshot.forks[fileId] = *fs.ForkOf(fileId);
    }
    snapshot.bitmap = bitmapBytes_;
    return snapshot;
}

void MemVolume::Restore(const Snapshot& snapshot) {
    std::erase_if(files_, [&](const auto& file) { return !snapshot.files.contains(file.first); });
    for (const auto& [fileId, bytes] : snapshot.files) {
        // Mostly nothing changed, and copies are slow where sanitizers watch them.
        if (Bytes& file = files_[fileId]; file != bytes) {
            file = bytes;
        }
    }
    for (const auto& [fileId, fork] : snapshot.forks) {
        *fs.ForkOf(fileId) = fork;
    }
    std::copy(snapshot.bitmap.begin(), snapshot.bitmap.end(), bitmapBytes_.begin());
    bitmap_.Attach(bitmapBytes_.data(), options.totalBlocks);
}

void MemVolume::Note(Call call, u64 offset, u64 bytes, bool noRead) {
    counts_[static_cast<int>(call)] += 1;
    if (options.listsCalls) {
        calls_.push_back({call, offset, bytes, noRead});
    }
}

MemVolume::Block* MemVolume::Find(buffer_head* bh, const char* what) {
    const auto found = lent_.find(bh);
    if (found == lent_.end()) {
        breaches.push_back(std::string(what) + " of a block that is not lent");
        return nullptr;
    }
    return found->second.get();
}

// From here on a journal knows nothing of what becomes of the block.
void MemVolume::NoteClean(Block* block) {
    block->access = false;
    if (fs.journal) {
        block->clean.assign(block->data, block->data + options.mapBlockSize);
    }
}

// What a journal keeps of a block is what it holds when access is asked for.
void MemVolume::Grant(Block* block) {
    if (!block->access && !std::equal(block->clean.begin(), block->clean.end(), block->data)) {
        breaches.push_back("a block was changed before journal access");
    }
    block->access = true;
}

void MemVolume::CheckFork(const HfsFork* fork, u8 forkType) {
    if (fork != nullptr || forkType != 0) {
        breaches.push_back("a fork was passed where the tree file itself is meant");
    }
}

int MemVolume::OnMap(void* self, CFileSystemHfs* fs, HfsRuns* /*runs*/, HfsFork* fork, u8 forkType,
                     u32 fileId, u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs) {
    MemVolume* volume = Self(self);
    volume->Note(Call::kMap, byteOffset, bytes, noRead);
    volume->CheckFork(fork, forkType);
    const u32 blockSize = fs->mapBlockSize;
    if (bytes == 0 || bytes % blockSize != 0 || byteOffset % blockSize != 0) {
        return kMemUnaligned;
    }
    const Bytes& file = volume->files_[fileId];
    if (byteOffset > file.size() || bytes > file.size() - byteOffset) {
        return kMemNoRange;
    }
    const u32 misalign = volume->options.misalign;
    const u32 pieceSize = volume->options.inOnePiece ? bytes : blockSize;
    std::shared_ptr<u8[]> piece;
    for (u32 at = 0, b = 0; at < bytes; at += blockSize, ++b) {
        if (at % pieceSize == 0) {
            piece.reset(new u8[pieceSize + misalign]);
        }
        auto block = std::make_unique<Block>();
        block->memory = piece;
        block->data = piece.get() + misalign + at % pieceSize;
        block->fileId = fileId;
        block->offset = byteOffset + at;
        if (noRead) {
            std::memset(block->data, 0xA5, blockSize);
        } else {
            std::memcpy(block->data, file.data() + block->offset, blockSize);
        }
        buffer_head* bh = reinterpret_cast<buffer_head*>(block.get());
        bufs[b].bh = bh;
        bufs[b].data = block->data;
        volume->NoteClean(block.get());
        volume->lent_[bh] = std::move(block);
    }
    return kOk;
}

int MemVolume::OnDirtyMeta(void* self, CFileSystemHfs* fs, buffer_head* bh) {
    MemVolume* volume = Self(self);
    Block* block = volume->Find(bh, "DirtyMeta");
    volume->Note(Call::kDirtyMeta, block != nullptr ? block->offset : 0, 0, false);
    if (block == nullptr) {
        return kMemNoRange;
    }
    if (fs->journal && !block->access) {
        volume->breaches.push_back("a block was handed over without journal access");
    }
    Bytes& file = volume->files_[block->fileId];
    if (block->offset + fs->mapBlockSize > file.size()) {
        return kMemNoRange;
    }
    std::memcpy(file.data() + block->offset, block->data, fs->mapBlockSize);
    volume->NoteClean(block);
    return kOk;
}

int MemVolume::OnZero(void* self, CFileSystemHfs* /*fs*/, HfsRuns* /*runs*/, HfsFork* fork,
                      u8 forkType, u32 fileId, u64 byteOffset, u64 bytes) {
    MemVolume* volume = Self(self);
    volume->Note(Call::kZero, byteOffset, bytes, false);
    volume->CheckFork(fork, forkType);
    Bytes& file = volume->files_[fileId];
    if (byteOffset > file.size() || bytes > file.size() - byteOffset) {
        return kMemNoRange;
    }
    std::memset(file.data() + byteOffset, 0, bytes);
    return kOk;
}

int MemVolume::OnResize(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* /*fork*/,
                        u8 /*forkType*/, u32 fileId, u64 newSize) {
    MemVolume* volume = Self(self);
    volume->Note(Call::kResize, newSize, 0, false);
    if (fs->nesting != 1) {
        volume->breaches.push_back("Resize outside the nesting counter");
    }
    HfsFork* fork = fs->ForkOf(fileId);
    const u64 blocks = (newSize + fs->allocBlockSize - 1) >> fs->allocBlockShift;
    if (newSize > volume->options.maxFileSize || blocks > volume->options.totalBlocks) {
        return kMemNoSpace;
    }
    if (blocks > fork->totalBlocks) {
        const int status = volume->Grow(fork, static_cast<u32>(blocks));
        if (status != kOk) {
            return status;
        }
    } else {
        volume->Shrink(fork, static_cast<u32>(blocks));
    }
    fork->logicalSize = newSize;
    volume->files_[fileId].resize(newSize, volume->options.stale);
    volume->FillRuns(*fork, runs);
    return kOk;
}

// Extends the fork to `blocks` allocation blocks, each piece as long as it comes.
int MemVolume::Grow(HfsFork* fork, u32 blocks) {
    const HfsFork before = *fork;
    while (fork->totalBlocks < blocks) {
        u32 first = 0;
        u32 count = 0;
        u32 last = 0;
        while (last < kExtentCount && fork->extents[last].blockCount != 0) {
            ++last;
        }
        if (last == kExtentCount ||
            !bitmap_.FindZeros(0, blocks - fork->totalBlocks, &first, &count)) {
            Shrink(fork, before.totalBlocks);
            return kMemNoSpace;
        }
        bitmap_.SetRun(first, count);
        HfsExtent* before1 = last > 0 ? &fork->extents[last - 1] : nullptr;
        if (before1 != nullptr && before1->startBlock + before1->blockCount == first) {
            before1->blockCount += count;
        } else {
            fork->extents[last] = {first, count};
        }
        fork->totalBlocks += count;
    }
    return kOk;
}

void MemVolume::Shrink(HfsFork* fork, u32 blocks) {
    for (u32 i = kExtentCount; i-- > 0 && fork->totalBlocks > blocks;) {
        HfsExtent* extent = &fork->extents[i];
        const u32 count = std::min(extent->blockCount, fork->totalBlocks - blocks);
        extent->blockCount -= count;
        fork->totalBlocks -= count;
        bitmap_.ClearRun(extent->startBlock + extent->blockCount, count);
    }
}

void MemVolume::FillRuns(const HfsFork& fork, HfsRuns* runs) {
    runs->Clear();
    u32 vcn = 0;
    for (const HfsExtent& extent : fork.extents) {
        if (extent.blockCount != 0) {
            runs->AddEntry(vcn, extent.startBlock, extent.blockCount);
            vcn += extent.blockCount;
        }
    }
}

void MemVolume::OnRelease(void* self, buffer_head* bh, int flag) {
    MemVolume* volume = Self(self);
    if (bh == nullptr) {
        volume->Note(Call::kRelease, 0, 0, false);
        return;
    }
    Block* block = volume->Find(bh, "Release");
    volume->Note(Call::kRelease, block != nullptr ? block->offset : 0, 0, false);
    if (flag != 0) {
        volume->breaches.push_back("Release with a flag other than 0");
    }
    if (block != nullptr && block->open) {
        volume->breaches.push_back("Release of a block open for modification");
    }
    volume->lent_.erase(bh);
}

void MemVolume::OnBeginModify(void* self, buffer_head* bh) {
    MemVolume* volume = Self(self);
    Block* block = volume->Find(bh, "BeginModify");
    volume->Note(Call::kBeginModify, block != nullptr ? block->offset : 0, 0, false);
    if (block != nullptr) {
        if (block->open) {
            volume->breaches.push_back("BeginModify of an open block");
        }
        block->open = true;
    }
}

void MemVolume::OnEndModify(void* self, buffer_head* bh) {
    MemVolume* volume = Self(self);
    Block* block = volume->Find(bh, "EndModify");
    volume->Note(Call::kEndModify, block != nullptr ? block->offset : 0, 0, false);
    if (block != nullptr) {
        if (!block->open) {
            volume->breaches.push_back("EndModify of a block that is not open");
        }
        block->open = false;
    }
}

int MemVolume::OnWriteAccess(void* self, buffer_head* bh) {
    MemVolume* volume = Self(self);
    Block* block = volume->Find(bh, "WriteAccess");
    volume->Note(Call::kWriteAccess, block != nullptr ? block->offset : 0, 0, false);
    if (block != nullptr) {
        volume->Grant(block);
    }
    return kOk;
}

int MemVolume::OnCreateAccess(void* self, buffer_head* bh) {
    MemVolume* volume = Self(self);
    Block* block = volume->Find(bh, "CreateAccess");
    volume->Note(Call::kCreateAccess, block != nullptr ? block->offset : 0, 0, false);
    if (block != nullptr) {
        volume->Grant(block);
    }
    return kOk;
}

TestTree::TestTree(MemVolume* volume, u32 fileId) {
    tree.volume = &volume->fs;
    tree.fileId = fileId;
    tree.convert = ConvertFor(fileId);
}

TestTree::~TestTree() {
    tree.Dtor();
}

}  // namespace VELK::test
