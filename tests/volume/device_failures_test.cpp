// Mounting and making volumes on devices whose calls fail in turn, and maps of partitions whose
// bytes are not what they should be: there is a volume or a sentence that says why not, and a
// volume that was made in spite of all is whole.
#include <gtest/gtest.h>

#include <cstring>

#include "capture.h"
#include "disk_builder.h"
#include "hfs/volume/image_volume.h"
#include "hfs/volume/make_volume.h"
#include "recording_device.h"

namespace VELK {
namespace {

using test::Bytes;
using test::DeviceFaults;
using test::DiskVolume;
using test::FaultyDevice;

// Keeps the device behind a faulty one alive beside the volume that owns the faulty one.
struct Medium {
    explicit Medium(u64 size) : memory(size) {}
    explicit Medium(const Bytes& bytes) : memory(bytes.size()) {
        EXPECT_TRUE(memory.Write(0, bytes.data(), bytes.size()).Ok());
    }
    std::unique_ptr<BlockDevice> Faulty() {
        return std::make_unique<FaultyDevice>(&memory, &faults);
    }

    MemoryDevice memory;
    DeviceFaults faults;
};

void ExpectASentence(const Problem& problem) {
    EXPECT_TRUE(problem);
    EXPECT_FALSE(problem.what.empty());
    EXPECT_EQ(problem.what.find('\n'), std::string::npos);
}

// Each tree opened, each fork asked for. How many of the trees are there.
u32 OpenTrees(ImageVolume* volume) {
    u32 open = 0;
    for (const u32 fileId : {kExtentsFileId, kCatalogFileId, kAttributesFileId}) {
        Problem problem;
        if (volume->Tree(fileId, &problem) != nullptr) {
            ++open;
        } else {
            ExpectASentence(problem);
        }
    }
    return open;
}

TEST(DeviceFailures, EachReadOfEachKindOfImageFailsInTurn) {
    const test::Capture capture;
    const Bytes volume = DiskVolume{}.Build();
    const Bytes images[] = {volume,
                            test::InApm(volume, 512),
                            test::InGpt(volume, 512),
                            test::InGpt(volume, 4096),
                            test::InMbr(volume),
                            test::InWrapper(volume)};
    for (const Bytes& image : images) {
        u32 refused = 0;
        bool failed = true;
        for (u32 nth = 1; failed; ++nth) {
            for (const bool forEver : {false, true}) {
                Medium medium(image);
                medium.faults.failRead = nth;
                medium.faults.forEver = forEver;
                Problem problem;
                VolumeScan scan;
                const auto mounted =
                    ImageVolume::Open(medium.Faulty(), OpenOptions{}, &scan, &problem);
                if (mounted) {
                    const u32 open = OpenTrees(mounted.get());
                    EXPECT_TRUE(open == 3 || medium.faults.hasFailed);
                } else {
                    ++refused;
                    EXPECT_TRUE(medium.faults.hasFailed);
                    ExpectASentence(problem);
                }
                failed = medium.faults.hasFailed;
            }
        }
        EXPECT_GT(refused, 2u);
    }
}

TEST(DeviceFailures, EachCallOfAVolumeBeingMadeFailsInTurn) {
    const test::Capture capture;
    for (const u64 journalSize : {u64{0}, u64{512} << 10}) {
        for (const bool failsWrites : {true, false}) {
            u32 refused = 0;
            bool failed = true;
            for (u32 nth = 1; failed; ++nth) {
                Medium medium(u64{1} << 20);
                (failsWrites ? medium.faults.failWrite : medium.faults.failRead) = nth;
                FormatOptions options;
                options.blockSize = 512;
                options.journalSize = journalSize;
                Problem problem;
                auto made = MakeVolume(medium.Faulty(), options, &problem);
                failed = medium.faults.hasFailed;
                refused += made ? 0u : 1u;
                if (!made) {
                    EXPECT_TRUE(failed);
                    ExpectASentence(problem);
                }
            }
            EXPECT_GT(refused, failsWrites ? 5u : 2u);
        }
    }
}

TEST(NewVolumeOptions, WhatNoVolumeCanHaveIsRefusedInASentence) {
    const test::Capture capture;
    const auto refusal = [](u64 size, auto change) {
        FormatOptions options;
        change(&options);
        Problem problem;
        EXPECT_EQ(nullptr, MakeMemoryVolume(size, options, &problem));
        return problem.Text();
    };
    constexpr u64 kSize = u64{1} << 20;
    for (const u32 blockSize : {0u, 256u, 513u, 131072u}) {
        EXPECT_NE(refusal(kSize, [&](FormatOptions* o) { o->blockSize = blockSize; })
                      .find("is not a power of two from 512 to 65,536"),
                  std::string::npos);
    }
    for (const u32 nodeSize : {0u, 256u, 1000u, 65536u}) {
        for (u32 FormatOptions::*field :
             {&FormatOptions::catalogNodeSize, &FormatOptions::extentsNodeSize,
              &FormatOptions::attributesNodeSize}) {
            EXPECT_NE(refusal(kSize, [&](FormatOptions* o) { o->*field = nodeSize; })
                          .find("is not a power of two from 512 to 32,768"),
                      std::string::npos);
        }
    }
    EXPECT_EQ(refusal(kSize, [](FormatOptions* o) { o->name.clear(); }),
              "volume name of 0 units: 1 to 255 are possible");
    EXPECT_EQ(refusal(kSize, [](FormatOptions* o) { o->name.assign(256, u'x'); }),
              "volume name of 256 units: 1 to 255 are possible");
    EXPECT_EQ(refusal(kSize + 100, [](FormatOptions*) {}),
              "volume size 1,048,676 is not a multiple of 512");
    EXPECT_NE(refusal(u64{512} << 32, [](FormatOptions* o) { o->blockSize = 512; })
                  .find("are too many blocks of 512: choose a larger block size"),
              std::string::npos);
    EXPECT_NE(refusal(2048, [](FormatOptions* o) { o->blockSize = 512; }), "");
    EXPECT_NE(refusal(16384, [](FormatOptions* o) { o->blockSize = 512; }), "");
    EXPECT_NE(refusal(kSize, [](FormatOptions* o) { o->journalSize = 1; }), "");
}

// The numbers of a map, byte by byte, at their extremes.
TEST(PartitionMaps, BytesAtTheirExtremesLeadToAVolumeOrASentence) {
    const test::Capture capture;
    const Bytes volume = DiskVolume{}.Build();
    struct {
        Bytes image;
        u32 from, to;
    } const maps[] = {{test::InApm(volume, 512), 0, 4},      // block size
                      {test::InApm(volume, 512), 516, 528},  // entries, start, size
                      {test::InApm(volume, 512), 560, 564},  // type
                      {test::InApm(volume, 2048), 0, 4},
                      {test::InGpt(volume, 512), 584, 600},    // table, entries, their size
                      {test::InGpt(volume, 512), 1024, 1028},  // type
                      {test::InGpt(volume, 512), 1056, 1084},  // first and last sector, name
                      {test::InMbr(volume), 446, 462},
                      {test::InMbr(volume), 510, 512},
                      {test::InWrapper(volume), 1024, 1026},   // signature
                      {test::InWrapper(volume), 1044, 1056},   // blocks
                      {test::InWrapper(volume), 1148, 1154}};  // the volume inside
    u32 mounted = 0;
    u32 refused = 0;
    for (const auto& map : maps) {
        for (u32 at = map.from; at < map.to; ++at) {
            for (const u8 value : {u8{0}, u8{0x7F}, u8{0xFF}}) {
                Bytes image = map.image;
                image[at] = value;
                Medium medium(image);
                Problem problem;
                VolumeScan scan;
                const auto found =
                    ImageVolume::Open(medium.Faulty(), OpenOptions{}, &scan, &problem);
                found ? ++mounted : ++refused;
                if (!found) {
                    ExpectASentence(problem);
                }
                for (const PartitionEntry& entry : scan.partitions) {
                    EXPECT_EQ(entry.name.find('\n'), std::string::npos);
                }
            }
        }
    }
    EXPECT_GT(mounted, 50u);
    EXPECT_GT(refused, 50u);
}

// Files that are no trees, and forks that are not there.
TEST(VolumeForks, NumbersOfNoSpecialFileAreAnswered) {
    const test::Capture capture;
    FormatOptions options;
    Problem problem;
    const auto volume = MakeMemoryVolume(u64{4} << 20, options, &problem);
    ASSERT_NE(nullptr, volume) << problem.Text();
    for (const u32 fileId : {0u, 1u, 2u, 5u, 9u, 16u, ~0u}) {
        Problem told;
        EXPECT_EQ(nullptr, volume->Tree(fileId, &told));
        EXPECT_EQ(told.what, "file " + std::to_string(fileId) + " is no tree");
        EXPECT_EQ(nullptr, volume->Tree(fileId, nullptr));
        EXPECT_EQ(nullptr, volume->OpenTree(fileId));
        EXPECT_FALSE(volume->HasTree(fileId));
        EXPECT_FALSE(volume->ImageOffset(fileId, 0).has_value());
        EXPECT_EQ(0u, volume->ForkBytes(fileId));
        EXPECT_TRUE(volume->ForkExtents(fileId).empty());
        u8 byte = 0;
        EXPECT_NE(0, volume->ReadFork(fileId, 0, &byte, 1));
    }
    EXPECT_FALSE(volume->IsCommitDue());
    EXPECT_EQ(nullptr, volume->OpenTree(kStartupFileId));
}

}  // namespace
}  // namespace VELK
