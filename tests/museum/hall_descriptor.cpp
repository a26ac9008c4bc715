// Hall: kind, height and record count of nodes.
#include <iterator>

#include "exhibit.h"
#include "hfs/format.h"

namespace VELK::test {

namespace {

const Exhibit kExhibits[] = {
    {"leaf-zeroed", "A leaf is all zeros.", [](Specimen& s) { s.catalog.Leaf(3).Fill(0); }},
    {"leaf-ones", "A leaf is all ones.", [](Specimen& s) { s.catalog.Leaf(3).Fill(0xFF); }},
    {"leaf-copied", "A leaf holds the bytes of its left neighbour.",
     [](Specimen& s) { s.catalog.Leaf(4).CopyFrom(s.catalog.Leaf(3)); }},
    {"leaf-kind-index", "A leaf says that it is an index node.",
     [](Specimen& s) { s.catalog.Leaf(0).Set8(kDescKind, 0); }},
    {"leaf-kind-header", "A leaf says that it is a header node.",
     [](Specimen& s) { s.catalog.Leaf(0).Set8(kDescKind, 1); }},
    {"leaf-kind-unknown", "The kind of a leaf is 42.",
     [](Specimen& s) { s.catalog.Leaf(0).Set8(kDescKind, 42); }},
    {"leaf-height-zero", "A leaf has height 0.",
     [](Specimen& s) { s.catalog.Leaf(0).Set8(kDescHeight, 0); }},
    {"leaf-height-2", "A leaf has height 2.",
     [](Specimen& s) { s.catalog.Leaf(0).Set8(kDescHeight, 2); }},
    {"leaf-height-255", "A leaf has height 255.",
     [](Specimen& s) { s.catalog.Leaf(0).Set8(kDescHeight, 255); }},
    {"leaf-empty", "A leaf has no records.",
     [](Specimen& s) { s.catalog.Leaf(0).Set16(kDescNumRecords, 0); }},
    {"leaf-records-fewer", "A leaf counts a record less than it has.",
     [](Specimen& s) { s.catalog.Leaf(0).Set16(kDescNumRecords, 3); }},
    {"leaf-records-more", "A leaf counts a record more than it has.",
     [](Specimen& s) { s.catalog.Leaf(0).Set16(kDescNumRecords, 5); }},
    {"leaf-records-65535", "A leaf counts 65,535 records.",
     [](Specimen& s) { s.catalog.Leaf(0).Set16(kDescNumRecords, 65535); }},
    {"leaf-records-fill-node", "A leaf counts as many records as slots fit into a node.",
     [](Specimen& s) { s.catalog.Leaf(0).Set16(kDescNumRecords, 248); }},
    {"leaf-reserved", "The reserved field of a leaf is not 0.",
     [](Specimen& s) { s.catalog.Leaf(0).Set16(kDescReserved, 7); }},
    {"root-zeroed", "The root is all zeros.", [](Specimen& s) { s.catalog.Root().Fill(0); }},
    {"root-kind-leaf", "The root says that it is a leaf.",
     [](Specimen& s) { s.catalog.Root().Set8(kDescKind, 0xFF); }},
    {"root-height", "The root has the height of its children.",
     [](Specimen& s) { s.catalog.Root().Set8(kDescHeight, 2); }},
    {"root-empty", "The root has no records.",
     [](Specimen& s) { s.catalog.Root().Set16(kDescNumRecords, 0); }},
    {"index-empty", "An index node has no records.",
     [](Specimen& s) { s.catalog.Index(2, 1).Set16(kDescNumRecords, 0); }},
    {"index-kind-map", "An index node says that it is a map node.",
     [](Specimen& s) { s.catalog.Index(2, 1).Set8(kDescKind, 2); }},
    {"index-records-65535", "An index node counts 65,535 records.",
     [](Specimen& s) { s.catalog.Index(2, 1).Set16(kDescNumRecords, 65535); }},
    {"extents-leaf-zeroed", "A leaf of the extents tree is all zeros.",
     [](Specimen& s) { s.extents.Leaf(1).Fill(0); }},
    {"attributes-leaf-zeroed", "A leaf of the attributes tree is all zeros.",
     [](Specimen& s) { s.attributes.Leaf(1).Fill(0); }},
};

}  // namespace

Hall DescriptorHall() {
    return {"Node descriptors", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
