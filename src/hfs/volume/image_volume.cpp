// The public face of a mounted volume: opening, looking, raw reading.
#include "hfs/volume/image_volume.h"

#include <algorithm>

#include "hfs/volume/journal_sink.h"
#include "hfs/volume/read_witness.h"
#include "hfs/volume/volume_state.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

// What a mount comes to on a medium that failed to read something: a failure has its reason there,
// and nobody writes to it who is not told to do so whatever the volume is like.
Problem ReadTrouble(const Problem& problem, const IoResult& failure, const OpenOptions& options) {
    const bool isRefused = options.access == Access::kWrite && !options.force;
    if (failure.Ok() || (problem ? problem.status != 0 : !isRefused)) {
        return problem;
    }
    Problem trouble =
        FailureAt(failure.offset,
                  "read error at " + HexOffset(failure.offset) + ": " + IoErrorText(failure.error),
                  problem ? problem.advice : "the volume can only be read");
    trouble.status = failure.error == kIoNoMemory ? kErrNoMemory : kErrVolumeIo;
    return trouble;
}

}  // namespace

ImageVolume::ImageVolume(std::unique_ptr<State> state) : state_(std::move(state)) {}
ImageVolume::~ImageVolume() = default;

std::unique_ptr<ImageVolume> ImageVolume::Open(std::unique_ptr<BlockDevice> image,
                                               const OpenOptions& options, VolumeScan* scan,
                                               Problem* problem) {
    VolumeScan ownScan;
    auto state = std::make_unique<State>();
    auto watched = std::make_unique<ReadWitness>(std::move(image));
    const ReadWitness& witness = *watched;
    state->image = std::move(watched);
    state->options = options;
    *problem = state->Mount(scan != nullptr ? scan : &ownScan);
    *problem = ReadTrouble(*problem, witness.FirstFailure(), options);
    if (*problem) {
        return nullptr;
    }
    return std::unique_ptr<ImageVolume>(new ImageVolume(std::move(state)));
}

std::unique_ptr<ImageVolume> ImageVolume::OpenFile(const std::string& path,
                                                   const OpenOptions& options, VolumeScan* scan,
                                                   Problem* problem) {
    const auto mode =
        options.access == Access::kWrite ? FileDevice::Mode::kReadWrite : FileDevice::Mode::kRead;
    std::unique_ptr<FileDevice> image = FileDevice::Open(path, mode, 0, problem);
    if (!image) {
        return nullptr;
    }
    return Open(std::move(image), options, scan, problem);
}

CFileSystemHfs* ImageVolume::Fs() {
    return &state_->fs;
}

const VolumeHeader& ImageVolume::Header() const {
    state_->SyncHeader();
    return state_->header;
}

const VolumePlace& ImageVolume::Place() const {
    return state_->place;
}

const std::vector<Problem>& ImageVolume::Notes() const {
    return state_->notes;
}

const Problem& ImageVolume::WriteObstacle() const {
    return state_->writeObstacle;
}

bool ImageVolume::IsTruncated() const {
    return state_->isTruncated;
}

const JournalState& ImageVolume::Journal() const {
    return state_->journal;
}

const VolumeHeader* ImageVolume::AlternateHeader(u64* offset) const {
    if (!state_->alternateOffset) {
        return nullptr;
    }
    if (offset != nullptr) {
        *offset = *state_->alternateOffset;
    }
    return &state_->alternate;
}

bool ImageVolume::UsedBackupHeader() const {
    return state_->usedBackup;
}

bool ImageVolume::HasTree(u32 fileId) const {
    return state_->Slot(fileId) != nullptr && state_->HasFork(fileId);
}

CBTreeHfs* ImageVolume::Tree(u32 fileId, Problem* problem) {
    CBTreeHfs* tree = state_->Open(fileId);
    if (tree == nullptr && problem != nullptr) {
        const TreeSlot* slot = state_->Slot(fileId);
        *problem = slot != nullptr
                       ? slot->problem
                       : UsageProblem("file " + std::to_string(fileId) + " is no tree", "");
    }
    return tree;
}

CBTreeHfs* ImageVolume::OpenTree(u32 fileId) {
    TreeSlot* slot = state_->Slot(fileId);
    return slot != nullptr && slot->isOpen ? slot->Get() : nullptr;
}

std::optional<u64> ImageVolume::ImageOffset(u32 fileId, u64 forkOffset) {
    const SpecialFile* file = state_->File(fileId);
    if (file == nullptr) {
        return std::nullopt;
    }
    state_->MapFork(fileId);
    std::optional<u64> found;
    ForEachPiece(*file->runs, state_->fs.allocBlockShift, forkOffset, 1, kErrVolumeUnmapped,
                 [&](u64 at, u64, u64) {
                     found = state_->place.offset + at;
                     return 0;
                 });
    return found;
}

int ImageVolume::ReadFork(u32 fileId, u64 forkOffset, void* target, u32 bytes) {
    const SpecialFile* file = state_->File(fileId);
    if (file == nullptr) {
        return kErrInvalid;
    }
    state_->MapFork(fileId);
    return state_->ReadBytes(*file->runs, fileId, forkOffset, target, bytes);
}

u64 ImageVolume::ForkBytes(u32 fileId) {
    const SpecialFile* file = state_->File(fileId);
    if (file == nullptr) {
        return 0;
    }
    state_->MapFork(fileId);
    const u64 mapped = u64{MappedBlocks(*file->runs)} << state_->fs.allocBlockShift;
    return std::min(mapped, state_->fs.ForkOf(fileId)->logicalSize);
}

std::vector<HfsExtent> ImageVolume::ForkExtents(u32 fileId) {
    std::vector<HfsExtent> extents;
    const SpecialFile* file = state_->File(fileId);
    if (file != nullptr) {
        state_->MapFork(fileId);
        for (u32 i = 0; i < file->runs->Count(); ++i) {
            extents.push_back({file->runs->At(i).lcn, file->runs->At(i).length});
        }
    }
    return extents;
}

int ImageVolume::ReadVolume(u64 offset, void* target, u64 bytes) {
    const IoResult result = state_->volume->Read(offset, target, static_cast<std::size_t>(bytes));
    return result.Ok() ? 0 : state_->IoStatus(result, 0, offset, false);
}

const Problem& ImageVolume::LastIoProblem() const {
    return state_->lastIo;
}

bool ImageVolume::IsWritable() const {
    return state_->isWritable;
}

u64 ImageVolume::HandedOverBlocks() const {
    return state_->handedOver;
}

bool ImageVolume::IsCommitDue() const {
    if (state_->journalSink == nullptr || state_->grantedBytes == 0) {
        return false;
    }
    const u64 most = state_->journalSink->Largest();
    return state_->grantedBytes >= most / 2 ||
           state_->grantedBytes + state_->LargestOperation() >= most;
}

u64 ImageVolume::CommittedBytes() const {
    return state_->transaction ? state_->transaction->BytesWritten() : 0;
}

int ImageVolume::Commit(unsigned long mode) {
    return state_->Commit(mode);
}

int ImageVolume::Close() {
    return state_->Close();
}

void ImageVolume::Restore() {
    state_->Restore();
}

bool ImageVolume::RestoreAfter(int status) {
    if (status == kOk || status == kErrNotFound || status == kErrExists || status == kErrTooLarge ||
        !state_->isWritable) {
        return false;
    }
    state_->Restore();
    return true;
}

void ImageVolume::CountCatalogRecord(u16 recordType, u32 id, int change) {
    constexpr u16 kFolderRecord = 1;
    constexpr u16 kFileRecord = 2;
    VolumeHeader& header = state_->header;
    if (recordType == kFolderRecord && id != kRootFolderId) {
        header.folderCount += static_cast<u32>(change);
    } else if (recordType == kFileRecord) {
        header.fileCount += static_cast<u32>(change);
    } else {
        return;
    }
    if (change > 0 && id >= header.nextCatalogId && id != ~u32{0}) {
        header.nextCatalogId = id + 1;
    }
}

void ImageVolume::SetModifyDate(u32 date) {
    state_->header.modifyDate = date;
}

Problem ImageVolume::SaveTo(std::FILE* file) {
    BlockDevice* home = state_->transaction ? state_->transaction->Home() : state_->image.get();
    std::vector<u8> buffer(std::size_t{1} << 20);
    for (u64 offset = 0; offset < home->Size();) {
        const u64 left = home->Size() - offset;
        const std::size_t piece = static_cast<std::size_t>(std::min<u64>(left, buffer.size()));
        const IoResult result = home->Read(offset, buffer.data(), piece);
        if (!result.Ok()) {
            return FailureAt(
                result.offset,
                "read error at " + HexOffset(result.offset) + ": " + IoErrorText(result.error), "");
        }
        if (std::fwrite(buffer.data(), 1, piece, file) != piece) {
            return Failure("cannot write the copy: disk full or not writable", "");
        }
        offset += piece;
    }
    return std::fflush(file) == 0 ? Problem{} : Failure("cannot write the copy", "");
}

}  // namespace VELK
