// Kinds of catalog items.
#include "tool/catalog_item.h"

#include <cstring>

#include "hfs/volume/volume_header.h"

namespace VELK::tool {

namespace {

constexpr u32 kModeTypeMask = 0170000;
constexpr u32 kModeSymlink = 0120000;
constexpr const char* kKindNames[] = {"file", "folder", "symlink", "hardlink"};

bool NameIs(const u8* unitsBe, u32 count, const char* ascii, u32 length) {
    if (count != length) {
        return false;
    }
    for (u32 i = 0; i < length; ++i) {
        if (GetBe16(unitsBe + 2 * i) != static_cast<u8>(ascii[i])) {
            return false;
        }
    }
    return true;
}

}  // namespace

const char* ItemKindName(ItemKind kind) {
    return kKindNames[static_cast<int>(kind)];
}

bool ItemKindByName(const std::string& name, ItemKind* kind) {
    for (int i = 0; i < 4; ++i) {
        if (name == kKindNames[i]) {
            *kind = static_cast<ItemKind>(i);
            return true;
        }
    }
    return false;
}

ItemKind CatalogItem::Kind() const {
    if (IsFolder()) {
        return ItemKind::kFolder;
    }
    // Links are files with a type and a creator of their own: to files, and to folders.
    if (std::memcmp(data_ + 48, "hlnkhfs+", 8) == 0 ||
        std::memcmp(data_ + 48, "fdrpMACS", 8) == 0) {
        return ItemKind::kHardlink;
    }
    return (Mode() & kModeTypeMask) == kModeSymlink ? ItemKind::kSymlink : ItemKind::kFile;
}

bool IsPrivateFolderName(u32 parent, const u8* unitsBe, u32 count) {
    constexpr char kFiles[] = "\0\0\0\0HFS+ Private Data";
    constexpr char kFolders[] = ".HFS+ Private Directory Data\r";
    return parent == kRootFolderId && (NameIs(unitsBe, count, kFiles, sizeof kFiles - 1) ||
                                       NameIs(unitsBe, count, kFolders, sizeof kFolders - 1));
}

}  // namespace VELK::tool
