// A journal that changes nodes under the engine's hands. No sound service does; the checks that
// look at what was written a moment before can be seen at work in no other way.
#include <functional>
#include <utility>

#include "sparse_volume.h"

namespace VELK::test {
namespace {

#define EXPECT_EVENTS(...) EXPECT_EQ(capture.Take(), (Events{__VA_ARGS__}))

// Grants everything, and does something at the nth access of a kind.
class TamperJournal {
public:
    using Action = std::function<void()>;

    explicit TamperJournal(CFileSystemHfs* fs) {
        fs->journal.ops = &kOps;
        fs->journal.self = this;
    }
    void AtWrite(int nth, Action action) { write_ = {nth, std::move(action)}; }
    void AtCreate(int nth, Action action) { create_ = {nth, std::move(action)}; }

private:
    struct Trap {
        int left = 0;
        Action action;

        int Step() {
            left -= 1;
            if (left == 0) {
                action();
            }
            return kOk;
        }
    };

    static int OnWrite(void* self, buffer_head*) {
        return static_cast<TamperJournal*>(self)->write_.Step();
    }
    static int OnCreate(void* self, buffer_head*) {
        return static_cast<TamperJournal*>(self)->create_.Step();
    }
    static constexpr HfsJournalOps kOps = {OnWrite, OnCreate};

    Trap write_;
    Trap create_;
};

class SpaceTamper : public SparseTreeTest {
protected:
    int GrowTo(u32 wanted) {
        const unsigned clump = NodeSize();
        return Tree().ExtendBTree(wanted, nullptr, &clump);
    }
    // Changes bytes of a cached node without a call into the tree.
    void Change(u32 nodeNum, u32 offset, const Bytes& bytes) {
        const HfsNode* node = CachedNode(Tree(), nodeNum);
        ASSERT_NE(node, nullptr);
        for (u32 i = 0; i < bytes.size(); ++i) {
            node->bufs[(offset + i) / MapBlock()].data[(offset + i) % MapBlock()] = bytes[i];
        }
    }
    void OpenWithEmptyNextNode() {
        Open(HeadBits(), 3);
        Bytes empty(NodeSize());
        empty.back() = 14;
        volume->PutNode(HeadBits(), empty);
        Tree().validNodes = HeadBits() + 9;
    }
};
INSTANTIATE_GEOMETRIES(SpaceTamper, GeometriesOfSeveralBlocks);

TEST_P(SpaceTamper, LinkLostBeforeTheBitsAreSetEndsWithAStatus) {
    Open(HeadBits(), 3);
    TamperJournal journal(&volume->fs);
    journal.AtCreate(1, [&] { Change(0, kDescFLink, {0, 0, 0, 0}); });
    EXPECT_EQ(GrowTo(HeadBits() + 9), kErrCorrupt);
    EXPECT_EVENTS(Asserted(4147), Reported(kReasonTree, 4150));
    EXPECT_TRUE(Tree().isDirty);
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(SpaceTamper, NewMapNodeOfAnotherKindEndsWithAStatus) {
    Open(HeadBits() - 1, 3);
    TamperJournal journal(&volume->fs);
    journal.AtWrite(2, [&] { Change(HeadBits() - 1, kDescKind, {0xFF}); });
    EXPECT_EQ(GrowTo(HeadBits() + StepBits() + 9), kErrCorrupt);
    EXPECT_EVENTS(Reported(kReasonTree, 3651), Reported(kErrCorrupt, 4157));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(SpaceTamper, NewMapNodeWithMoreRecordsPrintsAndIsRefused) {
    Open(HeadBits() - 1, 3);
    TamperJournal journal(&volume->fs);
    journal.AtWrite(2, [&] { Change(HeadBits() - 1, kDescNumRecords, {0, 2}); });
    EXPECT_EQ(GrowTo(HeadBits() + StepBits() + 9), kErrCorrupt);
    EXPECT_EVENTS(Asserted(4159), Reported(kReasonNode, 9402), Reported(kErrCorrupt, 4173));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(SpaceTamper, NewMapNodeThatIsNotEmptyPrintsAndIsRefused) {
    OpenWithEmptyNextNode();
    TamperJournal journal(&volume->fs);
    journal.AtWrite(3, [&] { Change(HeadBits(), NodeSize() - 2, {0, 16}); });
    EXPECT_EQ(GrowTo(HeadBits() + 9), kErrCorrupt);
    EXPECT_EVENTS(Asserted(4120), Reported(kReasonNode, 9402), Reported(kErrCorrupt, 4173));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

TEST_P(SpaceTamper, HeaderNodeThatIsNotEmptyPrintsAndGoesOn) {
    MakeVolume(1024);
    volume->stale = 0;
    TamperJournal journal(&volume->fs);
    journal.AtWrite(2, [&] { Change(0, NodeSize() - 2, {0, 16}); });
    EXPECT_EQ(Tree().Create(static_cast<u32>(__builtin_ctz(NodeSize())), 0, nullptr), kOk);
    EXPECT_EVENTS(Asserted(5349));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
}

}  // namespace
}  // namespace VELK::test
