// Keys and data in one piece: the scratch buffer, and the gate a key from a node passes before it
// is compared or converted.
#include "hfs/treehfs/scratch.h"

#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/report.h"
#include "platform/heap.h"

namespace VELK {

bool ShapeOf(CompareKeysFn compare, KeyShape* shape) {
    if (compare == CompareCatKeysCaseIns || compare == CompareCatKeysCaseBin) {
        *shape = {kCatKeyFixed, kCatKeyParentId, kCatKeyNameLength};
    } else if (compare == CompareExtentKeysPlus) {
        *shape = {kExtKeyFixed, kExtKeyFileId, 0};
    } else if (compare == CompareAttrKeys) {
        *shape = {kAttrKeyFixed, kAttrKeyFileId, kAttrKeyNameLength};
    } else {
        return false;
    }
    return true;
}

int EnsureScratch(CBTreeHfs* tree) {
    if (tree->scratch == nullptr) {
        tree->scratch = static_cast<u8*>(velk_heap_alloc(tree->header.nodeSize));
        if (tree->scratch == nullptr) {
            return kErrNoMemory;
        }
        tree->scratchHalf = tree->scratch + tree->header.nodeSize / 2;
    }
    return kOk;
}

u8* DataScratch(CBTreeHfs* tree, u32 size) {
    if (size > tree->header.nodeSize || EnsureScratch(tree) != kOk) {
        return nullptr;
    }
    return size <= tree->header.nodeSize / 2 ? tree->scratchHalf : tree->scratch;
}

int CopyKey(CBTreeHfs* tree, const HfsNode* node, const NodeKey& record, const BTreeKey** key) {
    if (record.keySize > tree->header.nodeSize) {
        return kErrCorrupt;
    }
    const int status = EnsureScratch(tree);
    if (status != kOk) {
        return status;
    }
    NodeBytes(&tree->header, node).CopyOut(tree->scratch, record.offset, record.keySize);
    *key = reinterpret_cast<const BTreeKey*>(tree->scratch);
    return kOk;
}

int GatherKey(CBTreeHfs* tree, const HfsNode* node, const NodeKey& record, const BTreeKey** key) {
    if (record.keySize <= record.firstBytes) {
        *key = reinterpret_cast<const BTreeKey*>(record.ptr);
        return kOk;
    }
    const int status = CopyKey(tree, node, record, key);
    HFS_ASSERT(status != kOk || record.next1 != nullptr, 262);
    return status;
}

bool NodeKeyIsSound(const CBTreeHfs* tree, const BTreeKey* key, u32 keySize) {
    KeyShape shape;
    if (!ShapeOf(tree->compareKeys, &shape)) {
        return true;
    }
    const u32 keyLength = keySize - kKeyLengthSize;
    if (keyLength > kMaxKeyLength || keyLength < shape.fixed) {
        return false;
    }
    // The whole key, not the two bytes of its length field.
    const u8* bytes = reinterpret_cast<const u8*>(key);
    return shape.nameLength == 0 ||
           shape.fixed + 2u * GetBe16(bytes + shape.nameLength) <= keyLength;
}

}  // namespace VELK
