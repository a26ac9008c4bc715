// What stands behind an ImageVolume. Private to the volume layer.
#pragma once

#include <array>
#include <new>
#include <optional>
#include <vector>

#include "hfs/volume/fork_map.h"
#include "hfs/volume/image_volume.h"
#include "hfs/volume/journal_state.h"
#include "hfs/volume/transaction.h"

namespace VELK {

class JournalSink;

// One record of the extents tree that continues a fork past its eight extents.
struct OverflowRecord {
    u32 startBlock;  // fork block it begins with
    HfsExtent extents[kExtentCount];

    bool operator==(const OverflowRecord& other) const;
};

// A special file. The trees keep their runs in the tree object, the others here.
struct SpecialFile {
    u32 fileId = 0;
    HfsRuns* runs = nullptr;
    HfsRuns ownRuns;
    bool isMapped = false;
    Problem problem;                       // why the fork cannot be mapped in full
    std::vector<OverflowRecord> overflow;  // as they stand in the extents tree
};

// A tree and what is known about opening it.
struct TreeSlot {
    alignas(CBTreeHfs) u8 storage[sizeof(CBTreeHfs)];
    bool isOpen = false;
    bool wasTried = false;
    bool isNew = false;  // made by Create and not committed yet
    Problem problem;

    CBTreeHfs* Get() { return std::launder(reinterpret_cast<CBTreeHfs*>(storage)); }
};

struct BitmapChange {
    u32 first;
    u32 count;
    bool set;
};

// What Restore goes back to.
struct CommittedFork {
    HfsFork fork;
    std::vector<HfsRuns::Run> runs;
    std::vector<OverflowRecord> overflow;
};

struct CommittedState {
    VolumeHeader header{};
    std::array<CommittedFork, 5> forks;
    std::array<u32, 3> validNodes{};
};

constexpr std::array<u32, 5> kSpecialFileIds = {kExtentsFileId, kCatalogFileId, kAttributesFileId,
                                                kAllocationFileId, kStartupFileId};
constexpr std::size_t kTreeCount = 3;  // the first of kSpecialFileIds are trees

// Gives up whatever reservation of nodes is open on a tree.
void EndReservation(CBTreeHfs* tree);

struct ImageVolume::State {
    // --- image, from the host's file up to the volume's bytes ------------------------------------
    std::unique_ptr<BlockDevice> image;
    std::unique_ptr<OverlayDevice> overlay;    // Access::kOverlay, or a journal in memory
    std::unique_ptr<CommitSink> sink;          // Access::kWrite
    JournalSink* journalSink = nullptr;        // the sink, where it keeps a journal
    std::unique_ptr<Transaction> transaction;  // unless read-only
    std::unique_ptr<SliceDevice> volume;       // what reads and writes go through
    OpenOptions options;
    VolumePlace place;
    u64 volumeBytes = 0;
    bool isTruncated = false;
    bool isWritable = false;
    bool usedBackup = false;
    std::vector<Problem> notes;
    Problem writeObstacle;  // Access::kOverlay, kWrite
    Problem lastIo;
    JournalState journal;
    JournalPlace journalPlace;
    VolumeHeader header{};
    VolumeHeader alternate{};
    std::optional<u64> alternateOffset;  // of the image

    // --- engine side -----------------------------------------------------------------------------
    CFileSystemHfs fs;
    CWndBitmap bitmap;
    std::vector<u8> bitmapBytes;
    std::array<TreeSlot, kTreeCount> trees;
    std::array<SpecialFile, 5> files;
    u64 handedOver = 0;
    u64 grantedBytes = 0;  // of map blocks opened for change since the last commit
    u64 trimFloor = 0;
    u32 unmarkedBlocks = 0;  // in use, but free by the allocation file

    // --- changes since the last commit -----------------------------------------------------------
    std::vector<BitmapChange> bitmapChanges;
    CommittedState committed;
    bool wasWritten = false;  // a commit of this mount has reached the image

    State();
    ~State();
    State(const State&) = delete;
    State& operator=(const State&) = delete;

    // volume_mount.cpp
    Problem Mount(VolumeScan* scan);
    Problem ReadHeaders();
    Problem FinishReading();
    Problem PrepareWriting();
    Problem CheckShape(const std::vector<Problem>& overlaps);
    void NoteWhatForcePassed();
    bool IsCutShort() const;
    BlockDevice* Base() { return overlay ? static_cast<BlockDevice*>(overlay.get()) : image.get(); }

    // volume_journal.cpp
    Problem SettleJournal();
    bool MayReplay();
    Problem Replay();
    Problem FinishReplay(u32 transactions, bool onMedium, bool isComplete);
    Problem ChooseSink();

    // volume_trees.cpp
    TreeSlot* Slot(u32 fileId);
    SpecialFile* File(u32 fileId);
    bool HasFork(u32 fileId) const;
    int MapFork(u32 fileId);  // fills the runs of a special file; 0 or why not
    CBTreeHfs* Open(u32 fileId);
    void ResetTree(TreeSlot* slot, u32 fileId);

    // volume_service.cpp
    void InstallServices();
    void InstallJournal();
    int Grant(u32 bytes);
    u64 LargestOperation() const;
    int ReadBytes(const HfsRuns& runs, u32 fileId, u64 offset, void* target, u64 bytes);
    int WriteBytes(const HfsRuns& runs, u32 fileId, u64 offset, const void* source, u64 bytes);
    int ZeroBytes(const HfsRuns& runs, u32 fileId, u64 offset, u64 bytes);
    int IoStatus(const IoResult& result, u32 fileId, u64 forkOffset, bool isWrite);

    // volume_resize.cpp
    Problem LoadBitmap();
    void MarkOwned(u32 first, u32 count);
    void NoteUnmarked();
    int Resize(HfsRuns* runs, u32 fileId, u64 newSize);

    // volume_commit.cpp
    void SyncHeader();
    void TakeSnapshot();
    void RememberMapped(u32 fileId);
    int SettleOverflow(u32 fileId);
    int WriteBitmap();
    int WriteHeaders();
    int CarryOver();
    int Commit(unsigned long mode);
    int Close();
    void Restore();
};

}  // namespace VELK
