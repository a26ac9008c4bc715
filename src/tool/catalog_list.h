// Lists catalog items one by one: a folder, or everything in key order, which is folder by folder
// by rising ID. Knows the path of each item and nothing of how it is printed.
#pragma once

#include <functional>

#include "tool/catalog_paths.h"
#include "tool/leaf_cursor.h"
#include "tool/progress.h"

namespace VELK::tool {

// One item while it is listed; everything is valid until the next one.
struct ListedItem {
    CatalogItem item;
    const u8* name;  // big-endian units
    u32 nameLength;
    u32 parent;
    const std::string* folderPath;  // ends with a slash; in the form of the list
    u32 node;
    u32 index;
    bool isPrivate;
    bool isLost;  // its folder could not be placed
};

struct ListScope {
    u32 folderId = 2;  // where to begin
    bool recursive = false;
    bool all = false;  // private folders, too
    NameForm form = NameForm::kText;
};

// Calls `visit` for every item of the scope; false from it ends the list. Throws ToolError.
// Returns the number of folders that could not be placed.
u64 ListCatalog(Session* session, const Invocation& call, const ListScope& scope,
                const std::function<bool(const ListedItem&)>& visit);

}  // namespace VELK::tool
