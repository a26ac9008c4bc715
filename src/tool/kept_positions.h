// Where the trees of a volume stand, remembered over a commit, which lets go of it.
#pragma once

#include <array>

#include "hfs/volume/image_volume.h"

namespace VELK::tool {

class KeptPositions {
public:
    // Remembers the position of every tree that is open. `volume` has to outlive this.
    explicit KeptPositions(ImageVolume* volume);
    // After a commit: each tree stands where it stood. A commit changes no record but those of the
    // extents tree, which then stands nowhere. 0, or the status of a node that could not be read.
    int PutBack() const;

private:
    struct Level {
        u32 node = 0;  // 0: the path holds none on this level
        s32 index = 0;
    };
    struct Position {
        u32 fileId = 0;
        u32 leafRecords = 0;
        bool isValid = false;
        std::array<Level, kMaxPathDepth + 1> levels;
    };

    static int PutBack(CBTreeHfs* tree, const Position& position);

    ImageVolume* volume_;
    std::array<Position, 3> positions_;
};

}  // namespace VELK::tool
