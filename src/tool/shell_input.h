// Where the shell's lines come from: a terminal with editing, history and completion, or any other
// input, plain.
#pragma once

#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace VELK::tool {

class ShellInput {
public:
    // Given what stands before the word under the cursor and the word so far: what it could become.
    using Completer =
        std::function<std::vector<std::string>(std::string_view before, std::string_view word)>;

    // `historyFile` may be empty: the history is then in memory only.
    ShellInput(std::string historyFile, Completer completer);
    ShellInput(const ShellInput&) = delete;
    ShellInput& operator=(const ShellInput&) = delete;
    ~ShellInput();

    bool IsTerminal() const { return isTerminal_; }
    enum class Typed { kLine, kInterrupt, kEnd };
    // The prompt is shown on a terminal only, and only there Ctrl-C gives up no more than the line;
    // elsewhere it throws Interrupted. Escape sequences of a prompt stand between kHidden.
    Typed Next(const std::string& prompt, std::string* line);
    static constexpr char kHidden = '\001';
    // A question to a person; false for anything but yes, and where nobody is there to ask.
    bool Ask(const std::string& question);

private:
    bool NextPlain(std::string* line);
    bool NextTyped(const std::string& prompt, std::string* line);

    std::string historyFile_;
    bool isTerminal_;
};

}  // namespace VELK::tool
