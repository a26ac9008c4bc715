// The operations of a run, each beside what the model says of it.
#include <algorithm>
#include <cstring>

#include "runner.h"

namespace VELK::test {

namespace {

unsigned Size(const Bytes& bytes) {
    return static_cast<unsigned>(bytes.size());
}

}  // namespace

Runner::Outcome Runner::Do(const Operation& operation) {
    if (operation.fault % 2 == 1) {
        faults_->FailAny(operation.fault / 2 + 1);
    } else if (operation.fault != 0) {
        heap_.FailNth(1 + operation.fault / 8);
    }
    switch (operation.verb) {
        case Verb::kInsert:
            return Insert(operation);
        case Verb::kDelete:
            return Delete(operation);
        case Verb::kDeleteAtPath:
            return DeleteAtPath();
        case Verb::kFind:
            return Find(operation);
        case Verb::kUpdate:
            return Update(operation);
        case Verb::kStep:
            return Step(operation, &cursor_);
        case Verb::kSeek:
            return Seek(operation);
        case Verb::kPosition:
            return Position(operation);
        case Verb::kWalk:
            return Walk(operation);
        case Verb::kFlush:
            return Flush(operation);
        case Verb::kRestore:
            return Restore();
        case Verb::kReserve:
            return Reserve(operation);
        case Verb::kRelease:
            tree_->ReleaseSpace(&reserve_);
            return std::nullopt;
        case Verb::kExtend:
            return Extend(operation);
        case Verb::kReopen:
            return Reopen();
        case Verb::kHoldNode:
            return HoldNode(operation);
        case Verb::kTooLarge:
            return TooLarge(operation);
        case Verb::kStaleStep:
            return Step(operation, &tree_->findData);
        case Verb::kCount:
            break;
    }
    return "no such operation";
}

Runner::Outcome Runner::Insert(const Operation& operation) {
    const ModelKey key = Key(operation.key);
    const HostKey host = key.Host();
    const u32 size = DataSize(operation.size);
    const Bytes data = DataOf(operation.key, ++salt_, size);
    const bool present = model_.count(key) != 0;
    // The buffer holds exactly `size` bytes: a byte read past it is seen.
    const Bytes exact(data.begin(), data.begin() + size);
    const int status = tree_->InsertRecord(host.Get(), host.id, exact.data(), size);
    if (present && status != kErrExists && !Faulted()) {
        return "a present key was inserted";
    }
    if (status == kErrExists && !present) {
        return "an absent key was called present";
    }
    if (status == kOk) {
        model_[key] = {key, data};
    }
    return Settle("insert", status);
}

Runner::Outcome Runner::Delete(const Operation& operation) {
    ModelKey key = Key(operation.key);
    // Mostly a key that is there: the next one in order.
    if (operation.size % 4 != 0 && !model_.empty()) {
        auto at = model_.lower_bound(key);
        key = (at == model_.end() ? model_.begin() : at)->first;
    }
    const HostKey host = key.Host();
    const bool present = model_.count(key) != 0;
    const int status = tree_->DeleteRecord(host.Get(), host.id, false);
    if (status == (present ? kErrNotFound : kOk)) {
        return present ? "a present key was not found" : "an absent key was deleted";
    }
    if (status == kOk) {
        model_.erase(key);
    }
    return Settle("delete", status);
}

// Wherever the tree's own path stands: the record it delivers is the one that goes, or nothing
// does.
Runner::Outcome Runner::DeleteAtPath() {
    unsigned size = 0;
    unsigned keySize = 0;
    const int here = tree_->IncPos(0, record_.data(), Size(record_), &size, key_, sizeof key_,
                                   &keySize, nullptr);
    if (here != kOk) {
        return std::nullopt;
    }
    const Bytes delivered(key_, key_ + keySize);
    const auto at = std::find_if(model_.begin(), model_.end(), [&](const auto& entry) {
        return entry.second.key.Delivered() == delivered;
    });
    const int status = tree_->DeleteRecord(nullptr, 0, true);
    if (status == kOk) {
        if (at == model_.end()) {
            return "a record the model does not know was deleted";
        }
        model_.erase(at);
    }
    return Settle("delete at the path", status);
}

Runner::Outcome Runner::Find(const Operation& operation) {
    const ModelKey key = Key(operation.key);
    const HostKey host = key.Host();
    const auto at = model_.find(key);
    unsigned size = 0;
    const u32 hits = tree_->hitCount + tree_->readCount;
    const int status = tree_->FindRecord(host.Get(), host.id, record_.data(), Size(record_), &size,
                                         operation.size % 2 == 0 ? nullptr : &cursor_);
    const u32 requests = tree_->hitCount + tree_->readCount - hits;
    if (status == kOk) {
        if (at == model_.end()) {
            return "an absent key was found";
        }
        if (Bytes(record_.begin(), record_.begin() + size) != at->second.data) {
            return "the record found has other data than the model's";
        }
    }
    if (!Faulted() && requests != tree_->header.treeDepth) {
        return "a lookup requested " + std::to_string(requests) + " nodes";
    }
    return Expect("find", status, at == model_.end() ? kErrNotFound : kOk);
}

Runner::Outcome Runner::Update(const Operation& operation) {
    ModelKey key = Key(operation.key);
    const auto at = model_.lower_bound(key);
    if (at == model_.end()) {
        return std::nullopt;
    }
    const HostKey host = at->first.Host();
    unsigned size = 0;
    int status =
        tree_->FindRecord(host.Get(), host.id, record_.data(), Size(record_), &size, nullptr);
    if (status != kOk) {
        return Expect("find before update", status, kOk);
    }
    const Bytes data = DataOf(operation.key, ++salt_, Size(at->second.data));
    status = tree_->UpdateKeyAndRecord(nullptr, data.data());
    if (status == kOk) {
        at->second.data = data;
    }
    return Settle("update", status);
}

// A path moved wherever it stands, over changes made meanwhile. What it delivers need not be in the
// model's order, but is a record of the tree, and nothing breaks.
Runner::Outcome Runner::Step(const Operation& operation, HfsFindData* path) {
    const int count = static_cast<int>(operation.size % 9) - 3;
    unsigned size = 0;
    unsigned keySize = 0;
    const int status = tree_->IncPos(count, record_.data(), Size(record_), &size, key_, sizeof key_,
                                     &keySize, path);
    if (status == kOk && model_.empty()) {
        return "an empty tree delivered a record";
    }
    if (status != kOk && path == &cursor_) {
        cursor_.ClearPath();
    }
    return std::nullopt;
}

Runner::Outcome Runner::Seek(const Operation& operation) {
    const ModelKey key = Key(operation.key);
    const HostKey host = key.Host();
    bool found = false;
    cursor_.level = 0;
    int status =
        tree_->FindEntry(host.Get(), host.id, &cursor_, &found, nullptr, nullptr, nullptr, nullptr);
    if (status != kOk) {
        cursor_.ClearPath();
        return Expect("seek", status, kOk);
    }
    if (found != (model_.count(key) != 0)) {
        return "seek and model disagree on whether the key is there";
    }
    if (model_.empty()) {
        return std::nullopt;
    }
    unsigned size = 0;
    unsigned keySize = 0;
    status = tree_->IncPos(0, record_.data(), Size(record_), &size, key_, sizeof key_, &keySize,
                           &cursor_);
    const auto at = model_.lower_bound(key);
    if (status == kOk &&
        (at == model_.end() || Bytes(key_, key_ + keySize) != at->second.key.Delivered())) {
        return "the record at the insertion point is not the model's next one";
    }
    return Expect("reading at the cursor", status, at == model_.end() ? kErrNotFound : kOk);
}

Runner::Outcome Runner::Position(const Operation& operation) {
    if (Outcome outcome = Seek(operation)) {
        return outcome;
    }
    if (!cursor_.valid || cursor_.level != 1 || Faulted()) {
        return std::nullopt;
    }
    const Bytes before(key_, key_ + sizeof key_);
    const bool onRecord = model_.lower_bound(Key(operation.key)) != model_.end();
    const unsigned long long position = tree_->GetPos(&cursor_, nullptr, nullptr);
    cursor_.ClearPath();
    cursor_.level = 0;
    unsigned size = 0;
    unsigned keySize = 0;
    const int status = tree_->SetPos(position, record_.data(), Size(record_), &size, key_,
                                     sizeof key_, &keySize, &cursor_);
    if (onRecord && status == kOk && Bytes(key_, key_ + sizeof key_) != before) {
        return "a position number led to another record";
    }
    return onRecord ? Expect("going to a position", status, kOk) : std::nullopt;
}

Runner::Outcome Runner::Walk(const Operation& operation) {
    if (Outcome outcome = Seek(operation)) {
        return outcome;
    }
    auto at = model_.lower_bound(Key(operation.key));
    for (u32 i = 0; i < operation.size % 50 && at != model_.end() && !Faulted(); ++i) {
        unsigned size = 0;
        unsigned keySize = 0;
        const int status = tree_->IncPos(1, record_.data(), Size(record_), &size, key_, sizeof key_,
                                         &keySize, &cursor_);
        ++at;
        if (status == kOk &&
            (at == model_.end() || Bytes(key_, key_ + keySize) != at->second.key.Delivered())) {
            return "the next record is not the model's";
        }
        if (Outcome outcome = Expect("stepping", status, at == model_.end() ? kErrNotFound : kOk)) {
            return outcome;
        }
    }
    return std::nullopt;
}

Runner::Outcome Runner::Flush(const Operation& operation) {
    const int status = tree_->Flush(operation.size % 4 == 0 ? 4 : 0);
    if (status != kOk) {
        return Settle("flush", status);
    }
    if (tree_->IsDirty() || !tree_->modifiedList.IsEmpty()) {
        return "something is left to write after a flush";
    }
    snapshot_ = volume_->Save();
    committed_ = model_;
    return Check(volume_->Disk(setup_.fileId));
}

Runner::Outcome Runner::Reserve(const Operation& operation) {
    const int request = static_cast<int>(operation.size % 4 | (operation.key % 2) << 16);
    const bool wasOpen = tree_->reservationOpen;
    BTReserve joined{};
    BTReserve* reserve = wasOpen ? &joined : &reserve_;
    const int status = tree_->ReserveSpace(request, reserve);
    if (status == kOk && reserve->owner == wasOpen) {
        return "ownership of the reservation is wrong";
    }
    return Settle("reserve", status);
}

Runner::Outcome Runner::Extend(const Operation& operation) {
    const u32 wanted = tree_->header.totalNodes + operation.size % 12;
    const int status = tree_->ExtendBTree(wanted, nullptr, nullptr);
    if (status == kOk && tree_->header.totalNodes < wanted) {
        return "the tree has fewer nodes than asked for";
    }
    return Settle("extend", status);
}

Runner::Outcome Runner::Reopen() {
    faults_->FailNone();
    heap_.FailNone();
    if (Outcome outcome = Flush({Verb::kFlush, 0, 0, 0})) {
        return outcome;
    }
    cursor_.ClearPath();
    tree_->ReleaseSpace(&reserve_);
    tree_->Dtor();
    const int status = tree_->Init();
    tree_->findData.valid = false;
    cursor_.valid = false;
    return Expect("opening again", status, kOk);
}

Runner::Outcome Runner::HoldNode(const Operation& operation) {
    HfsNode* node = nullptr;
    const u32 number = operation.size % (tree_->validNodes + 2);
    const int status = tree_->GetINode(number, &node, false);
    if (status != kOk) {
        const bool refused = number >= tree_->header.totalNodes && node == nullptr;
        return refused || Faulted() ? std::nullopt : Outcome("a node could not be had");
    }
    // A node with changes must not be given back in full: that would lose them.
    if (HasDirty(*tree_, node)) {
        node->refCount -= 1;
    } else {
        tree_->PutINode(node, false);
    }
    return std::nullopt;
}

Runner::Outcome Runner::TooLarge(const Operation& operation) {
    const HostKey host = Key(operation.key).Host();
    const Bytes data(setup_.geometry.nodeSize, 0x55);
    const bool nothing = operation.size % 2 == 0;
    const int status = tree_->InsertRecord(host.Get(), host.id, data.data(),
                                           nothing ? 0 : setup_.geometry.nodeSize);
    if (status != (nothing ? kErrInvalid : kErrTooLarge)) {
        return "a record no node can hold was not refused";
    }
    return std::nullopt;
}

}  // namespace VELK::test
