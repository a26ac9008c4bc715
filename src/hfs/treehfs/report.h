// How a failure leaves the engine. Three forms and no fourth:
//
//   HFS_TRY(call, site);                     passes a status on, reported with this site
//   return Fail(status, reason, site);       a failure arises here, reported with its reason
//   HFS_ASSERT(condition, site);             prints its line and goes on
//
// A site is the stable number of one check. It does not follow source lines, is never reused, and
// belongs to one place; the catalogue docs/sites.txt is generated from the source. Statuses that
// are part of normal life (absent, already there) are plain returns.
#pragma once

#include "platform/error.h"
#include "platform/trace.h"
#include "platform/types.h"

namespace VELK {

#define HFS_LIKELY(condition) __builtin_expect(static_cast<bool>(condition), true)
#define HFS_UNLIKELY(condition) __builtin_expect(static_cast<bool>(condition), false)

// Reports `code` (a reason or a status) at `site`.
void Report(int code, int site);
void AssertFailed(int site);

// Reports `reason` at `site` and returns `status`.
inline int Fail(int status, u32 reason, int site) {
    Report(static_cast<int>(reason), site);
    return status;
}

// Name of the tree with this file ID in traces: "ExtTree", "CatTree", "AttTree", else "Unknown".
const char* TreeName(u32 fileId);

#define HFS_TRY(call, site)                \
    do {                                   \
        const int status_ = (call);        \
        if (HFS_UNLIKELY(status_ != 0)) {  \
            ::VELK::Report(status_, site); \
            return status_;                \
        }                                  \
    } while (false)

#define HFS_ASSERT(condition, site)       \
    do {                                  \
        if (HFS_UNLIKELY(!(condition))) { \
            ::VELK::AssertFailed(site);   \
        }                                 \
    } while (false)

#define HFS_TRACE(...)                                  \
    do {                                                \
        if (velk_trace_level & VELK_TRACE_DIAGNOSTIC) { \
            _VELKTrace(__VA_ARGS__);                    \
        }                                               \
    } while (false)

}  // namespace VELK
