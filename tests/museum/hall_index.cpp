// Hall: index keys and the children they lead to.
#include <iterator>

#include "exhibit.h"
#include "hfs/format.h"

namespace VELK::test {

namespace {

const Exhibit kExhibits[] = {
    {"child-zero", "A child is node 0.", [](Specimen& s) { s.catalog.Root().SetData32(1, 0, 0); }},
    {"child-is-root", "A child of the root is the root.",
     [](Specimen& s) { s.catalog.Root().SetData32(1, 0, s.catalog.Image().rootNode); }},
    {"child-is-leaf", "A child of the root is a leaf.",
     [](Specimen& s) { s.catalog.Root().SetData32(1, 0, s.catalog.LeafNumber(4)); }},
    {"child-free", "A child is a free node.",
     [](Specimen& s) { s.catalog.Root().SetData32(1, 0, s.catalog.FreeNumber()); }},
    {"child-twice", "Two records of the root lead to the same child.",
     [](Specimen& s) { s.catalog.Root().SetData32(1, 0, s.catalog.IndexNumber(2, 0)); }},
    {"children-swapped", "Two children of the root are swapped.",
     [](Specimen& s) {
         s.catalog.Root().SetData32(0, 0, s.catalog.IndexNumber(2, 1));
         s.catalog.Root().SetData32(1, 0, s.catalog.IndexNumber(2, 0));
     }},
    {"child-last-of-file", "A child is the number of nodes.",
     [](Specimen& s) { s.catalog.Root().SetData32(1, 0, s.catalog.Image().totalNodes); }},
    {"child-largest", "A child is node 2^32 - 1.",
     [](Specimen& s) { s.catalog.Root().SetData32(1, 0, 0xFFFFFFFF); }},
    {"leaf-child-zero", "A child at level 2 is node 0.",
     [](Specimen& s) { s.catalog.Index(2, 1).SetData32(1, 0, 0); }},
    {"leaf-child-twice", "Two records at level 2 lead to the same leaf.",
     [](Specimen& s) { s.catalog.Index(2, 1).SetData32(1, 0, s.catalog.LeafNumber(4)); }},
    {"leaf-child-index", "A child at level 2 is an index node.",
     [](Specimen& s) { s.catalog.Index(2, 1).SetData32(1, 0, s.catalog.IndexNumber(2, 1)); }},
    {"leaf-child-free", "A child at level 2 is a free node.",
     [](Specimen& s) { s.catalog.Index(2, 1).SetData32(1, 0, s.catalog.FreeNumber()); }},
    {"separator-above-child", "A key of the root is above the first key below it.",
     [](Specimen& s) { s.catalog.Root().SetKey16(1, kCatKeyName + 2, u'h'); }},
    {"separator-below-child", "A key of the root is below the first key below it.",
     [](Specimen& s) { s.catalog.Root().SetKey16(1, kCatKeyName + 2, u'A'); }},
    {"separators-fall", "The keys of the root do not rise.",
     [](Specimen& s) { s.catalog.Root().SetKey32(1, kCatKeyParentId, 900); }},
    {"separator-first-too-high", "The first key of the root is above the first record.",
     [](Specimen& s) { s.catalog.Root().SetKey32(0, kCatKeyParentId, 5); }},
    {"index-key-length-zero", "A key of the root has length 0.",
     [](Specimen& s) { s.catalog.Root().SetKey16(1, 0, 0); }},
    {"index-key-length-600", "A key of the root is longer than the node.",
     [](Specimen& s) { s.catalog.Root().SetKey16(1, 0, 600); }},
    {"index-name-beyond-key", "A name in the root is longer than its key.",
     [](Specimen& s) { s.catalog.Root().SetKey16(1, kCatKeyNameLength, 200); }},
    {"index-data-two-bytes", "The last record of the root has 2 bytes of data.",
     [](Specimen& s) {
         s.catalog.Root().SetSlot(s.catalog.Root().Records(),
                                  s.catalog.Root().Slot(s.catalog.Root().Records()) - 2);
     }},
    {"index-one-child",
     "The root counts one record of three: two thirds of the tree cannot be reached from "
     "it.",
     [](Specimen& s) { s.catalog.Root().Set16(kDescNumRecords, 1); }},
    {"extents-child-zero", "A child of the root of the extents tree is node 0.",
     [](Specimen& s) { s.extents.Root().SetData32(1, 0, 0); }},
    {"extents-index-key-length", "An index key of the extents tree has 4 bytes.",
     [](Specimen& s) { s.extents.Root().SetKey16(1, 0, 4); }},
    {"attributes-child-twice",
     "Two records of the root of the attributes tree lead to the same leaf.",
     [](Specimen& s) { s.attributes.Root().SetData32(1, 0, s.attributes.LeafNumber(0)); }},
};

}  // namespace

Hall IndexHall() {
    return {"Index nodes", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
