// Records read where they lie against the way round that checks and reports: whatever damage there
// is to the bytes they go by, a record that is read at once is the one that the way round tells of,
// and that has nothing to say then.
#include <cstring>

#include "damages.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/node_child.h"
#include "hfs/treehfs/node_search.h"
#include "hfs/treehfs/scratch.h"
#include "node_bench.h"

namespace VELK::test {
namespace {

struct Reading {
    Geometry geometry;
    s8 kind;
    CompareKeysFn compare;
    bool hasScratch;
};
std::ostream& operator<<(std::ostream& out, const Reading& reading) {
    return out << reading.geometry << (reading.kind == kBTIndexNode ? ", index" : ", leaf")
               << (reading.compare == CompareCatKeysCaseIns ? ", folded" : "")
               << (reading.hasScratch ? ", scratch" : "");
}

std::vector<Reading> Readings() {
    std::vector<Reading> readings;
    for (const Geometry& geometry : std::vector<Geometry>{
             {1024, 1024}, {1024, 512}, {1024, 512, true}, {2048, 512}, {2048, 512, true}}) {
        for (const s8 kind : {kBTIndexNode, kBTLeafNode}) {
            for (CompareKeysFn compare : {CompareCatKeysCaseIns, CompareCatKeysCaseBin}) {
                readings.push_back({geometry, kind, compare, false});
                readings.push_back({geometry, kind, compare, true});
            }
        }
    }
    return readings;
}

class PlainRead : public ::testing::TestWithParam<Reading> {
protected:
    static constexpr u32 kRecords = 6;

    static std::u16string Name(u32 n) {
        return std::u16string(3 + n, static_cast<char16_t>('b' + n));
    }

    // Records over all of a node, some over the end of a block.
    static Bytes Content() {
        NodeImage image{.kind = GetParam().kind, .height = 1};
        for (u32 n = 0; n < kRecords; ++n) {
            const Bytes key = DiskCatKey(7, Name(n));
            image.records.push_back(
                GetParam().kind == kBTIndexNode
                    ? Record(key, 0x100 + n)
                    : Record(key, Pattern(GetParam().geometry.nodeSize / 8, n)));
        }
        if (GetParam().kind == kBTIndexNode) {  // the first key is long, and the second over an end
            image.records[0] = Record(DiskCatKey(7, std::u16string(238, u'a')), 0x100u);
        }
        return image.Build(GetParam().geometry.nodeSize);
    }

    void Make(const Bytes& content) {
        if (node_ != nullptr) {
            node_->Get()->hints = nullptr;
        }
        node_ = nullptr;
        bench_ = nullptr;
        bench_ = std::make_unique<NodeBench>(GetParam().geometry);
        bench_->tree.compareKeys = GetParam().compare;
        bench_->tree.nodeShift = GetParam().geometry.nodeSize == 1024 ? 10 : 11;
        node_ = bench_->Node(content, 3);
        if (GetParam().kind == kBTIndexNode) {
            std::memset(hints_, 0, sizeof hints_);
            node_->Get()->hints = reinterpret_cast<HfsHintTable*>(hints_);
        }
        if (GetParam().hasScratch) {
            ASSERT_EQ(EnsureScratch(&bench_->tree), kOk);
        }
    }

    void CompareRecord(u32 index) {
        CBTreeHfs* tree = &bench_->tree;
        RecordView plain{};
        if (!ViewPlain(tree, node_->Get(), index, &plain)) {
            return;
        }
        viewed_ += 1;
        RecordView record{};
        ASSERT_EQ(FetchKey(tree, node_->Get(), static_cast<int>(index), &record), kOk);
        EXPECT_EQ(bench_->capture.Take(), Events{});
        EXPECT_EQ(plain.keySize, record.keySize);
        EXPECT_EQ(std::memcmp(plain.key, record.key, record.keySize), 0);
        EXPECT_EQ(plain.data, record.data);
        EXPECT_EQ(plain.dataSize, record.dataSize);
        EXPECT_EQ(plain.dataOffset, record.dataOffset);
        EXPECT_EQ(tree->scratch != nullptr, GetParam().hasScratch);
    }

    void CompareChild(u32 index) {
        const u32 plain = PlainChild(&bench_->tree, node_->Get(), static_cast<s32>(index));
        if (plain == 0) {
            return;
        }
        children_ += 1;
        unsigned child = 0;
        ASSERT_EQ(
            node_->Get()->GetChildNodeNum(&bench_->tree.header, static_cast<int>(index), &child),
            kOk);
        EXPECT_EQ(bench_->capture.Take(), Events{});
        EXPECT_EQ(plain, child);
    }

    // A search as plainly as it can be said.
    int Search(const HostKey& key, bool* found, s32* index) {
        CBTreeHfs* tree = &bench_->tree;
        s32 low = 0;
        s32 high = static_cast<s32>(NumRecords(node_->Get())) - 1;
        while (low <= high) {
            const s32 middle = (low + high) >> 1;
            RecordView record{};
            const int status = FetchKey(tree, node_->Get(), middle, &record);
            if (status != kOk) {
                Report(status, 3005);
                return status;
            }
            const int order = GetParam().compare(key, key.id, record.key);
            if (order == 0) {
                *found = true;
                *index = middle;
                return kOk;
            }
            (order < 0 ? high : low) = order < 0 ? middle - 1 : middle + 1;
        }
        *found = false;
        *index = low;
        return kOk;
    }

    void CompareSearch(const Bytes& content, const HostKey& key) {
        Make(content);
        bool found = false;
        s32 index = -1;
        const int expected = Search(key, &found, &index);
        const Events events = bench_->capture.Take();
        Make(content);
        SearchResult result{};
        SearchResult inside{};
        SoughtKey sought(&bench_->tree, key, key.id);
        const bool isInside = SearchInside(&bench_->tree, node_->Get(), sought, &inside);
        EXPECT_EQ(bench_->capture.Take(), Events{});
        sought.LearnOrder();
        ASSERT_EQ(SearchNode(&bench_->tree, node_->Get(), sought, &result), expected);
        EXPECT_EQ(bench_->capture.Take(), events);
        if (expected == kOk) {
            EXPECT_EQ(result.found, found);
            EXPECT_EQ(result.index, index);
        }
        if (isInside && content == Content()) {  // it is asked of nodes in order only
            EXPECT_EQ(inside.found, result.found);
            EXPECT_EQ(inside.index, result.index);
        }
    }

    ~PlainRead() override {
        if (node_ != nullptr) {
            node_->Get()->hints = nullptr;
        }
    }

    std::unique_ptr<NodeBench> bench_;
    std::unique_ptr<LooseNode> node_;
    alignas(HfsHintTable) u8 hints_[offsetof(HfsHintTable, hints) + 64 * sizeof(HfsHint)];
    u32 viewed_ = 0;
    u32 children_ = 0;
};

TEST_P(PlainRead, ComesToWhatTheWayRoundDoes) {
    const Bytes content = Content();
    std::vector<Damage> damages = DamagesOf(content);
    damages.push_back({0, 0, 1});  // none
    for (const Damage& damage : damages) {
        if (damage.at == kDescKind && damage.value == u32{kBTMapNode}) {
            continue;  // no search comes to a node of the map, which has no keys
        }
        SCOPED_TRACE(::testing::Message() << damage);
        Bytes damaged = content;
        Apply(damage, &damaged);
        Make(damaged);
        for (u32 index = 0; index <= kRecords; ++index) {
            CompareRecord(index);
            CompareChild(index);
        }
        for (u32 n = 0; n < kRecords; ++n) {
            CompareSearch(damaged, HostCatKey(7, Name(n)));
            CompareSearch(damaged, HostCatKey(7, Name(n) + u"x"));
        }
        ASSERT_FALSE(HasFailure());
    }
    const bool isFolded = GetParam().compare == CompareCatKeysCaseIns;
    EXPECT_EQ(viewed_ > damages.size(), isFolded);
    EXPECT_EQ(children_ > damages.size(), GetParam().kind == kBTIndexNode);
}

INSTANTIATE_TEST_SUITE_P(Readings, PlainRead, ::testing::ValuesIn(Readings()));

}  // namespace
}  // namespace VELK::test
