// Stands in front of a device and remembers the first of its reads that failed. Mounting looks in
// many places for things that need not be there, and takes a place that cannot be read for one that
// holds nothing; who is about to write has to know the difference.
#pragma once

#include "hfs/volume/block_device.h"

namespace VELK {

class ReadWitness : public BlockDevice {
public:
    explicit ReadWitness(std::unique_ptr<BlockDevice> base) : base_(std::move(base)) {}

    u64 Size() const override { return base_->Size(); }
    bool IsWritable() const override { return base_->IsWritable(); }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override {
        const IoResult result = base_->Read(offset, target, bytes);
        // Behind the end there is nothing, whatever the medium is like.
        if (first_.Ok() && !result.Ok() && result.error != kIoPastEnd) {
            first_ = result;
        }
        return result;
    }
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override {
        return base_->Write(offset, source, bytes);
    }
    IoResult Zero(u64 offset, u64 bytes) override { return base_->Zero(offset, bytes); }
    IoResult Sync() override { return base_->Sync(); }

    const IoResult& FirstFailure() const { return first_; }  // error 0: every read was good

private:
    std::unique_ptr<BlockDevice> base_;
    IoResult first_;
};

}  // namespace VELK
