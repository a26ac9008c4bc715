// What all calls of the C interface share: failures with their texts, keys and buffers.
#include "c/handles.h"

using namespace VELK;

namespace VELK {

namespace {

thread_local std::string lastError;

}  // namespace

int FailC(int status, std::string text) {
    lastError = std::move(text);
    return status;
}

int NoHandle() {
    return FailC(kErrInvalid, "a handle or pointer that is needed is null");
}

int FailOn(const treehfs_volume* handle, u32 tree, int status) {
    if (status == kOk) {
        return kOk;
    }
    const Problem& medium = handle->volume->LastIoProblem();
    const bool isMedium = status == kErrVolumeIo || status == kErrVolumeTruncated ||
                          status == kErrVolumeUnmapped || status == kErrVolumeJournal;
    if (isMedium && medium) {
        return FailC(status, medium.Text());
    }
    Problem problem;
    if (IsTreeId(tree) && handle->volume->Tree(tree, &problem) == nullptr) {
        return FailC(status, problem.Text());
    }
    const std::string where = IsTreeId(tree) ? std::string(ForkName(tree)) + " tree: " : "";
    return FailC(status, where + StatusText(status));
}

bool IsTreeId(u32 tree) {
    return tree == kExtentsFileId || tree == kCatalogFileId || tree == kAttributesFileId;
}

int KeyFromBytes(u32 tree, const void* key, u32 size, SearchKey* result) {
    if (!IsTreeId(tree)) {
        return FailC(kErrInvalid, "file " + std::to_string(tree) + " is no tree");
    }
    if (key == nullptr || !SearchKeyFromStored(tree, static_cast<const u8*>(key), size, result)) {
        return FailC(kErrInvalid,
                     "these bytes are no key of the " + std::string(ForkName(tree)) + " tree");
    }
    return kOk;
}

int PutBytes(const void* bytes, std::size_t count, void* target, u32 capacity, u32* size) {
    if (size != nullptr) {
        *size = static_cast<u32>(count);
    }
    if (capacity < count || (target == nullptr && count != 0)) {
        return FailC(kErrVolumeBuffer, "the result takes " + std::to_string(count) +
                                           " bytes, the buffer has " + std::to_string(capacity));
    }
    if (count != 0) {
        std::memcpy(target, bytes, count);
    }
    return kOk;
}

int PutText(const std::string& text, char* target, u32 capacity, u32* size) {
    const int status = PutBytes(text.c_str(), text.size() + 1, target, capacity, size);
    if (size != nullptr) {
        *size -= 1;
    }
    return status;
}

void ReleaseCursors(treehfs_volume* handle) {
    for (treehfs_cursor* cursor : handle->cursors) {
        cursor->walk.Release();
    }
}

}  // namespace VELK

const char* treehfs_last_error(void) {
    return lastError.c_str();
}
