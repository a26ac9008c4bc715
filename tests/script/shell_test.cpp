// The shell on plain input, and what Tab offers.
#include <gtest/gtest.h>

#include <cstdio>

#include "hfs/records/key_text.h"
#include "hfs/records/record_text.h"
#include "hfs/volume/make_volume.h"
#include "script_support.h"
#include "tool/shell_complete.h"

namespace VELK::tool {
namespace {

using Words = std::vector<std::string>;

TEST(Shell, OperationsAndCommandsLookAtTheSameVolume) {
    const Transcript result = Shell(
        "insert 2:Documents folder{id:16}\n"
        "insert 16:\"\" thread{parent:2,name:Documents}\n"
        "insert 16:readme file{id:17,size:3}\n"
        "\n"
        "ls -R\n"
        "find 2:documents\n"
        "exit\n"
        "state\n",
        {"--new", "1M,node=512"});
    EXPECT_EQ(result.out,
              "1 insert 00000000 ok at=1/2\n"
              "2 insert 00000000 ok at=1/3\n"
              "3 insert 00000000 ok at=2/1\n"
              "/Documents\n"
              "/Documents/readme\n"
              "6 find   00000000 ok found=yes at=1/2\n");
    EXPECT_EQ(result.err, "");
    EXPECT_EQ(result.exitCode, 0);
}

TEST(Shell, MistakeCostsOneLineOnly) {
    const Transcript result =
        Shell("inser 2:a zero:4\nuse extents\nfind 2:a\nfind 5:data:0\n", {"--new", "1M"});
    EXPECT_EQ(result.out,
              "2 use    00000000 ok tree=extents\n"
              "4 find   00000000 ok found=no at=none\n");
    EXPECT_EQ(result.err,
              "shell:1: unknown operation 'inser' (did you mean insert?)\n"
              "shell:3: key '2:a' is a catalog key, the tree is extents: use catalog first\n");
}

TEST(Shell, RepetitionRunsAtItsEnd) {
    const Transcript result = Shell("repeat 2\nfind 2:x$i\nend\nrepeat 3\n", {"--new", "1M"});
    EXPECT_EQ(result.out,
              "2 find   00000000 ok found=no at=1/2\n"
              "2 find   00000000 ok found=no at=1/2\n");
    EXPECT_EQ(result.err, "shell:4: repeat without end\n");
}

TEST(Shell, ExpectReachesBackOverLines) {
    EXPECT_EQ(Shell("get 2:a\nexpect not-found\n", {"--new", "1M"}).exitCode, 0);
    EXPECT_EQ(Shell("get 2:a\nexpect ok\n", {"--new", "1M"}).exitCode, 1);
}

TEST(Shell, HelpNamesTheArguments) {
    const Transcript result = Shell("help reserve\nhelp reserv\nhelp\n", {"--new", "1M"});
    EXPECT_EQ(result.out.substr(0, result.out.find('\n')),
              "reserve LOW [HIGH]: reserve nodes for so many changes");
    EXPECT_EQ(result.err, "treehfs: no operation 'reserv' (did you mean reserve?)\n");
    EXPECT_NE(result.out.find("\ninsert KEY DATA "), std::string::npos);
}

TEST(Shell, UnflushedChangesAreDiscardedWhenNobodyCanBeAsked) {
    const std::string image = TempPath("shell.img");
    Apply("1M,node=512", "", {"--save", image, "--force"});
    const Transcript lost = Shell("insert 2:a folder{id:16}\n", {image, "--write"});
    EXPECT_EQ(lost.err, "discarded: 1 node has changed since the last flush\n");
    const Transcript kept = Shell("insert 2:a folder{id:16}\nflush\n", {image, "--write"});
    EXPECT_EQ(kept.out, "1 insert 00000000 ok at=1/2\n2 flush  00000000 ok written=2\n");
    EXPECT_EQ(kept.err, "");
    EXPECT_EQ(Shell("find 2:a\n", {image}).out, "1 find   00000000 ok found=yes at=1/2\n");
    std::remove(image.c_str());
}

class Completion : public ::testing::Test {
protected:
    void SetUp() override {
        FormatOptions options;
        Problem problem;
        volume_ = MakeMemoryVolume(u64{1} << 20, options, &problem);
        ASSERT_TRUE(volume_) << problem.Text();
        Insert("2:Documents", "folder{id:16}");
        Insert("2:\"Down loads\"", "folder{id:17}");
        Insert("2:other", "file{id:18}");
        Insert("16:readme", "file{id:19}");
    }
    void Insert(const std::string& keyText, const std::string& dataText) {
        CBTreeHfs* tree = volume_->Tree(kCatalogFileId, nullptr);
        SearchKey key;
        RecordData data;
        ASSERT_FALSE(ParseKey(keyText, kCatalogFileId, &key));
        ASSERT_FALSE(ParseData(dataText, kCatalogFileId, &data));
        const u32 size = static_cast<u32>(data.stored.size());
        std::vector<u8> host(size);
        tree->convert.DataToMemory(host.data(), data.stored.data(), size);
        ASSERT_EQ(tree->InsertRecord(key.Key(), key.id, host.data(), size), 0);
    }
    Words Candidates(const std::string& before, const std::string& word) {
        return ShellCandidates(volume_.get(), kCatalogFileId, before, word);
    }

    std::unique_ptr<ImageVolume> volume_;
};

TEST_F(Completion, OperationsFirst) {
    EXPECT_EQ(Candidates("", "ins"), Words{"insert"});
    EXPECT_EQ(Candidates("  ", "re"),
              (Words{"replace", "reserve", "release", "restore", "reopen", "repeat"}));
    EXPECT_EQ(Candidates("", "xyz"), Words{});
}

TEST_F(Completion, TreesAndStatuses) {
    EXPECT_EQ(Candidates("use ", "c"), Words{"catalog"});
    EXPECT_EQ(Candidates("expect ", "no"),
              (Words{"no-memory", "not-found", "no-space", "no-tree"}));
    EXPECT_EQ(Candidates("expect ", "j"), Words{"journal-full"});
}

TEST_F(Completion, KeysOfTheTreeInUse) {
    EXPECT_EQ(Candidates("find ", "2:do"), Words{"2:Documents"});
    EXPECT_EQ(Candidates("find ", "2:\"do"), (Words{"2:\"Documents\"", "2:\"Down loads\""}));
    EXPECT_EQ(Candidates("find ", "2:oth"), Words{"2:other"});
    EXPECT_EQ(Candidates("find ", "16:"), Words{"16:readme"});
    EXPECT_EQ(Candidates("find ", "nonsense"), Words{});
}

TEST_F(Completion, Paths) {
    EXPECT_EQ(Candidates("ls ", "/Do"), (Words{"/Documents", "/Down loads"}));
    EXPECT_EQ(Candidates("ls ", "/documents/r"), Words{"/documents/readme"});
    EXPECT_EQ(Candidates("ls ", "/nowhere/r"), Words{});
}

}  // namespace
}  // namespace VELK::tool
