// Lists of catalog items.
#include "tool/catalog_list.h"

#include "hfs/records/key_layout.h"
#include "hfs/records/thread_view.h"
#include "hfs/volume/volume_header.h"

namespace VELK::tool {

namespace {

u64 ListEverything(Session* session, const Invocation& call, const ListScope& scope,
                   const std::function<bool(const ListedItem&)>& visit) {
    LeafCursor cursor(session, kCatalogFileId, call.keepGoing);
    FolderTable folders(session, scope.form);
    folders.SetTop(scope.folderId);
    Progress progress(call, std::string(call.command.name) + " catalog", "records",
                      session->Tree(kCatalogFileId)->header.leafRecords, 0);
    LeafRecord record;
    u64 done = 0;
    cursor.SeekFirst();
    while (cursor.Next(&record)) {
        progress.Update(++done);
        const KeyView key(kCatalogFileId, record.key);
        const u32 parent = key.Id();
        if (parent < kRootFolderId) {
            continue;  // the root folder itself
        }
        const ThreadView thread(record.data, record.dataSize);
        if (thread.IsValid() && thread.IsOfFolder() && key.NameLength() == 0) {
            folders.EnterThread(parent, thread.Parent(), thread.Name(), thread.NameLength());
            continue;
        }
        const CatalogItem item(record.data, record.dataSize);
        if (!item.IsValid()) {
            continue;
        }
        if (parent != folders.CurrentId()) {
            folders.EnterLost(parent);
        }
        const FolderTable::Place& place = folders.CurrentPlace();
        if (!place.isWithin && !(place.isLost && scope.folderId == kRootFolderId)) {
            continue;
        }
        const bool isPrivate =
            place.isPrivate || IsPrivateFolderName(parent, key.Name(), key.NameLength());
        if (isPrivate && !scope.all) {
            continue;
        }
        if (!visit({item, key.Name(), key.NameLength(), parent, &folders.CurrentPath(), record.node,
                    record.index, isPrivate, place.isLost})) {
            break;
        }
    }
    return folders.LostFolders();
}

u64 ListFolder(Session* session, const Invocation& call, const ListScope& scope,
               const std::function<bool(const ListedItem&)>& visit) {
    LeafCursor cursor(session, kCatalogFileId, call.keepGoing);
    FolderTable folders(session, scope.form);
    FolderTable::Place place;
    const std::string path = folders.PathOf(scope.folderId, &place);
    LeafRecord record;
    cursor.Seek(LowestKey(kCatalogFileId, scope.folderId), nullptr);
    Progress progress(call, std::string(call.command.name) + " catalog", "records", 0, 0);
    u64 done = 0;
    while (cursor.Next(&record)) {
        progress.Update(++done);
        const KeyView key(kCatalogFileId, record.key);
        if (key.Id() != scope.folderId) {
            break;
        }
        const CatalogItem item(record.data, record.dataSize);
        if (!item.IsValid()) {
            continue;
        }
        const bool isPrivate = IsPrivateFolderName(key.Id(), key.Name(), key.NameLength());
        if (isPrivate && !scope.all) {
            continue;
        }
        if (!visit({item, key.Name(), key.NameLength(), key.Id(), &path, record.node, record.index,
                    isPrivate, place.isLost})) {
            break;
        }
    }
    return place.isLost ? 1 : 0;
}

}  // namespace

u64 ListCatalog(Session* session, const Invocation& call, const ListScope& scope,
                const std::function<bool(const ListedItem&)>& visit) {
    return scope.recursive ? ListEverything(session, call, scope, visit)
                           : ListFolder(session, call, scope, visit);
}

}  // namespace VELK::tool
