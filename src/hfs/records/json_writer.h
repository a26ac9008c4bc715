// Writes JSON straight into a string: no tree of values in between, and strings that come from
// UTF-16 names keep lone surrogates as \uXXXX, which no UTF-8 string could carry.
#pragma once

#include <concepts>
#include <string>
#include <string_view>

#include "platform/types.h"

namespace VELK {

class JsonWriter {
public:
    explicit JsonWriter(std::string* out) : out_(out) {}

    void BeginObject() { Open('{'); }
    void EndObject() { Close('}'); }
    void BeginArray() { Open('['); }
    void EndArray() { Close(']'); }
    void Key(std::string_view name);

    void Value(std::string_view text);  // UTF-8; bytes that are none become U+FFFD
    void Value(const char* text) { Value(std::string_view(text)); }
    void Value(const std::string& text) { Value(std::string_view(text)); }
    void Value(bool value) { Raw(value ? "true" : "false"); }
    void Value(double value);
    template <std::integral Number>
    void Value(Number value) {
        Raw(std::to_string(value));
    }
    void Null() { Raw("null"); }
    // The inside of a string that is escaped already.
    void EscapedString(std::string_view escaped);
    // A finished value.
    void Raw(std::string_view value);

    template <typename T>
    void Member(std::string_view name, const T& value) {
        Key(name);
        Value(value);
    }

private:
    void Separate();
    void Open(char bracket);
    void Close(char bracket);

    std::string* out_;
    bool needsComma_ = false;
};

}  // namespace VELK
