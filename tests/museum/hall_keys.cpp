// Hall: keys of leaf records.
#include <iterator>

#include "exhibit.h"
#include "hfs/format.h"

namespace VELK::test {

namespace {

const Exhibit kExhibits[] = {
    {"key-length-zero", "A key has length 0.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(1, 0, 0); }},
    {"key-length-5", "A key is shorter than its parent ID and name length.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(1, 0, 5); }},
    {"key-length-beyond-record", "A key is longer than its record.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(1, 0, 60); }},
    {"key-length-beyond-node", "A key is longer than the node.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(1, 0, 600); }},
    {"key-length-65535", "A key has 65,535 bytes.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(1, 0, 65535); }},
    {"key-length-largest", "A key has 521 bytes, one more than any key.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(0, 0, 521); }},
    {"key-length-odd", "A key has an odd length.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(0, 0, 15); }},
    {"name-beyond-key", "A name is longer than its key.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(0, kCatKeyNameLength, 5); }},
    {"name-255-in-short-key", "A name of 255 units in a key of 14 bytes.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(0, kCatKeyNameLength, 255); }},
    {"name-length-65535", "A name has 65,535 units.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(0, kCatKeyNameLength, 65535); }},
    {"name-shorter-than-key", "A name is shorter than its key.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(0, kCatKeyNameLength, 3); }},
    {"name-with-nul", "A name contains U+0000.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(0, kCatKeyName, 0); }},
    {"name-lone-surrogate", "A name contains half a pair of surrogates.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey16(0, kCatKeyName, 0xD800); }},
    {"name-escape", "A name contains the escape character.",
     [](Specimen& s) { s.catalog.Leaf(3).SetKey16(0, kCatKeyName + 2, 0x1B); }},
    {"keys-fall-in-leaf", "The keys of a leaf do not rise.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey32(1, kCatKeyParentId, 900); }},
    {"keys-equal", "Two records have the same key.",
     [](Specimen& s) { s.catalog.Leaf(0).SetKey32(3, kCatKeyParentId, 2); }},
    {"keys-fall-between-leaves", "The key of a leaf is below that of the leaf before it.",
     [](Specimen& s) { s.catalog.Leaf(4).SetKey16(0, kCatKeyName + 2, u'a'); }},
    {"key-above-right-neighbour", "The last key of a leaf is above the first one of the next.",
     [](Specimen& s) { s.catalog.Leaf(4).SetKey32(0, kCatKeyParentId, 800); }},
    {"parent-largest", "The parent of a file is folder 2^32 - 1.",
     [](Specimen& s) { s.catalog.Leaf(3).SetKey32(0, kCatKeyParentId, 0xFFFFFFFF); }},
    {"extents-key-length-9", "A key of the extents tree has 9 bytes.",
     [](Specimen& s) { s.extents.Leaf(0).SetKey16(1, 0, 9); }},
    {"extents-key-length-12", "A key of the extents tree has 12 bytes.",
     [](Specimen& s) { s.extents.Leaf(0).SetKey16(1, 0, 12); }},
    {"extents-key-pad", "The pad byte of an extents key is not 0.",
     [](Specimen& s) { s.extents.Leaf(0).SetKey8(1, kExtKeyPad, 1); }},
    {"extents-fork-type", "An extents key is of a fork of type 0x7F.",
     [](Specimen& s) {
         s.extents.Leaf(1).SetKey8(s.extents.Leaf(1).Records() - 1, kExtKeyForkType, 0x7F);
     }},
    {"extents-keys-fall", "The keys of the extents tree do not rise.",
     [](Specimen& s) { s.extents.Leaf(0).SetKey32(2, kExtKeyStartBlock, 0); }},
    {"attributes-key-length-11", "A key of the attributes tree is shorter than its fixed part.",
     [](Specimen& s) { s.attributes.Leaf(0).SetKey16(1, 0, 11); }},
    {"attributes-name-beyond-key", "The name of an attribute is longer than its key.",
     [](Specimen& s) { s.attributes.Leaf(0).SetKey16(1, kAttrKeyNameLength, 127); }},
    {"attributes-keys-fall", "The keys of the attributes tree do not rise.",
     [](Specimen& s) { s.attributes.Leaf(0).SetKey32(0, kAttrKeyFileId, 900); }},
};

}  // namespace

Hall KeyHall() {
    return {"Keys", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
