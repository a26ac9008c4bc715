// Hall: images that end too early.
#include <iterator>

#include "exhibit.h"

namespace VELK::test {

namespace {

const Exhibit kExhibits[] = {
    {"empty", "The image has no bytes.", [](Specimen& s) { s.bytes.clear(); }},
    {"one-byte", "The image has one byte.", [](Specimen& s) { s.bytes.resize(1); }},
    {"cut-in-header", "The image ends inside the volume header.",
     [](Specimen& s) { s.bytes.resize(1024 + 200); }},
    {"cut-after-header", "The image ends with the volume header.",
     [](Specimen& s) { s.bytes.resize(1536); }},
    {"cut-in-header-node", "The image ends inside the header node of the catalog.",
     [](Specimen& s) { s.bytes.resize(s.catalog.Header().at + 60); }},
    {"cut-after-header-node", "The image ends behind the header node of the catalog.",
     [](Specimen& s) { s.bytes.resize(s.catalog.Node(1).at); }},
    {"cut-in-leaf", "The image ends inside the third leaf of the catalog.",
     [](Specimen& s) { s.bytes.resize(s.catalog.Leaf(2).at + 100); }},
    {"cut-before-extents", "The image ends before the extents file.",
     [](Specimen& s) { s.bytes.resize(s.extents.Header().at); }},
    {"cut-in-extents-leaf", "The image ends inside the second leaf of the extents file.",
     [](Specimen& s) { s.bytes.resize(s.extents.Leaf(1).at + 10); }},
    {"cut-before-attributes", "The image ends before the attributes file.",
     [](Specimen& s) { s.bytes.resize(s.attributes.Header().at); }},
    {"cut-in-data", "The image ends behind the trees, inside the data of files.",
     [](Specimen& s) {
         s.bytes.resize(std::size_t{s.volume.dataStart} * VolumeImage::kBlockSize + 700);
     }},
    {"cut-last-block", "The last block is missing.",
     [](Specimen& s) { s.bytes.resize(s.bytes.size() - 512); }},
    {"zeros", "As long as a volume, and nothing but zeros.",
     [](Specimen& s) { std::fill(s.bytes.begin(), s.bytes.end(), u8{0}); }},
    {"ones", "As long as a volume, and nothing but ones.",
     [](Specimen& s) { std::fill(s.bytes.begin(), s.bytes.end(), u8{0xFF}); }},
};

}  // namespace

Hall TruncationHall() {
    return {"Truncated images", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
