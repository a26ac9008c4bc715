// Adds a tree to a volume that lacks it: the constants of the tree's kind, then the engine's
// Create.
#include "hfs/volume/volume_state.h"

namespace VELK {

namespace {

// What Create takes from the object for a tree of this kind. The attributes tree sets its own.
void SetTreeConstants(CBTreeHfs* tree, const CFileSystemHfs& fs, u32 fileId) {
    if (fileId == kCatalogFileId) {
        const bool binary = fs.version == kVersionHfsx;
        tree->compareKeys = binary ? CompareCatKeysCaseBin : CompareCatKeysCaseIns;
        tree->keyCompareType = binary ? kKeyCompareBinary : kKeyCompareFolding;
        tree->header.maxKeyLength = kCatMaxKeyLength;
        tree->header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
    } else if (fileId == kExtentsFileId) {
        tree->compareKeys = CompareExtentKeysPlus;
        tree->header.maxKeyLength = kExtMaxKeyLength;
        tree->header.attributes = kBTBigKeysMask;
    }
}

}  // namespace

int ImageVolume::CreateTree(u32 fileId, u32 nodeShift, const u64* initialSize) {
    TreeSlot* slot = state_->Slot(fileId);
    if (slot == nullptr) {
        return kErrInvalid;
    }
    if (!state_->isWritable) {
        return kErrVolumeReadOnly;
    }
    if (state_->HasFork(fileId)) {
        return kErrExists;
    }
    state_->ResetTree(slot, fileId);
    slot->isNew = true;
    SpecialFile* file = state_->File(fileId);
    file->isMapped = true;
    file->problem = Problem{};
    file->overflow.clear();

    CBTreeHfs* tree = slot->Get();
    SetTreeConstants(tree, state_->fs, fileId);
    const unsigned long long size = initialSize != nullptr ? *initialSize : 0;
    const int status = tree->Create(nodeShift, 0, initialSize != nullptr ? &size : nullptr);
    if (status != kOk) {
        return status;
    }
    slot->isOpen = true;
    HfsFork* fork = state_->fs.ForkOf(fileId);
    if (fork->clumpSize == 0) {
        fork->clumpSize = tree->header.clumpSize;
    }
    return kOk;
}

}  // namespace VELK
