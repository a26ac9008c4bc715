// Soundness, order and text of the keys of the three trees.
#include "hfs/check/check_keys.h"

#include <algorithm>
#include <cstring>

#include "hfs/check/check_bytes.h"
#include "hfs/check/check_run.h"
#include "hfs/names.h"

namespace VELK {
namespace {

struct KeyLimits {
    u32 least;
    u32 most;
};

KeyLimits LimitsOf(u32 fileId) {
    switch (fileId) {
        case kCatalogFileId:
            return {kCatKeyFixed, kCatMaxKeyLength};
        case kExtentsFileId:
            return {kExtKeyFixed, kExtMaxKeyLength};
        default:
            return {kAttrKeyFixed, kAttrMaxKeyLength};
    }
}

bool Fatal(CheckKeyFault* fault, std::string text) {
    fault->severity = CheckSeverity::kError;
    fault->text = std::move(text);
    return false;
}

bool Usable(CheckKeyFault* fault, CheckSeverity severity, std::string text) {
    fault->severity = severity;
    fault->text = std::move(text);
    return true;
}

bool NameFits(u32 keyLength, u32 fixed, u32 nameLength, CheckKeyFault* fault) {
    const u32 wanted = fixed + 2 * nameLength;
    if (wanted == keyLength) {
        return true;
    }
    std::string text = CheckPrint("a name of %u units takes a key of %u bytes, the key has %u",
                                  nameLength, wanted, keyLength);
    return wanted > keyLength ? Fatal(fault, std::move(text))
                              : Usable(fault, CheckSeverity::kWarning, std::move(text));
}

int CompareNumbers(u32 left, u32 right) {
    return left < right ? -1 : left > right ? 1 : 0;
}

// Names of two keys. What both begin with is skipped byte by byte: equal units weigh the same in
// either order, ignorable ones included.
int CompareNames(CheckNameOrder order, const u8* left, u32 leftCount, const u8* right,
                 u32 rightCount) {
    const u32 common = std::min(leftCount, rightCount);
    u32 i = 0;
    while (i < common && std::memcmp(left + 2 * i, right + 2 * i, 2) == 0) {
        ++i;
    }
    u16 units[256];
    const u32 rest = std::min(leftCount - i, u32{256});
    for (u32 k = 0; k < rest; ++k) {
        units[k] = static_cast<u16>(Load16(left + 2 * (i + k)));
    }
    return order == CheckNameOrder::kFolding
               ? CompareHfsNamesIns(units, rest, right + 2 * i, rightCount - i)
               : CompareHfsNamesBin(units, rest, right + 2 * i, rightCount - i);
}

int CompareCatalog(CheckNameOrder order, const u8* left, const u8* right) {
    const int parents =
        CompareNumbers(Load32(left + kCatKeyParentId), Load32(right + kCatKeyParentId));
    if (parents != 0) {
        return parents;
    }
    return CompareNames(order, left + kCatKeyName, Load16(left + kCatKeyNameLength),
                        right + kCatKeyName, Load16(right + kCatKeyNameLength));
}

int CompareExtents(const u8* left, const u8* right) {
    int order = CompareNumbers(Load32(left + kExtKeyFileId), Load32(right + kExtKeyFileId));
    if (order == 0) {
        order = CompareNumbers(left[kExtKeyForkType], right[kExtKeyForkType]);
    }
    if (order == 0) {
        order = CompareNumbers(Load32(left + kExtKeyStartBlock), Load32(right + kExtKeyStartBlock));
    }
    return order;
}

int CompareAttributes(const u8* left, const u8* right) {
    int order = CompareNumbers(Load32(left + kAttrKeyFileId), Load32(right + kAttrKeyFileId));
    if (order == 0) {
        order = CompareNames(CheckNameOrder::kBinary, left + kAttrKeyName,
                             Load16(left + kAttrKeyNameLength), right + kAttrKeyName,
                             Load16(right + kAttrKeyNameLength));
    }
    if (order == 0) {
        order =
            CompareNumbers(Load32(left + kAttrKeyStartBlock), Load32(right + kAttrKeyStartBlock));
    }
    return order;
}

void AppendUtf8(std::string* text, u32 point) {
    if (point < 0x80) {
        text->push_back(static_cast<char>(point));
    } else if (point < 0x800) {
        text->push_back(static_cast<char>(0xC0 | (point >> 6)));
        text->push_back(static_cast<char>(0x80 | (point & 0x3F)));
    } else if (point < 0x10000) {
        text->push_back(static_cast<char>(0xE0 | (point >> 12)));
        text->push_back(static_cast<char>(0x80 | ((point >> 6) & 0x3F)));
        text->push_back(static_cast<char>(0x80 | (point & 0x3F)));
    } else {
        text->push_back(static_cast<char>(0xF0 | (point >> 18)));
        text->push_back(static_cast<char>(0x80 | ((point >> 12) & 0x3F)));
        text->push_back(static_cast<char>(0x80 | ((point >> 6) & 0x3F)));
        text->push_back(static_cast<char>(0x80 | (point & 0x3F)));
    }
}

bool IsHighSurrogate(u32 unit) {
    return unit >= 0xD800 && unit < 0xDC00;
}
bool IsLowSurrogate(u32 unit) {
    return unit >= 0xDC00 && unit < 0xE000;
}

}  // namespace

bool CheckKeySound(const CheckKeyKind& kind, const u8* key, u32 room, CheckKeyFault* fault) {
    if (room < kKeyLengthSize) {
        return Fatal(fault, CheckPrint("the record of %u bytes has no room for a key", room));
    }
    const u32 keyLength = Load16(key);
    const KeyLimits limits = LimitsOf(kind.fileId);
    if (keyLength < limits.least || keyLength > limits.most) {
        return Fatal(
            fault, limits.least == limits.most
                       ? CheckPrint("key length is %u, expected %u", keyLength, limits.least)
                       : CheckPrint("key length is %u, expected %u to %u", keyLength, limits.least,
                                    limits.most));
    }
    if (kKeyLengthSize + keyLength > room) {
        return Fatal(fault, CheckPrint("a key of %u bytes does not fit its record of %u",
                                       kKeyLengthSize + keyLength, room));
    }
    if (kind.fileId == kCatalogFileId) {
        return NameFits(keyLength, kCatKeyFixed, Load16(key + kCatKeyNameLength), fault);
    }
    if (kind.fileId == kExtentsFileId) {
        const u32 forkType = key[kExtKeyForkType];
        if (forkType != kForkData && forkType != kForkResource) {
            return Usable(fault, CheckSeverity::kError,
                          CheckPrint("fork type is 0x%02x, expected 0x00 or 0xff", forkType));
        }
        if (key[kExtKeyPad] != 0) {
            return Usable(fault, CheckSeverity::kWarning,
                          CheckPrint("padding is 0x%02x, expected 0", key[kExtKeyPad]));
        }
        return true;
    }
    if (!NameFits(keyLength, kAttrKeyFixed, Load16(key + kAttrKeyNameLength), fault)) {
        return false;
    }
    const u32 pad = Load16(key + kAttrKeyPad);
    if (pad != 0 && fault->text.empty()) {
        return Usable(fault, CheckSeverity::kWarning,
                      CheckPrint("padding is 0x%04x, expected 0", pad));
    }
    return true;
}

int CompareCheckKeys(const CheckKeyKind& kind, const u8* left, const u8* right) {
    switch (kind.fileId) {
        case kCatalogFileId:
            return CompareCatalog(kind.names, left, right);
        case kExtentsFileId:
            return CompareExtents(left, right);
        default:
            return CompareAttributes(left, right);
    }
}

bool SameCheckKeys(const u8* left, const u8* right) {
    return std::memcmp(left, right, kKeyLengthSize) == 0 &&
           std::memcmp(left, right, kKeyLengthSize + Load16(left)) == 0;
}

std::string CheckNameText(const u8* units, u32 count) {
    std::string text = "\"";
    for (u32 i = 0; i < count; ++i) {
        const u32 unit = Load16(units + 2 * i);
        if (IsHighSurrogate(unit) && i + 1 < count && IsLowSurrogate(Load16(units + 2 * i + 2))) {
            const u32 low = Load16(units + 2 * i + 2);
            AppendUtf8(&text, 0x10000 + ((unit - 0xD800) << 10) + (low - 0xDC00));
            ++i;
        } else if (unit == '"' || unit == '\\') {
            text.push_back('\\');
            text.push_back(static_cast<char>(unit));
        } else if (unit < 0x20 || (unit >= 0x7F && unit < 0xA0) || IsHighSurrogate(unit) ||
                   IsLowSurrogate(unit)) {
            text += CheckPrint("\\u%04x", unit);
        } else {
            AppendUtf8(&text, unit);
        }
    }
    text.push_back('"');
    return text;
}

std::string CheckKeyText(const CheckKeyKind& kind, const u8* key) {
    if (kind.fileId == kCatalogFileId) {
        return CheckPrint("%u:", Load32(key + kCatKeyParentId)) +
               CheckNameText(key + kCatKeyName, Load16(key + kCatKeyNameLength));
    }
    if (kind.fileId == kExtentsFileId) {
        const u32 forkType = key[kExtKeyForkType];
        const std::string fork = forkType == kForkData       ? "data"
                                 : forkType == kForkResource ? "rsrc"
                                                             : CheckPrint("0x%02x", forkType);
        return CheckPrint("%u:%s:%u", Load32(key + kExtKeyFileId), fork.c_str(),
                          Load32(key + kExtKeyStartBlock));
    }
    std::string text = CheckPrint("%u:", Load32(key + kAttrKeyFileId)) +
                       CheckNameText(key + kAttrKeyName, Load16(key + kAttrKeyNameLength));
    if (const u32 start = Load32(key + kAttrKeyStartBlock); start != 0) {
        text += CheckPrint(":%u", start);
    }
    return text;
}

}  // namespace VELK
