// A journal of any bytes in a small volume: refused with words and without a changed byte, or
// carried out; then it is empty, the volume has its shape, and mounting once more changes nothing.
//
// Input: which checksums are made to fit, then the bytes of the journal from its header on.
#include <cstring>

#include "fuzz.h"
#include "hfs/volume/image_volume.h"
#include "hfs/volume/journal_format.h"
#include "hfs/volume/wire.h"
#include "journal_base.h"

namespace {

using namespace VELK;

// Makes the checksums of the header, and of the list it begins with, fit.
void FixChecksums(test::Bytes* image, const fuzz::JournalBase& base, u8 how) {
    u8* journal = image->data() + base.journalOffset;
    const bool isLittle = (how & 4) != 0;
    const auto store = [isLittle](u8* at, u32 value) {
        for (u32 i = 0; i < 4; ++i) {
            at[isLittle ? i : 3 - i] = static_cast<u8>(value >> (8 * i));
        }
    };
    if ((how & 2) != 0) {
        const u64 start = isLittle ? Le64(journal + 8) : Be64(journal + 8);
        if (start + 32 <= base.journalSize) {
            store(journal + start + 8, JournalChecksum(journal + start, 32, 8));
        }
    }
    if ((how & 1) != 0) {
        store(journal + 36, JournalChecksum(journal, kJournalHeaderSize, 36));
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
    fuzz::Input input(data, size);
    {
        const fuzz::Quiet quiet;
        Run(&input);
    }
    fuzz::CheckNothingFailed();
    return 0;
}
