// A journal of any bytes in a small volume: refused with words and without a changed byte, or
// carried out; then it is empty, the volume has its shape, and mounting once more changes nothing.
//
// Input: which checksums are made to fit, then the bytes of the journal from its header on.
#include <cstring>

#include "fuzz.h"
#include "hfs/volume/image_volume.h"
#include "hfs/volume/journal_format.h"
#include "journal_base.h"
#include "mutate_journal.h"

namespace {

using namespace VELK;

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
    fuzz::FitChecksums(image.data() + base.journalOffset, base.journalSize, how);
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

// The first byte has the checksums made to fit when the input runs.
extern "C" std::size_t LLVMFuzzerCustomMutator(u8* data, std::size_t size, std::size_t most,
                                               unsigned seed) {
    fuzz::Mutator mutator(seed);
    constexpr std::size_t kControl = 1;
    if (size < kControl + 2 * kJournalSector || mutator.OneIn(4)) {
        return LLVMFuzzerMutate(data, size, most);
    }
    data[0] = static_cast<u8>(data[0] | fuzz::kFitHeader | fuzz::kFitLists);
    fuzz::MutateJournal(&mutator, data + kControl, size - kControl,
                        (data[0] & fuzz::kLittleEndian) != 0);
    return size;
}
