// Splitting a line into words.
#include "tool/script_lex.h"

namespace VELK::tool {
namespace {

bool IsBlank(char character) {
    return character == ' ' || character == '\t' || character == '\r';
}

// Moves `at` behind the string that opens there; npos when it does not close.
std::size_t SkipQuoted(std::string_view line, std::size_t at) {
    for (++at; at < line.size(); ++at) {
        if (line[at] == '\\') {
            ++at;
        } else if (line[at] == '"') {
            return at + 1;
        }
    }
    return std::string_view::npos;
}

// The text of a word in quotes: \" and \\ lose their backslash.
std::string Unquoted(std::string_view inside) {
    std::string text;
    for (std::size_t i = 0; i < inside.size(); ++i) {
        const bool escapes = inside[i] == '\\' && i + 1 < inside.size() &&
                             (inside[i + 1] == '"' || inside[i + 1] == '\\');
        text.push_back(inside[escapes ? ++i : i]);
    }
    return text;
}

struct WordEnd {
    std::size_t end = 0;
    const char* fault = nullptr;
};

// Finds the end of the word at `at`: a blank outside quotes, braces and brackets.
WordEnd FindWordEnd(std::string_view line, std::size_t at) {
    int depth = 0;
    while (at < line.size() && (depth > 0 || !IsBlank(line[at]))) {
        if (line[at] == '"') {
            at = SkipQuoted(line, at);
            if (at == std::string_view::npos) {
                return {line.size(), "a string is not closed"};
            }
            continue;
        }
        if (line[at] == '{' || line[at] == '[') {
            ++depth;
        } else if ((line[at] == '}' || line[at] == ']') && depth > 0) {
            --depth;
        }
        ++at;
    }
    return {at, depth > 0 ? "a brace or bracket is not closed" : nullptr};
}

}  // namespace

const char* SplitScriptLine(std::string_view line, std::vector<std::string_view>* words,
                            std::deque<std::string>* unquoted) {
    std::size_t at = 0;
    for (;;) {
        while (at < line.size() && IsBlank(line[at])) {
            ++at;
        }
        if (at == line.size() || line[at] == '#') {
            return nullptr;
        }
        const WordEnd word = FindWordEnd(line, at);
        if (word.fault != nullptr) {
            return word.fault;
        }
        const std::string_view text = line.substr(at, word.end - at);
        if (text[0] == '"' && SkipQuoted(text, 0) == text.size()) {
            unquoted->push_back(Unquoted(text.substr(1, text.size() - 2)));
            words->push_back(unquoted->back());
        } else {
            words->push_back(text);
        }
        at = word.end;
    }
}

}  // namespace VELK::tool
