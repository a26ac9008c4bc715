// Scripts that look up, step and expect; and the ways a script ends.
#include <gtest/gtest.h>

#include "script_support.h"

namespace VELK::tool {
namespace {

constexpr char kThree[] =
    "insert 2:a folder{id:16}\ninsert 2:b folder{id:17}\ninsert 2:c folder{id:18}\n";

std::string Without(const std::string& lines, int count) {
    std::size_t at = 0;
    for (; count > 0; --count) {
        at = lines.find('\n', at) + 1;
    }
    return lines.substr(at);
}

std::string AfterThree(const std::string& script) {
    return Without(Lines(kThree + script), 3);
}

TEST(ScriptRead, FindTellsPlaceOrInsertionPoint) {
    EXPECT_EQ(AfterThree("find 2:b\nfind 2:B\nfind 2:bb\nget 2:zzz\n"),
              "4 find   00000000 ok found=yes at=1/3\n"
              "5 find   00000000 ok found=yes at=1/3\n"
              "6 find   00000000 ok found=no at=1/4\n"
              "7 get    A000010E not-found\n");
}

TEST(ScriptRead, StepsDeliverKeyAndPosition) {
    EXPECT_EQ(AfterThree("seek 2:a\nnext\nnext 1\nnext\nhere\nprev 2\n"),
              "4 seek   00000000 ok key=2:\"a\"\n"
              "5 next   00000000 ok key=2:\"b\" size=88 pos=515\n"
              "6 next   00000000 ok key=2:\"c\" size=88 pos=516\n"
              "7 next   A000010E not-found\n"
              "8 here   00000000 ok key=2:\"c\" size=88 pos=516\n"
              "9 prev   00000000 ok key=2:\"a\" size=88 pos=514\n");
}

TEST(ScriptRead, PositionsComeBack) {
    EXPECT_EQ(AfterThree("seek 2:b\npos\nseek first\ngoto 515\ngoto 99999999\n"),
              "4 seek   00000000 ok key=2:\"b\"\n"
              "5 pos    00000000 ok pos=515\n"
              "6 seek   00000000 ok key=1:\"Untitled\"\n"
              "7 goto   00000000 ok key=2:\"b\" size=88 pos=515\n"
              "8 goto   A000010E not-found\n");
}

TEST(ScriptRead, DataIsShownOnDemand) {
    EXPECT_EQ(AfterThree("seek last\nshow data\nhere\nshow nodata\nhere\n"),
              "4 seek   00000000 ok key=2:\"c\"\n"
              "6 here   00000000 ok key=2:\"c\" size=88 pos=516 data=folder{id:18}\n"
              "8 here   00000000 ok key=2:\"c\" size=88 pos=516\n");
}

TEST(ScriptRead, WalkAndDigestAgree) {
    const std::string lines = AfterThree("seek first\nwalk\ndigest\nseek 2:b\nwalk 1\n");
    const std::size_t walk = lines.find("digest=xxh3:");
    const std::size_t digest = lines.find("digest=xxh3:", walk + 1);
    ASSERT_NE(digest, std::string::npos) << lines;
    EXPECT_EQ(lines.substr(walk, 44), lines.substr(digest, 44));
    EXPECT_NE(lines.find("5 walk   00000000 ok count=5 "), std::string::npos);
    EXPECT_NE(lines.find(" records=5\n"), std::string::npos);
    EXPECT_NE(lines.find("8 walk   00000000 ok count=1 "), std::string::npos);
}

TEST(ScriptRead, IdStandsForTheKeyItsThreadNames) {
    EXPECT_EQ(AfterThree("find id:2\ninsert 16:\"\" thread{parent:2,name:\"a\"}\nget id:16\n"
                         "find id:99\n"),
              "4 find   00000000 ok found=yes at=1/0\n"
              "5 insert 00000000 ok at=1/5\n"
              "6 get    00000000 ok size=88 data=folder{id:16}\n"
              "7 find   A000010E not-found\n");
}

TEST(ScriptRead, EmptyTreeHasNoPlace) {
    EXPECT_EQ(Lines("use extents\nfind 5:data:0\nseek first\nnext\nwalk 0\npos\n"),
              "1 use    00000000 ok tree=extents\n"
              "2 find   00000000 ok found=no at=none\n"
              "3 seek   A000010E not-found\n"
              "4 next   A000010E not-found\n"
              "5 walk   00000000 ok count=0 digest=xxh3:99aa06d3014798d86001c324468d497f\n"
              "6 pos    00000000 ok pos=none\n");
}

TEST(ScriptExpect, ChecksStatusAndFields) {
    const Transcript result = Apply("1M,node=512",
                                    "expect ok\n"
                                    "find 2:a\n"
                                    "expect ok found=no at=1/2\n"
                                    "expect ok found=yes\n"
                                    "expect exists nothing=1\n"
                                    "find 2:\"\"\n"
                                    "expect 00000000 found=yes\n",
                                    {});
    EXPECT_EQ(result.out,
              "1 expect 00000001 failed want=operation have=none\n"
              "2 find   00000000 ok found=no at=1/2\n"
              "3 expect 00000000 ok\n"
              "4 expect 00000001 failed want=found=yes have=no\n"
              "5 expect 00000001 failed want=exists have=ok want=nothing=1 have=none\n"
              "6 find   00000000 ok found=yes at=1/1\n"
              "7 expect 00000000 ok\n"
              "s.tr: 7 operations, 4 ok, 3 failed, 3 unexpected\n");
    EXPECT_EQ(result.exitCode, 1);
}

TEST(ScriptEnd, FailingStatusesAreOnlyPrinted) {
    const Transcript result = Apply("1M,node=512", "get 2:a\nget 2:b\nstate\n", {});
    EXPECT_NE(result.out.find("s.tr: 3 operations, 1 ok, 2 not-found, 2 unexpected\n"),
              std::string::npos);
    EXPECT_EQ(result.exitCode, 0);
}

TEST(ScriptEnd, StrictStopsAtTheFirstThatIsNotExpected) {
    const Transcript result =
        Apply("1M,node=512", "get 2:a\nexpect not-found\nget 2:b\nstate\n", {"--strict"});
    EXPECT_EQ(result.out,
              "1 get    A000010E not-found\n"
              "2 expect 00000000 ok\n"
              "3 get    A000010E not-found\n"
              "s.tr: 3 operations, 1 ok, 2 not-found (1 expected), 1 unexpected, stopped\n");
    EXPECT_EQ(result.exitCode, 1);
}

TEST(ScriptEnd, StopOnStopsAtTheseStatusesAlone) {
    const Transcript result = Apply("1M,node=512", "get 2:a\ninsert 1:Untitled zero:88\nstate\n",
                                    {"--stop-on", "exists,corrupt"});
    EXPECT_NE(result.out.find("2 insert A000010F exists\ns.tr: 2 operations"), std::string::npos);
    EXPECT_EQ(result.exitCode, 1);
    EXPECT_EQ(Apply("1M", "state\n", {"--stop-on", "exist"}).err,
              "treehfs apply: --stop-on: unknown status 'exist' (did you mean exists?)\n");
}

TEST(ScriptOutput, StateFollowsEveryLine) {
    const Transcript result = Apply("1M,node=512", "find 2:a\nstate\n", {"--state"});
    EXPECT_EQ(result.out,
              "1 find   00000000 ok found=no at=1/2 depth=1 records=2 root=1 first=1 last=1 "
              "total=16 free=14 dirty=no\n"
              "2 state  00000000 ok depth=1 records=2 root=1 first=1 last=1 total=16 free=14 "
              "dirty=no\n"
              "s.tr: 2 operations, 2 ok, 0 unexpected\n");
}

TEST(ScriptOutput, TraceShowsReportsAndAssertionsInOrder) {
    const Transcript result =
        Apply("1M,node=512", "insert 2:a zero:600\nnode 999\nset trace off\nnode 999\n",
              {"--trace", "-q"});
    EXPECT_EQ(result.out,
              "1 insert A0000115 too-large\n"
              "  ! report 9 line 5026 status A0000115\n"
              "2 node   A000011C corrupt\n"
              "  ! assert 2638\n"
              "4 node   A000011C corrupt\n"
              "s.tr: 3 operations, 0 ok, 1 too-large, 2 corrupt, 3 unexpected\n");
}

TEST(ScriptOutput, JsonLines) {
    const Transcript result = Apply("1M,node=512", "find 2:a\nget 2:a\n", {"--json"});
    EXPECT_EQ(result.out,
              "{\"schema\":\"treehfs.apply/1\",\"script\":\"s.tr\"}\n"
              "{\"line\":1,\"op\":\"find\",\"status\":\"00000000\",\"name\":\"ok\","
              "\"fields\":{\"found\":\"no\",\"at\":\"1/2\"}}\n"
              "{\"line\":2,\"op\":\"get\",\"status\":\"A000010E\",\"name\":\"not-found\","
              "\"fields\":{}}\n"
              "{\"script\":\"s.tr\",\"operations\":2,\"ok\":1,\"statuses\":{\"A000010E\":1},"
              "\"unexpected\":1,\"stopped\":false}\n");
}

TEST(ScriptControl, RepetitionsNest) {
    EXPECT_EQ(Lines("repeat 2\nrepeat 2\nfind 2:x$j$i\nend\necho round $i\nend\nrepeat 0\n"
                    "find 2:never\nend\n"),
              "3 find   00000000 ok found=no at=1/2\n"
              "3 find   00000000 ok found=no at=1/2\n"
              "# round 1\n"
              "3 find   00000000 ok found=no at=1/2\n"
              "3 find   00000000 ok found=no at=1/2\n"
              "# round 2\n");
}

}  // namespace
}  // namespace VELK::tool
