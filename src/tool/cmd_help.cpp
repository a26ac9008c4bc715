// help, version: what the program can do, and which one it is.
#include "tool/command.h"
#include "tool/errors.h"

#ifndef TREEHFS_VERSION
#error "TREEHFS_VERSION comes from the build"
#endif

namespace VELK::tool {

namespace {

void PrintOverview(Output* out) {
    out->Write(
        "treehfs COMMAND [options] IMAGE [arguments]\n"
        "Looks into the B-trees of HFS+ and HFSX volumes. Nothing is written to an image\n"
        "unless an option says so.\n\nCommands:\n");
    for (const Command* const* command = kCommands; *command != nullptr; ++command) {
        out->Print("  {:<14}{}\n", (*command)->name, (*command)->summary);
    }
    out->Write(
        "\ntreehfs help COMMAND tells more about one of them.\n\nExamples:\n"
        "  treehfs info disk.img\n"
        "  treehfs ls -l disk.img /Documents\n"
        "  treehfs check disk.img\n");
}

int RunHelp(Invocation* call) {
    std::optional<std::string> topic;
    call->options.OptionalArgument("COMMAND", &topic, "the command to explain");
    call->Parse();
    if (!topic) {
        PrintOverview(&call->out);
        return kExitDone;
    }
    const Command* command = FindCommand(*topic);
    if (command == nullptr) {
        std::vector<std::string> names;
        for (const Command* const* each = kCommands; *each != nullptr; ++each) {
            names.push_back((*each)->name);
        }
        ThrowUsage("help", "unknown command '" + *topic + "'" + DidYouMean(*topic, names), "");
    }
    Invocation topicCall(*command, {"--help"});
    return command->run(&topicCall);
}

int RunVersion(Invocation* call) {
    call->DeclareJson();
    call->Parse();
    if (call->json) {
        call->out.Print("{{\"schema\":\"treehfs.version/1\",\"version\":\"{}\",\"script\":1}}\n",
                        TREEHFS_VERSION);
    } else {
        call->out.Print("treehfs {}\n", TREEHFS_VERSION);
    }
    return kExitDone;
}

}  // namespace

extern const Command kHelpCommand;
const Command kHelpCommand = {
    "help", "[COMMAND]", "explain a command", "", {"help", "help ls", "ls --help"}, RunHelp,
};

extern const Command kVersionCommand;
const Command kVersionCommand = {
    "version", "", "print the version", "", {"version", "--version", "version --json"}, RunVersion,
};

}  // namespace VELK::tool
