// See mutate.h.
#include "mutate.h"

#include <cstring>

#include "hfs/format.h"

namespace VELK::fuzz {

void Mutator::Field(u8* bytes, const std::vector<test::Field>& fields, u32 nodeSize, u64 limit) {
    const test::Field& field = fields[Below(static_cast<u32>(fields.size()))];
    const u64 old = test::GetField(bytes, field);
    if (OneIn(4)) {
        test::SetField(bytes, field, static_cast<u64>(random_()) << Below(33) ^ random_());
        return;
    }
    const std::vector<u64> values = test::BoundaryValues(field, old, nodeSize, limit);
    test::SetField(bytes, field, values[Below(static_cast<u32>(values.size()))]);
}

void Mutator::Node(u8* node, u32 nodeSize, u32 fileId, u32 totalNodes) {
    Field(node, test::FieldsOfNode(node, nodeSize, fileId), nodeSize, totalNodes);
}

// A number in the records of one node, if it is a leaf: an ID, a size, an extent.
void Mutator::Data(u8* tree, u32 nodeSize, u32 nodes) {
    u8* node = tree + std::size_t{Below(nodes)} * nodeSize;
    const std::vector<test::Field> words = test::DataOfNode(node, nodeSize);
    if (!words.empty()) {
        Field(node, words, nodeSize, nodes);
    }
}

// One node's link or child number names another node, often tying a ring.
void Mutator::Link(u8* tree, u32 nodeSize, u32 nodes) {
    u8* node = tree + std::size_t{Below(nodes)} * nodeSize;
    std::vector<test::Field> links;
    for (const test::Field& field : test::FieldsOfNode(node, nodeSize, kCatalogFileId)) {
        const bool isLink = field.offset <= kDescBLink || std::strcmp(field.name, "child") == 0 ||
                            std::strcmp(field.name, "root node") == 0;
        if (isLink && field.width == 4) {
            links.push_back(field);
        }
    }
    test::SetField(node, links[Below(static_cast<u32>(links.size()))], Below(nodes));
}

void Mutator::CopyNode(u8* tree, u32 nodeSize, u32 nodes) {
    const std::size_t from = std::size_t{Below(nodes)} * nodeSize;
    const std::size_t to = std::size_t{Below(nodes)} * nodeSize;
    std::memmove(tree + to, tree + from, nodeSize);
}

void Mutator::TreeFile(u8* tree, std::size_t size, u32 fileId) {
    const u32 nodeSize = test::ClaimedNodeSize(tree, size);
    const u32 nodes = static_cast<u32>(size / nodeSize);
    if (nodes == 0) {
        return;
    }
    for (u32 changes = 1 + Below(3); changes != 0; --changes) {
        const u32 verb = Below(16);
        if (verb == 0) {
            CopyNode(tree, nodeSize, nodes);
        } else if (verb < 4) {
            Link(tree, nodeSize, nodes);
        } else if (verb < 7) {
            Data(tree, nodeSize, nodes);
        } else {
            const u32 number = OneIn(3) ? 0 : Below(nodes);
            Node(tree + std::size_t{number} * nodeSize, nodeSize, fileId, nodes);
        }
    }
}

}  // namespace VELK::fuzz
