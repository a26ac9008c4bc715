// InsertRecord: look the key up, put the record into its leaf, make sure there are nodes for splits
// before the first one. Also the first leaf of an empty tree, and InsertTree for records that
// start at any level.
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/key_shape.h"
#include "hfs/treehfs/next_node.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/noderef.h"
#include "hfs/treehfs/own_change.h"
#include "hfs/treehfs/path_check.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

// Whether the name, if such keys have one, ends where the key says it does, or before.
bool HoldsName(const u8* key, const KeyShape& shape) {
    const u32 length = GetHost16(key);
    return length >= shape.fixed &&
           (shape.nameLength == 0 || shape.fixed + 2 * GetHost16(key + shape.nameLength) <= length);
}

// Whether no search that meets the record's key will find anything to say of it, there and as a
// separator, and whether its key was looked up by the ID it carries: another one leads it to a
// place where no lookup expects what is stored. False also for a comparator whose keys are not
// known.
bool IsOrdinary(const CBTreeHfs* tree, const void* key, u32 id) {
    const BTHeaderMem& hdr = tree->header;
    const u8* bytes = static_cast<const u8*>(key);
    const u32 length = GetHost16(bytes);
    const bool isIndexSize =
        (hdr.attributes & kBTVariableIndexKeysMask) != 0 || length == hdr.maxKeyLength;
    if (length > kMaxKeyLength || !isIndexSize) {
        return false;
    }
    KeyShape shape;
    return ShapeOf(tree->compareKeys, &shape) && HoldsName(bytes, shape) &&
           GetHost32(bytes + shape.id) == id;
}

// Keeps the books of whose changes the tree knows, after a record came in by its key.
void NoteRecord(CBTreeHfs* tree, const void* key, u32 id, u32 dataSize) {
    tree->isAllOwn = tree->isAllOwn && IsOrdinary(tree, key, id);
    tree->hasLongData = tree->hasLongData || dataSize > tree->header.blockSize;
}

// Makes the first leaf, which is also the root, of a record. A failure leaves the leaf allocated.
int InsertFirst(CBTreeHfs* tree, const BTreeKey* key, u32 id, const void* data, u32 dataSize) {
    BTHeaderMem* hdr = &tree->header;
    OwnChange change(tree);
    if (hdr->freeNodes == 0) {
        if (hdr->totalNodes == UINT32_MAX) {
            return Fail(kErrCorrupt, kReasonTree, 9250);
        }
        HFS_TRY(tree->ExtendBTree(hdr->totalNodes + 1, nullptr, nullptr), 5032);
    }
    NodeRef leaf;
    HFS_TRY(tree->AllocateNode(leaf.Out()), 5034);
    HFS_TRY(MarkDirty(tree, leaf.Get(), 0), 9251);
    SetKind(hdr, leaf.Get(), kBTLeafNode);
    SetHeight(hdr, leaf.Get(), 1);
    HFS_TRY(tree->_InsertKeyRecord(leaf.Get(), 0, key, 0, data, dataSize, &tree->convert), 5046);
    hdr->treeDepth = 1;
    hdr->leafRecords = 1;
    hdr->rootNode = leaf->nodeNum;
    hdr->firstLeafNode = leaf->nodeNum;
    hdr->lastLeafNode = leaf->nodeNum;
    tree->isDirty = true;
    change.Done();
    NoteRecord(tree, key, id, dataSize);
    return kOk;
}

// Grows the file when a split at every level could run out of nodes. Looks at the free nodes;
// deletion's test looks at the total on purpose.
int ReserveForSplits(CBTreeHfs* tree) {
    const BTHeaderMem& hdr = tree->header;
    const u32 depth = hdr.treeDepth;
    if (hdr.freeNodes >= depth + 1) {
        return kOk;
    }
    const u64 need = static_cast<u64>(hdr.totalNodes) + (depth - hdr.freeNodes);
    const u64 wanted = need + (need + 1 > tree->CalcMapBits() ? 2 : 1);  // one for a map node
    if (wanted > UINT32_MAX) {
        return Fail(kErrCorrupt, kReasonTree, 9252);
    }
    HFS_TRY(tree->ExtendBTree(static_cast<u32>(wanted), nullptr, nullptr), 5087);
    return kOk;
}

// After records moved and separators were replaced the tree's own path mostly leads where it did:
// then the next search need not go down again. It does so anyway among nodes of another writer,
// whose damage is not to be reported for this.
void RenewPath(CBTreeHfs* tree) {
    if (tree->isAllOwn && ParentsLeadHere(tree, &tree->findData, 1)) {
        tree->findData.leadsAsOf = tree->pathVersion;
    }
}

}  // namespace

int CBTreeHfs::InsertRecord(const void* key, unsigned keyLen, const void* data, unsigned dataSize) {
    const BTreeKey* searchKey = static_cast<const BTreeKey*>(key);
    const u64 evenDataSize = (static_cast<u64>(dataSize) + 1) / 2 * 2;
    if (PaddedKeySize(GetHost16(key)) + evenDataSize > header.nodeSize) {
        return Fail(kErrTooLarge, kReasonTooLarge, 5026);
    }
    if (dataSize == 0) {
        return Fail(kErrInvalid, kReasonInvalid, 9253);  // no lookup could read it again
    }
    if (header.treeDepth == 0) {
        return InsertFirst(this, searchKey, keyLen, data, dataSize);
    }

    bool found = false;
    HFS_TRY(FindEntry(searchKey, keyLen, &findData, &found, nullptr, nullptr, nullptr, nullptr),
            5057);
    if (found) {
        return kErrExists;
    }
    HFS_ASSERT(findData.valid, 5062);
    HFS_ASSERT(!found, 5066);
    HfsNode* leaf = findData.path[findData.level].node;
    const int index = findData.path[findData.level].index;
    if (header.leafRecords == UINT32_MAX) {
        return Fail(kErrCorrupt, kReasonTree, 9254);
    }

    PrefetchNextNode(this);
    OwnChange change(this);
    // At index 0 the leaf's first key changes, and with it the separator in the parent.
    bool inserted = false;
    if (index > 0) {
        HFS_TRY(_InsertKeyRecord(leaf, index, searchKey, 0, data, dataSize, &convert, &inserted),
                5071);
    }
    if (!inserted) {
        const int status = ReserveForSplits(this);
        if (status != 0) {
            return status;
        }
        HFS_TRY(InsertTree(searchKey, data, dataSize, leaf, index, 1, false, &findData, &convert),
                5092);
    }
    change.Done();
    NoteRecord(this, key, keyLen, dataSize);
    if (!inserted) {
        RenewPath(this);
    }
    header.leafRecords += 1;
    isDirty = true;
    return kOk;
}

int CBTreeHfs::InsertTree(const BTreeKey* key, const void* data, unsigned dataSize, HfsNode* node,
                          int index, int level, bool replacesSeparator, HfsFindData* path,
                          HfsConvert* hook) {
    path = path != nullptr ? path : &findData;
    // In a tree that nobody else touched the path of the lookup before InsertRecord's change leads.
    const bool isOwn = isAllOwn && path->leadsAsOf == kOwnChange;
    if (level < 1 || static_cast<u32>(level) > kMaxPathDepth || path->path[level].node != node ||
        node == nullptr || (!isOwn && !ParentsLeadHere(this, path, static_cast<u32>(level)))) {
        return Fail(kErrInvalid, kReasonInvalid, 9255);
    }
    InsertKey entry;
    entry.convert = hook;
    entry.key = key;
    entry.keyLength = hook != nullptr ? GetKeyLengthLe(&header, key, level == 1)
                                      : GetKeyLength(&header, key, level == 1);
    entry.data = data;
    entry.dataSize = dataSize;
    entry.replacesSeparator = replacesSeparator;
    entry.secondKeyFollows = false;
    // Asked once more, the leaf would say nothing but that the key is too long.
    entry.wasRefused = isOwn && index > 0 && entry.keyLength <= kMaxKeyLength;
    HFS_TRY(InsertLevel(path, &entry, nullptr, node, index, level), 4593);
    return kOk;
}

}  // namespace VELK
