// Counting, filtering and wording of findings; bounded reads of the source.
#include "hfs/check/check_run.h"

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <utility>

#include "hfs/format.h"

namespace VELK {
namespace {

constexpr u32 kStepsBetweenProgress = 256;

// An invariant that is asked for by name is looked at, however shallow the run.
CheckScope ScopeOf(const CheckOptions& options) {
    CheckScope scope = options.full    ? CheckScope::kFull
                       : options.quick ? CheckScope::kQuick
                                       : CheckScope::kDefault;
    const CheckIdInfo* table = CheckIdTable();
    for (u32 i = 0; i < kCheckIdCount; ++i) {
        if ((options.only & CheckIdBit(table[i].id)) != 0 && table[i].scope > scope) {
            scope = table[i].scope;
        }
    }
    return scope;
}

}  // namespace

std::string CheckPrint(const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    va_list again;
    va_copy(again, arguments);
    const int size = std::vsnprintf(nullptr, 0, format, arguments);
    va_end(arguments);
    std::string text(size > 0 ? static_cast<std::size_t>(size) : 0, '\0');
    if (size > 0) {
        std::vsnprintf(text.data(), text.size() + 1, format, again);
    }
    va_end(again);
    return text;
}

std::string CheckCounted(u64 count, const char* one, const char* many) {
    return std::to_string(count) + " " + (count == 1 ? one : many);
}

std::string CheckBlocksText(u32 start, u32 count) {
    return count == 1 ? CheckPrint("block %u", start)
                      : CheckPrint("blocks %u..%llu", start,
                                   static_cast<unsigned long long>(start) + count - 1);
}

const char* CheckFileName(u32 fileId) {
    switch (fileId) {
        case 0:
            return "volume";
        case kExtentsFileId:
            return "extents";
        case kCatalogFileId:
            return "catalog";
        case kBadBlockFileId:
            return "bad-block";
        case kAllocationFileId:
            return "allocation";
        case kStartupFileId:
            return "startup";
        case kAttributesFileId:
            return "attributes";
        default:
            return "file";
    }
}

std::string CheckFindingLine(const CheckFinding& finding) {
    const char* severity = finding.severity == CheckSeverity::kError     ? "error"
                           : finding.severity == CheckSeverity::kWarning ? "warn "
                                                                         : "info ";
    std::string line =
        CheckPrint("%s %s %s", severity, CheckIdOf(finding.id).name, finding.where.c_str());
    if (finding.offset != kCheckNoOffset) {
        line +=
            CheckPrint(" (image offset 0x%llx)", static_cast<unsigned long long>(finding.offset));
    }
    return line + ": " + finding.text;
}

CheckRun::CheckRun(const CheckSource& source, const CheckOptions& options, const CheckSink& sink)
    : source_(source),
      options_(options),
      sink_(sink),
      scope_(ScopeOf(options)),
      stage_(&summary_.stages[0]) {}

bool CheckRun::Wants(CheckId id) const {
    const u64 bit = CheckIdBit(id);
    return CheckIdOf(id).scope <= scope_ && (options_.skip & bit) == 0 &&
           (options_.only == 0 || (options_.only & bit) != 0);
}

bool CheckRun::WantsAny(std::initializer_list<CheckId> ids) const {
    return std::any_of(ids.begin(), ids.end(), [this](CheckId id) { return Wants(id); });
}

bool CheckRun::ReportsOn(u32 fileId) const {
    return options_.trees == 0 || fileId == 0 || fileId >= 32 ||
           (options_.trees & (u32{1} << fileId)) != 0;
}

std::string CheckRun::Where(const CheckPlace& place) const {
    std::string where = CheckFileName(place.tree);
    if (!place.part.empty()) {
        where += " " + place.part;
    } else if (place.node >= 0) {
        where += CheckPrint(" node %lld", static_cast<long long>(place.node));
    }
    if (place.record >= 0) {
        where += CheckPrint(" record %d", place.record);
    }
    return where;
}

void CheckRun::Tell(CheckId id, CheckSeverity severity, const CheckPlace& place, std::string text,
                    std::string expected, std::string found) {
    if (!Wants(id) || !ReportsOn(place.tree) || IsStopped()) {
        return;
    }
    const bool isError = severity == CheckSeverity::kError;
    u32* total = isError                               ? &summary_.errors
                 : severity == CheckSeverity::kWarning ? &summary_.warnings
                                                       : &summary_.infos;
    u32* ofStage = isError                               ? &stage_->errors
                   : severity == CheckSeverity::kWarning ? &stage_->warnings
                                                         : &stage_->infos;
    ++*total;
    ++*ofStage;
    if (options_.maxErrors != 0 && *total > options_.maxErrors) {
        ++summary_.untold;
        return;
    }
    if (sink_.finding != nullptr) {
        CheckFinding finding;
        finding.id = id;
        finding.severity = severity;
        finding.tree = place.tree;
        finding.node = place.node;
        finding.record = place.record;
        if (place.offset != kCheckNoOffset) {
            finding.offset = place.offset + source_.imageOffset;
        }
        finding.where = Where(place);
        finding.expected = std::move(expected);
        finding.found = std::move(found);
        finding.text = std::move(text);
        sink_.finding(sink_.self, finding);
    }
    if (isError && options_.maxErrors != 0 && summary_.errors >= options_.maxErrors) {
        summary_.isStopped = true;
    }
}

void CheckRun::Error(CheckId id, const CheckPlace& place, std::string text) {
    Tell(id, CheckSeverity::kError, place, std::move(text), "", "");
}

void CheckRun::Error(CheckId id, const CheckPlace& place, std::string text, u64 expected,
                     u64 found) {
    Tell(id, CheckSeverity::kError, place, std::move(text), std::to_string(expected),
         std::to_string(found));
}

void CheckRun::Warn(CheckId id, const CheckPlace& place, std::string text) {
    Tell(id, CheckSeverity::kWarning, place, std::move(text), "", "");
}

void CheckRun::Warn(CheckId id, const CheckPlace& place, std::string text, u64 expected,
                    u64 found) {
    Tell(id, CheckSeverity::kWarning, place, std::move(text), std::to_string(expected),
         std::to_string(found));
}

void CheckRun::Info(CheckId id, const CheckPlace& place, std::string text) {
    Tell(id, CheckSeverity::kInfo, place, std::move(text), "", "");
}

int CheckRun::Read(u64 offset, void* target, u64 size) {
    if (offset > source_.size || size > source_.size - offset) {
        return kCheckPastEnd;
    }
    summary_.bytes += size;
    return source_.read(source_.self, offset, target, static_cast<std::size_t>(size));
}

void CheckRun::Unreadable(const CheckPlace& place, u64 size, int status) {
    ++summary_.unreadable;
    if (sink_.unreadable == nullptr) {
        return;
    }
    CheckUnreadable unreadable;
    unreadable.tree = place.tree;
    unreadable.node = place.node;
    if (place.offset != kCheckNoOffset) {
        unreadable.offset = place.offset + source_.imageOffset;
    }
    unreadable.size = size;
    unreadable.status = status;
    unreadable.where = Where(place);
    sink_.unreadable(sink_.self, unreadable);
}

void CheckRun::CountNode(const char* stage, u64 total) {
    ++summary_.nodes;
    ++stage_->nodes;
    Step(stage, stage_->nodes, total);
}

void CheckRun::Step(const char* stage, u64 done, u64 total) {
    if (sink_.progress != nullptr && done % kStepsBetweenProgress == 0 &&
        !sink_.progress(sink_.self, {stage, done, total, summary_.bytes})) {
        summary_.isStopped = true;
    }
}

}  // namespace VELK
