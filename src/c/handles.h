// What stands behind the handles of the C interface.
#pragma once

#include <treehfs/treehfs.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include "hfs/records/stored_records.h"

struct treehfs_volume {
    std::unique_ptr<VELK::ImageVolume> volume;
    VELK::u64 imageBytes = 0;
    std::vector<std::string> notes;
    std::vector<treehfs_cursor*> cursors;  // open ones
    bool hasBegun = false;                 // by treehfs_begin
    bool hasChanges = false;               // since the last commit or rollback
    int lost = TREEHFS_OK;                 // why the transaction was dropped
};

struct treehfs_cursor {
    treehfs_volume* owner;  // null: the volume was closed
    VELK::u32 tree;
    VELK::RecordCursor walk;
    VELK::StoredRecord record;
};

namespace VELK {

// Keeps `text` as what treehfs_last_error says and returns `status`.
int FailC(int status, std::string text);
// The same for a failure of an operation on a volume: the medium's problem where it is one.
int FailOn(const treehfs_volume* handle, u32 tree, int status);

// A handle or pointer that is needed is null.
int NoHandle();

bool IsTreeId(u32 tree);
// Reads a key given as bytes; a status with its text kept.
int KeyFromBytes(u32 tree, const void* key, u32 size, SearchKey* result);
// Hands bytes out: `*size` says how many there are.
int PutBytes(const void* bytes, std::size_t count, void* target, u32 capacity, u32* size);
// The same with a NUL behind the text, which `*size` does not count.
int PutText(const std::string& text, char* target, u32 capacity, u32* size);

// Cursors give their nodes up before anything changes: a restore would pull them away.
void ReleaseCursors(treehfs_volume* handle);

// Runs a call of the interface: no exception leaves it.
template <typename Call>
int Guarded(Call call) {
    try {
        return call();
    } catch (const std::bad_alloc&) {
        return FailC(kErrNoMemory, StatusText(kErrNoMemory));
    } catch (...) {
        return FailC(kErrInvalid, StatusText(kErrInvalid));
    }
}

// A struct of the interface, all 0 but its size.
template <typename Struct>
Struct Sized() {
    Struct made{};
    made.struct_size = sizeof made;
    return made;
}

// Copies what caller and library both know of a struct that begins with its size.
template <typename Struct>
bool TakeStruct(const Struct* from, Struct* to) {
    if (from == nullptr) {
        return true;
    }
    if (from->struct_size < sizeof from->struct_size) {
        return false;
    }
    std::memcpy(to, from, std::min<std::size_t>(from->struct_size, sizeof *to));
    to->struct_size = sizeof *to;
    return true;
}

// The other way; a status with its text kept.
template <typename Struct>
int GiveStruct(const Struct& from, Struct* to) {
    if (to->struct_size < sizeof to->struct_size) {
        return FailC(kErrInvalid, "the struct has no size");
    }
    const u32 size = to->struct_size;
    std::memcpy(to, &from, std::min<std::size_t>(size, sizeof from));
    to->struct_size = size;
    return kOk;
}

}  // namespace VELK
