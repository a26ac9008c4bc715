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

// ---- records that searches have something to say of

struct NewRecord {
    const char* name;
    bool isOrdinary;
    u32 fileId;
    HostKey key;
    u32 size = 20;
    u32 attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
    CompareKeysFn compare = nullptr;  // null: the usual one of the tree
};

void PrintTo(const NewRecord& record, std::ostream* out) {
    *out << record.name;
}

// With another byte at `at`: of the length field (0) or of the number of units.
HostKey With(HostKey key, u32 at, u8 value) {
    key.bytes[at] = value;
    return key;
}
HostKey OfAnother(HostKey key) {
    key.id += 1;
    return key;
}
int CompareAny(const BTreeKey* one, unsigned id, const BTreeKey* other) {
    return CompareCatKeysCaseIns(one, id, other);
}

std::vector<NewRecord> NewRecords() {
    constexpr u32 kCat = kCatalogFileId;
    constexpr u32 kExt = kExtentsFileId;
    constexpr u32 kAttr = kAttributesFileId;
    const HostKey cat = HostCatKey(7, u"ab");
    const HostKey ext = HostExtKey(0, 7, 3);
    const HostKey attr = HostAttrKey(7, 0, u"ab");
    return {
        {"catalog", true, kCat, cat},
        {"catalogBinary", true, kCat, cat, 20, kBTBigKeysMask | kBTVariableIndexKeysMask,
         CompareCatKeysCaseBin},
        {"catalogOfAForeignOrder", false, kCat, cat, 20, kBTBigKeysMask | kBTVariableIndexKeysMask,
         CompareAny},
        {"catalogUnderAnotherId", false, kCat, OfAnother(cat)},
        {"catalogKeyWithoutNameLength", false, kCat, With(cat, 0, 4)},
        {"catalogNameBehindTheKey", false, kCat, With(cat, kCatKeyNameLength, 3)},
        {"catalogKeyLongerThanAny", false, kCat, HostCatKey(7, std::u16string(258, u'x'))},
        {"dataOfOneBlock", true, kCat, cat, 512},
        {"dataOfMore", true, kCat, cat, 514},
        {"extents", true, kExt, ext},
        {"extentsUnderAnotherId", false, kExt, OfAnother(ext)},
        {"extentsKeyThatIsShort", false, kExt, With(ext, 0, 8)},
        {"extentsOfFixedKeys", true, kExt, ext, 20, kBTBigKeysMask},
        {"extentsOfFixedKeysLongerThanThat", false, kExt, With(ext, 0, 12), 20, kBTBigKeysMask},
        {"attributes", true, kAttr, attr},
        {"attributesUnderAnotherId", false, kAttr, OfAnother(attr)},
        {"attributesKeyWithoutNameLength", false, kAttr, With(attr, 0, 10)},
        {"attributesNameBehindTheKey", false, kAttr, With(attr, kAttrKeyNameLength, 3)},
    };
}

class NewRecordInOwnTree : public ::testing::TestWithParam<NewRecord> {};

TEST_P(NewRecordInOwnTree, EndsItUnlessItIsOrdinary) {
    const NewRecord& record = GetParam();
    for (const bool isFirst : {true, false}) {
        Bench bench(Blocks(512), record.fileId);
        PrepareCreate(&bench.tree.tree);
        bench->header.attributes = record.attributes;
        const unsigned long long size = 64 * 4096;
        ASSERT_EQ(bench->Create(12, 0, &size), kOk);
        if (record.compare != nullptr) {
            bench->compareKeys = record.compare;
        }
        if (!isFirst) {
            const HostKey other = NthHostKey(record.fileId, 3);
            ASSERT_EQ(bench->InsertRecord(other.Get(), other.id, "ab", 2), kOk);
        }
        const Bytes data = Pattern(record.size, 1);
        EXPECT_EQ(bench->InsertRecord(record.key.Get(), record.key.id, data.data(), record.size),
                  kOk);
        EXPECT_EQ(bench->isAllOwn, record.isOrdinary) << isFirst;
        EXPECT_EQ(bench->hasLongData, record.size > 512) << isFirst;
        bench->findData.ClearPath();
        bench.capture.Take();
    }
}

INSTANTIATE_TEST_SUITE_P(All, NewRecordInOwnTree, ::testing::ValuesIn(NewRecords()),
                         [](const auto& one) { return one.param.name; });

}  // namespace
}  // namespace VELK::test
