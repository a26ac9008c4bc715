// Decides where the volume lies: a place the caller names, a bare volume, or a partition.
#include "hfs/volume/partition.h"

#include <algorithm>

#include "hfs/volume/partition_maps.h"
#include "hfs/volume/volume_header.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

bool HoldsVolume(Content content) {
    return content == Content::kHfsPlus || content == Content::kHfsx ||
           content == Content::kWrapper;
}

// Whether a header of an HFS+ volume stands 1,024 bytes before the end of a place.
bool HasAlternate(BlockDevice* image, u64 offset, u64 size) {
    u8 signature[4];
    if (size < 2 * kHeaderOffset ||
        !image->Read(offset + size - kAltHeaderFromEnd, signature, sizeof signature).Ok()) {
        return false;
    }
    return (Be16(signature) == kSignatureHfsPlus && Be16(signature + 2) == kVersionHfsPlus) ||
           (Be16(signature) == kSignatureHfsx && Be16(signature + 2) == kVersionHfsx);
}

// Steps from a wrapper to the volume inside it.
Problem EnterWrapper(BlockDevice* image, VolumePlace* place) {
    u8 mdb[kHeaderSize];
    const u64 at = place->offset + kHeaderOffset;
    if (!image->Read(at, mdb, sizeof mdb).Ok()) {
        return FailureAt(at, "HFS wrapper at " + Position(place->offset) + " cannot be read", "");
    }
    const u64 blockSize = Be32(mdb + 20);
    const u64 blockCount = Be16(mdb + 128);
    if (blockSize == 0 || blockSize % 512 != 0 || blockCount == 0) {
        return FailureAt(at,
                         "HFS wrapper at " + Position(place->offset) + ": block size " +
                             Grouped(blockSize) + ", " + Grouped(blockCount) +
                             " blocks for the volume inside",
                         "if you know where the volume starts, give --offset");
    }
    place->wrapped = true;
    place->wrapperOffset = place->offset;
    place->offset += u64{Be16(mdb + 28)} * 512 + Be16(mdb + 126) * blockSize;
    place->size = blockCount * blockSize;
    return {};
}

Problem HeaderGone(BlockDevice* image, u64 offset) {
    u8 signature[2] = {};
    image->Read(offset + kHeaderOffset, signature, sizeof signature);
    Problem problem =
        FailureAt(offset + kHeaderOffset,
                  "volume header at " + Position(offset + kHeaderOffset) +
                      Format(": signature %04X is neither 482B nor 4858", Be16(signature)),
                  "try --backup-header");
    problem.check = "V01";
    return problem;
}

// Accepts the place set in `*place` by what lies there.
Problem Accept(BlockDevice* image, Content content, bool lenient, VolumePlace* place) {
    switch (content) {
        case Content::kWrapper:
            return EnterWrapper(image, place);
        case Content::kHfsPlus:
        case Content::kHfsx:
            return {};
        default:
            break;
    }
    if (lenient && HasAlternate(image, place->offset, place->size)) {
        return {};
    }
    return HeaderGone(image, place->offset);
}

std::string PlainHfsText(u64 offset) {
    return "HFS volume without an HFS+ volume inside (signature 4244 at " +
           Position(offset + kHeaderOffset) + ")";
}

Problem PlainHfs(u64 offset) {
    return FailureAt(offset + kHeaderOffset, PlainHfsText(offset),
                     "only HFS+ and HFSX are supported");
}

Problem NothingFound(BlockDevice* image) {
    const u64 size = image->Size();
    if (size == 0) {
        return Failure("no HFS+ volume found (the image is empty)", "");
    }
    u8 bytes[4] = {};
    const std::size_t count = static_cast<std::size_t>(std::min<u64>(size, sizeof bytes));
    image->Read(0, bytes, count);
    std::string text = "no HFS+ volume found (looked at offset 1024, GPT, APM, MBR); first bytes";
    for (std::size_t i = 0; i < count; ++i) {
        text += Format(i % 2 == 0 ? " %02x" : "%02x", bytes[i]);
    }
    return FailureAt(0, text, "if you know where it starts, give --offset");
}

// The named partition, or the only one that holds a volume.
Problem ChoosePartition(const PlaceOptions& options, VolumeScan* scan, PartitionEntry** chosen) {
    *chosen = nullptr;
    std::string numbers;
    u32 candidates = 0;
    for (PartitionEntry& entry : scan->partitions) {
        if (entry.number == options.partition) {
            *chosen = &entry;
            return {};
        }
        if (entry.holdsVolume && options.partition == 0) {
            numbers += (candidates == 0   ? ""
                        : candidates == 1 ? " and "
                                          : ", ") +
                       std::to_string(entry.number);
            candidates += 1;
            *chosen = &entry;
        }
    }
    if (options.partition != 0) {
        return UsageProblem(Format("partition %u: ", options.partition) +
                                (scan->partitions.empty()
                                     ? std::string("the image has no partition map")
                                     : "the " + std::string(SchemeName(scan->scheme)) + " lists " +
                                           std::to_string(scan->partitions.size()) + " partitions"),
                            "see info --partitions");
    }
    if (candidates > 1) {
        *chosen = nullptr;
        return UsageProblem(
            std::to_string(candidates) + " HFS+ volumes (partitions " + numbers + ")",
            "choose with --partition");
    }
    return {};
}

Problem HoldsOther(const PartitionEntry& entry) {
    return FailureAt(entry.offset,
                     Format("partition %u holds ", entry.number) + entry.contentName + ", not HFS+",
                     "");
}

// Why no partition of the map can be taken.
Problem NoPartitionTaken(BlockDevice* image, const VolumeScan& scan) {
    for (const PartitionEntry& entry : scan.partitions) {
        if (entry.content == Content::kPlainHfs) {
            return PlainHfs(entry.offset);
        }
    }
    for (const PartitionEntry& entry : scan.partitions) {
        if (IsHfsType(entry) && entry.content != Content::kOther) {
            return HeaderGone(image, entry.offset);
        }
    }
    // Small boot partitions stand beside the one that is meant: name the largest.
    const PartitionEntry* largest = nullptr;
    for (const PartitionEntry& entry : scan.partitions) {
        if (entry.content == Content::kOther &&
            (largest == nullptr || entry.size > largest->size)) {
            largest = &entry;
        }
    }
    return largest != nullptr ? HoldsOther(*largest) : NothingFound(image);
}

void Describe(BlockDevice* image, PartitionEntry* entry) {
    entry->content = Identify(image, entry->offset, &entry->contentName);
    entry->holdsVolume = HoldsVolume(entry->content);
    if (entry->offset >= image->Size()) {
        entry->reason = "lies behind the end of the image";
    } else if (entry->holdsVolume) {
        entry->reason = "holds " + entry->contentName;
    } else if (IsHfsType(*entry)) {
        entry->reason = "type says HFS, but there is no volume header";
    } else {
        entry->reason = "type " + entry->type + ", holds " + entry->contentName;
    }
}

Problem TakePartition(BlockDevice* image, const PlaceOptions& options, VolumeScan* scan,
                      PartitionEntry* entry) {
    VolumePlace* place = &scan->place;
    place->offset = entry->offset;
    place->size = entry->size;
    place->scheme = entry->scheme;
    place->partition = entry->number;
    place->partitions = static_cast<u32>(scan->partitions.size());
    if (entry->content == Content::kPlainHfs) {
        return PlainHfs(entry->offset);
    }
    if (entry->content == Content::kOther) {
        return HoldsOther(*entry);
    }
    const Problem problem = Accept(image, entry->content, options.lenient, place);
    if (!problem) {
        entry->taken = true;
        entry->reason = options.partition != 0 ? "chosen" : "taken: " + entry->reason;
    }
    return problem;
}

// A volume at the start of the image, or at the place the caller names.
Problem TakeBare(BlockDevice* image, Content content, u64 offset, bool lenient, VolumeScan* scan) {
    scan->place.offset = offset;
    scan->place.size = image->Size() - offset;
    if (content == Content::kPlainHfs) {
        return PlainHfs(offset);
    }
    return Accept(image, content, lenient, &scan->place);
}

}  // namespace

const char* SchemeName(PartitionScheme scheme) {
    switch (scheme) {
        case PartitionScheme::kApm:
            return "APM";
        case PartitionScheme::kGpt:
            return "GPT";
        case PartitionScheme::kMbr:
            return "MBR";
        case PartitionScheme::kNone:
            break;
    }
    return "none";
}

// Several maps may describe one disk; the first that lists a volume is used, else the first found.
Problem ListPartitions(BlockDevice* image, VolumeScan* scan) {
    scan->partitions.clear();
    scan->scheme = PartitionScheme::kNone;
    struct Reader {
        PartitionScheme scheme;
        bool (*read)(BlockDevice*, std::vector<PartitionEntry>*);
    };
    constexpr Reader kReaders[] = {{PartitionScheme::kGpt, ReadGpt},
                                   {PartitionScheme::kApm, ReadApm},
                                   {PartitionScheme::kMbr, ReadMbr}};
    for (const Reader& reader : kReaders) {
        std::vector<PartitionEntry> entries;
        if (!reader.read(image, &entries)) {
            continue;
        }
        bool holdsVolume = false;
        for (PartitionEntry& entry : entries) {
            Describe(image, &entry);
            holdsVolume = holdsVolume || entry.holdsVolume;
        }
        if (holdsVolume || scan->scheme == PartitionScheme::kNone) {
            scan->partitions = std::move(entries);
            scan->scheme = reader.scheme;
        }
        if (holdsVolume) {
            break;
        }
    }
    return {};
}

Problem LocateVolume(BlockDevice* image, const PlaceOptions& options, VolumeScan* scan) {
    *scan = VolumeScan{};
    std::string name;
    if (options.offset) {
        const u64 offset = *options.offset;
        if (offset >= image->Size()) {
            return UsageProblem(
                "offset " + Grouped(offset) + ": the image ends at " + Grouped(image->Size()), "");
        }
        return TakeBare(image, Identify(image, offset, &name), offset, options.lenient, scan);
    }
    const Content bare = Identify(image, 0, &name);
    if (options.partition == 0 && (HoldsVolume(bare) || bare == Content::kPlainHfs)) {
        return TakeBare(image, bare, 0, options.lenient, scan);
    }
    ListPartitions(image, scan);
    PartitionEntry* chosen = nullptr;
    if (Problem problem = ChoosePartition(options, scan, &chosen)) {
        return problem;
    }
    if (chosen != nullptr) {
        return TakePartition(image, options, scan, chosen);
    }
    if (Problem container = IdentifyContainer(image)) {
        return container;
    }
    if (!scan->partitions.empty()) {
        for (PartitionEntry& entry : scan->partitions) {
            if (options.lenient && HasAlternate(image, entry.offset, entry.size)) {
                return TakePartition(image, options, scan, &entry);
            }
        }
        return NoPartitionTaken(image, *scan);
    }
    if (HasAlternate(image, 0, image->Size())) {
        return TakeBare(image, bare, 0, options.lenient, scan);
    }
    if (bare == Content::kOther) {
        return FailureAt(0, "holds " + name + ", not HFS+", "");
    }
    return NothingFound(image);
}

}  // namespace VELK
