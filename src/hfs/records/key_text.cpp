// Reading and printing keys. Readable text becomes the stored form first and the host form from
// there, so both notations meet the same checks.
#include "hfs/records/key_text.h"

#include <cstring>

#include "hfs/treehfs/bytes.h"
#include "hfs/volume/convert.h"

namespace VELK {
namespace {

constexpr u32 kMostCatalogUnits = 255;
constexpr u32 kMostAttributeUnits = 127;
constexpr u64 kMost32 = 0xFFFFFFFF;

struct KindText {
    u32 fileId;
    const char* name;
    const char* article;
    const char* expected;
};
constexpr KindText kKinds[] = {
    {kExtentsFileId, "extents", "an", "FILE:data|rsrc:BLOCK, for example 5:data:0"},
    {kCatalogFileId, "catalog", "a", "PARENT:NAME, for example 2:alpha"},
    {kAttributesFileId, "attributes", "an", "FILE:NAME[:BLOCK], for example 37:com.example.tag"},
};

const KindText& KindOf(u32 fileId) {
    for (const KindText& kind : kKinds) {
        if (kind.fileId == fileId) {
            return kind;
        }
    }
    return kKinds[1];
}

Problem KeyProblem(std::string_view text, const std::string& what) {
    return UsageProblem("key '" + std::string(text) + "': " + what, "");
}

u32 FixedLength(u32 fileId) {
    return fileId == kExtentsFileId      ? kExtKeyFixed
           : fileId == kAttributesFileId ? kAttrKeyFixed
                                         : kCatKeyFixed;
}

// What keeps stored bytes from being a key of this tree; empty: nothing.
std::string StoredFault(u32 fileId, const u8* stored, u32 size) {
    if (size < kKeyLengthSize) {
        return "no length field";
    }
    const u32 length = GetBe16(stored);
    if (length != size - kKeyLengthSize) {
        return "length field says " + std::to_string(length) + " bytes, " +
               std::to_string(size - kKeyLengthSize) + " follow";
    }
    const u32 fixed = FixedLength(fileId);
    if (length > kMaxKeyLength) {
        return std::to_string(length) + " bytes are more than any key has (" +
               std::to_string(kMaxKeyLength) + ")";
    }
    if (length < fixed) {
        return std::to_string(length) + " bytes are too few for " + KindOf(fileId).article + " " +
               ForkName(fileId) + " key (" + std::to_string(fixed) + ")";
    }
    if (fileId != kExtentsFileId) {
        const u32 units =
            GetBe16(stored + (fileId == kCatalogFileId ? kCatKeyNameLength : kAttrKeyNameLength));
        if (fixed + 2 * units > length) {
            return "name of " + std::to_string(units) + " units does not fit into " +
                   std::to_string(length) + " bytes";
        }
    }
    return {};
}

std::vector<u8> NamedKey(u32 fileId, u32 id, u32 startBlock, NameView name) {
    const bool isCatalog = fileId == kCatalogFileId;
    const u32 nameOffset = isCatalog ? kCatKeyName : kAttrKeyName;
    std::vector<u8> stored(nameOffset + 2 * name.size());
    PutBe16(stored.data(), static_cast<u32>(stored.size()) - kKeyLengthSize);
    PutBe32(stored.data() + (isCatalog ? kCatKeyParentId : kAttrKeyFileId), id);
    if (!isCatalog) {
        PutBe32(stored.data() + kAttrKeyStartBlock, startBlock);
    }
    PutBe16(stored.data() + (isCatalog ? kCatKeyNameLength : kAttrKeyNameLength),
            static_cast<u32>(name.size()));
    for (std::size_t i = 0; i < name.size(); ++i) {
        PutBe16(stored.data() + nameOffset + 2 * i, name[i]);
    }
    return stored;
}

// Takes the decimal or 0x number up to the next ':' and moves past it.
bool TakeId(std::string_view text, std::size_t* at, u32* id) {
    const std::size_t colon = text.find(':', *at);
    u64 number = 0;
    if (colon == std::string_view::npos ||
        !ParseNumber(text.substr(*at, colon - *at), kMost32, &number)) {
        return false;
    }
    *at = colon + 1;
    *id = static_cast<u32>(number);
    return true;
}

// A name: a string in quotes, or a word without quote, colon or blank.
bool TakeName(std::string_view text, std::size_t* at, Typed typed, NameUnits* name) {
    if (*at < text.size() && text[*at] == '"') {
        return TakeQuoted(text, at, typed, name);
    }
    const std::size_t end = std::min(text.find(':', *at), text.size());
    const std::string_view word = text.substr(*at, end - *at);
    if (word.empty() || word.find_first_of("\" \t") != std::string_view::npos) {
        return false;
    }
    NameUnits units;
    if (!VELK::UnitsFromUtf8(word, &units)) {
        return false;
    }
    *at = end;
    *name = typed == Typed::kDecomposed ? DecomposedUnits(units) : units;
    return true;
}

bool ReadExtentsKey(std::string_view text, std::vector<u8>* stored) {
    std::size_t at = 0;
    u32 id = 0;
    if (!TakeId(text, &at, &id)) {
        return false;
    }
    const bool isData = text.substr(at).starts_with("data:");
    u64 block = 0;
    if ((!isData && !text.substr(at).starts_with("rsrc:")) ||
        !ParseNumber(text.substr(at + 5), kMost32, &block)) {
        return false;
    }
    stored->assign(kExtKeySize, 0);
    PutBe16(stored->data(), kExtMaxKeyLength);
    (*stored)[kExtKeyForkType] = isData ? kForkData : kForkResource;
    PutBe32(stored->data() + kExtKeyFileId, id);
    PutBe32(stored->data() + kExtKeyStartBlock, static_cast<u32>(block));
    return true;
}

// Catalog and attributes keys; `*unitCount` tells a name that is too long from a wrong shape.
bool ReadNamedKey(std::string_view text, u32 fileId, std::vector<u8>* stored,
                  std::size_t* unitCount) {
    const bool isCatalog = fileId == kCatalogFileId;
    std::size_t at = 0;
    u32 id = 0;
    NameUnits name;
    if (!TakeId(text, &at, &id) ||
        !TakeName(text, &at, isCatalog ? Typed::kDecomposed : Typed::kAsIs, &name)) {
        return false;
    }
    u64 block = 0;
    if (at != text.size() &&
        (isCatalog || text[at] != ':' || !ParseNumber(text.substr(at + 1), kMost32, &block))) {
        return false;
    }
    *unitCount = name.size();
    if (name.size() <= kMostCatalogUnits) {
        *stored = NamedKey(fileId, id, static_cast<u32>(block), name);
    }
    return true;
}

bool ReadReadable(std::string_view text, u32 fileId, std::vector<u8>* stored,
                  std::size_t* unitCount) {
    *unitCount = 0;
    return fileId == kExtentsFileId ? ReadExtentsKey(text, stored)
                                    : ReadNamedKey(text, fileId, stored, unitCount);
}

// Text that is no key of this tree: one of another tree, or none at all.
Problem WrongShape(std::string_view text, u32 fileId) {
    for (const KindText& kind : kKinds) {
        std::vector<u8> stored;
        std::size_t unitCount = 0;
        if (kind.fileId != fileId && ReadReadable(text, kind.fileId, &stored, &unitCount)) {
            return UsageProblem("key '" + std::string(text) + "' is " + kind.article + " " +
                                    kind.name + " key, the tree is " + ForkName(fileId),
                                std::string("add -t ") + kind.name);
        }
    }
    return KeyProblem(text, std::string("expected ") + KindOf(fileId).expected);
}

Problem ReadHexKey(std::string_view text, u32 fileId, std::vector<u8>* stored) {
    const Problem problem = ParseHexBytes(text.substr(4), text, stored);
    if (problem) {
        return problem;
    }
    const std::string fault = StoredFault(fileId, stored->data(), static_cast<u32>(stored->size()));
    if (fault.empty()) {
        return {};
    }
    // The length field stands for the key: the rest may be long.
    const std::string shown = stored->size() <= kKeyLengthSize
                                  ? std::string(text)
                                  : "hex:" + HexText(stored->data(), 2) + " ... ";
    return UsageProblem(shown + ": " + fault, "");
}

}  // namespace

Problem ParseKey(std::string_view text, u32 fileId, SearchKey* key) {
    std::vector<u8> stored;
    if (text.starts_with("hex:")) {
        const Problem problem = ReadHexKey(text, fileId, &stored);
        if (problem) {
            return problem;
        }
    } else {
        std::size_t unitCount = 0;
        // FILE:data:BLOCK also has the shape of an attributes key; only there it is one.
        std::vector<u8> other;
        const bool isExtents = fileId == kCatalogFileId && ReadExtentsKey(text, &other);
        if (isExtents || !ReadReadable(text, fileId, &stored, &unitCount)) {
            return WrongShape(text, fileId);
        }
        const u32 most = fileId == kCatalogFileId ? kMostCatalogUnits : kMostAttributeUnits;
        if (unitCount > most) {
            return KeyProblem(text, "the name has " + std::to_string(unitCount) +
                                        " units, the longest has " + std::to_string(most));
        }
    }
    if (!SearchKeyFromStored(fileId, stored.data(), static_cast<u32>(stored.size()), key)) {
        return KeyProblem(text, "not a key of this tree");
    }
    return {};
}

bool ParseIdKey(std::string_view text, u32* id) {
    u64 number = 0;
    if (!text.starts_with("id:") || !ParseNumber(text.substr(3), kMost32, &number)) {
        return false;
    }
    *id = static_cast<u32>(number);
    return true;
}

std::string KeyText(u32 fileId, const u8* stored, u32 size, Blanks blanks) {
    if (StoredFault(fileId, stored, size).empty()) {
        if (fileId == kExtentsFileId) {
            const u8 fork = stored[kExtKeyForkType];
            if (size == kExtKeySize && stored[kExtKeyPad] == 0 &&
                (fork == kForkData || fork == kForkResource)) {
                return std::to_string(GetBe32(stored + kExtKeyFileId)) +
                       (fork == kForkData ? ":data:" : ":rsrc:") +
                       std::to_string(GetBe32(stored + kExtKeyStartBlock));
            }
        } else {
            const bool isCatalog = fileId == kCatalogFileId;
            const u32 units =
                GetBe16(stored + (isCatalog ? kCatKeyNameLength : kAttrKeyNameLength));
            const u32 nameOffset = isCatalog ? kCatKeyName : kAttrKeyName;
            const u32 most = isCatalog ? kMostCatalogUnits : kMostAttributeUnits;
            if (size == nameOffset + 2 * units && units <= most &&
                (isCatalog || GetBe16(stored + kAttrKeyPad) == 0)) {
                const u32 block = isCatalog ? 0 : GetBe32(stored + kAttrKeyStartBlock);
                const u32 id = GetBe32(stored + (isCatalog ? kCatKeyParentId : kAttrKeyFileId));
                return std::to_string(id) + ":" +
                       QuotedUnits(UnitsFromStored(stored + nameOffset, units),
                                   isCatalog ? Typed::kDecomposed : Typed::kAsIs, blanks) +
                       (block == 0 ? "" : ":" + std::to_string(block));
            }
        }
    }
    return "hex:" + HexText(stored, size);
}

bool SearchKeyFromStored(u32 fileId, const u8* stored, u32 size, SearchKey* key) {
    *key = SearchKey{};
    if (!StoredFault(fileId, stored, size).empty()) {
        return false;
    }
    key->size = size;
    const u32 idOffset = fileId == kCatalogFileId   ? kCatKeyParentId
                         : fileId == kExtentsFileId ? kExtKeyFileId
                                                    : kAttrKeyFileId;
    key->id = GetBe32(stored + idOffset);
    if (fileId != kExtentsFileId) {
        ConvertFor(fileId).KeyToMemory(key->bytes, stored, size);
        return true;
    }
    std::memcpy(key->bytes, stored, size);
    const u16 length = GetBe16(stored);
    const u32 block = GetBe32(stored + kExtKeyStartBlock);
    std::memcpy(key->bytes, &length, sizeof length);
    std::memcpy(key->bytes + kExtKeyFileId, &key->id, sizeof key->id);
    std::memcpy(key->bytes + kExtKeyStartBlock, &block, sizeof block);
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
