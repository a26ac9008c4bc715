// See keys.h.
#include "keys.h"

#include <cstring>

namespace VELK::test {

namespace {

template <typename T>
void PutHost(HostKey* key, u32 offset, T value) {
    std::memcpy(key->bytes + offset, &value, sizeof value);
}
template <typename T>
T GetHost(const void* bytes, u32 offset) {
    T value;
    std::memcpy(&value, static_cast<const u8*>(bytes) + offset, sizeof value);
    return value;
}

u32 Swap(u8* bytes, u32 offset, u32 width) {
    for (u32 low = 0; low < width / 2; ++low) {
        const u8 byte = bytes[offset + low];
        bytes[offset + low] = bytes[offset + width - 1 - low];
        bytes[offset + width - 1 - low] = byte;
    }
    return offset + width;
}

// Swaps `units` code units but none past `size` bytes.
void SwapUnits(u8* bytes, u32 offset, u32 units, u32 size) {
    for (u32 i = 0; i < units && offset + 2 <= size; ++i) {
        offset = Swap(bytes, offset, 2);
    }
}

u32 BeUnits(const u8* bytes) {
    return static_cast<u32>(bytes[0] << 8) | bytes[1];
}

void CopyKey(void* target, const void* source, u32 size) {
    std::memmove(target, source, size);
}

void SwapCatKey(u8* key, u32 units, u32 size) {
    Swap(key, 0, 2);
    Swap(key, kCatKeyParentId, 4);
    Swap(key, kCatKeyNameLength, 2);
    SwapUnits(key, kCatKeyName, units, size);
}

void SwapAttrKey(u8* key, u32 units, u32 size) {
    Swap(key, 0, 2);
    Swap(key, kAttrKeyFileId, 4);
    Swap(key, kAttrKeyStartBlock, 4);
    Swap(key, kAttrKeyNameLength, 2);
    SwapUnits(key, kAttrKeyName, units, size);
}

u32 HostKeySize(const void* key) {
    return GetHost<u16>(key, 0) + kKeyLengthSize;
}

void CatKeyToDisk(void* target, const void* source) {
    const u32 size = HostKeySize(source);
    const u32 units = GetHost<u16>(source, kCatKeyNameLength);
    CopyKey(target, source, size);
    SwapCatKey(static_cast<u8*>(target), units, size);
}
void CatKeyToMemory(void* target, const void* source, unsigned size) {
    CopyKey(target, source, size);
    if (size >= kKeyLengthSize + kCatKeyFixed) {
        SwapCatKey(static_cast<u8*>(target),
                   BeUnits(static_cast<const u8*>(target) + kCatKeyNameLength), size);
    }
}

void AttrKeyToDisk(void* target, const void* source) {
    const u32 size = HostKeySize(source);
    const u32 units = GetHost<u16>(source, kAttrKeyNameLength);
    CopyKey(target, source, size);
    SwapAttrKey(static_cast<u8*>(target), units, size);
}
void AttrKeyToMemory(void* target, const void* source, unsigned size) {
    CopyKey(target, source, size);
    if (size >= kKeyLengthSize + kAttrKeyFixed) {
        SwapAttrKey(static_cast<u8*>(target),
                    BeUnits(static_cast<const u8*>(target) + kAttrKeyNameLength), size);
    }
}

void ExtKeyToDisk(void* target, const void* source) {
    CopyKey(target, source, kExtKeySize);
    u8* key = static_cast<u8*>(target);
    Swap(key, 0, 2);
    Swap(key, kExtKeyFileId, 4);
    Swap(key, kExtKeyStartBlock, 4);
}

void CopyUnchanged(void* target, const void* source, unsigned size) {
    CopyKey(target, source, size);
}

Bytes AppendName(Bytes key, std::u16string_view name) {
    Append16(&key, static_cast<u32>(name.size()));
    for (const char16_t unit : name) {
        Append16(&key, unit);
    }
    return key;
}

u32 PutName(HostKey* key, u32 offset, std::u16string_view name) {
    PutHost(key, offset, static_cast<u16>(name.size()));
    std::memcpy(key->bytes + offset + 2, name.data(), name.size() * 2);
    return offset + 2 + static_cast<u32>(name.size()) * 2;
}

Bytes WithLength(Bytes key) {
    Put16(&key, 0, static_cast<u32>(key.size() - kKeyLengthSize));
    return key;
}

}  // namespace

HostKey HostCatKey(u32 parentId, std::u16string_view name) {
    HostKey key;
    key.id = parentId;
    PutHost(&key, kCatKeyParentId, parentId);
    const u32 size = PutName(&key, kCatKeyNameLength, name);
    PutHost(&key, 0, static_cast<u16>(size - kKeyLengthSize));
    return key;
}

HostKey HostExtKey(u8 forkType, u32 fileId, u32 startBlock) {
    HostKey key;
    key.id = fileId;
    PutHost(&key, 0, static_cast<u16>(kExtKeyFixed));
    PutHost(&key, kExtKeyForkType, forkType);
    PutHost(&key, kExtKeyFileId, fileId);
    PutHost(&key, kExtKeyStartBlock, startBlock);
    return key;
}

HostKey HostAttrKey(u32 fileId, u32 startBlock, std::u16string_view name) {
    HostKey key;
    key.id = fileId;
    PutHost(&key, kAttrKeyFileId, fileId);
    PutHost(&key, kAttrKeyStartBlock, startBlock);
    const u32 size = PutName(&key, kAttrKeyNameLength, name);
    PutHost(&key, 0, static_cast<u16>(size - kKeyLengthSize));
    return key;
}

Bytes DiskCatKey(u32 parentId, std::u16string_view name) {
    Bytes key(2);
    Append32(&key, parentId);
    return WithLength(AppendName(key, name));
}

Bytes DiskExtKey(u8 forkType, u32 fileId, u32 startBlock) {
    Bytes key = {0, 0, forkType, 0};
    Append32(&key, fileId);
    Append32(&key, startBlock);
    return WithLength(key);
}

Bytes DiskAttrKey(u32 fileId, u32 startBlock, std::u16string_view name) {
    Bytes key(4);
    Append32(&key, fileId);
    Append32(&key, startBlock);
    return WithLength(AppendName(key, name));
}

namespace {

// Names of one to six letters whose binary and folded order are the same.
std::u16string NthName(u32 n, bool between) {
    std::u16string name = u"k00000";
    for (std::size_t i = name.size(); i-- > 1 && n > 0; n /= 10) {
        name[i] = static_cast<char16_t>(u'0' + n % 10);
    }
    return between ? name + u"m" : name;
}

}  // namespace

HostKey NthHostKey(u32 fileId, u32 n, bool between) {
    switch (fileId) {
        case kExtentsFileId:
            return HostExtKey(kForkData, 16 + n / 4, (n % 4) * 8 + (between ? 1 : 0));
        case kAttributesFileId:
            return HostAttrKey(16 + n / 4, 0, NthName(n, between));
        default:
            return HostCatKey(16 + n / 4, NthName(n, between));
    }
}

Bytes NthDiskKey(u32 fileId, u32 n, bool between) {
    return DiskFormOf(fileId, NthHostKey(fileId, n, between));
}

Bytes DiskFormOf(u32 fileId, const BTreeKey* hostKey) {
    const u32 size = HostKeySize(hostKey);
    Bytes key(size);
    ConvertFor(fileId).KeyToDisk(key.data(), hostKey);
    return key;
}

void PrepareCreate(CBTreeHfs* tree) {
    if (tree->fileId != kAttributesFileId) {
        const bool isCatalog = tree->fileId == kCatalogFileId;
        tree->compareKeys = isCatalog ? CompareCatKeysCaseIns : CompareExtentKeysPlus;
        tree->header.maxKeyLength =
            static_cast<u16>(isCatalog ? kCatMaxKeyLength : kExtMaxKeyLength);
        tree->header.attributes = kBTBigKeysMask | (isCatalog ? kBTVariableIndexKeysMask : 0);
        tree->keyCompareType = isCatalog ? kKeyCompareFolding : 0;
    }
}

HfsConvert ConvertFor(u32 fileId) {
    switch (fileId) {
        case kExtentsFileId:
            return {0, 0, ExtKeyToDisk, CopyUnchanged, CopyUnchanged, CopyUnchanged};
        case kAttributesFileId:
            return {0, 0, AttrKeyToDisk, AttrKeyToMemory, CopyUnchanged, CopyUnchanged};
        default:
            return {0, 0, CatKeyToDisk, CatKeyToMemory, CopyUnchanged, CopyUnchanged};
    }
}

}  // namespace VELK::test
