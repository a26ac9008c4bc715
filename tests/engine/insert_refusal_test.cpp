// Insertions that are refused: requests that cannot be served, links and levels that disagree, maps
// that lie. Every report on the way up is compared.
#include <memory>

#include "hfs/treehfs/bytes.h"
#include "node_bench.h"
#include "tree_test.h"

namespace VELK::test {
namespace {

constexpr u32 kData = 24;
constexpr u32 kFit = 10;  // records of a full leaf of 512 bytes

const Event kDump = {Event::Kind::kDump, 128, 0, {}};

// What callers of InsertNode add to its report, for an insertion that starts at the leaf.
Events Upwards(Events events, int status) {
    for (const int site : {4639, 4593, 5092}) {
        events.push_back(Reported(status, site));
    }
    return events;
}

TreeImage Image(u32 records, u32 perLeaf = 0, u32 freeNodes = 8) {
    TreeShape shape;
    shape.recordsPerLeaf = perLeaf;
    shape.freeNodes = freeNodes;
    return BuildTree(shape, NthRecords(kCatalogFileId, records, kData));
}

class InsertRefusal : public ::testing::Test {
protected:
    void Open(const TreeImage& image) {
        tree_.reset();  // before the next one takes over heap and capture
        tree_ = std::make_unique<TreeOnVolume>(image, 512);
    }
    // Inserts behind record n and compares; nothing stays referenced but the path.
    void ExpectInsert(u32 n, int status, const Events& events) {
        EXPECT_EQ(tree_->InsertNth(n, kData, true), status);
        EXPECT_EQ(tree_->capture.Take(), events);
        EXPECT_TRUE(LedgerHolds(**tree_, References((*tree_)->findData)));
    }
    CBTreeHfs& Tree() { return **tree_; }

    std::unique_ptr<TreeOnVolume> tree_;
};

TEST_F(InsertRefusal, RecordLongerThanANode) {
    Open(Image(5));
    const HostKey key = NthHostKey(kCatalogFileId, 1, true);
    const u32 keySize = PaddedKeySize(GetHost16(key.bytes));
    for (const u32 size : {512 - keySize + 1, 0xFFFFFFFEu, 0xFFFFFFFFu}) {
        EXPECT_EQ(Tree().InsertRecord(key.Get(), key.id, key.bytes, size), kErrTooLarge);
        EXPECT_EQ(tree_->capture.Take(), Events{Reported(kReasonTooLarge, 5026)});
    }
    EXPECT_TRUE(ModifiedNodes(Tree()).empty());
}

// The map record of the header node leads to no child, whatever its bytes look like.
TEST_F(InsertRefusal, HeaderNodeThatCallsItselfAnIndexNode) {
    TreeImage image = Image(5);
    image.Patch8(0, kDescKind, static_cast<u8>(kBTIndexNode));
    image.Patch8(0, kDescHeight, 2);
    image.Patch16(0, 248, 250);
    image.Patch32(0, 500, image.rootNode);
    Open(image);
    HfsFindData path;
    Tree().header.treeDepth = 2;
    Tree().header.rootNode = 0;
    ASSERT_EQ(Tree().ReadLevel(2, 0, &path), kOk);
    ASSERT_EQ(Tree().ReadLevel(1, image.rootNode, &path), kOk);
    path.path[2].index = 2;
    const HostKey key = NthHostKey(kCatalogFileId, 1, true);
    const Bytes data = Pattern(kData, 1);
    EXPECT_EQ(Tree().InsertTree(key.Get(), data.data(), kData, path.path[1].node, 2, 1, false,
                                &path, &Tree().convert),
              kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(),
              (Events{Reported(kReasonNode, 9015), Reported(kReasonInvalid, 9255)}));
    EXPECT_TRUE(ModifiedNodes(Tree()).empty());
    path.ClearPath();
}

TEST_F(InsertRefusal, RecordThatPassesTheSizeCheckAndFitsNoNode) {
    Open(Image(0));
    const HostKey key = NthHostKey(kCatalogFileId, 1);
    const Bytes data(512 - PaddedKeySize(GetHost16(key.bytes)));
    EXPECT_EQ(tree_->Insert(key, data), kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(),
              (Events{Reported(kReasonInvalid, 1183), Reported(kErrInvalid, 1370),
                      Reported(kErrInvalid, 5046)}));
    EXPECT_TRUE(LedgerHolds(Tree(), 0));
    Open(Image(3));
    EXPECT_EQ(tree_->Insert(NthHostKey(kCatalogFileId, 1, true), Bytes(480)), kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(),
              Upwards({Reported(kReasonInvalid, 2086), Reported(kErrInvalid, 4467)}, kErrInvalid));
}

TEST_F(InsertRefusal, RecordWithoutData) {
    Open(Image(5));
    EXPECT_EQ(tree_->Insert(NthHostKey(kCatalogFileId, 1, true), {}), kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(), Events{Reported(kReasonInvalid, 9253)});
    Open(Image(0));
    EXPECT_EQ(tree_->Insert(NthHostKey(kCatalogFileId, 1, true), {}), kErrInvalid);
    EXPECT_EQ(Tree().header.treeDepth, 0);
}

// A new root that is refused half-way is handed over last, also when its node was modified before.
TEST_F(InsertRefusal, NewRootAboveAKeyThatCannotBeRead) {
    TreeImage image = Image(kFit);
    image.Patch16(1, 14, 0xFF);
    Open(image);
    HfsNode* root = nullptr;
    ASSERT_EQ(Tree().GetINode(3, &root, true), kOk);
    root->refCount -= 1;
    EXPECT_EQ(ModifiedNodes(Tree()), std::vector<u32>{3});
    ExpectInsert(kFit - 1, kErrCorrupt,
                 Upwards({Reported(kReasonNode, 9006), Reported(kErrCorrupt, 4488)}, kErrCorrupt));
    EXPECT_EQ(ModifiedNodes(Tree()), (std::vector<u32>{2, 1, 0, 3}));
}

TEST_F(InsertRefusal, LookupThatFails) {
    TreeImage image = Image(5);
    image.Patch32(0, kHeadRootNode, 0);
    Open(image);
    ExpectInsert(1, kErrCorrupt, {Reported(kReasonTree, 2980), Reported(kErrCorrupt, 5057)});
}

TEST_F(InsertRefusal, CountersAtTheirEnd) {
    Open(Image(5));
    Tree().header.leafRecords = 0xFFFFFFFFu;
    ExpectInsert(1, kErrCorrupt, {Reported(kReasonTree, 9254)});
    EXPECT_TRUE(ModifiedNodes(Tree()).empty());
    Open(Image(kFit));
    Tree().header.freeNodes = 0;
    Tree().header.totalNodes = 0xFFFFFFFFu;
    ExpectInsert(1, kErrCorrupt, {Reported(kReasonTree, 9252)});
    Open(Image(0));
    Tree().header.freeNodes = 0;
    Tree().header.totalNodes = 0xFFFFFFFFu;
    ExpectInsert(1, kErrCorrupt, {Reported(kReasonTree, 9250)});
}

TEST_F(InsertRefusal, GrowthThatFails) {
    TreeImage image = Image(0, 0, 0);
    Open(image);
    tree_->Volume().options.maxFileSize = 512;
    ExpectInsert(1, kMemNoSpace, {Reported(kMemNoSpace, 4047), Reported(kMemNoSpace, 5032)});
    Open(Image(kFit, 0, 0));
    tree_->Volume().options.maxFileSize = 512;
    ExpectInsert(1, kMemNoSpace, {Reported(kMemNoSpace, 4047), Reported(kMemNoSpace, 5087)});
}

TEST_F(InsertRefusal, MapFullInSpiteOfTheCounter) {
    TreeImage image = Image(0, 0, 0);
    image.Patch32(0, kHeadFreeNodes, 0);
    Open(image);
    Tree().header.freeNodes = 50;
    ExpectInsert(1, kErrNoSpace, {Reported(kErrNoSpace, 5034)});
    Open(Image(kFit, 0, 0));
    Tree().header.freeNodes = 50;
    ExpectInsert(1, kErrNoSpace, Upwards({Reported(kErrNoSpace, 4402)}, kErrNoSpace));
    Open(Image(kFit, 0, 1));
    Tree().header.freeNodes = 50;
    ExpectInsert(1, kErrNoSpace, Upwards({Reported(kErrNoSpace, 4474)}, kErrNoSpace));
}

TEST_F(InsertRefusal, LeftSiblingThatDoesNotLinkBack) {
    TreeImage image = Image(3 * kFit);
    image.Patch32(1, kDescFLink, 3);
    Open(image);
    tree_->capture.TraceAll();
    ExpectInsert(kFit + 1, kErrInvalid,
                 Upwards({Asserted(4353), Traced("bLink=1, NodeNum=2\n"), kDump,
                          Reported(kReasonInvalid, 4361), Reported(kErrInvalid, 4362)},
                         kErrInvalid));
}

TEST_F(InsertRefusal, LeftSiblingOfAnotherLevel) {
    for (const u32 field : {kDescHeight, kDescKind}) {
        TreeImage image = Image(3 * kFit);
        image.Patch8(1, field, 2);
        Open(image);
        ExpectInsert(kFit + 1, kErrInvalid,
                     Upwards({kDump, Reported(kReasonInvalid, 4361), Reported(kErrInvalid, 4362)},
                             kErrInvalid));
    }
}

TEST_F(InsertRefusal, NodeThatIsItsOwnSibling) {
    TreeImage image = Image(3 * kFit);
    image.Patch32(2, kDescFLink, 2);
    image.Patch32(2, kDescBLink, 2);
    Open(image);
    ExpectInsert(
        kFit + 1, kErrInvalid,
        Upwards({kDump, Reported(kReasonInvalid, 4361), Reported(kErrInvalid, 4362)}, kErrInvalid));
}

TEST_F(InsertRefusal, LeftSiblingThatIsNotThere) {
    TreeImage image = Image(3 * kFit);
    image.Patch32(2, kDescBLink, 0x10000);
    Open(image);
    ExpectInsert(kFit + 1, kErrCorrupt,
                 Upwards({Asserted(2638), Reported(kErrCorrupt, 4351)}, kErrCorrupt));
}

TEST_F(InsertRefusal, RightSiblingThatDisagrees) {
    struct Lie {
        u32 offset;
        u32 size;
    };
    for (const Lie& lie : {Lie{kDescBLink, 4}, Lie{kDescHeight, 1}, Lie{kDescKind, 1}}) {
        TreeImage image = Image(3 * kFit);
        lie.size == 4 ? image.Patch32(2, lie.offset, 3) : image.Patch8(2, lie.offset, 2);
        Open(image);
        tree_->capture.TraceAll();
        const u32 before = Tree().header.freeNodes;
        ExpectInsert(1, kErrInvalid,
                     Upwards({Reported(kReasonInvalid, 4418), Traced("fLink=2, NodeNum=1\n"), kDump,
                              kDump, Reported(kErrInvalid, 4424)},
                             kErrInvalid));
        EXPECT_EQ(Tree().header.freeNodes, before - 1);  // nothing is rolled back
    }
}

TEST_F(InsertRefusal, RightSiblingThatIsNotThere) {
    TreeImage image = Image(3 * kFit);
    image.Patch32(1, kDescFLink, 0x10000);
    Open(image);
    ExpectInsert(1, kErrCorrupt,
                 Upwards({Asserted(2638), Reported(kErrCorrupt, 4413)}, kErrCorrupt));
}

TEST_F(InsertRefusal, MapThatCallsTheFullLeafFree) {
    TreeImage image = Image(3 * kFit);
    image.Patch8(0, kHeadMapRecord, 0xBF);  // node 1
    Open(image);
    ExpectInsert(1, kErrCorrupt,
                 Upwards({Asserted(4404), Reported(kReasonTree, 9232)}, kErrCorrupt));
}

// The key lies in front of all nodes in memory, so in none.
TEST_F(InsertRefusal, AFreeNodeThatSomebodyHoldsIsTakenWithAnAssertion) {
    static HostKey key;
    key = NthHostKey(kCatalogFileId, 1, true);
    TreeImage image = Image(3 * kFit);
    Open(image);
    HfsNode* held = nullptr;
    ASSERT_EQ(Tree().GetINode(Tree().header.totalNodes - Tree().header.freeNodes, &held, true), 0);
    EXPECT_LT(reinterpret_cast<std::uintptr_t>(key.Get()),
              reinterpret_cast<std::uintptr_t>(held->bufs[0].data));
    const Bytes data = Pattern(kData, 1);
    EXPECT_EQ(Tree().InsertRecord(key.Get(), key.id, data.data(), kData), kOk);
    EXPECT_EQ(tree_->capture.Take(), Events{Asserted(4404)});
    EXPECT_EQ(Tree().FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr), kOk);
    EXPECT_EQ(held->refCount, 1);
    Tree().PutINode(held, false);
}

// The separator on its way up lies in the leaf that the map calls free: emptied and refilled, it
// would be read as something else.
TEST_F(InsertRefusal, MapThatCallsTheNodeOfASeparatorFree) {
    TreeShape shape;
    const std::vector<TreeRecord> records = NthRecords(kCatalogFileId, 200, kData);
    TreeImage image = BuildTree(shape, records);
    NodeImage leaf;
    leaf.fLink = 2;
    leaf.records = SomeRecords(2, kData);  // room for a longer first key
    image.SetNode(1, leaf.Build(512));
    image.Patch8(0, kHeadMapRecord, 0xBF);
    Open(image);
    EXPECT_EQ(tree_->Insert(HostCatKey(1, std::u16string(60, u'a')), Pattern(8, 1)), kErrCorrupt);
    EXPECT_EQ(tree_->capture.Take(),
              (Events{Asserted(4404), Reported(kReasonTree, 9232), Reported(kErrCorrupt, 4639),
                      Reported(kErrCorrupt, 4593), Reported(kErrCorrupt, 5092)}));
    EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
}

TEST_F(InsertRefusal, FirstKeyOfASplitRootThatCannotBeRead) {
    TreeImage image = Image(kFit);
    image.Patch16(1, 14, 0x7000);  // key length of record 0, which the search does not look at
    Open(image);
    ExpectInsert(
        kFit - 1, kErrCorrupt,
        Upwards({Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, 4488)}, kErrCorrupt));
}

// Two separators above half a node have no room in one root.
TEST_F(InsertRefusal, SeparatorsTooLongForARoot) {
    TreeShape shape;
    Open(BuildTree(shape, {{DiskCatKey(2, std::u16string(124, u'a')), Pattern(100, 1)}}));
    EXPECT_EQ(tree_->Insert(HostCatKey(3, std::u16string(124, u'b')), Pattern(100, 1)),
              kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(),
              Upwards({Reported(kReasonInvalid, 1183), Reported(kErrInvalid, 1370),
                       Reported(kErrInvalid, 4516)},
                      kErrInvalid));
    EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
}

// Separators above a quarter of a node: the first splits the parent, the second finds no room.
TEST_F(InsertRefusal, SecondSeparatorWithoutRoom) {
    const HostKey keyF = HostCatKey(1, std::u16string(124, u'f'));
    const TreeRecord recordA = {DiskCatKey(2, u"a"), Pattern(2, 1)};
    const TreeRecord recordB = {DiskCatKey(3, std::u16string(124, u'b')), Pattern(30, 2)};
    const TreeRecord recordC = {DiskCatKey(4, std::u16string(112, u'c')), Pattern(8, 3)};
    TreeShape shape;
    shape.recordsPerLeaf = 2;
    shape.minDepth = 3;
    Open(BuildTree(shape, {recordA, recordB, recordC}));
    EXPECT_EQ(tree_->Insert(keyF, Pattern(2, 4)), kErrInvalid);
    EXPECT_EQ(tree_->capture.Take(),
              (Events{Asserted(4342), Reported(kReasonInvalid, 9234), Reported(kErrInvalid, 4665),
                      Reported(kErrInvalid, 4593), Reported(kErrInvalid, 5092)}));
    EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
}

// Data can be followed over three blocks at the most. What lay in three where other writers put it
// lies in four as the first record of the new leaf, which then has no key for its parent.
TEST_F(InsertRefusal, FirstRecordOfTheNewLeafThatCannotBeReadAnyMore) {
    constexpr u32 kLong = 3;  // the record whose data then begins two bytes before a block ends
    std::vector<TreeRecord> records;
    for (u32 n = 0; n < 9; ++n) {
        const std::u16string name(n == kLong ? 244 : 6, u'r');
        records.push_back({DiskCatKey(10 + n, name), Pattern(1030, n)});
    }
    TreeShape shape;
    shape.nodeSize = 8192;
    shape.recordsPerLeaf = 7;
    Open(BuildTree(shape, records));
    EXPECT_EQ(tree_->Insert(HostCatKey(5, u"first"), Pattern(400, 9)), kErrCorrupt);
    EXPECT_EQ(tree_->capture.Of(Event::Kind::kReport),
              (Events{Reported(kReasonNode, 9007), Reported(kErrCorrupt, 4757),
                      Reported(kErrCorrupt, 4593), Reported(kErrCorrupt, 5092)}));
    EXPECT_TRUE(LedgerHolds(Tree(), References(Tree().findData)));
    Tree().findData.ClearPath();
    Tree().RestoreModifiedNodes();
    EXPECT_EQ(tree_->Flushed().records, records);
}

// Direct calls below InsertRecord.
class InsertStep : public InsertRefusal {
protected:
    // Opens a tree of three levels and looks record n up.
    void OpenAt(u32 n) {
        TreeShape shape;
        shape.recordsPerLeaf = 2;
        shape.childrenPerIndex = 3;
        Open(BuildTree(shape, NthRecords(kCatalogFileId, 16, kData)));
        const HostKey key = NthHostKey(kCatalogFileId, n);
        bool found = false;
        ASSERT_EQ(
            Tree().FindEntry(key.Get(), key.id, &path_, &found, nullptr, nullptr, nullptr, nullptr),
            kOk);
        ASSERT_TRUE(found);
    }
    void TearDown() override { path_.ClearPath(); }

    int InsertTree(HfsNode* node, int index, int level) {
        const Bytes key = DiskCatKey(1, u"new");
        const Bytes data = Pattern(8, 1);
        return Tree().InsertTree(reinterpret_cast<const BTreeKey*>(key.data()), data.data(), 8,
                                 node, index, level, false, &path_, nullptr);
    }
    int InsertLevel(HfsNode* node, int index, int level) {
        const Bytes key = DiskCatKey(1, u"new");
        const Bytes data = Pattern(8, 1);
        InsertKey entry = {nullptr,
                           reinterpret_cast<const BTreeKey*>(key.data()),
                           static_cast<u32>(key.size() - 2),
                           data.data(),
                           8,
                           false,
                           false};
        return Tree().InsertLevel(&path_, &entry, nullptr, node, index, level);
    }
    void ExpectRefused(int status, int expected, const Events& events) {
        EXPECT_EQ(status, expected);
        EXPECT_EQ(tree_->capture.Take(), events);
        EXPECT_TRUE(LedgerHolds(Tree(), References(path_)));
    }

    HfsFindData path_;
};

TEST_F(InsertStep, TreeInsertionAtTheFrontReachesTheRoot) {
    OpenAt(0);
    EXPECT_EQ(InsertTree(path_.path[1].node, 0, 1), kOk);
    Tree().header.leafRecords += 1;
    Tree().isDirty = true;
    path_.ClearPath();
    const FlatTree flat = tree_->Flushed();
    EXPECT_TRUE(IsSound(flat));
    EXPECT_EQ(flat.records[0].key, DiskCatKey(1, u"new"));
}

TEST_F(InsertStep, PathsThatDoNotLeadThereAreRefusedBeforeAnyChange) {
    const Events refused = {Reported(kReasonInvalid, 9255)};
    OpenAt(0);
    ExpectRefused(InsertTree(nullptr, 0, 1), kErrInvalid, refused);
    ExpectRefused(InsertTree(path_.path[2].node, 0, 1), kErrInvalid, refused);
    ExpectRefused(InsertTree(nullptr, 0, 4), kErrInvalid, refused);  // no node there in the path
    ExpectRefused(InsertTree(path_.path[1].node, 0, 0), kErrInvalid, refused);
    ExpectRefused(InsertTree(path_.path[1].node, 0, 16), kErrInvalid, refused);
    path_.path[2].index = 1;  // another leaf
    ExpectRefused(InsertTree(path_.path[1].node, 0, 1), kErrInvalid, refused);
    path_.path[2].index = -1;
    ExpectRefused(InsertTree(path_.path[1].node, 0, 1), kErrInvalid, refused);
    path_.path[2].index = 3;
    ExpectRefused(InsertTree(path_.path[1].node, 0, 1), kErrInvalid, refused);
    path_.path[2].index = 0;
    Tree().header.rootNode = 1;
    ExpectRefused(InsertTree(path_.path[1].node, 0, 1), kErrInvalid, refused);
    Tree().header.treeDepth = 4;
    ExpectRefused(InsertTree(path_.path[1].node, 0, 1), kErrInvalid, refused);
    Tree().header.treeDepth = 16;
    ExpectRefused(InsertTree(path_.path[1].node, 0, 1), kErrInvalid, refused);
    Tree().header.treeDepth = 3;
    EXPECT_TRUE(ModifiedNodes(Tree()).empty());
}

TEST_F(InsertStep, LevelsOutsideThePathAreRefused) {
    OpenAt(0);
    for (const int level : {-1, 0, 16}) {
        ExpectRefused(InsertLevel(path_.path[1].node, 0, level), kErrCorrupt,
                      {Reported(kReasonDepth, 9245)});
    }
}

TEST_F(InsertStep, NodeThatThePathDoesNotHoldIsAssertedAndRefused) {
    OpenAt(0);
    ExpectRefused(InsertLevel(path_.path[2].node, 0, 1), kErrInvalid,
                  {Asserted(4632), Reported(kReasonInvalid, 9246)});
    ExpectRefused(InsertLevel(nullptr, 0, 4), kErrInvalid, {Reported(kReasonInvalid, 9246)});
}

TEST_F(InsertStep, NodeOfAnotherHeightIsRefused) {
    OpenAt(0);
    path_.path[1].node->bufs[0].data[kDescHeight] = 2;
    ExpectRefused(InsertLevel(path_.path[1].node, 0, 1), kErrInvalid,
                  {Reported(kReasonInvalid, 9246)});
}

TEST_F(InsertStep, LeafOfTheWrongKindIsAsserted) {
    OpenAt(0);
    tree_->Volume().Damage(path_.path[1].node, kDescKind, kBTHeaderNode);
    EXPECT_EQ(InsertLevel(path_.path[1].node, 1, 1), kOk);
    EXPECT_EQ(tree_->capture.Take(), Events{Asserted(4631)});
}

TEST_F(InsertStep, ParentThatIsMissingOrNoIndexNodeIsAssertedAndRefused) {
    OpenAt(0);
    HfsNode* parent = path_.path[2].node;
    path_.path[2].node = nullptr;
    EXPECT_EQ(InsertLevel(path_.path[1].node, 0, 1), kErrCorrupt);
    EXPECT_EQ(tree_->capture.Take(), (Events{Asserted(4696), Reported(kReasonTree, 9241)}));
    path_.path[2].node = parent;
    parent->bufs[0].data[kDescKind] = kBTMapNode;
    ExpectRefused(InsertLevel(path_.path[1].node, 0, 1), kErrCorrupt,
                  {Asserted(4696), Reported(kReasonTree, 9241)});
}

TEST_F(InsertStep, ParentThatLeadsElsewhereIsAssertedAndRefused) {
    OpenAt(0);
    path_.path[2].index = 1;
    ExpectRefused(InsertLevel(path_.path[1].node, 0, 1), kErrCorrupt,
                  {Asserted(4705), Reported(kReasonTree, 9243)});
    path_.path[2].index = -1;
    ExpectRefused(InsertLevel(path_.path[1].node, 0, 1), kErrCorrupt,
                  {Asserted(410), Reported(kReasonNode, kAnySite), Reported(kErrCorrupt, kAnySite),
                   Reported(kErrCorrupt, 9242)});
}

TEST_F(InsertStep, TopOfThePathHasNoParent) {
    OpenAt(0);
    Tree().header.treeDepth = 16;
    HfsNode* leaf = path_.path[1].node;
    path_.path[1].node = nullptr;
    path_.path[15].node = leaf;
    tree_->Volume().Damage(leaf, kDescHeight, 15);
    EXPECT_EQ(InsertLevel(leaf, 0, 15), kErrCorrupt);
    EXPECT_EQ(tree_->capture.Take(), Events{Reported(kReasonTree, 9244)});
    path_.path[15].node = nullptr;
    path_.path[1].node = leaf;
}

// InsertNode alone.
class InsertOne : public InsertStep {
protected:
    int InsertNode(HfsNode* node, unsigned nodeNum, int index, u32 dataSize) {
        const Bytes key = DiskCatKey(1, u"new");
        const Bytes data = Pattern(dataSize, 1);
        const InsertKey entry = {nullptr,
                                 reinterpret_cast<const BTreeKey*>(key.data()),
                                 static_cast<u32>(key.size() - 2),
                                 data.data(),
                                 dataSize,
                                 false,
                                 false};
        return Tree().InsertNode(&entry, node, nodeNum, index, &outNodeNum_, &outIndex_, &newNode_,
                                 &firstKeyChanged_, &enterNewNode_, &newRoot_);
    }

    unsigned outNodeNum_ = 0;
    int outIndex_ = 0;
    HfsNode* newNode_ = nullptr;
    bool firstKeyChanged_ = false;
    bool enterNewNode_ = false;
    HfsNode* newRoot_ = nullptr;
};

TEST_F(InsertOne, RecordInFrontChangesTheFirstKeyOfAnyNodeButTheRoot) {
    OpenAt(0);
    EXPECT_EQ(InsertNode(path_.path[1].node, 1, 0, 8), kOk);
    EXPECT_TRUE(firstKeyChanged_);
    EXPECT_FALSE(enterNewNode_);
    EXPECT_EQ(outNodeNum_, 1u);
    EXPECT_EQ(outIndex_, 0);
    firstKeyChanged_ = false;
    HfsNode* root = path_.path[3].node;
    EXPECT_EQ(InsertNode(root, root->nodeNum, 0, 4), kOk);
    EXPECT_FALSE(firstKeyChanged_);
}

TEST_F(InsertOne, RecordBehindTheFirstChangesNothingAbove) {
    OpenAt(0);
    EXPECT_EQ(InsertNode(path_.path[1].node, 1, 1, 8), kOk);
    EXPECT_FALSE(firstKeyChanged_);
    EXPECT_FALSE(enterNewNode_);
    EXPECT_EQ(newNode_, nullptr);
    EXPECT_EQ(newRoot_, nullptr);
}

TEST_F(InsertOne, NumberOfNeitherNodeIsRefused) {
    OpenAt(0);
    ExpectRefused(InsertNode(path_.path[1].node, 5, 0, 8), kErrInvalid,
                  {Reported(kReasonInvalid, 9235)});
}

TEST_F(InsertOne, NumberOfNeitherNodeIsRefusedBesideANewOneToo) {
    OpenAt(0);
    ASSERT_EQ(Tree().GetINode(2, &newNode_, false), kOk);
    ExpectRefused(InsertNode(path_.path[1].node, 5, 0, 8), kErrInvalid,
                  {Reported(kReasonInvalid, 9235)});
    EXPECT_EQ(newNode_, nullptr);
}

TEST_F(InsertOne, HeightOneMustBeALeaf) {
    OpenAt(0);
    path_.path[1].node->bufs[0].data[kDescKind] = kBTMapNode;
    ExpectRefused(InsertNode(path_.path[1].node, 1, 0, 420), kErrInvalid,
                  {Reported(kReasonInvalid, 4394)});
}

TEST_F(InsertOne, FailureGivesBackTheNodeThatCameIn) {
    OpenAt(0);
    ASSERT_EQ(Tree().GetINode(2, &newNode_, false), kOk);
    ExpectRefused(InsertNode(path_.path[1].node, 2, 0, 470), kErrInvalid,
                  {Asserted(4342), Reported(kReasonInvalid, 9234)});
    EXPECT_EQ(newNode_, nullptr);
}

// A root whose height is that of the deepest path can take records, but not split.
TEST_F(InsertOne, RootOfDepth15DoesNotSplit) {
    for (const u16 depth : {u16{14}, u16{15}}) {
        OpenAt(0);
        HfsNode* root = path_.path[3].node;
        tree_->Volume().Damage(root, kDescHeight, static_cast<u8>(depth));
        Tree().header.treeDepth = depth;
        const u32 before = Tree().header.freeNodes;
        const int status = InsertNode(root, root->nodeNum, 1, 440);
        if (depth == 14) {
            EXPECT_EQ(status, kOk);
            EXPECT_EQ(Tree().header.treeDepth, 15);
            ASSERT_NE(newRoot_, nullptr);
            EXPECT_EQ(newRoot_->bufs[0].data[kDescHeight], 15);
            EXPECT_EQ(Get16(tree_->Node(newRoot_->nodeNum), kDescNumRecords), 2u);
            newRoot_->refCount -= 1;
            newNode_->refCount -= 1;
            newRoot_ = nullptr;
            newNode_ = nullptr;
        } else {
            ExpectRefused(status, kErrCorrupt, {Reported(kReasonDepth, 9231)});
            EXPECT_EQ(Tree().header.freeNodes, before);
            EXPECT_EQ(Tree().header.treeDepth, 15);
        }
        path_.ClearPath();
    }
}

}  // namespace
}  // namespace VELK::test
