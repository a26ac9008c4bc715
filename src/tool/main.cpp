// The program: the table of commands, dispatch, and the exit code of every way a command can end.
#include <fcntl.h>

#include <csignal>
#include <cstdio>
#include <exception>
#include <new>

#include "tool/command.h"
#include "tool/engine_trace.h"
#include "tool/errors.h"
#include "tool/progress.h"

namespace VELK::tool {

// One row per command, one file per command, in the order of the help text.
// clang-format off
extern const Command kInfoCommand;
extern const Command kCheckCommand;
extern const Command kLsCommand;
extern const Command kFindCommand;
extern const Command kDumpCommand;
extern const Command kNodeCommand;
extern const Command kStatsCommand;
extern const Command kPlotCommand;
extern const Command kBadBlocksCommand;
extern const Command kDiffCommand;
extern const Command kScanCommand;
extern const Command kFormatCommand;
extern const Command kCreateTreeCommand;
extern const Command kRebuildCommand;
extern const Command kDemoCommand;
extern const Command kApplyCommand;
extern const Command kShellCommand;
extern const Command kExportCommand;
extern const Command kImportCommand;
extern const Command kMetadumpCommand;
extern const Command kUndoCommand;
extern const Command kBenchCommand;
extern const Command kCompletionCommand;
extern const Command kHelpCommand;
extern const Command kVersionCommand;

const Command* const kCommands[] = {
    &kInfoCommand,
    &kCheckCommand,
    &kLsCommand,
    &kFindCommand,
    &kDumpCommand,
    &kNodeCommand,
    &kStatsCommand,
    &kPlotCommand,
    &kBadBlocksCommand,
    &kDiffCommand,
    &kScanCommand,
    &kFormatCommand,
    &kCreateTreeCommand,
    &kRebuildCommand,
    &kDemoCommand,
    &kApplyCommand,
    &kShellCommand,
    &kExportCommand,
    &kImportCommand,
    &kMetadumpCommand,
    &kUndoCommand,
    &kBenchCommand,
    &kCompletionCommand,
    &kHelpCommand,
    &kVersionCommand,
    nullptr,
};
// clang-format on

const Command* FindCommand(const std::string& name) {
    for (const Command* const* command = kCommands; *command != nullptr; ++command) {
        if (name == (*command)->name) {
            return *command;
        }
    }
    return nullptr;
}

namespace {

std::vector<std::string> CommandNames() {
    std::vector<std::string> names;
    for (const Command* const* command = kCommands; *command != nullptr; ++command) {
        names.push_back((*command)->name);
    }
    return names;
}

const Command& ChooseCommand(std::vector<std::string>* arguments) {
    if (arguments->empty()) {
        ThrowUsage("", "no command given", "treehfs help lists them");
    }
    std::string name = arguments->front();
    arguments->erase(arguments->begin());
    if (name == "--version") {
        name = "version";
    } else if (name == "-h" || name == "--help") {
        name = "help";
    } else if (name[0] == '-') {
        ThrowUsage("", "unknown option " + name + DidYouMean(name, {"--help", "--version"}), "");
    }
    const Command* command = FindCommand(name);
    if (command == nullptr) {
        ThrowUsage("", "unknown command '" + name + "'" + DidYouMean(name, CommandNames()), "");
    }
    return *command;
}

// Takes the numbers 0 to 2 where the caller has closed them: a file opened later would get one of
// them, and be written what is meant for the terminal. The wrong way round, so that using them
// fails as it would have.
bool HoldStandardNumbers() {
    for (int number = 0; number <= 2; ++number) {
        if (fcntl(number, F_GETFD) < 0 &&
            open("/dev/null", number == 0 ? O_WRONLY : O_RDONLY) != number) {
            return false;
        }
    }
    return true;
}

int RunCommand(std::vector<std::string> arguments) {
    const Command& command = ChooseCommand(&arguments);
    Invocation call(command, std::move(arguments));
    const int exitCode = command.run(&call);
    call.out.Commit();
    return exitCode;
}

int RunGuarded(const std::vector<std::string>& arguments, bool json) {
    ToolError failure;
    try {
        return RunCommand(arguments);
    } catch (const HelpShown&) {
        return kExitDone;
    } catch (const OutputClosed&) {
        return kExitDone;
    } catch (const Interrupted&) {
        std::fputs("treehfs: interrupted\n", stderr);
        return kExitInterrupted;
    } catch (const ToolError& error) {
        failure = error;
    } catch (const std::bad_alloc&) {
        failure.problem.what = "out of memory";
    } catch (const std::exception& error) {
        failure.problem.what = error.what();
    }
    PrintError(failure, json);
    return failure.exitCode;
}

}  // namespace

}  // namespace VELK::tool

int main(int argc, char** argv) {
    using namespace VELK::tool;
    if (!HoldStandardNumbers()) {
        return kExitFailed;
    }
    std::signal(SIGPIPE, SIG_IGN);
    InstallInterruptHandler();
    SilenceEngine();
    const std::vector<std::string> arguments(argv + 1, argv + argc);
    bool json = false;
    for (const std::string& argument : arguments) {
        json = json || argument == "--json";
    }
    return RunGuarded(arguments, json);
}
