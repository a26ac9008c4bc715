// A volume in a file, its catalog the ordered store: a commit brings the tree, the bitmap and both
// headers to the medium as one.
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "hfs/volume/make_volume.h"
#include "store.h"

namespace bench {

namespace {

using namespace VELK;

constexpr u64 kVolumeSize = u64{768} << 20;
constexpr u32 kClump = 4u << 20;

struct alignas(4) NumberKey {
    u8 bytes[kCatKeyName] = {};

    explicit NumberKey(u32 number) {
        const u16 length = kCatKeyFixed;
        std::memcpy(bytes, &length, sizeof length);
        std::memcpy(bytes + kCatKeyParentId, &number, sizeof number);
    }
};

class TreehfsStore : public CommitStore {
public:
    TreehfsStore(const std::string& folder, u64 journalBytes) {
        Problem problem;
        auto file = FileDevice::Open(folder + "/volume.img", FileDevice::Mode::kCreate, kVolumeSize,
                                     &problem);
        FormatOptions options;
        options.deviceIsZero = true;
        options.withAttributes = false;
        options.journalSize = journalBytes;
        options.clumpSize = kClump;
        if (file) {
            volume_ = MakeVolume(std::move(file), options, &problem);
        }
        tree_ = volume_ ? volume_->Tree(kCatalogFileId, &problem) : nullptr;
        if (tree_ == nullptr) {
            std::fprintf(stderr, "treehfs: %s\n", problem.Text().c_str());
            std::exit(1);
        }
        ownRecords_ = tree_->header.leafRecords;
    }

    bool Put(std::uint32_t number, const std::uint8_t* data) override {
        const NumberKey key(number + 1000);
        u8 record[kRecordSize];
        std::memcpy(record, data, sizeof record);
        record[0] = 0xFF;  // of no known type, so it is kept as it is
        record[1] = 0xFF;
        int status = tree_->InsertRecord(key.bytes, number + 1000, record, sizeof record);
        if (status == kErrExists) {
            // Looking for its place has left the tree on the record that is there.
            status = tree_->UpdateKeyAndRecord(nullptr, record);
        }
        volume_->TrimCache();
        return status == kOk;
    }
    bool Commit() override { return volume_->Commit(0) == kOk; }
    bool IsCommitDue() const override { return volume_->IsCommitDue(); }
    std::uint64_t Count() override { return tree_->header.leafRecords - ownRecords_; }

private:
    std::unique_ptr<ImageVolume> volume_;
    CBTreeHfs* tree_ = nullptr;
    u32 ownRecords_ = 0;  // root folder and journal files, with their threads
};

}  // namespace

std::unique_ptr<CommitStore> MakeTreehfs(const std::string& folder, std::uint64_t journalBytes) {
    return std::make_unique<TreehfsStore>(folder, journalBytes);
}

}  // namespace bench
