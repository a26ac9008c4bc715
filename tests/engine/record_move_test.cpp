// Moves of several records at once: every byte of both nodes, free space included, and every mark
// is what moves one by one leave.
#include "hfs/treehfs/record_move.h"

#include <algorithm>

#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/hints.h"
#include "node_bench.h"

namespace VELK::test {
namespace {

// A leaf of `count` records of different sizes whose free space holds what was there before.
Bytes UsedLeaf(u32 nodeSize, u32 count, u32 seed) {
    std::vector<Bytes> records;
    u32 used = 14;
    for (u32 n = 0; n < count; ++n) {
        records.push_back(NthRecord(n, 2 + (n * 7 + seed) % 5 * 12));
        used += static_cast<u32>(records.back().size());
    }
    Bytes leaf = LeafOf(nodeSize, records);
    const Bytes rest = Pattern(nodeSize - used - 2 * (count + 1), seed);
    std::copy(rest.begin(), rest.end(), leaf.begin() + used);
    return leaf;
}

struct Pair {
    Pair(const Geometry& geometry, u32 giverCount, u32 receiverCount)
        : bench(geometry),
          giver(bench.Node(UsedLeaf(geometry.nodeSize, giverCount, 3), 12)),
          receiver(bench.Node(UsedLeaf(geometry.nodeSize, receiverCount, 5), 11)) {}

    void ExpectEqual(const Pair& other) const {
        EXPECT_EQ(giver->Content(), other.giver->Content());
        EXPECT_EQ(receiver->Content(), other.receiver->Content());
        EXPECT_EQ(DirtyBlocks(*giver), DirtyBlocks(*other.giver));
        EXPECT_EQ(DirtyBlocks(*receiver), DirtyBlocks(*other.receiver));
    }

    NodeBench bench;
    std::unique_ptr<LooseNode> giver;
    std::unique_ptr<LooseNode> receiver;
};

class MoveRecords : public GeometryTest {
protected:
    static constexpr u32 kGiven = 7;  // records of the giver; fit the smallest node

    // Moves `count` records both ways of moving them, to either side.
    static void Compare(u32 count, u32 receiverCount, bool toTheLeft) {
        Pair atOnce(GetParam(), kGiven, receiverCount);
        Pair oneByOne(GetParam(), kGiven, receiverCount);
        EXPECT_EQ(toTheLeft ? MoveRecordsLeft(&atOnce.bench.tree, atOnce.receiver->Get(),
                                              atOnce.giver->Get(), count)
                            : MoveRecordsRight(&atOnce.bench.tree, atOnce.receiver->Get(),
                                               atOnce.giver->Get(), count),
                  kOk);
        for (u32 i = 0; i < count; ++i) {
            CBTreeHfs& tree = oneByOne.bench.tree;
            EXPECT_EQ(
                toTheLeft
                    ? tree._RotateRecordLeft(oneByOne.receiver->Get(), oneByOne.giver->Get())
                    : tree._RotateRecordRight(oneByOne.receiver->Get(), oneByOne.giver->Get()),
                kOk);
        }
        atOnce.ExpectEqual(oneByOne);
    }
};

TEST_P(MoveRecords, LeaveTheBytesThatMovesOneByOneLeave) {
    for (u32 count = 0; count <= kGiven; ++count) {
        for (const u32 receiverCount : {0u, 1u, 3u}) {
            Compare(count, receiverCount, true);
            Compare(count, receiverCount, false);
        }
    }
}

// A key claims to be longer than its record: the moves before it are done.
TEST_P(MoveRecords, StopAtTheRecordThatCannotBeRead) {
    for (const u32 round : {0u, 1u, 2u, 3u}) {
        const u32 moved = 1 + round / 2;
        const u32 count = moved == 1 ? 2 : 5;  // with it as the last one, and with others behind
        const bool toTheLeft = round % 2 == 0;
        Pair pair(GetParam(), kGiven, 1);
        const u32 bad = toTheLeft ? moved : kGiven - 1 - moved;
        NodeKey record;
        ASSERT_EQ((*pair.giver)->GetKey(&pair.bench.tree.header, static_cast<int>(bad), &record),
                  kOk);
        record.ptr[1] = 250;
        const int status = toTheLeft ? MoveRecordsLeft(&pair.bench.tree, pair.receiver->Get(),
                                                       pair.giver->Get(), count)
                                     : MoveRecordsRight(&pair.bench.tree, pair.receiver->Get(),
                                                        pair.giver->Get(), count);
        EXPECT_EQ(status, kErrCorrupt);
        EXPECT_EQ(GetBe16(pair.receiver->Content().data() + kDescNumRecords), 1 + moved);
        EXPECT_EQ(GetBe16(pair.giver->Content().data() + kDescNumRecords), kGiven - moved);
        pair.bench.capture.Take();
    }
}

TEST_P(MoveRecords, StopWhereTheReceiverIsFull) {
    Pair pair(GetParam(), kGiven, 0);
    const u32 room = GetParam().nodeSize - 14 - 2;
    Bytes full = LeafOf(GetParam().nodeSize, {NthRecord(40, room - 2 - 100)});
    pair.receiver = pair.bench.Node(full, 11);
    EXPECT_EQ(MoveRecordsLeft(&pair.bench.tree, pair.receiver->Get(), pair.giver->Get(), kGiven),
              kErrInvalid);
    EXPECT_EQ(pair.bench.capture.Take().back(), Reported(kErrInvalid, 1623));
}

// A record in front of others asks where the first of these lies: its key is read, also when all
// that could be refused otherwise has been granted.
TEST_P(MoveRecords, AreRefusedInFrontOfAKeyThatCannotBeRead) {
    Pair pair(GetParam(), kGiven, 2);
    CBTreeHfs& tree = pair.bench.tree;
    NodeKey first;
    ASSERT_EQ((*pair.receiver)->GetKey(&tree.header, 0, &first), kOk);
    first.ptr[1] = 250;
    ASSERT_EQ(tree.SetDirty(pair.giver->Get(), 0, GetParam().nodeSize), kOk);
    ASSERT_EQ(tree.SetDirty(pair.receiver->Get(), 0, GetParam().nodeSize), kOk);
    const Bytes given = pair.giver->Content();
    const Bytes received = pair.receiver->Content();
    EXPECT_EQ(MoveRecordsRight(&tree, pair.receiver->Get(), pair.giver->Get(), 3), kErrCorrupt);
    EXPECT_EQ(pair.bench.capture.Take(),
              (Events{Reported(kReasonNode, 9006), Reported(kErrCorrupt, 1203),
                      Reported(kErrCorrupt, 1705)}));
    EXPECT_EQ(pair.giver->Content(), given);
    EXPECT_EQ(pair.receiver->Content(), received);
}

INSTANTIATE_GEOMETRIES(MoveRecords, ChangeGeometries);

// ---- what is remembered of records

// A node of seven records, with the orders from `first` on.
struct Remembering {
    Remembering(const NodeBench& bench, u32 number, u64 first)
        : node(bench.Node(LeafOf(512, SomeRecords(7, 8, number)), number)) {
        node->Get()->hints = reinterpret_cast<HfsHintTable*>(memory);
        node->Get()->bufs[0].dirty = true;
        for (u32 n = 0; n < 7; ++n) {
            Hints(&bench.tree, node->Get()).LearnOrder(n, first + n);
        }
    }
    ~Remembering() { node->Get()->hints = nullptr; }
    std::vector<u64> Orders(const NodeBench& bench) const {
        std::vector<u64> orders;
        for (u32 n = 0; n < 12; ++n) {
            orders.push_back(Hints(&bench.tree, node->Get()).Order(n));
        }
        return orders;
    }

    std::unique_ptr<LooseNode> node;
    alignas(HfsHintTable) u8 memory[offsetof(HfsHintTable, hints) + 16 * sizeof(HfsHint)]{};
};

class MoveRemembered : public ::testing::Test {
protected:
    MoveRemembered() { bench_.tree.nodeShift = 9; }

    NodeBench bench_{Geometry{512, 512}};
};

TEST_F(MoveRemembered, GoesLeftWithTheRecords) {
    Remembering left(bench_, 1, 100);
    Remembering right(bench_, 20, 200);
    ASSERT_EQ(MoveRecordsLeft(&bench_.tree, left.node->Get(), right.node->Get(), 3), kOk);
    EXPECT_EQ(left.Orders(bench_),
              (std::vector<u64>{100, 101, 102, 103, 104, 105, 106, 200, 201, 202, 0, 0}));
    EXPECT_EQ(right.Orders(bench_), (std::vector<u64>{203, 204, 205, 206, 0, 0, 0, 0, 0, 0, 0, 0}));
}

TEST_F(MoveRemembered, GoesRightWithTheRecords) {
    Remembering left(bench_, 1, 100);
    Remembering right(bench_, 20, 200);
    ASSERT_EQ(MoveRecordsRight(&bench_.tree, right.node->Get(), left.node->Get(), 3), kOk);
    EXPECT_EQ(left.Orders(bench_), (std::vector<u64>{100, 101, 102, 103, 0, 0, 0, 0, 0, 0, 0, 0}));
    EXPECT_EQ(right.Orders(bench_),
              (std::vector<u64>{104, 105, 106, 200, 201, 202, 203, 204, 205, 206, 0, 0}));
}

// Two nodes that a damaged volume gives the same bytes: what one gains the other does, too.
TEST(MoveRecordsOfOneMemory, GoOneByOneInOneBlockAndInMany) {
    struct Outcome {
        int status;
        Events events;
        Bytes bytes;
        bool operator==(const Outcome&) const = default;
    };
    const auto play = [](const Geometry& geometry, bool toTheLeft) {
        Pair pair(geometry, 7, 3);
        CBTreeHfs& tree = pair.bench.tree;
        HfsNode* giver = pair.giver->Get();
        HfsNode* receiver = pair.receiver->Get();
        HfsBcbBuf own[8];
        for (u32 i = 0; i < geometry.Blocks(); ++i) {
            own[i] = receiver->bufs[i];
            receiver->bufs[i].data = giver->bufs[i].data;
        }
        EXPECT_EQ(tree.SetDirty(giver, 0, geometry.nodeSize), kOk);
        EXPECT_EQ(tree.SetDirty(receiver, 0, geometry.nodeSize), kOk);
        const int status = toTheLeft ? MoveRecordsLeft(&tree, receiver, giver, 2)
                                     : MoveRecordsRight(&tree, receiver, giver, 2);
        for (u32 i = 0; i < geometry.Blocks(); ++i) {
            receiver->bufs[i].data = own[i].data;
        }
        return Outcome{status, pair.bench.capture.Take(), pair.giver->Content()};
    };
    for (const bool toTheLeft : {true, false}) {
        const Outcome oneBlock = play({1024, 1024}, toTheLeft);
        EXPECT_EQ(oneBlock, play({1024, 512}, toTheLeft)) << toTheLeft;
        EXPECT_EQ(oneBlock, play({1024, 512, true}, toTheLeft)) << toTheLeft;
        EXPECT_NE(oneBlock.bytes, UsedLeaf(1024, 7, 3));
    }
}

// Nodes of two blocks in one piece, the second block of the giver being the first of the receiver:
// the first record that comes lands on the giver's table. So it does where blocks lie anywhere.
TEST(MoveRecordsOfOneMemory, GoOneByOneWhereOneBlockIsShared) {
    constexpr u32 kTable = 16;  // of the giver
    struct Outcome {
        int status;
        Events events;
        Bytes bytes;
        bool operator==(const Outcome&) const = default;
    };
    const auto play = [](bool inOnePiece) {
        NodeBench bench(Geometry{1024, 512});
        const u32 room = 512 - kTable - 14 - static_cast<u32>(NthRecord(40, 0).size());
        const Bytes given = UsedLeaf(1024, kTable / 2 - 1, 3);
        const Bytes received = LeafOf(1024, {NthRecord(40, room - 20)});
        Bytes memory(3 * 512);
        std::copy(given.begin(), given.end(), memory.begin());
        std::copy(received.begin(), received.end(), memory.begin() + 512);
        std::copy(given.end() - kTable, given.end(), memory.begin() + 1024 - kTable);
        const auto giver = bench.Node(given, 11);
        const auto receiver = bench.Node(received, 12);
        u32 block = 0;
        for (HfsNode* node : {giver->Get(), receiver->Get()}) {
            node->isOnePiece = inOnePiece;
            node->bufs[0].data = memory.data() + block * 512;
            node->bufs[1].data = memory.data() + (block + 1) * 512;
            EXPECT_EQ(bench.tree.SetDirty(node, 0, 1024), kOk);
            block += 1;
        }
        const int status = MoveRecordsLeft(&bench.tree, receiver->Get(), giver->Get(), 3);
        return Outcome{status, bench.capture.Take(), memory};
    };
    EXPECT_EQ(play(true), play(false));
}

}  // namespace
}  // namespace VELK::test
