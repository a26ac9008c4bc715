// Stepping along the leaf chain and positions as 64-bit numbers. Only path[1] moves: after a step
// over the end of a leaf the upper levels no longer lead to the position.
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/path_deliver.h"
#include "hfs/treehfs/path_level.h"
#include "hfs/treehfs/plain_record.h"
#include "hfs/treehfs/prefetch.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

u32 Least(u32 a, u32 b) {
    return a < b ? a : b;
}

// Gives the current leaf up before its sibling is loaded. A clean leaf nobody else holds leaves the
// cache, so that a scan does not fill it; one with changes stays until the load drops it.
void LeaveLeaf(CBTreeHfs* tree, HfsFindData* path) {
    path->valid = false;
    HfsFindLevel* leaf = &path->path[1];
    HfsNode* node = leaf->node;
    if (!HasDirtyBlock(&tree->header, node)) {
        leaf->node = nullptr;
        DropNode(tree, node);
    }
}

// Steps from the current leaf to node `sibling` on one side; the index becomes 0.
int EnterLeaf(CBTreeHfs* tree, u32 sibling, Side side, HfsFindData* path) {
    const HintedWay way = WayBeside(tree, path->path[1].node, side);
    LeaveLeaf(tree, path);
    path->leadsAsOf = 0;
    const int status = LoadLevel(tree, 1, sibling, way, path);
    if (status == kOk) {
        HfsNode* leaf = path->path[1].node;
        PrefetchRecords(&tree->header, leaf, 0);
        PrefetchLinks(leaf);
        PrefetchSibling(tree, leaf, side);  // the one after
    }
    return status;
}

// A chain of leaves cannot be longer than the tree has nodes: a longer one is a ring.
int CountHop(const CBTreeHfs* tree, u32* hops) {
    *hops += 1;
    return *hops > tree->header.totalNodes ? Fail(kErrCorrupt, kReasonTree, 9030) : kOk;
}

int StepForward(CBTreeHfs* tree, u32 count, HfsFindData* path) {
    HfsFindLevel* leaf = &path->path[1];
    u32 hops = 0;
    for (;;) {
        const u32 available = NumRecords(leaf->node) - static_cast<u32>(leaf->index);
        if (available > count) {
            leaf->index += static_cast<s32>(count);
            return kOk;
        }
        count -= available;
        const u32 next = FLink(leaf->node);
        if (next == 0) {
            return kErrNotFound;
        }
        int status = CountHop(tree, &hops);
        if (status == kOk) {
            status = EnterLeaf(tree, next, Side::kRight, path);
        }
        HFS_TRY(status, 3286);
        path->valid = true;
        HFS_ASSERT(leaf->index == 0, 3292);
    }
}

// Steps back over `count` records. A step that leaves a leaf lands on record 0 of the leaf reached,
// after one further leaf for each record still to go: callers rely on it.
int StepBackward(CBTreeHfs* tree, u32 count, HfsFindData* path) {
    HfsFindLevel* leaf = &path->path[1];
    const u32 index = static_cast<u32>(leaf->index);
    if (count <= index) {
        leaf->index = static_cast<s32>(index - count);
        return kOk;
    }
    u32 remaining = count - index - 1;
    u32 hops = 0;
    for (;;) {
        leaf->index = static_cast<s32>(NumRecords(leaf->node)) - 1;
        const u32 previous = BLink(leaf->node);
        if (previous == 0) {
            return kErrNotFound;
        }
        int status = CountHop(tree, &hops);
        if (status == kOk) {
            status = EnterLeaf(tree, previous, Side::kLeft, path);
        }
        HFS_TRY(status, 3257);
        path->valid = true;
        if (remaining == 0) {
            return kOk;
        }
        remaining -= 1;
    }
}

// Delivers key and record at the position.
struct Delivery {
    void* record;
    unsigned recordCapacity;
    unsigned* recordSize;
    void* keyOut;
    unsigned keyCapacity;
    unsigned* keySize;
};

int Fetch(CBTreeHfs* tree, const HfsFindLevel& leaf, bool withKey, RecordView* record) {
    const int status = withKey ? FetchKey(tree, leaf.node, leaf.index, record)
                               : FetchData(tree, leaf.node, leaf.index, record);
    if (status != kOk && status != kErrNoMemory) {
        Report(status, 3305);
    }
    return status;
}

[[gnu::always_inline]] inline int Deliver(CBTreeHfs* tree, const HfsFindLevel& leaf,
                                          const Delivery& to) {
    RecordView record;
    if (to.keyOut == nullptr ||
        HFS_UNLIKELY(!ViewPlain(tree, leaf.node, static_cast<u32>(leaf.index), &record))) {
        RecordView fetched;
        const int status = Fetch(tree, leaf, to.keyOut != nullptr, &fetched);
        if (HFS_UNLIKELY(status != kOk)) {
            return status;
        }
        record = fetched;  // a view nobody else saw can stay in registers
    }
    HFS_ASSERT(to.keyOut != nullptr || to.keyCapacity == 0, 3312);
    if (to.keyOut != nullptr) {
        HFS_ASSERT(to.keyCapacity >= record.keySize, 3316);
        HFS_ASSERT(to.keyCapacity >= tree->convert.minKeyBuffer, 3317);
        *to.keySize = Least(to.keyCapacity, record.keySize);
        DeliverKey(tree, record.key, to.keyOut, *to.keySize);
    }
    HFS_ASSERT(tree->fileId == kAttributesFileId || to.recordCapacity >= record.dataSize, 3339);
    HFS_ASSERT(to.recordCapacity >= tree->convert.minDataBuffer, 3340);
    const u32 size = Least(to.recordCapacity, record.dataSize);
    const int status = DeliverData(tree, leaf.node, record, to.record, size);
    if (status == kOk) {
        *to.recordSize = size;
    }
    return status;
}

}  // namespace

int CBTreeHfs::IncPos(int count, void* record, unsigned recordCapacity, unsigned* recordSize,
                      void* keyOut, unsigned keyCapacity, unsigned* keySize, HfsFindData* fd) {
    if (header.leafRecords == 0) {
        return kErrNotFound;
    }
    HfsFindData* path = fd != nullptr ? fd : &findData;
    HFS_ASSERT(path->valid, 3229);
    HFS_ASSERT(path->level == 1, 3234);
    if (!StandsOnLeaf(path, 1)) {
        return Fail(kErrInvalid, kReasonInvalid, 3236);
    }
    if (record == nullptr && recordCapacity != 0) {
        return Fail(kErrInvalid, kReasonInvalid, 9032);  // the record output is not optional
    }
    path->searchCount += 1;
    const u32 distance = count < 0 ? 0u - static_cast<u32>(count) : static_cast<u32>(count);
    const int status =
        count < 0 ? StepBackward(this, distance, path) : StepForward(this, distance, path);
    if (status != kOk) {
        return status;
    }
    return Deliver(this, path->path[1],
                   {record, recordCapacity, recordSize, keyOut, keyCapacity, keySize});
}

u64 CBTreeHfs::GetPos(const HfsFindData* fd, const CatalogKey* key, CatalogKey* keyCopy) const {
    HFS_ASSERT(fd != nullptr, 3146);
    const HfsFindData* path = fd != nullptr ? fd : &findData;
    HFS_ASSERT(path->valid, 3150);
    HFS_ASSERT(path->level == 1, 3151);
    if (key != nullptr && keyCopy != nullptr && convert.KeyToDisk != nullptr) {
        convert.KeyToDisk(keyCopy, key);
    }
    if (path->level > kMaxPathDepth || path->path[path->level].node == nullptr) {
        return ~u64{0};
    }
    const HfsFindLevel& at = path->path[path->level];
    return (static_cast<u64>(at.node->nodeNum) << nodeShift) + static_cast<u64>(at.index);
}

int CBTreeHfs::SetPos(const unsigned long long& pos, void* record, unsigned recordCapacity,
                      unsigned* recordSize, void* keyOut, unsigned keyCapacity, unsigned* keySize,
                      HfsFindData* fd) {
    HFS_ASSERT(fd != nullptr, 3180);
    HfsFindData* path = fd != nullptr ? fd : &findData;
    HFS_ASSERT(path->level == 0, 3185);
    const u32 nodeNum = static_cast<u32>(pos >> nodeShift);
    if (header.leafRecords == 0 || nodeNum == 0 || nodeNum >= header.totalNodes) {
        return kErrNotFound;
    }
    path->searchCount += 1;
    path->valid = false;
    path->level = 1;
    path->leadsAsOf = 0;
    HFS_TRY(LoadLevel(this, 1, nodeNum, {}, path), 3197);
    path->valid = true;
    const int index = static_cast<int>(pos & ((1u << nodeShift) - 1));
    HFS_TRY(IncPos(index, record, recordCapacity, recordSize, keyOut, keyCapacity, keySize, path),
            3201);
    return kOk;
}

}  // namespace VELK
