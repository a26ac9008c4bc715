// One call of a command: the options that several commands share, and what they mean.
#include "tool/command.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>

#include "hfs/format.h"
#include "tool/errors.h"
#include "tool/session.h"

namespace VELK::tool {

namespace {

bool WordIsOn(const std::string& word, int fd) {
    return word == "always" || (word == "auto" && isatty(fd) != 0);
}

// A terminal that knows no colours says so, or the person in front of it does.
bool WantsNoColor() {
    const char* term = std::getenv("TERM");
    const char* noColor = std::getenv("NO_COLOR");
    return (term != nullptr && std::string(term) == "dumb") ||
           (noColor != nullptr && *noColor != 0);
}

// Whether the caller has handed over this file descriptor. Those of our own files, the image's
// among them, are closed when a program is started.
bool IsHandedOver(int fd) {
    const int flags = fcntl(fd, F_GETFD);
    return flags >= 0 && (flags & FD_CLOEXEC) == 0;
}

u32 NarrowOption(const Invocation& call, const char* name, const std::optional<u64>& value,
                 u64 least, u64 most) {
    if (!value) {
        return 0;
    }
    if (*value < least || *value > most) {
        ThrowUsage(call.command.name,
                   fmt::format("{}: {} is not between {} and {}", name, *value, least, most), "");
    }
    return static_cast<u32>(*value);
}

}  // namespace

Invocation::Invocation(const Command& theCommand, std::vector<std::string> arguments)
    : command(theCommand), words(arguments), options(theCommand, std::move(arguments)) {}

void Invocation::DeclareImage() {
    options.Argument("IMAGE", &image, "disk image, partition or device with the volume");
    DeclarePlace();
}

void Invocation::DeclarePlace() {
    options.Count("--partition", &partitionNumber_, "N",
                  "partition as numbered by info --partitions");
    options.Size("--offset", &offset, "N",
                 "byte where the volume starts: 86016, 84K, 168s (sectors)");
    options.Flag("--backup-header", &backupHeader, "start from the alternate volume header");
    options.Count("--map", &mapNumber_, "N",
                  "hold nodes in pieces of N bytes (512 to 32768, for tests)");
}

void Invocation::DeclareTrees(TreeDefault treeDefault) {
    takesTrees_ = true;
    treeDefault_ = treeDefault;
    options.List("-t,--tree", &treeNames_, "TREE",
                 treeDefault == TreeDefault::kAll
                     ? "catalog, extents or attributes (c e a), repeatable; default all"
                 : treeDefault == TreeDefault::kAttributes
                     ? "catalog, extents or attributes (c e a); default attributes"
                     : "catalog, extents or attributes (c e a); default catalog");
}

void Invocation::DeclareRange() {
    options.Text("--range", &range, "FROM..TO", "only records with keys from FROM to TO");
}

void Invocation::DeclareLimits() {
    options.Count("--limit", &limitNumber_, "N", "at most N records");
    options.Count("--offset-records", &skipNumber_, "N", "leave out the first N records");
}

void Invocation::DeclareKeepGoing() {
    options.Flag("--keep-going", &keepGoing, "go past damaged nodes; each is named on stderr");
}

void Invocation::DeclareJson() {
    options.Flag("--json", &json, "output for programs");
}

void Invocation::DeclareOutputFile() {
    options.Text("-o,--output", &outputFile, "FILE",
                 "write to FILE, only if all goes well; - is standard output");
    options.Flag("--force", &force, "replace FILE if it exists");
}

void Invocation::DeclareGeneral() {
    options.BeginGeneral();
    options.Flag("-q,--quiet", &quiet, "no remarks, only results and errors");
    options.Flag("-v,--verbose", &verbose, "say what was decided and why");
    options.Flag("--trace", &trace, "engine reports and assertions on stderr");
    options.Choice("--color", &colorWord_, {"auto", "always", "never"}, "colour the output");
    options.Choice("--progress", &progressWord_, {"auto", "always", "never"},
                   "progress on stderr after a second");
    options.Count("--progress-fd", &progressFdNumber_, "N", "progress lines for a program");
}

void Invocation::ChooseTrees() {
    treesGiven = !treeNames_.empty();
    for (const std::string& name : treeNames_) {
        const u32 id = TreeIdFromText(name);
        if (id == 0) {
            ThrowUsage(command.name,
                       fmt::format("--tree: '{}' is no tree{}", name,
                                   DidYouMean(name, {"catalog", "extents", "attributes"})),
                       "catalog, extents or attributes");
        }
        if (std::find(trees.begin(), trees.end(), id) == trees.end()) {
            trees.push_back(id);
        }
    }
    if (treeDefault_ != TreeDefault::kAll && trees.size() > 1) {
        ThrowUsage(command.name,
                   fmt::format("--tree is given twice, as '{}' and as '{}'", treeNames_.front(),
                               treeNames_.back()),
                   "give it once");
    }
    if (!treesGiven) {
        trees = treeDefault_ == TreeDefault::kAll
                    ? std::vector<u32>{kCatalogFileId, kExtentsFileId, kAttributesFileId}
                : treeDefault_ == TreeDefault::kAttributes ? std::vector<u32>{kAttributesFileId}
                                                           : std::vector<u32>{kCatalogFileId};
    }
}

void Invocation::ChooseGeneral() {
    if (partitionNumber_ && offset) {
        ThrowUsage(command.name, "--partition and --offset both say where the volume starts",
                   "give one of them");
    }
    partition = NarrowOption(*this, "--partition", partitionNumber_, 1, 0xFFFFFFFF);
    mapBlockSize = NarrowOption(*this, "--map", mapNumber_, 512, 32768);
    if ((mapBlockSize & (mapBlockSize - 1)) != 0) {
        ThrowUsage(command.name, fmt::format("--map: {} is not a power of two", mapBlockSize), "");
    }
    if (progressFdNumber_) {
        progressFd =
            static_cast<int>(NarrowOption(*this, "--progress-fd", progressFdNumber_, 1, 65535));
        if (!IsHandedOver(progressFd)) {
            ThrowUsage(command.name,
                       fmt::format("--progress-fd: descriptor {} is not open", progressFd), "");
        }
    }
    if (outputFile == "-") {
        outputFile.clear();
    }
    limit = limitNumber_.value_or(~u64{0});
    skipRecords = skipNumber_.value_or(0);
    color = WordIsOn(colorWord_, outputFile.empty() ? STDOUT_FILENO : -1) &&
            (colorWord_ == "always" || !WantsNoColor());
    showProgress = WordIsOn(progressWord_, STDERR_FILENO) && !quiet;
}

void Invocation::Parse() {
    DeclareGeneral();
    options.Parse();
    if (takesTrees_) {
        ChooseTrees();
    }
    ChooseGeneral();
    if (!outputFile.empty()) {
        out.OpenFile(outputFile, FileOfImage(image), force);
    }
}

}  // namespace VELK::tool
