// Scripts that work on a whole tree: creating, growing, keeping, dropping, failing on purpose.
#include <gtest/gtest.h>

#include <cstdio>

#include "script_support.h"

namespace VELK::tool {
namespace {

std::string LinesOf(const std::string& volume, const std::string& script) {
    const Transcript result = Apply(volume, script, {"-q"});
    return result.out.substr(0, result.out.rfind("s.tr: "));
}

TEST(ScriptTree, CreateMakesAnAbsentTree) {
    EXPECT_EQ(LinesOf("1M,empty,map=512",
                      "use attributes\n"
                      "state\n"
                      "insert 16:tag inline{\"x\"}\n"
                      "create 8\n"
                      "create 16\n"
                      "create 9 8192\n"
                      "insert 16:tag inline{\"x\"}\n"
                      "create 9\n"),
              "1 use    00000000 ok tree=attributes absent=yes\n"
              "2 state  00000000 ok absent=yes\n"
              "3 insert A0000101 invalid absent=yes\n"
              "4 create A0000101 invalid restored=yes\n"
              "5 create A0000101 invalid restored=yes\n"
              "6 create 00000000 ok total=16 free=15\n"
              "7 insert 00000000 ok at=1/0\n"
              "8 create A000010F exists\n");
}

TEST(ScriptTree, ReservationsHaveOwners) {
    EXPECT_EQ(LinesOf("1M,node=512",
                      "reserve 3\n"
                      "reserve 1 1\n"
                      "header\n"
                      "release\n"
                      "release\n"
                      "release\n"),
              "1 reserve 00000000 ok owner=yes nodes=4\n"
              "2 reserve 00000000 ok owner=no nodes=0\n"
              "3 header 00000000 ok node=512 map=512 maxkey=516 clump=8192 type=00 compare=CF "
              "attributes=6 valid=16 cached=0 reserved=6\n"
              "4 release 00000000 ok nodes=0\n"
              "5 release 00000000 ok nodes=4\n"
              "6 release A0000101 invalid held=none\n");
}

TEST(ScriptTree, ExtendGrowsTheFile) {
    EXPECT_EQ(LinesOf("1M,node=512", "extend 17\nstate\ncheck\n"),
              "1 extend 00000000 ok total=32 free=30\n"
              "2 state  00000000 ok depth=1 records=2 root=1 first=1 last=1 total=32 free=30 "
              "dirty=yes\n"
              "3 check  00000000 ok errors=0 warnings=0 nodes=2\n");
}

TEST(ScriptTree, RestoreAndReopenDropWhatNoFlushHasKept) {
    EXPECT_EQ(LinesOf("1M,node=512",
                      "insert 2:a folder{id:16}\n"
                      "flush\n"
                      "insert 2:b folder{id:17}\n"
                      "restore\n"
                      "find 2:b\n"
                      "insert 2:c folder{id:18}\n"
                      "reopen\n"
                      "find 2:c\n"
                      "find 2:a\n"
                      "reopen\n"),
              "1 insert 00000000 ok at=1/2\n"
              "2 flush  00000000 ok written=2\n"
              "3 insert 00000000 ok at=1/3\n"
              "4 restore 00000000 ok\n"
              "5 find   00000000 ok found=no at=1/3\n"
              "6 insert 00000000 ok at=1/3\n"
              "7 reopen 00000000 ok dropped=yes\n"
              "8 find   00000000 ok found=no at=1/3\n"
              "9 find   00000000 ok found=yes at=1/2\n"
              "10 reopen 00000000 ok\n");
}

TEST(ScriptTree, ClearHandsOverAndRestoreStillTakesBack) {
    EXPECT_EQ(LinesOf("1M,node=512",
                      "insert 2:a folder{id:16}\n"
                      "clear\n"
                      "clear\n"
                      "restore\n"
                      "find 2:a\n"),
              "1 insert 00000000 ok at=1/2\n"
              "2 clear  00000000 ok written=1\n"
              "3 clear  00000000 ok written=0\n"
              "4 restore 00000000 ok\n"
              "5 find   00000000 ok found=no at=1/2\n");
}

TEST(ScriptFault, EachServiceFailsWhenTold) {
    EXPECT_EQ(LinesOf("1M,node=512",
                      "insert 2:a folder{id:16}\n"
                      "flush\n"
                      "fail write\n"
                      "insert 2:b folder{id:17}\n"
                      "flush\n"
                      "find 2:b\n"
                      "flush\n"
                      "reopen\n"
                      "fail read times 1\n"
                      "find 2:a\n"
                      "find 2:a\n"
                      "reopen\n"
                      "fail alloc after 0 times 1\n"
                      "find 2:a\n"
                      "fail journal\n"
                      "insert 2:d folder{id:18}\n"
                      "insert 2:d folder{id:18}\n"
                      "fail off\n"
                      "check\n"),
              "1 insert 00000000 ok at=1/2\n"
              "2 flush  00000000 ok written=2\n"
              "3 fail   00000000 ok fail=write after=0 times=1\n"
              "4 insert 00000000 ok at=1/3\n"
              "5 flush  A0000302 status written=1 restored=yes\n"
              "6 find   00000000 ok found=no at=1/3\n"
              "7 flush  00000000 ok written=0\n"
              "8 reopen 00000000 ok\n"
              "9 fail   00000000 ok fail=read after=0 times=1\n"
              "10 find   A0000301 status\n"
              "11 find   00000000 ok found=yes at=1/2\n"
              "12 reopen 00000000 ok\n"
              "13 fail   00000000 ok fail=alloc after=0 times=1\n"
              "14 find   A0000107 no-memory\n"
              "15 fail   00000000 ok fail=journal after=0 times=1\n"
              "16 insert A0000303 status restored=yes\n"
              "17 insert 00000000 ok at=1/3\n"
              "18 fail   00000000 ok fail=off\n"
              "19 check  00000000 ok errors=0 warnings=0 nodes=2\n");
}

TEST(ScriptFault, TreeThatCannotBeOpenedIsNotCalledAbsent) {
    const std::string image = TempPath("fault.img");
    Apply("1M,node=512", "", {"--save", image, "--force"});
    const std::string script = TempFile("fault.tr",
                                        "fail read\n"
                                        "find 2:a\n"
                                        "use attributes\n"
                                        "fail read\n"
                                        "use extents\n");
    EXPECT_EQ(RunTool("apply", {image, script}).out,
              "1 fail   00000000 ok fail=read after=0 times=1\n"
              "2 find   A0000301 status\n"
              "3 use    00000000 ok tree=attributes\n"
              "4 fail   00000000 ok fail=read after=0 times=1\n"
              "5 use    A0000301 status tree=extents\n" +
                  script + ": 5 operations, 3 ok, 2 A0000301, 2 unexpected\n");
    std::remove(image.c_str());
    std::remove(script.c_str());
}

TEST(ScriptFault, TreeIsOpenedWhenThereIsMemoryAgain) {
    const std::string image = TempPath("fault.img");
    Apply("1M,node=512", "", {"--save", image, "--force"});
    const std::string script = TempFile("fault.tr", "fail alloc\nfind 2:a\nfind 2:a\n");
    EXPECT_EQ(RunTool("apply", {image, script, "-q"}).out,
              "1 fail   00000000 ok fail=alloc after=0 times=1\n"
              "2 find   A0000107 no-memory\n"
              "3 find   00000000 ok found=no at=1/2\n" +
                  script + ": 3 operations, 2 ok, 1 no-memory, 1 unexpected\n");
    std::remove(image.c_str());
    std::remove(script.c_str());
}

TEST(ScriptFault, OnlyOnVolumesInMemory) {
    const std::string image = TempPath("fault.img");
    Apply("1M", "state\n", {"--save", image});
    const std::string script = TempFile("fault.tr", "fail read\n");
    const Transcript result = RunTool("apply", {image, script, "--write"});
    EXPECT_EQ(result.exitCode, 16);
    EXPECT_EQ(result.err, script + ":1: failures are for volumes whose changes stay in memory\n");
    EXPECT_EQ(RunTool("apply", {image, script}).exitCode, 0);
    std::remove(image.c_str());
    std::remove(script.c_str());
}

TEST(ScriptVolume, ChangesStayInMemoryUnlessWriteIsGiven) {
    const std::string image = TempPath("write.img");
    Apply("1M,node=512", "state\n", {"--save", image});
    const std::string change = TempFile("change.tr", "insert 2:a folder{id:16}\nflush\n");
    const std::string look = TempFile("look.tr", "find 2:a\ncheck\n");
    EXPECT_EQ(RunTool("apply", {image, change}).err,
              "nothing was written: 2 blocks changed in memory; add --write to keep them\n");
    EXPECT_NE(RunTool("apply", {image, look}).out.find("found=no"), std::string::npos);
    EXPECT_EQ(RunTool("apply", {image, change, "--write"}).err, "");
    const Transcript after = RunTool("apply", {image, look});
    EXPECT_NE(after.out.find("found=yes"), std::string::npos);
    EXPECT_NE(after.out.find("errors=0"), std::string::npos);
    EXPECT_EQ(after.err, "");
    for (const std::string& path : {image, change, look}) {
        std::remove(path.c_str());
    }
}

TEST(ScriptVolume, WrongNewVolumeIsExplained) {
    EXPECT_EQ(Apply("1M,nod=512", "state\n", {}).exitCode, 16);
    EXPECT_NE(Apply("1M,nod=512", "state\n", {}).err.find("did you mean node?"), std::string::npos);
    EXPECT_EQ(Apply("x", "state\n", {}).exitCode, 16);
    EXPECT_EQ(Apply("1M,block=1000", "state\n", {}).exitCode, 16);
    EXPECT_EQ(RunTool("apply", {"only-one"}).exitCode, 16);
}

TEST(ScriptVolume, CaseSensitiveVolumeTellsNamesApart) {
    EXPECT_EQ(
        LinesOf("1M,node=512,case", "insert 2:a folder{id:16}\ninsert 2:A folder{id:17}\ncheck\n"),
        "1 insert 00000000 ok at=1/2\n"
        "2 insert 00000000 ok at=1/2\n"
        "3 check  00000000 ok errors=0 warnings=0 nodes=2\n");
}

TEST(ScriptVolume, SavedFileIsNotOverwrittenUnasked) {
    const std::string image = TempFile("saved.img", "old");
    EXPECT_EQ(Apply("1M", "state\n", {"--save", image}).err,
              "treehfs: " + image + " exists: --force replaces it\n");
    EXPECT_EQ(Apply("1M", "state\n", {"--save", image, "--force"}).err, "");
    std::remove(image.c_str());
}

}  // namespace
}  // namespace VELK::tool
