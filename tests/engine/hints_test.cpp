// What an index node remembers of its records: exactly this, and no longer than it holds.
#include "hfs/treehfs/hints.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <utility>

#include "bench.h"
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/node_desc.h"

namespace VELK::test {
namespace {

// ---- the table by itself

// A node with room for 16 records, and children to hint at; a model of both beside it.
class HintTable : public ::testing::Test {
protected:
    static constexpr u32 kRoom = 16;  // of a node of 512 bytes

    struct Known {
        u64 order = 0;
        HfsNode* child = nullptr;
        bool operator==(const Known&) const = default;
    };
    struct Parent {
        explicit Parent(u32 number) : node(NodeImage{}.Build(512), 512, number) {
            node->hints = reinterpret_cast<HfsHintTable*>(memory);
        }
        ~Parent() { node->hints = nullptr; }
        LooseNode node;
        alignas(HfsHintTable) u8 memory[offsetof(HfsHintTable, hints) + kRoom * sizeof(HfsHint)]{};
        std::vector<Known> model = std::vector<Known>(kRoom);
    };

    HintTable() : bench_(Blocks(512)) {
        bench_->nodeShift = 9;
        EXPECT_EQ(HintRoom(&bench_.tree.tree), kRoom);
        EXPECT_EQ(HintBytes(&bench_.tree.tree), sizeof parent_.memory);
        for (u32 n = 0; n < kChildren; ++n) {
            children_.push_back(std::make_unique<LooseNode>(NodeImage{}.Build(512), 512, 300 + n));
        }
    }
    ~HintTable() override {
        Table(parent_).Forget();
        Table(other_).Forget();
    }

    Hints Table(const Parent& parent) { return {&bench_.tree.tree, parent.node.Get()}; }
    HfsNode* Child(u32 n) { return children_[n]->Get(); }
    // Record n has order 1000 + n and leads to child `from` + n; every third is not cached.
    void Fill(Parent* parent, u32 count, u32 from = 0) {
        Table(*parent).Forget();
        parent->model.assign(kRoom, {});
        for (u32 n = 0; n < std::min(count, kRoom); ++n) {
            Table(*parent).LearnOrder(n, 1000 + n);
            parent->model[n].order = 1000 + n;
            if (n % 3 != 2) {
                Table(*parent).SetChild(n, Child(from + n));
                parent->model[n].child = Child(from + n);
            }
        }
    }
    void Expect(const Parent& parent) {
        for (u32 n = 0; n < kRoom; ++n) {
            const Known& known = parent.model[n];
            ASSERT_EQ(Table(parent).Order(n), known.order) << n;
            ASSERT_EQ(Table(parent).Child(n), known.child) << n;
            if (known.child != nullptr) {
                ASSERT_EQ(known.child->hintedBy, parent.node.Get()) << n;
                ASSERT_EQ(Table(parent).IndexOf(known.child), n);
                ASSERT_EQ(Table(parent).Data(n), known.child->bufs[0].data) << n;
            }
        }
        ASSERT_EQ(Table(parent).Order(kRoom), 0u);
        ASSERT_EQ(Table(parent).Child(kRoom + 5), nullptr);
        for (const auto& child : children_) {
            HfsNode* node = child->Get();
            const bool isHinted = node->hintedBy == parent.node.Get();
            ASSERT_EQ(Table(parent).IndexOf(node) < kRoom, isHinted);
            ASSERT_EQ(std::any_of(parent.model.begin(), parent.model.end(),
                                  [node](const Known& known) { return known.child == node; }),
                      isHinted);
        }
    }
    // `change` changes table and model alike, in tables filled to every degree, at each index and
    // behind them all.
    template <typename Change>
    void ExpectAtAnyPlace(const Change& change) {
        for (const u32 count : {1u, 3u, kRoom + 4}) {
            for (u32 filled = 0; filled <= kRoom; ++filled) {
                for (u32 index = 0; index <= kRoom + 1; ++index) {
                    Fill(&parent_, filled);
                    change(index, count);
                    parent_.model.resize(kRoom);
                    Expect(parent_);
                }
            }
        }
    }

    static constexpr u32 kChildren = 40;
    Bench bench_;
    std::vector<std::unique_ptr<LooseNode>> children_;
    Parent parent_{100};
    Parent other_{200};
};

TEST_F(HintTable, RecordsComeInAtAnyPlace) {
    ExpectAtAnyPlace([&](u32 index, u32 count) {
        Table(parent_).Insert(index, count);
        std::vector<Known>& model = parent_.model;
        if (index < kRoom) {
            model.insert(model.begin() + index, count, Known{});
        }
    });
}

TEST_F(HintTable, RecordsLeaveAnyPlace) {
    ExpectAtAnyPlace([&](u32 index, u32 count) {
        Table(parent_).Remove(index, count);
        std::vector<Known>& model = parent_.model;
        if (index < kRoom) {
            model.erase(model.begin() + index, model.begin() + std::min(index + count, kRoom));
        }
    });
}

TEST_F(HintTable, RecordsGoToAnotherNode) {
    Fill(&parent_, 8);
    Fill(&other_, 12, 20);
    Table(other_).Insert(2, 3);
    Table(other_).Take(2, Table(parent_), 4, 3);
    Table(parent_).Remove(4, 3);
    std::vector<Known>& from = parent_.model;
    std::vector<Known>& to = other_.model;
    to.insert(to.begin() + 2, from.begin() + 4, from.begin() + 7);
    to.resize(kRoom);
    from.erase(from.begin() + 4, from.begin() + 7);
    from.resize(kRoom);
    Expect(parent_);
    Expect(other_);
}

// What has no room any more is let go, and what nobody knew stays unknown.
TEST_F(HintTable, RecordsGoWhereThereIsNoRoom) {
    Fill(&parent_, 6);
    Fill(&other_, kRoom, 20);
    Table(other_).Take(kRoom, Table(parent_), 4, 4);
    parent_.model[4].child = nullptr;
    Expect(parent_);
    Expect(other_);
    EXPECT_EQ(Child(4)->hintedBy, nullptr);
}

TEST_F(HintTable, RecordsBeyondItsRoomAreNotLearnt) {
    Fill(&parent_, kRoom);
    Table(parent_).LearnOrder(kRoom, 5);
    Table(parent_).SetChild(kRoom, Child(30));
    Expect(parent_);
    EXPECT_EQ(Child(30)->hintedBy, nullptr);
}

TEST_F(HintTable, WhatIsForgottenIsUnknown) {
    Fill(&parent_, kRoom);
    Table(parent_).Forget();
    parent_.model.assign(kRoom, {});
    Expect(parent_);
}

TEST_F(HintTable, ANodeWithoutRoomHasNothingToForget) {
    Fill(&parent_, 3);
    HfsHintTable* table = parent_.node->hints;
    parent_.node->hints = nullptr;
    ForgetRecords(&bench_.tree.tree, parent_.node.Get());
    parent_.node->hints = table;
    Expect(parent_);
    ForgetRecords(&bench_.tree.tree, parent_.node.Get());
    parent_.model.assign(kRoom, {});
    Expect(parent_);
}

TEST_F(HintTable, AChildHasOneHintOnly) {
    Fill(&parent_, 6);
    Fill(&other_, 6, 20);
    Table(parent_).SetChild(5, Child(0));
    parent_.model[5].child = Child(0);
    parent_.model[0].child = nullptr;
    Expect(parent_);
    Table(other_).SetChild(1, Child(0));
    parent_.model[5].child = nullptr;
    other_.model[1].child = Child(0);
    Expect(parent_);
    Expect(other_);
    EXPECT_EQ(Child(21)->hintedBy, nullptr);
}

TEST_F(HintTable, ANodeIsNotItsOwnChild) {
    Table(parent_).SetChild(0, parent_.node.Get());
    EXPECT_EQ(parent_.node->hintedBy, nullptr);
    Expect(parent_);
}

// A child that says it is hinted at where it is not: what lies behind the table stays as it was.
TEST_F(HintTable, AChildThatIsNotThereIsNotLookedForBehindIt) {
    struct {
        alignas(HfsHintTable) u8 memory[sizeof parent_.memory]{};
        HfsHint behind{};
    } room;
    room.behind = {5, Child(3), Child(3)->bufs[0].data};
    LooseNode lonely(NodeImage{}.Build(512), 512, 101);
    lonely->hints = reinterpret_cast<HfsHintTable*>(room.memory);
    Child(3)->hintedBy = lonely.Get();
    Child(0)->hintedBy = lonely.Get();
    Hints(&bench_.tree.tree, lonely.Get()).Leave(Child(0));
    EXPECT_EQ(room.behind.child, Child(3));
    EXPECT_EQ(Child(3)->hintedBy, lonely.Get());
    Child(0)->hintedBy = Child(3)->hintedBy = nullptr;
    lonely->hints = nullptr;
}

TEST_F(HintTable, AChildThatLeavesTheCacheIsForgotten) {
    Fill(&parent_, 6);
    bench_->rootHint = Child(1);
    ForgetHints(&bench_.tree.tree, Child(1));
    EXPECT_EQ(bench_->rootHint, nullptr);
    parent_.model[1].child = nullptr;
    Expect(parent_);
    ForgetHints(&bench_.tree.tree, Child(1));
    Expect(parent_);
}

TEST_F(HintTable, AParentThatGoesLetsItsChildrenGo) {
    Fill(&parent_, 6);
    bench_->rootHint = Child(1);
    ForgetHints(&bench_.tree.tree, parent_.node.Get());
    EXPECT_EQ(bench_->rootHint, Child(1));
    bench_->rootHint = nullptr;
    parent_.model.assign(kRoom, {});
    Expect(parent_);
}

// ---- what lookups let the root remember

class RootRemembers : public ::testing::TestWithParam<u32> {
protected:
    RootRemembers() : bench_(Blocks(512)) {}
    ~RootRemembers() override { bench_->findData.ClearPath(); }

    void Open(const std::vector<std::u16string>& names, u32 recordsPerLeaf) {
        TreeShape shape;
        shape.nodeSize = GetParam();
        shape.recordsPerLeaf = recordsPerLeaf;
        std::vector<TreeRecord> records;
        for (const std::u16string& name : names) {
            records.push_back({DiskCatKey(7, name), Pattern(8, 1)});
        }
        bench_.Open(BuildTree(shape, records));
        ASSERT_EQ(bench_->header.treeDepth, 2);
    }
    // Four leaves of one record each.
    void OpenFour() { Open({u"B", u"C", u"D", u"E"}, 1); }
    void FindFour() {
        for (const char16_t* name : {u"B", u"C", u"D", u"E"}) {
            ASSERT_EQ(Find(name), kOk);
        }
    }
    int Find(const std::u16string& name) {
        return bench_->FindRecord(HostCatKey(7, name), 7, nullptr, 0, nullptr, nullptr);
    }
    HfsNode* Root() { return bench_->findData.path[2].node; }
    Hints Remembered() { return {&bench_.tree.tree, Root()}; }

    Bench bench_;
};

// Parent, first and second unit of the name, folded, as one number; a unit that is not there is 0.
// Nothing where folding ignores one of the two, as a later unit counts in its place.
TEST_P(RootRemembers, TheOrderOfEachKeyThatHasOne) {
    const std::vector<std::u16string> names = {u"",   u"\u200Cb",  u"b\u200Cx", u"C",
                                               u"Cd", u"C\u200Dx", u"\u00C6",   u"\u4E00z"};
    Open(names, 1);
    for (const std::u16string& name : names) {
        ASSERT_EQ(Find(name), kOk);
    }
    const u64 orders[] = {0x700000000, 0, 0, 0x700630000, 0x700630064, 0, 0x700E60000, 0x74E00007A};
    for (u32 n = 0; n < names.size(); ++n) {
        EXPECT_EQ(Remembered().Order(n), orders[n]) << n;
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Each of two records in a leaf, so that a wrong turn above misses one.
TEST_P(RootRemembers, KeysThatDifferInOneUnitAreToldApart) {
    const std::vector<std::u16string> names = {
        u"",   u"\u0001", u"A",       u"a1",      u"AA",     u"aB",      u"B",       u"Bc",
        u"bm", u"bn",     u"BX",      u"bxx",     u"by",     u"C",       u"D\u00E0", u"D\u00E6",
        u"E",  u"\u00E6", u"\u00E6a", u"\u00E6c", u"\u4E00", u"\u4E00b", u"\u4E01",  u"\u4E01a"};
    Open(names, 2);
    for (u32 round = 0; round < 3; ++round) {
        for (std::size_t n = 0; n < names.size(); ++n) {
            EXPECT_EQ(Find(names[n]), kOk) << n;
            EXPECT_EQ(bench_->findData.path[2].index, static_cast<s32>(n / 2)) << n;
        }
        for (std::size_t n = names.size(); n-- > 0;) {
            EXPECT_EQ(Find(names[n] + u"\u0002"), kErrNotFound) << n;
            EXPECT_EQ(bench_->findData.path[2].index, static_cast<s32>(n / 2)) << n;
        }
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Somebody who holds the root writes another key and another child into a record, and says nothing.
// The child tells, and the root is searched as it is now.
TEST_P(RootRemembers, ARecordExchangedUnannouncedIsSearchedAgain) {
    OpenFour();
    FindFour();
    ASSERT_EQ(Remembered().Child(1)->nodeNum, 2u);
    NodeKey second;
    ASSERT_EQ(Root()->GetKey(&bench_->header, 1, &second), kOk);
    second.ptr[kCatKeyName + 1] = u'c' + 1;  // D, as the record behind it
    PutBe32(second.data, 4);
    EXPECT_EQ(Find(u"CA"), kErrNotFound);
    EXPECT_EQ(bench_->findData.path[2].index, 0);
    EXPECT_EQ(bench_->findData.path[1].node->nodeNum, 1u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// A child of no number: no hint leads there.
TEST_P(RootRemembers, NoChildOfARecordThatLeadsNowhere) {
    OpenFour();
    ASSERT_EQ(Find(u"E"), kOk);
    ForgetRecords(&bench_.tree.tree, Root());
    NodeKey second;
    ASSERT_EQ(Root()->GetKey(&bench_->header, 1, &second), kOk);
    PutBe32(second.data, 0);
    EXPECT_EQ(Find(u"E"), kOk);
    EXPECT_NE(Find(u"C"), kOk);
    ASSERT_NE(bench_->findData.path[2].node, nullptr);
    EXPECT_EQ(Remembered().Child(1), nullptr);
    EXPECT_NE(Remembered().Child(3), nullptr);
    PutBe32(second.data, 2);
    EXPECT_EQ(Find(u"C"), kOk);
    EXPECT_EQ(Remembered().Child(1)->nodeNum, 2u);
    EXPECT_NE(bench_.capture.Take(), Events{});
}

// Somebody who announces a change finds it searched, whatever was known before.
TEST_P(RootRemembers, NothingOfARecordAnnouncedAsChanged) {
    OpenFour();
    FindFour();
    ASSERT_EQ(bench_->SetDirty(Root(), 0), kOk);
    for (u32 n = 0; n < 4; ++n) {
        EXPECT_EQ(Remembered().Order(n), 0u);
        EXPECT_EQ(Remembered().Child(n), nullptr);
    }
    NodeKey second;
    ASSERT_EQ(Root()->GetKey(&bench_->header, 1, &second), kOk);
    second.ptr[kCatKeyName + 1] = u'b';
    EXPECT_EQ(Find(u"BA"), kErrNotFound);
    EXPECT_EQ(bench_->findData.path[2].index, 1);
    second.ptr[kCatKeyName + 1] = u'c';
    bench_->RestoreModifiedNodes();
}

// More records than have room: those behind are found as they lie.
TEST_P(RootRemembers, OnlyTheFirstOfManyRecords) {
    std::vector<std::u16string> names;
    for (u32 n = 0; n < 24; ++n) {
        names.push_back({static_cast<char16_t>(u'A' + n)});
    }
    Open(names, 1);
    for (u32 round = 0; round < 2; ++round) {
        for (u32 n = 0; n < 24; ++n) {
            EXPECT_EQ(Find(names[n]), kOk);
            EXPECT_EQ(bench_->findData.path[2].index, static_cast<s32>(n));
        }
        const u32 room = GetParam() / 32;
        for (u32 n = 0; n < 24; ++n) {
            EXPECT_EQ(Remembered().Order(n) != 0, n < room) << n;
            EXPECT_EQ(Remembered().Child(n) != nullptr, n < room) << n;
        }
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// ---- children that are cached

TEST_P(RootRemembers, WhereItsCachedChildrenLie) {
    OpenFour();
    ASSERT_EQ(Find(u"C"), kOk);
    const HfsNode* leaf = bench_->findData.path[1].node;
    EXPECT_EQ(Remembered().Child(1), leaf);
    EXPECT_EQ(leaf->hintedBy, Root());
    EXPECT_EQ(Remembered().Child(0), nullptr);
    EXPECT_EQ(bench_->rootHint, Root());
}

// A leaf that no parent led to is not taken for the root.
TEST_P(RootRemembers, WhereItLiesItself) {
    OpenFour();
    ASSERT_EQ(Find(u"C"), kOk);
    HfsFindData path;
    EXPECT_EQ(bench_->ReadLevel(1, 3, &path), kOk);
    EXPECT_EQ(bench_->rootHint, Root());
    path.ClearPath();
}

TEST_P(RootRemembers, WhereItLiesWhileAnotherCannotBeRead) {
    OpenFour();
    ASSERT_EQ(Find(u"C"), kOk);
    const HfsNode* root = Root();
    const u32 rootNode = std::exchange(bench_->header.rootNode, 1u);
    bench_.faults.Fail(Call::kMap, 1);
    EXPECT_EQ(Find(u"B"), kFaultStatus);
    EXPECT_EQ(bench_->rootHint, root);
    bench_->header.rootNode = rootNode;
    EXPECT_EQ(Find(u"B"), kOk);
}

TEST_P(RootRemembers, NoChildThatLeftTheCache) {
    OpenFour();
    ASSERT_EQ(Find(u"C"), kOk);
    HfsNode* leaf = bench_->findData.path[1].node;
    ASSERT_EQ(Find(u"D"), kOk);
    bench_->PutINode(leaf, false);
    EXPECT_EQ(Remembered().Child(1), nullptr);
    EXPECT_NE(Remembered().Child(2), nullptr);
    EXPECT_EQ(Find(u"C"), kOk);
    EXPECT_EQ(Remembered().Child(1), bench_->findData.path[1].node);
}

// A walk along the leaves tells the parent of each that it meets, and only of its own.
TEST_P(RootRemembers, NeighboursMetOnAWalk) {
    OpenFour();
    ASSERT_EQ(Find(u"B"), kOk);
    HfsNode* root = Root();
    const Hints hints(&bench_.tree.tree, root);
    u8 data[8];
    unsigned size = 0;
    for (u32 n = 1; n < 4; ++n) {
        ASSERT_EQ(bench_->IncPos(1, data, sizeof data, &size, nullptr, 0, nullptr, nullptr), kOk);
        const HfsNode* leaf = bench_->findData.path[1].node;
        EXPECT_EQ(hints.Child(n), leaf);
        EXPECT_EQ(leaf->hintedBy, root);
        EXPECT_EQ(hints.Child(n - 1), nullptr);  // the clean leaf left the cache
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// Three levels: leaves 1 .. 9, index nodes 10 .. 12 of four, four and one of them, root 13. A leaf
// met beside another is hinted at by the parent of that one when it is its child as well.
class BesideRemembers : public ::testing::Test {
protected:
    BesideRemembers() : bench_(Blocks(512)) { bench_.Open(SmallTree(512, 9)); }
    ~BesideRemembers() override { bench_->findData.ClearPath(); }

    HfsNode* Find(u32 n) {
        const HostKey key = NthHostKey(4, n);
        EXPECT_EQ(bench_->FindRecord(key.Get(), key.id, nullptr, 0, nullptr, nullptr), kOk);
        return bench_->findData.path[1].node;
    }
    HfsNode* Step(int count) {
        u8 record[8];
        u32 size = 0;
        u32 keySize = 0;
        alignas(8) u8 key[40];
        EXPECT_EQ(bench_->IncPos(count, record, 8, &size, key, 40, &keySize, nullptr), kOk);
        return bench_->findData.path[1].node;
    }
    u32 ParentOf(const HfsNode* leaf) {
        return leaf->hintedBy != nullptr ? leaf->hintedBy->nodeNum : 0;
    }
    HfsNode* Hinted(u32 parent, u32 index) {
        return Hints(&bench_.tree.tree, CachedNode(*bench_.tree, parent)).Child(index);
    }
    // A leaf stays cached as long as it is modified.
    void Keep(HfsNode* leaf) { ASSERT_EQ(bench_->SetDirty(leaf, 0), kOk); }

    Bench bench_;
};

TEST_F(BesideRemembers, TheParentItCameFrom) {
    EXPECT_EQ(ParentOf(Find(4)), 10u);
    HfsNode* next = Step(2);
    EXPECT_EQ(next->nodeNum, 4u);
    EXPECT_EQ(ParentOf(next), 10u);
    EXPECT_EQ(Hinted(10, 3), next);
    next = Step(-1);
    EXPECT_EQ(next->nodeNum, 3u);
    EXPECT_EQ(Hinted(10, 2), next);
}

TEST_F(BesideRemembers, NotTheParentOfAnotherFamily) {
    EXPECT_EQ(ParentOf(Find(6)), 10u);
    HfsNode* next = Step(2);
    EXPECT_EQ(next->nodeNum, 5u);
    EXPECT_EQ(ParentOf(next), 0u);
    EXPECT_EQ(Hinted(10, 4), nullptr);
    next = Step(-1);
    EXPECT_EQ(next->nodeNum, 4u);
    EXPECT_EQ(ParentOf(next), 0u);
}

TEST_F(BesideRemembers, TheParentThatLeadsThere) {
    HfsNode* next = Find(8);
    EXPECT_EQ(ParentOf(next), 11u);
    Keep(next);
    HfsNode* leaf = Find(6);
    EXPECT_EQ(ParentOf(leaf), 10u);
    EXPECT_EQ(Step(2), next);
    EXPECT_EQ(ParentOf(next), 11u);
    EXPECT_EQ(Hinted(11, 0), next);
    bench_->modifiedList.prev->Unlink();
}

INSTANTIATE_TEST_SUITE_P(Roots, RootRemembers, ::testing::Values(512u, 1024u));

}  // namespace
}  // namespace VELK::test
