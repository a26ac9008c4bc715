// The C interface: volumes, trees, records, transactions.
#include <mutex>

#include "c/handles.h"
#include "hfs/records/record_json.h"
#include "hfs/records/record_text.h"
#include "platform/host/host.h"

using namespace VELK;

namespace VELK {

namespace {

thread_local std::string lastError;

}  // namespace

int FailC(int status, std::string text) {
    lastError = std::move(text);
    return status;
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

namespace {

int PutText(const std::string& text, char* target, u32 capacity, u32* size) {
    const int status = PutBytes(text.c_str(), text.size() + 1, target, capacity, size);
    if (size != nullptr) {
        *size -= 1;
    }
    return status;
}

int NoHandle() {
    return FailC(kErrInvalid, "a handle or pointer that is needed is null");
}

OpenOptions OptionsOf(const treehfs_open_options& from) {
    OpenOptions options;
    options.access = from.access == TREEHFS_WRITE     ? Access::kWrite
                     : from.access == TREEHFS_OVERLAY ? Access::kOverlay
                                                      : Access::kReadOnly;
    if ((from.flags & TREEHFS_OPEN_AT_OFFSET) != 0) {
        options.offset = from.offset;
    }
    options.partition = from.partition;
    options.force = (from.flags & TREEHFS_OPEN_FORCE) != 0;
    options.replay = (from.flags & TREEHFS_OPEN_REPLAY) != 0;
    options.backupHeader = (from.flags & TREEHFS_OPEN_BACKUP_HEADER) != 0;
    if (from.cache_bytes != 0) {
        options.cacheBudget = from.cache_bytes;
    }
    return options;
}

// A library prints nothing: what the engine has to say goes nowhere, unless the program has hooks.
void SilenceEngine() {
    static const HostSinks kSilent = {
        nullptr,
        [](void*, const char*) {},
        [](void*, void*, const char*) {},
        [](void*, const void*, unsigned) {},
        nullptr,
    };
    static std::once_flag once;
    std::call_once(once, [] {
        const HostSinks* before = SetHostSinks(&kSilent);
        if (before != nullptr) {
            SetHostSinks(before);
        }
    });
}

int Open(const char* path, const treehfs_open_options* given, treehfs_volume** result) {
    auto from = Sized<treehfs_open_options>();
    if (!TakeStruct(given, &from) || from.access > TREEHFS_WRITE) {
        return FailC(kErrInvalid, "the options have no size, or an access that does not exist");
    }
    const OpenOptions options = OptionsOf(from);
    const auto mode =
        options.access == Access::kWrite ? FileDevice::Mode::kReadWrite : FileDevice::Mode::kRead;
    SilenceEngine();
    Problem problem;
    auto handle = std::make_unique<treehfs_volume>();
    std::unique_ptr<FileDevice> image = FileDevice::Open(path, mode, 0, &problem);
    if (image != nullptr) {
        handle->imageBytes = image->Size();
        handle->volume = ImageVolume::Open(std::move(image), options, nullptr, &problem);
    }
    if (handle->volume == nullptr) {
        return FailC(problem.status != kOk ? problem.status : kErrVolumeOpen,
                     std::string(path) + ": " + problem.Text());
    }
    for (const Problem& note : handle->volume->Notes()) {
        handle->notes.push_back(note.Text());
    }
    *result = handle.release();
    return kOk;
}

u32 FlagsOf(const ImageVolume& volume) {
    u32 flags = volume.Header().IsHfsx() ? TREEHFS_VOLUME_HFSX : 0;
    flags |= volume.Journal().present ? TREEHFS_VOLUME_JOURNALED : 0;
    flags |=
        volume.Journal().present && !volume.Journal().empty ? TREEHFS_VOLUME_JOURNAL_PENDING : 0;
    flags |= volume.IsTruncated() ? TREEHFS_VOLUME_TRUNCATED : 0;
    flags |= volume.IsWritable() ? TREEHFS_VOLUME_WRITABLE : 0;
    flags |= volume.UsedBackupHeader() ? TREEHFS_VOLUME_BACKUP_HEADER : 0;
    return flags;
}

// Cursors give their nodes up before anything changes: a restore would pull them away.
void ReleaseCursors(treehfs_volume* handle) {
    for (treehfs_cursor* cursor : handle->cursors) {
        cursor->walk.Release();
    }
}

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

}  // namespace VELK

const char* treehfs_status_name(int status) {
    return StatusName(status);
}

const char* treehfs_status_text(int status) {
    return StatusText(status);
}

const char* treehfs_last_error(void) {
    return lastError.c_str();
}

const char* treehfs_version(void) {
    return TREEHFS_VERSION;
}

int treehfs_open(const char* path, const treehfs_open_options* options, treehfs_volume** volume) {
    if (path == nullptr || volume == nullptr) {
        return NoHandle();
    }
    *volume = nullptr;
    return Guarded([&] { return Open(path, options, volume); });
}

int treehfs_close(treehfs_volume* volume) {
    if (volume == nullptr) {
        return kOk;
    }
    ReleaseCursors(volume);
    for (treehfs_cursor* cursor : volume->cursors) {
        cursor->owner = nullptr;
    }
    const int status = Guarded([&] { return FailOn(volume, 0, volume->volume->Close()); });
    delete volume;
    return status;
}

int treehfs_get_volume_info(treehfs_volume* volume, treehfs_volume_info* info) {
    if (volume == nullptr || info == nullptr) {
        return NoHandle();
    }
    const VolumeHeader& header = volume->volume->Header();
    auto out = Sized<treehfs_volume_info>();
    out.flags = FlagsOf(*volume->volume);
    out.offset = volume->volume->Place().offset;
    out.block_size = header.blockSize;
    out.total_blocks = header.totalBlocks;
    out.free_blocks = header.freeBlocks;
    out.file_count = header.fileCount;
    out.folder_count = header.folderCount;
    out.next_id = header.nextCatalogId;
    out.create_date = header.createDate;
    out.modify_date = header.modifyDate;
    out.backup_date = header.backupDate;
    out.checked_date = header.checkedDate;
    return GiveStruct(out, info) ? kOk : FailC(kErrInvalid, "the struct has no size");
}

const char* treehfs_note(treehfs_volume* volume, uint32_t index) {
    return volume != nullptr && index < volume->notes.size() ? volume->notes[index].c_str()
                                                             : nullptr;
}

int treehfs_get_tree_info(treehfs_volume* volume, uint32_t tree, treehfs_tree_info* info) {
    if (volume == nullptr || info == nullptr) {
        return NoHandle();
    }
    return Guarded([&] {
        Problem problem;
        const CBTreeHfs* opened = volume->volume->Tree(tree, &problem);
        if (opened == nullptr) {
            return FailC(problem.status != kOk ? problem.status : kErrVolumeNoTree, problem.Text());
        }
        auto out = Sized<treehfs_tree_info>();
        out.node_size = opened->header.nodeSize;
        out.depth = opened->header.treeDepth;
        out.root_node = opened->header.rootNode;
        out.first_leaf = opened->header.firstLeafNode;
        out.last_leaf = opened->header.lastLeafNode;
        out.leaf_records = opened->header.leafRecords;
        out.total_nodes = opened->header.totalNodes;
        out.free_nodes = opened->header.freeNodes;
        out.max_key_length = opened->header.maxKeyLength;
        out.attributes = opened->header.attributes;
        out.key_compare = opened->keyCompareType;
        return GiveStruct(out, info) ? kOk : FailC(kErrInvalid, "the struct has no size");
    });
}

int treehfs_key_parse(uint32_t tree, const char* text, void* key, uint32_t capacity,
                      uint32_t* size) {
    if (text == nullptr || size == nullptr || !IsTreeId(tree)) {
        return NoHandle();
    }
    return Guarded([&] {
        SearchKey parsed;
        const Problem problem = ParseKey(text, tree, &parsed);
        if (problem) {
            return FailC(kErrInvalid, problem.Text());
        }
        const std::vector<u8> stored = StoredKey(tree, parsed);
        return PutBytes(stored.data(), stored.size(), key, capacity, size);
    });
}

int treehfs_key_text(uint32_t tree, const void* key, uint32_t key_size, char* text,
                     uint32_t capacity, uint32_t* size) {
    if (key == nullptr || !IsTreeId(tree)) {
        return NoHandle();
    }
    return Guarded([&] {
        return PutText(KeyText(tree, static_cast<const u8*>(key), key_size, Blanks::kPlain), text,
                       capacity, size);
    });
}

int treehfs_data_parse(uint32_t tree, const char* text, void* data, uint32_t capacity,
                       uint32_t* size) {
    if (text == nullptr || size == nullptr || !IsTreeId(tree)) {
        return NoHandle();
    }
    return Guarded([&] {
        RecordData parsed;
        // A library does not read files that its caller did not open.
        const Problem problem = *text == '@' ? UsageProblem("a file is no data here", "")
                                             : ParseData(text, tree, &parsed);
        if (problem || parsed.isSame) {
            return FailC(kErrInvalid, problem ? problem.Text() : "'same' is no data here");
        }
        return PutBytes(parsed.stored.data(), parsed.stored.size(), data, capacity, size);
    });
}

int treehfs_record_json(uint32_t tree, const void* key, uint32_t key_size, const void* data,
                        uint32_t data_size, char* text, uint32_t capacity, uint32_t* size) {
    if (key == nullptr || (data == nullptr && data_size != 0) || !IsTreeId(tree)) {
        return NoHandle();
    }
    return Guarded([&] {
        std::string line;
        AppendRecordJson(tree, static_cast<const u8*>(key), key_size, static_cast<const u8*>(data),
                         data_size, RecordJsonOptions{}, &line);
        return PutText(line, text, capacity, size);
    });
}

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
        return GiveStruct(out, record) ? kOk : FailC(kErrInvalid, "the struct has no size");
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
