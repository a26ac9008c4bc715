// The service tables of an image volume: lends map blocks gathered from wherever the fork lies,
// stages what comes back.
//
// A buffer belongs to the node that mapped it and to nobody else, since a tree caches each node
// once; so there is nothing to look up here, and releasing a buffer forgets what was not handed
// over. The buffers of a node lie one behind the other, as a tree is at its fastest then.
#include <algorithm>
#include <cstring>
#include <new>

#include "hfs/volume/volume_state.h"
#include "platform/heap.h"

namespace VELK {

namespace {

// What a buffer_head of this volume points at. Those of a node stand side by side in one heap
// block, the bytes of all of them behind the last one, from the next line of the processor's cache
// on: they are copied and searched faster there.
struct alignas(16) MapBuffer {
    HfsRuns* runs;
    u64 offset;  // of the block in its fork
    u8* bytes;
    MapBuffer* first;  // of its node
    u32 lent;          // in the first one: buffers of the node that were not released
    u32 fileId;
    u32 size;
    bool isOpen;  // for change, where there is a journal
};

constexpr u64 kLine = 64;  // bytes

MapBuffer* BufferOf(buffer_head* bh) {
    return reinterpret_cast<MapBuffer*>(bh);
}

ImageVolume::State* StateOf(void* self);

}  // namespace

// Puts a failed transfer into words and returns its status.
int ImageVolume::State::IoStatus(const IoResult& result, u32 fileId, u64 forkOffset, bool isWrite) {
    if (result.error == kIoNoMemory) {
        return kErrNoMemory;
    }
    u64 at = place.offset + result.offset;
    std::string where =
        fileId == 0 ? std::string("volume") : std::string(ForkName(fileId)) + " file";
    std::optional<u32> node;
    TreeSlot* slot = Slot(fileId);
    if (slot != nullptr && slot->isOpen) {
        node = static_cast<u32>(forkOffset >> slot->Get()->nodeShift);
        where = std::string(ForkName(fileId)) + " node " + std::to_string(*node);
    }
    if (result.error == kIoPastEnd) {
        if (node && at < image->Size()) {  // the first map block that is not all there
            at += (image->Size() - at) / fs.mapBlockSize * fs.mapBlockSize;
        }
        lastIo = FailureAt(at,
                           "image ends at " + Position(image->Size()) + ", " + where + " (" +
                               HexOffset(at) + ") lies behind that",
                           "");
        lastIo.status = kErrVolumeTruncated;
    } else {
        lastIo = FailureAt(at,
                           std::string(isWrite ? "write" : "read") + " error at " + HexOffset(at) +
                               " (" + where + "): " + IoErrorText(result.error),
                           "");
        lastIo.status = result.error == kIoReadOnly ? kErrVolumeReadOnly : kErrVolumeIo;
    }
    lastIo.fileId = fileId;
    lastIo.node = node;
    return lastIo.status;
}

int ImageVolume::State::ReadBytes(const HfsRuns& runs, u32 fileId, u64 offset, void* target,
                                  u64 bytes) {
    u8* out = static_cast<u8*>(target);
    return ForEachPiece(runs, fs.allocBlockShift, offset, bytes, kErrVolumeUnmapped,
                        [&](u64 at, u64 done, u64 piece) {
                            const IoResult result =
                                volume->Read(at, out + done, static_cast<std::size_t>(piece));
                            return result.Ok() ? 0 : IoStatus(result, fileId, offset, false);
                        });
}

int ImageVolume::State::WriteBytes(const HfsRuns& runs, u32 fileId, u64 offset, const void* source,
                                   u64 bytes) {
    if (!isWritable) {
        return kErrVolumeReadOnly;
    }
    const u8* in = static_cast<const u8*>(source);
    return ForEachPiece(runs, fs.allocBlockShift, offset, bytes, kErrVolumeUnmapped,
                        [&](u64 at, u64 done, u64 piece) {
                            const IoResult result =
                                volume->Write(at, in + done, static_cast<std::size_t>(piece));
                            return result.Ok() ? 0 : IoStatus(result, fileId, offset, true);
                        });
}

int ImageVolume::State::ZeroBytes(const HfsRuns& runs, u32 fileId, u64 offset, u64 bytes) {
    if (!isWritable) {
        return kErrVolumeReadOnly;
    }
    return ForEachPiece(runs, fs.allocBlockShift, offset, bytes, kErrVolumeUnmapped,
                        [&](u64 at, u64, u64 piece) {
                            const IoResult result = volume->Zero(at, piece);
                            return result.Ok() ? 0 : IoStatus(result, fileId, offset, true);
                        });
}

namespace {

ImageVolume::State* StateOf(void* self) {
    return static_cast<ImageVolume::State*>(self);
}

// Fills `bytes` with what lies at `offset`, or with zeros where nothing is to be read. A block that
// lies nowhere is then found out here and not when it is handed over.
int Fetch(ImageVolume::State* state, const HfsRuns& runs, u32 fileId, u64 offset, bool noRead,
          u8* target, u32 bytes) {
    if (!noRead) {
        return state->ReadBytes(runs, fileId, offset, target, bytes);
    }
    std::memset(target, 0, bytes);
    return ForEachPiece(runs, state->fs.allocBlockShift, offset, bytes, kErrVolumeUnmapped,
                        [](u64, u64, u64) { return 0; });
}

int Map(void* self, CFileSystemHfs*, HfsRuns* runs, HfsFork*, u8, u32 fileId, u64 byteOffset,
        u32 bytes, bool noRead, HfsBcbBuf* bufs) {
    ImageVolume::State* state = StateOf(self);
    const u32 blockSize = state->fs.mapBlockSize;
    const u32 count = bytes / blockSize;
    const u64 headSize = (u64{count} * sizeof(MapBuffer) + kLine - 1) / kLine * kLine;
    void* memory = velk_heap_alloc(static_cast<std::size_t>(headSize + bytes));
    if (memory == nullptr) {
        return kErrNoMemory;
    }
    u8* const data = static_cast<u8*>(memory) + headSize;
    const int status = Fetch(state, *runs, fileId, byteOffset, noRead, data, bytes);
    if (status != 0) {
        velk_heap_free(memory);
        return status;
    }
    MapBuffer* const first = static_cast<MapBuffer*>(memory);
    for (u32 i = 0; i < count; ++i) {
        const u64 at = u64{i} * blockSize;
        MapBuffer* buffer = new (first + i)
            MapBuffer{runs, byteOffset + at, data + at, first, count, fileId, blockSize, false};
        bufs[i].bh = reinterpret_cast<buffer_head*>(buffer);
        bufs[i].data = buffer->bytes;
    }
    return 0;
}

int DirtyMeta(void* self, CFileSystemHfs*, buffer_head* bh) {
    ImageVolume::State* state = StateOf(self);
    MapBuffer* buffer = BufferOf(bh);
    const int status = state->WriteBytes(*buffer->runs, buffer->fileId, buffer->offset,
                                         buffer->bytes, buffer->size);
    if (status == 0) {
        state->handedOver += 1;
        buffer->isOpen = false;
    }
    return status;
}

int Zero(void* self, CFileSystemHfs*, HfsRuns* runs, HfsFork*, u8, u32 fileId, u64 byteOffset,
         u64 bytes) {
    return StateOf(self)->ZeroBytes(*runs, fileId, byteOffset, bytes);
}

int Resize(void* self, CFileSystemHfs*, HfsRuns* runs, HfsFork*, u8, u32 fileId, u64 newSize) {
    return StateOf(self)->Resize(runs, fileId, newSize);
}

void Release(void*, buffer_head* bh, int) {
    MapBuffer* first = BufferOf(bh)->first;
    first->lent -= 1;
    if (first->lent == 0) {
        velk_heap_free(first);
    }
}

// The bytes of a buffer are the node's own until they are handed over: nothing to open or close.
void BeginModify(void*, buffer_head*) {}
void EndModify(void*, buffer_head*) {}

// A block that changes will take its own bytes in the journal and, at worst, an entry's share of a
// list. That it is counted here lets the caller commit before a transaction grows too large.
int OpenForChange(void* self, buffer_head* bh) {
    MapBuffer* buffer = BufferOf(bh);
    if (buffer->isOpen) {
        return kOk;
    }
    const int status = StateOf(self)->Grant(buffer->size);
    buffer->isOpen = status == kOk;
    return status;
}

constexpr HfsJournalOps kJournalOps = {OpenForChange, OpenForChange};
constexpr HfsVolumeOps kVolumeOps = {Map, DirtyMeta, Zero, Resize};
constexpr HfsCacheOps kCacheOps = {Release, BeginModify, EndModify};

}  // namespace

int ImageVolume::State::Grant(u32 bytes) {
    if (!isWritable) {
        return kErrVolumeReadOnly;
    }
    grantedBytes += bytes;
    return kOk;
}

// Bytes of the journal that an operation on one record rarely goes beyond: on each level a node and
// the one it is shared with or split into, the neighbours of both leaves, header and map; besides a
// list, the volume header and a sector of the bitmap.
u64 ImageVolume::State::LargestOperation() const {
    constexpr u32 kNodesPerLevel = 2;
    constexpr u32 kOtherNodes = 4;
    u64 most = 0;
    for (const TreeSlot& slot : trees) {
        if (slot.isOpen) {
            const BTHeaderMem& tree =
                std::launder(reinterpret_cast<const CBTreeHfs*>(slot.storage))->header;
            const u64 nodes = u64{kNodesPerLevel} * (tree.treeDepth + 1u) + kOtherNodes;
            most = std::max(most, nodes * tree.nodeSize);
        }
    }
    return most + journalPlace.header.listSize + 2 * kSectorSize;
}

void ImageVolume::State::InstallJournal() {
    if (journalSink != nullptr) {
        fs.journal.ops = &kJournalOps;
        fs.journal.self = this;
    }
}

void ImageVolume::State::InstallServices() {
    fs.service.ops = &kVolumeOps;
    fs.service.self = this;
    fs.cache.ops = &kCacheOps;
    fs.cache.self = this;
    fs.bitmap = &bitmap;
}

}  // namespace VELK
