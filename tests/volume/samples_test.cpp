// Every sample volume opened: place, header facts and the headers of its trees.
#include <gtest/gtest.h>

#include <ostream>

#include "hfs/volume/image_volume.h"
#include "samples.h"

namespace VELK {
namespace {

struct TreeFacts {
    u32 nodeSize;
    u32 depth;
    u32 records;
    u32 used;
    u32 total;
};

struct Sample {
    const char* name;
    u64 offset;
    bool hfsx;
    bool wrapped;
    u32 blocks;
    u32 blockSize;
    TreeFacts catalog;
    TreeFacts extents;
    TreeFacts attributes;  // nodeSize 0: none
    u32 files;
    u32 folders;
};

void PrintTo(const Sample& sample, std::ostream* out) {
    *out << sample.name;
}

constexpr TreeFacts kNone = {0, 0, 0, 0, 0};

const Sample kSamples[] = {
    {"plain.img",
     0,
     false,
     false,
     1014,
     4096,
     {4096, 1, 26, 2, 8},
     {4096, 0, 0, 1, 8},
     {8192, 1, 1, 2, 8},
     8,
     4},
    {"blank.img",
     0,
     false,
     false,
     256,
     4096,
     {4096, 1, 2, 2, 8},
     {4096, 0, 0, 1, 8},
     {8192, 0, 0, 1, 8},
     0,
     0},
    {"hardlinks-small.img",
     0,
     false,
     false,
     256,
     4096,
     {4096, 2, 56, 5, 16},
     {4096, 0, 0, 1, 8},
     {8192, 0, 0, 1, 8},
     22,
     5},
    {"many-names.img",
     0,
     false,
     false,
     1280,
     4096,
     {4096, 3, 31178, 1166, 1170},
     {4096, 0, 0, 1, 10},
     {8192, 0, 0, 1, 8},
     14984,
     604},
    {"noattr.img",
     0,
     false,
     false,
     16384,
     4096,
     {4096, 1, 8, 2, 128},
     {4096, 0, 0, 1, 128},
     kNone,
     2,
     1},
    {"linux-512.img",
     0,
     false,
     false,
     1024,
     512,
     {4096, 1, 20, 2, 8},
     {4096, 0, 0, 1, 8},
     {8192, 1, 2, 2, 8},
     7,
     2},
    {"linux-hfsx-1024.img",
     0,
     true,
     false,
     512,
     1024,
     {4096, 1, 20, 2, 8},
     {4096, 0, 0, 1, 8},
     {8192, 1, 2, 2, 8},
     7,
     2},
    {"linux-2048-cp.img",
     0,
     false,
     false,
     256,
     2048,
     {4096, 1, 20, 2, 8},
     {4096, 0, 0, 1, 8},
     {8192, 1, 2, 2, 8},
     7,
     2},
    {"hfsx.img",
     0,
     true,
     false,
     466,
     4096,
     {4096, 1, 12, 2, 20},
     {4096, 0, 0, 1, 20},
     {8192, 0, 0, 1, 10},
     3,
     2},
    {"hfsx-app.img",
     0,
     true,
     false,
     1250,
     4096,
     {4096, 2, 40, 4, 9},
     {4096, 0, 0, 1, 9},
     {8192, 0, 0, 1, 8},
     12,
     7},
    {"wrapped.img",
     45056,
     false,
     true,
     2036,
     4096,
     {4096, 1, 2, 2, 15},
     {4096, 0, 0, 1, 15},
     kNone,
     0,
     0},
    {"hardlinks-journaled.img",
     0,
     false,
     false,
     10000,
     4096,
     {4096, 1, 28, 2, 78},
     {4096, 0, 0, 1, 78},
     {8192, 0, 0, 1, 39},
     9,
     4},
    {"attributes-journaled.img",
     0,
     false,
     false,
     24410,
     4096,
     {4096, 2, 30, 4, 190},
     {4096, 0, 0, 1, 190},
     {8192, 1, 2, 2, 95},
     11,
     3},
    {"attributes-nine.img",
     0,
     false,
     false,
     1024,
     4096,
     {4096, 1, 24, 2, 8},
     {4096, 0, 0, 1, 8},
     {8192, 1, 9, 2, 8},
     7,
     4},
    {"attribute-fork.img",
     0,
     false,
     false,
     470,
     4096,
     {4096, 2, 42, 4, 20},
     {4096, 0, 0, 1, 20},
     {8192, 1, 3, 2, 10},
     16,
     4},
    {"names-spotlight.img",
     0,
     false,
     false,
     16374,
     4096,
     {4096, 2, 206, 16, 127},
     {4096, 0, 0, 1, 127},
     {8192, 0, 0, 1, 63},
     84,
     18},
    {"mbr-journaled.img",
     32256,
     false,
     false,
     5004,
     4096,
     {4096, 1, 26, 2, 39},
     {4096, 0, 0, 1, 39},
     {8192, 0, 0, 1, 19},
     8,
     4},
    {"gpt-open-journal.img",
     20480,
     false,
     false,
     25590,
     4096,
     {4096, 1, 16, 2, 199},
     {4096, 0, 0, 1, 199},
     {8192, 0, 0, 1, 99},
     3,
     4},
    {"iso-2000-b512.hfs",
     0,
     false,
     false,
     1568,
     512,
     {1024, 4, 4002, 775, 775},
     {512, 0, 0, 1, 1},
     kNone,
     1860,
     140},
    {"iso-20000.hfs",
     0,
     false,
     false,
     3349,
     2048,
     {4096, 3, 40002, 1672, 1672},
     {2048, 0, 0, 1, 1},
     kNone,
     18600,
     1400},
};

class SampleVolume : public testing::TestWithParam<Sample> {
protected:
    void SetUp() override {
        std::string why;
        if (!HaveSamples(&why)) {
            GTEST_SKIP() << why;
        }
        const std::string path = SamplePath(GetParam().name);
        ASSERT_NE("", path);
        volume_ = ImageVolume::OpenFile(path, OpenOptions{}, &scan_, &problem_);
        ASSERT_NE(nullptr, volume_) << problem_.Text();
    }
    void ExpectTree(u32 fileId, const TreeFacts& facts) {
        CBTreeHfs* tree = volume_->Tree(fileId, &problem_);
        if (facts.nodeSize == 0) {
            EXPECT_EQ(nullptr, tree);
            EXPECT_EQ(ExitClass::kNo, problem_.exitClass);
            return;
        }
        ASSERT_NE(nullptr, tree) << problem_.Text();
        EXPECT_EQ(facts.nodeSize, tree->header.nodeSize);
        EXPECT_EQ(facts.depth, tree->header.treeDepth);
        EXPECT_EQ(facts.records, tree->header.leafRecords);
        EXPECT_EQ(facts.total, tree->header.totalNodes);
        EXPECT_EQ(facts.used, tree->header.totalNodes - tree->header.freeNodes);
    }

    VolumeScan scan_;
    Problem problem_;
    std::unique_ptr<ImageVolume> volume_;
};

TEST_P(SampleVolume, OpensWithItsKnownFacts) {
    const Sample& sample = GetParam();
    const VolumeHeader& header = volume_->Header();
    EXPECT_EQ(sample.offset, volume_->Place().offset);
    EXPECT_EQ(sample.wrapped, volume_->Place().wrapped);
    EXPECT_EQ(sample.hfsx, header.IsHfsx());
    EXPECT_EQ(sample.blocks, header.totalBlocks);
    EXPECT_EQ(sample.blockSize, header.blockSize);
    EXPECT_EQ(sample.files, header.fileCount);
    EXPECT_EQ(sample.folders, header.folderCount);
    EXPECT_FALSE(volume_->IsTruncated());
}

TEST_P(SampleVolume, ItsTreesOpen) {
    ExpectTree(kCatalogFileId, GetParam().catalog);
    ExpectTree(kExtentsFileId, GetParam().extents);
    ExpectTree(kAttributesFileId, GetParam().attributes);
}

TEST_P(SampleVolume, MapBlockIsTheSmallestNode) {
    u32 smallest = GetParam().catalog.nodeSize;
    smallest = std::min(smallest, GetParam().extents.nodeSize);
    EXPECT_EQ(smallest, volume_->Fs()->mapBlockSize);
}

TEST_P(SampleVolume, AlternateHeaderIsFoundAndReadsTheVolume) {
    u64 offset = 0;
    ASSERT_NE(nullptr, volume_->AlternateHeader(&offset));
    OpenOptions options;
    options.backupHeader = true;
    auto again = ImageVolume::OpenFile(SamplePath(GetParam().name), options, nullptr, &problem_);
    ASSERT_NE(nullptr, again) << problem_.Text();
    EXPECT_TRUE(again->UsedBackupHeader());
    EXPECT_EQ(GetParam().blocks, again->Header().totalBlocks);
    EXPECT_NE(nullptr, again->Tree(kCatalogFileId, &problem_)) << problem_.Text();
}

// Walks the catalog from its first leaf, as a listing does.
TEST_P(SampleVolume, CatalogWalkDeliversEveryRecord) {
    CBTreeHfs* tree = volume_->Tree(kCatalogFileId, &problem_);
    ASSERT_NE(nullptr, tree) << problem_.Text();
    HfsFindData path;
    alignas(8) u8 record[520];
    alignas(8) u8 key[600];
    unsigned recordSize = 0;
    unsigned keySize = 0;
    const unsigned long long first = static_cast<u64>(tree->header.firstLeafNode)
                                     << tree->nodeShift;
    int status =
        tree->SetPos(first, record, sizeof record, &recordSize, key, sizeof key, &keySize, &path);
    u32 count = 0;
    while (status == 0 && count <= tree->header.leafRecords) {
        count += 1;
        status =
            tree->IncPos(1, record, sizeof record, &recordSize, key, sizeof key, &keySize, &path);
        volume_->TrimCache();
    }
    path.ClearPath();
    EXPECT_EQ(kErrNotFound, status);
    EXPECT_EQ(tree->header.leafRecords, count);
}

std::string TestName(const testing::TestParamInfo<Sample>& info) {
    std::string name;
    for (const char c : std::string(info.param.name)) {
        name += std::isalnum(static_cast<unsigned char>(c)) != 0 ? c : '_';
    }
    return name;
}

INSTANTIATE_TEST_SUITE_P(Samples, SampleVolume, testing::ValuesIn(kSamples), TestName);

std::unique_ptr<ImageVolume> OpenSample(const char* name, VolumeScan* scan, Problem* problem) {
    return ImageVolume::OpenFile(SamplePath(name), OpenOptions{}, scan, problem);
}

class SampleFacts : public testing::Test {
protected:
    void SetUp() override {
        std::string why;
        if (!HaveSamples(&why)) {
            GTEST_SKIP() << why;
        }
    }
    VolumeScan scan_;
    Problem problem_;
};

TEST_F(SampleFacts, OpenJournalIsReportedAndTheVolumeReadAsItIs) {
    auto volume = OpenSample("gpt-open-journal.img", &scan_, &problem_);
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_TRUE(volume->Journal().readable);
    EXPECT_FALSE(volume->Journal().empty);
    EXPECT_EQ(20992u, volume->Journal().pendingBytes);
    ASSERT_EQ(1u, volume->Notes().size());
    EXPECT_EQ("the journal holds transactions (20,992 B): read as the volume stands without them",
              volume->Notes()[0].Text());
    EXPECT_EQ(PartitionScheme::kGpt, scan_.scheme);
}

TEST_F(SampleFacts, EmptyJournalIsNoNote) {
    for (const char* name :
         {"hardlinks-journaled.img", "attributes-journaled.img", "mbr-journaled.img"}) {
        auto volume = OpenSample(name, &scan_, &problem_);
        ASSERT_NE(nullptr, volume) << problem_.Text();
        EXPECT_TRUE(volume->Journal().readable) << name << volume->Journal().text;
        EXPECT_TRUE(volume->Journal().empty) << name;
        EXPECT_TRUE(volume->Notes().empty()) << name;
    }
}

TEST_F(SampleFacts, WholeDiskImageLeadsToItsVolume) {
    auto volume = OpenSample("iso-2000-b512.iso", &scan_, &problem_);
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ(522240u, volume->Place().offset);
    EXPECT_NE(0u, volume->Place().partition);
    EXPECT_EQ(1860u, volume->Header().fileCount);
}

TEST_F(SampleFacts, CompressedDiskImageIsNamed) {
    EXPECT_EQ(nullptr, OpenSample("attribute-fork.dmg", &scan_, &problem_));
    EXPECT_EQ("compressed disk image (koly trailer): convert it to a raw image first",
              problem_.Text());
}

TEST_F(SampleFacts, CatalogInFiveExtentsIsMappedWhole) {
    auto volume = OpenSample("many-names.img", &scan_, &problem_);
    ASSERT_NE(nullptr, volume) << problem_.Text();
    ASSERT_NE(nullptr, volume->Tree(kCatalogFileId, &problem_)) << problem_.Text();
    EXPECT_EQ(5u, volume->ForkExtents(kCatalogFileId).size());
}

TEST_F(SampleFacts, DamagedWrappedVolumeOpensItsHeader) {
    auto volume = OpenSample("damaged-wrapped.img", &scan_, &problem_);
    ASSERT_NE(nullptr, volume) << problem_.Text();
    EXPECT_EQ(180u, volume->Header().totalBlocks);
    EXPECT_TRUE(volume->Place().wrapped);
}

}  // namespace
}  // namespace VELK
