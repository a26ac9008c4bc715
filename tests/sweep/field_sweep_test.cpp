// Every field of every kind of node gets the values it should not have, one at a time and in pairs;
// then everything is called (trial.h). TREEHFS_SWEEP=all goes through all values of 16-bit fields
// and all pairs; without it a sample of both is tried.
#include <gtest/gtest.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <iterator>
#include <string>
#include <vector>

#include "fields.h"
#include "keys.h"
#include "tree_image.h"
#include "trial.h"

namespace VELK::test {

namespace {

bool SweepsAll() {
    const char* text = std::getenv("TREEHFS_SWEEP");
    return text != nullptr && std::string(text) == "all";
}

struct SweepSetup {
    u32 fileId;
    u32 nodeSize;
};

constexpr SweepSetup kSetups[] = {
    {kCatalogFileId, 512}, {kExtentsFileId, 512}, {kAttributesFileId, 512}, {kCatalogFileId, 1024}};

std::string NameOf(const SweepSetup& setup) {
    return "File" + std::to_string(setup.fileId) + "By" + std::to_string(setup.nodeSize);
}

// The nodes whose fields are set.
const char* const kNodeNames[] = {"Header", "FirstLeaf", "MiddleLeaf", "Index", "Root", "Map"};
constexpr std::size_t kNodes = std::size(kNodeNames);

class FieldSweep {
public:
    explicit FieldSweep(const SweepSetup& setup)
        : setup_(setup), sound_(Sound(setup)), trial_(setup.fileId, 512) {
        const u32 middleLeaf = sound_.levels[1][1];
        nodes_ = {0,
                  sound_.levels[1][0],
                  middleLeaf,
                  sound_.levels[2][0],
                  sound_.rootNode,
                  sound_.mapNodes[0]};
    }

    // The nodes whose fields are set, as in kNodeNames.
    const std::vector<u32>& Nodes() const { return nodes_; }
    std::vector<Field> FieldsOf(u32 nodeNum) const {
        return FieldsOfNode(sound_.Node(nodeNum).data(), sound_.shape.nodeSize,
                            sound_.shape.fileId);
    }

protected:
    // Three levels, two of them index nodes, and a map node more than needed.
    static TreeImage Sound(const SweepSetup& setup) {
        TreeShape shape;
        shape.fileId = setup.fileId;
        shape.nodeSize = setup.nodeSize;
        shape.recordsPerLeaf = 2;
        shape.childrenPerIndex = 2;
        shape.mapNodes = 1;
        shape.freeNodes = 3;
        std::vector<TreeRecord> records = NthRecords(shape.fileId, 8, kExtentRecordSize);
        if (shape.fileId == kExtentsFileId) {
            for (u32 n = 0; n < 3; ++n) {
                records[n].key = DiskExtKey(kForkData, kBadBlockFileId, n * 8);
            }
        }
        return BuildTree(shape, records);
    }

    // The field's place in the file.
    Field InFile(u32 nodeNum, Field field) const {
        field.offset += nodeNum * sound_.shape.nodeSize;
        return field;
    }
    void Try(const TreeImage& image, u32 nodeNum) {
        trial_.RunTree(image.bytes, nodeNum);
        trial_.RunNode(image.Node(nodeNum), nodeNum == 0 ? 0 : 1);
        trials_ += 1;
    }
    void TryValue(u32 nodeNum, const Field& field, u64 value) {
        TreeImage image = sound_;
        SetField(image.bytes.data(), InFile(nodeNum, field), value);
        Try(image, nodeNum);
        ASSERT_FALSE(::testing::Test::HasFailure())
            << "node " << nodeNum << ", " << field.name << " at " << field.offset << " = " << value;
    }

    // What a part of the whole sweep leaves behind (run.sh).
    void TellTrials() const {
        if (SweepsAll()) {
            std::printf("%llu trials\n", static_cast<unsigned long long>(trials_));
        }
    }

    SweepSetup setup_;
    TreeImage sound_;
    Trial trial_;
    std::vector<u32> nodes_;
    u64 trials_ = 0;
};

// One field of one node of a tree: a part of the sweep that can be run by itself.
struct FieldPart {
    SweepSetup setup;
    std::size_t node;
    std::size_t index;  // of the field among those of the node
    Field field;
};

class OneField : public FieldSweep, public ::testing::TestWithParam<FieldPart> {
public:
    // Of every node of every tree.
    static std::vector<FieldPart> All() {
        std::vector<FieldPart> parts;
        for (const SweepSetup& setup : kSetups) {
            const FieldSweep sweep(setup);
            for (std::size_t node = 0; node < kNodes; ++node) {
                std::size_t index = 0;
                for (const Field& field : sweep.FieldsOf(sweep.Nodes()[node])) {
                    parts.push_back({setup, node, index++, field});
                }
            }
        }
        return parts;
    }

    static std::string Name(const FieldPart& part) {
        std::string name = NameOf(part.setup) + "In" + kNodeNames[part.node] + "_" +
                           std::to_string(part.index) + "_" + part.field.name;
        for (char& character : name) {
            character = std::isalnum(static_cast<u8>(character)) != 0 ? character : '_';
        }
        return name;
    }

protected:
    OneField() : FieldSweep(GetParam().setup) {}
};

class TwoFields : public FieldSweep, public ::testing::TestWithParam<SweepSetup> {
protected:
    TwoFields() : FieldSweep(GetParam()) {}
};

// A few values for pairs: the ends, the neighbours of what is there, the tree's and node's ends.
std::vector<u64> FewValues(const Field& field, u64 old, const TreeImage& image) {
    const u64 all = field.width == 4 ? 0xFFFFFFFFu : (u64{1} << (8 * field.width)) - 1;
    return {0, (old + 1) & all, field.width == 4 ? image.totalNodes : image.shape.nodeSize & all,
            all};
}

}  // namespace

TEST_P(OneField, MayHoldAnyValue) {
    const FieldPart& part = GetParam();
    if (part.index == 0) {
        trial_.RunTree(sound_.bytes, 1);
        ASSERT_FALSE(HasFailure()) << "the sound tree";
    }
    const u32 nodeNum = Nodes()[part.node];
    const Field& field = part.field;
    // 65,536 values where nodes have 512 bytes; 251 is prime, so samples meet every residue.
    const u32 step = !SweepsAll() ? 6007 : setup_.nodeSize == 512 ? 1 : 251;
    if (SweepsAll() || field.width != 2) {
        const u64 old = GetField(sound_.bytes.data(), InFile(nodeNum, field));
        for (const u64 value :
             BoundaryValues(field, old, sound_.shape.nodeSize, sound_.totalNodes)) {
            TryValue(nodeNum, field, value);
        }
    }
    const u32 count = field.width == 1 ? 256 : field.width == 2 ? 65536 : 0;
    for (u32 value = field.offset % step; value < count; value += step) {
        TryValue(nodeNum, field, value);
        if (HasFatalFailure()) {
            return;
        }
    }
    TellTrials();
}

TEST_P(TwoFields, MayBeWrongTogether) {
    struct Change {
        u32 node;
        Field field;
        u64 value;
    };
    std::vector<Change> changes;
    for (const u32 nodeNum : Nodes()) {
        for (const Field& field : FieldsOf(nodeNum)) {
            const u64 old = GetField(sound_.bytes.data(), InFile(nodeNum, field));
            for (const u64 value : FewValues(field, old, sound_)) {
                changes.push_back({nodeNum, InFile(nodeNum, field), value});
            }
        }
    }
    const u64 all = u64{changes.size()} * changes.size();
    const u64 step = SweepsAll() ? 1 : all / 800 | 1;
    for (u64 pair = 0; pair < all; pair += step) {
        const Change& one = changes[static_cast<std::size_t>(pair / changes.size())];
        const Change& two = changes[static_cast<std::size_t>(pair % changes.size())];
        if (one.field.offset >= two.field.offset) {
            continue;  // tried the other way round, or the same field
        }
        TreeImage image = sound_;
        SetField(image.bytes.data(), one.field, one.value);
        SetField(image.bytes.data(), two.field, two.value);
        Try(image, two.node);
        ASSERT_FALSE(HasFailure())
            << one.field.name << " at " << one.field.offset << " = " << one.value << " and "
            << two.field.name << " at " << two.field.offset << " = " << two.value;
    }
    TellTrials();
}

INSTANTIATE_TEST_SUITE_P(Trees, OneField, ::testing::ValuesIn(OneField::All()),
                         [](const auto& part) { return OneField::Name(part.param); });
INSTANTIATE_TEST_SUITE_P(Trees, TwoFields, ::testing::ValuesIn(kSetups),
                         [](const auto& setup) { return NameOf(setup.param); });

}  // namespace VELK::test
