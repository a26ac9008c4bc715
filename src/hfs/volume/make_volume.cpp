// A new volume in three steps: header, reserved blocks and allocation file by hand; the trees by
// the engine's Create; the root folder and its thread by InsertRecord.
#include "hfs/volume/make_volume.h"

#include <algorithm>
#include <cstring>
#include <vector>

#include "hfs/volume/convert.h"
#include "hfs/volume/journal_format.h"
#include "hfs/volume/make_journal.h"
#include "hfs/volume/volume_header.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

constexpr u32 kLargestBlock = 65536;
constexpr u32 kDefaultClump = 65536;  // of user forks
constexpr u32 kFolderRecordSize = 88;
constexpr u32 kThreadRecordFixed = 10;
constexpr u16 kRootMode = 040755;

bool IsNodeSize(u32 size) {
    return IsPowerOfTwo(size) && size >= (1u << kMinNodeShift) && size <= (1u << kMaxNodeShift);
}

Problem CheckOptions(u64 size, const FormatOptions& options) {
    if (!IsPowerOfTwo(options.blockSize) || options.blockSize < kSectorSize ||
        options.blockSize > kLargestBlock) {
        return UsageProblem("block size " + Grouped(options.blockSize) +
                                " is not a power of two from 512 to 65,536",
                            "");
    }
    for (const u32 node :
         {options.catalogNodeSize, options.extentsNodeSize, options.attributesNodeSize}) {
        if (!IsNodeSize(node)) {
            return UsageProblem(
                "node size " + Grouped(node) + " is not a power of two from 512 to 32,768", "");
        }
    }
    if (options.name.empty() || options.name.size() > 255) {
        return UsageProblem("volume name of " + std::to_string(options.name.size()) +
                                " units: 1 to 255 are possible",
                            "");
    }
    if (options.journalSize != 0 &&
        (options.journalSize < kSmallestNewJournal || options.journalSize > kLargestNewJournal)) {
        return UsageProblem("a journal of " + Grouped(options.journalSize) +
                                " bytes: " + Grouped(kSmallestNewJournal) + " to " +
                                Grouped(kLargestNewJournal) + " are possible",
                            "");
    }
    if (size % kSectorSize != 0) {
        return UsageProblem("volume size " + Grouped(size) + " is not a multiple of 512", "");
    }
    if (size / options.blockSize > ~u32{0}) {
        return UsageProblem(
            Grouped(size) + " bytes are too many blocks of " + Grouped(options.blockSize),
            "choose a larger block size");
    }
    return {};
}

// The parts of a new volume that no tree needs: where blocks 0 .. and the last ones go.
struct Plan {
    VolumeHeader header{};
    std::vector<u8> bitmap;  // whole blocks
    JournalBlocks journal;
};

void MarkUsed(Plan* plan, u64 first, u64 end) {
    for (u64 block = first; block < end && block < plan->header.totalBlocks; ++block) {
        u8& byte = plan->bitmap[static_cast<std::size_t>(block / 8)];
        const u8 bit = static_cast<u8>(0x80 >> (block % 8));
        plan->header.freeBlocks -= (byte & bit) == 0 ? 1 : 0;
        byte = static_cast<u8>(byte | bit);
    }
}

Problem MakePlan(u64 size, const FormatOptions& options, Plan* plan) {
    VolumeHeader& header = plan->header;
    const u64 blockSize = options.blockSize;
    header.signature = options.caseSensitive ? kSignatureHfsx : kSignatureHfsPlus;
    header.version = options.caseSensitive ? kVersionHfsx : kVersionHfsPlus;
    header.attributes = 0;  // in the making: a cut leaves a volume that nobody takes for whole
    header.createDate = options.date;
    header.modifyDate = options.date;
    header.checkedDate = options.date;
    header.blockSize = options.blockSize;
    header.totalBlocks = static_cast<u32>(size / blockSize);
    header.freeBlocks = header.totalBlocks;
    header.rsrcClumpSize = kDefaultClump;
    header.dataClumpSize = kDefaultClump;
    header.nextCatalogId = kFirstUserId;
    header.encodingsBitmap = 1;
    header.finderInfo[6] = static_cast<u32>(options.uuid >> 32);
    header.finderInfo[7] = static_cast<u32>(options.uuid);

    // Whatever touches the header or the last 1,024 bytes is reserved, and the last block is even
    // when the alternate header lies in the tail behind it.
    const u64 firstFree = CeilDiv(kHeaderOffset + kHeaderSize, blockSize);
    const u64 lastFree = std::min<u64>((size - kAltHeaderFromEnd) / blockSize,
                                       header.totalBlocks == 0 ? 0 : header.totalBlocks - 1);
    const u64 bitmapBlocks = CeilDiv(CeilDiv(header.totalBlocks, 8), blockSize);
    const u64 journalBlocks =
        options.journalSize == 0 ? 0 : CeilDiv(options.journalSize, blockSize) + 1;
    const u64 behind = firstFree + bitmapBlocks + journalBlocks;
    if (size < 4 * kHeaderOffset || behind > lastFree) {
        return UsageProblem("a volume of " + Grouped(size) + " bytes is too small", "");
    }
    plan->bitmap.assign(static_cast<std::size_t>(bitmapBlocks * blockSize), 0);
    MarkUsed(plan, 0, behind);
    MarkUsed(plan, lastFree, header.totalBlocks);

    header.allocationFile.logicalSize = bitmapBlocks * blockSize;
    header.allocationFile.clumpSize =
        static_cast<u32>(std::min<u64>(bitmapBlocks * blockSize, u64{1} << 31));
    header.allocationFile.totalBlocks = static_cast<u32>(bitmapBlocks);
    header.allocationFile.extents[0] = {static_cast<u32>(firstFree),
                                        static_cast<u32>(bitmapBlocks)};
    header.nextAllocation = static_cast<u32>(behind);
    plan->journal = {static_cast<u32>(firstFree + bitmapBlocks), static_cast<u32>(journalBlocks)};
    if (journalBlocks != 0 && options.withRoot && !options.emptyTrees) {
        header.fileCount = kJournalFiles;
        header.nextCatalogId += kJournalFiles;
    }
    return {};
}

// What the device held before is gone, and known to be gone, before anything else of it is written
// over: the volume header first, by which it is found.
IoResult WritePlan(BlockDevice* device, const Plan& plan) {
    u8 bytes[kHeaderSize];
    EncodeHeader(plan.header, bytes);
    const u64 size = device->Size();
    const u64 bitmapAt =
        u64{plan.header.allocationFile.extents[0].startBlock} * plan.header.blockSize;
    IoResult result = device->Zero(0, kHeaderOffset + kHeaderSize);
    if (result.Ok()) {
        result = device->Sync();
    }
    if (result.Ok()) {
        result = device->Zero(size - kAltHeaderFromEnd, kAltHeaderFromEnd);
    }
    if (result.Ok()) {
        result = device->Sync();
    }
    if (result.Ok()) {
        result = device->Write(bitmapAt, plan.bitmap.data(), plan.bitmap.size());
    }
    if (result.Ok()) {
        result = device->Write(size - kAltHeaderFromEnd, bytes, sizeof bytes);
    }
    if (result.Ok()) {
        result = device->Write(kHeaderOffset, bytes, sizeof bytes);
    }
    return result;
}

// Makes the header at `offset` that of a whole volume, with its journal if it has one.
IoResult Proclaim(BlockDevice* device, u64 offset, const JournalBlocks& journal) {
    u8 bytes[kHeaderSize];
    const IoResult result = device->Read(offset, bytes, sizeof bytes);
    if (!result.Ok()) {
        return result;
    }
    VolumeHeader header;
    DecodeHeader(bytes, &header);
    header.attributes |= kVolUnmounted;
    if (journal.count != 0) {
        header.attributes |= kVolJournaled;
        header.journalInfoBlock = journal.first;
        header.lastMountedVersion = kKeeperCode;
    }
    EncodeHeader(header, bytes);
    return device->Write(offset, bytes, sizeof bytes);
}

// Everything a volume needs is there: its journal, then its headers.
// REQUIRES: what was written so far is synced.
IoResult Complete(BlockDevice* device, const JournalBlocks& journal, u32 blockSize) {
    IoResult result;
    if (journal.count != 0) {
        result = StartJournal(device, journal, blockSize);
    }
    if (result.Ok()) {
        result = Proclaim(device, device->Size() - kAltHeaderFromEnd, journal);
    }
    if (result.Ok()) {
        result = device->Sync();
    }
    if (result.Ok()) {
        result = Proclaim(device, kHeaderOffset, journal);
    }
    return result.Ok() ? device->Sync() : result;
}

// Zeroes the blocks of a tree file on the device itself. They belong to nobody yet, so this need
// not wait for the commit, and large files take no memory.
Problem ZeroFork(BlockDevice* device, ImageVolume* volume, u32 fileId) {
    const u64 blockSize = volume->Header().blockSize;
    for (const HfsExtent& extent : volume->ForkExtents(fileId)) {
        const IoResult result =
            device->Zero(extent.startBlock * blockSize, extent.blockCount * blockSize);
        if (!result.Ok()) {
            return FailureAt(
                result.offset,
                "write error at " + HexOffset(result.offset) + ": " + IoErrorText(result.error),
                "");
        }
    }
    return {};
}

struct NewTree {
    u32 fileId;
    u32 nodeSize;
    u64 size;
};

Problem MakeTree(BlockDevice* device, ImageVolume* volume, const NewTree& tree,
                 const FormatOptions& options) {
    volume->Fs()->ForkOf(tree.fileId)->clumpSize = options.clumpSize;
    const int status =
        volume->CreateTree(tree.fileId, Log2(tree.nodeSize), tree.size != 0 ? &tree.size : nullptr);
    if (status == kErrNoSpace) {
        return Failure("a volume of " + Grouped(device->Size()) + " bytes has no room for its " +
                           ForkName(tree.fileId) + " file",
                       "choose a larger size or smaller trees");
    }
    if (status != kOk) {
        return Failure(std::string(ForkName(tree.fileId)) + " tree: " + StatusWithCode(status), "");
    }
    return options.deviceIsZero ? Problem{} : ZeroFork(device, volume, tree.fileId);
}

std::vector<u8> CatalogKeyBytes(u32 parentId, const std::u16string& name) {
    std::vector<u8> key(kCatKeyName + 2 * name.size());
    StoreBe16(key.data(), static_cast<u32>(key.size() - kKeyLengthSize));
    StoreBe32(key.data() + kCatKeyParentId, parentId);
    StoreBe16(key.data() + kCatKeyNameLength, static_cast<u32>(name.size()));
    for (std::size_t i = 0; i < name.size(); ++i) {
        StoreBe16(key.data() + kCatKeyName + 2 * i, name[i]);
    }
    return key;
}

// Both forms have one layout: what is written big-endian here is turned into host order as a whole.
int InsertCatalogRecord(CBTreeHfs* tree, u32 parentId, const std::u16string& name,
                        const std::vector<u8>& record) {
    const HfsConvert& convert = ConvertFor(kCatalogFileId);
    const std::vector<u8> keyBytes = CatalogKeyBytes(parentId, name);
    CatalogKey key{};
    std::vector<u8> data(record.size());
    convert.KeyToMemory(&key, keyBytes.data(), static_cast<unsigned>(keyBytes.size()));
    convert.DataToMemory(data.data(), record.data(), static_cast<unsigned>(record.size()));
    return tree->InsertRecord(&key, parentId, data.data(), static_cast<unsigned>(data.size()));
}

int InsertRootFolder(CBTreeHfs* tree, const FormatOptions& options) {
    std::vector<u8> folder(kFolderRecordSize);
    StoreBe16(folder.data(), 1);  // folder
    StoreBe32(folder.data() + 4, options.journalSize != 0 ? kJournalFiles : 0);
    StoreBe32(folder.data() + 8, kRootFolderId);
    for (const u32 dateAt : {12u, 16u, 20u, 24u}) {
        StoreBe32(folder.data() + dateAt, options.date);
    }
    StoreBe16(folder.data() + 42, kRootMode);
    std::vector<u8> thread(kThreadRecordFixed + 2 * options.name.size());
    StoreBe16(thread.data(), 3);  // folder thread
    StoreBe32(thread.data() + 4, kRootParentId);
    StoreBe16(thread.data() + 8, static_cast<u32>(options.name.size()));
    for (std::size_t i = 0; i < options.name.size(); ++i) {
        StoreBe16(thread.data() + kThreadRecordFixed + 2 * i, options.name[i]);
    }
    const int status = InsertCatalogRecord(tree, kRootParentId, options.name, folder);
    return status != kOk ? status : InsertCatalogRecord(tree, kRootFolderId, u"", thread);
}

Problem MakeTrees(BlockDevice* device, ImageVolume* volume, const FormatOptions& options,
                  const JournalBlocks& journal) {
    std::vector<NewTree> trees = {{kExtentsFileId, options.extentsNodeSize, options.extentsSize}};
    if (options.withAttributes) {
        trees.push_back({kAttributesFileId, options.attributesNodeSize, options.attributesSize});
    }
    trees.push_back({kCatalogFileId, options.catalogNodeSize, options.catalogSize});
    for (const NewTree& tree : trees) {
        if (Problem problem = MakeTree(device, volume, tree, options)) {
            return problem;
        }
    }
    if (!options.withRoot) {
        return {};
    }
    CBTreeHfs* catalog = volume->OpenTree(kCatalogFileId);
    int status = InsertRootFolder(catalog, options);
    if (status == kOk && journal.count != 0) {
        status = InsertJournalFiles(
            journal, options.blockSize, options.date,
            [&](u32 parentId, const std::u16string& name, const std::vector<u8>& record) {
                return InsertCatalogRecord(catalog, parentId, name, record);
            });
    }
    if (status == kErrTooLarge || status == kErrInvalid) {
        return UsageProblem("catalog nodes of " + Grouped(options.catalogNodeSize) +
                                " bytes cannot hold the root folder",
                            "choose larger nodes or a shorter name");
    }
    return status == kOk ? Problem{} : Failure("root folder: " + StatusWithCode(status), "");
}

u32 SmallestNode(const FormatOptions& options) {
    const u32 smallest = std::min(options.catalogNodeSize, options.extentsNodeSize);
    return options.withAttributes ? std::min(smallest, options.attributesNodeSize) : smallest;
}

Problem WriteProblem(const IoResult& result) {
    return result.Ok() ? Problem{}
                       : FailureAt(result.offset,
                                   "write error at " + HexOffset(result.offset) + ": " +
                                       IoErrorText(result.error),
                                   "");
}

// `isWhole`: it has been completed.
std::unique_ptr<ImageVolume> MountNew(std::unique_ptr<BlockDevice> device,
                                      const FormatOptions& options, bool isWhole,
                                      Problem* problem) {
    OpenOptions open;
    open.force = !isWhole;
    open.access = Access::kWrite;
    open.offset = 0;
    open.mapBlockSize = options.mapBlockSize != 0 ? options.mapBlockSize : SmallestNode(options);
    return ImageVolume::Open(std::move(device), open, nullptr, problem);
}

// Makes what the plan left out, in one commit.
Problem Fill(BlockDevice* device, const FormatOptions& options, const Plan& plan) {
    Problem problem;
    auto view = std::make_unique<SliceDevice>(device, 0, device->Size());
    const std::unique_ptr<ImageVolume> volume = MountNew(std::move(view), options, false, &problem);
    if (!volume || options.emptyTrees) {
        return problem;
    }
    problem = MakeTrees(device, volume.get(), options, plan.journal);
    if (!problem) {
        const int status = volume->Commit(0);
        if (status != kOk) {
            problem = volume->LastIoProblem()
                          ? volume->LastIoProblem()
                          : Failure("cannot write the volume: " + StatusWithCode(status), "");
        }
    }
    return problem;
}

Problem PlanVolume(u64 size, const FormatOptions& options, Plan* plan) {
    const Problem problem = CheckOptions(size, options);
    return problem ? problem : MakePlan(size, options, plan);
}

}  // namespace

Problem CheckFormat(u64 size, const FormatOptions& options) {
    Plan plan;
    return PlanVolume(size, options, &plan);
}

std::unique_ptr<ImageVolume> MakeVolume(std::unique_ptr<BlockDevice> device,
                                        const FormatOptions& options, Problem* problem) {
    Plan plan;
    *problem = PlanVolume(device->Size(), options, &plan);
    if (!*problem) {
        *problem = WriteProblem(WritePlan(device.get(), plan));
    }
    if (!*problem) {
        *problem = Fill(device.get(), options, plan);
    }
    if (!*problem) {
        *problem = WriteProblem(Complete(device.get(), plan.journal, options.blockSize));
    }
    std::unique_ptr<ImageVolume> volume;
    if (!*problem) {
        volume = MountNew(std::move(device), options, true, problem);
    }
    for (const u32 fileId : {kExtentsFileId, kCatalogFileId, kAttributesFileId}) {
        if (volume && volume->HasTree(fileId) && volume->Tree(fileId, problem) == nullptr) {
            return nullptr;
        }
    }
    return volume;
}

std::unique_ptr<ImageVolume> MakeMemoryVolume(u64 size, const FormatOptions& options,
                                              Problem* problem) {
    *problem = CheckFormat(size, options);
    if (*problem) {
        return nullptr;  // a device of that size may be more than the memory has pages for
    }
    FormatOptions zeroed = options;
    zeroed.deviceIsZero = true;
    return MakeVolume(std::make_unique<MemoryDevice>(size), zeroed, problem);
}

}  // namespace VELK
