// Statuses every operation returns, reason codes that go to the error report, and the report
// itself.
#pragma once

#include "platform/types.h"

namespace VELK {

// A status is a 32-bit value carried in an int: 0 is success. Statuses of the volume, the journal
// or any other service pass through the engine unchanged.
constexpr int kOk = 0;                                        // done
constexpr int kErrInvalid = static_cast<int>(0xA0000101u);    // invalid request, or no room
constexpr int kErrBadRecord = static_cast<int>(0xA0000106u);  // bad-block record of the wrong size
constexpr int kErrNoMemory = static_cast<int>(0xA0000107u);   // out of memory
constexpr int kErrNotFound = static_cast<int>(0xA000010Eu);   // key absent, or end of iteration
constexpr int kErrExists = static_cast<int>(0xA000010Fu);     // key already present
constexpr int kErrTooLarge = static_cast<int>(0xA0000115u);   // record larger than a node
constexpr int kErrCorrupt = static_cast<int>(0xA000011Cu);    // tree structure inconsistent
constexpr int kErrNoSpace = static_cast<int>(0xA0000123u);    // no free node, or volume reserve

// Reason codes: why a failure arose, reported where it arose.
constexpr u32 kReasonInvalid = 1;   // request or sibling links that cannot be served
constexpr u32 kReasonUnknown = 3;   // a tree this engine does not know
constexpr u32 kReasonTooLarge = 9;  // record larger than a node
constexpr u32 kReasonTree = 10;     // links between nodes disagree
constexpr u32 kReasonDepth = 11;    // deeper than the search path can hold
constexpr u32 kReasonHeader = 14;   // header record out of range
constexpr u32 kReasonNode = 15;     // the inside of one node is inconsistent
constexpr u32 kReasonReserve = 16;  // the volume refuses a reservation

}  // namespace VELK

extern "C" {

// Records one step of a failure. `code` is a reason code where the failure arises and the status
// itself in every caller that passes it on; `fileName` identifies the source and its version;
// `line` is the stable number of the failing check (a site; see docs/reports.md).
// Supplied by the platform; must not fail and must not call back into a tree.
void VELKError(unsigned code, const char* fileName, int line);
}
