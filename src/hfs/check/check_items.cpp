// The catalog's files and folders against their threads, their parents, the counts of the volume
// header, and the attributes that claim to be theirs. Holds 32 bytes per file or folder.
#include <algorithm>

#include "hfs/check/check_records.h"
#include "hfs/check/check_volume.h"

namespace VELK {
namespace {

constexpr u32 kRootParentId = 1;
constexpr u32 kRootId = 2;
constexpr u32 kFirstUserId = 16;

enum ItemFlag : u8 { kIsFolder = 1, kHasThread = 2, kOnPath = 4, kReachesRoot = 8 };

struct Item {
    u32 id;
    u32 parent;
    u32 nodeNum;
    u32 hashHigh;
    u32 hashLow;
    u32 valence;
    u32 children;
    u16 record;
    u8 flags;
};

// 64 bits that tell names apart as they are stored.
u64 NameHash(const u8* units, u32 count) {
    u64 hash = 0xcbf29ce484222325u;
    for (u32 i = 0; i < 2 * count; ++i) {
        hash = (hash ^ units[i]) * 0x100000001b3u;
    }
    return hash;
}

class Items {
public:
    explicit Items(CheckVolumeState* state) : state_(*state), run_(*state->run) {}

    void Gather();
    void CheckIds();
    void CheckThreads();
    void CheckParents();
    void CheckLoops();
    void CheckCounts() const;
    void CheckAttributes();
    void CheckOverflowOwners();

private:
    static void TakeItem(void* self, const CheckTree&, const CheckNode&, u32, const CheckRecord&);
    static void TakeThread(void* self, const CheckTree&, const CheckNode&, u32, const CheckRecord&);
    static void TakeAttribute(void* self, const CheckTree&, const CheckNode&, u32,
                              const CheckRecord&);

    Item* Find(u32 id);
    CheckPlace Place(const Item& item) const {
        return state_.catalog->Place(item.nodeNum, kDescSize, item.record);
    }
    std::string KeyText(const Item& item) const;
    static const char* KindOf(const Item& item) {
        return (item.flags & kIsFolder) != 0 ? "folder" : "file";
    }

    CheckVolumeState& state_;
    CheckRun& run_;
    std::vector<Item> items_;
    u64 folders_ = 0;
    u32 attributeOwner_ = 0;  // the last one told
};

void Items::TakeItem(void* self, const CheckTree&, const CheckNode& node, u32 index,
                     const CheckRecord& record) {
    auto* items = static_cast<Items*>(self);
    const u32 type = Load16(record.data);
    if (type != kCatFolder && type != kCatFile) {
        return;
    }
    const u64 hash = NameHash(record.key + kCatKeyName, Load16(record.key + kCatKeyNameLength));
    Item item = {};
    item.id = Load32(record.data + kItemId);
    item.parent = Load32(record.key + kCatKeyParentId);
    item.nodeNum = node.nodeNum;
    item.hashHigh = static_cast<u32>(hash >> 32);
    item.hashLow = static_cast<u32>(hash);
    item.record = static_cast<u16>(index);
    if (type == kCatFolder) {
        item.flags = kIsFolder;
        item.valence = Load32(record.data + kFolderValence);
        ++items->folders_;
    }
    items->items_.push_back(item);
}

void Items::Gather() {
    items_.reserve(static_cast<std::size_t>(state_.catalog->leafRecords / 2 + 1));
    ForEachLeafRecord(state_.catalog.get(), {this, TakeItem});
    std::stable_sort(items_.begin(), items_.end(),
                     [](const Item& left, const Item& right) { return left.id < right.id; });
}

Item* Items::Find(u32 id) {
    auto found = std::lower_bound(items_.begin(), items_.end(), id,
                                  [](const Item& item, u32 value) { return item.id < value; });
    return found == items_.end() || found->id != id ? nullptr : &*found;
}

std::string Items::KeyText(const Item& item) const {
    CheckTree& tree = *state_.catalog;
    std::vector<u8> bytes(tree.nodeSize);
    if (tree.file->Read(tree.NodeOffset(item.nodeNum), bytes.data(), tree.nodeSize) != 0) {
        return "?";
    }
    const CheckNode node = {bytes.data(), item.nodeNum, tree.nodeSize,
                            CountUsableRecords(bytes.data(), tree.nodeSize)};
    CheckRecord record;
    if (item.record >= node.usable || !TakeRecord(tree, node, item.record, true, true, &record)) {
        return "?";
    }
    return CheckKeyText(tree.kind, record.key);
}

void Items::CheckIds() {
    u32 before = 0;
    for (const Item& item : items_) {
        if (item.id < kFirstUserId && item.id != kRootId) {
            run_.Error(CheckId::R10, Place(item),
                       CheckPrint("ID %u of %s %s is reserved", item.id, KindOf(item),
                                  KeyText(item).c_str()));
        } else if (item.id == before) {
            run_.Error(CheckId::R10, Place(item),
                       CheckPrint("ID %u of %s %s is used by another record too", item.id,
                                  KindOf(item), KeyText(item).c_str()));
        }
        before = item.id;
    }
    const CheckVolumeHeader& header = state_.header;
    if (!items_.empty() && items_.back().id >= header.nextCatalogId &&
        (header.attributes & kVolAttrReusedIds) == 0) {
        run_.Error(
            CheckId::V07, state_.HeaderPlace(kVolNextCatalogId),
            CheckPrint("next ID is %u, ID %u is in use", header.nextCatalogId, items_.back().id),
            u64{items_.back().id} + 1, header.nextCatalogId);
    }
}

void Items::TakeThread(void* self, const CheckTree& tree, const CheckNode& node, u32 index,
                       const CheckRecord& record) {
    auto* items = static_cast<Items*>(self);
    const u32 type = Load16(record.data);
    if (type != kCatFolderThread && type != kCatFileThread) {
        return;
    }
    const u32 id = Load32(record.key + kCatKeyParentId);
    Item* item = items->Find(id);
    if (item == nullptr) {
        items->run_.Error(CheckId::R05, tree.Place(node.nodeNum, node.Start(index), index),
                          CheckPrint("a thread of ID %u, which no file or folder has", id));
        return;
    }
    item->flags = static_cast<u8>(item->flags | kHasThread);
    const bool isFolder = (item->flags & kIsFolder) != 0;
    if (isFolder != (type == kCatFolderThread)) {
        items->run_.Error(
            CheckId::R05, tree.Place(node.nodeNum, record.dataOffset, index),
            CheckPrint("a %s thread, ID %u is a %s", type == kCatFolderThread ? "folder" : "file",
                       id, KindOf(*item)));
    }
    const u8* name = record.data + kThreadName;
    const u32 nameLength = Load16(record.data + kThreadNameLength);
    const u32 parent = Load32(record.data + kThreadParentId);
    const u64 hash = NameHash(name, nameLength);
    if (parent != item->parent || item->hashHigh != static_cast<u32>(hash >> 32) ||
        item->hashLow != static_cast<u32>(hash)) {
        items->run_.Tell(
            CheckId::R05, CheckSeverity::kError, tree.Place(node.nodeNum, record.dataOffset, index),
            CheckPrint("the thread of ID %u points to %u:%s, its record is %s", id, parent,
                       CheckNameText(name, nameLength).c_str(), items->KeyText(*item).c_str()),
            items->KeyText(*item), CheckPrint("%u:", parent) + CheckNameText(name, nameLength));
    }
}

void Items::CheckThreads() {
    ForEachLeafRecord(state_.catalog.get(), {this, TakeThread});
    for (std::size_t i = 0; i < items_.size() && !run_.IsStopped(); ++i) {
        const bool isFirst = i == 0 || items_[i - 1].id != items_[i].id;
        if (isFirst && (items_[i].flags & kHasThread) == 0) {
            run_.Error(CheckId::R05, Place(items_[i]),
                       CheckPrint("%s %s (ID %u) has no thread", KindOf(items_[i]),
                                  KeyText(items_[i]).c_str(), items_[i].id));
        }
    }
}

void Items::CheckParents() {
    const Item* root = Find(kRootId);
    if (root == nullptr || (root->flags & kIsFolder) == 0 || root->parent != kRootParentId) {
        run_.Error(CheckId::R05, {kCatalogFileId, -1, -1, kCheckNoOffset, "tree"},
                   "there is no root folder (ID 2 under ID 1)");
    }
    for (Item& item : items_) {
        if (item.parent == kRootParentId && item.id == kRootId) {
            continue;
        }
        Item* parent = Find(item.parent);
        if (parent == nullptr) {
            run_.Error(CheckId::R05, Place(item),
                       CheckPrint("%s %s (ID %u): there is no folder %u", KindOf(item),
                                  KeyText(item).c_str(), item.id, item.parent));
        } else if ((parent->flags & kIsFolder) == 0) {
            run_.Error(CheckId::R05, Place(item),
                       CheckPrint("%s %s (ID %u): ID %u is a file", KindOf(item),
                                  KeyText(item).c_str(), item.id, item.parent));
        } else {
            ++parent->children;
        }
    }
    for (const Item& item : items_) {
        if ((item.flags & kIsFolder) != 0 && item.valence != item.children) {
            run_.Warn(CheckId::R05, Place(item),
                      CheckPrint("valence of folder %s (ID %u) is %u, it has %s",
                                 KeyText(item).c_str(), item.id, item.valence,
                                 CheckCounted(item.children, "item", "items").c_str()),
                      item.children, item.valence);
        }
    }
}

// Folders whose chain of parents returns to itself. Each folder is passed at most twice.
void Items::CheckLoops() {
    std::vector<Item*> path;
    for (Item& start : items_) {
        path.clear();
        Item* item = &start;
        while (item != nullptr && (item->flags & (kOnPath | kReachesRoot)) == 0 &&
               (item->flags & kIsFolder) != 0) {
            item->flags = static_cast<u8>(item->flags | kOnPath);
            path.push_back(item);
            item = item->id == kRootId ? nullptr : Find(item->parent);
        }
        if (item != nullptr && (item->flags & kOnPath) != 0) {
            run_.Error(
                CheckId::R05, Place(*item),
                CheckPrint("folder %s (ID %u) lies in itself", KeyText(*item).c_str(), item->id));
        }
        for (Item* passed : path) {
            passed->flags = static_cast<u8>((passed->flags & ~kOnPath) | kReachesRoot);
        }
    }
}

void Items::CheckCounts() const {
    const CheckVolumeHeader& header = state_.header;
    const u64 files = items_.size() - folders_;
    const u64 folders = folders_ == 0 ? 0 : folders_ - 1;
    if (files != header.fileCount) {
        run_.Warn(CheckId::V06, state_.HeaderPlace(kVolFileCount),
                  CheckPrint("fileCount is %u, the catalog has %s", header.fileCount,
                             CheckCounted(files, "file", "files").c_str()),
                  files, header.fileCount);
    }
    if (folders != header.folderCount) {
        run_.Warn(
            CheckId::V06, state_.HeaderPlace(kVolFolderCount),
            CheckPrint("folderCount is %u, the catalog has %s below the root", header.folderCount,
                       CheckCounted(folders, "folder", "folders").c_str()),
            folders, header.folderCount);
    }
}

void Items::TakeAttribute(void* self, const CheckTree& tree, const CheckNode& node, u32 index,
                          const CheckRecord& record) {
    auto* items = static_cast<Items*>(self);
    const u32 id = Load32(record.key + kAttrKeyFileId);
    if (id != items->attributeOwner_ && items->Find(id) == nullptr) {
        items->run_.Error(CheckId::R09, tree.Place(node.nodeNum, node.Start(index), index),
                          CheckPrint("attribute %s: no file or folder has ID %u",
                                     CheckKeyText(tree.kind, record.key).c_str(), id));
    }
    items->attributeOwner_ = id;
}

void Items::CheckAttributes() {
    if (state_.attributes != nullptr) {
        ForEachLeafRecord(state_.attributes.get(), {this, TakeAttribute});
    }
}

void Items::CheckOverflowOwners() {
    for (CheckOverflow& overflow : state_.overflow) {
        const Item* item = Find(overflow.fileId);
        if (item != nullptr && (item->flags & kIsFolder) == 0) {
            continue;
        }
        overflow.isClaimed = true;  // told here, once
        run_.Error(CheckId::R08,
                   state_.extents->Place(overflow.nodeNum, kDescSize, overflow.record),
                   CheckPrint("extents of ID %u, which is no file", overflow.fileId));
    }
}

}  // namespace

void CheckItems(CheckVolumeState* state) {
    if (!state->run->WantsAny(
            {CheckId::R05, CheckId::R08, CheckId::R09, CheckId::R10, CheckId::V06, CheckId::V07})) {
        return;
    }
    Items items(state);
    items.Gather();
    items.CheckIds();
    items.CheckThreads();
    items.CheckParents();
    items.CheckLoops();
    items.CheckCounts();
    items.CheckAttributes();
    items.CheckOverflowOwners();
}

}  // namespace VELK
