// Carries a list of operations out on a tree and on the model beside it, and says at the first
// disagreement what it was. Every failure of a changing operation is followed by what a volume does
// then: paths dropped, disk back to the last commit, tree restored.
#pragma once

#include <memory>
#include <optional>

#include "capture.h"
#include "fault_service.h"
#include "geometry.h"
#include "heap_guard.h"
#include "ledger.h"
#include "mem_volume.h"
#include "operations.h"
#include "tree_model.h"

namespace VELK::test {

struct RunSetup {
    u32 fileId;
    Geometry geometry;
    bool isDigested = false;  // sum up what can be observed; bytes cost time
};

class Runner {
public:
    explicit Runner(const RunSetup& setup);
    ~Runner();

    // Runs the list; the text of the first disagreement, or none.
    std::optional<std::string> Run(const std::vector<Operation>& operations);

    // A number that everything observable of the run so far went into: node requests, header
    // fields, what was reported and asserted, the calls the volume saw, and with each audit every
    // byte of the tree. REQUIRES: the set-up asked for it.
    u64 Digest() const { return digest_; }

private:
    using Outcome = std::optional<std::string>;

    void Start();
    Outcome Do(const Operation& operation);
    Outcome Insert(const Operation& operation);
    Outcome Delete(const Operation& operation);
    Outcome DeleteAtPath();
    Outcome Find(const Operation& operation);
    Outcome Update(const Operation& operation);
    Outcome Step(const Operation& operation, HfsFindData* path);
    Outcome Seek(const Operation& operation);
    Outcome Position(const Operation& operation);
    Outcome Walk(const Operation& operation);
    Outcome Flush(const Operation& operation);
    Outcome Reserve(const Operation& operation);
    Outcome Extend(const Operation& operation);
    Outcome Reopen();
    Outcome HoldNode(const Operation& operation);
    Outcome TooLarge(const Operation& operation);

    // Ends a changing operation: nothing for success and for refusals that change nothing, else
    // back to the last commit. An error no fault and no full tree explains is a disagreement.
    Outcome Settle(const char* what, int status);
    Outcome Restore();
    // Whether a reading operation may have failed with this status.
    Outcome Expect(const char* what, int status, int wanted);
    Outcome Audit();
    Outcome CompareAll();
    Outcome Check(const Bytes& file) const;
    Bytes Present() const;
    Outcome CheckEvents(bool quiet);
    void DigestState();
    void Digest(u64 value);

    bool Faulted() const { return faults_->HasFailed() || heap_.HasFailed(); }
    u32 DataSize(u32 size) const;
    u32 LongestKey() const;
    ModelKey Key(u32 number) const { return KeyOf(setup_.fileId, number, LongestKey()); }

    RunSetup setup_;
    HeapGuard heap_;
    Capture capture_;
    std::unique_ptr<MemVolume> volume_;
    std::unique_ptr<FaultService> faults_;
    std::unique_ptr<CBTreeHfs> object_;
    Metered tree_{nullptr};  // every call held to its bounds
    HfsFindData cursor_;
    BTReserve reserve_{};
    bool reserved_ = false;
    bool refused_ = false;  // the operation at hand ended in a restore
    TreeModel model_;
    TreeModel committed_;
    MemVolume::Snapshot snapshot_;
    u32 salt_ = 0;
    u64 digest_ = 0;
    alignas(8) u8 key_[kKeyLengthSize + kMaxKeyLength + 6] = {};
    Bytes record_;
};

}  // namespace VELK::test
