// Names what lies at a place of an image by the signatures file systems and containers carry.
#include <cstring>

#include "hfs/volume/partition.h"
#include "hfs/volume/volume_header.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

struct Signature {
    u64 offset;
    const char* bytes;
    u32 size;
    const char* label;  // how the signature is written in a text
    const char* name;
};

// Other file systems, by bytes at a fixed place of the volume.
constexpr Signature kFileSystems[] = {
    {32, "NXSB", 4, "NXSB", "APFS"},
    {3, "NTFS    ", 8, "NTFS", "NTFS"},
    {3, "EXFAT   ", 8, "EXFAT", "exFAT"},
    {82, "FAT32   ", 8, "FAT32", "FAT32"},
    {54, "FAT16   ", 8, "FAT16", "FAT16"},
    {54, "FAT12   ", 8, "FAT12", "FAT12"},
    {1080, "\x53\xEF", 2, "EF53", "ext2/3/4"},
    {0, "XFSB", 4, "XFSB", "XFS"},
    {65600, "_BHRfS_M", 8, "_BHRfS_M", "Btrfs"},
    {0, "hsqs", 4, "hsqs", "SquashFS"},
    {4086, "SWAPSPACE2", 10, "SWAPSPACE2", "Linux swap"},
    {0, "LUKS\xBA\xBE", 6, "LUKS", "LUKS"},
    {32769, "CD001", 5, "CD001", "ISO 9660"},
};

// Files that hold an image in another form, by their first bytes.
constexpr Signature kContainers[] = {
    {0,
     "\xFD"
     "7zXZ",
     5, "", "xz"},
    {0, "\x1F\x8B", 2, "", "gzip"},
    {0, "BZh", 3, "", "bzip2"},
    {0, "\x28\xB5\x2F\xFD", 4, "", "zstd"},
    {0, "PK\x03\x04", 4, "", "zip"},
    {0, "7z\xBC\xAF\x27\x1C", 6, "", "7z"},
};

constexpr Signature kDiskImages[] = {
    {0, "QFI\xFB", 4, "", "qcow2"}, {0, "KDMV", 4, "", "VMDK"},
    {0, "vhdxfile", 8, "", "VHDX"}, {0, "conectix", 8, "", "VHD"},
    {0, "sprs", 4, "", "sparse"},   {0, "encrcdsa", 8, "", "encrypted"},
};

bool Matches(BlockDevice* image, u64 offset, const Signature& signature) {
    u8 bytes[16];
    return image->Read(offset + signature.offset, bytes, signature.size).Ok() &&
           std::memcmp(bytes, signature.bytes, signature.size) == 0;
}

}  // namespace

Content Identify(BlockDevice* image, u64 offset, std::string* name) {
    u8 head[kHeaderSize];
    // A map may place a partition anywhere in 64 bits, where sums begin at 0 again.
    if (offset >= image->Size()) {
        *name = "nothing known";
        return Content::kUnknown;
    }
    name->clear();
    if (image->Read(offset + kHeaderOffset, head, sizeof head).Ok()) {
        switch (Be16(head)) {
            case kSignatureHfsPlus:
                *name = "HFS+";
                return Content::kHfsPlus;
            case kSignatureHfsx:
                *name = "HFSX";
                return Content::kHfsx;
            case kSignatureHfs:
                if (Be16(head + 0x7C) == kSignatureHfsPlus) {
                    *name = "HFS wrapper around HFS+";
                    return Content::kWrapper;
                }
                *name = "HFS";
                return Content::kPlainHfs;
            default:
                break;
        }
    }
    for (const Signature& signature : kFileSystems) {
        if (Matches(image, offset, signature)) {
            *name = std::string(signature.name) + " (" + signature.label + " at " +
                    Position(offset + signature.offset) + ")";
            return Content::kOther;
        }
    }
    *name = "nothing known";
    return Content::kUnknown;
}

Problem IdentifyContainer(BlockDevice* image) {
    u8 trailer[4];
    if (image->Size() >= 512 && image->Read(image->Size() - 512, trailer, 4).Ok() &&
        std::memcmp(trailer, "koly", 4) == 0) {
        return Failure("compressed disk image (koly trailer)", "convert it to a raw image first");
    }
    for (const Signature& signature : kContainers) {
        if (Matches(image, 0, signature)) {
            return Failure(std::string("compressed file (") + signature.name + ")",
                           "unpack it first");
        }
    }
    for (const Signature& signature : kDiskImages) {
        if (Matches(image, 0, signature)) {
            return Failure(std::string(signature.name) + " disk image",
                           "convert it to a raw image first");
        }
    }
    return {};
}

}  // namespace VELK
