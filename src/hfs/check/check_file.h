// The bytes of one fork of the volume: its runs in the source, reads over run ends, and a window
// that reads neighbouring nodes in one go.
#pragma once

#include <vector>

#include "hfs/check/check_run.h"

namespace VELK {

// A place no source has, for runs that lie outside the volume.
constexpr u64 kCheckNowhere = u64{1} << 62;

// Blocks of the volume that belong together.
struct CheckExtent {
    u32 start = 0;
    u32 count = 0;
};

class CheckFile {
public:
    CheckFile(CheckRun* run, u32 fileId) : run_(run), fileId_(fileId) {}

    u32 FileId() const { return fileId_; }
    u64 Size() const { return size_; }  // bytes the runs hold
    u64 RunCount() const { return runs_.size(); }

    // `size` bytes of the source from `sourceOffset` on become the file's next bytes. What would
    // make the file larger than any can be is left out.
    void AddRun(u64 sourceOffset, u64 size);

    // A status other than 0: nothing is known of the target's content.
    int Read(u64 offset, void* target, u64 size) const;
    // Where a byte of the file lies in the source; kCheckNoOffset if it has no place there.
    u64 SourceOffset(u64 offset) const;

private:
    struct Run {
        u64 fileOffset;
        u64 sourceOffset;
        u64 size;
    };

    const Run* RunAt(u64 offset) const;

    CheckRun* run_;
    u32 fileId_;
    u64 size_ = 0;
    std::vector<Run> runs_;
};

// Reads nodes; those that lie behind each other in the file, several at a time.
class CheckNodeWindow {
public:
    CheckNodeWindow(const CheckFile* file, u32 nodeSize);

    // The node's bytes, valid until the next call; null with `*status` set if it cannot be read.
    const u8* Get(u32 nodeNum, int* status);

private:
    const CheckFile* file_;
    u32 nodeSize_;
    u32 maxCount_;
    u32 first_ = 0;
    u32 count_ = 0;
    std::vector<u8> bytes_;
};

}  // namespace VELK
