// treehfs shell: the operations of scripts typed one by one, and the commands that look.
#include <algorithm>
#include <cstdio>

#include "hfs/records/name_text.h"
#include "tool/command.h"
#include "tool/errors.h"
#include "tool/progress.h"
#include "tool/script_lex.h"
#include "tool/script_run.h"
#include "tool/script_volume.h"
#include "tool/session.h"
#include "tool/shell_complete.h"
#include "tool/shell_input.h"

namespace VELK::tool {
namespace {

constexpr char kRed[] = "\001\033[31m\001";  // between ShellInput::kHidden
constexpr char kPlain[] = "\001\033[0m\001";

class Shell {
public:
    Shell(Invocation* call, const TargetOptions& target, const ScriptRunOptions& options,
          ImageVolume* volume, const std::string& historyFile)
        : call_(call),
          isWriting_(target.write),
          volume_(volume),
          runner_(volume, options, &call->out,
                  [call](const std::string& text) {
                      call->out.Flush();
                      std::fprintf(stderr, "%s\n", text.c_str());
                  }),
          input_(historyFile, [this](std::string_view before, std::string_view word) {
              return ShellCandidates(volume_, runner_.FileId(), before, word);
          }) {
        context_.canInject = !target.write;
        context_.inputIsScript = true;
    }

    int Run() {
        std::string line;
        for (auto typed = ShellInput::Typed::kLine; !isDone_;) {
            typed = input_.Next(Prompt(), &line);
            if (typed == ShellInput::Typed::kEnd) {
                break;
            }
            if (typed == ShellInput::Typed::kInterrupt) {
                Forget();
                continue;
            }
            ++number_;
            HandleInterruptibly(line);
            call_->out.Flush();
        }
        if (!open_.empty()) {
            std::fprintf(stderr, "shell:%u: repeat without end\n", openLine_);
        }
        runner_.EndReservations();
        Leave();
        return runner_.ExitCode();
    }

private:
    std::string Prompt() const {
        if (!open_.empty()) {
            return "...> ";
        }
        const std::string prompt =
            std::string(ForkName(runner_.FileId())) + (isWriting_ ? "(WRITE)>" : "(memory)>");
        // The line editor drops an escape sequence that nothing visible follows.
        return (isWriting_ && call_->color ? kRed + prompt + kPlain : prompt) + " ";
    }

    // Gives up the lines of a repetition that has not ended.
    void Forget() {
        open_.clear();
        depth_ = 0;
    }

    // Ctrl-C stops what runs, not the shell: what was changed so far would be gone with it.
    void HandleInterruptibly(const std::string& line) {
        try {
            Handle(line);
        } catch (const Interrupted&) {
            LendVolume(nullptr, "");
            if (!input_.IsTerminal() || !TakeInterrupt()) {
                throw;
            }
            call_->out.Flush();
            std::fputs("treehfs: interrupted\n", stderr);
        }
    }

    void Handle(const std::string& line) {
        std::vector<std::string_view> words;
        std::deque<std::string> unquoted;
        const bool isSplit = SplitScriptLine(line, &words, &unquoted) == nullptr;
        if (isSplit && words.empty()) {
            return;
        }
        const std::string_view first = isSplit ? words[0] : std::string_view(line);
        if (open_.empty() && isSplit) {
            if (first == "exit" || first == "quit") {
                isDone_ = true;
                return;
            }
            if (first == "help") {
                Help(words);
                return;
            }
            if (IsCommand(words)) {
                RunCommand(words);
                return;
            }
        }
        // A repetition runs when its last `end` has been typed.
        if (open_.empty()) {
            openLine_ = number_;
        }
        open_ += line + "\n";
        depth_ += first == "repeat" ? 1 : 0;
        depth_ -= first == "end" ? 1 : 0;
        if (depth_ <= 0) {
            RunOperations();
        }
    }

    void RunOperations() {
        const std::string text = std::move(open_);
        open_.clear();
        depth_ = 0;
        context_.fileId = runner_.FileId();
        context_.firstLine = openLine_;
        Script script;
        const ScriptProblem problem = ParseScript("shell", text, &context_, &script);
        if (problem) {
            call_->out.Flush();
            std::fprintf(stderr, "%s\n", EscapedText(problem.Text()).c_str());
            return;
        }
        runner_.Run(script);
    }

    // Words that name an operation too are a command when they come with an option or a path.
    static bool IsCommand(const std::vector<std::string_view>& words) {
        const std::vector<std::string>& names = ShellCommandNames();
        ScriptOp op;
        if (std::find(names.begin(), names.end(), words[0]) == names.end()) {
            return false;
        }
        return !FindScriptOp(words[0], &op) ||
               (words.size() > 1 && (words[1].starts_with("-") || words[1].starts_with("/")));
    }

    void RunCommand(const std::vector<std::string_view>& words) {
        const Command* command = FindCommand(std::string(words[0]));
        if (command == nullptr) {
            std::fprintf(stderr, "treehfs: this program has no command %s\n",
                         std::string(words[0]).c_str());
            return;
        }
        std::vector<std::string> arguments = {kLentImage};
        arguments.insert(arguments.end(), words.begin() + 1, words.end());
        call_->out.Flush();
        LendVolume(volume_, call_->image);
        try {
            Invocation inner(*command, arguments);
            command->run(&inner);
            inner.out.Commit();
        } catch (const HelpShown&) {
        } catch (const ToolError& error) {
            PrintError(error, false);
        }
        LendVolume(nullptr, "");
    }

    void Help(const std::vector<std::string_view>& words) {
        ScriptOp op;
        for (std::size_t i = 1; i < words.size(); ++i) {
            if (FindScriptOp(words[i], &op)) {
                call_->out.Print("{}: {}\n", InfoOf(op).usage, InfoOf(op).summary);
            } else {
                const std::string word(words[i]);
                std::fprintf(stderr, "treehfs: no operation '%s'%s\n", word.c_str(),
                             DidYouMean(word, ScriptOpNames()).c_str());
            }
        }
        if (words.size() > 1) {
            return;
        }
        for (u32 i = 0; i < kScriptOpCount; ++i) {
            const ScriptOpInfo& info = InfoOf(static_cast<ScriptOp>(i));
            call_->out.Print("{:<36} {}\n", info.usage, info.summary);
        }
        call_->out.Print("{:<36} {}\n", "info ls dump plot export ...",
                         "commands of the program, without IMAGE");
        call_->out.Print("{:<36} {}\n", "check find node stats OPTION ...",
                         "the commands, where an option or path follows");
        call_->out.Print("{:<36} {}\n", "exit", "leave");
    }

    // Changes that no flush has kept: asked about once, where there is someone to ask.
    void Leave() {
        u64 nodes = 0;
        for (const u32 fileId : {kCatalogFileId, kExtentsFileId, kAttributesFileId}) {
            const CBTreeHfs* tree = volume_->OpenTree(fileId);
            for (const list_head* link = tree == nullptr ? nullptr : tree->modifiedList.next;
                 link != nullptr && link != &tree->modifiedList; link = link->next) {
                ++nodes;
            }
        }
        if (!isWriting_ || nodes == 0) {
            return;
        }
        const std::string count = Grouped(nodes) + (nodes == 1 ? " node has" : " nodes have");
        if (input_.Ask(count + " changed since the last flush: keep the changes? [y/N] ")) {
            return;
        }
        volume_->Restore();
        std::fprintf(stderr, "discarded: %s changed since the last flush\n", count.c_str());
    }

    Invocation* call_;
    bool isWriting_;
    ImageVolume* volume_;
    ScriptRunner runner_;
    ShellInput input_;
    ScriptContext context_;
    std::string open_;  // lines of a repetition that has not ended
    u32 openLine_ = 0;
    int depth_ = 0;
    u32 number_ = 0;
    bool isDone_ = false;
};

int Run(Invocation* call) {
    TargetOptions target;
    ScriptRunOptions options;
    std::string historyFile;
    std::optional<std::string> image;
    call->options.OptionalArgument("IMAGE", &image, "disk image; none with --new");
    target.Declare(call);
    call->options.Flag("--state", &options.showState, "the tree's counters at every line");
    call->options.Text("--history", &historyFile, "FILE", "keep the lines typed in FILE");
    call->Parse();
    options.trace = call->trace;
    if (image.has_value() != target.newVolume.empty()) {
        ThrowUsage("shell", image ? "expected no IMAGE with --new" : "expected IMAGE",
                   "treehfs help shell shows both ways");
    }
    call->image = image.value_or("");
    const std::unique_ptr<ImageVolume> volume = OpenTarget(*call, target);
    const u64 before = volume->HandedOverBlocks();
    const int exitCode = Shell(call, target, options, volume.get(), historyFile).Run();
    call->out.Flush();
    FinishTarget(*call, target, volume.get(), before);
    return exitCode;
}

}  // namespace

extern const Command kShellCommand;
const Command kShellCommand = {
    "shell",
    "IMAGE, --new SIZE[,...]",
    "type operations one by one",
    "The language of apply, and the commands that look without their IMAGE. Tab completes "
    "operations, keys and paths; help lists the operations. Changes stay in memory unless --write "
    "is given.",
    {"shell disk.img", "shell --new 64M,node=512", "shell disk.img --write --history .treehfs"},
    Run,
};

}  // namespace VELK::tool
