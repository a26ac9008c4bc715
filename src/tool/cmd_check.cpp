// check: runs the independent checker over the volume and tells what it finds.
#include <algorithm>

#include "hfs/check/check.h"
#include "hfs/records/json_writer.h"
#include "hfs/records/name_text.h"
#include "hfs/records/text_format.h"
#include "tool/errors.h"
#include "tool/progress.h"
#include "tool/session.h"

namespace VELK::tool {

namespace {

struct CheckArguments {
    bool quick = false;
    bool full = false;
    bool list = false;
    bool warningsAsErrors = false;
    std::vector<std::string> only;
    std::vector<std::string> skip;
    std::optional<u64> maxErrors;
};

// Everything the sinks of the checker need.
struct Run {
    Invocation* call;
    Session* session;
    Progress* progress;
    std::string stage = {};
    std::vector<std::string> lines = {};  // findings, told after the table of stages
    u32 unreadTrees = 0;                  // bit 1 << file ID: pieces of that tree could not be read
    bool interrupted = false;             // the user wants to stop
    std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
};

const char* SeverityWord(CheckSeverity severity) {
    return severity == CheckSeverity::kError     ? "error"
           : severity == CheckSeverity::kWarning ? "warning"
                                                 : "info";
}

void PrintList(Invocation* call) {
    for (u32 i = 0; i < kCheckIdCount; ++i) {
        const CheckIdInfo& info = CheckIdTable()[i];
        const char* scope = info.scope == CheckScope::kFull    ? "full"
                            : info.scope == CheckScope::kQuick ? "quick"
                                                               : "default";
        if (call->json) {
            std::string text;
            JsonWriter json(&text);
            json.BeginObject();
            json.Member("id", info.name);
            json.Member("scope", scope);
            json.Member("severity", SeverityWord(info.severity));
            json.Member("text", info.text);
            json.EndObject();
            call->out.Write(text + "\n");
        } else {
            call->out.Print("{}  {:<7}  {:<7}  {}\n", info.name, scope, SeverityWord(info.severity),
                            info.text);
        }
    }
}

// The mask of "K03,K04" as often as it is given.
u64 MaskOf(const char* option, const std::vector<std::string>& lists) {
    u64 mask = 0;
    for (const std::string& list : lists) {
        for (std::size_t at = 0; at <= list.size();) {
            const std::size_t end = std::min(list.find(',', at), list.size());
            const std::string name = list.substr(at, end - at);
            CheckId id;
            if (!FindCheckId(name, &id)) {
                ThrowUsage("check", std::string(option) + ": no invariant is called '" + name + "'",
                           "check --list shows them");
            }
            mask |= CheckIdBit(id);
            at = end + 1;
        }
    }
    return mask;
}

std::string FindingJson(const CheckFinding& finding) {
    std::string text;
    JsonWriter json(&text);
    json.BeginObject();
    json.Member("id", CheckIdOf(finding.id).name);
    json.Member("severity", SeverityWord(finding.severity));
    json.Member("tree", finding.tree == 0 ? "volume" : ForkName(finding.tree));
    if (finding.node >= 0) {
        json.Member("node", finding.node);
    }
    if (finding.record >= 0) {
        json.Member("record", finding.record);
    }
    if (finding.offset != kCheckNoOffset) {
        json.Member("offset", finding.offset);
    }
    if (!finding.expected.empty()) {
        json.Member("expected", finding.expected);
    }
    if (!finding.found.empty()) {
        json.Member("found", finding.found);
    }
    json.Member("text", finding.text);
    json.EndObject();
    return text;
}

// The first word in the colour of its severity.
std::string Painted(const std::string& line, CheckSeverity severity, bool color) {
    const std::size_t space = line.find(' ');
    if (!color || space == std::string::npos || severity == CheckSeverity::kInfo) {
        return line;
    }
    const char* paint = severity == CheckSeverity::kError ? "\x1b[31m" : "\x1b[33m";
    return paint + line.substr(0, space) + "\x1b[0m" + line.substr(space);
}

void OnFinding(void* self, const CheckFinding& finding) {
    Run* run = static_cast<Run*>(self);
    if (finding.severity == CheckSeverity::kInfo && run->call->quiet) {
        return;
    }
    if (run->call->json) {
        run->lines.push_back(FindingJson(finding));
    } else {
        run->lines.push_back(
            Painted(EscapedText(CheckFindingLine(finding)), finding.severity, run->call->color));
    }
}

void OnUnreadable(void* self, const CheckUnreadable& piece) {
    Run* run = static_cast<Run*>(self);
    run->unreadTrees |= 1u << (piece.tree & 31);
    std::string reason = "read error";
    if (piece.status == kCheckPastEnd || piece.status == kErrVolumeTruncated) {
        reason = "lies behind the end of the image";
    } else if (run->session->Volume().LastIoProblem()) {
        reason = run->session->Volume().LastIoProblem().what;
    }
    Problem problem = Failure(piece.where + ": " + reason, "");
    if (piece.offset != kCheckNoOffset) {
        problem.what = piece.where + " (image offset " + HexOffset(piece.offset) + "): " + reason;
        problem.offset = piece.offset;
    }
    if (run->call->json) {
        ToolError error;
        error.subject = run->session->Image();
        error.problem = problem;
        run->lines.push_back(ErrorJson(error));
    } else {
        run->lines.push_back(EscapedText("unread " + problem.what));
    }
}

bool OnProgress(void* self, const CheckProgress& progress) {
    Run* run = static_cast<Run*>(self);
    if (run->stage != progress.stage) {
        run->stage = progress.stage;
        run->progress->Restart("check " + run->stage, progress.total);
    }
    try {
        run->progress->Show(progress.done);
    } catch (const Interrupted&) {
        run->interrupted = true;
        return false;
    }
    return true;
}

int ReadVolumeBytes(void* self, u64 offset, void* target, std::size_t size) {
    return static_cast<Session*>(self)->Volume().ReadVolume(offset, target, size);
}

std::string VerdictText(const CheckStage& stage, bool color) {
    std::string text;
    switch (stage.verdict) {
        case CheckVerdict::kSound:
            return "ok";
        case CheckVerdict::kNone:
            return "none";
        case CheckVerdict::kNotRun:
            return std::string("not run") +
                   (stage.why[0] != 0 ? " (" + std::string(stage.why) + ")" : "");
        case CheckVerdict::kFindings:
        case CheckVerdict::kStopped:
            break;
    }
    if (stage.errors != 0) {
        text = Counted(stage.errors, "error", "errors");
        text = color ? "\x1b[31m" + text + "\x1b[0m" : text;
    }
    if (stage.warnings != 0) {
        text += (text.empty() ? "" : ", ") + Counted(stage.warnings, "warning", "warnings");
    }
    if (stage.verdict == CheckVerdict::kStopped) {
        text += (text.empty() ? "stopped" : ", stopped") +
                (stage.why[0] != 0 ? " (" + std::string(stage.why) + ")" : std::string());
    }
    return text;
}

void PrintStages(const Run& run, const CheckSummary& summary) {
    Invocation* call = run.call;
    constexpr std::size_t kTitleWidth = 32;
    constexpr std::size_t kVerdictWidth = 6;
    for (u32 i = 0; i < summary.stageCount; ++i) {
        const CheckStage& stage = summary.stages[i];
        std::string title = fmt::format("{}/{} {} ", i + 1, summary.stageCount, stage.title);
        title.resize(std::max(title.size(), kTitleWidth), '.');
        std::string verdict = VerdictText(stage, call->color);
        if (stage.tree != 0 && (run.unreadTrees & (1u << stage.tree)) != 0) {
            verdict = (verdict == "ok" ? "" : verdict + ", ") + "not all could be read";
        }
        std::string line = title + " " + fmt::format("{:<{}}", verdict, kVerdictWidth);
        if (stage.nodes != 0) {
            line += "   " + Counted(stage.nodes, "node", "nodes");
            if (stage.records != 0) {
                line += ", " + Counted(stage.records, "record", "records");
            }
        } else if (std::string(stage.title).find("bad-block") != std::string::npos &&
                   stage.verdict == CheckVerdict::kSound) {
            line += "   " + Counted(stage.runs, "run", "runs");
        }
        line.erase(line.find_last_not_of(' ') + 1);
        call->out.Print("{}\n", line);
    }
}

std::string SummaryWords(const CheckSummary& summary) {
    if (summary.errors == 0 && summary.warnings == 0 && summary.unreadable == 0 &&
        !summary.isStopped) {
        return "no errors";
    }
    std::string words =
        summary.errors == 0 ? "no errors" : Counted(summary.errors, "error", "errors");
    if (summary.warnings != 0) {
        words += ", " + Counted(summary.warnings, "warning", "warnings");
    }
    if (summary.unreadable != 0) {
        words += ", " + Counted(summary.unreadable, "piece unreadable", "pieces unreadable");
    }
    return summary.isStopped ? words + ", not finished" : words;
}

void PrintSummary(const Run& run, const CheckSummary& summary) {
    Output& out = run.call->out;
    const double seconds =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - run.start).count();
    if (run.call->json) {
        std::string text;
        JsonWriter json(&text);
        json.BeginObject();
        json.Key("summary");
        json.BeginObject();
        json.Member("errors", summary.errors);
        json.Member("warnings", summary.warnings);
        json.Member("infos", summary.infos);
        json.Member("untold", summary.untold);
        json.Member("unreadable", summary.unreadable);
        json.Member("nodes", summary.nodes);
        json.Member("bytes", summary.bytes);
        json.Member("finished", !summary.isStopped);
        json.EndObject();
        json.EndObject();
        out.Write(text + "\n");
        return;
    }
    if (summary.untold != 0) {
        out.Print("... and {} (--max-errors 0 shows all)\n",
                  Counted(summary.untold, "further finding", "further findings"));
    }
    out.Print("{}{}: {} in {:.2f} s ({}, {})\n",
              run.lines.empty() && summary.untold == 0 && run.call->quiet ? "" : "\n",
              EscapedText(run.session->Image()), SummaryWords(summary), seconds,
              Counted(summary.nodes, "node", "nodes"), BinaryBytes(summary.bytes));
}

int ExitOf(const CheckSummary& summary, bool warningsAsErrors) {
    const bool bad = summary.errors != 0 || (warningsAsErrors && summary.warnings != 0);
    const bool unread = summary.unreadable != 0 || (summary.isStopped && !bad);
    return (bad ? kExitFindings : 0) + (unread ? kExitFailed : 0);
}

int CheckImage(Invocation* call, const CheckArguments& arguments) {
    CheckOptions options;
    options.quick = arguments.quick;
    options.full = arguments.full;
    options.keepGoing = call->keepGoing;
    options.only = MaskOf("--only", arguments.only);
    options.skip = MaskOf("--skip", arguments.skip);
    options.maxErrors = static_cast<u32>(std::min<u64>(arguments.maxErrors.value_or(100), ~u32{0}));
    options.mapBlock = call->mapBlockSize;
    options.backupHeader = call->backupHeader;
    for (const u32 fileId : call->trees) {
        options.trees |= call->treesGiven ? 1u << fileId : 0;
    }
    Session session(*call, Session::Truncated::kRefuse);
    if (call->treesGiven) {
        for (const u32 fileId : call->trees) {
            if (!session.Volume().HasTree(fileId)) {
                session.Tree(fileId);  // says that there is none
            }
        }
    }
    Progress progress(*call, "check", "nodes", 0, 0);
    Run run{call, &session, &progress};
    const VolumePlace& place = session.Volume().Place();
    const CheckSource source = {&session, ReadVolumeBytes, session.ReadableBytes(), place.offset};
    const CheckSink sink = {&run, OnFinding, OnUnreadable, OnProgress};
    const CheckSummary summary = CheckVolume(source, options, sink);
    progress.Erase();
    if (call->json) {
        call->out.Write("{\"schema\":\"treehfs.check/1\"}\n");
    } else if (!call->quiet) {
        PrintStages(run, summary);
        call->out.Write(run.lines.empty() ? "" : "\n");
    }
    for (const std::string& line : run.lines) {
        call->out.Write(line);
        call->out.Write("\n");
    }
    PrintSummary(run, summary);
    if (run.interrupted) {
        throw Interrupted{};
    }
    return ExitOf(summary, arguments.warningsAsErrors);
}

int RunCheck(Invocation* call) {
    CheckArguments arguments;
    for (const std::string& word : call->words) {
        arguments.list = arguments.list || word == "--list";
    }
    if (!arguments.list) {
        call->DeclareImage();
    }
    call->DeclareTrees(TreeDefault::kAll);
    call->options.Flag("--quick", &arguments.quick, "headers, map and leaf chain only");
    call->options.Flag("--full", &arguments.full,
                       "also the trees against each other, bitmap and counts");
    call->options.List("--only", &arguments.only, "ID,ID", "these invariants alone");
    call->options.List("--skip", &arguments.skip, "ID,ID", "all but these invariants");
    call->options.Count("--max-errors", &arguments.maxErrors, "N",
                        "stop after N errors; default 100, 0 = never");
    call->options.Flag("--warnings-as-errors", &arguments.warningsAsErrors,
                       "warnings count for the exit code, too");
    call->options.Flag("--list", &arguments.list, "print every invariant; needs no IMAGE");
    call->DeclareKeepGoing();
    call->DeclareJson();
    call->DeclareOutputFile();
    call->Parse();
    if (arguments.list) {
        PrintList(call);
        return kExitDone;
    }
    if (arguments.quick && arguments.full) {
        ThrowUsage("check", "--quick and --full exclude each other", "");
    }
    return CheckImage(call, arguments);
}

}  // namespace

extern const Command kCheckCommand;
const Command kCheckCommand = {
    "check",
    "IMAGE",
    "test all invariants of all trees; writes nothing",
    "Exit code 0: no errors, 4: errors found, 8: could not read all of it, 12: both.",
    {"check disk.img", "check --full --max-errors 0 disk.img",
     "check --only K03,K04 -t c disk.img"},
    RunCheck,
};

}  // namespace VELK::tool
