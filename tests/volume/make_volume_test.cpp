// New volumes: their bytes, their trees, and what independent listers make of them.
#include "hfs/volume/make_volume.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>

#include "capture.h"
#include "hfs/volume/wire.h"

namespace VELK {
namespace {

struct Geometry {
    u64 size;
    u32 blockSize;
    u32 nodeSize;
    bool hfsx;
    bool attributes;
};

FormatOptions OptionsFor(const Geometry& geometry) {
    FormatOptions options;
    options.blockSize = geometry.blockSize;
    options.catalogNodeSize = geometry.nodeSize;
    options.extentsNodeSize = geometry.nodeSize;
    options.attributesNodeSize = geometry.nodeSize;
    options.caseSensitive = geometry.hfsx;
    options.withAttributes = geometry.attributes;
    options.name = u"Fresh";
    options.date = 3724989581u;
    options.uuid = 0x1122334455667788u;
    return options;
}

std::string ToolOutput(const std::string& command) {
    std::string output;
    std::FILE* pipe = popen((command + " 2>&1").c_str(), "r");
    if (pipe == nullptr) {
        return output;
    }
    char buffer[4096];
    for (std::size_t size = 0; (size = std::fread(buffer, 1, sizeof buffer, pipe)) > 0;) {
        output.append(buffer, size);
    }
    pclose(pipe);
    return output;
}

bool HaveTool(const char* name) {
    return std::system((std::string("command -v ") + name + " >/dev/null 2>&1").c_str()) == 0;
}

class NewVolume : public testing::TestWithParam<Geometry> {
protected:
    void SetUp() override {
        volume_ = MakeMemoryVolume(GetParam().size, OptionsFor(GetParam()), &problem_);
        ASSERT_NE(nullptr, volume_) << problem_.Text();
    }
    std::vector<u8> Bytes() {
        std::vector<u8> bytes(static_cast<std::size_t>(GetParam().size));
        EXPECT_EQ(0, volume_->ReadVolume(0, bytes.data(), bytes.size()));
        return bytes;
    }

    Problem problem_;
    std::unique_ptr<ImageVolume> volume_;
};

TEST_P(NewVolume, AlternateHeaderEqualsTheHeader) {
    const std::vector<u8> bytes = Bytes();
    const std::vector<u8> main(bytes.begin() + 1024, bytes.begin() + 1536);
    const std::vector<u8> alternate(bytes.end() - 1024, bytes.end() - 512);
    EXPECT_EQ(main, alternate);
    EXPECT_EQ(GetParam().hfsx ? 0x48580005u : 0x482B0004u, Be32(main.data()));
}

// Every block that a special file, the headers or the reserved ends take is marked, and no other.
TEST_P(NewVolume, BitmapMarksExactlyTheBlocksInUse) {
    const VolumeHeader& header = volume_->Header();
    std::vector<bool> used(header.totalBlocks, false);
    const u64 size = GetParam().size;
    for (u64 at : {u64{0}, u64{1024}, u64{1535}, size - 1024, size - 1}) {
        if (at / header.blockSize < header.totalBlocks) {
            used[static_cast<std::size_t>(at / header.blockSize)] = true;
        }
    }
    used[header.totalBlocks - 1] = true;
    if (header.blockSize == 512) {
        used[1] = true;
    }
    for (const u32 fileId : {3u, 4u, 6u, 8u}) {
        for (const HfsExtent& extent : volume_->ForkExtents(fileId)) {
            for (u32 i = 0; i < extent.blockCount; ++i) {
                EXPECT_FALSE(used[extent.startBlock + i]) << extent.startBlock + i;
                used[extent.startBlock + i] = true;
            }
        }
    }
    std::vector<u8> bitmap(header.totalBlocks / 8 + 1);
    ASSERT_EQ(0,
              volume_->ReadFork(kAllocationFileId, 0, bitmap.data(), (header.totalBlocks + 7) / 8));
    u32 freeBlocks = 0;
    for (u32 block = 0; block < header.totalBlocks; ++block) {
        EXPECT_EQ(used[block], (bitmap[block / 8] & (0x80 >> (block % 8))) != 0) << block;
        freeBlocks += used[block] ? 0u : 1u;
    }
    EXPECT_EQ(freeBlocks, header.freeBlocks);
}

TEST_P(NewVolume, OpensAgainWithARootFolder) {
    std::vector<u8> bytes = Bytes();
    auto device = std::make_unique<MemoryDevice>(bytes.size());
    ASSERT_TRUE(device->Write(0, bytes.data(), bytes.size()).Ok());
    auto again = ImageVolume::Open(std::move(device), OpenOptions{}, nullptr, &problem_);
    ASSERT_NE(nullptr, again) << problem_.Text();
    EXPECT_TRUE(again->Notes().empty());
    CBTreeHfs* catalog = again->Tree(kCatalogFileId, &problem_);
    ASSERT_NE(nullptr, catalog) << problem_.Text();
    EXPECT_EQ(2u, catalog->header.leafRecords);
    EXPECT_EQ(1u, catalog->header.treeDepth);
    EXPECT_EQ(GetParam().hfsx ? 0xBCu : 0xCFu, catalog->keyCompareType);
    ASSERT_NE(nullptr, again->Tree(kExtentsFileId, &problem_)) << problem_.Text();
    EXPECT_EQ(GetParam().attributes, again->HasTree(kAttributesFileId));
    EXPECT_EQ(16u, again->Header().nextCatalogId);
}

TEST_P(NewVolume, TwoAreEqualByteForByte) {
    const std::vector<u8> first = Bytes();
    volume_ = MakeMemoryVolume(GetParam().size, OptionsFor(GetParam()), &problem_);
    ASSERT_NE(nullptr, volume_);
    EXPECT_EQ(first, Bytes());
}

// A device full of old bytes gives the same volume, up to blocks that belong to nobody.
TEST_P(NewVolume, OldBytesDoNotShowInTreesAndHeaders) {
    auto device = std::make_unique<MemoryDevice>(GetParam().size);
    const std::vector<u8> old(static_cast<std::size_t>(GetParam().size), 0xA5);
    ASSERT_TRUE(device->Write(0, old.data(), old.size()).Ok());
    auto second = MakeVolume(std::move(device), OptionsFor(GetParam()), &problem_);
    ASSERT_NE(nullptr, second) << problem_.Text();
    for (const u32 fileId : {3u, 4u, 6u, 8u}) {
        const u32 size = static_cast<u32>(volume_->ForkBytes(fileId));
        std::vector<u8> a(size);
        std::vector<u8> b(size);
        ASSERT_EQ(0, volume_->ReadFork(fileId, 0, a.data(), size));
        ASSERT_EQ(0, second->ReadFork(fileId, 0, b.data(), size));
        EXPECT_EQ(a, b) << fileId;
    }
}

TEST_P(NewVolume, IndependentListersReadIt) {
    const std::string path = testing::TempDir() + "fresh_" +
                             std::to_string(GetParam().size + GetParam().blockSize +
                                            GetParam().nodeSize + (GetParam().hfsx ? 1u : 0u)) +
                             ".img";
    std::FILE* file = std::fopen(path.c_str(), "wb");
    ASSERT_NE(nullptr, file);
    ASSERT_FALSE(volume_->SaveTo(file));
    std::fclose(file);
    u32 asked = 0;
    if (HaveTool("fsstat")) {
        const std::string text = ToolOutput("fsstat '" + path + "'");
        EXPECT_NE(std::string::npos, text.find("Volume Name: Fresh")) << text;
        asked += 1;
    }
    if (HaveTool("fls")) {
        EXPECT_EQ(std::string::npos, ToolOutput("fls -r -p '" + path + "'").find("rror"));
        asked += 1;
    }
    if (HaveTool("7z")) {
        const std::string text = ToolOutput("7z l '" + path + "'");
        EXPECT_NE(std::string::npos, text.find("Type = HFS")) << text;
        EXPECT_EQ(std::string::npos, text.find("ERROR")) << text;
        asked += 1;
    }
    if (HaveTool("grub-fstest")) {
        EXPECT_EQ(std::string::npos, ToolOutput("grub-fstest '" + path + "' ls /").find("rror"));
        asked += 1;
    }
    std::remove(path.c_str());
    if (asked == 0) {
        GTEST_SKIP() << "none of fsstat, fls, 7z, grub-fstest is installed";
    }
}

INSTANTIATE_TEST_SUITE_P(Geometries, NewVolume,
                         testing::Values(Geometry{1 << 20, 4096, 4096, false, true},
                                         Geometry{1 << 20, 512, 4096, false, true},
                                         Geometry{1 << 20, 512, 8192, true, false},
                                         Geometry{4 << 20, 1024, 4096, true, true},
                                         Geometry{(4 << 20) + 2560, 4096, 4096, false, false},
                                         Geometry{8 << 20, 65536, 32768, false, true},
                                         Geometry{3 << 20, 2048, 16384, false, true}));

TEST(MakeVolume, RefusesWhatNoVolumeCanBe) {
    Problem problem;
    FormatOptions options;
    options.blockSize = 3000;
    EXPECT_EQ(nullptr, MakeMemoryVolume(1 << 20, options, &problem));
    EXPECT_EQ("block size 3,000 is not a power of two from 512 to 65,536", problem.Text());
    options.blockSize = 4096;
    options.catalogNodeSize = 256;
    EXPECT_EQ(nullptr, MakeMemoryVolume(1 << 20, options, &problem));
    EXPECT_EQ("node size 256 is not a power of two from 512 to 32,768", problem.Text());
    options.catalogNodeSize = 4096;
    EXPECT_EQ(nullptr, MakeMemoryVolume(4096, options, &problem));
    EXPECT_EQ(ExitClass::kUsage, problem.exitClass);
    EXPECT_EQ(nullptr, MakeMemoryVolume(65536, options, &problem));
    EXPECT_NE(std::string::npos, problem.Text().find("has no room for its")) << problem.Text();
    options.name = std::u16string(256, u'n');
    EXPECT_EQ(nullptr, MakeMemoryVolume(1 << 20, options, &problem));
    EXPECT_EQ("volume name of 256 units: 1 to 255 are possible", problem.Text());
}

// A name that fits a key, but not a node with another key beside it.
TEST(MakeVolume, ANameThatNoNodeHolds) {
    const test::Capture capture;
    Problem problem;
    FormatOptions options;
    options.blockSize = 512;
    options.catalogNodeSize = 512;
    options.extentsNodeSize = 512;
    options.name = std::u16string(255, u'n');
    EXPECT_EQ(nullptr, MakeMemoryVolume(1 << 20, options, &problem));
    EXPECT_EQ(
        "catalog nodes of 512 bytes cannot hold the root folder: choose larger nodes or a shorter "
        "name",
        problem.Text());
    EXPECT_EQ(ExitClass::kUsage, problem.exitClass);
    options.catalogNodeSize = 4096;
    EXPECT_NE(nullptr, MakeMemoryVolume(1 << 20, options, &problem)) << problem.Text();
}

TEST(MakeVolume, FewerBytesThanABlockAreTooSmall) {
    Problem problem;
    FormatOptions options;
    options.blockSize = 65536;
    EXPECT_EQ(nullptr, MakeMemoryVolume(32768, options, &problem));
    EXPECT_EQ("a volume of 32,768 bytes is too small", problem.Text());
}

TEST(MakeVolume, TreesOfTheSizesAskedFor) {
    Problem problem;
    FormatOptions options;
    options.catalogSize = 65536;
    options.extentsSize = 32768;
    options.attributesSize = 131072;
    options.mapBlockSize = 1024;
    auto volume = MakeMemoryVolume(1 << 20, options, &problem);
    ASSERT_NE(nullptr, volume) << problem.Text();
    EXPECT_EQ(65536u, volume->Header().catalogFile.logicalSize);
    EXPECT_EQ(32768u, volume->Header().extentsFile.logicalSize);
    EXPECT_EQ(131072u, volume->Header().attributesFile.logicalSize);
    EXPECT_EQ(1024u, volume->Fs()->mapBlockSize);
    EXPECT_EQ(16u, volume->Tree(kCatalogFileId, &problem)->header.totalNodes);
}

// The files that account for a journal stand in the root folder: without it there are none.
TEST(MakeVolume, AJournalWithoutARootFolder) {
    Problem problem;
    for (const bool emptyTrees : {false, true}) {
        FormatOptions options;
        options.journalSize = 64 << 10;
        options.withRoot = emptyTrees;
        options.emptyTrees = emptyTrees;
        auto volume = MakeMemoryVolume(2 << 20, options, &problem);
        ASSERT_NE(nullptr, volume) << problem.Text();
        EXPECT_TRUE(volume->Journal().readable && volume->Journal().empty);
        EXPECT_EQ(0u, volume->Header().fileCount);
        EXPECT_EQ(kFirstUserId, volume->Header().nextCatalogId);
        EXPECT_EQ(!emptyTrees, volume->HasTree(kCatalogFileId));
        if (!emptyTrees) {
            EXPECT_EQ(0u, volume->Tree(kCatalogFileId, &problem)->header.leafRecords);
        }
    }
}

TEST(MakeVolume, EmptyOneHasNoTreesUntilTheyAreCreated) {
    Problem problem;
    FormatOptions options;
    options.emptyTrees = true;
    auto volume = MakeMemoryVolume(1 << 20, options, &problem);
    ASSERT_NE(nullptr, volume) << problem.Text();
    EXPECT_FALSE(volume->HasTree(kCatalogFileId));
    EXPECT_EQ(nullptr, volume->Tree(kCatalogFileId, &problem));
    EXPECT_EQ("the volume has no catalog tree: create-tree would add one", problem.Text());
    ASSERT_EQ(kOk, volume->CreateTree(kCatalogFileId, 12, nullptr));
    EXPECT_NE(nullptr, volume->Tree(kCatalogFileId, &problem));
    EXPECT_EQ(kErrExists, volume->CreateTree(kCatalogFileId, 12, nullptr));
}

}  // namespace
}  // namespace VELK
