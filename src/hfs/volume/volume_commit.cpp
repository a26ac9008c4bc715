// One transaction over everything that changes: trees, overflow records, allocation file, headers.
// A commit brings all of it into the staged changes and carries them over; a restore forgets them
// and puts the parts kept in memory back to where the last commit left them.
#include <algorithm>
#include <cstring>

#include "hfs/volume/journal_sink.h"
#include "hfs/volume/volume_state.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

// "tref": last mounted version written by this layer where it keeps no journal.
constexpr u32 kOwnCode = 0x74726566;

void CopyRuns(const HfsRuns& runs, std::vector<HfsRuns::Run>* copy) {
    copy->clear();
    for (u32 i = 0; i < runs.Count(); ++i) {
        copy->push_back(runs.At(i));
    }
}

// REQUIRES: the runs held as many entries before, so that no memory is needed.
void PutRunsBack(const std::vector<HfsRuns::Run>& copy, HfsRuns* runs) {
    runs->Clear();
    for (const HfsRuns::Run& run : copy) {
        runs->AddEntry(run.vcn, run.lcn, run.length);
    }
}

bool SameFork(const HfsFork& a, const HfsFork& b) {
    return std::memcmp(&a, &b, sizeof a) == 0;
}

}  // namespace

// The header's forks and free blocks follow the parts the engine works on.
void ImageVolume::State::SyncHeader() {
    for (const u32 fileId : kSpecialFileIds) {
        *header.ForkOf(fileId) = *fs.ForkOf(fileId);
    }
    if (bitmap.Size() != 0) {
        header.freeBlocks = bitmap.GetZeros();
    }
}

void ImageVolume::State::TakeSnapshot() {
    SyncHeader();
    committed.header = header;
    for (std::size_t i = 0; i < files.size(); ++i) {
        committed.forks[i].fork = *fs.ForkOf(files[i].fileId);
        CopyRuns(*files[i].runs, &committed.forks[i].runs);
        committed.forks[i].overflow = files[i].overflow;
    }
    for (std::size_t i = 0; i < trees.size(); ++i) {
        committed.validNodes[i] = trees[i].Get()->validNodes;
        trees[i].isNew = false;
    }
    bitmapChanges.clear();
    grantedBytes = 0;
}

// A fork that is mapped for the first time still lies where the last commit left it: nothing can be
// changed about a fork that was not mapped.
void ImageVolume::State::RememberMapped(u32 fileId) {
    for (std::size_t i = 0; i < files.size(); ++i) {
        if (files[i].fileId == fileId) {
            CopyRuns(*files[i].runs, &committed.forks[i].runs);
            committed.forks[i].overflow = files[i].overflow;
        }
    }
}

// Stages the sectors of the allocation file whose bits changed.
int ImageVolume::State::WriteBitmap() {
    const SpecialFile* file = File(kAllocationFileId);
    for (const BitmapChange& change : bitmapChanges) {
        const u64 from = change.first / 8 / kSectorSize * kSectorSize;
        const u64 to = std::min<u64>(
            RoundUp((u64{change.first} + change.count + 7) / 8, kSectorSize), bitmapBytes.size());
        const int status =
            WriteBytes(*file->runs, kAllocationFileId, from, bitmapBytes.data() + from, to - from);
        if (status != kOk) {
            return status;
        }
    }
    return kOk;
}

// The volume header when anything changed; the alternate one when a special file changed its size
// or place.
int ImageVolume::State::WriteHeaders() {
    SyncHeader();
    u8 before[kHeaderSize];
    u8 bytes[kHeaderSize];
    EncodeHeader(committed.header, before);
    EncodeHeader(header, bytes);
    if (transaction->IsEmpty() && std::memcmp(before, bytes, sizeof bytes) == 0) {
        return kOk;
    }
    if (!wasWritten) {
        header.lastMountedVersion = journalSink != nullptr ? kKeeperCode : kOwnCode;
        header.writeCount += 1;
        EncodeHeader(header, bytes);
    }
    bool forksChanged = false;
    for (const u32 fileId : kSpecialFileIds) {
        forksChanged =
            forksChanged || !SameFork(*header.ForkOf(fileId), *committed.header.ForkOf(fileId));
    }
    IoResult result = volume->Write(kHeaderOffset, bytes, sizeof bytes);
    if (result.Ok() && forksChanged && alternateOffset) {
        result = volume->Write(*alternateOffset - place.offset, bytes, sizeof bytes);
        alternate = header;
    }
    return result.Ok() ? kOk : IoStatus(result, 0, kHeaderOffset, true);
}

int ImageVolume::State::Commit(unsigned long mode) {
    if (!isWritable) {
        return kErrVolumeReadOnly;
    }
    int status = kOk;
    // The extents tree comes last: overflow records of the others go into it.
    for (const u32 fileId : {kCatalogFileId, kAttributesFileId}) {
        if (status == kOk && Slot(fileId)->isOpen) {
            status = Slot(fileId)->Get()->Flush(mode);
        }
    }
    for (const u32 fileId : {kCatalogFileId, kAttributesFileId}) {
        if (status == kOk && File(fileId)->isMapped) {
            status = SettleOverflow(fileId);
        }
    }
    if (status == kOk && Slot(kExtentsFileId)->isOpen) {
        status = Slot(kExtentsFileId)->Get()->Flush(mode);
    }
    if (status == kOk) {
        status = WriteBitmap();
    }
    if (status == kOk) {
        status = WriteHeaders();
    }
    if (status != kOk) {
        Restore();
        return status;
    }
    status = transaction->IsEmpty() ? kOk : CarryOver();
    if (status == kOk) {
        TakeSnapshot();
    }
    return status;
}

int ImageVolume::State::CarryOver() {
    const IoResult result = transaction->Commit();
    if (result.Ok()) {
        wasWritten = true;
        return kOk;
    }
    if (result.error == kIoTooLarge) {
        lastIo =
            FailureAt(journal.offset,
                      "the changes take " + Grouped(journalSink->Needed()) +
                          " bytes of the journal, which holds " + Grouped(journalSink->Largest()),
                      "commit more often");
        lastIo.status = kErrVolumeJournal;
        Restore();
        return kErrVolumeJournal;
    }
    // A part may have reached the image. The staged changes stay in front of it, so that what is
    // read goes on agreeing with itself.
    isWritable = false;
    return IoStatus({result.error, result.offset - std::min(result.offset, place.offset)}, 0, 0,
                    true);
}

int ImageVolume::State::Close() {
    isWritable = false;
    const IoResult result = transaction ? transaction->Finish() : IoResult{};
    return result.Ok()
               ? kOk
               : IoStatus({result.error, result.offset - std::min(result.offset, place.offset)}, 0,
                          0, true);
}

void ImageVolume::State::Restore() {
    if (!transaction) {
        return;
    }
    transaction->Abort();
    grantedBytes = 0;
    while (!bitmapChanges.empty()) {
        const BitmapChange change = bitmapChanges.back();
        bitmapChanges.pop_back();
        if (change.set) {
            bitmap.ClearRun(change.first, change.count);
        } else {
            bitmap.SetRun(change.first, change.count);
        }
    }
    header = committed.header;
    for (std::size_t i = 0; i < files.size(); ++i) {
        const CommittedFork& fork = committed.forks[i];
        *fs.ForkOf(files[i].fileId) = fork.fork;
        if (files[i].isMapped && !fork.runs.empty()) {
            PutRunsBack(fork.runs, files[i].runs);
            files[i].overflow = fork.overflow;
        } else {
            files[i].runs->Clear();
            files[i].overflow.clear();
            files[i].isMapped = false;
        }
    }
    for (std::size_t i = 0; i < trees.size(); ++i) {
        TreeSlot* slot = &trees[i];
        CBTreeHfs* tree = slot->Get();
        EndReservation(tree);
        if (slot->isNew) {
            ResetTree(slot, kSpecialFileIds[i]);
        } else if (slot->isOpen) {
            tree->RestoreModifiedNodes();
            tree->findData.level = 0;
            tree->findData.valid = false;
            if (committed.validNodes[i] != 0) {
                tree->validNodes = committed.validNodes[i];
            }
            // The header node stays cached when its record could be read again.
            isWritable = isWritable && !tree->IsDirty() && tree->nodeRoot != nullptr;
        }
    }
}

}  // namespace VELK
