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

// What a sound table is, start by start.
bool IsSound(const Bytes& content) {
    const u32 size = static_cast<u32>(content.size());
    const u32 count = Get16(content, 10);
    const auto start = [&](u32 record) { return Get16(content, size - 2 * (record + 1)); };
    bool isSound = start(0) >= 14 && start(count) <= size - 2 * (count + 1);
    for (u32 record = 0; record <= count; ++record) {
        isSound =
            isSound && start(record) % 2 == 0 && (record == 0 || start(record - 1) < start(record));
    }
    return isSound;
}

TEST_P(OffsetTable, ShortTablesAreLookedAtFromEndToEnd) {
    for (u32 count = 1; count <= 13; ++count) {
        content_ = LeafOf(kNodeSize, std::vector<Bytes>(count, Records()[0]));
        for (u32 record = 0; record <= count; ++record) {
            const u32 is = Start(record);
            for (const u32 start : {is, is + 1, is - 2, is + 2, is + 10, is - 10, is + 12, 0u,
                                    is | 0x8000u, 0xFFFEu, 0x7FFEu, 0x8000u}) {
                Bytes changed = content_;
                Put16(&changed, SlotAt(record), start);
                EXPECT_EQ(IsSoundWith(record, start), IsSound(changed))
                    << "record " << record << " of " << count << ": " << start;
            }
        }
    }
}

// Nodes longer than the format allows open, too: starts have all of their bits.
TEST(LongOffsetTable, StartsOfAllLengthsFall) {
    constexpr u32 kLength = 40960;
    NodeBench bench{Geometry{kLength, 512}};
    const Bytes content = LeafOf(kLength, std::vector<Bytes>(5, Record({0, 2, 1, 1}, Bytes(7000))));
    for (const auto& [record, start] :
         {std::pair{4u, 28030u}, {4u, 28031u}, {4u, 35032u}, {5u, 40900u}, {3u, 0x8000u}}) {
        Bytes changed = content;
        Put16(&changed, kLength - 2 * (record + 1), start);
        const auto node = bench.Node(changed);
        EXPECT_EQ(TableIsSound(&bench.tree.header, node->Get()), IsSound(changed))
            << record << " " << start;
    }
}

TEST_P(OffsetTable, ATableBehindTheLastBlockIsRefused) {
    const auto node = bench_.Node(content_);
    BTHeaderMem header = bench_.tree.header;
    header.nodeSize = kNodeSize + 2;
    EXPECT_FALSE(TableIsSound(&header, node->Get()));
}

TEST_P(OffsetTable, AnEmptyNodeIsSound) {
    content_ = LeafOf(kNodeSize, {});
    EXPECT_TRUE(IsSoundWith(0, 14));
    EXPECT_FALSE(IsSoundWith(0, 12));
}

INSTANTIATE_TEST_SUITE_P(Blocks, OffsetTable, ::testing::Values(512u, 1024u, 4096u));

}  // namespace
}  // namespace VELK::test
