// Paths of a catalog: from a path to its record, and from a folder ID to its path.
//
// Threads lead from a folder to its parent, and on a damaged volume they may lead round in a ring
// or nowhere. A path is then begun with "?ID": the folder that could not be placed.
#pragma once

#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <unordered_set>
#include <vector>

#include "hfs/records/key_text.h"
#include "hfs/records/name_text.h"
#include "tool/catalog_item.h"
#include "tool/session.h"

namespace VELK::tool {

// A catalog item found by path or ID, copied out of its leaf.
struct FoundItem {
    u32 parent = 0;
    std::vector<u8> name;  // big-endian units
    std::vector<u8> data;
    u32 node = 0;
    u32 index = 0;

    CatalogItem Item() const { return {data.data(), static_cast<u32>(data.size())}; }
    u32 NameLength() const { return static_cast<u32>(name.size() / 2); }
};

// The record with exactly this key (by the tree's order). False: absent. Throws ToolError.
bool FindItem(Session* session, const SearchKey& key, FoundItem* item);
// The item whose thread is `id`; false: no thread, or it names nothing.
bool FindItemById(Session* session, u32 id, FoundItem* item);
// The item a path names; throws "not found" with what its folder holds. "" and "/": the root.
FoundItem FindItemByPath(Session* session, const std::string& path);

// Paths of folders met in key order. Only names and parents are kept, packed.
class FolderTable {
public:
    FolderTable(Session* session, NameForm form);

    // What is known of a folder besides its path.
    struct Place {
        bool isPrivate = false;  // it is, or lies in, a private folder
        bool isWithin = false;   // it is, or lies in, the folder of SetTop
        bool isLost = false;     // it could not be placed
    };

    // Listings below one folder: Place::isWithin tells whether a folder lies there.
    void SetTop(u32 folderId) { top_ = folderId; }

    // Makes `folderId` the current folder: its thread says (parent, name). Threads must come in
    // rising order of their IDs.
    void EnterThread(u32 folderId, u32 parent, const u8* unitsBe, u32 count);
    // The same for a folder without a thread.
    void EnterLost(u32 folderId);

    // Path of the current folder with a slash at the end: "/", "/dir/".
    const std::string& CurrentPath() const { return path_; }
    const Place& CurrentPlace() const { return place_; }
    u32 CurrentId() const { return currentId_; }
    u64 LostFolders() const { return lostFolders_; }

    // Path of any folder, looked up step by step; for lookups in no order.
    std::string PathOf(u32 folderId, Place* place);

private:
    struct Entry {
        u32 id;
        u32 parent;
        u32 name;  // position in the chunks
        bool isPrivate;
    };
    struct Step {
        u32 id;
        u32 parent;
        std::string name;
        bool isPrivate;
    };

    const Entry* Find(u32 id) const;
    u32 KeepName(const std::string& name);
    std::string NameAt(u32 position) const;
    bool ReadStep(u32 id, Step* step);
    void Forsake(u32 id, u32 stoppedAt, const std::vector<Step>& steps);
    void Build(u32 id, std::string* path, Place* place);

    static constexpr u32 kChunkShift = 16;
    static constexpr u32 kMostLevels = 1024;
    // All climbs together may take so many steps: no arrangement of threads can hold a listing up.
    static constexpr u64 kLeastSteps = u64{1} << 22;
    static constexpr u64 kStepsPerRecord = 64;
    static constexpr u64 kLookupCost = 32;

    Session* session_;
    NameForm form_;
    u32 top_ = 0;
    std::deque<Entry> entries_;
    std::vector<std::unique_ptr<char[]>> chunks_;
    u32 chunkUsed_ = 0;
    std::unordered_set<u32> lost_;
    std::string path_;
    Place place_;
    u32 currentId_ = 0;
    u64 lostFolders_ = 0;
    u64 stepsLeft_;
};

}  // namespace VELK::tool
