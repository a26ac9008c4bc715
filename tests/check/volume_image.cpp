// A whole small volume, laid out by hand; see check_support.h.
#include <algorithm>
#include <stdexcept>

#include "check_support.h"
#include "hfs/format.h"
#include "keys.h"

namespace VELK::test {

namespace {

constexpr u32 kHeader = 1024;
constexpr u32 kForks = kHeader + 112;

// Keys of one tree in rising order: numbers first, then names, which these tests keep in lower
// case.
bool ComesBefore(const TreeRecord& left, const TreeRecord& right) {
    const auto order = [](const Bytes& key) { return Bytes(key.begin() + 2, key.end()); };
    return order(left.key) < order(right.key);
}

}  // namespace

VolumeImage::VolumeImage() {
    const Bytes empty(80);
    catalog = {
        {DiskCatKey(1, u"root"), FolderData(2, 1)},
        {DiskCatKey(2, u""), ThreadData(true, 1, u"root")},
        {DiskCatKey(2, u"dir"), FolderData(16, 2)},
        {DiskCatKey(16, u""), ThreadData(true, 2, u"dir")},
        {DiskCatKey(16, u"alpha"), FileData(17, ForkData({{kDataStart, 2}}, kBlockSize), empty)},
        {DiskCatKey(16, u"beta"), FileData(18, empty, empty)},
        {DiskCatKey(17, u""), ThreadData(false, 16, u"alpha")},
        {DiskCatKey(18, u""), ThreadData(false, 16, u"beta")}};
    attributes = {{DiskAttrKey(17, 0, u"tag"), InlineAttribute(5)}};
    owned = {kDataStart, kDataStart + 1};
}

Bytes* VolumeImage::DataOf(std::vector<TreeRecord>* records, const Bytes& key) {
    for (TreeRecord& record : *records) {
        if (record.key == key) {
            return &record.data;
        }
    }
    throw std::out_of_range("no such record");
}

void VolumeImage::Sort() {
    // Catalog keys hold the length of the name before the name.
    std::sort(catalog.begin(), catalog.end(), [](const TreeRecord& left, const TreeRecord& right) {
        const auto parent = [](const TreeRecord& record) { return Get32(record.key, 2); };
        const auto name = [](const TreeRecord& record) {
            return Bytes(record.key.begin() + 8, record.key.end());
        };
        return parent(left) != parent(right) ? parent(left) < parent(right)
                                             : name(left) < name(right);
    });
    std::sort(attributes.begin(), attributes.end(), ComesBefore);
}

void VolumeImage::Patch16(u64 offset, u32 value) {
    Put16(&bytes, offset, value);
}
void VolumeImage::Patch32(u64 offset, u32 value) {
    Put32(&bytes, offset, value);
}

void VolumeImage::PatchHeaders32(u32 offset, u32 value) {
    Patch32(kHeader + offset, value);
    Patch32(bytes.size() - 1024 + offset, value);
}

void VolumeImage::Place(u32 block, const Bytes& content) {
    std::copy(content.begin(), content.end(),
              bytes.begin() + static_cast<long>(block) * kBlockSize);
    for (std::size_t i = 0; i < (content.size() + kBlockSize - 1) / kBlockSize; ++i) {
        used_.at(block + i) = true;
    }
}

// The catalog in `catalogPieces` runs with a free block between each two.
Runs VolumeImage::LayCatalog(u32* next) {
    const Bytes& content = catalogTree.bytes;
    const u32 blocks = static_cast<u32>(content.size() / kBlockSize);
    Runs runs;
    u32 done = 0;
    for (u32 piece = 0; piece < catalogPieces; ++piece) {
        const u32 count = piece + 1 == catalogPieces ? blocks - done : blocks / catalogPieces;
        const auto from = content.begin() + static_cast<long>(done) * kBlockSize;
        Place(*next, Bytes(from, from + static_cast<long>(count) * kBlockSize));
        runs.push_back({*next, count});
        *next += count + 1;
        done += count;
    }
    return runs;
}

void VolumeImage::PutHeader() {
    u32 files = 0;
    u32 folders = 0;
    u32 nextId = 16;
    for (const TreeRecord& record : catalog) {
        const u32 type = Get16(record.data, 0);
        files += type == 2 ? 1u : 0u;
        folders += type == 1 ? 1u : 0u;
        nextId = type <= 2 ? std::max(nextId, Get32(record.data, 8) + 1) : nextId;
    }
    Put16(&bytes, kHeader, isHfsx ? 0x4858 : 0x482B);
    Put16(&bytes, kHeader + 2, isHfsx ? 5 : 4);
    Put32(&bytes, kHeader + 4, 0x100);
    Put32(&bytes, kHeader + 32, files);
    Put32(&bytes, kHeader + 36, folders - 1);
    Put32(&bytes, kHeader + 40, kBlockSize);
    Put32(&bytes, kHeader + 44, totalBlocks);
    Put32(&bytes, kHeader + 48, static_cast<u32>(std::count(used_.begin(), used_.end(), false)));
    Put32(&bytes, kHeader + 64, nextId);
}

void VolumeImage::Build() {
    bytes.assign(static_cast<std::size_t>(totalBlocks) * kBlockSize, 0);
    used_.assign(totalBlocks, false);
    for (u32 block : {0u, 1u, 2u, 3u, totalBlocks - 2, totalBlocks - 1}) {
        used_[block] = true;
    }
    for (u32 block : owned) {
        used_.at(block) = true;
    }
    TreeShape shape;
    shape.keyCompareType = isHfsx ? kKeyCompareBinary : kKeyCompareFolding;
    shape.childrenPerIndex = childrenPerIndex;
    shape.freeNodes = freeNodes;
    catalogTree = BuildTree(shape, catalog);
    catalogStart = 4;
    u32 next = catalogStart;
    const Runs runs = LayCatalog(&next);
    std::vector<TreeRecord> overflow = extents;
    u32 startBlock = 0;
    for (std::size_t i = 0; i < runs.size(); startBlock += runs[i].second, ++i) {
        if (i >= 8 && i % 8 == 0) {
            const auto from = runs.begin() + static_cast<long>(i);
            const Runs eight(from,
                             from + static_cast<long>(std::min<std::size_t>(8, runs.size() - i)));
            overflow.push_back(
                {DiskExtKey(kForkData, kCatalogFileId, startBlock), ExtentData(eight)});
        }
    }
    std::sort(overflow.begin(), overflow.end(), [](const TreeRecord& a, const TreeRecord& b) {
        const auto order = [](const Bytes& key) {
            return std::make_tuple(Get32(key, 4), key[2], Get32(key, 8));
        };
        return order(a.key) < order(b.key);
    });
    extentsTree = BuildTree({.fileId = kExtentsFileId}, overflow);
    extentsStart = next;
    Place(extentsStart, extentsTree.bytes);
    next += static_cast<u32>(extentsTree.bytes.size() / kBlockSize);
    std::vector<Bytes> forks = {ForkData({{3, 1}}, kBlockSize),
                                ForkData({{extentsStart, next - extentsStart}}, kBlockSize),
                                ForkData(runs, kBlockSize), Bytes(80), Bytes(80)};
    if (hasAttributes) {
        attributesTree = BuildTree({.fileId = kAttributesFileId, .nodeSize = 1024}, attributes);
        attributesStart = next;
        Place(attributesStart, attributesTree.bytes);
        const u32 blocks = static_cast<u32>(attributesTree.bytes.size() / kBlockSize);
        forks[3] = ForkData({{attributesStart, blocks}}, kBlockSize);
        next += blocks;
    }
    if (next > dataStart) {
        throw std::length_error("the trees reach into the data");
    }
    PutHeader();
    for (std::size_t i = 0; i < forks.size(); ++i) {
        std::copy(forks[i].begin(), forks[i].end(),
                  bytes.begin() + kForks + static_cast<long>(80 * i));
    }
    for (u32 block = 0; block < totalBlocks; ++block) {
        if (used_[block]) {
            u8& marks = bytes[3 * kBlockSize + block / 8];
            marks = static_cast<u8>(marks | (0x80u >> (block % 8)));
        }
    }
    std::copy(bytes.begin() + kHeader, bytes.begin() + kHeader + 512, bytes.end() - 1024);
}

}  // namespace VELK::test
