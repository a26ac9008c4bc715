// Where the numbers of the format lie in the bytes of a node, a volume header, a journal: what a
// sweep or a mutator overwrites. Finds them in damaged bytes as well, and never leaves these.
// Written without the engine.
#pragma once

#include <cstddef>
#include <vector>

#include "platform/types.h"

namespace VELK::test {

// A big-endian number of 1, 2, 4 or 8 bytes.
struct Field {
    u32 offset;
    u8 width;
    const char* name;
};

u64 GetField(const u8* bytes, const Field& field);
void SetField(u8* bytes, const Field& field, u64 value);

// The fields of one node: descriptor, offset slots; in header nodes the header record and the map's
// first words; else of every record its key length, the numbers of its key, and its child.
// `fileId` says how keys are laid out.
std::vector<Field> FieldsOfNode(const u8* node, u32 nodeSize, u32 fileId);
// The numbers in the data of a leaf's records, whatever they mean: the type, then words.
std::vector<Field> DataOfNode(const u8* node, u32 nodeSize);
// The fields of a volume header, from its first byte.
const std::vector<Field>& FieldsOfVolumeHeader();
// Those of a journal's info block and header, and of a block list with `blocks` blocks.
const std::vector<Field>& FieldsOfJournalInfo();
const std::vector<Field>& FieldsOfJournalHeader();
std::vector<Field> FieldsOfJournalList(u32 blocks);

// Values at which a field of this width, now `old`, is likely to hurt: ends of its range, ends of
// the node, neighbours of `old`, and neighbours of `limit`, the number it should stay below.
std::vector<u64> BoundaryValues(const Field& field, u64 old, u32 nodeSize, u64 limit);

// The node size a tree file's header claims, if it is one; else 512.
u32 ClaimedNodeSize(const u8* tree, std::size_t size);

}  // namespace VELK::test
