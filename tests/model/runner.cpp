// The run: starting, ending and auditing it. The operations themselves are in runner_verbs.cpp.
#include "runner.h"

#include <algorithm>

#include "hfs/check/check.h"

namespace VELK::test {

namespace {

constexpr u32 kAuditEvery = 64;

// Assertions that sound trees and legal calls may print: records over three blocks, restoring with
// changes or a reservation open, large separators, a freed node taken again at once.
constexpr int kHarmless[] = {505, 506, 2340, 2377, 2380, 4342, 4404, 4526, 5220};
// What the unlucky calls of this test print besides: stepping a path that stands nowhere, asking
// for a node by number that is free or past the file's initialised part.
constexpr int kFromUnluckyCalls[] = {2638, 2671, 3229, 3234};
// What refused service calls print besides.
constexpr int kFromFaults[] = {3481, 5393};
// Going to a position behind the last record is answered with a report.
constexpr int kReportedAnswers[] = {3201};

// Calls that a careful caller makes. The others move a path that stands nowhere, ask for any node
// or hand in records no node can hold.
bool IsLegal(Verb verb) {
    return verb != Verb::kDeleteAtPath && verb != Verb::kStep && verb != Verb::kStaleStep &&
           verb != Verb::kHoldNode && verb != Verb::kTooLarge;
}

bool Contains(const int* from, std::size_t count, int site) {
    return std::find(from, from + count, site) != from + count;
}

std::string Hex(int status) {
    char text[16];
    std::snprintf(text, sizeof text, "%08X", static_cast<u32>(status));
    return text;
}

}  // namespace

Runner::Runner(const RunSetup& setup) : setup_(setup), record_(32768) {}

Runner::~Runner() {
    cursor_.ClearPath();
    if (object_ != nullptr) {
        faults_->FailNone();
        heap_.FailNone();
        tree_->ReleaseSpace(&reserve_);
        tree_->Dtor();
    }
}

u32 Runner::LongestKey() const {
    const u32 most = setup_.fileId == kCatalogFileId ? kCatMaxKeyLength : kAttrMaxKeyLength;
    return std::min(kKeyLengthSize + most, setup_.geometry.nodeSize / 8);
}

// Data a node of this geometry can hold four of and give back: at most two blocks long.
u32 Runner::DataSize(u32 size) const {
    const u32 most = std::min(setup_.geometry.nodeSize / 4, 2 * setup_.geometry.mapBlock);
    if (setup_.fileId == kExtentsFileId) {
        return kExtentRecordSize;
    }
    return 1 + size % (size % 16 == 0 ? most : std::min(most, 120u));
}

void Runner::Start() {
    MemVolumeOptions options;
    options.mapBlockSize = setup_.geometry.mapBlock;
    options.inOnePiece = setup_.geometry.inOnePiece;
    options.allocBlockSize = 1024;
    options.totalBlocks = 1u << 20;
    options.defaultClumpSize = 4 * setup_.geometry.nodeSize;
    volume_ = std::make_unique<MemVolume>(options);
    faults_ = std::make_unique<FaultService>(&volume_->fs);
    faults_->FailNone();
    object_ = std::make_unique<CBTreeHfs>();
    tree_ = Metered(object_.get());
    tree_->volume = &volume_->fs;
    tree_->fileId = setup_.fileId;
    tree_->convert = ConvertFor(setup_.fileId);
    PrepareCreate(object_.get());
}

std::optional<std::string> Runner::Run(const std::vector<Operation>& operations) {
    Start();
    u32 shift = 9;
    while ((1u << shift) < setup_.geometry.nodeSize) {
        ++shift;
    }
    const unsigned long long size = 4ull * setup_.geometry.nodeSize;
    volume_->fs.ForkOf(setup_.fileId)->clumpSize = 4 * setup_.geometry.nodeSize;
    if (const int status = tree_->Create(shift, 0, &size); status != kOk) {
        return "create gave " + Hex(status);
    }
    if (Outcome outcome = Flush({Verb::kFlush, 0, 0, 0})) {
        return outcome;
    }
    for (std::size_t i = 0; i < operations.size(); ++i) {
        const Operation& operation = operations[i];
        refused_ = false;
        Outcome outcome = Do(operation);
        const bool failed = Faulted();
        faults_->FailNone();
        heap_.FailNone();
        DigestState();
        if (!outcome) {
            outcome = CheckEvents(!failed && !refused_ && IsLegal(operation.verb));
        }
        if (!outcome && (i % kAuditEvery == kAuditEvery - 1 || failed)) {
            outcome = Audit();
        }
        if (outcome) {
            return "operation " + std::to_string(i) + " (" + Text(operation) + "): " + *outcome;
        }
    }
    return Flush({Verb::kFlush, 0, 0, 0});
}

Runner::Outcome Runner::Settle(const char* what, int status) {
    if (status == kOk || status == kErrNotFound || status == kErrExists || status == kErrTooLarge) {
        return std::nullopt;
    }
    // A deletion or a replaced separator may find no free node although the file could grow: the
    // volume restores then as for any failure.
    const bool explained = Faulted() || status == kErrNoSpace || status == kErrInvalid;
    refused_ = true;
    if (!explained) {
        return std::string(what) + " gave " + Hex(status);
    }
    return Restore();
}

Runner::Outcome Runner::Restore() {
    faults_->FailNone();
    heap_.FailNone();
    cursor_.ClearPath();
    cursor_.valid = false;
    tree_->ReleaseSpace(&reserve_);
    volume_->Restore(snapshot_);
    tree_->RestoreModifiedNodes();
    tree_->findData.valid = false;
    if (tree_->IsDirty()) {
        return "the tree is dirty after a restore";
    }
    model_ = committed_;
    for (const auto& [fileId, bytes] : snapshot_.files) {
        if (volume_->Disk(fileId) != bytes) {
            return "the disk differs from the last commit after a restore";
        }
    }
    return CompareAll();
}

Runner::Outcome Runner::Expect(const char* what, int status, int wanted) {
    if (status == wanted || Faulted()) {
        return std::nullopt;
    }
    return std::string(what) + " gave " + Hex(status) + " instead of " + Hex(wanted);
}

Runner::Outcome Runner::Audit() {
    volume_->TakeCalls();
    const u32 held = References(tree_->findData) + References(cursor_);
    if (const auto ledger = LedgerHolds(*tree_, held); !ledger) {
        return std::string("ledger: ") + ledger.message();
    }
    if (!volume_->breaches.empty()) {
        return "contract: " + volume_->breaches.front();
    }
    const Bytes file = Present();
    if (setup_.isDigested) {
        for (const u8 byte : file) {
            Digest(byte);
        }
        for (const u32 nodeNum : ModifiedNodes(*tree_)) {
            Digest(nodeNum);
        }
    }
    if (Outcome outcome = Check(file)) {
        return outcome;
    }
    if (tree_->header.leafRecords != model_.size()) {
        return "leafRecords " + std::to_string(tree_->header.leafRecords) + ", model " +
               std::to_string(model_.size());
    }
    return CompareAll();
}

// Every record in order, through a path of its own.
Runner::Outcome Runner::CompareAll() {
    HfsFindData path;
    ModelKey least;
    least.fileId = setup_.fileId;
    bool found = false;
    HostKey lowest = least.Host();
    int status =
        tree_->FindEntry(lowest.Get(), 0, &path, &found, nullptr, nullptr, nullptr, nullptr);
    if (status != kOk) {
        path.ClearPath();
        return "seeking the first record gave " + Hex(status);
    }
    int step = 0;
    for (const auto& [key, record] : model_) {
        unsigned size = 0;
        unsigned keySize = 0;
        status = tree_->IncPos(step, record_.data(), static_cast<unsigned>(record_.size()), &size,
                               key_, sizeof key_, &keySize, &path);
        step = 1;
        const Bytes wantedKey = record.key.Delivered();
        if (status != kOk || Bytes(key_, key_ + keySize) != wantedKey ||
            Bytes(record_.begin(), record_.begin() + size) != record.data) {
            path.ClearPath();
            return "walking gave " + Hex(status) + " or another record than the model's";
        }
    }
    unsigned size = 0;
    status = model_.empty()
                 ? kErrNotFound
                 : tree_->IncPos(step, record_.data(), static_cast<unsigned>(record_.size()), &size,
                                 nullptr, 0, nullptr, &path);
    path.ClearPath();
    return status == kErrNotFound ? std::nullopt
                                  : Outcome("walking past the last record gave " + Hex(status));
}

// The tree file as it would be if everything were written now: the disk, over it the cached nodes,
// over these the header as the tree holds it.
Bytes Runner::Present() const {
    const BTHeaderMem& header = tree_->header;
    Bytes file = volume_->Disk(setup_.fileId);
    for (const HfsNode* node : CachedNodes(*tree_)) {
        const std::size_t at = static_cast<std::size_t>(node->nodeNum) * header.nodeSize;
        for (u32 block = 0; block < header.blocksPerNode; ++block) {
            const u8* data = node->bufs[block].data;
            std::copy(data, data + header.blockSize,
                      file.begin() + static_cast<std::ptrdiff_t>(at + block * header.blockSize));
        }
    }
    Put16(&file, kHeadTreeDepth, header.treeDepth);
    Put32(&file, kHeadRootNode, header.rootNode);
    Put32(&file, kHeadLeafRecords, header.leafRecords);
    Put32(&file, kHeadFirstLeafNode, header.firstLeafNode);
    Put32(&file, kHeadLastLeafNode, header.lastLeafNode);
    Put32(&file, kHeadTotalNodes, header.totalNodes);
    Put32(&file, kHeadFreeNodes, header.freeNodes);
    return file;
}

// What the independent checker says of a tree file.
Runner::Outcome Runner::Check(const Bytes& file) const {
    std::string first;
    CheckSink sink;
    sink.self = &first;
    sink.finding = [](void* self, const CheckFinding& finding) {
        std::string* text = static_cast<std::string*>(self);
        if (text->empty() && finding.severity != CheckSeverity::kInfo) {
            *text = CheckFindingLine(finding);
        }
    };
    CheckTreeKind kind;
    kind.fileId = setup_.fileId;
    kind.anyData = true;
    CheckTreeBytes(file.data(), file.size(), kind, CheckOptions{}, sink);
    return first.empty() ? std::nullopt : Outcome("checker: " + first);
}

void Runner::Digest(u64 value) {
    digest_ = (digest_ ^ value) * 0x9E3779B97F4A7C15u;
    digest_ ^= digest_ >> 29;
}

void Runner::DigestState() {
    const BTHeaderMem& header = tree_->header;
    for (const u32 number : {tree_->hitCount, tree_->readCount, tree_->nodeCount, tree_->validNodes,
                             header.rootNode, header.treeDepth + 0u, header.leafRecords,
                             header.totalNodes, header.freeNodes, tree_->isDirty + 0u}) {
        Digest(number);
    }
    for (const CallRecord& call : volume_->TakeCalls()) {
        Digest(static_cast<u64>(call.call));
        Digest(call.offset);
        Digest(call.bytes);
    }
}

// What the engine said. A legal call on this sound tree, with working services, reports nothing.
Runner::Outcome Runner::CheckEvents(bool quiet) {
    for (const Event& event : capture_.Take()) {
        Digest(static_cast<u64>(event.kind));
        Digest(event.code);
        Digest(static_cast<u64>(event.site));
        if (event.kind == Event::Kind::kReport && quiet &&
            !Contains(kReportedAnswers, std::size(kReportedAnswers), event.site)) {
            return "report " + Hex(static_cast<int>(event.code)) + " at " +
                   std::to_string(event.site);
        }
        if (event.kind == Event::Kind::kAssertion &&
            !Contains(kHarmless, std::size(kHarmless), event.site) &&
            !Contains(kFromUnluckyCalls, std::size(kFromUnluckyCalls), event.site) &&
            !Contains(kFromFaults, std::size(kFromFaults), event.site)) {
            return "assertion " + std::to_string(event.site);
        }
    }
    return std::nullopt;
}

}  // namespace VELK::test
