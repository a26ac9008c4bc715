// Reading scripts: lines to operations, repetitions matched, included files read, every argument
// checked.
#include "tool/script.h"

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "hfs/records/quoted.h"
#include "platform/error.h"
#include "tool/errors.h"
#include "tool/script_lex.h"
#include "tool/script_words.h"
#include "tool/tree_name.h"

namespace VELK::tool {
namespace {

constexpr u32 kDeepestInclude = 16;
constexpr u32 kDeepestRepeat = 16;

bool ReadAll(std::FILE* file, std::string* text) {
    char buffer[65536];
    for (std::size_t count; (count = std::fread(buffer, 1, sizeof buffer, file)) > 0;) {
        text->append(buffer, count);
    }
    return std::ferror(file) == 0;
}

// False with the reason in `*why`.
bool ReadPath(const std::string& path, std::string* text, std::string* why) {
    std::FILE* file = path == "-" ? stdin : std::fopen(path.c_str(), "rb");
    const bool isRead = file != nullptr && ReadAll(file, text);
    if (!isRead) {
        *why = errno == ENOENT ? "no such file" : std::strerror(errno);
    }
    if (file != nullptr && file != stdin) {
        std::fclose(file);
    }
    // Some editors mark UTF-8 so.
    constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
    if (isRead && text->starts_with(kByteOrderMark)) {
        text->erase(0, kByteOrderMark.size());
    }
    return isRead;
}

class ScriptParser {
public:
    ScriptParser(ScriptContext* context, Script* script) : context_(context), script_(script) {}

    ScriptProblem ParseText(const std::string& name, std::string text, u32 depth) {
        script_->texts.push_back(std::make_unique<std::string>(std::move(text)));
        const std::string_view all = *script_->texts.back();
        const u32 file = static_cast<u32>(script_->files.size());
        script_->files.push_back(name);
        const std::size_t outerOpen = open_.size();
        u32 number = depth == 0 ? context_->firstLine - 1 : 0;
        for (std::size_t at = 0; at < all.size();) {
            const std::size_t end = std::min(all.find('\n', at), all.size());
            ++number;
            std::string fault = ParseLine(all.substr(at, end - at), file, number, depth);
            if (inner_) {
                return inner_;
            }
            if (!fault.empty()) {
                return {name, number, std::move(fault)};
            }
            at = end + 1;
        }
        if (open_.size() > outerOpen) {
            return {name, script_->lines[open_.back()].line, "repeat without end"};
        }
        return {};
    }

private:
    std::string ParseLine(std::string_view text, u32 file, u32 number, u32 depth) {
        if (number == 1 && text.starts_with("#!")) {
            return VersionFault(text);
        }
        const u32 first = static_cast<u32>(script_->words.size());
        const char* split = SplitScriptLine(text, &script_->words, &script_->unquoted);
        if (split != nullptr) {
            return split;
        }
        const std::size_t count = script_->words.size() - first;
        if (count == 0) {
            return {};
        }
        const std::string_view name = script_->words[first];
        ScriptLine line{};
        if (!FindScriptOp(name, &line.op)) {
            const std::string word(name);
            return "unknown operation '" + word + "'" + DidYouMean(word, ScriptOpNames());
        }
        if (count - 1 > 0xFFFF) {
            return "too many words";
        }
        line.wordCount = static_cast<u16>(count - 1);
        line.firstWord = first + 1;
        line.file = file;
        line.line = number;
        const std::string_view* words = script_->Words(line);
        for (u32 i = 0; i < line.wordCount && line.op != ScriptOp::kEcho; ++i) {
            line.expands = line.expands || words[i].find('$') != std::string_view::npos;
        }
        const std::string fault = CheckArguments(line, words);
        return fault.empty() ? Place(line, words, depth) : fault;
    }

    std::string VersionFault(std::string_view text) const {
        constexpr std::string_view kOption = "--script ";
        const std::size_t at = text.find(kOption);
        if (at == std::string_view::npos) {
            return {};
        }
        std::string_view version = text.substr(at + kOption.size());
        version = version.substr(0, version.find_first_of(" \t\r"));
        u64 number = 0;
        if (ParseNumber(version, 0xFFFF, &number) && number == kScriptVersion) {
            return {};
        }
        return "language version '" + std::string(version) + "' is not known, this program knows " +
               std::to_string(kScriptVersion);
    }

    // Words with $i are tried with the first and the last number they will stand for.
    std::string CheckArguments(const ScriptLine& line, const std::string_view* words) const {
        if (!line.expands) {
            return ArgumentFault(line.op, words, line.wordCount, *context_);
        }
        for (const bool last : {false, true}) {
            std::vector<u64> counters;
            for (std::size_t i = limits_.size(); i-- > 0;) {
                counters.push_back(last ? limits_[i] : 1);
            }
            std::vector<std::string> texts(line.wordCount);
            std::vector<std::string_view> expanded(line.wordCount);
            for (u32 i = 0; i < line.wordCount; ++i) {
                if (!ExpandWord(words[i], counters, &texts[i])) {
                    return "$i, $j and $k stand for the numbers of repetitions: there are " +
                           std::to_string(limits_.size()) + " here";
                }
                expanded[i] = texts[i];
            }
            std::string fault = ArgumentFault(line.op, expanded.data(), line.wordCount, *context_);
            if (!fault.empty()) {
                return fault;
            }
        }
        return {};
    }

    std::string Place(ScriptLine line, const std::string_view* words, u32 depth) {
        const u32 index = static_cast<u32>(script_->lines.size());
        switch (line.op) {
            case ScriptOp::kUse:
                context_->fileId = TreeIdFromText(std::string(words[0]));
                break;
            case ScriptOp::kInclude:
                return Include(line, std::string(words[0]), depth);
            case ScriptOp::kRepeat: {
                if (open_.size() == kDeepestRepeat) {
                    return "repetitions are nested too deeply";
                }
                u64 limit = 1;
                ParseNumber(words[0], kMostScriptNumber, &limit);
                open_.push_back(index);
                limits_.push_back(limit);
                break;
            }
            case ScriptOp::kEnd:
                if (open_.empty() || script_->lines[open_.back()].file != line.file) {
                    return "end without repeat";
                }
                line.partner = open_.back();
                script_->lines[open_.back()].partner = index;
                open_.pop_back();
                limits_.pop_back();
                break;
            default:
                break;
        }
        script_->lines.push_back(line);
        return {};
    }

    // An included file stands where it is named: its lines become part of the script.
    std::string Include(const ScriptLine& line, const std::string& path, u32 depth) {
        if (depth == kDeepestInclude) {
            return "include: '" + path + "' includes itself, or scripts are nested too deeply";
        }
        std::string full = path;
        const std::string& from = script_->files[line.file];
        const std::size_t slash = from.rfind('/');
        if (path[0] != '/' && slash != std::string::npos) {
            full = from.substr(0, slash + 1) + path;
        }
        std::string text;
        std::string why = "it is standard input";
        if (path == "-" || !ReadPath(full, &text, &why)) {
            return "include: cannot read '" + path + "': " + why;
        }
        inner_ = ParseText(full, std::move(text), depth + 1);
        return {};
    }

    ScriptContext* context_;
    Script* script_;
    std::vector<u32> open_;    // repeat lines without their end
    std::vector<u64> limits_;  // how often they run
    ScriptProblem inner_;      // of an included file
};

}  // namespace

bool ParseStatus(std::string_view word, int* status) {
    std::size_t count = 0;
    const StatusEntry* known = StatusTable(&count);
    for (std::size_t i = 0; i < count; ++i) {
        if (word == known[i].name) {
            *status = known[i].status;
            return true;
        }
    }
    u64 number = 0;
    if (word.size() != 8 || !ParseNumber("0x" + std::string(word), 0xFFFFFFFF, &number)) {
        return false;
    }
    *status = static_cast<int>(static_cast<u32>(number));
    return true;
}

std::vector<std::string> StatusNames() {
    std::vector<std::string> names;
    std::size_t count = 0;
    const StatusEntry* known = StatusTable(&count);
    for (std::size_t i = 0; i < count; ++i) {
        names.push_back(known[i].name);
    }
    return names;
}

bool ParseStatusList(std::string_view text, std::vector<int>* statuses, std::string* wrong) {
    while (!text.empty()) {
        const std::size_t comma = std::min(text.find(','), text.size());
        int status = 0;
        if (!ParseStatus(text.substr(0, comma), &status)) {
            *wrong = std::string(text.substr(0, comma));
            return false;
        }
        statuses->push_back(status);
        text.remove_prefix(std::min(comma + 1, text.size()));
    }
    return true;
}

bool ExpandWord(std::string_view word, const std::vector<u64>& counters, std::string* result) {
    result->clear();
    for (std::size_t i = 0; i < word.size(); ++i) {
        const bool isCounter =
            word[i] == '$' && i + 1 < word.size() && word[i + 1] >= 'i' && word[i + 1] <= 'k';
        if (!isCounter) {
            result->push_back(word[i]);
            continue;
        }
        const std::size_t level = static_cast<std::size_t>(word[++i] - 'i');
        if (level >= counters.size()) {
            return false;
        }
        *result += std::to_string(counters[level]);
    }
    return true;
}

ScriptProblem ParseScript(const std::string& name, std::string text, ScriptContext* context,
                          Script* script) {
    return ScriptParser(context, script).ParseText(name, std::move(text), 0);
}

ScriptProblem ReadScript(const std::string& path, ScriptContext* context, Script* script) {
    std::string text;
    std::string why;
    if (!ReadPath(path, &text, &why)) {
        return {path, 0, "cannot read the script: " + why};
    }
    context->inputIsScript = context->inputIsScript || path == "-";
    return ParseScript(path == "-" ? "stdin" : path, std::move(text), context, script);
}

}  // namespace VELK::tool
