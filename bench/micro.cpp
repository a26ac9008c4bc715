// The smallest pieces of the engine's work, each alone: an accessor, the comparators, moves inside
// a node, the search of a map for a clear bit, and a cached node by its number.
#include <benchmark/benchmark.h>

#include <cstring>
#include <memory>
#include <vector>

#include "hfs/treehfs.h"
#include "hfs/volume/convert.h"
#include "memory_volume.h"
#include "platform/bitmap.h"

namespace VELK::bench {

namespace {

constexpr u32 kNodeShift = 12;
constexpr u32 kDataSize = 248;

void Put16(u8* bytes, u32 value) {
    const u16 number = static_cast<u16>(value);
    std::memcpy(bytes, &number, sizeof number);
}

// A catalog key of parent 16 in host order; its name ends in `number`.
struct NumberedKey {
    explicit NumberedKey(u32 number) {
        constexpr u32 kUnits = 16;
        constexpr u32 kParent = 16;
        Put16(bytes, kCatKeyFixed + 2 * kUnits);
        std::memcpy(bytes + kCatKeyParentId, &kParent, sizeof kParent);
        Put16(bytes + kCatKeyNameLength, kUnits);
        for (u32 i = kUnits; i > 0; --i, number /= 10) {
            Put16(bytes + kCatKeyName + 2 * (i - 1), '0' + number % 10);
        }
    }
    const BTreeKey* Get() const { return reinterpret_cast<const BTreeKey*>(bytes); }

    alignas(8) u8 bytes[64] = {};
};

// A catalog tree of records with ascending keys.
struct Catalog {
    explicit Catalog(u32 records) : volume(kNodeShift) {
        tree.volume = &volume.fs;
        tree.fileId = kCatalogFileId;
        tree.convert = ConvertFor(kCatalogFileId);
        tree.convert.DataToDisk = nullptr;
        tree.compareKeys = CompareCatKeysCaseIns;
        tree.header.maxKeyLength = kCatMaxKeyLength;
        tree.header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
        tree.keyCompareType = kKeyCompareFolding;
        isSound = tree.Create(kNodeShift, 0, nullptr) == kOk;
        const u8 data[kDataSize] = {};
        for (u32 i = 0; i < records && isSound; ++i) {
            const NumberedKey key(i);
            isSound = tree.InsertRecord(key.bytes, 16, data, kDataSize) == kOk;
        }
    }
    ~Catalog() {
        tree.Flush(0);
        tree.Dtor();
    }

    MemoryVolume volume;
    CBTreeHfs tree;
    bool isSound;
};

void GetKey(benchmark::State& state) {
    Catalog catalog(8);
    HfsNode* leaf = nullptr;
    if (!catalog.isSound ||
        catalog.tree.GetINode(catalog.tree.header.rootNode, &leaf, false) != 0) {
        return state.SkipWithError("no tree");
    }
    int index = 0;
    for (auto _ : state) {
        NodeKey key;
        benchmark::DoNotOptimize(leaf->GetKey(&catalog.tree.header, index, &key));
        benchmark::DoNotOptimize(key);
        index = (index + 1) & 7;
    }
    leaf->refCount -= 1;
}
BENCHMARK(GetKey);

// Keys that differ in the last unit only.
void Compare(benchmark::State& state, CompareKeysFn compare) {
    const NumberedKey search(1000001);
    const NumberedKey other(1000002);
    alignas(8) u8 stored[64] = {};
    ConvertFor(kCatalogFileId).KeyToDisk(stored, other.bytes);
    for (auto _ : state) {
        benchmark::DoNotOptimize(
            compare(search.Get(), 16, reinterpret_cast<const BTreeKey*>(stored)));
    }
}
BENCHMARK_CAPTURE(Compare, folded, CompareCatKeysCaseIns);
BENCHMARK_CAPTURE(Compare, binary, CompareCatKeysCaseBin);

// Opens a gap in front of seven records and closes it again.
void InsertAndDeleteRecord(benchmark::State& state) {
    Catalog catalog(7);
    HfsNode* leaf = nullptr;
    if (!catalog.isSound ||
        catalog.tree.GetINode(catalog.tree.header.rootNode, &leaf, false) != 0) {
        return state.SkipWithError("no tree");
    }
    alignas(8) u8 stored[64] = {};
    ConvertFor(kCatalogFileId).KeyToDisk(stored, NumberedKey(0).bytes);
    const u8 data[kDataSize] = {};
    for (auto _ : state) {
        const int inserted = catalog.tree._InsertKeyRecord(
            leaf, 0, reinterpret_cast<const BTreeKey*>(stored), 0, data, kDataSize, nullptr);
        if (inserted != kOk || catalog.tree._DeleteRecord(leaf, 0) != kOk) {
            state.SkipWithError("a move failed");
            break;
        }
    }
    leaf->refCount -= 1;
}
BENCHMARK(InsertAndDeleteRecord);

// The only clear bit stands at the end of a map of `range` bytes.
void FirstClearBit(benchmark::State& state) {
    std::vector<u8> map(static_cast<std::size_t>(state.range(0)), 0xFF);
    map.back() = 0xFE;
    for (auto _ : state) {
        benchmark::DoNotOptimize(GetFreeBitPosBe(map.data(), 0, map.size() * 8));
    }
}
BENCHMARK(FirstClearBit)->Arg(256)->Arg(3840)->Arg(32000);

// A cached node by its number, in an order the processor cannot guess.
void NodeByNumber(benchmark::State& state) {
    const u32 nodes = static_cast<u32>(state.range(0));
    MemoryVolume volume(9);
    CBTreeHfs tree;
    tree.volume = &volume.fs;
    tree.fileId = kCatalogFileId;
    tree.compareKeys = CompareCatKeysCaseIns;
    tree.header.maxKeyLength = kCatMaxKeyLength;
    tree.header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
    const unsigned long long size = u64{nodes} * 512;
    bool isSound = tree.Create(9, 0, &size) == kOk;
    for (u32 i = 1; i < nodes && isSound; ++i) {
        HfsNode* node = nullptr;
        isSound = tree.GetINode(i, &node, true) == kOk;
        if (isSound) {
            node->refCount -= 1;
        }
    }
    u64 random = 1;
    for (auto _ : state) {
        random = random * 6364136223846793005u + 1442695040888963407u;
        HfsNode* node = nullptr;
        if (!isSound ||
            tree.GetINode(static_cast<u32>((random >> 33) % nodes), &node, false) != 0) {
            state.SkipWithError("no such node");
            break;
        }
        node->refCount -= 1;
    }
    tree.Flush(0);
    tree.Dtor();
}
BENCHMARK(NodeByNumber)->Arg(1000)->Arg(10000)->Arg(100000)->Arg(1000000);

}  // namespace

}  // namespace VELK::bench

BENCHMARK_MAIN();
