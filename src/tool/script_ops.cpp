// The operations of the language and what their arguments must look like.
#include <array>
#include <iterator>

#include "hfs/records/key_text.h"
#include "hfs/records/record_text.h"
#include "platform/error.h"
#include "tool/errors.h"
#include "tool/script.h"
#include "tool/script_words.h"
#include "tool/tree_name.h"

namespace VELK::tool {
namespace {

constexpr u8 kAny = 255;

constexpr ScriptOpInfo kScriptOps[] = {
    {"use", 1, 1, "use catalog|extents|attributes", "choose the tree"},
    {"insert", 2, 2, "insert KEY DATA", "add a record"},
    {"update", 1, 2, "update [KEY] DATA", "overwrite data of the same size, here or at KEY"},
    {"delete", 0, 1, "delete [KEY]", "remove the record here or at KEY"},
    {"replace", 2, 2, "replace KEY DATA", "delete, then insert"},
    {"find", 1, 1, "find KEY", "go to a key or where it would be"},
    {"get", 1, 1, "get KEY", "show a record"},
    {"seek", 1, 1, "seek KEY|first|last", "go to a record"},
    {"next", 0, 1, "next [N]", "step forward"},
    {"prev", 0, 1, "prev [N]", "step back"},
    {"here", 0, 0, "here", "show the record here"},
    {"pos", 0, 0, "pos", "the number of the position"},
    {"goto", 1, 1, "goto POS", "back to the position of that number"},
    {"walk", 0, 1, "walk [N]", "count and digest the records from here on"},
    {"reserve", 1, 2, "reserve LOW [HIGH]", "reserve nodes for so many changes"},
    {"release", 0, 0, "release", "end the last reservation"},
    {"extend", 1, 2, "extend NODES [BYTES]", "grow the tree file"},
    {"flush", 0, 1, "flush [zero]", "keep all changes; with zero, clear unused nodes"},
    {"clear", 0, 0, "clear", "hand modified nodes to the volume"},
    {"restore", 0, 0, "restore", "back to the last flush"},
    {"reopen", 0, 0, "reopen", "close the tree and open it again"},
    {"create", 1, 2, "create SHIFT [BYTES]", "make the tree, nodes of 2^SHIFT bytes"},
    {"badblocks", 0, 0, "badblocks", "load the list of bad blocks"},
    {"expect", 1, kAny, "expect STATUS [FIELD=VALUE ...]", "test how the last operation ended"},
    {"state", 0, 0, "state", "the tree's counters"},
    {"header", 0, 0, "header", "the tree's constants"},
    {"node", 1, 1, "node N", "one node"},
    {"check", 0, 1, "check [quick]", "check the tree"},
    {"stats", 0, 0, "stats", "nodes, records and fill"},
    {"digest", 0, 0, "digest", "digest of all records"},
    {"fail", 1, 5, "fail read|write|alloc|journal [after N] [times N], fail off",
     "make services fail"},
    {"set", 2, 2, "set trace on|off", "show engine reports and assertions"},
    {"show", 1, 1, "show data|nodata", "data of the records stepped on"},
    {"echo", 0, kAny, "echo TEXT", "print a remark"},
    {"include", 1, 1, "include FILE", "run the lines of another script"},
    {"repeat", 1, 1, "repeat N ... end", "run lines N times"},
    {"end", 0, 0, "end", "end of repeat"},
};
static_assert(std::size(kScriptOps) == kScriptOpCount);

std::string Quoted(std::string_view text) {
    return "'" + std::string(text) + "'";
}

std::string OneOf(std::string_view word, const std::vector<std::string>& words) {
    std::string list;
    for (std::size_t i = 0; i < words.size(); ++i) {
        if (word == words[i]) {
            return {};
        }
        list += (i == 0 ? "" : i + 1 == words.size() ? " or " : ", ") + words[i];
    }
    return "expected " + list + ", not " + Quoted(word) + DidYouMean(std::string(word), words);
}

std::string NumberFault(std::string_view word, u64 least, u64 most) {
    u64 number = 0;
    if (ParseNumber(word, most, &number) && number >= least) {
        return {};
    }
    return Quoted(word) + " is no number from " + std::to_string(least) + " to " +
           std::to_string(most);
}

std::string KeyFault(std::string_view word, u32 fileId) {
    u32 id = 0;
    if (fileId == kCatalogFileId && ParseIdKey(word, &id)) {
        return {};
    }
    SearchKey key;
    Problem problem = ParseKey(word, fileId, &key);
    if (problem && problem.advice.starts_with("add -t ")) {
        problem.advice = "use " + problem.advice.substr(7) + " first";
    }
    return problem ? problem.Text() : std::string();
}

std::string DataFault(std::string_view word, bool mayBeSame, const ScriptContext& context) {
    if (word == "@-" && context.inputIsScript) {
        return "data '@-': standard input is the script";
    }
    if (word == "@-") {
        return {};
    }
    RecordData data;
    const Problem problem = ParseData(word, context.fileId, &data);
    if (problem) {
        return problem.Text();
    }
    return data.isSame && !mayBeSame ? "'same' is for update and replace" : std::string();
}

std::string FailFault(const std::string_view* words, u32 count, const ScriptContext& context) {
    std::string fault = OneOf(words[0], {"read", "write", "alloc", "journal", "off"});
    if (fault.empty() && !context.canInject) {
        return "failures are for volumes whose changes stay in memory";
    }
    for (u32 i = 1; i < count && fault.empty(); i += 2) {
        fault = OneOf(words[i], {"after", "times"});
        if (fault.empty()) {
            fault = i + 1 < count ? NumberFault(words[i + 1], 0, kMostScriptNumber)
                                  : Quoted(words[i]) + " needs a number";
        }
    }
    return fault;
}

std::string ExpectFault(const std::string_view* words, u32 count) {
    int status = 0;
    if (!ParseStatus(words[0], &status)) {
        return "unknown status " + Quoted(words[0]) +
               DidYouMean(std::string(words[0]), StatusNames());
    }
    for (u32 i = 1; i < count; ++i) {
        const std::size_t equal = words[i].find('=');
        if (equal == std::string_view::npos || equal == 0) {
            return "expected FIELD=VALUE, not " + Quoted(words[i]);
        }
    }
    return {};
}

// Operations whose arguments are numbers or fixed words.
std::string PlainFault(ScriptOp op, const std::string_view* words, u32 count) {
    switch (op) {
        case ScriptOp::kUse:
            return OneOf(words[0], {"catalog", "extents", "attributes"});
        case ScriptOp::kNext:
        case ScriptOp::kPrev:
            return count == 0 ? "" : NumberFault(words[0], 0, kMostScriptSteps);
        case ScriptOp::kWalk:
            return count == 0 ? "" : NumberFault(words[0], 0, kMostScriptNumber);
        case ScriptOp::kGoto:
            return NumberFault(words[0], 0, kMostScriptNumber);
        case ScriptOp::kReserve: {
            const std::string fault = NumberFault(words[0], 0, 0xFFFF);
            return count == 2 && fault.empty() ? NumberFault(words[1], 0, 0xFFFF) : fault;
        }
        case ScriptOp::kExtend:
        case ScriptOp::kCreate: {
            const u64 most = op == ScriptOp::kExtend ? 0xFFFFFFFF : 255;
            const std::string fault = NumberFault(words[0], 0, most);
            return count == 2 && fault.empty() ? NumberFault(words[1], 0, kMostScriptNumber)
                                               : fault;
        }
        case ScriptOp::kFlush:
            return count == 0 ? "" : OneOf(words[0], {"zero"});
        case ScriptOp::kCheck:
            return count == 0 ? "" : OneOf(words[0], {"quick"});
        case ScriptOp::kNode:
            return NumberFault(words[0], 0, 0xFFFFFFFF);
        case ScriptOp::kShow:
            return OneOf(words[0], {"data", "nodata"});
        case ScriptOp::kSet: {
            const std::string fault = OneOf(words[0], {"trace"});
            return fault.empty() ? OneOf(words[1], {"on", "off"}) : fault;
        }
        case ScriptOp::kRepeat:
            return NumberFault(words[0], 0, kMostScriptNumber);
        default:
            return {};
    }
}

}  // namespace

const ScriptOpInfo& InfoOf(ScriptOp op) {
    return kScriptOps[static_cast<u32>(op)];
}

bool FindScriptOp(std::string_view name, ScriptOp* op) {
    for (u32 i = 0; i < kScriptOpCount; ++i) {
        if (name == kScriptOps[i].name) {
            *op = static_cast<ScriptOp>(i);
            return true;
        }
    }
    return false;
}

std::vector<std::string> ScriptOpNames() {
    std::vector<std::string> names;
    for (const ScriptOpInfo& info : kScriptOps) {
        names.push_back(info.name);
    }
    return names;
}

std::string ArgumentFault(ScriptOp op, const std::string_view* words, u32 count,
                          const ScriptContext& context) {
    const ScriptOpInfo& info = InfoOf(op);
    if (count < info.leastWords || (info.mostWords != kAny && count > info.mostWords)) {
        return std::string(info.name) + ": expected " + info.usage;
    }
    std::string fault;
    switch (op) {
        case ScriptOp::kInsert:
        case ScriptOp::kReplace:
        case ScriptOp::kUpdate: {
            const bool hasKey = count == 2;
            fault = hasKey ? KeyFault(words[0], context.fileId) : "";
            return fault.empty() ? DataFault(words[count - 1], op != ScriptOp::kInsert, context)
                                 : fault;
        }
        case ScriptOp::kDelete:
            return count == 0 ? "" : KeyFault(words[0], context.fileId);
        case ScriptOp::kSeek:
            return words[0] == "first" || words[0] == "last" ? ""
                                                             : KeyFault(words[0], context.fileId);
        case ScriptOp::kFind:
        case ScriptOp::kGet:
            return KeyFault(words[0], context.fileId);
        case ScriptOp::kExpect:
            return ExpectFault(words, count);
        case ScriptOp::kFail:
            return FailFault(words, count, context);
        default:
            fault = PlainFault(op, words, count);
            return fault.empty() ? fault : std::string(info.name) + ": " + fault;
    }
}

}  // namespace VELK::tool
