// info: the volume and its trees on one screen.
#include "hfs/names_text.h"
#include "hfs/records/text_format.h"
#include "tool/catalog_paths.h"
#include "tool/errors.h"
#include "tool/leaf_cursor.h"
#include "tool/progress.h"
#include "tool/record_digest.h"
#include "tool/volume_text.h"

namespace VELK::tool {

namespace {

struct InfoOptions {
    bool digest = false;
    bool partitions = false;
    bool headers = false;
};

// What the table says of one tree.
struct TreeRow {
    u32 fileId = 0;
    bool present = false;
    Problem problem;  // it cannot be opened
    u32 nodes = 0;
    u32 free = 0;
    u32 nodeSize = 0;
    u32 depth = 0;
    u32 records = 0;
    u32 mapNodes = 0;
    u64 fileBytes = 0;
    u32 extents = 0;
    u32 leaves = 0;
    double fill = 0;
};

TreeRow ReadTree(Session* session, const Invocation& call, u32 fileId) {
    TreeRow row;
    row.fileId = fileId;
    row.present = session->Volume().HasTree(fileId);
    if (!row.present) {
        return row;
    }
    CBTreeHfs* tree = session->TryTree(fileId, &row.problem);
    if (tree == nullptr) {
        return row;
    }
    row.nodes = tree->header.totalNodes;
    row.free = tree->header.freeNodes;
    row.nodeSize = tree->header.nodeSize;
    row.depth = tree->header.treeDepth;
    row.records = tree->header.leafRecords;
    row.mapNodes = static_cast<u32>(MapNodes(tree).size());
    row.fileBytes = session->Volume().Fs()->ForkOf(fileId)->logicalSize;
    row.extents = static_cast<u32>(session->Volume().ForkExtents(fileId).size());
    Progress progress(call, std::string("info ") + ForkName(fileId), "nodes", row.nodes,
                      row.nodeSize);
    u64 freeBytes = 0;
    try {
        WalkChain(session, fileId, tree->header.firstLeafNode, false, [&](const HeldNode& node) {
            if (node.Kind() != kBTLeafNode) {
                ThrowProblem(session->Image(),
                             session->ProblemOf(fileId, node.Number(), kErrCorrupt,
                                                "the chain of leaves leads there, to no leaf"));
            }
            row.leaves += 1;
            freeBytes += node.FreeBytes();
            progress.Update(row.leaves);
            return true;
        });
    } catch (const ToolError& error) {
        row.problem = error.problem;
    }
    if (row.leaves != 0) {
        row.fill =
            1.0 - static_cast<double>(freeBytes) / (static_cast<double>(row.leaves) * row.nodeSize);
    }
    return row;
}

void PrintTrees(Output* out, const std::vector<TreeRow>& rows) {
    out->Write(
        "\ntree          nodes     free   size  depth     records  map nodes             file"
        "  extents  leaf fill\n");
    for (const TreeRow& row : rows) {
        if (!row.present) {
            out->Print("{:<10}     none\n", ForkName(row.fileId));
        } else if (row.nodes == 0) {
            out->Print("{:<10}  damaged\n", ForkName(row.fileId));
        } else {
            const std::string fill =
                row.leaves == 0 ? "-" : fmt::format("{:.1f}%", row.fill * 100.0);
            out->Print("{:<10}{:>9}{:>9}{:>7}{:>7}{:>12}{:>11}{:>17}{:>9}{:>11}\n",
                       ForkName(row.fileId), Grouped(row.nodes), Grouped(row.free), row.nodeSize,
                       row.depth, Grouped(row.records), row.mapNodes, Grouped(row.fileBytes) + " B",
                       row.extents, fill);
        }
    }
}

// Remarks below the table: what a person would want to know next.
void PrintRemarks(Output* out, Session* session, const std::vector<TreeRow>& rows) {
    const VolumeHeader& header = session->Volume().Header();
    for (const TreeRow& row : rows) {
        if (row.problem) {
            out->Print("damaged: {}\n", EscapedText(row.problem.Text()));
        }
    }
    if (header.freeBlocks == 0) {
        out->Write("note: no free block: a tree cannot grow here\n");
    }
    const JournalState& journal = session->Volume().Journal();
    if (journal.present && journal.readable && !journal.empty) {
        out->Print("note: the journal holds transactions ({} B) that are not in the trees yet\n",
                   Grouped(journal.pendingBytes));
    }
}

void TreeMembers(const TreeRow& row, JsonWriter* json) {
    json->BeginObject();
    json->Member("tree", ForkName(row.fileId));
    json->Member("present", row.present);
    if (row.nodes != 0) {
        json->Member("nodes", row.nodes);
        json->Member("free_nodes", row.free);
        json->Member("node_size", row.nodeSize);
        json->Member("depth", row.depth);
        json->Member("records", row.records);
        json->Member("map_nodes", row.mapNodes);
        json->Member("file_bytes", row.fileBytes);
        json->Member("extents", row.extents);
        json->Key("leaf_fill");
        if (row.leaves != 0) {
            json->Value(row.fill);
        } else {
            json->Null();
        }
    }
    if (row.problem) {
        json->Member("damage", row.problem.what);
    }
    json->EndObject();
}

void PrintJson(Output* out, Session* session, const std::vector<TreeRow>& rows) {
    std::string text;
    JsonWriter json(&text);
    json.BeginObject();
    json.Member("schema", "treehfs.info/1");
    json.Member("image", session->Image());
    VolumeMembers(session, &json);
    json.Key("trees");
    json.BeginArray();
    for (const TreeRow& row : rows) {
        TreeMembers(row, &json);
    }
    json.EndArray();
    json.EndObject();
    out->Write(text + "\n");
}

int PrintDigests(Session* session, Invocation* call) {
    std::string text;
    JsonWriter json(&text);
    json.BeginObject();
    json.Member("schema", "treehfs.info.digest/1");
    for (const u32 fileId : session->ChosenTrees(*call)) {
        RecordDigest digest;
        LeafCursor cursor(session, fileId, false);
        Progress progress(*call, std::string("info ") + ForkName(fileId), "records",
                          session->Tree(fileId)->header.leafRecords, 0);
        cursor.SeekFirst();
        LeafRecord record;
        while (cursor.Next(&record)) {
            digest.Add(record.key, record.keySize, record.data, record.dataSize);
            progress.Update(digest.Records());
        }
        if (!call->json) {
            call->out.Print("{:<10}  {}  {}\n", ForkName(fileId), digest.Text(),
                            Counted(digest.Records(), "record", "records"));
            continue;
        }
        json.Key(ForkName(fileId));
        json.BeginObject();
        json.Member("digest", digest.Text());
        json.Member("records", digest.Records());
        json.EndObject();
    }
    json.EndObject();
    if (call->json) {
        call->out.Write(text + "\n");
    }
    return kExitDone;
}

int PrintOverview(Session* session, Invocation* call) {
    std::vector<TreeRow> rows;
    bool damaged = false;
    for (const u32 fileId : call->trees) {
        if (call->treesGiven) {
            session->Tree(fileId);
        }
        rows.push_back(ReadTree(session, *call, fileId));
        damaged = damaged || rows.back().problem;
    }
    if (call->json) {
        PrintJson(&call->out, session, rows);
    } else {
        call->out.Write(VolumeText(session));
        PrintTrees(&call->out, rows);
        PrintRemarks(&call->out, session, rows);
    }
    return damaged ? kExitFailed : kExitDone;
}

int RunInfo(Invocation* call) {
    InfoOptions info;
    call->DeclareImage();
    call->DeclareTrees(TreeDefault::kAll);
    call->options.Flag("--digest", &info.digest, "a digest of each tree's records");
    call->options.Flag("--partitions", &info.partitions, "what was found in the image, and why");
    call->options.Flag("--headers", &info.headers, "volume header and header records, raw");
    call->DeclareJson();
    call->DeclareOutputFile();
    call->Parse();
    if (info.digest + info.partitions + info.headers > 1) {
        ThrowUsage("info", "--digest, --partitions and --headers exclude each other", "");
    }
    if (info.partitions) {
        PrintPartitions(call);
        return kExitDone;
    }
    Session session(*call, Session::Truncated::kReadOn);
    if (info.digest) {
        return PrintDigests(&session, call);
    }
    if (info.headers) {
        PrintHeaders(&session, call);
        return kExitDone;
    }
    return PrintOverview(&session, call);
}

}  // namespace

extern const Command kInfoCommand;
const Command kInfoCommand = {
    "info",
    "IMAGE",
    "the volume and its three trees on one screen",
    "",
    {"info disk.img", "info --partitions disk.img", "info --digest -t catalog disk.img"},
    RunInfo,
};

}  // namespace VELK::tool
