// The volume the demo shows: filled and thinned through the engine, the same on every run.
#pragma once

#include <memory>

#include "hfs/volume/image_volume.h"

namespace VELK::tool {

struct DemoFigures {
    u32 folders = 0;
    u32 inserted = 0;  // files
    u32 deleted = 0;
};

// Makes a volume in memory, inserts 20,000 files in 200 folders and deletes a third of them.
// Throws a ToolError when anything fails.
std::unique_ptr<ImageVolume> MakeDemoVolume(DemoFigures* figures);

}  // namespace VELK::tool
