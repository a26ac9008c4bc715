// Takes the place of a volume's services, fails the nth call of a kind (or of any kind that can
// fail) once or for ever, and passes all others on. The volume stays as it is and gets its tables
// back at the end.
#pragma once

#include "mem_volume.h"

namespace VELK::test {

constexpr int kFaultStatus = 0x5F17;

class FaultService {
public:
    explicit FaultService(CFileSystemHfs* fs);
    ~FaultService();
    FaultService(const FaultService&) = delete;
    FaultService& operator=(const FaultService&) = delete;

    // The nth call of this kind from now on (1: the next) fails and does not reach the volume.
    void Fail(Call kind, u32 nth, int status = kFaultStatus, bool forever = false);
    // The nth of all calls that can fail, whatever its kind.
    void FailAny(u32 nth, int status = kFaultStatus, bool forever = false);
    void FailNone();

    bool HasFailed() const { return failures_ > 0; }  // since the last Fail or FailAny
    Call FailedCall() const { return failedCall_; }
    u32 Count(Call kind) const { return counts_[static_cast<int>(kind)]; }
    u32 Count() const { return countAll_; }  // calls that can fail

private:
    int Strike(Call kind);

    static int OnMap(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                     u32 fileId, u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs);
    static int OnDirtyMeta(void* self, CFileSystemHfs* fs, buffer_head* bh);
    static int OnZero(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                      u32 fileId, u64 byteOffset, u64 bytes);
    static int OnResize(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                        u32 fileId, u64 newSize);
    static int OnWriteAccess(void* self, buffer_head* bh);
    static int OnCreateAccess(void* self, buffer_head* bh);

    static const HfsVolumeOps kVolumeOps;
    static const HfsJournalOps kJournalOps;

    CFileSystemHfs* fs_;
    HfsService<HfsVolumeOps> volume_;
    HfsService<HfsJournalOps> journal_;
    bool any_ = false;
    Call kind_ = Call::kMap;
    u32 failIn_ = 0;
    int status_ = 0;
    bool forever_ = false;
    u32 failures_ = 0;
    Call failedCall_ = Call::kMap;
    u32 counts_[kCallKinds] = {};
    u32 countAll_ = 0;
};

}  // namespace VELK::test
