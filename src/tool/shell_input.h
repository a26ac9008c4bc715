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
    // False at the end of the input. The prompt is shown on a terminal only.
    bool Next(const std::string& prompt, std::string* line);
    // A question to a person; false for anything but yes, and where nobody is there to ask.
    bool Ask(const std::string& question);

private:
    bool NextPlain(std::string* line);

    std::string historyFile_;
    bool isTerminal_;
};

}  // namespace VELK::tool
