// See flat_tree.h.
#include "flat_tree.h"

#include <set>
#include <stdexcept>

namespace VELK::test {

namespace {

Bytes Slice(const Bytes& bytes, std::size_t from, std::size_t to) {
    return Bytes(bytes.begin() + static_cast<std::ptrdiff_t>(from),
                 bytes.begin() + static_cast<std::ptrdiff_t>(to));
}

class Reader {
public:
    Reader(const Bytes& file, FlatTree* tree) : file_(file), tree_(tree) {}

    void Run() {
        ReadHeader();
        tree_->levels.resize(tree_->depth + 1);
        used_.insert(0);
        for (u32 map = Get32(file_, 0); map != 0; map = Get32(NodeAt(map), 0)) {
            Require(used_.insert(map).second, "the map chain is a ring");
            maps_.push_back(map);
        }
        if (tree_->depth == 0) {
            Require(tree_->root == 0 && tree_->leafRecords == 0, "an empty tree has a root");
        } else {
            Visit(tree_->root, tree_->depth, nullptr);
            CheckLinks();
        }
        CheckCounters();
        CheckMap();
    }

private:
    static void Require(bool holds, const std::string& trouble) {
        if (!holds) {
            throw std::runtime_error(trouble);
        }
    }

    Bytes NodeAt(u32 number) const {
        Require(number < tree_->totalNodes, "node " + std::to_string(number) + " is not there");
        const std::size_t start = static_cast<std::size_t>(number) * tree_->nodeSize;
        return Slice(file_, start, start + tree_->nodeSize);
    }

    void ReadHeader() {
        tree_->depth = Get16(file_, 14);
        tree_->root = Get32(file_, 16);
        tree_->leafRecords = Get32(file_, 20);
        tree_->firstLeaf = Get32(file_, 24);
        tree_->lastLeaf = Get32(file_, 28);
        tree_->nodeSize = Get16(file_, 32);
        tree_->totalNodes = Get32(file_, 36);
        tree_->freeNodes = Get32(file_, 40);
        Require(static_cast<u64>(tree_->totalNodes) * tree_->nodeSize <= file_.size(),
                "more nodes than the file holds");
    }

    void Visit(u32 number, u32 level, const Bytes* separator) {
        const std::string where = "node " + std::to_string(number) + ": ";
        Require(used_.insert(number).second, where + "reached twice");
        const FlatNode node = ReadFlatNode(NodeAt(number), number);
        Require(node.height == level, where + "height");
        Require(node.kind == (level == 1 ? kBTLeafNode : kBTIndexNode), where + "kind");
        Require(!node.keys.empty(), where + "no records");
        Require(separator == nullptr || *separator == node.keys[0], where + "separator");
        tree_->levels[level].push_back(node);
        for (std::size_t i = 0; i < node.keys.size(); ++i) {
            if (level == 1) {
                tree_->records.push_back({node.keys[i], node.data[i]});
            } else {
                Require(node.data[i].size() == 4, where + "index record without a child");
                Visit(Get32(node.data[i], 0), level - 1, &node.keys[i]);
            }
        }
    }

    void CheckLinks() {
        for (const std::vector<FlatNode>& level : tree_->levels) {
            for (std::size_t i = 0; i < level.size(); ++i) {
                const std::string where = "node " + std::to_string(level[i].number) + ": ";
                Require(level[i].bLink == (i == 0 ? 0 : level[i - 1].number), where + "bLink");
                Require(level[i].fLink == (i + 1 == level.size() ? 0 : level[i + 1].number),
                        where + "fLink");
            }
        }
    }

    void CheckCounters() const {
        Require(tree_->leafRecords == tree_->records.size(), "leafRecords");
        Require(tree_->freeNodes == tree_->totalNodes - used_.size(), "freeNodes");
        const bool empty = tree_->depth == 0;
        Require(tree_->firstLeaf == (empty ? 0 : tree_->levels[1].front().number), "firstLeaf");
        Require(tree_->lastLeaf == (empty ? 0 : tree_->levels[1].back().number), "lastLeaf");
    }

    void CheckMap() const {
        Bytes bits = Slice(file_, 248, tree_->nodeSize - 8);
        for (const u32 map : maps_) {
            AppendBytes(&bits, Slice(NodeAt(map), 14, tree_->nodeSize - 6));
        }
        Require(bits.size() * 8 >= tree_->totalNodes, "the map is too short");
        for (u32 n = 0; n < tree_->totalNodes; ++n) {
            const bool isSet = (bits[n / 8] & (0x80 >> (n % 8))) != 0;
            Require(isSet == (used_.count(n) == 1), "map bit of node " + std::to_string(n));
        }
    }

    const Bytes& file_;
    FlatTree* tree_;
    std::set<u32> used_;
    std::vector<u32> maps_;
};

}  // namespace

FlatNode ReadFlatNode(const Bytes& node, u32 number) {
    FlatNode flat;
    flat.number = number;
    flat.fLink = Get32(node, 0);
    flat.bLink = Get32(node, 4);
    flat.kind = static_cast<s8>(node.at(8));
    flat.height = node.at(9);
    const u32 count = Get16(node, 10);
    u32 start = Get16(node, node.size() - 2);
    if (start != 14) {
        throw std::runtime_error("node " + std::to_string(number) + ": first slot");
    }
    for (u32 i = 0; i < count; ++i) {
        const u32 end = Get16(node, node.size() - 4 - 2 * i);
        const u32 keySize = Get16(node, start) + 2;
        const u32 padded = keySize + keySize % 2;
        if (end % 2 != 0 || end <= start + padded || end > node.size() - 2 * (count + 1)) {
            throw std::runtime_error("node " + std::to_string(number) + ": slot " +
                                     std::to_string(i));
        }
        flat.keys.push_back(Slice(node, start, start + keySize));
        flat.data.push_back(Slice(node, start + padded, end));
        start = end;
    }
    return flat;
}

FlatTree ReadFlat(const Bytes& file) {
    FlatTree tree;
    try {
        Reader(file, &tree).Run();
    } catch (const std::exception& error) {
        tree.trouble = error.what();
    }
    return tree;
}

std::vector<u32> NumbersOf(const FlatTree& tree, u32 level) {
    std::vector<u32> numbers;
    for (const FlatNode& node : tree.levels.at(level)) {
        numbers.push_back(node.number);
    }
    return numbers;
}

}  // namespace VELK::test
