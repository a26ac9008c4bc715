// Separators: the index records that lead from a parent to a child, made of the child's first key,
// taken whole, and its node number.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

// The first key of `node` in one piece: in place, or gathered into the tree's `scratch`. An
// accessor's failure is reported by it, kErrNoMemory and a key longer than scratch are not.
int FirstKey(CBTreeHfs* tree, HfsNode* node, const BTreeKey** key);

// The first key of `node` in one piece without the tree's scratch buffer, which holds another key:
// in place, or gathered into a heap block that the caller frees (`*heap`, else null).
int FirstKeyAside(CBTreeHfs* tree, HfsNode* node, const BTreeKey** key, void** heap);

// A separator on its way into a parent. The key stays where it lies.
struct Separator {
    InsertKey entry;
    u8 child[kChildSize];

    // REQUIRES: `leadsTo` stays cached until the separator is in.
    void Fill(const BTHeaderMem* hdr, const BTreeKey* key, HfsNode* leadsTo);
};

// Gives the separator of `child`, the record at which the path stands on `level`, the key that
// `child` has first now, as if it were deleted and a new one inserted in its place. REQUIRES: the
// record leads to `child`, as ChildOf says. False: nothing has changed, because there is no room,
// or more than this node to change, or something that could be refused half-way.
bool ReplacePlainSeparator(CBTreeHfs* tree, const HfsFindData* path, int level, HfsNode* child);

// Whether `key`, still to be inserted, lay in the bytes of the newly allocated `node`. A damaged
// map can call a node free that is in use; the key would then be read from a node that was emptied
// and refilled.
bool WasEmptied(const BTHeaderMem* hdr, const HfsNode* node, const BTreeKey* key);

}  // namespace VELK
