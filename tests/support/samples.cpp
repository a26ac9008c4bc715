// Finds and unpacks the sample volumes. Several test programs may do so at the same time: each
// unpacks to a name of its own and moves the whole file into place.
#include "samples.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>

namespace VELK {

namespace {

std::string Folder() {
    const char* named = std::getenv("TREEHFS_SAMPLES");
    return named != nullptr ? named : TREEHFS_SAMPLES_DIR;
}

bool Exists(const std::string& path) {
    struct stat info;
    return stat(path.c_str(), &info) == 0;
}

}  // namespace

bool HaveSamples(std::string* why) {
    const std::string folder = Folder();
    if (Exists(folder + "/SHA256SUMS")) {
        return true;
    }
    *why = "no sample volumes in " + folder + " (set TREEHFS_SAMPLES)";
    return false;
}

std::string SamplePath(const std::string& name) {
    const std::string source = Folder() + "/" + name;
    if (Exists(source)) {
        return source;
    }
    const std::string target = std::string(TREEHFS_UNPACKED_DIR) + "/" + name;
    if (Exists(target)) {
        return target;
    }
    if (!Exists(source + ".xz")) {
        return "";
    }
    const std::string part = target + "." + std::to_string(getpid());
    const std::string command =
        "mkdir -p '" TREEHFS_UNPACKED_DIR "' && xz -dc '" + source + ".xz' | dd of='" + part +
        "' conv=sparse bs=1M 2>/dev/null && mv '" + part + "' '" + target + "'";
    return std::system(command.c_str()) == 0 && Exists(target) ? target : "";
}

}  // namespace VELK
