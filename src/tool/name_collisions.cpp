// Names are compared decomposed and folded, ignorable units left out: the order of names of a
// case-insensitive volume, and any spelling of a letter.
#include "tool/name_collisions.h"

#include <algorithm>

#include "hfs/names.h"
#include "hfs/names_text.h"

namespace VELK::tool {

namespace {

std::u16string FoldedName(const u8* unitsBe, u32 count) {
    std::u16string folded;
    for (const char16_t unit : DecomposedUnits(UnitsFromStored(unitsBe, count))) {
        const u16 same = FoldHfsUnit(static_cast<u16>(unit));
        if (same != 0) {
            folded.push_back(static_cast<char16_t>(same));
        }
    }
    return folded;
}

}  // namespace

bool CollisionFinder::Add(const ListedItem& listed) {
    if (listed.parent != parent_ && !EndFolder()) {
        return false;
    }
    parent_ = listed.parent;
    folderPath_ = *listed.folderPath;
    const u8* data = listed.item.Bytes();
    const u32 size = listed.item.IsFolder() ? kFolderSize : kFileSize;
    Kept kept{FoldedName(listed.name, listed.nameLength),
              {listed.name, listed.name + std::size_t{2} * listed.nameLength},
              {data, data + size},
              listed};
    folder_.push_back(std::move(kept));
    return true;
}

bool CollisionFinder::EndFolder() {
    std::stable_sort(folder_.begin(), folder_.end(),
                     [](const Kept& a, const Kept& b) { return a.folded < b.folded; });
    bool goesOn = true;
    for (std::size_t i = 0; i < folder_.size() && goesOn; ++i) {
        Kept& kept = folder_[i];
        const bool isShared = (i > 0 && folder_[i - 1].folded == kept.folded) ||
                              (i + 1 < folder_.size() && folder_[i + 1].folded == kept.folded);
        if (!isShared) {
            continue;
        }
        kept.listed.item = CatalogItem(kept.data.data(), static_cast<u32>(kept.data.size()));
        kept.listed.name = kept.name.data();
        kept.listed.folderPath = &folderPath_;
        goesOn = visit_(kept.listed);
    }
    folder_.clear();
    return goesOn;
}

}  // namespace VELK::tool
