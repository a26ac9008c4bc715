// A recursive reader of JSON with a bounded depth.
#include "hfs/records/json_reader.h"

#include "hfs/records/quoted.h"

namespace VELK {
namespace {

constexpr int kDeepest = 32;

class Reader {
public:
    explicit Reader(std::string_view text) : text_(text) {}

    bool ReadWhole(JsonValue* value, std::string* fault) {
        if (ReadValue(value, 0)) {
            SkipBlanks();
            if (at_ == text_.size()) {
                return true;
            }
            fault_ = "nothing more";
        }
        *fault = "expected " + fault_ + " at character " + std::to_string(at_ + 1);
        return false;
    }

private:
    bool Fail(const char* expected) {
        if (fault_.empty()) {
            fault_ = expected;
        }
        return false;
    }
    void SkipBlanks() {
        while (at_ < text_.size() && (text_[at_] == ' ' || text_[at_] == '\t' ||
                                      text_[at_] == '\r' || text_[at_] == '\n')) {
            ++at_;
        }
    }
    bool Take(char wanted) {
        SkipBlanks();
        if (at_ < text_.size() && text_[at_] == wanted) {
            ++at_;
            return true;
        }
        return false;
    }
    bool TakeWord(std::string_view word) {
        if (text_.substr(at_, word.size()) == word) {
            at_ += word.size();
            return true;
        }
        return false;
    }

    bool ReadValue(JsonValue* value, int depth) {
        SkipBlanks();
        if (depth > kDeepest) {
            return Fail("less depth");
        }
        const char first = at_ < text_.size() ? text_[at_] : '\0';
        switch (first) {
            case '{':
                return ReadObject(value, depth);
            case '[':
                return ReadArray(value, depth);
            case '"':
                value->kind = JsonValue::Kind::kString;
                return TakeQuoted(text_, &at_, Typed::kAsIs, &value->units) || Fail("a string");
            case 't':
            case 'f':
                value->kind = JsonValue::Kind::kBool;
                value->isTrue = first == 't';
                return TakeWord(first == 't' ? "true" : "false") || Fail("a value");
            case 'n':
                return TakeWord("null") || Fail("a value");
            default:
                return ReadNumber(value);
        }
    }

    bool ReadNumber(JsonValue* value) {
        const std::size_t end = text_.find_first_not_of("+-.0123456789eE", at_);
        value->kind = JsonValue::Kind::kNumber;
        value->number = text_.substr(at_, end == std::string_view::npos ? end : end - at_);
        at_ += value->number.size();
        return !value->number.empty() || Fail("a value");
    }

    bool ReadObject(JsonValue* value, int depth) {
        value->kind = JsonValue::Kind::kObject;
        ++at_;
        if (Take('}')) {
            return true;
        }
        do {
            SkipBlanks();
            NameUnits name;
            if (!TakeQuoted(text_, &at_, Typed::kAsIs, &name)) {
                return Fail("a name in double quotes");
            }
            if (!Take(':')) {
                return Fail("':'");
            }
            value->names.push_back(Utf8FromUnits(name));
            value->items.emplace_back();
            if (!ReadValue(&value->items.back(), depth + 1)) {
                return false;
            }
        } while (Take(','));
        return Take('}') || Fail("',' or '}'");
    }

    bool ReadArray(JsonValue* value, int depth) {
        value->kind = JsonValue::Kind::kArray;
        ++at_;
        if (Take(']')) {
            return true;
        }
        do {
            value->items.emplace_back();
            if (!ReadValue(&value->items.back(), depth + 1)) {
                return false;
            }
        } while (Take(','));
        return Take(']') || Fail("',' or ']'");
    }

    std::string_view text_;
    std::size_t at_ = 0;
    std::string fault_;
};

}  // namespace

const JsonValue* JsonValue::Find(std::string_view name) const {
    for (std::size_t i = 0; i < names.size(); ++i) {
        if (names[i] == name) {
            return &items[i];
        }
    }
    return nullptr;
}

bool ReadJson(std::string_view text, JsonValue* value, std::string* fault) {
    return Reader(text).ReadWhole(value, fault);
}

}  // namespace VELK
