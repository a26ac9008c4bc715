// completion: a script that makes a shell complete commands, options and file names.
#include "tool/command.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

// Every option of a command. Its help is asked for, which declares them without running anything.
std::string OptionNames(const Command& command) {
    Invocation call(command, {"--completion-names"});
    try {
        command.run(&call);
    } catch (const ToolError&) {
        // The unknown option ends the call once everything is declared.
    }
    std::string names;
    for (const std::string& name : call.options.Names()) {
        names += (names.empty() ? "" : " ") + name;
    }
    return names;
}

std::string CommandList() {
    std::string names;
    for (const Command* const* command = kCommands; *command != nullptr; ++command) {
        names += (names.empty() ? "" : " ") + std::string((*command)->name);
    }
    return names;
}

void PrintBash(Output* out) {
    out->Print(
        "# bash completion for treehfs\n"
        "_treehfs() {{\n"
        "    local word=${{COMP_WORDS[COMP_CWORD]}} names=\n"
        "    if [ \"$COMP_CWORD\" -eq 1 ]; then\n"
        "        COMPREPLY=($(compgen -W '{}' -- \"$word\"))\n"
        "        return\n"
        "    fi\n"
        "    case ${{COMP_WORDS[1]}} in\n",
        CommandList());
    for (const Command* const* command = kCommands; *command != nullptr; ++command) {
        out->Print("        {}) names='{}' ;;\n", (*command)->name, OptionNames(**command));
    }
    out->Write(
        "    esac\n"
        "    case $word in\n"
        "        -*) COMPREPLY=($(compgen -W \"$names\" -- \"$word\")) ;;\n"
        "        *) COMPREPLY=($(compgen -f -- \"$word\")) ;;\n"
        "    esac\n"
        "}\n"
        "complete -o filenames -F _treehfs treehfs\n");
}

void PrintZsh(Output* out) {
    out->Write("#compdef treehfs\nautoload -U +X bashcompinit && bashcompinit\n");
    PrintBash(out);
}

void PrintFish(Output* out) {
    out->Write("# fish completion for treehfs\n");
    for (const Command* const* command = kCommands; *command != nullptr; ++command) {
        out->Print("complete -c treehfs -n __fish_use_subcommand -f -a {} -d '{}'\n",
                   (*command)->name, (*command)->summary);
    }
}

int RunCompletion(Invocation* call) {
    std::string shell;
    call->options.Argument("SHELL", &shell, "bash, zsh or fish");
    call->Parse();
    if (shell == "bash") {
        PrintBash(&call->out);
    } else if (shell == "zsh") {
        PrintZsh(&call->out);
    } else if (shell == "fish") {
        PrintFish(&call->out);
    } else {
        ThrowUsage("completion",
                   "unknown shell '" + shell + "'" + DidYouMean(shell, {"bash", "zsh", "fish"}),
                   "bash, zsh or fish");
    }
    return kExitDone;
}

}  // namespace

extern const Command kCompletionCommand;
const Command kCompletionCommand = {
    "completion",
    "SHELL",
    "print a completion script for a shell",
    "",
    {"completion bash > /etc/bash_completion.d/treehfs", "completion zsh > ~/.zfunc/_treehfs",
     "completion fish > ~/.config/fish/completions/treehfs.fish"},
    RunCompletion,
};

}  // namespace VELK::tool
