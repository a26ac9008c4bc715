// Writing and reading the log.
#include "tool/undo_file.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#define XXH_INLINE_ALL
#include <xxhash.h>

#include "hfs/treehfs/bytes.h"

namespace VELK::tool {

namespace {

constexpr char kMagic[16] = "treehfs undo 1\n";
constexpr u32 kEntryHead = 8 + 4 + 8;  // offset, size, sum of the bytes
constexpr u64 kLastEntry = ~u64{0};    // as the offset: the sum is that of the new bytes

void PutBe64(u8* bytes, u64 value) {
    PutBe32(bytes, static_cast<u32>(value >> 32));
    PutBe32(bytes + 4, static_cast<u32>(value));
}

u64 TakeBe64(const u8* bytes) {
    return u64{GetBe32(bytes)} << 32 | GetBe32(bytes + 4);
}

bool WriteEntry(std::FILE* file, u64 offset, u32 size, u64 sum, const u8* bytes) {
    u8 head[kEntryHead];
    PutBe64(head, offset);
    PutBe32(head + 8, size);
    PutBe64(head + 12, sum);
    return std::fwrite(head, 1, sizeof head, file) == sizeof head &&
           (size == 0 || std::fwrite(bytes, 1, size, file) == size);
}

// Adds the bytes of one sector to a running sum.
u64 Chained(u64 sum, const u8* bytes, std::size_t size) {
    return XXH3_64bits_withSeed(bytes, size, sum);
}

// Sectors one after the other, in whatever pieces they were kept.
IoResult ChainSectors(BlockDevice* image, u64 offset, u64 size, u64* sum) {
    u8 sector[kSectorSize];
    for (u64 at = 0; at < size; at += kSectorSize) {
        const std::size_t piece = static_cast<std::size_t>(std::min<u64>(kSectorSize, size - at));
        const IoResult result = image->Read(offset + at, sector, piece);
        if (!result.Ok()) {
            return result;
        }
        *sum = Chained(*sum, sector, piece);
    }
    return {};
}

bool ReadEntry(std::FILE* file, u64 imageSize, UndoLog* log) {
    u8 head[kEntryHead];
    if (std::fread(head, 1, sizeof head, file) != sizeof head) {
        return false;
    }
    const u64 offset = TakeBe64(head);
    const u32 size = GetBe32(head + 8);
    const u64 sum = TakeBe64(head + 12);
    if (offset == kLastEntry) {
        log->isComplete = true;
        log->newBytesSum = sum;
        return false;
    }
    if (offset > imageSize || size > imageSize - offset) {
        return false;
    }
    UndoStretch stretch;
    stretch.offset = offset;
    stretch.bytes.resize(size);
    if (std::fread(stretch.bytes.data(), 1, size, file) != size ||
        XXH3_64bits(stretch.bytes.data(), size) != sum) {
        return false;
    }
    log->stretches.push_back(std::move(stretch));
    return true;
}

}  // namespace

Problem ReadUndoLog(const std::string& path, UndoLog* log) {
    std::FILE* file = std::fopen(path.c_str(), "rbe");
    if (file == nullptr) {
        return Failure(path + ": cannot open: " + IoErrorText(errno), "");
    }
    u8 head[sizeof kMagic + 8];
    const bool isLog = std::fread(head, 1, sizeof head, file) == sizeof head &&
                       std::memcmp(head, kMagic, sizeof kMagic) == 0;
    if (isLog) {
        log->imageSize = TakeBe64(head + sizeof kMagic);
        while (ReadEntry(file, log->imageSize, log)) {
        }
    }
    std::fclose(file);
    return isLog ? Problem{} : Failure(path + ": is no file that --undo has written", "");
}

IoResult SumOfStretches(BlockDevice* image, const UndoLog& log, u64* sum) {
    *sum = 0;
    for (const UndoStretch& stretch : log.stretches) {
        const IoResult result = ChainSectors(image, stretch.offset, stretch.bytes.size(), sum);
        if (!result.Ok()) {
            return result;
        }
    }
    return {};
}

std::unique_ptr<UndoDevice> UndoDevice::Open(std::unique_ptr<BlockDevice> base,
                                             const std::string& path, Problem* problem) {
    std::FILE* file = std::fopen(path.c_str(), "wbe");
    u8 head[sizeof kMagic + 8];
    std::memcpy(head, kMagic, sizeof kMagic);
    PutBe64(head + sizeof kMagic, base->Size());
    if (file == nullptr || std::fwrite(head, 1, sizeof head, file) != sizeof head) {
        *problem = Failure(path + ": cannot be written: " + IoErrorText(errno), "");
        if (file != nullptr) {
            std::fclose(file);
        }
        return nullptr;
    }
    return std::unique_ptr<UndoDevice>(new UndoDevice(std::move(base), file));
}

UndoDevice::~UndoDevice() {
    u64 sum = 0;
    bool isReadable = error_ == 0;
    for (const u64 sector : order_) {
        const u64 offset = sector * kSectorSize;
        const u64 size = std::min<u64>(kSectorSize, base_->Size() - offset);
        isReadable = isReadable && ChainSectors(base_.get(), offset, size, &sum).Ok();
    }
    if (isReadable) {
        WriteEntry(file_, kLastEntry, 0, sum, nullptr);
    }
    std::fclose(file_);
}

bool UndoDevice::Append(u64 offset, const std::vector<u8>& bytes) {
    return WriteEntry(file_, offset, static_cast<u32>(bytes.size()),
                      XXH3_64bits(bytes.data(), bytes.size()), bytes.data());
}

// Appends the sectors of the range that the log does not have yet, and waits for the disk.
IoResult UndoDevice::Keep(u64 offset, std::size_t bytes) {
    bool isNew = false;
    for (u64 sector = offset / kSectorSize; sector * kSectorSize < offset + bytes; ++sector) {
        if (!kept_.insert(sector).second) {
            continue;
        }
        const u64 from = sector * kSectorSize;
        std::vector<u8> old(static_cast<std::size_t>(
            std::min<u64>(kSectorSize, base_->Size() - std::min(from, base_->Size()))));
        const IoResult result = base_->Read(from, old.data(), old.size());
        if (!result.Ok()) {
            return result;
        }
        order_.push_back(sector);
        isNew = true;
        if (!Append(from, old)) {
            return {errno != 0 ? errno : EIO, from};
        }
    }
    if (isNew && (std::fflush(file_) != 0 || fsync(fileno(file_)) != 0)) {
        return {errno, offset};
    }
    return {};
}

IoResult UndoDevice::Write(u64 offset, const void* source, std::size_t bytes) {
    if (offset > Size() || bytes > Size() - offset) {
        return {kIoPastEnd, offset};
    }
    if (error_ != 0) {
        return {error_, offset};
    }
    const IoResult result = Keep(offset, bytes);
    error_ = result.error;
    return result.Ok() ? base_->Write(offset, source, bytes) : result;
}

}  // namespace VELK::tool
