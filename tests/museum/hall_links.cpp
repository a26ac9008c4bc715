// Hall: links to the left and to the right.
#include <iterator>

#include "exhibit.h"
#include "hfs/format.h"

namespace VELK::test {

namespace {

const Exhibit kExhibits[] = {
    {"flink-self", "A leaf is followed by itself.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescFLink, s.catalog.LeafNumber(3)); }},
    {"flink-ring", "The last leaf is followed by the first.",
     [](Specimen& s) {
         s.catalog.Node(s.catalog.LastLeaf()).Set32(kDescFLink, s.catalog.LeafNumber(0));
     }},
    {"flink-back", "A leaf is followed by the one before it.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescFLink, s.catalog.LeafNumber(2)); }},
    {"flink-skips", "A leaf is followed by the next but one.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescFLink, s.catalog.LeafNumber(5)); }},
    {"flink-cut", "The chain ends in the middle.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescFLink, 0); }},
    {"flink-index", "A leaf is followed by an index node.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescFLink, s.catalog.IndexNumber(2, 0)); }},
    {"flink-free", "A leaf is followed by a free node.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescFLink, s.catalog.FreeNumber()); }},
    {"flink-behind-last", "A leaf is followed by the number of nodes.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescFLink, s.catalog.Image().totalNodes); }},
    {"flink-largest", "A leaf is followed by node 2^32 - 1.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescFLink, 0xFFFFFFFF); }},
    {"flink-of-last", "The last leaf is followed by a free node.",
     [](Specimen& s) {
         s.catalog.Node(s.catalog.LastLeaf()).Set32(kDescFLink, s.catalog.FreeNumber());
     }},
    {"empty-leaves-in-a-ring", "Two leaves without records follow each other for ever.",
     [](Specimen& s) {
         s.catalog.Leaf(3).Set16(kDescNumRecords, 0);
         s.catalog.Leaf(4).Set16(kDescNumRecords, 0);
         s.catalog.Leaf(4).Set32(kDescFLink, s.catalog.LeafNumber(3));
     }},
    {"blink-self", "A leaf is preceded by itself.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescBLink, s.catalog.LeafNumber(3)); }},
    {"blink-zero", "A leaf in the middle has none before it.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescBLink, 0); }},
    {"blink-skips", "A leaf is preceded by the last but one.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescBLink, s.catalog.LeafNumber(1)); }},
    {"blink-ring", "The first leaf is preceded by the last.",
     [](Specimen& s) { s.catalog.Leaf(0).Set32(kDescBLink, s.catalog.LastLeaf()); }},
    {"blink-largest", "A leaf is preceded by node 2^32 - 1.",
     [](Specimen& s) { s.catalog.Leaf(3).Set32(kDescBLink, 0xFFFFFFFF); }},
    {"index-flink-cut", "The chain of index nodes ends in the middle.",
     [](Specimen& s) { s.catalog.Index(2, 0).Set32(kDescFLink, 0); }},
    {"index-flink-self", "An index node is followed by itself.",
     [](Specimen& s) { s.catalog.Index(2, 0).Set32(kDescFLink, s.catalog.IndexNumber(2, 0)); }},
    {"index-blink-leaf", "An index node is preceded by a leaf.",
     [](Specimen& s) { s.catalog.Index(2, 1).Set32(kDescBLink, s.catalog.LeafNumber(0)); }},
    {"root-flink", "The root has a right neighbour.",
     [](Specimen& s) { s.catalog.Root().Set32(kDescFLink, s.catalog.IndexNumber(2, 0)); }},
    {"extents-flink-self", "A leaf of the bad-block list is followed by itself.",
     [](Specimen& s) { s.extents.Leaf(0).Set32(kDescFLink, s.extents.LeafNumber(0)); }},
    {"attributes-flink-ring", "The last leaf of the attributes tree is followed by the first.",
     [](Specimen& s) {
         s.attributes.Node(s.attributes.LastLeaf()).Set32(kDescFLink, s.attributes.LeafNumber(0));
     }},
};

}  // namespace

Hall LinkHall() {
    return {"Links between siblings", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
