// Hall: what lies around a volume.
#include <iterator>
#include "disk_builder.h"

#include "exhibit.h"

namespace VELK::test {

namespace {

const Exhibit kExhibits[] = {
    {"apm-entry-past-image", "The partition of the Apple map begins behind the end of the image.",
     [](Specimen& s) {
         s.bytes = InApm(s.bytes, 512);
         Put32(&s.bytes, 2 * 512 + 8, 0x00FFFFFF);
     }},
    {"apm-entry-count-huge", "The Apple map counts 2^32 - 1 entries.",
     [](Specimen& s) {
         s.bytes = InApm(s.bytes, 512);
         for (u32 i = 1; i < 4; ++i) {
             Put32(&s.bytes, i * 512 + 4, 0xFFFFFFFF);
         }
     }},
    {"apm-block-size-zero", "The Apple map has blocks of 0 bytes.",
     [](Specimen& s) {
         s.bytes = InApm(s.bytes, 512);
         Put16(&s.bytes, 2, 0);
     }},
    {"apm-entries-gone", "The Apple map has its driver block, but no entry.",
     [](Specimen& s) {
         s.bytes = InApm(s.bytes, 512);
         std::fill_n(s.bytes.begin() + 512, 3 * 512, u8{0});
     }},
    {"apm-volume-gone", "The partition of the Apple map is there, the volume in it is zeros.",
     [](Specimen& s) {
         s.bytes = InApm(s.bytes, 512);
         std::fill(s.bytes.begin() + kPartitionStart, s.bytes.end(), u8{0});
     }},
    {"apm-partition-short", "The partition of the Apple map is shorter than its volume.",
     [](Specimen& s) {
         s.bytes = InApm(s.bytes, 512);
         Put32(&s.bytes, 2 * 512 + 12, 100);
     }},
    {"gpt-entry-reversed", "The partition of the GUID table ends before it begins.",
     [](Specimen& s) {
         s.bytes = InGpt(s.bytes, 512);
         Put32(&s.bytes, 2 * 512 + 128 + 40, 0x01000000);
     }},
    {"gpt-entry-past-image", "The partition of the GUID table begins behind the end of the image.",
     [](Specimen& s) {
         s.bytes = InGpt(s.bytes, 512);
         Put32(&s.bytes, 2 * 512 + 128 + 32, 0xFFFFFFFF);
     }},
    {"gpt-entry-size-zero", "The entries of the GUID table have 0 bytes.",
     [](Specimen& s) {
         s.bytes = InGpt(s.bytes, 512);
         Put32(&s.bytes, 512 + 84, 0);
     }},
    {"gpt-entry-size-huge", "The entries of the GUID table have 2^32 - 1 bytes.",
     [](Specimen& s) {
         s.bytes = InGpt(s.bytes, 512);
         Put32(&s.bytes, 512 + 84, 0xFFFFFFFF);
     }},
    {"gpt-entries-past-image", "The entries of the GUID table lie behind the end of the image.",
     [](Specimen& s) {
         s.bytes = InGpt(s.bytes, 512);
         Put32(&s.bytes, 512 + 72, 0xFFFFFFFF);
     }},
    {"gpt-count-huge", "The GUID table counts 2^32 - 1 entries.",
     [](Specimen& s) {
         s.bytes = InGpt(s.bytes, 512);
         Put32(&s.bytes, 512 + 80, 0xFFFFFFFF);
     }},
    {"mbr-entry-past-image", "The partition of the MBR begins behind the end of the image.",
     [](Specimen& s) {
         s.bytes = InMbr(s.bytes);
         Put32(&s.bytes, 462 + 8, 0xFFFFFF7F);
     }},
    {"mbr-signature-gone", "The MBR lacks its signature.",
     [](Specimen& s) {
         s.bytes = InMbr(s.bytes);
         s.bytes[511] = 0;
     }},
    {"wrapper-without-volume", "The wrapper names no volume inside.",
     [](Specimen& s) {
         s.bytes = InWrapper(s.bytes);
         Put16(&s.bytes, 1024 + 0x7C, 0);
     }},
    {"wrapper-leads-outside", "The volume in the wrapper begins behind the end of the image.",
     [](Specimen& s) {
         s.bytes = InWrapper(s.bytes);
         Put16(&s.bytes, 1024 + 0x7E, 0xFFFF);
     }},
    {"wrapper-block-size-zero", "The blocks of the wrapper have 0 bytes.",
     [](Specimen& s) {
         s.bytes = InWrapper(s.bytes);
         Put32(&s.bytes, 1024 + 20, 0);
     }},
    {"wrapper-block-size-huge", "The blocks of the wrapper have 2^32 - 512 bytes.",
     [](Specimen& s) {
         s.bytes = InWrapper(s.bytes);
         Put32(&s.bytes, 1024 + 20, 0xFFFFFE00);
     }},
};

}  // namespace

Hall PartitionHall() {
    return {"Partition maps and wrappers", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
