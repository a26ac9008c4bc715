// One trial of a sweep: everything that can be called, on a tree file of any bytes. It comes back
// with statuses; reading changes nothing; each call keeps its bounds; nothing leaks. What is wrong
// fails the test that runs.
#pragma once

#include <vector>

#include "mem_volume.h"

namespace VELK::test {

class Trial {
public:
    Trial(u32 fileId, u32 mapBlock) : fileId_(fileId), mapBlock_(mapBlock) {}

    // The tree's calls on the whole file, those that change one node on `nodeNum`; and the checker.
    void RunTree(const Bytes& file, u32 nodeNum) const;
    // The accessors on one node of it.
    void RunNode(const Bytes& node, u32 nodeNum) const;

private:
    u32 fileId_;
    u32 mapBlock_;
};

}  // namespace VELK::test
