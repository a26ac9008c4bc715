// A tree on a volume in memory, with everything a test of changes wants to ask it.
#pragma once

#include <gtest/gtest.h>

#include <memory>

#include "capture.h"
#include "flat_tree.h"
#include "geometry.h"
#include "heap_guard.h"
#include "keys.h"
#include "ledger.h"
#include "mem_volume.h"

namespace VELK::test {

class TreeOnVolume {
public:
    TreeOnVolume(const TreeImage& image, u32 mapBlock, bool hasJournal = true)
        : TreeOnVolume(image, Geometry{image.shape.nodeSize, mapBlock}, hasJournal) {}
    TreeOnVolume(const TreeImage& image, const Geometry& geometry, bool hasJournal = true)
        : volume_(Options(geometry, hasJournal)) {
        volume_.LoadTree(image);
        volume_.fs.ForkOf(image.shape.fileId)->clumpSize = image.shape.clumpSize;
        tree_ = std::make_unique<TestTree>(&volume_, image.shape.fileId);
        status_ = (*tree_)->Init();
    }
    // A refused change leaves dirty nodes behind; they are dropped, not written.
    ~TreeOnVolume() {
        (*tree_)->findData.ClearPath();
        capture.Take();
    }

    int OpenStatus() const { return status_; }
    CBTreeHfs* operator->() { return &tree_->tree; }
    CBTreeHfs& operator*() { return tree_->tree; }
    MemVolume& Volume() { return volume_; }
    HeapGuard& Heap() { return heap_; }

    int Insert(const HostKey& key, const Bytes& data) {
        return tree_->tree.InsertRecord(key.Get(), key.id, data.data(),
                                        static_cast<unsigned>(data.size()));
    }
    int InsertNth(u32 n, u32 dataSize, bool between = false) {
        return Insert(NthHostKey(FileId(), n, between), Pattern(dataSize, n));
    }
    int Delete(const HostKey& key) { return tree_->tree.DeleteRecord(key.Get(), key.id, false); }
    int DeleteNth(u32 n) { return Delete(NthHostKey(FileId(), n)); }

    u32 FileId() const { return tree_->tree.fileId; }
    const Bytes& Disk() { return volume_.Disk(FileId()); }

    // Hands all changes over and reads the file.
    FlatTree Flushed() {
        EXPECT_EQ(tree_->tree.Flush(0), kOk);
        return ReadFlat(Disk());
    }
    // Content of a cached node, else that on disk.
    Bytes Node(u32 number) {
        const HfsNode* node = CachedNode(tree_->tree, number);
        const BTHeaderMem& header = tree_->tree.header;
        if (node == nullptr) {
            return volume_.DiskNode(FileId(), header.nodeSize, number);
        }
        Bytes content;
        for (u32 b = 0; b < header.blocksPerNode; ++b) {
            content.insert(content.end(), node->bufs[b].data,
                           node->bufs[b].data + header.blockSize);
        }
        return content;
    }

private:
    static MemVolumeOptions Options(const Geometry& geometry, bool hasJournal) {
        MemVolumeOptions options;
        options.mapBlockSize = geometry.mapBlock;
        options.allocBlockSize = geometry.mapBlock;
        options.inOnePiece = geometry.inOnePiece;
        options.totalBlocks = 1u << 17;
        options.hasJournal = hasJournal;
        return options;
    }

    HeapGuard heap_;
    MemVolume volume_;

public:
    Capture capture;

private:
    std::unique_ptr<TestTree> tree_;
    int status_ = kOk;
};

}  // namespace VELK::test
