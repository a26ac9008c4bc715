// Running scripts: repetitions, dispatch, one line per operation, expectations and the summary.
#include "tool/script_run.h"

#include <algorithm>

#include "hfs/records/json_writer.h"
#include "hfs/records/key_layout.h"
#include "hfs/records/record_fields.h"
#include "hfs/records/thread_view.h"
#include "hfs/treehfs/bytes.h"
#include "tool/command.h"
#include "tool/errors.h"
#include "tool/kept_positions.h"
#include "tool/progress.h"
#include "tool/script_words.h"

namespace VELK::tool {
namespace {

constexpr std::size_t kRecordRoom = 65536;  // more than any node holds
constexpr u64 kMostRemarks = 20;
constexpr u32 kTrimStride = 64;

// The value of " name=value" in fields; false: there is no such field.
bool FindField(const std::string& fields, std::string_view name, std::string_view* value) {
    const std::string_view all = fields;
    for (std::size_t at = 0; at < all.size();) {
        const std::size_t start = at + 1;
        const std::size_t end = std::min(all.find(' ', start), all.size());
        const std::string_view field = all.substr(start, end - start);
        if (field.size() > name.size() && field.starts_with(name) && field[name.size()] == '=') {
            *value = field.substr(name.size() + 1);
            return true;
        }
        at = end;
    }
    return false;
}

bool ChangesTree(ScriptOp op) {
    switch (op) {
        case ScriptOp::kInsert:
        case ScriptOp::kUpdate:
        case ScriptOp::kDelete:
        case ScriptOp::kReplace:
        case ScriptOp::kReserve:
        case ScriptOp::kExtend:
        case ScriptOp::kFlush:
        case ScriptOp::kClear:
        case ScriptOp::kCreate:
            return true;
        default:
            return false;
    }
}

// Whether such an operation may need more of the journal than the commits it asks for itself.
bool NeedsRoom(ScriptOp op) {
    return ChangesTree(op) && op != ScriptOp::kFlush && op != ScriptOp::kClear;
}

// The key of the item that a stored thread record names.
bool KeyOfThread(const std::vector<u8>& stored, SearchKey* key) {
    const ThreadView thread(stored.data(), static_cast<u32>(stored.size()));
    if (!thread.IsValid() || thread.NameLength() > kCatalogKeys.longestName) {
        return false;
    }
    *key = CatalogSearchKey(thread.Parent(), UnitsFromStored(thread.Name(), thread.NameLength()));
    return true;
}

void FieldsToJson(const std::string& fields, JsonWriter* json) {
    const std::string_view all = fields;
    for (std::size_t at = 0; at < all.size();) {
        const std::size_t start = at + 1;
        const std::size_t end = std::min(all.find(' ', start), all.size());
        const std::string_view field = all.substr(start, end - start);
        const std::size_t equal = field.find('=');
        if (equal != std::string_view::npos) {
            json->Member(field.substr(0, equal), field.substr(equal + 1));
        }
        at = end;
    }
}

}  // namespace

ScriptRunner::ScriptRunner(ImageVolume* volume, const ScriptRunOptions& options, Output* out,
                           std::function<void(const std::string&)> remark)
    : volume_(volume),
      options_(options),
      out_(out),
      remark_(std::move(remark)),
      shim_(volume->Fs()),
      record_(kRecordRoom) {
    log_.Keep(options.trace);
}

CBTreeHfs* ScriptRunner::Tree(Problem* problem) {
    CBTreeHfs* tree = volume_->OpenTree(fileId_);
    return tree != nullptr ? tree : volume_->Tree(fileId_, problem);
}

ScriptRunner::Outcome ScriptRunner::NoTree(const Problem& problem) {
    if (!volume_->HasTree(fileId_)) {
        return {kErrInvalid, " absent=yes"};
    }
    Remark(problem.Text());
    return {problem.status != kOk ? problem.status : kErrCorrupt, ""};
}

std::string ScriptRunner::StateFields(CBTreeHfs* tree) const {
    if (tree == nullptr) {
        return " absent=yes";
    }
    const BTHeaderMem& header = tree->header;
    return fmt::format(" depth={} records={} root={} first={} last={} total={} free={} dirty={}",
                       header.treeDepth, header.leafRecords, header.rootNode, header.firstLeafNode,
                       header.lastLeafNode, header.totalNodes, header.freeNodes,
                       tree->IsDirty() ? "yes" : "no");
}

void ScriptRunner::Remark(const std::string& text) {
    // What the next line expects needs no explanation.
    if (!isExpected_ && remarks_++ < kMostRemarks) {
        remark_("line " + std::to_string(line_->line) + ": " + InfoOf(line_->op).name + ": " +
                text);
    }
}

void ScriptRunner::EndReservations() {
    for (Held& held : held_) {
        if (CBTreeHfs* tree = volume_->OpenTree(held.fileId)) {
            tree->ReleaseSpace(&held.reserve);
        }
    }
    held_.clear();
}

void ScriptRunner::Settle(Outcome* outcome) {
    const int status = outcome->status;
    if (status == kOk || status == kErrNotFound || status == kErrExists || status == kErrTooLarge) {
        return;
    }
    EndReservations();
    if (volume_->RestoreAfter(status)) {
        NoteRestored(outcome);
    }
}

// A restore that fails leaves a volume that takes no more changes.
void ScriptRunner::NoteRestored(Outcome* outcome) const {
    outcome->fields += volume_->IsWritable() ? " restored=yes" : " readonly=yes";
}

// Reads a key; `id:N` stands for the one its thread names. 0 or the status of that lookup.
int ScriptRunner::TakeKey(std::string_view word, SearchKey* key) {
    u32 id = 0;
    if (fileId_ != kCatalogFileId || !ParseIdKey(word, &id)) {
        // Checked before the run, so it can only be the key of another tree that a repetition
        // has meanwhile left.
        return ParseKey(word, fileId_, key) ? kErrInvalid : kOk;
    }
    CBTreeHfs* tree = Tree();
    *key = LowestKey(kCatalogFileId, id);
    HfsFindData path;
    unsigned size = 0;
    const int status = tree->FindRecord(key->Key(), key->id, record_.data(),
                                        static_cast<unsigned>(record_.size()), &size, &path);
    path.ClearPath();
    if (status != kOk) {
        return status;
    }
    std::vector<u8> stored(size);
    tree->convert.DataToDisk(stored.data(), record_.data(), size);
    return KeyOfThread(stored, key) ? kOk : kErrNotFound;
}

ScriptRunner::Outcome ScriptRunner::Execute(ScriptOp op, const std::string_view* words, u32 count) {
    if (ChangesTree(op) && !volume_->IsWritable()) {
        return {kErrVolumeReadOnly, " readonly=yes"};
    }
    if (NeedsRoom(op) && volume_->IsCommitDue()) {
        const KeptPositions positions(volume_);
        Outcome kept = KeepAll(0);
        hasLost_ = hasLost_ || kept.status != kOk;
        if (kept.status == kOk) {
            kept.status = positions.PutBack();
        }
        if (kept.status != kOk) {
            return kept;
        }
    }
    switch (op) {
        case ScriptOp::kUse:
            return Use(words);
        case ScriptOp::kCreate:
            return Create(words, count);
        case ScriptOp::kBadblocks:
            return BadBlocks();
        case ScriptOp::kRestore:
            return Restore();
        case ScriptOp::kFlush:
            return Flush(count);
        case ScriptOp::kFail:
            return Fail(words, count);
        case ScriptOp::kState:
            return State();
        default:
            break;
    }
    Problem problem;
    return Tree(&problem) == nullptr ? NoTree(problem) : ExecuteOnTree(op, words, count);
}

// REQUIRES: the tree in use is there and open.
ScriptRunner::Outcome ScriptRunner::ExecuteOnTree(ScriptOp op, const std::string_view* words,
                                                  u32 count) {
    switch (op) {
        case ScriptOp::kInsert:
            return Insert(words);
        case ScriptOp::kUpdate:
            return Update(words, count);
        case ScriptOp::kDelete:
            return Delete(words, count);
        case ScriptOp::kReplace:
            return Replace(words);
        case ScriptOp::kFind:
            return Find(words);
        case ScriptOp::kGet:
            return Get(words);
        case ScriptOp::kSeek:
            return Seek(words);
        case ScriptOp::kNext:
        case ScriptOp::kPrev: {
            u64 steps = 1;
            if (count != 0) {
                ParseNumber(words[0], kMostScriptSteps, &steps);
            }
            return Step(op == ScriptOp::kNext ? static_cast<s64>(steps) : -static_cast<s64>(steps));
        }
        case ScriptOp::kHere:
            return Step(0);
        case ScriptOp::kPos:
            return Position();
        case ScriptOp::kGoto:
            return Goto(words);
        case ScriptOp::kWalk:
            return Walk(words, count);
        case ScriptOp::kReserve:
            return Reserve(words, count);
        case ScriptOp::kRelease:
            return Release();
        case ScriptOp::kExtend:
            return Extend(words, count);
        case ScriptOp::kClear:
            return Clear();
        case ScriptOp::kReopen:
            return Reopen();
        case ScriptOp::kHeader:
            return Header();
        case ScriptOp::kNode:
            return Node(words);
        case ScriptOp::kCheck:
            return Check(count);
        case ScriptOp::kStats:
            return Stats();
        default:
            return Digest();
    }
}

// Script control: nothing of the engine is called and no line is printed.
bool ScriptRunner::Control(ScriptOp op, const std::string_view* words, u32 count) {
    switch (op) {
        case ScriptOp::kSet:
            log_.Keep(words[1] == "on");
            return true;
        case ScriptOp::kShow:
            showData_ = words[0] == "data";
            return true;
        case ScriptOp::kEcho: {
            std::string text = "#";
            for (u32 i = 0; i < count; ++i) {
                std::string word;
                text += ' ';
                text += ExpandWord(words[i], counters_, &word) ? std::string_view(word) : words[i];
            }
            if (options_.json) {
                std::string line;
                JsonWriter json(&line);
                json.BeginObject();
                json.Member("echo",
                            std::string_view(text).substr(std::min<std::size_t>(2, text.size())));
                json.EndObject();
                text = line;
            }
            out_->Print("{}\n", text);
            return true;
        }
        default:
            return false;
    }
}

void ScriptRunner::Print(const ScriptLine& line, const std::string& file, int status,
                         const char* name, const std::string& fields) {
    const char* op = InfoOf(line.op).name;
    const std::string state = options_.showState && line.op != ScriptOp::kState
                                  ? StateFields(volume_->OpenTree(fileId_))
                                  : std::string();
    const std::vector<std::string> log =
        log_.IsKeeping() ? log_.Take(status) : std::vector<std::string>();
    if (options_.json) {
        std::string text;
        JsonWriter json(&text);
        json.BeginObject();
        if (line.file != 0) {
            json.Member("file", file);
        }
        json.Member("line", line.line);
        json.Member("op", op);
        json.Member("status", fmt::format("{:08X}", static_cast<u32>(status)));
        json.Member("name", name);
        json.Key("fields");
        json.BeginObject();
        FieldsToJson(fields + state, &json);
        json.EndObject();
        if (log_.IsKeeping()) {
            json.Key("trace");
            json.BeginArray();
            for (const std::string& entry : log) {
                json.Value(std::string_view(entry).substr(2));
            }
            json.EndArray();
        }
        json.EndObject();
        out_->Print("{}\n", text);
        return;
    }
    if (line.file != 0) {
        out_->Print("{}:", file);
    }
    out_->Print("{} {:<6} {:08X} {}{}{}\n", line.line, op, static_cast<u32>(status), name, fields,
                state);
    for (const std::string& entry : log) {
        out_->Print("  {}\n", entry);
    }
}

void ScriptRunner::Tally(int status) {
    const auto [entry, isNew] = counts_.try_emplace(status);
    if (isNew && status != kOk) {
        order_.push_back(status);
    }
    ++entry->second.all;
    ++operations_;
}

bool ScriptRunner::StopsAt(int status) const {
    return (options_.strict && status != kOk) ||
           std::find(options_.stopOn.begin(), options_.stopOn.end(), status) !=
               options_.stopOn.end();
}

void ScriptRunner::Expect(const ScriptLine& line, const std::string_view* words, u32 count) {
    int wanted = kOk;
    ParseStatus(words[0], &wanted);
    std::string fault;
    if (!hasLast_) {
        fault = " want=operation have=none";
    } else if (last_.status != wanted) {
        fault = fmt::format(
            " want={} have={}", words[0],
            last_.status == kOk || StatusName(last_.status) != std::string_view("status")
                ? std::string(StatusName(last_.status))
                : fmt::format("{:08X}", static_cast<u32>(last_.status)));
    }
    for (u32 i = 1; i < count; ++i) {
        const std::size_t equal = words[i].find('=');
        std::string_view value;
        const bool isThere = FindField(last_.fields, words[i].substr(0, equal), &value);
        if (!isThere || value != words[i].substr(equal + 1)) {
            fault += fmt::format(" want={} have={}", words[i],
                                 isThere ? value : std::string_view("none"));
        }
    }
    if (fault.empty() && hasLast_ && last_.status != kOk && !lastCounted_) {
        ++counts_[last_.status].expected;
        lastCounted_ = true;
    }
    failedExpects_ += fault.empty() ? 0u : 1u;
    ++operations_;
    counts_[kOk].all += fault.empty() ? 1u : 0u;
    Print(line, {}, fault.empty() ? kOk : 1, fault.empty() ? "ok" : "failed", fault);
}

// Runs one operation; false when the script stops there.
bool ScriptRunner::RunLine(const Script& script, const ScriptLine& line) {
    const std::string_view* words = script.Words(line);
    std::vector<std::string> texts;
    std::vector<std::string_view> expanded;
    if (line.expands) {
        texts.resize(line.wordCount);
        for (u32 i = 0; i < line.wordCount; ++i) {
            ExpandWord(words[i], counters_, &texts[i]);
        }
        expanded.assign(texts.begin(), texts.end());
        words = expanded.data();
    }
    if (Control(line.op, words, line.wordCount)) {
        return true;
    }
    if (line.op == ScriptOp::kExpect) {
        Expect(line, words, line.wordCount);
        return failedExpects_ == 0 || !options_.strict;
    }
    line_ = &line;
    const std::size_t next = static_cast<std::size_t>(&line - script.lines.data()) + 1;
    isExpected_ = next < script.lines.size() && script.lines[next].op == ScriptOp::kExpect;
    last_ = Execute(line.op, words, line.wordCount);
    hasLast_ = true;
    lastCounted_ = false;
    Tally(last_.status);
    Print(line, script.files[line.file], last_.status, StatusName(last_.status), last_.fields);
    if (operations_ % kTrimStride == 0) {
        volume_->TrimCache();
        ThrowIfInterrupted();
    }
    // A status that the next line asks for is no reason to stop.
    if (StopsAt(last_.status) && !isExpected_) {
        wasStopped_ = true;
        return false;
    }
    return true;
}

bool ScriptRunner::Run(const Script& script) {
    std::vector<u64> limits;
    counters_.clear();  // an interrupted run has left its own
    for (u32 i = 0; i < script.lines.size(); ++i) {
        const ScriptLine& line = script.lines[i];
        if (line.op == ScriptOp::kRepeat) {
            std::string word;
            u64 limit = 0;
            ExpandWord(script.Words(line)[0], counters_, &word);
            ParseNumber(word, kMostScriptNumber, &limit);
            if (limit == 0) {
                i = line.partner;
                continue;
            }
            limits.push_back(limit);
            counters_.insert(counters_.begin(), 1);
        } else if (line.op == ScriptOp::kEnd) {
            if (++counters_.front() <= limits.back()) {
                i = line.partner;
                ThrowIfInterrupted();
            } else {
                limits.pop_back();
                counters_.erase(counters_.begin());
            }
        } else if (!RunLine(script, line)) {
            return false;
        }
    }
    return true;
}

void ScriptRunner::PrintSummary(const std::string& name) {
    u64 unexpected = failedExpects_;
    std::string statuses;
    for (const int status : order_) {
        const Count& count = counts_[status];
        unexpected += count.all - count.expected;
        statuses += fmt::format(", {} {}", count.all,
                                StatusName(status) == std::string_view("status")
                                    ? fmt::format("{:08X}", static_cast<u32>(status))
                                    : std::string(StatusName(status)));
        if (count.expected == count.all) {
            statuses += " (expected)";
        } else if (count.expected != 0) {
            statuses += fmt::format(" ({} expected)", count.expected);
        }
    }
    if (failedExpects_ != 0) {
        statuses += fmt::format(", {} failed", failedExpects_);
    }
    if (options_.json) {
        std::string text;
        JsonWriter json(&text);
        json.BeginObject();
        json.Member("script", name);
        json.Member("operations", operations_);
        json.Member("ok", counts_[kOk].all);
        json.Key("statuses");
        json.BeginObject();
        for (const int status : order_) {
            json.Member(fmt::format("{:08X}", static_cast<u32>(status)), counts_[status].all);
        }
        json.EndObject();
        json.Member("unexpected", unexpected);
        json.Member("stopped", wasStopped_);
        json.EndObject();
        out_->Print("{}\n", text);
        return;
    }
    out_->Print("{}: {} {}, {} ok{}, {} unexpected{}\n", name, operations_,
                operations_ == 1 ? "operation" : "operations", counts_[kOk].all, statuses,
                unexpected, wasStopped_ ? ", stopped" : "");
}

}  // namespace VELK::tool
