// Looking at damaged trees: every 16-bit word of every node in use is replaced by other values in
// turn, then everything that reads is called. Each call must come back with a status, within a
// bounded number of node requests, with the books in order and nothing to write. Every map block is
// a heap block of its own, so a single byte read outside a node ends the test.
#include <gtest/gtest.h>

#include "bench.h"

namespace VELK::test {
namespace {

class Reader {
public:
    Reader(u32 mapBlock, u32 fileId) : bench_(Blocks(mapBlock), fileId) {}

    // Calls everything that reads on this image. False: something was not as it must be.
    bool Survives(const TreeImage& image) {
        bench_.Load(image);
        const bool opened = bench_->Init() == kOk;
        bool sound = true;
        if (opened) {
            sound = SearchAll() && WalkAll() && JumpAll() && LoadBadBlocks();
        }
        sound = sound && bench_->modifiedList.IsEmpty();
        path_.ClearPath();
        bench_->Dtor();
        sound = sound && bench_.volume.Lent() == 0 && bench_.heap.Live() == 0;
        path_ = HfsFindData();
        bench_->findData = HfsFindData();
        bench_.Forget();
        return sound;
    }

private:
    u32 Requests() { return bench_->hitCount + bench_->readCount; }
    bool InOrder(u32 requestsBefore) {
        const u64 bound = 4 * (static_cast<u64>(bench_->header.totalNodes) + 64);
        return Requests() - requestsBefore <= bound &&
               LedgerHolds(*bench_.tree, References(path_) + References(bench_->findData));
    }

    bool SearchAll() {
        bool sound = true;
        for (u32 n = 0; n < 8 && sound; ++n) {
            const HostKey key = NthHostKey(bench_->fileId, n, n % 2 == 1);
            u32 size = 0;
            const u32 before = Requests();
            bench_->FindRecord(key.Get(), key.id, record_, sizeof record_, &size, &path_);
            sound = InOrder(before);
        }
        return sound;
    }

    bool WalkAll() {
        const HostKey key = NthHostKey(bench_->fileId, 0);
        bool found = false;
        bench_->FindEntry(key, key.id, &path_, &found, nullptr, nullptr, nullptr, nullptr);
        bool sound = true;
        for (int step = 0; step < 20 && sound; ++step) {
            const int count = step == 0 ? 0 : step == 15 ? -3 : step == 17 ? 0x7FFFFFFF : 1;
            sound = StepBy(count);
        }
        return sound;
    }
    bool StepBy(int count) {
        u32 size = 0;
        u32 keySize = 0;
        const u32 before = Requests();
        bench_->IncPos(count, record_, sizeof record_, &size, key_, sizeof key_, &keySize, &path_);
        return InOrder(before);
    }

    bool JumpAll() {
        bool sound = true;
        for (u32 leaf = 0; leaf < 8 && sound; ++leaf) {
            path_.ClearPath();
            path_.level = 0;
            const unsigned long long position =
                (static_cast<unsigned long long>(leaf) << bench_->nodeShift) + 1;
            u32 size = 0;
            const u32 before = Requests();
            bench_->SetPos(position, record_, sizeof record_, &size, nullptr, 0, nullptr, &path_);
            sound = InOrder(before);
        }
        return sound;
    }

    bool LoadBadBlocks() {
        if (bench_->fileId != kExtentsFileId) {
            return true;
        }
        HfsRuns runs;
        bench_->LoadBadBlocks(&runs);
        return LedgerHolds(*bench_.tree, References(path_) + References(bench_->findData));
    }

    Bench bench_;
    HfsFindData path_;
    u8 record_[64];
    alignas(8) u8 key_[kKeyLengthSize + kMaxKeyLength];
};

struct Damage {
    Geometry geometry;
    u32 fileId;
};
std::ostream& operator<<(std::ostream& out, const Damage& damage) {
    return out << damage.geometry << ", file " << damage.fileId;
}

class CorruptRead : public ::testing::TestWithParam<Damage> {
protected:
    // Three leaves of two records, an index node, one map node more than needed.
    TreeImage Sound() const {
        TreeShape shape;
        shape.fileId = GetParam().fileId;
        shape.nodeSize = GetParam().geometry.nodeSize;
        shape.recordsPerLeaf = 2;
        shape.mapNodes = 1;
        shape.freeNodes = 3;
        std::vector<TreeRecord> records = NthRecords(shape.fileId, 6, kExtentRecordSize);
        if (shape.fileId == kExtentsFileId) {
            for (u32 n = 0; n < 4; ++n) {
                records[n].key = DiskExtKey(kForkData, kBadBlockFileId, n * 8);
            }
        }
        return BuildTree(shape, records);
    }
};

TEST_P(CorruptRead, AnyWordOfAnyNodeMayBeAnything) {
    Reader reader(GetParam().geometry.mapBlock, GetParam().fileId);
    const TreeImage sound = Sound();
    ASSERT_TRUE(reader.Survives(sound));
    const u32 nodeSize = sound.shape.nodeSize;
    const u32 used = sound.totalNodes - sound.freeNodes;
    for (u32 at = 0; at < used * nodeSize; at += 2) {
        const u32 inNode = at % nodeSize;
        if (inNode > 200 && inNode < nodeSize - 16) {
            continue;  // free space
        }
        const u32 was = Get16(sound.bytes, at);
        for (const u32 value : {0u, 1u, 4u, was ^ 1u, was + 2, 0x7FFFu, 0xFFFFu, nodeSize - 1}) {
            TreeImage image = sound;
            Put16(&image.bytes, at, value & 0xFFFF);
            ASSERT_TRUE(reader.Survives(image)) << "byte " << at << " value " << value;
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Trees, CorruptRead,
                         ::testing::Values(Damage{{512, 512}, 4}, Damage{{1024, 512}, 4},
                                           Damage{{512, 512}, 3}, Damage{{1024, 512}, 3},
                                           Damage{{512, 512}, 8}, Damage{{1024, 512}, 8}));

}  // namespace
}  // namespace VELK::test
