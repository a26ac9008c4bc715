// Opening and finishing the volume of a script.
#include "tool/script_volume.h"

#include <fmt/format.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>

#include "hfs/records/text_format.h"
#include "hfs/volume/make_volume.h"
#include "tool/errors.h"
#include "tool/options.h"
#include "tool/undo_file.h"
#include "tool/write_gate.h"

namespace VELK::tool {
namespace {

struct NamedNumber {
    const char* name;
    u32* target;
};

[[noreturn]] void ThrowNewVolume(const std::string& word, const std::string& what) {
    ThrowUsage("", fmt::format("--new: '{}' {}", word, what),
               "SIZE[,block=N][,map=N][,node=N][,clump=N][,case][,empty]");
}

// One item behind the size of --new.
void ApplyItem(const std::string& item, FormatOptions* options) {
    if (item == "case") {
        options->caseSensitive = true;
        return;
    }
    if (item == "empty") {
        options->emptyTrees = true;
        return;
    }
    u32 nodeSize = 0;
    const NamedNumber numbers[] = {{"block", &options->blockSize},
                                   {"map", &options->mapBlockSize},
                                   {"node", &nodeSize},
                                   {"clump", &options->clumpSize}};
    const std::size_t equal = item.find('=');
    for (const NamedNumber& number : numbers) {
        u64 value = 0;
        if (item.substr(0, equal) != number.name) {
            continue;
        }
        if (equal == std::string::npos) {
            ThrowNewVolume(item, "needs a value");
        }
        if (!ParseSize(item.substr(equal + 1), &value) || value == 0 || value > 0xFFFFFFFF) {
            ThrowNewVolume(item, "is no size in bytes");
        }
        *number.target = static_cast<u32>(value);
        if (nodeSize != 0) {
            options->catalogNodeSize = nodeSize;
            options->extentsNodeSize = nodeSize;
            options->attributesNodeSize = nodeSize;
        }
        return;
    }
    ThrowNewVolume(item,
                   "is unknown" + DidYouMean(item.substr(0, equal),
                                             {"block", "map", "node", "clump", "case", "empty"}));
}

std::unique_ptr<ImageVolume> OpenNew(const TargetOptions& target) {
    FormatOptions options;
    const std::string& text = target.newVolume;
    std::size_t at = std::min(text.find(','), text.size());
    u64 size = 0;
    if (!ParseSize(text.substr(0, at), &size) || size == 0) {
        ThrowNewVolume(text.substr(0, at), "is no size in bytes");
    }
    while (at < text.size()) {
        const std::size_t end = std::min(text.find(',', at + 1), text.size());
        ApplyItem(text.substr(at + 1, end - at - 1), &options);
        at = end;
    }
    Problem problem;
    std::unique_ptr<ImageVolume> volume = MakeMemoryVolume(size, options, &problem);
    if (!volume) {
        ThrowProblem("--new", problem);
    }
    return volume;
}

// Whether two names, of files that need not be there yet, lead to one.
bool IsSameFile(const std::string& one, const std::string& other) {
    namespace files = std::filesystem;
    std::error_code none;
    const auto place = [&none](const std::string& name) {
        return files::weakly_canonical(files::absolute(name, none), none);
    };
    return place(one) == place(other) || files::equivalent(one, other, none);
}

// REQUIRES of a file that is to be written: it is not there, or --force replaces it.
void CheckReplaces(const TargetOptions& options, const std::string& file) {
    if (!options.force && !file.empty() && access(file.c_str(), F_OK) == 0) {
        ThrowFailed("", file + " exists", "--force replaces it");
    }
}

void Save(const TargetOptions& options, ImageVolume* volume) {
    CheckReplaces(options, options.saveFile);
    const std::string part = options.saveFile + ".part";
    std::FILE* file = std::fopen(part.c_str(), "wb");
    if (file == nullptr) {
        ThrowFailed(options.saveFile, "cannot be written", "");
    }
    Problem problem = volume->SaveTo(file);
    if (std::fclose(file) != 0 && !problem) {
        problem = Failure("cannot write the copy: disk full or not writable", "");
    }
    if (!problem && std::rename(part.c_str(), options.saveFile.c_str()) != 0) {
        problem = Failure("cannot be written", "");
    }
    if (problem) {
        std::remove(part.c_str());
        ThrowProblem(options.saveFile, problem);
    }
}

// What a person should know before changes are made: among it what was done to the journal.
void TellNotes(const std::string& image, const ImageVolume& volume) {
    for (const Problem& note : volume.Notes()) {
        PrintNote(image, note);
    }
    const u32 replayed = volume.Journal().replayed;
    if (replayed != 0) {
        PrintNote(image, Failure(fmt::format("the journal held {}",
                                             Counted(replayed, "transaction", "transactions")),
                                 "carried out before anything else"));
    }
}

// The last commit. A volume that a failure has closed to changes has lost some already.
void KeepRest(const std::string& subject, ImageVolume* volume) {
    const bool wasWritable = volume->IsWritable();
    const int status = wasWritable ? volume->Commit(0) : kErrVolumeReadOnly;
    if (status == kOk) {
        return;
    }
    Problem problem = !wasWritable && volume->LastIoProblem() ? volume->LastIoProblem()
                                                              : CommitProblem(volume, status);
    problem.what = "the last changes could not be kept: " + problem.what;
    ThrowProblem(subject, problem);
}

}  // namespace

void TargetOptions::Declare(Invocation* call) {
    call->options.Text("--new", &newVolume, "SIZE[,...]",
                       "a fresh volume in memory instead of an image: 64M, 1M,node=512, also "
                       "block=N map=N clump=N case empty");
    DeclareForImage(call);
}

void TargetOptions::DeclareForImage(Invocation* call) {
    call->DeclarePlace();
    call->options.Text("--save", &saveFile, "FILE", "write the volume to FILE afterwards");
    call->options.Flag("--write", &write, "let changes reach the image");
    call->options.Text("--undo", &undoFile, "FILE",
                       "with --write: keep what is overwritten, for the command undo");
    call->options.Flag("--force", &force,
                       "write to a damaged volume, one with a journal or not unmounted; replace "
                       "FILE");
}

std::string TargetOptions::Subject(const Invocation& call) const {
    return newVolume.empty() ? call.image : "new volume";
}

namespace {

std::unique_ptr<ImageVolume> OpenWithUndo(const Invocation& call, const TargetOptions& target,
                                          const OpenOptions& options, Problem* problem) {
    CheckReplaces(target, target.undoFile);
    std::error_code none;
    if (std::filesystem::equivalent(target.undoFile, call.image, none)) {
        ThrowFailed(target.undoFile, "is the image itself", "choose another name");
    }
    std::unique_ptr<BlockDevice> device =
        FileDevice::Open(call.image, FileDevice::Mode::kReadWrite, 0, problem);
    if (device != nullptr) {
        device = UndoDevice::Open(std::move(device), target.undoFile, problem);
    }
    return device == nullptr ? nullptr
                             : ImageVolume::Open(std::move(device), options, nullptr, problem);
}

}  // namespace

std::unique_ptr<ImageVolume> OpenTarget(const Invocation& call, const TargetOptions& options) {
    if (!options.undoFile.empty() && !options.write) {
        ThrowUsage(call.command.name, "--undo is for --write: without it the image stays as it is",
                   "");
    }
    CheckReplaces(options, options.saveFile);  // now, not when all the work is done
    if (!options.undoFile.empty() && !options.saveFile.empty() &&
        IsSameFile(options.undoFile, options.saveFile)) {
        ThrowFailed(options.saveFile, "--undo writes there", "choose another name");
    }
    if (!options.newVolume.empty()) {
        if (options.write) {
            ThrowUsage(call.command.name, "--new and --write do not go together",
                       "--save FILE keeps a new volume");
        }
        return OpenNew(options);
    }
    OpenOptions open;
    open.access = options.write ? Access::kWrite : Access::kOverlay;
    open.force = options.force;
    open.replay = options.write;  // what the journal holds is carried out before anything is read
    open.offset = call.offset;
    open.partition = call.partition;
    open.backupHeader = call.backupHeader;
    open.mapBlockSize = call.mapBlockSize;
    if (options.write) {
        CheckBeforeWriting(call.image, open);
    }
    Problem problem;
    std::unique_ptr<ImageVolume> volume =
        options.undoFile.empty() ? ImageVolume::OpenFile(call.image, open, nullptr, &problem)
                                 : OpenWithUndo(call, options, open, &problem);
    if (!volume) {
        ThrowProblem(call.image, problem);
    }
    if (!call.quiet) {
        TellNotes(call.image, *volume);
    }
    return volume;
}

Problem CommitProblem(ImageVolume* volume, int status) {
    const Problem& io = volume->LastIoProblem();
    return io && io.status == status ? io : Failure(StatusWithCode(status), "");
}

void FinishTarget(const Invocation& call, const TargetOptions& options, ImageVolume* volume,
                  u64 handedOverBefore) {
    const bool keeps = options.write || !options.saveFile.empty();
    if (options.write || (keeps && volume->IsWritable())) {
        KeepRest(options.Subject(call), volume);
    }
    if (options.write && volume->Close() != kOk) {
        ThrowProblem(call.image, volume->LastIoProblem());
    }
    if (!options.saveFile.empty()) {
        Save(options, volume);  // closed, if it was written to, so that the copy is whole in itself
    }
    u64 changed = volume->HandedOverBlocks() - handedOverBefore;
    for (const u32 fileId : {kCatalogFileId, kExtentsFileId, kAttributesFileId}) {
        const CBTreeHfs* tree = volume->OpenTree(fileId);
        for (const list_head* link = tree == nullptr ? nullptr : tree->modifiedList.next;
             link != nullptr && link != &tree->modifiedList; link = link->next) {
            ++changed;
        }
    }
    if (!keeps && changed != 0 && options.newVolume.empty() && !call.quiet) {
        std::fprintf(stderr,
                     "nothing was written: %s %s changed in memory; add --write to keep %s\n",
                     Grouped(changed).c_str(), changed == 1 ? "block" : "blocks",
                     changed == 1 ? "it" : "them");
    }
}

}  // namespace VELK::tool
