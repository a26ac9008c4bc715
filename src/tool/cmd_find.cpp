// find: by name, ID, kind, size, date or block; or by exact key, showing the way down the tree.
#include "hfs/records/text_format.h"
#include "hfs/volume/volume_header.h"
#include "tool/block_owner.h"
#include "tool/errors.h"
#include "tool/item_printer.h"
#include "tool/key_search.h"
#include "tool/name_collisions.h"
#include "tool/name_glob.h"

namespace VELK::tool {

namespace {

struct FindOptions {
    std::optional<std::string> path;
    std::optional<std::string> name;
    std::optional<std::string> iname;
    std::optional<u64> id;
    std::optional<std::string> type;
    std::optional<u64> larger;
    std::optional<std::string> newer;
    std::optional<u64> block;
    std::optional<std::string> key;
    std::optional<std::string> nearest;
    bool tracePath = false;
    bool orphans = false;
    bool collisions = false;
    std::optional<std::string> format;
    PrintStyle style;

    // Whether something is asked of the items of a list.
    bool ChoosesItems() const {
        return path || name || iname || id || type || larger || newer || orphans || collisions;
    }
};

// The conditions an item must meet, ready for use.
struct Conditions {
    std::vector<NameGlob> globs;
    std::optional<ItemKind> kind;
    std::optional<u64> larger;
    std::optional<u32> newer;
    bool orphans = false;

    bool Hold(const ListedItem& listed) const {
        if ((orphans && !listed.isLost) || (kind && listed.item.Kind() != *kind) ||
            (larger && (listed.item.IsFolder() || listed.item.Size() <= *larger)) ||
            (newer && listed.item.ModifyDate() <= *newer)) {
            return false;
        }
        for (const NameGlob& glob : globs) {
            if (!glob.Matches(listed.name, listed.nameLength)) {
                return false;
            }
        }
        return true;
    }
};

void Declare(Invocation* call, FindOptions* find) {
    call->DeclareImage();
    OptionSet& options = call->options;
    options.OptionalArgument("PATH", &find->path, "folder to search in; default everything");
    options.Text("--name", &find->name, "GLOB", "name matches: * ? [a-z]");
    options.Text("--iname", &find->iname, "GLOB", "the same, whatever the case of letters");
    options.Count("--id", &find->id, "N", "the file or folder with this ID");
    options.Text("--type", &find->type, "KIND", "file, folder, symlink or hardlink");
    options.Size("--larger", &find->larger, "N", "files of more than N bytes: 1000, 64K");
    options.Text("--newer", &find->newer, "DATE", "changed after 2026-11-21[T01:18:16Z]");
    options.Count("--block", &find->block, "N", "whose allocation block this is");
    options.Text("--key", &find->key, "KEY", "the record with exactly this key");
    options.Text("--nearest", &find->nearest, "KEY", "where this key would be inserted");
    options.Flag("--trace-path", &find->tracePath, "with a key: the way down the tree");
    options.Flag("--orphans", &find->orphans, "items whose folder cannot be placed");
    options.Flag("--collisions", &find->collisions,
                 "names that are one but for case and spelling, folder by folder");
    options.Text("--format", &find->format, "PATTERN",
                 "a line of your own for each: '{id}\\t{path}\\n'");
    options.Flag("-l,--long", &find->style.longForm, "type, ID, size, date before the path");
    options.Flag("-0,--null", &find->style.zeroEnds, "end paths with NUL, escape nothing");
    options.Flag("--nfc", &find->style.composed, "names in composed form");
    call->DeclareTrees(TreeDefault::kCatalog);
    call->DeclareLimits();
    call->DeclareKeepGoing();
    call->DeclareJson();
    call->DeclareOutputFile();
}

Conditions Prepare(const FindOptions& find) {
    Conditions conditions;
    if (find.name) {
        conditions.globs.emplace_back(*find.name, false);
    }
    if (find.iname) {
        conditions.globs.emplace_back(*find.iname, true);
    }
    if (find.type) {
        ItemKind kind;
        if (!ItemKindByName(*find.type, &kind)) {
            ThrowUsage("find",
                       "--type: '" + *find.type + "' is no kind of item" +
                           DidYouMean(*find.type, {"file", "folder", "symlink", "hardlink"}),
                       "file, folder, symlink or hardlink");
        }
        conditions.kind = kind;
    }
    if (find.newer) {
        u32 date = 0;
        if (!ParseDate(*find.newer, &date)) {
            ThrowUsage("find", "--newer: '" + *find.newer + "' is no date",
                       "write it like 2026-11-21 or 2026-11-21T01:18:16Z");
        }
        conditions.newer = date;
    }
    conditions.larger = find.larger;
    conditions.orphans = find.orphans;
    return conditions;
}

u64 FindOne(Session* session, const FindOptions& find, const Conditions& conditions,
            ItemPrinter* printer) {
    FoundItem item;
    if (*find.id > 0xFFFFFFFF || !FindItemById(session, static_cast<u32>(*find.id), &item)) {
        return 0;
    }
    FolderTable folders(session, printer->Form());
    FolderTable::Place place;
    // The root folder is "/", its name is the volume's.
    const bool isRoot = item.parent < kRootFolderId;
    const std::string path = folders.PathOf(isRoot ? kRootFolderId : item.parent, &place);
    const ListedItem listed = {item.Item(),
                               item.name.data(),
                               isRoot ? 0 : item.NameLength(),
                               item.parent,
                               &path,
                               item.node,
                               item.index,
                               place.isPrivate,
                               place.isLost};
    if (!conditions.Hold(listed)) {
        return 0;
    }
    printer->Print(listed);
    return 1;
}

u64 FindMany(Session* session, const Invocation& call, const FindOptions& find,
             const Conditions& conditions, ItemPrinter* printer) {
    u64 printed = 0;
    u64 matched = 0;
    if (call.limit == 0) {
        return 0;
    }
    ListScope scope;
    scope.recursive = true;
    scope.all = true;
    scope.form = printer->Form();
    if (find.path) {
        const FoundItem start = FindItemByPath(session, *find.path);
        if (!start.Item().IsFolder()) {
            ThrowNo(session->Image(), *find.path + ": not a folder", "");
        }
        scope.folderId = start.Item().Id();
    }
    const auto print = [&](const ListedItem& listed) {
        if (matched++ >= call.skipRecords) {
            printer->Print(listed);
            printed += 1;
        }
        return printed < call.limit;
    };
    CollisionFinder collisions(print);
    ListCatalog(session, call, scope, [&](const ListedItem& listed) {
        if (!conditions.Hold(listed)) {
            return true;
        }
        return find.collisions ? collisions.Add(listed) : print(listed);
    });
    if (printed < call.limit) {
        collisions.Finish();
    }
    return printed;
}

int FindItems(Session* session, Invocation* call, FindOptions* find) {
    const Conditions conditions = Prepare(*find);
    find->style.wholePaths = true;
    find->style.json = call->json;
    ItemPrinter printer(session, &call->out, find->style);
    if (call->json) {
        call->out.Write("{\"schema\":\"treehfs.find/1\"}\n");
    }
    const u64 printed = find->id ? FindOne(session, *find, conditions, &printer)
                                 : FindMany(session, *call, *find, conditions, &printer);
    if (call->json) {
        call->out.Print("{{\"summary\":{{\"items\":{}}}}}\n", printed);
    }
    if (session->PassedOver() != 0) {
        return kExitFailed;
    }
    return printed != 0 ? kExitDone : kExitNo;
}

int RunFind(Invocation* call) {
    FindOptions find;
    Declare(call, &find);
    call->Parse();
    const bool byKey = find.key || find.nearest;
    if ((find.key && find.nearest) || (byKey && find.block)) {
        ThrowUsage("find", "--key, --nearest and --block exclude each other", "");
    }
    if ((byKey || find.block) && find.ChoosesItems()) {
        ThrowUsage("find",
                   "--key, --nearest and --block stand alone: other conditions are for lists", "");
    }
    if (!byKey && (call->treesGiven && call->trees[0] != kCatalogFileId)) {
        ThrowUsage("find", "only --key and --nearest look into other trees than the catalog", "");
    }
    if (find.tracePath && !byKey) {
        ThrowUsage("find", "--trace-path wants --key or --nearest", "");
    }
    if (find.format && (call->json || byKey || find.block)) {
        ThrowUsage("find", "--format is for lists of paths: not with --json, --key or --block", "");
    }
    if (find.format) {
        find.style.format = std::make_shared<const ItemFormat>("find", *find.format);
    }
    Session session(*call, Session::Truncated::kReadOn);
    if (find.block) {
        return FindBlock(&session, call, *find.block);
    }
    if (byKey) {
        const KeySearch search = {find.key ? *find.key : *find.nearest, find.nearest.has_value(),
                                  find.tracePath};
        return SearchByKey(&session, call, search);
    }
    return FindItems(&session, call, &find);
}

}  // namespace

extern const Command kFindCommand;
const Command kFindCommand = {
    "find",
    "IMAGE [PATH]",
    "search by name, ID, kind, size, date or block; or by exact key",
    "Conditions are combined: all must hold; --key, --nearest and --block stand alone. Exit code 1 "
    "when nothing matches. The fields of --format: path name id parent type size rsize modified "
    "created mode flags node record.",
    {"find disk.img --name 'file_1?.txt' --limit 2", "find disk.img --type file --larger 64K -l",
     "find disk.img --key '2:file_1.txt' --trace-path"},
    RunFind,
};

}  // namespace VELK::tool
