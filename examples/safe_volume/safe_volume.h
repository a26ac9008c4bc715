// A volume that survives the power going away at any moment: one tree in a file of the host, with a
// log in front of it. What the engine hands over is staged; a commit writes all of it into the log,
// syncs, writes each block to its place, and syncs again. A log that is whole is carried out when
// the file is opened.
#pragma once

#include <array>
#include <map>
#include <string>
#include <vector>

#include "hfs/treehfs.h"

class SafeVolume {
public:
    static constexpr unsigned kBlock = 512;        // map block, allocation block and sector, bytes
    static constexpr unsigned kLogBlocks = 1024;   // of the file: the log
    static constexpr unsigned kMaxFile = 4 << 20;  // the tree file grows up to here, bytes

    // Opens or makes the file and carries out what its log holds. `writes`: the power goes off
    // before that write; negative: never.
    SafeVolume(const std::string& path, long writes);
    ~SafeVolume();
    SafeVolume(const SafeVolume&) = delete;
    SafeVolume& operator=(const SafeVolume&) = delete;

    bool IsOpen() const { return file_ >= 0; }
    bool IsNew() const { return fs.attributesFork.logicalSize == 0; }
    // Everything the tree has changed is on the medium when this returns 0. On failure the tree and
    // the medium are as the last commit left them; or, when the medium itself failed, nothing is
    // written any more, and who opens the file next finds that commit or this one.
    int Commit(VELK::CBTreeHfs* tree);
    // Back to the last commit, after an operation that failed.
    void Abort(VELK::CBTreeHfs* tree);

    VELK::CFileSystemHfs fs;
    unsigned lentBlocks = 0;

private:
    using Block = std::array<VELK::u8, kBlock>;
    using Blocks = std::map<VELK::u32, Block>;  // by number of the block in the file

    static int Map(void* self, VELK::CFileSystemHfs* fs, VELK::HfsRuns* runs, VELK::HfsFork* fork,
                   VELK::u8 forkType, VELK::u32 fileId, VELK::u64 byteOffset, VELK::u32 bytes,
                   bool noRead, VELK::HfsBcbBuf* bufs);
    static int DirtyMeta(void* self, VELK::CFileSystemHfs* fs, VELK::buffer_head* bh);
    static int Zero(void* self, VELK::CFileSystemHfs* fs, VELK::HfsRuns* runs, VELK::HfsFork* fork,
                    VELK::u8 forkType, VELK::u32 fileId, VELK::u64 byteOffset, VELK::u64 bytes);
    static int Resize(void* self, VELK::CFileSystemHfs* fs, VELK::HfsRuns* runs,
                      VELK::HfsFork* fork, VELK::u8 forkType, VELK::u32 fileId, VELK::u64 newSize);
    static void Release(void* self, VELK::buffer_head* bh, int flag);
    static void Modify(void*, VELK::buffer_head*) {}

    bool Get(VELK::u32 block, VELK::u8* target);
    bool Read(VELK::u32 block, void* target, unsigned blocks);
    bool Write(VELK::u32 block, const void* source, unsigned blocks);
    bool Sync();
    bool WriteLog(const Blocks& blocks);
    bool ReadLog(Blocks* blocks);
    bool WriteHome(const Blocks& blocks);
    void SetSize(VELK::u64 bytes);

    static const VELK::HfsVolumeOps kVolumeOps;
    static const VELK::HfsCacheOps kCacheOps;

    int file_ = -1;
    long writes_;
    bool hasFailed_ = false;         // a write or sync failed: nothing is written any more
    VELK::u64 committedSize_ = 0;    // of the tree file, bytes
    Blocks staged_;                  // since the last commit
    VELK::u8 bitmapBytes_[64] = {};  // an allocation bitmap for the reserve the engine asks about
    VELK::CWndBitmap bitmap_;
};
