// Keys and records as text and as JSON: whatever is printed is accepted, and means the same bytes.
#include <gtest/gtest.h>

#include "draws.h"
#include "hfs/records/key_text.h"
#include "hfs/records/record_json.h"
#include "hfs/records/record_text.h"
#include "tool/script.h"

namespace VELK {
namespace {

u32 SizeOf(const Bytes& bytes) {
    return static_cast<u32>(bytes.size());
}

rc::Gen<Blanks> AnyBlanks() {
    return rc::gen::element(Blanks::kPlain, Blanks::kEscaped);
}

RC_GTEST_PROP(PrintedText, KeyIsAccepted, ()) {
    const u32 fileId = *AnyTree();
    const Bytes stored = *AnyKey(fileId);
    const std::string text = KeyText(fileId, stored.data(), SizeOf(stored), *AnyBlanks());
    RC_LOG() << text;
    SearchKey key;
    RC_ASSERT(!ParseKey(text, fileId, &key));
    RC_ASSERT(StoredKey(fileId, key) == stored);
}

RC_GTEST_PROP(PrintedText, RecordIsAccepted, ()) {
    const u32 fileId = *AnyTree();
    const Bytes stored = *AnyRecord(fileId);
    const std::string text = DataText(fileId, stored.data(), SizeOf(stored), *AnyBlanks());
    RC_LOG() << text;
    RecordData data;
    RC_ASSERT(!ParseData(text, fileId, &data));
    RC_ASSERT(data.stored == stored);
}

RC_GTEST_PROP(PrintedText, RecordIsALineOfAScript, ()) {
    const u32 fileId = *AnyTree();
    const Bytes key = *AnyKey(fileId);
    const Bytes stored = *AnyRecord(fileId);
    const Blanks blanks = *AnyBlanks();
    const std::string keyText = KeyText(fileId, key.data(), SizeOf(key), blanks);
    const std::string dataText = DataText(fileId, stored.data(), SizeOf(stored), blanks);
    RC_LOG() << keyText << ' ' << dataText;
    tool::Script script;
    tool::ScriptContext context;
    context.fileId = fileId;
    const tool::ScriptProblem problem = tool::ParseScript(
        "drawn", "insert " + keyText + " " + dataText + "  # as printed\n", &context, &script);
    RC_LOG() << problem.what;
    RC_ASSERT(!problem);
    RC_ASSERT(script.lines.size() == 1u);
    RC_ASSERT(script.lines[0].wordCount == 2);
    std::string keyWord, dataWord;
    RC_ASSERT(tool::ExpandWord(script.Words(script.lines[0])[0], {}, &keyWord));
    RC_ASSERT(tool::ExpandWord(script.Words(script.lines[0])[1], {}, &dataWord));
    RC_ASSERT(keyWord == keyText);
    RC_ASSERT(dataWord == dataText);
}

RC_GTEST_PROP(PrintedJson, RecordComesBack, ()) {
    const u32 fileId = *AnyTree();
    const Bytes stored = *AnyKey(fileId);
    const Bytes data = *AnyRecord(fileId);
    std::string line;
    AppendRecordJson(fileId, stored.data(), SizeOf(stored), data.data(), SizeOf(data),
                     {.raw = true, .rawKeys = *rc::gen::arbitrary<bool>()}, &line);
    RC_LOG() << line;
    JsonValue value;
    std::string fault;
    RC_ASSERT(ReadJson(line, &value, &fault));
    SearchKey key;
    Bytes back;
    RC_ASSERT(!RecordFromJson(value, fileId, &key, &back));
    RC_ASSERT(StoredKey(fileId, key) == stored);
    RC_ASSERT(back == data);
}

}  // namespace
}  // namespace VELK
