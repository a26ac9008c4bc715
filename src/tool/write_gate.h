// What stands between --write and an image: changes build on trees that hold together, so a damaged
// volume is not written to unless the user insists.
#pragma once

#include <string>

#include "hfs/volume/image_volume.h"

namespace VELK::tool {

// Looks at the volume as it will be once its journal has been carried out, and changes nothing.
// Throws a ToolError when the checker finds something that changes would build on; with
// `open.force` says so on standard error and returns. What cannot be mounted is left for the mount
// that follows to explain.
void CheckBeforeWriting(const std::string& image, const OpenOptions& open);

}  // namespace VELK::tool
