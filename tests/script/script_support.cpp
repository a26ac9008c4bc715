#include "script_support.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>

#include "tool/command.h"
#include "tool/engine_trace.h"
#include "tool/errors.h"

namespace VELK::tool {
// The table of the program, as far as these tests need it.
extern const Command kApplyCommand, kExportCommand, kImportCommand, kLsCommand, kShellCommand;
const Command* const kCommands[] = {&kApplyCommand, &kExportCommand, &kImportCommand,
                                    &kLsCommand,    &kShellCommand,  nullptr};

const Command* FindCommand(const std::string& name) {
    for (const Command* const* command = kCommands; *command != nullptr; ++command) {
        if (name == (*command)->name) {
            return *command;
        }
    }
    return nullptr;
}

std::string TempPath(const std::string& name) {
    return ::testing::TempDir() + "treehfs_" + std::to_string(getpid()) + "_" + name;
}

std::string TempFile(const std::string& name, const std::string& text) {
    const std::string path = TempPath(name);
    std::FILE* file = std::fopen(path.c_str(), "wb");
    EXPECT_NE(file, nullptr);
    std::fwrite(text.data(), 1, text.size(), file);
    std::fclose(file);
    return path;
}

Transcript RunTool(const std::string& command, const std::vector<std::string>& arguments) {
    SilenceEngine();
    Transcript result;
    ::testing::internal::CaptureStdout();
    ::testing::internal::CaptureStderr();
    bool json = false;
    for (const std::string& argument : arguments) {
        json = json || argument == "--json";
    }
    try {
        Invocation call(*FindCommand(command), arguments);
        result.exitCode = call.command.run(&call);
        call.out.Commit();
    } catch (const ToolError& error) {
        PrintError(error, json);
        result.exitCode = error.exitCode;
    }
    std::fflush(stdout);
    std::fflush(stderr);
    result.out = ::testing::internal::GetCapturedStdout();
    result.err = ::testing::internal::GetCapturedStderr();
    return result;
}

Transcript Apply(const std::string& volume, const std::string& script,
                 const std::vector<std::string>& options) {
    const std::string path = TempFile("s.tr", script);
    std::vector<std::string> arguments = {"--new", volume};
    arguments.insert(arguments.end(), options.begin(), options.end());
    arguments.push_back(path);
    Transcript result = RunTool("apply", arguments);
    std::remove(path.c_str());
    for (std::string* text : {&result.out, &result.err}) {
        for (std::size_t at; (at = text->find(path)) != std::string::npos;) {
            text->replace(at, path.size(), "s.tr");
        }
    }
    return result;
}

Transcript Shell(const std::string& input, const std::vector<std::string>& arguments) {
    const std::string path = TempFile("shell.in", input);
    EXPECT_NE(std::freopen(path.c_str(), "rb", stdin), nullptr);
    Transcript result = RunTool("shell", arguments);
    std::remove(path.c_str());
    return result;
}

std::string Lines(const std::string& script) {
    const Transcript result = Apply("1M,node=512", script, {});
    const std::size_t summary = result.out.rfind("s.tr: ");
    EXPECT_NE(summary, std::string::npos) << result.out << result.err;
    return summary == std::string::npos ? result.out : result.out.substr(0, summary);
}

}  // namespace VELK::tool
