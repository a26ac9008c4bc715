// A journal of any bytes in a small volume: refused with words and without a changed byte, or
// carried out; then it is empty, the volume has its shape, and mounting once more changes nothing.
//
// Input: which checksums are made to fit, then the bytes of the journal from its header on.
#include <algorithm>
#include <cstring>

#include "fuzz.h"
#include "hfs/volume/image_volume.h"
#include "hfs/volume/journal_format.h"
#include "hfs/volume/wire.h"
#include "journal_base.h"
#include "mutate.h"

namespace {

using namespace VELK;

constexpr u32 kMostLists = 64;

u64 Number(const u8* at, u32 width, bool isLittle) {
    u64 value = 0;
    for (u32 i = 0; i < width; ++i) {
        value = value << 8 | at[isLittle ? width - 1 - i : i];
    }
    return value;
}

void StoreChecksum(u8* at, u32 value, bool isLittle) {
    for (u32 i = 0; i < 4; ++i) {
        at[isLittle ? i : 3 - i] = static_cast<u8>(value >> (8 * i));
    }
}

// Where the block lists begin that a reader of this journal would meet, one after the other.
std::vector<u64> ListsOf(const u8* journal, u64 size, bool isLittle) {
    std::vector<u64> lists;
    u64 at = Number(journal + 8, 8, isLittle);
    while (lists.size() < kMostLists && at < size && size - at >= 32) {
        lists.push_back(at);
        const u64 used = Number(journal + at + 4, 4, isLittle);
        if (used == 0) {
            break;
        }
        at += used;
    }
    return lists;
}

// Makes the checksums of the header, and of the lists behind each other, fit.
void FixChecksums(test::Bytes* image, const fuzz::JournalBase& base, u8 how) {
    u8* journal = image->data() + base.journalOffset;
    const bool isLittle = (how & 4) != 0;
    if ((how & 2) != 0) {
        for (const u64 list : ListsOf(journal, base.journalSize, isLittle)) {
            StoreChecksum(journal + list + 8, JournalChecksum(journal + list, 32, 8), isLittle);
        }
    }
    if ((how & 1) != 0) {
        StoreChecksum(journal + 36, JournalChecksum(journal, kJournalHeaderSize, 36), isLittle);
    }
}

test::Bytes BytesOf(BlockDevice* device) {
    test::Bytes bytes(static_cast<std::size_t>(device->Size()));
    FUZZ_CHECK(device->Read(0, bytes.data(), bytes.size()).Ok());
    return bytes;
}

std::unique_ptr<ImageVolume> Mount(BlockDevice* device, Access access, Problem* problem) {
    OpenOptions options;
    options.access = access;
    options.replay = true;
    options.offset = 0;
    return ImageVolume::Open(std::make_unique<SliceDevice>(device, 0, device->Size()), options,
                             nullptr, problem);
}

void Run(fuzz::Input* input) {
    static const fuzz::JournalBase base = fuzz::MakeJournalBase();
    const u8 how = input->U8();
    test::Bytes image = base.image;
    const test::Bytes bytes = input->Rest(static_cast<std::size_t>(base.journalSize));
    if (!bytes.empty()) {
        std::memcpy(image.data() + base.journalOffset, bytes.data(), bytes.size());
    }
    FixChecksums(&image, base, how);
    MemoryDevice device(image.size());
    FUZZ_CHECK(device.Write(0, image.data(), image.size()).Ok());
    Problem problem;
    auto volume = Mount(&device, Access::kReadOnly, &problem);
    FUZZ_CHECK(volume != nullptr || !problem.Text().empty());
    volume = Mount(&device, Access::kOverlay, &problem);
    FUZZ_CHECK(BytesOf(&device) == image);
    volume = Mount(&device, Access::kWrite, &problem);
    if (volume == nullptr) {
        FUZZ_CHECK(!problem.Text().empty());
        return;
    }
    FUZZ_CHECK(volume->Journal().empty && volume->Header().totalBlocks * 512 == image.size());
    volume.reset();
    const test::Bytes once = BytesOf(&device);
    volume = Mount(&device, Access::kWrite, &problem);
    FUZZ_CHECK(volume != nullptr && volume->Journal().replayed == 0);
    volume.reset();
    FUZZ_CHECK(BytesOf(&device) == once);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const u8* data, std::size_t size) {
    fuzz::RunQuietly(data, size, Run);
    return 0;
}

// Fields of the header or of one list; their checksums are made to fit by the first byte.
extern "C" std::size_t LLVMFuzzerCustomMutator(u8* data, std::size_t size, std::size_t most,
                                               unsigned seed) {
    fuzz::Mutator mutator(seed);
    constexpr std::size_t kControl = 1;
    if (size < kControl + 2 * kJournalSector || mutator.OneIn(4)) {
        return LLVMFuzzerMutate(data, size, most);
    }
    u8* journal = data + kControl;
    const u64 journalSize = size - kControl;
    data[0] = static_cast<u8>(data[0] | 3);
    const std::vector<u64> lists = ListsOf(journal, journalSize, (data[0] & 4) != 0);
    if (lists.empty() || mutator.OneIn(4)) {
        mutator.Field(journal, test::FieldsOfJournalHeader(), kJournalSector, journalSize);
        return size;
    }
    const u64 list = lists[mutator.Below(static_cast<u32>(lists.size()))];
    const u32 room = static_cast<u32>((journalSize - list) / 16);
    const u32 blocks = room > 2 ? std::min(room - 2, 8u) : 0;
    mutator.Field(journal + list, test::FieldsOfJournalList(blocks), kJournalSector, journalSize);
    return size;
}
