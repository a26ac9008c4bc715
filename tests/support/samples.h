// The folder of sample volumes, which a clone of the project may lack: TREEHFS_SAMPLES in the
// environment, else shared/samples beside the project. Tests that need one skip without it.
#pragma once

#include <string>
#include <vector>

namespace VELK {

// Whether the folder is there, and why not.
bool HaveSamples(std::string* why);

// Path of a sample, unpacked into the build folder on first use; empty when it is not there.
// `name` without ".xz", as in "plain.img".
std::string SamplePath(const std::string& name);

}  // namespace VELK
