// diff: what two volumes' trees differ in, record by record.
#include <filesystem>

#include "hfs/records/name_text.h"
#include "hfs/records/record_view.h"
#include "hfs/records/text_format.h"
#include "tool/errors.h"
#include "tool/tree_diff.h"

namespace VELK::tool {

namespace {

struct DiffOptions {
    std::string other;
    std::vector<std::string> ignored;
    std::optional<u64> limit;
    bool summary = false;
};

class DiffPrinter {
public:
    DiffPrinter(Invocation* call, const DiffOptions& options, u32 fileId)
        : call_(call), options_(options), fileId_(fileId) {}

    void Print(const LeafRecord* before, const LeafRecord* after) {
        if (options_.summary || printed_ == options_.limit) {
            return;
        }
        printed_ += 1;
        call_->out.Write(call_->json ? Json(before, after) : Line(before, after));
    }
    bool LeftOut(u64 differences) const { return !options_.summary && printed_ < differences; }

private:
    std::string KeyOf(const LeafRecord& record) const {
        return EscapedText(KeyText(fileId_, record.key, record.keySize, Blanks::kPlain));
    }

    std::string Line(const LeafRecord* before, const LeafRecord* after) const {
        const LeafRecord* shown = before != nullptr ? before : after;  // one is there
        if (before == nullptr || after == nullptr) {
            return fmt::format("{} {}  {}\n", before != nullptr ? '-' : '+', KeyOf(*shown),
                               EscapedText(RecordSummary(fileId_, shown->data, shown->dataSize)));
        }
        std::string changes;
        for (const FieldChange& change : FieldChanges(fileId_, *before, *after, options_.ignored)) {
            changes += fmt::format("{}{} {} -> {}", changes.empty() ? "" : ", ", change.field,
                                   change.before, change.after);
        }
        if (KeyOf(*before) != KeyOf(*after)) {
            changes = "now " + KeyOf(*after) + (changes.empty() ? "" : ", " + changes);
        }
        return fmt::format("~ {}  {}\n", KeyOf(*before), EscapedText(changes));
    }

    void RecordJson(const char* name, const LeafRecord& record, JsonWriter* json) const {
        json->Key(name);
        json->BeginObject();
        RecordMembers(fileId_, record.data, record.dataSize, json);
        json->EndObject();
    }

    std::string Json(const LeafRecord* before, const LeafRecord* after) const {
        std::string text;
        JsonWriter json(&text);
        const LeafRecord* shown = before != nullptr ? before : after;  // one is there
        json.BeginObject();
        json.Member("change", after == nullptr    ? "removed"
                              : before == nullptr ? "added"
                                                  : "changed");
        json.Member("tree", ForkName(fileId_));
        json.Key("key");
        json.BeginObject();
        KeyMembers(fileId_, shown->key, shown->keySize, &json);
        json.EndObject();
        if (before != nullptr && after != nullptr) {
            json.Key("fields");
            json.BeginArray();
            for (const FieldChange& change :
                 FieldChanges(fileId_, *before, *after, options_.ignored)) {
                json.Value(change.field);
            }
            json.EndArray();
        }
        if (before != nullptr) {
            RecordJson("before", *before, &json);
        }
        if (after != nullptr) {
            RecordJson("after", *after, &json);
        }
        json.EndObject();
        return text + "\n";
    }

    Invocation* call_;
    const DiffOptions& options_;
    u32 fileId_;
    u64 printed_ = 0;
};

void CheckIgnored(const Invocation& call, const std::vector<std::string>& ignored) {
    for (const std::string& field : ignored) {
        bool isKnown = false;
        for (const u32 fileId : call.trees) {
            isKnown = isKnown || IsFieldOfTree(fileId, field);
        }
        if (!isKnown) {
            ThrowUsage("diff", "--ignore: no record has a field '" + field + "'",
                       "dump --values full shows the fields");
        }
    }
}

// Returns the number of differences.
u64 DiffTree(Session* before, Session* after, Invocation* call, const DiffOptions& options,
             u32 fileId) {
    DiffPrinter printer(call, options, fileId);
    const u32 total =
        before->Volume().HasTree(fileId) ? before->Tree(fileId)->header.leafRecords : 0;
    Progress progress(*call, std::string("diff ") + ForkName(fileId), "records", total, 0);
    const DiffCounts counts =
        DiffTrees(before, after, fileId, call->keepGoing, options.ignored, &progress,
                  [&](const LeafRecord* a, const LeafRecord* b) { printer.Print(a, b); });
    progress.Erase();
    if (call->json) {
        call->out.Print(
            "{{\"summary\":{{\"tree\":\"{}\",\"removed\":{},\"added\":{},\"changed\":{},"
            "\"equal\":{}}}}}\n",
            ForkName(fileId), counts.removed, counts.added, counts.changed, counts.equal);
    } else if (printer.LeftOut(counts.Differences())) {
        call->out.Write("... the others are only counted (--limit)\n");
    }
    if (!call->json && counts.Differences() == 0) {
        call->out.Print("{}: no difference in {}\n", ForkName(fileId),
                        Counted(counts.equal, "record", "records"));
    } else if (!call->json) {
        call->out.Print("{}: {} only in {}, {} only in {}, {} changed, {} equal\n",
                        ForkName(fileId), Grouped(counts.removed), EscapedText(before->Image()),
                        Grouped(counts.added), EscapedText(after->Image()), Grouped(counts.changed),
                        Grouped(counts.equal));
    }
    return counts.Differences();
}

int RunDiff(Invocation* call) {
    DiffOptions options;
    call->options.Argument("A", &call->image, "the image before");
    call->options.Argument("B", &options.other, "the image after");
    call->DeclarePlace();
    call->DeclareTrees(TreeDefault::kAll);
    call->options.List("--ignore", &options.ignored, "FIELD",
                       "a field that may differ: modified, accessed, ...; repeatable");
    call->options.Flag("--summary", &options.summary, "only how many records differ");
    call->options.Count("--limit", &options.limit, "N", "show at most N differences of a tree");
    call->DeclareKeepGoing();
    call->DeclareJson();
    call->DeclareOutputFile();
    call->Parse();
    CheckIgnored(*call, options.ignored);
    std::error_code none;
    if (std::filesystem::equivalent(call->outputFile, options.other, none)) {
        ThrowFailed(call->outputFile, "is the image itself", "choose another name");
    }
    Session before(*call, Session::Truncated::kRefuse);
    Session after(*call, options.other, Session::Truncated::kRefuse);
    if (call->json) {
        call->out.Write("{\"schema\":\"treehfs.diff/1\"}\n");
    }
    u64 differences = 0;
    for (const u32 fileId : call->trees) {
        if (call->treesGiven) {
            before.Tree(fileId);
            after.Tree(fileId);
        }
        if (before.Volume().HasTree(fileId) || after.Volume().HasTree(fileId)) {
            differences += DiffTree(&before, &after, call, options, fileId);
        }
    }
    if (before.PassedOver() + after.PassedOver() != 0) {
        return kExitFailed;
    }
    return differences != 0 ? kExitNo : kExitDone;
}

}  // namespace

extern const Command kDiffCommand;
const Command kDiffCommand = {
    "diff",
    "A B",
    "the records in which two volumes' trees differ",
    "- stands before a record that only A has, + before one that only B has, ~ before one that\n"
    "both have with different data. --partition and --offset hold for both images. Exit code 1\n"
    "when there is a difference.",
    {"diff before.img after.img", "diff --ignore accessed --ignore modified -t catalog a.img b.img",
     "diff --summary a.img b.img"},
    RunDiff,
};

}  // namespace VELK::tool
