// The table of invariants, and that each has a test that provokes it.
#include <gtest/gtest.h>

#include <fstream>

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

TEST(CheckIds, DocumentTellsTheSame) {
    std::ifstream file(TREEHFS_CHECK_DOCUMENT);
    ASSERT_TRUE(file.is_open());
    const char* scopes[] = {"quick", "default", "full"};
    const char* severities[] = {"info", "warning", "error"};
    std::vector<std::string> rows;
    for (std::string line; std::getline(file, line);) {
        if (line.size() > 6 && line[0] == '|' && line[5] == ' ' && line[3] != 'D') {
            rows.push_back(line);
        }
    }
    ASSERT_EQ(rows.size(), kCheckIdCount);
    for (u32 i = 0; i < kCheckIdCount; ++i) {
        const CheckIdInfo& info = CheckIdTable()[i];
        EXPECT_EQ(rows[i], std::string("| ") + info.name + " | " +
                               scopes[static_cast<u32>(info.scope)] + " | " +
                               severities[static_cast<u32>(info.severity)] + " | " + info.text +
                               " |");
    }
}

// "| `K03` | likely cause | what to do |", each once, in the order of the table.
TEST(CheckIds, DocumentSaysWhatToDoForEach) {
    std::ifstream file(TREEHFS_CHECK_DOCUMENT);
    ASSERT_TRUE(file.is_open());
    u32 count = 0;
    for (std::string line; std::getline(file, line);) {
        if (line.compare(0, 3, "| `") != 0) {
            continue;
        }
        ASSERT_LT(count, kCheckIdCount) << line;
        const std::string head = std::string("| `") + CheckIdTable()[count].name + "` | ";
        EXPECT_EQ(line.substr(0, head.size()), head);
        const std::size_t second = line.find(" | ", head.size());
        ASSERT_NE(second, std::string::npos) << line;
        EXPECT_GT(second, head.size() + 5) << line;
        EXPECT_GT(line.size(), second + 10) << line;
        count += 1;
    }
    EXPECT_EQ(count, kCheckIdCount);
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
