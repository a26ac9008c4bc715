// See script_line.h.
#include "script_line.h"

#include <iterator>

#include "hfs/records/record_fields.h"

namespace VELK::fuzz {

namespace {

using Texts = const char* const;

template <std::size_t kCount>
std::string OneOf(Mutator* mutator, Texts (&texts)[kCount]) {
    return texts[mutator->Below(kCount)];
}

std::string Number(Mutator* mutator) {
    static Texts kNumbers[] = {
        "0",          "1",    "2",          "3",   "7",          "8",
        "9",          "16",   "255",        "512", "65536",      "2147483648",
        "4294967295", "0x10", "0xFFFFFFFF", "-1",  "4294967296", "1099511627776",
        "$i",         ""};
    return OneOf(mutator, kNumbers);
}

std::string Hex(Mutator* mutator) {
    std::string text = "hex:";
    const u32 count = mutator->Below(24);
    if (mutator->OneIn(2)) {  // a length field that is right, for a key
        const char kDigits[] = "0123456789abcdef";
        text += {'0', '0', kDigits[count / 16], kDigits[count % 16]};
    }
    for (u32 i = 0; i < count; ++i) {
        text += mutator->OneIn(3) ? "01" : mutator->OneIn(8) ? "f" : "00";
    }
    return text;
}

std::string Name(Mutator* mutator) {
    static Texts kNames[] = {"a",
                             "n$i",
                             "\"a b\"",
                             "\"\"",
                             "\"\\u0301e\"",
                             "\"\\\"\"",
                             "\"\\x\"",
                             "\xC3\xA9",
                             "\xFF",
                             "\"\\uD800\"",
                             "data",
                             "rsrc",
                             "\"\xF0\x9F\x98\x80\"",
                             "a\\b",
                             "\"a:b/c\"",
                             "a/b",
                             "\"open",
                             "a%2Fb"};
    return OneOf(mutator, kNames);
}

std::string Key(Mutator* mutator) {
    if (mutator->OneIn(4)) {
        return Hex(mutator);
    }
    const std::string key = Number(mutator) + ":" + Name(mutator);
    return mutator->OneIn(2) ? key + ":" + Number(mutator) : key;
}

std::string Extents(Mutator* mutator) {
    std::string text = "[";
    for (u32 left = mutator->Below(10); left > 0; --left) {
        text += "[" + Number(mutator) + "," + Number(mutator) + (left > 1 ? "]," : "]");
    }
    return text + "]";
}

std::string Value(Mutator* mutator, FieldKind kind) {
    static Texts kDates[] = {"2001-02-03T04:05:06", "2001-02-03", "2040-02-06T06:28:15Z",
                             "1903-12-31",          "2001-02-30", "3000000000"};
    static Texts kCodes[] = {"\"TEXT\"", "\"TE\\u00e9T\"", "0x54455854", "\"LONGER\"", "0"};
    if (kind == FieldKind::kDate || mutator->OneIn(16)) {
        return OneOf(mutator, kDates);
    }
    if (kind == FieldKind::kCode || mutator->OneIn(16)) {
        return OneOf(mutator, kCodes);
    }
    return kind == FieldKind::kExtents || mutator->OneIn(16) ? Extents(mutator) : Number(mutator);
}

std::string Record(Mutator* mutator) {
    const RecordKind& kind = kRecordKinds[mutator->Below(kRecordKindCount)];
    std::string text = std::string(kind.name) + "{";
    if (kind.type == kInlineAttribute) {
        return text + (mutator->OneIn(2) ? Name(mutator) : Hex(mutator)) + "}";
    }
    if (kind.fieldCount == 0 || kind.fields[0].kind == FieldKind::kExtents) {
        return text + Extents(mutator) + "}";
    }
    for (u32 left = mutator->Below(6); left > 0; --left) {
        const Field& field = kind.fields[mutator->Below(kind.fieldCount)];
        text += std::string(field.name) + ":" + Value(mutator, field.kind) + (left > 1 ? "," : "");
    }
    if (mutator->OneIn(4)) {
        text += ",name:" + Name(mutator);
    }
    return text + "}";
}

std::string Data(Mutator* mutator) {
    switch (mutator->Below(6)) {
        case 0:
            return "zero:" + Number(mutator);
        case 1:
            return "fill:" + Hex(mutator).substr(4) + "*" + Number(mutator);
        case 2:
            return mutator->OneIn(2) ? "seq:" + Number(mutator) : "same";
        case 3:
            return Hex(mutator);
        default:
            return Record(mutator);
    }
}

}  // namespace

std::string RecordWord(Mutator* mutator) {
    const RecordKind& kind = kRecordKinds[mutator->Below(kRecordKindCount)];
    if (kind.fieldCount == 0 || mutator->OneIn(4)) {
        return std::string(kind.name) + "{";
    }
    return std::string(",") + kind.fields[mutator->Below(kind.fieldCount)].name + ":";
}

// In the forms K stands for a key, D for data, N for a number.
std::string ScriptLineText(Mutator* mutator) {
    static Texts kForms[] = {"insert K D",
                             "insert K D",
                             "insert K D",
                             "update K D",
                             "update D",
                             "replace K D",
                             "delete K",
                             "find K",
                             "get K",
                             "seek K",
                             "seek last",
                             "use catalog",
                             "use extents",
                             "use attributes",
                             "next N",
                             "prev N",
                             "goto N",
                             "walk N",
                             "reserve N N",
                             "extend N N",
                             "create N N",
                             "flush zero",
                             "node N",
                             "check quick",
                             "expect ok",
                             "expect exists,not-found",
                             "expect N nodes=N",
                             "set trace on",
                             "show nodata",
                             "fail alloc after N times N",
                             "fail journal",
                             "fail off",
                             "repeat N",
                             "end",
                             "echo D"};
    std::string line;
    for (const char letter : OneOf(mutator, kForms)) {
        line += letter == 'K'   ? Key(mutator)
                : letter == 'D' ? Data(mutator)
                : letter == 'N' ? Number(mutator)
                                : std::string(1, letter);
    }
    return line + "\n";
}

}  // namespace VELK::fuzz
