// Independent checker of HFS+ volumes and of single B-trees. It reads bytes by itself, knows the
// format and the order of names, and nothing of the engine or the volume layer: it judges both.
//
// It visits every node at most once, holds a few bytes per node, believes no count before it has
// been compared with the size of the image, and writes nothing. docs/check.md says what each
// invariant means.
//
//     CheckOptions options;
//     options.full = true;
//     CheckSink sink;
//     sink.finding = [](void*, const CheckFinding& finding) {
//         std::puts(CheckFindingLine(finding).c_str());
//     };
//     const CheckSummary summary = CheckVolume(source, options, sink);
//     return summary.errors == 0 && summary.unreadable == 0 && !summary.isStopped;
#pragma once

#include <cstddef>
#include <string>

#include "platform/types.h"

namespace VELK {

// The invariants. Names and meanings are stable for ever; a retired one is not reused.
// clang-format off
enum class CheckId : u8 {
    V01, V02, V03, V04, V05, V06, V07, V08,
    H01, H02, H03, H04, H05, H06, H07, H08, H09, H10, H11, H12, H13, H14,
    M01, M02, M03, M04, M05,
    N01, N02, N03, N04, N05, N06,
    L01, L02,
    K01, K02, K03, K04, K05,
    R01, R02, R03, R04, R05, R06, R07, R08, R09, R10,
    D01,
};
// clang-format on
constexpr u32 kCheckIdCount = 51;  // how many invariants there are

// A remark; something a reader can live with; something that makes it go wrong.
enum class CheckSeverity : u8 { kInfo, kWarning, kError };

// How thorough a run must be for an invariant to be looked at.
enum class CheckScope : u8 { kQuick, kDefault, kFull };

// What is known of an invariant. The texts are constant.
struct CheckIdInfo {
    CheckId id;              // its place in the table
    const char* name;        // "K03"
    CheckScope scope;        // the shallowest run that looks
    CheckSeverity severity;  // the worst it is reported with
    const char* text;        // one line for a person
};

// All invariants, in the order of CheckId; kCheckIdCount entries. And one of them.
const CheckIdInfo* CheckIdTable();
const CheckIdInfo& CheckIdOf(CheckId id);
// By name, as in "K03". False: there is none.
bool FindCheckId(const std::string& name, CheckId* id);

// Sets of invariants are masks of these bits.
constexpr u64 CheckIdBit(CheckId id) {
    return u64{1} << static_cast<u32>(id);
}

// The bytes of a volume: offset 0 is its first byte, wherever it lies in the image.
struct CheckSource {
    void* self;  // passed to `read`
    // Fills all `size` bytes or returns a status other than 0. Never asked beyond `size` below.
    int (*read)(void* self, u64 offset, void* target, std::size_t size);
    u64 size;         // bytes there are from the volume's start to its end (or the image's)
    u64 imageOffset;  // of the volume in the image; only added to the offsets in findings
};

// How thorough the run is and what it reports. By default every tree is walked from its root.
struct CheckOptions {
    bool quick = false;      // headers, map and leaf chain only
    bool full = false;       // also the trees against each other, the bitmap, the volume's counts
    bool keepGoing = false;  // go on in a tree after a node that cannot be read
    u32 trees = 0;           // bit 1 << file ID of the trees to report on; 0: all
    u64 only = 0;            // these invariants alone, in whatever scope they have; 0: all
    u64 skip = 0;            // these invariants are not reported; 0: none
    u32 maxErrors = 100;     // stop at so many errors; as many other findings are told; 0: no limit
    u32 mapBlock = 0;        // unit nodes are mapped in, if the caller has one (H02); 0: none
    bool backupHeader = false;  // start from the alternate volume header
};

constexpr u64 kCheckNoOffset = ~u64{0};  // a finding that belongs to no byte in particular

// One breach of an invariant. Valid during the call that tells of it; copy what is to stay.
struct CheckFinding {
    CheckId id = CheckId::V01;                       // the invariant
    CheckSeverity severity = CheckSeverity::kError;  // of this breach; never above the invariant's
    u32 tree = 0;                                    // file ID of the tree, 0: the volume
    s64 node = -1;                                   // -1: no node in particular
    s32 record = -1;                                 // index in the node
    u64 offset = kCheckNoOffset;                     // byte of the image
    std::string where;                               // "catalog node 14 record 0"
    std::string expected;                            // may be empty
    std::string found;                               // may be empty
    std::string text;                                // a sentence that holds all of it
};

// "error K03 catalog node 14 record 0 (image offset 0x2380e): key ... is not above ..."
std::string CheckFindingLine(const CheckFinding& finding);

// A stretch that could not be read. No invariant: it says nothing about the volume.
struct CheckUnreadable {
    u32 tree = 0;                 // file ID of the tree, 0: the volume
    s64 node = -1;                // -1: no node in particular
    u64 offset = kCheckNoOffset;  // byte of the image
    u64 size = 0;                 // bytes
    int status = 0;     // what CheckSource::read returned; kCheckPastEnd: beyond the source
    std::string where;  // "catalog node 14"
};
constexpr int kCheckPastEnd = -1;  // status of a stretch that lies beyond the source

// How far the run has come.
struct CheckProgress {
    const char* stage;  // "catalog"
    u64 done;           // nodes
    u64 total;          // nodes there are to visit, as far as is known
    u64 bytes;          // read since the start of the run
};

// What the caller wants to hear of; each may be null.
struct CheckSink {
    void* self = nullptr;  // passed to each
    // One finding, or one stretch that could not be read, as it is met.
    void (*finding)(void* self, const CheckFinding& finding) = nullptr;
    void (*unreadable)(void* self, const CheckUnreadable& unreadable) = nullptr;
    // Every few hundred nodes. False stops the run.
    bool (*progress)(void* self, const CheckProgress& progress) = nullptr;
};

// How a stage ended.
enum class CheckVerdict : u8 {
    kSound,     // looked at; there may be remarks of severity info
    kFindings,  // errors or warnings
    kNone,      // the volume has no such tree
    kNotRun,    // not asked for, or in vain because of earlier findings
    kStopped,   // not finished: unreadable, too many errors, or interrupted
};

// What one stage found. Counts are of this stage alone.
struct CheckStage {
    const char* title = "";                        // "catalog tree"
    u32 tree = 0;                                  // file ID of the tree it is about, 0: of none
    CheckVerdict verdict = CheckVerdict::kNotRun;  // how it ended
    const char* why = "";                          // of kNotRun and kStopped: "needs --full"
    // Findings by severity.
    u32 errors = 0;
    u32 warnings = 0;
    u32 infos = 0;

    u64 nodes = 0;    // visited
    u64 records = 0;  // in leaves
    u64 runs = 0;     // of the bad-block list
};

// Stages of a run over a volume: the header, the extents, catalog and attributes trees, the
// bad-block list, the trees against each other.
constexpr u32 kCheckStages = 6;

// What the whole run found.
struct CheckSummary {
    // Findings by severity.
    u32 errors = 0;
    u32 warnings = 0;
    u32 infos = 0;

    u32 untold = 0;                   // findings that were counted, but no longer told
    u32 unreadable = 0;               // nodes and other pieces
    u64 nodes = 0;                    // visited
    u64 bytes = 0;                    // read
    bool isStopped = false;           // it ended before its end, so silence means nothing
    u32 stageCount = 0;               // entries of `stages` in use
    CheckStage stages[kCheckStages];  // in the order they ran
};

// Checks the volume: header, three trees, bad-block list, and with `full` how they fit together.
CheckSummary CheckVolume(const CheckSource& source, const CheckOptions& options,
                         const CheckSink& sink);

// How the names of a catalog are ordered: regardless of case, or by their code units.
enum class CheckNameOrder : u8 { kFolding, kBinary };

// What a tree file that lies flat in memory holds.
struct CheckTreeKind {
    u32 fileId = 0;  // kCatalogFileId, kExtentsFileId or kAttributesFileId
    CheckNameOrder names = CheckNameOrder::kFolding;  // of the catalog
    bool anyData = false;  // leaf data is the caller's own: R01, R03, R04 are left out
};

// Checks one tree file by itself; the summary has one stage. Of `options.full` D01 takes effect.
CheckSummary CheckTreeBytes(const void* bytes, std::size_t size, const CheckTreeKind& kind,
                            const CheckOptions& options, const CheckSink& sink);

}  // namespace VELK
