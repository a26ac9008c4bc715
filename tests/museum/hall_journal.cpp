// Hall: journals, their info block and their header.
#include <iterator>

#include "exhibit.h"

namespace VELK::test {

namespace {

using F = VolumeField;

const Exhibit kExhibits[] = {
    {"journal-pending", "The journal holds 4,096 bytes of transactions that were not carried out.",
     [](Specimen& s) { s.Journaled(512, 4608); }},
    {"journal-pending-zeros",
     "A transaction waits in the journal of a volume whose last writer kept it, and its "
     "bytes are zeros.",
     [](Specimen& s) {
         s.Journaled(512, 4608);
         s.SetFirstHeader32(F::kLastMounted, 0x4846534A);
     }},
    {"journal-info-block-zero", "The volume has a journal, and its info block is block 0.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         s.SetHeader32(F::kJournalInfo, 0);
     }},
    {"journal-info-outside", "The info block of the journal lies behind the last block.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         s.SetHeader32(F::kJournalInfo, 5000);
     }},
    {"journal-elsewhere", "The journal lies on another device.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         Put32(&s.bytes, s.JournalInfoOffset(), 2);
     }},
    {"journal-offset-outside", "The journal begins behind the end of the volume.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         Put32(&s.bytes, s.JournalInfoOffset() + 36, 1);
     }},
    {"journal-offset-odd", "The journal begins inside a sector.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         Put32(&s.bytes, s.JournalInfoOffset() + 40, static_cast<u32>(s.JournalOffset() + 1));
     }},
    {"journal-size-zero", "The journal has 0 bytes.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         Put32(&s.bytes, s.JournalInfoOffset() + 48, 0);
     }},
    {"journal-size-wraps", "The journal has 2^64 - 512 bytes: offset and size wrap.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         Put32(&s.bytes, s.JournalInfoOffset() + 44, 0xFFFFFFFF);
         Put32(&s.bytes, s.JournalInfoOffset() + 48, 0xFFFFFE00);
     }},
    {"journal-over-catalog", "The journal covers the catalog file.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         Put32(&s.bytes, s.JournalInfoOffset() + 40,
               s.Header32(F::kCatalog + F::kFirstStart) * VolumeImage::kBlockSize);
     }},
    {"journal-over-header", "The journal covers the volume header.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         Put32(&s.bytes, s.JournalInfoOffset() + 40, 0);
     }},
    {"journal-header-zeroed", "The journal header is all zeros.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         std::fill_n(s.bytes.begin() + static_cast<long>(s.JournalOffset()), 44, u8{0});
     }},
    {"journal-checksum", "The checksum of the journal header is wrong.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         s.BreakJournalChecksum();
     }},
    {"journal-start-outside", "The journal starts behind its end; the checksum fits.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         s.SetJournal32(12, 0x7FFFFE00);
     }},
    {"journal-start-in-header", "The journal starts in its own header; the checksum fits.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         s.SetJournal32(12, 0);
     }},
    {"journal-start-odd", "The journal starts inside a sector; the checksum fits.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         s.SetJournal32(12, 513);
     }},
    {"journal-list-size-zero", "The block lists of the journal have 0 bytes; the checksum fits.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         s.SetJournal32(32, 0);
     }},
    {"journal-list-size-huge", "The block lists of the journal have 2^31 bytes; the checksum fits.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         s.SetJournal32(32, 0x80000000);
     }},
    {"journal-sector-zero", "The sectors of the journal have 0 bytes; the checksum fits.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         s.SetJournal32(40, 0);
     }},
    {"journal-sizes-differ", "Journal header and info block state two sizes; the checksum fits.",
     [](Specimen& s) {
         s.Journaled(512, 512);
         s.SetJournal32(28, 4096);
     }},
};

}  // namespace

Hall JournalHall() {
    return {"Journal", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
