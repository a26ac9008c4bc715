// See fault_service.h.
#include "fault_service.h"

namespace VELK::test {

namespace {

FaultService* Self(void* self) {
    return static_cast<FaultService*>(self);
}

}  // namespace

const HfsVolumeOps FaultService::kVolumeOps = {OnMap, OnDirtyMeta, OnZero, OnResize};
const HfsJournalOps FaultService::kJournalOps = {OnWriteAccess, OnCreateAccess};

FaultService::FaultService(CFileSystemHfs* fs)
    : fs_(fs), volume_(fs->service), journal_(fs->journal) {
    fs_->service.ops = &kVolumeOps;
    fs_->service.self = this;
    if (journal_) {
        fs_->journal.ops = &kJournalOps;
        fs_->journal.self = this;
    }
}

FaultService::~FaultService() {
    fs_->service = volume_;
    fs_->journal = journal_;
}

void FaultService::Fail(Call kind, u32 nth, int status, bool forever) {
    any_ = false;
    kind_ = kind;
    failIn_ = nth;
    status_ = status;
    forever_ = forever;
    failures_ = 0;
}

void FaultService::FailAny(u32 nth, int status, bool forever) {
    Fail(Call::kMap, nth, status, forever);
    any_ = true;
}

void FaultService::FailNone() {
    failIn_ = 0;
}

// Counts a call; not 0: the call fails with this status.
int FaultService::Strike(Call kind) {
    counts_[static_cast<int>(kind)] += 1;
    countAll_ += 1;
    if (failIn_ == 0 || (!any_ && kind != kind_)) {
        return kOk;
    }
    if (failIn_ > 1) {
        failIn_ -= 1;
        return kOk;
    }
    failIn_ = forever_ ? 1 : 0;
    failures_ += 1;
    failedCall_ = kind;
    return status_;
}

int FaultService::OnMap(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                        u32 fileId, u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs) {
    const int status = Self(self)->Strike(Call::kMap);
    const HfsService<HfsVolumeOps>& next = Self(self)->volume_;
    return status != kOk ? status
                         : next.ops->Map(next.self, fs, runs, fork, forkType, fileId, byteOffset,
                                         bytes, noRead, bufs);
}

int FaultService::OnDirtyMeta(void* self, CFileSystemHfs* fs, buffer_head* bh) {
    const int status = Self(self)->Strike(Call::kDirtyMeta);
    const HfsService<HfsVolumeOps>& next = Self(self)->volume_;
    return status != kOk ? status : next.ops->DirtyMeta(next.self, fs, bh);
}

int FaultService::OnZero(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                         u32 fileId, u64 byteOffset, u64 bytes) {
    const int status = Self(self)->Strike(Call::kZero);
    const HfsService<HfsVolumeOps>& next = Self(self)->volume_;
    return status != kOk
               ? status
               : next.ops->Zero(next.self, fs, runs, fork, forkType, fileId, byteOffset, bytes);
}

int FaultService::OnResize(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork,
                           u8 forkType, u32 fileId, u64 newSize) {
    const int status = Self(self)->Strike(Call::kResize);
    const HfsService<HfsVolumeOps>& next = Self(self)->volume_;
    return status != kOk ? status
                         : next.ops->Resize(next.self, fs, runs, fork, forkType, fileId, newSize);
}

int FaultService::OnWriteAccess(void* self, buffer_head* bh) {
    const int status = Self(self)->Strike(Call::kWriteAccess);
    const HfsService<HfsJournalOps>& next = Self(self)->journal_;
    return status != kOk ? status : next.ops->GetWriteAccess(next.self, bh);
}

int FaultService::OnCreateAccess(void* self, buffer_head* bh) {
    const int status = Self(self)->Strike(Call::kCreateAccess);
    const HfsService<HfsJournalOps>& next = Self(self)->journal_;
    return status != kOk ? status : next.ops->GetCreateAccess(next.self, bh);
}

}  // namespace VELK::test
