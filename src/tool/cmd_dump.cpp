// dump: records or nodes of a tree, readable, as JSON or as bytes.
#include "tool/dump_printer.h"
#include "tool/errors.h"
#include "tool/key_argument.h"
#include "tool/leaf_cursor.h"
#include "tool/progress.h"
#include "tool/record_filter.h"
#include "tool/reverse_walk.h"

namespace VELK::tool {

namespace {

struct DumpOptions {
    bool nodes = false;
    bool reverse = false;
    std::vector<std::string> where;
    std::string order = "leaf";
    DumpStyle style;
    std::string values = "short";
};

NodeOrder OrderOf(const std::string& word) {
    return word == "bfs"    ? NodeOrder::kBreadth
           : word == "dfs"  ? NodeOrder::kDepth
           : word == "disk" ? NodeOrder::kDisk
                            : NodeOrder::kLeaf;
}

// Counts what --offset-records leaves out and where --limit ends.
class Window {
public:
    explicit Window(const Invocation& call) : skip_(call.skipRecords), left_(call.limit) {}
    bool IsOver() const { return left_ == 0; }
    bool Takes() {
        if (skip_ > 0) {
            skip_ -= 1;
            return false;
        }
        left_ -= 1;
        return true;
    }

private:
    u64 skip_;
    u64 left_;
};

void DumpBackwards(Session* session, Invocation* call, const RecordFilter& filter,
                   DumpPrinter* printer, Progress* progress) {
    const u32 fileId = call->trees[0];
    const KeyRange range = RangeArgument(session, fileId, call->range);
    Window window(*call);
    u64 done = 0;
    WalkBackwards(session, fileId, range, call->keepGoing, [&](const NodeRecord& record) {
        progress->Update(++done);
        if (!window.IsOver() && filter.Holds(record, true) && window.Takes()) {
            printer->Record(record, true);
        }
        return !window.IsOver();
    });
}

void DumpByKey(Session* session, Invocation* call, const RecordFilter& filter, DumpPrinter* printer,
               Progress* progress) {
    const u32 fileId = call->trees[0];
    const CBTreeHfs* tree = session->Tree(fileId);
    const KeyRange range = RangeArgument(session, fileId, call->range);
    LeafCursor cursor(session, fileId, call->keepGoing);
    cursor.SeekFrom(range.from);
    Window window(*call);
    LeafRecord record;
    u64 done = 0;
    while (!window.IsOver() && cursor.Next(&record)) {
        progress->Update(++done);
        const int place = range.Place(*tree, record.key);
        if (place > 0) {
            break;
        }
        if (place == 0 && filter.Holds(record, true) && window.Takes()) {
            printer->Record(record, true);
        }
    }
}

// Records of one node, as far as they can be located.
void DumpNodeRecords(Session* session, Invocation* call, const HeldNode& node,
                     const KeyRange& range, const RecordFilter& filter, Window* window,
                     DumpPrinter* printer) {
    const u32 fileId = call->trees[0];
    CBTreeHfs* tree = session->Tree(fileId);
    const bool isLeaf = node.Kind() == kBTLeafNode;
    if (!isLeaf && node.Kind() != kBTIndexNode) {
        return;
    }
    RecordReader reader(tree);
    NodeRecord record;
    SearchKey key;
    for (u32 i = 0; i < node.RecordCount() && !window->IsOver(); ++i) {
        const int status = reader.Describe(node.Get(), i, &record);
        if (status != 0 || !SearchKeyFromStored(fileId, record.key, record.keySize, &key)) {
            const Problem problem =
                session->ProblemOf(fileId, node.Number(), status != 0 ? status : kErrCorrupt,
                                   fmt::format("record {} cannot be read", i));
            if (!call->keepGoing) {
                ThrowProblem(session->Image(), problem);
            }
            session->NotePassedOver(problem);
            if (status != 0) {
                return;  // the offsets of this node lead nowhere
            }
            continue;
        }
        if (range.Place(*tree, record.key) == 0 && filter.Holds(record, isLeaf) &&
            window->Takes()) {
            printer->Record(record, isLeaf);
        }
    }
}

void DumpByNode(Session* session, Invocation* call, const DumpOptions& dump,
                const RecordFilter& filter, DumpPrinter* printer, Progress* progress) {
    const u32 fileId = call->trees[0];
    const KeyRange range = RangeArgument(session, fileId, call->range);
    Window window(*call);
    u64 done = 0;
    VisitNodes(session, fileId, OrderOf(dump.order), call->keepGoing, [&](const HeldNode& node) {
        progress->Update(++done);
        if (window.IsOver()) {
            return false;
        }
        if (!dump.nodes) {
            DumpNodeRecords(session, call, node, range, filter, &window, printer);
        } else if (window.Takes()) {
            printer->Node(node);
        }
        return !window.IsOver();
    });
}

void Declare(Invocation* call, DumpOptions* dump) {
    call->DeclareImage();
    call->DeclareTrees(TreeDefault::kCatalog);
    OptionSet& options = call->options;
    options.Flag("--nodes", &dump->nodes, "a line per node instead of one per record");
    options.Choice("--order", &dump->order, {"leaf", "bfs", "dfs", "disk"},
                   "by key; by level; each node before its children; as in the file");
    options.Flag("--reverse", &dump->reverse, "records from the last key to the first");
    options.List("--where", &dump->where, "CONDITION",
                 "only records with type=file, size>=64K, name=*.txt, ...; all must hold");
    options.Choice("--values", &dump->values, {"none", "short", "full"},
                   "how much of the data is shown");
    options.Flag("--hide-names", &dump->style.hideNames, "n and the ID in place of each name");
    options.Flag("--hex", &dump->style.hex, "bytes, sixteen to a row");
    options.Flag("--raw", &dump->style.raw, "the bytes themselves");
    call->DeclareRange();
    call->DeclareLimits();
    call->DeclareKeepGoing();
    call->DeclareJson();
    call->DeclareOutputFile();
}

void CheckCombination(Invocation* call, const DumpOptions& dump) {
    if (call->json + dump.style.hex + dump.style.raw > 1) {
        ThrowUsage("dump", "--json, --hex and --raw exclude each other", "");
    }
    if (dump.style.raw && call->out.IsTerminal()) {
        ThrowUsage("dump", "--raw would write bytes to the terminal", "add -o FILE, or use --hex");
    }
    const bool choosesRecords = !call->range.empty() || !dump.where.empty();
    if (dump.nodes && choosesRecords) {
        ThrowUsage("dump",
                   fmt::format("{} chooses records, --nodes lists nodes",
                               call->range.empty() ? "--where" : "--range"),
                   "leave one out");
    }
    if (dump.reverse && (dump.nodes || dump.order != "leaf")) {
        ThrowUsage("dump", "--reverse goes by key: not with --nodes or another --order", "");
    }
}

// A tree named by --where tree=... is the one dumped.
void ChooseTree(Invocation* call, DumpOptions* dump) {
    const u32 named = RecordFilter::TakeTree(&dump->where);
    if (named != 0 && call->treesGiven && named != call->trees[0]) {
        ThrowUsage("dump", "--tree and --where name different trees", "leave one out");
    }
    if (named != 0) {
        call->trees[0] = named;
    }
}

int RunDump(Invocation* call) {
    DumpOptions dump;
    Declare(call, &dump);
    call->Parse();
    ChooseTree(call, &dump);
    CheckCombination(call, dump);
    dump.style.json = call->json;
    dump.style.values = dump.values == "none"   ? DumpStyle::Values::kNone
                        : dump.values == "full" ? DumpStyle::Values::kFull
                                                : DumpStyle::Values::kShort;
    const u32 fileId = call->trees[0];
    const RecordFilter filter(fileId, dump.where);
    Session session(*call, Session::Truncated::kRefuse);
    const CBTreeHfs* tree = session.Tree(fileId);
    DumpPrinter printer(&session, &call->out, fileId, dump.style);
    const bool byKey = dump.order == "leaf" && !dump.nodes;
    Progress progress(*call, std::string("dump ") + ForkName(fileId), byKey ? "records" : "nodes",
                      byKey ? tree->header.leafRecords : tree->header.totalNodes,
                      byKey ? 0 : tree->header.nodeSize);
    printer.Begin(dump.nodes);
    if (dump.reverse) {
        DumpBackwards(&session, call, filter, &printer, &progress);
    } else if (byKey) {
        DumpByKey(&session, call, filter, &printer, &progress);
    } else {
        DumpByNode(&session, call, dump, filter, &printer, &progress);
    }
    printer.End();
    return session.PassedOver() != 0 ? kExitFailed : kExitDone;
}

}  // namespace

extern const Command kDumpCommand;
const Command kDumpCommand = {
    "dump",
    "IMAGE",
    "records or nodes of a tree, readable, as JSON or as bytes",
    "--order disk reads every node of the file and does not trust the index: it shows records of\n"
    "nodes that are no longer in use, too. --where compares (= != < <= > >=) a field that "
    "--values\n"
    "full or --json shows, besides type, node, record, bytes and the fields of the key.",
    {"dump -t catalog --range '2:a..2:b' disk.img", "dump --where 'size>=64K' --json disk.img",
     "dump --nodes --order disk disk.img"},
    RunDump,
};

}  // namespace VELK::tool
