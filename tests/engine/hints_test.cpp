// What an index node remembers of its records: exactly this, and no longer than it holds.
#include "hfs/treehfs/hints.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>

#include "bench.h"
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/node_desc.h"

namespace VELK::test {
namespace {

// ---- the separators by themselves

class SeparatorTable : public ::testing::Test {
protected:
    static constexpr u32 kRoom = 16;  // of a node of 512 bytes

    SeparatorTable() : bench_(Blocks(512)), node_(NodeImage{}.Build(512), 512) {
        bench_->nodeShift = 9;
        EXPECT_EQ(SeparatorRoom(&bench_.tree.tree), kRoom);
        memory_.resize(HintBytes(&bench_.tree.tree) / sizeof(HfsHintSet) + 2);
        std::memset(static_cast<void*>(memory_.data()), 0, memory_.size() * sizeof(HfsHintSet));
        node_->hints = memory_.data();
    }
    ~SeparatorTable() override { node_->hints = nullptr; }

    Separators Table() { return {&bench_.tree.tree, node_.Get()}; }
    // Record n leads to child 100 + n.
    void LearnFirst(u32 count) {
        Table().Forget();
        model_.assign(kRoom, 0);
        for (u32 n = 0; n < std::min(count, kRoom); ++n) {
            Table().Learn(n, 1000 + n, 100 + n);
            model_[n] = 100 + n;
        }
    }
    void ExpectModel() {
        for (u32 n = 0; n < kRoom; ++n) {
            ASSERT_EQ(Table().Child(n), model_[n]) << n;
            if (model_[n] != 0) {
                ASSERT_EQ(Table().Order(n), u64{900} + model_[n]) << n;
            }
        }
        ASSERT_EQ(Table().Child(kRoom), 0u);
        ASSERT_EQ(Table().Child(kRoom + 5), 0u);
    }

    Bench bench_;
    LooseNode node_;
    std::vector<HfsHintSet> memory_;
    std::vector<u32> model_;
};

TEST_F(SeparatorTable, ARecordComesInAtAnyPlace) {
    for (u32 count = 0; count <= kRoom + 4; ++count) {
        for (u32 index = 0; index <= count; ++index) {
            LearnFirst(count);
            Table().Insert(index, count);
            if (index < kRoom) {
                model_.insert(model_.begin() + index, 0);
                model_.resize(kRoom);
            }
            ExpectModel();
        }
    }
}

TEST_F(SeparatorTable, ARecordLeavesAnyPlace) {
    for (u32 count = 1; count <= kRoom + 4; ++count) {
        for (u32 index = 0; index < count; ++index) {
            LearnFirst(count);
            Table().Remove(index, count);
            if (index < kRoom) {
                model_.erase(model_.begin() + index);
                model_.push_back(0);
            }
            ExpectModel();
        }
    }
}

TEST_F(SeparatorTable, RecordsBeyondItsRoomAreNotLearnt) {
    LearnFirst(kRoom);
    Table().Learn(kRoom, 5, 5);
    Table().Learn(kRoom + 1, 6, 6);
    ExpectModel();
}

TEST_F(SeparatorTable, WhatIsForgottenIsUnknown) {
    LearnFirst(kRoom);
    Table().Forget();
    model_.assign(kRoom, 0);
    ExpectModel();
}

TEST_F(SeparatorTable, ANodeWithoutRoomHasNothingToForget) {
    LearnFirst(3);
    node_->hints = nullptr;
    ForgetSeparators(&bench_.tree.tree, node_.Get());
    node_->hints = memory_.data();
    ExpectModel();
    ForgetSeparators(&bench_.tree.tree, node_.Get());
    model_.assign(kRoom, 0);
    ExpectModel();
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
    int Find(const std::u16string& name) {
        return bench_->FindRecord(HostCatKey(7, name), 7, nullptr, 0, nullptr, nullptr);
    }
    HfsNode* Root() { return bench_->findData.path[2].node; }
    Separators Remembered() { return {&bench_.tree.tree, Root()}; }

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
        const bool hasOrder = orders[n] != 0;
        EXPECT_EQ(Remembered().Child(n), hasOrder ? n + 1 : 0) << n;
        if (hasOrder) {
            EXPECT_EQ(Remembered().Order(n), orders[n]) << n;
        }
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
    Open({u"B", u"C", u"D", u"E"}, 1);
    for (const char16_t* name : {u"B", u"C", u"D", u"E"}) {
        ASSERT_EQ(Find(name), kOk);
    }
    ASSERT_EQ(Remembered().Child(1), 2u);
    NodeKey second;
    ASSERT_EQ(Root()->GetKey(&bench_->header, 1, &second), kOk);
    second.ptr[kCatKeyName + 1] = u'c' + 1;  // D, as the record behind it
    PutBe32(second.data, 4);
    EXPECT_EQ(Find(u"CA"), kErrNotFound);
    EXPECT_EQ(bench_->findData.path[2].index, 0);
    EXPECT_EQ(bench_->findData.path[1].node->nodeNum, 1u);
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// A child of no number, of no child's size, or none of an index node: the record is not learnt.
TEST_P(RootRemembers, NothingOfARecordThatLeadsNowhere) {
    Open({u"B", u"C", u"D", u"E"}, 1);
    ASSERT_EQ(Find(u"E"), kOk);
    ASSERT_EQ(Remembered().Child(1), 2u);
    ForgetSeparators(&bench_.tree.tree, Root());
    NodeKey second;
    ASSERT_EQ(Root()->GetKey(&bench_->header, 1, &second), kOk);
    PutBe32(second.data, 0);
    EXPECT_EQ(Find(u"E"), kOk);
    EXPECT_EQ(Remembered().Child(1), 0u);
    EXPECT_EQ(Remembered().Child(2), 3u);
    PutBe32(second.data, 2);
    EXPECT_EQ(Find(u"E"), kOk);
    EXPECT_EQ(Remembered().Child(1), 2u);
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
            EXPECT_EQ(Remembered().Child(n), n < room ? n + 1 : 0) << n;
        }
    }
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

// ---- children that are cached

TEST_P(RootRemembers, WhereItsCachedChildrenLie) {
    Open({u"B", u"C", u"D", u"E"}, 1);
    ASSERT_EQ(Find(u"C"), kOk);
    const HfsNode* leaf = bench_->findData.path[1].node;
    const HintPlace hint = FindHint(&bench_.tree.tree, Root(), 2);
    ASSERT_TRUE(hint);
    EXPECT_EQ(hint.Node(), leaf);
    EXPECT_EQ(hint.Data(), leaf->bufs[0].data);
    EXPECT_EQ(leaf->hintedBy, Root());
    EXPECT_FALSE(FindHint(&bench_.tree.tree, Root(), 1));
    EXPECT_FALSE(FindHint(&bench_.tree.tree, leaf, 2));
    EXPECT_FALSE(FindHint(&bench_.tree.tree, nullptr, 2));
    EXPECT_EQ(bench_->rootHint, Root());
}

TEST_P(RootRemembers, NoChildThatLeftTheCache) {
    Open({u"B", u"C", u"D", u"E"}, 1);
    ASSERT_EQ(Find(u"C"), kOk);
    HfsNode* root = Root();
    HfsNode* leaf = bench_->findData.path[1].node;
    ASSERT_EQ(Find(u"D"), kOk);
    bench_->PutINode(leaf, false);
    EXPECT_FALSE(FindHint(&bench_.tree.tree, root, 2));
    EXPECT_TRUE(FindHint(&bench_.tree.tree, root, 3));
    EXPECT_EQ(Find(u"C"), kOk);
    EXPECT_TRUE(FindHint(&bench_.tree.tree, root, 2));
}

// Three levels: leaves 1 .. 9, index nodes 10 .. 12 of four, four and one of them, root 13. A leaf
// met beside another gets the parent of that one, unless a parent leads to it already.
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
    // A leaf stays cached as long as it is modified.
    void Keep(HfsNode* leaf) { ASSERT_EQ(bench_->SetDirty(leaf, 0), kOk); }

    Bench bench_;
};

TEST_F(BesideRemembers, TheParentItCameFrom) {
    EXPECT_EQ(ParentOf(Find(6)), 10u);
    const HfsNode* next = Step(2);
    EXPECT_EQ(next->nodeNum, 5u);
    EXPECT_EQ(ParentOf(next), 10u);
    EXPECT_TRUE(FindHint(&bench_.tree.tree, CachedNode(*bench_.tree, 10), 5));
}

TEST_F(BesideRemembers, TheParentThatLeadsThere) {
    HfsNode* next = Find(8);
    EXPECT_EQ(ParentOf(next), 11u);
    Keep(next);
    HfsNode* leaf = Find(6);
    EXPECT_EQ(ParentOf(leaf), 10u);
    EXPECT_EQ(Step(2), next);
    EXPECT_EQ(ParentOf(next), 11u);
    bench_->modifiedList.prev->Unlink();
}

// ---- places of children

// A parent with four sets of three places each; a child belongs into the set of its number and
// into the one beside, 0 with 1 and 2 with 3.
class ChildPlaces : public ::testing::Test {
protected:
    ChildPlaces() : bench_(Blocks(512)), parent_(NodeImage{}.Build(512), 512, 100) {
        bench_->nodeShift = 9;
        EXPECT_EQ(HintSetCount(&bench_.tree.tree), 4u);
        memory_.resize(HintBytes(&bench_.tree.tree) / sizeof(HfsHintSet) + 1);
        std::memset(static_cast<void*>(memory_.data()), 0, memory_.size() * sizeof(HfsHintSet));
        parent_->hints = memory_.data();
    }
    ~ChildPlaces() override { parent_->hints = nullptr; }

    HfsNode* Hint(u32 number) {
        children_.push_back(std::make_unique<LooseNode>(NodeImage{}.Build(512), 512, number));
        SetHint(&bench_.tree.tree, parent_.Get(), children_.back()->Get());
        EXPECT_EQ(children_.back()->Get()->hintedBy, parent_.Get());
        return children_.back()->Get();
    }
    // Set and place of the hint at a child, as 10 x set + place; 99: there is none.
    u32 PlaceOf(u32 number) {
        const HintPlace hint = FindHint(&bench_.tree.tree, parent_.Get(), number);
        return hint ? 10 * static_cast<u32>(hint.set - memory_.data()) + hint.place : 99;
    }

    Bench bench_;
    LooseNode parent_;
    std::vector<HfsHintSet> memory_;
    std::vector<std::unique_ptr<LooseNode>> children_;
};

TEST_F(ChildPlaces, OwnSetThenTheOneBeside) {
    std::vector<u32> places;
    for (const u32 number : {5u, 9u, 13u, 17u, 21u, 25u, 6u, 7u}) {
        const HfsNode* child = Hint(number);
        places.push_back(PlaceOf(number));
        EXPECT_EQ(FindHint(&bench_.tree.tree, parent_.Get(), number).Node(), child);
        EXPECT_EQ(FindHint(&bench_.tree.tree, parent_.Get(), number).Data(), child->bufs[0].data);
    }
    EXPECT_EQ(places, (std::vector<u32>{10, 11, 12, 0, 1, 2, 20, 30}));
    EXPECT_EQ(PlaceOf(29), 99u);
}

TEST_F(ChildPlaces, OneTooManyTakesThePlaceOfAnotherInTurn) {
    std::vector<HfsNode*> children;
    for (u32 n = 0; n < 11; ++n) {
        children.push_back(Hint(4 + 4 * n));
    }
    const std::vector<u32> places = {99, 99, 99, 10, 11, 12, 99, 99, 2, 0, 1};
    for (u32 n = 0; n < 11; ++n) {
        EXPECT_EQ(PlaceOf(4 + 4 * n), places[n]) << n;
        EXPECT_EQ(children[n]->hintedBy, places[n] == 99 ? nullptr : parent_.Get()) << n;
    }
}

TEST_F(ChildPlaces, AChildHasOnePlaceOnly) {
    HfsNode* child = Hint(5);
    Hint(9);
    SetHint(&bench_.tree.tree, parent_.Get(), child);
    EXPECT_EQ(PlaceOf(5), 10u);
    EXPECT_EQ(PlaceOf(9), 11u);
    EXPECT_EQ(memory_[1].node[2], nullptr);
}

TEST_F(ChildPlaces, ANodeIsNotItsOwnChild) {
    SetHint(&bench_.tree.tree, parent_.Get(), parent_.Get());
    EXPECT_EQ(PlaceOf(100), 99u);
    EXPECT_EQ(parent_->hintedBy, nullptr);
}

TEST_F(ChildPlaces, AForgottenPlaceIsFreeAgain) {
    HfsNode* first = Hint(5);
    Hint(9);
    bench_->rootHint = first;
    ForgetHints(&bench_.tree.tree, first);
    EXPECT_EQ(first->hintedBy, nullptr);
    EXPECT_EQ(bench_->rootHint, nullptr);
    EXPECT_EQ(PlaceOf(5), 99u);
    Hint(13);
    EXPECT_EQ(PlaceOf(13), 10u);
    EXPECT_EQ(PlaceOf(9), 11u);
}

TEST_F(ChildPlaces, AParentThatGoesLetsItsChildrenGo) {
    std::vector<HfsNode*> children;
    for (const u32 number : {5u, 9u, 6u, 7u}) {
        children.push_back(Hint(number));
    }
    HfsNode* other = children_[0]->Get();
    bench_->rootHint = other;
    ForgetHints(&bench_.tree.tree, parent_.Get());
    for (const HfsNode* child : children) {
        EXPECT_EQ(child->hintedBy, nullptr);
    }
    EXPECT_EQ(bench_->rootHint, other);
    bench_->rootHint = nullptr;
}

INSTANTIATE_TEST_SUITE_P(Roots, RootRemembers, ::testing::Values(512u, 1024u));

}  // namespace
}  // namespace VELK::test
