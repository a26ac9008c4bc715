// Changes on their way to the image: staged over the device, seen by every read, carried over all
// at once by Commit or forgotten by Abort.
#pragma once

#include "hfs/volume/block_device.h"

namespace VELK {

// Carries staged changes to their place. What stands between staging and the image (a journal, a
// recorder of writes) takes the place of this.
class CommitSink {
public:
    virtual ~CommitSink() = default;
    // On failure `home` may hold a part of the changes; the sink says what that means.
    virtual IoResult Carry(const OverlayDevice& staged, BlockDevice* home, u64* bytesWritten);
    // After the last Carry: leaves `home` as a volume nobody uses. Writes nothing after a failure.
    virtual IoResult Finish(BlockDevice*) { return {}; }

protected:
    // Writes the staged sectors in rising order, but none of [skip, skip + skipBytes). No sync.
    static IoResult CarryExcept(const OverlayDevice& staged, BlockDevice* home, u64 skip,
                                u64 skipBytes, u64* bytesWritten);
};

class Transaction {
public:
    explicit Transaction(BlockDevice* home) : home_(home), staged_(home) {}

    // The device to read and write through.
    OverlayDevice* Staged() { return &staged_; }
    BlockDevice* Home() { return home_; }
    bool IsEmpty() const { return staged_.IsEmpty(); }
    // Replaces the sink; null puts the direct one back. The caller keeps the sink alive.
    void SetSink(CommitSink* sink) { sink_ = sink; }

    IoResult Commit() {
        CommitSink* sink = sink_ != nullptr ? sink_ : &direct_;
        const IoResult result = sink->Carry(staged_, home_, &bytesWritten_);
        if (result.Ok()) {
            staged_.Drop();
        }
        return result;
    }
    void Abort() { staged_.Drop(); }
    IoResult Finish() { return sink_ != nullptr ? sink_->Finish(home_) : IoResult{}; }
    u64 BytesWritten() const { return bytesWritten_; }

private:
    BlockDevice* home_;
    OverlayDevice staged_;
    CommitSink direct_;
    CommitSink* sink_ = nullptr;
    u64 bytesWritten_ = 0;
};

}  // namespace VELK
