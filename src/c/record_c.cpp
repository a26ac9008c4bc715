// The C interface: records, cursors, transactions.
#include "c/handles.h"

using namespace VELK;

namespace {

// Runs a change of one record and keeps the books of the transaction.
template <typename Change>
int Apply(treehfs_volume* handle, u32 tree, const void* key, u32 keySize, Change change) {
    if (handle == nullptr) {
        return NoHandle();
    }
    if (handle->lost != kOk) {
        return FailC(handle->lost, "the transaction was dropped by an earlier failure: roll back");
    }
    SearchKey search;
    int status = KeyFromBytes(tree, key, keySize, &search);
    if (status != kOk) {
        return status;
    }
    ReleaseCursors(handle);
    const bool takesChanges = handle->volume->IsWritable();
    status = takesChanges ? change(search) : kErrVolumeReadOnly;
    handle->hasChanges = handle->hasChanges || status == kOk;
    const bool isDropped = takesChanges && status != kOk && status != kErrNotFound &&
                           status != kErrExists && status != kErrTooLarge &&
                           status != kErrVolumeNoTree;
    if (isDropped && (handle->hasChanges || handle->hasBegun)) {
        handle->lost = status;
    }
    return FailOn(handle, tree, status);
}

// A change with data: the bytes as a vector, whatever their size.
template <typename Change>
int ApplyData(treehfs_volume* handle, u32 tree, const void* key, u32 keySize, const void* data,
              u32 dataSize, Change change) {
    if (data == nullptr && dataSize != 0) {
        return NoHandle();
    }
    const u8* bytes = static_cast<const u8*>(data);
    const std::vector<u8> stored(bytes, bytes + dataSize);
    return Apply(handle, tree, key, keySize, [&](const SearchKey& search) {
        return change(handle->volume.get(), tree, search, stored);
    });
}

int EndTransaction(treehfs_volume* handle) {
    handle->hasBegun = false;
    handle->hasChanges = false;
    handle->lost = kOk;
    return kOk;
}

}  // namespace

int treehfs_find(treehfs_volume* volume, uint32_t tree, const void* key, uint32_t key_size,
                 void* data, uint32_t capacity, uint32_t* size) {
    if (volume == nullptr) {
        return NoHandle();
    }
    return Guarded([&] {
        SearchKey search;
        int status = KeyFromBytes(tree, key, key_size, &search);
        if (status != kOk) {
            return status;
        }
        StoredRecord record;
        status = FindStored(volume->volume.get(), tree, search, &record);
        return status == kOk
                   ? PutBytes(record.data.data(), record.data.size(), data, capacity, size)
                   : FailOn(volume, tree, status);
    });
}

int treehfs_cursor_open(treehfs_volume* volume, uint32_t tree, const void* key, uint32_t key_size,
                        treehfs_cursor** cursor) {
    if (volume == nullptr || cursor == nullptr) {
        return NoHandle();
    }
    *cursor = nullptr;
    return Guarded([&] {
        SearchKey from;
        if (key != nullptr || !IsTreeId(tree)) {
            const int status = KeyFromBytes(tree, key, key_size, &from);
            if (status != kOk) {
                return status;
            }
        }
        Problem problem;
        if (volume->volume->Tree(tree, &problem) == nullptr) {
            return FailOn(volume, tree, problem.status != kOk ? problem.status : kErrVolumeNoTree);
        }
        std::unique_ptr<treehfs_cursor> made(
            new treehfs_cursor{volume, tree, {volume->volume.get(), tree}, {}});
        if (key != nullptr) {
            made->walk.Seek(from);
        }
        volume->cursors.push_back(made.get());
        *cursor = made.release();
        return kOk;
    });
}

int treehfs_cursor_next(treehfs_cursor* cursor, treehfs_record* record) {
    if (cursor == nullptr || record == nullptr) {
        return NoHandle();
    }
    if (cursor->owner == nullptr) {
        return FailC(kErrVolumeClosed, StatusText(kErrVolumeClosed));
    }
    return Guarded([&] {
        const int status = cursor->walk.Next(&cursor->record);
        cursor->owner->volume->TrimCache();
        if (status != kOk) {
            return FailOn(cursor->owner, cursor->tree, status);
        }
        const StoredRecord& found = cursor->record;
        auto out = Sized<treehfs_record>();
        out.id = found.id;
        out.key = found.key.data();
        out.key_size = static_cast<u32>(found.key.size());
        out.data = found.data.data();
        out.data_size = static_cast<u32>(found.data.size());
        out.node = found.node;
        out.index = found.index;
        return GiveStruct(out, record);
    });
}

void treehfs_cursor_close(treehfs_cursor* cursor) {
    if (cursor != nullptr && cursor->owner != nullptr) {
        std::erase(cursor->owner->cursors, cursor);
    }
    delete cursor;
}

int treehfs_begin(treehfs_volume* volume) {
    if (volume == nullptr) {
        return NoHandle();
    }
    if (!volume->volume->IsWritable()) {
        return FailOn(volume, 0, kErrVolumeReadOnly);
    }
    if (volume->hasBegun || volume->hasChanges || volume->lost != kOk) {
        return FailC(kErrInvalid, "changes wait already: commit or roll back first");
    }
    volume->hasBegun = true;
    return kOk;
}

int treehfs_commit(treehfs_volume* volume) {
    if (volume == nullptr) {
        return NoHandle();
    }
    if (volume->lost != kOk) {
        return FailC(volume->lost, "the transaction was dropped by an earlier failure: roll back");
    }
    return Guarded([&] {
        ReleaseCursors(volume);
        const int status = volume->volume->Commit(0);
        EndTransaction(volume);
        return FailOn(volume, 0, status);
    });
}

int treehfs_rollback(treehfs_volume* volume) {
    if (volume == nullptr) {
        return NoHandle();
    }
    return Guarded([&] {
        ReleaseCursors(volume);
        volume->volume->Restore();
        return EndTransaction(volume);
    });
}

int treehfs_insert(treehfs_volume* volume, uint32_t tree, const void* key, uint32_t key_size,
                   const void* data, uint32_t data_size) {
    return Guarded(
        [&] { return ApplyData(volume, tree, key, key_size, data, data_size, InsertStored); });
}

int treehfs_update(treehfs_volume* volume, uint32_t tree, const void* key, uint32_t key_size,
                   const void* data, uint32_t data_size) {
    return Guarded(
        [&] { return ApplyData(volume, tree, key, key_size, data, data_size, UpdateStored); });
}

int treehfs_delete(treehfs_volume* volume, uint32_t tree, const void* key, uint32_t key_size) {
    return Guarded([&] {
        return Apply(volume, tree, key, key_size, [&](const SearchKey& search) {
            return DeleteStored(volume->volume.get(), tree, search);
        });
    });
}
