// The offset table as changes rely on it: one record out of order anywhere in it, in whichever
// block, and the node is left alone.
#include "hfs/treehfs/slots.h"

#include <gtest/gtest.h>

#include "flat_tree.h"
#include "node_bench.h"

namespace VELK::test {
namespace {

constexpr u32 kNodeSize = 4096;
constexpr u32 kRecords = 300;  // their slots lie in two blocks of 512 bytes

class OffsetTable : public ::testing::TestWithParam<u32> {
protected:
    OffsetTable() : content_(LeafOf(kNodeSize, Records())) {}

    static std::vector<Bytes> Records() {
        std::vector<Bytes> records;
        for (u32 n = 0; n < kRecords; ++n) {
            const Bytes key = {0, 2, static_cast<u8>(n >> 8), static_cast<u8>(n)};
            records.push_back(Record(key, Pattern(6, n)));
        }
        return records;
    }
    static u32 SlotAt(u32 record) { return kNodeSize - 2 * (record + 1); }
    // Whether the table is sound with another start of one record.
    bool IsSoundWith(u32 record, u32 start) {
        Bytes content = content_;
        Put16(&content, SlotAt(record), start);
        const auto node = bench_.Node(content);
        return TableIsSound(&bench_.tree.header, node->Get());
    }
    u32 Start(u32 record) const { return Get16(content_, SlotAt(record)); }

    NodeBench bench_{Geometry{kNodeSize, GetParam()}};
    Bytes content_;
};

TEST_P(OffsetTable, RecordsInOrderAreSound) {
    EXPECT_EQ(Start(0), 14u);
    EXPECT_EQ(Start(kRecords), 14u + 10 * kRecords);
    EXPECT_TRUE(IsSoundWith(0, 14));
}

TEST_P(OffsetTable, ARecordOutOfOrderIsFoundInEachBlock) {
    for (const u32 record : {1u, 100u, 254u, 255u, 256u, 299u}) {
        EXPECT_FALSE(IsSoundWith(record, Start(record + 1))) << record;
        EXPECT_FALSE(IsSoundWith(record, Start(record + 1) + 2)) << record;
        EXPECT_FALSE(IsSoundWith(record, Start(record - 1))) << record;
        EXPECT_FALSE(IsSoundWith(record, Start(record) + 1)) << record;
        EXPECT_TRUE(IsSoundWith(record, Start(record) + 2)) << record;
    }
}

TEST_P(OffsetTable, ItsEndsAreBounded) {
    EXPECT_FALSE(IsSoundWith(0, 12));
    EXPECT_FALSE(IsSoundWith(0, 0));
    EXPECT_TRUE(IsSoundWith(kRecords, SlotAt(kRecords)));
    EXPECT_FALSE(IsSoundWith(kRecords, SlotAt(kRecords) + 2));
    EXPECT_FALSE(IsSoundWith(kRecords, Start(kRecords) + 1));
}

TEST_P(OffsetTable, ATableAsLongAsTheNodeIsRefused) {
    Put16(&content_, 10, (kNodeSize - 14) / 2);
    EXPECT_FALSE(IsSoundWith(0, 14));
}

TEST_P(OffsetTable, WordsBelowItAreNoSlots) {
    Put16(&content_, SlotAt(kRecords + 1), Start(0));
    Put16(&content_, SlotAt(kRecords + 2), Start(1));
    const auto node = bench_.Node(content_);
    RecordSlots slots{};
    EXPECT_TRUE(LoadRecordSlots(&bench_.tree.header, node->Get(), kRecords - 1, &slots));
    EXPECT_EQ(slots.start, Start(kRecords - 1));
    EXPECT_FALSE(LoadRecordSlots(&bench_.tree.header, node->Get(), kRecords, &slots));
    EXPECT_FALSE(LoadRecordSlots(&bench_.tree.header, node->Get(), kRecords + 1, &slots));
}

TEST_P(OffsetTable, AnEmptyNodeIsSound) {
    content_ = LeafOf(kNodeSize, {});
    EXPECT_TRUE(IsSoundWith(0, 14));
    EXPECT_FALSE(IsSoundWith(0, 12));
}

INSTANTIATE_TEST_SUITE_P(Blocks, OffsetTable, ::testing::Values(512u, 1024u, 4096u));

}  // namespace
}  // namespace VELK::test
