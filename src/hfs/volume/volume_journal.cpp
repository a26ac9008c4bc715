// The journal of a volume that is being mounted: what waits in it is carried out before anything
// else is read, on the medium or in memory, and the way changes will take is chosen.
#include "hfs/volume/journal_replay.h"
#include "hfs/volume/journal_sink.h"
#include "hfs/volume/volume_state.h"
#include "hfs/volume/wire.h"
#include "hfs/volume/write_checks.h"

namespace VELK {

namespace {

// More than this is not carried out: it is kept in memory until it is known to be sound.
constexpr u64 kMostPending = u64{1} << 30;
constexpr u64 kSmallJournal = 1u << 16;

Problem TransferProblem(const IoResult& result, u64 volumeOffset, bool isWrite) {
    const u64 at = volumeOffset + result.offset;
    Problem problem = FailureAt(at,
                                std::string(isWrite ? "write" : "read") + " error at " +
                                    HexOffset(at) + " (journal): " + IoErrorText(result.error),
                                "");
    problem.status = kErrVolumeIo;
    return problem;
}

Problem PendingNote(const JournalState& journal, const std::string& advice) {
    return FailureAt(journal.offset,
                     "the journal holds transactions (" + Grouped(journal.pendingBytes) + " B)",
                     advice);
}

// Whether the journal leaves a volume of the same shape, whose last writer is still one that keeps
// the journal: or a replay that was cut would not be begun again.
bool LeavesShape(const VolumeHeader& a, const VolumeHeader& b) {
    return a.signature == b.signature && a.blockSize == b.blockSize &&
           a.totalBlocks == b.totalBlocks && a.journalInfoBlock == b.journalInfoBlock &&
           (b.attributes & kVolJournaled) != 0 && KeepsJournal(b.lastMountedVersion);
}

}  // namespace

// Whether the options allow to carry out what waits, and the journal's state makes sense of it.
bool ImageVolume::State::MayReplay() {
    if (!journal.readable || journal.empty) {
        return false;
    }
    if (!KeepsJournal(header.lastMountedVersion)) {
        notes.push_back(
            PendingNote(journal,
                        "not carried out: the volume was last written by a program that "
                        "does not keep the journal"));
        return false;
    }
    if (!options.replay) {
        notes.push_back(PendingNote(journal, "read as the volume stands without them"));
        return false;
    }
    if (journal.pendingBytes > kMostPending) {
        notes.push_back(PendingNote(journal, "not carried out: too much to hold in memory"));
        return false;
    }
    // Locked and cut-off volumes are refused for writing a little later.
    return options.access != Access::kWrite ||
           ((header.attributes & kVolSoftwareLock) == 0 && !IsCutShort());
}

// Everything is first carried out in memory: only when all of it is sound, and gives a volume of
// the same shape, does a byte of the medium change. Interrupted there, it begins again next time,
// since the journal is emptied last.
Problem ImageVolume::State::Replay() {
    auto memory = std::make_unique<OverlayDevice>(image.get());
    SliceDevice from(image.get(), place.offset, volumeBytes);
    SliceDevice to(memory.get(), place.offset, volumeBytes);
    const ReplayResult result = ReplayJournal(&from, journalPlace, &to);
    if (!result.io.Ok()) {
        return TransferProblem(result.io, place.offset, false);
    }
    const bool onMedium = options.access == Access::kWrite;
    if (!result.isComplete) {
        Problem note = FailureAt(place.offset + result.stoppedAt,
                                 "the journal is damaged at " +
                                     Position(place.offset + result.stoppedAt) + ": " + result.text,
                                 "run check, then --force");
        note.check = "V08";
        if (onMedium && !options.force) {
            return note;
        }
        if (onMedium) {
            note.advice = "written to all the same, without what follows there";
        }
        notes.push_back(note);
    }
    const VolumeHeader before = header;
    overlay = std::move(memory);
    if (Problem problem = ReadHeaders()) {
        return problem;
    }
    JournalPlace found;
    const bool staysReadable = ReadJournalState(&to, header, place.offset, &found).readable;
    if (!staysReadable || found.offset != journalPlace.offset || found.size != journalPlace.size ||
        !LeavesShape(before, header)) {
        return FailureAt(journal.offset, "the journal would change the shape of the volume",
                         "run check");
    }
    return FinishReplay(result.transactions, onMedium, result.isComplete);
}

Problem ImageVolume::State::FinishReplay(u32 transactions, bool onMedium, bool isComplete) {
    BlockDevice* target = onMedium ? image.get() : overlay.get();
    if (onMedium) {
        u64 bytes = 0;
        CommitSink direct;
        const IoResult result = direct.Carry(*overlay, image.get(), &bytes);
        overlay.reset();
        if (!result.Ok()) {
            return TransferProblem(result, 0, true);
        }
    }
    SliceDevice to(target, place.offset, volumeBytes);
    journalPlace.header.start = journalPlace.header.end;
    IoResult result = WriteJournalHeader(&to, journalPlace);
    if (result.Ok()) {
        result = target->Sync();
    }
    if (!result.Ok()) {
        return TransferProblem(result, place.offset, true);
    }
    journal.replayed = transactions;
    journal.empty = true;
    journal.pendingBytes = 0;
    journal.isConsistent = isComplete;
    return {};
}

Problem ImageVolume::State::SettleJournal() {
    SliceDevice volumeDevice(image.get(), place.offset, volumeBytes);
    journal = ReadJournalState(&volumeDevice, header, place.offset, &journalPlace);
    journal.isConsistent = journal.present && journal.readable && journal.empty &&
                           KeepsJournal(header.lastMountedVersion);
    if (MayReplay()) {
        if (Problem problem = Replay()) {
            return problem;
        }
    }
    // A volume whose transactions all stand is as good as one that was unmounted.
    if (journal.isConsistent) {
        header.attributes |= kVolUnmounted;
    }
    return {};
}

// REQUIRES: writing was found to be allowed.
Problem ImageVolume::State::ChooseSink() {
    if (!journal.present || !journalPlace.isSound) {
        sink = std::make_unique<HeaderLastSink>(place.offset + kHeaderOffset);
    } else {
        if (place.offset % kJournalSector != 0 || volumeBytes % kJournalSector != 0) {
            return Failure("the volume does not begin and end with a sector",
                           "its journal cannot be written");
        }
        if (journalPlace.offset % journalPlace.header.sectorSize != 0 ||
            journalPlace.size % journalPlace.header.sectorSize != 0) {
            return Failure("the journal does not begin and end with one of its sectors",
                           "it cannot be written");
        }
        JournalSink::Options how;
        how.volumeOffset = place.offset;
        how.volumeBytes = volumeBytes;
        how.mustInit = !journal.readable || !journal.empty;
        how.endsClean = (header.attributes & kVolUnmounted) != 0;
        if ((!journal.readable || journalPlace.needsInit) && journalPlace.size < kSmallJournal) {
            journalPlace.header.listSize = kSmallestList;
        }
        auto made = std::make_unique<JournalSink>(journalPlace, how);
        journalSink = made.get();
        sink = std::move(made);
    }
    transaction->SetSink(sink.get());
    return {};
}

}  // namespace VELK
