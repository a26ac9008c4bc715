// The volume a script runs on: a fresh one in memory, or an image whose changes stay in memory
// unless they are asked to reach it.
#pragma once

#include <memory>
#include <string>

#include "hfs/volume/image_volume.h"
#include "tool/command.h"

namespace VELK::tool {

// What the commands that run operations have in common.
struct TargetOptions {
    std::string newVolume;  // SIZE[,block=N][,map=N][,node=N][,clump=N][,case][,empty]
    std::string saveFile;
    std::string undoFile;
    bool write = false;
    bool force = false;

    void Declare(Invocation* call);
    // The same without --new, for commands that want an image.
    void DeclareForImage(Invocation* call);
    // What errors name: the image, or "new volume".
    std::string Subject(const Invocation& call) const;
};

// Throws a ToolError when there is no such volume, or when changing it would be unsafe.
std::unique_ptr<ImageVolume> OpenTarget(const Invocation& call, const TargetOptions& options);

// Why a commit failed: what the volume says of its medium or its journal, else the status.
Problem CommitProblem(ImageVolume* volume, int status);

// After the last operation: keeps the changes of a volume that is written to or saved, writes the
// copy, and says what becomes of changes that nothing keeps.
void FinishTarget(const Invocation& call, const TargetOptions& options, ImageVolume* volume,
                  u64 handedOverBefore);

}  // namespace VELK::tool
