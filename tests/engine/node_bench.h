// Loose nodes on a tree without a file, for operations that change one node or two. The journal
// refuses write access when told to.
#pragma once

#include <gtest/gtest.h>

#include <memory>

#include "capture.h"
#include "geometry.h"
#include "heap_guard.h"
#include "keys.h"
#include "node_image.h"
#include "platform/heap.h"

namespace VELK::test {

constexpr int kRefused = 0x5A5A;

// Geometries of the tests of changes: one block, two, many, and these in one piece.
inline std::vector<Geometry> ChangeGeometries() {
    return {{512, 512},  {1024, 512},  {1024, 512, true}, {4096, 4096},      {4096, 1024},
            {4096, 512}, {8192, 4096}, {4096, 512, true}, {8192, 4096, true}};
}

// Record n of the catalog tree, and one between it and the next.
inline Bytes NthRecord(u32 n, u32 dataSize, bool between = false) {
    return Record(NthDiskKey(kCatalogFileId, n, between), Pattern(dataSize, n));
}
inline std::vector<Bytes> SomeRecords(u32 count, u32 dataSize, u32 from = 0) {
    std::vector<Bytes> records;
    for (u32 n = from; n < from + count; ++n) {
        records.push_back(NthRecord(n, dataSize));
    }
    return records;
}

inline Bytes LeafOf(u32 nodeSize, const std::vector<Bytes>& records) {
    NodeImage image;
    image.records = records;
    return image.Build(nodeSize);
}

class NodeBench {
public:
    explicit NodeBench(const Geometry& geometry) : geometry_(geometry) {
        fs.journal.ops = &kJournal;
        fs.journal.self = this;
        tree.volume = &fs;
        tree.header = GeometryHeader(geometry.nodeSize, geometry.mapBlock);
        tree.convert = ConvertFor(kCatalogFileId);
        tree.compareKeys = CompareCatKeysCaseBin;
    }
    ~NodeBench() { velk_heap_free(tree.scratch); }

    std::unique_ptr<LooseNode> Node(const Bytes& content, u32 number = 1) const {
        return std::make_unique<LooseNode>(content, geometry_.mapBlock, number, false,
                                           geometry_.inOnePiece);
    }

    // The nth request for write access from now on is refused.
    void RefuseAccess(u32 nth) { refuseIn_ = nth; }

    HeapGuard heap;
    Capture capture;
    CFileSystemHfs fs;
    CBTreeHfs tree;

private:
    static int OnWriteAccess(void* self, buffer_head*) {
        NodeBench* bench = static_cast<NodeBench*>(self);
        return bench->refuseIn_ != 0 && --bench->refuseIn_ == 0 ? kRefused : kOk;
    }
    static int OnCreateAccess(void*, buffer_head*) { return kOk; }
    static constexpr HfsJournalOps kJournal = {OnWriteAccess, OnCreateAccess};

    Geometry geometry_;
    u32 refuseIn_ = 0;
};

// Nodes of eight blocks. The slots of 300 records of 6 bytes reach over a block end.
class ManyBlocksTest : public ::testing::Test {
protected:
    static std::vector<Bytes> Tiny(u32 count) {
        std::vector<Bytes> records;
        for (u32 n = 0; n < count; ++n) {
            records.push_back({0, 2, static_cast<u8>(n >> 8), static_cast<u8>(n), 0xD0, 0x0D});
        }
        return records;
    }

    NodeBench bench_{Geometry{4096, 512}};
};

// Numbers of the blocks marked dirty.
inline std::vector<u32> DirtyBlocks(const LooseNode& node) {
    std::vector<u32> blocks;
    for (u32 b = 0; b < node.header.blocksPerNode; ++b) {
        if (node->bufs[b].dirty) {
            blocks.push_back(b);
        }
    }
    return blocks;
}

class NodeTest : public GeometryTest {
protected:
    NodeTest() : bench_(GetParam()), tree_(bench_.tree) {}

    NodeBench bench_;
    CBTreeHfs& tree_;
};

}  // namespace VELK::test
