// The tree engine over a volume in memory. The volume keeps the tree file as one stretch of address
// space and lends its blocks in place, as a driver with a page cache would.
#include <sys/mman.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "hfs/treehfs.h"
#include "hfs/volume/convert.h"
#include "platform/heap.h"
#include "store.h"

namespace bench {

namespace {

using namespace VELK;

constexpr u32 kNodeSize = 4096;
constexpr u32 kNodeShift = 12;
constexpr u64 kBytesPerRecord = 400;  // that the tree file takes, about
constexpr u64 kHeapPerRecord = 16;    // that its cached nodes take besides, about
constexpr u64 kAddressSpace = u64{8} << 30;

// The tree file; grows within address space that was set aside.
class RamVolume {
public:
    // `supplied` bytes are touched now: what the system needs to supply memory is not measured.
    RamVolume(u32 mapBlock, Lending lending, u64 supplied) : lending_(lending) {
        void* space = mmap(nullptr, kAddressSpace, PROT_READ | PROT_WRITE,
                           MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
        if (space == MAP_FAILED) {
            std::perror("mmap");
            std::abort();
        }
        madvise(space, kAddressSpace, MADV_HUGEPAGE);
        bytes_ = static_cast<u8*>(space);
        std::memset(bytes_, 0, supplied);
        fs.service = {&kOps, this};
        fs.cache.ops = &kCacheOps;
        fs.cache.self = this;
        fs.mapBlockSize = static_cast<u16>(mapBlock);
        fs.mapBlockShift = static_cast<u8>(__builtin_ctz(mapBlock));
        fs.allocBlockSize = kNodeSize;
        fs.allocBlockShift = kNodeShift;
        fs.totalBlocks = static_cast<u32>(kAddressSpace >> kNodeShift);
        fs.volumeSize = u64{1} << 29;  // decides the first size of the tree file only
        fs.catalogFork.clumpSize = 4u << 20;
    }
    ~RamVolume() { munmap(bytes_, kAddressSpace); }
    RamVolume(const RamVolume&) = delete;
    RamVolume& operator=(const RamVolume&) = delete;

    CFileSystemHfs fs;

private:
    static int Map(void* self, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32, u64 offset,
                   u32 bytes, bool, HfsBcbBuf* bufs) {
        RamVolume* volume = static_cast<RamVolume*>(self);
        if (offset + bytes > fs->catalogFork.logicalSize) {
            return kErrInvalid;
        }
        for (u32 at = 0; at < bytes; at += fs->mapBlockSize, ++bufs) {
            const u32 place =
                volume->lending_ == Lending::kInOnePiece ? at : bytes - fs->mapBlockSize - at;
            bufs->data = volume->bytes_ + offset + place;
            bufs->bh = reinterpret_cast<buffer_head*>(bufs->data);
        }
        return kOk;
    }
    static int DirtyMeta(void*, CFileSystemHfs*, buffer_head*) { return kOk; }
    static int Zero(void*, CFileSystemHfs*, HfsRuns*, HfsFork*, u8, u32, u64, u64) { return kOk; }
    static int Resize(void*, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32, u64 size) {
        fs->catalogFork.logicalSize = size;
        fs->catalogFork.totalBlocks = static_cast<u32>(size >> kNodeShift);
        return size <= kAddressSpace ? kOk : kErrNoSpace;
    }
    static void Release(void*, buffer_head*, int) {}
    static void Modify(void*, buffer_head*) {}

    static constexpr HfsVolumeOps kOps = {Map, DirtyMeta, Zero, Resize};
    static constexpr HfsCacheOps kCacheOps = {Release, Modify, Modify};

    u8* bytes_;
    Lending lending_;  // apart: a node's blocks lie in reverse order
};

// Lets the heap touch `bytes` now, as the volume did.
void SupplyHeap(u64 bytes) {
    constexpr u64 kBlock = 4096;
    std::vector<void*> blocks;
    for (u64 at = 0; at < bytes; at += kBlock) {
        blocks.push_back(velk_heap_alloc(kBlock));
        if (blocks.back() == nullptr) {
            std::abort();
        }
        std::memset(blocks.back(), 0, kBlock);
    }
    for (void* block : blocks) {
        velk_heap_free(block);
    }
}

class TreehfsStore : public Store {
public:
    TreehfsStore(const Workload& load, u32 mapBlock, Lending lending)
        : load_(load), volume_(mapBlock, lending, kBytesPerRecord * load.count) {
        tree_.volume = &volume_.fs;
        tree_.fileId = kCatalogFileId;
        tree_.compareKeys = CompareCatKeysCaseIns;
        tree_.header.maxKeyLength = kCatMaxKeyLength;
        tree_.header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
        tree_.keyCompareType = kKeyCompareFolding;
        tree_.convert.KeyToDisk = ConvertFor(kCatalogFileId).KeyToDisk;
        SupplyHeap(kHeapPerRecord * load.count);
        const unsigned long long size = 4u << 20;
        if (tree_.Create(kNodeShift, 0, &size) != kOk) {
            std::abort();
        }
    }
    ~TreehfsStore() override {
        path_.ClearPath();
        tree_.Dtor();
    }

    void EndPhase() override {
        path_.ClearPath();
        if (tree_.Flush(0) != kOk) {
            std::abort();
        }
    }
    bool Insert(const Record& record, bool) override {
        return tree_.InsertRecord(record.host, record.Parent(), record.data, record.size) == kOk;
    }
    int Lookup(const Record& record, u8* out) override {
        unsigned size = 0;
        return tree_.FindRecord(record.host, record.Parent(), out, kLargestData, &size, &path_) ==
                       kOk
                   ? static_cast<int>(size)
                   : -1;
    }
    bool Update(const Record& record) override {
        bool found = false;
        return tree_.FindEntry(Key(record.host), record.Parent(), nullptr, &found, nullptr, nullptr,
                               nullptr, nullptr) == kOk &&
               found && tree_.UpdateKeyAndRecord(nullptr, record.data) == kOk;
    }
    bool Delete(const Record& record) override {
        return tree_.DeleteRecord(record.host, record.Parent(), false) == kOk;
    }
    u32 Scan(Digest* sum) override { return Walk(0, sum, false); }
    u32 List(u32 parent, Digest* sum) override { return Walk(parent, sum, true); }
    u64 Bytes() override { return volume_.fs.catalogFork.logicalSize; }
    bool Less(u32 a, u32 b) const override {
        if (load_.parent[a] != load_.parent[b]) {
            return load_.parent[a] < load_.parent[b];
        }
        alignas(8) u8 other[kLargestKey];
        tree_.convert.KeyToDisk(other, load_.Host(b).data());
        return CompareCatKeysCaseIns(Key(load_.Host(a).data()), load_.parent[a], Key(other)) < 0;
    }

private:
    static const BTreeKey* Key(const void* bytes) { return static_cast<const BTreeKey*>(bytes); }

    // From the first key of `parent` on; keys are delivered because a listing needs them.
    u32 Walk(u32 parent, Digest* sum, bool oneFolder) {
        alignas(8) u8 key[kKeyLengthSize + kMaxKeyLength + 6];
        std::memset(key, 0, kKeyLengthSize + kCatKeyFixed);  // no name
        key[0] = kCatKeyFixed;
        u8 data[kLargestData];
        bool found = false;
        if (tree_.FindEntry(Key(key), parent, &path_, &found, nullptr, nullptr, nullptr, nullptr) !=
            kOk) {
            return 0;
        }
        u32 count = 0;
        for (int step = 0;; step = 1) {
            unsigned size = 0;
            unsigned keySize = 0;
            if (tree_.IncPos(step, data, sizeof data, &size, key, sizeof key, &keySize, &path_) !=
                kOk) {
                break;
            }
            u32 owner;
            std::memcpy(&owner, key + kCatKeyParentId, 4);
            if (oneFolder && __builtin_bswap32(owner) != parent) {
                break;
            }
            sum->Add(data, size);
            count += 1;
        }
        return count;
    }

    const Workload& load_;
    RamVolume volume_;
    CBTreeHfs tree_;
    HfsFindData path_;
};

}  // namespace

std::unique_ptr<Store> MakeTreehfs(const Workload& load, std::uint32_t blocksPerNode,
                                   Lending lending) {
    return std::make_unique<TreehfsStore>(load, kNodeSize / blocksPerNode, lending);
}

}  // namespace bench
