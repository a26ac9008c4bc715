// What a mistyped word was most likely meant to be.
#pragma once

#include <string>
#include <vector>

namespace VELK {

// The word of `words` that `wrong` was most likely meant to be; empty: none is near.
std::string NearestWord(const std::string& wrong, const std::vector<std::string>& words);
// " (did you mean WORD?)", or nothing.
std::string DidYouMean(const std::string& wrong, const std::vector<std::string>& words);

}  // namespace VELK
