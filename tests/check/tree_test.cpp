// Header, map, nodes, links and keys of one tree: sound trees are clean, and each fault is told
// with the name of the invariant it breaks and of no other.
#include <gtest/gtest.h>

#include "check_support.h"
#include "hfs/format.h"
#include "keys.h"

namespace VELK::test {
namespace {

// The nth node (0 ..) of a level, from the left.
u32 NodeAt(const TreeImage& tree, u32 level, u32 n) {
    return tree.levels.at(level).at(n);
}

u32 RecordStart(const TreeImage& tree, u32 nodeNum, u32 index) {
    return Get16(tree.Node(nodeNum), tree.shape.nodeSize - 2 * (index + 1));
}

#define EXPECT_IDS(outcome, ids) EXPECT_EQ((outcome).Ids(), ids) << (outcome).Lines()

}  // namespace

TEST(CheckTreeSound, TreesOfEveryKindAndDepthAreClean) {
    for (u32 count : {0u, 1u, 3u, 40u, 300u}) {
        EXPECT_IDS(CheckImage(CatalogTree(count), Full()), "");
        EXPECT_IDS(CheckImage(ExtentsTree(count), Full()), "");
        EXPECT_IDS(CheckImage(AttributesTree(count), Full()), "");
        EXPECT_IDS(CheckImage(CatalogTree(count), Quick()), "");
    }
}

TEST(CheckTreeSound, MapNodesAndFifteenLevelsAreClean) {
    TreeShape shape;
    shape.freeNodes = 9000;
    EXPECT_IDS(CheckImage(BuildTree(shape, CatalogOf(20)), Full()), "");
    shape.freeNodes = 8;
    shape.minDepth = 15;
    EXPECT_IDS(CheckImage(BuildTree(shape, CatalogOf(20)), Full()), "");
}

TEST(CheckTreeSound, VisitsEveryNodeOnceAndCountsRecords) {
    const TreeImage tree = CatalogTree(300);
    const Outcome outcome = CheckImage(tree);
    EXPECT_EQ(outcome.summary.nodes, tree.totalNodes - tree.freeNodes);
    EXPECT_EQ(outcome.summary.stages[0].records, tree.leafRecords);
    EXPECT_EQ(outcome.summary.stages[0].verdict, CheckVerdict::kSound);
}

TEST(CheckTreeSound, EmptyTreeOfAnyDataIsCleanWithoutLookingAtIt) {
    TreeImage tree = BuildTree({}, NthRecords(kCatalogFileId, 30, 40));
    Outcome outcome;
    CheckTreeKind kind = {kCatalogFileId, CheckNameOrder::kFolding, true};
    const CheckSummary summary =
        CheckTreeBytes(tree.bytes.data(), tree.bytes.size(), kind, Full(), {});
    EXPECT_EQ(summary.errors + summary.warnings, 0u);
    EXPECT_NE(CheckImage(tree).Ids(), "");
}

// Header.

TEST(CheckHeader, H01WrongKindHeightAndOffsets) {
    TreeImage tree = CatalogTree(40);
    tree.Patch8(0, kDescKind, 0);
    EXPECT_IDS(CheckImage(tree), "H01");
    tree = CatalogTree(40);
    tree.Patch8(0, kDescHeight, 3);
    EXPECT_EQ(CheckImage(tree).First(CheckId::H01).text, "height of node 0 is 3, expected 0");
    tree = CatalogTree(40);
    tree.Patch16(0, 512 - 6, 250);
    const CheckFinding finding = CheckImage(tree).First(CheckId::H01);
    EXPECT_EQ(finding.text, "the map record starts at 250, expected 248");
    EXPECT_EQ(finding.offset, 506u);
    EXPECT_EQ(finding.expected, "248");
    EXPECT_EQ(finding.found, "250");
}

TEST(CheckHeader, H02NodeSizeNoPowerOfTwoOrBelowTheMapBlock) {
    TreeImage tree = CatalogTree(40);
    tree.Patch16(0, kHeadNodeSize, 1000);
    EXPECT_IDS(CheckImage(tree), "H02");
    CheckOptions options;
    options.mapBlock = 1024;
    EXPECT_IDS(CheckImage(CatalogTree(40), options), "H02");
}

TEST(CheckHeader, H03TooDeepToSearchOrToOpen) {
    TreeImage tree = CatalogTree(40);
    tree.Patch16(0, kHeadTreeDepth, 16);
    EXPECT_IDS(CheckImage(tree), "H03 H12");
    tree.Patch16(0, kHeadTreeDepth, 17);
    EXPECT_EQ(CheckImage(tree).First(CheckId::H03).text,
              "treeDepth is 17, more than 16, the most that opens");
}

TEST(CheckHeader, H04RootNodeBeyondTheTree) {
    TreeImage tree = CatalogTree(40);
    tree.Patch32(0, kHeadRootNode, 900);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "H04");
    EXPECT_EQ(
        CheckFindingLine(outcome.findings[0]),
        "error H04 catalog header (image offset 0x10): rootNode 900 is not below totalNodes " +
            std::to_string(tree.totalNodes));
    tree = CatalogTree(40);
    tree.Patch32(0, kHeadFreeNodes, tree.totalNodes);
    EXPECT_IDS(CheckImage(tree), "H04 H13");
}

TEST(CheckHeader, H05MoreNodesThanTheForkHoldsOrFewer) {
    TreeImage tree = CatalogTree(40);
    tree.Patch32(0, kHeadTotalNodes, 0xFFFFFFFF);
    EXPECT_NE(CheckImage(tree).Ids().find("H05"), std::string::npos);
    EXPECT_EQ(CheckImage(tree).First(CheckId::H05).severity, CheckSeverity::kError);
    tree = CatalogTree(40);
    tree.bytes.resize(tree.bytes.size() + 512);
    EXPECT_IDS(CheckImage(tree), "H05");
    EXPECT_EQ(CheckImage(tree).First(CheckId::H05).severity, CheckSeverity::kWarning);
    tree.bytes.resize(100);
    EXPECT_IDS(CheckImage(tree), "H05");
}

TEST(CheckHeader, H06UnknownTreeType) {
    TreeImage tree = CatalogTree(40);
    tree.Patch8(0, kHeadBtreeType, 0x01);
    EXPECT_IDS(CheckImage(tree), "H06");
    for (u32 type : {0x00u, 0x80u, 0xFFu}) {
        tree.Patch8(0, kHeadBtreeType, type);
        EXPECT_IDS(CheckImage(tree), "");
    }
}

TEST(CheckHeader, H07KeyMarksMissing) {
    TreeImage tree = ExtentsTree(3);
    tree.Patch32(0, kHeadAttributes, 0);
    EXPECT_IDS(CheckImage(tree), "H07");
    tree = AttributesTree(3);
    tree.Patch32(0, kHeadAttributes, kBTBigKeysMask);
    EXPECT_IDS(CheckImage(tree), "H07");
}

TEST(CheckHeader, H08MaximalKeyLengthOfAnotherTree) {
    TreeImage tree = AttributesTree(3);
    tree.Patch16(0, kHeadMaxKeyLength, 516);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "H08");
    EXPECT_EQ(outcome.findings[0].text, "maxKeyLength is 516, expected 266");
}

TEST(CheckHeader, H10EmptyInSomeFieldsOnly) {
    TreeImage tree = CatalogTree(0);
    tree.Patch32(0, kHeadLastLeafNode, 0);
    EXPECT_IDS(CheckImage(tree), "H10 L02");
    tree = ExtentsTree(0);
    tree.Patch32(0, kHeadLeafRecords, 5);
    EXPECT_IDS(CheckImage(tree), "H10 H11");
}

TEST(CheckHeader, H11LeafRecordsMiscounted) {
    TreeImage tree = CatalogTree(40);
    tree.Patch32(0, kHeadLeafRecords, 84);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "H11");
    EXPECT_EQ(CheckFindingLine(outcome.findings[0]),
              "warn  H11 catalog header (image offset 0x14): leafRecords is 84, counted 82");
    EXPECT_IDS(CheckImage(tree, Quick()), "H11");
}

TEST(CheckHeader, H12DepthIsNotTheRootsHeight) {
    TreeImage tree = CatalogTree(40);
    tree.Patch16(0, kHeadTreeDepth, tree.depth + 1);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "H12");
    EXPECT_EQ(outcome.findings[0].found, std::to_string(tree.depth + 1));
}

TEST(CheckHeader, H13FreeNodesMiscounted) {
    TreeImage tree = CatalogTree(40);
    tree.Patch32(0, kHeadFreeNodes, 7);
    const Outcome outcome = CheckImage(tree, Quick());
    EXPECT_IDS(outcome, "H13");
    EXPECT_EQ(outcome.findings[0].text, "freeNodes is 7, the map has 8 clear bits");
}

TEST(CheckHeader, H14ReservedFieldsNotZero) {
    TreeImage tree = CatalogTree(4);
    tree.Patch16(0, kHeadReserved, 1);
    tree.Patch8(0, 119, 1);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "H14");
    EXPECT_EQ(outcome.summary.warnings, 2u);
}

// Map.

TEST(CheckMap, M01MapChainReturnsToItself) {
    TreeImage tree = BuildTree({.freeNodes = 9000}, CatalogOf(4));
    ASSERT_EQ(tree.mapNodes.size(), 2u);
    tree.Patch32(tree.mapNodes[1], kDescFLink, tree.mapNodes[0]);
    EXPECT_IDS(CheckImage(tree), "M01");
}

TEST(CheckMap, M01MapNodeOfAnotherKindOrShape) {
    const TreeImage sound = BuildTree({.freeNodes = 9000}, CatalogOf(4));
    TreeImage tree = sound;
    tree.Patch8(tree.mapNodes[0], kDescKind, 0);
    EXPECT_IDS(CheckImage(tree), "M01");
    tree = sound;
    tree.Patch16(tree.mapNodes[0], kDescNumRecords, 2);
    EXPECT_IDS(CheckImage(tree), "M01");
    tree = sound;
    tree.Patch16(tree.mapNodes[1], 512 - 4, 512 - 4);
    EXPECT_IDS(CheckImage(tree), "M01");
    tree = sound;
    tree.Patch32(0, kDescFLink, 0x7FFFFFFF);
    EXPECT_IDS(CheckImage(tree), "M01");
}

TEST(CheckMap, M02MapTooShortOrTooLong) {
    TreeImage tree = BuildTree({.freeNodes = 9000}, CatalogOf(4));
    tree.Patch32(tree.mapNodes[0], kDescFLink, 0);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "M02");
    EXPECT_EQ(outcome.First(CheckId::M02).severity, CheckSeverity::kError);
    const Outcome spare = CheckImage(BuildTree({.mapNodes = 1}, CatalogOf(4)));
    EXPECT_IDS(spare, "M02");
    EXPECT_EQ(spare.First(CheckId::M02).severity, CheckSeverity::kWarning);
}

TEST(CheckMap, M03BitBeyondTheTotal) {
    TreeImage tree = CatalogTree(4);
    tree.Patch8(0, kHeadMapRecord + 20, 0x10);
    const Outcome outcome = CheckImage(tree, Quick());
    EXPECT_IDS(outcome, "M03");
    EXPECT_EQ(outcome.findings[0].where, "catalog map bit 163");
}

TEST(CheckMap, M04NodeInUseWithItsBitClear) {
    TreeImage tree = CatalogTree(40);
    const u32 used = tree.totalNodes - tree.freeNodes;
    ASSERT_GT(used, 16u);
    const u32 byte = tree.bytes[kHeadMapRecord + 1];
    ASSERT_EQ(byte, 0xFFu);
    tree.Patch8(0, kHeadMapRecord + 1, 0xEF);
    tree.Patch32(0, kHeadFreeNodes, tree.freeNodes + 1);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "M04");
    EXPECT_EQ(CheckFindingLine(outcome.findings[0]),
              "error M04 catalog map bit 11 (image offset 0xf9): node 11 is in use but its bit is "
              "clear");
}

TEST(CheckMap, M05MarkedNodesThatNothingLeadsTo) {
    TreeImage tree = CatalogTree(4);
    const u32 first = tree.totalNodes - tree.freeNodes;
    for (u32 nodeNum = first; nodeNum < first + 3; ++nodeNum) {
        u8& marks = tree.bytes[kHeadMapRecord + nodeNum / 8];
        marks = static_cast<u8>(marks | (0x80u >> (nodeNum % 8)));
    }
    tree.Patch32(0, kHeadFreeNodes, tree.freeNodes - 3);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "M05");
    ASSERT_EQ(outcome.findings.size(), 1u);
    EXPECT_EQ(outcome.findings[0].text, "nodes " + std::to_string(first) + ".." +
                                            std::to_string(first + 2) +
                                            " are marked used but nothing leads to them");
    EXPECT_IDS(CheckImage(tree, Quick()), "");
}

// Nodes.

TEST(CheckNodes, N01IndexNodeAmongTheLeaves) {
    TreeImage tree = CatalogTree(40);
    tree.Patch8(NodeAt(tree, 1, 2), kDescKind, 0);
    EXPECT_IDS(CheckImage(tree), "N01");
    EXPECT_IDS(CheckImage(tree, Quick()), "N01");
}

TEST(CheckNodes, N02HeightOfAnotherLevel) {
    TreeImage tree = CatalogTree(40);
    tree.Patch8(NodeAt(tree, 1, 2), kDescHeight, 2);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "N02");
    EXPECT_EQ(outcome.findings[0].node, NodeAt(tree, 1, 2));
    EXPECT_EQ(outcome.findings[0].text, "height is 2, at level 1");
}

TEST(CheckNodes, N03OffsetsOutOfOrder) {
    const TreeImage sound = CatalogTree(40);
    const u32 leaf = sound.levels[1].at(sound.levels[1].size() - 2);  // of threads
    ASSERT_GE(Get16(sound.Node(leaf), kDescNumRecords), 3u);
    TreeImage tree = sound;
    tree.Patch16(leaf, 512 - 4, RecordStart(tree, leaf, 1) + 1);  // odd
    EXPECT_IDS(CheckImage(tree), "N03");
    tree = sound;
    tree.Patch16(leaf, 512 - 4, 14);  // not rising
    EXPECT_EQ(CheckImage(tree).First(CheckId::N03).text,
              "record 1 starts at 14, not behind record 0 at 14");
    tree = sound;
    tree.Patch16(leaf, 512 - 2, 16);  // record 0 elsewhere
    EXPECT_EQ(CheckImage(tree).First(CheckId::N03).text, "record 0 starts at 16, expected 14");
    tree = sound;
    tree.Patch16(leaf, kDescNumRecords, 0xFFFF);
    EXPECT_IDS(CheckImage(tree), "N03");
    tree = sound;
    const u32 count = Get16(tree.Node(leaf), kDescNumRecords);
    tree.Patch16(leaf, 512 - 2 * (count + 1), 512);  // free space in the table
    EXPECT_IDS(CheckImage(tree), "N03");
}

TEST(CheckNodes, N04NodeWithoutRecords) {
    TreeImage tree = CatalogTree(40);
    const u32 leaf = NodeAt(tree, 1, 2);
    const u32 records = Get16(tree.Node(leaf), kDescNumRecords);
    tree.Patch16(leaf, kDescNumRecords, 0);
    tree.Patch32(0, kHeadLeafRecords, tree.leafRecords - records);
    EXPECT_IDS(CheckImage(tree), "N04");
}

TEST(CheckNodes, N05ChildBeyondTheTreeOrReachedTwice) {
    const TreeImage sound = CatalogTree(40);
    const u32 parent = NodeAt(sound, 2, 0);
    const u32 next = RecordStart(sound, parent, 2);
    TreeImage tree = sound;
    tree.Patch32(parent, next - 4, 0x01000000);
    EXPECT_IDS(CheckImage(tree), "N05");
    tree = sound;
    tree.Patch32(parent, next - 4, NodeAt(tree, 1, 0));
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "N05");
    EXPECT_EQ(outcome.findings[0].record, 1);
    EXPECT_EQ(outcome.findings[0].node, parent);
}

TEST(CheckNodes, N05RootBelowItself) {
    TreeImage tree = CatalogTree(40);
    const u32 parent = NodeAt(tree, 2, 0);
    tree.Patch32(parent, RecordStart(tree, parent, 1) - 4, tree.rootNode);
    EXPECT_IDS(CheckImage(tree), "N05");
}

TEST(CheckNodes, N06ReservedFieldNotZero) {
    TreeImage tree = CatalogTree(40);
    tree.Patch16(NodeAt(tree, 1, 1), kDescReserved, 0xBEEF);
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "N06");
    EXPECT_EQ(outcome.summary.errors, 0u);
}

// Links.

TEST(CheckLinks, L01LinksAgainstTheOrderOfTheParents) {
    TreeImage tree = CatalogTree(40);
    tree.Patch32(NodeAt(tree, 1, 1), kDescFLink, NodeAt(tree, 1, 3));
    const Outcome outcome = CheckImage(tree);
    EXPECT_IDS(outcome, "L01");
    EXPECT_EQ(outcome.findings[0].text, "fLink is 4, the next node of level 1 is 3");
    tree = CatalogTree(40);
    tree.Patch32(NodeAt(tree, 1, 1), kDescBLink, 0);
    EXPECT_IDS(CheckImage(tree), "L01");
    EXPECT_IDS(CheckImage(tree, Quick()), "L01");
}

TEST(CheckLinks, L01ChainThatReturnsEndsTheQuickLook) {
    TreeImage tree = CatalogTree(40);
    tree.Patch32(NodeAt(tree, 1, 3), kDescFLink, NodeAt(tree, 1, 0));
    EXPECT_IDS(CheckImage(tree, Quick()), "L01");
    tree.Patch32(NodeAt(tree, 1, 3), kDescFLink, 0x80000000);
    EXPECT_IDS(CheckImage(tree, Quick()), "L01");
}

TEST(CheckLinks, L02EndsOfTheChain) {
    TreeImage tree = CatalogTree(40);
    tree.Patch32(NodeAt(tree, 1, 0), kDescBLink, 5);
    EXPECT_IDS(CheckImage(tree), "L02");
    EXPECT_IDS(CheckImage(tree, Quick()), "L02");
    tree = CatalogTree(40);
    tree.Patch32(0, kHeadFirstLeafNode, NodeAt(tree, 1, 1));
    EXPECT_IDS(CheckImage(tree), "L02");
    tree = CatalogTree(40);
    tree.Patch32(0, kHeadLastLeafNode, NodeAt(tree, 1, 1));
    EXPECT_IDS(CheckImage(tree), "L02");
    EXPECT_IDS(CheckImage(tree, Quick()), "L02");
}

}  // namespace VELK::test
