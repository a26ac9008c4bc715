// A few of a workload's records in a file: a fresh process that looks them up need not make the
// whole workload first.
#pragma once

#include <string>

#include "workload.h"

namespace bench {

struct Sample {
    Workload load;                      // of these records alone; only keys and sizes
    std::vector<std::uint32_t> origin;  // number of each in the workload it was taken from
};

// `count` records of a workload, each at most once, in no order.
Sample TakeSample(const Workload& load, std::uint32_t count);
// False: the file could not be written or read.
bool WriteSample(const Sample& sample, const std::string& path);
bool ReadSample(const std::string& path, Sample* sample);

}  // namespace bench
