// Looks for records outside a tree: in leaves that nothing leads to, in freed nodes, in the gaps of
// nodes in use, in the journal.
#pragma once

#include <functional>
#include <vector>

#include "tool/progress.h"
#include "tool/record_carve.h"
#include "tool/session.h"

namespace VELK::tool {

enum class OutsidePlace : u8 { kStranded, kFreed, kGap, kJournal };
constexpr u32 kOutsidePlaces = 4;
enum class OutsideState : u8 {
    kSame,   // the tree has this very record
    kOther,  // the tree has this key with other data
    kGone,   // the tree has no such key
};
constexpr u32 kOutsideStates = 3;

const char* OutsidePlaceName(OutsidePlace place);
const char* OutsideStateName(OutsideState state);

struct OutsideRecord {
    OutsidePlace place;
    OutsideState state;
    s64 node;    // -1: the journal's bytes belong to no node
    u64 offset;  // of the image
    CarvedRecord record;
};

class OutsideScan {
public:
    using Visit = std::function<void(const OutsideRecord&)>;

    OutsideScan(Session* session, const Invocation& call, u32 fileId, Visit visit);

    // Every node of the tree's file. Damage is named and passed over. Throws ToolError.
    void ScanNodes();
    // The journal's buffer; nothing when there is no journal that can be read.
    void ScanJournal();

private:
    void Node(u32 number, bool isReached, bool isFree);
    // `imageOffset`: of the byte at `at` of the leaf.
    void LeafRecords(OutsidePlace place, s64 node, const u8* bytes,
                     const std::function<u64(u32 at)>& imageOffset);
    u32 RingStart(u64 journalStart, u64 journalSize);
    void ReadJournal(u64 volumeOffset, u8* target, u64 bytes);
    void Found(OutsidePlace place, s64 node, u64 offset, const CarvedRecord& record);
    OutsideState StateOf(const CarvedRecord& record);

    Session* session_;
    const Invocation& call_;
    u32 fileId_;
    CBTreeHfs* tree_;
    Visit visit_;
    std::vector<u8> bytes_;
    std::vector<u8> present_;
    std::vector<u8> stored_;
};

}  // namespace VELK::tool
