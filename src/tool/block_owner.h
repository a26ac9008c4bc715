// find --block: whose allocation block it is.
#pragma once

#include "tool/session.h"

namespace VELK::tool {

// Returns the exit code: 1 when nobody owns the block.
int FindBlock(Session* session, Invocation* call, u64 block);

}  // namespace VELK::tool
