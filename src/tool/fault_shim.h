// Makes a service of a mounted volume fail on purpose: stands in front of its tables and of the
// heap, passes every call on, and fails those it was told to.
#pragma once

#include "hfs/fshfs.h"
#include "platform/host/host.h"

namespace VELK::tool {

// Statuses of failures made here, so that no one takes them for real ones.
constexpr int kErrMadeRead = static_cast<int>(0xA0000301u);
constexpr int kErrMadeWrite = static_cast<int>(0xA0000302u);
constexpr int kErrMadeJournal = static_cast<int>(0xA0000303u);

enum class Fault { kRead, kWrite, kAlloc, kJournal };

class FaultShim {
public:
    // Goes in front of the services of `fs` at the first Arm; leaves at the end of its life.
    explicit FaultShim(CFileSystemHfs* fs);
    FaultShim(const FaultShim&) = delete;
    FaultShim& operator=(const FaultShim&) = delete;
    ~FaultShim();

    // Lets `after` calls of the kind pass, then fails `times`. Reading is mapping of blocks whose
    // content is wanted; writing is handing over, zeroing and resizing; journal is leave to change
    // a block; alloc is the engine's heap.
    void Arm(Fault fault, u64 after, u64 times);
    void Disarm();

private:
    struct Plan {
        u64 after = 0;
        u64 times = 0;
    };
    friend struct ShimTables;
    bool Fails(Fault fault);
    void Install();

    CFileSystemHfs* fs_;
    Plan plans_[4];
    bool isInstalled_ = false;
    HfsService<HfsVolumeOps> service_;
    HfsService<HfsJournalOps> journal_;
    HostHeap heap_;
    const HostHeap* heapBefore_ = nullptr;
};

}  // namespace VELK::tool
