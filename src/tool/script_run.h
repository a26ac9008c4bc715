// Runs a script against a mounted volume: each operation is one call (or two) of the engine's
// public operations and prints one line, `LINE OPERATION STATUS NAME fields`.
//
// A changing operation that failed half-way takes the volume back to the last flush; its line then
// ends with `restored=yes`.
#pragma once

#include <deque>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "hfs/records/key_text.h"
#include "hfs/records/record_text.h"
#include "hfs/volume/image_volume.h"
#include "tool/engine_log.h"
#include "tool/errors.h"
#include "tool/fault_shim.h"
#include "tool/node_reader.h"
#include "tool/output.h"
#include "tool/record_digest.h"
#include "tool/script.h"

namespace VELK::tool {

struct ScriptRunOptions {
    bool showState = false;  // the tree's counters at the end of every line
    bool trace = false;      // reports and assertions beneath each line
    bool strict = false;     // stop at the first status that is not ok
    bool json = false;
    std::vector<int> stopOn;
};

class ScriptRunner {
public:
    // Remarks for a person go to `remark`, a line at a time.
    ScriptRunner(ImageVolume* volume, const ScriptRunOptions& options, Output* out,
                 std::function<void(const std::string&)> remark);

    // Runs every line; false when it stopped before the end.
    bool Run(const Script& script);

    // The last line: "split.tr: 8 operations, 7 ok, 1 exists (expected), 0 unexpected".
    void PrintSummary(const std::string& name);
    // 8 when changes were lost that no line had asked to keep yet, else 1 when an `expect` failed
    // or the run was stopped by a status, else 0.
    int ExitCode() const {
        return hasLost_ ? kExitFailed : failedExpects_ != 0 || wasStopped_ ? kExitNo : kExitDone;
    }
    u32 FileId() const { return fileId_; }
    // Ends what the script left open, so that the volume can be committed.
    void EndReservations();

private:
    struct Outcome {
        int status = kOk;
        std::string fields;  // each " name=value"
    };
    struct Held {
        u32 fileId;
        BTReserve reserve;
    };

    // script_run.cpp
    bool RunLine(const Script& script, const ScriptLine& line);
    Outcome Execute(ScriptOp op, const std::string_view* words, u32 count);
    Outcome ExecuteOnTree(ScriptOp op, const std::string_view* words, u32 count);
    bool Control(ScriptOp op, const std::string_view* words, u32 count);
    void Expect(const ScriptLine& line, const std::string_view* words, u32 count);
    void Print(const ScriptLine& line, const std::string& file, int status, const char* name,
               const std::string& fields);
    void Tally(int status);
    bool StopsAt(int status) const;
    void Remark(const std::string& text);

    // The tree in use, opened when it is not yet; null where that fails.
    CBTreeHfs* Tree(Problem* problem = nullptr);
    // What an operation says that finds no tree to work on.
    Outcome NoTree(const Problem& problem);
    std::string StateFields(CBTreeHfs* tree) const;
    // After a changing operation: takes the volume back if `status` says so.
    void Settle(Outcome* outcome);
    void NoteRestored(Outcome* outcome) const;
    // Commits; on failure the volume is back at the last commit.
    Outcome KeepAll(unsigned long mode);
    int TakeKey(std::string_view word, SearchKey* key);

    // script_change.cpp
    Outcome Insert(const std::string_view* words);
    Outcome Update(const std::string_view* words, u32 count);
    Outcome Delete(const std::string_view* words, u32 count);
    Outcome Replace(const std::string_view* words);
    Outcome InsertRecord(CBTreeHfs* tree, const SearchKey& key, const std::vector<u8>& stored);
    int TakeData(CBTreeHfs* tree, std::string_view word, const SearchKey* key,
                 std::vector<u8>* stored);
    void ExplainInsert(CBTreeHfs* tree, int status, u32 size);

    // script_read.cpp
    Outcome Find(const std::string_view* words);
    Outcome Get(const std::string_view* words);
    Outcome Seek(const std::string_view* words);
    Outcome Step(s64 count);
    Outcome Position();
    Outcome Goto(const std::string_view* words);
    Outcome Walk(const std::string_view* words, u32 count);
    int Deliver(CBTreeHfs* tree, int count, HfsFindData* path);
    void RecordFields(CBTreeHfs* tree, Outcome* outcome, bool withPosition);

    // script_tree.cpp
    Outcome Use(const std::string_view* words);
    Outcome Reserve(const std::string_view* words, u32 count);
    Outcome Release();
    Outcome Extend(const std::string_view* words, u32 count);
    Outcome Flush(u32 count);
    Outcome Clear();
    Outcome Restore();
    Outcome Reopen();
    Outcome Create(const std::string_view* words, u32 count);
    Outcome BadBlocks();
    Outcome Fail(const std::string_view* words, u32 count);

    // script_look.cpp
    Outcome State();
    Outcome Header();
    Outcome Node(const std::string_view* words);
    Outcome Check(u32 count);
    Outcome Stats();
    Outcome Digest();

    ImageVolume* volume_;
    ScriptRunOptions options_;
    Output* out_;
    std::function<void(const std::string&)> remark_;
    EngineLog log_;
    FaultShim shim_;

    u32 fileId_ = kCatalogFileId;
    bool showData_ = false;
    std::vector<u64> counters_;  // of the repetitions, innermost first
    std::deque<Held> held_;
    const ScriptLine* line_ = nullptr;  // the one that runs
    bool isExpected_ = false;           // the next line says how this one ends

    Outcome last_;  // of the operation that `expect` is about
    bool hasLast_ = false;
    bool lastCounted_ = false;  // as expected

    struct Count {
        u64 all = 0;
        u64 expected = 0;
    };
    std::map<int, Count> counts_;
    std::vector<int> order_;  // statuses as they first came up
    u64 operations_ = 0;
    u64 failedExpects_ = 0;
    u64 remarks_ = 0;
    bool wasStopped_ = false;
    bool hasLost_ = false;  // a commit between the lines failed

    std::vector<u8> record_;  // the delivered one, host order
    u32 recordSize_ = 0;
    alignas(8) u8 key_[kKeyLengthSize + kMaxKeyLength + 6] = {};  // the delivered one
    u32 keySize_ = 0;
};

// A tree file as it stands in memory, changes that no flush has seen included: what a checker
// reads. 0, or the status of a failed read.
int FlatTree(ImageVolume* volume, CBTreeHfs* tree, std::vector<u8>* bytes);

// Digests the records along the chain of leaves; no path is moved. A script that counts what its
// operations find in the cache has the nodes kept. 0 or the status that ended it.
int DigestTree(CBTreeHfs* tree, RecordDigest* digest,
               HeldNode::AfterUse afterUse = HeldNode::AfterUse::kDrop);

}  // namespace VELK::tool
