// What a writing command overwrites, kept in a file of its own so that `undo` can put it back.
//
// The file is a log: the image's size, then for each stretch its place and its old bytes with a
// sum. It reaches the disk before the image changes, so it serves after a crash, too. When the
// command ends well a last entry holds a sum of the new bytes: undo then knows whether the image
// has changed since.
#pragma once

#include <cstdio>
#include <memory>
#include <string>
#include <unordered_set>
#include <vector>

#include "hfs/volume/block_device.h"

namespace VELK::tool {

struct UndoStretch {
    u64 offset = 0;
    std::vector<u8> bytes;
};

struct UndoLog {
    u64 imageSize = 0;
    std::vector<UndoStretch> stretches;  // no byte of the image is in two
    bool isComplete = false;             // the last entry is there
    u64 newBytesSum = 0;
};

// Problem: the file cannot be read, or is no such log. A log that breaks off is read up to there.
Problem ReadUndoLog(const std::string& path, UndoLog* log);
// Sum of the bytes that now stand where the log's stretches were.
IoResult SumOfStretches(BlockDevice* image, const UndoLog& log, u64* sum);

// Passes everything on to `base`, and keeps what is overwritten first.
class UndoDevice : public BlockDevice {
public:
    // Null with `*problem` set when the log cannot be made. A file that exists is replaced.
    static std::unique_ptr<UndoDevice> Open(std::unique_ptr<BlockDevice> base,
                                            const std::string& path, Problem* problem);
    ~UndoDevice() override;  // writes the last entry

    u64 Size() const override { return base_->Size(); }
    bool IsWritable() const override { return base_->IsWritable(); }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override {
        return base_->Read(offset, target, bytes);
    }
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override;
    IoResult Sync() override { return base_->Sync(); }

private:
    UndoDevice(std::unique_ptr<BlockDevice> base, std::FILE* file)
        : base_(std::move(base)), file_(file) {}
    IoResult Keep(u64 offset, std::size_t bytes);
    bool Append(u64 offset, const std::vector<u8>& bytes);

    std::unique_ptr<BlockDevice> base_;
    std::FILE* file_;
    std::unordered_set<u64> kept_;  // numbers of the sectors in the log
    std::vector<u64> order_;        // in the order of the log
    int error_ = 0;
};

}  // namespace VELK::tool
