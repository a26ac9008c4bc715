// scan: records that lie outside the trees.
#include <array>

#include "hfs/records/key_text.h"
#include "hfs/records/name_text.h"
#include "hfs/records/record_view.h"
#include "hfs/records/text_format.h"
#include "tool/errors.h"
#include "tool/outside_scan.h"

namespace VELK::tool {

namespace {

struct ScanOptions {
    bool deleted = false;
    bool journal = false;
    std::optional<u64> limit;
};

struct ScanCounts {
    std::array<u64, kOutsidePlaces> places{};
    std::array<u64, kOutsideStates> states{};

    u64 All() const { return states[0] + states[1] + states[2]; }
};

std::string Line(u32 fileId, const OutsideRecord& found) {
    const CarvedRecord& record = found.record;
    const std::string node = found.node < 0 ? "-" : std::to_string(found.node);
    return fmt::format("{:<9}{:>7}  {:<12}  {:<6}  {}  {}\n", OutsidePlaceName(found.place), node,
                       HexOffset(found.offset), OutsideStateName(found.state),
                       EscapedText(KeyText(fileId, record.key, record.keySize, Blanks::kPlain)),
                       EscapedText(RecordSummary(fileId, record.data, record.dataSize)));
}

std::string Json(u32 fileId, const OutsideRecord& found) {
    std::string text;
    JsonWriter json(&text);
    json.BeginObject();
    json.Member("tree", ForkName(fileId));
    json.Member("place", OutsidePlaceName(found.place));
    json.Member("state", OutsideStateName(found.state));
    if (found.node >= 0) {
        json.Member("node", found.node);
    }
    json.Member("offset", found.offset);
    json.Key("key");
    json.BeginObject();
    KeyMembers(fileId, found.record.key, found.record.keySize, &json);
    json.EndObject();
    RecordMembers(fileId, found.record.data, found.record.dataSize, &json);
    json.EndObject();
    return text + "\n";
}

void Summary(Invocation* call, u32 fileId, const ScanCounts& counts) {
    if (call->json) {
        call->out.Print(
            "{{\"summary\":{{\"tree\":\"{}\",\"records\":{},\"same\":{},\"other\":{},\"gone\":{},"
            "\"stranded\":{},\"freed\":{},\"gap\":{},\"journal\":{}}}}}\n",
            ForkName(fileId), counts.All(), counts.states[0], counts.states[1], counts.states[2],
            counts.places[0], counts.places[1], counts.places[2], counts.places[3]);
        return;
    }
    if (counts.All() == 0) {
        call->out.Print("{}: no records outside the tree\n", ForkName(fileId));
        return;
    }
    call->out.Print(
        "{}: {} outside the tree: {} gone from it, {} with other data, {} the same;\n"
        "    {} in stranded leaves, {} in freed nodes, {} in gaps, {} in the journal\n",
        ForkName(fileId), Counted(counts.All(), "record", "records"), Grouped(counts.states[2]),
        Grouped(counts.states[1]), Grouped(counts.states[0]), Grouped(counts.places[0]),
        Grouped(counts.places[1]), Grouped(counts.places[2]), Grouped(counts.places[3]));
}

// Returns the number of records.
u64 ScanTree(Session* session, Invocation* call, const ScanOptions& options, u32 fileId) {
    ScanCounts counts;
    u64 printed = 0;
    OutsideScan scan(session, *call, fileId, [&](const OutsideRecord& found) {
        if (options.deleted && found.state != OutsideState::kGone) {
            return;
        }
        counts.places[static_cast<u8>(found.place)] += 1;
        counts.states[static_cast<u8>(found.state)] += 1;
        if (printed++ < options.limit.value_or(~u64{0})) {
            call->out.Write(call->json ? Json(fileId, found) : Line(fileId, found));
        }
    });
    if (!options.journal) {
        scan.ScanNodes();
    }
    scan.ScanJournal();
    if (!call->json && options.limit && printed > *options.limit) {
        call->out.Write("... the others are only counted (--limit)\n");
    }
    Summary(call, fileId, counts);
    return counts.All();
}

int RunScan(Invocation* call) {
    ScanOptions options;
    call->DeclareImage();
    call->DeclareTrees(TreeDefault::kAll);
    call->options.Flag("--deleted", &options.deleted, "only records whose key the tree lacks now");
    call->options.Flag("--journal", &options.journal, "only what lies in the journal");
    call->options.Count("--limit", &options.limit, "N", "show at most N records of a tree");
    call->DeclareJson();
    call->DeclareOutputFile();
    call->Parse();
    Session session(*call, Session::Truncated::kReadOn);
    const JournalState& journal = session.Volume().Journal();
    if (options.journal && (!journal.present || !journal.readable)) {
        ThrowNo(session.Image(),
                journal.present ? "the journal cannot be read: " + journal.text
                                : "the volume has no journal",
                "");
    }
    if (call->json) {
        call->out.Write("{\"schema\":\"treehfs.scan/1\"}\n");
    }
    u64 found = 0;
    for (const u32 fileId : session.ChosenTrees(*call)) {
        found += ScanTree(&session, call, options, fileId);
    }
    if (session.PassedOver() != 0) {
        return kExitFailed;
    }
    return found != 0 ? kExitDone : kExitNo;
}

}  // namespace

extern const Command kScanCommand;
const Command kScanCommand = {
    "scan",
    "IMAGE",
    "records outside the trees: what was deleted or left behind",
    "Looks into leaves that nothing leads to (stranded), nodes the map calls free (freed), the "
    "free\n"
    "bytes of nodes in use (gap) and the journal. Damage is named and passed over. Exit code 1 "
    "when\n"
    "nothing is found.",
    {"scan --deleted disk.img", "scan --journal -t catalog disk.img", "scan --json disk.img"},
    RunScan,
};

}  // namespace VELK::tool
