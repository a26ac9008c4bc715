// Devices for tests of what reaches a medium: one that writes down every write and sync, one that
// fails when told to. Both pass on to a device they do not own, so that a volume can own them.
#pragma once

#include <vector>

#include "hfs/volume/block_device.h"

namespace VELK::test {

struct DeviceEvent {
    bool isSync = false;
    u64 offset = 0;
    std::vector<u8> bytes;  // of a write
};

class RecordingDevice : public BlockDevice {
public:
    RecordingDevice(BlockDevice* base, std::vector<DeviceEvent>* log) : base_(base), log_(log) {}

    u64 Size() const override { return base_->Size(); }
    bool IsWritable() const override { return true; }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override {
        return base_->Read(offset, target, bytes);
    }
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override;
    IoResult Sync() override;

private:
    BlockDevice* base_;
    std::vector<DeviceEvent>* log_;
};

// The nth call of a kind fails, n counting from 1; 0: none does.
struct DeviceFaults {
    int error = 5;  // EIO
    u32 failRead = 0;
    u32 failWrite = 0;
    u32 failSync = 0;
    bool forEver = false;     // and every call of the kind after it
    bool writesPart = false;  // the failing write moves half of its sectors
    u64 sizeLimit = ~u64{0};  // nothing from here on can be read or written any more
    u32 reads = 0;            // calls so far
    u32 writes = 0;
    u32 syncs = 0;
    u32 changesAfterFailure = 0;  // writes that came although a sync had failed
    bool hasFailed = false;
    bool syncHasFailed = false;
};

class FaultyDevice : public BlockDevice {
public:
    FaultyDevice(BlockDevice* base, DeviceFaults* faults) : base_(base), faults_(faults) {}

    u64 Size() const override { return base_->Size(); }
    bool IsWritable() const override { return true; }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override;
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override;
    IoResult Sync() override;

private:
    bool Strikes(u32* calls, u32 nth);

    BlockDevice* base_;
    DeviceFaults* faults_;
};

}  // namespace VELK::test
