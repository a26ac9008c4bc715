// Records out as JSON Lines and in again.
#include <gtest/gtest.h>

#include <cstdio>

#include "script_support.h"

namespace VELK::tool {
namespace {

constexpr char kRecords[] =
    "repeat 40\n"
    "insert 2:\"file $i\" file{id:$i,size:5,data:[[$i,1]],created:2026-11-21T01:18:16Z}\n"
    "end\n"
    "insert 2:\"\\ud800 lone\" folder{id:5}\n"
    "insert 16:\"\" thread{parent:2,name:\"file 1\"}\n"
    "use extents\n"
    "insert 1042:rsrc:96 extents{[[100,8],[300,4]]}\n"
    "use attributes\n"
    "insert 17:text inline{\"text\"}\n"
    "insert 17:bytes inline{hex:ff00}\n"
    "insert 17:big fork{size:9000,data:[[40,3]]}\n"
    "insert 17:big:3 extents{[[50,1]]}\n";

class Export : public ::testing::Test {
protected:
    void SetUp() override {
        image_ = TempPath("export.img");
        const Transcript made =
            Apply("1M,node=1024", kRecords, {"--save", image_, "--force", "--strict"});
        ASSERT_EQ(made.exitCode, 0) << made.out;
    }
    void TearDown() override { std::remove(image_.c_str()); }

    Transcript Exported(std::vector<std::string> options) {
        options.push_back(image_);
        return RunTool("export", options);
    }
    Transcript Imported(const std::string& lines, std::vector<std::string> arguments) {
        const std::string file = TempFile("records.jsonl", lines);
        arguments.push_back(file);
        Transcript result = RunTool("import", arguments);
        std::remove(file.c_str());
        for (std::size_t at; (at = result.err.find(file)) != std::string::npos;) {
            result.err.replace(at, file.size(), "FILE");
        }
        return result;
    }

    std::string image_;
};

TEST_F(Export, HeaderRecordsAndSummary) {
    const std::string out = Exported({"-t", "attributes"}).out;
    EXPECT_EQ(out.substr(0, out.find("{\"summary\"")),
              "{\"schema\":\"treehfs.records/1\",\"tree\":\"attributes\",\"node_size\":1024,"
              "\"compare\":\"binary\",\"records\":4}\n"
              "{\"key\":{\"file\":17,\"name\":\"big\"},\"type\":\"fork\",\"size\":9000,"
              "\"data\":[[40,3]],\"blocks\":3,\"raw\":"
              "\"00000020000000000000000000002328000000000000000300000028000000030000000000000000"
              "000000000000000000000000000000000000000000000000000000000000000000000000000000000000"
              "000000000000\"}\n"
              "{\"key\":{\"file\":17,\"name\":\"big\",\"block\":3},\"type\":\"extents\","
              "\"extents\":[[50,1]],\"raw\":"
              "\"00000030000000000000003200000001000000000000000000000000000000000000000000000000"
              "0000000000000000000000000000000000000000000000000000000000000000\"}\n"
              "{\"key\":{\"file\":17,\"name\":\"bytes\"},\"type\":\"inline\",\"size\":2,"
              "\"hex\":\"ff00\",\"raw\":\"00000010000000000000000000000002ff00\"}\n"
              "{\"key\":{\"file\":17,\"name\":\"text\"},\"type\":\"inline\",\"size\":4,"
              "\"text\":\"text\",\"raw\":\"0000001000000000000000000000000474657874\"}\n");
    EXPECT_NE(out.find("{\"summary\":{\"records\":4,\"digest\":\"xxh3:"), std::string::npos);
}

TEST_F(Export, EveryTreeComesBackFromBytesAndFromFields) {
    for (const char* tree : {"catalog", "extents", "attributes"}) {
        for (const bool readable : {false, true}) {
            std::vector<std::string> options = {"-t", tree};
            if (readable) {
                options.push_back("--no-raw");
            }
            const Transcript result = Imported(Exported(options).out, {"--new", "1M,empty"});
            EXPECT_EQ(result.exitCode, 0) << tree << readable << result.err;
            EXPECT_NE(result.out.find(" inserted, 0 refused; digest equals the source\n"),
                      std::string::npos)
                << tree << readable << result.out;
        }
    }
}

TEST_F(Export, KeysThatAreNoReadableOnesBringTheirBytes) {
    const std::string script =
        TempFile("odd.tr", "insert hex:000a0000000200010061ffff hex:00090102\nflush\n");
    // The files' blocks are marked free: a tree that grows would take them.
    EXPECT_EQ(RunTool("apply", {image_, script, "--write"}).err,
              "treehfs: " + image_ + ": the volume is damaged (V05): run check, then --force\n");
    EXPECT_EQ(RunTool("apply", {image_, script, "--write", "--force"}).err,
              "treehfs: " + image_ +
                  ": the volume is damaged (V05): written to all the same, which may make it "
                  "worse\n");
    std::remove(script.c_str());
    const std::string out = Exported({}).out;
    EXPECT_NE(out.find("\"key_raw\":\"000a0000000200010061ffff\",\"type\":\"unknown\""),
              std::string::npos);
    EXPECT_EQ(Imported(out, {"--new", "1M,empty"}).exitCode, 0);
}

TEST_F(Export, RecordsThatExistAreRefusedReplacedOrStopIt) {
    const std::string lines = Exported({}).out;
    const Transcript skipped = Imported(lines, {image_, "-q"});
    EXPECT_EQ(skipped.out, "0 inserted, 44 refused; digest equals the source\n");
    EXPECT_EQ(skipped.exitCode, 1);
    const Transcript replaced = Imported(lines, {image_, "--on-exists", "replace", "-q"});
    EXPECT_EQ(replaced.out, "0 inserted, 44 replaced, 0 refused; digest equals the source\n");
    EXPECT_EQ(replaced.exitCode, 0);
    const Transcript stopped = Imported(lines, {image_, "--on-exists", "stop", "-q"});
    EXPECT_EQ(stopped.out, "0 inserted, 1 refused; stopped at a record that exists\n");
    EXPECT_EQ(stopped.exitCode, 1);
}

// One is larger than a node, which shows before anything is touched. The other is not, but leaves
// no room for the node's own bytes: that shows when the record in its place was taken out already.
TEST_F(Export, ARecordWhoseSuccessorFitsNowhereStays) {
    const std::string copy = TempPath("copy.img");
    Apply("1M,node=1024",
          "use attributes\ninsert 17:bytes inline{\"ab\"}\ninsert 17:text inline{\"text\"}\n",
          {"--save", copy, "--force"});
    const std::string header =
        "{\"schema\":\"treehfs.records/1\",\"tree\":\"attributes\",\"node_size\":1024}\n";
    const auto line = [](const std::string& name, const std::string& size, std::size_t count) {
        std::string value;
        for (std::size_t i = 0; i < count; ++i) {
            value += "78";
        }
        return "{\"key\":{\"file\":17,\"name\":\"" + name +
               "\"},\"type\":\"inline\",\"raw\":\"000000100000000000000000" + size + value +
               "\"}\n";
    };
    const std::vector<std::string> arguments = {copy, "--on-exists", "replace", "--write", "-q"};
    const Transcript larger =
        Imported(header + line("text", "0000044c", 1100) + line("bytes", "00000003", 3), arguments);
    EXPECT_EQ(larger.out, "0 inserted, 1 replaced, 1 refused\n") << larger.err;
    EXPECT_EQ(larger.exitCode, 1);
    const Transcript tight =
        Imported(header + line("bytes", "00000002", 2) + line("text", "000003d8", 984), arguments);
    EXPECT_EQ(tight.err, "treehfs: FILE: line 3: invalid (A0000101): nothing was kept\n");
    EXPECT_EQ(tight.exitCode, 8);
    const std::string out = RunTool("export", {"-t", "attributes", "--no-raw", copy}).out;
    EXPECT_EQ(out.substr(out.find('\n') + 1, out.find("{\"summary\"") - out.find('\n') - 1),
              "{\"key\":{\"file\":17,\"name\":\"bytes\"},\"type\":\"inline\",\"size\":3,"
              "\"text\":\"xxx\"}\n"
              "{\"key\":{\"file\":17,\"name\":\"text\"},\"type\":\"inline\",\"size\":4,"
              "\"text\":\"text\"}\n");
    std::remove(copy.c_str());
}

TEST_F(Export, ImportedRecordsAreKeptByWrite) {
    const std::string copy = TempPath("copy.img");
    Apply("1M,empty", "", {"--save", copy, "--force"});
    const std::string lines = Exported({}).out;
    EXPECT_EQ(Imported(lines, {copy}).err.substr(0, 19), "nothing was written");
    const Transcript result = Imported(lines, {copy, "--write", "--batch", "10"});
    EXPECT_EQ(result.out, "44 inserted, 0 refused; digest equals the source\n");
    EXPECT_EQ(result.err, "");
    EXPECT_EQ(RunTool("export", {copy}).out, lines);
    std::remove(copy.c_str());
}

TEST_F(Export, OrderOfNamesThatDiffersIsSaid) {
    const Transcript result = Imported(Exported({}).out, {"--new", "1M,empty,case"});
    EXPECT_EQ(result.err,
              "treehfs: new volume: names fold case in the source and do not here: the order and "
              "the digest may differ\n");
}

// A zero ends no line, wherever it stands.
TEST_F(Export, LinesWithZerosAreNamed) {
    const std::string zero(1, '\0');
    EXPECT_EQ(Imported(zero + "\n", {"--new", "1M"}).err,
              "treehfs: FILE: line 1: expected a value at character 1\n");
    EXPECT_EQ(Imported("{\"a\":" + zero + "1}\n{}\n", {"--new", "1M"}).err,
              "treehfs: FILE: line 1: expected a value at character 6\n");
}

TEST_F(Export, WrongLinesAreNamed) {
    EXPECT_EQ(Imported("{\"a\":", {"--new", "1M"}).err,
              "treehfs: FILE: line 1: expected a value at character 6\n");
    EXPECT_EQ(Imported("{\"a\":1}\n", {"--new", "1M"}).err,
              "treehfs: FILE: line 1: expected a header line with schema treehfs.records/1\n");
    const std::string header =
        "{\"schema\":\"treehfs.records/1\",\"tree\":\"catalog\",\"node_size\":4096,"
        "\"compare\":\"case-insensitive\"}\n";
    EXPECT_EQ(Imported(header + "{\"type\":\"file\"}\n", {"--new", "1M"}).err,
              "treehfs: FILE: line 2: a record without a key: nothing was kept\n");
    EXPECT_EQ(Imported(header + "{\"key\":{\"parent\":2,\"name\":\"a\"}}\n", {"--new", "1M"}).err,
              "treehfs: FILE: line 2: a record without data: neither raw nor a type of this tree: "
              "nothing was kept\n");
    EXPECT_EQ(Imported(header + "{\"key\":{\"name\":\"a\"},\"raw\":\"00\"}\n", {"--new", "1M"}).err,
              "treehfs: FILE: line 2: key ':\"a\"': expected PARENT:NAME, for example 2:alpha: "
              "nothing was kept\n");
    EXPECT_EQ(Imported("{\"schema\":\"treehfs.records/1\",\"tree\":\"x\"}\n", {"--new", "1M"}).err,
              "treehfs: FILE: line 1: the header names no tree\n");
}

}  // namespace
}  // namespace VELK::tool
