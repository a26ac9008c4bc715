// Mounting: place, header, alternate header, forks, map block, journal. Reads the volume and
// changes nothing.
#include <algorithm>
#include <bit>

#include "hfs/volume/volume_state.h"
#include "hfs/volume/wire.h"
#include "hfs/volume/write_checks.h"

namespace VELK {

namespace {

constexpr u32 kNodeSizeInFork = kHeadNodeSize;  // node 0 starts the fork

bool ReadHeaderAt(BlockDevice* image, u64 offset, VolumeHeader* header) {
    u8 bytes[kHeaderSize];
    if (!image->Read(offset, bytes, sizeof bytes).Ok()) {
        return false;
    }
    DecodeHeader(bytes, header);
    return true;
}

bool LooksLikeHeader(const VolumeHeader& header) {
    return (header.signature == kSignatureHfsPlus || header.signature == kSignatureHfsx) &&
           IsPowerOfTwo(header.blockSize) && header.blockSize >= kSectorSize;
}

// The alternate header stands 1,024 bytes before the volume's end. Where the map (or the image)
// does not end with the volume, that end is known only to within one block.
std::optional<u64> FindAlternate(BlockDevice* image, const VolumePlace& place,
                                 const VolumeHeader* main, VolumeHeader* header) {
    std::vector<u64> sizes = {place.size};
    if (main != nullptr) {
        const u64 size = u64{main->totalBlocks} * main->blockSize;
        for (u64 tail = 0; tail < main->blockSize && tail < (u64{1} << 16); tail += kSectorSize) {
            sizes.push_back(size + tail);
        }
    }
    for (const u64 size : sizes) {
        if (size < 2 * kHeaderOffset + kHeaderSize) {
            continue;
        }
        const u64 at = place.offset + size - kAltHeaderFromEnd;
        if (ReadHeaderAt(image, at, header) && LooksLikeHeader(*header) &&
            (main == nullptr || header->blockSize == main->blockSize)) {
            return at;
        }
    }
    return std::nullopt;
}

std::string VolumeWords(const VolumePlace& place) {
    return place.partition == 0 ? std::string("the volume")
                                : Format("the volume (partition %u)", place.partition);
}

Problem TruncatedNote(u64 imageSize, const VolumePlace& place, u64 end) {
    Problem note = FailureAt(
        imageSize,
        "image ends at " + Position(imageSize) + ", " + VolumeWords(place) + " at " + Position(end),
        "reading what is there; check and dump need --keep-going");
    note.status = kErrVolumeTruncated;
    note.check = "V02";
    return note;
}

bool Overlap(u64 start, u64 count, u64 otherStart, u64 otherCount) {
    return count != 0 && otherCount != 0 && start < otherStart + otherCount &&
           otherStart < start + count;
}

Problem OverlapNote(const std::string& what) {
    Problem note = Failure(what, "run check");
    note.check = "V04";
    return note;
}

// Extents of different special files that claim the same blocks.
void NoteSharedBlocks(const VolumeHeader& header, std::vector<Problem>* notes) {
    for (std::size_t i = 0; i < kSpecialFileIds.size(); ++i) {
        for (std::size_t j = i + 1; j < kSpecialFileIds.size(); ++j) {
            const HfsFork* a = header.ForkOf(kSpecialFileIds[i]);
            const HfsFork* b = header.ForkOf(kSpecialFileIds[j]);
            bool overlap = false;
            for (const HfsExtent& x : a->extents) {
                for (const HfsExtent& y : b->extents) {
                    overlap =
                        overlap || Overlap(x.startBlock, x.blockCount, y.startBlock, y.blockCount);
                }
            }
            if (overlap) {
                notes->push_back(OverlapNote(std::string(ForkName(kSpecialFileIds[i])) +
                                             " file and " + ForkName(kSpecialFileIds[j]) +
                                             " file claim the same blocks"));
            }
        }
    }
}

// Extents of special files that lie over the volume header or its copy.
void NoteCoveredHeaders(const VolumeHeader& header, u64 volumeBytes, std::vector<Problem>* notes) {
    for (const u32 fileId : kSpecialFileIds) {
        bool overlap = false;
        for (const HfsExtent& extent : header.ForkOf(fileId)->extents) {
            const u64 start = u64{extent.startBlock} * header.blockSize;
            const u64 bytes = u64{extent.blockCount} * header.blockSize;
            overlap = overlap || Overlap(start, bytes, kHeaderOffset, kHeaderSize) ||
                      Overlap(start, bytes, volumeBytes - kAltHeaderFromEnd, kHeaderSize);
        }
        if (overlap) {
            notes->push_back(OverlapNote(std::string(ForkName(fileId)) +
                                         " file claims the blocks of a volume header"));
        }
    }
}

void NoteOverlaps(const VolumeHeader& header, u64 volumeBytes, std::vector<Problem>* notes) {
    NoteSharedBlocks(header, notes);
    NoteCoveredHeaders(header, volumeBytes, notes);
}

// What a tree's header gives as its node size, 0 when it cannot be read.
u32 StatedNodeSize(ImageVolume::State* state, u32 fileId) {
    const HfsFork* fork = state->header.ForkOf(fileId);
    if (fork->extents[0].blockCount == 0) {
        return 0;
    }
    u8 bytes[2];
    const u64 at = u64{fork->extents[0].startBlock} * state->header.blockSize + kNodeSizeInFork;
    if (!state->volume->Read(at, bytes, sizeof bytes).Ok()) {
        return 0;
    }
    return Be16(bytes);
}

bool IsNodeSize(u32 size) {
    return IsPowerOfTwo(size) && size >= (1u << kMinNodeShift) && size <= (1u << kMaxNodeShift);
}

// The map block is the smallest node size of the volume's trees, so that nearly every node is one
// block whatever the allocation block.
Problem ChooseMapBlock(ImageVolume::State* state) {
    u32 smallest = 0;
    for (std::size_t i = 0; i < kTreeCount; ++i) {
        const u32 size = StatedNodeSize(state, kSpecialFileIds[i]);
        if (IsNodeSize(size) && (smallest == 0 || size < smallest)) {
            smallest = size;
        }
    }
    const u32 wanted = state->options.mapBlockSize;
    if (wanted != 0) {
        if (!IsPowerOfTwo(wanted) || wanted < kSectorSize || wanted > (1u << kMaxNodeShift)) {
            return UsageProblem(
                "map block " + std::to_string(wanted) + " is not a power of two from 512 to 32,768",
                "");
        }
        if (smallest != 0 && wanted > smallest) {
            return UsageProblem("map block " + Grouped(wanted) +
                                    ": the smallest node of the volume has " + Grouped(smallest) +
                                    " bytes",
                                "give at most that");
        }
        smallest = wanted;
    } else if (smallest == 0) {
        smallest = kSectorSize;
    }
    state->fs.mapBlockSize = static_cast<u16>(smallest);
    state->fs.mapBlockShift = Log2(smallest);
    return {};
}

void FillFileSystem(ImageVolume::State* state) {
    const VolumeHeader& header = state->header;
    CFileSystemHfs& fs = state->fs;
    fs.allocBlockSize = header.blockSize;
    fs.allocBlockShift = Log2(header.blockSize);
    fs.totalBlocks = header.totalBlocks;
    fs.volumeSize = state->volumeBytes;
    fs.version = header.version;
    fs.defaultClumpSize = header.dataClumpSize;
    for (const u32 fileId : kSpecialFileIds) {
        *fs.ForkOf(fileId) = *header.ForkOf(fileId);
    }
    state->InstallServices();
}

// Stacks the devices: image, changes in memory, open transaction, the volume's part of it.
void StackDevices(ImageVolume::State* state) {
    if (state->options.access == Access::kOverlay && !state->overlay) {
        state->overlay = std::make_unique<OverlayDevice>(state->image.get());
    }
    BlockDevice* top = state->Base();
    if (state->options.access != Access::kReadOnly) {
        state->transaction = std::make_unique<Transaction>(top);
        top = state->transaction->Staged();
    }
    state->volume = std::make_unique<SliceDevice>(top, state->place.offset, state->volumeBytes);
}

// Where the volume ends: with its blocks, or a little behind them where its partition does.
u64 MeasureVolume(const ImageVolume::State& state) {
    const u64 blocksBytes = u64{state.header.totalBlocks} * state.header.blockSize;
    if (state.place.size < blocksBytes + state.header.blockSize) {
        return std::max(state.place.size, blocksBytes);
    }
    const u64 start = state.place.offset;
    return state.alternateOffset &&
                   *state.alternateOffset >= start + blocksBytes - kAltHeaderFromEnd
               ? *state.alternateOffset + kAltHeaderFromEnd - start
               : blocksBytes;
}

}  // namespace

Problem ImageVolume::State::ReadHeaders() {
    const u64 mainOffset = place.offset + kHeaderOffset;
    const bool hasMain = ReadHeaderAt(Base(), mainOffset, &header);
    const Problem mainProblem =
        hasMain ? CheckHeader(header, mainOffset)
                : FailureAt(mainOffset, "volume header at " + Position(mainOffset) + ": unreadable",
                            "try --backup-header");
    alternateOffset = FindAlternate(Base(), place, mainProblem ? nullptr : &header, &alternate);
    if (!options.backupHeader) {
        return mainProblem;
    }
    if (!alternateOffset) {
        return FailureAt(place.offset + place.size - kAltHeaderFromEnd,
                         "alternate volume header at " +
                             Position(place.offset + place.size - kAltHeaderFromEnd) +
                             ": there is none",
                         "");
    }
    header = alternate;
    usedBackup = true;
    Problem problem = CheckHeader(header, *alternateOffset);
    problem.advice.clear();
    return problem;
}

bool ImageVolume::State::IsCutShort() const {
    return place.offset + u64{header.totalBlocks} * header.blockSize > image->Size();
}

Problem ImageVolume::State::Mount(VolumeScan* scan) {
    PlaceOptions where;
    where.offset = options.offset;
    where.partition = options.partition;
    where.lenient = options.backupHeader;
    if (Problem problem = LocateVolume(image.get(), where, scan)) {
        return problem;
    }
    place = scan->place;
    if (Problem problem = ReadHeaders()) {
        return problem;
    }
    volumeBytes = MeasureVolume(*this);
    if (Problem problem = SettleJournal()) {
        return problem;
    }
    StackDevices(this);
    FillFileSystem(this);
    if (Problem problem = ChooseMapBlock(this)) {
        return problem;
    }
    isTruncated = IsCutShort();
    if (isTruncated) {
        notes.insert(notes.begin(),
                     TruncatedNote(image->Size(), place,
                                   place.offset + u64{header.totalBlocks} * header.blockSize));
    }
    return options.access == Access::kReadOnly ? FinishReading() : PrepareWriting();
}

Problem ImageVolume::State::FinishReading() {
    NoteOverlaps(header, volumeBytes, &notes);
    return {};
}

// What no change can build on, whatever the user insists on: it would write over something else.
Problem ImageVolume::State::CheckShape(const std::vector<Problem>& overlaps) {
    Problem problem = isTruncated ? notes.front() : overlaps.empty() ? Problem{} : overlaps.front();
    for (std::size_t i = 0; i < kTreeCount && !problem; ++i) {
        const u32 fileId = kSpecialFileIds[i];
        problem = CheckForkExtents(*header.ForkOf(fileId), header.totalBlocks, fileId);
        const u32 size = StatedNodeSize(this, fileId);
        if (!problem && size != 0 && !IsNodeSize(size)) {
            problem = Failure(Format("%s tree: node size %u is not a power of two from 512 to "
                                     "32,768",
                                     ForkName(fileId), size),
                              "");
            problem.check = "H02";
        }
    }
    problem.advice = "the volume can only be read";
    return problem;
}

// With --force what would be refused becomes a remark.
void ImageVolume::State::NoteWhatForcePassed() {
    if (Problem passed = CheckMayWrite(header, journal, false)) {
        passed.advice = "written to all the same";
        notes.push_back(passed);
    }
}

Problem ImageVolume::State::PrepareWriting() {
    std::vector<Problem> overlaps;
    NoteOverlaps(header, volumeBytes, &overlaps);
    writeObstacle = CheckMayWrite(header, journal, options.force);
    if (!writeObstacle) {
        writeObstacle = CheckShape(overlaps);
    }
    isWritable = true;
    if (options.access == Access::kWrite) {
        if (writeObstacle) {
            return writeObstacle;
        }
        NoteWhatForcePassed();
        if (Problem problem = ChooseSink()) {
            return problem;
        }
        InstallJournal();
    }
    notes.insert(notes.end(), overlaps.begin(), overlaps.end());
    if (Problem problem = LoadBitmap()) {
        return problem;
    }
    TakeSnapshot();
    return {};
}

}  // namespace VELK
