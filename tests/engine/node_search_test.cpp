// Searches in one node look at no byte that is not the node's: each block of it ends where memory
// does, and a record begins on the last byte of one.
#include "hfs/treehfs/node_search.h"
#include "hfs/treehfs/node_child.h"

#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/scratch.h"
#include "node_bench.h"

namespace VELK::test {
namespace {

constexpr u32 kNodeSize = 1024;
constexpr u32 kBlockSize = 512;
constexpr u32 kRecords = 5;
constexpr u32 kKeySize = 10;  // of a name of one letter

// A block behind which nothing may be read.
class FencedBlock {
public:
    explicit FencedBlock(const u8* content)
        : page_(static_cast<std::size_t>(sysconf(_SC_PAGESIZE))),
          memory_(mmap(nullptr, 2 * page_, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1,
                       0)) {
        EXPECT_NE(memory_, MAP_FAILED);
        EXPECT_EQ(mprotect(static_cast<u8*>(memory_) + page_, page_, PROT_NONE), 0);
        std::memcpy(Data(), content, kBlockSize);
    }
    ~FencedBlock() { munmap(memory_, 2 * page_); }
    FencedBlock(const FencedBlock&) = delete;
    FencedBlock& operator=(const FencedBlock&) = delete;

    u8* Data() const { return static_cast<u8*>(memory_) + page_ - kBlockSize; }

private:
    std::size_t page_;
    void* memory_;
};

struct Search {
    CompareKeysFn compare;
    bool remembers;  // the node has room for hints
};

class FencedNode : public ::testing::TestWithParam<Search> {
protected:
    FencedNode() {
        bench_.tree.nodeShift = 10;
        bench_.tree.compareKeys = GetParam().compare;
    }
    ~FencedNode() override {
        if (node_ != nullptr) {
            node_->Get()->hints = nullptr;
        }
    }

    static std::u16string Name(u32 n) { return {static_cast<char16_t>(u'b' + n)}; }

    // A node in which record `odd` begins on the last byte of the first block.
    void Make(s8 kind, u32 odd) {
        NodeImage image{.kind = kind};
        for (u32 n = 0; n < kRecords; ++n) {
            image.records.push_back(Record(DiskCatKey(7, Name(n)), 100 + n));
        }
        Bytes bytes = image.Build(kNodeSize);
        const Bytes key = DiskCatKey(7, Name(odd));
        ASSERT_EQ(key.size(), kKeySize);
        std::copy(key.begin(), key.end(), bytes.begin() + kBlockSize - 1);
        Put16(&bytes, kNodeSize - 2 * (odd + 1), kBlockSize - 1);
        Put16(&bytes, kNodeSize - 2 * (odd + 2), kBlockSize - 1 + kKeySize + kChildSize);
        node_ = bench_.Node(bytes, 3);
        for (u32 b = 0; b < 2; ++b) {
            blocks_[b] = std::make_unique<FencedBlock>(bytes.data() + b * kBlockSize);
            node_->Get()->bufs[b].data = blocks_[b]->Data();
        }
        std::fill(std::begin(memory_), std::end(memory_), u8{0});
        node_->Get()->hints =
            GetParam().remembers ? reinterpret_cast<HfsHintTable*>(memory_) : nullptr;
    }

    NodeBench bench_{Geometry{kNodeSize, kBlockSize}};
    std::unique_ptr<FencedBlock> blocks_[2];
    std::unique_ptr<LooseNode> node_;
    alignas(HfsHintTable) u8 memory_[offsetof(HfsHintTable, hints) + 32 * sizeof(HfsHint)];
};

TEST_P(FencedNode, ARecordThatBeginsOnABlocksLastByteIsReadWithCare) {
    for (const s8 kind : {kBTLeafNode, kBTIndexNode}) {
        for (const u32 odd : {0u, 2u, 4u}) {
            Make(kind, odd);
            const HostKey host = HostCatKey(7, Name(odd));
            SoughtKey key(&bench_.tree, host.Get(), host.id);
            SearchResult result{};
            EXPECT_FALSE(SearchInside(&bench_.tree, node_->Get(), key, &result));
            key.LearnOrder();
            ASSERT_EQ(SearchNode(&bench_.tree, node_->Get(), key, &result), kOk);
            EXPECT_TRUE(result.found);
            EXPECT_EQ(result.index, static_cast<s32>(odd));
            EXPECT_FALSE(ViewPlain(&bench_.tree, node_->Get(), odd, &result.record));
            EXPECT_EQ(PlainChild(&bench_.tree, node_->Get(), static_cast<s32>(odd)), 0u);
            EXPECT_EQ(bench_.capture.Take(), Events{});
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Searches, FencedNode,
                         ::testing::Values(Search{CompareCatKeysCaseIns, false},
                                           Search{CompareCatKeysCaseIns, true},
                                           Search{CompareCatKeysCaseBin, false}));

// A node of two blocks in one piece, with a record over the end of the first.
class NodeInOnePiece : public ::testing::TestWithParam<CompareKeysFn> {
protected:
    NodeInOnePiece() {
        bench_.tree.nodeShift = 10;
        bench_.tree.compareKeys = GetParam();
    }

    // Three records, the middle one at node offset `start`.
    void Make(s8 kind, u32 start) {
        NodeImage image{.kind = kind};
        const u32 before = start - 14 - kKeySize;
        image.records.push_back(Record(DiskCatKey(7, u"b"), Pattern(before, 1)));
        image.records.push_back(Record(DiskCatKey(7, u"c"), 0x1234u));
        image.records.push_back(Record(DiskCatKey(7, u"d"), 0x5678u));
        node_ = bench_.Node(image.Build(kNodeSize), 3);
    }
    // Where the record's key is told to be by a search.
    const u8* KeyFound() {
        const HostKey host = HostCatKey(7, u"c");
        SearchResult result{};
        EXPECT_EQ(
            SearchNode(&bench_.tree, node_->Get(), SoughtKey(&bench_.tree, host, host.id), &result),
            kOk);
        EXPECT_TRUE(result.found);
        EXPECT_EQ(result.index, 1);
        EXPECT_EQ(std::memcmp(result.record.key, DiskCatKey(7, u"c").data(), kKeySize), 0);
        return reinterpret_cast<const u8*>(result.record.key);
    }
    bool IsInside() {
        const HostKey host = HostCatKey(7, u"c");
        SearchResult result{};
        return SearchInside(&bench_.tree, node_->Get(), SoughtKey(&bench_.tree, host, host.id),
                            &result);
    }
    bool View(RecordView* record) { return ViewPlain(&bench_.tree, node_->Get(), 1, record); }
    u32 Child() { return PlainChild(&bench_.tree, node_->Get(), 1); }

    NodeBench bench_{Geometry{kNodeSize, kBlockSize, true}};
    std::unique_ptr<LooseNode> node_;
};

// Nobody is to find a tree usable without memory that finds it unusable where blocks lie apart.
TEST_P(NodeInOnePiece, AKeyOverABlocksEndIsReadWhereItLiesIfItCouldBeGathered) {
    Make(kBTLeafNode, kBlockSize - 4);
    RecordView record;
    EXPECT_FALSE(IsInside());
    EXPECT_FALSE(View(&record));
    EXPECT_EQ(bench_.tree.scratch, nullptr);
    bench_.heap.FailNth(1);
    const HostKey host = HostCatKey(7, u"c");
    SearchResult result{};
    EXPECT_EQ(
        SearchNode(&bench_.tree, node_->Get(), SoughtKey(&bench_.tree, host, host.id), &result),
        kErrNoMemory);
    bench_.heap.FailNone();
    EXPECT_EQ(KeyFound(), bench_.tree.scratch);

    std::memset(bench_.tree.scratch, 0xEE, kNodeSize);
    EXPECT_EQ(KeyFound(), node_->At(kBlockSize - 4));
    EXPECT_TRUE(IsInside());
    if (GetParam() == CompareCatKeysCaseIns) {
        EXPECT_TRUE(View(&record));
        EXPECT_EQ(reinterpret_cast<const u8*>(record.key), node_->At(kBlockSize - 4));
    }
    EXPECT_EQ(Bytes(bench_.tree.scratch, bench_.tree.scratch + kNodeSize), Bytes(kNodeSize, 0xEE));
    EXPECT_EQ(bench_.capture.Take(), Events{});
}

TEST_P(NodeInOnePiece, DataOverABlocksEndIsInOnePieceIfItCouldBeGathered) {
    Make(kBTIndexNode, kBlockSize - kKeySize - 2);
    RecordView record;
    const bool isFolded = GetParam() == CompareCatKeysCaseIns;
    EXPECT_EQ(View(&record), isFolded);
    if (isFolded) {
        EXPECT_EQ(record.dataFirstBytes, 2u);
    }
    EXPECT_EQ(Child(), 0u);
    EXPECT_EQ(KeyFound(), node_->At(kBlockSize - kKeySize - 2));
    ASSERT_EQ(EnsureScratch(&bench_.tree), kOk);
    EXPECT_EQ(View(&record), isFolded);
    if (isFolded) {
        EXPECT_GE(record.dataFirstBytes, kChildSize);
    }
    EXPECT_EQ(Child(), 0x1234u);
}

// An index node of one record, with room for what searches learn of it.
struct HintedIndex {
    HintedIndex(const Geometry& geometry, const Bytes& record)
        : bench(geometry),
          node(bench.Node(
              NodeImage{.kind = kBTIndexNode, .records = {record}}.Build(geometry.nodeSize), 3)) {
        bench.tree.nodeShift = geometry.nodeSize == 1024 ? 10 : 11;
        bench.tree.compareKeys = CompareCatKeysCaseIns;
        node->Get()->hints = reinterpret_cast<HfsHintTable*>(memory);
    }
    ~HintedIndex() { node->Get()->hints = nullptr; }

    int Search(SearchResult* result) {
        const HostKey host = HostCatKey(7, u"c");
        SoughtKey key(&bench.tree, host, host.id);
        key.LearnOrder();
        return SearchNode(&bench.tree, node->Get(), key, result);
    }

    NodeBench bench;
    std::unique_ptr<LooseNode> node;
    alignas(HfsHintTable) u8 memory[offsetof(HfsHintTable, hints) + 64 * sizeof(HfsHint)]{};
};

// Data of more than a block lies in two now and could come to lie in three, where each search that
// meets it has something to say: the order of its key is not remembered.
TEST(NodeWithLongData, IsSearchedAgainWhereItLies) {
    for (const u32 dataSize : {kBlockSize, kBlockSize + 2}) {
        for (const bool inOnePiece : {false, true}) {
            HintedIndex index({2048, kBlockSize, inOnePiece},
                              Record(DiskCatKey(7, u"c"), Pattern(dataSize, 1)));
            SearchResult result{};
            EXPECT_EQ(index.Search(&result), kOk);
            EXPECT_TRUE(result.found);
            EXPECT_EQ(Hints(&index.bench.tree, index.node->Get()).Order(0) != 0,
                      dataSize == kBlockSize);
            EXPECT_EQ(index.bench.capture.Take(), Events{});
        }
    }
}

// That there is no memory for a key is for whoever asked: no fault of the node, also in one that
// remembers what searches met.
TEST(NodeWithoutMemory, ReportsNothingOfAKeyOverABlocksEnd) {
    for (const bool inOnePiece : {false, true}) {
        HintedIndex index({kNodeSize, kBlockSize, inOnePiece},
                          Record(DiskCatKey(7, std::u16string(255, u'c')), 5u));
        SearchResult result{};
        index.bench.heap.FailNth(1);
        EXPECT_EQ(index.Search(&result), kErrNoMemory);
        index.bench.heap.FailNone();
        EXPECT_EQ(index.bench.capture.Take(), Events{});
    }
}

INSTANTIATE_TEST_SUITE_P(Orders, NodeInOnePiece,
                         ::testing::Values(CompareCatKeysCaseIns, CompareCatKeysCaseBin));

}  // namespace
}  // namespace VELK::test
