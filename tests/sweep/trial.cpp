// See trial.h.
#include "trial.h"

#include <gtest/gtest.h>

#include "hfs/check/check.h"
#include "hfs/treehfs/noderef.h"
#include "keys.h"
#include "ledger.h"
#include "node_image.h"
#include "quiet.h"

namespace VELK::test {

namespace {

constexpr u32 kKeys = 4;
constexpr int kMostSteps = 40;

// A tree that is open, and the buffers of its caller.
class Caller {
public:
    Caller(MemVolume* volume, CBTreeHfs* object) : volume_(volume), tree_(object) {}
    ~Caller() {
        path_.ClearPath();
        tree_->ReleaseSpace(&reserve_);
    }

    void Read() {
        Search();
        Walk(1);
        Walk(-1);
        Nodes();
        tree_->GetMemSize(true);
        tree_->CalcMapBits();
        MapNodes();
        if (tree_->fileId == kExtentsFileId) {
            HfsRuns runs;
            tree_->LoadBadBlocks(&runs);
        }
        EXPECT_TRUE(tree_->modifiedList.IsEmpty() && !tree_->IsDirty()) << "reading marked";
        EXPECT_EQ(volume_->Count(Call::kDirtyMeta) + volume_->Count(Call::kZero) +
                      volume_->Count(Call::kResize),
                  0u)
            << "reading wrote";
    }

    void Change() {
        if (tree_->Flush(0) != kOk) {
            return;
        }
        before_ = volume_->Save();
        for (u32 n = 0; n < kKeys; ++n) {
            Settle(Insert(n, true));
            Settle(Update(n));
            Settle(Delete(n));
        }
        Settle(DeleteAtPath());
        Settle(tree_->ReserveSpace(3, &reserve_));
        Settle(tree_->ExtendBTree(tree_->header.totalNodes + 1, nullptr, nullptr));
        tree_->ReleaseSpace(&reserve_);
        Settle(AllocateAndFree());
        Settle(tree_->Flush(4));
    }

    // What changes one node, called on a node as it is.
    void ChangeNode(u32 number) {
        ChangeNode(number, 0);
        ChangeNode(number, -1);
        Settle(RotateRecords(number, number + 1));
        Settle(RotateRecords(number - 1, number));
    }

private:
    void Search() {
        for (u32 n = 0; n < kKeys; ++n) {
            const HostKey key = NthHostKey(tree_->fileId, n, n % 2 == 1);
            bool found = false;
            tree_->FindRecord(key.Get(), key.id, record_, sizeof record_, &size_, &path_);
            tree_->FindEntry(key.Get(), key.id, &path_, &found, record_, &size_, key_, &keySize_);
            tree_->GetPos(&path_, nullptr, nullptr);
            path_.ClearPath();
        }
    }

    void Walk(int step) {
        const u32 from = step > 0 ? tree_->header.firstLeafNode : tree_->header.lastLeafNode;
        const unsigned long long position = static_cast<u64>(from) << tree_->nodeShift;
        path_.level = 0;
        int status = tree_->SetPos(position, record_, sizeof record_, &size_, key_, sizeof key_,
                                   &keySize_, &path_);
        for (int i = 0; i < kMostSteps && status == kOk; ++i) {
            size_ = 0;
            status = tree_->IncPos(i == 9 ? 3 * step : step, record_, sizeof record_, &size_, key_,
                                   sizeof key_, &keySize_, &path_);
        }
        if (status == kOk) {
            tree_->IncPos(step > 0 ? 0x7FFFFFFF : -0x7FFFFFFF, record_, sizeof record_, &size_,
                          key_, sizeof key_, &keySize_, &path_);
        }
        path_.ClearPath();
    }

    void Nodes() {
        for (const u32 number :
             {0u, 1u, 3u, tree_->header.totalNodes - 1, tree_->header.totalNodes, 0xFFFFFFFFu}) {
            HfsNode* node = nullptr;
            if (tree_->GetINode(number, &node, false) == kOk) {
                tree_->PutINode(node, false);
            }
        }
        for (const int level : {0, 1, 2, 15, 16}) {
            tree_->ReadLevel(level, tree_->header.rootNode, &path_);
        }
        path_.ClearPath();
    }

    void MapNodes() {
        HfsNode* node = nullptr;
        int status = tree_->GetINode(0, &node, false);
        for (int i = 0; i < kMostSteps && status == kOk && node != nullptr; ++i) {
            status = tree_->GetMapNode(&node);
        }
        ReleaseNode(node);
    }

    int Insert(u32 n, bool between) {
        const HostKey key = NthHostKey(tree_->fileId, n, between);
        const Bytes data = Pattern(kExtentRecordSize, n);
        return tree_->InsertRecord(key.Get(), key.id, data.data(), kExtentRecordSize);
    }
    int Update(u32 n) {
        const HostKey key = NthHostKey(tree_->fileId, n);
        const int status =
            tree_->FindRecord(key.Get(), key.id, record_, sizeof record_, &size_, nullptr);
        return status == kOk ? tree_->UpdateKeyAndRecord(nullptr, record_) : status;
    }
    int Delete(u32 n) {
        const HostKey key = NthHostKey(tree_->fileId, n);
        return tree_->DeleteRecord(key.Get(), key.id, false);
    }
    int DeleteAtPath() {
        tree_->IncPos(1, record_, sizeof record_, &size_, nullptr, 0, nullptr, nullptr);
        return tree_->DeleteRecord(nullptr, 0, true);
    }
    int AllocateAndFree() {
        HfsNode* node = nullptr;
        const int status = tree_->AllocateNode(&node);
        if (status != kOk) {
            return status;
        }
        const u32 number = node->nodeNum;
        ReleaseNode(node);
        return tree_->FreeNode(number);
    }

    void ChangeNode(u32 number, int index) {
        NodeRef node;
        if (tree_->GetINode(number, node.Out(), false) != kOk) {
            return;
        }
        bool inserted = false;
        NodeKey place = {};
        const HostKey key = NthHostKey(tree_->fileId, 1);
        const u8 data[4] = {0, 0, 0, 1};
        int status = tree_->SetDirty(node.Get(), 0, tree_->header.nodeSize);
        if (status == kOk) {
            status = tree_->_DeleteRecord(node.Get(), index);
            if (status == kOk) {
                status = tree_->_InsertRecord(node.Get(), 0, 20, &place, &inserted);
            }
            if (status == kOk) {
                status = tree_->_InsertKeyRecord(node.Get(), 0, key.Get(), 10, data, 4,
                                                 &tree_->convert, &inserted);
            }
        }
        node.Reset();
        Restore();
    }

    int RotateRecords(u32 one, u32 other) {
        NodeRef left;
        NodeRef right;
        int status = tree_->GetINode(one, left.Out(), false);
        if (status == kOk) {
            status = tree_->GetINode(other, right.Out(), false);
        }
        if (status == kOk) {
            tree_->_RotateRecordLeft(left.Get(), right.Get());
            tree_->_RotateRecordRight(left.Get(), right.Get());
            status = kErrCorrupt;  // the tree is not to be kept
        }
        return status;
    }

    // As a volume does after a changing call.
    void Settle(int status) {
        if (status != kOk && status != kErrNotFound && status != kErrExists &&
            status != kErrTooLarge) {
            Restore();
        }
    }
    void Restore() {
        path_.ClearPath();
        tree_->ReleaseSpace(&reserve_);
        volume_->Restore(before_);
        tree_->RestoreModifiedNodes();
        EXPECT_EQ(volume_->Disk(tree_->fileId), before_.files.at(tree_->fileId));
    }

    MemVolume* volume_;
    Metered tree_;
    HfsFindData path_;
    BTReserve reserve_ = {};
    MemVolume::Snapshot before_;
    alignas(8) u8 record_[2048] = {};
    alignas(8) u8 key_[kKeyLengthSize + kMaxKeyLength + 6] = {};
    unsigned size_ = 0;
    unsigned keySize_ = 0;
};

void CheckFile(const Bytes& file, u32 fileId) {
    u32 told = 0;
    CheckSink sink;
    sink.self = &told;
    sink.finding = [](void* self, const CheckFinding& finding) {
        EXPECT_FALSE(finding.text.empty());
        *static_cast<u32*>(self) += 1;
    };
    CheckTreeKind kind;
    kind.fileId = fileId;
    CheckOptions options;
    options.keepGoing = true;
    const CheckSummary summary = CheckTreeBytes(file.data(), file.size(), kind, options, sink);
    EXPECT_EQ(told + summary.untold, summary.errors + summary.warnings + summary.infos);
    EXPECT_LE(summary.nodes, file.size() / 512);
}

}  // namespace

void Trial::RunTree(const Bytes& file, u32 nodeNum) const {
    const Quiet quiet;
    MemVolumeOptions options;
    options.mapBlockSize = mapBlock_;
    options.allocBlockSize = mapBlock_;
    options.totalBlocks = 512 + static_cast<u32>(file.size() / mapBlock_);
    options.listsCalls = false;
    MemVolume volume(options);
    volume.LoadFile(fileId_, file);
    TestTree tree(&volume, fileId_);
    if (tree->Init() == kOk) {
        Caller caller(&volume, &tree.tree);
        caller.Read();
        EXPECT_TRUE(LedgerHolds(tree.tree, References(tree.tree.findData)));
        caller.Change();
        caller.ChangeNode(nodeNum);
    }
    CheckFile(file, fileId_);
}

void Trial::RunNode(const Bytes& node, u32 nodeNum) const {
    const Quiet quiet;
    const LooseNode loose(node, mapBlock_, nodeNum);
    const u32 nodeSize = static_cast<u32>(node.size());
    for (const int index :
         {-0x7FFFFFFF, -70000, -2, -1, 0, 1, 2, 3, 4, 100, 255, 256, 65535, 70000, 0x7FFFFFFF}) {
        NodeKey key = {};
        unsigned number = 0;
        if (loose->GetKey(loose.Hdr(), index, &key) == kOk) {
            EXPECT_LE(u64{key.offset} + key.size, nodeSize);
        }
        loose->GetRecordSize(loose.Hdr(), index, &number);
        loose->GetChildNodeNum(loose.Hdr(), index, &number);
    }
    NodeKey free = {};
    loose->GetFreeKey(loose.Hdr(), Get16(node, kDescNumRecords), &free);
    unsigned freeBytes = 0;
    if (loose->GetNodeFreeSize(loose.Hdr(), &freeBytes) == kOk) {
        EXPECT_LE(freeBytes, nodeSize);
    }
}

}  // namespace VELK::test
