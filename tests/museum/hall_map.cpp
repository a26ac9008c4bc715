// Hall: map records and the chain of map nodes.
#include <iterator>

#include "exhibit.h"
#include "hfs/format.h"

namespace VELK::test {

namespace {

const Exhibit kExhibits[] = {
    {"map-header-bit-clear", "The bit of the header node is clear.",
     [](Specimen& s) { s.catalog.SetMapBit(0, false); }},
    {"map-root-bit-clear", "The bit of the root is clear.",
     [](Specimen& s) { s.catalog.SetMapBit(s.catalog.Image().rootNode, false); }},
    {"map-leaf-bit-clear", "The bit of a leaf is clear.",
     [](Specimen& s) { s.catalog.SetMapBit(s.catalog.LeafNumber(3), false); }},
    {"map-all-clear", "All bits of the map are clear.",
     [](Specimen& s) {
         for (u32 n = 0; n < s.catalog.Image().totalNodes; ++n) {
             s.catalog.SetMapBit(n, false);
         }
     }},
    {"map-leak", "The bit of a free node is set.",
     [](Specimen& s) { s.catalog.SetMapBit(s.catalog.FreeNumber(), true); }},
    {"map-bit-behind-last", "A bit behind the last node is set.",
     [](Specimen& s) { s.catalog.SetMapBit(s.catalog.Image().totalNodes + 3, true); }},
    {"map-record-slot", "The map record starts 2 bytes late.",
     [](Specimen& s) { s.catalog.Header().SetSlot(2, 250); }},
    {"map-record-into-slots", "The map record reaches over the offset table.",
     [](Specimen& s) { s.catalog.Header().SetSlot(3, 510); }},
    {"map-record-short", "The map record has 2 bytes.",
     [](Specimen& s) { s.catalog.Header().SetSlot(3, 250); }},
    {"map-chain-not-needed", "The header node names a free node as map node; the map needs none.",
     [](Specimen& s) { s.catalog.Header().Set32(kDescFLink, s.catalog.FreeNumber()); }},
    {"map-chain-cut", "The map needs a second node and names none.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.Header().Set32(kDescFLink, 0);
     }},
    {"map-chain-to-itself", "The map node is followed by itself.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.MapNode(0).Set32(kDescFLink, s.catalog.MapNumber(0));
     }},
    {"map-chain-to-leaf", "The map goes on in a leaf.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.Header().Set32(kDescFLink, s.catalog.LeafNumber(0));
     }},
    {"map-chain-to-free", "The map goes on in a free node.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.Header().Set32(kDescFLink, s.catalog.FreeNumber());
     }},
    {"map-chain-behind-last", "The map goes on behind the last node.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.Header().Set32(kDescFLink, s.catalog.Image().totalNodes);
     }},
    {"map-chain-largest", "The map goes on in node 2^32 - 1.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.Header().Set32(kDescFLink, 0xFFFFFFFF);
     }},
    {"map-node-kind", "The map node says that it is a leaf.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.MapNode(0).Set8(kDescKind, 0xFF);
     }},
    {"map-node-height", "The map node has height 1.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.MapNode(0).Set8(kDescHeight, 1);
     }},
    {"map-node-records", "The map node has no records.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.MapNode(0).Set16(kDescNumRecords, 0);
     }},
    {"map-node-record-short", "The record of the map node ends half-way.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.MapNode(0).SetSlot(1, 256);
     }},
    {"map-node-record-odd", "The record of the map node starts at an odd byte.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.MapNode(0).SetSlot(0, 15);
     }},
    {"map-node-zeroed", "The map node is all zeros.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.MapNode(0).Fill(0);
     }},
    {"map-node-own-bit", "The bit of the map node is clear.",
     [](Specimen& s) {
         s.Widen();
         s.catalog.SetMapBit(s.catalog.MapNumber(0), false);
     }},
};

}  // namespace

Hall MapHall() {
    return {"Map of nodes", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
