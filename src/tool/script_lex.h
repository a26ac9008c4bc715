// Words of one line of a script.
#pragma once

#include <deque>
#include <string>
#include <string_view>
#include <vector>

namespace VELK::tool {

// Appends the words of `line` up to its comment. A word in quotes as a whole loses them; its text
// is kept in `unquoted`. Returns what is wrong, or null.
const char* SplitScriptLine(std::string_view line, std::vector<std::string_view>* words,
                            std::deque<std::string>* unquoted);

}  // namespace VELK::tool
