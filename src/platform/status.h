// Every status of this project by name: those of the engine (platform/error.h) and those of the
// layers above it, which pass through the engine unchanged.
#pragma once

#include <cstddef>

#include "platform/error.h"

namespace VELK {

// The volume layer and what stands on it.
constexpr int kErrVolumeIo = static_cast<int>(0xA0000201u);         // the device failed
constexpr int kErrVolumeTruncated = static_cast<int>(0xA0000202u);  // past the end of the image
constexpr int kErrVolumeReadOnly = static_cast<int>(0xA0000203u);   // takes no changes
constexpr int kErrVolumeUnmapped = static_cast<int>(0xA0000204u);   // past the fork's extents
constexpr int kErrVolumeJournal = static_cast<int>(0xA0000205u);    // more than the journal holds
constexpr int kErrVolumeOpen = static_cast<int>(0xA0000206u);       // no volume can be opened there
constexpr int kErrVolumeNoTree = static_cast<int>(0xA0000207u);     // the volume has no such tree
constexpr int kErrVolumeClosed = static_cast<int>(0xA0000208u);     // closed already
constexpr int kErrVolumeBuffer = static_cast<int>(0xA0000209u);     // the caller's buffer is small

// One status and its words, which are constant.
struct StatusEntry {
    int status;        // its value
    const char* name;  // one word for programs, as in "not-found"
    const char* text;  // what it means, for a person; no full stop
};

// Every status there is, kOk first; `*count` entries.
const StatusEntry* StatusTable(std::size_t* count);
// The name of a status; "status" for one that is not of this project.
const char* StatusName(int status);
// What a status means; "unknown status" for one that is not of this project.
const char* StatusText(int status);

}  // namespace VELK
