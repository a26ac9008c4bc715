// The names by which command lines and scripts call the trees.
#pragma once

#include <string>

#include "platform/types.h"

namespace VELK::tool {

// File ID of "catalog", "extents", "attributes" or "c", "e", "a"; 0: none of them.
u32 TreeIdFromText(const std::string& text);

}  // namespace VELK::tool
