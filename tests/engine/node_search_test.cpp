// Searches in one node look at no byte that is not the node's: each block of it ends where memory
// does, and a record begins on the last byte of one.
#include "hfs/treehfs/node_search.h"
#include "hfs/treehfs/node_child.h"

#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

#include "hfs/treehfs/hints.h"
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

}  // namespace
}  // namespace VELK::test
