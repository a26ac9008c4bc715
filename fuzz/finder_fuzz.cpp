// The search for the volume in an image of any bytes: partition maps, wrapper, header. It reads no
// more often than the maps have entries, lists no more than it says, never takes a place that does
// not begin in the image, and a header decoded and encoded again is the same 512 bytes.
//
// Input: how to look, size of the image, one sector that stands 1,024 bytes into every 4,096, then
// the first bytes of the image.
#include <algorithm>
#include <cstring>

#include "fuzz.h"
#include "hfs/volume/partition.h"
#include "hfs/volume/volume_header.h"
#include "mutate.h"

namespace {

using namespace VELK;

constexpr u32 kPeriod = 4096;
constexpr u32 kMostEntries = 4096;
constexpr u32 kReadsPerEntry = 20;
constexpr std::size_t kControl = 3;

// The given bytes, then the sector over and over.
class Image : public BlockDevice {
public:
    Image(u64 size, test::Bytes sector, test::Bytes start)
        : size_(size), sector_(std::move(sector)), start_(std::move(start)) {
        sector_.resize(kHeaderSize);
    }

    u64 Size() const override { return size_; }
    bool IsWritable() const override { return false; }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override {
        reads += 1;
        if (offset > size_ || bytes > size_ - offset) {
            return {kIoPastEnd, offset};
        }
        std::memset(target, 0, bytes);
        u64 sectorAt = offset / kPeriod * kPeriod + kHeaderOffset;
        for (; sectorAt < offset + bytes; sectorAt += kPeriod) {
            CopyShared(sector_, sectorAt, target, offset, bytes);
        }
        CopyShared(start_, 0, target, offset, bytes);
        return {};
    }
    IoResult Write(u64 offset, const void*, std::size_t) override { return {kIoReadOnly, offset}; }
    IoResult Sync() override { return {}; }

    u32 reads = 0;

private:
    // What `source`, which lies at `at`, shares with the `bytes` bytes at `offset`. In one piece:
    // the fuzzer watches every comparison made here.
    static void CopyShared(const test::Bytes& source, u64 at, void* target, u64 offset,
                           std::size_t bytes) {
        const u64 first = std::max(at, offset);
        const u64 end = std::min(at + source.size(), offset + bytes);
        if (first < end) {
            std::memcpy(static_cast<u8*>(target) + (first - offset), source.data() + (first - at),
                        static_cast<std::size_t>(end - first));
        }
    }

    u64 size_;
    test::Bytes sector_;
    test::Bytes start_;
};

void CheckHeaderSector(const test::Bytes& sector) {
    VolumeHeader header = {};
    DecodeHeader(sector.data(), &header);
    u8 again[kHeaderSize];
    EncodeHeader(header, again);
    FUZZ_CHECK(std::equal(sector.begin(), sector.end(), again));
    const Problem problem = CheckHeader(header, kHeaderOffset);
    FUZZ_CHECK(!problem || !problem.Text().empty());
    for (const u32 fileId :
         {kExtentsFileId, kCatalogFileId, kAllocationFileId, kStartupFileId, kAttributesFileId}) {
        const HfsFork& fork = *header.ForkOf(fileId);
        if (CheckForkExtents(fork, header.totalBlocks, fileId)) {
            continue;
        }
        u64 blocks = 0;
        for (const HfsExtent& extent : fork.extents) {
            FUZZ_CHECK(u64{extent.startBlock} + extent.blockCount <= header.totalBlocks ||
                       extent.blockCount == 0);
            blocks += extent.blockCount;
        }
        FUZZ_CHECK(blocks <= fork.totalBlocks);
    }
}

void Look(const PlaceOptions& options, Image* image) {
    VolumeScan scan;
    const Problem problem = LocateVolume(image, options, &scan);
    FUZZ_CHECK(!problem || !problem.Text().empty());
    FUZZ_CHECK(scan.partitions.size() <= kMostEntries);
    FUZZ_CHECK(image->reads <= 64 + 3 * kMostEntries * kReadsPerEntry);
    u32 taken = 0;
    for (const PartitionEntry& entry : scan.partitions) {
        FUZZ_CHECK(!entry.reason.empty() && entry.number != 0);
        FUZZ_CHECK(!entry.holdsVolume || entry.offset < image->Size());
        taken += entry.taken ? 1 : 0;
    }
    if (problem) {
        FUZZ_CHECK(taken == 0);
        return;
    }
    FUZZ_CHECK(taken == (scan.place.partition != 0 ? 1u : 0u));
    const u64 from = scan.place.wrapped ? scan.place.wrapperOffset : scan.place.offset;
    FUZZ_CHECK(from < image->Size() && scan.place.offset >= from);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const u8* data, std::size_t size) {
    fuzz::Input input(data, size);
    const u8 how = input.U8();
    const u8 shift = input.U8();
    const u8 more = input.U8();
    test::Bytes sector = input.Rest(kHeaderSize);
    sector.resize(kHeaderSize);
    const test::Bytes start = input.Rest(1u << 16);
    PlaceOptions options;
    options.lenient = (how & 1) != 0;
    options.partition = how >> 1 & 7;
    if ((how & 0x10) != 0) {
        options.offset = u64{512} << (how >> 5);
    }
    Image image((start.size() >> (shift & 1)) + (u64{more} << (shift >> 2)), sector, start);
    CheckHeaderSector(sector);
    Look(options, &image);
    return 0;
}

// The volume's header sector, the entries of the three maps, or bytes.
extern "C" std::size_t LLVMFuzzerCustomMutator(u8* data, std::size_t size, std::size_t most,
                                               unsigned seed) {
    fuzz::Mutator mutator(seed);
    constexpr std::size_t kStart = kControl + kHeaderSize;
    if (size < kStart + kHeaderSize || mutator.OneIn(3)) {
        return LLVMFuzzerMutate(data, size, most);
    }
    if (mutator.OneIn(3)) {
        mutator.Field(data + kControl, test::FieldsOfVolumeHeader(), 512, size / 512);
        return size;
    }
    // Numbers of map entries are 4 or 8 bytes, little-endian in two of the maps.
    const u32 at = mutator.Below(static_cast<u32>(size - kStart) / 4 - 2) * 4;
    const u8 width = mutator.OneIn(2) ? 4 : 8;
    u8* place = data + kStart + at;
    mutator.Field(place, {{0, width, "number of an entry"}}, 512, size / 512);
    if (mutator.OneIn(2)) {
        std::reverse(place, place + width);
    }
    return size;
}
