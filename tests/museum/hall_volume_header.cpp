// Hall: fields of the volume header.
#include <iterator>

#include "exhibit.h"

namespace VELK::test {

namespace {

using F = VolumeField;

const Exhibit kExhibits[] = {
    {"header-zeroed", "The volume header is all zeros; its copy is whole.",
     [](Specimen& s) { std::fill_n(s.bytes.begin() + 1024, 512, u8{0}); }},
    {"headers-zeroed", "The volume header and its copy are all zeros.",
     [](Specimen& s) {
         std::fill_n(s.bytes.begin() + 1024, 512, u8{0});
         std::fill_n(s.bytes.end() - 1024, 512, u8{0});
     }},
    {"copy-zeroed", "The copy of the volume header is all zeros.",
     [](Specimen& s) { std::fill_n(s.bytes.end() - 1024, 512, u8{0}); }},
    {"copy-differs", "The copy of the volume header counts another number of blocks.",
     [](Specimen& s) { Put32(&s.bytes, s.bytes.size() - 1024 + F::kTotalBlocks, 900); }},
    {"signature-unknown", "The signature is neither H+ nor HX.",
     [](Specimen& s) { s.SetHeader16(F::kSignature, 0x4831); }},
    {"version-of-the-other-kind", "Signature H+ with the version of HFSX.",
     [](Specimen& s) { s.SetHeader16(F::kVersion, 5); }},
    {"version-from-the-future", "HFSX of version 6.",
     [](Specimen& s) { s.SetHeader32(F::kSignature, 0x48580006); }},
    {"block-size-zero", "The allocation block has 0 bytes.",
     [](Specimen& s) { s.SetHeader32(F::kBlockSize, 0); }},
    {"block-size-odd", "The allocation block has 513 bytes.",
     [](Specimen& s) { s.SetHeader32(F::kBlockSize, 513); }},
    {"block-size-256", "The allocation block is smaller than a sector.",
     [](Specimen& s) { s.SetHeader32(F::kBlockSize, 256); }},
    {"block-size-2-to-31", "The allocation block has 2^31 bytes.",
     [](Specimen& s) { s.SetHeader32(F::kBlockSize, 0x80000000); }},
    {"block-size-doubled",
     "The allocation block is given twice its size, so that no fork lies where it is said "
     "to.",
     [](Specimen& s) { s.SetHeader32(F::kBlockSize, 1024); }},
    {"total-blocks-zero", "The volume has no blocks.",
     [](Specimen& s) { s.SetHeader32(F::kTotalBlocks, 0); }},
    {"total-blocks-largest", "The volume has 2^32 - 1 blocks.",
     [](Specimen& s) { s.SetHeader32(F::kTotalBlocks, 0xFFFFFFFF); }},
    {"total-blocks-too-few", "The volume ends before the blocks of its files.",
     [](Specimen& s) { s.SetHeader32(F::kTotalBlocks, 500); }},
    {"free-blocks-wrong", "One free block more than the allocation file has.",
     [](Specimen& s) { s.SetHeader32(F::kFreeBlocks, s.Header32(F::kFreeBlocks) + 1); }},
    {"file-count-wrong", "The header counts a file too many.",
     [](Specimen& s) { s.SetHeader32(F::kFileCount, 10); }},
    {"folder-count-wrong", "The header counts no folder.",
     [](Specimen& s) { s.SetHeader32(F::kFolderCount, 0); }},
    {"next-id-taken", "The next ID is that of a file there is.",
     [](Specimen& s) { s.SetHeader32(F::kNextCatalogId, 17); }},
    {"not-unmounted", "The volume was not unmounted cleanly.",
     [](Specimen& s) { s.SetHeader32(F::kAttributes, 0x200); }},
    {"boot-inconsistent", "The volume was found to be inconsistent.",
     [](Specimen& s) { s.SetHeader32(F::kAttributes, Specimen::kClean | 0x800); }},
    {"software-lock", "The volume is locked against writing.",
     [](Specimen& s) { s.SetHeader32(F::kAttributes, Specimen::kClean | 0x8000); }},
};

}  // namespace

Hall VolumeHeaderHall() {
    return {"Volume header", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
