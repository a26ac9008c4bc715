// Insertions, deletions and updates on damaged trees: whatever a node holds, every call ends with a
// status, within its bounds, without touching a byte outside the blocks and without leaving a
// reference behind.
#include <algorithm>
#include <cstdlib>
#include <random>

#include "geometry.h"
#include "tree_test.h"

namespace VELK::test {
namespace {

constexpr u32 kRecords = 60;
constexpr u32 kData = 24;

u32 Seed() {
    const char* wanted = std::getenv("TREEHFS_SEED");
    return wanted != nullptr ? static_cast<u32>(std::strtoul(wanted, nullptr, 0))
                             : std::random_device{}();
}

class HostileChange : public GeometryTest {
protected:
    HostileChange() : seed_(Seed()), random_(seed_) {
        TreeShape shape;
        shape.nodeSize = NodeSize();
        shape.recordsPerLeaf = NodeSize() == 512 ? 0 : 9;
        shape.childrenPerIndex = 3;
        shape.clumpSize = NodeSize();
        image_ = BuildTree(shape, NthRecords(kCatalogFileId, kRecords, kData));
    }

    u32 Below(u32 limit) { return static_cast<u32>(random_() % limit); }

    // A value that is likely to hurt.
    u32 Value(u32 old, u32 bits) {
        const u32 mask = bits == 32 ? 0xFFFFFFFFu : (1u << bits) - 1;
        const u32 values[] = {0,
                              1,
                              2,
                              13,
                              14,
                              15,
                              old + 1,
                              old - 1,
                              old + 2,
                              old - 2,
                              MapBlock() - 1,
                              MapBlock(),
                              MapBlock() + 1,
                              NodeSize() - 1,
                              NodeSize(),
                              NodeSize() + 1,
                              0x7FFFFFFFu,
                              0xFFFFFFFFu,
                              image_.totalNodes,
                              Below(image_.totalNodes),
                              static_cast<u32>(random_())};
        return values[Below(std::size(values))] & mask;
    }

    // Damages one field of one node.
    void Damage(TreeImage* image) {
        const u32 node = Below(4) == 0 ? 0 : Below(image->totalNodes - image->freeNodes);
        const Bytes bytes = image->Node(node);
        const u32 records = std::min(Get16(bytes, kDescNumRecords), 20u);
        switch (Below(node == 0 ? 7 : 6)) {
            case 0: {
                const u32 at = Below(2) * 4;
                image->Patch32(node, at, Value(Get32(bytes, at), 32));
                break;
            }
            case 1:
                image->Patch8(node, 8 + Below(2), Value(bytes[8], 8));
                break;
            case 2:
                image->Patch16(node, kDescNumRecords, Value(records, 16));
                break;
            case 3:
            case 4: {
                const u32 slot = NodeSize() - 2 * (1 + Below(records + 2));
                image->Patch16(node, slot, Value(Get16(bytes, slot), 16));
                break;
            }
            case 5: {
                const u32 at = Below(NodeSize() - 4);
                image->Patch32(node, at, Value(Get32(bytes, at), 32));
                break;
            }
            default: {
                const u32 at = 14 + 2 * Below(20);
                if (at != kHeadNodeSize) {  // another size does not open
                    image->Patch16(0, at, Value(Get16(bytes, at), 16));
                }
            }
        }
    }

    void RunOn(const TreeImage& image) {
        TreeOnVolume tree(image, MapBlock());
        if (tree.OpenStatus() != kOk) {
            return;
        }
        // Growth by a forged count is the volume's to refuse.
        tree.Volume().options.maxFileSize = image.bytes.size() + 64 * NodeSize();
        for (u32 step = 0; step < 8; ++step) {
            const u32 calls = tree.Volume().Count(Call::kMap) + tree->hitCount;
            Act(&tree, Below(5));
            ASSERT_LE(tree.Volume().Count(Call::kMap) + tree->hitCount - calls,
                      4 * (image.totalNodes + 64));
            ASSERT_TRUE(LedgerHolds(*tree, References(tree->findData)));
        }
    }

    void Act(TreeOnVolume* tree, u32 what) {
        const u32 n = Below(kRecords);
        const Bytes data = Pattern(NodeSize(), n);
        switch (what) {
            case 0:
                tree->InsertNth(n, kData, true);
                break;
            case 1:
                tree->Insert(HostCatKey(1 + Below(3), std::u16string(1 + Below(60), u'a')),
                             Pattern(90, n));
                break;
            case 2:
                tree->DeleteNth(n);
                break;
            case 3:
                (*tree)->DeleteRecord(nullptr, 0, true);
                break;
            default: {
                const HostKey key = NthHostKey(kCatalogFileId, n);
                (*tree)->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr);
                (*tree)->UpdateKeyAndRecord(nullptr, data.data());
            }
        }
    }

    u32 seed_;
    std::mt19937 random_;
    TreeImage image_;
};

TEST_P(HostileChange, EveryCallEndsWithAStatus) {
    for (u32 run = 0; run < 400 && !HasFailure(); ++run) {
        TreeImage image = image_;
        for (u32 damages = 1 + Below(3); damages > 0; --damages) {
            Damage(&image);
        }
        RunOn(image);
        EXPECT_FALSE(HasFatalFailure()) << "run " << run << " seed " << seed_;
    }
}

std::vector<Geometry> HostileGeometries() {
    return {{512, 512}, {1024, 512}, {2048, 512}};
}
INSTANTIATE_GEOMETRIES(HostileChange, HostileGeometries);

}  // namespace
}  // namespace VELK::test
