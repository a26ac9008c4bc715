// What a word of the shell could become: an operation or command, a tree, a key of the tree in use,
// a path.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "hfs/volume/image_volume.h"

namespace VELK::tool {

// Commands of the program that work on the shell's volume.
const std::vector<std::string>& ShellCommandNames();

// Candidates for `word`, which follows `before` on its line; each begins with `word`, but for the
// case of names where the tree folds it. At most a hundred.
std::vector<std::string> ShellCandidates(ImageVolume* volume, u32 fileId, std::string_view before,
                                         std::string_view word);

}  // namespace VELK::tool
