// treehfs apply: runs an operations script through the engine.
#include <cstdio>

#include "hfs/records/json_writer.h"
#include "hfs/records/name_text.h"
#include "tool/command.h"
#include "tool/errors.h"
#include "tool/script_run.h"
#include "tool/script_volume.h"
#include "tool/script_words.h"

namespace VELK::tool {
namespace {

// A mistake in a script is shown as compilers show theirs: file, line, what is wrong.
int ReportMistake(const ScriptProblem& problem, bool json) {
    if (problem.line == 0) {
        ThrowFailed(problem.file, problem.what, "");
    }
    if (json) {
        ToolError error;
        error.problem = UsageProblem(problem.Text(), "");
        error.exitCode = kExitUsage;
        PrintError(error, true);
    } else {
        std::fprintf(stderr, "%s\n", EscapedText(problem.Text()).c_str());
    }
    return kExitUsage;
}

int Run(Invocation* call) {
    TargetOptions target;
    ScriptRunOptions options;
    std::string stopOn;
    std::vector<std::string> names;
    call->options.Arguments("[IMAGE] SCRIPT", &names,
                            "disk image (none with --new), then the script; - is standard input");
    target.Declare(call);
    call->options.Flag("--state", &options.showState, "the tree's counters at every line");
    call->options.Flag("--strict", &options.strict, "stop at the first status that is not ok");
    call->options.Text("--stop-on", &stopOn, "STATUS,...", "stop at these statuses");
    call->DeclareJson();
    call->Parse();
    options.trace = call->trace;
    options.json = call->json;
    std::string wrong;
    if (!ParseStatusList(stopOn, &options.stopOn, &wrong)) {
        ThrowUsage("apply",
                   "--stop-on: unknown status '" + wrong + "'" + DidYouMean(wrong, StatusNames()),
                   "");
    }
    const std::size_t wanted = target.newVolume.empty() ? 2 : 1;
    if (names.size() != wanted) {
        ThrowUsage("apply",
                   wanted == 2 ? "expected IMAGE and SCRIPT" : "expected SCRIPT and no IMAGE",
                   "treehfs help apply shows both ways");
    }
    call->image = wanted == 2 ? names[0] : std::string();

    ScriptContext context;
    context.canInject = !target.write;
    Script script;
    const ScriptProblem mistake = ReadScript(names.back(), &context, &script);
    if (mistake) {
        return ReportMistake(mistake, call->json);
    }
    const std::unique_ptr<ImageVolume> volume = OpenTarget(*call, target);
    const u64 before = volume->HandedOverBlocks();
    int exitCode = kExitDone;
    {
        ScriptRunner runner(volume.get(), options, &call->out, [&](const std::string& text) {
            if (!call->quiet) {
                call->out.Flush();
                std::fprintf(stderr, "%s\n", text.c_str());
            }
        });
        if (call->json) {
            std::string header;
            JsonWriter json(&header);
            json.BeginObject();
            json.Member("schema", "treehfs.apply/1");
            json.Member("script", names.back());
            json.EndObject();
            call->out.Print("{}\n", header);
        }
        runner.Run(script);
        runner.PrintSummary(script.files.front());
        runner.EndReservations();
        exitCode = runner.ExitCode();
    }
    call->out.Flush();
    FinishTarget(*call, target, volume.get(), before);
    return exitCode;
}

}  // namespace

extern const Command kApplyCommand;
const Command kApplyCommand = {
    "apply",
    "IMAGE SCRIPT, --new SIZE[,...] SCRIPT",
    "run an operations script through the engine",
    "One operation per line, one line of output for each: LINE OPERATION STATUS NAME fields. The "
    "script is read whole and checked before anything runs. Changes stay in memory unless --write "
    "or --save keeps them.",
    {"apply --new 1M,node=512 split.tr", "apply disk.img changes.tr --write",
     "apply --new 64M,empty --state --trace - < script.tr"},
    Run,
};

}  // namespace VELK::tool
