// Reads one JSON value. Strings are kept as UTF-16 units, because names may hold halves of
// surrogate pairs, which no UTF-8 string could carry; numbers are kept as they are written.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "hfs/names_text.h"
#include "platform/types.h"

namespace VELK {

// A value and what it holds. Fields that its kind does not use are empty.
struct JsonValue {
    // What JSON knows.
    enum class Kind : u8 { kNull, kBool, kNumber, kString, kArray, kObject };

    Kind kind = Kind::kNull;         // which of them it is
    bool isTrue = false;             // of a bool
    std::string number;              // as it was written
    NameUnits units;                 // of a string
    std::vector<JsonValue> items;    // of an array; of an object, the values of its members
    std::vector<std::string> names;  // of the members

    // Member of an object; null when there is none.
    const JsonValue* Find(std::string_view name) const;
    // A string as UTF-8.
    std::string Text() const { return Utf8FromUnits(units); }
};

// Reads `text` as a whole. False with the reason and the character it stands at in `*fault`.
bool ReadJson(std::string_view text, JsonValue* value, std::string* fault);

}  // namespace VELK
