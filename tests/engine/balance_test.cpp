// _RotateLeft and _RotateRight on loose nodes: how many entries go, where the new record ends, and
// what is refused.
#include <algorithm>

#include "flat_tree.h"
#include "node_bench.h"

namespace VELK::test {
namespace {

constexpr u32 kLeft = 11;  // node numbers
constexpr u32 kNode = 12;
constexpr u32 kRight = 13;

// A record of `size` bytes whose key sorts by `n`; the new one of a test has odd n.
Bytes Sized(u32 n, u32 size) {
    const Bytes key = {0, 4, 0, 0, static_cast<u8>(n >> 8), static_cast<u8>(n)};
    return Record(key, Pattern(size - 6, n));
}
std::vector<Bytes> Even(u32 count, u32 size, u32 from = 0) {
    std::vector<Bytes> records;
    for (u32 i = 0; i < count; ++i) {
        records.push_back(Sized(2 * (from + i), size));
    }
    return records;
}

struct Outcome {
    int status = -1;
    int index = -1;
    unsigned nodeNum = ~0u;
    bool rotated = false;
    unsigned moved = ~0u;
};

class BalanceBench : public NodeBench {
public:
    explicit BalanceBench(const Geometry& geometry)
        : NodeBench(geometry), size_(geometry.nodeSize) {}

    void Load(const std::vector<Bytes>& sibling, const std::vector<Bytes>& full, u32 siblingNum) {
        sibling_ = Node(LeafOf(size_, sibling), siblingNum);
        node_ = Node(LeafOf(size_, full), kNode);
        siblingBefore_ = sibling_->Content();
        nodeBefore_ = node_->Content();
    }
    void LoadRaw(const Bytes& sibling, const Bytes& full, u32 siblingNum) {
        sibling_ = Node(sibling, siblingNum);
        node_ = Node(full, kNode);
        siblingBefore_ = sibling;
        nodeBefore_ = full;
    }
    Outcome Left(int index, const Bytes& record, HfsConvert* hook = nullptr) {
        Outcome out;
        out.status = tree._RotateLeft(sibling_->Get(), node_->Get(), index, KeyOf(record),
                                      record.data() + 6, DataSizeOf(record), &out.index,
                                      &out.nodeNum, &out.rotated, &out.moved, hook);
        return out;
    }
    Outcome Right(int index, const Bytes& record, HfsConvert* hook = nullptr) {
        Outcome out;
        out.status = tree._RotateRight(node_->Get(), sibling_->Get(), index, KeyOf(record),
                                       record.data() + 6, DataSizeOf(record), &out.index,
                                       &out.nodeNum, &out.moved, hook);
        return out;
    }
    Bytes SiblingBytes() const { return sibling_->Content(); }
    std::vector<Bytes> Sibling() const { return RecordsOf(*sibling_); }
    std::vector<Bytes> Full() const { return RecordsOf(*node_); }
    bool IsUnchanged() const {
        return sibling_->Content() == siblingBefore_ && node_->Content() == nodeBefore_;
    }

private:
    static const BTreeKey* KeyOf(const Bytes& record) {
        return reinterpret_cast<const BTreeKey*>(record.data());
    }
    static unsigned DataSizeOf(const Bytes& record) {
        return static_cast<unsigned>(record.size()) - 6;
    }
    static std::vector<Bytes> RecordsOf(const LooseNode& node) {
        const FlatNode flat = ReadFlatNode(node.Content(), 0);
        std::vector<Bytes> records;
        for (std::size_t i = 0; i < flat.keys.size(); ++i) {
            records.push_back(Record(flat.keys[i], flat.data[i]));
        }
        return records;
    }

    u32 size_;
    std::unique_ptr<LooseNode> sibling_;
    std::unique_ptr<LooseNode> node_;
    Bytes siblingBefore_;
    Bytes nodeBefore_;
};

// Sums worked out by hand for nodes of 512 bytes. A node of k records of 50 bytes uses 16 + 52k.
class SmallBalance : public ::testing::Test {
protected:
    BalanceBench bench_{Geometry{512, 512}};
};

TEST_F(SmallBalance, ATieStopsTheLeftMove) {
    bench_.Load({}, Even(9, 50), kLeft);  // 16 against 484 + 52; five entries make it 276 to 276
    const Outcome out = bench_.Left(9, Sized(99, 50));
    EXPECT_EQ(out.status, kOk);
    EXPECT_TRUE(out.rotated);
    EXPECT_EQ(out.moved, 5u);
    EXPECT_EQ(out.index, 4);
    EXPECT_EQ(out.nodeNum, kNode);
    EXPECT_EQ(bench_.Sibling(), Even(5, 50));
}

TEST_F(SmallBalance, ATieStopsTheRightMove) {
    bench_.Load({}, Even(9, 50), kRight);
    const Outcome out = bench_.Right(9, Sized(99, 50));
    EXPECT_EQ(out.status, kOk);
    EXPECT_EQ(out.moved, 5u);
    EXPECT_EQ(out.index, 4);  // behind the four records moved after it
    EXPECT_EQ(out.nodeNum, kRight);
    EXPECT_EQ(bench_.Full(), Even(5, 50));
}

TEST_F(SmallBalance, NewRecordAmongThoseThatGoLeft) {
    bench_.Load(Even(1, 50), Even(9, 50, 1), kLeft);  // 68 against 536
    const Outcome out = bench_.Left(1, Sized(3, 50));
    EXPECT_TRUE(out.rotated);
    EXPECT_EQ(out.moved, 5u);  // 328 against 276
    EXPECT_EQ(out.index, 2);
    EXPECT_EQ(out.nodeNum, kLeft);
    EXPECT_EQ(bench_.Sibling(), (std::vector<Bytes>{Sized(0, 50), Sized(2, 50), Sized(3, 50),
                                                    Sized(4, 50), Sized(6, 50), Sized(8, 50)}));
}

TEST_F(SmallBalance, FullLeftSiblingTakesNothing) {
    bench_.Load(Even(9, 50), Even(9, 50, 20), kLeft);  // 484 + 52 would be 536
    const Outcome out = bench_.Left(3, Sized(47, 50));
    EXPECT_EQ(out.status, kOk);
    EXPECT_FALSE(out.rotated);
    EXPECT_EQ(out.index, 0);
    EXPECT_EQ(out.nodeNum, 0u);
    EXPECT_EQ(out.moved, 0u);
    EXPECT_TRUE(bench_.IsUnchanged());
    EXPECT_TRUE(bench_.capture.All().empty());
}

TEST_F(SmallBalance, FullerLeftSiblingReceivesNothing) {
    bench_.Load(Even(6, 50), Even(3, 50, 20), kLeft);  // 328 against 224
    const Outcome out = bench_.Left(1, Sized(41, 50));
    EXPECT_EQ(out.status, kOk);
    EXPECT_EQ(out.moved, 0u);
    EXPECT_EQ(bench_.Sibling(), Even(6, 50));
    EXPECT_EQ(out.nodeNum, kNode);
    EXPECT_EQ(out.index, 1);
}

TEST_F(SmallBalance, FullerRightSiblingReceivesNothing) {
    bench_.Load(Even(6, 50, 20), Even(3, 50), kRight);  // 328 against 224
    const Outcome out = bench_.Right(3, Sized(5, 50));
    EXPECT_EQ(out.status, kOk);
    EXPECT_EQ(out.moved, 0u);
    EXPECT_EQ(bench_.Sibling(), Even(6, 50, 20));
    EXPECT_EQ(out.nodeNum, kNode);
    EXPECT_EQ(out.index, 3);
}

TEST_F(SmallBalance, LastEntryIsGivenBackWhenItDoesNotFitTheSibling) {
    // 304 against 484 + 52; 52 makes it 356 to 484, 252 more would be 608.
    bench_.Load({Sized(0, 286)},
                {Sized(2, 50), Sized(4, 250), Sized(6, 50), Sized(8, 50), Sized(10, 58)}, kLeft);
    const Outcome out = bench_.Left(5, Sized(11, 50));
    EXPECT_TRUE(out.rotated);
    EXPECT_EQ(out.moved, 1u);
    EXPECT_EQ(out.nodeNum, kNode);
    EXPECT_EQ(out.index, 4);
    EXPECT_EQ(bench_.Sibling(), (std::vector<Bytes>{Sized(0, 286), Sized(2, 50)}));
}

TEST_F(SmallBalance, LeftMoveThatCannotBalanceIsNoError) {
    // 16 against 420 + 402: 202 and 402 would be 620.
    bench_.Load({}, {Sized(0, 200), Sized(2, 200)}, kLeft);
    const Outcome out = bench_.Left(1, Sized(1, 400));
    EXPECT_EQ(out.status, kOk);
    EXPECT_FALSE(out.rotated);
    EXPECT_TRUE(bench_.IsUnchanged());
    EXPECT_TRUE(bench_.capture.All().empty());
}

TEST_F(SmallBalance, RightMoveThatCannotBalanceIsAnError) {
    bench_.Load({}, {Sized(0, 200), Sized(2, 200)}, kRight);
    EXPECT_EQ(bench_.Right(1, Sized(1, 400)).status, kErrInvalid);
    EXPECT_EQ(bench_.capture.All(), Events{Reported(kReasonInvalid, 2086)});
    EXPECT_TRUE(bench_.IsUnchanged());
}

TEST_F(SmallBalance, RightGivesTheLastEntryBack) {
    bench_.Load({Sized(90, 300)}, {Sized(0, 50), Sized(2, 50), Sized(4, 250), Sized(6, 50)},
                kRight);
    // 318 against 424 + 102 = 526: 52 makes it 370 to 474, 252 more would be 622.
    const Outcome out = bench_.Right(0, Sized(1, 100));
    EXPECT_EQ(out.status, kOk);
    EXPECT_EQ(out.moved, 1u);
    EXPECT_EQ(out.nodeNum, kNode);
    EXPECT_EQ(out.index, 0);
}

TEST_F(SmallBalance, RightWithRecordsTakesInFrontOfThem) {
    bench_.Load(Even(1, 50, 20), Even(9, 50), kRight);
    const Outcome out = bench_.Right(8, Sized(15, 50));
    EXPECT_EQ(out.nodeNum, kRight);
    EXPECT_EQ(out.index, 3);
    EXPECT_EQ(bench_.Sibling(), (std::vector<Bytes>{Sized(10, 50), Sized(12, 50), Sized(14, 50),
                                                    Sized(15, 50), Sized(16, 50), Sized(40, 50)}));
}

TEST_F(SmallBalance, MissingBigKeysAreAsserted) {
    bench_.tree.header.attributes = kBTVariableIndexKeysMask;
    bench_.Load({}, Even(9, 50), kLeft);
    EXPECT_EQ(bench_.Left(9, Sized(99, 50)).status, kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(1925)});
    bench_.Load({}, Even(9, 50), kRight);
    EXPECT_EQ(bench_.Right(9, Sized(99, 50)).status, kOk);
    EXPECT_EQ(bench_.capture.Take(), Events{Asserted(2043)});
}

// Index keys of fixed size are measured and recorded by the header's length, whatever their own.
TEST_F(SmallBalance, FixedIndexKeysTakeTheHeadersLength) {
    bench_.tree.header.attributes = kBTBigKeysMask;
    bench_.tree.header.maxKeyLength = 10;
    NodeImage index;
    index.kind = kBTIndexNode;
    index.height = 2;
    const Bytes empty = index.Build(512);
    for (u32 n = 0; n < 40; ++n) {
        index.records.push_back(Sized(2 * n, 10));
    }
    bench_.LoadRaw(empty, index.Build(512), kLeft);  // 16 against 16 + 40 x 12 + 18
    const Outcome out = bench_.Left(0, Sized(1, 10));
    EXPECT_EQ(out.status, kOk);
    EXPECT_EQ(out.moved, 21u);  // 18 + 20 x 12 make 274 against 256
    EXPECT_EQ(Get16(bench_.SiblingBytes(), 14), 10u);
}

// The checks of the offset table, each with the lines of both rotations.
class BrokenBalance : public SmallBalance {
protected:
    static u32 SlotAt(u32 index) { return 512 - 2 * (index + 1); }
    void Expect(const Bytes& sibling, const Bytes& full, const Events& left, const Events& right) {
        bench_.LoadRaw(sibling, full, kLeft);
        EXPECT_EQ(bench_.Left(9, Sized(99, 50)).status, kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), left);
        EXPECT_TRUE(bench_.IsUnchanged());
        bench_.LoadRaw(sibling, full, kRight);
        EXPECT_EQ(bench_.Right(9, Sized(99, 50)).status, kErrCorrupt);
        EXPECT_EQ(bench_.capture.Take(), right);
        EXPECT_TRUE(bench_.IsUnchanged());
    }
    Bytes Full() const { return LeafOf(512, Even(9, 50)); }
    Bytes Empty() const { return LeafOf(512, {}); }
};

TEST_F(BrokenBalance, TooManyRecordsForTheirSlots) {
    Bytes bad = Full();
    Put16(&bad, 10, 256);
    Expect(Empty(), bad, {Reported(kReasonNode, 1781), Reported(kErrCorrupt, 1932)},
           {Reported(kReasonNode, 1781), Reported(kErrCorrupt, 2049)});
    Expect(bad, Full(), {Reported(kReasonNode, 1781), Reported(kErrCorrupt, 1935)},
           {Reported(kReasonNode, 1781), Reported(kErrCorrupt, 2052)});
}

TEST_F(BrokenBalance, FreeSpaceBehindItsSlot) {
    Bytes bad = Full();
    Put16(&bad, SlotAt(9), SlotAt(9) + 2);
    Expect(Empty(), bad, {Reported(kReasonNode, 1789), Reported(kErrCorrupt, 1932)},
           {Reported(kReasonNode, 1789), Reported(kErrCorrupt, 2049)});
    Expect(bad, Full(), {Reported(kReasonNode, 1789), Reported(kErrCorrupt, 1935)},
           {Reported(kReasonNode, 1789), Reported(kErrCorrupt, 2052)});
}

TEST_F(BrokenBalance, RecordThatDoesNotEndBehindItsStart) {
    Bytes bad = Full();
    Put16(&bad, SlotAt(0), 64);   // record 0 ends at 64
    Put16(&bad, SlotAt(8), 464);  // record 8 too
    Expect(Empty(), bad, {Reported(kReasonNode, 1856), Reported(kErrCorrupt, 1944)},
           {Reported(kReasonNode, 1856), Reported(kErrCorrupt, 2062)});
}

TEST_F(BrokenBalance, RecordsThatEndBeforeTheBalance) {
    Bytes bad = LeafOf(512, Even(1, 50));
    Put16(&bad, SlotAt(0), 480);  // one record of 20 bytes behind a gap
    Put16(&bad, SlotAt(1), 500);
    bench_.LoadRaw(Empty(), bad, kLeft);
    EXPECT_EQ(bench_.Left(1, Sized(99, 50)).status, kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonNode, 1856), Reported(kErrCorrupt, 1951)}));
    bench_.LoadRaw(Empty(), bad, kRight);
    EXPECT_EQ(bench_.Right(1, Sized(99, 50)).status, kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(),
              (Events{Reported(kReasonNode, 1856), Reported(kErrCorrupt, 2069)}));
    EXPECT_TRUE(bench_.IsUnchanged());
}

// The offset table of this many records reaches into the descriptor, whose links are small numbers.
TEST_F(BrokenBalance, OffsetTableInTheDescriptor) {
    Bytes bad = Full();
    Put16(&bad, 10, 254);
    Expect(Empty(), bad, {Reported(kReasonNode, 9220)},
           {Reported(kReasonNode, 1856), Reported(kErrCorrupt, 2062)});
}

TEST_F(BrokenBalance, FreeSpaceAtAnOddOffset) {
    Bytes bad = Full();
    Put16(&bad, SlotAt(9), 465);
    Expect(Empty(), bad, {Reported(kReasonNode, 9220)}, {Reported(kReasonNode, 9221)});
}

// The free space claims the whole node, so a record takes more than is in use.
TEST_F(BrokenBalance, RecordsLargerThanWhatIsInUse) {
    Bytes bad = LeafOf(512, Even(2, 200));
    Put16(&bad, SlotAt(2), 20);
    bench_.LoadRaw(Empty(), bad, kLeft);
    EXPECT_EQ(bench_.Left(2, Sized(99, 50)).status, kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 9220)});
    EXPECT_TRUE(bench_.IsUnchanged());
}

TEST_F(BrokenBalance, ANodeThatIsItsOwnSibling) {
    NodeBench bench{Geometry{512, 512}};
    const auto node = bench.Node(LeafOf(512, Even(4, 50)));
    const Bytes before = node->Content();
    const Bytes record = Sized(3, 50);
    const BTreeKey* key = reinterpret_cast<const BTreeKey*>(record.data());
    Outcome out;
    EXPECT_EQ(bench.tree._RotateLeft(node->Get(), node->Get(), 2, key, record.data() + 6, 44,
                                     &out.index, &out.nodeNum, &out.rotated, &out.moved, nullptr),
              kErrCorrupt);
    EXPECT_EQ(bench.capture.Take(), Events{Reported(kReasonNode, 9220)});
    EXPECT_EQ(node->Content(), before);
}

TEST_F(BrokenBalance, DamageBeyondTheMovedRecordsIsRefusedToo) {
    Bytes bad = Full();
    Put16(&bad, SlotAt(7), 365);  // odd; a left move does not reach it
    bench_.LoadRaw(Empty(), bad, kLeft);
    EXPECT_EQ(bench_.Left(9, Sized(99, 50)).status, kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 9220)});
    EXPECT_TRUE(bench_.IsUnchanged());
    bad = Full();
    Put16(&bad, SlotAt(1), 65);
    bench_.LoadRaw(Empty(), bad, kRight);
    EXPECT_EQ(bench_.Right(9, Sized(99, 50)).status, kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take(), Events{Reported(kReasonNode, 9221)});
    EXPECT_TRUE(bench_.IsUnchanged());
}

TEST_F(BrokenBalance, IndexBehindTheRecordsIsRefused) {
    bench_.Load({}, Even(9, 50), kLeft);
    EXPECT_EQ(bench_.Left(10, Sized(99, 50)).status, kErrCorrupt);
    bench_.Load({}, Even(9, 50), kRight);
    EXPECT_EQ(bench_.Right(-1, Sized(99, 50)).status, kErrCorrupt);
    EXPECT_TRUE(bench_.IsUnchanged());
}

// Failures of the steps, by the line of each.
class FailingBalance : public ::testing::Test {
protected:
    // A hook without functions copies, but makes the conversion ask for the scratch buffer, which
    // is what fails. Its key length is read in host order.
    static Bytes HostOrder(Bytes record) {
        std::swap(record[0], record[1]);
        return record;
    }
    void ExpectNoMemory(const Outcome& out, int site) {
        EXPECT_EQ(out.status, kErrNoMemory);
        EXPECT_EQ(bench_.capture.Take(),
                  (Events{Reported(kErrNoMemory, 9204), Reported(kErrNoMemory, site)}));
    }

    BalanceBench bench_{Geometry{1024, 512}};
    HfsConvert hook_{};
};

TEST_F(FailingBalance, NewRecordIntoTheLeftSibling) {
    bench_.Load({}, Even(19, 50), kLeft);
    bench_.heap.FailNth(1);
    ExpectNoMemory(bench_.Left(2, HostOrder(Sized(3, 50)), &hook_), 1989);
}

TEST_F(FailingBalance, NewRecordIntoTheFullNodeAfterALeftMove) {
    bench_.Load({}, Even(19, 50), kLeft);
    bench_.heap.FailNth(1);
    ExpectNoMemory(bench_.Left(19, HostOrder(Sized(99, 50)), &hook_), 2007);
}

TEST_F(FailingBalance, NewLastRecordIntoTheRightSibling) {
    bench_.Load({}, Even(19, 50), kRight);
    bench_.heap.FailNth(1);
    ExpectNoMemory(bench_.Right(19, HostOrder(Sized(99, 50)), &hook_), 2100);
}

TEST_F(FailingBalance, NewInnerRecordIntoTheRightSibling) {
    bench_.Load({}, Even(19, 50), kRight);
    bench_.heap.FailNth(1);
    ExpectNoMemory(bench_.Right(17, HostOrder(Sized(33, 50)), &hook_), 2113);
}

TEST_F(FailingBalance, NewRecordIntoTheFullNodeAfterARightMove) {
    bench_.Load({}, Even(19, 50), kRight);
    bench_.heap.FailNth(1);
    ExpectNoMemory(bench_.Right(1, HostOrder(Sized(1, 50)), &hook_), 2135);
}

// The record that is to follow the new one claims a key longer than itself.
TEST_F(FailingBalance, MovesBehindTheNewRecord) {
    Bytes bad = LeafOf(1024, Even(19, 50));
    Put16(&bad, 14 + 50, 60);  // of record 1
    bench_.LoadRaw(LeafOf(1024, {}), bad, kLeft);
    EXPECT_EQ(bench_.Left(1, Sized(1, 50)).status, kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take().back(), Reported(kErrCorrupt, 1996));
    bad = LeafOf(1024, Even(19, 50));
    Put16(&bad, 14 + 50 * 17, 60);  // of the last but one
    bench_.LoadRaw(LeafOf(1024, {}), bad, kRight);
    EXPECT_EQ(bench_.Right(18, Sized(35, 50)).status, kErrCorrupt);
    EXPECT_EQ(bench_.capture.Take().back(), Reported(kErrCorrupt, 2122));
}

TEST_F(FailingBalance, MovesOfSingleRecords) {
    bench_.Load({}, Even(19, 50), kLeft);
    bench_.RefuseAccess(1);
    EXPECT_EQ(bench_.Left(19, Sized(99, 50)).status, kRefused);
    EXPECT_EQ(bench_.capture.Take().back(), Reported(kRefused, 1996));
    bench_.Load({}, Even(19, 50), kRight);
    bench_.RefuseAccess(1);
    EXPECT_EQ(bench_.Right(0, Sized(1, 50)).status, kRefused);
    EXPECT_EQ(bench_.capture.Take().back(), Reported(kRefused, 2122));
}

// Every insertion index in every geometry against the rule, worked out on plain sizes.
class Balance : public GeometryTest {
protected:
    // Records whose sizes differ, as many as fit.
    std::vector<Bytes> Mixed(u32 from) const {
        std::vector<Bytes> records;
        for (u32 n = from;; ++n) {
            records.push_back(Sized(2 * n, 30 + n * 14 % 60));
            if (UsedBytes(records) + 14 > NodeSize()) {
                records.pop_back();
                return records;
            }
        }
    }
    static u32 Used(const std::vector<Bytes>& records) { return 14 + UsedBytes(records); }
};

TEST_P(Balance, RightMoveAtEveryIndex) {
    const std::vector<Bytes> full = Mixed(0);
    for (u32 index = 0; index <= full.size(); ++index) {
        BalanceBench bench(GetParam());
        bench.Load({}, full, kRight);
        const Bytes fresh = Sized(2 * index + 1, 90);
        const Outcome out = bench.Right(static_cast<int>(index), fresh);
        ASSERT_EQ(out.status, kOk);
        std::vector<Bytes> left = full;
        left.insert(left.begin() + index, fresh);
        std::vector<Bytes> right;
        while (Used(right) < Used(left)) {
            right.insert(right.begin(), left.back());
            left.pop_back();
        }
        ASSERT_EQ(bench.Full(), left) << index;
        ASSERT_EQ(bench.Sibling(), right) << index;
        ASSERT_EQ(out.moved, right.size());
        const bool wentRight = index >= left.size();
        ASSERT_EQ(out.nodeNum, wentRight ? kRight : kNode);
        ASSERT_EQ(out.index, static_cast<int>(wentRight ? index - left.size() : index));
    }
}

TEST_P(Balance, LeftMoveAtEveryIndex) {
    const std::vector<Bytes> full = Mixed(50);
    const std::vector<Bytes> before = Even(2, 40);
    for (u32 index = 0; index <= full.size(); ++index) {
        BalanceBench bench(GetParam());
        bench.Load(before, full, kLeft);
        const Bytes fresh = Sized(101 + 2 * index, 90);
        const Outcome out = bench.Left(static_cast<int>(index), fresh);
        ASSERT_EQ(out.status, kOk);
        ASSERT_TRUE(out.rotated);
        std::vector<Bytes> left = before;
        std::vector<Bytes> right = full;
        right.insert(right.begin() + index, fresh);
        while (Used(left) < Used(right)) {
            left.push_back(right.front());
            right.erase(right.begin());
        }
        const u32 moved = static_cast<u32>(left.size() - before.size());
        ASSERT_EQ(bench.Sibling(), left) << index;
        ASSERT_EQ(bench.Full(), right) << index;
        ASSERT_EQ(out.moved, moved);
        ASSERT_EQ(out.nodeNum, index < moved ? kLeft : kNode);
        ASSERT_EQ(out.index, static_cast<int>(index < moved ? index + 2 : index - moved));
    }
}

INSTANTIATE_GEOMETRIES(Balance, ChangeGeometries);

}  // namespace
}  // namespace VELK::test
