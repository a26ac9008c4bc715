// Reads everything there is to read of a volume through volume layer and engine, and puts what they
// said into a line: which calls failed, with the status, the reports and the assertions.
#pragma once

#include <string>

#include "specimen.h"

namespace VELK::test {

struct Reading {
    // "find catalog: corrupt 15@441 >1807 (2 of 22)": status; reason @ site of the first report,
    // then > the sites it was passed on at; ! assertions; and how much of it failed. Calls that
    // fared as on the sound volume are left out.
    std::string text;
    // What must never be: blocks made dirty, references lost, more work than the tree's size
    // allows. Empty: nothing.
    std::string fault;
};

// `sound`: the volume the image was made from; its records are looked up.
Reading ReadEverything(const Bytes& image, const VolumeImage& sound);

}  // namespace VELK::test
