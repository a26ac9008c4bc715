// A volume in memory that fills the engine's service tables and is as unkind as the contract
// allows: every mapped map block is a heap block of its own of exactly mapBlockSize bytes (an
// access past it is seen by the sanitizer; blocks of one Map can be lent in one piece instead, as
// other volumes do), it is a copy of the "disk" taken at Map, and only what
// DirtyMeta hands over gets back there. Breaches of the contract (a block released twice, a handle
// it never gave, a block handed over without journal access ...) are collected in `breaches` and
// fail the test at the end.
#pragma once

#include <iosfwd>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "hfs/treehfs.h"
#include "image_bytes.h"
#include "metered.h"
#include "tree_image.h"

namespace VELK::test {

// Statuses only this volume gives.
constexpr int kMemNoRange = 0x5001;    // Map or Zero outside the tree file
constexpr int kMemNoSpace = 0x5002;    // no allocation blocks left, or beyond maxFileSize
constexpr int kMemUnaligned = 0x5003;  // Map of less than whole map blocks

// The calls of the service tables.
enum class Call {
    kMap,
    kDirtyMeta,
    kZero,
    kResize,
    kRelease,
    kBeginModify,
    kEndModify,
    kWriteAccess,
    kCreateAccess,
};
constexpr int kCallKinds = 9;

// One call as the volume saw it.
struct CallRecord {
    Call call;
    u64 offset;   // byte in the tree file (Resize: the new size)
    u64 bytes;    // Map, Zero: length
    bool noRead;  // Map

    friend bool operator==(const CallRecord&, const CallRecord&) = default;
};
std::ostream& operator<<(std::ostream& out, const CallRecord& record);

struct MemVolumeOptions {
    u32 mapBlockSize = 512;
    u32 allocBlockSize = 512;
    u32 totalBlocks = 65536;  // allocation blocks
    u16 version = kVersionHfsPlus;
    u32 defaultClumpSize = 4096;
    bool hasJournal = false;
    u64 maxFileSize = ~0ull;  // Resize beyond fails
    u8 stale = 0xE5;          // what freshly allocated disk bytes hold
    u32 misalign = 0;         // bytes every block is off its alignment
    bool inOnePiece = false;  // blocks of one Map lie one behind the other
    bool listsCalls = true;   // for TakeCalls; otherwise they are only counted
};

class MemVolume {
public:
    explicit MemVolume(const MemVolumeOptions& options = {});
    ~MemVolume();  // a test failure when blocks are still lent or the contract was breached
    MemVolume(const MemVolume&) = delete;
    MemVolume& operator=(const MemVolume&) = delete;

    // Makes `content` the tree file `fileId` (3, 4 or 8), rounded up to allocation blocks.
    void LoadFile(u32 fileId, const Bytes& content);
    void LoadTree(const TreeImage& image) { LoadFile(image.shape.fileId, image.bytes); }
    Bytes& Disk(u32 fileId) { return files_[fileId]; }
    // Changes a byte of a cached node behind the engine's back, as if it had been read so.
    void Damage(const HfsNode* node, u32 offset, u8 value);
    // One node as it is on disk now.
    Bytes DiskNode(u32 fileId, u32 nodeSize, u32 nodeNum);

    u32 Count(Call call) const { return counts_[static_cast<int>(call)]; }
    std::vector<CallRecord> TakeCalls();  // all calls since the last Take
    std::size_t Lent() const { return lent_.size(); }

    // Everything a transaction could change: tree files, forks, bitmap.
    struct Snapshot {
        std::map<u32, Bytes> files;
        std::map<u32, HfsFork> forks;
        Bytes bitmap;
    };
    Snapshot Save();
    void Restore(const Snapshot& snapshot);

    CFileSystemHfs fs;
    MemVolumeOptions options;
    std::vector<std::string> breaches;

private:
    struct Block {
        std::shared_ptr<u8[]> memory;
        u8* data;
        u32 fileId;
        u64 offset;
        Bytes clean;          // with a journal: what it held when it was read or handed over last
        bool access = false;  // granted since then
        bool open = false;
    };

    static int OnMap(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                     u32 fileId, u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs);
    static int OnDirtyMeta(void* self, CFileSystemHfs* fs, buffer_head* bh);
    static int OnZero(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                      u32 fileId, u64 byteOffset, u64 bytes);
    static int OnResize(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                        u32 fileId, u64 newSize);
    static void OnRelease(void* self, buffer_head* bh, int flag);
    static void OnBeginModify(void* self, buffer_head* bh);
    static void OnEndModify(void* self, buffer_head* bh);
    static int OnWriteAccess(void* self, buffer_head* bh);
    static int OnCreateAccess(void* self, buffer_head* bh);

    void Note(Call call, u64 offset, u64 bytes, bool noRead);
    Block* Find(buffer_head* bh, const char* what);
    void NoteClean(Block* block);
    void Grant(Block* block);
    void CheckFork(const HfsFork* fork, u8 forkType);
    int Grow(HfsFork* fork, u32 blocks);
    void Shrink(HfsFork* fork, u32 blocks);
    void FillRuns(const HfsFork& fork, HfsRuns* runs);

    static const HfsVolumeOps kVolumeOps;
    static const HfsCacheOps kCacheOps;
    static const HfsJournalOps kJournalOps;

    Bytes bitmapBytes_;
    CWndBitmap bitmap_;
    std::map<u32, Bytes> files_;
    std::map<buffer_head*, std::unique_ptr<Block>> lent_;
    std::vector<CallRecord> calls_;
    u32 counts_[kCallKinds] = {};
};

// A tree object of a volume, with the hooks of ConvertFor; torn down at its end. What is called
// through it is held to its bounds.
class TestTree {
public:
    TestTree(MemVolume* volume, u32 fileId);
    ~TestTree();
    Metered::Call operator->() { return Metered::Call(&tree); }
    CBTreeHfs& operator*() { return tree; }

    CBTreeHfs tree;
};

}  // namespace VELK::test
