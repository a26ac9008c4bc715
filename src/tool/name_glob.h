// Patterns for names: * any number of characters, ? one, [a-z] one of a set, [!a-z] one outside,
// \ takes the next as it is. Compared in composed form, so that ? stands for one visible letter.
#pragma once

#include <string>

#include "hfs/names_text.h"
#include "platform/types.h"

namespace VELK::tool {

class NameGlob {
public:
    NameGlob(const std::string& pattern, bool ignoreCase);
    // `unitsBe` is a name as stored.
    bool Matches(const u8* unitsBe, u32 count) const;

private:
    std::u32string pattern_;
    bool ignoreCase_;
};

}  // namespace VELK::tool
