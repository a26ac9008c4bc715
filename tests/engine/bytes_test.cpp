// NodeBytes against one flat buffer: whatever the blocks, the bytes are the same.
#include "hfs/treehfs/bytes.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <random>

#include "geometry.h"
#include "node_image.h"

namespace VELK::test {
namespace {

class NodeBytesTest : public GeometryTest {
protected:
    NodeBytesTest() : flat_(Pattern(NodeSize(), 3)), node_(flat_, MapBlock(), 1, true) {}

    NodeBytes View() const { return NodeBytes(node_.Hdr(), node_.Get()); }

    // Offsets close to every block end, to both ends of the node, and some between.
    std::vector<u32> Offsets() const {
        std::vector<u32> offsets = {0, 1, 13, 14, NodeSize() / 2 + 1};
        for (u32 end = MapBlock(); end <= NodeSize(); end += MapBlock()) {
            for (u32 back = 0; back <= 5; ++back) {
                offsets.push_back(end - back);
            }
        }
        return offsets;
    }

    Bytes flat_;
    LooseNode node_;
};

TEST_P(NodeBytesTest, ContentIsTheBlocksOneAfterTheOther) {
    EXPECT_EQ(node_.Content(), flat_);
    EXPECT_EQ(View().Limit(), NodeSize());
}

TEST_P(NodeBytesTest, EveryByteHasItsAddress) {
    for (u32 offset = 0; offset < NodeSize(); ++offset) {
        ASSERT_EQ(View().At(offset), node_.At(offset)) << offset;
    }
}

TEST_P(NodeBytesTest, TheAddressOfTheNodesEndIsNull) {
    EXPECT_EQ(View().At(NodeSize()), nullptr);
    EXPECT_EQ(View().At(0xFFFFFFFFu), nullptr);
}

TEST_P(NodeBytesTest, RoomEndsWithTheBlock) {
    EXPECT_EQ(View().Room(0), MapBlock());
    EXPECT_EQ(View().Room(MapBlock() - 1), 1u);
    EXPECT_EQ(View().Room(MapBlock()), MapBlock());
}

TEST_P(NodeBytesTest, ReadsBigEndianAtAnyOffset) {
    for (const u32 offset : Offsets()) {
        if (offset + 2 <= NodeSize()) {
            ASSERT_EQ(View().U16(offset), Get16(flat_, offset)) << offset;
        }
        if (offset + 4 <= NodeSize()) {
            ASSERT_EQ(View().U32(offset), Get32(flat_, offset)) << offset;
        }
        if (offset < NodeSize()) {
            ASSERT_EQ(View().U8(offset), flat_[offset]) << offset;
        }
    }
}

TEST_P(NodeBytesTest, ReadsThatLeaveTheNodeYieldZero) {
    for (const u32 offset :
         {NodeSize() - 1, NodeSize(), NodeSize() + 1, 0x7FFFFFFFu, 0xFFFFFFFFu}) {
        EXPECT_EQ(View().U16(offset), 0) << offset;
        EXPECT_EQ(View().U32(offset), 0u) << offset;
    }
    EXPECT_EQ(View().U32(NodeSize() - 3), 0u);
    EXPECT_EQ(View().U8(NodeSize()), 0);
}

TEST_P(NodeBytesTest, WritesBigEndianAtAnyOffset) {
    for (const u32 offset : Offsets()) {
        if (offset + 4 <= NodeSize()) {
            View().SetU32(offset, 0x81020304u + offset);
            Put32(&flat_, offset, 0x81020304u + offset);
        }
        if (offset + 2 <= NodeSize()) {
            View().SetU16(offset, 0xA55Au ^ offset);
            Put16(&flat_, offset, (0xA55Au ^ offset) & 0xFFFF);
        }
        if (offset < NodeSize()) {
            View().SetU8(offset, offset * 3);
            flat_[offset] = static_cast<u8>(offset * 3);
        }
    }
    EXPECT_EQ(node_.Content(), flat_);
}

TEST_P(NodeBytesTest, WritesThatLeaveTheNodeChangeNothing) {
    const Bytes source(8, 0x11);
    View().SetU16(NodeSize() - 1, 0x1234);
    View().SetU32(NodeSize() - 3, 0x12345678);
    View().SetU8(NodeSize(), 1);
    View().CopyIn(NodeSize() - 7, source.data(), 8);
    View().Fill(NodeSize() - 7, 0x22, 8);
    View().Move(NodeSize() - 7, 0, 8);
    View().Move(0, NodeSize() - 7, 8);
    View().Move(0xFFFFFFFFu, 0, 2);
    View().Fill(0, 0x33, 0xFFFFFFFFu);
    EXPECT_EQ(node_.Content(), flat_);
}

TEST_P(NodeBytesTest, CopyOutBeyondTheNodeCopiesNothing) {
    Bytes target(8, 0x77);
    View().CopyOut(target.data(), NodeSize() - 7, 8);
    View().CopyOut(target.data(), 0xFFFFFFFFu, 8);
    EXPECT_EQ(target, Bytes(8, 0x77));
}

TEST_P(NodeBytesTest, CopiesWholeNodesOutAndIn) {
    Bytes target(NodeSize());
    View().CopyOut(target.data(), 0, NodeSize());
    EXPECT_EQ(target, flat_);
    const Bytes other = Pattern(NodeSize(), 9);
    View().CopyIn(0, other.data(), NodeSize());
    EXPECT_EQ(node_.Content(), other);
}

TEST_P(NodeBytesTest, NothingIsCopiedForSizeZero) {
    View().CopyOut(nullptr, 0, 0);
    View().CopyIn(NodeSize(), nullptr, 0);
    View().Fill(3, 0x55, 0);
    View().Move(NodeSize(), 0, 0);
    EXPECT_EQ(node_.Content(), flat_);
}

TEST_P(NodeBytesTest, FillsAcrossBlocks) {
    View().Fill(3, 0x5A, NodeSize() - 5);
    std::fill(flat_.begin() + 3, flat_.end() - 2, u8{0x5A});
    EXPECT_EQ(node_.Content(), flat_);
}

TEST_P(NodeBytesTest, RandomMovesEqualThoseOfAFlatBuffer) {
    std::mt19937 random(NodeSize() * 7 + MapBlock());
    for (int round = 0; round < 1500; ++round) {
        const u32 target = static_cast<u32>(random() % NodeSize());
        const u32 any = static_cast<u32>(random());
        const u32 source = round % 3 == 0 ? target ^ (any % 4) : any % NodeSize();
        const u32 most = NodeSize() - std::max({target, source, 1u});
        const u32 size = most == 0 ? 0 : static_cast<u32>(random() % most);
        View().Move(target, source, size);
        std::memmove(flat_.data() + target, flat_.data() + source, size);
    }
    EXPECT_EQ(node_.Content(), flat_);
}

TEST_P(NodeBytesTest, RandomCopiesInAndOutEqualThoseOfAFlatBuffer) {
    std::mt19937 random(NodeSize() * 11 + MapBlock());
    Bytes buffer(NodeSize());
    for (int round = 0; round < 500; ++round) {
        const u32 offset = static_cast<u32>(random() % NodeSize());
        const u32 size = static_cast<u32>(random() % (NodeSize() - offset + 1));
        View().CopyOut(buffer.data(), offset, size);
        ASSERT_EQ(std::memcmp(buffer.data(), flat_.data() + offset, size), 0) << offset;
        const u32 to = static_cast<u32>(random() % (NodeSize() - size + 1));
        View().CopyIn(to, buffer.data(), size);
        std::memcpy(flat_.data() + to, buffer.data(), size);
    }
    EXPECT_EQ(node_.Content(), flat_);
}

TEST_P(NodeBytesTest, RandomCopiesBetweenNodesEqualThoseOfFlatBuffers) {
    std::mt19937 random(NodeSize() * 13 + MapBlock());
    Bytes otherFlat = Pattern(NodeSize(), 77);
    LooseNode other(otherFlat, MapBlock(), 2, true);
    for (int round = 0; round < 500; ++round) {
        const u32 from = static_cast<u32>(random() % NodeSize());
        const u32 to = static_cast<u32>(random() % NodeSize());
        const u32 size = static_cast<u32>(random() % (NodeSize() - std::max(from, to) + 1));
        CopyBetween(View(), to, NodeBytes(other.Hdr(), other.Get()), from, size);
        std::memcpy(flat_.data() + to, otherFlat.data() + from, size);
    }
    EXPECT_EQ(node_.Content(), flat_);
    EXPECT_EQ(other.Content(), otherFlat);
}

TEST_P(NodeBytesTest, CopyBetweenRefusesWhatLeavesEitherNode) {
    const LooseNode other(Pattern(NodeSize(), 77), MapBlock(), 2, true);
    const NodeBytes otherView(other.Hdr(), other.Get());
    CopyBetween(View(), NodeSize() - 3, otherView, 0, 4);
    CopyBetween(View(), 0, otherView, NodeSize() - 3, 4);
    EXPECT_EQ(node_.Content(), flat_);
}

TEST_P(NodeBytesTest, ABlockIsDirtyWhereItWasMarked) {
    const LooseNode clean(flat_, MapBlock(), 1, false);
    EXPECT_TRUE(View().IsDirty(NodeSize() - 1));
    EXPECT_FALSE(NodeBytes(clean.Hdr(), clean.Get()).IsDirty(0));
    EXPECT_FALSE(View().IsDirty(NodeSize()));
}

TEST_P(NodeBytesTest, CopyBetweenRefusesBeforeTheFirstPiece) {
    const LooseNode other(Pattern(NodeSize(), 77), MapBlock(), 2, true);
    CopyBetween(View(), NodeSize() - 10, NodeBytes(other.Hdr(), other.Get()), MapBlock() - 4, 12);
    EXPECT_EQ(node_.Content(), flat_);
}

INSTANTIATE_GEOMETRIES(NodeBytesTest, AllGeometries);

TEST(BigEndian, GetAndPutAtOddAddresses) {
    u8 bytes[8] = {};
    PutBe32(bytes + 1, 0x89ABCDEFu);
    PutBe16(bytes + 5, 0xF00Du);
    EXPECT_EQ(bytes[1], 0x89);
    EXPECT_EQ(bytes[4], 0xEF);
    EXPECT_EQ(GetBe32(bytes + 1), 0x89ABCDEFu);
    EXPECT_EQ(GetBe16(bytes + 5), 0xF00Du);
}

TEST(BigEndian, PaddedKeySizeIsLengthFieldAndKeyRoundedUpToEven) {
    EXPECT_EQ(PaddedKeySize(0), 2u);
    EXPECT_EQ(PaddedKeySize(1), 4u);
    EXPECT_EQ(PaddedKeySize(2), 4u);
    EXPECT_EQ(PaddedKeySize(7), 10u);
    EXPECT_EQ(PaddedKeySize(10), 12u);
    EXPECT_EQ(PaddedKeySize(516), 518u);
}

}  // namespace
}  // namespace VELK::test
