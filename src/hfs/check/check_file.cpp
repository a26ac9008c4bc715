// Mapping of a fork's bytes to the source, and the window nodes are read through.
#include "hfs/check/check_file.h"

#include <algorithm>

namespace VELK {
namespace {

constexpr u32 kWindowSize = 256 * 1024;
constexpr u64 kMostBytes = u64{1} << 62;  // sums of two such still fit 64 bits

}  // namespace

void CheckFile::AddRun(u64 sourceOffset, u64 size) {
    size = std::min(size, kMostBytes - size_);
    if (size == 0) {
        return;
    }
    if (!runs_.empty() && runs_.back().sourceOffset + runs_.back().size == sourceOffset) {
        runs_.back().size += size;
    } else {
        runs_.push_back({size_, sourceOffset, size});
    }
    size_ += size;
}

const CheckFile::Run* CheckFile::RunAt(u64 offset) const {
    if (offset >= size_) {
        return nullptr;
    }
    auto behind =
        std::upper_bound(runs_.begin(), runs_.end(), offset,
                         [](u64 value, const Run& run) { return value < run.fileOffset; });
    return &*(behind - 1);
}

int CheckFile::Read(u64 offset, void* target, u64 size) const {
    u8* to = static_cast<u8*>(target);
    while (size > 0) {
        const Run* run = RunAt(offset);
        if (run == nullptr) {
            return kCheckPastEnd;
        }
        const u64 inRun = offset - run->fileOffset;
        const u64 piece = std::min(size, run->size - inRun);
        if (int status = run_->Read(run->sourceOffset + inRun, to, piece); status != 0) {
            return status;
        }
        offset += piece;
        to += piece;
        size -= piece;
    }
    return 0;
}

u64 CheckFile::SourceOffset(u64 offset) const {
    const Run* run = RunAt(offset);
    if (run == nullptr || run->sourceOffset >= kCheckNowhere) {
        return kCheckNoOffset;
    }
    return run->sourceOffset + (offset - run->fileOffset);
}

CheckNodeWindow::CheckNodeWindow(const CheckFile* file, u32 nodeSize)
    : file_(file), nodeSize_(nodeSize), maxCount_(std::max(kWindowSize / nodeSize, u32{1})) {}

const u8* CheckNodeWindow::Get(u32 nodeNum, int* status) {
    *status = 0;
    if (nodeNum >= first_ && nodeNum - first_ < count_) {
        return bytes_.data() + static_cast<std::size_t>(nodeNum - first_) * nodeSize_;
    }
    // Twice as many each time as long as the next node is the one that follows, else one.
    const bool goesOn = count_ != 0 && nodeNum - first_ == count_;
    const u64 nodesInFile = file_->Size() / nodeSize_;
    u64 count = goesOn ? std::min(count_ * 2, maxCount_) : 1;
    count = std::min(count, nodesInFile > nodeNum ? nodesInFile - nodeNum : 1);
    bytes_.resize(std::max(bytes_.size(), static_cast<std::size_t>(count * nodeSize_)));
    first_ = nodeNum;
    count_ = static_cast<u32>(count);
    const u64 offset = static_cast<u64>(nodeNum) * nodeSize_;
    *status = file_->Read(offset, bytes_.data(), count * nodeSize_);
    if (*status != 0 && count > 1) {
        count_ = 1;
        *status = file_->Read(offset, bytes_.data(), nodeSize_);
    }
    if (*status != 0) {
        count_ = 0;
        return nullptr;
    }
    return bytes_.data();
}

}  // namespace VELK
