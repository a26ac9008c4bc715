// Where the bytes of an image lie: a file or block device, memory, a part of another device, or
// another device with changes kept in memory. All positions are 64-bit bytes.
//
// Reads go into buffers of the caller, never through a mapping: a file that is cut short while it
// is open then gives an error instead of a fault.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "hfs/volume/problem.h"
#include "platform/types.h"

namespace VELK {

constexpr int kIoPastEnd = -1;    // the range leaves the device
constexpr int kIoReadOnly = -2;   // the device takes no writes
constexpr int kIoNoMemory = -3;   // out of memory
constexpr int kIoTooLarge = -4;   // more changes than the journal holds; nothing was written
constexpr u32 kSectorSize = 512;  // smallest unit anything on a volume is changed in

// Result of one transfer. A failed one may have moved some of the bytes.
struct IoResult {
    int error = 0;   // 0, a kIo... value, or an errno value
    u64 offset = 0;  // first byte that could not be transferred; kIoPastEnd: of the range

    bool Ok() const { return error == 0; }  // every byte was transferred
};

// The text for IoResult::error: "Input/output error" and the like.
std::string IoErrorText(int error);

// A run of bytes that can be read, and perhaps written. Not copied; used by one thread at a time.
class BlockDevice {
public:
    BlockDevice() = default;
    BlockDevice(const BlockDevice&) = delete;
    BlockDevice& operator=(const BlockDevice&) = delete;
    virtual ~BlockDevice() = default;

    virtual u64 Size() const = 0;         // bytes
    virtual bool IsWritable() const = 0;  // else Write and Zero give kIoReadOnly
    // All of [offset, offset + bytes) or an error. Zero writes zeros.
    virtual IoResult Read(u64 offset, void* target, std::size_t bytes) = 0;
    virtual IoResult Write(u64 offset, const void* source, std::size_t bytes) = 0;
    virtual IoResult Zero(u64 offset, u64 bytes);
    // Returns when everything written before has reached the medium.
    virtual IoResult Sync() = 0;
};

// The calls a FileDevice makes of the host for every transfer: pread, pwrite and fsync, or others
// that take, return and set errno like these.
struct HostCalls {
    // Positioned; they may transfer less than was asked for, and are then called again.
    ssize_t (*read)(int handle, void* target, std::size_t bytes, off_t offset);
    ssize_t (*write)(int handle, const void* source, std::size_t bytes, off_t offset);
    int (*sync)(int handle);  // 0: all that was written is on the medium
};

// A regular file or a block device of the host. The first sync that fails is final: the host may
// have dropped what it could not write, and a later sync would say nothing of it. From then on the
// device takes no writes. Neither does a file that has become shorter than it was.
class FileDevice : public BlockDevice {
public:
    // What the file is opened for. To be written, it must not be mounted, nor locked by another.
    enum class Mode { kRead, kReadWrite, kCreate };

    // Opens `path`; null with `*problem` set when that fails, when it is a folder, or when it is
    // neither file nor block device. kCreate makes the file, or empties it, and gives it `size`
    // bytes.
    static std::unique_ptr<FileDevice> Open(const std::string& path, Mode mode, u64 size,
                                            Problem* problem);
    ~FileDevice() override;  // closes the file; does not sync

    u64 Size() const override { return size_; }
    bool IsWritable() const override { return writable_; }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override;
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override;
    IoResult Sync() override;
    int Handle() const { return handle_; }  // the host's file descriptor; stays the device's
    // Puts other calls in the place of the host's, for tests of failures; null: the host's own.
    static void SetHostCalls(const HostCalls* calls);

private:
    FileDevice(int handle, u64 size, bool writable)
        : handle_(handle), size_(size), writable_(writable) {}
    bool HasShrunk();

    int handle_;
    u64 size_;
    bool writable_;
    bool isFile_ = false;
    bool hasShrunk_ = false;
    int syncError_ = 0;  // of the first sync that failed
};

// Bytes in memory; untouched stretches take none.
class MemoryDevice : public BlockDevice {
public:
    // `size` bytes of zeros. A write that finds no memory gives kIoNoMemory.
    explicit MemoryDevice(u64 size);

    u64 Size() const override { return size_; }
    bool IsWritable() const override { return true; }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override;
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override;
    IoResult Zero(u64 offset, u64 bytes) override;
    IoResult Sync() override { return {}; }

private:
    static constexpr u32 kChunkSize = 1u << 16;

    u64 size_;
    std::vector<std::unique_ptr<u8[]>> chunks_;  // null: zeros
};

// The bytes [offset, offset + size) of another device, which must outlive this one.
class SliceDevice : public BlockDevice {
public:
    // `base` stays the caller's. A slice that leaves it is refused by the base, transfer by
    // transfer.
    SliceDevice(BlockDevice* base, u64 offset, u64 size)
        : base_(base), offset_(offset), size_(size) {}

    u64 Size() const override { return size_; }
    bool IsWritable() const override { return base_->IsWritable(); }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override;
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override;
    IoResult Zero(u64 offset, u64 bytes) override;
    IoResult Sync() override { return base_->Sync(); }
    u64 Offset() const { return offset_; }  // byte of the base where the slice starts

private:
    BlockDevice* base_;
    u64 offset_;
    u64 size_;
};

// Another device with every change kept in memory; the other one is never written. Owns nothing
// of the base, which must outlive this one.
class OverlayDevice : public BlockDevice {
public:
    static constexpr u32 kPageSize = 4096;  // bytes; page n starts at byte n * kPageSize
    static constexpr u32 kSectorsPerPage = kPageSize / kSectorSize;  // sectors of a page

    // One page of changes: sectors of `changed` hold `bytes`, the others are the base's.
    struct Page {
        u8 bytes[kPageSize];         // those of unchanged sectors say nothing
        u8 changed = 0;              // bit i: sector i
        std::unique_ptr<Page> next;  // of the spare ones
    };

    // Without changes. `base` stays the caller's.
    explicit OverlayDevice(BlockDevice* base) : base_(base) {}
    ~OverlayDevice() override;

    u64 Size() const override { return base_->Size(); }
    bool IsWritable() const override { return true; }
    IoResult Read(u64 offset, void* target, std::size_t bytes) override {
        return Peek(offset, target, bytes);
    }
    IoResult Write(u64 offset, const void* source, std::size_t bytes) override;
    IoResult Sync() override { return {}; }

    BlockDevice* Base() const { return base_; }      // the device below
    bool IsEmpty() const { return pages_.empty(); }  // nothing was changed
    // Numbers of the changed pages, rising.
    std::vector<u64> ChangedPages() const;
    // The changes in page `number`, null when there are none. Stays the device's.
    const Page* PageAt(u64 number) const;
    // Reads as Read does; for those who hold the device constant.
    IoResult Peek(u64 offset, void* target, std::size_t bytes) const;
    // Forgets every change. Keeps the memory for the changes to come.
    void Drop();

private:
    std::unique_ptr<Page> NewPage();
    IoResult ReadPage(u64 offset, u8* target, u32 bytes) const;
    IoResult WritePage(u64 offset, const u8* source, u32 bytes);

    BlockDevice* base_;
    std::unordered_map<u64, std::unique_ptr<Page>> pages_;
    std::unique_ptr<Page> spare_;  // first of those whose changes were forgotten
};

}  // namespace VELK
