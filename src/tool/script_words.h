// Words and limits that the parser of scripts and their execution share.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "platform/types.h"

namespace VELK::tool {

constexpr u64 kMostScriptNumber = ~u64{0} >> 1;
constexpr u64 kMostScriptSteps = 0x7FFFFFFF;

// "ok", "exists", ... or eight hexadecimal digits.
bool ParseStatus(std::string_view word, int* status);
std::vector<std::string> StatusNames();
// A list as in "corrupt,no-space"; false with the wrong word in `*wrong`.
bool ParseStatusList(std::string_view text, std::vector<int>* statuses, std::string* wrong);

}  // namespace VELK::tool
