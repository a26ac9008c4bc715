// See tree_image.h.
#include "tree_image.h"

#include <algorithm>
#include <stdexcept>

#include "keys.h"

namespace VELK::test {

namespace {

struct Entry {
    Bytes firstKey;
    Bytes record;
};

// Splits `entries` into nodes of at most `most` records (0: what fits) and adds them to the image
// as level `height`. Returns the entries of the level above.
std::vector<Entry> AddLevel(TreeImage* image, std::vector<NodeImage>* nodes, u32 height, u32 most,
                            const std::vector<Entry>& entries) {
    std::vector<Entry> parents;
    std::vector<u32> numbers;
    NodeImage node;
    const auto finish = [&] {
        const u32 number = static_cast<u32>(nodes->size());
        numbers.push_back(number);
        nodes->push_back(node);
        node.records.clear();
    };
    node.height = static_cast<u8>(height);
    node.kind = height == 1 ? kBTLeafNode : kBTIndexNode;
    for (const Entry& entry : entries) {
        const std::size_t used = 14 + UsedBytes(node.records) + entry.record.size() + 2;
        const bool full =
            (most != 0 && node.records.size() == most) || used > image->shape.nodeSize;
        if (full && !node.records.empty()) {
            finish();
        }
        if (node.records.empty()) {
            const u32 number = static_cast<u32>(nodes->size());
            parents.push_back({entry.firstKey, Record(entry.firstKey, number)});
        }
        node.records.push_back(entry.record);
    }
    finish();
    for (std::size_t i = 0; i < numbers.size(); ++i) {
        NodeImage& linked = nodes->at(numbers[i]);
        linked.bLink = i == 0 ? 0 : numbers[i - 1];
        linked.fLink = i + 1 == numbers.size() ? 0 : numbers[i + 1];
    }
    image->levels.push_back(numbers);
    return parents;
}

u32 MapNodesFor(u32 nodeSize, u32 otherNodes) {
    u32 maps = 0;
    while (nodeSize * 8 - 2048 + maps * (nodeSize * 8 - 160) < otherNodes + maps) {
        maps += 1;
    }
    return maps;
}

Bytes HeaderNode(const TreeImage& image) {
    const TreeShape& shape = image.shape;
    Bytes node(shape.nodeSize);
    const bool extents = shape.fileId == kExtentsFileId;
    const u32 maxKey = extents ? 10u : shape.fileId == kAttributesFileId ? 266u : 516u;
    Put32(&node, 0, image.mapNodes.empty() ? 0 : image.mapNodes[0]);
    node[8] = 1;
    Put16(&node, 10, 3);
    Put16(&node, 14, image.depth);
    Put32(&node, 16, image.rootNode);
    Put32(&node, 20, image.leafRecords);
    Put32(&node, 24, image.depth == 0 ? 0 : image.levels[1].front());
    Put32(&node, 28, image.depth == 0 ? 0 : image.levels[1].back());
    Put16(&node, 32, shape.nodeSize);
    Put16(&node, 34, maxKey);
    Put32(&node, 36, image.totalNodes);
    Put32(&node, 40, image.freeNodes);
    Put32(&node, 46, shape.clumpSize);
    node[50] = shape.btreeType;
    node[51] = shape.keyCompareType;
    Put32(&node, 52, extents ? 2 : 6);
    const u32 used = image.totalNodes - image.freeNodes;
    const Bytes map = MapBits(shape.nodeSize - 256, 0, used);
    std::copy(map.begin(), map.end(), node.begin() + 248);
    Put16(&node, shape.nodeSize - 2, 14);
    Put16(&node, shape.nodeSize - 4, 120);
    Put16(&node, shape.nodeSize - 6, 248);
    Put16(&node, shape.nodeSize - 8, shape.nodeSize - 8);
    return node;
}

void AddMapNodes(TreeImage* image) {
    const u32 nodeSize = image->shape.nodeSize;
    const u32 used = image->totalNodes - image->freeNodes;
    for (std::size_t i = 0; i < image->mapNodes.size(); ++i) {
        NodeImage map;
        map.kind = kBTMapNode;
        map.height = 0;
        map.fLink = i + 1 == image->mapNodes.size() ? 0 : image->mapNodes[i + 1];
        map.bLink = i == 0 ? 0 : image->mapNodes[i - 1];
        const u32 first = nodeSize * 8 - 2048 + static_cast<u32>(i) * (nodeSize * 8 - 160);
        map.records.push_back(MapBits(nodeSize - 20, first, used));
        image->SetNode(image->mapNodes[i], map.Build(nodeSize));
    }
}

// All nodes of the tree proper, node 0 left empty.
std::vector<NodeImage> AddLevels(TreeImage* image, const std::vector<TreeRecord>& records) {
    std::vector<NodeImage> nodes(1);
    image->levels.resize(1);
    if (records.empty()) {
        return nodes;
    }
    std::vector<Entry> entries;
    for (const TreeRecord& record : records) {
        entries.push_back({record.key, Record(record.key, record.data)});
    }
    u32 height = 1;
    entries = AddLevel(image, &nodes, height, image->shape.recordsPerLeaf, entries);
    while (entries.size() > 1 || height < image->shape.minDepth) {
        height += 1;
        const u32 most = image->shape.childrenPerIndex;
        if (most == 1 && entries.size() > 1) {
            throw std::invalid_argument("a level of one-child nodes never narrows");
        }
        entries = AddLevel(image, &nodes, height, most, entries);
    }
    image->depth = height;
    image->rootNode = image->levels[height].front();
    return nodes;
}

}  // namespace

Bytes TreeImage::Node(u32 nodeNum) const {
    const auto start = bytes.begin() + static_cast<std::ptrdiff_t>(nodeNum) * shape.nodeSize;
    return Bytes(start, start + shape.nodeSize);
}

void TreeImage::SetNode(u32 nodeNum, const Bytes& node) {
    std::copy(node.begin(), node.end(),
              bytes.begin() + static_cast<std::ptrdiff_t>(nodeNum) * shape.nodeSize);
}

void TreeImage::Patch16(u32 nodeNum, u32 offset, u32 value) {
    Put16(&bytes, static_cast<std::size_t>(nodeNum) * shape.nodeSize + offset, value);
}
void TreeImage::Patch32(u32 nodeNum, u32 offset, u32 value) {
    Put32(&bytes, static_cast<std::size_t>(nodeNum) * shape.nodeSize + offset, value);
}
void TreeImage::Patch8(u32 nodeNum, u32 offset, u32 value) {
    bytes.at(static_cast<std::size_t>(nodeNum) * shape.nodeSize + offset) = static_cast<u8>(value);
}

TreeImage BuildTree(const TreeShape& shape, const std::vector<TreeRecord>& records) {
    TreeImage image;
    image.shape = shape;
    image.leafRecords = static_cast<u32>(records.size());
    const std::vector<NodeImage> nodes = AddLevels(&image, records);
    const u32 treeNodes = static_cast<u32>(nodes.size());
    const u32 maps = MapNodesFor(shape.nodeSize, treeNodes + shape.freeNodes) + shape.mapNodes;
    for (u32 i = 0; i < maps; ++i) {
        image.mapNodes.push_back(treeNodes + i);
    }
    image.freeNodes = shape.freeNodes;
    image.totalNodes = treeNodes + maps + shape.freeNodes;
    image.bytes.assign(static_cast<std::size_t>(image.totalNodes) * shape.nodeSize, shape.stale);
    image.SetNode(0, HeaderNode(image));
    for (u32 n = 1; n < treeNodes; ++n) {
        image.SetNode(n, nodes[n].Build(shape.nodeSize));
    }
    AddMapNodes(&image);
    return image;
}

std::vector<TreeRecord> NthRecords(u32 fileId, u32 count, u32 dataSize) {
    std::vector<TreeRecord> records;
    for (u32 n = 0; n < count; ++n) {
        records.push_back({NthDiskKey(fileId, n), Pattern(dataSize, n)});
    }
    return records;
}

Bytes MapBits(u32 bytes, u32 firstNode, u32 usedNodes) {
    Bytes map(bytes);
    for (u32 bit = 0; bit < bytes * 8 && firstNode + bit < usedNodes; ++bit) {
        map[bit / 8] = static_cast<u8>(map[bit / 8] | (0x80 >> (bit % 8)));
    }
    return map;
}

}  // namespace VELK::test
