// Writes JSON straight into a string: no tree of values in between, and strings that come from
// UTF-16 names keep lone surrogates as \uXXXX, which no UTF-8 string could carry.
#pragma once

#include <concepts>
#include <string>
#include <string_view>

#include "platform/types.h"

namespace VELK {

// Appends to a string of the caller's, which has to outlive it. Commas come by themselves; that
// each member has its key and each bracket its end is the caller's business.
//
//     JsonWriter json(&line);
//     json.BeginObject();
//     json.Member("id", 16);
//     json.EndObject();  // {"id":16}
class JsonWriter {
public:
    // Appends to `*out`.
    explicit JsonWriter(std::string* out) : out_(out) {}

    // Brackets, and the name of a member.
    void BeginObject() { Open('{'); }
    void EndObject() { Close('}'); }
    void BeginArray() { Open('['); }
    void EndArray() { Close(']'); }
    void Key(std::string_view name);

    // A value: a string, which is UTF-8 (bytes that are none become U+FFFD), a bool or a number.
    void Value(std::string_view text);
    void Value(const char* text) { Value(std::string_view(text)); }
    void Value(const std::string& text) { Value(std::string_view(text)); }
    void Value(bool value) { Raw(value ? "true" : "false"); }
    void Value(double value);
    // A whole number.
    template <std::integral Number>
    void Value(Number value) {
        Raw(std::to_string(value));
    }
    // The value null.
    void Null() { Raw("null"); }
    // The inside of a string that is escaped already.
    void EscapedString(std::string_view escaped);
    // A finished value.
    void Raw(std::string_view value);

    // Key and value.
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
