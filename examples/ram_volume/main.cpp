// Uses the engine on the volume in memory: creates an attributes tree, inserts a thousand records,
// writes them out, opens the tree again and looks every record up. Exit status 0: all went well.
#include <cstdio>
#include <cstring>

#include "hfs/treehfs.h"
#include "hfs/volume/convert.h"
#include "ram_volume.h"

using namespace VELK;

namespace {

constexpr unsigned kRecords = 1000;
constexpr unsigned kNodeShift = 11;  // nodes of 2,048 bytes
constexpr unsigned kValueSize = 8;

// The key of attribute "note" of a file, in host order, aligned as the engine asks.
struct alignas(4) AttributeKey {
    u16 keyLength;
    u16 pad;
    u32 fileId;
    u32 startBlock;
    u16 nameLength;
    u16 name[4];
};

AttributeKey KeyOf(u32 fileId) {
    return {kAttrKeyFixed + 8, 0, fileId, 0, 4, {'n', 'o', 't', 'e'}};
}

// An inline attribute in host order: type 0x10, two reserved words, the value's size, the value.
struct Attribute {
    u32 type;
    u32 reserved[2];
    u32 size;
    u8 value[kValueSize];
};

// Room for any record of the tree: a caller cannot know what lies there (see minDataBuffer).
union AnyAttribute {
    Attribute found;
    u8 bytes[4096];
};

void Prepare(CBTreeHfs* tree, RamVolume* volume) {
    tree->volume = &volume->fs;
    tree->fileId = kAttributesFileId;
    tree->convert = ConvertFor(kAttributesFileId);
}

int Fill(RamVolume* volume) {
    CBTreeHfs tree;
    Prepare(&tree, volume);
    int status = tree.Create(kNodeShift, 0, nullptr);
    for (u32 i = 0; i < kRecords && status == kOk; ++i) {
        const u32 fileId = 16 + i * 37 % kRecords;  // every one of them, in no order
        const AttributeKey key = KeyOf(fileId);
        Attribute record = {0x10, {}, kValueSize, {}};
        std::memcpy(record.value, &fileId, sizeof fileId);
        status = tree.InsertRecord(&key, fileId, &record, sizeof record);
    }
    if (status == kOk) {
        status = tree.Flush(0);
    }
    std::printf("created: depth %u, %u records, %u of %u nodes free\n", tree.header.treeDepth,
                tree.header.leafRecords, tree.header.freeNodes, tree.header.totalNodes);
    tree.Dtor();
    return status;
}

int LookUp(RamVolume* volume) {
    CBTreeHfs tree;
    Prepare(&tree, volume);
    int status = tree.Init();
    u32 found = 0;
    for (u32 fileId = 16; fileId < 16 + kRecords && status == kOk; ++fileId) {
        const AttributeKey key = KeyOf(fileId);
        AnyAttribute buffer = {};
        unsigned size = 0;
        status = tree.FindRecord(&key, fileId, &buffer, sizeof buffer, &size, nullptr);
        u32 value = 0;
        std::memcpy(&value, buffer.found.value, sizeof value);
        found += status == kOk && size == sizeof buffer.found && value == fileId ? 1 : 0;
    }
    std::printf("opened again: %u of %u records found\n", found, kRecords);
    tree.Dtor();
    return status == kOk && found != kRecords ? kErrNotFound : status;
}

}  // namespace

int main() {
    RamVolume volume;
    int status = Fill(&volume);
    if (status == kOk) {
        status = LookUp(&volume);
    }
    if (status != kOk || volume.lentBlocks != 0) {
        std::printf("status %08X, %u blocks still lent\n", static_cast<unsigned>(status),
                    volume.lentBlocks);
        return 1;
    }
    return 0;
}
