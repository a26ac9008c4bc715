// ls: lists a folder, or everything below it.
#include "hfs/volume/volume_header.h"
#include "tool/errors.h"
#include "tool/item_printer.h"

namespace VELK::tool {

namespace {

struct LsOptions {
    std::optional<std::string> path;
    std::optional<u64> byId;
    bool recursive = false;
    bool all = false;
    PrintStyle style;
};

void Declare(Invocation* call, LsOptions* ls) {
    call->DeclareImage();
    call->options.OptionalArgument("PATH", &ls->path, "folder or file; default the root folder");
    call->options.Flag("-l,--long", &ls->style.longForm, "type, ID, size (folders: entries), date");
    call->options.Flag("-R,--recursive", &ls->recursive,
                       "everything below PATH, folder by folder, with whole paths");
    call->options.Flag("-a,--all", &ls->all, "also the private metadata folders");
    call->options.Count("--by-id", &ls->byId, "ID", "the folder or file with this ID");
    call->options.Flag("--xattr", &ls->style.attributes, "extended attributes below each item");
    call->options.Flag("--extents", &ls->style.extents, "where the forks lie, in blocks");
    call->options.Flag("-0,--null", &ls->style.zeroEnds, "end items with NUL, escape nothing");
    call->options.Flag("--nfc", &ls->style.composed, "names in composed form");
    call->DeclareLimits();
    call->DeclareKeepGoing();
    call->DeclareJson();
    call->DeclareOutputFile();
}

FoundItem FindStart(Session* session, const LsOptions& ls) {
    if (!ls.byId) {
        return FindItemByPath(session, ls.path.value_or("/"));
    }
    FoundItem item;
    if (*ls.byId > 0xFFFFFFFF || !FindItemById(session, static_cast<u32>(*ls.byId), &item)) {
        ThrowNo(session->Image(), fmt::format("no file or folder has ID {}", *ls.byId), "");
    }
    return item;
}

void PrintOne(Session* session, ItemPrinter* printer, const FoundItem& found) {
    FolderTable folders(session, printer->Form());
    FolderTable::Place place;
    const std::string path = folders.PathOf(found.parent, &place);
    printer->Print({found.Item(), found.name.data(), found.NameLength(), found.parent, &path,
                    found.node, found.index, place.isPrivate, place.isLost});
}

int FinishList(const Session& session, const Invocation& call, u64 lostFolders) {
    if (lostFolders != 0) {
        PrintNote(
            session.Image(),
            Failure(fmt::format("{} could not be placed in the folder tree (shown as ?ID)",
                                lostFolders == 1 ? "1 folder" : Grouped(lostFolders) + " folders"),
                    "run check --full"));
    }
    (void)call;
    return lostFolders != 0 || session.PassedOver() != 0 ? kExitFailed : kExitDone;
}

int RunLs(Invocation* call) {
    LsOptions ls;
    Declare(call, &ls);
    call->Parse();
    if (ls.path && ls.byId) {
        ThrowUsage("ls", "PATH and --by-id exclude each other", "");
    }
    if (ls.style.zeroEnds && (ls.style.attributes || ls.style.extents || call->json)) {
        ThrowUsage("ls", "--null lists names only", "leave out --xattr, --extents and --json");
    }
    Session session(*call, Session::Truncated::kReadOn);
    const FoundItem start = FindStart(&session, ls);
    ls.style.wholePaths = ls.recursive;
    ls.style.json = call->json;
    ItemPrinter printer(&session, &call->out, ls.style);
    u64 lost = 0;
    u64 printed = 0;
    u64 seen = 0;
    if (call->json) {
        call->out.Write("{\"schema\":\"treehfs.ls/1\"}\n");
    }
    if (!start.Item().IsFolder()) {
        PrintOne(&session, &printer, start);
        printed = 1;
    } else if (call->limit > 0) {
        // A folder that is asked for by name is shown, private or not.
        const bool isPrivate =
            IsPrivateFolderName(start.parent, start.name.data(), start.NameLength());
        const ListScope scope{start.Item().Id(), ls.recursive, ls.all || isPrivate, printer.Form()};
        lost = ListCatalog(&session, *call, scope, [&](const ListedItem& listed) {
            if (seen++ >= call->skipRecords) {
                printer.Print(listed);
                printed += 1;
            }
            return printed < call->limit;
        });
    }
    if (call->json) {
        call->out.Print("{{\"summary\":{{\"items\":{},\"lost_folders\":{}}}}}\n", printed, lost);
    }
    return FinishList(session, *call, lost);
}

}  // namespace

extern const Command kLsCommand;
const Command kLsCommand = {
    "ls",
    "IMAGE [PATH]",
    "list a folder, or the whole tree with -R",
    "Names are shown with ':' for the '/' a name may hold; what a terminal could take amiss is\n"
    "written \\xNN or \\uNNNN, and such a path is understood as an argument, too. -R lists folder\n"
    "by folder in the order of their IDs.",
    {"ls disk.img", "ls -l disk.img /Documents", "ls -R -0 disk.img | xargs -0 -n1 echo"},
    RunLs,
};

}  // namespace VELK::tool
