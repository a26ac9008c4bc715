// Lookup: from the root to a leaf by binary search in each node, leaving the search path behind.
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/node_child.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/node_search.h"
#include "hfs/treehfs/noderef.h"
#include "hfs/treehfs/path_deliver.h"
#include "hfs/treehfs/path_level.h"
#include "hfs/treehfs/prefetch.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

u32 Least(u32 a, u32 b) {
    return a < b ? a : b;
}

int BadTree(int site) {
    return Fail(kErrCorrupt, kReasonTree, site);
}

// Whether the node just loaded into `level` belongs there.
int CheckPlace(const HfsNode* node, int level) {
    if (HFS_UNLIKELY(Height(node) != static_cast<u32>(level))) {
        HFS_TRACE("Incorrect node height: %u != %u\n", Height(node), static_cast<u32>(level));
        return BadTree(2916);
    }
    if (level == 1) {
        if (HFS_UNLIKELY(!IsLeaf(node))) {
            HFS_TRACE("Incorrect node type (%d): expected leaf\n", Kind(node));
            return BadTree(2925);
        }
    } else if (HFS_UNLIKELY(Kind(node) != kBTIndexNode)) {
        HFS_TRACE("Incorrect node type (%d): expected index\n", Kind(node));
        return BadTree(2934);
    }
    HFS_ASSERT(node->refCount >= 1, 2938);
    return kOk;
}

// See LoadLevel.
[[gnu::always_inline]] inline int LoadHere(CBTreeHfs* tree, int level, u32 nodeNum,
                                           const HintedWay& way, HfsFindData* path) {
    HfsFindLevel* entry = &path->path[level];
    entry->index = 0;
    ReleaseNode(entry->node);
    entry->node = nullptr;
    const u32 readBefore = tree->readCount;
    const NodeUse use = level > 1 ? NodeUse::kReadIndex : NodeUse::kRead;
    HFS_TRY(FetchByWay(tree, way, nodeNum, use, &entry->node), 2909);
    const int status = CheckPlace(entry->node, level);
    if (HFS_UNLIKELY(status != kOk && nodeNum >= tree->validNodes &&
                     tree->readCount != readBefore)) {
        // A damaged link led past the initialised part of the file, and the cache made up an empty,
        // modified node for it. Looking must leave nothing to write.
        DropNode(tree, entry->node);
        entry->node = nullptr;
    }
    return status;
}

void DeliverFoundKey(const CBTreeHfs* tree, const SearchResult& found, void* keyOut,
                     unsigned* keyOutSize) {
    const u32 size = found.record.keySize;
    HFS_ASSERT(*keyOutSize <= size, 3039);
    HFS_ASSERT(*keyOutSize >= tree->convert.minKeyBuffer, 3040);
    // The whole key is delivered whatever the capacity: callers offer room for any key.
    DeliverKey(tree, found.record.key, keyOut, size);
    *keyOutSize = Least(size, *keyOutSize);
}

int DeliverFoundRecord(CBTreeHfs* tree, const HfsNode* node, const SearchResult& found,
                       void* record, unsigned* recordSize) {
    HFS_ASSERT(*recordSize >= found.record.dataSize, 3051);
    HFS_ASSERT(*recordSize >= tree->convert.minDataBuffer, 3052);
    const u32 size = Least(found.record.dataSize, *recordSize);
    const int status = DeliverData(tree, node, found.record, record, size);
    if (status == kOk) {
        *recordSize = size;
    }
    return status;
}

// Searches an index node of the path and gives the child that leads on to the key, and the way
// there. The way goes on while the record's bytes may still be on theirs: should they lead to
// another child, somebody wrote into the node, and it is searched once more as it is.
int SearchIndex(CBTreeHfs* tree, const SoughtKey& key, HfsFindLevel* entry, bool* found,
                SearchResult* result, u32* child, HintedWay* way) {
    const int status = SearchNode(tree, entry->node, key, result);
    if (HFS_UNLIKELY(status != kOk)) {
        return status;
    }
    *found = result->found;
    entry->index = !result->found && result->index > 0 ? result->index - 1 : result->index;
    *way = WayDown(tree, entry->node, static_cast<u32>(entry->index));
    if (way->node != nullptr) {
        *child = PlainChild(tree, entry->node, entry->index);
        if (HFS_LIKELY(*child == way->node->nodeNum)) {
            return kOk;
        }
        if (*child != 0) {
            ForgetRecords(tree, entry->node);
            return SearchIndex(tree, key, entry, found, result, child, way);
        }
    }
    HFS_TRY(ChildOf(tree, entry->node, entry->index, child), 3095);
    return kOk;
}

// Goes from the root to a leaf and searches each node on the way. `*found` tells of the node
// searched last.
int Descend(CBTreeHfs* tree, const SoughtKey& key, LeafUse use, HfsFindData* path, bool* found,
            SearchResult* result) {
    u32 nodeNum = tree->header.rootNode;
    int level = tree->header.treeDepth;
    HintedWay way;
    for (;;) {
        if (HFS_UNLIKELY(nodeNum == 0)) {
            return BadTree(2980);
        }
        if (level == 1) {
            PrefetchLeaf(tree->header, way.data, use);
        }
        int status = CheckLevel(level);
        if (status == kOk) {
            status = LoadHere(tree, level, nodeNum, way, path);
        }
        HFS_TRY(status, 2982);
        HfsFindLevel* entry = &path->path[level];
        if (IsLeaf(entry->node)) {
            status = SearchNode(tree, entry->node, key, result);
            *found = status == kOk ? result->found : *found;
            entry->index = status == kOk ? result->index : entry->index;
            return status;
        }
        status = SearchIndex(tree, key, entry, found, result, &nodeNum, &way);
        if (HFS_UNLIKELY(status != kOk)) {
            return status;
        }
        level -= 1;
    }
}

// Whether going down once more would end where the tree's own path stands, without a word. Only
// nodes this engine built are known to be in order: in a damaged tree the way down can lead to
// another leaf, or to an error. A node with fewer or more references than expected is asserted, and
// so is a path with a gap.
bool PathStillLeads(const CBTreeHfs* tree) {
    const HfsFindData& path = tree->findData;
    const u32 depth = tree->header.treeDepth;
    if (!tree->isAllOwn || path.leadsAsOf != tree->pathVersion || depth > kMaxPathDepth) {
        return false;
    }
    for (u32 level = 1; level <= depth; ++level) {
        const HfsNode* node = path.path[level].node;
        if (node == nullptr || node->refCount < 1 || node->refCount > 3) {
            return false;
        }
    }
    std::uintptr_t beyond = reinterpret_cast<std::uintptr_t>(path.path[0].node);
#pragma GCC unroll 4
    for (u32 level = depth + 1; level <= kMaxPathDepth; ++level) {
        beyond |= reinterpret_cast<std::uintptr_t>(path.path[level].node);
    }
    if (beyond != 0) {
        return false;
    }
    return path.path[depth].node->nodeNum == tree->header.rootNode;
}

// What a walk or a change from that place on meets first.
[[gnu::always_inline]] inline void PrefetchFrom(const BTHeaderMem& header, const HfsNode* leaf,
                                                u32 index) {
    PrefetchRecords(&header, leaf, NodeBytes(&header, leaf).U16(SlotOffset(&header, index)));
    __builtin_prefetch(leaf->modifiedLink.prev, 1);
    __builtin_prefetch(leaf->modifiedLink.next, 1);
}

// When the leaf beside that of the tree's own path is the last one, below the same parent, and the
// key lies in it: moves the path there. REQUIRES: PathStillLeads, so that a hint leads where its
// record does.
bool FindOnLastLeaf(CBTreeHfs* tree, const SoughtKey& key, SearchResult* result) {
    const BTHeaderMem& header = tree->header;
    HfsFindLevel& leaf = tree->findData.path[1];
    HfsFindLevel& parent = tree->findData.path[2];
    if (header.treeDepth < 2 || FLink(leaf.node) != header.lastLeafNode) {
        return false;
    }
    const u32 index = static_cast<u32>(parent.index) + 1;
    HfsNode* last = WayDown(tree, parent.node, index).node;
    if (last == nullptr || last->refCount > 2 || !SearchInside(tree, last, key, result)) {
        return false;
    }
    leaf.node->refCount -= 1;
    TakeReference(last);
    leaf.node = last;
    parent.index += 1;
    return true;
}

// Records are often inserted in key order. When the tree's own path still leads where it did, and
// the key lies between the first and the last key of its leaf, or past the last one of the last
// leaf, the way down is the one the path holds; behind a leaf that was split it is next to that.
// Counters move as they would on the way down.
bool FindByOwnPath(CBTreeHfs* tree, const SoughtKey& key, SearchResult* result) {
    HfsFindData* path = &tree->findData;
    if (!PathStillLeads(tree) || (!SearchInside(tree, path->path[1].node, key, result) &&
                                  !FindOnLastLeaf(tree, key, result))) {
        return false;
    }
    path->searchCount += 1;
    path->valid = true;
    tree->hitCount += tree->header.treeDepth;
    return true;
}

}  // namespace

void HfsFindData::ClearPath() {
    int below = -1;
#pragma GCC unroll 16
    for (int i = 0; i <= static_cast<int>(kMaxPathDepth); ++i) {
        if (HFS_LIKELY(path[i].node == nullptr)) {
            continue;
        }
        HFS_ASSERT(below < 0 || below == i - 1, 752);
        path[i].node->refCount -= 1;
        HFS_ASSERT(path[i].node->refCount >= 0, 755);
        path[i].node = nullptr;
        below = i;
    }
}

int CheckLevel(int level) {
    if (HFS_UNLIKELY(level < 1 || level > static_cast<int>(kMaxPathDepth))) {
        return Fail(kErrCorrupt, kReasonDepth, 2898);
    }
    return kOk;
}

int LoadLevel(CBTreeHfs* tree, int level, u32 nodeNum, const HintedWay& way, HfsFindData* path) {
    return LoadHere(tree, level, nodeNum, way, path);
}

int CBTreeHfs::ReadLevel(int level, unsigned nodeNum, HfsFindData* fd) {
    HfsFindData* path = fd != nullptr ? fd : &findData;
    path->leadsAsOf = 0;
    const int status = CheckLevel(level);
    return status != kOk ? status : LoadLevel(this, level, nodeNum, {}, path);
}

int CBTreeHfs::FindEntry(const BTreeKey* key, unsigned keyArg, HfsFindData* fd, bool* found,
                         void* record, unsigned* recordSize, void* keyOut, unsigned* keyOutSize) {
    HFS_ASSERT(reinterpret_cast<std::uintptr_t>(keyOut) % 8 == 0, 2963);
    HfsFindData* path = fd != nullptr ? fd : &findData;
    *found = false;
    if (header.treeDepth == 0) {
        return kOk;
    }
    // Who asks for a place and no record goes on from there, with a walk or with a change.
    const bool isPlace = record == nullptr && keyOut == nullptr;
    SoughtKey searchKey(this, key, keyArg);
    SearchResult result;
    if (path == &findData && FindByOwnPath(this, searchKey, &result)) {
        *found = result.found;
    } else {
        searchKey.LearnOrder();
        path->leadsAsOf = 0;
        path->ClearPath();
        path->searchCount += 1;
        path->valid = true;
        const LeafUse use = isPlace ? LeafUse::kPlace : LeafUse::kRecord;
        const int status = Descend(this, searchKey, use, path, found, &result);
        if (HFS_UNLIKELY(status != kOk)) {
            return status;
        }
        path->leadsAsOf = pathVersion;
        if (isPlace) {
            PrefetchFrom(header, path->path[1].node, static_cast<u32>(result.index));
        }
    }
    path->level = 1;
    path->path[1].index = result.index;
    if (!result.found || isPlace) {
        return kOk;
    }
    const HfsNode* leaf = path->path[1].node;
    if (keyOut != nullptr) {
        DeliverFoundKey(this, result, keyOut, keyOutSize);
    }
    return record == nullptr ? kOk : DeliverFoundRecord(this, leaf, result, record, recordSize);
}

int CBTreeHfs::FindRecord(const void* key, unsigned keyArg, void* record, unsigned recordCapacity,
                          unsigned* recordSize, HfsFindData* fd) {
    if (record != nullptr) {
        *recordSize = recordCapacity;
    }
    bool found = false;
    HFS_TRY(FindEntry(static_cast<const BTreeKey*>(key), keyArg, fd, &found, record, recordSize,
                      nullptr, nullptr),
            3126);
    return found ? kOk : kErrNotFound;
}

}  // namespace VELK
