// A volume whose one tree file exists only where it was written, so that trees of a million nodes
// cost nothing; and a fixture that opens empty trees of any size on it, map nodes and all, without
// the engine. As unkind as the other volume of the tests: every lent map block is a heap block of
// its own and gets back to the disk only through DirtyMeta.
#pragma once

#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <optional>

#include "capture.h"
#include "fault_service.h"
#include "geometry.h"
#include "heap_guard.h"
#include "keys.h"
#include "ledger.h"
#include "tree_image.h"

namespace VELK::test {

constexpr int kSparseNoRange = 0x5101;  // Map outside the file
constexpr int kSparseNoSpace = 0x5102;  // Resize beyond the volume

class SparseVolume {
public:
    SparseVolume(u32 mapBlockSize, u32 allocBlockSize, u32 totalBlocks, bool hasJournal);
    ~SparseVolume();  // a test failure when blocks are still lent
    SparseVolume(const SparseVolume&) = delete;
    SparseVolume& operator=(const SparseVolume&) = delete;

    void SetFileSize(u32 fileId, u64 size);  // fork, bitmap and file
    void PutNode(u32 nodeNum, const Bytes& node);
    Bytes DiskNode(u32 nodeSize, u32 nodeNum) const;
    u64 FileSize() const { return fileSize_; }
    // Of all blocks, so many are in use by others from now on.
    void UseBlocks(u32 count);

    CFileSystemHfs fs;
    u8 stale = 0xE5;             // what bytes hold that were never written
    bool liesAboutSize = false;  // Resize leaves the fork's logical size alone
    std::vector<u64> resizes;    // sizes asked for

private:
    struct Block {
        std::unique_ptr<u8[]> data;
        u64 offset;
    };

    static int OnMap(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                     u32 fileId, u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs);
    static int OnDirtyMeta(void* self, CFileSystemHfs* fs, buffer_head* bh);
    static int OnZero(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                      u32 fileId, u64 byteOffset, u64 bytes);
    static int OnResize(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                        u32 fileId, u64 newSize);
    static void OnRelease(void* self, buffer_head* bh, int flag);
    static void OnModify(void* self, buffer_head* bh);
    static int OnAccess(void* self, buffer_head* bh);

    static const HfsVolumeOps kVolumeOps;
    static const HfsCacheOps kCacheOps;
    static const HfsJournalOps kJournalOps;

    Bytes bitmapBytes_;
    CWndBitmap bitmap_;
    u64 fileSize_ = 0;
    std::map<u64, Bytes> disk_;  // by byte offset, one map block each
    std::map<buffer_head*, std::unique_ptr<Block>> lent_;
};

// Opens empty trees of any number of nodes. Node 0 and the map nodes 1 .. are in use, and whatever
// else the test wants.
class SparseTreeTest : public GeometryTest {
protected:
    void TearDown() override { Close(); }

    u32 HeadBits() const { return NodeSize() * 8 - 2048; }
    u32 StepBits() const { return NodeSize() * 8 - 160; }

    // A volume of `totalBlocks` allocation blocks as large as a node.
    void MakeVolume(u32 totalBlocks = 0x200000, u32 fileId = kAttributesFileId);
    // A tree of `totalNodes` nodes, of which 0 .. usedNodes - 1 are in use, on a new volume.
    void Open(u32 totalNodes, u32 usedNodes);
    void Close();
    CBTreeHfs& Tree() { return *tree; }

    // The present bytes of a node: cached, or on disk.
    Bytes Live(u32 nodeNum);
    // Overwrites bytes of a cached node behind the engine's back.
    void Poke(u32 nodeNum, u32 offset, const Bytes& bytes);
    void Poke8(u32 nodeNum, u32 offset, u32 value);
    void Poke16(u32 nodeNum, u32 offset, u32 value);
    void Poke32(u32 nodeNum, u32 offset, u32 value);
    // Brings a node into the cache, unreferenced.
    void Touch(u32 nodeNum);

    // Holds when the chain of map records covers exactly what a map of `totalNodes` nodes needs,
    // every record lies where it should, and the clear bits below the total are `freeNodes`.
    ::testing::AssertionResult MapIsSound();
    // The bit of a node, read from the bytes.
    bool BitIsSet(u32 nodeNum);

    HeapGuard heap;
    Capture capture;
    bool hasJournal = false;
    u32 allocBlockSize = 0;  // 0: as large as a node
    std::unique_ptr<SparseVolume> volume;
    std::unique_ptr<CBTreeHfs> tree;
};

// Nodes of one block, two, several; blocks small and large.
inline std::vector<Geometry> MapGeometries() {
    return {{512, 512},  {1024, 512},  {4096, 4096}, {4096, 1024},
            {4096, 512}, {8192, 4096}, {32768, 4096}};
}

inline std::vector<Geometry> GeometriesOfSeveralBlocks() {
    return {{1024, 512}, {4096, 1024}, {4096, 512}, {8192, 4096}, {32768, 4096}};
}

// Every node size, as one block of the largest size a block can have or several of them.
inline std::vector<Geometry> AllNodeSizes() {
    return {{512, 512},   {1024, 1024}, {2048, 1024}, {4096, 4096},
            {8192, 2048}, {16384, 512}, {32768, 4096}};
}

}  // namespace VELK::test
