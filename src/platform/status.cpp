// Names and texts of statuses: the one table behind messages, scripts, JSON and the C interface.
#include "platform/status.h"

namespace VELK {

namespace {

constexpr StatusEntry kStatuses[] = {
    {kOk, "ok", "success"},
    {kErrInvalid, "invalid", "the request cannot be served, or there is no room for it"},
    {kErrBadRecord, "bad-record", "a bad-block record has the wrong size"},
    {kErrNoMemory, "no-memory", "out of memory"},
    {kErrNotFound, "not-found", "no such key, or the end of the records"},
    {kErrExists, "exists", "the key is there already"},
    {kErrTooLarge, "too-large", "key and data are larger than a node"},
    {kErrCorrupt, "corrupt", "the tree contradicts itself"},
    {kErrNoSpace, "no-space", "no free node, and the volume cannot supply one"},
    {kErrVolumeIo, "io", "the image or device could not be read or written"},
    {kErrVolumeTruncated, "truncated", "past the end of the image"},
    {kErrVolumeReadOnly, "read-only", "the volume takes no changes"},
    {kErrVolumeUnmapped, "unmapped", "past the extents of the tree file"},
    {kErrVolumeJournal, "journal-full", "more changes than the journal holds at once"},
    {kErrVolumeOpen, "cannot-open", "no volume can be opened there"},
    {kErrVolumeNoTree, "no-tree", "the volume has no such tree"},
    {kErrVolumeClosed, "closed", "the volume is closed"},
    {kErrVolumeBuffer, "small-buffer", "the buffer offered is too small"},
};

const StatusEntry* Find(int status) {
    for (const StatusEntry& entry : kStatuses) {
        if (entry.status == status) {
            return &entry;
        }
    }
    return nullptr;
}

}  // namespace

const StatusEntry* StatusTable(std::size_t* count) {
    *count = sizeof kStatuses / sizeof kStatuses[0];
    return kStatuses;
}

const char* StatusName(int status) {
    const StatusEntry* entry = Find(status);
    return entry != nullptr ? entry->name : "status";
}

const char* StatusText(int status) {
    const StatusEntry* entry = Find(status);
    return entry != nullptr ? entry->text : "unknown status";
}

}  // namespace VELK
