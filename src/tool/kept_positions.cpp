// A path is kept as node numbers: the nodes themselves may leave the cache with the commit.
#include "tool/kept_positions.h"

namespace VELK::tool {

KeptPositions::KeptPositions(ImageVolume* volume) : volume_(volume) {
    constexpr std::array<u32, 3> kTrees = {kExtentsFileId, kCatalogFileId, kAttributesFileId};
    for (std::size_t i = 0; i < kTrees.size(); ++i) {
        Position& position = positions_[i];
        position.fileId = kTrees[i];
        const CBTreeHfs* tree = volume->OpenTree(position.fileId);
        if (tree == nullptr || tree->findData.level != 1) {
            continue;
        }
        position.leafRecords = tree->header.leafRecords;
        position.isValid = tree->findData.valid;
        for (std::size_t level = 1; level < position.levels.size(); ++level) {
            const HfsFindLevel& at = tree->findData.path[level];
            position.levels[level] = {at.node != nullptr ? at.node->nodeNum : 0, at.index};
        }
    }
}

int KeptPositions::PutBack() const {
    for (const Position& position : positions_) {
        CBTreeHfs* tree = volume_->OpenTree(position.fileId);
        if (tree == nullptr || position.levels[1].node == 0 ||
            tree->header.leafRecords != position.leafRecords) {
            continue;
        }
        const int status = PutBack(tree, position);
        if (status != kOk) {
            tree->findData.ClearPath();
            tree->findData.valid = false;
            return status;
        }
    }
    return kOk;
}

int KeptPositions::PutBack(CBTreeHfs* tree, const Position& position) {
    for (std::size_t level = 1; level < position.levels.size(); ++level) {
        const Level& at = position.levels[level];
        if (at.node == 0) {
            continue;
        }
        const int status = tree->ReadLevel(static_cast<int>(level), at.node, &tree->findData);
        if (status != kOk) {
            return status;
        }
        tree->findData.path[level].index = at.index;
    }
    tree->findData.level = 1;
    tree->findData.valid = position.isValid;
    return kOk;
}

}  // namespace VELK::tool
