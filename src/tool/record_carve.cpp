// What makes bytes a record.
#include "tool/record_carve.h"

#include <algorithm>

#include "hfs/records/key_layout.h"
#include "hfs/records/search_key.h"
#include "hfs/records/thread_view.h"

namespace VELK::tool {

namespace {

constexpr u32 kSlot = 2;  // bytes of an entry of the offset table

// The key's length counts its fields and nothing else.
bool IsWholeKey(u32 fileId, const u8* key, u32 keySize) {
    SearchKey ignored;
    if (!SearchKeyFromStored(fileId, key, keySize, &ignored)) {
        return false;
    }
    const KeyView view(fileId, key);
    if (keySize != view.Size() || view.Id() == 0) {
        return false;
    }
    if (fileId == kExtentsFileId) {
        const u8 fork = key[kExtKeyForkType];
        return (fork == kForkData || fork == kForkResource) && key[kExtKeyPad] == 0;
    }
    return fileId == kCatalogFileId || (view.NameLength() != 0 && GetBe16(key + kAttrKeyPad) == 0);
}

// Runs packed from the front, at least one.
bool AreRuns(const u8* extents) {
    bool ended = false;
    for (u32 i = 0; i < kExtentCount; ++i) {
        const u32 start = GetBe32(extents + 8 * i);
        const u32 count = GetBe32(extents + 8 * i + 4);
        if ((i == 0 && count == 0) || (ended && (start != 0 || count != 0))) {
            return false;
        }
        ended = count == 0;
    }
    return true;
}

// Bytes of the data that belong to `key`; 0: no record of this tree.
u32 DataSizeOf(u32 fileId, const u8* key, const u8* data, u32 room) {
    const RecordKind* kind = KindOfRecord(fileId, data, room);
    if (kind == nullptr) {
        return 0;
    }
    if (fileId == kExtentsFileId) {
        return AreRuns(data) ? kind->size : 0;
    }
    if (fileId == kAttributesFileId) {
        const u64 inlineSize = kInlineFixed + u64{GetBe32(data + kInlineFixed - 4)};
        const u64 size = kind->type == kInlineAttribute ? (inlineSize + 1) & ~u64{1} : kind->size;
        return size <= room ? static_cast<u32>(size) : 0;
    }
    const u32 keyUnits = KeyView(fileId, key).NameLength();
    if (kind->type == kFolderRecord || kind->type == kFileRecord) {
        return keyUnits != 0 && GetBe32(data + 8) >= 2 ? kind->size : 0;
    }
    const ThreadView thread(data, room);
    const bool isWhole = thread.IsValid() && keyUnits == 0 && thread.NameLength() != 0 &&
                         thread.NameLength() <= kCatalogKeys.longestName &&
                         GetBe16(data + 2) == 0 && thread.Parent() != 0;
    return isWhole ? thread.Size() : 0;
}

}  // namespace

bool CarveRecord(u32 fileId, const u8* bytes, u32 room, CarvedRecord* record) {
    if (room < kKeyLengthSize) {
        return false;
    }
    const u32 keySize = kKeyLengthSize + GetBe16(bytes);
    const u32 dataAt = (keySize + 1) & ~1u;
    if (dataAt >= room || !IsWholeKey(fileId, bytes, keySize)) {
        return false;
    }
    const u32 dataSize = DataSizeOf(fileId, bytes, bytes + dataAt, room - dataAt);
    *record = {bytes, keySize, bytes + dataAt, dataSize};
    return dataSize != 0;
}

void CarveAll(u32 fileId, const u8* bytes, u32 from, u32 to,
              const std::function<void(u32 at, const CarvedRecord&)>& visit) {
    CarvedRecord record;
    for (u32 at = (from + 1) & ~1u; at < to;) {
        if (CarveRecord(fileId, bytes + at, to - at, &record)) {
            visit(at, record);
            at += record.Size();
        } else {
            at += 2;
        }
    }
}

u32 TableStart(const u8* bytes, u32 nodeSize) {
    const u32 table = kSlot * (GetBe16(bytes + kDescNumRecords) + 1u);
    return nodeSize - std::min(table, nodeSize - kDescSize);
}

u32 GapStart(const u8* bytes, u32 nodeSize) {
    const u32 table = TableStart(bytes, nodeSize);
    return std::min<u32>(GetBe16(bytes + table), table);
}

bool IsLeafImage(const u8* bytes, u32 nodeSize) {
    const u32 count = GetBe16(bytes + kDescNumRecords);
    if (static_cast<s8>(bytes[kDescKind]) != kBTLeafNode || bytes[kDescHeight] != 1 || count == 0 ||
        count > (nodeSize - kDescSize) / kSlot - 1) {
        return false;
    }
    const u32 table = TableStart(bytes, nodeSize);
    u32 last = 0;
    for (u32 i = 0; i <= count; ++i) {
        const u32 offset = GetBe16(bytes + nodeSize - kSlot * (i + 1));
        if ((i == 0 && offset != kDescSize) || (i > 0 && offset <= last) || offset > table ||
            offset % 2 != 0) {
            return false;
        }
        last = offset;
    }
    return true;
}

}  // namespace VELK::tool
