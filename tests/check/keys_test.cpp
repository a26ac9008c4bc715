// Keys and leaf data of one tree: order, index keys, types and sizes.
#include <gtest/gtest.h>

#include <cstring>

#include "check_support.h"
#include "hfs/format.h"
#include "keys.h"

namespace VELK::test {
namespace {

u32 RecordStart(const TreeImage& tree, u32 nodeNum, u32 index) {
    return Get16(tree.Node(nodeNum), tree.shape.nodeSize - 2 * (index + 1));
}

#define EXPECT_IDS(outcome, ids) EXPECT_EQ((outcome).Ids(), ids) << (outcome).Lines()

// A tree of one kind with these records, in the order given.
Outcome CheckRecords(u32 fileId, const std::vector<TreeRecord>& records) {
    TreeShape shape;
    shape.fileId = fileId;
    shape.nodeSize = 4096;
    return CheckImage(BuildTree(shape, records));
}

Outcome CheckOne(u32 fileId, const Bytes& key, const Bytes& data) {
    return CheckRecords(fileId, {{key, data}});
}

Bytes WithByte(Bytes bytes, std::size_t offset, u32 value) {
    bytes.at(offset) = static_cast<u8>(value);
    return bytes;
}

const Bytes kEmptyFork(80);

}  // namespace

TEST(CheckKeys, K01KeyLengthOutOfRange) {
    TreeImage tree = CatalogTree(0);
    const u32 leaf = tree.levels[1][0];
    tree.Patch16(leaf, 14, 4);
    EXPECT_IDS(CheckImage(tree), "K01");
    tree.Patch16(leaf, 14, 518);
    EXPECT_EQ(CheckImage(tree).First(CheckId::K01).text, "key length is 518, expected 6 to 516");
    tree.Patch16(leaf, 14, 400);
    EXPECT_EQ(CheckImage(tree).First(CheckId::K01).text,
              "a key of 402 bytes does not fit its record of 104");
}

TEST(CheckKeys, K01NameThatDoesNotFitItsKey) {
    TreeImage tree = CatalogTree(0);
    const u32 leaf = tree.levels[1][0];
    tree.Patch16(leaf, 14 + kCatKeyNameLength, 200);
    const CheckFinding longer = CheckImage(tree).First(CheckId::K01);
    EXPECT_EQ(longer.text, "a name of 200 units takes a key of 406 bytes, the key has 14");
    EXPECT_EQ(longer.severity, CheckSeverity::kError);
    tree.Patch16(leaf, 14 + kCatKeyNameLength, 3);
    EXPECT_EQ(CheckImage(tree).First(CheckId::K01).severity, CheckSeverity::kWarning);
}

TEST(CheckKeys, K01PaddingOfAnAttributeKey) {
    const Outcome outcome =
        CheckOne(kAttributesFileId, WithByte(DiskAttrKey(20, 0, u"tag"), kAttrKeyPad, 1),
                 InlineAttribute(4));
    EXPECT_IDS(outcome, "K01");
    EXPECT_EQ(outcome.summary.errors, 0u);
}

TEST(CheckKeys, K02KeysFallWithinANode) {
    std::vector<TreeRecord> records = CatalogOf(3);
    std::swap(records[3], records[4]);
    const Outcome outcome = CheckRecords(kCatalogFileId, records);
    EXPECT_IDS(outcome, "K02");
    EXPECT_EQ(outcome.findings[0].text,
              "key 2:\"file_0001\" is not above record 3's key 2:\"file_0002\"");
    EXPECT_EQ(outcome.findings[0].where, "catalog node 1 record 4");
}

TEST(CheckKeys, K02EqualKeysInOtherCase) {
    std::vector<TreeRecord> records = CatalogOf(1);
    records.insert(records.begin() + 3, {DiskCatKey(2, u"FILE_0000"), records[2].data});
    EXPECT_IDS(CheckRecords(kCatalogFileId, records), "K02");
    TreeImage tree = BuildTree({.nodeSize = 4096}, records);
    const CheckTreeKind binary = {kCatalogFileId, CheckNameOrder::kBinary, false};
    const CheckSummary summary =
        CheckTreeBytes(tree.bytes.data(), tree.bytes.size(), binary, {}, {});
    EXPECT_EQ(summary.errors, 1u);  // upper case comes first there
}

TEST(CheckKeys, K03KeysFallFromNodeToNode) {
    TreeImage tree = CatalogTree(40);
    const u32 left = tree.levels[1][5];
    const u32 right = tree.levels[1][6];
    // The name of the right leaf's first key, in the leaf and in the index above it.
    const u32 name = 14 + kCatKeyName;
    Bytes node = tree.Node(right);
    Bytes before(node.begin() + 14, node.begin() + 14 + 26);
    tree.Patch16(right, name, u'a');
    Bytes after = before;
    Put16(&after, kCatKeyName, u'a');
    for (std::size_t i = 0; i + before.size() <= tree.bytes.size(); i += 2) {
        if (std::memcmp(tree.bytes.data() + i, before.data(), before.size()) == 0) {
            std::memcpy(tree.bytes.data() + i, after.data(), after.size());
        }
    }
    const Outcome outcome = CheckImage(tree);
    EXPECT_NE(outcome.Ids().find("K03"), std::string::npos) << outcome.Lines();
    const std::string text = outcome.First(CheckId::K03).text;
    EXPECT_NE(text.find("\"aile_"), std::string::npos) << text;
    EXPECT_NE(text.find("is not above node " + std::to_string(left) + "'s last key 2:\"file_"),
              std::string::npos)
        << text;
}

// Leaves of two records each, file IDs 100, 110 | 120, 130 | 140, ...; the second child begins at
// 120. The index key above it is set to `fileId`.
Outcome CheckWithIndexKey(u32 fileId) {
    std::vector<TreeRecord> records;
    for (u32 i = 0; i < 8; ++i) {
        records.push_back({DiskExtKey(kForkData, 100 + 10 * i, 8), ExtentData({{1, 1}})});
    }
    TreeShape shape;
    shape.fileId = kExtentsFileId;
    shape.recordsPerLeaf = 2;
    TreeImage tree = BuildTree(shape, records);
    tree.Patch32(tree.rootNode, RecordStart(tree, tree.rootNode, 1) + kExtKeyFileId, fileId);
    return CheckImage(tree);
}

TEST(CheckKeys, K04IndexKeyAboveItsChild) {
    const Outcome outcome = CheckWithIndexKey(125);
    EXPECT_IDS(outcome, "K04");
    EXPECT_EQ(outcome.findings[0].where, "extents node 5 record 1");
    EXPECT_EQ(outcome.findings[0].text,
              "index key 125:data:8 is above the first key 120:data:8 of its child 2");
    EXPECT_EQ(outcome.summary.errors, 1u);
}

TEST(CheckKeys, K04LowerIndexKeyIsAWarningUnlessItMisleads) {
    const Outcome between = CheckWithIndexKey(115);
    EXPECT_IDS(between, "K04");
    EXPECT_EQ(between.findings[0].text,
              "index key 115:data:8 is below the first key 120:data:8 of its child 2");
    EXPECT_EQ(between.summary.errors, 0u);
    const Outcome misleading = CheckWithIndexKey(110);
    EXPECT_IDS(misleading, "K04");
    EXPECT_EQ(misleading.findings[0].text,
              "index key 110:data:8 of child 2 is not above node 1's last key 110:data:8");
    EXPECT_EQ(misleading.summary.errors, 1u);
}

TEST(CheckKeys, K05ExtentsKeys) {
    const Bytes key = DiskExtKey(kForkData, 20, 8);
    const Bytes data = ExtentData({{5, 1}});
    EXPECT_IDS(CheckOne(kExtentsFileId, key, data), "");
    EXPECT_IDS(CheckOne(kExtentsFileId, WithByte(key, 1, 8), data), "K05");
    EXPECT_IDS(CheckOne(kExtentsFileId, WithByte(key, kExtKeyForkType, 1), data), "K05");
    const Outcome pad = CheckOne(kExtentsFileId, WithByte(key, kExtKeyPad, 1), data);
    EXPECT_IDS(pad, "K05");
    EXPECT_EQ(pad.summary.errors, 0u);
}

TEST(CheckRecords, R01CatalogTypesAndSizes) {
    const Bytes item = DiskCatKey(2, u"a");
    const Bytes thread = DiskCatKey(20, u"");
    const Bytes file = FileData(20, kEmptyFork, kEmptyFork);
    EXPECT_IDS(CheckOne(kCatalogFileId, item, file), "");
    EXPECT_IDS(CheckOne(kCatalogFileId, item, WithByte(file, 1, 9)), "R01");
    EXPECT_IDS(CheckOne(kCatalogFileId, item, Bytes(file.begin(), file.end() - 2)), "R01");
    EXPECT_IDS(CheckOne(kCatalogFileId, item, WithByte(FolderData(20, 0), 1, 2)), "R01");
    EXPECT_IDS(CheckOne(kCatalogFileId, thread, file), "R01");
    EXPECT_IDS(CheckOne(kCatalogFileId, item, ThreadData(false, 2, u"a")), "R01");
    EXPECT_IDS(CheckOne(kCatalogFileId, thread, ThreadData(false, 2, u"a")), "");
    EXPECT_IDS(CheckOne(kCatalogFileId, thread, ThreadData(false, 2, u"")), "R01");
    EXPECT_IDS(CheckOne(kCatalogFileId, thread, WithByte(ThreadData(false, 2, u"ab"), 9, 3)),
               "R01");
}

TEST(CheckRecords, R02IndexRecordWithMoreThanAChild) {
    TreeImage tree = CatalogTree(40);
    const u32 parent = tree.levels[2][0];
    // The first key loses a unit, which the data gains.
    const u32 start = RecordStart(tree, parent, 1);
    const u32 length = Get16(tree.Node(parent), start);
    tree.Patch16(parent, start, length - 2);
    tree.Patch16(parent, start + kCatKeyNameLength, (length - 2 - 6) / 2);
    const Outcome outcome = CheckImage(tree);
    EXPECT_NE(outcome.Ids().find("R02"), std::string::npos) << outcome.Lines();
    EXPECT_EQ(outcome.First(CheckId::R02).text, "an index record with 6 bytes of data, expected 4");
}

TEST(CheckRecords, R03ExtentsSizesAndPacking) {
    const Bytes key = DiskExtKey(kForkResource, 20, 8);
    EXPECT_IDS(CheckOne(kExtentsFileId, key, Bytes(60)), "R03");
    const Outcome gap = CheckOne(kExtentsFileId, key, ExtentData({{9, 1}, {0, 0}, {12, 1}}));
    EXPECT_IDS(gap, "R03");
    EXPECT_EQ(gap.summary.errors, 1u);
    const Outcome none = CheckOne(kExtentsFileId, key, ExtentData({}));
    EXPECT_IDS(none, "R03");
    EXPECT_EQ(none.summary.errors, 0u);
    EXPECT_IDS(CheckOne(kExtentsFileId, key, ExtentData({{9, 1}, {3, 0}})), "R03");
}

TEST(CheckRecords, R04AttributeTypesAndSizes) {
    const Bytes key = DiskAttrKey(20, 0, u"tag");
    const Bytes later = DiskAttrKey(20, 8, u"tag");
    Bytes fork(88);
    Put32(&fork, 0, 0x20);
    Bytes extents(72);
    Put32(&extents, 0, 0x30);
    for (u32 size : {0u, 1u, 21u, 300u}) {
        EXPECT_IDS(CheckOne(kAttributesFileId, key, InlineAttribute(size)), "");
    }
    EXPECT_IDS(CheckOne(kAttributesFileId, key, fork), "");
    EXPECT_IDS(CheckOne(kAttributesFileId, later, extents), "");
    EXPECT_IDS(CheckOne(kAttributesFileId, key, WithByte(InlineAttribute(8), 15, 12)), "R04");
    EXPECT_IDS(CheckOne(kAttributesFileId, key, WithByte(InlineAttribute(8), 12, 0xFF)), "R04");
    EXPECT_IDS(CheckOne(kAttributesFileId, key, Bytes(fork.begin(), fork.end() - 4)), "R04");
    EXPECT_IDS(CheckOne(kAttributesFileId, later, Bytes(extents.begin(), extents.end() - 8)),
               "R04");
    EXPECT_IDS(CheckOne(kAttributesFileId, key, extents), "R04");
    EXPECT_IDS(CheckOne(kAttributesFileId, later, fork), "R04");
    const Outcome unknown = CheckOne(kAttributesFileId, key, WithByte(Bytes(88), 3, 0x77));
    EXPECT_IDS(unknown, "R04");
    EXPECT_EQ(unknown.summary.errors, 0u);
}

TEST(CheckKeys, NamesAreShownSoThatTheyCanBeTypedAgain) {
    std::vector<TreeRecord> records = {
        {DiskCatKey(2, u"\u0001\"\\\xD800z\u00e9\xD83D\xDE00"), FolderData(20, 0)},
        {DiskCatKey(2, u""), ThreadData(true, 1, u"r")}};
    const Outcome outcome = CheckRecords(kCatalogFileId, records);
    EXPECT_EQ(outcome.First(CheckId::K02).text,
              "key 2:\"\" is not above record 0's key "
              "2:\"\\u0001\\\"\\\\\\ud800z\u00e9\U0001F600\"");
}

}  // namespace VELK::test
