// The HfsConvert hooks of the three trees. A layout is a row of field runs; converting reverses the
// bytes of each whole field on a little-endian host and copies on a big-endian one.
#include "hfs/volume/convert.h"

#include <bit>
#include <cstring>
#include <type_traits>

namespace VELK {
namespace {

struct FieldRun {
    u8 width;   // bytes of one field, a power of two; 0 ends a layout
    u16 count;  // fields; kRest: as many as the size holds
};
constexpr u16 kRest = 0xFFFF;

// Type, flags; valence, ID, five dates, owner and group; their flag bytes; mode; special; window,
// Finder flags, location; scroll position, date added; extended flags; folder, encoding, count.
constexpr FieldRun kFolderLayout[] = {{2, 2}, {4, 9}, {1, 2}, {2, 1}, {4, 1},
                                      {2, 8}, {4, 2}, {2, 2}, {4, 3}, {0, 0}};
// The same up to the Finder information, which starts with type and creator; then both forks:
// size, clump and blocks, eight extents.
constexpr FieldRun kFileLayout[] = {{2, 2}, {4, 9}, {1, 2}, {2, 1},  {4, 3}, {2, 4},  {4, 2},
                                    {2, 2}, {4, 3}, {8, 1}, {4, 18}, {8, 1}, {4, 18}, {0, 0}};
constexpr FieldRun kThreadLayout[] = {{2, 2}, {4, 1}, {2, kRest}, {0, 0}};
constexpr FieldRun kTypeLayout[] = {{2, 1}, {0, 0}};

constexpr FieldRun kInlineLayout[] = {{4, 4}, {0, 0}};
constexpr FieldRun kForkAttributeLayout[] = {{4, 2}, {8, 1}, {4, 18}, {0, 0}};
constexpr FieldRun kExtentsAttributeLayout[] = {{4, 18}, {0, 0}};
constexpr FieldRun kAttributeTypeLayout[] = {{4, 1}, {0, 0}};

constexpr FieldRun kCatalogKeyLayout[] = {{2, 1}, {4, 1}, {2, kRest}, {0, 0}};
constexpr FieldRun kExtentsKeyLayout[] = {{2, 1}, {1, 2}, {4, 2}, {0, 0}};
constexpr FieldRun kAttributesKeyLayout[] = {{2, 2}, {4, 2}, {2, kRest}, {0, 0}};

constexpr u32 kMaxThreadRecord = 10 + 2 * 255;
constexpr u32 kForkAttributeSize = 88;

void CopyBytes(void* target, const void* source, unsigned size) {
    if (size != 0) {
        std::memmove(target, source, size);
    }
}

// Reverses the bytes of each field in a word of eight bytes.
template <typename Field>
constexpr u64 Swapped(u64 fields) {
    if constexpr (sizeof(Field) == sizeof(u8)) {
        return fields;
    } else if constexpr (sizeof(Field) == sizeof(u16)) {
        constexpr u64 kLowBytes = 0x00FF00FF00FF00FF;
        return (fields & kLowBytes) << 8 | (fields >> 8 & kLowBytes);
    } else if constexpr (sizeof(Field) == sizeof(u32)) {
        return std::rotl(__builtin_bswap64(fields), 32);
    } else {
        return __builtin_bswap64(fields);
    }
}

// Converts up to eight bytes of whole fields.
template <typename Field>
void CopySwapped(u8* target, const u8* source, unsigned size = sizeof(Field)) {
    u64 fields = 0;
    std::memcpy(&fields, source, size);
    if constexpr (std::endian::native == std::endian::little) {
        fields = Swapped<Field>(fields);
    }
    std::memcpy(target, &fields, size);
}

// In words, the last one over the end of the word before it: names have any length, and a loop over
// their last units ends where no processor expects it to. That word is read before a conversion in
// place could change it.
template <typename Field>
void CopyRun(u8* target, const u8* source, unsigned size) {
    constexpr unsigned kStep = sizeof(u64);
    if (size < kStep) {
        for (unsigned at = 0; at < size; at += sizeof(Field)) {
            CopySwapped<Field>(target + at, source + at);
        }
        return;
    }
    u8 last[kStep];
    CopySwapped<Field>(last, source + size - kStep, kStep);
    for (unsigned at = 0; at + kStep < size; at += kStep) {
        CopySwapped<Field>(target + at, source + at, kStep);
    }
    std::memcpy(target + size - kStep, last, kStep);
}

template <unsigned kWidth>
using FieldOf =
    std::conditional_t<kWidth == sizeof(u64), u64,
                       std::conditional_t<kWidth == sizeof(u32), u32,
                                          std::conditional_t<kWidth == sizeof(u16), u16, u8>>>;

// Both directions at once: reversing the bytes of every field is its own inverse. A field that the
// size cuts, and what follows the layout, is copied as it is. `kAt` is the first run to take.
template <const auto& kLayout, std::size_t kAt = 0>
void CopyFields(u8* target, const u8* source, unsigned size) {
    constexpr FieldRun kRun = kLayout[kAt];
    if constexpr (kRun.width == 0) {
        CopyBytes(target, source, size);
    } else {
        using Field = FieldOf<kRun.width>;
        constexpr unsigned kSize = unsigned{kRun.count} * kRun.width;
        if (size < kSize) {
            const unsigned whole = size & ~(kRun.width - 1u);
            CopyRun<Field>(target, source, whole);
            CopyBytes(target + whole, source + whole, size - whole);
            return;
        }
        CopyRun<Field>(target, source, kSize);
        CopyFields<kLayout, kAt + 1>(target + kSize, source + kSize, size - kSize);
    }
}

using CopyFn = void (*)(u8* target, const u8* source, unsigned size);

void Copy(CopyFn copy, void* target, const void* source, unsigned size) {
    copy(static_cast<u8*>(target), static_cast<const u8*>(source), size);
}

u16 HostU16(const void* bytes) {
    u16 value;
    std::memcpy(&value, bytes, sizeof value);
    return value;
}

u32 HostU32(const void* bytes) {
    u32 value;
    std::memcpy(&value, bytes, sizeof value);
    return value;
}

u16 DiskU16(const void* bytes) {
    u16 value;
    CopySwapped<u16>(reinterpret_cast<u8*>(&value), static_cast<const u8*>(bytes));
    return value;
}

u32 DiskU32(const void* bytes) {
    u32 value;
    CopySwapped<u32>(reinterpret_cast<u8*>(&value), static_cast<const u8*>(bytes));
    return value;
}

// The type of an unknown record is converted all the same: left as it is, it could read as a
// known type on the way back.
CopyFn CatalogCopy(u16 type) {
    switch (type) {
        case 1:
            return CopyFields<kFolderLayout>;
        case 2:
            return CopyFields<kFileLayout>;
        case 3:
        case 4:
            return CopyFields<kThreadLayout>;
        default:
            return CopyFields<kTypeLayout>;
    }
}

CopyFn AttributeCopy(u32 type) {
    switch (type) {
        case 0x10:
            return CopyFields<kInlineLayout>;
        case 0x20:
            return CopyFields<kForkAttributeLayout>;
        case 0x30:
            return CopyFields<kExtentsAttributeLayout>;
        default:
            return CopyFields<kAttributeTypeLayout>;
    }
}

void CatalogDataToDisk(void* target, const void* source, unsigned size) {
    Copy(CatalogCopy(size < sizeof(u16) ? u16{0} : HostU16(source)), target, source, size);
}
void CatalogDataToMemory(void* target, const void* source, unsigned size) {
    Copy(CatalogCopy(size < sizeof(u16) ? u16{0} : DiskU16(source)), target, source, size);
}
void AttributesDataToDisk(void* target, const void* source, unsigned size) {
    Copy(AttributeCopy(size < sizeof(u32) ? 0 : HostU32(source)), target, source, size);
}
void AttributesDataToMemory(void* target, const void* source, unsigned size) {
    Copy(AttributeCopy(size < sizeof(u32) ? 0 : DiskU32(source)), target, source, size);
}

// A host key says its own size in its length field.
unsigned HostKeySize(const void* key) {
    return kKeyLengthSize + HostU16(key);
}

void CatalogKeyToDisk(void* target, const void* source) {
    Copy(CopyFields<kCatalogKeyLayout>, target, source, HostKeySize(source));
}
void CatalogKeyToMemory(void* target, const void* source, unsigned size) {
    Copy(CopyFields<kCatalogKeyLayout>, target, source, size);
}
void ExtentsKeyToDisk(void* target, const void* source) {
    Copy(CopyFields<kExtentsKeyLayout>, target, source, HostKeySize(source));
}
void AttributesKeyToDisk(void* target, const void* source) {
    Copy(CopyFields<kAttributesKeyLayout>, target, source, HostKeySize(source));
}
void AttributesKeyToMemory(void* target, const void* source, unsigned size) {
    Copy(CopyFields<kAttributesKeyLayout>, target, source, size);
}

void CopyKey(void* target, const void* source) {
    std::memmove(target, source, HostKeySize(source));
}

constexpr HfsConvert kCatalogConvert = {kKeyLengthSize + kCatMaxKeyLength,
                                        kMaxThreadRecord,
                                        CatalogKeyToDisk,
                                        CatalogKeyToMemory,
                                        CatalogDataToDisk,
                                        CatalogDataToMemory};
constexpr HfsConvert kExtentsConvert = {kExtKeySize, kExtentRecordSize, ExtentsKeyToDisk,
                                        CopyBytes,   CopyBytes,         CopyBytes};
constexpr HfsConvert kAttributesConvert = {kKeyLengthSize + kAttrMaxKeyLength,
                                           kForkAttributeSize,
                                           AttributesKeyToDisk,
                                           AttributesKeyToMemory,
                                           AttributesDataToDisk,
                                           AttributesDataToMemory};
constexpr HfsConvert kCopyingConvert = {0, 0, CopyKey, CopyBytes, CopyBytes, CopyBytes};

}  // namespace

const HfsConvert& ConvertFor(u32 fileId) {
    switch (fileId) {
        case kCatalogFileId:
            return kCatalogConvert;
        case kExtentsFileId:
            return kExtentsConvert;
        case kAttributesFileId:
            return kAttributesConvert;
        default:
            return kCopyingConvert;
    }
}

}  // namespace VELK
