// Catalog records as listings need them, read in place from the bytes of a leaf.
#pragma once

#include <string>

#include "hfs/records/record_fields.h"
#include "hfs/treehfs/bytes.h"
#include "platform/types.h"

namespace VELK::tool {

enum class ItemKind { kFile, kFolder, kSymlink, kHardlink };

// "file", "folder", "symlink", "hardlink".
const char* ItemKindName(ItemKind kind);
// The kind of that name; false: none.
bool ItemKindByName(const std::string& name, ItemKind* kind);

// A folder or file record as stored; invalid for anything else, or when it is too short. One that
// is invalid has zeros in all its fields.
class CatalogItem {
public:
    CatalogItem() = default;
    CatalogItem(const u8* data, u32 size) {
        const u32 type = size >= 2 ? GetBe16(data) : 0;
        const bool whole = (type == kFolderRecord && size >= kFolderSize) ||
                           (type == kFileRecord && size >= kFileSize);
        data_ = whole ? data : kNothing;
    }

    bool IsValid() const { return data_ != kNothing; }
    const u8* Bytes() const { return data_; }
    bool IsFolder() const { return GetBe16(data_) == kFolderRecord; }
    u32 Id() const { return GetBe32(data_ + 8); }
    u32 Flags() const { return GetBe16(data_ + 2); }
    u32 Valence() const { return GetBe32(data_ + 4); }
    u32 ModifyDate() const { return GetBe32(data_ + 16); }
    u32 CreateDate() const { return GetBe32(data_ + 12); }
    u32 Mode() const { return GetBe16(data_ + 42); }
    u32 LinkReference() const { return GetBe32(data_ + 44); }
    ItemKind Kind() const;
    // Bytes of the data fork; the number of entries of a folder.
    u64 Size() const { return IsFolder() ? Valence() : GetBe64(data_ + 88); }
    u64 ResourceSize() const { return IsFolder() ? 0 : GetBe64(data_ + 168); }
    const u8* DataFork() const { return data_ + 88; }
    const u8* ResourceFork() const { return data_ + 168; }

private:
    static u64 GetBe64(const u8* bytes) { return u64{GetBe32(bytes)} << 32 | GetBe32(bytes + 4); }

    static constexpr u8 kNothing[kFileSize] = {};

    const u8* data_ = kNothing;
};

// The two folders in the root in which the native system keeps linked and open files.
bool IsPrivateFolderName(u32 parent, const u8* unitsBe, u32 count);

}  // namespace VELK::tool
