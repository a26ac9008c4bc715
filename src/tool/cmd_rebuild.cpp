// rebuild: writes a tree anew, its records in key order, so that its nodes are full and lie one
// behind the other. All of it happens in one transaction of the volume: it succeeds whole, or
// nothing has changed.
#include <vector>

#include "hfs/check/check.h"
#include "hfs/records/text_format.h"
#include "tool/errors.h"
#include "tool/node_reader.h"
#include "tool/progress.h"
#include "tool/record_digest.h"
#include "tool/script_run.h"
#include "tool/script_volume.h"

namespace VELK::tool {

namespace {

// A record in the form the engine's operations take it.
struct KeptRecord {
    SearchKey key;
    std::vector<u8> data;  // host form
};

struct Shape {
    u64 used = 0;  // nodes that are not free
    u64 depth = 0;
    std::string digest;
    u64 records = 0;
};

class TreeRebuild {
public:
    TreeRebuild(Invocation* call, ImageVolume* volume, u32 fileId)
        : call_(call), volume_(volume), fileId_(fileId) {
        Problem problem;
        tree_ = volume->Tree(fileId, &problem);
        if (tree_ == nullptr) {
            ThrowProblem(call->image, problem);
        }
    }

    void Run() {
        MustBeSound("the tree is damaged", "run check; a damaged tree is not rebuilt");
        const Shape before = Measure();
        Gather();
        Empty();
        Fill();
        MustBeSound("the new tree is not sound", "please report this");
        const Shape after = Measure();
        if (after.digest != before.digest || after.records != before.records) {
            Fail(kErrCorrupt, "the new tree does not hold the same records");
        }
        Report(before, after);
    }

private:
    [[noreturn]] void Fail(int status, const std::string& what) {
        volume_->RestoreAfter(kErrCorrupt);
        ThrowFailed(call_->image,
                    fmt::format("{} tree: {}{}", ForkName(fileId_), what,
                                status == kErrCorrupt ? "" : ": " + StatusWithCode(status)),
                    "nothing was changed");
    }

    // The checker's opinion of the tree as it stands in memory.
    void MustBeSound(const char* what, const char* advice) {
        std::vector<u8> bytes;
        if (const int status = FlatTree(volume_, tree_, &bytes); status != kOk) {
            Fail(status, "cannot be read");
        }
        CheckTreeKind kind;
        kind.fileId = fileId_;
        kind.names = tree_->compareKeys == CompareCatKeysCaseBin ? CheckNameOrder::kBinary
                                                                 : CheckNameOrder::kFolding;
        CheckSink sink;
        sink.finding = [](void*, const CheckFinding&) {};
        const CheckSummary summary =
            CheckTreeBytes(bytes.data(), bytes.size(), kind, CheckOptions{}, sink);
        if (summary.errors != 0) {
            volume_->RestoreAfter(kErrCorrupt);
            ThrowFailed(call_->image, fmt::format("{} tree: {}", ForkName(fileId_), what), advice);
        }
    }

    Shape Measure() {
        Shape shape;
        RecordDigest digest;
        if (const int status = DigestTree(tree_, &digest); status != kOk) {
            Fail(status, "cannot be read");
        }
        shape.used = tree_->header.totalNodes - tree_->header.freeNodes;
        shape.depth = tree_->header.treeDepth;
        shape.digest = digest.Text();
        shape.records = digest.Records();
        return shape;
    }

    void Gather() {
        RecordReader reader(tree_);
        HeldNode node(tree_);
        NodeRecord record;
        for (u32 number = tree_->header.firstLeafNode; number != 0; number = node.FLink()) {
            if (const int status = node.Open(number); status != kOk) {
                Fail(status, "cannot be read");
            }
            for (u32 i = 0; i < node.RecordCount(); ++i) {
                KeptRecord kept;
                const int status = reader.Describe(node.Get(), i, &record);
                if (status != kOk ||
                    !SearchKeyFromStored(fileId_, record.key, record.keySize, &kept.key)) {
                    Fail(status, fmt::format("record {} of node {} cannot be read", i, number));
                }
                kept.data.resize(record.dataSize);
                tree_->convert.DataToMemory(kept.data.data(), record.data, record.dataSize);
                records_.push_back(std::move(kept));
            }
        }
    }

    // From the last record to the first: no leaf is ever merged with one that is to go as well.
    void Empty() {
        Progress progress(*call_, std::string("rebuild ") + ForkName(fileId_), "records",
                          2 * records_.size(), 0);
        for (std::size_t i = records_.size(); i-- > 0;) {
            const SearchKey& key = records_[i].key;
            const int status = tree_->DeleteRecord(key.Key(), key.id, false);
            if (status != kOk) {
                Fail(status, "cannot be emptied");
            }
            progress.Update(records_.size() - i);
        }
    }

    void Fill() {
        Progress progress(*call_, std::string("rebuild ") + ForkName(fileId_), "records",
                          2 * records_.size(), 0);
        u64 done = records_.size();
        for (const KeptRecord& record : records_) {
            const int status =
                tree_->InsertRecord(record.key.Key(), record.key.id, record.data.data(),
                                    static_cast<unsigned>(record.data.size()));
            if (status != kOk) {
                Fail(status, "cannot be filled again");
            }
            progress.Update(++done);
        }
    }

    void Report(const Shape& before, const Shape& after) {
        if (call_->json) {
            call_->out.Print(
                "{{\"schema\":\"treehfs.rebuild/1\",\"tree\":\"{}\",\"records\":{},"
                "\"digest\":\"{}\",\"nodes_before\":{},\"nodes_after\":{},\"depth_before\":{},"
                "\"depth_after\":{}}}\n",
                ForkName(fileId_), after.records, after.digest, before.used, after.used,
                before.depth, after.depth);
            return;
        }
        call_->out.Print("{}: {} in {} before, {} after; depth {} before, {} after; {}\n",
                         ForkName(fileId_), Counted(after.records, "record", "records"),
                         Counted(before.used, "node", "nodes"), Grouped(after.used), before.depth,
                         after.depth, "the digest is the same");
    }

    Invocation* call_;
    ImageVolume* volume_;
    u32 fileId_;
    CBTreeHfs* tree_ = nullptr;
    std::vector<KeptRecord> records_;
};

int RunRebuild(Invocation* call) {
    TargetOptions target;
    call->options.Argument("IMAGE", &call->image, "disk image");
    call->DeclareTrees(TreeDefault::kCatalog);
    target.DeclareForImage(call);
    call->DeclareJson();
    call->Parse();
    const std::unique_ptr<ImageVolume> volume = OpenTarget(*call, target);
    const u64 before = volume->HandedOverBlocks();
    TreeRebuild(call, volume.get(), call->trees[0]).Run();
    FinishTarget(*call, target, volume.get(), before);
    call->out.Flush();
    return kExitDone;
}

}  // namespace

extern const Command kRebuildCommand;
const Command kRebuildCommand = {
    "rebuild",
    "IMAGE",
    "write a tree anew with full nodes, its records unchanged",
    "Either the whole tree is written anew or nothing changes. The tree's file keeps its size: "
    "what\n"
    "is saved are free nodes, into which the tree can grow again. Without --write the new tree is\n"
    "made and checked in memory only.",
    {"rebuild disk.img", "rebuild -t catalog disk.img --write",
     "rebuild disk.img --save compact.img"},
    RunRebuild,
};

}  // namespace VELK::tool
