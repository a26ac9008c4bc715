// Scripts as text: words, repetitions, included files, and the line that names each mistake.
#include <gtest/gtest.h>

#include <cstdio>
#include <fstream>
#include <iterator>

#include "hfs/records/record_fields.h"
#include "script_support.h"
#include "tool/script.h"

namespace VELK::tool {
namespace {

std::string Mistake(const std::string& text) {
    Script script;
    ScriptContext context;
    const ScriptProblem problem = ParseScript("split.tr", text, &context, &script);
    return problem ? problem.Text() : std::string();
}

Script Parsed(const std::string& text) {
    Script script;
    ScriptContext context;
    const ScriptProblem problem = ParseScript("split.tr", text, &context, &script);
    EXPECT_FALSE(problem) << problem.Text();
    return script;
}

TEST(ScriptWords, BlanksSeparateSaveInsideQuotesAndBraces) {
    const Script script =
        Parsed("insert 2:\"a b # c\" thread{parent:2, name:\"x } y\"}  # remark\n");
    ASSERT_EQ(script.lines.size(), 1u);
    EXPECT_EQ(script.lines[0].wordCount, 2);
    EXPECT_EQ(script.Words(script.lines[0])[0], "2:\"a b # c\"");
    EXPECT_EQ(script.Words(script.lines[0])[1], "thread{parent:2, name:\"x } y\"}");
}

TEST(ScriptWords, WordInQuotesLosesThem) {
    const Script script = Parsed("insert \"hex:0008 00000002 0001 0061\" \"hex:00 01\"\n");
    EXPECT_EQ(script.Words(script.lines[0])[0], "hex:0008 00000002 0001 0061");
    EXPECT_EQ(script.Words(script.lines[0])[1], "hex:00 01");
}

TEST(ScriptWords, EmptyLinesAndRemarksAreNothing) {
    const Script script = Parsed("#!treehfs apply --script 1\n\n   \t\r\n# x\nstate\r\nflush");
    ASSERT_EQ(script.lines.size(), 2u);
    EXPECT_EQ(script.lines[0].line, 5u);
    EXPECT_EQ(script.lines[1].line, 6u);
}

TEST(ScriptMistake, NamesFileLineAndWord) {
    EXPECT_EQ(Mistake("use catalog\nstate\ninser 2:a zero:4\n"),
              "split.tr:3: unknown operation 'inser' (did you mean insert?)");
    EXPECT_EQ(Mistake("insert 2:alpha\n"), "split.tr:1: insert: expected insert KEY DATA");
    EXPECT_EQ(Mistake("insert 2-alpha zero:4\n"),
              "split.tr:1: key '2-alpha': expected PARENT:NAME, for example 2:alpha");
    EXPECT_EQ(Mistake("insert 5:data:0 zero:64\n"),
              "split.tr:1: key '5:data:0' is an extents key, the tree is catalog: use extents "
              "first");
    EXPECT_EQ(Mistake("find hex:00zz\n"),
              "split.tr:1: hex:00zz: 'z' at digit 3 is not hexadecimal");
    EXPECT_EQ(Mistake("insert hex:0010000000020002 zero:4\n"),
              "split.tr:1: hex:0010 ... : length field says 16 bytes, 6 follow");
    EXPECT_EQ(Mistake("insert 2:a hex:000\n"),
              "split.tr:1: hex:000: 3 digits are no whole number of bytes");
    EXPECT_EQ(Mistake("insert 2:a same\n"), "split.tr:1: 'same' is for update and replace");
    EXPECT_EQ(Mistake("use catlog\n"),
              "split.tr:1: use: expected catalog, extents or attributes, not 'catlog' (did you "
              "mean catalog?)");
    EXPECT_EQ(Mistake("next x\n"), "split.tr:1: next: 'x' is no number from 0 to 2147483647");
    EXPECT_EQ(Mistake("expect exist\n"),
              "split.tr:1: unknown status 'exist' (did you mean exists?)");
    EXPECT_EQ(Mistake("expect ok found\n"), "split.tr:1: expected FIELD=VALUE, not 'found'");
    EXPECT_EQ(Mistake("find \"2:a\n"), "split.tr:1: a string is not closed");
    EXPECT_EQ(Mistake("insert 2:a file{id:1\n"), "split.tr:1: a brace or bracket is not closed");
    EXPECT_EQ(Mistake("fail read after\n"), "split.tr:1: 'after' needs a number");
    EXPECT_EQ(Mistake("set trace maybe\n"), "split.tr:1: set: expected on or off, not 'maybe'");
    EXPECT_EQ(Mistake("state now\n"), "split.tr:1: state: expected state");
    EXPECT_EQ(Mistake("reserve 65536\n"),
              "split.tr:1: reserve: '65536' is no number from 0 to 65535");
    EXPECT_EQ(Mistake("#!treehfs apply --script 2\n"),
              "split.tr:1: language version '2' is not known, this program knows 1");
}

TEST(ScriptMistake, KeysAreReadForTheTreeInUse) {
    EXPECT_EQ(Mistake("use extents\ninsert 5:data:0 extents{[[1,2]]}\n"), "");
    EXPECT_EQ(Mistake("use extents\ninsert 2:alpha zero:64\n"),
              "split.tr:2: key '2:alpha' is a catalog key, the tree is extents: use catalog first");
    EXPECT_EQ(Mistake("use attributes\ninsert 20:tag inline{\"x\"}\n"), "");
}

TEST(ScriptMistake, Repetitions) {
    EXPECT_EQ(Mistake("repeat 3\nstate\n"), "split.tr:1: repeat without end");
    EXPECT_EQ(Mistake("state\nend\n"), "split.tr:2: end without repeat");
    EXPECT_EQ(Mistake("repeat 3\nrepeat 2\nend\nend\n"), "");
    EXPECT_EQ(Mistake("find 2:f$i\n"),
              "split.tr:1: $i, $j and $k stand for the numbers of repetitions: there are 0 here");
    EXPECT_EQ(Mistake("repeat 2\nfind 2:f$j\nend\n"),
              "split.tr:2: $i, $j and $k stand for the numbers of repetitions: there are 1 here");
    EXPECT_EQ(Mistake("repeat 9999999999\ninsert 2:f file{id:$i}\nend\n"),
              "split.tr:2: data 'file{id:9999999999}': '9999999999' is no value for 'id'");
}

TEST(ScriptInclude, LinesStandWhereTheFileIsNamed) {
    const std::string inner = TempFile("inner.tr", "state\nflush\n");
    const Script script = Parsed("use catalog\ninclude " + inner + "\nstate\n");
    ASSERT_EQ(script.lines.size(), 4u);
    EXPECT_EQ(script.lines[2].op, ScriptOp::kFlush);
    EXPECT_EQ(script.files[script.lines[2].file], inner);
    EXPECT_EQ(script.lines[2].line, 2u);
    std::remove(inner.c_str());
}

TEST(ScriptInclude, MistakesNameTheInnerFile) {
    const std::string inner = TempFile("inner.tr", "state\nflus\n");
    EXPECT_EQ(Mistake("include " + inner + "\n"),
              inner + ":2: unknown operation 'flus' (did you mean flush?)");
    std::remove(inner.c_str());
    EXPECT_EQ(Mistake("include nowhere.tr\n"),
              "split.tr:1: include: cannot read 'nowhere.tr': no such file");
}

TEST(ScriptInclude, RepetitionsDoNotCrossFiles) {
    const std::string inner = TempFile("inner.tr", "end\n");
    EXPECT_EQ(Mistake("repeat 2\ninclude " + inner + "\nend\n"), inner + ":1: end without repeat");
    std::remove(inner.c_str());
}

TEST(ScriptInclude, FileThatIncludesItselfIsRefused) {
    const std::string path = TempPath("ring.tr");
    TempFile("ring.tr", "include " + path + "\n");
    EXPECT_NE(Mistake("include " + path + "\n").find("includes itself"), std::string::npos);
    std::remove(path.c_str());
}

TEST(ScriptParsed, NothingRunsWhenALineIsWrong) {
    const Transcript result = Apply("1M,node=512", "insert 2:a zero:88\ninser\n", {});
    EXPECT_EQ(result.exitCode, 16);
    EXPECT_EQ(result.out, "");
    EXPECT_EQ(result.err, "s.tr:2: unknown operation 'inser' (did you mean insert?)\n");
}

TEST(ScriptParsed, MissingScriptIsNoMistakeOfForm) {
    const Transcript result = RunTool("apply", {"--new", "1M", "/nowhere/x.tr"});
    EXPECT_EQ(result.exitCode, 8);
    EXPECT_EQ(result.err, "treehfs: /nowhere/x.tr: cannot read the script: no such file\n");
}

TEST(ScriptParsed, MarkOfUtf8AtTheStartIsPassedOver) {
    const std::string path = TempFile("marked.tr", "\xEF\xBB\xBF#!treehfs apply\nstate\n");
    EXPECT_EQ(RunTool("apply", {"--new", "1M", path}).err, "");
    EXPECT_EQ(RunTool("apply", {"--new", "1M", path}).exitCode, 0);
    std::remove(path.c_str());
}

TEST(ScriptHandbook, NamesEveryOperationAndField) {
    std::ifstream script(TREEHFS_DOCS "/script.md");
    const std::string text(std::istreambuf_iterator<char>(script), {});
    ASSERT_FALSE(text.empty());
    for (const std::string& name : ScriptOpNames()) {
        EXPECT_TRUE(text.find("`" + name) != std::string::npos ||
                    text.find("... " + name + "`") != std::string::npos)
            << name;
    }
    std::ifstream records(TREEHFS_DOCS "/records.md");
    const std::string fields(std::istreambuf_iterator<char>(records), {});
    for (u32 i = 0; i < kRecordKindCount; ++i) {
        for (u32 k = 0; k < kRecordKinds[i].fieldCount; ++k) {
            const std::string name = kRecordKinds[i].fields[k].name;
            EXPECT_TRUE(fields.find("`" + name + "`") != std::string::npos) << name;
        }
    }
}

TEST(ExpandWord, CountersStandForTheirNumbers) {
    std::string word;
    EXPECT_TRUE(ExpandWord("2:f$i_$j$", {7, 20}, &word));
    EXPECT_EQ(word, "2:f7_20$");
    EXPECT_FALSE(ExpandWord("$k", {7, 20}, &word));
}

}  // namespace
}  // namespace VELK::tool
