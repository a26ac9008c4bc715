// See program_run.h.
#include "program_run.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>

#include "tool/command.h"
#include "tool/engine_trace.h"
#include "tool/errors.h"

namespace VELK::tool {

// The commands the museum is shown to.
extern const Command kInfoCommand, kCheckCommand, kLsCommand, kFindCommand, kDumpCommand,
    kNodeCommand, kStatsCommand, kApplyCommand;
const Command* const kCommands[] = {&kInfoCommand,  &kCheckCommand, &kLsCommand,
                                    &kFindCommand,  &kDumpCommand,  &kNodeCommand,
                                    &kStatsCommand, &kApplyCommand, nullptr};

const Command* FindCommand(const std::string& name) {
    for (const Command* const* command = kCommands; *command != nullptr; ++command) {
        if (name == (*command)->name) {
            return *command;
        }
    }
    return nullptr;
}

}  // namespace VELK::tool

namespace VELK::test {

namespace {

void ReplaceAll(std::string* text, const std::string& from, const std::string& to) {
    for (std::size_t at = 0; (at = text->find(from, at)) != std::string::npos; at += to.size()) {
        text->replace(at, from.size(), to);
    }
}

}  // namespace

ProgramRun::ProgramRun(const Bytes& image)
    : path_(::testing::TempDir() + "treehfs_museum_" + std::to_string(getpid()) + ".img") {
    std::ofstream file(path_, std::ios::binary | std::ios::trunc);
    file.write(reinterpret_cast<const char*>(image.data()),
               static_cast<std::streamsize>(image.size()));
}

ProgramRun::~ProgramRun() {
    std::remove(path_.c_str());
}

Told ProgramRun::Run(const std::string& command, std::vector<std::string> arguments) {
    for (std::string& argument : arguments) {
        argument = argument == "IMAGE" ? path_ : argument;
    }
    tool::SilenceEngine();
    Told told;
    ::testing::internal::CaptureStdout();
    ::testing::internal::CaptureStderr();
    try {
        tool::Invocation call(*tool::FindCommand(command), arguments);
        told.exitCode = call.command.run(&call);
        call.out.Commit();
    } catch (const tool::ToolError& error) {
        tool::PrintError(error, false);
        told.exitCode = error.exitCode;
    }
    std::fflush(stdout);
    std::fflush(stderr);
    told.out = ::testing::internal::GetCapturedStdout();
    told.err = ::testing::internal::GetCapturedStderr();
    ReplaceAll(&told.out, path_, "IMAGE");
    ReplaceAll(&told.err, path_, "IMAGE");
    return told;
}

Bytes ProgramRun::FileBytes() const {
    std::ifstream file(path_, std::ios::binary);
    const std::string text((std::istreambuf_iterator<char>(file)),
                           std::istreambuf_iterator<char>());
    return Bytes(text.begin(), text.end());
}

}  // namespace VELK::test
