// Each service call and each allocation of an insertion or deletion fails in turn. Whatever came
// before: the status is that of the failure, every report on the way up carries it, nothing stays
// referenced, and after a restore tree and file are those of the last flush and work again.
#include <functional>
#include <memory>

#include "fault_service.h"
#include "geometry.h"
#include "tree_test.h"

namespace VELK::test {
namespace {

constexpr u32 kData = 24;

struct Scenario {
    const char* name;
    TreeImage (*image)(u32 nodeSize);
    int (*change)(TreeOnVolume* tree);
};

TreeImage Image(u32 nodeSize, u32 records, u32 perLeaf, u32 freeNodes = 8) {
    TreeShape shape;
    shape.nodeSize = nodeSize;
    shape.recordsPerLeaf = perLeaf;
    shape.freeNodes = freeNodes;
    shape.clumpSize = nodeSize;
    return BuildTree(shape, NthRecords(kCatalogFileId, records, kData));
}

// Every leaf and index node as full as it gets.
TreeImage FullImage(u32 nodeSize) {
    return Image(nodeSize, nodeSize / 2, 0, 30);
}

// First records short, others long: separators grow when the first go.
TreeImage GrowingImage(u32 nodeSize) {
    TreeShape shape;
    shape.nodeSize = nodeSize;
    shape.recordsPerLeaf = 2;
    shape.freeNodes = 30;
    std::vector<TreeRecord> records;
    for (u32 n = 0; n < 120; ++n) {
        records.push_back(
            {DiskCatKey(16 + n, std::u16string(n % 2 == 0 ? 2u : 40u, u'a')), Pattern(kData, n)});
    }
    return BuildTree(shape, records);
}

// A full leaf behind one with room.
TreeImage LeftRoomImage(u32 nodeSize) {
    const u32 fit = (nodeSize - 16) / 46;
    TreeImage image = Image(nodeSize, fit + 3, fit);
    const std::vector<TreeRecord> records = NthRecords(kCatalogFileId, fit + 3, kData);
    NodeImage leaf;
    leaf.fLink = 2;
    for (u32 n = 0; n < fit + 3; ++n) {
        if (n == 3) {
            image.SetNode(1, leaf.Build(nodeSize));
            leaf = NodeImage{};
            leaf.bLink = 1;
        }
        leaf.records.push_back(Record(records[n].key, records[n].data));
    }
    image.SetNode(2, leaf.Build(nodeSize));
    NodeImage root;
    root.kind = kBTIndexNode;
    root.height = 2;
    root.records = {Record(records[0].key, 1), Record(records[3].key, 2)};
    image.SetNode(3, root.Build(nodeSize));
    return image;
}

// One full leaf of keys that lie over block ends.
TreeImage LongKeyImage(u32 nodeSize) {
    TreeShape shape;
    shape.nodeSize = nodeSize;
    std::vector<TreeRecord> records;
    const u32 nameLength = nodeSize < 4096 ? 30 : 250;
    for (u32 n = 0; n < nodeSize / (nameLength * 2 + 8 + kData + 2); ++n) {
        records.push_back(
            {DiskCatKey(16 + n, std::u16string(nameLength, u'k')), Pattern(kData, n)});
    }
    return BuildTree(shape, records);
}

const Scenario kScenarios[] = {
    {"FirstRecord", [](u32 nodeSize) { return Image(nodeSize, 0, 0); },
     [](TreeOnVolume* tree) { return tree->InsertNth(1, 20); }},
    {"FirstRecordWithGrowth", [](u32 nodeSize) { return Image(nodeSize, 0, 0, 0); },
     [](TreeOnVolume* tree) { return tree->InsertNth(1, 20); }},
    {"RoomInTheLeaf", [](u32 nodeSize) { return Image(nodeSize, 9, 3); },
     [](TreeOnVolume* tree) { return tree->InsertNth(4, 20, true); }},
    {"KeyBeforeAll", [](u32 nodeSize) { return Image(nodeSize, 9, 3); },
     [](TreeOnVolume* tree) { return tree->Insert(HostCatKey(1, u"a"), Pattern(20, 1)); }},
    {"LeafSplit", FullImage, [](TreeOnVolume* tree) { return tree->InsertNth(25, 24, true); }},
    {"RootSplit", [](u32 nodeSize) { return Image(nodeSize, (nodeSize - 16) / 46, 0); },
     [](TreeOnVolume* tree) { return tree->InsertNth(3, 24, true); }},
    {"BothSeparators", FullImage,
     [](TreeOnVolume* tree) {
         return tree->Insert(HostCatKey(1, std::u16string(60, u'a')), Pattern(90, 1));
     }},
    {"SplitWithGrowth", [](u32 nodeSize) { return Image(nodeSize, nodeSize / 4, 0, 0); },
     [](TreeOnVolume* tree) { return tree->InsertNth(25, 24, true); }},
    {"LeftSiblingTakesRecords", LeftRoomImage,
     [](TreeOnVolume* tree) { return tree->InsertNth(8, 24, true); }},
    {"RootSplitOfLongKeys", LongKeyImage,
     [](TreeOnVolume* tree) {
         return tree->Insert(HostCatKey(17, std::u16string(80, u'x')), Pattern(100, 1));
     }},
    {"PlainDeletion", [](u32 nodeSize) { return Image(nodeSize, 9, 3); },
     [](TreeOnVolume* tree) { return tree->DeleteNth(4); }},
    {"DeletionOfAFirstRecord", [](u32 nodeSize) { return Image(nodeSize, 9, 3); },
     [](TreeOnVolume* tree) { return tree->DeleteNth(3); }},
    {"DeletionOfALeaf", [](u32 nodeSize) { return Image(nodeSize, 9, 1); },
     [](TreeOnVolume* tree) { return tree->DeleteNth(3); }},
    {"DeletionWithCollapse", [](u32 nodeSize) { return Image(nodeSize, 2, 1); },
     [](TreeOnVolume* tree) { return tree->DeleteNth(0); }},
    {"LastDeletion", [](u32 nodeSize) { return Image(nodeSize, 1, 0); },
     [](TreeOnVolume* tree) { return tree->DeleteNth(0); }},
    {"DeletionThatSplitsParents", GrowingImage,
     [](TreeOnVolume* tree) { return tree->Delete(HostCatKey(16 + 60, u"aa")); }},
};

struct FaultCase {
    const Scenario* scenario;
    Geometry geometry;
};

class ChangeFault : public ::testing::TestWithParam<FaultCase> {
protected:
    int Change(TreeOnVolume* tree) { return GetParam().scenario->change(tree); }

    // What the volume does with a change that failed.
    static void Undo(TreeOnVolume* tree, const MemVolume::Snapshot& before) {
        (*tree)->findData.ClearPath();
        (*tree)->findData.valid = false;
        (*tree)->RestoreModifiedNodes();
        tree->Volume().Restore(before);
        tree->capture.Take();
    }

    void ExpectReports(const Events& events, int status) {
        for (const Event& event : events) {
            if (event.kind == Event::Kind::kReport) {
                EXPECT_EQ(static_cast<int>(event.code), status) << event;
            } else {
                // Emptying a node goes on when its journal access is refused.
                EXPECT_TRUE(event == Asserted(2745) || event == Asserted(2769)) << event;
            }
        }
    }

    // After the restore: nothing is dirty, the file is the old one, and the change works.
    void ExpectRestored(TreeOnVolume* tree, const MemVolume::Snapshot& before) {
        EXPECT_FALSE((*tree)->isDirty);
        EXPECT_TRUE(ModifiedNodes(**tree).empty());
        EXPECT_TRUE(LedgerHolds(**tree, 0));
        EXPECT_EQ((*tree)->Flush(0), kOk);
        EXPECT_EQ(tree->Disk(), before.files.at(kCatalogFileId));
        EXPECT_EQ(Change(tree), kOk);
        const FlatTree flat = tree->Flushed();
        EXPECT_TRUE(IsSound(flat));
        EXPECT_EQ(flat.records, good_.records);
        EXPECT_TRUE(tree->capture.All().empty());
    }

    void SetUp() override {
        image_ = GetParam().scenario->image(GetParam().geometry.nodeSize);
        TreeOnVolume tree(image_, GetParam().geometry.mapBlock);
        ASSERT_EQ(Change(&tree), kOk);
        good_ = tree.Flushed();
        ASSERT_TRUE(IsSound(good_));
        ASSERT_TRUE(tree.capture.All().empty());
    }

    TreeImage image_;
    FlatTree good_;
};

TEST_P(ChangeFault, EveryServiceCallFailsOnce) {
    for (u32 nth = 1;; ++nth) {
        TreeOnVolume tree(image_, GetParam().geometry.mapBlock);
        const MemVolume::Snapshot before = tree.Volume().Save();
        {
            FaultService faults(&tree.Volume().fs);
            faults.FailAny(nth);
            const int status = Change(&tree);
            if (!faults.HasFailed()) {
                EXPECT_EQ(status, kOk);
                EXPECT_GT(nth, 2u);
                return;
            }
            if (status != kOk) {
                ASSERT_EQ(status, kFaultStatus) << nth;
            }
            ExpectReports(tree.capture.Take(), kFaultStatus);
            EXPECT_TRUE(LedgerHolds(*tree, References(tree->findData))) << nth;
        }
        Undo(&tree, before);
        ExpectRestored(&tree, before);
        if (HasFailure()) {
            FAIL() << "call " << nth;
        }
    }
}

TEST_P(ChangeFault, EveryServiceCallFailsForEver) {
    for (u32 nth = 1;; ++nth) {
        TreeOnVolume tree(image_, GetParam().geometry.mapBlock);
        const MemVolume::Snapshot before = tree.Volume().Save();
        {
            FaultService faults(&tree.Volume().fs);
            faults.FailAny(nth, kFaultStatus, true);
            const int status = Change(&tree);
            if (!faults.HasFailed()) {
                return;
            }
            ASSERT_TRUE(status == kFaultStatus || status == kOk) << nth;
            EXPECT_TRUE(LedgerHolds(*tree, References(tree->findData))) << nth;
        }
        Undo(&tree, before);
        ExpectRestored(&tree, before);
        if (HasFailure()) {
            FAIL() << "call " << nth;
        }
    }
}

TEST_P(ChangeFault, EveryAllocationFailsOnce) {
    for (u32 nth = 1;; ++nth) {
        TreeOnVolume tree(image_, GetParam().geometry.mapBlock);
        const MemVolume::Snapshot before = tree.Volume().Save();
        tree.Heap().FailNth(nth);
        const int status = Change(&tree);
        tree.Heap().FailNone();
        if (!tree.Heap().HasFailed()) {
            EXPECT_EQ(status, kOk);
            return;
        }
        if (status != kOk) {  // the volume can do without memory for its runs
            ASSERT_EQ(status, kErrNoMemory) << nth;
        }
        ExpectReports(tree.capture.Take(), kErrNoMemory);
        EXPECT_TRUE(LedgerHolds(*tree, References(tree->findData))) << nth;
        Undo(&tree, before);
        ExpectRestored(&tree, before);
        if (HasFailure()) {
            FAIL() << "allocation " << nth;
        }
    }
}

std::vector<FaultCase> FaultCases() {
    std::vector<FaultCase> cases;
    for (const Scenario& scenario : kScenarios) {
        for (const Geometry geometry :
             {Geometry{512, 512}, Geometry{1024, 512}, Geometry{4096, 512}}) {
            cases.push_back({&scenario, geometry});
        }
    }
    return cases;
}

std::string FaultName(const ::testing::TestParamInfo<FaultCase>& param) {
    return std::string(param.param.scenario->name) + std::to_string(param.param.geometry.nodeSize);
}

INSTANTIATE_TEST_SUITE_P(Scenarios, ChangeFault, ::testing::ValuesIn(FaultCases()), FaultName);

// A first key straddles a block end when it is longer than a block less the descriptor. With both
// separators under way the scratch buffer holds one, the other needs a buffer of its own.
class SecondSeparator : public ::testing::Test {
protected:
    static TreeImage LongKeys(u32 records) {
        TreeShape shape;
        shape.nodeSize = 4096;
        shape.freeNodes = 20;
        std::vector<TreeRecord> all;
        for (u32 n = 0; n < records; ++n) {
            all.push_back({DiskCatKey(16 + n, std::u16string(250, u'k')), Pattern(kData, n)});
        }
        return BuildTree(shape, all);
    }
    static int InsertBeforeAll(TreeOnVolume* tree) {
        return tree->Insert(HostCatKey(1, std::u16string(255, u'a')), Pattern(200, 1));
    }
};

TEST_F(SecondSeparator, BothKeysStraddleOnEveryLevel) {
    for (const u32 records : {14u, 49u, 50u, 343u}) {
        TreeOnVolume tree(LongKeys(records), 512);
        ASSERT_EQ(InsertBeforeAll(&tree), kOk);
        const FlatTree flat = tree.Flushed();
        EXPECT_TRUE(IsSound(flat)) << records;
        EXPECT_EQ(flat.records.size(), records + 1);
        EXPECT_TRUE(tree.capture.All().empty());
    }
}

TEST_F(SecondSeparator, NoMemoryForItsKeyEndsTheInsertionAtOnce) {
    const TreeImage image = LongKeys(49);
    u32 refused = 0;
    for (u32 nth = 1;; ++nth) {
        TreeOnVolume tree(image, 512);
        tree.Heap().FailNth(nth);
        const int status = InsertBeforeAll(&tree);
        tree.Heap().FailNone();
        if (!tree.Heap().HasFailed()) {
            EXPECT_EQ(status, kOk);
            break;
        }
        ASSERT_EQ(status, kErrNoMemory);
        EXPECT_TRUE(LedgerHolds(*tree, References(tree->findData)));
        const Events atOnce = {Reported(kErrNoMemory, 4593), Reported(kErrNoMemory, 5092)};
        refused += tree.capture.Take() == atOnce ? 1u : 0u;
        tree->findData.ClearPath();
        tree->RestoreModifiedNodes();
        EXPECT_EQ(InsertBeforeAll(&tree), kOk);
        EXPECT_TRUE(IsSound(tree.Flushed()));
    }
    EXPECT_GE(refused, 1u);
}

}  // namespace
}  // namespace VELK::test
