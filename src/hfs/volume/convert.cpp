// The HfsConvert hooks of the three trees. A layout is a row of field runs; converting reverses the
// bytes of each whole field on a little-endian host and copies on a big-endian one.
#include "hfs/volume/convert.h"

#include <bit>
#include <cstring>

namespace VELK {
namespace {

struct FieldRun {
    u8 width;   // bytes of one field; 0 ends a layout
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

template <typename Field>
void CopySwapped(u8* target, const u8* source) {
    Field field;
    std::memcpy(&field, source, sizeof field);
    if constexpr (std::endian::native == std::endian::little) {
        Field swapped = 0;
        for (unsigned i = 0; i < sizeof field; ++i) {
            swapped = static_cast<Field>(swapped << 8) | static_cast<u8>(field >> (8 * i));
        }
        field = swapped;
    }
    std::memcpy(target, &field, sizeof field);
}

void CopyField(u8* target, const u8* source, unsigned width) {
    switch (width) {
        case 2:
            CopySwapped<u16>(target, source);
            break;
        case 4:
            CopySwapped<u32>(target, source);
            break;
        case 8:
            CopySwapped<u64>(target, source);
            break;
        default:
            *target = *source;
    }
}

// Both directions at once: reversing the bytes of every field is its own inverse.
void CopyFields(const FieldRun* layout, void* target, const void* source, unsigned size) {
    u8* to = static_cast<u8*>(target);
    const u8* from = static_cast<const u8*>(source);
    unsigned offset = 0;
    for (; layout->width != 0; ++layout) {
        for (unsigned left = layout->count; left != 0; --left) {
            if (size - offset < layout->width) {
                CopyBytes(to + offset, from + offset, size - offset);
                return;
            }
            CopyField(to + offset, from + offset, layout->width);
            offset += layout->width;
        }
    }
    CopyBytes(to + offset, from + offset, size - offset);
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
const FieldRun* CatalogLayout(u16 type) {
    switch (type) {
        case 1:
            return kFolderLayout;
        case 2:
            return kFileLayout;
        case 3:
        case 4:
            return kThreadLayout;
        default:
            return kTypeLayout;
    }
}

const FieldRun* AttributeLayout(u32 type) {
    switch (type) {
        case 0x10:
            return kInlineLayout;
        case 0x20:
            return kForkAttributeLayout;
        case 0x30:
            return kExtentsAttributeLayout;
        default:
            return kAttributeTypeLayout;
    }
}

void CatalogDataToDisk(void* target, const void* source, unsigned size) {
    CopyFields(CatalogLayout(size < sizeof(u16) ? u16{0} : HostU16(source)), target, source, size);
}
void CatalogDataToMemory(void* target, const void* source, unsigned size) {
    CopyFields(CatalogLayout(size < sizeof(u16) ? u16{0} : DiskU16(source)), target, source, size);
}
void AttributesDataToDisk(void* target, const void* source, unsigned size) {
    CopyFields(AttributeLayout(size < sizeof(u32) ? 0 : HostU32(source)), target, source, size);
}
void AttributesDataToMemory(void* target, const void* source, unsigned size) {
    CopyFields(AttributeLayout(size < sizeof(u32) ? 0 : DiskU32(source)), target, source, size);
}

// A host key says its own size in its length field.
unsigned HostKeySize(const void* key) {
    return kKeyLengthSize + HostU16(key);
}

void CatalogKeyToDisk(void* target, const void* source) {
    CopyFields(kCatalogKeyLayout, target, source, HostKeySize(source));
}
void CatalogKeyToMemory(void* target, const void* source, unsigned size) {
    CopyFields(kCatalogKeyLayout, target, source, size);
}
void ExtentsKeyToDisk(void* target, const void* source) {
    CopyFields(kExtentsKeyLayout, target, source, HostKeySize(source));
}
void AttributesKeyToDisk(void* target, const void* source) {
    CopyFields(kAttributesKeyLayout, target, source, HostKeySize(source));
}
void AttributesKeyToMemory(void* target, const void* source, unsigned size) {
    CopyFields(kAttributesKeyLayout, target, source, size);
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
