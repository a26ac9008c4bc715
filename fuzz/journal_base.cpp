// Makes the volume whose journal is fuzzed: the bytes from before a commit, with the journal from
// after it.
#include "journal_base.h"

#include <algorithm>

#include "fuzz.h"
#include "hfs/volume/make_volume.h"
#include "keys.h"

namespace VELK::fuzz {

namespace {

constexpr u64 kSize = 128 << 10;

test::Bytes BytesOf(BlockDevice* device) {
    test::Bytes bytes(kSize);
    FUZZ_CHECK(device->Read(0, bytes.data(), bytes.size()).Ok());
    return bytes;
}

}  // namespace

JournalBase MakeJournalBase() {
    MemoryDevice device(kSize);
    FormatOptions options;
    options.blockSize = 512;
    options.catalogNodeSize = 512;
    options.extentsNodeSize = 512;
    options.clumpSize = 512;
    options.withAttributes = false;
    options.deviceIsZero = true;
    options.journalSize = 32 << 10;
    Problem problem;
    const auto volume =
        MakeVolume(std::make_unique<SliceDevice>(&device, 0, kSize), options, &problem);
    FUZZ_CHECK(volume != nullptr);
    JournalBase base;
    base.image = BytesOf(&device);
    base.journalOffset = volume->Journal().offset;
    base.journalSize = volume->Journal().size;
    CBTreeHfs* catalog = volume->Tree(kCatalogFileId, &problem);
    FUZZ_CHECK(catalog != nullptr);
    for (u32 n = 0; n < 12; ++n) {
        const test::HostKey key = test::NthHostKey(kCatalogFileId, n);
        const test::Bytes record = test::Pattern(88, n);
        FUZZ_CHECK(catalog->InsertRecord(key.Get(), key.id, record.data(), 88) == kOk);
    }
    FUZZ_CHECK(volume->Commit(0) == kOk);
    const test::Bytes after = BytesOf(&device);
    const auto journal = static_cast<std::ptrdiff_t>(base.journalOffset);
    std::copy_n(after.begin() + journal, base.journalSize, base.image.begin() + journal);
    // The commit took the volume into use: its last writer is one that keeps the journal.
    std::copy_n(after.begin() + 1024 + 4, 8, base.image.begin() + 1024 + 4);
    return base;
}

}  // namespace VELK::fuzz
