// A device for commands that only read: reads that follow one another are served from a window
// that is filled with one larger read, so that a walk over a tree costs few calls of the system.
#pragma once

#include <memory>

#include "hfs/volume/block_device.h"

namespace VELK::tool {

class ReadAheadDevice : public BlockDevice {
public:
    explicit ReadAheadDevice(std::unique_ptr<BlockDevice> base);

    u64 Size() const override { return base_->Size(); }
    bool IsWritable() const override { return false; }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override;
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override;
    IoResult Sync() override { return {}; }

    static constexpr std::size_t kWindowSize = std::size_t{1} << 17;

private:
    bool Holds(u64 offset, std::size_t bytes) const {
        return offset >= windowStart_ && offset - windowStart_ <= windowBytes_ &&
               bytes <= windowBytes_ - (offset - windowStart_);
    }
    bool FillWindow(u64 offset);

    std::unique_ptr<BlockDevice> base_;
    std::unique_ptr<u8[]> window_;
    u64 windowStart_ = 0;
    u64 windowBytes_ = 0;
    u64 expected_ = 0;  // where the last read ended
    u32 inRow_ = 0;     // reads that followed one another
};

}  // namespace VELK::tool
