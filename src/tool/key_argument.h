// Keys and ranges of keys in arguments.
#pragma once

#include <optional>
#include <string>

#include "hfs/records/key_text.h"
#include "tool/session.h"

namespace VELK::tool {

// The key that `text` means in tree `fileId`; id:N is the key that the thread of N names. Throws
// ToolError.
SearchKey KeyArgument(Session* session, u32 fileId, const std::string& text);

// FROM..TO, either of which may be missing.
struct KeyRange {
    std::optional<SearchKey> from;
    std::optional<SearchKey> to;

    // Where a stored key of the tree lies: negative before, 0 inside, positive behind.
    int Place(const CBTreeHfs& tree, const u8* stored) const;
};
KeyRange RangeArgument(Session* session, u32 fileId, const std::string& text);

}  // namespace VELK::tool
