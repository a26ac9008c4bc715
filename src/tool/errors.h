// How a command ends when it cannot do what was asked: one line on standard error and an exit code.
// Inside the tool failures are thrown; layers below return a Problem.
#pragma once

#include <string>
#include <vector>

#include "hfs/records/nearest_word.h"
#include "hfs/volume/problem.h"

namespace VELK::tool {

enum ExitCode : int {
    kExitDone = 0,
    kExitNo = 1,        // the answer is no
    kExitFindings = 4,  // check found errors
    kExitFailed = 8,    // could not do it
    kExitUsage = 16,    // wrong command line
    kExitInterrupted = 32,
};

// "treehfs[ COMMAND]: [SUBJECT: ]WHAT[: ADVICE]".
struct ToolError {
    std::string command;  // set for mistakes of the command line only
    std::string subject;  // the file concerned
    Problem problem;
    int exitCode = kExitFailed;
};

// The user asked to stop, with Ctrl-C or a termination signal.
struct Interrupted {};
// The reader of standard output went away.
struct OutputClosed {};
// Help was asked for and printed.
struct HelpShown {};

[[noreturn]] void ThrowProblem(const std::string& subject, const Problem& problem);
[[noreturn]] void ThrowFailed(const std::string& subject, std::string what, std::string advice);
[[noreturn]] void ThrowNo(const std::string& subject, std::string what, std::string advice);
// A mistake in an argument, which the text itself names.
[[noreturn]] void ThrowArgument(const std::string& subject, std::string what, std::string advice);
// A mistake in the command line of `command`.
[[noreturn]] void ThrowUsage(const std::string& command, std::string what, std::string advice);

// The one line, without line feed; control characters in it are escaped.
std::string ErrorLine(const ToolError& error);
std::string ErrorJson(const ToolError& error);
void PrintError(const ToolError& error, bool json);

// A remark on standard error: "treehfs: SUBJECT: TEXT".
void PrintNote(const std::string& subject, const Problem& note);

}  // namespace VELK::tool
