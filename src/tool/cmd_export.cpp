// treehfs export: the records of a tree as lines of JSON.
#include "hfs/records/json_writer.h"
#include "hfs/records/record_json.h"
#include "hfs/volume/volume_header.h"
#include "tool/errors.h"
#include "tool/key_argument.h"
#include "tool/leaf_cursor.h"
#include "tool/progress.h"
#include "tool/record_digest.h"
#include "tool/session.h"

namespace VELK::tool {
namespace {

std::string HeaderLine(u32 fileId, const CBTreeHfs& tree) {
    std::string line;
    JsonWriter json(&line);
    json.BeginObject();
    json.Member("schema", "treehfs.records/1");
    json.Member("tree", ForkName(fileId));
    json.Member("node_size", tree.header.nodeSize);
    const bool isBinary = fileId != kCatalogFileId || tree.compareKeys == CompareCatKeysCaseBin;
    json.Member("compare", isBinary ? "binary" : "case-insensitive");
    json.Member("records", tree.header.leafRecords);
    json.EndObject();
    return line + "\n";
}

std::string SummaryLine(const RecordDigest& digest) {
    std::string line;
    JsonWriter json(&line);
    json.BeginObject();
    json.Key("summary");
    json.BeginObject();
    json.Member("records", digest.Records());
    json.Member("digest", digest.Text());
    json.EndObject();
    json.EndObject();
    return line + "\n";
}

int Run(Invocation* call) {
    bool noRaw = false;
    RecordJsonOptions options;
    call->DeclareImage();
    call->DeclareTrees(TreeDefault::kCatalog);
    call->DeclareRange();
    call->DeclareLimits();
    call->DeclareKeepGoing();
    call->DeclareOutputFile();
    call->options.Flag("--no-raw", &noRaw, "readable fields only, without the bytes");
    call->options.Flag("--raw-keys", &options.rawKeys, "also the bytes of the keys");
    call->Parse();
    options.raw = !noRaw;
    const u32 fileId = call->trees.front();
    Session session(*call, Session::Truncated::kReadOn);
    const CBTreeHfs* tree = session.Tree(fileId);
    call->out.Write(HeaderLine(fileId, *tree));
    const KeyRange range = RangeArgument(&session, fileId, call->range);
    LeafCursor cursor(&session, fileId, call->keepGoing);
    cursor.SeekFrom(range.from);
    Progress progress(*call, std::string("export ") + ForkName(fileId), "records",
                      tree->header.leafRecords, 0);
    RecordDigest digest;
    LeafRecord record;
    std::string line;
    u64 inRange = 0;
    for (u64 seen = 1; digest.Records() < call->limit && cursor.Next(&record); ++seen) {
        progress.Update(seen);
        const int place = range.Place(*tree, record.key);
        if (place > 0) {
            break;
        }
        if (place < 0 || inRange++ < call->skipRecords) {
            continue;
        }
        line.clear();
        AppendRecordJson(fileId, record.key, record.keySize, record.data, record.dataSize, options,
                         &line);
        line.push_back('\n');
        call->out.Write(line);
        digest.Add(record.key, record.keySize, record.data, record.dataSize);
        session.Volume().TrimCache();
    }
    call->out.Write(SummaryLine(digest));
    return session.PassedOver() != 0 ? kExitFailed : kExitDone;
}

}  // namespace

extern const Command kExportCommand;
const Command kExportCommand = {
    "export",
    "IMAGE",
    "records of a tree as lines of JSON",
    "A header line, one line for each record, and a line with their digest. The bytes of a record "
    "(raw) decide when it is imported; without them its readable fields do.",
    {"export disk.img | head -3", "export -t attributes disk.img -o tags.jsonl",
     "export disk.img | treehfs import copy.img - --write"},
    Run,
};

}  // namespace VELK::tool
