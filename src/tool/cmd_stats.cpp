// stats: depth, fill, fan-out and order of the trees.
#include "tool/errors.h"
#include "tool/tree_stats.h"

namespace VELK::tool {

namespace {

int RunStats(Invocation* call) {
    call->DeclareImage();
    call->DeclareTrees(TreeDefault::kAll);
    call->DeclareKeepGoing();
    call->DeclareJson();
    call->DeclareOutputFile();
    call->Parse();
    Session session(*call, Session::Truncated::kReadOn);
    std::string text;
    JsonWriter json(&text);
    json.BeginObject();
    json.Member("schema", "treehfs.stats/1");
    json.Key("trees");
    json.BeginArray();
    bool first = true;
    for (const u32 fileId : session.ChosenTrees(*call)) {
        const CBTreeHfs* tree = session.Tree(fileId);
        Progress progress(*call, std::string("stats ") + ForkName(fileId), "nodes",
                          tree->header.totalNodes, tree->header.nodeSize);
        const TreeStats stats = CollectStats(&session, fileId, call->keepGoing, &progress);
        if (call->json) {
            json.BeginObject();
            StatsMembers(stats, &json);
            json.EndObject();
        } else {
            call->out.Print("{}{}", first ? "" : "\n", StatsText(stats));
        }
        first = false;
    }
    json.EndArray();
    json.EndObject();
    if (call->json) {
        call->out.Write(text + "\n");
    }
    return session.PassedOver() != 0 ? kExitFailed : kExitDone;
}

}  // namespace

extern const Command kStatsCommand;
const Command kStatsCommand = {
    "stats",
    "IMAGE",
    "depth, fill, fan-out and fragmentation of the trees",
    "",
    {"stats disk.img", "stats -t catalog disk.img", "stats --json disk.img"},
    RunStats,
};

}  // namespace VELK::tool
