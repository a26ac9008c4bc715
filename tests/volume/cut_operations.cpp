// Insertions, deletions, growth and the like on small trees.
#include "cut_operations.h"

#include <gtest/gtest.h>

namespace VELK::test {

namespace {

constexpr u32 kFirstNumber = 1000;
constexpr u32 kNumberStep = 100;

u32 Middle(const CutVolume& on) {
    auto at = on.numbers.begin();
    std::advance(at, static_cast<std::ptrdiff_t>(on.numbers.size() / 2));
    return at == on.numbers.end() ? kFirstNumber : *at;
}

int Insert(CutVolume* on, u32 number) {
    while (!on->numbers.insert(number).second) {
        number += 1;
    }
    return InsertNumber(on->volume, number);
}

int Delete(CutVolume* on, u32 number) {
    on->numbers.erase(number);
    return DeleteNumber(on->volume, number);
}

// Inserts in one place until `isDone`, at most `most` records.
int InsertUntil(CutVolume* on, u32 most, const std::function<bool(const CBTreeHfs&)>& isDone) {
    CBTreeHfs* catalog = on->volume->Tree(kCatalogFileId, nullptr);
    const u32 place = Middle(*on);
    int status = 0;
    for (u32 i = 0; i < most && status == 0 && !isDone(*catalog); ++i) {
        status = Insert(on, place + 1);
        if (status == 0 && on->volume->IsCommitDue()) {
            status = on->commit();
        }
    }
    return status;
}

// Deletes from the middle on until `keep` are left, at most `most`.
int DeleteDownTo(CutVolume* on, std::size_t keep, u32 most) {
    int status = 0;
    for (u32 i = 0; i < most && on->numbers.size() > keep && status == 0; ++i) {
        status = Delete(on, Middle(*on));
        if (status == 0 && on->volume->IsCommitDue()) {
            status = on->commit();
        }
    }
    return status;
}

int Grow(CutVolume* on, u32 fileId, u32 nodes) {
    CBTreeHfs* tree = on->volume->Tree(fileId, nullptr);
    return tree->ExtendBTree(tree->header.totalNodes + nodes, nullptr, nullptr);
}

int GrowAllTrees(CutVolume* on) {
    int status = Insert(on, Middle(*on) + 1);
    for (const u32 fileId : {kExtentsFileId, kCatalogFileId, kAttributesFileId}) {
        if (status == 0 && on->volume->HasTree(fileId)) {
            status = Grow(on, fileId, 1);
        }
    }
    return status;
}

int MixedChanges(CutVolume* on) {
    int status = 0;
    for (u32 i = 0; i < 3 && status == 0; ++i) {
        status = Insert(on, kFirstNumber + 7 * i);
    }
    for (u32 i = 0; i < 2 && status == 0; ++i) {
        status = Delete(on, *on->numbers.rbegin());
    }
    return status == 0 && !on->numbers.empty() ? UpdateNumber(on->volume, Middle(*on), 0x33)
                                               : status;
}

int UpdateAll(CutVolume* on) {
    int status = 0;
    for (auto at = on->numbers.begin(); at != on->numbers.end() && status == 0; ++at) {
        status = UpdateNumber(on->volume, *at, on->fill);
    }
    on->fill = static_cast<u8>(on->fill + 1);
    return status;
}

}  // namespace

const char* CutOperationName(u32 operation) {
    static const char* const kNames[kCutOperations + 1] = {"insert",
                                                           "insert with split",
                                                           "root split",
                                                           "delete",
                                                           "delete with unlink",
                                                           "collapse",
                                                           "update",
                                                           "growth",
                                                           "growth by four",
                                                           "create tree",
                                                           "several trees",
                                                           "mixed",
                                                           "update all"};
    return kNames[operation];
}

int DoCutOperation(u32 operation, CutVolume* on) {
    CBTreeHfs* catalog = on->volume->Tree(kCatalogFileId, nullptr);
    const u32 usedNodes = catalog->header.totalNodes - catalog->header.freeNodes;
    const u32 depth = catalog->header.treeDepth;
    switch (operation) {
        case 0:
            return Insert(on, on->numbers.empty() ? kFirstNumber : *on->numbers.rbegin() + 1);
        case 1:
            return InsertUntil(on, 6, [&](const CBTreeHfs& tree) {
                return tree.header.totalNodes - tree.header.freeNodes != usedNodes;
            });
        case 2:
            return InsertUntil(
                on, 60, [&](const CBTreeHfs& tree) { return tree.header.treeDepth > depth; });
        case 3:
            return DeleteDownTo(on, 0, 1);
        case 4:
            return DeleteDownTo(on, 0, 8);
        case 5:
            return DeleteDownTo(on, 2, 1000);
        case 6:
            return on->numbers.empty() ? 0 : UpdateNumber(on->volume, Middle(*on), 0x55);
        case 7:
            return Grow(on, kCatalogFileId, 1);
        case 8:
            return Grow(on, kCatalogFileId, 4);
        case 9:
            return on->volume->HasTree(kAttributesFileId)
                       ? 0
                       : on->volume->CreateTree(kAttributesFileId, 9, nullptr);
        case 10:
            return GrowAllTrees(on);
        case 11:
            return MixedChanges(on);
        default:
            return UpdateAll(on);
    }
}

CutBase MakeCutBase(const CutBaseShape& shape) {
    CutBase base;
    auto device = FreshDevice(shape.size, SmallFormat(shape.journalSize));
    Problem problem;
    auto volume = MountOn(device.get(), Writing(), &problem);
    EXPECT_NE(nullptr, volume) << problem.Text();
    CutVolume on{volume.get(), {}, [&] { return volume->Commit(0); }};
    for (u32 i = 0; i < shape.records; ++i) {
        EXPECT_EQ(0, Insert(&on, kFirstNumber + kNumberStep * i));
        if (volume->IsCommitDue()) {
            EXPECT_EQ(0, volume->Commit(0));
        }
    }
    CBTreeHfs* catalog = volume->Tree(kCatalogFileId, nullptr);
    while (catalog->header.totalNodes < shape.catalogNodes) {
        EXPECT_EQ(0, Grow(&on, kCatalogFileId,
                          std::min(40u, shape.catalogNodes - catalog->header.totalNodes)));
        EXPECT_EQ(0, volume->Commit(0));
    }
    while (shape.nearlyFull && volume->Header().freeBlocks > 4) {
        EXPECT_EQ(0, Grow(&on, kExtentsFileId, std::min(40u, volume->Header().freeBlocks - 3)));
        EXPECT_EQ(0, volume->Commit(0));
    }
    EXPECT_EQ(0, volume->Commit(0));
    EXPECT_EQ(0, volume->Close());
    volume.reset();
    if (shape.journalSize != 0) {
        MoveJournal(device.get(), shape.journalAt, false);
    }
    base.bytes = BytesOf(device.get());
    base.numbers = on.numbers;
    return base;
}

}  // namespace VELK::test
