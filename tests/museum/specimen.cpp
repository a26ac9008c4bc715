// See specimen.h.
#include "specimen.h"

#include <algorithm>
#include <iterator>
#include <stdexcept>

#include "hfs/format.h"
#include "keys.h"

namespace VELK::test {

namespace {

constexpr u32 kFiles = 9;
constexpr u32 kBadRecords = 8;

// Every second block from `first` on, one at a time.
Runs SingleBlocks(u32 first, u32 count) {
    Runs runs;
    for (u32 i = 0; i < count; ++i) {
        runs.push_back({first + 2 * i, 1});
    }
    return runs;
}

Bytes ForkAttribute(const Runs& runs) {
    Bytes data(8);
    Put32(&data, 0, 0x20);
    AppendBytes(&data, ForkData(runs, VolumeImage::kBlockSize));
    return data;
}

void FillCatalog(VolumeImage* volume) {
    const Bytes empty(80);
    const u32 data = volume->dataStart;
    volume->catalog = {{DiskCatKey(1, u"root"), FolderData(2, 1)},
                       {DiskCatKey(2, u""), ThreadData(true, 1, u"root")},
                       {DiskCatKey(2, u"dir"), FolderData(16, kFiles)},
                       {DiskCatKey(16, u""), ThreadData(true, 2, u"dir")}};
    for (u32 i = 0; i < kFiles; ++i) {
        const std::u16string name = {u'f', static_cast<char16_t>(u'a' + i)};
        const Runs runs = i == 0 ? SingleBlocks(data, 9) : Runs{{data + 20 + 2 * i, 2}};
        volume->catalog.push_back(
            {DiskCatKey(16, name),
             FileData(17 + i, ForkData(runs, VolumeImage::kBlockSize), empty)});
        volume->catalog.push_back({DiskCatKey(17 + i, u""), ThreadData(false, 16, name)});
    }
    volume->Sort();
}

void FillOthers(VolumeImage* volume) {
    const u32 data = volume->dataStart;
    const u32 bad = data + 100;
    volume->extents.clear();
    for (u32 i = 0; i < kBadRecords; ++i) {
        volume->extents.push_back({DiskExtKey(kForkData, kBadBlockFileId, 8 * i),
                                   ExtentData(SingleBlocks(bad + 16 * i, 8))});
    }
    volume->extents.push_back({DiskExtKey(kForkData, 17, 8), ExtentData({{data + 16, 1}})});
    volume->attributes.clear();
    for (u32 i = 0; i < 6; ++i) {
        const std::u16string name = {u't', static_cast<char16_t>(u'0' + i)};
        volume->attributes.push_back({DiskAttrKey(17, 0, name), InlineAttribute(200)});
    }
    volume->attributes.push_back({DiskAttrKey(18, 0, u"big"), ForkAttribute({{data + 90, 1}})});
    volume->owned.clear();
    for (u32 block = data; block < data + 100 + 16 * kBadRecords; ++block) {
        const bool isFile =
            block < data + 17 ? block % 2 == data % 2 : block >= data + 22 && block < data + 38;
        const bool isBad = block >= bad && (block - bad) % 2 == 0;
        if (isFile || isBad || block == data + 90) {
            volume->owned.push_back(block);
        }
    }
}

}  // namespace

void NodeHandle::Fill(u8 value) {
    std::fill_n(image->begin() + static_cast<std::ptrdiff_t>(at), size, value);
}

void NodeHandle::CopyFrom(const NodeHandle& other) {
    std::copy_n(other.image->begin() + static_cast<std::ptrdiff_t>(other.at), size,
                image->begin() + static_cast<std::ptrdiff_t>(at));
}

void NodeHandle::SwapSlots(u32 a, u32 b) {
    const u32 first = Slot(a);
    SetSlot(a, Slot(b));
    SetSlot(b, first);
}

u32 NodeHandle::Data(u32 record) const {
    const u32 start = Slot(record);
    const u32 key = kKeyLengthSize + Get16(*image, at + start);
    return start + key + key % 2;
}

NodeHandle TreeHandle::Node(u32 nodeNum) const {
    const u32 size = tree_->shape.nodeSize;
    return {image_,
            std::size_t{*firstBlock_} * VolumeImage::kBlockSize + std::size_t{nodeNum} * size,
            size};
}

void TreeHandle::SetMapBit(u32 nodeNum, bool used) const {
    const u32 inHeader = (tree_->shape.nodeSize - kHeadMapOverhead) * 8;
    NodeHandle node = nodeNum < inHeader ? Header() : MapNode(0);
    const u32 bit = nodeNum < inHeader ? nodeNum : nodeNum - inHeader;
    const u32 offset = (nodeNum < inHeader ? kHeadMapRecord : kDescSize) + bit / 8;
    const u32 mask = 0x80u >> (bit % 8);
    const u32 before = node.image->at(node.at + offset);
    node.Set8(offset, used ? before | mask : before & ~mask);
}

NodeHandle TreeHandle::LeafOf(const Bytes& key, u32* record) const {
    for (const u32 number : tree_->levels.at(1)) {
        const NodeHandle node = Node(number);
        for (u32 i = 0; i < node.Records(); ++i) {
            const auto start =
                image_->begin() + static_cast<std::ptrdiff_t>(node.at + node.Slot(i));
            if (std::equal(key.begin(), key.end(), start)) {
                *record = i;
                return node;
            }
        }
    }
    throw std::out_of_range("no leaf holds this key");
}

Specimen::Specimen()
    : bytes(volume.bytes),
      catalog(&volume.bytes, &volume.catalogTree, &volume.catalogStart),
      extents(&volume.bytes, &volume.extentsTree, &volume.extentsStart),
      attributes(&volume.bytes, &volume.attributesTree, &volume.attributesStart) {
    volume.childrenPerIndex = 4;
    FillCatalog(&volume);
    FillOthers(&volume);
    Rebuild();
}

// The header has to tell of bad blocks where there are any.
void Specimen::Rebuild() {
    volume.Build();
    SetHeader32(VolumeField::kAttributes, kClean);
}

void Specimen::MoveFiles(u32 dataStart, u32 totalBlocks) {
    volume.totalBlocks = totalBlocks;
    volume.dataStart = dataStart;
    FillCatalog(&volume);
    FillOthers(&volume);
    Rebuild();
}

void Specimen::Widen() {
    volume.freeNodes = 2100;
    MoveFiles(2700, 3000);
}

void Specimen::Narrow() {
    MoveFiles(110, 350);
}

void Specimen::Erase(std::vector<TreeRecord>* records, const Bytes& key) {
    const auto found = std::find_if(records->begin(), records->end(),
                                    [&](const TreeRecord& record) { return record.key == key; });
    if (found == records->end()) {
        throw std::out_of_range("no such record");
    }
    records->erase(found);
}

void Specimen::SetHeader16(u32 offset, u32 value) {
    Put16(&bytes, 1024 + offset, value);
    Put16(&bytes, bytes.size() - 1024 + offset, value);
}

void Specimen::SetHeader32(u32 offset, u32 value) {
    Put32(&bytes, 1024 + offset, value);
    Put32(&bytes, bytes.size() - 1024 + offset, value);
}

void Specimen::SetBlockMark(u32 block, bool used) {
    u8& marks = bytes.at(std::size_t{3} * VolumeImage::kBlockSize + block / 8);
    const u32 mask = 0x80u >> (block % 8);
    marks = static_cast<u8>(used ? marks | mask : marks & ~mask);
}

void Specimen::Journaled(u64 start, u64 end) {
    constexpr u32 kInfoBlock = 400;
    constexpr u32 kFirstBlock = 410;
    constexpr u32 kBlocks = 64;
    volume.owned.push_back(kInfoBlock);
    for (u32 i = 0; i < kBlocks; ++i) {
        volume.owned.push_back(kFirstBlock + i);
    }
    Rebuild();
    SetHeader32(VolumeField::kAttributes, kClean | 0x2000);
    SetHeader32(VolumeField::kJournalInfo, kInfoBlock);
    const std::size_t info = JournalInfoOffset();
    Put32(&bytes, info, 1);  // it lies in the volume
    Put32(&bytes, info + 40, kFirstBlock * VolumeImage::kBlockSize);
    Put32(&bytes, info + 48, kBlocks * VolumeImage::kBlockSize);
    const std::size_t header = JournalOffset();
    const u64 fields[] = {0x4A4E4C78, 0x12345678, 0,  start,
                          0,          end,        0,  kBlocks * VolumeImage::kBlockSize,
                          4096,       0,          512};
    for (std::size_t i = 0; i < std::size(fields); ++i) {
        Put32(&bytes, header + 4 * i, static_cast<u32>(fields[i]));
    }
    SetJournal32(0, static_cast<u32>(fields[0]));
}

u64 Specimen::JournalInfoOffset() const {
    return u64{Header32(VolumeField::kJournalInfo)} * VolumeImage::kBlockSize;
}

u64 Specimen::JournalOffset() const {
    return Get32(bytes, JournalInfoOffset() + 40);
}

void Specimen::SetJournal32(u32 offset, u32 value) {
    const std::size_t at = JournalOffset();
    Put32(&bytes, at + offset, value);
    Put32(&bytes, at + 36, 0);
    u32 sum = 0;
    for (u32 i = 0; i < 44; ++i) {
        sum = (sum << 8) ^ (sum + bytes.at(at + i));
    }
    Put32(&bytes, at + 36, ~sum);
}

void Specimen::BreakJournalChecksum() {
    bytes.at(JournalOffset() + 36) ^= 1;
}

}  // namespace VELK::test
