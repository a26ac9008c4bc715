// One line for every failure, and suggestions for mistyped words.
#include "tool/errors.h"

#include <cstdio>

#include "hfs/records/json_writer.h"
#include "hfs/records/name_text.h"

namespace VELK::tool {

namespace {

ToolError MakeError(const std::string& subject, int exitCode, std::string what,
                    std::string advice) {
    ToolError error;
    error.subject = subject;
    error.problem.exitClass = static_cast<ExitClass>(exitCode);
    error.problem.what = std::move(what);
    error.problem.advice = std::move(advice);
    error.exitCode = exitCode;
    return error;
}

}  // namespace

void ThrowProblem(const std::string& subject, const Problem& problem) {
    ToolError error;
    error.subject = subject;
    error.problem = problem;
    error.exitCode = problem ? static_cast<int>(problem.exitClass) : int{kExitFailed};
    throw ToolError(std::move(error));
}

void ThrowFailed(const std::string& subject, std::string what, std::string advice) {
    throw MakeError(subject, kExitFailed, std::move(what), std::move(advice));
}

void ThrowNo(const std::string& subject, std::string what, std::string advice) {
    throw MakeError(subject, kExitNo, std::move(what), std::move(advice));
}

void ThrowArgument(const std::string& subject, std::string what, std::string advice) {
    throw MakeError(subject, kExitUsage, std::move(what), std::move(advice));
}

void ThrowUsage(const std::string& command, std::string what, std::string advice) {
    ToolError error = MakeError("", kExitUsage, std::move(what), std::move(advice));
    error.command = command;
    throw ToolError(std::move(error));
}

std::string ErrorLine(const ToolError& error) {
    std::string line = "treehfs";
    if (!error.command.empty()) {
        line += " " + error.command;
    }
    line += ": ";
    if (!error.subject.empty()) {
        line += error.subject + ": ";
    }
    return EscapedText(line + error.problem.Text());
}

std::string ErrorJson(const ToolError& error) {
    std::string text;
    JsonWriter json(&text);
    json.BeginObject();
    json.Member("schema", "treehfs.error/1");
    json.Member("code", error.exitCode);
    if (!error.command.empty()) {
        json.Member("command", error.command);
    }
    if (!error.subject.empty()) {
        json.Member("image", error.subject);
    }
    json.Member("what", error.problem.what);
    if (error.problem.status != 0) {
        json.Member("status", StatusName(error.problem.status));
    }
    if (error.problem.offset) {
        json.Member("offset", *error.problem.offset);
    }
    if (error.problem.fileId) {
        json.Member("tree", ForkName(*error.problem.fileId));
    }
    if (error.problem.node) {
        json.Member("node", *error.problem.node);
    }
    if (!error.problem.advice.empty()) {
        json.Member("advice", error.problem.advice);
    }
    json.EndObject();
    return text;
}

void PrintError(const ToolError& error, bool json) {
    const std::string line = (json ? ErrorJson(error) : ErrorLine(error)) + "\n";
    std::fwrite(line.data(), 1, line.size(), stderr);
}

void PrintNote(const std::string& subject, const Problem& note) {
    const std::string line = EscapedText("treehfs: " + subject + ": " + note.Text()) + "\n";
    std::fwrite(line.data(), 1, line.size(), stderr);
}

}  // namespace VELK::tool
