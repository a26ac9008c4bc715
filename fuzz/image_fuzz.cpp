// A whole image of any bytes: checked; found, mounted, asked for everything, its trees opened,
// walked and changed. Whatever it holds there is an answer or a problem in words; the checker asks
// for no byte that is not there; nothing leaks and everything ends. No byte changes unless it was
// mounted for writing; a volume that took changes can be mounted again.
//
// Input: how to open it (bits: 1 changes stay in memory, 2 by the copy of the header, 4 small
// blocks, 16 and 32 the partition, 64 replay, 128 write), what to do (bits 3 the pattern of
// changes, 12 the size of records, 48 how many, 64 not in order of keys; bit 128: write past what
// stands against it), then the image.
#include <algorithm>
#include <cstring>

#include "fuzz.h"
#include "hfs/check/check.h"
#include "hfs/volume/image_volume.h"
#include "hfs/volume/journal_format.h"
#include "keys.h"
#include "metered.h"
#include "mutate_journal.h"

namespace {

using namespace VELK;

constexpr std::size_t kMostBytes = 1u << 20;
constexpr u32 kSteps = 300;
constexpr u32 kTrees[] = {kExtentsFileId, kCatalogFileId, kAttributesFileId};
constexpr u32 kSpecialFiles[] = {kExtentsFileId, kCatalogFileId, kAllocationFileId, kStartupFileId,
                                 kAttributesFileId};

struct alignas(8) Buffers {
    u8 record[32768];
    u8 key[kKeyLengthSize + kMaxKeyLength + 6];
    unsigned recordSize;
    unsigned keySize;
};

void Walk(ImageVolume* volume, test::Metered tree) {
    Buffers at = {};
    HfsFindData path;
    const unsigned long long first = static_cast<u64>(tree->header.firstLeafNode)
                                     << tree->nodeShift;
    int status = tree->SetPos(first, at.record, sizeof at.record, &at.recordSize, at.key,
                              sizeof at.key, &at.keySize, &path);
    for (u32 i = 0; i < kSteps && status == kOk; ++i) {
        status = tree->IncPos(1, at.record, sizeof at.record, &at.recordSize, at.key, sizeof at.key,
                              &at.keySize, &path);
        volume->TrimCache();
    }
    path.ClearPath();
}

// Inserts records, and deletes each fourth instead or, with the last pattern, all of them again.
void Change(ImageVolume* volume, test::Metered tree, u8 what) {
    constexpr u32 kLastPattern = 3;
    constexpr u32 kSizes[] = {88, 10, 248, 150};
    const u32 size = kSizes[what >> 2 & 3];
    const u32 count = 12u << (what >> 4 & 3);
    const u32 stride = (what & 64) != 0 ? 5 : 1;  // prime to every count
    const u32 steps = (what & 3) == kLastPattern ? 2 * count : count;
    for (u32 n = 0; n < steps && volume->IsWritable(); ++n) {
        const test::HostKey key = test::NthHostKey(tree->fileId, n * stride % count);
        const test::Bytes record = test::Pattern(size, n);
        const int status = n >= count || (n + what) % 4 == 0
                               ? tree->DeleteRecord(key.Get(), key.id, false)
                               : tree->InsertRecord(key.Get(), key.id, record.data(), size);
        if (status != kOk && volume->RestoreAfter(status)) {
            return;
        }
    }
    volume->Commit(0);
}

int ReadBytes(void* self, u64 offset, void* target, std::size_t size) {
    const auto* bytes = static_cast<const test::Bytes*>(self);
    FUZZ_CHECK(offset <= bytes->size() && size <= bytes->size() - offset);
    std::memcpy(target, bytes->data() + offset, size);
    return 0;
}

// The checker on the same bytes as if the volume began with them.
void Check(test::Bytes bytes, u8 how) {
    CheckOptions options;
    options.full = (how & 8) != 0;
    options.quick = (how & 4) != 0;
    options.keepGoing = (how & 2) != 0;
    options.maxErrors = 20;
    u32 told = 0;
    CheckSink sink;
    sink.self = &told;
    sink.finding = [](void* self, const CheckFinding& finding) {
        FUZZ_CHECK(!finding.text.empty() && !CheckFindingLine(finding).empty());
        *static_cast<u32*>(self) += 1;
    };
    const CheckSummary summary = CheckVolume({&bytes, ReadBytes, bytes.size(), 0}, options, sink);
    FUZZ_CHECK(told + summary.untold == summary.errors + summary.warnings + summary.infos);
    FUZZ_CHECK(summary.stageCount <= kCheckStages);
}

constexpr u8 kWrite = 128;
constexpr u8 kForce = 128;

OpenOptions OptionsOf(u8 how, u8 what) {
    OpenOptions options;
    options.access = (how & kWrite) != 0 ? Access::kWrite
                     : (how & 1) != 0    ? Access::kOverlay
                                         : Access::kReadOnly;
    options.backupHeader = (how & 2) != 0;
    options.partition = how >> 4 & 3;
    options.replay = (how & 0x40) != 0;
    options.mapBlockSize = (how & 4) != 0 ? 512 : 0;
    options.cacheBudget = 1u << 14;
    options.force = (what & kForce) != 0;
    return options;
}

std::unique_ptr<ImageVolume> Mount(MemoryDevice* device, const OpenOptions& options) {
    VolumeScan scan;
    Problem problem;
    auto volume = ImageVolume::Open(std::make_unique<SliceDevice>(device, 0, device->Size()),
                                    options, &scan, &problem);
    FUZZ_CHECK(volume != nullptr || !problem.Text().empty());
    return volume;
}

test::Bytes BytesOf(MemoryDevice* device) {
    test::Bytes bytes(static_cast<std::size_t>(device->Size()));
    FUZZ_CHECK(device->Read(0, bytes.data(), bytes.size()).Ok());
    return bytes;
}

// What the volume says of itself and of its special files.
void Ask(ImageVolume* volume) {
    for (const Problem& note : volume->Notes()) {
        FUZZ_CHECK(!note.Text().empty());
    }
    u64 copyAt = 0;
    volume->AlternateHeader(&copyAt);
    u8 bytes[kHeaderSize];
    volume->ReadVolume(kHeaderOffset, bytes, sizeof bytes);
    for (const u32 fileId : kSpecialFiles) {
        const u64 size = volume->ForkBytes(fileId);
        u64 mapped = 0;
        for (const HfsExtent& extent : volume->ForkExtents(fileId)) {
            mapped += u64{extent.blockCount} * volume->Header().blockSize;
        }
        FUZZ_CHECK(size <= mapped);
        const u64 last = size - std::min<u64>(size, sizeof bytes);
        FUZZ_CHECK(size == 0 || volume->ImageOffset(fileId, size - 1).has_value());
        volume->ReadFork(fileId, last, bytes, static_cast<u32>(size - last));
    }
}

void Run(fuzz::Input* input) {
    const u8 how = input->U8();
    const u8 what = input->U8();
    const test::Bytes bytes = input->Rest(kMostBytes);
    if (!bytes.empty()) {
        Check(bytes, how);
    }
    MemoryDevice device(bytes.size());
    FUZZ_CHECK(device.Write(0, bytes.data(), bytes.size()).Ok());
    OpenOptions options = OptionsOf(how, what);
    std::unique_ptr<ImageVolume> volume = Mount(&device, options);
    if (volume == nullptr) {
        return;
    }
    Ask(volume.get());
    for (const u32 fileId : kTrees) {
        Problem trouble;
        CBTreeHfs* tree = volume->Tree(fileId, &trouble);
        FUZZ_CHECK(tree != nullptr || !trouble.Text().empty());
        if (tree != nullptr) {
            Walk(volume.get(), test::Metered(tree));
            if (options.access != Access::kReadOnly && fileId != kExtentsFileId) {
                Change(volume.get(), test::Metered(tree), what);
            }
        }
    }
    volume->Close();
    volume.reset();
    if (options.access == Access::kWrite) {
        options.access = Access::kReadOnly;
        FUZZ_CHECK(Mount(&device, options) != nullptr);
    } else {
        FUZZ_CHECK(BytesOf(&device) == bytes);
    }
}

// A field of the header, or of its copy.
void MutateHeader(fuzz::Mutator* mutator, u8* image, u64 size, const VolumeHeader& header) {
    u8* at = mutator->OneIn(4) ? image + size - kAltHeaderFromEnd : image + kHeaderOffset;
    mutator->Field(at, test::FieldsOfVolumeHeader(), kHeaderSize, header.totalBlocks);
}

// The journal the header leads to, whose checksums fit afterwards, or its info block. False: there
// is none in the image.
bool MutateJournalOf(fuzz::Mutator* mutator, u8* image, u64 size, const VolumeHeader& header) {
    const u64 infoAt = u64{header.journalInfoBlock} * header.blockSize;
    if ((header.attributes & kVolJournaled) == 0 || infoAt >= size ||
        size - infoAt < kJournalInfoSize) {
        return false;
    }
    if (mutator->OneIn(8)) {
        mutator->Field(image + infoAt, test::FieldsOfJournalInfo(), kJournalSector, size);
        return true;
    }
    const JournalInfo place = DecodeJournalInfo(image + infoAt);
    if (place.size < 2 * kJournalSector || place.offset >= size ||
        place.size > size - place.offset) {
        return false;
    }
    u8* journal = image + place.offset;
    const bool isLittle = journal[4] == 0x78;  // the mark of the byte order is 0x12345678
    fuzz::MutateJournal(mutator, journal, place.size, isLittle);
    const u32 order = isLittle ? fuzz::kLittleEndian : 0;
    fuzz::FitChecksums(journal, place.size,
                       static_cast<u8>(fuzz::kFitHeader | fuzz::kFitLists | order));
    return true;
}

// One of the three trees, where its file begins. False: it does not lie in the image.
bool MutateTree(fuzz::Mutator* mutator, u8* image, u64 size, const VolumeHeader& header) {
    const u32 fileId = kTrees[mutator->Below(3)];
    const HfsExtent& extent = header.ForkOf(fileId)->extents[0];
    const u64 start = u64{extent.startBlock} * header.blockSize;
    const u64 length = u64{extent.blockCount} * header.blockSize;
    if (start >= size || length > size - start) {
        return false;
    }
    mutator->TreeFile(image + start, static_cast<std::size_t>(length), fileId);
    return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const u8* data, std::size_t size) {
    fuzz::RunQuietly(data, size, Run);
    return 0;
}

// The volume's header, its journal, or one of its trees.
extern "C" std::size_t LLVMFuzzerCustomMutator(u8* data, std::size_t size, std::size_t most,
                                               unsigned seed) {
    fuzz::Mutator mutator(seed);
    constexpr std::size_t kControl = 2;
    if (size < kControl + kHeaderOffset + kHeaderSize || mutator.OneIn(4)) {
        return LLVMFuzzerMutate(data, size, most);
    }
    if (mutator.OneIn(3)) {
        // The same image opened or changed in another way.
        data[mutator.Below(kControl)] = static_cast<u8>(mutator.Below(256));
        return size;
    }
    u8* image = data + kControl;
    const u64 imageSize = size - kControl;
    VolumeHeader header = {};
    DecodeHeader(image + kHeaderOffset, &header);
    if (mutator.OneIn(8) && MutateJournalOf(&mutator, image, imageSize, header)) {
        return size;
    }
    if (mutator.OneIn(4) || !MutateTree(&mutator, image, imageSize, header)) {
        MutateHeader(&mutator, image, imageSize, header);
    }
    return size;
}
