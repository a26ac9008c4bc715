// The volume's services and the trees: while a tree waits for a service, no tree changes. Records
// of extents that find no room in the volume header are left to the commit.
#include <gtest/gtest.h>

#include <string>

#include "capture.h"
#include "hfs/volume/make_volume.h"
#include "ledger.h"
#include "small_volume.h"

namespace VELK {
namespace {

constexpr u32 kTreeIds[] = {kExtentsFileId, kCatalogFileId, kAttributesFileId};

// What a call into a tree would change.
struct TreeState {
    u32 nodeCount = 0;
    u64 pathVersion = 0;
    u64 references = 0;
    bool isDirty = false;
    std::vector<u32> modified;

    explicit TreeState(const CBTreeHfs* tree) {
        if (tree == nullptr) {
            return;
        }
        nodeCount = tree->nodeCount;
        pathVersion = tree->pathVersion;
        isDirty = tree->isDirty;
        modified = test::ModifiedNodes(*tree);
        for (const HfsNode* node : test::CachedNodes(*tree)) {
            references += static_cast<u64>(node->refCount);
        }
    }
    friend bool operator==(const TreeState&, const TreeState&) = default;
};

// Stands in front of a volume's services and compares the trees before and after each call.
class Watch {
public:
    explicit Watch(ImageVolume* volume) : volume_(volume) {
        HfsService<HfsVolumeOps>& service = volume->Fs()->service;
        behind_ = service;
        service = {&kOps, this};
    }
    ~Watch() { volume_->Fs()->service = behind_; }
    Watch(const Watch&) = delete;
    Watch& operator=(const Watch&) = delete;

    u32 calls = 0;
    u32 resizes = 0;
    std::vector<std::string> entered;

private:
    std::vector<TreeState> States() {
        std::vector<TreeState> states;
        for (const u32 fileId : kTreeIds) {
            states.emplace_back(volume_->OpenTree(fileId));
        }
        return states;
    }
    void Compare(const char* call, const std::vector<TreeState>& before) {
        ++calls;
        const std::vector<TreeState> after = States();
        for (std::size_t i = 0; i < before.size(); ++i) {
            if (before[i] != after[i]) {
                entered.push_back(std::string(call) + " changes tree " +
                                  std::to_string(kTreeIds[i]));
            }
        }
    }

    static Watch* Of(void* self) { return static_cast<Watch*>(self); }
    static int OnMap(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                     u32 fileId, u64 byteOffset, u32 bytes, bool noRead, HfsBcbBuf* bufs) {
        Watch* watch = Of(self);
        const std::vector<TreeState> before = watch->States();
        const int status = watch->behind_.ops->Map(watch->behind_.self, fs, runs, fork, forkType,
                                                   fileId, byteOffset, bytes, noRead, bufs);
        watch->Compare("Map", before);
        return status;
    }
    static int OnDirtyMeta(void* self, CFileSystemHfs* fs, buffer_head* bh) {
        Watch* watch = Of(self);
        const std::vector<TreeState> before = watch->States();
        const int status = watch->behind_.ops->DirtyMeta(watch->behind_.self, fs, bh);
        watch->Compare("DirtyMeta", before);
        return status;
    }
    static int OnZero(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                      u32 fileId, u64 byteOffset, u64 bytes) {
        Watch* watch = Of(self);
        const std::vector<TreeState> before = watch->States();
        const int status = watch->behind_.ops->Zero(watch->behind_.self, fs, runs, fork, forkType,
                                                    fileId, byteOffset, bytes);
        watch->Compare("Zero", before);
        return status;
    }
    static int OnResize(void* self, CFileSystemHfs* fs, HfsRuns* runs, HfsFork* fork, u8 forkType,
                        u32 fileId, u64 newSize) {
        Watch* watch = Of(self);
        const std::vector<TreeState> before = watch->States();
        const int status = watch->behind_.ops->Resize(watch->behind_.self, fs, runs, fork, forkType,
                                                      fileId, newSize);
        ++watch->resizes;
        watch->Compare("Resize", before);
        return status;
    }

    static constexpr HfsVolumeOps kOps = {OnMap, OnDirtyMeta, OnZero, OnResize};

    ImageVolume* volume_;
    HfsService<HfsVolumeOps> behind_;
};

TEST(VolumeServices, ChangeNoTree) {
    const test::Capture capture;
    Problem problem;
    const std::unique_ptr<ImageVolume> volume =
        MakeMemoryVolume(1 << 20, test::SmallTrees(), &problem);
    ASSERT_NE(nullptr, volume) << problem.Text();
    Watch watch(volume.get());
    CBTreeHfs* catalog = volume->Tree(kCatalogFileId, &problem);
    CBTreeHfs* attributes = volume->Tree(kAttributesFileId, &problem);
    ASSERT_NE(nullptr, catalog);
    ASSERT_NE(nullptr, attributes);
    const unsigned clump = 512;
    // Files that grow in turns soon have more pieces than the volume header has room for.
    for (u32 i = 0; i < 60; ++i) {
        for (u32 n = 0; n < 5; ++n) {
            ASSERT_EQ(0, test::InsertNumber(volume.get(), 100 + i * 5 + n));
        }
        ASSERT_EQ(0, attributes->ExtendBTree(attributes->header.totalNodes + 1, nullptr, &clump));
        ASSERT_EQ(0, volume->Commit(i % 4 == 0 ? 4 : 0));
    }
    for (u32 n = 400; n < 500; ++n) {
        ASSERT_EQ(0, test::InsertNumber(volume.get(), n));
    }
    volume->Restore();
    EXPECT_EQ(watch.entered, std::vector<std::string>{});
    EXPECT_GT(watch.calls, 500u);
    EXPECT_GT(watch.resizes, 60u);
    CBTreeHfs* extents = volume->OpenTree(kExtentsFileId);
    ASSERT_NE(nullptr, extents);
    EXPECT_GT(extents->header.leafRecords, 5u);
}

}  // namespace
}  // namespace VELK
