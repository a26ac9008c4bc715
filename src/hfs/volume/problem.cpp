// Texts of problems: numbers as people read them, names of statuses and special files.
#include "hfs/volume/problem.h"

#include <cstdarg>
#include <cstdio>

#include "hfs/format.h"
#include "platform/error.h"

namespace VELK {

Problem Failure(std::string what, std::string advice) {
    Problem problem;
    problem.exitClass = ExitClass::kFailed;
    problem.what = std::move(what);
    problem.advice = std::move(advice);
    return problem;
}

Problem FailureAt(u64 offset, std::string what, std::string advice) {
    Problem problem = Failure(std::move(what), std::move(advice));
    problem.offset = offset;
    return problem;
}

Problem UsageProblem(std::string what, std::string advice) {
    Problem problem = Failure(std::move(what), std::move(advice));
    problem.exitClass = ExitClass::kUsage;
    return problem;
}

std::string Grouped(u64 number) {
    std::string text = std::to_string(number);
    for (std::size_t end = text.size(); end > 3; end -= 3) {
        text.insert(end - 3, 1, ',');
    }
    return text;
}

std::string Position(u64 offset) {
    return offset < 10000 ? std::to_string(offset) : Grouped(offset);
}

std::string HexOffset(u64 number) {
    return Format("0x%llx", static_cast<unsigned long long>(number));
}

std::string Format(const char* format, ...) {
    va_list arguments;
    va_list again;
    va_start(arguments, format);
    va_copy(again, arguments);
    const int size = std::vsnprintf(nullptr, 0, format, arguments);
    va_end(arguments);
    std::string text(size > 0 ? static_cast<std::size_t>(size) : 0, '\0');
    std::vsnprintf(text.data(), text.size() + 1, format, again);
    va_end(again);
    return text;
}

std::string StatusWithCode(int status) {
    return Format("%s (%08X)", StatusName(status), static_cast<unsigned>(status));
}

const char* ForkName(u32 fileId) {
    switch (fileId) {
        case kExtentsFileId:
            return "extents";
        case kCatalogFileId:
            return "catalog";
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

}  // namespace VELK
