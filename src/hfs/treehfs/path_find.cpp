// Lookup: from the root to a leaf by binary search in each node, leaving the search path behind.
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/noderef.h"
#include "hfs/treehfs/path_deliver.h"
#include "hfs/treehfs/path_level.h"
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

// What a search in one node came to.
struct SearchResult {
    bool found;
    s32 index;  // the equal record, or the first greater one
    NodeKey record;
    const BTreeKey* key;  // of the equal record
};

int SearchNode(CBTreeHfs* tree, const HfsNode* node, const BTreeKey* key, unsigned keyArg,
               SearchResult* result) {
    s32 low = 0;
    s32 high = static_cast<s32>(NumRecords(node)) - 1;
    while (low <= high) {
        const s32 middle = (low + high) >> 1;
        const int status = FetchKey(tree, node, middle, &result->record, &result->key);
        if (HFS_UNLIKELY(status != kOk)) {
            if (status != kErrNoMemory) {
                Report(status, 3005);
            }
            return status;
        }
        const int order = tree->compareKeys(key, keyArg, result->key);
        if (order == 0) {
            result->found = true;
            result->index = middle;
            return kOk;
        }
        if (order < 0) {
            high = middle - 1;
        } else {
            low = middle + 1;
        }
    }
    result->found = false;
    result->index = low;
    return kOk;
}

void DeliverFoundKey(const CBTreeHfs* tree, const SearchResult& found, void* keyOut,
                     unsigned* keyOutSize) {
    const u32 size = found.record.keySize;
    HFS_ASSERT(*keyOutSize <= size, 3039);
    HFS_ASSERT(*keyOutSize >= tree->convert.minKeyBuffer, 3040);
    // The whole key is delivered whatever the capacity: callers offer room for any key.
    DeliverKey(tree, found.key, keyOut, size);
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

}  // namespace

void HfsFindData::ClearPath() {
    int below = -1;
    for (int i = 0; i <= static_cast<int>(kMaxPathDepth); ++i) {
        if (path[i].node == nullptr) {
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

int LoadLevel(CBTreeHfs* tree, int level, u32 nodeNum, HfsFindData* path) {
    HfsFindLevel* entry = &path->path[level];
    entry->index = 0;
    ReleaseNode(entry->node);
    entry->node = nullptr;
    const u32 readBefore = tree->readCount;
    HFS_TRY(tree->GetINode(nodeNum, &entry->node, false), 2909);
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

bool StandsOnLeaf(const HfsFindData* path, u32 slack) {
    const HfsFindLevel& leaf = path->path[1];
    return path->level == 1 && leaf.node != nullptr && IsLeaf(leaf.node) &&
           Height(leaf.node) == 1 && leaf.index >= 0 &&
           static_cast<u32>(leaf.index) < NumRecords(leaf.node) + slack;
}

int CBTreeHfs::ReadLevel(int level, unsigned nodeNum, HfsFindData* fd) {
    HfsFindData* path = fd != nullptr ? fd : &findData;
    const int status = CheckLevel(level);
    return status != kOk ? status : LoadLevel(this, level, nodeNum, path);
}

int CBTreeHfs::FindEntry(const BTreeKey* key, unsigned keyArg, HfsFindData* fd, bool* found,
                         void* record, unsigned* recordSize, void* keyOut, unsigned* keyOutSize) {
    HFS_ASSERT(reinterpret_cast<std::uintptr_t>(keyOut) % 8 == 0, 2963);
    HfsFindData* path = fd != nullptr ? fd : &findData;
    *found = false;
    if (header.treeDepth == 0) {
        return kOk;
    }
    path->ClearPath();
    path->searchCount += 1;
    path->valid = true;

    u32 nodeNum = header.rootNode;
    int level = header.treeDepth;
    SearchResult result;
    for (;;) {
        if (HFS_UNLIKELY(nodeNum == 0)) {
            return BadTree(2980);
        }
        int status = CheckLevel(level);
        if (status == kOk) {
            status = LoadLevel(this, level, nodeNum, path);
        }
        HFS_TRY(status, 2982);
        HfsFindLevel* entry = &path->path[level];
        status = SearchNode(this, entry->node, key, keyArg, &result);
        if (HFS_UNLIKELY(status != kOk)) {
            return status;
        }
        *found = result.found;
        entry->index = result.index;
        if (IsLeaf(entry->node)) {
            break;
        }
        if (!result.found && result.index > 0) {
            entry->index = result.index - 1;
        }
        HFS_TRY(entry->node->GetChildNodeNum(&header, entry->index, &nodeNum), 3095);
        level -= 1;
    }
    path->level = static_cast<u32>(level);
    if (!result.found) {
        return kOk;
    }
    if (keyOut != nullptr) {
        DeliverFoundKey(this, result, keyOut, keyOutSize);
    }
    return record == nullptr
               ? kOk
               : DeliverFoundRecord(this, path->path[level].node, result, record, recordSize);
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
