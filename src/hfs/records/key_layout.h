// Keys as they lie in a leaf, read tree by tree: one place knows which tree's keys have which
// fields. The offsets are the same in host order.
#pragma once

#include "hfs/format.h"
#include "hfs/treehfs/bytes.h"

namespace VELK {

// Where the fields of a tree's keys stand, in bytes from the key's start.
struct KeyLayout {
    u32 fixed;        // bytes of the fields, the length field and the name's units left out
    u32 id;           // the parent's ID in the catalog, else the file's
    u32 startBlock;   // 0: these keys have no such field
    u32 nameLength;   // 0: these keys have no name
    u32 longestName;  // units
};

// The keys of each tree.
constexpr KeyLayout kCatalogKeys = {kCatKeyFixed, kCatKeyParentId, 0, kCatKeyNameLength,
                                    (kCatMaxKeyLength - kCatKeyFixed) / 2};
constexpr KeyLayout kExtentsKeys = {kExtKeyFixed, kExtKeyFileId, kExtKeyStartBlock, 0, 0};
constexpr KeyLayout kAttributesKeys = {kAttrKeyFixed, kAttrKeyFileId, kAttrKeyStartBlock,
                                       kAttrKeyNameLength, (kAttrMaxKeyLength - kAttrKeyFixed) / 2};

// Those of tree `fileId`.
constexpr const KeyLayout& KeyLayoutOf(u32 fileId) {
    return fileId == kExtentsFileId      ? kExtentsKeys
           : fileId == kAttributesFileId ? kAttributesKeys
                                         : kCatalogKeys;
}

// A key as stored. REQUIRES: bytes that SearchKeyFromStored takes.
class KeyView {
public:
    // Of a key of tree `fileId`; its bytes have to outlive the view.
    KeyView(u32 fileId, const u8* stored) : layout_(KeyLayoutOf(fileId)), bytes_(stored) {}

    // The fields by name; 0 for one that keys of this tree do not have.
    u32 Id() const { return GetBe32(bytes_ + layout_.id); }
    u32 StartBlock() const {
        return layout_.startBlock == 0 ? 0 : GetBe32(bytes_ + layout_.startBlock);
    }
    u32 NameLength() const {
        return layout_.nameLength == 0 ? 0 : GetBe16(bytes_ + layout_.nameLength);
    }
    // The name's units, big-endian: they follow the fields.
    const u8* Name() const { return bytes_ + kKeyLengthSize + layout_.fixed; }
    // Bytes of length field, fields and name; the key's length field may say more.
    u32 Size() const { return kKeyLengthSize + layout_.fixed + 2 * NameLength(); }

private:
    const KeyLayout& layout_;
    const u8* bytes_;
};

}  // namespace VELK
