// Conversion of keys and records between host order, as callers of a tree see them, and the
// big-endian form in its nodes. The host form of a key or record has the very layout of the stored
// one, with each field in host order.
//
// The extents tree is one-sided: callers search with keys in host order, but get keys and records
// as they are on disk, because the loader of the bad-block list reads them so; its records go in
// as they are on disk, too.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// The hooks for the trees 3 (extents), 4 (catalog) and 8 (attributes); any other ID gets hooks
// that copy. No hook touches a byte beyond the size it is given: fields cut by it, bytes behind the
// known layout and bodies of unknown types are copied unchanged, and the way there and back
// restores every byte. `target` may be `source`.
const HfsConvert& ConvertFor(u32 fileId);

}  // namespace VELK
