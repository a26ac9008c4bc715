// The table of invariants: what each demands, how thorough a run must be to look at it, and how
// grave a breach is at worst.
#include "hfs/check/check.h"

namespace VELK {
namespace {

constexpr CheckScope kQuick = CheckScope::kQuick;
constexpr CheckScope kDefault = CheckScope::kDefault;
constexpr CheckScope kFull = CheckScope::kFull;
constexpr CheckSeverity kInfo = CheckSeverity::kInfo;
constexpr CheckSeverity kWarning = CheckSeverity::kWarning;
constexpr CheckSeverity kError = CheckSeverity::kError;

#define CHECK_ROW(id, scope, severity, text) \
    { CheckId::id, #id, scope, severity, text }

constexpr CheckIdInfo kTable[] = {
    CHECK_ROW(V01, kQuick, kError, "signature and version agree (H+ 4, HX 5)"),
    CHECK_ROW(V02, kQuick, kError,
              "allocation block size is a power of two, at least 512; the volume fits the image"),
    CHECK_ROW(V03, kQuick, kWarning,
              "the alternate header lies 1,024 bytes before the end and agrees"),
    CHECK_ROW(V04, kQuick, kError,
              "extents of every special file lie inside the volume, do not overlap, add up"),
    CHECK_ROW(V05, kFull, kError, "blocks in use are marked used in the allocation file"),
    CHECK_ROW(V06, kFull, kWarning,
              "counts of files, folders and free blocks equal what the volume holds"),
    CHECK_ROW(V07, kFull, kError, "the next ID is above every ID, unless IDs are reused"),
    CHECK_ROW(V08, kQuick, kInfo, "the journal is empty and the volume was unmounted cleanly"),
    CHECK_ROW(
        H01, kQuick, kError,
        "node 0: header kind, height 0, three records at 14, 120, 248, free space at the end"),
    CHECK_ROW(H02, kQuick, kError,
              "node size is a power of two 512..32,768, not below the map block"),
    CHECK_ROW(H03, kQuick, kError, "depth is at most 16 (opens), at most 15 (can be searched)"),
    CHECK_ROW(H04, kQuick, kError,
              "root, first leaf, last leaf and free nodes are below the total of nodes"),
    CHECK_ROW(H05, kQuick, kError, "the total of nodes fits the fork"),
    CHECK_ROW(H06, kQuick, kError, "tree type is 0x00, 0x80 or 0xFF"),
    CHECK_ROW(H07, kQuick, kError,
              "key lengths are 16 bits wide; index keys vary where the tree demands it"),
    CHECK_ROW(H08, kQuick, kError, "maximal key length fits the kind of tree"),
    CHECK_ROW(H09, kQuick, kInfo, "key compare type fits the volume version"),
    CHECK_ROW(H10, kQuick, kError,
              "depth, root, first and last leaf, leaf records: all 0 (empty tree) or none"),
    CHECK_ROW(H11, kQuick, kWarning, "leaf records equal the records counted"),
    CHECK_ROW(H12, kDefault, kError, "tree depth equals the height of the root"),
    CHECK_ROW(H13, kQuick, kWarning, "free nodes equal the clear bits of the map"),
    CHECK_ROW(H14, kQuick, kWarning, "reserved fields of the header are 0"),
    CHECK_ROW(M01, kQuick, kError,
              "map chain: header, then map nodes of one record, ends with 0, no loop"),
    CHECK_ROW(M02, kQuick, kError, "the map covers all nodes, and no map node is superfluous"),
    CHECK_ROW(M03, kQuick, kWarning, "no map bit is set at or above the total of nodes"),
    CHECK_ROW(M04, kQuick, kError, "every node in use has its bit set in the map"),
    CHECK_ROW(M05, kDefault, kWarning, "every bit set belongs to a node in use"),
    CHECK_ROW(N01, kQuick, kError, "kind fits the place: leaf at level 1, index above"),
    CHECK_ROW(N02, kQuick, kError, "height equals the level"),
    CHECK_ROW(N03, kQuick, kError, "record 0 at 14; offsets even, rising, below their table"),
    CHECK_ROW(N04, kQuick, kError, "no node in use is without records"),
    CHECK_ROW(N05, kDefault, kError, "children are nodes of the tree, each reached once"),
    CHECK_ROW(N06, kQuick, kWarning, "the reserved field of a node is 0"),
    CHECK_ROW(L01, kQuick, kError,
              "links to the siblings agree with the parents' order on every level"),
    CHECK_ROW(L02, kQuick, kError,
              "outermost links are 0; first and last leaf are the ends of the chain"),
    CHECK_ROW(K01, kDefault, kError, "key length is in range, the name fits it, padding is 0"),
    CHECK_ROW(K02, kDefault, kError, "keys rise within a node"),
    CHECK_ROW(K03, kDefault, kError, "keys rise from node to node"),
    CHECK_ROW(K04, kDefault, kError,
              "an index key equals the first key of its child (lower: warning, higher: error)"),
    CHECK_ROW(K05, kDefault, kError, "extents keys: length 10, pad 0, fork type 0x00 or 0xFF"),
    CHECK_ROW(R01, kDefault, kError,
              "catalog record: known type, and its size (folder 88, file 248, thread 10 + name)"),
    CHECK_ROW(R02, kDefault, kError, "data of an index record is 4 bytes"),
    CHECK_ROW(R03, kDefault, kError, "extents record is 64 bytes, its runs packed to the front"),
    CHECK_ROW(R04, kDefault, kError,
              "attribute record: known type, and its size (inline, fork, extents)"),
    CHECK_ROW(
        R05, kFull, kError,
        "every file and folder has its thread and its parent; the thread points back; valence"),
    CHECK_ROW(R06, kFull, kError, "extents of files lie inside the volume, no block owned twice"),
    CHECK_ROW(R07, kDefault, kError, "bad-block records: data fork, consecutive start blocks"),
    CHECK_ROW(R08, kFull, kError,
              "overflow extents continue the first eight of a file that exists"),
    CHECK_ROW(R09, kFull, kError, "attributes belong to an existing file or folder"),
    CHECK_ROW(R10, kFull, kError, "no ID is used twice, none is a reserved one"),
    CHECK_ROW(D01, kFull, kError, "looking up every leaf key from the root arrives at its record"),
};

#undef CHECK_ROW

constexpr u32 kRows = sizeof(kTable) / sizeof(kTable[0]);
static_assert(kRows == kCheckIdCount && kCheckIdCount <= 64);

constexpr bool IsInOrder() {
    for (u32 i = 0; i < kRows; ++i) {
        if (static_cast<u32>(kTable[i].id) != i) {
            return false;
        }
    }
    return true;
}
static_assert(IsInOrder());

}  // namespace

const CheckIdInfo* CheckIdTable() {
    return kTable;
}

const CheckIdInfo& CheckIdOf(CheckId id) {
    return kTable[static_cast<u32>(id)];
}

bool FindCheckId(const std::string& name, CheckId* id) {
    for (const CheckIdInfo& row : kTable) {
        if (name == row.name) {
            *id = row.id;
            return true;
        }
    }
    return false;
}

}  // namespace VELK
