// What went wrong, as a value: one text for a person, the place it belongs to, what to do about it,
// and how the program should end because of it. Nothing in this layer throws.
#pragma once

#include <optional>
#include <string>

#include "platform/status.h"
#include "platform/types.h"

namespace VELK {

// How a program that meets the problem should end.
enum class ExitClass : int {
    kNone = 0,    // no problem
    kNo = 1,      // the answer is no (an absent tree)
    kFailed = 8,  // could not do it
    kUsage = 16,  // asked the wrong way
};

// Made without arguments it is no problem. Problems are compared with nothing and thrown never:
// they are returned, or written to a `Problem*` that may be null where its declaration says so.
struct Problem {
    ExitClass exitClass = ExitClass::kNone;  // kNone: there is none
    int status = 0;             // status of the engine or of this layer behind it, 0: none
    std::string what;           // "volume header at 1024: block size 3000 is not a power of two"
    std::string advice;         // "try --backup-header"; may be empty
    std::optional<u64> offset;  // byte of the image
    std::optional<u32> fileId;  // tree file it concerns
    std::optional<u32> node;    // node of that tree
    std::string check;          // invariant of the checker that names it, as in "H04"; may be empty

    // Whether there is a problem.
    explicit operator bool() const { return exitClass != ExitClass::kNone; }

    // "WHAT: ADVICE", without the name of the image.
    std::string Text() const { return advice.empty() ? what : what + ": " + advice; }
};

// A problem of class kFailed, one that also names a byte of the image, and one of class kUsage.
Problem Failure(std::string what, std::string advice);
Problem FailureAt(u64 offset, std::string what, std::string advice);
Problem UsageProblem(std::string what, std::string advice);

// Number with commas between groups of three digits, as in "209,735,712".
std::string Grouped(u64 number);
// A place in the image: "1024", "16,384", "209,735,712".
std::string Position(u64 offset);
// "0x15810".
std::string HexOffset(u64 number);
// printf into a string of any length.
#if defined(__GNUC__)
__attribute__((format(printf, 1, 2)))
#endif
std::string
Format(const char* format, ...);

// Name and number of a status: "corrupt (A000011C)".
std::string StatusWithCode(int status);

// "catalog", "extents", "attributes", "allocation", "startup", else "file".
const char* ForkName(u32 fileId);

}  // namespace VELK
