// The places, one after the other.
#include "tool/outside_scan.h"

#include <algorithm>
#include <cstring>

#include "hfs/records/key_text.h"
#include "hfs/treehfs/bytes.h"
#include "hfs/volume/journal_format.h"
#include "tool/errors.h"
#include "tool/node_reader.h"
#include "tool/tree_survey.h"

namespace VELK::tool {

namespace {

constexpr u64 kJournalWindow = u64{1} << 20;
constexpr u32 kMostRecord = 1u << 16;

}  // namespace

const char* OutsidePlaceName(OutsidePlace place) {
    constexpr const char* kNames[kOutsidePlaces] = {"stranded", "freed", "gap", "journal"};
    return kNames[static_cast<u8>(place)];
}

const char* OutsideStateName(OutsideState state) {
    constexpr const char* kNames[kOutsideStates] = {"same", "other", "gone"};
    return kNames[static_cast<u8>(state)];
}

OutsideScan::OutsideScan(Session* session, const Invocation& call, u32 fileId, Visit visit)
    : session_(session),
      call_(call),
      fileId_(fileId),
      tree_(session->Tree(fileId)),
      visit_(std::move(visit)),
      bytes_(tree_->header.nodeSize),
      present_(kMostRecord) {}

void OutsideScan::ScanNodes() {
    const TreeSurvey survey = SurveyTree(tree_, [&] {
        session_->Volume().TrimCache();
        ThrowIfInterrupted();
    });
    std::vector<bool> reached(survey.nodes.size());
    VisitNodes(session_, fileId_, NodeOrder::kDepth, true, [&](const HeldNode& node) {
        if (node.Number() < reached.size()) {
            reached[node.Number()] = true;
        }
        return true;
    });
    Progress progress(call_, std::string("scan ") + ForkName(fileId_), "nodes", survey.nodes.size(),
                      tree_->header.nodeSize);
    for (u32 number = 1; number < survey.nodes.size(); ++number) {
        progress.Update(number);
        if (survey.nodes[number].state != NodeState::kMap || reached[number]) {
            Node(number, reached[number], survey.nodes[number].state == NodeState::kFree);
        }
    }
}

void OutsideScan::Node(u32 number, bool isReached, bool isFree) {
    const u32 nodeSize = tree_->header.nodeSize;
    const u64 forkOffset = u64{number} * nodeSize;
    const std::optional<u64> offset = session_->Volume().ImageOffset(fileId_, forkOffset);
    if (!offset || session_->Volume().ReadFork(fileId_, forkOffset, bytes_.data(), nodeSize) != 0) {
        return;  // the walk has named it if the tree needs it
    }
    const u8* bytes = bytes_.data();
    if (!isReached && IsLeafImage(bytes, nodeSize)) {
        LeafRecords(isFree ? OutsidePlace::kFreed : OutsidePlace::kStranded, number, bytes,
                    [&](u32 at) { return *offset + at; });
    }
    const bool hasTable = isReached || IsLeafImage(bytes, nodeSize);
    const u32 from = hasTable ? GapStart(bytes, nodeSize) : kDescSize;
    const u32 to = hasTable ? TableStart(bytes, nodeSize) : nodeSize;
    const OutsidePlace place = isReached ? OutsidePlace::kGap
                               : isFree  ? OutsidePlace::kFreed
                                         : OutsidePlace::kStranded;
    CarveAll(fileId_, bytes, from, to, [&](u32 at, const CarvedRecord& record) {
        Found(place, number, *offset + at, record);
    });
}

void OutsideScan::LeafRecords(OutsidePlace place, s64 node, const u8* bytes,
                              const std::function<u64(u32 at)>& imageOffset) {
    const u32 nodeSize = tree_->header.nodeSize;
    const u32 count = GetBe16(bytes + kDescNumRecords);
    CarvedRecord record;
    for (u32 i = 0; i < count; ++i) {
        const u32 at = GetBe16(bytes + nodeSize - 2 * (i + 1));
        const u32 end = GetBe16(bytes + nodeSize - 2 * (i + 2));
        if (CarveRecord(fileId_, bytes + at, end - at, &record)) {
            Found(place, node, imageOffset(at), record);
        }
    }
}

OutsideState OutsideScan::StateOf(const CarvedRecord& record) {
    SearchKey key;
    unsigned size = 0;
    if (!SearchKeyFromStored(fileId_, record.key, record.keySize, &key) ||
        tree_->FindRecord(key.Key(), key.id, present_.data(),
                          static_cast<unsigned>(present_.size()), &size, nullptr) != kOk) {
        return OutsideState::kGone;
    }
    stored_.resize(size);
    tree_->convert.DataToDisk(stored_.data(), present_.data(), size);
    const bool isSame =
        size == record.dataSize && std::memcmp(stored_.data(), record.data, size) == 0;
    return isSame ? OutsideState::kSame : OutsideState::kOther;
}

void OutsideScan::Found(OutsidePlace place, s64 node, u64 offset, const CarvedRecord& record) {
    visit_({place, StateOf(record), node, offset, record});
}

// Where the ring begins behind the journal's header. A journal that was announced and never written
// has none; its ring will begin behind one sector.
u32 OutsideScan::RingStart(u64 journalStart, u64 journalSize) {
    u8 sector[kJournalSector];
    ReadJournal(journalStart, sector, sizeof sector);
    JournalHeader header;
    return DecodeJournalHeader(sector, journalSize, &header).empty() ? header.sectorSize
                                                                     : kJournalSector;
}

void OutsideScan::ReadJournal(u64 volumeOffset, u8* target, u64 bytes) {
    if (session_->Volume().ReadVolume(volumeOffset, target, bytes) != kOk) {
        ThrowProblem(session_->Image(), session_->Volume().LastIoProblem());
    }
}

// The journal is a ring: a node that runs over its end goes on at its start, so what is read of the
// end is followed by as much of the start as a node can need.
void OutsideScan::ScanJournal() {
    const JournalState& journal = session_->Volume().Journal();
    if (!journal.present || !journal.readable) {
        return;
    }
    const u32 nodeSize = tree_->header.nodeSize;
    const u64 start = journal.offset - session_->Volume().Place().offset;
    const u32 ringStart = RingStart(start, journal.size);
    const u64 ring = journal.size - ringStart;
    Progress progress(call_, std::string("scan journal ") + ForkName(fileId_), "B", ring, 1);
    std::vector<u8> window(kJournalWindow + nodeSize);
    for (u64 base = 0; base < ring && nodeSize <= ring; base += kJournalWindow) {
        const u64 bytes = std::min<u64>(window.size(), ring - base);
        ReadJournal(start + ringStart + base, window.data(), bytes);
        if (bytes < window.size()) {
            const u64 more = std::min<u64>(window.size() - bytes, nodeSize);
            ReadJournal(start + ringStart, window.data() + bytes, more);
        }
        for (u64 at = 0; at < std::min(kJournalWindow, bytes); at += kJournalSector) {
            progress.Update(base + at);
            if (IsLeafImage(window.data() + at, nodeSize)) {
                LeafRecords(OutsidePlace::kJournal, -1, window.data() + at, [&](u32 inNode) {
                    return journal.offset + ringStart + (base + at + inNode) % ring;
                });
            }
        }
    }
}

}  // namespace VELK::tool
