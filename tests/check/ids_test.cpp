// The table of invariants, and that each has a test that provokes it.
#include <gtest/gtest.h>

#include "check_support.h"

namespace VELK::test {

TEST(CheckIds, NamesAreFoundAndOthersAreNot) {
    CheckId id = CheckId::V01;
    EXPECT_TRUE(FindCheckId("K03", &id));
    EXPECT_EQ(id, CheckId::K03);
    EXPECT_FALSE(FindCheckId("K99", &id));
    EXPECT_FALSE(FindCheckId("", &id));
    EXPECT_FALSE(FindCheckId("k03", &id));
}

TEST(CheckIds, ThereAreFiftyOneWithATextEach) {
    EXPECT_EQ(kCheckIdCount, 51u);
    for (u32 i = 0; i < kCheckIdCount; ++i) {
        EXPECT_EQ(static_cast<u32>(CheckIdTable()[i].id), i);
        EXPECT_GT(std::string(CheckIdTable()[i].text).size(), 10u);
    }
}

// Test names carry the invariant they provoke: "H04RootNodeBeyondTheTree".
TEST(CheckIds, EveryOneIsProvokedByATest) {
    std::string names;
    const testing::UnitTest& all = *testing::UnitTest::GetInstance();
    for (int suite = 0; suite < all.total_test_suite_count(); ++suite) {
        for (int i = 0; i < all.GetTestSuite(suite)->total_test_count(); ++i) {
            names += std::string(" ") + all.GetTestSuite(suite)->GetTestInfo(i)->name();
        }
    }
    for (u32 i = 0; i < kCheckIdCount; ++i) {
        EXPECT_NE(names.find(std::string(" ") + CheckIdTable()[i].name), std::string::npos)
            << CheckIdTable()[i].name << " is provoked by no test";
    }
}

}  // namespace VELK::test
