// Reading and printing keys.
#include "hfs/records/key_text.h"

#include "hfs/records/key_layout.h"

namespace VELK {
namespace {

constexpr u64 kMost32 = 0xFFFFFFFF;

constexpr u32 kKinds[] = {kExtentsFileId, kCatalogFileId, kAttributesFileId};

const char* FormText(u32 fileId) {
    return fileId == kExtentsFileId      ? "FILE:data|rsrc:BLOCK, for example 5:data:0"
           : fileId == kAttributesFileId ? "FILE:NAME[:BLOCK], for example 37:com.example.tag"
                                         : "PARENT:NAME, for example 2:alpha";
}

Problem KeyProblem(std::string_view text, const std::string& what) {
    return UsageProblem("key '" + std::string(text) + "': " + what, "");
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

bool ReadExtentsKey(std::string_view text, SearchKey* key) {
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
    *key = ExtentsSearchKey(id, isData ? kForkData : kForkResource, static_cast<u32>(block));
    return true;
}

// Catalog and attributes keys; `*unitCount` tells a name that is too long from a wrong shape.
bool ReadNamedKey(std::string_view text, u32 fileId, SearchKey* key, std::size_t* unitCount) {
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
    *key = isCatalog ? CatalogSearchKey(id, name)
                     : AttributesSearchKey(id, name, static_cast<u32>(block));
    return true;
}

bool ReadReadable(std::string_view text, u32 fileId, SearchKey* key, std::size_t* unitCount) {
    *unitCount = 0;
    return fileId == kExtentsFileId ? ReadExtentsKey(text, key)
                                    : ReadNamedKey(text, fileId, key, unitCount);
}

// Text that is no key of this tree: one of another tree, or none at all.
Problem WrongShape(std::string_view text, u32 fileId) {
    for (const u32 other : kKinds) {
        SearchKey key;
        std::size_t unitCount = 0;
        if (other != fileId && ReadReadable(text, other, &key, &unitCount)) {
            return UsageProblem("key '" + std::string(text) + "' is " + KeyKindText(other) +
                                    ", the tree is " + ForkName(fileId),
                                std::string("add -t ") + ForkName(other));
        }
    }
    return KeyProblem(text, std::string("expected ") + FormText(fileId));
}

Problem ReadHexKey(std::string_view text, u32 fileId, SearchKey* key) {
    std::vector<u8> stored;
    const Problem problem = ParseHexBytes(text.substr(4), text, &stored);
    const u32 size = static_cast<u32>(stored.size());
    if (problem || SearchKeyFromStored(fileId, stored.data(), size, key)) {
        return problem;
    }
    // The length field stands for the key: the rest may be long.
    const std::string shown = size <= kKeyLengthSize
                                  ? std::string(text)
                                  : "hex:" + HexText(stored.data(), kKeyLengthSize) + " ... ";
    return UsageProblem(shown + ": " + FaultOfStored(fileId, stored.data(), size), "");
}

// "5:data:0" as stored in the extents tree; empty when text would not say all that the key holds.
std::string ExtentsKeyText(const u8* stored, u32 size) {
    const u8 fork = stored[kExtKeyForkType];
    if (size != kExtKeySize || stored[kExtKeyPad] != 0 ||
        (fork != kForkData && fork != kForkResource)) {
        return {};
    }
    const KeyView key(kExtentsFileId, stored);
    return std::to_string(key.Id()) + (fork == kForkData ? ":data:" : ":rsrc:") +
           std::to_string(key.StartBlock());
}

// The same for the other two trees.
std::string NamedKeyText(u32 fileId, const u8* stored, u32 size, Blanks blanks) {
    const bool isCatalog = fileId == kCatalogFileId;
    const KeyView key(fileId, stored);
    if (size != key.Size() || key.NameLength() > KeyLayoutOf(fileId).longestName ||
        (!isCatalog && GetBe16(stored + kAttrKeyPad) != 0)) {
        return {};
    }
    return std::to_string(key.Id()) + ":" +
           QuotedUnits(UnitsFromStored(key.Name(), key.NameLength()),
                       isCatalog ? Typed::kDecomposed : Typed::kAsIs, blanks) +
           (key.StartBlock() == 0 ? "" : ":" + std::to_string(key.StartBlock()));
}

}  // namespace

Problem ParseKey(std::string_view text, u32 fileId, SearchKey* key) {
    if (text.starts_with("hex:")) {
        return ReadHexKey(text, fileId, key);
    }
    // FILE:data:BLOCK also has the shape of an attributes key; only there it is one.
    SearchKey other;
    std::size_t unitCount = 0;
    const bool isExtents = fileId == kCatalogFileId && ReadExtentsKey(text, &other);
    if (isExtents || !ReadReadable(text, fileId, key, &unitCount)) {
        return WrongShape(text, fileId);
    }
    const u32 most = KeyLayoutOf(fileId).longestName;
    if (unitCount > most) {
        return KeyProblem(text, "the name has " + std::to_string(unitCount) +
                                    " units, the longest has " + std::to_string(most));
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
    std::string text;
    if (FaultOfStored(fileId, stored, size).empty()) {
        text = fileId == kExtentsFileId ? ExtentsKeyText(stored, size)
                                        : NamedKeyText(fileId, stored, size, blanks);
    }
    return text.empty() ? "hex:" + HexText(stored, size) : text;
}

}  // namespace VELK
