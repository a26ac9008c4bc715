// A volume whose buffer cache lends what two nodes share as one piece of memory, as it is when
// nodes of an odd size overlap: a change to one is a change to the other, and nothing may leave its
// block.
#include <map>

#include "hfs/treehfs/bytes.h"
#include "tree_test.h"

namespace VELK::test {
namespace {

struct SharedCache {
    Bytes file;
    std::map<u64, std::unique_ptr<u8[]>> blocks;

    static int Map(void* self, CFileSystemHfs*, HfsRuns*, HfsFork*, u8, u32, u64 offset, u32 bytes,
                   bool, HfsBcbBuf* bufs) {
        auto* cache = static_cast<SharedCache*>(self);
        for (u32 i = 0; i < bytes / 512; ++i) {
            std::unique_ptr<u8[]>& block = cache->blocks[offset + 512 * i];
            if (block == nullptr) {
                block = std::make_unique<u8[]>(512);
                std::memcpy(block.get(), cache->file.data() + offset + 512 * i, 512);
            }
            bufs[i].bh = reinterpret_cast<buffer_head*>(block.get());
            bufs[i].data = block.get();
        }
        return kOk;
    }
    static int DirtyMeta(void*, CFileSystemHfs*, buffer_head*) { return kOk; }
    static int Zero(void*, CFileSystemHfs*, HfsRuns*, HfsFork*, u8, u32, u64, u64) { return kOk; }
    static int Resize(void*, CFileSystemHfs*, HfsRuns*, HfsFork*, u8, u32, u64) { return kOk; }
    static void Release(void*, buffer_head*, int) {}
    static void Modify(void*, buffer_head*) {}
    static constexpr HfsVolumeOps kVolume = {Map, DirtyMeta, Zero, Resize};
    static constexpr HfsCacheOps kCache = {Release, Modify, Modify};
};

class OnSharedCache {
public:
    explicit OnSharedCache(SharedCache* cache) {
        volume_.LoadFile(kCatalogFileId, cache->file);
        volume_.fs.service = {&SharedCache::kVolume, cache};
        volume_.fs.cache.ops = &SharedCache::kCache;
    }
    ~OnSharedCache() { capture_.Take(); }
    MemVolume* Get() { return &volume_; }

private:
    HeapGuard heap_;
    MemVolume volume_;
    Capture capture_;
};

constexpr u32 kSize = 1536;  // three blocks, but the nodes follow one another by 512 bytes

Bytes Separator(u32 parent, const std::u16string& name, u32 child) {
    return Record(DiskCatKey(parent, name), child);
}

// Node 0 of a tree whose nodes up to `used` are in use.
void PutHeader(Bytes* file, u16 depth, u32 root, u32 leaf, u32 used) {
    u8* head = file->data();
    head[kDescKind] = kBTHeaderNode;
    PutBe16(head + kDescNumRecords, 3);
    PutBe16(head + kHeadTreeDepth, depth);
    PutBe32(head + kHeadRootNode, root);
    PutBe32(head + kHeadLeafRecords, 40);
    PutBe32(head + kHeadFirstLeafNode, leaf);
    PutBe32(head + kHeadLastLeafNode, leaf);
    PutBe16(head + kHeadNodeSize, kSize);
    PutBe16(head + kHeadMaxKeyLength, kCatMaxKeyLength);
    PutBe32(head + kHeadTotalNodes, 30);
    PutBe32(head + kHeadFreeNodes, 10);
    PutBe32(head + kHeadAttributes, kBTBigKeysMask | kBTVariableIndexKeysMask);
    PutBe16(head + kSize - 2, 14);
    PutBe16(head + kSize - 4, 120);
    PutBe16(head + kSize - 6, 248);
    PutBe16(head + kSize - 8, kSize - 8);
    for (u32 node = 0; node <= used; ++node) {
        head[248 + node / 8] = static_cast<u8>(head[248 + node / 8] | 0x80u >> node % 8);
    }
}

// A leaf (node 9) whose parent (6) is full, and whose first key lies in a block that it shares with
// its parent's left sibling (10), where records will come to lie.
Bytes TreeFile() {
    Bytes file(32 * 512);
    const auto put = [&](u32 number, const Bytes& node) {
        std::copy(node.begin(), node.end(), file.begin() + number * 512);
    };
    NodeImage root;
    root.kind = kBTIndexNode;
    root.height = 3;
    root.records = {Separator(1, u"a", 10), Separator(100, u"a", 6)};
    put(3, root.Build(kSize));

    const std::u16string name(20, char16_t{0x0101});
    NodeImage parent;
    parent.kind = kBTIndexNode;
    parent.height = 2;
    parent.bLink = 10;
    for (u32 n = 0; n < 28; ++n) {
        parent.records.push_back(n == 20 ? Separator(140, u"a", 9)
                                         : Separator(100 + 2 * n, name, 20));
    }
    put(6, parent.Build(kSize));
    NodeImage left;
    left.kind = kBTIndexNode;
    left.height = 2;
    left.fLink = 6;
    for (u32 n = 0; n < 4; ++n) {
        left.records.push_back(Separator(1 + n, name, 20));
    }
    put(10, left.Build(kSize));

    // The leaf's second block is the first one of node 10.
    u8* leaf = file.data() + 9 * 512;
    leaf[kDescKind] = 0xFF;
    leaf[kDescHeight] = 1;
    PutBe16(leaf + kDescNumRecords, 1);
    const Bytes record = Record(DiskCatKey(140, u"c"), Pattern(4, 1));
    std::copy(record.begin(), record.end(), leaf + 912);
    PutBe16(leaf + kSize - 2, 912);
    PutBe16(leaf + kSize - 4, 912 + static_cast<u32>(record.size()));

    PutHeader(&file, 3, 3, 9, 12);
    return file;
}

// A full leaf (node 6) below a root (3), with nothing between them in the file.
TEST(SharedBuffers, SeparatorsOfBothHalvesAreCopied) {
    SharedCache cache;
    cache.file.resize(32 * 512);
    const auto put = [&](u32 number, const Bytes& node) {
        std::copy(node.begin(), node.end(), cache.file.begin() + number * 512);
    };
    NodeImage root;
    root.kind = kBTIndexNode;
    root.height = 2;
    root.records = {Separator(20, u"a", 6)};
    put(3, root.Build(kSize));
    NodeImage leaf;
    for (const u32 parent : {20u, 30u, 40u}) {
        leaf.records.push_back(Record(DiskCatKey(parent, u"a"), Pattern(480, parent)));
    }
    put(6, leaf.Build(kSize));
    PutHeader(&cache.file, 2, 3, 6, 11);

    OnSharedCache volume(&cache);
    TestTree tree(volume.Get(), kCatalogFileId);
    ASSERT_EQ((*tree).Init(), kOk);
    const Bytes data = Pattern(480, 10);
    const auto key = [](u32 parent) { return HostCatKey(parent, u"a"); };
    ASSERT_EQ((*tree).InsertRecord(key(10), 10, data.data(), 480), kOk);
    EXPECT_EQ((*tree).header.lastLeafNode, 12u);
    for (const u32 parent : {10u, 20u, 30u, 40u}) {
        u8 record[480];
        unsigned size = 0;
        EXPECT_EQ((*tree).FindRecord(key(parent), parent, record, 480, &size, nullptr), kOk);
        EXPECT_EQ(Bytes(record, record + size), Pattern(480, parent));
    }
    (*tree).findData.ClearPath();
}

// The leaf's separator follows its new first key. While the parent makes room for it, the records
// that move change the key it is taken from, and the key's length.
TEST(SharedBuffers, SeparatorThatLiesInTheSiblingOfItsParent) {
    SharedCache cache;
    cache.file = TreeFile();
    OnSharedCache volume(&cache);
    TestTree tree(volume.Get(), kCatalogFileId);
    ASSERT_EQ((*tree).Init(), kOk);
    const HostKey key = HostCatKey(140, std::u16string(40, u'b'));
    const Bytes data = Pattern(4, 2);
    const int status = (*tree).InsertRecord(key, key.id, data.data(), 4);
    EXPECT_EQ(status, kOk);
    (*tree).findData.ClearPath();
}

}  // namespace
}  // namespace VELK::test
