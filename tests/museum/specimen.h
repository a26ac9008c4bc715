// A sound little volume, and handles to hurt it by: each exhibit of the museum is one of these with
// a few of its bytes changed.
#pragma once

#include "check_support.h"

namespace VELK::test {

// One node in the image.
struct NodeHandle {
    Bytes* image;
    std::size_t at;  // of the node's first byte
    u32 size;

    void Set8(u32 offset, u32 value) { image->at(at + offset) = static_cast<u8>(value); }
    void Set16(u32 offset, u32 value) { Put16(image, at + offset, value); }
    void Set32(u32 offset, u32 value) { Put32(image, at + offset, value); }
    void Fill(u8 value);
    void CopyFrom(const NodeHandle& other);

    u32 Records() const { return Get16(*image, at + kDescNumRecords); }
    // Offset table: where record `index` starts; the entry behind the last one is the free space's.
    u32 Slot(u32 index) const { return Get16(*image, at + size - 2 * (index + 1)); }
    void SetSlot(u32 index, u32 value) { Set16(size - 2 * (index + 1), value); }
    void SwapSlots(u32 a, u32 b);

    // Fields of a record's key, counted from its length field, and of its data.
    void SetKey8(u32 record, u32 offset, u32 value) { Set8(Slot(record) + offset, value); }
    void SetKey16(u32 record, u32 offset, u32 value) { Set16(Slot(record) + offset, value); }
    void SetKey32(u32 record, u32 offset, u32 value) { Set32(Slot(record) + offset, value); }
    u32 Data(u32 record) const;  // offset of its first byte in the node
    void SetData8(u32 record, u32 offset, u32 value) { Set8(Data(record) + offset, value); }
    void SetData16(u32 record, u32 offset, u32 value) { Set16(Data(record) + offset, value); }
    void SetData32(u32 record, u32 offset, u32 value) { Set32(Data(record) + offset, value); }
};

// One tree in the image. Nodes are numbered as TreeImage says: header, leaves, index levels, map.
class TreeHandle {
public:
    TreeHandle(Bytes* image, const TreeImage* tree, const u32* firstBlock)
        : image_(image), tree_(tree), firstBlock_(firstBlock) {}

    NodeHandle Node(u32 nodeNum) const;
    NodeHandle Header() const { return Node(0); }
    NodeHandle Root() const { return Node(tree_->rootNode); }
    NodeHandle Leaf(u32 i) const { return Node(LeafNumber(i)); }
    NodeHandle Index(u32 level, u32 i) const { return Node(tree_->levels.at(level).at(i)); }
    NodeHandle MapNode(u32 i) const { return Node(tree_->mapNodes.at(i)); }
    u32 LeafNumber(u32 i) const { return tree_->levels.at(1).at(i); }
    u32 LastLeaf() const { return tree_->levels.at(1).back(); }
    u32 IndexNumber(u32 level, u32 i) const { return tree_->levels.at(level).at(i); }
    u32 MapNumber(u32 i) const { return tree_->mapNodes.at(i); }
    u32 FreeNumber() const { return tree_->totalNodes - 1; }
    const TreeImage& Image() const { return *tree_; }
    // The map bit of a node, in the header node or the first map node.
    void SetMapBit(u32 nodeNum, bool used) const;
    // The leaf a catalog, extents or attributes key lies in, and its record there.
    NodeHandle LeafOf(const Bytes& key, u32* record) const;

private:
    Bytes* image_;
    const TreeImage* tree_;
    const u32* firstBlock_;
};

// Byte offsets of the volume header's fields.
struct VolumeField {
    static constexpr u32 kSignature = 0, kVersion = 2, kAttributes = 4, kLastMounted = 8,
                         kJournalInfo = 12, kFileCount = 32, kFolderCount = 36, kBlockSize = 40,
                         kTotalBlocks = 44, kFreeBlocks = 48, kNextCatalogId = 64;
    // Forks, and fields and extents in a fork.
    static constexpr u32 kAllocation = 112, kExtents = 192, kCatalog = 272, kAttributesFile = 352,
                         kStartup = 432;
    static constexpr u32 kSizeHigh = 0, kSizeLow = 4, kBlocks = 12, kFirstStart = 16,
                         kFirstCount = 20, kSecondStart = 24, kSecondCount = 28;
};

// Nodes of 512 bytes; catalog of three levels with nine files in a folder, one of them in nine
// extents; an extents tree of two levels with that file's ninth extent and the bad-block list; an
// attributes tree of two levels.
class Specimen {
public:
    Specimen();

    // Attributes of the volume header: unmounted cleanly, with bad blocks.
    static constexpr u32 kClean = 0x300;

    VolumeImage volume;  // laid out
    Bytes& bytes;        // the image; may be replaced
    TreeHandle catalog;
    TreeHandle extents;
    TreeHandle attributes;

    // Lays the volume out again after its parts were changed.
    void Rebuild();
    // Gives the catalog so many nodes that its map needs a node of its own.
    void Widen();
    // Leaves no more room before the files than the trees need.
    void Narrow();
    // The data of a record, to be changed before Rebuild.
    Bytes& CatalogData(const Bytes& key) { return *VolumeImage::DataOf(&volume.catalog, key); }
    Bytes& ExtentsData(const Bytes& key) { return *VolumeImage::DataOf(&volume.extents, key); }
    Bytes& AttributesData(const Bytes& key) {
        return *VolumeImage::DataOf(&volume.attributes, key);
    }
    void Erase(std::vector<TreeRecord>* records, const Bytes& key);

    // Fields of the volume header: in both copies, or in the first one alone.
    void SetHeader16(u32 offset, u32 value);
    void SetHeader32(u32 offset, u32 value);
    void SetFirstHeader32(u32 offset, u32 value) { Put32(&bytes, 1024 + offset, value); }
    u32 Header32(u32 offset) const { return Get32(bytes, 1024 + offset); }
    // The mark of an allocation block.
    void SetBlockMark(u32 block, bool used);

    // The same volume with a journal of 32 KiB.
    void Journaled(u64 start, u64 end);
    u64 JournalOffset() const;                 // of the journal header
    u64 JournalInfoOffset() const;             // of the info block
    void SetJournal32(u32 offset, u32 value);  // in the journal header, with a checksum that fits
    void BreakJournalChecksum();

private:
    void MoveFiles(u32 dataStart, u32 totalBlocks);
};

}  // namespace VELK::test
