// Hall: extents of the special files in the volume header.
#include <iterator>

#include "exhibit.h"

namespace VELK::test {

namespace {

using F = VolumeField;

const Exhibit kExhibits[] = {
    {"catalog-leaves-volume", "The extent of the catalog file begins behind the last block.",
     [](Specimen& s) { s.SetHeader32(F::kCatalog + F::kFirstStart, 5000); }},
    {"catalog-start-largest", "The extent of the catalog file begins at block 2^32 - 1.",
     [](Specimen& s) { s.SetHeader32(F::kCatalog + F::kFirstStart, 0xFFFFFFFF); }},
    {"catalog-count-largest",
     "The extent of the catalog file has 2^32 - 1 blocks: start and count wrap.",
     [](Specimen& s) { s.SetHeader32(F::kCatalog + F::kFirstCount, 0xFFFFFFFF); }},
    {"catalog-start-zero", "The extent of the catalog file lies over the volume header.",
     [](Specimen& s) { s.SetHeader32(F::kCatalog + F::kFirstStart, 0); }},
    {"catalog-extent-short", "The extent of the catalog file is a block shorter than the fork.",
     [](Specimen& s) {
         s.SetHeader32(F::kCatalog + F::kFirstCount, s.Header32(F::kCatalog + F::kFirstCount) - 1);
     }},
    {"catalog-blocks-zero", "The catalog fork has an extent, but 0 blocks.",
     [](Specimen& s) { s.SetHeader32(F::kCatalog + F::kBlocks, 0); }},
    {"catalog-absent", "The catalog fork is empty.",
     [](Specimen& s) {
         for (u32 at = 0; at < 80; at += 4) {
             s.SetHeader32(F::kCatalog + at, 0);
         }
     }},
    {"catalog-over-extents", "Catalog file and extents file claim the same blocks.",
     [](Specimen& s) { s.SetHeader32(F::kCatalog + F::kFirstStart, s.volume.extentsStart); }},
    {"catalog-twice-the-same", "Two extents of the catalog file are the same.",
     [](Specimen& s) {
         s.SetHeader32(F::kCatalog + F::kSecondStart, s.volume.catalogStart);
         s.SetHeader32(F::kCatalog + F::kSecondCount, 2);
     }},
    {"catalog-gap", "An extent of the catalog file follows an unused one.",
     [](Specimen& s) {
         s.SetHeader32(F::kCatalog + F::kSecondStart + 8, s.volume.dataStart);
         s.SetHeader32(F::kCatalog + F::kSecondCount + 8, 2);
     }},
    {"catalog-size-huge", "The catalog file is 2^63 bytes long.",
     [](Specimen& s) { s.SetHeader32(F::kCatalog + F::kSizeHigh, 0x80000000); }},
    {"catalog-size-zero", "The catalog file has blocks and no bytes.",
     [](Specimen& s) { s.SetHeader32(F::kCatalog + F::kSizeLow, 0); }},
    {"extents-absent", "The extents fork is empty.",
     [](Specimen& s) {
         for (u32 at = 0; at < 80; at += 4) {
             s.SetHeader32(F::kExtents + at, 0);
         }
     }},
    {"extents-leave-volume", "The extent of the extents file begins behind the last block.",
     [](Specimen& s) { s.SetHeader32(F::kExtents + F::kFirstStart, 5000); }},
    {"extents-need-themselves",
     "The extents file goes on in overflow records, which would lie in itself.",
     [](Specimen& s) { s.SetHeader32(F::kExtents + F::kBlocks, 100); }},
    {"attributes-leave-volume", "The extent of the attributes file begins behind the last block.",
     [](Specimen& s) { s.SetHeader32(F::kAttributesFile + F::kFirstStart, 5000); }},
    {"attributes-over-header-copy", "The attributes file lies over the last two blocks.",
     [](Specimen& s) {
         s.SetHeader32(F::kAttributesFile + F::kFirstStart, s.volume.totalBlocks - 2);
     }},
    {"allocation-absent", "The allocation fork is empty.",
     [](Specimen& s) {
         for (u32 at = 0; at < 80; at += 4) {
             s.SetHeader32(F::kAllocation + at, 0);
         }
     }},
    {"allocation-leaves-volume", "The extent of the allocation file begins behind the last block.",
     [](Specimen& s) { s.SetHeader32(F::kAllocation + F::kFirstStart, 5000); }},
    {"allocation-short", "The allocation file has fewer bits than the volume blocks.",
     [](Specimen& s) { s.SetHeader32(F::kAllocation + F::kSizeLow, 16); }},
    {"startup-over-catalog", "The startup file claims blocks of the catalog file.",
     [](Specimen& s) {
         s.SetHeader32(F::kStartup + F::kSizeLow, 512);
         s.SetHeader32(F::kStartup + F::kBlocks, 1);
         s.SetHeader32(F::kStartup + F::kFirstStart, s.volume.catalogStart + 1);
         s.SetHeader32(F::kStartup + F::kFirstCount, 1);
     }},
    {"catalog-marked-free", "The allocation file calls blocks of the catalog file free.",
     [](Specimen& s) { s.SetBlockMark(s.volume.catalogStart + 1, false); }},
    {"file-marked-free", "The allocation file calls a block of a file free.",
     [](Specimen& s) { s.SetBlockMark(s.volume.dataStart + 2, false); }},
    {"block-lost", "The allocation file calls a block used that nothing owns.",
     [](Specimen& s) { s.SetBlockMark(s.volume.dataStart + 60, true); }},
};

}  // namespace

Hall ForkHall() {
    return {"Forks of the special files", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
