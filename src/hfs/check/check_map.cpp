// The node map: its chain of records, the bits it holds, and those bits against the nodes in use.
#include <algorithm>
#include <bit>

#include "hfs/check/check_tree.h"

namespace VELK {
namespace {

u64 HeaderBits(const CheckTree& tree) {
    return u64{tree.nodeSize - kHeadMapOverhead} * 8;
}
u64 MapNodeBits(const CheckTree& tree) {
    return u64{tree.nodeSize - kMapNodeOverhead} * 8;
}

// The byte of the map that holds the bit of `nodeNum`.
CheckPlace BitPlace(const CheckTree& tree, u32 nodeNum) {
    const u64 inHeader = HeaderBits(tree);
    u32 node = 0;
    u64 offset = kHeadMapRecord + nodeNum / 8;
    if (nodeNum >= inHeader) {
        const u64 index = (nodeNum - inHeader) / MapNodeBits(tree);
        node = index < tree.mapNodes.size() ? tree.mapNodes[index] : 0;
        offset = kDescSize + (nodeNum - inHeader) % MapNodeBits(tree) / 8;
    }
    CheckPlace place = tree.Place(node, static_cast<u32>(offset));
    place.part = CheckPrint("map bit %u", nodeNum);
    return place;
}

// Adds the bits of one map record: `size` bytes at `bytes`, which lie at `offset` of `nodeNum`.
// Returns how many of them below the total of nodes are set.
u64 TakeBits(CheckTree* tree, u32 nodeNum, u32 offset, const u8* bytes, u32 size) {
    const u64 first = tree->mapBits;
    const u64 total = tree->header.totalNodes;
    u64 used = 0;
    bool toldBeyond = false;
    for (u32 i = 0; i < size; ++i) {
        const u64 bit = first + u64{i} * 8;
        const u32 inside = bit >= total ? 0 : static_cast<u32>(std::min<u64>(total - bit, 8));
        const u32 mask = (0xFF00u >> inside) & 0xFFu;
        used += static_cast<u64>(std::popcount(bytes[i] & mask));
        const u32 beyond = bytes[i] & ~mask & 0xFFu;
        if (beyond != 0 && !toldBeyond) {
            toldBeyond = true;
            CheckPlace place = tree->Place(nodeNum, offset + i);
            const u64 number = bit + static_cast<u32>(std::countl_zero(static_cast<u8>(beyond)));
            place.part = CheckPrint("map bit %llu", static_cast<unsigned long long>(number));
            tree->run->Warn(
                CheckId::M03, place,
                CheckPrint("the bit is set, the tree has %u nodes", tree->header.totalNodes));
        }
    }
    const u64 kept = std::min<u64>(size, CeilDivide(tree->nodes, 8) - tree->map.size());
    tree->map.insert(tree->map.end(), bytes, bytes + kept);
    tree->mapBits += u64{size} * 8;
    return used;
}

// Shape of a map node. False: its record is not where it belongs.
bool CheckMapNode(const CheckTree& tree, u32 nodeNum, const u8* node) {
    const s8 kind = static_cast<s8>(node[kDescKind]);
    const u32 count = Load16(node + kDescNumRecords);
    if (kind != kBTMapNode) {
        tree.run->Error(
            CheckId::M01, tree.Place(nodeNum, kDescKind),
            CheckPrint("kind of a node of the map chain is %d, expected %d", kind, kBTMapNode));
        return false;
    }
    if (node[kDescHeight] != 0) {
        tree.run->Error(CheckId::M01, tree.Place(nodeNum, kDescHeight),
                        CheckPrint("height of a map node is %u, expected 0", node[kDescHeight]), 0,
                        node[kDescHeight]);
    }
    if (count != 1) {
        tree.run->Error(CheckId::M01, tree.Place(nodeNum, kDescNumRecords),
                        CheckPrint("a map node of %u records, expected 1", count), 1, count);
        return false;
    }
    const u32 start = Load16(node + tree.nodeSize - kSlotSize);
    const u32 end = Load16(node + tree.nodeSize - 2 * kSlotSize);
    if (start != kDescSize || end != tree.nodeSize - kMapNodeTail) {
        tree.run->Error(CheckId::M01, tree.Place(nodeNum, tree.nodeSize - 2 * kSlotSize),
                        CheckPrint("the map record lies at %u to %u, expected %u to %u", start, end,
                                   kDescSize, tree.nodeSize - kMapNodeTail));
        return false;
    }
    return true;
}

// The map nodes behind the header. Returns the bits set in them.
u64 FollowChain(CheckTree* tree, u32 next) {
    std::vector<u8> node(tree->nodeSize);
    u64 used = 0;
    u32 from = 0;
    while (next != 0 && !tree->run->IsStopped()) {
        const CheckPlace link = tree->Place(from, kDescFLink);
        if (next >= tree->nodes || !tree->seen.Add(next)) {
            tree->run->Error(CheckId::M01, link,
                             next >= tree->nodes
                                 ? CheckPrint("the map chain leads to node %u, the tree has nodes "
                                              "0..%u",
                                              next, tree->nodes - 1)
                                 : CheckPrint("the map chain returns to node %u", next));
            tree->isMapWhole = false;
            return used;
        }
        if (int status = tree->file->Read(tree->NodeOffset(next), node.data(), tree->nodeSize);
            status != 0) {
            tree->CannotRead(next, status);
            tree->isMapWhole = false;
            return used;
        }
        tree->run->CountNode(tree->Name(), tree->header.totalNodes);
        if (!CheckMapNode(*tree, next, node.data())) {
            tree->isMapWhole = false;
            return used;
        }
        if (tree->mapBits >= tree->header.totalNodes) {
            tree->run->Warn(CheckId::M02, tree->Place(next, kDescSize),
                            CheckPrint("a superfluous map node: the map covers %llu nodes without "
                                       "it, the tree has %u",
                                       static_cast<unsigned long long>(tree->mapBits),
                                       tree->header.totalNodes));
        }
        tree->mapNodes.push_back(next);
        used += TakeBits(tree, next, kDescSize, node.data() + kDescSize,
                         tree->nodeSize - kMapNodeOverhead);
        from = next;
        next = Load32(node.data() + kDescFLink);
    }
    return used;
}

// Marked nodes first..last that nothing leads to.
void TellLeak(const CheckTree& tree, u32 first, u32 last) {
    const std::string text =
        first == last
            ? CheckPrint("node %u is marked used but nothing leads to it", first)
            : CheckPrint("nodes %u..%u are marked used but nothing leads to them", first, last);
    tree.run->Warn(CheckId::M05, BitPlace(tree, first), text);
}

}  // namespace

bool CheckMap(CheckTree* tree) {
    if (!tree->isMapWhole) {
        return false;
    }
    std::vector<u8> node(tree->nodeSize);
    if (int status = tree->file->Read(0, node.data(), tree->nodeSize); status != 0) {
        tree->isMapWhole = false;
        return tree->CannotRead(0, status);
    }
    u64 used = TakeBits(tree, 0, kHeadMapRecord, node.data() + kHeadMapRecord,
                        tree->nodeSize - kHeadMapOverhead);
    used += FollowChain(tree, Load32(node.data() + kDescFLink));
    if (!tree->isMapWhole) {
        return false;
    }
    const u32 total = tree->header.totalNodes;
    if (tree->mapBits < total) {
        tree->run->Error(CheckId::M02, tree->HeaderPlace(kHeadTotalNodes),
                         CheckPrint("the map covers %llu nodes, the tree has %u",
                                    static_cast<unsigned long long>(tree->mapBits), total),
                         total, tree->mapBits);
    } else if (total - used != tree->header.freeNodes) {
        tree->run->Warn(CheckId::H13, tree->HeaderPlace(kHeadFreeNodes),
                        CheckPrint("freeNodes is %u, the map has %s", tree->header.freeNodes,
                                   CheckCounted(total - used, "clear bit", "clear bits").c_str()),
                        total - used, tree->header.freeNodes);
    }
    return true;
}

void CheckMapAgainstNodes(CheckTree* tree) {
    if (!tree->isMapWhole) {
        return;
    }
    // A chain that ends too early leaves its other nodes behind: told as M02.
    const bool tellsLeaks =
        tree->isWhole && tree->mapBits >= tree->header.totalNodes && tree->run->Wants(CheckId::M05);
    const u32 count = static_cast<u32>(std::min<u64>(tree->map.size() * u64{8}, tree->nodes));
    bool inLeak = false;
    u32 leakStart = 0;
    for (u64 at = 0; at < count && !tree->run->IsStopped(); ++at) {
        const u32 nodeNum = static_cast<u32>(at);
        const u32 marked = tree->map[nodeNum / 8];
        const u32 inUse = tree->seen.EightFrom(nodeNum & ~7u);
        if (nodeNum % 8 == 0 && marked == inUse && !inLeak) {
            at += 7;  // eight that agree
            continue;
        }
        const u32 bit = 0x80u >> (nodeNum % 8);
        if ((inUse & ~marked & bit) != 0) {
            tree->run->Error(CheckId::M04, BitPlace(*tree, nodeNum),
                             CheckPrint("node %u is in use but its bit is clear", nodeNum));
        }
        const bool isLeaked = tellsLeaks && (marked & ~inUse & bit) != 0;
        if (isLeaked && !inLeak) {
            leakStart = nodeNum;
        } else if (!isLeaked && inLeak) {
            TellLeak(*tree, leakStart, nodeNum - 1);
        }
        inLeak = isLeaked;
    }
    if (inLeak) {
        TellLeak(*tree, leakStart, count - 1);
    }
}

}  // namespace VELK
