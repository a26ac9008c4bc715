// Keys, data and order of the model. See tree_model.h.
#include "tree_model.h"

#include <algorithm>
#include <tuple>

namespace VELK::test {

namespace {

// The model's names use ASCII letters and a few units that have no case, so folding is this much.
std::u16string Folded(const std::u16string& name) {
    std::u16string folded = name;
    for (char16_t& unit : folded) {
        if (unit >= u'A' && unit <= u'Z') {
            unit = static_cast<char16_t>(unit + (u'a' - u'A'));
        }
    }
    return folded;
}

std::u16string NameOf(u32 number, u32 longestUnits) {
    constexpr char16_t kUnits[] = u"aBcDeFgHiJkLmNoPqRsTuVwXyZ0123456789_-\u3042\u4E00\u30A2";
    const u32 hash = number * 2654435761u;
    u32 length = 1 + hash % 9;
    if (number % 7 == 0) {
        length = 1 + (hash >> 8) % longestUnits;
    }
    length = std::min(length, longestUnits);
    std::u16string name;
    u32 state = hash;
    for (u32 i = 0; i < length; ++i) {
        state = state * 1664525u + 1013904223u;
        name += kUnits[(state >> 16) % (std::size(kUnits) - 1)];
    }
    if (number % 3 == 0 && name[0] >= u'a' && name[0] <= u'z') {
        name[0] = static_cast<char16_t>(name[0] - (u'a' - u'A'));
    }
    return name;
}

}  // namespace

HostKey ModelKey::Host() const {
    switch (fileId) {
        case kCatalogFileId:
            return HostCatKey(id, name);
        case kExtentsFileId:
            return HostExtKey(static_cast<u8>(fork), id, block);
        default:
            return HostAttrKey(id, block, name);
    }
}

Bytes ModelKey::Delivered() const {
    if (fileId == kExtentsFileId) {
        return DiskExtKey(static_cast<u8>(fork), id, block);
    }
    const HostKey host = Host();
    u16 length = 0;
    std::copy(host.bytes, host.bytes + 2, reinterpret_cast<u8*>(&length));
    return Bytes(host.bytes, host.bytes + kKeyLengthSize + length);
}

bool ModelOrder::operator()(const ModelKey& a, const ModelKey& b) const {
    switch (a.fileId) {
        case kCatalogFileId:
            return std::tuple(a.id, Folded(a.name)) < std::tuple(b.id, Folded(b.name));
        case kExtentsFileId:
            return std::tie(a.id, a.fork, a.block) < std::tie(b.id, b.fork, b.block);
        default:
            return std::tie(a.id, a.name, a.block) < std::tie(b.id, b.name, b.block);
    }
}

ModelKey KeyOf(u32 fileId, u32 number, u32 longest) {
    ModelKey key;
    key.fileId = fileId;
    key.id = 16 + (number * 40503u >> 4) % 97;
    if (fileId == kExtentsFileId) {
        key.fork = number % 5 == 0 ? 0xFF : 0;
        key.block = number * 8;
        return key;
    }
    const u32 fixed = fileId == kCatalogFileId ? kCatKeyName : kAttrKeyName;
    key.name = NameOf(number, (longest - fixed) / 2);
    if (fileId == kAttributesFileId) {
        key.block = number % 11 == 0 ? number : 0;
    }
    return key;
}

Bytes DataOf(u32 number, u32 salt, u32 size) {
    Bytes data(size);
    u32 state = number * 2246822519u + salt * 3266489917u + 1;
    for (u8& byte : data) {
        state = state * 1664525u + 1013904223u;
        byte = static_cast<u8>(state >> 24);
    }
    if (size % 2 != 0) {
        data.push_back(0);
    }
    return data;
}

}  // namespace VELK::test
