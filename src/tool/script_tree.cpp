// Operations of scripts on a whole tree: growing, reserving, keeping and dropping changes.
#include <fmt/format.h>

#include "tool/command.h"
#include "tool/script_run.h"
#include "tool/script_volume.h"
#include "tool/script_words.h"

namespace VELK::tool {

ScriptRunner::Outcome ScriptRunner::Use(const std::string_view* words) {
    fileId_ = TreeIdFromText(std::string(words[0]));
    const std::string fields = " tree=" + std::string(words[0]);
    if (!volume_->HasTree(fileId_)) {
        return {kOk, fields + " absent=yes"};
    }
    Problem problem;
    return {Tree(&problem) == nullptr ? NoTree(problem).status : kOk, fields};
}

ScriptRunner::Outcome ScriptRunner::Reserve(const std::string_view* words, u32 count) {
    u64 low = 0;
    u64 high = 0;
    ParseNumber(words[0], 0xFFFF, &low);
    if (count == 2) {
        ParseNumber(words[1], 0xFFFF, &high);
    }
    Held held{fileId_, {}};
    const u32 request = static_cast<u32>(high << 16 | low);
    Outcome outcome;
    outcome.status = Tree()->ReserveSpace(static_cast<int>(request), &held.reserve);
    if (outcome.status == kOk) {
        outcome.fields = fmt::format(" owner={} nodes={}", held.reserve.owner ? "yes" : "no",
                                     held.reserve.nodes);
        held_.push_back(held);
    }
    Settle(&outcome);
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Release() {
    for (std::size_t i = held_.size(); i-- > 0;) {
        if (held_[i].fileId == fileId_) {
            const u32 nodes = held_[i].reserve.nodes;
            Tree()->ReleaseSpace(&held_[i].reserve);
            held_.erase(held_.begin() + static_cast<std::ptrdiff_t>(i));
            return {kOk, fmt::format(" nodes={}", nodes)};
        }
    }
    return {kErrInvalid, " held=none"};
}

ScriptRunner::Outcome ScriptRunner::Extend(const std::string_view* words, u32 count) {
    CBTreeHfs* tree = Tree();
    u64 nodes = 0;
    u64 size = 0;
    ParseNumber(words[0], 0xFFFFFFFF, &nodes);
    if (count == 2) {
        ParseNumber(words[1], kMostScriptNumber, &size);
    }
    const unsigned long long bytes = size;
    Outcome outcome;
    outcome.status =
        tree->ExtendBTree(static_cast<u32>(nodes), count == 2 ? &bytes : nullptr, nullptr);
    Settle(&outcome);
    outcome.fields = fmt::format(" total={} free={}{}", tree->header.totalNodes,
                                 tree->header.freeNodes, outcome.fields);
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::KeepAll(unsigned long mode) {
    Outcome outcome;
    outcome.status = volume_->Commit(mode);
    if (outcome.status != kOk) {
        // The commit has restored already; what was reserved went with it.
        held_.clear();
        NoteRestored(&outcome);
        Remark("the changes could not be kept: " + CommitProblem(volume_, outcome.status).Text());
    }
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Flush(u32 count) {
    const u64 before = volume_->HandedOverBlocks();
    Outcome outcome = KeepAll(count != 0 ? 4 : 0);
    outcome.fields =
        fmt::format(" written={}", volume_->HandedOverBlocks() - before) + outcome.fields;
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Clear() {
    const u64 before = volume_->HandedOverBlocks();
    Outcome outcome;
    outcome.status = Tree()->Clear();
    outcome.fields = fmt::format(" written={}", volume_->HandedOverBlocks() - before);
    Settle(&outcome);
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Restore() {
    EndReservations();
    volume_->Restore();
    return {kOk, volume_->IsWritable() ? "" : " readonly=yes"};
}

// Closing a tree drops what no flush has kept; the volume goes back with it, or its forks would
// have grown for a tree that knows nothing of it.
ScriptRunner::Outcome ScriptRunner::Reopen() {
    CBTreeHfs* tree = Tree();
    EndReservations();
    Outcome outcome;
    if (tree->IsDirty() || !tree->modifiedList.IsEmpty()) {
        volume_->Restore();
        outcome.fields = " dropped=yes";
        tree = Tree();
        if (tree == nullptr) {
            return {kOk, " dropped=yes absent=yes"};
        }
    }
    tree->Dtor();
    outcome.status = tree->Init();
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Create(const std::string_view* words, u32 count) {
    u64 shift = 0;
    u64 size = 0;
    ParseNumber(words[0], 255, &shift);
    if (count == 2) {
        ParseNumber(words[1], kMostScriptNumber, &size);
    }
    Outcome outcome;
    outcome.status =
        volume_->CreateTree(fileId_, static_cast<u32>(shift), count == 2 ? &size : nullptr);
    if (outcome.status == kOk) {
        const BTHeaderMem& header = Tree()->header;
        outcome.fields = fmt::format(" total={} free={}", header.totalNodes, header.freeNodes);
    }
    Settle(&outcome);
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::BadBlocks() {
    CBTreeHfs* tree = volume_->Tree(kExtentsFileId, nullptr);
    if (tree == nullptr) {
        return {kErrInvalid, " absent=yes"};
    }
    HfsRuns runs;
    Outcome outcome;
    outcome.status = tree->LoadBadBlocks(&runs);
    u32 count = 0;
    u64 blocks = 0;
    for (u32 i = 0; i < runs.Count(); ++i) {
        // The list begins with a hole as long as the volume, which the runs then fill.
        if (runs.At(i).lcn != HfsRuns::kHole) {
            ++count;
            blocks += runs.At(i).length;
        }
    }
    outcome.fields = fmt::format(" runs={} blocks={}", count, blocks);
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Fail(const std::string_view* words, u32 count) {
    if (words[0] == "off") {
        shim_.Disarm();
        return {kOk, " fail=off"};
    }
    const Fault fault = words[0] == "read"    ? Fault::kRead
                        : words[0] == "write" ? Fault::kWrite
                        : words[0] == "alloc" ? Fault::kAlloc
                                              : Fault::kJournal;
    u64 after = 0;
    u64 times = 1;
    for (u32 i = 1; i + 1 < count; i += 2) {
        ParseNumber(words[i + 1], kMostScriptNumber, words[i] == "after" ? &after : &times);
    }
    shim_.Arm(fault, after, times);
    return {kOk, fmt::format(" fail={} after={} times={}", words[0], after, times)};
}

}  // namespace VELK::tool
