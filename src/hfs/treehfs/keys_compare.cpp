// The key comparators of the three tree kinds. The first key is the search key in host order, its
// ID passed beside it; the second is the key of a node, big-endian as stored. They trust the
// lengths in the keys: whoever takes a key from a node checks it first (see key_shape.h).
#include "hfs/names.h"
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

bool IsAligned(const void* bytes, std::uintptr_t alignment) {
    return reinterpret_cast<std::uintptr_t>(bytes) % alignment == 0;
}

const u8* BytesOf(const BTreeKey* key) {
    return key->length;
}

template <typename Number>
int Compare(Number search, Number node) {
    return search == node ? 0 : (search > node ? 1 : -1);
}

// Code unit by code unit, unsigned; a proper prefix sorts first.
int CompareUnits(const u8* search, u32 searchLength, const u8* node, u32 nodeLength) {
    const u32 common = searchLength < nodeLength ? searchLength : nodeLength;
    for (u32 i = 0; i < common; ++i) {
        const int order = Compare<u32>(GetHost16(search + 2 * i), GetBe16(node + 2 * i));
        if (order != 0) {
            return order;
        }
    }
    return Compare(searchLength, nodeLength);
}

}  // namespace

int CompareCatKeysCaseIns(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey) {
    HFS_ASSERT(IsAligned(searchKey, 4), 70);
    HFS_ASSERT(IsAligned(nodeKey, 2), 71);
    const u8* search = BytesOf(searchKey);
    const u8* node = BytesOf(nodeKey);
    const int byParent = Compare<u32>(id, GetBe32(node + kCatKeyParentId));
    if (byParent != 0) {
        return byParent;
    }
    const u32 searchLength = GetHost16(search + kCatKeyNameLength);
    const u32 nodeLength = GetBe16(node + kCatKeyNameLength);
    if (searchLength == 0 || nodeLength == 0) {
        return static_cast<int>(searchLength) - static_cast<int>(nodeLength);
    }
    return CompareHfsNamesIns(search + kCatKeyName, searchLength, node + kCatKeyName, nodeLength);
}

int CompareCatKeysCaseBin(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey) {
    HFS_ASSERT(IsAligned(searchKey, 4), 123);
    HFS_ASSERT(IsAligned(nodeKey, 2), 124);
    const u8* search = BytesOf(searchKey);
    const u8* node = BytesOf(nodeKey);
    const int byParent = Compare<u32>(id, GetBe32(node + kCatKeyParentId));
    if (byParent != 0) {
        return byParent;
    }
    return CompareHfsNamesBin(search + kCatKeyName, GetHost16(search + kCatKeyNameLength),
                              node + kCatKeyName, GetBe16(node + kCatKeyNameLength));
}

int CompareExtentKeysPlus(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey) {
    HFS_ASSERT(IsAligned(searchKey, 4), 157);
    HFS_ASSERT(IsAligned(nodeKey, 2), 158);
    const u8* search = BytesOf(searchKey);
    const u8* node = BytesOf(nodeKey);
    const int byFile = Compare<u32>(id, GetBe32(node + kExtKeyFileId));
    if (byFile != 0) {
        return byFile;
    }
    const int byFork = Compare(search[kExtKeyForkType], node[kExtKeyForkType]);
    if (byFork != 0) {
        return byFork;
    }
    return Compare(GetHost32(search + kExtKeyStartBlock), GetBe32(node + kExtKeyStartBlock));
}

int CompareAttrKeys(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey) {
    HFS_ASSERT(IsAligned(searchKey, 4), 189);
    HFS_ASSERT(IsAligned(nodeKey, 2), 190);
    const u8* search = BytesOf(searchKey);
    const u8* node = BytesOf(nodeKey);
    const int byFile = Compare<u32>(id, GetBe32(node + kAttrKeyFileId));
    if (byFile != 0) {
        return byFile;
    }
    const int byName = CompareUnits(search + kAttrKeyName, GetHost16(search + kAttrKeyNameLength),
                                    node + kAttrKeyName, GetBe16(node + kAttrKeyNameLength));
    if (byName != 0) {
        return byName;
    }
    return Compare(GetHost32(search + kAttrKeyStartBlock), GetBe32(node + kAttrKeyStartBlock));
}

}  // namespace VELK
