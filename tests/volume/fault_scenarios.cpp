// The scenarios. Each changes as little as it needs to come to what its name says.
#include "fault_scenarios.h"

#include <gtest/gtest.h>

#include <cstring>

#include "hfs/volume/extents_key.h"
#include "hfs/volume/reservation.h"
#include "hfs/volume/wire.h"
#include "recording_device.h"

namespace VELK::test {

namespace {

constexpr u32 kFirstNumber = 1000;  // of MakeCutBase's records
constexpr u32 kNumberStep = 100;
constexpr u32 kRecords = 24;
constexpr u32 kOwnRecords = 6;  // root folder and the journal's files, with their threads
constexpr u32 kBadBlockFile = 5;

CBTreeHfs* Catalog(ImageVolume* volume) {
    return volume->Tree(kCatalogFileId, nullptr);
}

u32 UsedNodes(ImageVolume* volume) {
    return Catalog(volume)->header.totalNodes - Catalog(volume)->header.freeNodes;
}

u32 Depth(ImageVolume* volume) {
    return Catalog(volume)->header.treeDepth;
}

int Nothing(ImageVolume*) {
    return kOk;
}

int OpenTrees(ImageVolume* volume) {
    for (const u32 fileId : {kExtentsFileId, kCatalogFileId, kAttributesFileId}) {
        Problem problem;
        if (volume->HasTree(fileId) && volume->Tree(fileId, &problem) == nullptr) {
            return problem.status;
        }
    }
    return kOk;
}

int Committed(ImageVolume* volume, int status) {
    return status == kOk ? volume->Commit(0) : status;
}

// Repeats `step`, each time with a commit, up to the last one before `measure` changes.
int UpToTheLastBefore(ImageVolume* volume, int (*step)(ImageVolume*),
                      u32 (*measure)(ImageVolume*)) {
    const u32 before = measure(volume);
    for (u32 i = 0; i < 300; ++i) {
        const int status = step(volume);
        if (status != kOk) {
            return status;
        }
        if (measure(volume) != before) {
            volume->Restore();
            return kOk;
        }
        if (volume->Commit(0) != kOk) {
            return kErrVolumeIo;
        }
    }
    return kErrNotFound;
}

// A record between others; where, follows from how many there are, so that nothing is looked up.
int InsertBetween(ImageVolume* volume) {
    const u32 turn = Catalog(volume)->header.leafRecords;
    return InsertNumber(volume, kFirstNumber + kNumberStep * (turn % kRecords) + turn / kRecords);
}

// A record before all others: its key goes up to the root.
int InsertBeforeAll(ImageVolume* volume) {
    const CBTreeHfs* catalog = Catalog(volume);
    const u16 name = static_cast<u16>(0x4E00 - catalog->header.leafRecords);
    alignas(4) u8 key[kCatKeyName + 2] = {};
    const u16 keyLength = kCatKeyFixed + 2;
    const u16 nameLength = 1;
    std::memcpy(key, &keyLength, sizeof keyLength);
    std::memcpy(key + kCatKeyNameLength, &nameLength, sizeof nameLength);
    std::memcpy(key + kCatKeyName, &name, sizeof name);
    const u8 data[60] = {0xFF, 0xFF};
    return Catalog(volume)->InsertRecord(key, 0, data, sizeof data);
}

// The highest number there is; found with everything working.
u32 g_highest = 0;

int FindHighest(ImageVolume* volume, u32 from) {
    g_highest = from;
    while (g_highest > kFirstNumber && !HasNumber(volume, g_highest)) {
        g_highest -= 1;
    }
    return kOk;
}

int DeleteHighest(ImageVolume* volume) {
    return DeleteNumber(volume, g_highest);
}

// As high as it takes, and then emptied from the right until one deletion more would bring it down.
int PrepareCollapse(ImageVolume* volume) {
    const u32 depth = Depth(volume);
    int status = kOk;
    while (status == kOk && Depth(volume) == depth) {
        status = Committed(volume, InsertBetween(volume));
    }
    g_highest = kFirstNumber + kNumberStep * kRecords;
    const auto deleteNext = [](ImageVolume* on) {
        FindHighest(on, g_highest);
        return DeleteHighest(on);
    };
    return status == kOk ? UpToTheLastBefore(volume, deleteNext, Depth) : status;
}

int DeleteFirst(ImageVolume* volume) {
    const u32 gone = kOwnRecords + kRecords - Catalog(volume)->header.leafRecords;
    return DeleteNumber(volume, kFirstNumber + kNumberStep * gone);
}

int MakeAttributes(ImageVolume* volume) {
    return volume->CreateTree(kAttributesFileId, kMinNodeShift, nullptr);
}

int InsertAttribute(ImageVolume* volume) {
    alignas(4) u8 key[kAttrKeyName + 2] = {};
    const u16 keyLength = kAttrKeyFixed + 2;
    const u32 fileId = 40;
    const u16 nameLength = 1;
    const u16 name = u'n';
    std::memcpy(key, &keyLength, sizeof keyLength);
    std::memcpy(key + kAttrKeyFileId, &fileId, sizeof fileId);
    std::memcpy(key + kAttrKeyNameLength, &nameLength, sizeof nameLength);
    std::memcpy(key + kAttrKeyName, &name, sizeof name);
    const u32 record[6] = {0x10, 0, 0, 8, 1, 2};  // inline, of eight bytes
    return volume->Tree(kAttributesFileId, nullptr)
        ->InsertRecord(key, fileId, record, sizeof record);
}

int Iterate(ImageVolume* volume) {
    HfsFindData path;
    alignas(4) u8 key[kMaxKeyLength + kKeyLengthSize] = {};
    alignas(4) u8 data[4096];
    const u16 keyLength = kCatKeyFixed;
    std::memcpy(key, &keyLength, sizeof keyLength);
    bool found = false;
    int status = Catalog(volume)->FindEntry(reinterpret_cast<BTreeKey*>(key), 0, &path, &found,
                                            nullptr, nullptr, nullptr, nullptr);
    for (int step = 0; status == kOk; step = 1) {
        unsigned size = 0;
        unsigned keySize = 0;
        status = Catalog(volume)->IncPos(step, data, sizeof data, &size, key, sizeof key, &keySize,
                                         &path);
    }
    path.ClearPath();
    return status == kErrNotFound ? kOk : status;
}

int AddBadBlocks(ImageVolume* volume) {
    int status = kOk;
    for (u32 i = 0; i < 12 && status == kOk; ++i) {
        const ExtentsKey key(kBadBlockFile, 8 * i);
        u8 extents[kExtentRecordSize] = {};
        for (u32 k = 0; k < kExtentCount; ++k) {
            StoreBe32(extents + 8 * k, 100 + 20 * i + 2 * k);
            StoreBe32(extents + 8 * k + 4, 1);
        }
        status = volume->Tree(kExtentsFileId, nullptr)
                     ->InsertRecord(key.bytes, kBadBlockFile, extents, sizeof extents);
    }
    return status;
}

int LoadBadBlocks(ImageVolume* volume) {
    HfsRuns runs;
    return volume->Tree(kExtentsFileId, nullptr)->LoadBadBlocks(&runs);
}

int Grow(ImageVolume* volume, u32 fileId, u32 nodes) {
    CBTreeHfs* tree = volume->Tree(fileId, nullptr);
    return tree->ExtendBTree(tree->header.totalNodes + nodes, nullptr, nullptr);
}

int ReserveAndInsert(ImageVolume* volume) {
    Reservation reservation(Catalog(volume));
    const int status = reservation.Reserve(4, 0);
    return status == kOk ? InsertBetween(volume) : status;
}

// What `log` left of a volume when the power went as soon as the first transaction counted: its
// copies had been synced, and then the journal's header.
std::vector<u8> CutBeforeAnyPlace(const std::vector<u8>& base,
                                  const std::vector<DeviceEvent>& log) {
    auto device = DeviceWith(base);
    u32 syncs = 0;
    for (auto event = log.begin(); event != log.end() && syncs < 2; ++event) {
        if (event->isSync) {
            syncs += 1;
        } else {
            EXPECT_TRUE(
                device->Write(event->offset, event->bytes.data(), event->bytes.size()).Ok());
        }
    }
    EXPECT_NE(0u, JournalOf(device.get()).header.Used());
    return BytesOf(device.get());
}

}  // namespace

const FaultScenario kFaultScenario[kFaultScenarios] = {
    {"Open", MakeAttributes, Nothing, OpenTrees, 0, true},
    {"FirstInsertion", MakeAttributes, OpenTrees,
     [](ImageVolume* volume) { return Committed(volume, InsertAttribute(volume)); }},
    {"Insertion", Nothing, OpenTrees,
     [](ImageVolume* volume) { return Committed(volume, InsertNumber(volume, 9999)); }},
    {"Update", Nothing, OpenTrees,
     [](ImageVolume* volume) {
         return Committed(volume, UpdateNumber(volume, kFirstNumber + kNumberStep, 0x55));
     }},
    {"Deletion", Nothing, OpenTrees,
     [](ImageVolume* volume) {
         return Committed(volume, DeleteNumber(volume, kFirstNumber + kNumberStep));
     }},
    {"Create", Nothing, OpenTrees,
     [](ImageVolume* volume) { return Committed(volume, MakeAttributes(volume)); }},
    {"Split",
     [](ImageVolume* volume) { return UpToTheLastBefore(volume, InsertBetween, UsedNodes); },
     OpenTrees, [](ImageVolume* volume) { return Committed(volume, InsertBetween(volume)); }},
    {"RootSplit",
     [](ImageVolume* volume) { return UpToTheLastBefore(volume, InsertBetween, Depth); }, OpenTrees,
     [](ImageVolume* volume) { return Committed(volume, InsertBetween(volume)); }},
    {"BothSeparators",
     [](ImageVolume* volume) { return UpToTheLastBefore(volume, InsertBeforeAll, UsedNodes); },
     OpenTrees, [](ImageVolume* volume) { return Committed(volume, InsertBeforeAll(volume)); }},
    {"GrowthWithMapNodes", Nothing, OpenTrees,
     [](ImageVolume* volume) { return Committed(volume, Grow(volume, kCatalogFileId, 8)); }, 2046},
    {"DeletionOfALeaf",
     [](ImageVolume* volume) { return UpToTheLastBefore(volume, DeleteFirst, UsedNodes); },
     OpenTrees, [](ImageVolume* volume) { return Committed(volume, DeleteFirst(volume)); }},
    {"DeletionWithCollapse", PrepareCollapse,
     [](ImageVolume* volume) {
         const int status = OpenTrees(volume);
         return status == kOk ? FindHighest(volume, kFirstNumber + kNumberStep * kRecords) : status;
     },
     [](ImageVolume* volume) { return Committed(volume, DeleteHighest(volume)); }},
    {"Iteration", Nothing, OpenTrees, Iterate},
    {"BadBlocks", AddBadBlocks, OpenTrees, LoadBadBlocks},
    {"ReservedInsertion", Nothing, OpenTrees,
     [](ImageVolume* volume) { return Committed(volume, ReserveAndInsert(volume)); }},
    {"SeveralTrees", MakeAttributes, OpenTrees,
     [](ImageVolume* volume) {
         int status = InsertBetween(volume);
         status = status == kOk ? InsertAttribute(volume) : status;
         return Committed(volume, status == kOk ? Grow(volume, kExtentsFileId, 1) : status);
     }},
    {"Flush", Nothing,
     [](ImageVolume* volume) {
         const int status = OpenTrees(volume);
         return status == kOk ? InsertBetween(volume) : status;
     },
     [](ImageVolume* volume) { return volume->Commit(0); }},
    {"FlushWithZeroing", Nothing,
     [](ImageVolume* volume) {
         const int status = OpenTrees(volume);
         return status == kOk ? MakeAttributes(volume) : status;
     },
     [](ImageVolume* volume) { return volume->Commit(4); }},
    {"Restore", Nothing,
     [](ImageVolume* volume) {
         const int status = OpenTrees(volume);
         return status == kOk ? InsertBetween(volume) : status;
     },
     [](ImageVolume* volume) {
         volume->Restore();
         return volume->IsWritable() ? kOk : kErrVolumeReadOnly;
     }},
    {"Replay", MakeAttributes, Nothing, nullptr},
};

std::vector<u8> MakeFaultBase(const FaultScenario& scenario) {
    CutBaseShape shape;
    shape.records = kRecords;
    shape.size = 112 << 10;
    if (scenario.catalogNodes != 0) {
        shape.size = 1536 << 10;
        shape.journalSize = 64 << 10;
        shape.catalogNodes = scenario.catalogNodes;
    }
    const CutBase base = MakeCutBase(shape);
    auto device = DeviceWith(base.bytes);
    std::vector<DeviceEvent> log;
    RecordingDevice recorder(device.get(), &log);
    Problem problem;
    auto volume = MountOn(&recorder, Writing(), &problem);
    EXPECT_NE(nullptr, volume) << problem.Text();
    EXPECT_EQ(kOk, Committed(volume.get(), scenario.prepare(volume.get()))) << scenario.name;
    EXPECT_EQ(kOk, volume->Close());
    volume.reset();
    return Mounts(scenario) ? CutBeforeAnyPlace(base.bytes, log) : BytesOf(device.get());
}

}  // namespace VELK::test
