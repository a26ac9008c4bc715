// Whose change it is: of a tree made here it is known that each record lies where a lookup of its
// key ends, as long as records come and go by InsertRecord and DeleteRecord alone; of others never.
#include "bench.h"

namespace VELK::test {
namespace {

constexpr u32 kRecords = 40;  // in leaves of ten

class OwnChanges : public ::testing::Test {
protected:
    OwnChanges() : bench_(Blocks(512)) {}
    ~OwnChanges() override {
        bench_->findData.ClearPath();
        bench_.capture.Take();
    }

    void MakeTree() {
        PrepareCreate(&bench_.tree.tree);
        const unsigned long long size = 64 * 512;
        ASSERT_EQ(bench_->Create(9, 0, &size), kOk);
        InsertAll();
        ASSERT_EQ(Find(kRecords - 1), kOk);
    }
    void ReadTree() { bench_.Open(BuildTree({}, NthRecords(kCatalogFileId, kRecords, 24))); }
    void InsertAll() {
        for (u32 n = 0; n < kRecords; ++n) {
            const HostKey key = NthHostKey(kCatalogFileId, n);
            const Bytes data = Pattern(24, n);
            ASSERT_EQ(bench_->InsertRecord(key.Get(), key.id, data.data(), 24), kOk);
        }
    }
    // From the last record on; after each of them the tree is as this says.
    void DeleteAll(bool isAllOwn) {
        for (u32 n = kRecords; n-- > 0;) {
            const HostKey key = NthHostKey(kCatalogFileId, n);
            ASSERT_EQ(bench_->DeleteRecord(key.Get(), key.id, false), kOk);
            ASSERT_EQ(bench_->isAllOwn, isAllOwn) << n;
        }
    }
    int Find(u32 n) {
        const HostKey key = NthHostKey(kCatalogFileId, n);
        return bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr);
    }
    HfsNode* Leaf() { return bench_->findData.path[1].node; }

    Bench bench_;
};

TEST_F(OwnChanges, ATreeMadeHereIsKnownThroughAllItsChanges) {
    MakeTree();
    EXPECT_TRUE(bench_->isAllOwn);
    DeleteAll(true);
    InsertAll();
    EXPECT_TRUE(bench_->isAllOwn);
}

TEST_F(OwnChanges, ATreeThatWasReadIsNeverKnown) {
    ReadTree();
    EXPECT_FALSE(bench_->isAllOwn);
    DeleteAll(false);
    InsertAll();
    EXPECT_FALSE(bench_->isAllOwn);
}

TEST_F(OwnChanges, ARecordPutInByHandEndsIt) {
    MakeTree();
    NodeKey record;
    bool inserted = false;
    EXPECT_EQ(bench_->_InsertRecord(Leaf(), 0, 40, &record, &inserted), kOk);
    EXPECT_FALSE(bench_->isAllOwn);
}

TEST_F(OwnChanges, ARecordTakenOutByHandEndsIt) {
    MakeTree();
    EXPECT_EQ(bench_->_DeleteRecord(Leaf(), 0), kOk);
    EXPECT_FALSE(bench_->isAllOwn);
}

TEST_F(OwnChanges, ANodeEmptiedByHandEndsIt) {
    MakeTree();
    EXPECT_EQ(bench_->Zero(Leaf()), kOk);
    EXPECT_FALSE(bench_->isAllOwn);
}

TEST_F(OwnChanges, ANodeGivenBackByHandEndsIt) {
    MakeTree();
    EXPECT_EQ(bench_->FreeNode(Leaf()->nodeNum), kOk);
    EXPECT_FALSE(bench_->isAllOwn);
}

}  // namespace
}  // namespace VELK::test
