// Puts records into a tree on the safe volume, each in a commit of its own.
//
// usage: safe_volume FILE [WRITES]: FILE is made or gone on with; before write number WRITES the
// power goes off (exit status 99). Each commit that has returned prints its number: whatever
// happens, the next run finds that many records or one more, and no gap.
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "hfs/volume/convert.h"
#include "safe_volume.h"

using namespace VELK;

namespace {

constexpr u32 kRecords = 60;
constexpr u32 kFirstFile = 16;

// The key of attribute "note" of a file, in host order, aligned as the engine asks.
struct alignas(4) AttributeKey {
    u16 keyLength;
    u16 pad;
    u32 fileId;
    u32 startBlock;
    u16 nameLength;
    u16 name[4];
};

AttributeKey KeyOf(u32 i) {
    return {kAttrKeyFixed + 8, 0, kFirstFile + i, 0, 4, {'n', 'o', 't', 'e'}};
}

// An inline attribute in host order.
struct Attribute {
    u32 type;
    u32 reserved[2];
    u32 size;
    u32 value[12];
};

// How many records there are from the first on without a gap; more than the tree holds: never.
u32 CountRecords(CBTreeHfs* tree) {
    u32 count = 0;
    int status = kOk;
    while (status == kOk) {
        const AttributeKey key = KeyOf(count);
        alignas(8) u8 record[4096];
        unsigned size = 0;
        status = tree->FindRecord(&key, key.fileId, record, sizeof record, &size, nullptr);
        count += status == kOk ? 1 : 0;
    }
    return status == kErrNotFound && count == tree->header.leafRecords ? count : ~u32{0};
}

int Add(SafeVolume* volume, CBTreeHfs* tree, u32 i) {
    const AttributeKey key = KeyOf(i);
    const Attribute record = {0x10, {}, sizeof record.value, {i}};
    const int status = tree->InsertRecord(&key, key.fileId, &record, sizeof record);
    if (status != kOk) {
        volume->Abort(tree);
        return status;
    }
    return volume->Commit(tree);
}

}  // namespace

int main(int count, char** words) {
    if (count < 2) {
        std::fprintf(stderr, "usage: safe_volume FILE [WRITES]\n");
        return 16;
    }
    SafeVolume volume(words[1], count > 2 ? std::atol(words[2]) : -1);
    if (!volume.IsOpen()) {
        std::perror(words[1]);
        return 8;
    }
    CBTreeHfs tree;
    tree.volume = &volume.fs;
    tree.fileId = kAttributesFileId;
    tree.convert = ConvertFor(kAttributesFileId);
    const bool isNew = volume.IsNew();
    int status = isNew ? tree.Create(kMinNodeShift + 1, 0, nullptr) : tree.Init();
    u32 found = status == kOk ? CountRecords(&tree) : ~u32{0};
    std::printf("found %u\n", found);
    std::fflush(stdout);
    for (; status == kOk && found < kRecords; ++found) {
        status = Add(&volume, &tree, found);
        if (status == kOk) {
            std::printf("committed %u\n", found + 1);
            std::fflush(stdout);
        }
    }
    tree.Dtor();
    return status == kOk && found == kRecords && volume.lentBlocks == 0 ? 0 : 1;
}
