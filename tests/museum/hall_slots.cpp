// Hall: where records start and end.
#include <iterator>

#include "exhibit.h"
#include "hfs/format.h"

namespace VELK::test {

namespace {

const Exhibit kExhibits[] = {
    {"slot-zero", "The second record starts at 0, over the descriptor.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(1, 0); }},
    {"slot-in-descriptor", "The first record starts in the descriptor.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(0, 8); }},
    {"slot-first-late", "The first record starts 2 bytes late.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(0, 16); }},
    {"slot-odd", "The second record starts at an odd byte.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(1, s.catalog.Leaf(0).Slot(1) + 1); }},
    {"slot-equal", "Two records start at the same byte.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(1, s.catalog.Leaf(0).Slot(2)); }},
    {"slots-swapped", "Two slots are swapped.",
     [](Specimen& s) { s.catalog.Leaf(0).SwapSlots(1, 2); }},
    {"slot-in-table", "A record starts in the offset table.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(2, 506); }},
    {"slot-behind-node", "A record starts behind the node.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(2, 0x4000); }},
    {"slot-65535", "A record starts at byte 65,535.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(2, 65535); }},
    {"slot-at-node-end", "A record starts where the node ends.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(2, 512); }},
    {"slot-last-byte", "A record starts at the last byte of the node.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(3, 511); }},
    {"free-zero", "The free space starts at 0.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(4, 0); }},
    {"free-below-record", "The free space starts before the last record.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(4, s.catalog.Leaf(0).Slot(3) - 2); }},
    {"free-in-table", "The free space starts in the offset table.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(4, 508); }},
    {"free-behind-node", "The free space starts behind the node.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(4, 0x8000); }},
    {"free-odd", "The free space starts at an odd byte.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(4, s.catalog.Leaf(0).Slot(4) + 1); }},
    {"free-too-late", "The free space starts 10 bytes late: the last record has a tail.",
     [](Specimen& s) { s.catalog.Leaf(0).SetSlot(4, s.catalog.Leaf(0).Slot(4) + 10); }},
    {"table-zeroed", "The offset table is all zeros.",
     [](Specimen& s) {
         for (u32 i = 0; i < 5; ++i) {
             s.catalog.Leaf(0).SetSlot(i, 0);
         }
     }},
    {"index-slot-behind-node", "A record of the root starts behind the node.",
     [](Specimen& s) { s.catalog.Root().SetSlot(1, 0x4000); }},
    {"index-slots-swapped", "Two slots of an index node are swapped.",
     [](Specimen& s) { s.catalog.Index(2, 0).SwapSlots(1, 2); }},
    {"extents-slot-odd", "A record of the extents tree starts at an odd byte.",
     [](Specimen& s) { s.extents.Leaf(0).SetSlot(2, s.extents.Leaf(0).Slot(2) + 1); }},
};

}  // namespace

Hall SlotHall() {
    return {"Offset tables", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
