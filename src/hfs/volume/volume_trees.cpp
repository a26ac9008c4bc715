// The trees of a mounted volume: their forks as runs, opened on first use, their caches kept within
// a budget.
#include <algorithm>
#include <cstring>
#include <new>

#include "hfs/volume/convert.h"
#include "hfs/volume/extents_key.h"
#include "hfs/volume/tree_diagnosis.h"
#include "hfs/volume/volume_state.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

void SetUpTree(CBTreeHfs* tree, CFileSystemHfs* fs, u32 fileId) {
    tree->volume = fs;
    tree->fileId = fileId;
    tree->convert = ConvertFor(fileId);
}

Problem ForkProblem(u32 fileId, const std::string& what) {
    Problem problem = Failure(std::string(ForkName(fileId)) + " file: " + what, "run check");
    problem.fileId = fileId;
    problem.check = "V04";
    problem.status = kErrVolumeUnmapped;
    return problem;
}

// Reads the overflow record that continues a fork at `startBlock`.
int ReadOverflow(CBTreeHfs* extentsTree, u32 fileId, u32 startBlock, OverflowRecord* record) {
    const ExtentsKey key(fileId, startBlock);
    u8 bytes[kExtentRecordSize] = {};
    unsigned size = 0;
    HfsFindData path;
    const int status =
        extentsTree->FindRecord(key.bytes, fileId, bytes, sizeof bytes, &size, &path);
    path.ClearPath();
    if (status != 0) {
        return status;
    }
    if (size != kExtentRecordSize) {
        return kErrBadRecord;
    }
    record->startBlock = startBlock;
    for (u32 i = 0; i < kExtentCount; ++i) {
        record->extents[i] = {Be32(bytes + 8 * i), Be32(bytes + 8 * i + 4)};
    }
    return 0;
}

HfsNode* NodeOfLink(rb_node* link) {
    return reinterpret_cast<HfsNode*>(link);  // the link is the first member
}

rb_node* FirstOf(rb_node* node) {
    while (node != nullptr && node->left != nullptr) {
        node = node->left;
    }
    return node;
}

rb_node* NextOf(rb_node* node) {
    if (node->right != nullptr) {
        return FirstOf(node->right);
    }
    rb_node* parent = node->Parent();
    while (parent != nullptr && node == parent->right) {
        node = parent;
        parent = node->Parent();
    }
    return parent;
}

enum class Idle { kLeaves, kAll };

bool IsIdle(const HfsNode* node) {
    return node->refCount <= 0 && node->modifiedLink.next == &node->modifiedLink;
}

bool IsLeaf(const HfsNode* node) {
    return static_cast<s8>(node->bufs[0].data[kDescKind]) == kBTLeafNode;
}

// Drops idle nodes, which are clean and held by nobody, and tells the bytes of those that remain.
// Taking a node up and releasing it in full is the engine's own way of letting go of one.
u64 DropNodes(CBTreeHfs* tree, Idle which) {
    std::vector<u32> numbers;
    u64 kept = 0;
    for (rb_node* link = FirstOf(tree->nodeRoot); link != nullptr; link = NextOf(link)) {
        const HfsNode* node = NodeOfLink(link);
        if (IsIdle(node)) {
            if (which == Idle::kAll || IsLeaf(node)) {
                numbers.push_back(node->nodeNum);
            } else {
                kept += 1;
            }
        }
    }
    for (const u32 number : numbers) {
        HfsNode* node = nullptr;
        if (tree->GetINode(number, &node, false) == 0) {
            tree->PutINode(node, false);
        }
    }
    return tree->nodeCount != 0 ? tree->GetMemSize(false) / tree->nodeCount * kept : 0;
}

// The same for all open trees.
u64 DropNodes(std::array<TreeSlot, kTreeCount>* trees, Idle which) {
    u64 kept = 0;
    for (TreeSlot& slot : *trees) {
        if (slot.isOpen) {
            kept += DropNodes(slot.Get(), which);
        }
    }
    return kept;
}

}  // namespace

void EndReservation(CBTreeHfs* tree) {
    tree->reservedNodes = 0;
    tree->reservationUsed = 0;
    tree->reservationOpen = false;
}

bool OverflowRecord::operator==(const OverflowRecord& other) const {
    return startBlock == other.startBlock &&
           std::memcmp(extents, other.extents, sizeof extents) == 0;
}

ImageVolume::State::State() {
    for (std::size_t i = 0; i < kSpecialFileIds.size(); ++i) {
        files[i].fileId = kSpecialFileIds[i];
        if (i < kTreeCount) {
            CBTreeHfs* tree = new (trees[i].storage) CBTreeHfs;
            SetUpTree(tree, &fs, kSpecialFileIds[i]);
            files[i].runs = &tree->runs;
        } else {
            files[i].runs = &files[i].ownRuns;
        }
    }
}

ImageVolume::State::~State() {
    Close();
    for (TreeSlot& slot : trees) {
        EndReservation(slot.Get());
        slot.Get()->Dtor();
        slot.Get()->~CBTreeHfs();
    }
}

// Puts a tree object back to the state before it was opened; its address stays.
void ImageVolume::State::ResetTree(TreeSlot* slot, u32 fileId) {
    CBTreeHfs* tree = slot->Get();
    EndReservation(tree);
    tree->Dtor();
    tree->~CBTreeHfs();
    SetUpTree(new (slot->storage) CBTreeHfs, &fs, fileId);
    slot->isOpen = false;
    slot->isNew = false;
    slot->wasTried = false;
    slot->problem = Problem{};
    File(fileId)->isMapped = false;
}

TreeSlot* ImageVolume::State::Slot(u32 fileId) {
    for (std::size_t i = 0; i < kTreeCount; ++i) {
        if (kSpecialFileIds[i] == fileId) {
            return &trees[i];
        }
    }
    return nullptr;
}

SpecialFile* ImageVolume::State::File(u32 fileId) {
    for (SpecialFile& file : files) {
        if (file.fileId == fileId) {
            return &file;
        }
    }
    return nullptr;
}

bool ImageVolume::State::HasFork(u32 fileId) const {
    const HfsFork* fork = const_cast<CFileSystemHfs&>(fs).ForkOf(fileId);
    return fork != nullptr &&
           (fork->totalBlocks != 0 || fork->logicalSize != 0 || fork->extents[0].blockCount != 0);
}

// The eight extents of the header, then the records of the extents tree, each of which begins where
// the one before ended. The extents tree itself has no such records. What can be mapped is mapped
// even when the rest cannot.
int ImageVolume::State::MapFork(u32 fileId) {
    SpecialFile* file = File(fileId);
    if (file == nullptr) {
        return kErrInvalid;
    }
    if (file->isMapped) {
        return file->problem.status;
    }
    file->isMapped = true;
    file->problem = Problem{};
    file->runs->Clear();
    file->overflow.clear();
    const HfsFork* fork = fs.ForkOf(fileId);
    if (Problem problem = CheckForkExtents(*fork, fs.totalBlocks, fileId)) {
        problem.status = kErrVolumeUnmapped;
        file->problem = problem;
    }
    u32 blocks = 0;
    int status =
        AppendExtents(file->runs, fork->extents, fs.totalBlocks, fork->totalBlocks, &blocks);
    while (status == kOk && blocks < fork->totalBlocks) {
        OverflowRecord record{};
        CBTreeHfs* extentsTree = fileId != kExtentsFileId ? Open(kExtentsFileId) : nullptr;
        if (extentsTree == nullptr || ReadOverflow(extentsTree, fileId, blocks, &record) != 0 ||
            record.extents[0].blockCount == 0) {
            break;
        }
        status =
            AppendExtents(file->runs, record.extents, fs.totalBlocks, fork->totalBlocks, &blocks);
        file->overflow.push_back(record);
        if (bitmap.Size() != 0) {
            for (const HfsExtent& extent : record.extents) {
                MarkOwned(extent.startBlock, extent.blockCount);
            }
        }
    }
    if (status == kErrNoMemory) {
        // Nothing is wrong with the fork: the next one who asks may have more luck.
        file->runs->Clear();
        file->overflow.clear();
        file->isMapped = false;
        return status;
    }
    if (!file->problem && (status != kOk || blocks != fork->totalBlocks)) {
        file->problem = ForkProblem(fileId, "extents for " + Grouped(blocks) + " of " +
                                                Grouped(fork->totalBlocks) + " blocks found");
    }
    RememberMapped(fileId);
    return file->problem.status;
}

CBTreeHfs* ImageVolume::State::Open(u32 fileId) {
    TreeSlot* slot = Slot(fileId);
    if (slot == nullptr) {
        return nullptr;
    }
    if (slot->isOpen) {
        return slot->Get();
    }
    if (slot->wasTried) {
        return nullptr;
    }
    const std::string name = ForkName(fileId);
    if (!HasFork(fileId)) {
        slot->problem = Failure("the volume has no " + name + " tree", "create-tree would add one");
        slot->problem.exitClass = ExitClass::kNo;
        slot->problem.fileId = fileId;
        return nullptr;
    }
    if (MapFork(fileId) == kErrNoMemory) {
        slot->problem = Failure(name + " tree: " + StatusWithCode(kErrNoMemory), "");
        slot->problem.status = kErrNoMemory;
        slot->problem.fileId = fileId;
        return nullptr;
    }
    slot->wasTried = true;
    CBTreeHfs* tree = slot->Get();
    lastIo = Problem{};
    const int status = tree->Init();
    if (status == 0) {
        slot->isOpen = true;
        committed.validNodes[static_cast<std::size_t>(slot - trees.data())] = tree->validNodes;
        if (File(fileId)->problem) {
            notes.push_back(File(fileId)->problem);
        }
        return tree;
    }
    u8 bytes[kHeadEnd];
    const bool readable = ReadBytes(tree->runs, fileId, 0, bytes, sizeof bytes) == 0;
    if (File(fileId)->problem) {
        slot->problem = File(fileId)->problem;
    } else if (!readable && lastIo) {
        slot->problem = lastIo;
        slot->problem.what = name + " tree: " + lastIo.what;
    } else {
        const u64 start = u64{fs.ForkOf(fileId)->extents[0].startBlock} << fs.allocBlockShift;
        slot->problem = DiagnoseTree({fileId, status, readable ? bytes : nullptr, fs.mapBlockSize,
                                      u64{fs.ForkOf(fileId)->totalBlocks} << fs.allocBlockShift,
                                      place.offset + start});
    }
    slot->problem.status = status;
    slot->problem.fileId = fileId;
    const Problem kept = slot->problem;
    ResetTree(slot, fileId);
    slot->problem = kept;
    slot->wasTried = status != kErrNoMemory;  // there may be memory the next time
    return nullptr;
}

}  // namespace VELK

namespace VELK {

u64 ImageVolume::CachedBytes() const {
    u64 bytes = 0;
    for (TreeSlot& slot : state_->trees) {
        bytes += slot.Get()->GetMemSize(false);
    }
    return bytes;
}

// Index nodes are few, and nearly every lookup meets them again: all but leaves stay as long as
// they leave a quarter of the room for these. What could not be dropped last time (nodes that are
// modified or held) does not count until it goes, or a long run of changes would look through it
// again and again.
void ImageVolume::TrimCache() {
    const u64 budget = state_->options.cacheBudget;
    const u64 cached = CachedBytes();
    state_->trimFloor = std::min(state_->trimFloor, cached);
    if (cached < state_->trimFloor + budget) {
        return;
    }
    u64 kept = DropNodes(&state_->trees, Idle::kLeaves);
    if (kept > budget - budget / 4) {
        kept = DropNodes(&state_->trees, Idle::kAll);
    }
    state_->trimFloor = CachedBytes() - kept;
}

}  // namespace VELK
