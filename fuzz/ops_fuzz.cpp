// A sequence of operations on a sound tree, in any order, against a plain model. The tree on disk
// is then read without the engine and compared record by record.
//
// Input: tree kind, geometry (low bits: map block, journal, made by Create; high bits: node size,
// binary order of names), then operations of three bytes: what, key, and a size or a variety.
#include <algorithm>
#include <cstring>
#include <map>

#include "capture.h"
#include "flat_tree.h"
#include "fuzz.h"
#include "keys.h"
#include "ledger.h"
#include "mem_volume.h"
#include "mutate.h"

namespace {

using namespace VELK;

constexpr u32 kFiles[] = {kCatalogFileId, kExtentsFileId, kAttributesFileId};
constexpr u32 kMostOperations = 2000;
constexpr u32 kMostTakenBack = 8;  // each copies the whole volume
constexpr u32 kGrowth = 2600;      // nodes, more than the map of a header node of 512 bytes covers

class Run {
public:
    explicit Run(fuzz::Input* input)
        : fileId_(kFiles[input->U8() % 3]),
          geometry_(input->U8()),
          nodeSize_(std::max(512u << (geometry_ >> 4 & 3), 512u << (geometry_ & 3))),
          volume_(Options(geometry_)) {
        test::TestTree tree(&volume_, fileId_);
        tree_ = test::Metered(&tree.tree);
        if ((geometry_ & 8) != 0) {
            Create();
        } else {
            Open();
        }
        for (u32 i = 0; i < kMostOperations && !input->IsEmpty(); ++i) {
            Operate(input);
        }
        Compare();
    }

private:
    static test::MemVolumeOptions Options(u8 geometry) {
        test::MemVolumeOptions options;
        options.mapBlockSize = 512u << (geometry & 3);
        options.allocBlockSize = options.mapBlockSize;
        options.listsCalls = false;
        options.totalBlocks = 1u << 15;
        options.hasJournal = (geometry & 4) != 0;
        options.version = (geometry & 0x40) != 0 ? kVersionHfsx : kVersionHfsPlus;
        return options;
    }

    // What is built without the engine is opened.
    void Open() {
        test::TreeShape shape;
        shape.fileId = fileId_;
        shape.nodeSize = nodeSize_;
        shape.clumpSize = 4 * nodeSize_;
        shape.freeNodes = 2;
        shape.keyCompareType = IsBinary() ? kKeyCompareBinary : kKeyCompareFolding;
        volume_.LoadTree(test::BuildTree(shape, {}));
        FUZZ_CHECK(tree_->Init() == kOk);
    }

    // The engine searches faster in a tree that it built itself, until it reads of it again.
    void Create() {
        u32 shift = 9;
        while (1u << shift < nodeSize_) {
            ++shift;
        }
        const unsigned long long size = 4 * nodeSize_;
        volume_.fs.ForkOf(fileId_)->clumpSize = 4 * nodeSize_;
        test::PrepareCreate(tree_.Get());
        if (IsBinary() && fileId_ == kCatalogFileId) {
            tree_->compareKeys = CompareCatKeysCaseBin;
            tree_->keyCompareType = kKeyCompareBinary;
        }
        FUZZ_CHECK(tree_->Create(shift, 0, &size) == kOk);
    }

    bool IsBinary() const { return (geometry_ & 0x40) != 0; }

    void Operate(fuzz::Input* input) {
        const u8 what = input->U8();
        const u32 n = input->U8() | (what & 0xF0u) << 4;
        const u8 third = input->U8();
        switch (what & 7) {
            case 0:
            case 1:
            case 2:
                return Insert(n, 2 + 2 * (third % (nodeSize_ / 8)));
            case 3:
                return (third & 1) != 0 ? DeleteAtPath(n) : Delete(n);
            case 4:
                return (third & 1) != 0 ? FindAbsent(n) : Find(n);
            case 5:
                return Update(n);
            case 6:
                return Maintain(n, what, third);
            default:
                return (third & 1) != 0 ? Return(n) : Step(n, what);
        }
    }

    // What leaves the records as they are.
    void Maintain(u32 n, u8 what, u8 third) {
        switch (third & 7) {
            case 3:
                return TakeBack(n);
            case 4:
                FUZZ_CHECK(tree_->ReserveSpace(1 + static_cast<int>(n % 8), &reserve_) == kOk);
                return tree_->ReleaseSpace(&reserve_);
            case 5:
                return Extend(n);
            case 6:
                FUZZ_CHECK(tree_->Clear() == kOk);
                return;
            case 7:
                return AllocateAndFree();
            default:
                FUZZ_CHECK(tree_->Flush(what >> 4 & 4) == kOk);
        }
    }

    // Two changes that the volume drops again.
    void TakeBack(u32 n) {
        if (takenBack_++ >= kMostTakenBack) {
            return;
        }
        FUZZ_CHECK(tree_->Flush(0) == kOk);
        const test::MemVolume::Snapshot before = volume_.Save();
        const std::map<u32, test::Bytes> known = model_;
        Insert(n, nodeSize_ / 8);
        Delete(n + 1);
        tree_->findData.ClearPath();
        volume_.Restore(before);
        tree_->RestoreModifiedNodes();
        FUZZ_CHECK(!(*tree_).IsDirty());
        model_ = known;
    }

    // Once, so that runs stay short.
    void Extend(u32 n) {
        if (!hasExtended_) {
            hasExtended_ = true;
            const u32 more = 1 + n % (nodeSize_ == 512 ? kGrowth : 64);
            FUZZ_CHECK(tree_->ExtendBTree((*tree_).header.totalNodes + more, nullptr, nullptr) ==
                       kOk);
        }
    }

    void AllocateAndFree() {
        if ((*tree_).header.freeNodes != 0) {
            HfsNode* node = nullptr;
            FUZZ_CHECK(tree_->AllocateNode(&node) == kOk);
            const u32 number = node->nodeNum;
            node->refCount -= 1;
            FUZZ_CHECK(tree_->FreeNode(number) == kOk);
        }
    }

    void Insert(u32 n, u32 size) {
        const test::HostKey key = test::NthHostKey(fileId_, n);
        const test::Bytes data = test::Pattern(size, n + size);
        const bool isNew = model_.try_emplace(n, data).second;
        FUZZ_CHECK(tree_->InsertRecord(key.Get(), key.id, data.data(), size) ==
                   (isNew ? kOk : kErrExists));
    }

    void Delete(u32 n) {
        const test::HostKey key = test::NthHostKey(fileId_, n);
        const bool isThere = model_.erase(n) != 0;
        FUZZ_CHECK(tree_->DeleteRecord(key.Get(), key.id, false) == (isThere ? kOk : kErrNotFound));
    }

    void DeleteAtPath(u32 n) {
        if (Find(n, nullptr)) {
            FUZZ_CHECK(tree_->DeleteRecord(nullptr, 0, true) == kOk);
            model_.erase(n);
        }
    }

    // Leaves the record in `record_`. True: it is there, and is the model's.
    bool Find(u32 n, HfsFindData* path) {
        const test::HostKey key = test::NthHostKey(fileId_, n);
        unsigned size = 0;
        const int status =
            tree_->FindRecord(key.Get(), key.id, record_, sizeof record_, &size, path);
        const auto known = model_.find(n);
        FUZZ_CHECK(status == (known == model_.end() ? kErrNotFound : kOk));
        FUZZ_CHECK(status != kOk || test::Bytes(record_, record_ + size) == known->second);
        return status == kOk;
    }

    void Find(u32 n) {
        HfsFindData path;
        Find(n, &path);
        path.ClearPath();
    }

    // A key that nobody inserts, looked for from where the tree's own path stands.
    void FindAbsent(u32 n) {
        const test::HostKey key = test::NthHostKey(fileId_, n, true);
        unsigned size = 0;
        FUZZ_CHECK(tree_->FindRecord(key.Get(), key.id, record_, sizeof record_, &size, nullptr) ==
                   kErrNotFound);
    }

    // Away from a record, and back to it by its position.
    void Return(u32 n) {
        HfsFindData path;
        if (Find(n, &path)) {
            const unsigned long long position = tree_->GetPos(&path, nullptr, nullptr);
            path.ClearPath();
            path.level = 0;
            unsigned size = 0;
            unsigned keySize = 0;
            FUZZ_CHECK(tree_->SetPos(position, record_, sizeof record_, &size, key_, sizeof key_,
                                     &keySize, &path) == kOk);
            FUZZ_CHECK(test::Bytes(record_, record_ + size) == model_.at(n));
        }
        path.ClearPath();
    }

    void Update(u32 n) {
        if (Find(n, nullptr)) {
            test::Bytes& data = model_.at(n);
            data = test::Pattern(data.size(), n * 7 + data[0]);
            FUZZ_CHECK(tree_->UpdateKeyAndRecord(nullptr, data.data()) == kOk);
        }
    }

    // A few steps forward from a key, compared with the model.
    void Step(u32 n, u8 what) {
        HfsFindData path;
        if (Find(n, &path)) {
            auto known = model_.find(n);
            for (u32 i = 0; i < 1u + (what >> 4); ++i) {
                unsigned size = 0;
                const int status =
                    tree_->IncPos(1, record_, sizeof record_, &size, nullptr, 0, nullptr, &path);
                ++known;
                FUZZ_CHECK(status == (known == model_.end() ? kErrNotFound : kOk));
                if (status != kOk) {
                    break;
                }
                FUZZ_CHECK(test::Bytes(record_, record_ + size) == known->second);
            }
        }
        path.ClearPath();
    }

    void Compare() {
        FUZZ_CHECK(tree_->Flush(0) == kOk);
        FUZZ_CHECK(test::LedgerHolds(*tree_, test::References(tree_->findData)));
        const test::FlatTree flat = test::ReadFlat(volume_.Disk(fileId_));
        FUZZ_CHECK(test::IsSound(flat));
        FUZZ_CHECK(flat.records.size() == model_.size());
        std::size_t i = 0;
        for (const auto& [n, data] : model_) {
            FUZZ_CHECK(flat.records[i].key == test::NthDiskKey(fileId_, n));
            FUZZ_CHECK(flat.records[i].data == data);
            ++i;
        }
    }

    u32 fileId_;
    u8 geometry_;
    u32 nodeSize_;
    test::MemVolume volume_;
    test::Metered tree_{nullptr};
    std::map<u32, test::Bytes> model_;
    BTReserve reserve_ = {};
    u32 takenBack_ = 0;
    bool hasExtended_ = false;
    alignas(8) u8 key_[kKeyLengthSize + kMaxKeyLength + 6] = {};
    alignas(8) u8 record_[8192] = {};
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const u8* data, std::size_t size) {
    fuzz::RunQuietly(data, size, [](fuzz::Input* input) { const Run run(input); });
    return 0;
}

// Operations are repeated, exchanged, given another key or verb, as wholes.
extern "C" std::size_t LLVMFuzzerCustomMutator(u8* data, std::size_t size, std::size_t most,
                                               unsigned seed) {
    fuzz::Mutator mutator(seed);
    constexpr std::size_t kControl = 2;
    constexpr u32 kOperation = 3;
    const u32 count = size > kControl ? static_cast<u32>(size - kControl) / kOperation : 0;
    if (count < 2 || mutator.OneIn(4)) {
        return LLVMFuzzerMutate(data, size, most);
    }
    const auto at = [data](u32 index) { return data + kControl + std::size_t{index} * kOperation; };
    const u32 first = mutator.Below(count);
    const u32 second = mutator.Below(count);
    switch (mutator.Below(4)) {
        case 0:
            at(first)[0] = static_cast<u8>(mutator.Below(256));
            break;
        case 1:
            at(first)[1] = at(second)[1];
            at(first)[0] = static_cast<u8>((at(second)[0] & 0xF0) | (at(first)[0] & 0x0F));
            break;
        case 2:
            std::swap_ranges(at(first), at(first) + kOperation, at(second));
            break;
        default: {
            const u32 most3 = std::min(count - first, count - second);
            const u32 copied = 1 + mutator.Below(most3);
            std::memmove(at(first), at(second), std::size_t{copied} * kOperation);
        }
    }
    return size;
}
