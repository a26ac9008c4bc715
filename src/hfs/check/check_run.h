// State of one run: which invariants are wanted, where findings go, how many there were, and every
// read of the source. All parts of the checker report through it.
#pragma once

#include <initializer_list>
#include <string>

#include "hfs/check/check.h"

namespace VELK {

// Where a finding belongs. `offset` is a byte of the source, kCheckNoOffset: none.
struct CheckPlace {
    u32 tree = 0;
    s64 node = -1;
    s32 record = -1;
    u64 offset = kCheckNoOffset;
    std::string part = {};  // "header", "map bit 19", if node and record do not say it
};

// printf into a string.
#if defined(__GNUC__)
__attribute__((format(printf, 1, 2)))
#endif
std::string
CheckPrint(const char* format, ...);

// "1 block", "7 blocks".
std::string CheckCounted(u64 count, const char* one, const char* many);

// "block 7", "blocks 7..9".
std::string CheckBlocksText(u32 start, u32 count);

// "catalog", "extents", "attributes", "allocation", "startup", "bad-block", "volume" (0).
const char* CheckFileName(u32 fileId);

class CheckRun {
public:
    CheckRun(const CheckSource& source, const CheckOptions& options, const CheckSink& sink);

    const CheckSource& Source() const { return source_; }
    const CheckOptions& Options() const { return options_; }
    bool IsFull() const { return scope_ == CheckScope::kFull; }
    bool IsQuick() const { return scope_ == CheckScope::kQuick; }

    // Whether findings of `id` would be told; a costly look may be left out otherwise.
    bool Wants(CheckId id) const;
    bool WantsAny(std::initializer_list<CheckId> ids) const;
    // True once the run must end: too many errors, or the caller wants no more.
    bool IsStopped() const { return summary_.isStopped; }

    // The worst severity of `id` is an error unless said otherwise.
    void Error(CheckId id, const CheckPlace& place, std::string text);
    void Error(CheckId id, const CheckPlace& place, std::string text, u64 expected, u64 found);
    void Warn(CheckId id, const CheckPlace& place, std::string text);
    void Warn(CheckId id, const CheckPlace& place, std::string text, u64 expected, u64 found);
    void Info(CheckId id, const CheckPlace& place, std::string text);
    void Tell(CheckId id, CheckSeverity severity, const CheckPlace& place, std::string text,
              std::string expected, std::string found);

    // Bytes [offset, offset + size) of the source; a status other than 0 if there are none such.
    int Read(u64 offset, void* target, u64 size);
    void Unreadable(const CheckPlace& place, u64 size, int status);

    // Findings of the tree `fileId` are kept back while it is not among the wanted ones.
    bool ReportsOn(u32 fileId) const;

    // The stage that counts findings from now on.
    CheckStage* UseStage(u32 index) {
        stage_ = &summary_.stages[index];
        return stage_;
    }
    CheckStage* Stage() { return stage_; }

    // One more node of `stage` visited.
    void CountNode(const char* stage, u64 total);
    // `done` steps of `total`, which count no nodes of their own; tells every few hundred.
    void Step(const char* stage, u64 done, u64 total);

    CheckSummary* Summary() { return &summary_; }

private:
    std::string Where(const CheckPlace& place) const;

    CheckSource source_;
    CheckOptions options_;
    CheckSink sink_;
    CheckScope scope_;
    CheckSummary summary_;
    CheckStage* stage_;
};

}  // namespace VELK
