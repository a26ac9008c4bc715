// Failing services on purpose.
#include "tool/fault_shim.h"

#include <cstdlib>

#include "platform/error.h"

namespace VELK::tool {

// The entries of the tables that stand in front.
struct ShimTables {
    static FaultShim* Of(void* self) { return static_cast<FaultShim*>(self); }

    static int Map(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                   u32 fileId, u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs) {
        if (!noRead && Of(self)->Fails(Fault::kRead)) {
            return kErrMadeRead;
        }
        const auto& next = Of(self)->service_;
        return next.ops->Map(next.self, fs, runs, fork, forkType, fileId, byteOffset, bytes, noRead,
                             bufs);
    }
    static int DirtyMeta(void* self, CFileSystemHfs* fs, buffer_head* bh) {
        if (Of(self)->Fails(Fault::kWrite)) {
            return kErrMadeWrite;
        }
        const auto& next = Of(self)->service_;
        return next.ops->DirtyMeta(next.self, fs, bh);
    }
    static int Zero(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                    u32 fileId, u64 byteOffset, u64 bytes) {
        if (Of(self)->Fails(Fault::kWrite)) {
            return kErrMadeWrite;
        }
        const auto& next = Of(self)->service_;
        return next.ops->Zero(next.self, fs, runs, fork, forkType, fileId, byteOffset, bytes);
    }
    static int Resize(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                      u32 fileId, u64 newSize) {
        if (Of(self)->Fails(Fault::kWrite)) {
            return kErrMadeWrite;
        }
        const auto& next = Of(self)->service_;
        return next.ops->Resize(next.self, fs, runs, fork, forkType, fileId, newSize);
    }
    static int GetWriteAccess(void* self, buffer_head* bh) {
        if (Of(self)->Fails(Fault::kJournal)) {
            return kErrMadeJournal;
        }
        const auto& next = Of(self)->journal_;
        return next ? next.ops->GetWriteAccess(next.self, bh) : kOk;
    }
    static int GetCreateAccess(void* self, buffer_head* bh) {
        if (Of(self)->Fails(Fault::kJournal)) {
            return kErrMadeJournal;
        }
        const auto& next = Of(self)->journal_;
        return next ? next.ops->GetCreateAccess(next.self, bh) : kOk;
    }
    static void* Alloc(void* self, std::size_t size) {
        FaultShim* shim = Of(self);
        if (shim->Fails(Fault::kAlloc)) {
            return nullptr;
        }
        const HostHeap* next = shim->heapBefore_;
        return next != nullptr ? next->Alloc(next->self, size) : HostAlloc(size);
    }
    static void Free(void* self, void* memory) {
        const HostHeap* next = Of(self)->heapBefore_;
        if (next != nullptr) {
            next->Free(next->self, memory);
        } else {
            HostFree(memory);
        }
    }

    static constexpr HfsVolumeOps kVolume = {Map, DirtyMeta, Zero, Resize};
    static constexpr HfsJournalOps kJournal = {GetWriteAccess, GetCreateAccess};
};

FaultShim::FaultShim(CFileSystemHfs* fs)
    : fs_(fs), heap_{ShimTables::Alloc, ShimTables::Free, this} {}

FaultShim::~FaultShim() {
    if (isInstalled_) {
        fs_->service = service_;
        fs_->journal = journal_;
        SetHostHeap(heapBefore_);
    }
}

void FaultShim::Install() {
    if (isInstalled_) {
        return;
    }
    isInstalled_ = true;
    service_ = fs_->service;
    journal_ = fs_->journal;
    fs_->service = {&ShimTables::kVolume, this};
    fs_->journal = {&ShimTables::kJournal, this};
    heapBefore_ = SetHostHeap(&heap_);
}

void FaultShim::Arm(Fault fault, u64 after, u64 times) {
    Install();
    plans_[static_cast<int>(fault)] = {after, times};
}

void FaultShim::Disarm() {
    for (Plan& plan : plans_) {
        plan = Plan{};
    }
}

bool FaultShim::Fails(Fault fault) {
    Plan& plan = plans_[static_cast<int>(fault)];
    if (plan.times == 0) {
        return false;
    }
    if (plan.after != 0) {
        --plan.after;
        return false;
    }
    --plan.times;
    return true;
}

}  // namespace VELK::tool
