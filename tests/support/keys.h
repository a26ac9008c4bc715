// Keys of the three trees in both forms: as callers pass them (host order) and as nodes hold them
// (big-endian, without the pad byte); and the conversion hooks between the two.
#pragma once

#include <string>
#include <string_view>

#include "hfs/treehfs.h"
#include "image_bytes.h"

namespace VELK::test {

// A search key with the alignment and the room that callers of the engine give theirs.
struct alignas(8) HostKey {
    u8 bytes[kKeyLengthSize + kMaxKeyLength + 6] = {};
    u32 id = 0;  // the comparator's ID argument

    const BTreeKey* Get() const { return reinterpret_cast<const BTreeKey*>(bytes); }
    BTreeKey* Get() { return reinterpret_cast<BTreeKey*>(bytes); }
    operator const BTreeKey*() const { return Get(); }  // NOLINT: keys are passed as pointers
};

HostKey HostCatKey(u32 parentId, std::u16string_view name);
HostKey HostExtKey(u8 forkType, u32 fileId, u32 startBlock);
HostKey HostAttrKey(u32 fileId, u32 startBlock, std::u16string_view name);

Bytes DiskCatKey(u32 parentId, std::u16string_view name);
Bytes DiskExtKey(u8 forkType, u32 fileId, u32 startBlock);
Bytes DiskAttrKey(u32 fileId, u32 startBlock, std::u16string_view name);

// The nth (0 ..) of an endless ascending run of keys for the tree `fileId`, in both forms. They
// leave gaps: a key between the nth and the next is made with `between` set.
HostKey NthHostKey(u32 fileId, u32 n, bool between = false);
Bytes NthDiskKey(u32 fileId, u32 n, bool between = false);

// A disk key from a host key of the tree `fileId`.
Bytes DiskFormOf(u32 fileId, const BTreeKey* hostKey);

// Hooks that swap the keys of the tree `fileId` and copy its data unchanged; the extents tree's
// ToMemory hooks copy the disk bytes. The two minimum sizes are 0.
HfsConvert ConvertFor(u32 fileId);

// Sets what Create takes from a tree of `fileId`: order, longest key, attributes.
void PrepareCreate(CBTreeHfs* tree);

}  // namespace VELK::test
