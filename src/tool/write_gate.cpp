// The checks of the independent checker that every change relies on.
#include "tool/write_gate.h"

#include <algorithm>
#include <vector>

#include "hfs/check/check.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

// Where trees lie, how they hang together and which nodes and blocks are free. What records say of
// files is left out: changes neither follow nor worsen it.
constexpr CheckId kReliedOn[] = {
    CheckId::V01, CheckId::V02, CheckId::V04, CheckId::V05, CheckId::H01, CheckId::H02,
    CheckId::H03, CheckId::H04, CheckId::H05, CheckId::H06, CheckId::H07, CheckId::H08,
    CheckId::H10, CheckId::H11, CheckId::H12, CheckId::H13, CheckId::M01, CheckId::M02,
    CheckId::M04, CheckId::N01, CheckId::N02, CheckId::N03, CheckId::N04, CheckId::N05,
    CheckId::L01, CheckId::L02, CheckId::K01, CheckId::K02, CheckId::K03, CheckId::K04,
    CheckId::K05, CheckId::R02, CheckId::R03};

// Warnings to others: insertion and deletion decide by these two counters.
constexpr bool IsCounter(CheckId id) {
    return id == CheckId::H11 || id == CheckId::H13;
}

struct Found {
    const VolumeHeader* header;
    std::vector<std::string> ids;
    bool isUnreadable = false;
};

// A tree that was never made, as on volumes made with the item `empty`: nothing there is damaged.
// A catalog that is gone while the volume counts files is another matter.
bool IsOfTreeNeverMade(const VolumeHeader& header, const CheckFinding& finding) {
    const HfsFork* fork = header.ForkOf(finding.tree);
    if (fork == nullptr || fork->logicalSize != 0 || fork->totalBlocks != 0 ||
        fork->extents[0].blockCount != 0) {
        return false;
    }
    return finding.tree != kCatalogFileId || (header.fileCount == 0 && header.folderCount == 0);
}

// Things that changes build on.
void Take(Found* found, const CheckFinding& finding) {
    const bool counts = finding.severity == CheckSeverity::kError || IsCounter(finding.id);
    if (counts && !IsOfTreeNeverMade(*found->header, finding)) {
        found->ids.push_back(CheckIdOf(finding.id).name);
    }
}

Found CheckReliedOn(ImageVolume* volume, u64 imageBytes, bool backupHeader) {
    CheckOptions options;
    for (const CheckId id : kReliedOn) {
        options.only |= CheckIdBit(id);
    }
    options.backupHeader = backupHeader;
    const VolumePlace& place = volume->Place();
    const u64 behind = imageBytes > place.offset ? imageBytes - place.offset : 0;
    const CheckSource source = {
        volume,
        [](void* self, u64 offset, void* target, std::size_t size) {
            return static_cast<ImageVolume*>(self)->ReadVolume(offset, target, size);
        },
        place.size != 0 ? std::min(behind, place.size) : behind, place.offset};
    Found found = {&volume->Header(), {}, false};
    CheckSink sink;
    sink.self = &found;
    sink.finding = [](void* self, const CheckFinding& finding) {
        Take(static_cast<Found*>(self), finding);
    };
    sink.unreadable = [](void* self, const CheckUnreadable&) {
        static_cast<Found*>(self)->isUnreadable = true;
    };
    CheckVolume(source, options, sink);
    std::sort(found.ids.begin(), found.ids.end());
    found.ids.erase(std::unique(found.ids.begin(), found.ids.end()), found.ids.end());
    return found;
}

std::string Joined(const std::vector<std::string>& words) {
    std::string text;
    for (const std::string& word : words) {
        text += (text.empty() ? "" : ", ") + word;
    }
    return text;
}

}  // namespace

void CheckBeforeWriting(const std::string& image, const OpenOptions& open) {
    OpenOptions look = open;
    look.access = Access::kOverlay;
    Problem problem;
    auto file = FileDevice::Open(image, FileDevice::Mode::kRead, 0, &problem);
    if (!file) {
        return;
    }
    const u64 imageBytes = file->Size();
    const auto volume = ImageVolume::Open(std::move(file), look, nullptr, &problem);
    if (!volume || volume->WriteObstacle()) {
        return;
    }
    const Found found = CheckReliedOn(volume.get(), imageBytes, open.backupHeader);
    if (found.ids.empty() && !found.isUnreadable) {
        return;
    }
    Problem refusal = found.ids.empty()
                          ? Failure("not all of the trees can be read", "run check, then --force")
                          : Failure("the volume is damaged (" + Joined(found.ids) + ")",
                                    "run check, then --force");
    if (!open.force) {
        ThrowProblem(image, refusal);
    }
    refusal.advice = "written to all the same, which may make it worse";
    PrintNote(image, refusal);
}

}  // namespace VELK::tool
