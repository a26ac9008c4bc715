// Scripts that change records: what each line says, and what a failure takes back.
#include <gtest/gtest.h>

#include <cstdio>
#include <fstream>
#include <iterator>

#include "script_support.h"

namespace VELK::tool {
namespace {

TEST(ScriptChange, TranscriptOfTheHandbook) {
    const Transcript result = Apply("1M,node=512",
                                    "use catalog\n"
                                    "insert 2:alpha file{id:16}\n"
                                    "insert 2:alpha file{id:17}\n"
                                    "expect exists\n"
                                    "find 2:beta\n"
                                    "delete 2:alpha\n"
                                    "state\n"
                                    "flush\n",
                                    {});
    EXPECT_EQ(result.out,
              "1 use    00000000 ok tree=catalog\n"
              "2 insert 00000000 ok at=1/2\n"
              "3 insert A000010F exists\n"
              "4 expect 00000000 ok\n"
              "5 find   00000000 ok found=no at=1/3\n"
              "6 delete 00000000 ok\n"
              "7 state  00000000 ok depth=1 records=2 root=1 first=1 last=1 total=16 free=14 "
              "dirty=yes\n"
              "8 flush  00000000 ok written=2\n"
              "s.tr: 8 operations, 7 ok, 1 exists (expected), 0 unexpected\n");
    EXPECT_EQ(result.err, "");
    EXPECT_EQ(result.exitCode, 0);
}

TEST(ScriptChange, UpdateOverwritesDataOfTheSameSize) {
    EXPECT_EQ(Lines("insert 2:a folder{id:16}\n"
                    "update 2:a folder{id:16,valence:7}\n"
                    "get 2:a\n"
                    "seek 2:a\n"
                    "update folder{id:17}\n"
                    "get 2:a\n"
                    "update 2:a same\n"
                    "get 2:a\n"
                    "update 2:none folder{id:1}\n"),
              "1 insert 00000000 ok at=1/2\n"
              "2 update 00000000 ok\n"
              "3 get    00000000 ok size=88 data=folder{id:16,valence:7}\n"
              "4 seek   00000000 ok key=2:\"a\"\n"
              "5 update 00000000 ok\n"
              "6 get    00000000 ok size=88 data=folder{id:17}\n"
              "7 update 00000000 ok\n"
              "8 get    00000000 ok size=88 data=folder{id:17}\n"
              "9 update A000010E not-found\n");
}

TEST(ScriptChange, UpdateOfAnotherSizeIsExplained) {
    const Transcript result =
        Apply("1M,node=512", "insert 2:a folder{id:16}\nupdate 2:a zero:90\nget 2:a\n", {});
    EXPECT_NE(result.out.find("2 update A0000101 invalid holds=88 given=90\n"), std::string::npos);
    EXPECT_NE(result.out.find("3 get    00000000 ok size=88 data=folder{id:16}\n"),
              std::string::npos);
    EXPECT_EQ(result.err, "line 2: update: record holds 88 bytes, 90 given: use replace\n");
}

TEST(ScriptChange, ReplaceTakesAnySize) {
    EXPECT_EQ(Lines("insert 2:a folder{id:16}\n"
                    "replace 2:a file{id:16}\n"
                    "get 2:a\n"
                    "replace 2:b file{id:16}\n"),
              "1 insert 00000000 ok at=1/2\n"
              "2 replace 00000000 ok at=1/2\n"
              "3 get    00000000 ok size=248 data=file{id:16}\n"
              "4 replace A000010E not-found\n");
}

TEST(ScriptChange, ReplacementThatIsRefusedLeavesTheOldRecord) {
    EXPECT_EQ(Lines("insert 2:a folder{id:16}\n"
                    "flush\n"
                    "replace 2:a zero:2000\n"
                    "get 2:a\n"),
              "1 insert 00000000 ok at=1/2\n"
              "2 flush  00000000 ok written=2\n"
              "3 replace A0000115 too-large restored=yes\n"
              "4 get    00000000 ok size=88 data=folder{id:16}\n");
}

TEST(ScriptChange, DeleteByKeyAndAtThePosition) {
    EXPECT_EQ(Lines("insert 2:a folder{id:16}\n"
                    "insert 2:b folder{id:17}\n"
                    "delete 2:c\n"
                    "seek 2:a\n"
                    "delete\n"
                    "find 2:a\n"
                    "delete 2:b\n"
                    "state\n"),
              "1 insert 00000000 ok at=1/2\n"
              "2 insert 00000000 ok at=1/3\n"
              "3 delete A000010E not-found\n"
              "4 seek   00000000 ok key=2:\"a\"\n"
              "5 delete 00000000 ok\n"
              "6 find   00000000 ok found=no at=1/2\n"
              "7 delete 00000000 ok\n"
              "8 state  00000000 ok depth=1 records=2 root=1 first=1 last=1 total=16 free=14 "
              "dirty=yes\n");
}

TEST(ScriptChange, RecordLargerThanANodeIsExplained) {
    const Transcript result = Apply("1M,node=512", "insert 2:big zero:600\n", {});
    EXPECT_NE(result.out.find("1 insert A0000115 too-large\n"), std::string::npos);
    EXPECT_EQ(result.err,
              "line 1: insert: key and data take 614 bytes, a node holds 512 (too-large)\n");
    EXPECT_EQ(Apply("1M,node=512", "insert 2:big zero:600\nexpect too-large\n", {}).err, "");
}

TEST(ScriptChange, FailedChangeTakesTheVolumeBackToTheLastFlush) {
    EXPECT_EQ(Lines("insert 2:a folder{id:16}\n"
                    "flush\n"
                    "insert 2:b folder{id:17}\n"
                    "insert 2:c zero:0\n"
                    "find 2:a\n"
                    "find 2:b\n"
                    "state\n"),
              "1 insert 00000000 ok at=1/2\n"
              "2 flush  00000000 ok written=2\n"
              "3 insert 00000000 ok at=1/3\n"
              "4 insert A0000101 invalid restored=yes\n"
              "5 find   00000000 ok found=yes at=1/2\n"
              "6 find   00000000 ok found=no at=1/3\n"
              "7 state  00000000 ok depth=1 records=3 root=1 first=1 last=1 total=16 free=14 "
              "dirty=no\n");
}

TEST(ScriptChange, VolumeWithoutRoomIsExplained) {
    const Transcript result = Apply("256K,node=512",
                                    "repeat 2000\n"
                                    "insert 2:f$i file{id:$i}\n"
                                    "end\n",
                                    {"--stop-on", "no-space"});
    EXPECT_NE(result.out.find("A0000123 no-space restored=yes"), std::string::npos) << result.out;
    EXPECT_NE(result.err.find(": insert: no-space (A0000123): the volume has no free blocks to "
                              "grow the catalog\n"),
              std::string::npos)
        << result.err;
    EXPECT_EQ(result.exitCode, 1);
}

TEST(ScriptChange, OtherTreesTakeTheirOwnKeys) {
    EXPECT_EQ(Lines("use extents\n"
                    "insert 1042:rsrc:96 extents{[[100,8],[300,4]]}\n"
                    "get 1042:rsrc:96\n"
                    "badblocks\n"
                    "insert 5:data:0 extents{[[7,2],[20,1]]}\n"
                    "badblocks\n"
                    "use attributes\n"
                    "insert 37:\"my tag\" inline{\"two words\"}\n"
                    "seek first\n"
                    "get 37:\"my tag\"\n"),
              "1 use    00000000 ok tree=extents\n"
              "2 insert 00000000 ok at=1/0\n"
              "3 get    00000000 ok size=64 data=extents{[[100,8],[300,4]]}\n"
              "4 badblocks 00000000 ok runs=0 blocks=0\n"
              "5 insert 00000000 ok at=1/0\n"
              "6 badblocks 00000000 ok runs=2 blocks=3\n"
              "7 use    00000000 ok tree=attributes\n"
              "8 insert 00000000 ok at=1/0\n"
              "9 seek   00000000 ok key=37:\"my\\u0020tag\"\n"
              "10 get    00000000 ok size=26 data=inline{\"two\\u0020words\"}\n");
}

TEST(ScriptChange, PlainHexDrivesIt) {
    EXPECT_EQ(Lines("insert hex:00080000000200010061 "
                    "hex:00030000000000020001006100\n"
                    "get 2:a\n"),
              "1 insert 00000000 ok at=1/2\n"
              "2 get    00000000 ok size=14 data=hex:0003000000000002000100610000\n");
}

TEST(ScriptChange, ThousandsOfRecordsStaySound) {
    const Transcript result = Apply("4M,node=512",
                                    "repeat 3000\n"
                                    "insert 2:\"name $i\" file{id:$i}\n"
                                    "end\n"
                                    "check\n"
                                    "expect ok errors=0 warnings=0\n"
                                    "repeat 1500\n"
                                    "delete 2:\"name $i\"\n"
                                    "end\n"
                                    "check\n"
                                    "expect ok errors=0 warnings=0\n"
                                    "seek first\n"
                                    "walk\n"
                                    "expect ok count=1502\n"
                                    "flush\n"
                                    "reopen\n"
                                    "digest\n"
                                    "expect ok records=1502\n",
                                    {"--strict"});
    EXPECT_EQ(result.exitCode, 0) << result.out.substr(result.out.size() - 400);
    EXPECT_NE(result.out.find("s.tr: 4511 operations, 4511 ok, 0 unexpected\n"), std::string::npos);
}

TEST(ScriptChange, TwoRunsGiveTheSameBytes) {
    const std::string script =
        "repeat 300\ninsert 2:f$i file{id:$i}\nend\nrepeat 100\ndelete 2:f$i\nend\nflush zero\n";
    std::string images[2];
    std::string outputs[2];
    for (int run = 0; run < 2; ++run) {
        const std::string path = TempPath("saved.img");
        outputs[run] = Apply("1M,node=512", script, {"--save", path, "--state"}).out;
        std::ifstream file(path, std::ios::binary);
        images[run].assign(std::istreambuf_iterator<char>(file), {});
        std::remove(path.c_str());
    }
    EXPECT_EQ(images[0].size(), std::size_t{1} << 20);
    EXPECT_EQ(images[0], images[1]);
    EXPECT_EQ(outputs[0], outputs[1]);
}

}  // namespace
}  // namespace VELK::tool
