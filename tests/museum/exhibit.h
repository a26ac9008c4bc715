// The museum: every way in which a volume can be hurt, each as a small image with a name. The
// labels, what engine, checker and program say of each, stand in docs/damage.md (document.h).
#pragma once

#include <string>
#include <vector>

#include "specimen.h"

namespace VELK::test {

struct Exhibit {
    const char* name;
    const char* hurt;  // one sentence
    void (*make)(Specimen& s);
};

// A hall: the exhibits of one area.
struct Hall {
    const char* title;
    std::vector<Exhibit> exhibits;
};

// One function per hall, each in a file of its own.
Hall VolumeHeaderHall();
Hall ForkHall();
Hall TruncationHall();
Hall PartitionHall();
Hall JournalHall();
Hall TreeHeaderHall();
Hall MapHall();
Hall DescriptorHall();
Hall SlotHall();
Hall KeyHall();
Hall IndexHall();
Hall LinkHall();
Hall RecordHall();

// All of them, in the order of a walk through.
std::vector<Hall> Museum();

// The image of an exhibit.
Bytes MakeImage(const Exhibit& exhibit);

}  // namespace VELK::test
