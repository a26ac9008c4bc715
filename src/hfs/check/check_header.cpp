// The header node of a tree: its shape, and its fields against each other and against the fork.
#include <algorithm>
#include <iterator>

#include "hfs/check/check_tree.h"

namespace VELK {
namespace {

constexpr u32 kLeastRead = u32{1} << kMinNodeShift;
constexpr u32 kReservedTail = 56;  // from here to the end of the header record: 0

constexpr u32 kTypeSystem = 0x00;
constexpr u32 kTypeUser = 0x80;
constexpr u32 kTypeReserved = 0xFF;

void Decode(const u8* node, CheckTreeHeader* header) {
    header->treeDepth = Load16(node + kHeadTreeDepth);
    header->rootNode = Load32(node + kHeadRootNode);
    header->leafRecords = Load32(node + kHeadLeafRecords);
    header->firstLeafNode = Load32(node + kHeadFirstLeafNode);
    header->lastLeafNode = Load32(node + kHeadLastLeafNode);
    header->nodeSize = Load16(node + kHeadNodeSize);
    header->maxKeyLength = Load16(node + kHeadMaxKeyLength);
    header->totalNodes = Load32(node + kHeadTotalNodes);
    header->freeNodes = Load32(node + kHeadFreeNodes);
    header->btreeType = node[kHeadBtreeType];
    header->keyCompareType = node[kHeadKeyCompareType];
    header->attributes = Load32(node + kHeadAttributes);
}

void CheckDescriptor(const CheckTree& tree, const u8* node) {
    const s8 kind = static_cast<s8>(node[kDescKind]);
    if (kind != kBTHeaderNode) {
        tree.run->Tell(CheckId::H01, CheckSeverity::kError, tree.HeaderPlace(kDescKind),
                       CheckPrint("kind of node 0 is %d, expected %d", kind, kBTHeaderNode),
                       std::to_string(kBTHeaderNode), std::to_string(kind));
    }
    if (node[kDescHeight] != 0) {
        tree.run->Error(CheckId::H01, tree.HeaderPlace(kDescHeight),
                        CheckPrint("height of node 0 is %u, expected 0", node[kDescHeight]), 0,
                        node[kDescHeight]);
    }
    if (const u32 bLink = Load32(node + kDescBLink); bLink != 0) {
        tree.run->Warn(CheckId::H01, tree.HeaderPlace(kDescBLink),
                       CheckPrint("bLink of node 0 is %u, expected 0", bLink), 0, bLink);
    }
    if (const u32 reserved = Load16(node + kDescReserved); reserved != 0) {
        tree.run->Warn(CheckId::N06, tree.HeaderPlace(kDescReserved),
                       CheckPrint("reserved field is 0x%04x, expected 0", reserved), 0, reserved);
    }
}

// Record count and offsets. False: the map record is not where it belongs.
bool CheckSlots(const CheckTree& tree, const u8* node) {
    const u32 size = tree.nodeSize;
    const u32 count = Load16(node + kDescNumRecords);
    bool isSound = true;
    if (count != kHeadNumRecords) {
        tree.run->Error(CheckId::H01, tree.HeaderPlace(kDescNumRecords),
                        CheckPrint("node 0 holds %u records, expected %u", count, kHeadNumRecords),
                        kHeadNumRecords, count);
        isSound = false;
    }
    const u32 wanted[] = {kDescSize, kHeadEnd, kHeadMapRecord, size - kHeadSlotsSize};
    const char* names[] = {"the header record", "the user data", "the map record",
                           "the free space"};
    for (u32 i = 0; i <= kHeadNumRecords; ++i) {
        const u32 offset = size - kSlotSize * (i + 1);
        const u32 value = Load16(node + offset);
        if (value != wanted[i]) {
            tree.run->Error(CheckId::H01, tree.HeaderPlace(offset),
                            CheckPrint("%s starts at %u, expected %u", names[i], value, wanted[i]),
                            wanted[i], value);
            isSound = false;
        }
    }
    return isSound;
}

bool CheckNodeSize(CheckTree* tree, u32 mapBlock) {
    const u32 size = tree->header.nodeSize;
    const CheckPlace place = tree->HeaderPlace(kHeadNodeSize);
    if (!IsPowerOfTwo(size) || size < (u32{1} << kMinNodeShift) ||
        size > (u32{1} << kMaxNodeShift)) {
        tree->run->Error(
            CheckId::H02, place,
            CheckPrint("node size is %u, expected a power of two from 512 to 32768", size));
        return false;
    }
    if (size < mapBlock) {
        tree->run->Error(CheckId::H02, place,
                         CheckPrint("node size %u is below the map block of %u", size, mapBlock),
                         mapBlock, size);
    }
    if (size > tree->file->Size()) {
        tree->run->Error(CheckId::H05, place,
                         CheckPrint("a node takes %u bytes, the fork holds %llu", size,
                                    static_cast<unsigned long long>(tree->file->Size())),
                         size, tree->file->Size());
        return false;
    }
    tree->nodeSize = size;
    return true;
}

void CheckTotals(CheckTree* tree) {
    const CheckTreeHeader& header = tree->header;
    const u64 held = std::min(tree->file->Size(), tree->logicalSize);
    const u64 wanted = static_cast<u64>(header.totalNodes) * tree->nodeSize;
    if (header.totalNodes == 0 || wanted > held) {
        tree->run->Error(CheckId::H05, tree->HeaderPlace(kHeadTotalNodes),
                         CheckPrint("totalNodes is %u, the fork holds %llu", header.totalNodes,
                                    static_cast<unsigned long long>(held / tree->nodeSize)),
                         held / tree->nodeSize, header.totalNodes);
    } else if (tree->logicalSize - wanted >= tree->nodeSize) {
        tree->run->Warn(
            CheckId::H05, tree->HeaderPlace(kHeadTotalNodes),
            CheckPrint("totalNodes is %u, the fork's size is that of %llu", header.totalNodes,
                       static_cast<unsigned long long>(tree->logicalSize / tree->nodeSize)),
            tree->logicalSize / tree->nodeSize, header.totalNodes);
    }
    const u64 room = tree->file->Size() / tree->nodeSize;
    tree->nodes = static_cast<u32>(std::min<u64>(header.totalNodes, room));

    const struct {
        const char* name;
        u32 offset;
        u32 value;
    } numbers[] = {{"rootNode", kHeadRootNode, header.rootNode},
                   {"firstLeafNode", kHeadFirstLeafNode, header.firstLeafNode},
                   {"lastLeafNode", kHeadLastLeafNode, header.lastLeafNode},
                   {"freeNodes", kHeadFreeNodes, header.freeNodes}};
    for (const auto& number : numbers) {
        if (number.value != 0 && number.value >= header.totalNodes) {
            tree->run->Error(CheckId::H04, tree->HeaderPlace(number.offset),
                             CheckPrint("%s %u is not below totalNodes %u", number.name,
                                        number.value, header.totalNodes));
        }
    }
}

void CheckDepthAndEmptiness(CheckTree* tree) {
    const CheckTreeHeader& header = tree->header;
    if (header.treeDepth > kMaxPathDepth) {
        const bool opens = header.treeDepth <= kMaxOpenDepth;
        tree->run->Error(CheckId::H03, tree->HeaderPlace(kHeadTreeDepth),
                         CheckPrint("treeDepth is %u, %s", header.treeDepth,
                                    opens ? "more than the 15 levels that can be searched"
                                          : "more than 16, the most that opens"),
                         kMaxPathDepth, header.treeDepth);
    }
    const u32 fields[] = {header.treeDepth, header.rootNode, header.leafRecords,
                          header.firstLeafNode, header.lastLeafNode};
    const auto zeros = std::count(std::begin(fields), std::end(fields), 0u);
    if (zeros != 0 && zeros != std::ssize(fields)) {
        tree->run->Error(CheckId::H10, tree->HeaderPlace(kHeadTreeDepth),
                         CheckPrint("treeDepth %u, rootNode %u, leafRecords %u, firstLeafNode %u, "
                                    "lastLeafNode %u: some are 0, some are not",
                                    header.treeDepth, header.rootNode, header.leafRecords,
                                    header.firstLeafNode, header.lastLeafNode));
    }
}

void CheckKindFields(const CheckTree& tree) {
    const CheckTreeHeader& header = tree.header;
    const u32 fileId = tree.FileId();
    const u32 type = header.btreeType;
    if (type != kTypeSystem && type != kTypeUser && type != kTypeReserved) {
        tree.run->Error(CheckId::H06, tree.HeaderPlace(kHeadBtreeType),
                        CheckPrint("tree type is 0x%02x, expected 0x00, 0x80 or 0xff", type),
                        kTypeSystem, type);
    }
    if ((header.attributes & kBTBigKeysMask) == 0) {
        tree.run->Error(CheckId::H07, tree.HeaderPlace(kHeadAttributes),
                        CheckPrint("attributes 0x%08x lack the mark of 16-bit key lengths (0x%x)",
                                   header.attributes, kBTBigKeysMask));
    }
    if (fileId != kExtentsFileId && !tree.HasVariableIndexKeys()) {
        tree.run->Error(CheckId::H07, tree.HeaderPlace(kHeadAttributes),
                        CheckPrint("attributes 0x%08x lack the mark of index keys of their own "
                                   "length (0x%x)",
                                   header.attributes, kBTVariableIndexKeysMask));
    }
    const u32 maxKey = fileId == kCatalogFileId   ? kCatMaxKeyLength
                       : fileId == kExtentsFileId ? kExtMaxKeyLength
                                                  : kAttrMaxKeyLength;
    if (header.maxKeyLength != maxKey) {
        tree.run->Error(CheckId::H08, tree.HeaderPlace(kHeadMaxKeyLength),
                        CheckPrint("maxKeyLength is %u, expected %u", header.maxKeyLength, maxKey),
                        maxKey, header.maxKeyLength);
    }
}

void CheckReserved(const CheckTree& tree, const u8* node) {
    if (const u32 value = Load16(node + kHeadReserved); value != 0) {
        tree.run->Warn(CheckId::H14, tree.HeaderPlace(kHeadReserved),
                       CheckPrint("reserved field is 0x%04x, expected 0", value), 0, value);
    }
    for (u32 i = kReservedTail; i < kHeadEnd; ++i) {
        if (node[i] != 0) {
            tree.run->Warn(CheckId::H14, tree.HeaderPlace(i),
                           CheckPrint("reserved byte is 0x%02x, expected 0", node[i]), 0, node[i]);
            return;
        }
    }
}

}  // namespace

bool CheckHeaderNode(CheckTree* tree, u32 mapBlock) {
    std::vector<u8> node(kLeastRead);
    if (tree->file->Size() < kLeastRead) {
        tree->run->Error(CheckId::H05, tree->HeaderPlace(0),
                         CheckPrint("the fork of %llu bytes has no room for a header node",
                                    static_cast<unsigned long long>(tree->file->Size())));
        return false;
    }
    if (int status = tree->file->Read(0, node.data(), kLeastRead); status != 0) {
        tree->CannotRead(0, status);
        return false;
    }
    Decode(node.data(), &tree->header);
    CheckDescriptor(*tree, node.data());
    if (!CheckNodeSize(tree, mapBlock)) {
        return false;
    }
    node.resize(tree->nodeSize);
    if (int status = tree->file->Read(0, node.data(), tree->nodeSize); status != 0) {
        tree->CannotRead(0, status);
        return false;
    }
    tree->run->CountNode(tree->Name(), tree->header.totalNodes);
    tree->isMapWhole = CheckSlots(*tree, node.data());
    CheckTotals(tree);
    CheckDepthAndEmptiness(tree);
    CheckKindFields(*tree);
    CheckReserved(*tree, node.data());
    if (tree->nodes == 0) {
        return false;
    }
    tree->seen.Reset(tree->nodes);
    tree->seen.Add(0);
    const CheckTreeHeader& header = tree->header;
    tree->isUsable = header.rootNode != 0 && header.rootNode < tree->nodes;
    const bool isEmpty = header.rootNode == 0 && header.treeDepth == 0 &&
                         header.firstLeafNode == 0 && header.lastLeafNode == 0;
    tree->isWhole = tree->isUsable || isEmpty;
    return true;
}

}  // namespace VELK
