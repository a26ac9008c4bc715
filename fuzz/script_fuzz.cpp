// The script parser on any text: it ends, names a line that is there when it refuses, and what it
// accepts is well formed: words inside their list, repetitions closed and nested, arguments that
// their check accepts; and the same text gives the same answer again.
//
// Input: which tree, whether faults may be injected; then the text.
#include <algorithm>
#include <cstring>
#include <string>

#include "fuzz.h"
#include "mutate.h"
#include "script_line.h"
#include "tool/script.h"

namespace {

using namespace VELK;
using namespace VELK::tool;

constexpr u32 kFiles[] = {kCatalogFileId, kExtentsFileId, kAttributesFileId};
constexpr std::size_t kMostText = 1u << 14;

void CheckAccepted(const Script& script) {
    std::vector<u32> open;
    for (u32 i = 0; i < script.lines.size(); ++i) {
        const ScriptLine& line = script.lines[i];
        const ScriptOpInfo& info = InfoOf(line.op);
        FUZZ_CHECK(line.wordCount >= info.leastWords);
        FUZZ_CHECK(line.wordCount <= info.mostWords || info.mostWords == 255);
        FUZZ_CHECK(line.firstWord + std::size_t{line.wordCount} <= script.words.size());
        FUZZ_CHECK(line.file < script.files.size() && line.line != 0);
        if (line.op == ScriptOp::kRepeat) {
            open.push_back(i);
        } else if (line.op == ScriptOp::kEnd) {
            FUZZ_CHECK(!open.empty() && line.partner == open.back());
            FUZZ_CHECK(script.lines[open.back()].partner == i);
            open.pop_back();
        }
    }
    FUZZ_CHECK(open.empty());
}

void Run(const ScriptContext& given, const std::string& text, u32 lines) {
    ScriptContext context = given;
    Script script;
    const ScriptProblem problem = ParseScript("text", text, &context, &script);
    if (problem) {
        FUZZ_CHECK(problem.line >= 1 && problem.line <= lines && problem.file == "text");
    } else {
        CheckAccepted(script);
    }
    ScriptContext secondContext = given;
    Script second;
    const ScriptProblem again = ParseScript("text", text, &secondContext, &second);
    FUZZ_CHECK(again.line == problem.line && again.what == problem.what);
    FUZZ_CHECK(second.lines.size() == script.lines.size());
    FUZZ_CHECK(secondContext.fileId == context.fileId);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const u8* data, std::size_t size) {
    fuzz::Input input(data, size);
    const u8 how = input.U8();
    const test::Bytes bytes = input.Rest(kMostText);
    std::string text(bytes.begin(), bytes.end());
    // What names files of the host would try the host, not the parser.
    if (text.find("include") != std::string::npos || text.find('@') != std::string::npos) {
        return 0;
    }
    u32 lines = 1;
    for (const char character : text) {
        lines += character == '\n' ? 1 : 0;
    }
    ScriptContext context;
    context.fileId = kFiles[how % 3];
    context.canInject = (how & 4) != 0;
    context.inputIsScript = true;
    Run(context, text, lines);
    return 0;
}

// Puts a word or a line of the language somewhere, makes a script of lines, or changes bytes.
extern "C" std::size_t LLVMFuzzerCustomMutator(u8* data, std::size_t size, std::size_t most,
                                               unsigned seed) {
    static const char* const kWords[] = {"repeat 3\n",
                                         "end\n",
                                         "$i",
                                         "$j",
                                         "\"",
                                         "\\",
                                         "{",
                                         "}",
                                         "[",
                                         "]",
                                         "\n",
                                         " ",
                                         "#",
                                         ":",
                                         "/",
                                         "hex:",
                                         "file:",
                                         "zero:",
                                         "ok",
                                         "exists",
                                         "not-found",
                                         "corrupt",
                                         "A000011C",
                                         "0x",
                                         "4294967295",
                                         "9223372036854775807",
                                         "18446744073709551616",
                                         "first",
                                         "last",
                                         "catalog",
                                         "extents",
                                         "attributes",
                                         "#!treehfs --script 1\n",
                                         "%2F",
                                         "\\u",
                                         "{parent: 2}",
                                         "id=",
                                         "name=",
                                         "data",
                                         "rsrc",
                                         "2001-02-03T04:05:06",
                                         "0755"};
    static const std::vector<std::string> operations = ScriptOpNames();
    fuzz::Mutator mutator(seed);
    if (mutator.OneIn(2)) {
        return LLVMFuzzerMutate(data, size, most);
    }
    if (size > 1 && mutator.OneIn(8)) {
        size = 1;  // a new script
    }
    const bool isLine = size == 1 || mutator.OneIn(4);
    const std::string words =
        isLine             ? fuzz::ScriptLineText(&mutator)
        : mutator.OneIn(3) ? fuzz::RecordWord(&mutator)
        : mutator.OneIn(2) ? operations[mutator.Below(static_cast<u32>(operations.size()))] + " "
                           : kWords[mutator.Below(static_cast<u32>(std::size(kWords)))];
    if (size == 0 || size + words.size() > most) {
        return LLVMFuzzerMutate(data, size, most);
    }
    std::size_t at = 1 + mutator.Below(static_cast<u32>(size));
    while (isLine && at > 1 && at < size && data[at - 1] != '\n') {
        ++at;
    }
    std::memmove(data + at + words.size(), data + at, size - at);
    std::copy(words.begin(), words.end(), data + at);
    return size + words.size();
}
