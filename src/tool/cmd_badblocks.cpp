// badblocks: the runs of the bad-block file, as the engine loads them.
#include "hfs/records/json_writer.h"
#include "hfs/records/text_format.h"
#include "tool/errors.h"
#include "tool/session.h"

namespace VELK::tool {

namespace {

struct BadRun {
    u32 fileBlock;
    u32 volumeBlock;
    u32 count;
};

// The loader begins with a hole as large as the volume; what it then lays into it are the bad runs.
std::vector<BadRun> LoadRuns(Session* session) {
    CBTreeHfs* tree = session->Tree(kExtentsFileId);
    HfsRuns runs;
    const int status = tree->LoadBadBlocks(&runs);
    if (status != 0) {
        ThrowProblem(session->Image(),
                     session->ProblemOf(kExtentsFileId, tree->header.firstLeafNode, status,
                                        "the records of the bad-block file"));
    }
    std::vector<BadRun> found;
    for (u32 i = 0; i < runs.Count(); ++i) {
        const HfsRuns::Run& run = runs.At(i);
        if (run.lcn != HfsRuns::kHole) {
            found.push_back({run.vcn, run.lcn, run.length});
        }
    }
    return found;
}

int RunBadBlocks(Invocation* call) {
    call->DeclareImage();
    call->DeclareJson();
    call->DeclareOutputFile();
    call->Parse();
    Session session(*call, Session::Truncated::kReadOn);
    const std::vector<BadRun> runs = LoadRuns(&session);
    u64 blocks = 0;
    for (const BadRun& run : runs) {
        blocks += run.count;
    }
    if (call->json) {
        std::string text;
        JsonWriter json(&text);
        json.BeginObject();
        json.Member("schema", "treehfs.badblocks/1");
        json.Key("runs");
        json.BeginArray();
        for (const BadRun& run : runs) {
            json.BeginObject();
            json.Member("file_block", run.fileBlock);
            json.Member("volume_block", run.volumeBlock);
            json.Member("count", run.count);
            json.EndObject();
        }
        json.EndArray();
        json.Member("blocks", blocks);
        json.EndObject();
        call->out.Write(text + "\n");
        return kExitDone;
    }
    if (runs.empty()) {
        call->out.Write("no bad blocks\n");
        return kExitDone;
    }
    call->out.Write("file block  volume block  count\n");
    for (const BadRun& run : runs) {
        call->out.Print("{:>10}{:>14}{:>7}\n", Grouped(run.fileBlock), Grouped(run.volumeBlock),
                        Grouped(run.count));
    }
    call->out.Print("{}, {}\n", Counted(runs.size(), "run", "runs"),
                    Counted(blocks, "block", "blocks"));
    return kExitDone;
}

}  // namespace

extern const Command kBadBlocksCommand;
const Command kBadBlocksCommand = {
    "badblocks",
    "IMAGE",
    "runs of the bad-block file, from the extents tree",
    "",
    {"badblocks disk.img", "badblocks --json disk.img", "badblocks --partition 2 disk.img"},
    RunBadBlocks,
};

}  // namespace VELK::tool
