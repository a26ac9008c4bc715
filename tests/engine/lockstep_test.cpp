// What nodes and paths remember is there to be quick, and must not show: each sequence of calls is
// played as it comes, and again with all forgotten that can be before each call. After every step
// the two agree in all that can be seen: answers, reports, counters, calls of the volume in their
// order, references, the tree of cached nodes, the list of modified ones, and all bytes. Nodes in
// one block are changed at once where those in several go piece by piece: played on both, a
// sequence comes to the same bytes after every step. So are nodes whose blocks lie one behind the
// other: where these lie must not show in anything.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <random>
#include <sstream>

#include "bench.h"
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/hints.h"

namespace VELK::test {
namespace {

enum class Others { kLeaveIt, kTouch, kDamage };

struct Game {
    u32 seed;
    u32 nodeShift;
    u32 mapBlock;
    Others others;  // what is done to nodes beside the tree's operations
    bool forgets;
    // Nothing that depends on how many blocks a node has: no faults, no data in three of them.
    bool inAnyBlocks = false;
    bool inOnePiece = false;  // the blocks of a node lie one behind the other
};

template <typename Visit>
void EachNode(rb_node* link, const Visit& visit) {
    if (link != nullptr) {
        EachNode(link->left, visit);
        EachNode(link->right, visit);
        visit(NodeOf(link));
    }
}

constexpr u32 kLeastBlock = 512;

class Player {
public:
    explicit Player(const Game& game)
        : game_(game),
          random_(game.seed),
          bench_(Blocks({1u << game.nodeShift, game.mapBlock, game.inOnePiece}, true)) {
        bench_.Create(game.nodeShift, CompareCatKeysCaseIns);
    }
    ~Player() {
        ClearPaths();
        bench_->Dtor();
        bench_.capture.Take();
        bench_.volume.breaches.clear();  // damaged maps give out nodes that are in use
    }

    // One call, and all that can be seen then.
    std::string Step() {
        if (game_.forgets) {
            Forget();
        }
        out_.str({});
        Call();
        bench_.heap.FailNone();
        bench_.faults.FailNone();
        Describe();
        EXPECT_TRUE(ShortcutsHold(*bench_.tree));
        return out_.str();
    }

private:
    u32 Below(u32 limit) { return static_cast<u32>(random_() % limit); }
    bool OneIn(u32 times) { return Below(times) == 0; }

    // Few IDs, and names that are alike: folded, ignored and closed-off units among them.
    // In some games most keys ascend.
    HostKey Key() {
        if (game_.seed % 4 == 3 && !OneIn(4)) {
            keys_ += OneIn(3) ? 0u : 1u;
            return HostCatKey(6, std::u16string(1, static_cast<char16_t>(0x4E00 + keys_)));
        }
        static constexpr char16_t kUnits[] = {u'a',   u'A',   u'b', u'c', u'd',   u'e', u'z',
                                              0x200C, 0x200D, 0xE9, 0xC6, 0x4E00, 1,    0};
        std::u16string name;
        for (u32 left = OneIn(10) ? 20 + Below(60) : Below(6); left > 0; --left) {
            name += kUnits[Below(std::size(kUnits))];
        }
        return HostCatKey(5 + Below(5), name);
    }

    void Call() {
        if (!game_.inAnyBlocks && OneIn(40)) {
            OneIn(2) ? bench_.heap.FailNth(1 + Below(4)) : bench_.faults.FailAny(1 + Below(12));
        }
        const u32 what = Below(100);
        if (what < 30) {
            const u32 most = game_.inAnyBlocks ? kLeastBlock - 4 : (1u << game_.nodeShift) / 3;
            const u32 size = 2 + Below(OneIn(4) ? most : 60);
            const HostKey key = Key();
            Answer("insert", bench_->InsertRecord(key, key.id, Pattern(size, 1).data(), size));
        } else if (what < 45) {
            Answer("delete", Delete());
        } else if (what < 70) {
            Answer("find", Find(Path(), Key()));
        } else if (what < 88) {
            Answer("step", StepOn());
        } else if (what < 91) {
            HfsFindData* path = Path();
            path->ClearPath();
            path->level = 0;
            const u64 position = (u64{Below(40)} << game_.nodeShift) + Below(30);
            Answer("position", bench_->SetPos(position, record_, sizeof record_, &size_, nullptr, 0,
                                              nullptr, path));
        } else if (what < 93) {
            Answer("clear", bench_->Clear());
        } else if (what < 95) {
            ClearPaths();
            Answer("flush", bench_->Flush(0));
        } else if (game_.others != Others::kLeaveIt) {
            Touch();
        }
    }
    void Answer(const char* call, int status) { out_ << call << " " << std::hex << status; }

    // Null in half of all cases where the caller has no need of it: the tree's own.
    HfsFindData* Path() { return OneIn(2) ? &bench_->findData : &path_; }
    int Find(HfsFindData* path, const HostKey& key) {
        bool found = false;
        const int status =
            bench_->FindEntry(key, key.id, path, &found, nullptr, nullptr, nullptr, nullptr);
        out_ << (found ? "found " : "");
        return status;
    }
    // The record at or behind a key, by the key or where the path stands.
    int Delete() {
        HfsFindData* path = &bench_->findData;
        if (bench_->header.treeDepth == 0 || Find(path, Key()) != kOk) {
            return kErrNotFound;
        }
        unsigned keySize = 0;
        if (bench_->IncPos(0, record_, sizeof record_, &size_, key_, sizeof key_, &keySize, path) !=
            kOk) {
            return kErrNotFound;
        }
        u32 id = 0;
        std::memcpy(&id, key_ + kCatKeyParentId, sizeof id);
        return bench_->DeleteRecord(OneIn(2) ? key_ : nullptr, id, OneIn(2));
    }
    int StepOn() {
        HfsFindData* path = Path();
        if (path->level != 1 || path->path[1].node == nullptr || OneIn(8)) {
            Find(path, Key());
        }
        const int count = OneIn(6) ? -static_cast<int>(Below(12)) : static_cast<int>(Below(12));
        unsigned keySize = 0;
        const int status = bench_->IncPos(count, record_, sizeof record_, &size_,
                                          OneIn(2) ? key_ : nullptr, sizeof key_, &keySize, path);
        out_ << size_ << " " << keySize << " ";
        return status;
    }
    // Somebody else takes a node by its number, and may write into it.
    void Touch() {
        const u32 number = 1 + Below(30);
        HfsNode* node = nullptr;
        if ((number >= bench_->validNodes && CachedNode(*bench_.tree, number) == nullptr) ||
            bench_->GetINode(number, &node, false) != kOk) {
            return;
        }
        const u32 size = 1u << game_.nodeShift;
        if (game_.others == Others::kDamage && bench_->SetDirty(node, 0, size) == kOk) {
            const u32 at = OneIn(2) ? Below(size) : OneIn(2) ? Below(14) : size - 1 - Below(40);
            const u32 block = bench_->header.blockSize;
            u8* byte = &node->bufs[at / block].data[at % block];
            *byte = static_cast<u8>(OneIn(3) ? Below(256) : *byte ^ 1u << Below(8));
        }
        node->refCount -= 1;
    }

    void Forget() {
        EachNode(bench_->nodeRoot,
                 [this](HfsNode* node) { ForgetRecords(&bench_.tree.tree, node); });
        bench_->rootHint = nullptr;
        std::fill(std::begin(bench_->lateNodes), std::end(bench_->lateNodes), nullptr);
        bench_->isAllOwn = false;
        bench_->noneFreeBelow = 0;
        bench_->findData.leadsAsOf = 0;
    }
    void ClearPaths() {
        path_.ClearPath();
        bench_->findData.ClearPath();
    }

    void Describe() {
        const CBTreeHfs& tree = *bench_.tree;
        out_ << std::dec << " hit " << tree.hitCount << " read " << tree.readCount << " valid "
             << tree.validNodes << " dirty " << tree.isDirty << " records "
             << tree.header.leafRecords << " free " << tree.header.freeNodes << " root "
             << tree.header.rootNode << " depth " << tree.header.treeDepth;
        DescribePath("own", tree.findData);
        DescribePath("other", path_);
        out_ << " tree ";
        DescribeTree(tree.nodeRoot);
        if (game_.inAnyBlocks) {
            bench_.volume.TakeCalls();
            bench_.capture.Take();
            return;
        }
        out_ << " modified";
        for (const list_head* at = tree.modifiedList.next; at != &tree.modifiedList;
             at = at->next) {
            out_ << " " << NodeOfModified(const_cast<list_head*>(at))->nodeNum;
        }
        for (const auto& call : bench_.volume.TakeCalls()) {
            out_ << " " << call;
        }
        for (const Event& event : bench_.capture.Take()) {
            out_ << " " << event;
        }
    }
    void DescribePath(const char* name, const HfsFindData& path) {
        out_ << " " << name << " " << path.level << path.valid << " " << path.searchCount;
        for (const HfsFindLevel& level : path.path) {
            if (level.node != nullptr) {
                out_ << " " << level.node->nodeNum << ":" << level.index;
            }
        }
    }
    void DescribeTree(const rb_node* link) {
        if (link == nullptr) {
            return;
        }
        HfsNode* node = NodeOf(const_cast<rb_node*>(link));
        u64 bytes = 0;
        for (u32 i = 0; i < bench_->header.blocksPerNode; ++i) {
            for (u32 at = 0; at < bench_->header.blockSize; ++at) {
                bytes = bytes * 1099511628211u + node->bufs[i].data[at] +
                        (node->bufs[i].dirty && !game_.inAnyBlocks ? 1 : 0);
            }
        }
        out_ << node->nodeNum << ((link->parentColor & 1) != 0 ? "b" : "r") << node->refCount << "="
             << bytes << "(";
        DescribeTree(link->left);
        out_ << ",";
        DescribeTree(link->right);
        out_ << ")";
    }

    Game game_;
    std::mt19937 random_;
    Bench bench_;
    HfsFindData path_;
    std::ostringstream out_;
    u32 keys_ = 0;
    unsigned size_ = 0;
    alignas(8) u8 key_[kKeyLengthSize + kMaxKeyLength + 6] = {};
    alignas(8) u8 record_[1u << 15] = {};
};

// Plays the same steps twice, one game after the other: the heap and the reports are shared.
void ExpectAlike(const Game& game, const Game& other) {
    constexpr u32 kSteps = 400;
    std::vector<std::string> seen;
    {
        Player player(game);
        for (u32 i = 0; i < kSteps; ++i) {
            seen.push_back(player.Step());
        }
    }
    Player player(other);
    for (u32 i = 0; i < kSteps; ++i) {
        ASSERT_EQ(seen[i], player.Step())
            << "step " << i << ", before it: " << (i > 0 ? seen[i - 1] : "");
    }
}

class Lockstep : public ::testing::TestWithParam<u32> {};

TEST_P(Lockstep, NothingShowsOfWhatIsRemembered) {
    constexpr std::pair<u32, u32> kShapes[] = {{9, 512},  {10, 512},  {11, 512},
                                               {12, 512}, {12, 4096}, {11, 1024}};
    const u32 seed = GetParam();
    const auto [nodeShift, mapBlock] = kShapes[seed % std::size(kShapes)];
    const Others others = static_cast<Others>(seed / std::size(kShapes) % 3);
    ExpectAlike({seed, nodeShift, mapBlock, others, false},
                {seed, nodeShift, mapBlock, others, true});
}

TEST_P(Lockstep, NodesInOneBlockAndInManyHaveTheSameBytes) {
    constexpr u32 kShifts[] = {11, 12, 13};
    const u32 seed = GetParam();
    const u32 nodeShift = kShifts[seed % std::size(kShifts)];
    const Others others = static_cast<Others>(seed / std::size(kShifts) % 3);
    // In two blocks no damage makes data lie in three.
    const u32 block = others == Others::kDamage ? 1u << (nodeShift - 1) : kLeastBlock;
    ExpectAlike({seed, nodeShift, 1u << nodeShift, others, false, true},
                {seed, nodeShift, block, others, false, true});
}

TEST_P(Lockstep, NothingShowsOfWhereBlocksLie) {
    constexpr std::pair<u32, u32> kShapes[] = {{10, 512}, {11, 512}, {12, 512}, {12, 2048}};
    const u32 seed = GetParam();
    const auto [nodeShift, mapBlock] = kShapes[seed % std::size(kShapes)];
    const Others others = static_cast<Others>(seed / std::size(kShapes) % 3);
    ExpectAlike({seed, nodeShift, mapBlock, others, false, false, true},
                {seed, nodeShift, mapBlock, others, false});
}

INSTANTIATE_TEST_SUITE_P(Seeds, Lockstep, ::testing::Range(0u, 72u));

}  // namespace
}  // namespace VELK::test
