// Long random runs of insertions and deletions against a plain model; each tree grows and shrinks
// to next to nothing twice. The tree on disk is read without the engine and compared as a whole; no
// report and no unexpected assertion is let pass. TREEHFS_SEED repeats a run.
#include <cstdlib>
#include <map>
#include <random>

#include "geometry.h"
#include "tree_test.h"

namespace VELK::test {
namespace {

struct Churn {
    u32 fileId;
    u32 nodeSize;
    u32 mapBlock;
    u32 maxName;  // code units; 0: the tree's keys have no names
    u32 maxData;
    u32 steps;
};

u32 Seed() {
    const char* wanted = std::getenv("TREEHFS_SEED");
    return wanted != nullptr ? static_cast<u32>(std::strtoul(wanted, nullptr, 0))
                             : std::random_device{}();
}

class ChurnTest : public ::testing::TestWithParam<Churn> {
protected:
    ChurnTest() : seed_(Seed()), random_(seed_) {}

    u32 Below(u32 limit) { return static_cast<u32>(random_() % limit); }

    HostKey RandomKey() {
        const u32 id = 16 + Below(40);
        std::u16string name;
        const u32 length = GetParam().maxName == 0 ? 0 : 1 + Below(GetParam().maxName);
        for (u32 i = 0; i < length; ++i) {
            name += static_cast<char16_t>(u'a' + Below(i < 2 ? 3 : 26));
        }
        switch (GetParam().fileId) {
            case kExtentsFileId:
                return HostExtKey(Below(2) != 0 ? kForkData : kForkResource, id, Below(64));
            case kAttributesFileId:
                return HostAttrKey(id, 0, name);
            default:
                return HostCatKey(id, name);
        }
    }

    // Catalog keys order by parent ID, then binary name (these names fold to themselves).
    struct ModelKey {
        std::vector<u32> order;
        friend bool operator<(const ModelKey& a, const ModelKey& b) { return a.order < b.order; }
    };
    ModelKey OrderOf(const Bytes& disk) const {
        ModelKey key;
        if (GetParam().fileId == kExtentsFileId) {
            key.order = {Get32(disk, 4), disk[2], Get32(disk, 8)};
            return key;
        }
        const bool attributes = GetParam().fileId == kAttributesFileId;
        key.order.push_back(Get32(disk, attributes ? 4 : 2));
        for (std::size_t at = attributes ? 14 : 8; at < disk.size(); at += 2) {
            key.order.push_back(Get16(disk, at));
        }
        return key;
    }

    void Compare(TreeOnVolume* tree) {
        const FlatTree flat = tree->Flushed();
        ASSERT_TRUE(IsSound(flat)) << "seed " << seed_;
        ASSERT_EQ(flat.records.size(), model_.size()) << "seed " << seed_;
        std::size_t i = 0;
        for (const auto& [order, record] : model_) {
            ASSERT_EQ(flat.records[i].key, record.key) << "seed " << seed_ << " record " << i;
            ASSERT_EQ(flat.records[i].data, record.data) << "seed " << seed_ << " record " << i;
            ++i;
        }
    }

    void Step(TreeOnVolume* tree, bool growing) {
        const HostKey key = RandomKey();
        const Bytes disk = DiskFormOf(GetParam().fileId, key);
        const bool insert = Below(100) < (growing ? 80 : 10);
        if (insert) {
            const Bytes data = Pattern(2 * (1 + Below(GetParam().maxData / 2)), Below(1000));
            const bool isNew = model_.try_emplace(OrderOf(disk), TreeRecord{disk, data}).second;
            ASSERT_EQ(tree->Insert(key, data), isNew ? kOk : kErrExists);
            return;
        }
        auto victim = model_.lower_bound(OrderOf(disk));
        if (victim == model_.end()) {
            ASSERT_EQ(tree->Delete(key), kErrNotFound);
            return;
        }
        ASSERT_EQ(tree->Delete(HostOf(victim->second.key)), kOk);
        model_.erase(victim);
    }

    HostKey HostOf(const Bytes& disk) const {
        std::u16string name;
        switch (GetParam().fileId) {
            case kExtentsFileId:
                return HostExtKey(disk[2], Get32(disk, 4), Get32(disk, 8));
            case kAttributesFileId:
                for (std::size_t at = 14; at < disk.size(); at += 2) {
                    name += static_cast<char16_t>(Get16(disk, at));
                }
                return HostAttrKey(Get32(disk, 4), Get32(disk, 8), name);
            default:
                for (std::size_t at = 8; at < disk.size(); at += 2) {
                    name += static_cast<char16_t>(Get16(disk, at));
                }
                return HostCatKey(Get32(disk, 2), name);
        }
    }

    // The only assertions that sound trees may print: records over three blocks, and a node freed
    // by a deletion and taken again by the same one.
    static bool IsHarmless(const Event& event) {
        return event == Asserted(505) || event == Asserted(506) || event == Asserted(4404) ||
               event == Asserted(4526);
    }

    u32 seed_;
    std::mt19937 random_;
    std::map<ModelKey, TreeRecord> model_;
};

TEST_P(ChurnTest, TreeEqualsTheModelAfterEveryFewSteps) {
    TreeShape shape;
    shape.fileId = GetParam().fileId;
    shape.nodeSize = GetParam().nodeSize;
    shape.clumpSize = 16 * GetParam().nodeSize;
    TreeOnVolume tree(BuildTree(shape, {}), GetParam().mapBlock);
    for (u32 step = 0; step < GetParam().steps && !HasFailure(); ++step) {
        Step(&tree, step * 4 / GetParam().steps % 2 == 0);
        for (const Event& event : tree.capture.Take()) {
            ASSERT_TRUE(IsHarmless(event)) << event << " step " << step << " seed " << seed_;
        }
        ASSERT_TRUE(LedgerHolds(*tree, References(tree->findData)))
            << "step " << step << " seed " << seed_;
        if (step % 50 == 0 || step + 1 == GetParam().steps) {
            Compare(&tree);
        }
    }
}

std::string ChurnName(const ::testing::TestParamInfo<Churn>& param) {
    return "Tree" + std::to_string(param.param.fileId) + "Node" +
           std::to_string(param.param.nodeSize) + "Block" + std::to_string(param.param.mapBlock);
}

INSTANTIATE_TEST_SUITE_P(Trees, ChurnTest,
                         ::testing::Values(Churn{kCatalogFileId, 512, 512, 20, 60, 6000},
                                           Churn{kCatalogFileId, 1024, 512, 40, 200, 6000},
                                           Churn{kCatalogFileId, 4096, 4096, 255, 800, 3000},
                                           Churn{kCatalogFileId, 4096, 1024, 255, 800, 3000},
                                           Churn{kCatalogFileId, 4096, 512, 255, 800, 3000},
                                           Churn{kCatalogFileId, 8192, 4096, 255, 2500, 3000},
                                           Churn{kExtentsFileId, 512, 512, 0, 64, 6000},
                                           Churn{kExtentsFileId, 1024, 512, 0, 64, 6000},
                                           Churn{kAttributesFileId, 2048, 512, 100, 300, 3000}),
                         ChurnName);

}  // namespace
}  // namespace VELK::test
