// See sparse_volume.h.
#include "sparse_volume.h"

#include <algorithm>
#include <cstring>

namespace VELK::test {

namespace {

SparseVolume* Self(void* self) {
    return static_cast<SparseVolume*>(self);
}

u8 Log2(u32 value) {
    u8 shift = 0;
    while ((1u << shift) < value) {
        ++shift;
    }
    return shift;
}

}  // namespace

const HfsVolumeOps SparseVolume::kVolumeOps = {OnMap, OnDirtyMeta, OnZero, OnResize};
const HfsCacheOps SparseVolume::kCacheOps = {OnRelease, OnModify, OnModify};
const HfsJournalOps SparseVolume::kJournalOps = {OnAccess, OnAccess};

SparseVolume::SparseVolume(u32 mapBlockSize, u32 allocBlockSize, u32 totalBlocks, bool hasJournal)
    : bitmapBytes_((totalBlocks + 7) / 8) {
    bitmap_.Attach(bitmapBytes_.data(), totalBlocks);
    fs.service.ops = &kVolumeOps;
    fs.service.self = this;
    fs.cache.ops = &kCacheOps;
    fs.cache.self = this;
    if (hasJournal) {
        fs.journal.ops = &kJournalOps;
        fs.journal.self = this;
    }
    fs.mapBlockSize = static_cast<u16>(mapBlockSize);
    fs.mapBlockShift = Log2(mapBlockSize);
    fs.allocBlockSize = allocBlockSize;
    fs.allocBlockShift = Log2(allocBlockSize);
    fs.totalBlocks = totalBlocks;
    fs.volumeSize = static_cast<u64>(totalBlocks) * allocBlockSize;
    fs.bitmap = &bitmap_;
}

SparseVolume::~SparseVolume() {
    EXPECT_EQ(lent_.size(), 0u) << "blocks were never released";
    EXPECT_EQ(fs.nesting, 0u);
}

void SparseVolume::SetFileSize(u32 fileId, u64 size) {
    HfsFork* fork = fs.ForkOf(fileId);
    const u32 blocks = static_cast<u32>((size + fs.allocBlockSize - 1) >> fs.allocBlockShift);
    bitmap_.ClearRun(0, fork->totalBlocks);
    bitmap_.SetRun(0, blocks);
    fork->totalBlocks = blocks;
    fork->extents[0] = {0, blocks};
    fork->logicalSize = size;
    fileSize_ = size;
}

void SparseVolume::PutNode(u32 nodeNum, const Bytes& node) {
    const u64 start = static_cast<u64>(nodeNum) * node.size();
    for (std::size_t at = 0; at < node.size(); at += fs.mapBlockSize) {
        const auto from = node.begin() + static_cast<std::ptrdiff_t>(at);
        disk_[start + at] = Bytes(from, from + fs.mapBlockSize);
    }
}

Bytes SparseVolume::DiskNode(u32 nodeSize, u32 nodeNum) const {
    Bytes node;
    const u64 start = static_cast<u64>(nodeNum) * nodeSize;
    for (u32 at = 0; at < nodeSize; at += fs.mapBlockSize) {
        const auto found = disk_.find(start + at);
        AppendBytes(&node, found != disk_.end() ? found->second : Bytes(fs.mapBlockSize, stale));
    }
    return node;
}

void SparseVolume::UseBlocks(u32 count) {
    bitmap_.SetRun(bitmap_.Size() - count, count);
}

int SparseVolume::OnMap(void* self, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32, u64 byteOffset,
                        u32 bytes, bool noRead, HfsBcbBuf* bufs) {
    SparseVolume* volume = Self(self);
    if (byteOffset + bytes > volume->fileSize_) {
        return kSparseNoRange;
    }
    for (u32 b = 0; b < bytes / fs->mapBlockSize; ++b) {
        auto block = std::make_unique<Block>();
        block->data.reset(new u8[fs->mapBlockSize]);
        block->offset = byteOffset + static_cast<u64>(b) * fs->mapBlockSize;
        const auto found = volume->disk_.find(block->offset);
        if (noRead || found == volume->disk_.end()) {
            std::memset(block->data.get(), volume->stale, fs->mapBlockSize);
        } else {
            std::copy(found->second.begin(), found->second.end(), block->data.get());
        }
        buffer_head* bh = reinterpret_cast<buffer_head*>(block.get());
        bufs[b].bh = bh;
        bufs[b].data = block->data.get();
        volume->lent_[bh] = std::move(block);
    }
    return kOk;
}

int SparseVolume::OnDirtyMeta(void* self, CFileSystemHfs* fs, buffer_head* bh) {
    SparseVolume* volume = Self(self);
    const Block& block = *volume->lent_.at(bh);
    volume->disk_[block.offset] = Bytes(block.data.get(), block.data.get() + fs->mapBlockSize);
    return kOk;
}

int SparseVolume::OnZero(void*, CFileSystemHfs*, HfsRuns*, HfsFork*, u8, u32, u64, u64) {
    return kOk;
}

int SparseVolume::OnResize(void* self, CFileSystemHfs* fs, HfsRuns*, HfsFork*, u8, u32 fileId,
                           u64 newSize) {
    SparseVolume* volume = Self(self);
    volume->resizes.push_back(newSize);
    EXPECT_EQ(fs->nesting, 1u);
    const u64 blocks = (newSize + fs->allocBlockSize - 1) >> fs->allocBlockShift;
    HfsFork* fork = fs->ForkOf(fileId);
    if (blocks > fork->totalBlocks && blocks - fork->totalBlocks > volume->bitmap_.GetZeros()) {
        return kSparseNoSpace;
    }
    const u64 before = fork->logicalSize;
    volume->SetFileSize(fileId, newSize);
    if (volume->liesAboutSize) {
        fork->logicalSize = before;
    }
    return kOk;
}

void SparseVolume::OnRelease(void* self, buffer_head* bh, int) {
    EXPECT_EQ(Self(self)->lent_.erase(bh), 1u) << "a block released twice";
}

void SparseVolume::OnModify(void*, buffer_head*) {}

int SparseVolume::OnAccess(void*, buffer_head*) {
    return kOk;
}

void SparseTreeTest::MakeVolume(u32 totalBlocks, u32 fileId) {
    Close();
    volume = std::make_unique<SparseVolume>(
        MapBlock(), allocBlockSize != 0 ? allocBlockSize : NodeSize(), totalBlocks, hasJournal);
    tree = std::make_unique<CBTreeHfs>();
    tree->volume = &volume->fs;
    tree->fileId = fileId;
    tree->convert = ConvertFor(fileId);
}

void SparseTreeTest::Open(u32 totalNodes, u32 usedNodes) {
    if (volume == nullptr || volume->FileSize() != 0) {
        MakeVolume();
    }
    u32 mapNodes = 0;
    while (HeadBits() + mapNodes * StepBits() < totalNodes) {
        mapNodes += 1;
    }
    const u32 used = std::max(usedNodes, 1 + mapNodes);
    volume->SetFileSize(tree->fileId, static_cast<u64>(totalNodes) * NodeSize());

    // A tree without records, with the numbers of the larger one put in.
    const TreeShape shape{.fileId = tree->fileId, .nodeSize = NodeSize(), .freeNodes = 0};
    Bytes head = BuildTree(shape, {}).Node(0);
    Put32(&head, kDescFLink, mapNodes != 0 ? 1 : 0);
    Put32(&head, kHeadTotalNodes, totalNodes);
    Put32(&head, kHeadFreeNodes, totalNodes - used);
    const Bytes bits = MapBits(NodeSize() - 256, 0, used);
    std::copy(bits.begin(), bits.end(), head.begin() + 248);
    volume->PutNode(0, head);
    for (u32 i = 0; i < mapNodes; ++i) {
        NodeImage map{.kind = kBTMapNode, .height = 0, .fLink = i + 1 == mapNodes ? 0 : i + 2};
        map.records.push_back(MapBits(NodeSize() - 20, HeadBits() + i * StepBits(), used));
        volume->PutNode(1 + i, map.Build(NodeSize()));
    }
    ASSERT_EQ(tree->Init(), kOk);
    capture.Take();
}

void SparseTreeTest::Close() {
    if (tree != nullptr) {
        tree->Dtor();
    }
    tree.reset();
    volume.reset();
    capture.Take();
}

Bytes SparseTreeTest::Live(u32 nodeNum) {
    const HfsNode* node = CachedNode(*tree, nodeNum);
    if (node == nullptr) {
        return volume->DiskNode(NodeSize(), nodeNum);
    }
    Bytes bytes;
    for (u32 b = 0; b < GetParam().Blocks(); ++b) {
        bytes.insert(bytes.end(), node->bufs[b].data, node->bufs[b].data + MapBlock());
    }
    return bytes;
}

void SparseTreeTest::Touch(u32 nodeNum) {
    HfsNode* node = nullptr;
    ASSERT_EQ(tree->GetINode(nodeNum, &node, false), kOk);
    node->refCount -= 1;
}

void SparseTreeTest::Poke(u32 nodeNum, u32 offset, const Bytes& bytes) {
    Touch(nodeNum);
    const HfsNode* node = CachedNode(*tree, nodeNum);
    for (u32 i = 0; i < bytes.size(); ++i) {
        node->bufs[(offset + i) / MapBlock()].data[(offset + i) % MapBlock()] = bytes[i];
    }
}

void SparseTreeTest::Poke8(u32 nodeNum, u32 offset, u32 value) {
    Poke(nodeNum, offset, {static_cast<u8>(value)});
}

void SparseTreeTest::Poke16(u32 nodeNum, u32 offset, u32 value) {
    Bytes bytes;
    Append16(&bytes, value);
    Poke(nodeNum, offset, bytes);
}

void SparseTreeTest::Poke32(u32 nodeNum, u32 offset, u32 value) {
    Bytes bytes;
    Append32(&bytes, value);
    Poke(nodeNum, offset, bytes);
}

bool SparseTreeTest::BitIsSet(u32 nodeNum) {
    u32 map = 0;
    u32 offset = 248;
    u32 bit = nodeNum;
    u32 capacity = HeadBits();
    while (bit >= capacity) {
        bit -= capacity;
        capacity = StepBits();
        map = Get32(Live(map), kDescFLink);
        offset = 14;
    }
    return (Live(map)[offset + bit / 8] & (0x80 >> (bit % 8))) != 0;
}

::testing::AssertionResult SparseTreeTest::MapIsSound() {
    ::testing::AssertionResult failure = ::testing::AssertionFailure();
    const u32 total = tree->header.totalNodes;
    u64 bits = 0;
    u64 clear = 0;
    u32 nodeNum = 0;
    do {
        const Bytes node = Live(nodeNum);
        const bool isHead = nodeNum == 0;
        const u32 start = isHead ? 248 : 14;
        const u32 end = NodeSize() - (isHead ? 8 : 6);
        const u32 slot = isHead ? NodeSize() - 6 : NodeSize() - 2;
        if (node[8] != (isHead ? 1 : 2) || Get16(node, 10) != (isHead ? 3u : 1u) ||
            Get16(node, slot) != start || Get16(node, slot - 2) != end) {
            return failure << "node " << nodeNum << " is no map node";
        }
        if (bits >= total && !isHead) {
            return failure << "map node " << nodeNum << " is not needed";
        }
        if (nodeNum >= total) {
            return failure << "map node " << nodeNum << " lies past the end";
        }
        for (u32 bit = 0; bit < (end - start) * 8 && bits + bit < total; ++bit) {
            clear += (node[start + bit / 8] & (0x80 >> (bit % 8))) == 0 ? 1u : 0u;
        }
        bits += (end - start) * 8;
        nodeNum = Get32(node, kDescFLink);
    } while (nodeNum != 0);
    if (bits < total) {
        return failure << bits << " bits for " << total << " nodes";
    }
    if (clear != tree->header.freeNodes) {
        return failure << clear << " clear bits, freeNodes " << tree->header.freeNodes;
    }
    return ::testing::AssertionSuccess();
}

}  // namespace VELK::test
