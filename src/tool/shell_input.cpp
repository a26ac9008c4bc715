// Lines from a terminal by the line editor's library where there is one, else by the standard
// library.
#include "tool/shell_input.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "tool/errors.h"
#include "tool/progress.h"

#ifdef TREEHFS_EDITLINE
#include <editline/readline.h>
#endif

namespace VELK::tool {

namespace {

#ifdef TREEHFS_EDITLINE
// The library calls functions without a context, one line at a time.
ShellInput::Completer g_completer;
std::vector<std::string> g_candidates;

char* NextCandidate(const char*, int state) {
    static std::size_t next = 0;
    next = state == 0 ? 0 : next;
    return next < g_candidates.size() ? strdup(g_candidates[next++].c_str()) : nullptr;
}

char** Complete(const char* text, int start, int) {
    rl_attempted_completion_over = 1;  // never names of files
    const std::string_view line = rl_line_buffer;
    g_candidates = g_completer(line.substr(0, static_cast<std::size_t>(start)), text);
    return g_candidates.empty() ? nullptr : rl_completion_matches(text, NextCandidate);
}

char g_wordBreaks[] = " \t";

bool HoldsSomething(const std::string& path) {
    struct stat info;
    return stat(path.c_str(), &info) == 0 && info.st_size != 0;
}
#endif

}  // namespace

ShellInput::ShellInput(std::string historyFile, Completer completer)
    : historyFile_(std::move(historyFile)), isTerminal_(isatty(STDIN_FILENO) != 0) {
#ifdef TREEHFS_EDITLINE
    if (isTerminal_) {
        g_completer = std::move(completer);
        rl_attempted_completion_function = Complete;
        rl_completer_word_break_characters = g_wordBreaks;
        using_history();
        if (!historyFile_.empty() && read_history(historyFile_.c_str()) != 0 &&
            HoldsSomething(historyFile_)) {
            ThrowFailed(historyFile_, "holds no history and would be replaced",
                        "choose another name for --history");
        }
    }
#else
    (void)completer;
#endif
}

ShellInput::~ShellInput() {
#ifdef TREEHFS_EDITLINE
    if (isTerminal_ && !historyFile_.empty()) {
        if (write_history(historyFile_.c_str()) != 0) {
            PrintNote(historyFile_, Failure("the history cannot be kept there", ""));
        }
    }
    g_completer = nullptr;
#endif
}

bool ShellInput::NextPlain(std::string* line) {
    line->clear();
    int character = 0;
    while ((character = std::getchar()) != EOF && character != '\n') {
        line->push_back(static_cast<char>(character));
    }
    return character != EOF || !line->empty();
}

bool ShellInput::NextTyped(const std::string& prompt, std::string* line) {
#ifdef TREEHFS_EDITLINE
    char* text = readline(prompt.c_str());
    if (text == nullptr) {
        return false;
    }
    *line = text;
    if (*text != 0) {
        add_history(text);
    }
    std::free(text);
    return true;
#else
    std::string shown = prompt;
    std::erase(shown, kHidden);
    std::fputs(shown.c_str(), stdout);
    std::fflush(stdout);
    return NextPlain(line);
#endif
}

ShellInput::Typed ShellInput::Next(const std::string& prompt, std::string* line) {
    const bool isLine = isTerminal_ ? NextTyped(prompt, line) : NextPlain(line);
    if (isTerminal_ && !isLine) {
        std::fputc('\n', stdout);  // what comes next begins a line
        std::fflush(stdout);
    }
    if (isTerminal_ && TakeInterrupt()) {
        std::clearerr(stdin);
        return Typed::kInterrupt;
    }
    ThrowIfInterrupted();
    return isLine ? Typed::kLine : Typed::kEnd;
}

bool ShellInput::Ask(const std::string& question) {
    if (!isTerminal_) {
        return false;
    }
    std::fputs(question.c_str(), stderr);
    std::string answer;
    return NextPlain(&answer) && !answer.empty() && (answer[0] == 'y' || answer[0] == 'Y');
}

}  // namespace VELK::tool
