// See exhibit.h.
#include "exhibit.h"

namespace VELK::test {

std::vector<Hall> Museum() {
    return {VolumeHeaderHall(), ForkHall(), TruncationHall(), PartitionHall(), JournalHall(),
            TreeHeaderHall(),   MapHall(),  DescriptorHall(), SlotHall(),      KeyHall(),
            IndexHall(),        LinkHall(), RecordHall()};
}

Bytes MakeImage(const Exhibit& exhibit) {
    Specimen specimen;
    exhibit.make(specimen);
    return specimen.bytes;
}

}  // namespace VELK::test
