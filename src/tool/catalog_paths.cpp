// Paths of a catalog.
#include "tool/catalog_paths.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstring>

#include "hfs/names_text.h"
#include "hfs/records/key_layout.h"
#include "hfs/records/thread_view.h"
#include "tool/errors.h"
#include "tool/leaf_cursor.h"

namespace VELK::tool {

namespace {

FoundItem CopyItem(const LeafRecord& record) {
    const KeyView key(kCatalogFileId, record.key);
    FoundItem item;
    item.parent = key.Id();
    item.name.assign(key.Name(), key.Name() + 2 * std::size_t{key.NameLength()});
    item.data.assign(record.data, record.data + record.dataSize);
    item.node = record.node;
    item.index = record.index;
    return item;
}

// Names stored by writers of other generations may be composed differently: compares all names of
// a folder in composed form.
bool FindByComposedName(Session* session, u32 parent, NameView name, FoundItem* item) {
    const NameUnits wanted = ComposedUnits(name);
    LeafCursor cursor(session, kCatalogFileId, false);
    cursor.Seek(LowestKey(kCatalogFileId, parent), nullptr);
    LeafRecord record;
    while (cursor.Next(&record)) {
        const KeyView key(kCatalogFileId, record.key);
        if (key.Id() != parent) {
            return false;
        }
        if (ComposedUnits(UnitsFromStored(key.Name(), key.NameLength())) == wanted &&
            CatalogItem(record.data, record.dataSize).IsValid()) {
            *item = CopyItem(record);
            return true;
        }
    }
    return false;
}

bool IsAscii(NameView name) {
    return std::all_of(name.begin(), name.end(), [](char16_t unit) { return unit < 0x80; });
}

bool FindChild(Session* session, u32 parent, const std::string& component, FoundItem* item) {
    const NameUnits typed = UnitsFromPath(component);
    if (typed.size() > kCatalogKeys.longestName) {
        return false;
    }
    const NameUnits decomposed = DecomposedUnits(typed);
    if (decomposed.size() <= kCatalogKeys.longestName &&
        FindItem(session, CatalogSearchKey(parent, decomposed), item)) {
        return true;
    }
    if (decomposed != typed && FindItem(session, CatalogSearchKey(parent, typed), item)) {
        return true;
    }
    return !IsAscii(typed) && FindByComposedName(session, parent, typed, item);
}

}  // namespace

bool FindItem(Session* session, const SearchKey& key, FoundItem* item) {
    LeafCursor cursor(session, kCatalogFileId, false);
    bool found = false;
    cursor.Seek(key, &found);
    LeafRecord record;
    if (!found || !cursor.Next(&record)) {
        return false;
    }
    *item = CopyItem(record);
    return true;
}

bool FindItemById(Session* session, u32 id, FoundItem* item) {
    FoundItem found;
    if (!FindItem(session, LowestKey(kCatalogFileId, id), &found)) {
        return false;
    }
    const ThreadView thread(found.data.data(), static_cast<u32>(found.data.size()));
    if (!thread.IsValid() || thread.NameLength() > kCatalogKeys.longestName) {
        return false;
    }
    const NameUnits name = UnitsFromStored(thread.Name(), thread.NameLength());
    return FindItem(session, CatalogSearchKey(thread.Parent(), name), item) &&
           item->Item().IsValid();
}

FoundItem FindItemByPath(Session* session, const std::string& path) {
    FoundItem item;
    if (!FindItemById(session, kRootFolderId, &item)) {
        ThrowFailed(session->Image(), "catalog: the root folder has no record", "run check --full");
    }
    std::string shown;
    std::size_t at = 0;
    while (at < path.size()) {
        const std::size_t end = std::min(path.find('/', at), path.size());
        const std::string component = path.substr(at, end - at);
        at = end + 1;
        if (component.empty() || component == ".") {
            continue;
        }
        const CatalogItem folder = item.Item();
        if (!folder.IsFolder()) {
            ThrowNo(session->Image(),
                    shown + ": is a " + ItemKindName(folder.Kind()) + ", not a folder", "");
        }
        const std::string parentText = shown.empty() ? "/" : shown;
        shown += "/" + component;
        FoundItem child;
        if (!FindChild(session, folder.Id(), component, &child) || !child.Item().IsValid()) {
            ThrowNo(session->Image(),
                    fmt::format(
                        "{}: not found; {} has {}", shown, parentText,
                        folder.Valence() == 1 ? "1 entry" : Grouped(folder.Valence()) + " entries"),
                    "");
        }
        item = std::move(child);
    }
    return item;
}

FolderTable::FolderTable(Session* session, NameForm form)
    : session_(session),
      form_(form),
      stepsLeft_(kLeastSteps +
                 kStepsPerRecord * session->Tree(kCatalogFileId)->header.leafRecords) {}

const FolderTable::Entry* FolderTable::Find(u32 id) const {
    const auto found =
        std::lower_bound(entries_.begin(), entries_.end(), id,
                         [](const Entry& entry, u32 wanted) { return entry.id < wanted; });
    return found != entries_.end() && found->id == id ? &*found : nullptr;
}

u32 FolderTable::KeepName(const std::string& name) {
    const u32 needed = static_cast<u32>(name.size()) + 2;
    constexpr u32 kChunkSize = 1u << kChunkShift;
    if (chunks_.empty() || kChunkSize - chunkUsed_ < needed) {
        chunks_.emplace_back(new char[kChunkSize]);
        chunkUsed_ = 0;
    }
    char* target = chunks_.back().get() + chunkUsed_;
    const u16 length = static_cast<u16>(name.size());
    std::memcpy(target, &length, sizeof length);
    name.copy(target + sizeof length, name.size());
    const u32 position = (static_cast<u32>(chunks_.size() - 1) << kChunkShift) + chunkUsed_;
    chunkUsed_ += needed;
    return position;
}

std::string FolderTable::NameAt(u32 position) const {
    const char* at =
        chunks_[position >> kChunkShift].get() + (position & ((1u << kChunkShift) - 1));
    u16 length = 0;
    std::memcpy(&length, at, sizeof length);
    return {at + sizeof length, length};
}

// Parent and name of a folder: from the table, or from its thread for a folder that comes later.
bool FolderTable::ReadStep(u32 id, Step* step) {
    step->id = id;
    const Entry* entry = Find(id);
    const u64 cost = entry != nullptr ? 1 : kLookupCost;
    if (stepsLeft_ < cost) {
        return false;
    }
    stepsLeft_ -= cost;
    if (entry != nullptr) {
        step->parent = entry->parent;
        step->name = NameAt(entry->name);
        step->isPrivate = entry->isPrivate;
        return true;
    }
    FoundItem found;
    if (!FindItem(session_, LowestKey(kCatalogFileId, id), &found)) {
        return false;
    }
    const ThreadView thread(found.data.data(), static_cast<u32>(found.data.size()));
    if (!thread.IsValid() || !thread.IsOfFolder()) {
        return false;
    }
    step->parent = thread.Parent();
    step->name.clear();
    AppendName(&step->name, thread.Name(), thread.NameLength(), form_);
    step->isPrivate = IsPrivateFolderName(step->parent, thread.Name(), thread.NameLength());
    return true;
}

// Remembers what a climb that did not reach the root has shown: who hangs on a ring, or on a folder
// that is not there, is not climbed from again.
void FolderTable::Forsake(u32 id, u32 stoppedAt, const std::vector<Step>& steps) {
    lost_.insert(id);
    const bool isRing = std::any_of(steps.begin(), steps.end(),
                                    [&](const Step& step) { return step.id == stoppedAt; });
    if (steps.size() >= kMostLevels && !isRing) {
        return;  // merely deep: the folders above it have their place
    }
    for (const Step& step : steps) {
        lost_.insert(step.id);
    }
    lost_.insert(stoppedAt);
}

// Climbs from `id` to the root.
void FolderTable::Build(u32 id, std::string* path, Place* place) {
    *place = Place{};
    std::vector<Step> steps;
    u32 at = id;
    while (at != kRootFolderId) {
        place->isWithin = place->isWithin || at == top_;
        Step step;
        if (steps.size() >= kMostLevels || lost_.count(at) != 0 || !ReadStep(at, &step)) {
            place->isLost = true;
            break;
        }
        place->isPrivate = place->isPrivate || step.isPrivate;
        at = step.parent;
        steps.push_back(std::move(step));
    }
    if (place->isLost) {
        Forsake(id, at, steps);
        *path = fmt::format("?{}/", id);
        return;
    }
    place->isWithin = place->isWithin || top_ == kRootFolderId || top_ == 0;
    *path = "/";
    for (auto step = steps.rbegin(); step != steps.rend(); ++step) {
        path->append(step->name);
        path->push_back('/');
    }
}

void FolderTable::EnterThread(u32 folderId, u32 parent, const u8* unitsBe, u32 count) {
    std::string name;
    AppendName(&name, unitsBe, count, form_);
    entries_.push_back(
        {folderId, parent, KeepName(name), IsPrivateFolderName(parent, unitsBe, count)});
    currentId_ = folderId;
    Build(folderId, &path_, &place_);
    lostFolders_ += place_.isLost ? 1 : 0;
}

void FolderTable::EnterLost(u32 folderId) {
    currentId_ = folderId;
    lost_.insert(folderId);
    path_ = fmt::format("?{}/", folderId);
    place_ = Place{};
    place_.isLost = true;
    lostFolders_ += 1;
}

std::string FolderTable::PathOf(u32 folderId, Place* place) {
    std::string path;
    Build(folderId, &path, place);
    return path;
}

}  // namespace VELK::tool
