// The owners of an allocation block: special files, forks of the catalog, runs of the extents tree
// (the bad-block file among them), forks of attributes.
#include "tool/block_owner.h"

#include "hfs/records/json_writer.h"
#include "tool/catalog_list.h"
#include "tool/errors.h"
#include "tool/leaf_cursor.h"

namespace VELK::tool {

namespace {

struct Owner {
    std::string what;   // "/dir/file, data fork"
    u64 fileBlock = 0;  // the block's place in the fork
};

// Place of `block` in the eight extents at `extents`, which begin at fork block `first`.
std::optional<u64> PlaceIn(const u8* extents, u64 first, u64 block) {
    for (u32 i = 0; i < kExtentCount; ++i) {
        const u64 start = GetBe32(extents + 8 * i);
        const u64 count = GetBe32(extents + 8 * i + 4);
        if (count == 0) {
            break;
        }
        if (block >= start && block < start + count) {
            return first + (block - start);
        }
        first += count;
    }
    return std::nullopt;
}

void AddSpecialFiles(Session* session, u64 block, std::vector<Owner>* owners) {
    for (const u32 fileId :
         {kExtentsFileId, kCatalogFileId, kAllocationFileId, kStartupFileId, kAttributesFileId}) {
        u64 first = 0;
        for (const HfsExtent& extent : session->Volume().ForkExtents(fileId)) {
            if (block >= extent.startBlock && block < u64{extent.startBlock} + extent.blockCount) {
                owners->push_back(
                    {std::string(ForkName(fileId)) + " file", first + block - extent.startBlock});
            }
            first += extent.blockCount;
        }
    }
    const VolumeHeader& header = session->Volume().Header();
    const u64 firstByte = block * header.blockSize;
    const u64 volumeBytes = u64{header.totalBlocks} * header.blockSize;
    if (firstByte < kHeaderOffset + kHeaderSize) {
        owners->push_back({"volume header", block});
    }
    if (firstByte + header.blockSize > volumeBytes - kAltHeaderFromEnd) {
        owners->push_back({"alternate volume header", 0});
    }
}

void AddCatalogForks(Session* session, const Invocation& call, u64 block,
                     std::vector<Owner>* owners) {
    ListScope scope;
    scope.recursive = true;
    scope.all = true;
    ListCatalog(session, call, scope, [&](const ListedItem& listed) {
        if (listed.item.IsFolder()) {
            return true;
        }
        for (const bool isData : {true, false}) {
            const u8* fork = isData ? listed.item.DataFork() : listed.item.ResourceFork();
            if (const auto place = PlaceIn(fork + 16, 0, block)) {
                owners->push_back({*listed.folderPath + NameText(listed.name, listed.nameLength) +
                                       (isData ? ", data fork" : ", resource fork"),
                                   *place});
            }
        }
        return true;
    });
}

void AddOverflow(Session* session, const Invocation& call, u64 block, std::vector<Owner>* owners) {
    if (!session->Volume().HasTree(kExtentsFileId)) {
        return;
    }
    LeafCursor cursor(session, kExtentsFileId, call.keepGoing);
    cursor.SeekFirst();
    LeafRecord record;
    while (cursor.Next(&record)) {
        const u32 fileId = GetBe32(record.key + kExtKeyFileId);
        const bool isSpecial = fileId == kCatalogFileId || fileId == kAllocationFileId ||
                               fileId == kStartupFileId || fileId == kAttributesFileId;
        if (record.dataSize < kExtentRecordSize || isSpecial) {
            continue;
        }
        const auto place = PlaceIn(record.data, GetBe32(record.key + kExtKeyStartBlock), block);
        if (!place) {
            continue;
        }
        FoundItem item;
        std::string what = "file " + std::to_string(fileId);
        if (fileId == kBadBlockFileId) {
            what = "bad-block file";
        } else if (FindItemById(session, fileId, &item)) {
            FolderTable folders(session, NameForm::kText);
            FolderTable::Place unused;
            what = folders.PathOf(item.parent, &unused) +
                   NameText(item.name.data(), item.NameLength());
        }
        const bool isResource = record.key[kExtKeyForkType] == kForkResource;
        owners->push_back({what + (isResource ? ", resource fork" : ", data fork"), *place});
    }
}

void AddAttributeForks(Session* session, const Invocation& call, u64 block,
                       std::vector<Owner>* owners) {
    if (!session->Volume().HasTree(kAttributesFileId)) {
        return;
    }
    LeafCursor cursor(session, kAttributesFileId, call.keepGoing);
    cursor.SeekFirst();
    LeafRecord record;
    while (cursor.Next(&record)) {
        const u32 type = record.dataSize >= 4 ? GetBe32(record.data) : 0;
        std::optional<u64> place;
        if (type == kForkAttribute && record.dataSize >= kForkAttributeSize) {
            place = PlaceIn(record.data + 24, 0, block);
        } else if (type == kExtentsAttribute && record.dataSize >= kExtentsAttributeSize) {
            place = PlaceIn(record.data + 8, GetBe32(record.key + kAttrKeyStartBlock), block);
        }
        if (place) {
            owners->push_back({"attribute " + KeyText(kAttributesFileId, record.key, record.keySize,
                                                      Blanks::kPlain),
                               *place});
        }
    }
}

}  // namespace

int FindBlock(Session* session, Invocation* call, u64 block) {
    const VolumeHeader& header = session->Volume().Header();
    if (block >= header.totalBlocks) {
        ThrowArgument(
            session->Image(),
            fmt::format("block {}: the volume has blocks 0..{}", block, header.totalBlocks - 1),
            "");
    }
    std::vector<Owner> owners;
    AddSpecialFiles(session, block, &owners);
    AddCatalogForks(session, *call, block, &owners);
    AddOverflow(session, *call, block, &owners);
    AddAttributeForks(session, *call, block, &owners);
    if (call->json) {
        std::string text;
        JsonWriter json(&text);
        json.BeginObject();
        json.Member("schema", "treehfs.find.block/1");
        json.Member("block", block);
        json.Key("owners");
        json.BeginArray();
        for (const Owner& owner : owners) {
            json.BeginObject();
            json.Member("owner", owner.what);
            json.Member("file_block", owner.fileBlock);
            json.EndObject();
        }
        json.EndArray();
        json.EndObject();
        call->out.Write(text + "\n");
    } else {
        for (const Owner& owner : owners) {
            call->out.Print("block {}: {}, block {} of it\n", block, EscapedText(owner.what),
                            owner.fileBlock);
        }
    }
    if (owners.empty() && !call->json) {
        call->out.Print("block {}: nobody's\n", block);
    }
    return owners.empty() ? kExitNo : kExitDone;
}

}  // namespace VELK::tool
