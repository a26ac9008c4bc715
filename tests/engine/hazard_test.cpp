// Damage and requests at the ends of their range that no other file of these tests goes through
// value by value: each call ends with a status, within its bounds, and leaves the books in order.
#include <climits>

#include "fault_service.h"
#include "tree_test.h"

namespace VELK::test {
namespace {

constexpr u32 kNodeSize = 512;

// Leaves of `recordsPerLeaf` records under index nodes of three.
TreeImage SmallTreeOf(u32 fileId, u32 records, u32 recordsPerLeaf, u32 dataSize) {
    TreeShape shape;
    shape.fileId = fileId;
    shape.nodeSize = kNodeSize;
    shape.recordsPerLeaf = recordsPerLeaf;
    shape.childrenPerIndex = 3;
    shape.clumpSize = kNodeSize;
    return BuildTree(shape, NthRecords(fileId, records, dataSize));
}

void ExpectBooksInOrder(TreeOnVolume* tree, const std::string& when, u32 heldByCallers = 0) {
    EXPECT_TRUE(LedgerHolds(**tree, References((*tree)->findData) + heldByCallers)) << when;
    EXPECT_TRUE(tree->Volume().breaches.empty()) << when;
}

// A path at the nth record.
void Stand(TreeOnVolume* tree, u32 n, HfsFindData* path) {
    const HostKey key = NthHostKey(tree->FileId(), n);
    bool found = false;
    ASSERT_EQ(kOk,
              (*tree)->FindEntry(key, key.id, path, &found, nullptr, nullptr, nullptr, nullptr));
    ASSERT_TRUE(found);
}

// The data of a record, or the status that kept it from being read.
struct ReadBack {
    int status;
    Bytes data;
};
ReadBack Read(TreeOnVolume* tree, const HostKey& key) {
    Bytes data((*tree)->header.nodeSize);
    unsigned size = 0;
    HfsFindData path;
    const int status = (*tree)->FindRecord(key, key.id, data.data(),
                                           static_cast<unsigned>(data.size()), &size, &path);
    path.ClearPath();
    data.resize(status == kOk ? size : 0);
    return {status, data};
}

// What is read of `size` bytes of data: records have even lengths.
Bytes Stored(u32 size, u32 n) {
    Bytes data = Pattern(size, n);
    data.resize((size + 1) / 2 * 2);
    return data;
}

TreeImage FewRecordsIn(u32 nodeSize) {
    TreeShape shape;
    shape.nodeSize = nodeSize;
    shape.freeNodes = 16;
    shape.clumpSize = nodeSize;
    return BuildTree(shape, NthRecords(kCatalogFileId, 3, 20));
}

}  // namespace

// Index keys of the extents tree have the length that the header states, which nothing checks when
// the tree opens: it decides what is copied into separators.
TEST(ChangeHazard, IndexKeysOfAnyLengthTheHeaderStates) {
    const TreeImage sound = SmallTreeOf(kExtentsFileId, 30, 4, kExtentRecordSize);
    for (const u32 stated : {0u, 1u, 9u, 11u, 12u, 255u, 511u, 519u, 520u, 521u, 32768u, 65535u}) {
        for (const u32 mapBlock : {512u, kNodeSize}) {
            TreeImage image = sound;
            image.Patch16(0, kHeadMaxKeyLength, stated);
            TreeOnVolume tree(image, mapBlock);
            ASSERT_EQ(tree.OpenStatus(), kOk);
            for (u32 n = 0; n < 30; ++n) {
                tree.InsertNth(n, kExtentRecordSize, true);
                tree.DeleteNth(29 - n);
            }
            ExpectBooksInOrder(&tree, "key length " + std::to_string(stated));
        }
    }
}

// A node in use whose bit is clear is handed out again; whoever held it then finds it empty.
TEST(ChangeHazard, EachMapBitClearInTurn) {
    const TreeImage sound = SmallTreeOf(kCatalogFileId, 40, 4, 60);
    const u32 used = sound.totalNodes - sound.freeNodes;
    for (u32 n = 0; n < used; ++n) {
        TreeImage image = sound;
        const Bytes header = image.Node(0);
        image.Patch8(0, kHeadMapRecord + n / 8,
                     header[kHeadMapRecord + n / 8] & ~(0x80u >> (n % 8)));
        image.Patch32(0, kHeadFreeNodes, sound.freeNodes + 1);
        TreeOnVolume tree(image, kNodeSize);
        ASSERT_EQ(tree.OpenStatus(), kOk);
        u32 refused = 0;
        for (u32 record = 0; record < 40; ++record) {
            refused += tree.InsertNth(record, 60, true) != kOk ? 1u : 0u;
        }
        for (u32 record = 0; record < 40; ++record) {
            refused += tree.DeleteNth(record) != kOk ? 1u : 0u;
        }
        EXPECT_GT(refused, 0u) << "node " << n;
        ExpectBooksInOrder(&tree, "bit of node " + std::to_string(n));
    }
}

// A leaf that goes changes its neighbours. One that does not link back, stands on another level or
// does not exist is left as it is, and so is the whole deletion's outcome: refused.
TEST(ChangeHazard, AnyNodeAsTheNeighbourOfALeafThatGoes) {
    const TreeImage sound = SmallTreeOf(kCatalogFileId, 9, 1, 60);
    const u32 middle = sound.levels[1][4];
    for (const u32 link : {kDescFLink, kDescBLink}) {
        const u32 right = Get32(sound.Node(middle), link);
        const u32 left = Get32(sound.Node(middle), kDescBLink);  // done before the right one
        for (u32 target = 1; target < sound.totalNodes + 2; ++target) {
            if (target == right) {
                continue;
            }
            TreeImage image = sound;
            image.Patch32(middle, link, target);
            TreeOnVolume tree(image, kNodeSize);
            ASSERT_EQ(tree.OpenStatus(), kOk);
            const int status = tree.DeleteNth(4);
            EXPECT_TRUE(status == kErrInvalid || status == kErrCorrupt) << target;
            if (target < sound.totalNodes && target != middle && target != left) {
                EXPECT_EQ(image.Node(target), tree.Node(target)) << target;
            }
            ExpectBooksInOrder(&tree, "neighbour " + std::to_string(target));
        }
    }
}

TEST(ChangeHazard, StepsOfAnyDistanceEnd) {
    const TreeImage image = SmallTreeOf(kCatalogFileId, 9, 2, 8);
    TreeOnVolume tree(image, kNodeSize);
    const HostKey key = NthHostKey(kCatalogFileId, 4);
    for (const int distance : {INT_MIN, INT_MIN + 1, -1000, 1000, INT_MAX - 1, INT_MAX}) {
        HfsFindData path;
        bool found = false;
        ASSERT_EQ(kOk,
                  tree->FindEntry(key, key.id, &path, &found, nullptr, nullptr, nullptr, nullptr));
        u8 record[64];
        alignas(8) u8 keyOut[kKeyLengthSize + kMaxKeyLength];
        unsigned size = 0;
        unsigned keySize = 0;
        EXPECT_EQ(kErrNotFound, tree->IncPos(distance, record, sizeof record, &size, keyOut,
                                             sizeof keyOut, &keySize, &path))
            << distance;
        path.ClearPath();
        EXPECT_TRUE(tree.capture.Take().empty()) << distance;
    }
    ExpectBooksInOrder(&tree, "far steps");
}

// Nodes of two map blocks at most are what volumes of the usual node sizes have.
TEST(ChangeHazard, DataOfEverySizeInNodesOfTwoBlocksIsReadBack) {
    struct {
        u32 nodeSize, mapBlock, step;
    } const geometries[] = {{512, 512, 1}, {1024, 512, 1}, {4096, 2048, 37}, {8192, 4096, 101}};
    for (const auto& [nodeSize, mapBlock, step] : geometries) {
        const TreeImage image = FewRecordsIn(nodeSize);
        u32 stored = 0;
        for (u32 size = 1; size <= nodeSize; size += step) {
            TreeOnVolume tree(image, mapBlock);
            const int status = tree.InsertNth(1, size, true);
            if (status != kOk) {
                EXPECT_TRUE(status == kErrTooLarge || status == kErrInvalid) << size;
                // The halves of a split hold a neighbour each: there is room for two records.
                EXPECT_GT(size, nodeSize - 128) << "refused although there is room";
                continue;
            }
            ++stored;
            const ReadBack read = Read(&tree, NthHostKey(kCatalogFileId, 1, true));
            EXPECT_EQ(read.status, kOk) << size;
            EXPECT_EQ(read.data, Stored(size, 1)) << size;
            for (u32 n = 0; n < 3; ++n) {
                EXPECT_EQ(Read(&tree, NthHostKey(kCatalogFileId, n)).data, Pattern(20, n)) << size;
            }
        }
        EXPECT_GT(stored, 40u) << nodeSize;
    }
}

// Data may start anywhere in a block, so up to two blocks and two bytes of it lie in three at most.
// More of it is stored, and told of when it cannot be followed: no reader gets a part for the
// whole.
TEST(ChangeHazard, DataOverMoreThanThreeBlocksIsToldOfWhenItIsRead) {
    constexpr u32 kAlwaysRead = 2 * 512 + 2;
    const TreeImage image = FewRecordsIn(8192);
    u32 unread = 0;
    for (u32 size = 900; size < 2200; size += 2) {
        TreeOnVolume tree(image, 512);
        ASSERT_EQ(kOk, tree.InsertNth(1, size, true)) << size;
        tree.capture.Take();
        const ReadBack read = Read(&tree, NthHostKey(kCatalogFileId, 1, true));
        if (read.status == kOk) {
            EXPECT_EQ(read.data, Stored(size, 1)) << size;
            continue;
        }
        ++unread;
        EXPECT_EQ(read.status, kErrCorrupt);
        EXPECT_GT(size, kAlwaysRead);
        const Events reports = tree.capture.Of(Event::Kind::kReport);
        ASSERT_FALSE(reports.empty());
        EXPECT_EQ(reports[0], Reported(kReasonNode, 9007)) << size;
    }
    EXPECT_GT(unread, 100u);
}

// Nobody tells a path of changes made beside it. It may then skip records or see some twice, but it
// ends, stays in the tree, and holds what it says it holds.
TEST(ChangeHazard, PathBesideEveryChangeStepsOnAndEnds) {
    constexpr u32 kRecords = 12;
    const TreeImage image = SmallTreeOf(kCatalogFileId, kRecords, 3, 100);
    for (u32 at = 0; at < kRecords; ++at) {
        for (u32 change = 0; change < 3 * kRecords; ++change) {
            const u32 n = change / 3;
            const int direction = change % 2 == 0 ? 1 : -1;
            TreeOnVolume tree(image, kNodeSize);
            HfsFindData path;
            Stand(&tree, at, &path);
            if (change % 3 == 0) {
                ASSERT_EQ(kOk, tree.DeleteNth(n));
            } else if (change % 3 == 1) {
                ASSERT_EQ(kOk, tree.InsertNth(n, 200, true));
            } else {
                for (u32 other = 0; other < kRecords; ++other) {
                    ASSERT_EQ(kOk, tree.DeleteNth((n + other) % kRecords));
                }
            }
            u8 record[512];
            unsigned size = 0;
            u32 steps = 0;
            int status = kOk;
            while (status == kOk && steps <= 2 * kRecords) {
                status = tree->IncPos(direction, record, sizeof record, &size, nullptr, 0, nullptr,
                                      &path);
                ++steps;
            }
            EXPECT_LE(steps, kRecords + 2) << at << ' ' << change;
            EXPECT_TRUE(status == kErrNotFound || status == kErrInvalid || status == kErrCorrupt)
                << std::hex << status;
            ExpectBooksInOrder(&tree, "path beside a change", References(path));
            path.ClearPath();
        }
    }
}

// Separators may lie below the first keys they stand for, above the last keys before them: some
// writers leave them behind when a first record goes. Keys in the gap between are led to the node
// on the right, and have to be found wherever the record went.
TEST(ChangeHazard, SeparatorsBelowTheirFirstKeysLoseNoRecord) {
    constexpr u32 kRecords = 60;
    constexpr u32 kStep = 100;
    const auto key_of = [](u32 id) { return HostCatKey(id, u"k"); };
    u32 seed = 1;
    for (u32 round = 0; round < 30; ++round) {
        TreeShape shape;
        shape.nodeSize = kNodeSize;
        shape.recordsPerLeaf = 3 + round % 3;
        shape.childrenPerIndex = 3;
        shape.freeNodes = 40;
        shape.clumpSize = kNodeSize;
        std::vector<TreeRecord> records;
        for (u32 n = 0; n < kRecords; ++n) {
            records.push_back({DiskCatKey((n + 1) * kStep, u"k"), Pattern(60, n)});
        }
        TreeImage image = BuildTree(shape, records);
        for (u32 level = 2; level <= image.depth; ++level) {
            for (const u32 number : image.levels[level]) {
                const Bytes node = image.Node(number);
                for (u32 slot = 0; slot < Get16(node, kDescNumRecords); ++slot) {
                    const u32 parent = Get16(node, kNodeSize - 2 * slot - 2) + kCatKeyParentId;
                    const u32 lower = 20 * (level - 1);  // nearer the root, lower
                    image.Patch32(number, parent, Get32(node, parent) - lower);
                }
            }
        }
        TreeOnVolume tree(image, kNodeSize);
        ASSERT_EQ(tree.OpenStatus(), kOk);
        std::vector<u32> ids;
        for (u32 n = 0; n < kRecords; ++n) {
            ids.push_back((n + 1) * kStep);
        }
        for (u32 change = 0; change < 60; ++change) {
            seed = seed * 1664525 + 1013904223;
            const u32 id = (seed >> 8) % kRecords * kStep + kStep - 1 - (seed >> 24) % 90;
            const int status = tree.Insert(key_of(id), Pattern(20 + (seed >> 16) % 180, id));
            ASSERT_TRUE(status == kOk || status == kErrExists) << status;
            if (status == kOk) {
                ids.push_back(id);
            }
            for (const u32 known : ids) {
                ASSERT_EQ(kOk, Read(&tree, key_of(known)).status)
                    << known << " after " << id << " in round " << round;
            }
        }
    }
}

// The order a volume keeps when a change fails under two paths of its callers: paths first, then
// the restore. Both paths serve again afterwards.
TEST(ChangeHazard, PathsOfCallersDroppedBeforeTheRestoreServeAgain) {
    const TreeImage image = SmallTreeOf(kCatalogFileId, 24, 3, 100);
    bool failed = true;
    u32 nth = 1;
    for (; failed; ++nth) {
        TreeOnVolume tree(image, kNodeSize);
        const MemVolume::Snapshot before = tree.Volume().Save();
        HfsFindData paths[2];
        Stand(&tree, 10, &paths[0]);
        Stand(&tree, 23, &paths[1]);
        {
            FaultService faults(&tree.Volume().fs);
            faults.FailAny(nth);
            const int status = tree.InsertNth(10, 200, true);
            failed = faults.HasFailed();
            EXPECT_EQ(status, failed ? kFaultStatus : kOk) << nth;
        }
        ExpectBooksInOrder(&tree, "after the failure", References(paths[0]) + References(paths[1]));
        for (HfsFindData& path : paths) {
            path.ClearPath();
            path.valid = false;
        }
        tree->findData.ClearPath();
        tree->RestoreModifiedNodes();
        tree.Volume().Restore(before);
        ExpectBooksInOrder(&tree, "after the restore");
        Stand(&tree, 10, &paths[0]);
        Stand(&tree, 23, &paths[1]);
        paths[0].ClearPath();
        paths[1].ClearPath();
        EXPECT_EQ(kOk, tree.InsertNth(10, 200, true));
        EXPECT_TRUE(IsSound(tree.Flushed()));
    }
    EXPECT_GT(nth, 6u);
}

}  // namespace VELK::test
