// See reading.h.
#include "reading.h"

#include <cstring>
#include <memory>

#include "capture.h"
#include "hfs/volume/image_volume.h"
#include "keys.h"
#include "ledger.h"
#include "quiet.h"

namespace VELK::test {

namespace {

constexpr u32 kLongestData = 65536;
constexpr u32 kTreeIds[] = {kExtentsFileId, kCatalogFileId, kAttributesFileId};

HostKey HostFormOf(u32 fileId, const Bytes& disk) {
    const auto name = [&](std::size_t lengthAt) {
        std::u16string units;
        for (u32 i = 0; i < Get16(disk, lengthAt); ++i) {
            units.push_back(static_cast<char16_t>(Get16(disk, lengthAt + 2 + 2 * i)));
        }
        return units;
    };
    switch (fileId) {
        case kExtentsFileId:
            return HostExtKey(disk[kExtKeyForkType], Get32(disk, kExtKeyFileId),
                              Get32(disk, kExtKeyStartBlock));
        case kCatalogFileId:
            return HostCatKey(Get32(disk, kCatKeyParentId), name(kCatKeyNameLength));
        default:
            return HostAttrKey(Get32(disk, kAttrKeyFileId), Get32(disk, kAttrKeyStartBlock),
                               name(kAttrKeyNameLength));
    }
}

// "corrupt"; statuses of the volume layer, which have no name, as "A0000202".
std::string NameOf(int status) {
    const std::string name = StatusName(status);
    return name == "status" ? Format("%08X", static_cast<u32>(status)) : name;
}

// What was said since the last look: " 15@441 >1807 !410".
std::string Said(const Events& events) {
    std::string text;
    for (const Event& event : events) {
        const bool isReport = event.kind == Event::Kind::kReport;
        if (isReport && event.code < 0x100) {
            text += " " + std::to_string(event.code) + "@" + std::to_string(event.site);
        } else if (isReport) {
            text += " >" + std::to_string(event.site);
        } else if (event.kind == Event::Kind::kAssertion) {
            text += " !" + std::to_string(event.site);
        }
    }
    return text;
}

// Reads one tree. `text_` gets a piece for each kind of call that did not go as it should.
class TreeReader {
public:
    TreeReader(CBTreeHfs* tree, Capture* capture, Reading* reading, const TreeImage& sound,
               const std::vector<TreeRecord>& records)
        : tree_(tree), capture_(capture), reading_(reading), sound_(sound), records_(records) {}

    void ReadAll() {
        Find();
        Walk("walk", tree_->header.firstLeafNode, 1);
        Walk("back", tree_->header.lastLeafNode, -1);
        BadBlocks();
        Accessors();
        path_.ClearPath();
        tree_->findData.ClearPath();
    }

private:
    // Every call goes through here: what it asked of the cache is bounded by the tree's size.
    template <typename Call>
    int Counted(Call call) {
        const u64 before = u64{tree_->hitCount} + tree_->readCount;
        const int status = call();
        const u64 requests = u64{tree_->hitCount} + tree_->readCount - before;
        if (requests > 4 * (u64{tree_->header.totalNodes} + 64)) {
            reading_->fault += " " + std::to_string(requests) + " node requests in one call";
        }
        return status;
    }

    void Tell(const char* call, const std::string& what) {
        reading_->text += (reading_->text.empty() ? "" : "; ") + std::string(call) + " " +
                          ForkName(tree_->fileId) + ": " + what;
    }

    void Find() {
        u32 failed = 0;
        u32 absent = 0;
        std::string first;
        for (const TreeRecord& record : records_) {
            const HostKey key = HostFormOf(tree_->fileId, record.key);
            bool found = false;
            size_ = kLongestData;
            const int status = Counted([&] {
                return tree_->FindEntry(key, key.id, &path_, &found, record_, &size_, nullptr,
                                        nullptr);
            });
            const std::string said = Said(capture_->Take());
            failed += status != kOk ? 1 : 0;
            absent += status == kOk && !found ? 1 : 0;
            if (first.empty() && (status != kOk || !said.empty())) {
                first = NameOf(status) + said;
            }
        }
        const std::string of = " of " + std::to_string(records_.size());
        if (!first.empty()) {
            Tell("find", first + " (" + std::to_string(failed) + of + ")");
        }
        if (absent != 0) {
            Tell("find", std::to_string(absent) + of + " not there");
        }
    }

    // From one end of the leaf chain to the other, a record at a time.
    void Walk(const char* name, u32 leaf, int step) {
        const u32 whole = Stops(step);
        u32 count = 0;
        path_.ClearPath();
        path_.level = 0;
        // Backwards from behind the last record of the sound tree's last leaf.
        const u64 index = step > 0 ? 0 : LastIndex(leaf);
        int status = Counted([&] {
            return tree_->SetPos((u64{leaf} << tree_->nodeShift) + index, record_, sizeof record_,
                                 &size_, keyOut_, sizeof keyOut_, &keySize_, &path_);
        });
        while (status == kOk && ++count <= 2 * whole) {
            status = Counted([&] {
                return tree_->IncPos(step, record_, sizeof record_, &size_, keyOut_, sizeof keyOut_,
                                     &keySize_, &path_);
            });
        }
        const std::string said = Said(capture_->Take());
        const std::string end = count > 2 * whole ? "never ends" : NameOf(status) + said;
        if (count != whole || status != kErrNotFound || !said.empty()) {
            Tell(name, end + " (after " + std::to_string(std::min(count, 2 * whole)) + " of " +
                           std::to_string(whole) + ")");
        }
    }

    // Records a walk stops at on the sound tree. A step back that leaves a leaf lands on the first
    // record of the leaf before.
    u32 Stops(int step) const {
        if (step > 0 || records_.empty()) {
            return static_cast<u32>(records_.size());
        }
        const std::vector<u32>& leaves = sound_.levels[1];
        return Get16(sound_.Node(leaves.back()), kDescNumRecords) +
               static_cast<u32>(leaves.size()) - 1;
    }

    u64 LastIndex(u32 leaf) {
        HfsNode* node = nullptr;
        u64 index = 0;
        if (tree_->GetINode(leaf, &node, false) == kOk) {
            const u8* bytes = node->bufs[0].data;
            const u32 records =
                static_cast<u32>(bytes[kDescNumRecords] << 8) | bytes[kDescNumRecords + 1];
            index = records == 0 ? 0 : std::min(records - 1, 100u);
            node->refCount -= 1;
        }
        capture_->Take();
        return index;
    }

    void BadBlocks() {
        if (tree_->fileId != kExtentsFileId) {
            return;
        }
        HfsRuns runs;
        const int status = Counted([&] { return tree_->LoadBadBlocks(&runs); });
        const std::string said = Said(capture_->Take());
        u32 blocks = 0;
        for (u32 i = 0; i < runs.Count(); ++i) {
            blocks += runs.At(i).lcn != HfsRuns::kHole ? runs.At(i).length : 0;
        }
        if (status != kOk || !said.empty() || blocks != 64) {
            Tell("badblocks",
                 NameOf(status) + said + " (" + std::to_string(blocks) + " of 64 blocks)");
        }
    }

    // Any index, in every node of the sound tree and the first ones behind it. Most are refused, at
    // more words than all else together; nobody asks for them.
    void Accessors() {
        const Silence silence;
        const u32 nodes = std::min(sound_.totalNodes, 40u) + 2;
        for (u32 n = 0; n < nodes; ++n) {
            HfsNode* node = nullptr;
            if (tree_->GetINode(n, &node, false) != kOk) {
                continue;
            }
            for (int index = -2; index < 20; ++index) {
                Accessors(*node, index);
            }
            Accessors(*node, 65535);
            node->refCount -= 1;
        }
    }

    void Accessors(const HfsNode& node, int index) {
        NodeKey key = {};
        unsigned number = 0;
        node.GetKey(&tree_->header, index, &key);
        node.GetFreeKey(&tree_->header, static_cast<unsigned>(index), &key);
        node.GetChildNodeNum(&tree_->header, index, &number);
        node.GetRecordSize(&tree_->header, index, &number);
        node.GetNodeFreeSize(&tree_->header, &number);
    }

    CBTreeHfs* tree_;
    Capture* capture_;
    Reading* reading_;
    const TreeImage& sound_;
    const std::vector<TreeRecord>& records_;
    HfsFindData path_;
    u8 record_[kLongestData];
    alignas(8) u8 keyOut_[528];
    unsigned size_ = 0;
    unsigned keySize_ = 0;
};

// Whether reading has left something to write, or references behind.
std::string FaultOf(ImageVolume* volume) {
    std::string fault;
    for (const u32 fileId : kTreeIds) {
        const CBTreeHfs* tree = volume->OpenTree(fileId);
        if (tree == nullptr) {
            continue;
        }
        const ::testing::AssertionResult ledger = LedgerHolds(*tree, References(tree->findData));
        fault += ledger ? "" : std::string(" ") + ledger.message();
        fault += tree->IsDirty() ? " the header is dirty" : "";
        fault += ModifiedNodes(*tree).empty() ? "" : " a node is modified";
    }
    return volume->HandedOverBlocks() == 0 ? fault : fault + " blocks were handed over";
}

// Adds the volume's remarks from number `first` on; returns how many there are.
std::size_t TellNotes(const ImageVolume& volume, std::size_t first, const char* when,
                      Reading* reading) {
    for (std::size_t i = first; i < volume.Notes().size(); ++i) {
        reading->text += (reading->text.empty() ? "" : "; ") + std::string(when) + ": " +
                         volume.Notes()[i].Text();
    }
    return volume.Notes().size();
}

Reading ReadAs(Access access, const Bytes& image, const VolumeImage& sound) {
    Reading reading;
    Capture capture;
    OpenOptions options;
    options.access = access;
    options.replay = access != Access::kReadOnly;
    Problem problem;
    auto device = std::make_unique<MemoryDevice>(image.size());
    MemoryDevice* kept = device.get();
    device->Write(0, image.data(), image.size());
    const auto volume = ImageVolume::Open(std::move(device), options, nullptr, &problem);
    if (!volume) {
        reading.text = "mount: " + problem.Text();
        return reading;
    }
    std::size_t told = TellNotes(*volume, 0, "mount", &reading);
    for (const u32 fileId : kTreeIds) {
        capture.Take();
        CBTreeHfs* tree = volume->Tree(fileId, &problem);
        const std::string said = Said(capture.Take());
        if (tree == nullptr || !said.empty()) {
            reading.text += (reading.text.empty() ? "open " : "; open ") +
                            std::string(ForkName(fileId)) + ": " +
                            (tree == nullptr ? problem.Text() + "," : std::string("ok")) + said;
        }
        told = TellNotes(*volume, told, "open", &reading);
        if (tree == nullptr) {
            continue;
        }
        const bool isExtents = fileId == kExtentsFileId;
        const bool isCatalog = fileId == kCatalogFileId;
        TreeReader(tree, &capture, &reading,
                   isExtents   ? sound.extentsTree
                   : isCatalog ? sound.catalogTree
                               : sound.attributesTree,
                   isExtents   ? sound.extents
                   : isCatalog ? sound.catalog
                               : sound.attributes)
            .ReadAll();
    }
    reading.fault += FaultOf(volume.get());
    Bytes after(image.size());
    kept->Read(0, after.data(), after.size());
    reading.fault += after == image ? "" : " the image changed";
    return reading;
}

}  // namespace

Reading ReadEverything(const Bytes& image, const VolumeImage& sound) {
    Reading reading = ReadAs(Access::kReadOnly, image, sound);
    // Where changes would be taken, reading makes none either.
    reading.fault += ReadAs(Access::kOverlay, image, sound).fault;
    return reading;
}

}  // namespace VELK::test
