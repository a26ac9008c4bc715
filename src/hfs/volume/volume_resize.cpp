// Space for special files: blocks out of the allocation bitmap and back. All of it happens in
// memory, remembered in `bitmapChanges`, and reaches the volume with the next commit.
#include <algorithm>

#include "hfs/volume/volume_state.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

// Free blocks taken for one resize, given back unless the resize succeeds.
class Taken {
public:
    explicit Taken(ImageVolume::State* state)
        : state_(state), changesBefore_(state->bitmapChanges.size()) {}
    ~Taken() {
        if (!kept_) {
            while (state_->bitmapChanges.size() > changesBefore_) {
                const BitmapChange& change = state_->bitmapChanges.back();
                state_->bitmap.ClearRun(change.first, change.count);
                state_->bitmapChanges.pop_back();
            }
        }
    }
    void Take(HfsExtent extent) {
        state_->bitmap.SetRun(extent.startBlock, extent.blockCount);
        state_->bitmapChanges.push_back({extent.startBlock, extent.blockCount, true});
        extents.push_back(extent);
    }
    void Keep() { kept_ = true; }

    std::vector<HfsExtent> extents;

private:
    ImageVolume::State* state_;
    std::size_t changesBefore_;
    bool kept_ = false;
};

u32 EndOfFork(const HfsRuns& runs) {
    if (runs.Count() == 0) {
        return 0;
    }
    const HfsRuns::Run& last = runs.At(runs.Count() - 1);
    return last.lcn + last.length;
}

// One free run that holds all of `wanted`, looked for from `hint` on and then from the start.
bool FindWhole(const CWndBitmap& bitmap, u32 hint, u32 wanted, u32* first) {
    for (const u32 start : {hint, u32{0}}) {
        u32 from = start;
        u32 count = 0;
        while (bitmap.FindZeros(from, wanted, first, &count)) {
            if (count == wanted) {
                return true;
            }
            from = *first + count;
        }
    }
    return false;
}

// Takes `wanted` blocks: next to the fork's end as far as it goes, then in one piece, else in as
// many as it needs from the start of the volume.
bool TakeBlocks(const CWndBitmap& bitmap, u32 forkEnd, u32 hint, u32 wanted, Taken* taken) {
    u32 first = 0;
    u32 count = 0;
    if (bitmap.GetZeros() < wanted) {
        return false;
    }
    if (forkEnd != 0 && bitmap.FindZeros(forkEnd, wanted, &first, &count) && first == forkEnd) {
        taken->Take({first, count});
        wanted -= count;
    }
    if (wanted != 0 && FindWhole(bitmap, hint, wanted, &first)) {
        taken->Take({first, wanted});
        wanted = 0;
    }
    u32 from = 0;
    while (wanted != 0 && bitmap.FindZeros(from, wanted, &first, &count)) {
        taken->Take({first, count});
        wanted -= count;
        from = first + count;
    }
    return wanted == 0;
}

// Gives back every block of the fork from fork block `keep` on.
void FreeBlocks(ImageVolume::State* state, HfsRuns* runs, u32 keep) {
    for (u32 i = 0; i < runs->Count(); ++i) {
        const HfsRuns::Run& run = runs->At(i);
        const u64 end = u64{run.vcn} + run.length;
        if (end <= keep) {
            continue;
        }
        const u32 skip = keep > run.vcn ? keep - run.vcn : 0;
        state->bitmap.ClearRun(run.lcn + skip, run.length - skip);
        state->bitmapChanges.push_back({run.lcn + skip, run.length - skip, false});
    }
    runs->Truncate(keep);
}

}  // namespace

// The allocation file as it is needed: one bit for each block. It may be longer.
Problem ImageVolume::State::LoadBitmap() {
    constexpr u64 kPiece = 1u << 20;
    const u64 bytes = CeilDiv(fs.totalBlocks, 8);
    if (MapFork(kAllocationFileId) == kErrNoMemory) {
        Problem problem = Failure("allocation file: " + StatusWithCode(kErrNoMemory), "");
        problem.status = kErrNoMemory;
        return problem;
    }
    const SpecialFile* file = File(kAllocationFileId);
    const u64 mapped = u64{MappedBlocks(*file->runs)} << fs.allocBlockShift;
    if (mapped < bytes) {
        Problem problem = Failure("allocation file: " + Grouped(mapped) + " bytes for " +
                                      Grouped(fs.totalBlocks) + " blocks",
                                  "the volume can only be read");
        problem.fileId = kAllocationFileId;
        return problem;
    }
    // In pieces: how many blocks there are is what the header claims, and costs no memory before
    // as many marks have been read.
    for (u64 at = 0; at < bytes; at += kPiece) {
        const u64 count = std::min(kPiece, bytes - at);
        bitmapBytes.resize(static_cast<std::size_t>(at + count));
        if (ReadBytes(*file->runs, kAllocationFileId, at, bitmapBytes.data() + at, count) != 0) {
            return lastIo;
        }
    }
    bitmap.Attach(bitmapBytes.data(), fs.totalBlocks);
    const u64 end = volumeBytes - std::min<u64>(volumeBytes, kAltHeaderFromEnd);
    MarkOwned(0, static_cast<u32>(CeilDiv(kHeaderOffset + kHeaderSize, fs.allocBlockSize)));
    MarkOwned(static_cast<u32>(std::min<u64>(end / fs.allocBlockSize, fs.totalBlocks - 1)),
              ~u32{0});
    if (journalPlace.isSound) {
        const u64 behind = journalPlace.offset + journalPlace.size;
        const u32 first = static_cast<u32>(journalPlace.offset / fs.allocBlockSize);
        MarkOwned(header.journalInfoBlock, 1);
        MarkOwned(first, static_cast<u32>(CeilDiv(behind, fs.allocBlockSize)) - first);
    }
    for (const u32 fileId : kSpecialFileIds) {
        for (const HfsExtent& extent : fs.ForkOf(fileId)->extents) {
            MarkOwned(extent.startBlock, extent.blockCount);
        }
    }
    NoteUnmarked();
    return {};
}

// Blocks that headers and special files take are in use whatever the allocation file says: handing
// them out again would destroy the volume. They are only kept from being handed out; the file is
// not corrected, except where a sector of it changes anyway.
void ImageVolume::State::MarkOwned(u32 first, u32 count) {
    if (first < fs.totalBlocks) {
        unmarkedBlocks += bitmap.SetRun(first, std::min(count, fs.totalBlocks - first));
    }
}

void ImageVolume::State::NoteUnmarked() {
    if (unmarkedBlocks != 0) {
        Problem note = Failure("allocation file: " + Grouped(unmarkedBlocks) +
                                   " blocks of headers and special files are marked free",
                               "run check --full");
        note.check = "V05";
        notes.push_back(note);
    }
}

int ImageVolume::State::Resize(HfsRuns* runs, u32 fileId, u64 newSize) {
    HfsFork* fork = fs.ForkOf(fileId);
    if (!isWritable) {
        return kErrVolumeReadOnly;
    }
    const u64 newBlocks = CeilDiv(newSize, fs.allocBlockSize);
    if (fork == nullptr || MappedBlocks(*runs) != fork->totalBlocks) {
        return kErrVolumeUnmapped;
    }
    if (newBlocks > fs.totalBlocks) {
        return kErrNoSpace;
    }
    const u32 oldBlocks = fork->totalBlocks;
    if (newBlocks > oldBlocks) {
        Taken taken(this);
        if (!TakeBlocks(bitmap, EndOfFork(*runs), header.nextAllocation,
                        static_cast<u32>(newBlocks) - oldBlocks, &taken)) {
            return kErrNoSpace;
        }
        u32 next = oldBlocks;
        for (const HfsExtent& extent : taken.extents) {
            if (!runs->AddEntry(next, extent.startBlock, extent.blockCount)) {
                runs->Truncate(oldBlocks);
                return kErrNoMemory;
            }
            next += extent.blockCount;
        }
        // Only records of the extents tree can hold more than eight extents, and none of them may
        // belong to that tree itself.
        if (runs->Count() > kExtentCount &&
            (fileId == kExtentsFileId || !HasFork(kExtentsFileId))) {
            runs->Truncate(oldBlocks);
            return kErrNoSpace;
        }
        taken.Keep();
        header.nextAllocation = EndOfFork(*runs);
    } else if (newBlocks < oldBlocks) {
        FreeBlocks(this, runs, static_cast<u32>(newBlocks));
    }
    fork->logicalSize = newSize;
    fork->totalBlocks = static_cast<u32>(newBlocks);
    SetInlineExtents(*runs, fork);
    return kOk;
}

}  // namespace VELK
