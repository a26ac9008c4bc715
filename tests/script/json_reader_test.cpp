// JSON as import meets it: every kind of value, halves of pairs, and what is no JSON.
#include "hfs/records/json_reader.h"

#include <gtest/gtest.h>

namespace VELK::tool {
namespace {

JsonValue Read(const std::string& text) {
    JsonValue value;
    std::string fault;
    EXPECT_TRUE(ReadJson(text, &value, &fault)) << fault;
    return value;
}

std::string Fault(const std::string& text) {
    JsonValue value;
    std::string fault;
    EXPECT_FALSE(ReadJson(text, &value, &fault)) << text;
    return fault;
}

TEST(JsonReader, ValuesOfEveryKind) {
    const JsonValue value = Read(
        " {\"a\": 12, \"b\":[true,false,null,-1.5e3], \"c\":\"x\\n\\u00e9\", \"d\":{}, "
        "\"e\":[]} ");
    EXPECT_EQ(value.Find("a")->number, "12");
    ASSERT_EQ(value.Find("b")->items.size(), 4u);
    EXPECT_TRUE(value.Find("b")->items[0].isTrue);
    EXPECT_FALSE(value.Find("b")->items[1].isTrue);
    EXPECT_EQ(value.Find("b")->items[2].kind, JsonValue::Kind::kNull);
    EXPECT_EQ(value.Find("b")->items[3].number, "-1.5e3");
    EXPECT_EQ(value.Find("c")->units, u"x\n\u00e9");
    EXPECT_EQ(value.Find("d")->kind, JsonValue::Kind::kObject);
    EXPECT_EQ(value.Find("e")->kind, JsonValue::Kind::kArray);
    EXPECT_EQ(value.Find("f"), nullptr);
}

TEST(JsonReader, HalvesOfPairsSurvive) {
    EXPECT_EQ(Read("\"\\ud800x\"").units, (NameUnits{0xD800, u'x'}));
    EXPECT_EQ(Read("\"\\ud83d\\ude00\"").units, u"\U0001F600");
}

TEST(JsonReader, RefusesWhatIsNoJson) {
    EXPECT_EQ(Fault(""), "expected a value at character 1");
    EXPECT_EQ(Fault("{"), "expected a name in double quotes at character 2");
    EXPECT_EQ(Fault("{\"a\" 1}"), "expected ':' at character 6");
    EXPECT_EQ(Fault("[1 2]"), "expected ',' or ']' at character 4");
    EXPECT_EQ(Fault("{} x"), "expected nothing more at character 4");
    EXPECT_EQ(Fault("\"open"), "expected a string at character 1");
    EXPECT_EQ(Fault("tru"), "expected a value at character 1");
    Fault(std::string(100, '['));
}

}  // namespace
}  // namespace VELK::tool
