// Opening the image of a command.
#include "tool/session.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdio>

#include "tool/engine_trace.h"
#include "tool/errors.h"
#include "tool/read_ahead.h"

namespace VELK::tool {

namespace {

OpenOptions OptionsOf(const Invocation& call) {
    OpenOptions options;
    options.offset = call.offset;
    options.partition = call.partition;
    options.backupHeader = call.backupHeader;
    options.mapBlockSize = call.mapBlockSize;
    return options;
}

void ExplainPlace(const std::string& image, const VolumeScan& scan) {
    for (const PartitionEntry& entry : scan.partitions) {
        std::fprintf(stderr, "treehfs: %s: partition %u (%s): %s\n", image.c_str(), entry.number,
                     entry.contentName.c_str(), entry.reason.c_str());
    }
}

ImageVolume* g_lentVolume = nullptr;
std::string g_lentFile;

}  // namespace

void LendVolume(ImageVolume* volume, const std::string& file) {
    g_lentVolume = volume;
    g_lentFile = file;
}

const std::string& FileOfImage(const std::string& image) {
    return g_lentVolume != nullptr && image == kLentImage ? g_lentFile : image;
}

Session::Session(const Invocation& call, const std::string& image, Truncated truncated)
    : image_(image), quiet_(call.quiet), json_(call.json) {
    if (call.trace) {
        TraceEngine();
    }
    Problem problem;
    if (g_lentVolume != nullptr && image_ == kLentImage) {
        volume_ = g_lentVolume;
        return;
    }
    if (auto file = FileDevice::Open(image_, FileDevice::Mode::kRead, 0, &problem)) {
        imageBytes_ = file->Size();
        owned_ = ImageVolume::Open(std::make_unique<ReadAheadDevice>(std::move(file)),
                                   OptionsOf(call), &scan_, &problem);
    }
    volume_ = owned_.get();
    if (call.verbose) {
        ExplainPlace(image_, scan_);
    }
    if (volume_ == nullptr) {
        ThrowProblem(image_, problem);
    }
    if (volume_->IsTruncated() && truncated == Truncated::kRefuse && !call.keepGoing) {
        for (const Problem& note : volume_->Notes()) {
            if (note.status == kErrVolumeTruncated) {
                ThrowProblem(image_, note);
            }
        }
    }
    if (quiet_) {
        return;
    }
    for (const Problem& note : volume_->Notes()) {
        PrintNote(image_, note);
    }
    if (call.verbose) {
        PrintNote(image_, Failure(fmt::format("volume at byte {}, read through the {} header",
                                              Grouped(volume_->Place().offset),
                                              volume_->UsedBackupHeader() ? "alternate" : "first"),
                                  ""));
    }
}

std::vector<u32> Session::ChosenTrees(const Invocation& call) const {
    std::vector<u32> chosen = call.trees;
    if (!call.treesGiven) {
        std::erase_if(chosen, [&](u32 fileId) { return !volume_->HasTree(fileId); });
    }
    return chosen;
}

CBTreeHfs* Session::Tree(u32 fileId) {
    Problem problem;
    CBTreeHfs* tree = volume_->Tree(fileId, &problem);
    if (tree == nullptr) {
        ThrowProblem(image_, problem);
    }
    return tree;
}

u64 Session::ReadableBytes() const {
    if (owned_ == nullptr) {
        return u64{volume_->Header().totalBlocks} * volume_->Header().blockSize;
    }
    const u64 start = volume_->Place().offset;
    const u64 behind = imageBytes_ > start ? imageBytes_ - start : 0;
    return volume_->Place().size != 0 ? std::min(behind, volume_->Place().size) : behind;
}

std::string Session::OffsetText(u32 fileId, u64 forkOffset) {
    const std::optional<u64> offset = volume_->ImageOffset(fileId, forkOffset);
    return offset ? "image offset " + HexOffset(*offset) : "";
}

Problem Session::ProblemOf(u32 fileId, u32 node, int status, const std::string& detail) {
    const bool fromVolume =
        status == kErrVolumeIo || status == kErrVolumeTruncated || status == kErrVolumeUnmapped;
    if (fromVolume && volume_->LastIoProblem()) {
        return volume_->LastIoProblem();
    }
    const CBTreeHfs* tree = volume_->OpenTree(fileId);
    const u64 forkOffset = tree != nullptr ? u64{node} << tree->nodeShift : 0;
    std::string what =
        fmt::format("{} node {}: {}", ForkName(fileId), node, StatusWithCode(status));
    if (!detail.empty()) {
        what += ": " + detail;
    }
    const std::string place = OffsetText(fileId, forkOffset);
    if (!place.empty()) {
        what += " (" + place + ")";
    }
    Problem problem = Failure(what, "run check; --keep-going goes past it");
    problem.status = status;
    problem.fileId = fileId;
    problem.node = node;
    problem.offset = volume_->ImageOffset(fileId, forkOffset);
    return problem;
}

void Session::NotePassedOver(const Problem& problem) {
    passedOver_ += 1;
    ToolError error;
    error.subject = image_;
    error.problem = problem;
    error.problem.advice = "passed over";
    PrintError(error, json_);
}

}  // namespace VELK::tool
