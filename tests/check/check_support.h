// What the tests of the checker share: a run with all it said, trees of sound records, and whole
// small volumes, all built here byte by byte.
#pragma once

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "hfs/check/check.h"
#include "tree_image.h"

namespace VELK::test {

struct Outcome {
    CheckSummary summary;
    std::vector<CheckFinding> findings;
    std::vector<CheckUnreadable> unreadable;

    // Names of the invariants that errors and warnings were told of, in order, without repetition:
    // "H04 L02". Remarks count only with `withInfos`.
    std::string Ids(bool withInfos = false) const;
    // All findings, a line each; for messages.
    std::string Lines() const;
    // The first finding of `id`; an empty one if there is none.
    CheckFinding First(CheckId id) const;
};

Outcome CheckSourceBytes(const CheckSource& source, const CheckOptions& options);
Outcome CheckBytes(const Bytes& volume, const CheckOptions& options = {});
Outcome CheckImage(const TreeImage& tree, const CheckOptions& options = {});
CheckOptions Quick();
CheckOptions Full();

// Data of catalog records.
Bytes FolderData(u32 id, u32 valence);
Bytes ThreadData(bool isFolder, u32 parent, std::u16string_view name);

using Runs = std::vector<std::pair<u32, u32>>;

// 80 bytes of fork data: runs, their sum as total, and the size they hold.
Bytes ForkData(const Runs& runs, u32 blockSize);
// Eight extents.
Bytes ExtentData(const Runs& runs);
Bytes FileData(u32 id, const Bytes& dataFork, const Bytes& rsrcFork);
Bytes InlineAttribute(u32 size);

// Records of a catalog: a root of `files` files ("file_0000" ...), with all threads, in order.
std::vector<TreeRecord> CatalogOf(u32 files);
// A sound catalog tree with nodes of 512 bytes.
TreeImage CatalogTree(u32 files);
// A sound extents tree and a sound attributes tree.
TreeImage ExtentsTree(u32 records);
TreeImage AttributesTree(u32 records);

// A volume whose parts the test may change before and after it is laid out. Blocks of 512 bytes:
//   0..2 header, 3 allocation file, then the trees, then data, the last two for the copy.
struct VolumeImage {
    static constexpr u32 kBlockSize = 512;
    static constexpr u32 kTotalBlocks = 1000;
    static constexpr u32 kDataStart = 700;  // blocks from here on are for files

    VolumeImage();

    // Parts, set to a sound volume: root with folder 16 "dir", in it file 17 "alpha" (data fork of
    // two blocks) and file 18 "beta" (empty), each attribute of 17 inline.
    std::vector<TreeRecord> catalog;
    std::vector<TreeRecord> extents;
    std::vector<TreeRecord> attributes;
    bool isHfsx = false;
    bool hasAttributes = true;
    u32 catalogPieces = 1;     // runs the catalog file is laid out in
    u32 childrenPerIndex = 0;  // of the catalog; 0: as many as fit
    u32 freeNodes = 8;         // of the catalog
    u32 totalBlocks = kTotalBlocks;
    u32 dataStart = kDataStart;
    std::vector<u32> owned;  // blocks of files, to be marked used

    // Lays everything out. `bytes` and the trees below are there afterwards.
    void Build();

    // A record's data in `catalog`, `extents` or `attributes` by its key.
    static Bytes* DataOf(std::vector<TreeRecord>* records, const Bytes& key);
    void Sort();

    Bytes bytes;
    TreeImage catalogTree;
    TreeImage extentsTree;
    TreeImage attributesTree;
    u32 catalogStart = 0;  // block, of a file in one piece
    u32 extentsStart = 0;
    u32 attributesStart = 0;

    void Patch16(u64 offset, u32 value);
    void Patch32(u64 offset, u32 value);
    // Changes the volume header and its copy.
    void PatchHeaders32(u32 offset, u32 value);

private:
    void Place(u32 block, const Bytes& content);
    void PutHeader();
    Runs LayCatalog(u32* next);

    std::vector<bool> used_;
};

}  // namespace VELK::test
