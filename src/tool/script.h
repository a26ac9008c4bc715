// The operations script: what `apply` and `shell` read. A script is read whole and every line is
// checked before anything runs; running it (script_run.h) meets no mistakes of form any more.
//
// One operation per line; `#` begins a comment; blanks separate words, except inside quotes,
// braces and brackets. `repeat N ... end` runs its lines N times; `$i` stands for the number of the
// innermost repetition, from 1, `$j` and `$k` for those around it.
#pragma once

#include <deque>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "hfs/format.h"
#include "platform/types.h"

namespace VELK::tool {

constexpr u32 kScriptVersion = 1;

// In the order of kScriptOps.
enum class ScriptOp : u8 {
    kUse,
    kInsert,
    kUpdate,
    kDelete,
    kReplace,
    kFind,
    kGet,
    kSeek,
    kNext,
    kPrev,
    kHere,
    kPos,
    kGoto,
    kWalk,
    kReserve,
    kRelease,
    kExtend,
    kFlush,
    kClear,
    kRestore,
    kReopen,
    kCreate,
    kBadblocks,
    kExpect,
    kState,
    kHeader,
    kNode,
    kCheck,
    kStats,
    kDigest,
    kFail,
    kSet,
    kShow,
    kEcho,
    kInclude,
    kRepeat,
    kEnd,
};
constexpr u32 kScriptOpCount = static_cast<u32>(ScriptOp::kEnd) + 1;

struct ScriptOpInfo {
    const char* name;
    u8 leastWords;  // arguments
    u8 mostWords;
    const char* usage;    // "insert KEY DATA"
    const char* summary;  // one line for a person
};
const ScriptOpInfo& InfoOf(ScriptOp op);
// False: no operation has this name.
bool FindScriptOp(std::string_view name, ScriptOp* op);
std::vector<std::string> ScriptOpNames();

struct ScriptLine {
    ScriptOp op;
    bool expands;   // a word holds $i, $j or $k
    u16 wordCount;  // arguments
    u32 firstWord;  // in Script::words
    u32 file;       // in Script::files
    u32 line;       // from 1
    u32 partner;    // repeat: index of its end; end: index of its repeat
};

struct Script {
    std::vector<std::string> files;  // as named, the script itself first
    std::vector<ScriptLine> lines;
    std::vector<std::string_view> words;

    const std::string_view* Words(const ScriptLine& line) const {
        return words.data() + line.firstWord;
    }
    // What the words point into.
    std::vector<std::unique_ptr<std::string>> texts;
    std::deque<std::string> unquoted;
};

// Where and why a script is wrong.
struct ScriptProblem {
    std::string file;
    u32 line = 0;
    std::string what;

    explicit operator bool() const { return !what.empty(); }
    // "split.tr:3: unknown operation 'inser' (did you mean insert?)"
    std::string Text() const { return file + ":" + std::to_string(line) + ": " + what; }
};

struct ScriptContext {
    u32 fileId = kCatalogFileId;  // the tree that keys belong to before the first `use`
    bool canInject = true;        // `fail` is allowed
    u32 firstLine = 1;            // number of the text's first line
    bool inputIsScript = false;   // standard input is the script: no data can come from it
};

// Appends the lines of `text` to `script`. On a problem the script is not to be run. `context`
// leaves with the tree in use at the end.
ScriptProblem ParseScript(const std::string& name, std::string text, ScriptContext* context,
                          Script* script);
// The same for a file; "-" is standard input.
ScriptProblem ReadScript(const std::string& path, ScriptContext* context, Script* script);

// What is wrong with the arguments of one operation; empty: nothing. Words are expanded already.
std::string ArgumentFault(ScriptOp op, const std::string_view* words, u32 count,
                          const ScriptContext& context);

// Replaces $i, $j and $k; `counters` begins with the innermost. False: there is no such repetition.
bool ExpandWord(std::string_view word, const std::vector<u64>& counters, std::string* result);

}  // namespace VELK::tool
