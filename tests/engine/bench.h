// One tree on a volume in memory, with captures, a guarded heap and faults: the bench most engine
// tests stand on.
#pragma once

#include <gtest/gtest.h>

#include "capture.h"
#include "fault_service.h"
#include "geometry.h"
#include "heap_guard.h"
#include "keys.h"
#include "ledger.h"
#include "mem_volume.h"
#include "tree_image.h"

namespace VELK::test {

struct Bench {
    explicit Bench(const MemVolumeOptions& options, u32 fileId = kCatalogFileId)
        : volume(options), tree(&volume, fileId), faults(&volume.fs) {}

    void Load(const TreeImage& loaded) {
        image = loaded;
        volume.LoadFile(tree->fileId, image.bytes);
    }
    // Loads and opens; what was said and called until then is forgotten.
    void Open(const TreeImage& loaded) {
        Load(loaded);
        ASSERT_EQ(tree->Init(), kOk);
        Forget();
    }
    // A tree of the engine's own: 64 nodes, no records, keys of names in the order of `compare`.
    void Create(u32 nodeShift, CompareKeysFn compare) {
        tree->compareKeys = compare;
        tree->header.maxKeyLength = kCatMaxKeyLength;
        tree->header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
        const unsigned long long size = u64{64} << nodeShift;
        ASSERT_EQ(tree->Create(nodeShift, 0, &size), kOk);
    }
    void Forget() {
        capture.Take();
        volume.TakeCalls();
    }
    CBTreeHfs* operator->() { return &tree.tree; }

    Capture capture;
    HeapGuard heap;
    MemVolume volume;
    TestTree tree;
    FaultService faults;
    TreeImage image;
};

inline MemVolumeOptions Blocks(u32 mapBlockSize, bool hasJournal = false) {
    MemVolumeOptions options;
    options.mapBlockSize = mapBlockSize;
    options.hasJournal = hasJournal;
    return options;
}

inline MemVolumeOptions Blocks(const Geometry& geometry, bool hasJournal = false) {
    MemVolumeOptions options = Blocks(geometry.mapBlock, hasJournal);
    options.inOnePiece = geometry.inOnePiece;
    return options;
}

// A small tree of NthRecords: `leaves` leaves of two records each below index nodes of four.
inline TreeImage SmallTree(u32 nodeSize, u32 leaves = 3, u32 fileId = kCatalogFileId) {
    TreeShape shape;
    shape.fileId = fileId;
    shape.nodeSize = nodeSize;
    shape.recordsPerLeaf = 2;
    shape.childrenPerIndex = 4;
    return BuildTree(shape, NthRecords(fileId, leaves * 2, 8));
}

}  // namespace VELK::test
