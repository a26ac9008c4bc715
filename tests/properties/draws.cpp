// Generators.
#include "draws.h"

#include "hfs/format.h"
#include "hfs/records/record_fields.h"

namespace VELK {

namespace {

void AppendBe(Bytes* bytes, u64 value, u32 width) {
    for (u32 i = width; i > 0; --i) {
        bytes->push_back(static_cast<u8>(value >> (8 * (i - 1))));
    }
}

// Numbers of `width` bytes, small ones often.
rc::Gen<u64> AnyNumber(u32 width) {
    const u64 most = width == 8 ? ~u64{0} : (u64{1} << (8 * width)) - 1;
    return rc::gen::map(rc::gen::weightedOneOf<u64>({
                            {3, rc::gen::element<u64>(0, 1, 2, 16)},
                            {1, rc::gen::arbitrary<u64>()},
                        }),
                        [most](u64 number) { return number & most; });
}

rc::Gen<Bytes> AnyBytes(u32 count) {
    return rc::gen::container<Bytes>(
        count,
        rc::gen::weightedOneOf<u8>({{3, rc::gen::just<u8>(0)}, {1, rc::gen::arbitrary<u8>()}}));
}

const RecordKind* AnyKind(u32 fileId) {
    std::vector<const RecordKind*> kinds;
    for (u32 i = 0; i < kRecordKindCount; ++i) {
        if (kRecordKinds[i].fileId == fileId) {
            kinds.push_back(&kRecordKinds[i]);
        }
    }
    return *rc::gen::elementOf(kinds);
}

}  // namespace

rc::Gen<u16> AnyUnit() {
    return rc::gen::weightedOneOf<u16>({
        {6, rc::gen::element<u16>('a', 'b', 'c', 'i', 'A', 'B', '0', '9', '.')},
        {3, rc::gen::element<u16>(' ', '$', '"', '\\', '/', ':', '#', '{', '}', '[', ']', '*', '?',
                                  '!', '-', 0, 0x0A, 0x1B, 0x7F)},
        {3, rc::gen::element<u16>(0x00E9, 0x0300, 0x0301, 0x0323, 0x1E69, 0xAC01, 0x1100, 0x1161,
                                  0x11A8, 0x0130, 0x03C3, 0x2400, 0x200C, 0x202E, 0xFEFF)},
        {2, rc::gen::element<u16>(0xD800, 0xDBFF, 0xDC00, 0xDFFF, 0xFFFD, 0xFFFF)},
        {1, rc::gen::arbitrary<u16>()},
    });
}

rc::Gen<Units> AnyName(u32 most) {
    return rc::gen::map(rc::gen::container<Units>(AnyUnit()), [most](Units units) {
        units.resize(std::min<std::size_t>(units.size(), most));
        return units;
    });
}

rc::Gen<Units> AlikeName() {
    return rc::gen::resize(
        6, rc::gen::container<Units>(rc::gen::element<u16>('a', 'A', 'b', 'B', 0x0301, 0x200C)));
}

rc::Gen<u32> AnyTree() {
    return rc::gen::elementOf(std::vector<u32>{kCatalogFileId, kExtentsFileId, kAttributesFileId});
}

rc::Gen<Bytes> AnyKey(u32 fileId) {
    return rc::gen::exec([fileId] {
        Bytes key;
        if (fileId == kExtentsFileId) {
            AppendBe(&key, 10, 2);
            AppendBe(&key, *rc::gen::element<u64>(0, 0xFF), 1);
            AppendBe(&key, 0, 1);
            AppendBe(&key, *AnyNumber(4), 4);
            AppendBe(&key, *AnyNumber(4), 4);
            return key;
        }
        const bool isCatalog = fileId == kCatalogFileId;
        const Units name = *AnyName(isCatalog ? 255 : 127);
        AppendBe(&key, (isCatalog ? 6 : 12) + 2 * name.size(), 2);
        AppendBe(&key, 0, isCatalog ? 0 : 2);
        AppendBe(&key, *AnyNumber(4), 4);
        AppendBe(&key, isCatalog ? 0 : *AnyNumber(4), isCatalog ? 0 : 4);
        AppendBe(&key, name.size(), 2);
        const Bytes stored = Stored(name);
        key.insert(key.end(), stored.begin(), stored.end());
        return key;
    });
}

rc::Gen<Bytes> AnyRecord(u32 fileId) {
    return rc::gen::exec([fileId] {
        const RecordKind& kind = *AnyKind(fileId);
        Bytes record = *AnyBytes(kind.size);
        const u32 typeWidth = fileId == kCatalogFileId ? 2 : fileId == kAttributesFileId ? 4 : 0;
        for (u32 i = 0; i < typeWidth; ++i) {
            record[i] = static_cast<u8>(kind.type >> (8 * (typeWidth - 1 - i)));
        }
        if (kind.size == kThreadFixed) {
            const Units name = *AnyName(255);
            const Bytes stored = Stored(name);
            record[8] = 0;
            record[9] = static_cast<u8>(name.size());
            record.insert(record.end(), stored.begin(), stored.end());
        } else if (kind.type == kInlineAttribute) {
            const Bytes value = *rc::gen::arbitrary<Bytes>();
            record[12] = record[13] = record[14] = 0;
            record[15] = static_cast<u8>(value.size());
            record.insert(record.end(), value.begin(), value.end());
        }
        return record;
    });
}

NameUnits InHostOrder(const Units& units) {
    return NameUnits(units.begin(), units.end());
}

Bytes Stored(const Units& units) {
    Bytes bytes;
    for (const u16 unit : units) {
        AppendBe(&bytes, unit, 2);
    }
    return bytes;
}

}  // namespace VELK
