// Leaf records from the last key down to the first. The engine steps backwards by leaf, not by
// record, so this walk follows the backward links and reads each leaf from its end.
#pragma once

#include <functional>

#include "tool/key_argument.h"
#include "tool/node_reader.h"

namespace VELK::tool {

// Calls `visit` for each record from `range.to` (the tree's last record when it is open) down to
// `range.from`; false from it ends the walk. Keys that do not fall, leaves that are none and rings
// of leaves end it with a message, or are passed over. Throws ToolError.
void WalkBackwards(Session* session, u32 fileId, const KeyRange& range, bool keepGoing,
                   const std::function<bool(const NodeRecord&)>& visit);

}  // namespace VELK::tool
