// A mounted HFS+ volume in an image: finds it, fills in CFileSystemHfs and its service tables,
// opens the trees, and for volumes that take changes keeps them in one transaction over all trees,
// the volume header and the allocation file.
//
//     Problem problem;
//     auto volume = ImageVolume::OpenFile("disk.img", OpenOptions{}, nullptr, &problem);
//     CBTreeHfs* catalog = volume ? volume->Tree(kCatalogFileId, &problem) : nullptr;
//     if (catalog == nullptr) {
//         std::puts(problem.Text().c_str());
//         return;
//     }
//     HfsFindData path;
//     status = catalog->FindRecord(&key, parentId, &record, sizeof record, &size, &path);
//     path.ClearPath();  // before the volume goes
//     volume->Close();   // or the destructor
#pragma once

#include <cstdio>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "hfs/treehfs.h"
#include "hfs/volume/block_device.h"
#include "hfs/volume/partition.h"
#include "hfs/volume/problem.h"
#include "hfs/volume/volume_header.h"

namespace VELK {

// What becomes of changes.
enum class Access {
    kReadOnly,  // changes are refused
    kOverlay,   // changes stay in memory, the image is never written
    kWrite,     // a commit reaches the image
};

// How to mount. The names after -- are the options of the tool that set these.
struct OpenOptions {
    Access access = Access::kReadOnly;  // what becomes of changes
    std::optional<u64> offset;          // --offset: byte of the image where the volume starts
    u32 partition = 0;                  // --partition; 0: whichever holds a volume
    bool backupHeader = false;          // start from the alternate header
    bool force = false;                 // --force: write past a full journal or an unclean unmount
    // Carry out the transactions that wait in the journal before anything else is read: on the
    // image with Access::kWrite, else in memory only.
    bool replay = false;
    u32 mapBlockSize = 0;  // --map; 0: the smallest node size of the volume's trees
    // Bytes of clean nodes that TrimCache leaves cached. A job that meets most leaves once is
    // quicker with less than the processor caches: memory that comes back is warm, fresh memory is
    // not.
    u64 cacheBudget = u64{8} << 20;
};

// The volume's journal as found at mount.
struct JournalState {
    bool present = false;       // the volume header says there is one
    bool readable = false;      // info block and header are there and sound
    bool empty = true;          // nothing waits in it
    u64 pendingBytes = 0;       // bytes of transactions that were not carried out
    u32 replayed = 0;           // transactions that this mount has carried out
    bool isConsistent = false;  // it was kept, and nothing waits in it any more
    u64 offset = 0;             // of the journal header, bytes of the image
    u64 size = 0;               // bytes, journal header included
    std::string text;           // what is wrong with it, when not readable
};

// One mounted volume, and its trees. Not copied, not moved: trees and paths point into it. One
// thread at a time. Trees are opened when they are first asked for.
class ImageVolume {
public:
    // Null with `*problem` set when there is no volume to mount. `scan` (optional) receives what
    // was looked at, also on failure. The volume owns the device.
    static std::unique_ptr<ImageVolume> Open(std::unique_ptr<BlockDevice> image,
                                             const OpenOptions& options, VolumeScan* scan,
                                             Problem* problem);
    // The same for a file of the host.
    static std::unique_ptr<ImageVolume> OpenFile(const std::string& path,
                                                 const OpenOptions& options, VolumeScan* scan,
                                                 Problem* problem);

    ImageVolume(const ImageVolume&) = delete;
    ImageVolume& operator=(const ImageVolume&) = delete;
    ~ImageVolume();  // closes, tears the trees down; what was not committed is gone

    CFileSystemHfs* Fs();                // as the engine sees the volume; stays the volume's
    const VolumeHeader& Header() const;  // with the changes made since mount
    const VolumePlace& Place() const;    // where in the image it was found
    // Things a user should know although the volume opened: a truncated image, a journal that is
    // not empty, overlapping forks, ...
    const std::vector<Problem>& Notes() const;
    bool IsTruncated() const;  // the image ends before the volume does
    // Why Access::kWrite with the same options is refused. No problem: it is not, or the volume
    // was opened read-only.
    const Problem& WriteObstacle() const;
    const JournalState& Journal() const;  // as found at mount, and what became of it
    // The alternate header; null when it cannot be read. `*offset` (optional): its image offset.
    const VolumeHeader* AlternateHeader(u64* offset) const;
    bool UsedBackupHeader() const;  // the volume was mounted by it

    // --- trees -----------------------------------------------------------------------------------

    // fileId is kExtentsFileId, kCatalogFileId or kAttributesFileId.
    bool HasTree(u32 fileId) const;  // its fork is not empty
    // The open tree; opens it on first use. Null with `*problem` (optional) set: it stays closed,
    // unless it was for want of memory.
    CBTreeHfs* Tree(u32 fileId, Problem* problem);
    // The tree if it is open already, else null.
    CBTreeHfs* OpenTree(u32 fileId);
    // Drops clean nodes nobody holds when the trees' caches are above the budget: the leaves, and
    // all others too when these take more than three quarters of it. Search paths stay valid. Call
    // it between operations of long jobs; cheap when there is nothing to do.
    void TrimCache();
    u64 CachedBytes() const;  // of all trees, clean or not

    // Byte of the image where byte `forkOffset` of a special file lies; none when it lies nowhere.
    std::optional<u64> ImageOffset(u32 fileId, u64 forkOffset);
    // Reads bytes of a special file (3, 4, 6, 7, 8) past the engine: 0 or a kErrVolume... status.
    int ReadFork(u32 fileId, u64 forkOffset, void* target, u32 bytes);
    // Bytes of a special file that can be read: the lesser of its size and its mapped blocks.
    u64 ForkBytes(u32 fileId);
    // Extents of a special file, those of the overflow tree included, in fork order.
    std::vector<HfsExtent> ForkExtents(u32 fileId);
    // Reads volume bytes (offset 0 is the volume's first byte).
    int ReadVolume(u64 offset, void* target, u64 bytes);
    // Why the last Map, Zero or DirtyMeta failed, with offset and node: "read error at 0x23800
    // (catalog node 14): Input/output error". No problem when none did.
    const Problem& LastIoProblem() const;

    // --- changes ---------------------------------------------------------------------------------

    bool IsWritable() const;  // takes changes; ends when a restore leaves a tree dirty
    // Makes an absent tree with the engine's Create and adds it to the volume. `initialSize` null:
    // the default clump. Catalog and extents constants are set here. 0 or a status.
    int CreateTree(u32 fileId, u32 nodeShift, const u64* initialSize);
    // Flushes every tree with `mode`, brings overflow records, bitmap and header up to date and
    // commits. On failure restores and returns the status. When the medium failed, the volume takes
    // no more changes, and whether this commit stands shows when it is mounted the next time.
    // kErrVolumeJournal: too much for one transaction; nothing was written.
    int Commit(unsigned long mode);
    // Back to the last commit: drops staged changes, forks, bitmap and header, restores the trees.
    // Paths the caller holds must be cleared before.
    void Restore();
    // Ends writing: empties the journal and marks the volume as unmounted. The volume can be read
    // further. 0 or a status; what was committed stands in either case.
    int Close();
    // To be called with the status of every changing operation. When it is a failure that may have
    // left a change half done, restores and returns true.
    bool RestoreAfter(int status);
    // Keeps the header's counts in step with catalog records put in (+1) or taken out (-1).
    void CountCatalogRecord(u16 recordType, u32 id, int change);
    void SetModifyDate(u32 date);  // seconds since 1904; written with the next commit
    u64 HandedOverBlocks() const;  // map blocks the trees have handed over since mount
    u64 CommittedBytes() const;    // bytes that commits have written since mount
    // Whether the changes since the last commit take half of what the journal holds, or so much
    // that an operation on one record may no longer fit beside them: time to commit. Never without
    // a journal.
    bool IsCommitDue() const;

    // Writes the whole image as it stands after the last commit.
    Problem SaveTo(std::FILE* file);

    struct State;  // private to the volume layer

private:
    explicit ImageVolume(std::unique_ptr<State> state);
    std::unique_ptr<State> state_;
};

}  // namespace VELK
