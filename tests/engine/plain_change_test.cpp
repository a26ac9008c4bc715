// Changes done in one go, in a node of one block or of two in one piece, against the long way that
// nodes of two blocks go: with whatever damage to the bytes they go by, all give the same answer,
// say the same and leave the same bytes.
#include <memory>

#include "bench.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/separator.h"
#include "node_bench.h"

namespace VELK::test {
namespace {

constexpr u32 kNodeSize = 1024;
constexpr Geometry kOneBlock = {kNodeSize, kNodeSize};
constexpr Geometry kTwoBlocks = {kNodeSize, kNodeSize / 2};
constexpr Geometry kOnePiece = {kNodeSize, kNodeSize / 2, true};

struct Damage {
    u32 at;  // node offset
    u32 value;
    u32 width;  // bytes
};
std::ostream& operator<<(std::ostream& out, const Damage& damage) {
    return out << damage.value << " in " << damage.width << " bytes at " << damage.at;
}

// Kinds, counts, starts and key lengths that lead out of the ordinary, and some that do not.
std::vector<Damage> DamagesOf(const Bytes& content) {
    const u32 size = static_cast<u32>(content.size());
    const u32 count = Get16(content, kDescNumRecords);
    std::vector<Damage> damages;
    for (const u32 kind : {0xFFu, 0x00u, 0x01u, 0x02u, 0x03u}) {
        damages.push_back({kDescKind, kind, 1});
    }
    damages.push_back({kDescHeight, 5, 1});
    for (const u32 other : {0u, 1u, count - 1, count + 1, 504u, 505u, 510u, 511u, 512u, 0xFFFFu}) {
        damages.push_back({kDescNumRecords, other, 2});
    }
    const u32 free = Get16(content, size - 2 * (count + 1));
    for (u32 record = 0; record <= count; ++record) {
        const u32 slot = size - 2 * (record + 1);
        const u32 start = Get16(content, slot);
        for (const u32 other :
             {0u, 2u, 12u, 13u, 14u, start - 2, start - 1, start + 1, start + 2, start + 30, free,
              free + 2, slot, size - 2, size, 0x8000u, 0xFFFEu}) {
            damages.push_back({slot, other & 0xFFFF, 2});
        }
        if (record < count) {
            const u32 length = Get16(content, start);
            for (const u32 other : {0u, 1u, 5u, 6u, length - 2, length - 1, length + 1, length + 2,
                                    length + 20, 516u, 520u, 521u, 0xFFFFu}) {
                damages.push_back({start, other & 0xFFFF, 2});
            }
        }
    }
    return damages;
}

void Apply(const Damage& damage, Bytes* content) {
    if (damage.width == 1) {
        (*content)[damage.at] = static_cast<u8>(damage.value);
    } else {
        Put16(content, damage.at, damage.value);
    }
}

struct Outcome {
    int status = kOk;
    bool inserted = false;
    Events events;
    Bytes bytes;

    bool operator==(const Outcome&) const = default;
};
std::ostream& operator<<(std::ostream& out, const Outcome& outcome) {
    out << std::hex << outcome.status << std::dec << (outcome.inserted ? " inserted" : "");
    for (const Event& event : outcome.events) {
        out << " " << event;
    }
    return out << " " << ::testing::PrintToString(outcome.bytes);
}

enum class Form { kDisk, kHost, kHookOfKeys, kNoHooks };

Outcome Insert(const Geometry& geometry, const Bytes& content, int index, Form form) {
    NodeBench bench(geometry);
    const auto node = bench.Node(content);
    EXPECT_EQ(bench.tree.SetDirty(node->Get(), 0, kNodeSize), kOk);
    const HostKey host = HostCatKey(7, u"middle");
    const Bytes disk = DiskCatKey(7, u"middle");
    HfsConvert hooks = form == Form::kNoHooks ? HfsConvert{} : bench.tree.convert;
    if (form == Form::kHookOfKeys) {
        hooks.DataToDisk = nullptr;
    }
    const Bytes data = Pattern(21, 3);
    Outcome outcome;
    outcome.status = bench.tree._InsertKeyRecord(
        node->Get(), index,
        form == Form::kDisk ? reinterpret_cast<const BTreeKey*>(disk.data()) : host.Get(), 0,
        data.data(), 21, form == Form::kDisk ? nullptr : &hooks, &outcome.inserted);
    outcome.events = bench.capture.Take();
    outcome.bytes = node->Content();
    return outcome;
}

TEST(PlainInsertion, ComesToWhatTheLongWayDoes) {
    const Bytes content = LeafOf(kNodeSize, SomeRecords(3, 30));
    std::vector<Damage> damages = DamagesOf(content);
    damages.push_back({0, 0, 1});  // none
    for (const Damage& damage : damages) {
        Bytes damaged = content;
        Apply(damage, &damaged);
        for (const int index : {-1, 0, 1, 2, 3, 4}) {
            for (const Form form : {Form::kDisk, Form::kHost, Form::kHookOfKeys, Form::kNoHooks}) {
                const Outcome expected = Insert(kTwoBlocks, damaged, index, form);
                for (const Geometry& geometry : {kOneBlock, kOnePiece}) {
                    ASSERT_EQ(Insert(geometry, damaged, index, form), expected)
                        << damage << ", record " << index << ", form " << static_cast<int>(form)
                        << ", " << geometry;
                }
            }
        }
    }
}

// Takes the first record of a leaf out after somebody damaged that, or the root, behind the lookup.
constexpr u32 kKeys = 90;

class FirstRecordGoes {
public:
    explicit FirstRecordGoes(const Geometry& geometry) : bench_(Blocks(geometry)) {
        bench_.Create(10, CompareCatKeysCaseIns);
        for (u32 n = 0; n < kKeys; ++n) {
            const HostKey key = Key(n);
            EXPECT_EQ(bench_->InsertRecord(key, key.id, Pattern(30, n).data(), 30), kOk);
        }
        EXPECT_EQ(bench_->header.treeDepth, 2);
        bench_.Forget();
    }
    ~FirstRecordGoes() {
        bench_->findData.ClearPath();
        bench_->Dtor();
        bench_.capture.Take();
    }

    Bytes Root() { return Content(bench_->header.rootNode); }
    Bytes Leaf(u32 leaf) {
        StandOn(leaf);
        return Content(bench_->findData.path[1].node->nodeNum);
    }
    u32 Leaves() { return Get16(Root(), kDescNumRecords); }

    Outcome Play(u32 leaf, int level, const Damage& damage) {
        StandOn(leaf);
        HfsNode* root = bench_->findData.path[2].node;
        HfsNode* damaged = bench_->findData.path[level].node;
        EXPECT_EQ(bench_->SetDirty(root, 0, kNodeSize), kOk);
        EXPECT_EQ(bench_->SetDirty(damaged, 0, kNodeSize), kOk);
        for (u32 i = 0; i < damage.width; ++i) {
            const u32 at = damage.at + i;
            const u32 block = bench_->header.blockSize;
            damaged->bufs[at / block].data[at % block] =
                static_cast<u8>(damage.value >> 8 * (damage.width - 1 - i));
        }
        bench_.Forget();
        Outcome outcome;
        outcome.status = bench_->DeleteTree(1, nullptr);
        outcome.events = bench_.capture.Take();
        outcome.bytes = Content(root->nodeNum);
        return outcome;
    }

    // Whether the root takes the first key of a leaf at once that a damaged volume lent in the same
    // memory.
    bool ReplacesInOneMemory() {
        StandOn(1);
        HfsNode* leaf = bench_->findData.path[1].node;
        HfsNode* root = bench_->findData.path[2].node;
        EXPECT_EQ(bench_->SetDirty(root, 0, kNodeSize), kOk);
        u8* const own = leaf->bufs[0].data;
        leaf->bufs[0].data = root->bufs[0].data;
        const bool replaces = ReplacePlainSeparator(&*bench_.tree, &bench_->findData, 2, leaf);
        leaf->bufs[0].data = own;
        return replaces;
    }

private:
    static HostKey Key(u32 n) {
        return HostCatKey(5, std::u16string(1 + n % 7, static_cast<char16_t>(0x4E00 + n)));
    }
    // Puts the tree's own path on the first record of the nth leaf.
    void StandOn(u32 leaf) {
        for (u32 n = 0; n < kKeys; ++n) {
            const HostKey key = Key(n);
            bool found = false;
            EXPECT_EQ(
                bench_->FindEntry(key, key.id, nullptr, &found, nullptr, nullptr, nullptr, nullptr),
                kOk);
            const HfsFindLevel* path = bench_->findData.path;
            if (static_cast<u32>(path[2].index) == leaf && path[1].index == 0) {
                return;
            }
        }
        ADD_FAILURE() << "no leaf " << leaf;
    }
    Bytes Content(u32 number) {
        const HfsNode* node = CachedNode(*bench_.tree, number);
        Bytes bytes;
        for (u32 at = 0; at < kNodeSize; ++at) {
            const u32 block = bench_->header.blockSize;
            bytes.push_back(node->bufs[at / block].data[at % block]);
        }
        return bytes;
    }

    Bench bench_;
};

void ExpectAlike(u32 leaf, int level, const Damage& damage) {
    const Outcome expected = FirstRecordGoes(kTwoBlocks).Play(leaf, level, damage);
    for (const Geometry& geometry : {kOneBlock, kOnePiece}) {
        ASSERT_EQ(FirstRecordGoes(geometry).Play(leaf, level, damage), expected)
            << damage << ", leaf " << leaf << ", level " << level << ", " << geometry;
    }
}

TEST(PlainSeparator, ComesToWhatTheLongWayDoes) {
    const u32 leaves = FirstRecordGoes(kOneBlock).Leaves();
    ASSERT_GE(leaves, 4u);
    for (u32 leaf = 0; leaf < leaves; ++leaf) {
        ExpectAlike(leaf, 2, {0, 0, 1});  // none
        for (const Damage& damage : DamagesOf(FirstRecordGoes(kOneBlock).Root())) {
            ExpectAlike(leaf, 2, damage);
        }
        for (const Damage& damage : DamagesOf(FirstRecordGoes(kOneBlock).Leaf(leaf))) {
            ExpectAlike(leaf, 1, damage);
        }
        ASSERT_FALSE(HasFatalFailure());
    }
}

TEST(PlainSeparator, IsNotExchangedInTheMemoryItComesFrom) {
    FirstRecordGoes tree(kOneBlock);
    const Bytes before = tree.Root();
    EXPECT_FALSE(tree.ReplacesInOneMemory());
    EXPECT_EQ(tree.Root(), before);
}

}  // namespace
}  // namespace VELK::test
