// What the host itself does with a file or a block device: writing to it would then destroy what
// the host keeps of it in memory.
#pragma once

#include <sys/stat.h>

#include <string>

#include "hfs/volume/problem.h"

namespace VELK {

// Where the host tells of its mounts and of its block devices. A place that is not there tells
// nothing.
struct HostTables {
    std::string mounts = "/proc/self/mountinfo";
    std::string blocks = "/sys/block";
};

// The folder on which the block device `device` is mounted; empty when nowhere.
std::string MountPointOf(dev_t device, const HostTables& tables);
// The loop device that presents the file `info` describes: "loop0"; empty when none does.
// `*device` (optional): its number.
std::string LoopDeviceOf(const struct stat& info, const HostTables& tables, dev_t* device);
// Why `path`, whose state is `info`, must not be written; no problem when nothing is known.
Problem CheckNotInUse(const struct stat& info, const HostTables& tables);

}  // namespace VELK
