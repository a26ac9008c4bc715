// What the program works out itself: patterns, masked names, records found without a table.
#include <gtest/gtest.h>

#include "draws.h"
#include "hfs/names.h"
#include "hfs/records/record_fields.h"
#include "tool/name_glob.h"
#include "tool/name_mask.h"
#include "tool/record_carve.h"

namespace VELK::tool {
namespace {

// A name with some of its letters replaced by ? and some stretches by * is a pattern that it fits.
RC_GTEST_PROP(NamePatterns, NameFitsThePatternMadeOfIt, ()) {
    const auto name = *rc::gen::container<std::string>(
        rc::gen::element('a', 'b', 'A', '.', ' ', '*', '?', '[', ']', '\\', '!', '-'));
    std::string pattern;
    for (const char letter : name) {
        switch (*rc::gen::inRange(0, 6)) {
            case 0:
                pattern += '?';
                break;
            case 1:
                pattern += '*';  // in place of the letter
                break;
            case 2:
                pattern += '*';  // in place of nothing
                [[fallthrough]];
            default:
                pattern += '\\';
                pattern += letter;
        }
    }
    RC_LOG() << pattern;
    const Bytes stored = Stored(Units(name.begin(), name.end()));
    RC_ASSERT(NameGlob(pattern, false).Matches(stored.data(), static_cast<u32>(name.size())));
    RC_ASSERT(NameGlob(pattern, true).Matches(stored.data(), static_cast<u32>(name.size())));
}

int Order(bool folds, const Bytes& host, const Bytes& stored) {
    const NameUnits first = UnitsFromStored(host.data(), static_cast<u32>(host.size() / 2));
    const auto compare = folds ? CompareHfsNamesIns : CompareHfsNamesBin;
    const int order = compare(first.data(), static_cast<unsigned>(first.size()), stored.data(),
                              static_cast<unsigned>(stored.size() / 2));
    return (order > 0) - (order < 0);
}

// A masked folder has its names in the same order, each as long as it was.
RC_GTEST_PROP(MaskedNames, KeepOrderAndLength, (bool folds)) {
    const auto names =
        *rc::gen::container<std::vector<Units>>(rc::gen::oneOf(AlikeName(), AnyName(40)));
    NameMask mask(folds);
    for (const Units& name : names) {
        const Bytes stored = Stored(name);
        mask.Add(2, stored.data(), static_cast<u32>(name.size()), *rc::gen::inRange(0, 9) == 0);
    }
    RC_PRE(mask.Prepare());
    std::vector<Bytes> before, after;
    for (const Units& name : names) {
        before.push_back(Stored(name));
        after.push_back(before.back());
        mask.Replace(2, after.back().data(), static_cast<u32>(name.size()));
    }
    for (std::size_t i = 0; i < names.size(); ++i) {
        for (std::size_t j = 0; j < i; ++j) {
            RC_ASSERT(Order(folds, after[i], after[j]) == Order(folds, before[i], before[j]));
        }
    }
}

// A record in the middle of other bytes is found with exactly its bytes.
RC_GTEST_PROP(CarvedRecords, SoundRecordIsFoundWhole, ()) {
    const u32 fileId = kCatalogFileId;
    Bytes data = *rc::gen::suchThat(AnyRecord(fileId), [](const Bytes& record) {
        return record[1] <= kFileRecord || record[9] != 0;  // a thread names something
    });
    Bytes key = *rc::gen::suchThat(AnyKey(fileId), [](const Bytes& drawn) {
        return drawn[7] != 0;  // has a name
    });
    key[5] |= 1;  // a parent
    if (data[1] <= kFileRecord) {
        data[8] |= 1;  // an ID that is not reserved
    } else {
        key.resize(kCatKeyName);  // a thread's key has no name
        key[1] = kCatKeyName - kKeyLengthSize;
        key[7] = 0;
        data[2] = data[3] = 0;
        data[7] |= 1;  // the folder it leads to
    }
    const Bytes behind = *rc::gen::arbitrary<Bytes>();
    Bytes all = key;
    all.insert(all.end(), data.begin(), data.end());
    all.insert(all.end(), behind.begin(), behind.end());
    CarvedRecord record;
    RC_ASSERT(CarveRecord(fileId, all.data(), static_cast<u32>(all.size()), &record));
    RC_ASSERT(record.keySize == key.size());
    RC_ASSERT(record.dataSize == data.size());
    RC_ASSERT(!CarveRecord(fileId, all.data(), record.Size() - 1, &record));
}

}  // namespace
}  // namespace VELK::tool
