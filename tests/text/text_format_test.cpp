// Columns: texts below each other on a terminal.
#include "hfs/records/text_format.h"

#include <gtest/gtest.h>

namespace VELK {
namespace {

TEST(ShownWidth, MarksTakeNoColumnAndIdeographsTwo) {
    EXPECT_EQ(ShownWidth(""), 0u);
    EXPECT_EQ(ShownWidth("readme.txt"), 10u);
    EXPECT_EQ(ShownWidth("Gr\u00F6\u00DFe"), 5u);
    EXPECT_EQ(ShownWidth("Gro\u0308\u00DFe"), 5u);
    EXPECT_EQ(ShownWidth("\u65E5\u672C"), 4u);
    EXPECT_EQ(ShownWidth("\u1112\u1161\u11AB"), 2u);  // one syllable, decomposed
    EXPECT_EQ(ShownWidth("a\U0001F600b"), 4u);
    EXPECT_EQ(ShownWidth("\u036F\u0370"), 1u);  // the last mark, and the letter behind it
}

TEST(ShownWidth, BytesThatAreNoTextCountOneByOne) {
    EXPECT_EQ(ShownWidth("a\xFF"
                         "b"),
              3u);
}

TEST(Padded, ReachesTheColumnOrGoesBeyond) {
    EXPECT_EQ(Padded("o\u0308", 3), "o\u0308  ");
    EXPECT_EQ(Padded("long", 3), "long");
    EXPECT_EQ(Padded("", 2), "  ");
}

}  // namespace
}  // namespace VELK
