// Hall: what the records of the trees say.
#include <iterator>

#include "exhibit.h"
#include "hfs/format.h"
#include "keys.h"

namespace VELK::test {

namespace {

const Exhibit kExhibits[] = {
    {"catalog-type-zero", "A catalog record has type 0.",
     [](Specimen& s) {
         Put16(&s.CatalogData(DiskCatKey(16, u"fc")), 0, 0);
         s.Rebuild();
     }},
    {"catalog-type-unknown", "A catalog record has type 0x7777.",
     [](Specimen& s) {
         Put16(&s.CatalogData(DiskCatKey(16, u"fc")), 0, 0x7777);
         s.Rebuild();
     }},
    {"file-as-folder", "A file record says that it is a folder.",
     [](Specimen& s) {
         Put16(&s.CatalogData(DiskCatKey(16, u"fc")), 0, 1);
         s.Rebuild();
     }},
    {"file-too-short", "A file record has 100 bytes.",
     [](Specimen& s) {
         s.CatalogData(DiskCatKey(16, u"fc")).resize(100);
         s.Rebuild();
     }},
    {"folder-too-long", "A folder record has 2 bytes too many.",
     [](Specimen& s) {
         s.CatalogData(DiskCatKey(2, u"dir")).resize(90);
         s.Rebuild();
     }},
    {"record-of-two-bytes", "The thread of a file has 2 bytes.",
     [](Specimen& s) {
         s.CatalogData(DiskCatKey(19, u"")).resize(2);
         s.Rebuild();
     }},
    {"thread-name-beyond-record", "The name in a thread is longer than its record.",
     [](Specimen& s) {
         Put16(&s.CatalogData(DiskCatKey(19, u"")), 8, 200);
         s.Rebuild();
     }},
    {"thread-points-elsewhere", "A thread names a folder that is not there.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(19, u"")), 4, 77);
         s.Rebuild();
     }},
    {"thread-points-to-itself", "The thread of a folder names the folder as its own parent.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(16, u"")), 4, 16);
         s.Rebuild();
     }},
    {"thread-missing", "A file has no thread.",
     [](Specimen& s) {
         s.Erase(&s.volume.catalog, DiskCatKey(19, u""));
         s.Rebuild();
     }},
    {"folder-missing", "The folder of nine files is not there.",
     [](Specimen& s) {
         s.Erase(&s.volume.catalog, DiskCatKey(2, u"dir"));
         s.Rebuild();
     }},
    {"root-folder-missing", "The root folder is not there.",
     [](Specimen& s) {
         s.Erase(&s.volume.catalog, DiskCatKey(1, u"root"));
         s.Rebuild();
     }},
    {"folders-in-a-ring", "A folder lies in itself.",
     [](Specimen& s) {
         s.Erase(&s.volume.catalog, DiskCatKey(2, u"dir"));
         s.volume.catalog.push_back({DiskCatKey(16, u"dir"), FolderData(16, 9)});
         Put32(&s.CatalogData(DiskCatKey(16, u"")), 4, 16);
         s.volume.Sort();
         s.Rebuild();
     }},
    {"valence-wrong", "A folder counts 200 items and has nine.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(2, u"dir")), 4, 200);
         s.Rebuild();
     }},
    {"id-twice", "Two files have the same ID.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(16, u"fd")), 8, 19);
         s.Rebuild();
     }},
    {"id-of-a-special-file", "A file has the ID of the catalog file.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(16, u"fd")), 8, 4);
         s.Rebuild();
     }},
    {"id-zero", "A file has the ID 0.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(16, u"fd")), 8, 0);
         s.Rebuild();
     }},
    {"file-extent-outside", "An extent of a file leaves the volume.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(16, u"fd")), 88 + 16, 999999);
         s.Rebuild();
     }},
    {"file-extent-wraps", "Start and count of an extent of a file wrap.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(16, u"fd")), 88 + 20, 0xFFFFFFFF);
         s.Rebuild();
     }},
    {"file-over-catalog", "A file claims blocks of the catalog.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(16, u"fd")), 88 + 16, 5);
         s.Rebuild();
     }},
    {"file-over-file", "Two files claim the same blocks.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(16, u"fd")), 88 + 16, s.volume.dataStart + 24);
         s.Rebuild();
     }},
    {"file-size-huge", "A file of two blocks has 2^63 bytes.",
     [](Specimen& s) {
         Put32(&s.CatalogData(DiskCatKey(16, u"fd")), 88, 0x80000000);
         s.Rebuild();
     }},
    {"overflow-missing", "The ninth extent of a file is nowhere.",
     [](Specimen& s) {
         s.Erase(&s.volume.extents, DiskExtKey(kForkData, 17, 8));
         s.Rebuild();
     }},
    {"overflow-of-no-file", "An overflow record belongs to a file that is not there.",
     [](Specimen& s) {
         s.volume.extents.back().key = DiskExtKey(kForkData, 99, 8);
         s.Rebuild();
     }},
    {"overflow-start-wrong", "An overflow record begins past the end of its fork.",
     [](Specimen& s) {
         s.volume.extents.back().key = DiskExtKey(kForkData, 17, 9);
         s.Rebuild();
     }},
    {"overflow-too-short", "An overflow record has 60 bytes.",
     [](Specimen& s) {
         s.volume.extents.back().data.resize(60);
         s.Rebuild();
     }},
    {"overflow-too-long", "An overflow record has 68 bytes.",
     [](Specimen& s) {
         s.volume.extents.back().data.resize(68);
         s.Rebuild();
     }},
    {"overflow-gap", "The extents of an overflow record have a gap.",
     [](Specimen& s) {
         Put32(&s.volume.extents.back().data, 8 * 3, 900);
         Put32(&s.volume.extents.back().data, 8 * 3 + 4, 1);
         s.Rebuild();
     }},
    {"bad-block-gap", "The bad-block list leaves out a record.",
     [](Specimen& s) {
         s.Erase(&s.volume.extents, DiskExtKey(kForkData, kBadBlockFileId, 16));
         s.Rebuild();
     }},
    {"bad-block-outside", "A bad block lies outside the volume.",
     [](Specimen& s) {
         Put32(&s.ExtentsData(DiskExtKey(kForkData, kBadBlockFileId, 16)), 0, 0xFFFFFFFF);
         s.Rebuild();
     }},
    {"bad-block-of-two-records", "The bad-block list has a record of the resource fork.",
     [](Specimen& s) {
         s.volume.extents[7].key = DiskExtKey(kForkResource, kBadBlockFileId, 0);
         s.Rebuild();
     }},
    {"bad-block-too-short", "The first record of the bad-block list has 40 bytes.",
     [](Specimen& s) {
         s.volume.extents[0].data.resize(40);
         s.Rebuild();
     }},
    {"attribute-type-unknown", "An attribute has an unknown type.",
     [](Specimen& s) {
         Put32(&s.volume.attributes[2].data, 0, 0x99);
         s.Rebuild();
     }},
    {"attribute-size-beyond-record", "An inline attribute is longer than its record.",
     [](Specimen& s) {
         Put32(&s.volume.attributes[2].data, 12, 5000);
         s.Rebuild();
     }},
    {"attribute-size-largest", "An inline attribute has 2^32 - 1 bytes.",
     [](Specimen& s) {
         Put32(&s.volume.attributes[2].data, 12, 0xFFFFFFFF);
         s.Rebuild();
     }},
    {"attribute-too-short", "An attribute has 4 bytes.",
     [](Specimen& s) {
         s.volume.attributes[2].data.resize(4);
         s.Rebuild();
     }},
    {"attribute-of-no-file", "An attribute belongs to a file that is not there.",
     [](Specimen& s) {
         s.volume.attributes.back().key = DiskAttrKey(999, 0, u"big");
         s.Rebuild();
     }},
    {"attribute-fork-outside", "The fork of an attribute leaves the volume.",
     [](Specimen& s) {
         Put32(&s.volume.attributes.back().data, 8 + 16, 999999);
         s.Rebuild();
     }},
};

}  // namespace

Hall RecordHall() {
    return {"Records", {std::begin(kExhibits), std::end(kExhibits)}};
}

}  // namespace VELK::test
