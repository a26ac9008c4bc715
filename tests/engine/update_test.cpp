// UpdateKeyAndRecord: the data of a record is overwritten where it lies, over block ends too;
// nothing else changes.
#include <memory>

#include "fault_service.h"
#include "geometry.h"
#include "node_bench.h"
#include "tree_test.h"

namespace VELK::test {
namespace {

TreeImage Image(u32 nodeSize, u32 records, u32 dataSize) {
    TreeShape shape;
    shape.nodeSize = nodeSize;
    return BuildTree(shape, NthRecords(kCatalogFileId, records, dataSize));
}

class Update : public GeometryTest {
protected:
    // Records of a third of a map block, so that some lie over every block end.
    u32 DataSize() const { return MapBlock() / 3 / 2 * 2; }
    u32 Count() const { return 5 * NodeSize() / DataSize(); }

    void Open(u32 records, u32 dataSize) {
        tree_.reset();
        tree_ = std::make_unique<TreeOnVolume>(Image(NodeSize(), records, dataSize), GetParam());
    }
    void Find(u32 n) {
        const HostKey key = NthHostKey(kCatalogFileId, n);
        ASSERT_EQ((*tree_)->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr), kOk);
    }

    std::unique_ptr<TreeOnVolume> tree_;
};

TEST_P(Update, EveryRecordIsOverwrittenInItsPlace) {
    Open(Count(), DataSize());
    std::vector<TreeRecord> expected = NthRecords(kCatalogFileId, Count(), DataSize());
    for (u32 n = 0; n < Count(); ++n) {
        Find(n);
        expected[n].data = Pattern(DataSize(), n + 1000);
        ASSERT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, expected[n].data.data()), kOk);
    }
    EXPECT_FALSE((*tree_)->isDirty);
    EXPECT_TRUE(tree_->capture.All().empty());
    const FlatTree flat = tree_->Flushed();
    EXPECT_TRUE(IsSound(flat));
    EXPECT_EQ(flat.records, expected);
}

TEST_P(Update, OnlyTheDataIsMarked) {
    Open(Count(), DataSize());
    Find(1);
    const Bytes before = tree_->Node(1);
    const Bytes data = Pattern(DataSize(), 77);
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kOk);
    Bytes expected = before;
    const u32 start = Get16(before, NodeSize() - 4) + 20;  // behind the key
    std::copy(data.begin(), data.end(), expected.begin() + start);
    EXPECT_EQ(tree_->Node(1), expected);
    EXPECT_EQ(ModifiedNodes(**tree_), std::vector<u32>{1});
    const HfsNode* node = CachedNode(**tree_, 1);
    for (u32 b = 0; b < GetParam().Blocks(); ++b) {
        const bool touched = b >= start / MapBlock() && b <= (start + DataSize() - 1) / MapBlock();
        EXPECT_EQ(node->bufs[b].dirty, touched) << b;
    }
}

TEST_P(Update, DataLongerThanHalfANode) {
    const u32 size = NodeSize() - 14 - 4 - 20;
    if (size > 2 * MapBlock() + 4) {
        return;  // no reader could follow more than three pieces
    }
    Open(1, size);
    Find(0);
    tree_->capture.Take();
    const Bytes data = Pattern(size, 9);
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kOk);
    EXPECT_EQ(tree_->Flushed().records[0].data, data);
}

TEST_P(Update, HookWithoutFunctionsCopies) {
    Open(Count(), DataSize());
    Find(2);
    (*tree_)->convert.DataToDisk = nullptr;
    const Bytes data = Pattern(DataSize(), 5);
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kOk);
    EXPECT_EQ(tree_->Flushed().records[2].data, data);
}

TEST_P(Update, NothingGivenIsAsserted) {
    Open(5, 24);
    Find(2);
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, nullptr), kOk);
    EXPECT_EQ(tree_->capture.Take(), Events{Asserted(3548)});
    EXPECT_TRUE(ModifiedNodes(**tree_).empty());
}

TEST_P(Update, KeyIsAssertedAndIgnored) {
    Open(5, 24);
    Find(2);
    const HostKey other = NthHostKey(kCatalogFileId, 4);
    const Bytes before = tree_->Node(1);
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(other.Get(), nullptr), kOk);
    EXPECT_EQ(tree_->capture.Take(), Events{Asserted(3559)});
    EXPECT_EQ(tree_->Node(1), before);
    EXPECT_TRUE(ModifiedNodes(**tree_).empty());
}

TEST_P(Update, PositionsThatAreNoRecordAreRefused) {
    const Bytes data = Pattern(24, 1);
    const Events refused = {Reported(kReasonInvalid, 9214)};
    Open(5, 24);
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kErrInvalid);  // never searched
    EXPECT_EQ(tree_->capture.Take(), refused);
    Find(2);
    ASSERT_EQ((*tree_)->Flush(0), kOk);  // lets the path go
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(), refused);
    Find(4);
    (*tree_)->findData.path[1].index = 5;
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(), refused);
    (*tree_)->findData.path[1].index = -1;
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(), refused);
    (*tree_)->findData.path[1].index = 4;
    (*tree_)->findData.level = 2;
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(), refused);
    EXPECT_TRUE(ModifiedNodes(**tree_).empty());
}

TEST_P(Update, RecordThatCannotBeReadIsReported) {
    Open(5, 24);
    Find(2);
    HfsNode* node = (*tree_)->findData.path[1].node;
    u8* tail = node->bufs[GetParam().Blocks() - 1].data + MapBlock();
    tail[-6] = 0xFF;  // record 2 starts behind the node
    const Bytes data = Pattern(24, 1);
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kErrCorrupt);
    EXPECT_EQ(tree_->capture.Take(),
              (Events{Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 3556)}));
}

TEST_P(Update, RecordThatReachesBehindTheFreeSpaceIsRefused) {
    Open(5, 24);
    Find(4);
    HfsNode* node = (*tree_)->findData.path[1].node;
    u8* tail = node->bufs[GetParam().Blocks() - 1].data + MapBlock();
    tail[-12] = static_cast<u8>((NodeSize() - 4) >> 8);
    tail[-11] = static_cast<u8>(NodeSize() - 4);  // the record runs into its own slot
    const Bytes before = tree_->Node(1);
    const Bytes data = Pattern(NodeSize(), 1);
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kErrCorrupt);
    EXPECT_EQ(tree_->Node(1), before);
    tree_->capture.Take();
}

TEST_P(Update, MissingScratchBufferIsReported) {
    if (GetParam().Blocks() == 1) {
        return;  // nothing straddles
    }
    Open(5, 24);
    Find(2);
    velk_heap_free((*tree_)->scratch);
    (*tree_)->scratch = nullptr;
    tree_->Heap().FailNth(1);
    const Bytes data = Pattern(24, 1);
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kErrNoMemory);
    EXPECT_EQ(tree_->capture.Take(), Events{Reported(kErrNoMemory, 9216)});
    EXPECT_TRUE(ModifiedNodes(**tree_).empty());
}

TEST_P(Update, RefusedAccessIsReportedAndNothingWritten) {
    Open(5, 24);
    Find(2);
    const Bytes before = tree_->Node(1);
    const Bytes data = Pattern(24, 1);
    FaultService faults(&tree_->Volume().fs);
    faults.Fail(Call::kWriteAccess, 1);
    EXPECT_EQ((*tree_)->UpdateKeyAndRecord(nullptr, data.data()), kFaultStatus);
    EXPECT_EQ(tree_->capture.Take(),
              (Events{Reported(kFaultStatus, kAnySite), Reported(kFaultStatus, 3586)}));
    EXPECT_EQ(tree_->Node(1), before);
}

INSTANTIATE_GEOMETRIES(Update, ChangeGeometries);

// A lookup leaves a leaf it rejected in the path.
TEST(UpdateInPlace, LeafOfTheWrongHeightIsRefused) {
    TreeImage image = Image(512, 3, 24);
    image.Patch8(1, 9, 2);
    TreeOnVolume tree(image, 512);
    EXPECT_EQ(tree->ReadLevel(1, 1, nullptr), kErrCorrupt);
    tree.capture.Take();
    tree->findData.level = 1;
    const Bytes data = Pattern(24, 9);
    EXPECT_EQ(tree->UpdateKeyAndRecord(nullptr, data.data()), kErrInvalid);
    EXPECT_EQ(tree.capture.Take(), Events{Reported(kReasonInvalid, 9214)});
    EXPECT_TRUE(ModifiedNodes(*tree).empty());
}

}  // namespace
}  // namespace VELK::test
