// Times the engine's operations on one tree, operation by operation.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "hfs/records/key_text.h"
#include "hfs/volume/image_volume.h"
#include "tool/progress.h"

namespace VELK::tool {

enum class BenchOrder : u8 { kRandom, kRising, kFalling, kZipf };

// What one pass over an operation took.
struct BenchTime {
    u64 count = 0;
    double seconds = 0;
};

// The operations of a tree made for the purpose, in memory. Each call does what its name says once
// and times it; a status that is not ok throws a ToolError.
class BenchTree {
public:
    BenchTree(u64 records, u32 nodeSize, BenchOrder order, u64 seed);

    BenchTime Insert();
    BenchTime FindHit();
    BenchTime FindMiss();
    BenchTime Iterate();
    BenchTime Update();
    BenchTime DeleteHalf();
    BenchTime FlushAndReopen();

    CBTreeHfs* Tree() { return volume_->Tree(kCatalogFileId, nullptr); }
    ImageVolume* Volume() { return volume_.get(); }

private:
    SearchKey KeyOf(u64 number, bool isThere) const;
    u64 Pick(u64 i) const;

    u64 records_;
    BenchOrder order_;
    std::vector<u32> shuffled_;
    std::vector<u8> record_;  // a file, host form
    std::unique_ptr<ImageVolume> volume_;
};

// The reading operations on the keys of a tree that is there.
class BenchReader {
public:
    // At most `most` keys are taken, spread over the tree.
    BenchReader(CBTreeHfs* tree, std::vector<SearchKey> keys, u64 seed);
    BenchTime FindHit();
    BenchTime Iterate();

private:
    CBTreeHfs* tree_;
    std::vector<SearchKey> keys_;
    std::vector<u8> record_;
};

}  // namespace VELK::tool
