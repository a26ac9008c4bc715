// The tree engine over a volume in an image file, as a program finds it that mounts it and tells it
// to keep little.
#include <cstdio>
#include <cstdlib>

#include "hfs/volume/make_volume.h"
#include "store.h"

namespace bench {

namespace {

using namespace VELK;

constexpr u64 kBytesPerRecord = 1024;  // of the volume; the file has holes where nothing lies
constexpr u64 kSmallestVolume = u64{64} << 20;
constexpr u32 kClump = 4u << 20;
// Leaves that are met once need not stay: what they leave behind is warm, fresh memory is cleared
// by the system first.
constexpr u64 kCache = u64{800} << 10;
constexpr u32 kBatch = 100000;  // records of a commit while the image is filled

[[noreturn]] void Fail(const char* what, const std::string& text) {
    std::fprintf(stderr, "treehfs-image: %s: %s\n", what, text.c_str());
    std::abort();
}

class ImageStore : public Store {
public:
    ImageStore(const Workload& load, const std::string& folder) {
        const std::string path = folder + "/volume.img";
        Problem problem;
        OpenOptions cached;
        cached.cacheBudget = kCache;
        volume_ = ImageVolume::OpenFile(path, cached, nullptr, &problem);
        if (!volume_) {
            FormatOptions options;
            options.deviceIsZero = true;
            options.withAttributes = false;
            options.clumpSize = kClump;
            auto file = FileDevice::Open(path, FileDevice::Mode::kCreate,
                                         kSmallestVolume + load.count * kBytesPerRecord, &problem);
            volume_ = file ? MakeVolume(std::move(file), options, &problem) : nullptr;
        }
        tree_ = volume_ ? volume_->Tree(kCatalogFileId, &problem) : nullptr;
        if (tree_ == nullptr) {
            Fail("opening", problem.Text());
        }
    }
    ~ImageStore() override {
        path_.ClearPath();
        volume_->Close();
    }

    bool Insert(const Record& record, bool) override {
        if (tree_->InsertRecord(record.host, record.Parent(), record.data, record.size) != kOk) {
            return false;
        }
        volume_->TrimCache();
        inserted_ += 1;
        return inserted_ % kBatch != 0 || volume_->Commit(0) == kOk;
    }
    int Lookup(const Record& record, std::uint8_t* out) override {
        volume_->TrimCache();
        unsigned size = 0;
        return tree_->FindRecord(record.host, record.Parent(), out, kLargestData, &size, &path_) ==
                       kOk
                   ? static_cast<int>(size)
                   : -1;
    }
    void Keep() override {
        if (const int status = volume_->Commit(0)) {
            Fail("committing", StatusText(status));
        }
    }
    std::uint64_t Bytes() override { return volume_->ForkBytes(kCatalogFileId); }

    // What a store in memory is measured by: not asked of an image.
    bool Update(const Record&) override { return false; }
    bool Delete(const Record&) override { return false; }
    std::uint32_t Scan(Digest*) override { return 0; }
    std::uint32_t List(std::uint32_t, Digest*) override { return 0; }
    bool Less(std::uint32_t, std::uint32_t) const override { return false; }

private:
    std::unique_ptr<ImageVolume> volume_;
    CBTreeHfs* tree_ = nullptr;
    HfsFindData path_;
    std::uint32_t inserted_ = 0;
};

}  // namespace

std::unique_ptr<Store> MakeImage(const Workload& load, const std::string& folder) {
    return std::make_unique<ImageStore>(load, folder);
}

}  // namespace bench
