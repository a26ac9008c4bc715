// Keys made of what they name, and threads and keys read in place.
#include "hfs/records/search_key.h"

#include <gtest/gtest.h>

#include "hfs/records/key_layout.h"
#include "hfs/records/thread_view.h"

namespace VELK::tool {
namespace {

using Bytes = std::vector<u8>;

TEST(SearchKey, CatalogKeyHoldsParentAndName) {
    const SearchKey key = CatalogSearchKey(0x01020304, u"a\u00e9");
    EXPECT_EQ(key.id, 0x01020304u);
    EXPECT_EQ(StoredKey(kCatalogFileId, key), (Bytes{0, 10, 1, 2, 3, 4, 0, 2, 0, 'a', 0, 0xE9}));
}

TEST(SearchKey, ExtentsKeyHoldsFileForkAndBlock) {
    const SearchKey key = ExtentsSearchKey(0x01020304, kForkResource, 0x05060708);
    EXPECT_EQ(key.id, 0x01020304u);
    EXPECT_EQ(StoredKey(kExtentsFileId, key), (Bytes{0, 10, 0xFF, 0, 1, 2, 3, 4, 5, 6, 7, 8}));
}

TEST(SearchKey, AttributesKeyHoldsFileBlockAndName) {
    const SearchKey key = AttributesSearchKey(0x01020304, u"a", 0x05060708);
    EXPECT_EQ(key.id, 0x01020304u);
    EXPECT_EQ(StoredKey(kAttributesFileId, key),
              (Bytes{0, 14, 0, 0, 1, 2, 3, 4, 5, 6, 7, 8, 0, 1, 0, 'a'}));
}

TEST(SearchKey, LowestKeyHasNothingButTheId) {
    EXPECT_EQ(StoredKey(kCatalogFileId, LowestKey(kCatalogFileId, 16)),
              (Bytes{0, 6, 0, 0, 0, 16, 0, 0}));
    EXPECT_EQ(StoredKey(kExtentsFileId, LowestKey(kExtentsFileId, 16)),
              (Bytes{0, 10, 0, 0, 0, 0, 0, 16, 0, 0, 0, 0}));
    EXPECT_EQ(StoredKey(kAttributesFileId, LowestKey(kAttributesFileId, 16)),
              (Bytes{0, 12, 0, 0, 0, 0, 0, 16, 0, 0, 0, 0, 0, 0}));
}

TEST(SearchKey, NamesAreCutToTheLongestTheTreeCanHave) {
    const NameUnits longName(300, u'x');
    EXPECT_EQ(CatalogSearchKey(2, longName).size, 2u + 516);
    EXPECT_EQ(AttributesSearchKey(2, longName, 0).size, 2u + 266);
}

TEST(SearchKey, FaultsOfStoredKeysAreNamed) {
    const auto fault = [](u32 fileId, const Bytes& stored) {
        return FaultOfStored(fileId, stored.data(), static_cast<u32>(stored.size()));
    };
    EXPECT_EQ(fault(kCatalogFileId, {0}), "no length field");
    EXPECT_EQ(fault(kCatalogFileId, {0, 6, 0, 0}), "length field says 6 bytes, 2 follow");
    EXPECT_EQ(fault(kExtentsFileId, {0, 2, 0, 0}), "2 bytes are too few for an extents key (10)");
    EXPECT_EQ(fault(kCatalogFileId, {0, 2, 0, 0}), "2 bytes are too few for a catalog key (6)");
    EXPECT_EQ(fault(kCatalogFileId, {0, 8, 0, 0, 0, 2, 0, 2, 0, 'a'}),
              "name of 2 units does not fit into 8 bytes");
    Bytes tooLong(2 + 522);
    tooLong[0] = 522 >> 8;
    tooLong[1] = 522 & 0xFF;
    EXPECT_EQ(fault(kCatalogFileId, tooLong), "522 bytes are more than any key has (520)");
    EXPECT_EQ(fault(kCatalogFileId, {0, 6, 0, 0, 0, 16, 0, 0}), "");
}

TEST(KeyView, ReadsTheFieldsOfEachTree) {
    const u8 catalog[] = {0, 8, 1, 2, 3, 4, 0, 1, 0, 'a'};
    const KeyView named(kCatalogFileId, catalog);
    EXPECT_EQ(named.Id(), 0x01020304u);
    EXPECT_EQ(named.StartBlock(), 0u);
    EXPECT_EQ(named.NameLength(), 1u);
    EXPECT_EQ(named.Name(), catalog + 8);
    EXPECT_EQ(named.Size(), 10u);

    const u8 extents[] = {0, 10, 0xFF, 0, 1, 2, 3, 4, 5, 6, 7, 8};
    const KeyView run(kExtentsFileId, extents);
    EXPECT_EQ(run.Id(), 0x01020304u);
    EXPECT_EQ(run.StartBlock(), 0x05060708u);
    EXPECT_EQ(run.NameLength(), 0u);
    EXPECT_EQ(run.Size(), 12u);

    const u8 attributes[] = {0, 14, 0, 0, 1, 2, 3, 4, 5, 6, 7, 8, 0, 1, 0, 'a'};
    const KeyView value(kAttributesFileId, attributes);
    EXPECT_EQ(value.Id(), 0x01020304u);
    EXPECT_EQ(value.StartBlock(), 0x05060708u);
    EXPECT_EQ(value.NameLength(), 1u);
    EXPECT_EQ(value.Name(), attributes + 14);
    EXPECT_EQ(value.Size(), 16u);
}

TEST(ThreadView, ReadsWhereAnItemLies) {
    const u8 bytes[] = {0, 3, 0, 0, 1, 2, 3, 4, 0, 1, 0, 'a', 0xEE, 0xEE};
    const ThreadView thread(bytes, sizeof bytes);
    ASSERT_TRUE(thread.IsValid());
    EXPECT_TRUE(thread.IsOfFolder());
    EXPECT_EQ(thread.Parent(), 0x01020304u);
    EXPECT_EQ(thread.NameLength(), 1u);
    EXPECT_EQ(thread.Name(), bytes + 10);
    EXPECT_EQ(thread.Size(), 12u);
}

TEST(ThreadView, NameHasToFitIntoTheRecord) {
    const u8 bytes[] = {0, 4, 0, 0, 1, 2, 3, 4, 0, 1, 0, 'a'};
    EXPECT_TRUE(ThreadView(bytes, 12).IsValid());
    EXPECT_FALSE(ThreadView(bytes, 12).IsOfFolder());
    EXPECT_FALSE(ThreadView(bytes, 11).IsValid());
    EXPECT_FALSE(ThreadView(bytes, 9).IsValid());
    EXPECT_FALSE(ThreadView(bytes, 0).IsValid());
}

TEST(ThreadView, OtherRecordsAreNone) {
    const u8 folder[] = {0, 1, 0, 0, 1, 2, 3, 4, 0, 1, 0, 'a'};
    EXPECT_FALSE(ThreadView(folder, sizeof folder).IsValid());
    const u8 unknown[] = {0, 5, 0, 0, 1, 2, 3, 4, 0, 1, 0, 'a'};
    EXPECT_FALSE(ThreadView(unknown, sizeof unknown).IsValid());
}

}  // namespace
}  // namespace VELK::tool
