// The image a command works on: opened as the options say, with its remarks printed, and its trees
// at hand. Turns statuses into the one line a person gets.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "hfs/volume/image_volume.h"
#include "tool/command.h"

namespace VELK::tool {

// While a volume is lent, a session on the image named kLentImage looks at it as it stands, changes
// in memory included. Null ends the loan. `file` is the one it lies in.
constexpr char kLentImage[] = "(this volume)";
void LendVolume(ImageVolume* volume, const std::string& file);
// The file behind the image's name: the lent volume's, or the image itself.
const std::string& FileOfImage(const std::string& image);

class Session {
public:
    // What a command can do with an image that was cut short.
    enum class Truncated {
        kReadOn,  // says so and reads what is there
        kRefuse,  // stops, unless --keep-going is given
    };

    // Opens read-only: the call's image, or another one in the same way. Throws ToolError.
    Session(const Invocation& call, Truncated truncated) : Session(call, call.image, truncated) {}
    Session(const Invocation& call, const std::string& image, Truncated truncated);
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    ImageVolume& Volume() { return *volume_; }
    const VolumeScan& Scan() const { return scan_; }
    const std::string& Image() const { return image_; }

    // Of the trees the call is about: those it names, present or not, or else those the volume has.
    std::vector<u32> ChosenTrees(const Invocation& call) const;
    // The open tree; throws when it is absent or cannot be opened.
    CBTreeHfs* Tree(u32 fileId);
    // The same, with null instead of a throw.
    CBTreeHfs* TryTree(u32 fileId, Problem* problem) { return volume_->Tree(fileId, problem); }

    // Bytes from the volume's start to its end, or to the image's if that comes first.
    u64 ReadableBytes() const;

    // What a failed operation on a node means: "catalog node 14: corrupt (A000011C): ...".
    Problem ProblemOf(u32 fileId, u32 node, int status, const std::string& detail);
    // "image offset 0x2380e" of a byte of a node; empty when it lies nowhere.
    std::string OffsetText(u32 fileId, u64 forkOffset);

    // Names a damaged piece that --keep-going passes over, on standard error.
    void NotePassedOver(const Problem& problem);
    u64 PassedOver() const { return passedOver_; }

private:
    std::string image_;
    bool quiet_;
    bool json_;
    u64 imageBytes_ = 0;
    VolumeScan scan_;
    std::unique_ptr<ImageVolume> owned_;
    ImageVolume* volume_ = nullptr;  // owned or lent
    u64 passedOver_ = 0;
};

}  // namespace VELK::tool
