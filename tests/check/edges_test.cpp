// Rarer faults of each part, and the words for them.
#include <gtest/gtest.h>

#include <cstring>

#include "check_support.h"
#include "hfs/format.h"
#include "keys.h"

namespace VELK::test {
namespace {

#define EXPECT_IDS(outcome, ids) EXPECT_EQ((outcome).Ids(), ids) << (outcome).Lines()

constexpr u32 kHeader = 1024;
constexpr u32 kForks = 112;
constexpr u32 kBlock = VolumeImage::kBlockSize;
constexpr u32 kData = VolumeImage::kDataStart;

Outcome CheckOne(u32 fileId, const Bytes& key, const Bytes& data) {
    TreeShape shape;
    shape.fileId = fileId;
    shape.nodeSize = 4096;
    return CheckImage(BuildTree(shape, {{key, data}}));
}

VolumeImage InPieces(u32 pieces) {
    VolumeImage volume;
    volume.catalogPieces = pieces;
    volume.Build();
    return volume;
}

// A source whose bytes from..to-1 cannot be read.
struct Holed {
    const Bytes* bytes;
    u64 from;
    u64 to;
};

Outcome CheckHoled(const VolumeImage& volume, u64 from, u64 to, const CheckOptions& options) {
    Holed holed = {&volume.bytes, from, to};
    CheckSource source = {};
    source.self = &holed;
    source.size = volume.bytes.size();
    source.read = [](void* self, u64 offset, void* target, std::size_t size) {
        const auto* from_ = static_cast<const Holed*>(self);
        if (offset < from_->to && offset + size > from_->from) {
            return 5;
        }
        std::memcpy(target, from_->bytes->data() + offset, size);
        return 0;
    };
    return CheckSourceBytes(source, options);
}

}  // namespace

TEST(CheckEdges, QuickLookFindsTheCatalogsOverflowExtents) {
    const VolumeImage volume = InPieces(12);
    EXPECT_IDS(CheckBytes(volume.bytes, Quick()), "");
    EXPECT_EQ(CheckBytes(volume.bytes, Quick()).summary.stages[2].records, 8u);
}

TEST(CheckEdges, OverflowExtentsOfASpecialFileMustContinueIt) {
    VolumeImage volume = InPieces(12);
    const u64 leaf = u64{volume.extentsStart} * kBlock + volume.extentsTree.levels[1][0] * 512;
    const u32 start = Get32(volume.bytes, leaf + 14 + kExtKeyStartBlock);
    volume.Patch32(leaf + 14 + kExtKeyStartBlock, start + 1);
    const Outcome outcome = CheckBytes(volume.bytes);
    EXPECT_EQ(outcome.First(CheckId::V04).text, "extents of the catalog file start at block " +
                                                    std::to_string(start + 1) + ", expected " +
                                                    std::to_string(start));
}

TEST(CheckEdges, DescriptorOfTheHeaderNode) {
    TreeImage tree = CatalogTree(4);
    tree.Patch32(0, kDescBLink, 3);
    EXPECT_IDS(CheckImage(tree), "H01");
    tree = CatalogTree(4);
    tree.Patch16(0, kDescReserved, 3);
    EXPECT_IDS(CheckImage(tree), "N06");
}

TEST(CheckEdges, ForkSmallerThanItsNodes) {
    TreeImage tree = CatalogTree(4);
    tree.Patch16(0, kHeadNodeSize, 32768);
    EXPECT_EQ(CheckImage(tree).First(CheckId::H05).text,
              "a node takes 32768 bytes, the fork holds " + std::to_string(tree.bytes.size()));
}

TEST(CheckEdges, CompareTypeOfOtherTreesHasNoMeaning) {
    VolumeImage volume;
    volume.Build();
    volume.bytes[u64{volume.extentsStart} * kBlock + kHeadKeyCompareType] = kKeyCompareFolding;
    EXPECT_EQ(CheckBytes(volume.bytes).Ids(true), "H09");
}

TEST(CheckEdges, MapNodesAreJudgedLikeTheHeadersMap) {
    const TreeImage sound = BuildTree({.freeNodes = 9000}, CatalogOf(4));
    TreeImage tree = sound;
    tree.Patch8(tree.mapNodes[0], kDescHeight, 1);
    EXPECT_IDS(CheckImage(tree), "M01");
    // Bit 2048 + 16 is the first of the third byte of the first map node.
    tree = sound;
    tree.Patch8(tree.mapNodes[0], kDescSize + 2, 0xC0);
    tree.Patch32(0, kHeadFreeNodes, tree.freeNodes - 2);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "M05");
    EXPECT_EQ(outcome.findings[0].where, "catalog map bit 2064");
    EXPECT_EQ(outcome.findings[0].offset, u64{tree.mapNodes[0]} * 512 + 16);
    EXPECT_EQ(outcome.findings[0].text,
              "nodes 2064..2065 are marked used but nothing leads to them");
}

TEST(CheckEdges, LeakUpToTheLastNode) {
    TreeImage tree = CatalogTree(4);
    const u32 last = tree.totalNodes - 1;
    u8& marks = tree.bytes[kHeadMapRecord + last / 8];
    marks = static_cast<u8>(marks | (0x80u >> (last % 8)));
    tree.Patch32(0, kHeadFreeNodes, tree.freeNodes - 1);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "M05");
    EXPECT_EQ(outcome.findings[0].text,
              "node " + std::to_string(last) + " is marked used but nothing leads to it");
}

TEST(CheckEdges, RecordsTooShortForTheirType) {
    const Bytes thread = DiskCatKey(20, u"");
    Bytes brief(8);
    Put16(&brief, 0, 4);
    EXPECT_EQ(CheckOne(kCatalogFileId, thread, brief).First(CheckId::R01).text,
              "thread record of 8 bytes, expected 10");
    EXPECT_EQ(CheckOne(kCatalogFileId, thread, {}).First(CheckId::R01).text,
              "the record holds no type");
    const Bytes attribute = DiskAttrKey(20, 0, u"a");
    EXPECT_EQ(CheckOne(kAttributesFileId, attribute, Bytes(2)).First(CheckId::R04).text,
              "attribute record of 2 bytes is too short");
    Bytes inlined(8);
    Put32(&inlined, 0, 0x10);
    EXPECT_EQ(CheckOne(kAttributesFileId, attribute, inlined).First(CheckId::R04).text,
              "attribute record of 8 bytes is too short");
}

TEST(CheckEdges, PaddingBehindAnOddKey) {
    Bytes key = DiskCatKey(2, u"ab");
    Put16(&key, 0, Get16(key, 0) + 1);
    key.push_back(0);
    EXPECT_IDS(CheckOne(kCatalogFileId, key, FolderData(20, 0)), "K01");
    TreeImage tree = BuildTree({.nodeSize = 4096}, {{key, FolderData(20, 0)}});
    EXPECT_EQ(CheckImage(tree).summary.warnings, 1u);  // the name leaves a byte over
    tree.Patch8(1, 14 + 13, 1);
    EXPECT_EQ(CheckImage(tree).summary.warnings, 2u);
}

TEST(CheckEdges, ForkTypeOfNoForkHasNoFileEither) {
    VolumeImage volume;
    volume.extents = {{DiskExtKey(1, 17, 8), ExtentData({{kData + 30, 1}})}};
    volume.owned.push_back(kData + 30);
    volume.Build();
    const Outcome outcome = CheckBytes(volume.bytes, Full());
    EXPECT_IDS(outcome, "K05 R08");
    EXPECT_EQ(outcome.First(CheckId::R08).text,
              "extents of file 17 that none of its forks continues with");
}

TEST(CheckEdges, RunsBehindAnEmptyOne) {
    VolumeImage volume;
    Bytes* file = VolumeImage::DataOf(&volume.catalog, DiskCatKey(16, u"alpha"));
    Put32(file, 88 + 16 + 16, kData + 9);
    Put32(file, 88 + 16 + 20, 1);
    volume.Build();
    EXPECT_IDS(CheckBytes(volume.bytes, Full()), "R06");
    volume = {};
    volume.Build();
    volume.PatchHeaders32(kForks + 16 + 16, 300);
    volume.PatchHeaders32(kForks + 16 + 20, 1);
    const Outcome outcome = CheckBytes(volume.bytes);
    EXPECT_IDS(outcome, "V04");
    EXPECT_EQ(outcome.findings[0].text, "run 2 of 1 block stands behind an empty one");
    EXPECT_EQ(outcome.findings[0].where, "allocation file");
}

TEST(CheckEdges, VolumeWithoutBlocks) {
    VolumeImage volume;
    volume.Build();
    volume.PatchHeaders32(44, 0);
    EXPECT_EQ(CheckBytes(volume.bytes).First(CheckId::V02).text, "the volume has no blocks");
}

TEST(CheckEdges, AllocationFileTooShort) {
    VolumeImage volume;
    volume.Build();
    volume.PatchHeaders32(kForks + 4, 100);
    const Outcome outcome = CheckBytes(volume.bytes, Full());
    EXPECT_IDS(outcome, "V05");
    EXPECT_EQ(outcome.findings[0].text, "100 bytes hold no marks for 1000 blocks");
}

TEST(CheckEdges, JournalsThatCannotBeUnderstood) {
    VolumeImage volume;
    volume.Build();
    volume.PatchHeaders32(4, 0x2100);
    EXPECT_EQ(CheckBytes(volume.bytes).First(CheckId::V08).text,
              "the journal info block 0 cannot be read");
    volume.PatchHeaders32(12, 800);
    volume.Patch32(u64{800} * kBlock, 2);
    EXPECT_EQ(CheckBytes(volume.bytes).First(CheckId::V08).text,
              "the journal lies on another device");
    volume.Patch32(u64{800} * kBlock, 5);  // to be made new
    EXPECT_EQ(CheckBytes(volume.bytes).Ids(true), "");
    volume.Patch32(u64{800} * kBlock, 1);
    volume.Patch32(u64{800} * kBlock + 36, 0x7FFFFFFF);
    EXPECT_NE(CheckBytes(volume.bytes).First(CheckId::V08).text.find("cannot be read"),
              std::string::npos);
    volume.Patch32(u64{800} * kBlock + 36, 0);
    volume.Patch32(u64{800} * kBlock + 40, 801 * kBlock);
    const u8 little[] = {0x78, 0x4C, 0x4E, 0x4A, 0x78, 0x56, 0x34, 0x12, 0xFF, 0xFF, 0xFF, 0xFF};
    std::memcpy(volume.bytes.data() + 801 * kBlock, little, sizeof(little));
    EXPECT_EQ(CheckBytes(volume.bytes).First(CheckId::V08).text,
              "the journal's offsets lie outside the journal");
}

TEST(CheckEdges, LookupThatArrivesElsewhere) {
    // The same key in two leaves: a search only ever sees the right one.
    std::vector<TreeRecord> records;
    for (u32 fileId : {100u, 110u, 110u, 120u}) {
        records.push_back({DiskExtKey(kForkData, fileId, 8), ExtentData({{1, 1}})});
    }
    TreeShape shape;
    shape.fileId = kExtentsFileId;
    shape.recordsPerLeaf = 2;
    const Outcome outcome = CheckImage(BuildTree(shape, records), Full());
    EXPECT_IDS(outcome, "K03 D01");
    EXPECT_EQ(outcome.First(CheckId::D01).text,
              "looking up 110:data:8 from the root arrives at node 2 record 0");
}

TEST(CheckEdges, UnreadablePlacesAreNamed) {
    VolumeImage volume;
    volume.Build();
    const u64 catalog = u64{volume.catalogStart} * kBlock;
    const CheckOptions going = {.full = true, .keepGoing = true};
    Outcome outcome = CheckHoled(volume, kHeader, kHeader + 512, {});
    ASSERT_EQ(outcome.unreadable.size(), 1u);
    EXPECT_EQ(outcome.unreadable[0].where, "volume header");
    EXPECT_EQ(outcome.summary.stages[0].verdict, CheckVerdict::kStopped);
    outcome = CheckHoled(volume, catalog, catalog + 512, going);
    EXPECT_EQ(outcome.unreadable[0].where, "catalog node 0");
    const u64 root = catalog + u64{volume.catalogTree.rootNode} * 512;
    outcome = CheckHoled(volume, root, root + 512, going);
    EXPECT_EQ(outcome.unreadable[0].where,
              "catalog node " + std::to_string(volume.catalogTree.rootNode));
    EXPECT_IDS(outcome, "");
    const u64 leaf = catalog + u64{volume.catalogTree.levels[1][1]} * 512;
    EXPECT_EQ(CheckHoled(volume, leaf, leaf + 512, Quick()).unreadable.size(), 1u);
    outcome = CheckHoled(volume, 3 * kBlock, 4 * kBlock, going);
    ASSERT_EQ(outcome.unreadable.size(), 1u);
    EXPECT_EQ(outcome.unreadable[0].where, "allocation file");
    EXPECT_IDS(outcome, "");
}

}  // namespace VELK::test
