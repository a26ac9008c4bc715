// A whole tree file of any bytes: opened, walked both ways, searched, changed, while a call of the
// volume or the heap may fail. Nothing may be read or written outside it, every walk ends, nothing
// leaks, no service is used against its contract, and after a change that failed the restored tree
// is the one before it.
//
// Input: tree kind, geometry and fault, what to do (bits: 1 change, and fail in that, 2 keys
// between those there are, 4 every call there is, as the sweep makes them, 8 grow the file by more
// nodes than one map node covers), then the tree file.
#include "fault_service.h"
#include "fuzz.h"
#include "keys.h"
#include "mem_volume.h"
#include "mutate.h"
#include "trial.h"

namespace {

using namespace VELK;

constexpr std::size_t kMostBytes = 1u << 18;
constexpr u32 kSteps = 400;
constexpr u32 kKeys = 24;
constexpr u32 kGrowth = 2600;
constexpr u32 kFiles[] = {kCatalogFileId, kExtentsFileId, kAttributesFileId};

struct alignas(8) Buffers {
    u8 record[32768];
    u8 key[kKeyLengthSize + kMaxKeyLength + 6];
    unsigned recordSize;
    unsigned keySize;
};

void Walk(test::Metered tree, int step, u32 firstNode) {
    Buffers at = {};
    HfsFindData path;
    const unsigned long long position = static_cast<u64>(firstNode) << tree->nodeShift;
    int status = tree->SetPos(position, at.record, sizeof at.record, &at.recordSize, at.key,
                              sizeof at.key, &at.keySize, &path);
    for (u32 i = 0; i < kSteps && status == kOk; ++i) {
        FUZZ_CHECK(at.recordSize <= sizeof at.record && at.keySize <= sizeof at.key);
        status = tree->IncPos(step, at.record, sizeof at.record, &at.recordSize, at.key,
                              sizeof at.key, &at.keySize, &path);
    }
    path.ClearPath();
}

void Search(test::Metered tree) {
    Buffers at = {};
    for (u32 n = 0; n < kKeys; ++n) {
        const test::HostKey key = test::NthHostKey(tree->fileId, n * 3, n % 2 == 0);
        HfsFindData path;
        tree->FindRecord(key.Get(), key.id, at.record, sizeof at.record, &at.recordSize, &path);
        path.ClearPath();
    }
}

bool IsAnswer(int status) {
    return status == kOk || status == kErrNotFound || status == kErrExists ||
           status == kErrTooLarge;
}

void Restore(test::Metered tree, test::MemVolume* volume, const test::MemVolume::Snapshot& before) {
    tree->findData.ClearPath();
    volume->Restore(before);
    tree->RestoreModifiedNodes();
}

// Which call fails from now on: bits 4 to 6 of the geometry with, unless these count a trial's
// calls, the upper half of the pattern; bit 7 of the geometry: one of the heap, else one of the
// volume. 0: none. The numbers grow like squares, over `fine`: further on it matters less which
// call it is.
void SetFault(test::FaultService* faults, u8 geometry, u8 pattern, u32 fine) {
    const u32 low = (pattern & 4) != 0 ? 0 : pattern >> 4;
    const u32 number = (geometry >> 4 & 7u) * 16 + low;
    const u32 nth = number * (number + fine - 1) / fine;
    if (nth == 0) {
        return;
    }
    if ((geometry & 0x80) != 0) {
        test::HeapGuard::Current()->FailNth(nth);
    } else {
        faults->FailAny(nth);
    }
}

// Changes until one fails, then restores, as a volume does. False: restored. One pattern in three
// ends with deleting all that it inserted.
bool Change(test::Metered tree, test::MemVolume* volume, u8 pattern) {
    const test::MemVolume::Snapshot before = volume->Save();
    const u32 steps = pattern % 3 == 2 ? 2 * kKeys : kKeys;
    for (u32 n = 0; n < steps; ++n) {
        const test::HostKey key = test::NthHostKey(tree->fileId, n % kKeys, (pattern & 2) != 0);
        const test::Bytes record = test::Pattern(2 + 2 * (n * pattern % 120), n);
        const int status = n >= kKeys || (n + pattern) % 3 == 0
                               ? tree->DeleteRecord(key.Get(), key.id, false)
                               : tree->InsertRecord(key.Get(), key.id, record.data(),
                                                    static_cast<unsigned>(record.size()));
        if (!IsAnswer(status)) {
            Restore(tree, volume, before);
            return false;
        }
    }
    if ((pattern & 8) != 0 &&
        tree->ExtendBTree((*tree).header.totalNodes + kGrowth, nullptr, nullptr) != kOk) {
        Restore(tree, volume, before);
        return false;
    }
    if (tree->Flush(0) != kOk) {
        Restore(tree, volume, before);
        return false;
    }
    return true;
}

void Run(fuzz::Input* input) {
    const u32 fileId = kFiles[input->U8() % 3];
    const u8 geometry = input->U8();
    const u8 pattern = input->U8();
    test::MemVolumeOptions options;
    options.mapBlockSize = 512u << (geometry & 3);
    options.allocBlockSize = options.mapBlockSize;
    options.listsCalls = false;
    options.totalBlocks = 4096;
    options.hasJournal = (geometry & 4) != 0;
    options.version = (geometry & 8) != 0 ? kVersionHfsx : kVersionHfsPlus;
    const test::Bytes file = input->Rest(kMostBytes);
    if ((pattern & 4) != 0) {
        test::Trial(fileId, options.mapBlockSize).RunTree(file, 1 + (pattern >> 4));
    }
    test::MemVolume volume(options);
    volume.LoadFile(fileId, file);
    test::FaultService faults(&volume.fs);
    const bool changes = (pattern & 1) != 0;
    if (!changes) {
        SetFault(&faults, geometry, pattern, 8);  // 1, 2, 3, 5, ... 2127
    }
    {
        test::TestTree owner(&volume, fileId);
        const test::Metered tree(&owner.tree);
        if (tree->Init() == kOk) {
            Walk(tree, 1, (*tree).header.firstLeafNode);
            Walk(tree, -1, (*tree).header.lastLeafNode);
            Search(tree);
            if (fileId == kExtentsFileId) {
                HfsRuns runs;
                tree->LoadBadBlocks(&runs);
            }
            if (changes && tree->Flush(0) == kOk) {
                SetFault(&faults, geometry, pattern, 16);  // 1, 2, 3, 4, 6, ... 1127
                if (Change(tree, &volume, pattern)) {
                    Walk(tree, 1, (*tree).header.firstLeafNode);
                }
            }
        }
    }
    FUZZ_CHECK(volume.Lent() == 0);
    // A node is emptied for its new owner even when the journal refuses.
    if (faults.HasFailed() && faults.FailedCall() == test::Call::kWriteAccess) {
        volume.breaches.clear();
    }
    for (const std::string& breach : volume.breaches) {
        std::fprintf(stderr, "%s\n", breach.c_str());
    }
    FUZZ_CHECK(volume.breaches.empty());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const u8* data, std::size_t size) {
    fuzz::RunQuietly(data, size, Run);
    return 0;
}

extern "C" std::size_t LLVMFuzzerCustomMutator(u8* data, std::size_t size, std::size_t most,
                                               unsigned seed) {
    fuzz::Mutator mutator(seed);
    constexpr std::size_t kControl = 3;
    if (size <= kControl || mutator.OneIn(4)) {
        return LLVMFuzzerMutate(data, size, most);
    }
    if (mutator.OneIn(3)) {
        // The same tree in other blocks, changed in another way or with another fault.
        u8* control = data + 1 + mutator.Below(2);
        *control = mutator.OneIn(2) ? static_cast<u8>(mutator.Below(256))
                                    : static_cast<u8>((*control & 15) | mutator.Below(16) << 4);
        return size;
    }
    mutator.TreeFile(data + kControl, size - kControl, kFiles[data[0] % 3]);
    return size;
}
