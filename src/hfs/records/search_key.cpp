// Keys in host order and as stored.
#include "hfs/records/search_key.h"

#include <algorithm>
#include <cstring>

#include "hfs/records/key_layout.h"
#include "hfs/volume/convert.h"
#include "hfs/volume/problem.h"

namespace VELK {
namespace {

template <typename Field>
void PutHost(SearchKey* key, u32 offset, Field value) {
    std::memcpy(key->bytes + offset, &value, sizeof value);
}

// Fields that the tree's keys do not have are left out.
SearchKey KeyOfFields(u32 fileId, u32 id, u32 startBlock, NameView name) {
    const KeyLayout& layout = KeyLayoutOf(fileId);
    const u32 units = static_cast<u32>(std::min<std::size_t>(name.size(), layout.longestName));
    SearchKey key;
    key.id = id;
    key.size = kKeyLengthSize + layout.fixed + 2 * units;
    PutHost(&key, 0, static_cast<u16>(key.size - kKeyLengthSize));
    PutHost(&key, layout.id, id);
    if (layout.startBlock != 0) {
        PutHost(&key, layout.startBlock, startBlock);
    }
    if (layout.nameLength != 0) {
        PutHost(&key, layout.nameLength, static_cast<u16>(units));
        std::memcpy(key.bytes + key.size - 2 * units, name.data(), 2 * units);
    }
    return key;
}

}  // namespace

SearchKey LowestKey(u32 fileId, u32 id) {
    return KeyOfFields(fileId, id, 0, u"");
}

SearchKey CatalogSearchKey(u32 parent, NameView name) {
    return KeyOfFields(kCatalogFileId, parent, 0, name);
}

SearchKey ExtentsSearchKey(u32 file, u8 forkType, u32 startBlock) {
    SearchKey key = KeyOfFields(kExtentsFileId, file, startBlock, u"");
    key.bytes[kExtKeyForkType] = forkType;
    return key;
}

SearchKey AttributesSearchKey(u32 file, NameView name, u32 startBlock) {
    return KeyOfFields(kAttributesFileId, file, startBlock, name);
}

std::string KeyKindText(u32 fileId) {
    return std::string(fileId == kCatalogFileId ? "a " : "an ") + ForkName(fileId) + " key";
}

std::string FaultOfStored(u32 fileId, const u8* stored, u32 size) {
    if (size < kKeyLengthSize) {
        return "no length field";
    }
    const u32 length = GetBe16(stored);
    if (length != size - kKeyLengthSize) {
        return "length field says " + std::to_string(length) + " bytes, " +
               std::to_string(size - kKeyLengthSize) + " follow";
    }
    if (length > kMaxKeyLength) {
        return std::to_string(length) + " bytes are more than any key has (" +
               std::to_string(kMaxKeyLength) + ")";
    }
    const u32 fixed = KeyLayoutOf(fileId).fixed;
    if (length < fixed) {
        return std::to_string(length) + " bytes are too few for " + KeyKindText(fileId) + " (" +
               std::to_string(fixed) + ")";
    }
    const KeyView key(fileId, stored);
    if (key.Size() > size) {
        return "name of " + std::to_string(key.NameLength()) + " units does not fit into " +
               std::to_string(length) + " bytes";
    }
    return {};
}

bool SearchKeyFromStored(u32 fileId, const u8* stored, u32 size, SearchKey* key) {
    *key = SearchKey{};
    if (!FaultOfStored(fileId, stored, size).empty()) {
        return false;
    }
    const KeyView view(fileId, stored);
    key->size = size;
    key->id = view.Id();
    if (fileId != kExtentsFileId) {
        ConvertFor(fileId).KeyToMemory(key->bytes, stored, size);
        return true;
    }
    // The tree's own hook leaves these keys as they are.
    std::memcpy(key->bytes, stored, size);
    PutHost(key, 0, GetBe16(stored));
    PutHost(key, kExtKeyFileId, view.Id());
    PutHost(key, kExtKeyStartBlock, view.StartBlock());
    return true;
}

std::vector<u8> StoredKey(u32 fileId, const SearchKey& key) {
    std::vector<u8> stored(key.size);
    ConvertFor(fileId).KeyToDisk(stored.data(), key.bytes);
    return stored;
}

std::vector<u8> StoredFromDelivered(u32 fileId, const u8* delivered, u32 size) {
    std::vector<u8> stored(delivered, delivered + size);
    if (fileId != kExtentsFileId && size >= kKeyLengthSize) {
        // Reversing the fields is its own inverse, and this hook obeys a size.
        ConvertFor(fileId).KeyToMemory(stored.data(), delivered, size);
    }
    return stored;
}

}  // namespace VELK
