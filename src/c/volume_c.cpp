// The C interface: volumes and what is known of them and their trees.
#include <mutex>

#include "c/handles.h"
#include "platform/host/host.h"

using namespace VELK;

namespace {

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

}  // namespace

const char* treehfs_status_name(int status) {
    return StatusName(status);
}

const char* treehfs_status_text(int status) {
    return StatusText(status);
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
    return GiveStruct(out, info);
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
        return GiveStruct(out, info);
    });
}
